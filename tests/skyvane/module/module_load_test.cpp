// The module under load and without its Azure client: every change is
// received or reported dropped, and the value queue keeps to its limit.
#include "ModuleHost.h"

#include "AzureLocalProcess.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <set>
#include <thread>

namespace {

using azurelocal::AzureLocalProcess;

// Runs the event loop until the module has posted no cycle for a second.
void PumpUntilQuiet(const CRecordingHostWnd& host) {
    int seen = -1;
    auto quietSince = std::chrono::steady_clock::now();
    PumpUntil(
        [&] {
            const int now = host.Count(WM_USER + 2);
            if (now != seen) {
                seen = now;
                quietSince = std::chrono::steady_clock::now();
            }
            return std::chrono::steady_clock::now() - quietSince > std::chrono::seconds(1);
        },
        std::chrono::seconds(120));
}

TEST(ModuleLoad, EveryChangeOfTenThousandVariablesIsReceivedOrReportedDropped) {
    TempFolder folder;
    CTestLog log(folder);
    std::string error;
    auto receiver = AzureLocalProcess::Start({}, error);
    ASSERT_TRUE(receiver) << error;
    constexpr int kVariables = 10000, kRounds = 10;
    CBulkPlant plant(kVariables);
    ASSERT_TRUE(plant.started);
    ModuleSettings settings{plant.Keys(), {{receiver->ConnectionString(), "values", false, 1}}};
    WriteSettingsFile(folder.Path("skyvane.ini"), settings);
    CHostedModule hosted(folder.Path("skyvane.ini"));
    ASSERT_TRUE(hosted.module.Loaded());
    ASSERT_EQ(hosted.Init(), 1);

    // A change of every variable each second, for ten seconds.
    const auto start = std::chrono::steady_clock::now();
    std::atomic<bool> fired{false};
    std::thread producer([&] {
        for (int round = 1; round <= kRounds; ++round) {
            plant.FireRound(round);
            std::this_thread::sleep_until(start + std::chrono::seconds(round));
        }
        fired = true;
    });
    PumpUntil([&] { return fired.load(); }, std::chrono::seconds(60));
    producer.join();
    PumpUntil([&] { return receiver->Stats().rows >= kVariables * kRounds; }, std::chrono::seconds(30));
    const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    PumpUntilQuiet(hosted.host);
    hosted.module.DllExit();

    std::set<std::pair<std::string, double>> received;
    size_t duplicates = 0;
    for (const auto& r : receiver->Rows()) duplicates += !received.insert({r.row.variable, r.row.value}).second;
    const int dropped = log.CountContaining("Value change queue full");
    EXPECT_EQ(duplicates, 0u);
    EXPECT_EQ(received.size() + static_cast<size_t>(dropped), static_cast<size_t>(kVariables * kRounds));
    std::printf("%zu rows received, %d changes reported dropped, %.0f changes/s end to end\n", received.size(), dropped,
                received.size() / seconds);
    plant.runtime->Stop();
}

TEST(ModuleLoad, WithoutTheAzureClientTheQueueHoldsItsLimitPlusOne) {
    TempFolder folder;
    CTestLog log(folder);
    // The module alone in a folder: its Azure client library is not beside it.
    const std::string copy = folder.Path("libSkyvane.so");
    std::filesystem::copy_file(azurelocal::BuildBinaryDir() + "/libSkyvane.so", copy);
    CBulkPlant plant(10);  // queue limit 40
    ASSERT_TRUE(plant.started);
    WriteSettingsFile(folder.Path("skyvane.ini"),
                      {plant.Keys(),
                       {{"Endpoint=sb://127.0.0.1:9/;SharedAccessKeyName=k;SharedAccessKey=s", "values", false, 1}}});
    {
        CHostedModule hosted(folder.Path("skyvane.ini"), copy);
        ASSERT_TRUE(hosted.module.Loaded());
        ASSERT_EQ(hosted.Init(), 1);
        // Rounds of ten changes, each taken over by a tick before the next,
        // so that only the module's own queue overflows: 41 kept, 9 dropped.
        for (int round = 1; round <= 5; ++round) {
            ASSERT_TRUE(plant.FireRound(round));
            VX_PumpMessages(200);
        }
        hosted.module.DllExit();
        EXPECT_EQ(hosted.host.Count(WM_USER + 2), 1);  // only the end of init: no cycle ever ran
    }
    EXPECT_EQ(log.CountContaining("Creating Azure Wrapper failed"), 1);
    EXPECT_EQ(log.CountContaining("Value change queue full: Value change for Plant#V"), 9);
    EXPECT_EQ(log.CountContaining("of project:"), 0);
    plant.runtime->Stop();
}

}  // namespace
