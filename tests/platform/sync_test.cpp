#include "platform/sync.h"
#include "platform/ticks.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

namespace {

// What f returns when run on a thread of its own.
template <typename F>
auto OnAnotherThread(F f) {
    decltype(f()) result{};
    std::thread([&] { result = f(); }).join();
    return result;
}

}  // namespace

TEST(CMutexTest, RecursiveOnOneThreadExclusiveAcrossThreads) {
    CMutex mutex;
    ASSERT_TRUE(mutex.Lock(0));
    ASSERT_TRUE(mutex.Lock(0));  // recursion on the owning thread

    bool gotImmediately = true, gotWithTimeout = true;
    ULONGLONG waited = 0;
    std::thread other([&] {
        gotImmediately = mutex.Lock(0);
        const ULONGLONG start = GetTickCount64();
        gotWithTimeout = mutex.Lock(60);
        waited = GetTickCount64() - start;
    });
    other.join();
    EXPECT_FALSE(gotImmediately);
    EXPECT_FALSE(gotWithTimeout);
    EXPECT_GE(waited, 50u);

    const auto lockElsewhere = [&] {
        return OnAnotherThread([&] {
            const bool got = mutex.Lock(0);
            if (got) mutex.Unlock();
            return got;
        });
    };
    mutex.Unlock();
    EXPECT_FALSE(lockElsewhere()) << "still held once";
    mutex.Unlock();
    EXPECT_TRUE(lockElsewhere());
}

TEST(CMutexTest, WaitingLockSucceedsWhenReleasedInTime) {
    CMutex mutex;
    std::atomic<bool> held{false};
    std::thread owner([&] {
        CSingleLock lock(&mutex, true);
        held = true;
        Sleep(30);
    });
    while (!held) std::this_thread::yield();
    CSingleLock lock(&mutex);
    EXPECT_TRUE(lock.Lock(5000));
    EXPECT_TRUE(lock.IsLocked());
    owner.join();
}

TEST(CSingleLockTest, UnlocksOnDestructionAndOnlyOnce) {
    CCriticalSection cs;
    {
        CSingleLock lock(&cs, true);
        EXPECT_TRUE(lock.IsLocked());
        EXPECT_TRUE(lock.Unlock());
        EXPECT_FALSE(lock.Unlock());
        EXPECT_TRUE(lock.Lock());
    }
    EXPECT_TRUE(OnAnotherThread([&] { return CSingleLock(&cs, true).IsLocked(); }));
}

TEST(Ticks, MonotonicAndConsistent) {
    const ULONGLONG a = GetTickCount64();
    Sleep(20);
    const ULONGLONG b = GetTickCount64();
    EXPECT_GE(b - a, 20u);
    EXPECT_EQ(static_cast<DWORD>(GetTickCount64() - GetTickCount()) / 1000, 0u);
    EXPECT_NE(GetCurrentThreadId(), 0u);
    EXPECT_NE(OnAnotherThread([] { return GetCurrentThreadId(); }), GetCurrentThreadId());
}

TEST(CMutexTest, UnlockByAnotherThreadIsRefused) {
    CMutex mutex;
    ASSERT_TRUE(mutex.Lock());
    EXPECT_FALSE(OnAnotherThread([&] { return mutex.Unlock(); }));
    EXPECT_TRUE(mutex.Unlock());
    EXPECT_FALSE(mutex.Unlock());
}
