#include "Gateway.h"

#include "automation/comptr.h"
#include "automation/local_socket.h"
#include "automation/rot.h"
#include "tarvo/Control.h"
#include "tarvo/TarvoIds.h"

#include <QCoreApplication>
#include <QFile>

#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <sys/stat.h>

namespace {

constexpr off_t kLargestSettingsFile = 16 * 1024 * 1024;

int Milliseconds(double seconds) { return static_cast<int>(seconds * 1000 + 0.5); }

// Whether a runtime has registered its application object where the module looks for it.
bool RuntimeReachable() {
    CComPtr<IUnknown> application;
    return SUCCEEDED(GetActiveObject(CLSID_TarvoApplication, application.Receive()));
}

std::string AbsolutePath(const std::string& path) {
    std::error_code error;
    const std::filesystem::path absolute = std::filesystem::absolute(path, error);
    return error ? path : absolute.lexically_normal().string();
}

}  // namespace

void GatewaySay(const std::string& text) {
    const std::time_t now = std::time(nullptr);
    std::tm local = {};
    localtime_r(&now, &local);
    char stamp[16];
    std::strftime(stamp, sizeof stamp, "%H:%M:%S", &local);
    std::printf("%s %s\n", stamp, text.c_str());
    std::fflush(stdout);  // a pipe to a service manager or a test buffers otherwise
}

void GatewayError(const std::string& text) {
    std::fprintf(stderr, "skyvane-gateway: %s\n", text.c_str());
    std::fflush(stderr);
}

bool CheckSettingsFile(const std::string& path, std::string& error) {
    struct stat info = {};
    if (stat(path.c_str(), &info) != 0) {
        error =
            "settings file '" + path + "' " +
            (errno == ENOENT ? std::string("does not exist") : "cannot be read: " + std::string(std::strerror(errno)));
        return false;
    }
    if (!S_ISREG(info.st_mode)) {
        error = "settings file '" + path + "' is not a regular file";
        return false;
    }
    if (info.st_size > kLargestSettingsFile) {
        error = "settings file '" + path + "' is larger than 16 MiB";
        return false;
    }
    std::ifstream file(path, std::ios::binary);
    if (!file) {
        error = "settings file '" + path + "' cannot be read: " + std::strerror(errno);
        return false;
    }
    return true;
}

CGateway::CGateway(const GatewayOptions& options, CSkyvaneModule& module, tarvo::RuntimeConfig project)
    : m_options(options), m_module(module), m_project(std::move(project)), m_window(*this) {
    m_window.CreateMessageWindow(u"skyvane-gateway");
    m_context.m_pWnd = &m_window;
    // The module reads the file by this path whenever it restarts: a relative
    // path must not depend on the folder the gateway runs in later.
    m_context.m_strIniFile = CString::FromUtf8(AbsolutePath(m_options.iniFile));

    m_retryTimer.setSingleShot(true);
    QObject::connect(&m_retryTimer, &QTimer::timeout, [this] { AttemptStart(); });
    QObject::connect(&m_statusTimer, &QTimer::timeout, [this] {
        PrintStatus();
        WriteMetrics();
    });
    m_durationTimer.setSingleShot(true);
    QObject::connect(&m_durationTimer, &QTimer::timeout, [this] { Stop("--duration has passed", 0); });
    m_runtimeTimer.setSingleShot(true);
    QObject::connect(&m_runtimeTimer, &QTimer::timeout, [this] {
        if (!StartRuntime()) Stop("the runtime stand-in did not start", 2);
    });
}

CGateway::~CGateway() {
    StopModule();
    if (m_pRuntime) m_pRuntime->Stop();
    DetachRuntimeSource();
}

void CGateway::AttachRuntimeSource() {
    LocalSocketOptions options;  // the folder: $SKYVANE_AUTOMATION_DIR, else the user's runtime folder
    options.log = [](const std::string& text) { GatewayError("runtime connection: " + text); };
    // From a transport thread: only a post, which is safe from any thread and
    // does nothing once the window is gone.
    options.lost = [window = m_window.GetSafeHwnd()] { ::PostMessage(window, WM_GATEWAY_RUNTIME_LOST); };
    m_dwRuntimeSource = AddRunningObjectSource(CreateLocalSocketSource(options));
}

