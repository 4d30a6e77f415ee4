// The settings file with many variables, and the change detection every
// value report goes through.

#include "cloud/VarItem.h"
#include "frame/ConfigFile.h"

#include "vxhelper/variant.h"

#include <benchmark/benchmark.h>

#include <cstdlib>
#include <filesystem>
#include <string>
#include <unistd.h>

namespace {

CString ScratchPath() {
    const char* dir = std::getenv("TMPDIR");
    return CString::FromUtf8(std::string(dir && *dir ? dir : "/tmp") + "/skyvane-bench-" + std::to_string(getpid()) +
                             ".ini");
}

CAzureConfig MakeConfig(int variables) {
    CAzureConfig config;
    for (int i = 0; i < variables; ++i) {
        auto* item = new CVarItem;
        item->m_strName = CString::Formatted(u"Line%d#Variable_%d", i % 10, i);
        config.m_mapVariables.SetAt(item->m_strName, item);
    }
    auto* connection = new CConnection;
    connection->m_strConnection =
        u"Endpoint=sb://ns.servicebus.windows.net/;SharedAccessKeyName=send;SharedAccessKey=abc=";
    connection->m_strQueue = u"telemetry";
    config.m_lstConnections.AddTail(connection);
    return config;
}

void BM_WriteConfig(benchmark::State& state) {
    const CString path = ScratchPath();
    const CAzureConfig config = MakeConfig(static_cast<int>(state.range(0)));
    for (auto _ : state) {
        state.PauseTiming();
        std::filesystem::remove(path.ToUtf8());
        state.ResumeTiming();
        benchmark::DoNotOptimize(WriteConfig(path, config));
    }
    std::filesystem::remove(path.ToUtf8());
}
BENCHMARK(BM_WriteConfig)->Arg(100)->Arg(10000)->Unit(benchmark::kMillisecond);

void BM_ReadConfig(benchmark::State& state) {
    const CString path = ScratchPath();
    WriteConfig(path, MakeConfig(static_cast<int>(state.range(0))));
    CAzureConfig config;
    for (auto _ : state) {
        ReadConfig(path, config);
        benchmark::DoNotOptimize(config.m_mapVariables.GetCount());
    }
    std::filesystem::remove(path.ToUtf8());
}
BENCHMARK(BM_ReadConfig)->Arg(100)->Arg(10000)->Unit(benchmark::kMillisecond);

// A number that changes on every report (each one stored and converted in time).
void BM_UpdateChanged(benchmark::State& state) {
    CVarItemRtData data;
    const DATE time = 45382.5;
    double value = 0;
    for (auto _ : state) {
        VX_CVariant report(value += 1.0);
        benchmark::DoNotOptimize(data.Update(&report, 0, 0, &time));
    }
}
BENCHMARK(BM_UpdateChanged);

// A repeated value: the report is compared and dropped.
void BM_UpdateUnchanged(benchmark::State& state) {
    CVarItemRtData data;
    const DATE time = 45382.5;
    VX_CVariant report(42.0);
    data.Update(&report, 0, 0, &time);
    for (auto _ : state) benchmark::DoNotOptimize(data.Update(&report, 0, 0, &time));
}
BENCHMARK(BM_UpdateUnchanged);

}  // namespace
