// Cost of the module's log records on the caller's thread, and what the
// log's writer thread sustains to a file.
#include "brennic/logsink.h"
#include "frame/ModuleLog.h"

#include "temp_folder.h"

#include <benchmark/benchmark.h>

#include <cstdio>
#include <memory>

namespace {

const CString kText = u"Adding of 12 Online Rows succeeded for 'Endpoint=sb://local' Queue 'values'";

// A sink writing to a file of its own; entry 19 as given, the log's own records off.
std::unique_ptr<CLogSink> MakeSink(const TempFolder& folder, int entry19, const char* capacity) {
    auto sink = std::make_unique<CLogSink>();
    const std::string config = "[file]\npath = " + folder.Path("bench.log") +
                               "\nmax_size = 1G\n[stderr]\nenabled = no\n[queue]\ncapacity = " + capacity +
                               "\n[levels]\n0 = 0\n19 = " + std::to_string(entry19) + "\n";
    sink->SetConfigPath(CString::FromUtf8(folder.Write("brennic.ini", config)));
    return sink;
}

void BM_RecordWithoutSink(benchmark::State& state) {
    for (auto _ : state) CModuleLog::LogInfo(kText);
}
BENCHMARK(BM_RecordWithoutSink);

// Information off: the level test is all that runs.
void BM_RecordDisabled(benchmark::State& state) {
    TempFolder folder;
    auto sink = MakeSink(folder, LOG_LEVEL_ERROR, "10000");
    sink->ReadCfg();
    for (auto _ : state) CModuleLog::LogInfo(kText);
}
BENCHMARK(BM_RecordDisabled);

// Information on, writer running: building the record and queueing it.
void BM_RecordEnabled(benchmark::State& state) {
    TempFolder folder;
    auto sink = MakeSink(folder, LOG_LEVEL_INFO, "1000000");
    sink->StartLogging();
    for (auto _ : state) CModuleLog::LogInfo(kText);
    state.counters["dropped"] = static_cast<double>(sink->GetDroppedCount());
    sink->Flush();
}
BENCHMARK(BM_RecordEnabled)->ThreadRange(1, 2)->UseRealTime();

// The writer alone: records queued before it starts, timed until all are in the file.
void BM_WriterToFile(benchmark::State& state) {
    constexpr int kRecords = 100000;
    TempFolder folder;
    for (auto _ : state) {
        state.PauseTiming();
        std::remove(folder.Path("bench.log").c_str());
        auto sink = MakeSink(folder, LOG_LEVEL_INFO, "100000");
        sink->ReadCfg();
        for (int i = 0; i < kRecords; ++i) CModuleLog::LogInfo(kText);
        state.ResumeTiming();
        sink->StartLogging();
        sink->Flush();
        state.PauseTiming();
        sink.reset();
        state.ResumeTiming();
    }
    state.SetItemsProcessed(state.iterations() * kRecords);
}
BENCHMARK(BM_WriterToFile)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace

BENCHMARK_MAIN();