void CGateway::DetachRuntimeSource() {
    if (m_dwRuntimeSource) RemoveRunningObjectSource(m_dwRuntimeSource);
    m_dwRuntimeSource = 0;
}

bool CGateway::Start() {
    if (!m_options.metricsFile.empty() && !WriteMetrics()) return false;
    m_statusTimer.start(Milliseconds(m_options.statusInterval));
    m_intervalClock.start();
    if (m_options.duration > 0) m_durationTimer.start(Milliseconds(m_options.duration));
    if (m_options.projectFile.empty()) {
        AttachRuntimeSource();
    } else {
        if (m_options.simulateDelay > 0) {
            GatewaySay("the runtime stand-in starts in " + std::to_string(Milliseconds(m_options.simulateDelay)) +
                       " ms");
            m_runtimeTimer.start(Milliseconds(m_options.simulateDelay));
        } else if (!StartRuntime()) {
            return false;
        }
    }
    AttemptStart();
    return true;
}

bool CGateway::StartRuntime() {
    m_pRuntime = std::make_unique<tarvo::Runtime>(m_project);
    std::string error;
    if (!m_pRuntime->Start(&error)) {
        GatewayError("the runtime stand-in did not start: " + error);
        m_pRuntime.reset();
        return false;
    }
    GatewaySay("the runtime stand-in runs '" + m_options.projectFile + "'");
    return true;
}

void CGateway::AttemptStart() {
    if (m_bStopping || m_bRunning) return;
    ++m_nAttempt;
    const std::string attempt = "start attempt " + std::to_string(m_nAttempt);
    std::string error;
    if (!CheckSettingsFile(m_context.m_strIniFile.ToUtf8(), error)) {
        ScheduleAttempt(attempt + " skipped: " + error);
        return;
    }
    m_status.OnStartAttempt();
    m_bInInit = true;
    const int result = m_module.Init(&m_context);
    m_bInInit = false;
    if (result == 1) {
        m_bRunning = true;
        m_bSaidNoRuntime = false;
        m_backoff.Reset();
        m_status.SetRunning(true);
        GatewaySay(attempt + ": the module runs");
        return;
    }
    // The module stays as far as it got; dll_exit brings it back to a clean state for the next init.
    m_module.DllExit(0);
    if (RuntimeReachable()) {
        ScheduleAttempt(attempt + " failed: the module could not start (its message says why)");
        return;
    }
    if (!m_bSaidNoRuntime) GatewaySay("no SCADA runtime is reachable yet; waiting for it");
    m_bSaidNoRuntime = true;
    ScheduleAttempt(attempt + " failed: no SCADA runtime is reachable");
}

void CGateway::ScheduleAttempt(const std::string& why) {
    const int pause = m_backoff.NextPauseMs();
    GatewaySay(why + "; next attempt in " + std::to_string(pause / 1000) + " s");
    m_retryTimer.start(pause);
}

void CGateway::Reload() {
    if (m_bStopping) return;
    if (!m_bRunning) {
        GatewaySay("reload: the module is not running; trying to start it now");
        m_retryTimer.stop();
        AttemptStart();
        return;
    }
    if (m_bReloadPending) {
        m_bReloadAgain = true;  // one restart at a time: this one follows the pending one
        return;
    }
    std::string error;
    if (!CheckSettingsFile(m_context.m_strIniFile.ToUtf8(), error)) {
        // The module would read an unreadable file as empty settings and export nothing.
        GatewaySay("reload refused: " + error + "; the running settings stay");
        return;
    }
    GatewaySay("reload: the module reads the settings file again");
    m_bRestartFailed = false;
    if (m_module.ExecAction(&m_context) != 1) m_bRestartFailed = true;
    m_bReloadPending = true;
    m_window.PostMessage(WM_GATEWAY_RELOAD_DONE);
}

void CGateway::OnReloadDone() {
    m_bReloadPending = false;
    if (m_bStopping || !m_bRunning) return;
    if (m_bRestartFailed) {
        StopModule();
        m_backoff.Reset();
        ScheduleAttempt("reload failed: the export did not restart with the new settings");
        return;
    }
    GatewaySay("reload: the module runs with the new settings");
    if (m_bReloadAgain) {
        m_bReloadAgain = false;
        Reload();
    }
}

