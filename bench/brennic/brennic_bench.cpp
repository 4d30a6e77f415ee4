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

// One record of the module on the caller's thread. Argument 0: information
// off, so the level test is all that runs; 1: information on with the writer
// running, so the record is built and queued. Thread 0 sets the sink up
// before the threads start their loops and removes it after they all end.
void BM_Record(benchmark::State& state) {
    static std::unique_ptr<TempFolder> folder;
    static std::unique_ptr<CLogSink> sink;
    const bool enabled = state.range(0) != 0;
    if (state.thread_index() == 0) {
        folder = std::make_unique<TempFolder>();
        sink = MakeSink(*folder, enabled ? LOG_LEVEL_INFO : LOG_LEVEL_ERROR, "1000000");
        sink->StartLogging();
    }
    for (auto _ : state) CModuleLog::LogInfo(kText);
    if (state.thread_index() == 0) {
        state.counters["dropped"] = static_cast<double>(sink->GetDroppedCount());
        sink.reset();
        folder.reset();
    }
}
BENCHMARK(BM_Record)->ArgName("enabled")->Arg(0)->Arg(1)->ThreadRange(1, 2)->UseRealTime();

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
