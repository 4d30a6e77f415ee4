#include "frame/LogMainAccess.h"

#include "frame/MainAccess.h"

namespace {

void PadTo(CStringArray& names, int count) {
    while (names.GetSize() < count) names.Add(CString());
}

}  // namespace

CLogMainAccess::CLogMainAccess(CMainAccess* owner) : m_pMainAccess(owner) {}

CLogMainAccess::~CLogMainAccess() = default;

bool CLogMainAccess::ReadCfg() {
    const bool read = CLogSink::ReadCfg();
    if (read && m_pMainAccess) {
        BYTE levels[LOG_MODULE_COUNT];
        GetLevelTable(levels);
        m_pMainAccess->OnLogLevels(levels, LOG_MODULE_COUNT);
    }
    return read;
}

void CLogMainAccess::FillClientModules(CStringArray& names) {
    CLogSink::FillClientModules(names);
    PadTo(names, 16);
    names.Add(u"Pelgrad");
    names.Add(u"KAP");
    PadTo(names, 19);
    names.Add(u"PelgradDll");
    if (m_pMainAccess) m_pMainAccess->OnFillLogModules(names);
}

void CLogMainAccess::FillClientFields(CLogRec* record) {
    CLogSink::FillClientFields(record);
    if (m_pMainAccess) m_pMainAccess->OnFillLogFields(record);
}

void CLogMainAccess::CmdSetParameter(const CCliParam& param) {
    if (m_pMainAccess) m_pMainAccess->OnLogLevels(param.m_LogLevels, LOG_MODULE_COUNT);
    CLogSink::CmdSetParameter(param);
}
