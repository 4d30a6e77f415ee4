// tarvo-runtime: runs the SCADA runtime stand-in from a project file until
// SIGINT or SIGTERM, reachable from other processes of the user through the
// local-socket transport (its application object and its control object).
// With --watch it also subscribes every variable of every project through the
// automation interface, as a client would, and prints how many changes
// arrived every five seconds. Messages go to standard error.
#include "automation/connection.h"
#include "automation/dispatch_call.h"
#include "automation/dispatch_object.h"
#include "automation/local_socket.h"
#include "automation/rot.h"
#include "platform/text.h"
#include "tarvo/Control.h"
#include "tarvo/ControlIds.h"

#include <atomic>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <string>
#include <vector>

namespace {

// Counts the changes that reach it.
class CCountingSink final : public CDispatchObject {
public:
    HRESULT Invoke(DISPID member, WORD, DISPPARAMS* params, VARIANT*, EXCEPINFO*) override {
        if (member != tarvo::dispid::EventVariableBulkChange || !params || params->cArgs != 6) return S_OK;
        const VARIANT& ids = DispatchArgs(*params)[1];
        if ((ids.vt & VT_ARRAY) && ids.parray) changes += ids.parray->cElements;
        return S_OK;
    }
    std::atomic<unsigned long long> changes{0};

protected:
    IUnknown* FindInterface(REFIID iid) override {
        if (iid == DIID_IOnlineVariableEvents) return static_cast<IDispatch*>(this);
        return CDispatchObject::FindInterface(iid);
    }
};

struct Watch {
    std::u16string project;
    CComPtr<IDispatch> container;
    CComPtr<IConnectionPoint> point;
    CComPtr<CCountingSink> sink;
    DWORD cookie = 0;
};

// Subscribes every variable of one project; throws CAutomationError when a call fails.
Watch WatchProject(IDispatch* projects, LONG position) {
    using namespace tarvo::dispid;
    Watch watch;
    const CComVariant project = CallMethodOrThrow(projects, CollectionItem, static_cast<int>(position));
    if (project.vt != VT_DISPATCH || !project.pdispVal) throw CAutomationError(E_FAIL, u"no such project");
    const CComVariant name = GetPropertyOrThrow(project.pdispVal, ProjectName);
    watch.project = name.vt == VT_BSTR && name.bstrVal ? name.bstrVal : u"";
    const CComVariant variables = CallMethodOrThrow(project.pdispVal, ProjectVariables);
    const CComVariant containers = CallMethodOrThrow(project.pdispVal, ProjectContainers);
    const CComVariant created = CallMethodOrThrow(containers.pdispVal, ContainersCreate, u"tarvo-runtime-watch");
    watch.container = created.pdispVal;
    CallMethodOrThrow(watch.container.Get(), ContainerReset);
    const CComVariant count = GetPropertyOrThrow(variables.pdispVal, CollectionCount);
    for (LONG i = 0; i < count.lVal; ++i) {
        const CComVariant variable = CallMethodOrThrow(variables.pdispVal, CollectionItem, static_cast<int>(i));
        const CComVariant variableName = GetPropertyOrThrow(variable.pdispVal, VariableName);
        CallMethodOrThrow(watch.container.Get(), ContainerAdd, static_cast<const char16_t*>(variableName.bstrVal));
    }
    CComPtr<IConnectionPointContainer> points;
    if (FAILED(watch.container.QueryInterface(IID_IConnectionPointContainer, points)) ||
        FAILED(points->FindConnectionPoint(DIID_IOnlineVariableEvents, watch.point.Receive())))
        throw CAutomationError(E_FAIL, u"the container has no change events");
    watch.sink = MakeComObject<CCountingSink>();
    if (FAILED(watch.point->Advise(watch.sink.Get(), &watch.cookie))) throw CAutomationError(E_FAIL, u"advise failed");
    CallMethodOrThrow(watch.container.Get(), ContainerStart);
    return watch;
}

std::vector<Watch> WatchAll() {
    std::vector<Watch> watches;
    CComPtr<IUnknown> unknown;
    CComPtr<IDispatch> application;
    if (FAILED(GetActiveObject(CLSID_TarvoApplication, unknown.Receive())) ||
        FAILED(unknown.QueryInterface(IID_ITarvoApplication, application))) {
        std::fprintf(stderr, "tarvo-runtime: the runtime is not registered\n");
        return watches;
    }
    try {
        const CComVariant projects = CallMethodOrThrow(application.Get(), tarvo::dispid::ApplicationProjects);
        const CComVariant count = GetPropertyOrThrow(projects.pdispVal, tarvo::dispid::CollectionCount);
        for (LONG i = 0; i < count.lVal; ++i) watches.push_back(WatchProject(projects.pdispVal, i));
    } catch (const CAutomationError& error) {
        std::fprintf(stderr, "tarvo-runtime: watching failed: %s\n", error.what());
    }
    return watches;
}

void Unwatch(std::vector<Watch>& watches) {
    for (Watch& watch : watches) {
        if (watch.point && watch.cookie) watch.point->Unadvise(watch.cookie);
        if (watch.container) CallMethod(watch.container.Get(), tarvo::dispid::ContainerStop, nullptr);
    }
    watches.clear();
}

const char kHelp[] =
    "usage: tarvo-runtime PROJECT_FILE [--watch] [--paused] [--socket-dir DIR]\n"
    "Runs the SCADA runtime stand-in until SIGINT or SIGTERM.\n"
    "  --watch           subscribe every variable and print the changes every 5 s\n"
    "  --paused          start with the simulation paused (tarvo-ctl can drive it)\n"
    "  --socket-dir DIR  folder of the sockets (default: $SKYVANE_AUTOMATION_DIR,\n"
    "                    else $XDG_RUNTIME_DIR/skyvane-automation, else\n"
    "                    /tmp/skyvane-automation-UID)\n";

int Usage() {
    std::fputs(kHelp, stderr);
    return 2;
}

struct Options {
    std::string file;
    bool watch = false;
    bool paused = false;
    std::string socketDir;
};

bool ParseOptions(int argc, char** argv, Options* options) {
    for (int i = 1; i < argc; ++i) {
        const std::string arg = argv[i];
        if (arg == "--watch") options->watch = true;
        else if (arg == "--paused") options->paused = true;
        else if (arg == "--socket-dir" && i + 1 < argc) options->socketDir = argv[++i];
        else if (!arg.empty() && arg[0] != '-' && options->file.empty()) options->file = arg;
        else return false;
    }
    return !options->file.empty();
}

void LogLine(const std::string& text) { std::fprintf(stderr, "tarvo-runtime: %s\n", text.c_str()); }

}  // namespace

