// The runtime's automation tables, driven by DISPID as its clients drive them.
#include "TarvoClient.h"

using namespace tarvo_test;

using TarvoTables = RuntimeTest;

TEST_F(TarvoTables, ProjectsByNameAndPosition) {
    CComPtr<IDispatch> application = ActiveApplication();
    ASSERT_TRUE(application) << "the runtime is not in the running-object table";
    const CComVariant projects = CallMethodOrThrow(application.Get(), ApplicationProjects);
    ASSERT_EQ(projects.vt, VT_DISPATCH);
    const CComVariant count = GetPropertyOrThrow(projects.pdispVal, CollectionCount);
    EXPECT_EQ(count.vt, VT_I4);
    EXPECT_EQ(count.lVal, 2);

    const CComVariant byName = CallMethodOrThrow(projects.pdispVal, CollectionItem, u"Utilities");
    EXPECT_EQ(AsText(GetPropertyOrThrow(AsObject(byName).Get(), ProjectName)), u"Utilities");
    const CComVariant byPosition = CallMethodOrThrow(projects.pdispVal, CollectionItem, 0);
    EXPECT_EQ(AsText(GetPropertyOrThrow(AsObject(byPosition).Get(), ProjectName)), u"Plant");
    // Any numeric type names a position.
    const CComVariant byDouble = CallMethodOrThrow(projects.pdispVal, CollectionItem, 1.0);
    EXPECT_EQ(AsText(GetPropertyOrThrow(AsObject(byDouble).Get(), ProjectName)), u"Utilities");

    // No such project: a null object, not an error. Names compare exactly.
    for (const CComVariant& key : {CComVariant(2), CComVariant(-1), CComVariant(u"plant"), CComVariant(u"")}) {
        const CComVariant none = CallMethodOrThrow(projects.pdispVal, CollectionItem, key);
        EXPECT_EQ(none.vt, VT_DISPATCH);
        EXPECT_EQ(none.pdispVal, nullptr);
    }
}

TEST_F(TarvoTables, VariablesHaveIdsAndNames) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    const CComVariant variables = CallMethodOrThrow(plant.Get(), ProjectVariables);
    EXPECT_EQ(GetPropertyOrThrow(variables.pdispVal, CollectionCount).lVal, 3);

    const CComVariant count = CallMethodOrThrow(variables.pdispVal, CollectionItem, u"Count");
    const CComVariant id = GetPropertyOrThrow(count.pdispVal, VariableId);
    EXPECT_EQ(id.vt, VT_I4);
    EXPECT_EQ(id.lVal, 40);  // given in the configuration
    EXPECT_EQ(AsText(GetPropertyOrThrow(count.pdispVal, VariableName)), u"Count");

    // Variables without an id get the free ones from 1, ids unique in the project.
    const CComVariant first = CallMethodOrThrow(variables.pdispVal, CollectionItem, 0);
    const CComVariant second = CallMethodOrThrow(variables.pdispVal, CollectionItem, 1);
    EXPECT_EQ(GetPropertyOrThrow(first.pdispVal, VariableId).lVal, 1);
    EXPECT_EQ(GetPropertyOrThrow(second.pdispVal, VariableId).lVal, 2);

    const CComVariant missing = CallMethodOrThrow(variables.pdispVal, CollectionItem, u"Nothing");
    EXPECT_EQ(missing.pdispVal, nullptr);
    EXPECT_EQ(CallMethodOrThrow(variables.pdispVal, CollectionItem, 3).pdispVal, nullptr);
}

