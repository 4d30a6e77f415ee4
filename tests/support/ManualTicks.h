#pragma once
// A tick source that tests move by hand: while one lives, GetTickCount and
// GetTickCount64 read it, so schedules and deadlines run without waiting.
// It can take over Sleep too, for code that polls until a deadline: the
// test then decides whether those waits let time pass.

#include "platform/ticks.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <set>
#include <thread>

class CManualTicks {
public:
    // What Sleep does while the clock is installed.
    enum class Sleeps {
        Real,          // sleeps on the real clock; the ticks do not move
        StandStill,    // returns after a real millisecond; the ticks do not move, so no deadline passes
        MoveTheClock,  // moves the ticks by the time asked for and returns at once
    };

    explicit CManualTicks(Sleeps sleeps = Sleeps::Real, ULONGLONG start = 1000000) {
        s_now.store(start);
        s_sleeps = sleeps;
        {
            std::lock_guard<std::mutex> guard(s_lock);
            s_sleepers.clear();
            ++s_generation;
        }
        SetTickSource(&Now, sleeps == Sleeps::Real ? nullptr : &OnSleep);
    }
    ~CManualTicks() { SetTickSource(nullptr); }
    CManualTicks(const CManualTicks&) = delete;
    CManualTicks& operator=(const CManualTicks&) = delete;

    void Advance(ULONGLONG milliseconds) {
        s_now.fetch_add(milliseconds);
        Wake();
    }
    static ULONGLONG Now() { return s_now.load(); }

    // Whether the given thread has called Sleep since the clock was installed.
    bool HasSlept(DWORD threadId) const {
        std::lock_guard<std::mutex> guard(s_lock);
        return s_sleepers.count(threadId) != 0;
    }

    // Waits until `ready` holds, checking it again whenever a sleep ends or
    // the clock moves; false if it still fails after `limit` of real time.
    template <class Ready>
    bool WaitUntil(Ready ready, std::chrono::milliseconds limit = std::chrono::seconds(10)) const {
        const auto giveUp = std::chrono::steady_clock::now() + limit;
        for (;;) {
            unsigned long long seen;
            {
                std::lock_guard<std::mutex> guard(s_lock);
                seen = s_generation;
            }
            if (ready()) return true;  // checked outside the lock: it may take locks of its own
            std::unique_lock<std::mutex> lock(s_lock);
            if (!s_woken.wait_until(lock, giveUp, [&] { return s_generation != seen; })) {
                lock.unlock();
                return ready();
            }
        }
    }

private:
    static void OnSleep(DWORD milliseconds) {
        if (s_sleeps == Sleeps::MoveTheClock) {
            s_now.fetch_add(milliseconds);
            std::this_thread::yield();
        } else {
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
        {
            std::lock_guard<std::mutex> guard(s_lock);
            s_sleepers.insert(GetCurrentThreadId());
            ++s_generation;
        }
        s_woken.notify_all();
    }
    static void Wake() {
        {
            std::lock_guard<std::mutex> guard(s_lock);
            ++s_generation;
        }
        s_woken.notify_all();
    }

    static inline std::atomic<ULONGLONG> s_now{0};
    static inline std::atomic<Sleeps> s_sleeps{Sleeps::Real};
    static inline std::mutex s_lock;  // guards s_sleepers and s_generation
    static inline std::condition_variable s_woken;
    static inline std::set<DWORD> s_sleepers;
    static inline unsigned long long s_generation = 0;  // counts sleeps and moves of the clock
};
