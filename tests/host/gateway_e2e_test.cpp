// skyvane-gateway with the real module, the runtime stand-in started by
// --simulate and azure-local: the whole road from a simulated plant to Azure.
#include "AzureLocalProcess.h"
#include "GatewayProcess.h"
#include "runtime_process.h"
#include "temp_folder.h"

#include <QElapsedTimer>

#include <gtest/gtest.h>

#include <cstdlib>
#include <set>
#include <string>

namespace {

struct Target {
    std::string entity;
    bool eventHub;
    int format;  // 0 XML, 1 JSON, 2 BOND
};

const char* const kVariables[] = {"Plant#Tank1.Level", "Plant#Pump1.Speed", "Plant#Pump1.State",
                                  "Utilities#Water.Flow"};

// The line of a start attempt, the first or a later one, that got the module running.
bool ModuleRuns(const std::string& line) {
    return line.find("start attempt") != std::string::npos && line.find("the module runs") != std::string::npos;
}

class GatewayEndToEnd : public ::testing::Test {
protected:
    void SetUp() override {
        std::string error;
        m_server = azurelocal::AzureLocalProcess::Start({}, error);
        ASSERT_TRUE(m_server) << error;
        // The module's log goes to a file of the test's own, not to standard error.
        m_logFile = m_folder.Path("gateway.log");
        m_environment = QProcessEnvironment::systemEnvironment();
        m_environment.insert("BRENNIC_CONFIG",
                             QString::fromStdString(m_folder.Write("brennic.ini", "[file]\npath = " + m_logFile +
                                                                                      "\n[stderr]\nenabled = no\n")));
    }

    std::string WriteSettings(const std::vector<Target>& targets, const std::string& extraVariable = {}) {
        std::vector<std::string> variables(std::begin(kVariables), std::end(kVariables));
        if (!extraVariable.empty()) variables.push_back(extraVariable);
        std::string text = "[Azure]\nINTEGRITYPERIOD=5\n[VARIABLES]\nCOUNT=" + std::to_string(variables.size()) + "\n";
        for (size_t i = 0; i < variables.size(); ++i) text += "NAME_" + std::to_string(i) + "=" + variables[i] + "\n";
        text += "[CONNECTIONS]\nCOUNT=" + std::to_string(targets.size()) + "\n";
        for (size_t i = 0; i < targets.size(); ++i) {
            const std::string n = std::to_string(i);
            text += "CONN_" + n + "=" + m_server->ConnectionString() + "\nQUEUE_" + n + "=" + targets[i].entity +
                    "\nMODE_" + n + "=" + (targets[i].eventHub ? "1" : "0") + "\nFORMAT_" + n + "=" +
                    std::to_string(targets[i].format) + "\n";
        }
        return m_folder.Write("settings.ini", text);
    }

    std::unique_ptr<GatewayProcess> StartGateway(const std::string& ini, std::vector<std::string> extra = {}) {
        std::vector<std::string> args = {"run", "--ini", ini, "--simulate", Project(), "--status-interval", "0.5"};
        args.insert(args.end(), extra.begin(), extra.end());
        return std::make_unique<GatewayProcess>(args, m_environment);
    }

    static std::string Project() {
        return std::string(std::getenv("SKYVANE_SOURCE_DIR")) + "/tarvo/examples/plant.json";
    }

    // Rows received per entity, and the formats each entity received.
    std::map<std::string, size_t> RowsPerEntity(std::map<std::string, std::set<std::string>>* formats = nullptr) {
        std::map<std::string, size_t> rows;
        for (const auto& received : m_server->Rows()) {
            ++rows[received.entity];
            if (formats) (*formats)[received.entity].insert(received.format);
        }
        return rows;
    }

    // Stops the gateway with the signal; the time it took, or -1 when it did not end with 0.
    qint64 StopWith(GatewayProcess& gateway, int signal) {
        QElapsedTimer clock;
        clock.start();
        gateway.Signal(signal);
        if (gateway.WaitForExit(10000) != 0) return -1;
        return clock.elapsed();
    }

    // Stopped by the signal while values flow, the gateway ends with 0 within 2 s, its log written out.
    void ExpectQuickCleanStop(GatewayProcess& gateway, int signal) {
        const qint64 stopMs = StopWith(gateway, signal);
        EXPECT_GE(stopMs, 0);
        EXPECT_LT(stopMs, 2000) << "a stop during steady sending ends the gateway within 2 s";
        const auto lines = TempFolder::ReadLines(m_logFile);
        const std::string last = lines.empty() ? std::string() : lines.back();
        EXPECT_NE(last.find("Log stopped"), std::string::npos) << "the log is written out: " << last;
    }

