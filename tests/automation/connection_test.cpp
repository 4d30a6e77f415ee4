#include "automation/connection.h"

#include "RecordingSink.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

namespace {

constexpr IID DIID_ITestEvents = {0xABCD, 0, 0, {1, 1, 1, 1, 1, 1, 1, 1}};
constexpr IID DIID_IOtherEvents = {0xABCE, 0, 0, {1, 1, 1, 1, 1, 1, 1, 1}};

size_t FireOne(CConnectionPoint* point, int value) {
    CComVariant arg(value);
    DISPPARAMS params{&arg, nullptr, 1, 0};
    return point->Fire(7, &params);
}

}  // namespace

TEST(ConnectionPoint, AdviseFireUnadvise) {
    auto point = CConnectionPoint::Create(DIID_ITestEvents);
    auto sink = MakeComObject<RecordingSink>(DIID_ITestEvents);
    DWORD cookie = 0;
    ASSERT_EQ(point->Advise(sink.Get(), &cookie), S_OK);
    EXPECT_NE(cookie, 0u);
    EXPECT_EQ(sink->RefCount(), 2u);
    EXPECT_EQ(point->ConnectionCount(), 1u);

    EXPECT_EQ(FireOne(point.Get(), 5), 1u);
    const auto calls = sink->Calls();
    ASSERT_EQ(calls.size(), 1u);
    EXPECT_EQ(calls[0].member, 7);
    ASSERT_EQ(calls[0].args.size(), 1u);
    EXPECT_EQ(calls[0].args[0].lVal, 5);

    EXPECT_EQ(point->Unadvise(cookie), S_OK);
    EXPECT_EQ(sink->RefCount(), 1u);
    EXPECT_EQ(FireOne(point.Get(), 6), 0u);
    EXPECT_EQ(sink->CallCount(), 1u);
    EXPECT_EQ(point->Unadvise(cookie), CONNECT_E_NOCONNECTION);
    EXPECT_EQ(point->Unadvise(0), CONNECT_E_NOCONNECTION);
    EXPECT_EQ(point->Unadvise(12345), CONNECT_E_NOCONNECTION);

    IID iid{};
    EXPECT_EQ(point->GetConnectionInterface(&iid), S_OK);
    EXPECT_TRUE(iid == DIID_ITestEvents);
}

TEST(ConnectionPoint, RefusesWhatItCannotCall) {
    auto point = CConnectionPoint::Create(DIID_ITestEvents);
    auto wrongSink = MakeComObject<RecordingSink>(DIID_IOtherEvents);
    DWORD cookie = 99;
    EXPECT_EQ(point->Advise(wrongSink.Get(), &cookie), CONNECT_E_CANNOTCONNECT);
    EXPECT_EQ(cookie, 0u);
    EXPECT_EQ(wrongSink->RefCount(), 1u);
    EXPECT_EQ(point->Advise(nullptr, &cookie), E_POINTER);
    EXPECT_EQ(point->Advise(wrongSink.Get(), nullptr), E_POINTER);

    bool refuse = true;
    auto gated = CConnectionPoint::Create(DIID_ITestEvents, [&] { return refuse ? E_FAIL : S_OK; });
    auto sink = MakeComObject<RecordingSink>(DIID_ITestEvents);
    EXPECT_EQ(gated->Advise(sink.Get(), &cookie), E_FAIL);
    refuse = false;
    EXPECT_EQ(gated->Advise(sink.Get(), &cookie), S_OK);

    // Closing ends every connection and refuses later ones.
    gated->Close();
    EXPECT_EQ(sink->RefCount(), 1u);
    EXPECT_EQ(gated->Advise(sink.Get(), &cookie), CONNECT_E_CANNOTCONNECT);
    EXPECT_EQ(gated->Unadvise(cookie), CONNECT_E_NOCONNECTION);
}

TEST(ConnectionPoint, SameSinkTwiceHasTwoConnections) {
    auto point = CConnectionPoint::Create(DIID_ITestEvents);
    auto sink = MakeComObject<RecordingSink>(DIID_ITestEvents);
    DWORD first = 0, second = 0;
    ASSERT_EQ(point->Advise(sink.Get(), &first), S_OK);
    ASSERT_EQ(point->Advise(sink.Get(), &second), S_OK);
    EXPECT_NE(first, second);
    EXPECT_EQ(FireOne(point.Get(), 1), 2u);
    EXPECT_EQ(point->Unadvise(first), S_OK);
    EXPECT_EQ(FireOne(point.Get(), 2), 1u);
    point.Release();  // the point goes with a sink still advised: the sink is released
    EXPECT_EQ(sink->RefCount(), 1u);
}

TEST(ConnectionPoint, UnadviseWaitsForACallInProgress) {
    auto point = CConnectionPoint::Create(DIID_ITestEvents);
    auto sink = MakeComObject<RecordingSink>(DIID_ITestEvents);
    std::atomic<bool> entered{false}, release{false}, unadvised{false};
    sink->onCall = [&](const RecordingSink::Call&) {
        entered = true;
        while (!release) std::this_thread::yield();
    };
    DWORD cookie = 0;
    ASSERT_EQ(point->Advise(sink.Get(), &cookie), S_OK);
    std::thread firing([&] { FireOne(point.Get(), 1); });
    while (!entered) std::this_thread::yield();
    std::thread unadvising([&] {
        EXPECT_EQ(point->Unadvise(cookie), S_OK);
        unadvised = true;
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_FALSE(unadvised) << "Unadvise returned while the sink was still being called";
    release = true;
    firing.join();
    unadvising.join();
    EXPECT_TRUE(unadvised);
    EXPECT_EQ(sink->RefCount(), 1u);
}

TEST(ConnectionPoint, SinkMayUnadviseItselfDuringItsCall) {
    auto point = CConnectionPoint::Create(DIID_ITestEvents);
    DWORD cookie = 0;
    HRESULT inner = E_FAIL;
    {
        auto sink = MakeComObject<RecordingSink>(DIID_ITestEvents);
        sink->onCall = [&](const RecordingSink::Call&) { inner = point->Unadvise(cookie); };
        ASSERT_EQ(point->Advise(sink.Get(), &cookie), S_OK);
    }  // only the connection holds the sink now
    EXPECT_EQ(FireOne(point.Get(), 1), 1u);
    EXPECT_EQ(inner, S_OK);
    EXPECT_EQ(point->ConnectionCount(), 0u);
}

// Advising and unadvising while two threads fire: no call may reach a sink
// after its Unadvise returned, and every reference comes back.
TEST(ConnectionPoint, AdviseAndUnadviseWhileFiring) {
    auto point = CConnectionPoint::Create(DIID_ITestEvents);
    auto sink = MakeComObject<RecordingSink>(DIID_ITestEvents);
    std::atomic<bool> done{false};
    auto fire = [&] {
        while (!done) FireOne(point.Get(), 1);
    };
    std::thread a(fire), b(fire);
    size_t lateCalls = 0;
    for (int i = 0; i < 100; ++i) {
        DWORD cookie = 0;
        ASSERT_EQ(point->Advise(sink.Get(), &cookie), S_OK);
        std::this_thread::yield();
        ASSERT_EQ(point->Unadvise(cookie), S_OK);
        // Calls in progress have ended; none may start before the next Advise.
        sink->ClearCalls();
        for (int k = 0; k < 20; ++k) std::this_thread::yield();
        lateCalls += sink->CallCount();
    }
    done = true;
    a.join();
    b.join();
    EXPECT_EQ(lateCalls, 0u);
    EXPECT_EQ(sink->RefCount(), 1u);
}
