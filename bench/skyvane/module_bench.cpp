// The module end to end, driven through its exports as a host drives it:
// 10,000 variables in the runtime stand-in, libSkyvane.so, libCorvell.so and
// azure-local on loopback. Prints, for rising change rates, how many changes
// arrived and how many were dropped, the highest rate with nothing dropped,
// and the module's CPU use while 10,000 configured variables stay still.
//
//   build/release/bin/skyvane_module_bench [SECONDS_PER_RATE] [IDLE_SECONDS]
#include "ModuleHost.h"

#include "AzureLocalProcess.h"

#include <QCoreApplication>

#include <sys/resource.h>

#include <atomic>
#include <cstdio>
#include <thread>

namespace {

using Clock = std::chrono::steady_clock;
constexpr int kVariables = 10000;

double CpuSeconds() {
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    return usage.ru_utime.tv_sec + usage.ru_stime.tv_sec + (usage.ru_utime.tv_usec + usage.ru_stime.tv_usec) / 1e6;
}

struct RateResult {
    double offered = 0;  // changes per second fired
    long fired = 0;
    long received = 0;
    double throughput = 0;  // received per second, first fire to last row
};

// Fires rounds of every variable at the offered rate for the given time,
// then waits until the rows stop coming.
RateResult RunRate(CBulkPlant& plant, azurelocal::AzureLocalProcess& receiver, double rate, double seconds,
                   double& nextValue) {
    RateResult result;
    result.offered = rate;
    const long before = static_cast<long>(receiver.Stats().rows);
    const int rounds = std::max(1, static_cast<int>(rate * seconds / kVariables));
    const auto interval = std::chrono::duration<double>(kVariables / rate);
    const auto start = Clock::now();
    std::atomic<bool> done{false};
    std::thread producer([&] {
        for (int r = 0; r < rounds; ++r) {
            plant.FireRound(++nextValue);
            std::this_thread::sleep_until(start + std::chrono::duration_cast<Clock::duration>(interval * (r + 1)));
        }
        done = true;
    });
    PumpUntil([&] { return done.load(); }, std::chrono::seconds(600));
    producer.join();
    result.fired = static_cast<long>(rounds) * kVariables;
    long seen = -1;
    auto lastChange = Clock::now(), lastRow = Clock::now();
    PumpUntil(
        [&] {
            const long now = static_cast<long>(receiver.Stats().rows) - before;
            if (now != seen) {
                seen = now;
                lastChange = lastRow = Clock::now();
            }
            return now >= result.fired || Clock::now() - lastChange > std::chrono::seconds(2);
        },
        std::chrono::seconds(120));
    result.received = seen;
    result.throughput = seen / std::chrono::duration<double>(lastRow - start).count();
    return result;
}

}  // namespace

int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    const double secondsPerRate = argc > 1 ? std::atof(argv[1]) : 4.0;
    const double idleSeconds = argc > 2 ? std::atof(argv[2]) : 20.0;
    TempFolder folder;
    CTestLog log(folder);
    std::string error;
    auto receiver = azurelocal::AzureLocalProcess::Start({}, error);
    if (!receiver) {
        std::fprintf(stderr, "azure-local: %s\n", error.c_str());
        return 1;
    }
    CBulkPlant plant(kVariables);
    ModuleSettings settings{plant.Keys(), {{receiver->ConnectionString(), "values", false, 1}}};
    WriteSettingsFile(folder.Path("skyvane.ini"), settings);
    CHostedModule hosted(folder.Path("skyvane.ini"));
    if (!plant.started || !hosted.module.Loaded() || hosted.Init() != 1) {
        std::fprintf(stderr, "the module did not start\n");
        return 1;
    }

    // Idle: everything configured and subscribed, nothing changes.
    VX_PumpMessages(1000);
    const double cpuBefore = CpuSeconds();
    const auto idleStart = Clock::now();
    VX_PumpMessages(static_cast<DWORD>(idleSeconds * 1000));
    const double idleWall = std::chrono::duration<double>(Clock::now() - idleStart).count();
    const double idleCpu = (CpuSeconds() - cpuBefore) / idleWall * 100.0;
    std::printf("idle, %d variables, %.0f s: %.2f %% of one core (whole process: host loop, module, stand-in)\n",
                kVariables, idleWall, idleCpu);

    std::printf("%12s %10s %10s %10s %14s\n", "offered/s", "fired", "received", "dropped", "received/s");
    double nextValue = 0, sustained = 0;
    for (double rate : {50000.0, 100000.0, 200000.0, 400000.0}) {
        const RateResult r = RunRate(plant, *receiver, rate, secondsPerRate, nextValue);
        std::printf("%12.0f %10ld %10ld %10ld %14.0f\n", r.offered, r.fired, r.received, r.fired - r.received,
                    r.throughput);
        std::fflush(stdout);
        if (r.received == r.fired) sustained = std::max(sustained, r.throughput);
    }
    std::printf("highest rate with every change received: %.0f changes/s (one JSON connection)\n", sustained);
    hosted.module.DllExit();
    plant.runtime->Stop();
    return 0;
}