TEST_F(TarvoTables, BadCallsReturnErrorStatus) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    const CComVariant variables = CallMethodOrThrow(plant.Get(), ProjectVariables);
    CComVariant result;
    EXPECT_EQ(CallMethod(plant.Get(), 77, &result), DISP_E_MEMBERNOTFOUND);
    EXPECT_EQ(CallMethod(variables.pdispVal, CollectionItem, &result), DISP_E_BADPARAMCOUNT);
    EXPECT_EQ(CallMethod(variables.pdispVal, CollectionItem, &result, u"Level", 1), DISP_E_BADPARAMCOUNT);
    EXPECT_EQ(CallMethod(variables.pdispVal, CollectionItem, &result, CComVariant()), DISP_E_TYPEMISMATCH);
    EXPECT_EQ(CallMethod(variables.pdispVal, CollectionItem, &result, plant.Get()), DISP_E_TYPEMISMATCH);
    EXPECT_EQ(CallMethod(variables.pdispVal, CollectionItem, &result, 1e20), DISP_E_OVERFLOW);
    EXPECT_EQ(CallMethod(variables.pdispVal, CollectionCount, &result), DISP_E_MEMBERNOTFOUND);  // a get, no method
    EXPECT_EQ(result.vt, VT_EMPTY);

    CComPtr<IDispatch> container = OpenContainer(plant.Get(), u"c", {}, false);
    EXPECT_EQ(CallMethod(container.Get(), ContainerAdd, &result, 5), DISP_E_TYPEMISMATCH);
    EXPECT_EQ(CallMethod(container.Get(), ContainerStart, &result, 1), DISP_E_BADPARAMCOUNT);
}

TEST_F(TarvoTables, ObjectsAnswerTheirInterfaces) {
    CComPtr<IDispatch> application = ActiveApplication();
    CComPtr<IUnknown> unknown;
    EXPECT_EQ(application.QueryInterface(IID_IConnectionPointContainer, unknown), E_NOINTERFACE);
    CComPtr<IDispatch> plant = Project(u"Plant");
    EXPECT_EQ(plant.QueryInterface(IID_IProject, unknown), S_OK);
    EXPECT_EQ(plant.QueryInterface(IID_IConnectionPointContainer, unknown), S_OK);
    CComPtr<IDispatch> container = OpenContainer(plant.Get(), u"c", {}, false);
    EXPECT_EQ(container.QueryInterface(IID_IOnlineVariable, unknown), S_OK);

    // A container offers only its own event interface.
    CComPtr<IConnectionPointContainer> points;
    ASSERT_EQ(container.QueryInterface(IID_IConnectionPointContainer, points), S_OK);
    CComPtr<IConnectionPoint> point;
    EXPECT_EQ(points->FindConnectionPoint(DIID_IProjectEvents, point.Receive()), CONNECT_E_NOCONNECTION);
    EXPECT_EQ(points->FindConnectionPoint(DIID_IOnlineVariableEvents, point.Receive()), S_OK);
}

TEST_F(TarvoTables, ContainersAreCreatedAndDeletedByName) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    const CComVariant containers = CallMethodOrThrow(plant.Get(), ProjectContainers);
    CComPtr<IDispatch> container = OpenContainer(plant.Get(), u"Gw", {u"Level", u"State"});
    ASSERT_EQ(runtime->Containers(u"Plant").size(), 1u);
    EXPECT_EQ(runtime->Containers(u"Plant")[0].variables, (std::vector<std::u16string>{u"Level", u"State"}));
    EXPECT_TRUE(runtime->Containers(u"Plant")[0].started);

    // Adding a name twice keeps it once; removing reports whether it was there.
    EXPECT_NE(CallMethodOrThrow(container.Get(), ContainerAdd, u"Level").boolVal, VARIANT_FALSE);
    EXPECT_NE(CallMethodOrThrow(container.Get(), ContainerRemove, u"Level").boolVal, VARIANT_FALSE);
    EXPECT_EQ(CallMethodOrThrow(container.Get(), ContainerRemove, u"Level").boolVal, VARIANT_FALSE);
    EXPECT_EQ(CallMethodOrThrow(container.Get(), ContainerAdd, u"Nothing").boolVal, VARIANT_FALSE);
    EXPECT_EQ(runtime->Containers(u"Plant")[0].variables, (std::vector<std::u16string>{u"State"}));
    // Reset takes every name out and stops.
    CallMethodOrThrow(container.Get(), ContainerReset);
    EXPECT_TRUE(runtime->Containers(u"Plant")[0].variables.empty());
    EXPECT_FALSE(runtime->Containers(u"Plant")[0].started);

    EXPECT_THROW(CallMethodOrThrow(containers.pdispVal, ContainersCreate, u"Gw"), CAutomationError);
    EXPECT_THROW(CallMethodOrThrow(containers.pdispVal, ContainersCreate, u""), CAutomationError);

    auto sink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    ASSERT_NE(Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get()), 0u);
    EXPECT_EQ(sink->RefCount(), 2u);
    EXPECT_NE(CallMethodOrThrow(containers.pdispVal, ContainersDelete, u"Gw").boolVal, VARIANT_FALSE);
    EXPECT_EQ(sink->RefCount(), 1u) << "deleting a container releases its sinks";
    EXPECT_EQ(CallMethodOrThrow(containers.pdispVal, ContainersDelete, u"Gw").boolVal, VARIANT_FALSE);
    EXPECT_TRUE(runtime->Containers(u"Plant").empty());
    // The client's object of a deleted container raises errors, and can go any time.
    EXPECT_THROW(CallMethodOrThrow(container.Get(), ContainerStart), CAutomationError);

    // The name is free again.
    CComPtr<IDispatch> again = OpenContainer(plant.Get(), u"Gw", {u"Level"});
    EXPECT_TRUE(again);
}

