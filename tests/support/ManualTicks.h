#pragma once
// A tick source that tests move by hand: while one lives, GetTickCount and
// GetTickCount64 read it, so schedules and deadlines run without waiting.

#include "platform/ticks.h"

#include <atomic>

class CManualTicks {
public:
    explicit CManualTicks(ULONGLONG start = 1000000) {
        s_now.store(start);
        SetTickSource(&Now);
    }
    ~CManualTicks() { SetTickSource(nullptr); }
    CManualTicks(const CManualTicks&) = delete;
    CManualTicks& operator=(const CManualTicks&) = delete;

    void Advance(ULONGLONG milliseconds) { s_now.fetch_add(milliseconds); }

private:
    static ULONGLONG Now() { return s_now.load(); }
    static inline std::atomic<ULONGLONG> s_now{0};
};
