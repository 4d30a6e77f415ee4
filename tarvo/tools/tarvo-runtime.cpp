// tarvo-runtime: runs the SCADA runtime stand-in from a project file until
// SIGINT or SIGTERM. With --watch it also subscribes every variable of every
// project through the automation interface, as a client would, and prints
// how many changes arrived every five seconds.
#include "automation/connection.h"
#include "automation/dispatch_call.h"
#include "automation/dispatch_object.h"
#include "automation/rot.h"
#include "platform/text.h"
#include "tarvo/Control.h"

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

int Usage() {
    std::fprintf(stderr, "usage: tarvo-runtime PROJECT_FILE [--watch]\n");
    return 2;
}

}  // namespace

int main(int argc, char** argv) {
    if (argc < 2 || argc > 3 || (argc == 3 && std::strcmp(argv[2], "--watch") != 0)) return Usage();
    const bool watchChanges = argc == 3;

    tarvo::RuntimeConfig config;
    std::string error;
    if (!tarvo::LoadProjectFile(argv[1], &config, &error)) {
        std::fprintf(stderr, "tarvo-runtime: %s\n", error.c_str());
        return 1;
    }

    // Signals are taken with sigwait: block them before any thread starts.
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGINT);
    sigaddset(&signals, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);

    tarvo::Runtime runtime(config);
    if (!runtime.Start(&error)) {
        std::fprintf(stderr, "tarvo-runtime: %s\n", error.c_str());
        return 1;
    }
    size_t variables = 0;
    for (const auto& project : config.projects) variables += project.variables.size();
    std::printf("tarvo-runtime: %zu projects, %zu variables, tick %u ms; stop with Ctrl+C\n", config.projects.size(),
                variables, static_cast<unsigned>(config.tickMs));
    std::fflush(stdout);

    std::vector<Watch> watches = watchChanges ? WatchAll() : std::vector<Watch>{};
    const timespec period{5, 0};
    int signal = -1;
    while (signal < 0) {
        signal = sigtimedwait(&signals, nullptr, &period);
        for (Watch& watch : watches) {
            std::printf("%s: %llu changes\n", Utf16ToUtf8(watch.project).c_str(), watch.sink->changes.exchange(0));
        }
        std::fflush(stdout);
    }
    Unwatch(watches);
    runtime.Stop();
    std::printf("tarvo-runtime: stopped (%s)\n", signal == SIGINT ? "SIGINT" : "SIGTERM");
    return 0;
}
