// skyvane-gateway as a process, driving a stand-in of the module that records
// its calls and posts cycles as the module does.
#include "GatewayProcess.h"
#include "temp_folder.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <map>
#include <sstream>
#include <string>

namespace {

std::string FakeIni(const TempFolder& folder, const std::string& fake) {
    return folder.Write("settings.ini",
                        "[Azure]\nINTEGRITYPERIOD=5\n[Fake]\nCALLS=" + folder.Path("calls.log") + "\n" + fake);
}

std::vector<std::string> Calls(const TempFolder& folder) {
    std::vector<std::string> calls;
    for (const std::string& line : TempFolder::ReadLines(folder.Path("calls.log")))
        calls.push_back(line.substr(0, line.find(' ')));
    return calls;
}

// The metrics file read by the Prometheus client library: sample name to value.
std::map<std::string, double> ParseMetrics(const std::string& file, std::string& output) {
    const char* python = std::getenv("SKYVANE_PYTHON");
    const char* source = std::getenv("SKYVANE_SOURCE_DIR");
    std::map<std::string, double> samples;
    if (!python || !*python || !source) {
        output = "SKYVANE_PYTHON or SKYVANE_SOURCE_DIR is not set";
        return samples;
    }
    const ChildResult parser =
        RunChild({python, std::string(source) + "/tests/host/check_metrics.py", file}, /*withErrors=*/true);
    output = parser.output;
    if (parser.exitCode != 0) return {};
    std::istringstream lines(output);
    std::string name, type;
    double value;
    while (lines >> name >> type >> value) samples[name] = value;
    return samples;
}

TEST(GatewayProcess, BadStartsEndWithTheirExitCodeAndOneClearLine) {
    TempFolder folder;
    const std::string ini = FakeIni(folder, "");
    const std::string notAModule = folder.Write("libNotAModule.so", "not a library");
    struct Case {
        std::vector<std::string> args;
        int code;
        std::string named;
    };
    const Case cases[] = {
        {{"run", "--ini", folder.Path("missing.ini")}, 2, "missing.ini' does not exist"},
        {{"run", "--ini", folder.Path()}, 2, "is not a regular file"},
        {{"run"}, 2, "--ini"},
        {{"run", "--ini", ini, "--duration", "soon"}, 2, "soon"},
        {{"run", "--ini", ini, "--colour"}, 2, "--colour"},
        {{"run", "--ini", ini, "--simulate", folder.Path("nope.json")}, 2, "nope.json"},
        {{"run", "--ini", ini, "--module", folder.Path("libMissing.so")}, 1, "libMissing.so"},
        {{"run", "--ini", ini, "--module", notAModule}, 1, "libNotAModule.so"},
        {{"run", "--ini", ini, "--module", GatewayProcess::FakeModule("incomplete")}, 1, "lacks the export 'dll_exit'"},
        {{"run", "--ini", ini, "--module", GatewayProcess::FakeModule(), "--metrics-file",
          folder.Path("no/such/folder/m.prom")},
         2,
         "m.prom"},
    };
    for (const Case& c : cases) {
        GatewayProcess gateway(c.args);
        std::string line;
        for (const std::string& arg : c.args) line += arg + " ";
        EXPECT_EQ(gateway.WaitForExit(), c.code) << line;
        const std::string errors = gateway.Errors();
        EXPECT_NE(errors.find(c.named), std::string::npos) << line << "-> " << errors;
        EXPECT_EQ(std::count(errors.begin(), errors.end(), '\n'), 1) << line << "-> " << errors;
    }
    EXPECT_FALSE(std::filesystem::exists(folder.Path("calls.log"))) << "no start reached the module";
}

TEST(GatewayProcess, CountsTheModulesCyclesIntoStatusLinesAndMetricsAndStopsOnSigterm) {
    TempFolder folder;
    const std::string ini = FakeIni(folder, "ROWS=5\nCYCLE_MS=10\nFAIL_EVERY=4\n");
    const std::string metrics = folder.Path("gateway.prom");
    GatewayProcess gateway({"run", "--ini", ini, "--module", GatewayProcess::FakeModule(), "--status-interval", "0.2",
                            "--metrics-file", metrics});
    ASSERT_NE(gateway.WaitForText("start attempt 1: the module runs"), "");
    ASSERT_NE(gateway.WaitForLine([](const std::string& line) {
        return line.find("status: ") != std::string::npos && line.find(" 0 cycles") == std::string::npos;
    }),
              "");
    gateway.Signal(SIGTERM);
    EXPECT_EQ(gateway.WaitForExit(), 0);
    EXPECT_NE(gateway.WaitForText("stopping: SIGTERM"), "");

    // Every cycle the module posted is in the lines, the closing 1026 of init is not.
    const Sums sums = SumStatusLines(gateway.Lines());
    EXPECT_GT(sums.cycles, 0u);
    EXPECT_EQ(sums.rows, 5 * sums.cycles);
    EXPECT_EQ(sums.failed, sums.cycles / 4);

    std::string output;
    const auto samples = ParseMetrics(metrics, output);
    ASSERT_FALSE(samples.empty()) << output;
    EXPECT_EQ(samples.at("skyvane_gateway_rows_sent_total"), static_cast<double>(sums.rows));
    EXPECT_EQ(samples.at("skyvane_gateway_cycles_total"), static_cast<double>(sums.cycles));
    EXPECT_EQ(samples.at("skyvane_gateway_failed_cycles_total"), static_cast<double>(sums.failed));
    EXPECT_EQ(samples.at("skyvane_gateway_start_attempts_total"), 1.0);
    EXPECT_EQ(samples.at("skyvane_gateway_module_running"), 0.0);

    // Every export ran on the thread that loaded the module, with the gateway's window and an absolute path.
    const auto lines = TempFolder::ReadLines(folder.Path("calls.log"));
    ASSERT_EQ(Calls(folder), (std::vector<std::string>{"init", "dll_exit"}));
    EXPECT_NE(lines[0].find("window=1 ini=" + ini + " result=1"), std::string::npos) << lines[0];
    for (const std::string& line : lines) EXPECT_NE(line.find("loader_thread=1"), std::string::npos) << line;
}

TEST(GatewayProcess, RetriesInitWithGrowingPausesWhileNoRuntimeIsThere) {
    TempFolder folder;
    const std::string ini = FakeIni(folder, "INIT=0,0,1\n");
    // A relative path, from the folder the gateway runs in: the module gets it absolute.
    GatewayProcess gateway({"run", "--ini", "settings.ini", "--module", GatewayProcess::FakeModule()},
                           QProcessEnvironment::systemEnvironment(), folder.Path());
    EXPECT_NE(gateway.WaitForText("start attempt 1 failed: no SCADA runtime is reachable; next attempt in 1 s"), "");
    EXPECT_NE(gateway.WaitForText("start attempt 2 failed: no SCADA runtime is reachable; next attempt in 2 s"), "");
    EXPECT_NE(gateway.WaitForText("start attempt 3: the module runs"), "");
    gateway.Signal(SIGINT);
    EXPECT_EQ(gateway.WaitForExit(), 0);
    size_t said = 0;
    for (const std::string& line : gateway.Lines())
        said += line.find("no SCADA runtime is reachable yet") != std::string::npos;
    EXPECT_EQ(said, 1u) << "said once";
    // A failed init is followed by dll_exit before the next one.
    EXPECT_EQ(Calls(folder), (std::vector<std::string>{"init", "dll_exit", "init", "dll_exit", "init", "dll_exit"}));
    const auto lines = TempFolder::ReadLines(folder.Path("calls.log"));
    ASSERT_EQ(lines.size(), 6u);
    EXPECT_NE(lines[4].find("ini=" + ini + " result=1"), std::string::npos) << lines[4];
}

TEST(GatewayProcess, OtherStartFailuresAreToldApartFromAMissingRuntime) {
    TempFolder folder;
    const std::string ini = FakeIni(folder, "INIT=0,1\n");
    const std::string project = std::string(std::getenv("SKYVANE_SOURCE_DIR")) + "/tarvo/examples/plant.json";
    GatewayProcess gateway({"run", "--ini", ini, "--module", GatewayProcess::FakeModule(), "--simulate", project});
    EXPECT_NE(gateway.WaitForText("start attempt 1 failed: the module could not start"), "");
    EXPECT_NE(gateway.WaitForText("start attempt 2: the module runs"), "");
    gateway.Signal(SIGTERM);
    EXPECT_EQ(gateway.WaitForExit(), 0);
    for (const std::string& line : gateway.Lines()) EXPECT_EQ(line.find("no SCADA runtime"), std::string::npos) << line;
}

TEST(GatewayProcess, SighupRestartsReportsAFailedRestartAndKeepsSettingsItCannotRead) {
    TempFolder folder;
    const std::string ini = FakeIni(folder, "RESTART=1\n");
    GatewayProcess gateway({"run", "--ini", ini, "--module", GatewayProcess::FakeModule()});
    ASSERT_NE(gateway.WaitForText("start attempt 1: the module runs"), "");

    gateway.Signal(SIGHUP);
    EXPECT_NE(gateway.WaitForText("reload: the module runs with the new settings"), "");

    FakeIni(folder, "RESTART=0\n");
    gateway.Signal(SIGHUP);
    EXPECT_NE(gateway.WaitForText("could not restart the export (message 1126)"), "");
    EXPECT_NE(gateway.WaitForText(
                  "reload failed: the export did not restart with the new settings; next attempt in 1 s"),
              "");
    EXPECT_NE(gateway.WaitForText("start attempt 2: the module runs"), "");

    std::filesystem::rename(ini, folder.Path("moved.ini"));
    gateway.Signal(SIGHUP);
    EXPECT_NE(gateway.WaitForText("reload refused: settings file '" + ini +
                                  "' does not exist; the running settings stay"),
              "");
    std::filesystem::rename(folder.Path("moved.ini"), ini);

    gateway.Signal(SIGTERM);
    EXPECT_EQ(gateway.WaitForExit(), 0);
    EXPECT_EQ(Calls(folder),
              (std::vector<std::string>{"init", "exec_action", "exec_action", "dll_exit", "init", "dll_exit"}));
}

TEST(GatewayProcess, ConfigureStartsTheModuleRunsKonfigAndStopsIt) {
    TempFolder folder;
    const std::string ini = FakeIni(folder, "");
    QProcessEnvironment offscreen = QProcessEnvironment::systemEnvironment();
    offscreen.insert("QT_QPA_PLATFORM", "offscreen");
    GatewayProcess gateway({"configure", "--ini", ini, "--module", GatewayProcess::FakeModule()}, offscreen);
    EXPECT_EQ(gateway.WaitForExit(), 0) << gateway.Errors();
    EXPECT_EQ(Calls(folder), (std::vector<std::string>{"init", "konfig", "dll_exit"}));

    QProcessEnvironment headless = QProcessEnvironment::systemEnvironment();
    for (const char* name : {"DISPLAY", "WAYLAND_DISPLAY", "QT_QPA_PLATFORM"}) headless.remove(name);
    GatewayProcess noDisplay({"configure", "--ini", ini, "--module", GatewayProcess::FakeModule()}, headless);
    EXPECT_EQ(noDisplay.WaitForExit(), 2);
    EXPECT_NE(noDisplay.Errors().find("needs a display"), std::string::npos);
}

}  // namespace