TEST_F(TarvoTables, StoppingWhileClientsHoldObjects) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    const CComVariant variables = CallMethodOrThrow(plant.Get(), ProjectVariables);
    CComPtr<IDispatch> container = OpenContainer(plant.Get(), u"Gw", {u"Level"});
    auto containerSink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    auto projectSink = MakeComObject<RecordingSink>(DIID_IProjectEvents);
    const DWORD containerCookie = Advise(container.Get(), DIID_IOnlineVariableEvents, containerSink.Get());
    const DWORD projectCookie = Advise(plant.Get(), DIID_IProjectEvents, projectSink.Get());
    ASSERT_NE(containerCookie, 0u);
    ASSERT_NE(projectCookie, 0u);

    runtime->Stop();
    EXPECT_FALSE(ActiveApplication()) << "a stopped runtime stays in the running-object table";
    EXPECT_EQ(containerSink->RefCount(), 1u);
    EXPECT_EQ(projectSink->RefCount(), 1u);
    CComVariant result;
    EXPECT_EQ(CallMethod(container.Get(), ContainerStop, &result), RPC_E_DISCONNECTED);
    EXPECT_EQ(GetProperty(plant.Get(), ProjectName, &result), RPC_E_DISCONNECTED);
    EXPECT_EQ(GetProperty(variables.pdispVal, CollectionCount, &result), RPC_E_DISCONNECTED);
    EXPECT_TRUE(FAILED(Unadvise(container.Get(), DIID_IOnlineVariableEvents, containerCookie)));
    EXPECT_FALSE(runtime->SetValue(u"Plant", u"Level", CComVariant(1.0)));

    // Objects go in an odd order; then a fresh start serves new objects.
    plant.Release();
    container.Release();
    std::string error;
    ASSERT_TRUE(runtime->Start(&error)) << error;
    EXPECT_EQ(AsText(GetPropertyOrThrow(Project(u"Plant").Get(), ProjectName)), u"Plant");
}

TEST(TarvoRuntime, StartRefusesBadConfigurationAndSecondStart) {
    tarvo::RuntimeConfig config = SmallPlant();
    config.projects[0].variables[1].name = u"Level";  // twice in one project
    tarvo::Runtime bad(config);
    std::string error;
    EXPECT_FALSE(bad.Start(&error));
    EXPECT_NE(error.find("used twice"), std::string::npos) << error;
    EXPECT_FALSE(ActiveApplication());

    tarvo::Runtime good(SmallPlant());
    ASSERT_TRUE(good.Start());
    EXPECT_FALSE(good.Start(&error));
    EXPECT_TRUE(ActiveApplication());
    good.Stop();
    good.Stop();
    EXPECT_FALSE(ActiveApplication());
}
