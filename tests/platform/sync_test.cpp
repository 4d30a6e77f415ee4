#include "platform/sync.h"
#include "platform/ticks.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

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

    mutex.Unlock();
    // Still held once: another thread must still fail.
    std::thread second([&] { gotImmediately = mutex.Lock(0); });
    second.join();
    EXPECT_FALSE(gotImmediately);

    mutex.Unlock();
    std::thread third([&] {
        gotImmediately = mutex.Lock(0);
        if (gotImmediately) mutex.Unlock();
    });
    third.join();
    EXPECT_TRUE(gotImmediately);
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
    bool free = false;
    std::thread other([&] {
        CSingleLock lock(&cs, true);
        free = lock.IsLocked();
    });
    other.join();
    EXPECT_TRUE(free);
}

TEST(Ticks, MonotonicAndConsistent) {
    const ULONGLONG a = GetTickCount64();
    Sleep(20);
    const ULONGLONG b = GetTickCount64();
    EXPECT_GE(b - a, 20u);
    EXPECT_EQ(static_cast<DWORD>(GetTickCount64() - GetTickCount()) / 1000, 0u);
    EXPECT_NE(GetCurrentThreadId(), 0u);
    DWORD otherId = 0;
    std::thread t([&] { otherId = GetCurrentThreadId(); });
    t.join();
    EXPECT_NE(otherId, GetCurrentThreadId());
}

TEST(CMutexTest, UnlockByAnotherThreadIsRefused) {
    CMutex mutex;
    ASSERT_TRUE(mutex.Lock());
    bool unlocked = true;
    std::thread other([&] { unlocked = mutex.Unlock(); });
    other.join();
    EXPECT_FALSE(unlocked);
    EXPECT_TRUE(mutex.Unlock());
    EXPECT_FALSE(mutex.Unlock());
}
