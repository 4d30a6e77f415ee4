#include "platform/ticks.h"

#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

#include <atomic>

namespace {

ULONGLONG MonotonicMilliseconds() {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<ULONGLONG>(ts.tv_sec) * 1000u + static_cast<ULONGLONG>(ts.tv_nsec) / 1000000u;
}

void RealSleep(DWORD milliseconds) {
    timespec ts{static_cast<time_t>(milliseconds / 1000), static_cast<long>(milliseconds % 1000) * 1000000L};
    while (nanosleep(&ts, &ts) != 0) {}
}

std::atomic<TickSource> g_tickSource{&MonotonicMilliseconds};
std::atomic<SleepHook> g_sleep{&RealSleep};

}  // namespace

void SetTickSource(TickSource source, SleepHook sleep) {
    g_sleep.store(sleep ? sleep : &RealSleep);
    g_tickSource.store(source ? source : &MonotonicMilliseconds);
}

ULONGLONG GetTickCount64() { return g_tickSource.load(std::memory_order_relaxed)(); }

DWORD GetTickCount() { return static_cast<DWORD>(GetTickCount64()); }

void Sleep(DWORD milliseconds) { g_sleep.load(std::memory_order_relaxed)(milliseconds); }

DWORD GetCurrentThreadId() { return static_cast<DWORD>(syscall(SYS_gettid)); }

DWORD GetCurrentProcessId() { return static_cast<DWORD>(getpid()); }
