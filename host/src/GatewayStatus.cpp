#include "GatewayStatus.h"

#include <algorithm>
#include <cstdio>

namespace {

// One metric with its help and type lines.
void AppendMetric(std::string& text, const char* name, const char* type, const char* help, const std::string& value) {
    text += std::string("# HELP ") + name + " " + help + "\n";
    text += std::string("# TYPE ") + name + " " + type + "\n";
    text += std::string(name) + " " + value + "\n";
}

std::string Seconds(ULONGLONG milliseconds) {
    const std::string fraction = std::to_string(1000 + milliseconds % 1000);  // "1xyz": three digits with zeros
    return std::to_string(milliseconds / 1000) + "." + fraction.substr(1);
}

void AddCycle(auto& counters, ULONGLONG rows, ULONGLONG durationMs) {
    counters.rows += rows;
    ++counters.cycles;
    counters.totalMs += durationMs;
    counters.longestMs = std::max(counters.longestMs, durationMs);
}

}  // namespace

void CGatewayStatus::OnCycle(WPARAM rows, LPARAM durationMs) {
    // The module posts the duration as a 32-bit tick difference.
    const ULONGLONG duration = static_cast<DWORD>(durationMs);
    AddCycle(m_interval, rows, duration);
    AddCycle(m_total, rows, duration);
}

void CGatewayStatus::OnFailedCycle() {
    ++m_interval.failedCycles;
    ++m_total.failedCycles;
}

std::string CGatewayStatus::TakeIntervalLine(double intervalSeconds) {
    char seconds[32];
    std::snprintf(seconds, sizeof seconds, "%g", intervalSeconds);
    const std::string line = "status: " + std::to_string(m_interval.rows) + " rows sent, " +
                             std::to_string(m_interval.failedCycles) + " failed cycles, " +
                             std::to_string(m_interval.cycles) + " cycles, longest cycle " +
                             std::to_string(m_interval.longestMs) + " ms (last " + seconds + " s)";
    m_interval = Counters{};
    return line;
}

std::string CGatewayStatus::PrometheusText() const {
    std::string text;
    AppendMetric(text, "skyvane_gateway_rows_sent_total", "counter",
                 "Rows the module reported as sent successfully, summed over all targets.",
                 std::to_string(m_total.rows));
    AppendMetric(text, "skyvane_gateway_cycles_total", "counter", "Export cycles that did work.",
                 std::to_string(m_total.cycles));
    AppendMetric(text, "skyvane_gateway_failed_cycles_total", "counter", "Export cycles in which rows failed.",
                 std::to_string(m_total.failedCycles));
    AppendMetric(text, "skyvane_gateway_cycle_seconds_total", "counter", "Time spent in export cycles.",
                 Seconds(m_total.totalMs));
    AppendMetric(text, "skyvane_gateway_cycle_seconds_max", "gauge", "Longest export cycle since the gateway started.",
                 Seconds(m_total.longestMs));
    AppendMetric(text, "skyvane_gateway_start_attempts_total", "counter", "Calls of the module's init.",
                 std::to_string(m_nStartAttempts));
    AppendMetric(text, "skyvane_gateway_restart_failures_total", "counter",
                 "Restarts of the export that failed (message 1126).", std::to_string(m_nRestartFailures));
    AppendMetric(text, "skyvane_gateway_module_running", "gauge",
                 "1 while the module exports, 0 while the gateway waits to start it.", m_bRunning ? "1" : "0");
    if (m_bSimulating) {
        AppendMetric(text, "skyvane_gateway_simulated_changes_total", "counter",
                     "Variable changes the runtime stand-in of --simulate has fired.",
                     std::to_string(m_nSimulatedChanges));
    }
    return text;
}
