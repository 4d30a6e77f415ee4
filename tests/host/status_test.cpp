// Counting the module's messages into status lines and metrics.
#include "GatewayStatus.h"

#include <gtest/gtest.h>

#include <string>

namespace {

// The value of one sample line "name value" of the exposition text.
std::string Sample(const std::string& text, const std::string& name) {
    const std::string start = "\n" + name + " ";
    const size_t at = ("\n" + text).find(start);
    if (at == std::string::npos) return "(missing)";
    const size_t value = at + start.size() - 1;
    return text.substr(value, text.find('\n', value) - value);
}

TEST(GatewayStatus, IntervalLinesStartFromZeroWhileTotalsKeepCounting) {
    CGatewayStatus status;
    status.OnCycle(10, 4);
    status.OnCycle(7, 12);
    status.OnFailedCycle();
    status.OnCycle(0, 3);
    EXPECT_EQ(status.TakeIntervalLine(10),
              "status: 17 rows sent, 1 failed cycles, 3 cycles, longest cycle 12 ms (last 10 s)");
    EXPECT_EQ(status.TakeIntervalLine(0.5),
              "status: 0 rows sent, 0 failed cycles, 0 cycles, longest cycle 0 ms (last 0.5 s)");
    status.OnCycle(5, 2);

    const std::string text = status.PrometheusText();
    EXPECT_EQ(Sample(text, "skyvane_gateway_rows_sent_total"), "22");
    EXPECT_EQ(Sample(text, "skyvane_gateway_cycles_total"), "4");
    EXPECT_EQ(Sample(text, "skyvane_gateway_failed_cycles_total"), "1");
    EXPECT_EQ(Sample(text, "skyvane_gateway_cycle_seconds_total"), "0.021");
    EXPECT_EQ(Sample(text, "skyvane_gateway_cycle_seconds_max"), "0.012");
    EXPECT_EQ(Sample(text, "skyvane_gateway_module_running"), "0");
    EXPECT_EQ(Sample(text, "skyvane_gateway_simulated_changes_total"), "(missing)") << "only with --simulate";
    status.SetSimulatedChanges(123456789012);
    EXPECT_EQ(Sample(status.PrometheusText(), "skyvane_gateway_simulated_changes_total"), "123456789012");
}

TEST(GatewayStatus, DurationIsTheModulesThirtyTwoBitTickDifference) {
    CGatewayStatus status;
    // A duration above 2^31 ms arrives sign-extended when the module widens a 32-bit value.
    status.OnCycle(1, static_cast<LPARAM>(static_cast<int>(3000000000u)));
    status.OnCycle(1, 65000);
    status.SetRunning(true);
    const std::string text = status.PrometheusText();
    EXPECT_EQ(Sample(text, "skyvane_gateway_cycle_seconds_max"), "3000000.000");
    EXPECT_EQ(Sample(text, "skyvane_gateway_cycle_seconds_total"), "3000065.000");
    EXPECT_EQ(Sample(text, "skyvane_gateway_module_running"), "1");
}

}  // namespace
