#include "platform/ticks.h"
#include "platform/window.h"

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <thread>
#include <vector>

namespace {

class RecordingWindow : public CWnd {
public:
    struct Seen {
        UINT message;
        WPARAM wParam;
        LPARAM lParam;
        DWORD thread;
    };
    LRESULT WindowProc(UINT message, WPARAM wParam, LPARAM lParam) override {
        seen.push_back({message, wParam, lParam, GetCurrentThreadId()});
        if (onMessage) onMessage(message);
        return message == WM_USER + 7 ? static_cast<LRESULT>(wParam * 2) : CWnd::WindowProc(message, wParam, lParam);
    }
    int Count(UINT message) const {
        int n = 0;
        for (const auto& s : seen) n += s.message == message;
        return n;
    }
    std::vector<Seen> seen;
    std::function<void(UINT)> onMessage;
};

void PumpUntil(const std::function<bool()>& done, DWORD limitMs = 5000) {
    const ULONGLONG end = GetTickCount64() + limitMs;
    while (!done() && GetTickCount64() < end) VX_PumpMessages(5);
}

}  // namespace

TEST(MessageWindow, PostFromAnotherThreadArrivesOnOwningThread) {
    RecordingWindow window;
    ASSERT_TRUE(window.CreateMessageWindow(u"test"));
    const HWND handle = window.GetSafeHwnd();
    bool posted = false;
    std::thread poster([&] { posted = PostMessage(handle, WM_USER + 1, 11, 22); });
    poster.join();
    EXPECT_TRUE(posted);
    EXPECT_EQ(window.Count(WM_USER + 1), 0);  // posting never runs the handler at once
    PumpUntil([&] { return window.Count(WM_USER + 1) == 1; });
    ASSERT_EQ(window.Count(WM_USER + 1), 1);
    EXPECT_EQ(window.seen[0].wParam, 11u);
    EXPECT_EQ(window.seen[0].lParam, 22);
    EXPECT_EQ(window.seen[0].thread, GetCurrentThreadId());
}

TEST(MessageWindow, SendCallsDirectlyOnOwnerAndWaitsFromOtherThreads) {
    RecordingWindow window;
    ASSERT_TRUE(window.CreateMessageWindow(u"test"));
    EXPECT_EQ(window.SendMessage(WM_USER + 7, 21), 42);
    EXPECT_EQ(window.seen.size(), 1u);

    LRESULT fromOther = 0;
    std::atomic<bool> finished{false};
    std::thread sender([&] {
        fromOther = SendMessage(window.GetSafeHwnd(), WM_USER + 7, 50);
        finished = true;
    });
    PumpUntil([&] { return finished.load(); });
    sender.join();
    EXPECT_EQ(fromOther, 100);
    EXPECT_EQ(window.seen.back().thread, GetCurrentThreadId());
}

TEST(MessageWindow, DeadHandleIsSafe) {
    HWND stale;
    {
        RecordingWindow window;
        ASSERT_TRUE(window.CreateMessageWindow(u"test"));
        stale = window.GetSafeHwnd();
        EXPECT_TRUE(IsWindow(stale));
        EXPECT_TRUE(PostMessage(stale, WM_USER + 2));  // pending when the window dies
    }
    EXPECT_FALSE(IsWindow(stale));
    EXPECT_FALSE(PostMessage(stale, WM_USER + 3));
    EXPECT_EQ(SendMessage(stale, WM_USER + 3), 0);
    VX_PumpMessages(20);  // the pending message must be dropped, not delivered to freed memory
    EXPECT_FALSE(PostMessage(nullptr, WM_USER));
}

TEST(MessageWindow, SenderOnAnotherThreadIsReleasedWhenWindowDies) {
    auto* window = new RecordingWindow;
    ASSERT_TRUE(window->CreateMessageWindow(u"test"));
    const HWND handle = window->GetSafeHwnd();
    std::atomic<bool> finished{false};
    LRESULT result = -1;
    std::thread sender([&] {
        result = SendMessage(handle, WM_USER + 7, 5);
        finished = true;
    });
    // Destroy before the owner's loop ever runs the sent message.
    while (!finished) {
        Sleep(10);
        if (window) {
            delete window;
            window = nullptr;
        }
    }
    sender.join();
    EXPECT_EQ(result, 0);
}

TEST(MessageWindow, DestroyDeliversWmDestroyAndStopsTimers) {
    RecordingWindow window;
    ASSERT_TRUE(window.CreateMessageWindow(u"test"));
    ASSERT_EQ(window.SetTimer(1, 10), 1u);
    EXPECT_TRUE(window.DestroyWindow());
    EXPECT_EQ(window.Count(WM_DESTROY), 1);
    VX_PumpMessages(40);
    EXPECT_EQ(window.Count(WM_TIMER), 0);
    EXPECT_FALSE(window.DestroyWindow());
}

TEST(MessageWindow, DestroyFromInsideOwnHandlerIsSafe) {
    RecordingWindow window;
    ASSERT_TRUE(window.CreateMessageWindow(u"test"));
    window.onMessage = [&](UINT message) {
        if (message == WM_USER + 9) window.DestroyWindow();
    };
    window.PostMessage(WM_USER + 9);
    window.PostMessage(WM_USER + 10);  // queued behind; must never arrive
    PumpUntil([&] { return window.Count(WM_DESTROY) == 1; });
    VX_PumpMessages(20);
    EXPECT_EQ(window.Count(WM_USER + 10), 0);
}

TEST(MessageWindow, TimerKeepsFiringInsideNestedLoop) {
    RecordingWindow window;
    ASSERT_TRUE(window.CreateMessageWindow(u"test"));
    CNestedLoop nested;
    int ticksInside = 0;
    bool inNested = false;
    window.onMessage = [&](UINT message) {
        if (message == WM_USER + 5) {
            // A handler that runs a modal loop, as a message box does.
            inNested = true;
            EXPECT_EQ(nested.Run(), 3);
            inNested = false;
        } else if (message == WM_TIMER && inNested && ++ticksInside == 4) {
            nested.Exit(3);
        }
    };
    ASSERT_EQ(window.SetTimer(1, 50), 1u);
    window.PostMessage(WM_USER + 5);
    const ULONGLONG start = GetTickCount64();
    PumpUntil([&] { return ticksInside >= 4 && !inNested; });
    EXPECT_EQ(ticksInside, 4);
    EXPECT_GE(GetTickCount64() - start, 150u);
    EXPECT_TRUE(window.KillTimer(1));
    EXPECT_FALSE(window.KillTimer(1));
}

TEST(MessageWindow, TimerFromAnotherThreadIsRefused) {
    RecordingWindow window;
    ASSERT_TRUE(window.CreateMessageWindow(u"test"));
    UINT_PTR id = 99;
    std::thread other([&] { id = window.SetTimer(1, 10); });
    other.join();
    EXPECT_EQ(id, 0u);
}
