#pragma once
// The gateway's own hidden window: the host window of the context record, to
// which the module sends and posts its status messages.

#include "platform/window.h"

// Messages of the module to the host window.
constexpr UINT WM_SKYVANE_FAILED_CYCLE = WM_USER + 1;      // 1025: rows failed in the cycle just reported
constexpr UINT WM_SKYVANE_CYCLE = WM_USER + 2;             // 1026: rows sent (wParam), duration in ms (lParam)
constexpr UINT WM_SKYVANE_RESTART_FAILED = WM_USER + 102;  // 1126: exec_action could not restart the export
constexpr UINT WM_SKYVANE_STARTING = WM_USER + 103;        // 1127: init has begun
// The gateway's own: posted after exec_action returns, so that it arrives
// after any 1126 the module posted during the call.
constexpr UINT WM_GATEWAY_RELOAD_DONE = WM_USER + 200;
// The gateway's own: the connection to a runtime in another process was lost.
constexpr UINT WM_GATEWAY_RUNTIME_LOST = WM_USER + 201;

// What the window hands on; called on the window's (main) thread.
class IHostMessages {
public:
    virtual ~IHostMessages() = default;
    virtual void OnModuleStarting() = 0;
    virtual void OnCycle(WPARAM rows, LPARAM durationMs) = 0;
    virtual void OnFailedCycle() = 0;
    virtual void OnRestartFailed() = 0;
    virtual void OnReloadDone() = 0;
    virtual void OnRuntimeLost() = 0;
};

class CHostWindow : public CWnd {
public:
    explicit CHostWindow(IHostMessages& target) : m_target(target) {}

    LRESULT WindowProc(UINT message, WPARAM wParam, LPARAM lParam) override;

private:
    IHostMessages& m_target;
};
