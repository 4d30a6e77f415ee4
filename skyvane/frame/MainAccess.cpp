#include "frame/MainAccess.h"

#include "frame/ConfigData.h"
#include "frame/LogMainAccess.h"

CMainAccess::CMainAccess() = default;

CMainAccess::~CMainAccess() = default;

int CMainAccess::Init(CConfigData* context) {
    m_pLogSink.reset();  // at most one sink of ours: a repeated Init must not leave the first one running
    m_pLogSink = std::make_unique<CLogMainAccess>(this);
    const CString name = GetLogSinkName();
    if (!name.IsEmpty()) m_pLogSink->SetLogSinkName(name);
    m_pLogSink->StartLogging();

    if (!m_pConfigData) m_pConfigData = std::make_unique<CConfigData>();
    return CopyContext(context);
}

int CMainAccess::Konfig(CConfigData* context) { return CopyContext(context); }

int CMainAccess::ExecAction(CConfigData* context) { return CopyContext(context); }

int CMainAccess::DllExit(int) {
    m_pConfigData.reset();
    m_pLogSink.reset();
    return 1;
}

void CMainAccess::OnFillLogFields(CLogRec*) {}

void CMainAccess::OnFillLogModules(CStringArray&) {}

CString CMainAccess::GetLogSinkName() { return CString(); }

bool CMainAccess::OnLogLevels(const BYTE*, int) { return true; }

int CMainAccess::CopyContext(CConfigData* context) {
    if (!m_pConfigData || !context) return 0;
    m_pConfigData->CopyFrom(*context);
    return 1;
}
