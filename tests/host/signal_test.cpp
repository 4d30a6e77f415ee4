// Signals turned into event-loop work.
#include "SignalBridge.h"

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QEventLoop>

#include <gtest/gtest.h>

#include <csignal>
#include <thread>
#include <vector>

namespace {

// Runs the event loop until the condition holds or five seconds pass.
bool RunUntil(const std::function<bool()>& condition) {
    QDeadlineTimer deadline(5000);
    while (!condition() && !deadline.hasExpired()) QCoreApplication::processEvents(QEventLoop::WaitForMoreEvents, 100);
    return condition();
}

TEST(SignalBridge, DeliversSignalsInOrderOnTheLoopEvenFromOtherThreads) {
    std::vector<int> received;
    const std::thread::id loopThread = std::this_thread::get_id();
    bool offLoop = false;
    CSignalBridge bridge({SIGUSR1, SIGHUP}, [&](int signal) {
        received.push_back(signal);
        offLoop = offLoop || std::this_thread::get_id() != loopThread;
    });
    ASSERT_TRUE(bridge.IsValid());
    raise(SIGUSR1);
    std::thread([] { raise(SIGHUP); }).join();
    raise(SIGUSR1);
    EXPECT_TRUE(received.empty()) << "nothing runs inside the handler";
    ASSERT_TRUE(RunUntil([&] { return received.size() == 3; }));
    EXPECT_EQ(received, (std::vector<int>{SIGUSR1, SIGHUP, SIGUSR1}));
    EXPECT_FALSE(offLoop);
}

TEST(SignalBridge, OneBridgeAtATimeAndTheEarlierDispositionComesBack) {
    std::signal(SIGUSR2, SIG_IGN);
    {
        int first = 0;
        CSignalBridge bridge({SIGUSR2}, [&](int) { ++first; });
        ASSERT_TRUE(bridge.IsValid());
        {
            CSignalBridge second({SIGUSR2}, [](int) {});
            EXPECT_FALSE(second.IsValid());
        }
        // The refused second bridge took nothing of the first one away.
        raise(SIGUSR2);
        EXPECT_TRUE(RunUntil([&] { return first == 1; }));
    }
    struct sigaction now = {};
    sigaction(SIGUSR2, nullptr, &now);
    EXPECT_EQ(now.sa_handler, SIG_IGN);
    std::signal(SIGUSR2, SIG_DFL);
}

}  // namespace
