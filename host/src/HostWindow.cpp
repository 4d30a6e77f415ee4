#include "HostWindow.h"

LRESULT CHostWindow::WindowProc(UINT message, WPARAM wParam, LPARAM lParam) {
    switch (message) {
    case WM_SKYVANE_STARTING: m_target.OnModuleStarting(); return 0;
    case WM_SKYVANE_CYCLE: m_target.OnCycle(wParam, lParam); return 0;
    case WM_SKYVANE_FAILED_CYCLE: m_target.OnFailedCycle(); return 0;
    case WM_SKYVANE_RESTART_FAILED: m_target.OnRestartFailed(); return 0;
    case WM_GATEWAY_RELOAD_DONE: m_target.OnReloadDone(); return 0;
    case WM_GATEWAY_RUNTIME_LOST: m_target.OnRuntimeLost(); return 0;
    default: return CWnd::WindowProc(message, wParam, lParam);
    }
}
