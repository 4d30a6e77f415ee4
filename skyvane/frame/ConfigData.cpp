#include "frame/ConfigData.h"

#include <algorithm>

CConfigData::~CConfigData() {
    AssignInterface(m_pFirstInterface, nullptr);
    AssignInterface(m_pSecondInterface, nullptr);
}

void CConfigData::AssignInterface(IUnknown*& slot, IUnknown* value) {
    if (slot == value) return;
    if (value) value->AddRef();
    IUnknown* old = slot;
    slot = value;
    if (old) old->Release();
}

void CConfigData::CopyFrom(const CConfigData& source) {
    // The module hands its own copy back in (konfig applies its saved
    // settings through it): emptying the containers first would lose them.
    if (&source == this) return;
    m_pWnd = source.m_pWnd;
    m_strIniFile = source.m_strIniFile;
    m_strText = source.m_strText;
    m_bFlag = source.m_bFlag;
    m_lstFirst = source.m_lstFirst;
    m_lstSecond = source.m_lstSecond;
    m_mapPointers = source.m_mapPointers;
    m_mapTexts = source.m_mapTexts;
    AssignInterface(m_pFirstInterface, source.m_pFirstInterface);
    AssignInterface(m_pSecondInterface, source.m_pSecondInterface);
    std::copy(std::begin(source.m_adwWords), std::end(source.m_adwWords), m_adwWords);
}
