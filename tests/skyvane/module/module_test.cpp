// The module driven through its four exports, as a host drives it: a
// recording host window, a settings file, the runtime stand-in in process
// and azure-local on loopback.
#include "ModuleHost.h"
#include "ManualTicks.h"

#include "AzureLocalProcess.h"

#include "automation/comvariant.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <map>
#include <set>
#include <thread>

namespace {

using azurelocal::AzureLocalProcess;
using azurelocal::ReceivedRow;

constexpr UINT kRowsFailed = WM_USER + 1, kStatus = WM_USER + 2, kRestartFailed = WM_USER + 102,
               kInitBegin = WM_USER + 103;

class ModuleTest : public ::testing::Test {
protected:
    void SetUp() override {
        std::string error;
        receiver = AzureLocalProcess::Start({}, error);
        ASSERT_TRUE(receiver) << error;
        ASSERT_TRUE(module.Loaded());
    }

    void TearDown() override {
        module.DllExit();
        if (runtime) runtime->Stop();
    }

    std::string SettingsPath() const { return folder.Path("skyvane.ini"); }

    void StartRuntime(std::vector<tarvo::ProjectConfig> projects) {
        tarvo::RuntimeConfig config;
        config.projects = std::move(projects);
        tarvo::RuntimeOptions options;
        options.simulate = false;  // values change only when a test sets them
        runtime = std::make_unique<tarvo::Runtime>(config, options);
        std::string error;
        ASSERT_TRUE(runtime->Start(&error)) << error;
    }

    // The common set-up: a runtime with Plant#Level, exported to the JSON target "values".
    void StartPlantLevel() {
        StartRuntime({Project(u"Plant", {u"Level"})});
        WriteSettingsFile(SettingsPath(), {{"Plant#Level"}, {Target("values", 1)}});
    }

    TargetSettings Target(const std::string& queue, int format, bool eventHub = false) const {
        return {receiver->ConnectionString(), queue, eventHub, format};
    }

    void Set(const std::u16string& project, const std::u16string& variable, double value, ULONGLONG status = 0) {
        ASSERT_TRUE(runtime->SetValue(project, variable, CComVariant(value), status, 45000.5));
    }

    std::vector<ReceivedRow> RowsOf(const std::string& entity, const std::string& variable = {}) {
        std::vector<ReceivedRow> rows;
        for (ReceivedRow& r : receiver->Rows()) {
            if (r.entity == entity && (variable.empty() || r.row.variable == variable)) rows.push_back(std::move(r));
        }
        return rows;
    }

    // The receiver's count first: it is cheap, and the rows are read only once enough arrived.
    bool WaitForRows(const std::string& entity, size_t count, const std::string& variable = {}) {
        return PumpUntil([&] { return receiver->Stats().rows >= count && RowsOf(entity, variable).size() >= count; });
    }

