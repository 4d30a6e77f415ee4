#include "vxhelper/dirmanager.h"
#include "vxhelper/thread.h"

#include "platform/ticks.h"

#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>

namespace {

struct Work {
    std::atomic<int> cycles{0};
    std::atomic<bool> sawThread{false};
    std::atomic<bool> release{false};  // for routines that ignore the run flag until released
};

DWORD LoopWhileRunFlag(VX_CThread* thread) {
    auto* work = static_cast<Work*>(thread->GetParameter());
    work->sawThread = true;
    while (thread->IsRunFlagSet()) {
        ++work->cycles;
        Sleep(1);
    }
    return 7;
}

DWORD WaitForRelease(VX_CThread* thread) {
    auto* work = static_cast<Work*>(thread->GetParameter());
    while (!work->release) Sleep(1);
    return 3;
}

TEST(VxThread, RunsUntilEndThreadClearsTheFlag) {
    Work work;
    VX_CThread thread;
    EXPECT_TRUE(thread.EndThread());  // nothing running
    ASSERT_TRUE(thread.BeginThread(LoopWhileRunFlag, &work));
    EXPECT_FALSE(thread.BeginThread(LoopWhileRunFlag, &work));  // one routine at a time
    while (work.cycles < 3) Sleep(1);
    EXPECT_TRUE(thread.IsRunning());
    EXPECT_TRUE(thread.EndThread(INFINITE));
    EXPECT_FALSE(thread.IsRunning());
    EXPECT_FALSE(thread.IsRunFlagSet());
    EXPECT_TRUE(work.sawThread);
    EXPECT_EQ(thread.GetExitCode(), 7u);
    const int cycles = work.cycles;
    Sleep(5);
    EXPECT_EQ(work.cycles, cycles);  // the routine has really ended

    // The same object starts again, with a bigger stack.
    ASSERT_TRUE(thread.BeginThread(LoopWhileRunFlag, &work, 0, 1024 * 1024));
    EXPECT_TRUE(thread.EndThread());
    EXPECT_FALSE(thread.BeginThread(nullptr, &work));
}

TEST(VxThread, EndThreadTimesOutAndCanWaitAgain) {
    Work work;
    VX_CThread thread;
    ASSERT_TRUE(thread.BeginThread(WaitForRelease, &work));
    EXPECT_FALSE(thread.EndThread(10));
    EXPECT_TRUE(thread.IsRunning());
    work.release = true;
    EXPECT_TRUE(thread.EndThread(INFINITE));
    EXPECT_EQ(thread.GetExitCode(), 3u);
}

TEST(VxThread, DestructorEndsTheRoutine) {
    Work work;
    {
        VX_CThread thread;
        ASSERT_TRUE(thread.BeginThread(LoopWhileRunFlag, &work));
    }
    const int cycles = work.cycles;
    Sleep(5);
    EXPECT_EQ(work.cycles, cycles);
}

int g_objectInTestProgram = 0;

TEST(VxDirManager, DirectoryOfTheModuleHoldingAnAddress) {
    // The test program and the helper library are built into the same folder.
    const std::string programDir = std::filesystem::canonical("/proc/self/exe").parent_path().string() + "/";
    EXPECT_EQ(VX_DirManager::GetModuleDir(&g_objectInTestProgram).ToUtf8(), programDir);
    EXPECT_EQ(VX_DirManager::GetModuleDir(reinterpret_cast<const void*>(&VX_DirManager::GetModuleDir)).ToUtf8(), programDir);
    EXPECT_TRUE(std::filesystem::exists(programDir + "libVXHelper.so"));
    int onTheStack = 0;
    EXPECT_TRUE(VX_DirManager::GetModuleDir(&onTheStack).IsEmpty());
    EXPECT_TRUE(VX_DirManager::GetModuleDir(nullptr).IsEmpty());
}

}  // namespace
