#include "frame/MainSkyvane.h"

#include "frame/ConfigData.h"
#include "frame/ConfigFile.h"
#include "frame/HostMessages.h"
#include "frame/ModuleLog.h"
#include "res/resource.h"
#include "ui/SettingsDialog.h"

#include "platform/resources.h"
#include "vxhelper/messagebox.h"

#include <algorithm>

namespace {

constexpr DWORD WS_POPUP = 0x80000000;
// Carries an export's body to the window's thread (lParam: the body).
constexpr UINT WM_SKYVANE_RUN_ON_WINDOW_THREAD = WM_USER + 200;
constexpr int kListedUnknownNames = 10;

}  // namespace

CMainSkyvane::CMainSkyvane() { CreateEx(0, u"Static", u"Skyvane", WS_POPUP, 0, 0, 0, 0, nullptr, 0); }

CMainSkyvane::~CMainSkyvane() = default;

// ---- Exports ---------------------------------------------------------------

int CMainSkyvane::Init(CConfigData* context) {
    return RunOnWindowThread([&] { return InitOnWindowThread(context); });
}

int CMainSkyvane::Konfig(CConfigData* context) {
    return RunOnWindowThread([&] {
        if (RunSettingsDialog(context) == 0) ExecActionOnWindowThread(GetConfigData());
        return 0;
    });
}

int CMainSkyvane::ExecAction(CConfigData* context) {
    return RunOnWindowThread([&] { return ExecActionOnWindowThread(context); });
}

int CMainSkyvane::DllExit(int unused) {
    return RunOnWindowThread([&] { return DllExitOnWindowThread(unused); });
}

// The timer, the variable check and the runtime link live on the window's
// thread; an export called elsewhere would run beside them.
int CMainSkyvane::RunOnWindowThread(const std::function<int()>& body) {
    return static_cast<int>(SendMessage(WM_SKYVANE_RUN_ON_WINDOW_THREAD, 0, reinterpret_cast<LPARAM>(&body)));
}

int CMainSkyvane::InitOnWindowThread(CConfigData* context) {
    if (HWND host = context ? SafeHwnd(context->m_pWnd) : nullptr) ::SendMessage(host, WM_SKYVANE_INIT_BEGIN, 1, 0);
    // A running worker reads the settings that are about to be replaced.
    StopExport();
    if (!CMainAccess::Init(context)) return 0;
    PublishHostWindow();
    ReadConfig(context->m_strIniFile, m_config);
    if (!SetTimer(kTickTimerId, kTickMs)) {
        LogError(u"Starting the module's timer failed");
        return 0;
    }
    m_nTickState = kTickIdle;
    if (!StartExport()) return 0;
    if (HWND host = m_hHostWnd.load()) ::SendMessage(host, WM_SKYVANE_STATUS, 0, 0);
    return 1;
}

int CMainSkyvane::ExecActionOnWindowThread(CConfigData* context) {
    if (!CMainAccess::ExecAction(context)) return 0;
    PublishHostWindow();
    StopExport();
    ReadConfig(context->m_strIniFile, m_config);
    if (!StartExport()) ::PostMessage(SafeHwnd(context->m_pWnd), WM_SKYVANE_RESTART_FAILED, 0, 0);
    return 1;
}

int CMainSkyvane::DllExitOnWindowThread(int unused) {
    m_nTickState = kTickClosed;
    StopExport();
    DiscardQueuedValues();
    m_hHostWnd.store(nullptr);
    return CMainAccess::DllExit(unused);
}

int CMainSkyvane::RunSettingsDialog(CConfigData* context) {
    if (!context) return 1;
    static VX_CRefCnt busy;  // held while the dialog is open: a second konfig returns at once
    VX_ReentranceGuard guard(busy);
    if (!guard.Entered()) return 2;
    if (!CMainAccess::Konfig(context)) return 1;
    CAzureConfig working(m_config);
    if (ShowSettingsDialog(context->m_pWnd, working) != IDOK) return 1;
    // dll_exit may have run in the dialog's message loop.
    const CConfigData* copy = GetConfigData();
    if (!copy) return 1;
    // A refused write must not read as saved: the restart would read the old file.
    if (!WriteConfig(copy->m_strIniFile, working)) {
        CString text;
        AfxLoadString(IDS_SETTINGS_NOT_SAVED, text);
        VXHelper_MessageBox(SafeHwnd(copy->m_pWnd), CString::Formatted(text, copy->m_strIniFile), MB_ICONERROR);
        return 1;
    }
    return 0;
}

void CMainSkyvane::PublishHostWindow() {
    const CConfigData* copy = GetConfigData();
    m_hHostWnd.store(copy ? SafeHwnd(copy->m_pWnd) : nullptr);
}