    TempFolder m_folder;
    std::unique_ptr<azurelocal::AzureLocalProcess> m_server;
    std::string m_logFile;
    QProcessEnvironment m_environment;
};

TEST_F(GatewayEndToEnd, RowsReachBothTargetsInTheirFormatsAndTheStatusLinesCountThem) {
    const std::string ini = WriteSettings({{"values", false, 1}, {"plant-hub", true, 2}});
    auto gateway = StartGateway(ini);
    ASSERT_NE(gateway->WaitForText("start attempt 1: the module runs"), "") << gateway->Errors();
    ASSERT_NE(gateway->WaitForLine(IsStatusWithRows), "");

    ExpectQuickCleanStop(*gateway, SIGTERM);

    std::map<std::string, std::set<std::string>> formats;
    auto rows = RowsPerEntity(&formats);
    EXPECT_GT(rows["values"], 0u);
    EXPECT_GT(rows["plant-hub"], 0u);
    EXPECT_EQ(formats["values"], (std::set<std::string>{"JSON"}));
    EXPECT_EQ(formats["plant-hub"], (std::set<std::string>{"BOND"}));
    // Every row the module reported as sent arrived, and nothing else.
    size_t received = 0;
    for (const auto& [entity, count] : rows) received += count;
    EXPECT_EQ(SumStatusLines(gateway->Lines()).rows, received);
    EXPECT_EQ(SumStatusLines(gateway->Lines()).failed, 0u);
}

TEST_F(GatewayEndToEnd, SigintEndsItLikeSigterm) {
    auto gateway = StartGateway(WriteSettings({{"values", false, 0}}));
    ASSERT_NE(gateway->WaitForLine(IsStatusWithRows), "") << gateway->Errors();
    ExpectQuickCleanStop(*gateway, SIGINT);
    EXPECT_NE(gateway->WaitForText("stopping: SIGINT"), "");
    EXPECT_GT(RowsPerEntity()["values"], 0u);
}

TEST_F(GatewayEndToEnd, SighupBringsANewTargetAndReportsAnUnknownVariableWithoutStopping) {
    auto gateway = StartGateway(WriteSettings({{"values", false, 1}}));
    ASSERT_NE(gateway->WaitForLine(IsStatusWithRows), "") << gateway->Errors();

    WriteSettings({{"values", false, 1}, {"late-queue", false, 0}});
    gateway->Signal(SIGHUP);
    ASSERT_NE(gateway->WaitForText("reload: the module runs with the new settings"), "");
    // Rows counted after the restart went to every target, the new one included.
    ASSERT_NE(gateway->WaitForLine(IsStatusWithRows), "");
    std::map<std::string, std::set<std::string>> formats;
    EXPECT_GT(RowsPerEntity(&formats)["late-queue"], 0u);
    EXPECT_EQ(formats["late-queue"], (std::set<std::string>{"XML"}));

    WriteSettings({{"values", false, 1}, {"late-queue", false, 0}}, "Plant#NoSuchVariable");
    gateway->Signal(SIGHUP);
    EXPECT_NE(gateway->WaitForText("could not restart the export (message 1126)"), "");
    EXPECT_NE(gateway->WaitForText("start attempt 2 failed: the module could not start"), "");
    EXPECT_GE(StopWith(*gateway, SIGTERM), 0) << "still running, and stops cleanly";
    const std::string errors = gateway->Errors();
    EXPECT_NE(errors.find("Variable is unknown:"), std::string::npos) << errors;
    EXPECT_NE(errors.find("Plant#NoSuchVariable"), std::string::npos) << errors;
    EXPECT_EQ(errors.find("azure-local-key"), std::string::npos) << "no key in the output";
}

TEST_F(GatewayEndToEnd, StartedBeforeTheRuntimeItKeepsTryingAndThenSends) {
    auto gateway = StartGateway(WriteSettings({{"values", false, 1}}), {"--simulate-delay", "2"});
    EXPECT_NE(gateway->WaitForText("start attempt 1 failed: no SCADA runtime is reachable"), "") << gateway->Errors();
    EXPECT_NE(gateway->WaitForText("the runtime stand-in runs"), "");
    EXPECT_NE(gateway->WaitForLine(ModuleRuns), "");
    ASSERT_NE(gateway->WaitForLine(IsStatusWithRows), "");
    EXPECT_GE(StopWith(*gateway, SIGTERM), 0);
    EXPECT_GT(RowsPerEntity()["values"], 0u);
}

TEST_F(GatewayEndToEnd, FollowsARuntimeInAnotherProcessThatStartsLaterAndIsKilled) {
    const std::string sockets = m_folder.Path("sockets");
    m_environment.insert("SKYVANE_AUTOMATION_DIR", QString::fromStdString(sockets));
    GatewayProcess gateway({"run", "--ini", WriteSettings({{"values", false, 1}}), "--status-interval", "0.5"},
                           m_environment);
    ASSERT_NE(gateway.WaitForText("start attempt 1 failed: no SCADA runtime is reachable"), "") << gateway.Errors();
    RuntimeProcess runtime;
    ASSERT_TRUE(runtime.Start(Project(), sockets));
    EXPECT_NE(gateway.WaitForLine(ModuleRuns), "");
    ASSERT_NE(gateway.WaitForLine(IsStatusWithRows), "");

    // Killed while values flow: the gateway keeps running, says so, and
    // sends again once a new runtime is there.
    runtime.Kill(SIGKILL);
    ASSERT_NE(gateway.WaitForText("the SCADA runtime went away"), "") << gateway.Errors();
    ASSERT_TRUE(runtime.Start(Project(), sockets));
    EXPECT_NE(gateway.WaitForLine(ModuleRuns, 45000), "");
    const size_t before = RowsPerEntity()["values"];
    ASSERT_NE(gateway.WaitForLine(IsStatusWithRows), "");
    EXPECT_GE(StopWith(gateway, SIGTERM), 0);
    EXPECT_TRUE(runtime.Stop());
    EXPECT_GT(RowsPerEntity()["values"], before);
}

}  // namespace