    TempFolder folder;
    CTestLog log{folder};
    std::unique_ptr<AzureLocalProcess> receiver;
    std::unique_ptr<tarvo::Runtime> runtime;
    CHostedModule hosted{SettingsPath()};
    CRecordingHostWnd& host = hosted.host;
    CConfigData& context = hosted.context;
    CModuleUnderTest& module = hosted.module;
};

TEST_F(ModuleTest, ValuesReachEveryTargetInItsFormatOnlyWhenTheyChange) {
    StartRuntime({Project(u"Plant", {u"Level", u"Flow", u"Idle"})});
    WriteSettingsFile(SettingsPath(), {{"Plant#Level", "Plant#Flow", "Plant#Idle"},
                                       {Target("values", 1), Target("hub", 2, true), Target("xml", 0)}});
    ASSERT_EQ(module.Init(&context), 1);
    const auto messages = host.Messages();
    ASSERT_GE(messages.size(), 2u);
    EXPECT_EQ(messages[0].message, kInitBegin);
    EXPECT_EQ(messages[0].wParam, 1u);
    EXPECT_EQ(messages[1].message, kStatus);
    EXPECT_EQ(messages[1].wParam, 0u);

    // The first cycle is a full send, but nothing has a value yet.
    ASSERT_TRUE(PumpUntil([&] { return host.Count(kStatus) >= 2; }));
    EXPECT_TRUE(receiver->Rows().empty());

    Set(u"Plant", u"Level", 12.5);
    for (const char* entity : {"values", "hub", "xml"}) ASSERT_TRUE(WaitForRows(entity, 1)) << entity;
    for (const auto& [entity, format] :
         std::map<std::string, std::string>{{"values", "JSON"}, {"hub", "BOND"}, {"xml", "XML"}}) {
        const auto rows = RowsOf(entity);
        ASSERT_EQ(rows.size(), 1u) << entity;
        EXPECT_EQ(rows[0].format, format);
        EXPECT_EQ(rows[0].row.project, "Plant");
        EXPECT_EQ(rows[0].row.variable, "Level");
        EXPECT_DOUBLE_EQ(rows[0].row.value, 12.5);
    }

    // The same value and status again is no change; a status of its own is.
    // Flow's row marks the point by which the repeat would have arrived.
    Set(u"Plant", u"Level", 12.5);
    Set(u"Plant", u"Flow", 3.0);
    ASSERT_TRUE(WaitForRows("values", 1, "Flow"));
    EXPECT_EQ(RowsOf("values", "Level").size(), 1u);
    Set(u"Plant", u"Level", 12.5, 0x80000000ull << 32 | 7);
    ASSERT_TRUE(WaitForRows("values", 2, "Level"));
    EXPECT_EQ(RowsOf("values", "Level").back().row.status, 0x80000000ull << 32 | 7);
    EXPECT_TRUE(RowsOf("values", "Idle").empty());
}

TEST_F(ModuleTest, IntegrityPeriodResendsEveryValidVariable) {
    CManualTicks ticks;  // the worker's schedule follows it; nothing else here reads ticks
    StartRuntime({Project(u"Plant", {u"Level", u"Idle", u"Other"})});
    ModuleSettings settings{{"Plant#Level", "Plant#Idle", "Plant#Other"}, {Target("values", 1)}};
    settings.integrityPeriod = 1;
    WriteSettingsFile(SettingsPath(), settings);
    ASSERT_EQ(module.Init(&context), 1);
    Set(u"Plant", u"Level", 4.0);
    ASSERT_TRUE(WaitForRows("values", 1, "Level"));
    // A change of another variable shows a cycle ran; it sends no full set
    // until a whole period has passed since the first.
    const auto cycleWithChange = [&](double value, size_t otherRows) {
        Set(u"Plant", u"Other", value);
        return WaitForRows("values", otherRows, "Other");
    };
    ticks.Advance(999);
    ASSERT_TRUE(cycleWithChange(1.0, 1));
    EXPECT_EQ(RowsOf("values", "Level").size(), 1u);
    for (size_t sends = 1; sends <= 2; ++sends) {
        ticks.Advance(sends == 1 ? 1 : 1000);
        ASSERT_TRUE(WaitForRows("values", 1 + sends, "Level")) << sends;
        ASSERT_TRUE(cycleWithChange(1.0 + static_cast<double>(sends), 1 + 2 * sends))
            << "Other: a change and a full set";
        EXPECT_EQ(RowsOf("values", "Level").size(), 1 + sends) << "one full set a period, never one a cycle";
    }
    EXPECT_TRUE(RowsOf("values", "Idle").empty()) << "no value, no row";
}

TEST_F(ModuleTest, UnknownVariablesAreListedLastFirstUnderTheirHeading) {
    StartRuntime({Project(u"Plant", {u"Level"})});
    CMessageBoxRecorder boxes;
    for (int unknown : {1, 10, 11}) {
        ModuleSettings settings{{"Plant#Level"}, {Target("values", 1)}};
        for (int i = 0; i < unknown; ++i) settings.variables.push_back("Plant#Missing" + std::to_string(10 + i));
        WriteSettingsFile(SettingsPath(), settings);
        EXPECT_EQ(module.Init(&context), 0) << unknown;
    }
    const auto texts = boxes.Texts();
    ASSERT_EQ(texts.size(), 3u);
    EXPECT_EQ(texts[0], "Variable is unknown:\nPlant#Missing10");
    // Map order puts Missing10..Missing20 in key order; the first ten refused are shown, the last first.
    std::string tenListed;
    for (int i = 19; i >= 10; --i) tenListed += "Plant#Missing" + std::to_string(i) + (i > 10 ? ", " : "");
    EXPECT_EQ(texts[1], "The listed variables are unknown:\n" + tenListed);
    EXPECT_EQ(texts[2], "Many variables are unknown, some are listed:\n" + tenListed);
}

TEST_F(ModuleTest, ALinkThatCannotStartOrNoRuntimeShowsTheConnectionFailure) {
    CMessageBoxRecorder boxes;
    WriteSettingsFile(SettingsPath(), {{"Plant#Level"}, {Target("values", 1)}});
    EXPECT_EQ(module.Init(&context), 0);  // no runtime at all
    StartRuntime({Project(u"Plant", {u"Level"})});
    runtime->SetStartFails(true);
    EXPECT_EQ(module.Init(&context), 0);
    runtime->SetStartFails(false);
    EXPECT_EQ(module.Init(&context), 1);
    EXPECT_EQ(boxes.Texts(), std::vector<std::string>(2, "Connection to SCADA system failed!"));
}

TEST_F(ModuleTest, ProjectsSwitchedInactiveAndActiveAreSubscribedAgain) {
    StartRuntime({Project(u"Plant", {u"Level"}), Project(u"Line2", {u"Speed"})});
    CMessageBoxRecorder boxes;
    WriteSettingsFile(SettingsPath(), {{"Plant#Level", "Line2#Speed"}, {Target("values", 1)}});
    ASSERT_EQ(module.Init(&context), 1);

    ASSERT_TRUE(runtime->SetProjectActive(u"Plant", false));
    // The other project's values keep flowing while Plant is inactive.
    ASSERT_TRUE(PumpUntil([&] {
        Set(u"Line2", u"Speed", static_cast<double>(RowsOf("values", "Speed").size() + 1));
        return RowsOf("values", "Speed").size() >= 3;
    }));
    ASSERT_TRUE(runtime->SetProjectActive(u"Plant", true));
    ASSERT_TRUE(runtime->SetProjectActive(u"Plant", true));  // a second "Active" in a row
    double level = 0;
    ASSERT_TRUE(PumpUntil([&] {
        Set(u"Plant", u"Level", ++level);
        return RowsOf("values", "Level").size() >= 2;
    }));
    EXPECT_TRUE(boxes.Texts().empty());
    EXPECT_EQ(log.CountContaining("fail!"), 0);
}

TEST_F(ModuleTest, ExecActionAppliesNewSettingsAndReportsAFailedRestart) {
    StartRuntime({Project(u"Plant", {u"Level", u"Flow"})});
    EXPECT_EQ(module.ExecAction(&context), 0);  // before init
    WriteSettingsFile(SettingsPath(), {{"Plant#Level", "Plant#Flow"}, {Target("values", 1)}});
    ASSERT_EQ(module.Init(&context), 1);

    WriteSettingsFile(SettingsPath(), {{"Plant#Level"}, {Target("values", 1), Target("added", 2, true)}});
    EXPECT_EQ(module.ExecAction(&context), 1);
    Set(u"Plant", u"Flow", 9.0);
    Set(u"Plant", u"Level", 1.0);
    ASSERT_TRUE(WaitForRows("added", 1, "Level"));
    ASSERT_TRUE(WaitForRows("values", 1, "Level"));
    EXPECT_TRUE(RowsOf("values", "Flow").empty());

    CMessageBoxRecorder boxes;
    WriteSettingsFile(SettingsPath(), {{"Plant#Nowhere"}, {Target("values", 1)}});
    EXPECT_EQ(module.ExecAction(&context), 1);
    ASSERT_TRUE(PumpUntil([&] { return host.Count(kRestartFailed) == 1; }));
    EXPECT_EQ(boxes.Texts().size(), 1u);
}

TEST_F(ModuleTest, DllExitEndsTheExportAndInitWorksAgain) {
    StartPlantLevel();
    ASSERT_EQ(module.Init(&context), 1);
    EXPECT_EQ(module.DllExit(), 1);
    VX_PumpMessages(100);  // what the worker posted before it ended
    host.Clear();
    Set(u"Plant", u"Level", 5.0);
    VX_PumpMessages(300);  // ticks arrive and must do nothing
    EXPECT_TRUE(host.Messages().empty());
    EXPECT_TRUE(receiver->Rows().empty());
    EXPECT_EQ(module.ExecAction(&context), 0);

    ASSERT_EQ(module.Init(&context), 1);
    Set(u"Plant", u"Level", 6.0);
    ASSERT_TRUE(WaitForRows("values", 1, "Level"));
    EXPECT_DOUBLE_EQ(RowsOf("values", "Level").back().row.value, 6.0);
}

TEST_F(ModuleTest, ARetriedSendLosesNothingAndRefusedRowsAreReportedWithTheKeyMasked) {
    StartPlantLevel();
    ASSERT_EQ(module.Init(&context), 1);

    ASSERT_TRUE(receiver->Fault("kind=status&status=503&count=1&retry-after-ms=100"));
    Set(u"Plant", u"Level", 1.0);
    ASSERT_TRUE(WaitForRows("values", 1, "Level"));

    ASSERT_TRUE(receiver->Fault("kind=status&status=400&count=1"));
    Set(u"Plant", u"Level", 2.0);
    ASSERT_TRUE(PumpUntil([&] { return host.Count(kRowsFailed) == 1; }));
    module.DllExit();  // flushes the log
    const std::string masked = "SharedAccessKey=***";
    EXPECT_EQ(log.CountContaining("Adding of 1 Online Rows failed for 'Endpoint=sb://127.0.0.1:"), 1);
    EXPECT_GE(log.CountContaining(masked), 2);  // the failure and at least one success
    EXPECT_EQ(log.CountContaining(AzureLocalProcess::kKey), 0);
}

TEST_F(ModuleTest, EveryTargetGetsTheSameRowsAndTheStatusCountsThemAll) {
    StartRuntime({Project(u"Plant", {u"A", u"B", u"C", u"D"})});
    WriteSettingsFile(SettingsPath(),
                      {{"Plant#A", "Plant#B", "Plant#C", "Plant#D"}, {Target("first", 1), Target("second", 0)}});
    ASSERT_EQ(module.Init(&context), 1);
    // The first send waits a second for its retry; the next three changes
    // queue meanwhile and go out together.
    ASSERT_TRUE(receiver->Fault("kind=status&status=503&count=1&retry-after=1"));
    Set(u"Plant", u"D", 1.0);
    ASSERT_TRUE(PumpUntil([&] { return receiver->Stats().requests >= 1; }));
    Set(u"Plant", u"A", 1.0);
    Set(u"Plant", u"B", 1.0);
    Set(u"Plant", u"C", 1.0);
    ASSERT_TRUE(WaitForRows("second", 4));
    EXPECT_EQ(RowsOf("first").size(), 4u);
    // The cycle's status is posted after its last send.
    EXPECT_TRUE(PumpUntil([&] {
        const auto messages = host.Messages();
        return std::any_of(messages.begin(), messages.end(),
                           [](const auto& m) { return m.message == kStatus && m.wParam == 6; });
    }));
}

TEST_F(ModuleTest, ExportsCalledOnAnotherThreadRunOnTheWindowsThread) {
    StartPlantLevel();
    std::atomic<int> result{-1};
    std::thread caller([&] { result = module.Init(&context); });
    ASSERT_TRUE(PumpUntil([&] { return result.load() != -1; }));  // the window's thread carries it out
    caller.join();
    EXPECT_EQ(result.load(), 1);
    Set(u"Plant", u"Level", 3.0);
    ASSERT_TRUE(WaitForRows("values", 1, "Level"));
    result = -1;
    std::thread stopper([&] { result = module.DllExit(); });
    ASSERT_TRUE(PumpUntil([&] { return result.load() != -1; }));
    stopper.join();
    EXPECT_EQ(result.load(), 1);
}

TEST_F(ModuleTest, ACheckRequestedWhileAMessageBoxIsOpenRunsWhenItCloses) {
    StartPlantLevel();
    runtime->SetRaiseError(tarvo::ObjectKind::Variables, tarvo::dispid::CollectionItem);  // the lookup fails
    CMessageBoxRecorder boxes;
    // While the box is open the runtime recovers and the project becomes
    // active again: its check is asked for inside the box's loop.
    boxes.onShow = [&] {
        if (boxes.Texts().size() > 1) return;
        runtime->ClearFaults();
        runtime->SetProjectActive(u"Plant", true);
        VX_PumpMessages(300);
    };
    EXPECT_EQ(module.Init(&context), 0);
    // The check asked for in the box runs after it: Level is subscribed again.
    ASSERT_TRUE(PumpUntil([&] {
        const auto containers = runtime->Containers(u"Plant");
        return containers.size() == 1 && containers[0].started && containers[0].variables.size() == 1;
    }));
    Set(u"Plant", u"Level", 8.0);
    ASSERT_TRUE(WaitForRows("values", 1, "Level"));
    EXPECT_EQ(boxes.Texts(), std::vector<std::string>{"Variable is unknown:\nPlant#Level"});
}

TEST_F(ModuleTest, KonfigWithoutADesktopSaysSoAndChangesNothing) {
    StartPlantLevel();
    const std::string before = TempFolder::Read(SettingsPath());
    CMessageBoxRecorder boxes;
    EXPECT_EQ(module.Konfig(&context), 0);  // before init: nothing to configure
    EXPECT_TRUE(boxes.Texts().empty());
    ASSERT_EQ(module.Init(&context), 1);
    EXPECT_EQ(module.Konfig(&context), 0);
    EXPECT_EQ(boxes.Texts(),
              std::vector<std::string>{"The settings dialog needs a desktop session; the settings were not changed."});
    EXPECT_EQ(TempFolder::Read(SettingsPath()), before);
    Set(u"Plant", u"Level", 2.0);
    ASSERT_TRUE(WaitForRows("values", 1, "Level"));
}

}  // namespace