void CGateway::OnRuntimeLost() {
    if (m_bStopping || !m_bRunning) return;
    // The module's link now fails every call and nothing in it would ever
    // subscribe again: start it afresh once a runtime is there.
    GatewaySay("the SCADA runtime went away; the module stops and waits for it");
    StopModule();
    m_backoff.Reset();
    ScheduleAttempt("runtime lost");
}

void CGateway::OnCycle(WPARAM rows, LPARAM durationMs) {
    if (m_bInInit) return;  // the 1026 that closes a successful init
    m_status.OnCycle(rows, durationMs);
}

void CGateway::OnRestartFailed() {
    m_bRestartFailed = true;
    m_status.OnRestartFailed();
    GatewaySay("the module could not restart the export (message 1126)");
}

void CGateway::StopModule() {
    if (!m_bRunning || !m_module.IsLoaded()) return;
    m_module.DllExit(0);
    m_bRunning = false;
    m_status.SetRunning(false);
}

void CGateway::Stop(const char* reason, int exitCode) {
    if (m_bStopping) return;
    m_bStopping = true;
    m_retryTimer.stop();
    m_statusTimer.stop();
    m_durationTimer.stop();
    m_runtimeTimer.stop();
    GatewaySay(std::string("stopping: ") + reason);
    StopModule();
    // The worker has ended: count the cycles it posted before it did.
    QCoreApplication::sendPostedEvents();
    PrintStatus();
    WriteMetrics();
    m_module.Unload();  // releases what the module held of the runtime
    if (m_pRuntime) m_pRuntime->Stop();
    DetachRuntimeSource();
    GatewaySay("stopped");
    QCoreApplication::exit(exitCode);
}

int CGateway::Configure() {
    if (m_options.projectFile.empty()) AttachRuntimeSource();
    else if (!StartRuntime()) return 2;
    // The module takes the host's context in init; konfig before init does nothing.
    m_bInInit = true;
    const int started = m_module.Init(&m_context);
    m_bInInit = false;
    m_bRunning = true;  // dll_exit is due either way: init keeps what it got as far as it got
    if (started != 1) GatewaySay("the module did not start; its dialog may lack the runtime's variables");
    m_module.Konfig(&m_context);
    StopModule();
    QCoreApplication::sendPostedEvents();
    m_module.Unload();
    if (m_pRuntime) m_pRuntime->Stop();
    DetachRuntimeSource();
    return 0;
}

void CGateway::PrintStatus() {
    // The last line, at a stop, covers less than a whole interval.
    const double seconds = std::round(static_cast<double>(m_intervalClock.restart()) / 100) / 10;
    GatewaySay(m_status.TakeIntervalLine(seconds));
}

// Written beside the file and renamed over it, so that a reader never sees
// half a file, but not synced to disk: this runs on the event loop the
// module's timer shares, and a sync on a busy disk held the timer (and with it
// every value change) up for hundreds of milliseconds. A file that a crash
// leaves behind is replaced at the next interval.
bool CGateway::WriteMetrics() {
    if (m_options.metricsFile.empty()) return true;
    if (m_pRuntime) m_status.SetSimulatedChanges(m_pRuntime->ChangesFired());
    const std::string temporary = m_options.metricsFile + ".tmp";  // the textfile collector reads *.prom only
    QFile file(QString::fromStdString(temporary));
    const std::string text = m_status.PrometheusText();
    bool ok = file.open(QIODevice::WriteOnly | QIODevice::Truncate) &&
              file.write(text.data(), static_cast<qint64>(text.size())) == static_cast<qint64>(text.size());
    file.close();
    std::string reason = file.errorString().toStdString();
    ok = ok && file.error() == QFileDevice::NoError;
    if (ok && std::rename(temporary.c_str(), m_options.metricsFile.c_str()) != 0) {
        ok = false;
        reason = std::strerror(errno);
    }
    if (!ok) std::remove(temporary.c_str());
    if (!ok && !m_bMetricsFailing)
        GatewayError("cannot write the metrics file '" + m_options.metricsFile + "': " + reason);
    if (ok && m_bMetricsFailing) GatewaySay("the metrics file is written again");
    m_bMetricsFailing = !ok;
    return ok;
}
