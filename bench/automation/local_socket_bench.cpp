// Changes per second across the local-socket transport: a tarvo-runtime
// process with N variables in one container that all change every tick; each
// iteration asks it (through its control object) for one tick, whose
// "VariableBulkChange" reaches this process's sink before the call returns.
#include "automation/connection.h"
#include "automation/dispatch_call.h"
#include "automation/dispatch_object.h"
#include "automation/local_socket.h"
#include "tarvo/RemoteControl.h"

#include "runtime_process.h"
#include "temp_folder.h"

#include <benchmark/benchmark.h>

#include "ReadingSink.h"

#include <atomic>
#include <string>

namespace {

using namespace tarvo::dispid;

struct Setup {
    TempFolder folder;
    RuntimeProcess process;
    DWORD source = 0;
    std::unique_ptr<tarvo::RemoteControl> control;
    CComPtr<IDispatch> container;
    CComPtr<CReadingSink> sink = MakeComObject<CReadingSink>();
    CComPtr<IConnectionPoint> point;
    DWORD cookie = 0;
    bool ready = false;

    explicit Setup(int variables) {
        const std::string project = folder.Write(
            "bench.json",
            R"({"tick_ms": 100, "projects": [{"name": "Bench", "variables": [{"name": "V{n}", "repeat": )" +
                std::to_string(variables) + R"(, "generator": {"kind": "counter", "period_ms": 100}}]}]})");
        LocalSocketOptions options;
        options.folder = folder.Path("sockets");
        source = AddRunningObjectSource(CreateLocalSocketSource(options));
        if (!process.Start(project, options.folder, {"--paused"})) return;
        control = std::make_unique<tarvo::RemoteControl>(tarvo::RemoteControl::Find());
        control->SetDelivery(tarvo::Delivery::CallerThread);
        CComPtr<IUnknown> unknown;
        if (FAILED(GetActiveObject(CLSID_TarvoApplication, unknown.Receive()))) return;
        CComPtr<IDispatch> application;
        unknown.QueryInterface(IID_IDispatch, application);
        const CComVariant projects = CallMethodOrThrow(application.Get(), ApplicationProjects);
        const CComVariant bench = CallMethodOrThrow(projects.pdispVal, CollectionItem, u"Bench");
        const CComVariant containers = CallMethodOrThrow(bench.pdispVal, ProjectContainers);
        container = CallMethodOrThrow(containers.pdispVal, ContainersCreate, u"Bench").pdispVal;
        CallMethodOrThrow(container.Get(), ContainerReset);
        for (int i = 1; i <= variables; ++i) {
            const std::string name = "V" + std::to_string(i);
            CallMethodOrThrow(container.Get(), ContainerAdd, std::u16string(name.begin(), name.end()));
        }
        CComPtr<IConnectionPointContainer> points;
        container.QueryInterface(IID_IConnectionPointContainer, points);
        points->FindConnectionPoint(DIID_IOnlineVariableEvents, point.Receive());
        point->Advise(sink.Get(), &cookie);
        CallMethodOrThrow(container.Get(), ContainerStart);
        control->Tick();  // the initial values
        sink->changes = 0;
        ready = true;
    }
    ~Setup() {
        if (point) point->Unadvise(cookie);
        point.Release();
        container.Release();
        control.reset();
        process.Stop();
        RemoveRunningObjectSource(source);
    }
};

void BM_BulkChangeAcrossSocket(benchmark::State& state) {
    const auto variables = static_cast<int>(state.range(0));
    Setup setup(variables);
    if (!setup.ready) {
        state.SkipWithError("tarvo-runtime did not start");
        return;
    }
    for (auto _ : state) setup.control->Tick();
    const auto expected = static_cast<unsigned long long>(state.iterations()) *
                          static_cast<unsigned long long>(variables);
    if (setup.sink->changes != expected) state.SkipWithError("the sink did not get every change");
    state.SetItemsProcessed(static_cast<int64_t>(setup.sink->changes.load()));
    state.counters["changes/event"] = variables;
}
BENCHMARK(BM_BulkChangeAcrossSocket)->Arg(1000)->Arg(10000)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace

BENCHMARK_MAIN();
