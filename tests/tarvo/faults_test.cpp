// Injected faults: each makes exactly the chosen call fail, the way a client sees it.
#include "TarvoClient.h"

using namespace tarvo_test;

using TarvoFaults = RuntimeTest;

TEST_F(TarvoFaults, RefusedNameAndFailingStart) {
    CComPtr<IDispatch> container = OpenContainer(Project(u"Plant").Get(), u"Gw", {u"Level"}, false);
    runtime->SetRefusedName(u"State");
    EXPECT_EQ(CallMethodOrThrow(container.Get(), ContainerAdd, u"State").boolVal, VARIANT_FALSE);
    EXPECT_NE(CallMethodOrThrow(container.Get(), ContainerAdd, u"Count").boolVal, VARIANT_FALSE);
    runtime->SetRefusedName(u"State", false);
    EXPECT_NE(CallMethodOrThrow(container.Get(), ContainerAdd, u"State").boolVal, VARIANT_FALSE);

    runtime->SetStartFails(true);
    const CComVariant refused = CallMethodOrThrow(container.Get(), ContainerStart);
    EXPECT_EQ(refused.vt, VT_BOOL);
    EXPECT_EQ(refused.boolVal, VARIANT_FALSE);
    EXPECT_FALSE(runtime->Containers(u"Plant")[0].started);
    runtime->ClearFaults();
    EXPECT_NE(CallMethodOrThrow(container.Get(), ContainerStart).boolVal, VARIANT_FALSE);
}

TEST_F(TarvoFaults, FailingAdvise) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    CComPtr<IDispatch> container = OpenContainer(plant.Get(), u"Gw", {u"Level"});
    auto sink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    auto projectSink = MakeComObject<RecordingSink>(DIID_IProjectEvents);
    runtime->SetAdviseFails(true);
    HRESULT status = S_OK;
    EXPECT_EQ(Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get(), &status), 0u);
    EXPECT_EQ(status, CONNECT_E_CANNOTCONNECT);
    EXPECT_EQ(Advise(plant.Get(), DIID_IProjectEvents, projectSink.Get(), &status), 0u);
    EXPECT_EQ(status, CONNECT_E_CANNOTCONNECT);
    EXPECT_EQ(sink->RefCount(), 1u);
    runtime->SetAdviseFails(false);
    EXPECT_NE(Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get()), 0u);
    // A sink without the event interface cannot be advised at all.
    EXPECT_EQ(Advise(container.Get(), DIID_IOnlineVariableEvents, projectSink.Get(), &status), 0u);
    EXPECT_EQ(status, CONNECT_E_CANNOTCONNECT);
}

TEST_F(TarvoFaults, MemberRaisesAnError) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    runtime->SetRaiseError(tarvo::ObjectKind::Project, ProjectContainers);
    CComVariant result;
    EXCEPINFO info{0, nullptr, nullptr, 0};
    EXPECT_EQ(InvokeMember(plant.Get(), ProjectContainers, DISPATCH_METHOD, nullptr, 0, &result, &info),
              DISP_E_EXCEPTION);
    EXPECT_EQ(result.vt, VT_EMPTY);
    EXPECT_EQ(info.scode, E_FAIL);
    ASSERT_NE(info.bstrDescription, nullptr);
    EXPECT_NE(std::u16string(info.bstrDescription).find(u"Injected"), std::u16string::npos);
    ClearExcepInfo(&info);
    EXPECT_THROW(CallMethodOrThrow(plant.Get(), ProjectContainers), CAutomationError);

    // Only that member of that kind of object: the rest works.
    EXPECT_NO_THROW(CallMethodOrThrow(plant.Get(), ProjectVariables));
    EXPECT_EQ(AsText(GetPropertyOrThrow(plant.Get(), ProjectName)), u"Plant");
    runtime->SetRaiseError(tarvo::ObjectKind::Project, ProjectContainers, false);
    EXPECT_NO_THROW(CallMethodOrThrow(plant.Get(), ProjectContainers));

    runtime->SetRaiseError(tarvo::ObjectKind::Application, ApplicationProjects);
    EXPECT_THROW(Project(u"Plant"), CAutomationError);
}

TEST_F(TarvoFaults, ProjectLookupFails) {
    runtime->SetProjectLookupFails(true);
    EXPECT_FALSE(Project(u"Plant"));
    const CComVariant projects = CallMethodOrThrow(ActiveApplication().Get(), ApplicationProjects);
    EXPECT_EQ(CallMethodOrThrow(projects.pdispVal, CollectionItem, 0).pdispVal, nullptr);
    runtime->ClearFaults();
    EXPECT_TRUE(Project(u"Plant"));
}

// Clients advising, unadvising and releasing on several threads while the
// runtime fires from its own thread and from a caller's.
TEST(TarvoConcurrency, AdviseUnadviseAndReleaseWhileFiring) {
    tarvo::RuntimeConfig config = SmallPlant();
    config.tickMs = 1;
    config.projects[0].variables[2].generator.periodMs = 1;
    const long liveBefore = tarvo::Runtime::LiveObjects();
    tarvo::Runtime runtime(config);
    ASSERT_TRUE(runtime.Start());
    std::atomic<bool> done{false};
    std::thread setter([&] {
        while (!done) runtime.SetValue(u"Plant", u"Level", CComVariant(1.0));
    });
    auto client = [&](const char16_t* name) {
        for (int i = 0; i < 30; ++i) {
            auto sink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
            CComPtr<IDispatch> plant = Project(u"Plant");
            CComPtr<IDispatch> container = OpenContainer(plant.Get(), name, {u"Level", u"Count"});
            const DWORD cookie = Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get());
            EXPECT_NE(cookie, 0u);
            std::this_thread::yield();
            EXPECT_EQ(Unadvise(container.Get(), DIID_IOnlineVariableEvents, cookie), S_OK);
            EXPECT_EQ(sink->RefCount(), 1u);
            const CComVariant containers = CallMethodOrThrow(plant.Get(), ProjectContainers);
            CallMethodOrThrow(containers.pdispVal, ContainersDelete, name);
        }
    };
    std::thread a(client, u"A");
    std::thread b(client, u"B");
    a.join();
    b.join();
    done = true;
    setter.join();
    runtime.Stop();
    EXPECT_EQ(tarvo::Runtime::LiveObjects(), liveBefore);
}
