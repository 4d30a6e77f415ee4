// The runtime stand-in's event rate: changes per second delivered to a sink
// through "VariableBulkChange", with 10,000 variables in one container that
// all change every tick.
#include "automation/connection.h"
#include "automation/dispatch_call.h"
#include "automation/dispatch_object.h"
#include "automation/rot.h"
#include "tarvo/Control.h"

#include <benchmark/benchmark.h>

#include "ReadingSink.h"

#include <atomic>
#include <string>

namespace {

using namespace tarvo::dispid;

constexpr int kVariables = 10000;

std::u16string Name(int i) {
    const std::string name = "V" + std::to_string(i);
    return std::u16string(name.begin(), name.end());
}

tarvo::RuntimeConfig TenThousandCounters() {
    tarvo::RuntimeConfig config;
    config.tickMs = 100;
    tarvo::ProjectConfig project;
    project.name = u"Bench";
    for (int i = 0; i < kVariables; ++i) {
        tarvo::VariableConfig v;
        v.name = Name(i);
        v.generator.kind = tarvo::GeneratorKind::Counter;
        v.generator.periodMs = config.tickMs;  // every variable changes every tick
        project.variables.push_back(std::move(v));
    }
    config.projects = {project};
    return config;
}

// A started runtime with one started container of all variables and a sink on it.
struct Setup {
    tarvo::Runtime runtime{TenThousandCounters(), {tarvo::Delivery::CallerThread, false}};
    CComPtr<IDispatch> container;
    CComPtr<CReadingSink> sink = MakeComObject<CReadingSink>();
    CComPtr<IConnectionPoint> point;
    DWORD cookie = 0;

    Setup() {
        runtime.Start();
        const CComVariant projects = CallMethodOrThrow(runtime.Application().Get(), ApplicationProjects);
        const CComVariant project = CallMethodOrThrow(projects.pdispVal, CollectionItem, u"Bench");
        const CComVariant containers = CallMethodOrThrow(project.pdispVal, ProjectContainers);
        container = CallMethodOrThrow(containers.pdispVal, ContainersCreate, u"Bench").pdispVal;
        CallMethodOrThrow(container.Get(), ContainerReset);
        for (int i = 0; i < kVariables; ++i) CallMethodOrThrow(container.Get(), ContainerAdd, Name(i).c_str());
        CComPtr<IConnectionPointContainer> points;
        container.QueryInterface(IID_IConnectionPointContainer, points);
        points->FindConnectionPoint(DIID_IOnlineVariableEvents, point.Receive());
        point->Advise(sink.Get(), &cookie);
        CallMethodOrThrow(container.Get(), ContainerStart);
        runtime.Tick();  // the initial values
        sink->changes = 0;
    }
    ~Setup() {
        point->Unadvise(cookie);
        runtime.Stop();
    }
};

void Report(benchmark::State& state, const Setup& setup) {
    const auto expected = static_cast<unsigned long long>(state.iterations()) * kVariables;
    if (setup.sink->changes != expected) state.SkipWithError("the sink did not get every change");
    state.SetItemsProcessed(static_cast<int64_t>(setup.sink->changes.load()));
    state.counters["changes/event"] = kVariables;
}

// Generating, building the arrays and delivering on the calling thread.
void BM_BulkChangeOnCallerThread(benchmark::State& state) {
    Setup setup;
    for (auto _ : state) setup.runtime.Tick();
    Report(state, setup);
}
BENCHMARK(BM_BulkChangeOnCallerThread)->Unit(benchmark::kMillisecond)->UseRealTime();

// The same, delivered on the runtime's own thread (handed over, then waited for).
void BM_BulkChangeOnRuntimeThread(benchmark::State& state) {
    Setup setup;
    setup.runtime.SetDelivery(tarvo::Delivery::OwnThread);
    for (auto _ : state) {
        setup.runtime.Tick();
        setup.runtime.Flush();
    }
    Report(state, setup);
}
BENCHMARK(BM_BulkChangeOnRuntimeThread)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace

BENCHMARK_MAIN();