// ---- Start and stop --------------------------------------------------------

bool CMainSkyvane::StartExport() {
    m_pBridge = std::make_unique<CAzureValueExchangeViaCOM>(this);
    if (!m_pBridge->Connect()) return false;
    if (!m_worker.BeginThread(&CMainSkyvane::WorkerProc, this)) {
        LogError(u"Starting the export thread failed");
        return false;
    }
    return CheckVariables(0, 0) != 0;
}

void CMainSkyvane::StopExport() {
    m_worker.EndThread(INFINITE);
    if (m_pBridge) m_pBridge->Disconnect();
}

// ---- Variable check --------------------------------------------------------

LRESULT CMainSkyvane::CheckVariables(WPARAM, LPARAM) {
    if (!GetConfigData() || !m_pBridge) return 0;
    VX_ReentranceGuard guard(m_checkBusy);
    if (!guard.Entered()) {
        // Dispatched by a message box's loop inside a check: that check has
        // already passed the variables, so this request would be lost.
        m_bCheckRefused = true;
        return 1;
    }
    const LRESULT result = SubscribeVariables();
    if (m_bCheckRefused) {
        m_bCheckRefused = false;
        RequestVariableCheck();
    }
    return result;
}

LRESULT CMainSkyvane::SubscribeVariables() {
    CAzureValueExchangeViaCOM* bridge = m_pBridge.get();  // a message box's loop may replace m_pBridge
    CStringArray refused;
    for (const auto& [key, item] : m_config.m_mapVariables) {
        if (!bridge->AddVariable(item)) refused.Add(item->m_strName);
    }
    m_nQueueLimit = static_cast<int>(std::min<long long>(4LL * m_config.m_mapVariables.GetCount(), 0x7FFFFFFF));

    const HWND parent = m_hHostWnd.load();
    if (refused.IsEmpty()) {
        if (bridge->StartLink()) return 1;
        VXHelper_MessageBox(parent, IDS_CONNECTION_FAILED, MB_ICONERROR);
        return 0;
    }
    // Without a runtime every name is refused; telling the user they are all
    // unknown would send them looking in the wrong place.
    if (!CAzureValueExchangeViaCOM::IsRuntimeReachable()) {
        VXHelper_MessageBox(parent, IDS_CONNECTION_FAILED, MB_ICONERROR);
        return 0;
    }
    ShowUnknownVariables(refused);
    return 0;
}

// A heading by the number of names, then at most ten names, the last refused first.
void CMainSkyvane::ShowUnknownVariables(const CStringArray& refused) {
    const int count = refused.GetCount();
    const UINT heading = count == 1                    ? IDS_UNKNOWN_VARIABLE
                         : count > kListedUnknownNames ? IDS_MANY_UNKNOWN_VARIABLES
                                                       : IDS_UNKNOWN_VARIABLES;
    CString text;
    AfxLoadString(heading, text);
    for (int i = std::min(count, kListedUnknownNames) - 1; i >= 0; --i) {
        text += refused[i];
        if (i > 0) text += u", ";
    }
    VXHelper_MessageBox(m_hHostWnd.load(), text, MB_ICONERROR);
}

bool CMainSkyvane::RequestVariableCheck() {
    PostMessage(WM_SKYVANE_CHECK_VARIABLES, 0, 0);
    return true;
}

// ---- Window ----------------------------------------------------------------

LRESULT CMainSkyvane::WindowProc(UINT message, WPARAM wParam, LPARAM lParam) {
    switch (message) {
    case WM_TIMER: OnTick(); break;
    case WM_DESTROY: {
        const LRESULT result = DefWindowProc(message, wParam, lParam);
        KillTimer(kTickTimerId);
        return result;
    }
    case WM_SKYVANE_CHECK_VARIABLES: return CheckVariables(wParam, lParam);
    case WM_SKYVANE_RUN_ON_WINDOW_THREAD:
        return lParam ? (*reinterpret_cast<const std::function<int()>*>(lParam))() : 0;
    default: break;
    }
    return DefWindowProc(message, wParam, lParam);
}

void CMainSkyvane::OnTick() {
    if (m_nTickState != kTickIdle) return;
    m_nTickState = kTickBusy;
    if (m_pBridge) m_pBridge->ProcessAllProjects();
    if (m_nTickState == kTickBusy) m_nTickState = kTickIdle;
}

// ---- Log -------------------------------------------------------------------

void CMainSkyvane::LogError(const CString& text) { CModuleLog::LogError(text); }

void CMainSkyvane::LogInfo(const CString& text) { CModuleLog::LogInfo(text); }
