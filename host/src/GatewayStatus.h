#pragma once
// What the gateway counts from the module's messages: per status interval for
// the status line, and since the start for the metrics file.
// Used on the main thread only.

#include "platform/types.h"

#include <string>

class CGatewayStatus {
public:
    // 1026 after a worker cycle: rows added successfully, the cycle's duration.
    void OnCycle(WPARAM rows, LPARAM durationMs);
    // 1025: rows failed in the cycle just reported.
    void OnFailedCycle();
    void OnStartAttempt() { ++m_nStartAttempts; }
    // 1126: the module could not restart the export.
    void OnRestartFailed() { ++m_nRestartFailures; }
    void SetRunning(bool running) { m_bRunning = running; }
    // With --simulate: the changes the runtime stand-in has fired, for the metrics.
    void SetSimulatedChanges(ULONGLONG changes) { m_nSimulatedChanges = changes, m_bSimulating = true; }

    // The status line for the interval that ends now; the next interval starts at zero.
    std::string TakeIntervalLine(double intervalSeconds);
    // The totals since the start in the Prometheus text exposition format.
    std::string PrometheusText() const;

private:
    struct Counters {
        ULONGLONG rows = 0;
        ULONGLONG cycles = 0;
        ULONGLONG failedCycles = 0;
        ULONGLONG longestMs = 0;
        ULONGLONG totalMs = 0;
    };

    Counters m_interval;
    Counters m_total;
    ULONGLONG m_nStartAttempts = 0;
    ULONGLONG m_nRestartFailures = 0;
    ULONGLONG m_nSimulatedChanges = 0;
    bool m_bRunning = false;
    bool m_bSimulating = false;
};
