// The gateway's command line and the pause between start attempts.
#include "Backoff.h"
#include "GatewayOptions.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace {

using Args = std::vector<std::string>;

TEST(GatewayOptions, ReadsEveryOptionOfRunInBothSpellings) {
    GatewayOptions options;
    std::string error;
    ASSERT_TRUE(ParseGatewayOptions({"run", "--ini", "a.ini", "--simulate=plant.json", "--simulate-delay", "2.5",
                                     "--duration=20", "--status-interval", "0.5", "--metrics-file", "m.prom",
                                     "--module", "lib/libSkyvane.so"},
                                    options, error))
        << error;
    EXPECT_EQ(options.command, GatewayCommand::Run);
    EXPECT_EQ(options.iniFile, "a.ini");
    EXPECT_EQ(options.projectFile, "plant.json");
    EXPECT_DOUBLE_EQ(options.simulateDelay, 2.5);
    EXPECT_DOUBLE_EQ(options.duration, 20);
    EXPECT_DOUBLE_EQ(options.statusInterval, 0.5);
    EXPECT_EQ(options.metricsFile, "m.prom");
    EXPECT_EQ(options.modulePath, "lib/libSkyvane.so");

    ASSERT_TRUE(ParseGatewayOptions({"run", "--ini", "b.ini"}, options, error));
    EXPECT_DOUBLE_EQ(options.statusInterval, 10);  // the default, not the earlier call's value
    EXPECT_DOUBLE_EQ(options.duration, 0);
    EXPECT_TRUE(options.projectFile.empty());

    ASSERT_TRUE(ParseGatewayOptions({"configure", "--ini", "c.ini", "--simulate", "p.json"}, options, error));
    EXPECT_EQ(options.command, GatewayCommand::Configure);
    ASSERT_TRUE(ParseGatewayOptions({"--version"}, options, error));
    EXPECT_EQ(options.command, GatewayCommand::Version);
    ASSERT_TRUE(ParseGatewayOptions({"--help"}, options, error));
    EXPECT_EQ(options.command, GatewayCommand::Help);
}

TEST(GatewayOptions, RefusesBadCommandLinesNamingTheCulprit) {
    struct Case {
        Args args;
        std::string named;  // the error names this
    };
    const Case cases[] = {
        {{}, "command"},
        {{"start", "--ini", "a"}, "start"},
        {{"run"}, "--ini"},
        {{"run", "--ini"}, "--ini needs a value"},
        {{"run", "--ini="}, "--ini needs a value"},
        {{"run", "--ini", "a", "--ini", "b"}, "twice"},
        {{"run", "--ini", "a", "--verbose"}, "--verbose"},
        {{"run", "--ini", "a", "extra"}, "extra"},
        {{"run", "--ini", "a", "--duration", "0"}, "--duration"},
        {{"run", "--ini", "a", "--duration", "-3"}, "-3"},
        {{"run", "--ini", "a", "--duration", "10s"}, "10s"},
        {{"run", "--ini", "a", "--duration", "3e6"}, "3e6"},
        {{"run", "--ini", "a", "--status-interval", "nan"}, "nan"},
        {{"run", "--ini", "a", "--status-interval", "inf"}, "inf"},
        {{"run", "--ini", "a", "--simulate-delay", "2"}, "--simulate"},
        {{"configure", "--ini", "a", "--duration", "5"}, "does not apply to configure"},
        {{"configure", "--ini", "a", "--metrics-file", "m"}, "does not apply to configure"},
        {{"--help", "run"}, "--help"},
    };
    for (const Case& c : cases) {
        GatewayOptions options;
        std::string error;
        std::string line;
        for (const std::string& arg : c.args) line += arg + " ";
        EXPECT_FALSE(ParseGatewayOptions(c.args, options, error)) << line;
        EXPECT_NE(error.find(c.named), std::string::npos) << line << "-> " << error;
        EXPECT_EQ(error.find('\n'), std::string::npos) << "one line: " << error;
    }
}

TEST(Backoff, DoublesFromOneSecondUpToThirtyAndStartsAgainAfterReset) {
    CBackoff backoff;
    std::vector<int> pauses;
    for (int i = 0; i < 8; ++i) pauses.push_back(backoff.NextPauseMs());
    EXPECT_EQ(pauses, (std::vector<int>{1000, 2000, 4000, 8000, 16000, 30000, 30000, 30000}));
    backoff.Reset();
    EXPECT_EQ(backoff.NextPauseMs(), 1000);
}

}  // namespace
