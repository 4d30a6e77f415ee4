// konfig through the module's export, as a host with a desktop runs it: the
// settings dialog is driven by its controls' ids inside the export's call.
#include "UiTestSupport.h"

#include "AzureLocalProcess.h"
#include "ModuleHost.h"
#include "frame/ConfigFile.h"
#include "res/resource.h"

#include <QLineEdit>

#include <gtest/gtest.h>

#include <filesystem>

namespace {

using azurelocal::AzureLocalProcess;

class KonfigTest : public ::testing::Test {
protected:
    void SetUp() override {
        std::string error;
        receiver = AzureLocalProcess::Start({}, error);
        ASSERT_TRUE(receiver) << error;
        ASSERT_TRUE(hosted.module.Loaded());
        tarvo::RuntimeConfig config;
        config.projects = {Project(u"Plant", {u"Level", u"Flow"})};
        tarvo::RuntimeOptions options;
        options.simulate = false;
        runtime = std::make_unique<tarvo::Runtime>(config, options);
        ASSERT_TRUE(runtime->Start(&error)) << error;
    }
    void TearDown() override {
        hosted.module.DllExit();
        if (runtime) runtime->Stop();
    }

    TargetSettings Target(const std::string& queue) const { return {receiver->ConnectionString(), queue, false, 1}; }

    size_t RowsOf(const std::string& entity, const std::string& variable) {
        size_t count = 0;
        for (const auto& r : receiver->Rows()) count += r.entity == entity && r.row.variable == variable;
        return count;
    }
    // Sets the variable until one more of its rows reached the target.
    bool ValueReaches(const std::string& entity, const std::u16string& variable) {
        const size_t before = RowsOf(entity, CString(variable).ToUtf8());
        double value = 100;
        return PumpUntil([&] {
            runtime->SetValue(u"Plant", variable, CComVariant(++value), 0, 45000.5);
            return RowsOf(entity, CString(variable).ToUtf8()) > before;
        });
    }

    // Adds Flow to the exported variables and a target "added" in the open settings dialog.
    void AddFlowAndTarget(QDialog& settings) {
        SelectRows(Control<QTreeWidget>(settings, IDC_LIST_PROJECTS), {"Plant"});
        SelectRows(Control<QTreeWidget>(settings, IDC_LIST_VARIABLES), {"Flow"});
        Click(settings, IDC_ADD_VARIABLES);
        const QString connection = QString::fromStdString(receiver->ConnectionString());
        driver.OnNextDialog("2000", [connection](QDialog& target) {
            Control<QLineEdit>(target, IDC_CONNECTION_TEXT)->setText(connection);
            Control<QLineEdit>(target, IDC_CONNECTION_QUEUE)->setText("added");
            Click(target, IDC_OK);
        });
        Click(settings, IDC_NEW_CONNECTION);
    }

    TempFolder folder;
    CTestLog log{folder};
    std::string settingsPath = folder.Path("skyvane.ini");
    std::unique_ptr<AzureLocalProcess> receiver;
    std::unique_ptr<tarvo::Runtime> runtime;
    CModalDriver driver;
    CHostedModule hosted{settingsPath};
};

TEST_F(KonfigTest, OkSavesTheSettingsAndRestartsTheExportWithThem) {
    WriteSettingsFile(settingsPath, {{"Plant#Level"}, {Target("values")}});
    ASSERT_EQ(hosted.Init(), 1);
    ASSERT_TRUE(ValueReaches("values", u"Level"));

    driver.OnNextDialog("1000", [&](QDialog& settings) {
        AddFlowAndTarget(settings);
        Control<QLineEdit>(settings, IDC_INTEGRITY_PERIOD)->setText("3600");
        Click(settings, IDC_OK);
    });
    EXPECT_EQ(hosted.module.Konfig(&hosted.context), 0);
    EXPECT_EQ(driver.DialogsShown("1000"), 1);
    EXPECT_TRUE(driver.BoxTexts().empty());

    CAzureConfig saved;
    ReadConfig(CString(settingsPath), saved);
    EXPECT_EQ(saved.m_mapVariables.GetCount(), 2);
    ASSERT_EQ(saved.m_lstConnections.GetCount(), 2);
    EXPECT_EQ(saved.m_lstConnections.GetTail()->m_strQueue.ToUtf8(), "added");
    EXPECT_EQ(saved.m_nIntegrityPeriod, 3600);
    // The export runs with the saved settings: Flow now reaches both targets.
    EXPECT_TRUE(ValueReaches("added", u"Flow"));
    EXPECT_TRUE(ValueReaches("values", u"Flow"));
}

TEST_F(KonfigTest, CancelLeavesTheFileAndTheRunningExportAlone) {
    WriteSettingsFile(settingsPath, {{"Plant#Level"}, {Target("values")}});
    const std::string before = TempFolder::Read(settingsPath);
    ASSERT_EQ(hosted.Init(), 1);

    int nested = -1;
    driver.OnNextDialog("1000", [&](QDialog& settings) {
        AddFlowAndTarget(settings);
        nested = hosted.module.Konfig(&hosted.context);  // a second konfig while this one is open
        Click(settings, IDC_CANCEL);
    });
    EXPECT_EQ(hosted.module.Konfig(&hosted.context), 0);
    EXPECT_EQ(nested, 0);
    EXPECT_EQ(driver.DialogsShown("1000"), 1);
    EXPECT_EQ(TempFolder::Read(settingsPath), before);
    EXPECT_TRUE(ValueReaches("values", u"Level"));
    EXPECT_EQ(RowsOf("values", "Flow"), 0u);
    EXPECT_EQ(hosted.host.Count(WM_USER + 102), 0);
}

TEST_F(KonfigTest, ASaveThatFailsIsReportedAndNothingRestarts) {
    WriteSettingsFile(settingsPath, {{"Plant#Level"}, {Target("values")}});
    ASSERT_EQ(hosted.Init(), 1);
    // The file cannot be replaced once its place is a folder.
    std::filesystem::remove(settingsPath);
    std::filesystem::create_directory(settingsPath);

    driver.OnNextDialog("1000", [&](QDialog& settings) {
        AddFlowAndTarget(settings);
        Click(settings, IDC_OK);
    });
    EXPECT_EQ(hosted.module.Konfig(&hosted.context), 0);
    ASSERT_EQ(driver.BoxTexts().size(), 1u);
    EXPECT_EQ(driver.BoxTexts()[0], "The settings could not be saved to " + settingsPath + ". Nothing was changed.");
    // Not restarted: the running export keeps its targets and variables.
    EXPECT_TRUE(ValueReaches("values", u"Level"));
    EXPECT_EQ(RowsOf("added", "Flow"), 0u);
    EXPECT_EQ(RowsOf("values", "Flow"), 0u);
}

}  // namespace
