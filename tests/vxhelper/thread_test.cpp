#include "vxhelper/dirmanager.h"
#include "vxhelper/thread.h"

#include "platform/ticks.h"

#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>

namespace {

struct Work {
    std::atomic<int> cycles{0};
    std::atomic<bool> ignoreStop{false};  // keeps the routine running until cleared
};

DWORD Routine(VX_CThread* thread) {
    auto* work = static_cast<Work*>(thread->GetParameter());
    while (thread->IsRunFlagSet() || work->ignoreStop) {
        ++work->cycles;
        Sleep(1);
    }
    return 7;
}

TEST(VxThread, RunsUntilEndThreadClearsTheFlag) {
    Work work;
    VX_CThread thread;
    EXPECT_TRUE(thread.EndThread());  // nothing running
    ASSERT_TRUE(thread.BeginThread(Routine, &work));
    EXPECT_FALSE(thread.BeginThread(Routine, &work));  // one routine at a time
    while (work.cycles < 3) Sleep(1);
    EXPECT_TRUE(thread.EndThread(INFINITE));
    EXPECT_FALSE(thread.IsRunning());
    EXPECT_EQ(thread.GetExitCode(), 7u);
    const int cycles = work.cycles;
    Sleep(5);
    EXPECT_EQ(work.cycles, cycles);  // the routine has really ended

    // A routine that does not stop in time: EndThread says so, and can wait again.
    work.ignoreStop = true;
    ASSERT_TRUE(thread.BeginThread(Routine, &work, 0, 1024 * 1024));
    EXPECT_FALSE(thread.EndThread(10));
    EXPECT_TRUE(thread.IsRunning());
    work.ignoreStop = false;
    EXPECT_TRUE(thread.EndThread(INFINITE));

    // The destructor ends a running routine.
    {
        VX_CThread scoped;
        ASSERT_TRUE(scoped.BeginThread(Routine, &work));
    }
    const int after = work.cycles;
    Sleep(5);
    EXPECT_EQ(work.cycles, after);
}

int g_objectInTestProgram = 0;

TEST(VxDirManager, DirectoryOfTheModuleHoldingAnAddress) {
    // The test program and the helper library are built into the same folder.
    const std::string programDir = std::filesystem::canonical("/proc/self/exe").parent_path().string() + "/";
    EXPECT_EQ(VX_DirManager::GetModuleDir(&g_objectInTestProgram).ToUtf8(), programDir);
    EXPECT_EQ(VX_DirManager::GetModuleDir(reinterpret_cast<const void*>(&VX_DirManager::GetModuleDir)).ToUtf8(),
              programDir);
    int onTheStack = 0;
    EXPECT_TRUE(VX_DirManager::GetModuleDir(&onTheStack).IsEmpty());
    EXPECT_TRUE(VX_DirManager::GetModuleDir(nullptr).IsEmpty());
}

}  // namespace
