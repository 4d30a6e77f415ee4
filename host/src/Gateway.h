#pragma once
// The gateway's work on its main thread: starting the module (and trying
// again while it cannot start), applying new settings on request, counting
// the module's status messages into status lines and the metrics file, and
// stopping. Everything here runs on the thread that loaded the module, which
// runs the event loop the module's window lives on.

#include "GatewayOptions.h"
#include "GatewayStatus.h"
#include "Backoff.h"
#include "HostWindow.h"
#include "SkyvaneModule.h"

#include "frame/ConfigData.h"
#include "tarvo/Config.h"

#include <QElapsedTimer>
#include <QTimer>

#include <memory>
#include <string>

namespace tarvo {
class Runtime;
}

// Whether the settings file can be given to the module: an existing,
// readable regular file of at most 16 MiB (the largest the module reads).
// False with one line naming the file and the cause.
bool CheckSettingsFile(const std::string& path, std::string& error);

class CGateway final : public IHostMessages {
public:
    // options: as parsed; module: loaded; project: the stand-in's project when
    // options.projectFile is set.
    CGateway(const GatewayOptions& options, CSkyvaneModule& module, tarvo::RuntimeConfig project);
    ~CGateway() override;
    CGateway(const CGateway&) = delete;
    CGateway& operator=(const CGateway&) = delete;

    // For run: starts the timers, the stand-in (if any) and the first start
    // attempt. False with a line on standard error when the metrics file
    // cannot be written; the caller exits with 2.
    bool Start();
    // SIGHUP: new settings, or an attempt at once while the module waits to start.
    void Reload();
    // SIGINT, SIGTERM, the end of --duration: stops and unloads the module,
    // stops the stand-in and ends the event loop with exitCode.
    void Stop(const char* reason, int exitCode = 0);
    // For configure: starts the module, runs its settings dialog, stops it.
    int Configure();

    // IHostMessages
    void OnModuleStarting() override {}
    void OnCycle(WPARAM rows, LPARAM durationMs) override;
    void OnFailedCycle() override { m_status.OnFailedCycle(); }
    void OnRestartFailed() override;
    void OnReloadDone() override;
    // The runtime in another process went away: stop the module and wait for a runtime again.
    void OnRuntimeLost() override;

private:
    bool StartRuntime();
    // Without --simulate: lets the running-object table reach a runtime in another process.
    void AttachRuntimeSource();
    void DetachRuntimeSource();
    void AttemptStart();
    void ScheduleAttempt(const std::string& why);
    void StopModule();
    void PrintStatus();
    bool WriteMetrics();

    GatewayOptions m_options;
    CSkyvaneModule& m_module;
    tarvo::RuntimeConfig m_project;
    std::unique_ptr<tarvo::Runtime> m_pRuntime;
    CHostWindow m_window;
    CConfigData m_context;
    CGatewayStatus m_status;
    CBackoff m_backoff;
    QTimer m_retryTimer;
    QTimer m_statusTimer;
    QTimer m_durationTimer;
    QTimer m_runtimeTimer;
    QElapsedTimer m_intervalClock;  // since the last status line

    bool m_bRunning = false;  // init returned 1 and dll_exit has not been called since
    bool m_bInInit = false;   // inside the init call: its closing 1026 is no cycle
    bool m_bStopping = false;
    bool m_bSaidNoRuntime = false;   // "no runtime yet" is said once per wait
    bool m_bReloadPending = false;   // exec_action returned, its WM_GATEWAY_RELOAD_DONE not yet seen
    bool m_bReloadAgain = false;     // a SIGHUP arrived while a reload was pending
    bool m_bRestartFailed = false;   // a 1126 arrived since the last exec_action
    bool m_bMetricsFailing = false;  // the last metrics write failed (reported once)
    unsigned m_nAttempt = 0;
    DWORD m_dwRuntimeSource = 0;  // the local-socket source of the running-object table, 0 when none
};

// A line on standard output, with the local time in front.
void GatewaySay(const std::string& text);
// A line on standard error.
void GatewayError(const std::string& text);