int main(int argc, char** argv) {
    if (argc == 2 && (std::strcmp(argv[1], "--help") == 0 || std::strcmp(argv[1], "-h") == 0)) {
        std::fputs(kHelp, stdout);
        return 0;
    }
    Options options;
    if (!ParseOptions(argc, argv, &options)) return Usage();

    tarvo::RuntimeConfig config;
    std::string error;
    if (!tarvo::LoadProjectFile(options.file, &config, &error)) {
        LogLine(error);
        return 1;
    }

    // Signals are taken with sigwait: block them before any thread starts.
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGINT);
    sigaddset(&signals, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);

    tarvo::Runtime runtime(config);
    runtime.SetSimulationPaused(options.paused);
    if (!runtime.Start(&error)) {
        LogLine(error);
        return 1;
    }
    LocalSocketOptions socket;
    socket.folder = options.socketDir;
    socket.log = LogLine;
    CComPtr<IDispatch> control = runtime.ControlObject();
    DWORD applicationServer = 0, controlServer = 0;
    if (FAILED(RegisterLocalServer(runtime.Application().Get(), CLSID_TarvoApplication, socket, &applicationServer,
                                   &error)) ||
        FAILED(RegisterLocalServer(control.Get(), CLSID_TarvoControl, socket, &controlServer, &error))) {
        LogLine(error);
        if (applicationServer) RevokeLocalServer(applicationServer);
        runtime.Stop();
        return 1;
    }
    size_t variables = 0;
    for (const auto& project : config.projects) variables += project.variables.size();
    LogLine(std::to_string(config.projects.size()) + " projects, " + std::to_string(variables) + " variables, tick " +
            std::to_string(config.tickMs) + " ms");
    LogLine("ready, sockets in " + LocalSocketFolder(socket) + "; stop with Ctrl+C");

    std::vector<Watch> watches = options.watch ? WatchAll() : std::vector<Watch>{};
    const timespec period{5, 0};
    int signal = -1;
    while (signal < 0) {
        signal = sigtimedwait(&signals, nullptr, &period);
        for (Watch& watch : watches) {
            std::printf("%s: %llu changes\n", Utf16ToUtf8(watch.project).c_str(), watch.sink->changes.exchange(0));
        }
        std::fflush(stdout);
    }
    // Clients see the connection go first, then the runtime stops.
    RevokeLocalServer(controlServer);
    RevokeLocalServer(applicationServer);
    control.Release();
    Unwatch(watches);
    runtime.Stop();
    LogLine(std::string("stopped (") + (signal == SIGINT ? "SIGINT" : "SIGTERM") + ")");
    return 0;
}
