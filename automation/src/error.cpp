#include "automation/error.h"

#include "platform/text.h"

#include <cstdio>

CAutomationError::CAutomationError(HRESULT status, std::u16string description, std::u16string source)
    : m_status(status), m_description(std::move(description)), m_source(std::move(source)) {
    char code[16];
    std::snprintf(code, sizeof code, "0x%08X", static_cast<unsigned>(m_status));
    m_what = m_description.empty() ? std::string("automation call failed") : Utf16ToUtf8(m_description);
    m_what += " (";
    m_what += code;
    m_what += ")";
}

CAutomationError CAutomationError::FromCall(HRESULT status, const EXCEPINFO& info) {
    if (status != DISP_E_EXCEPTION) return CAutomationError(status);
    auto text = [](BSTR s) { return s ? std::u16string(s, SysStringLen(s)) : std::u16string(); };
    return CAutomationError(FAILED(info.scode) ? info.scode : DISP_E_EXCEPTION, text(info.bstrDescription),
                            text(info.bstrSource));
}

void CAutomationError::Fill(EXCEPINFO* info) const {
    if (!info) return;
    ClearExcepInfo(info);
    info->scode = m_status;
    info->bstrDescription = SysAllocStringLen(m_description.data(), static_cast<UINT>(m_description.size()));
    info->bstrSource = SysAllocStringLen(m_source.data(), static_cast<UINT>(m_source.size()));
}

void ClearExcepInfo(EXCEPINFO* info) {
    if (!info) return;
    SysFreeString(info->bstrSource);
    SysFreeString(info->bstrDescription);
    *info = EXCEPINFO{0, nullptr, nullptr, 0};
}
