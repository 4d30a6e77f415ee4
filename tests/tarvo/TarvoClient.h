#pragma once
// Walks the runtime's automation tables the way its clients do: by DISPID,
// with VARIANT arguments, raising CAutomationError when a call fails.

#include "automation/connection.h"
#include "automation/dispatch_call.h"
#include "automation/rot.h"
#include "tarvo/Control.h"

#include <gtest/gtest.h>

#include "RecordingSink.h"

namespace tarvo_test {

using namespace tarvo::dispid;

inline CComPtr<IDispatch> AsObject(const CComVariant& v) {
    return v.vt == VT_DISPATCH ? CComPtr<IDispatch>(v.pdispVal) : CComPtr<IDispatch>();
}

inline std::u16string AsText(const CComVariant& v) {
    return v.vt == VT_BSTR && v.bstrVal ? std::u16string(v.bstrVal) : std::u16string(u"<not a text>");
}

// The application object through the running-object table.
inline CComPtr<IDispatch> ActiveApplication() {
    CComPtr<IUnknown> unknown;
    CComPtr<IDispatch> application;
    if (SUCCEEDED(GetActiveObject(CLSID_TarvoApplication, unknown.Receive())))
        unknown.QueryInterface(IID_ITarvoApplication, application);
    return application;
}

inline CComPtr<IDispatch> Project(const std::u16string& name) {
    const CComVariant projects = CallMethodOrThrow(ActiveApplication().Get(), ApplicationProjects);
    return AsObject(CallMethodOrThrow(projects.pdispVal, CollectionItem, name.c_str()));
}

// A container of a project, reset, with these names added and (optionally) started.
inline CComPtr<IDispatch> OpenContainer(IDispatch* project, const std::u16string& name,
                                        const std::vector<std::u16string>& variables, bool start = true) {
    const CComVariant containers = CallMethodOrThrow(project, ProjectContainers);
    CComPtr<IDispatch> container = AsObject(CallMethodOrThrow(containers.pdispVal, ContainersCreate, name.c_str()));
    CallMethodOrThrow(container.Get(), ContainerReset);
    for (const std::u16string& variable : variables) {
        const CComVariant added = CallMethodOrThrow(container.Get(), ContainerAdd, variable.c_str());
        EXPECT_EQ(added.vt, VT_BOOL);
        EXPECT_NE(added.boolVal, VARIANT_FALSE) << "not added";
    }
    if (start) CallMethodOrThrow(container.Get(), ContainerStart);
    return container;
}

// Advises a sink on an object's connection point; returns the cookie (0 = failed).
inline DWORD Advise(IDispatch* source, const IID& events, IUnknown* sink, HRESULT* status = nullptr) {
    CComPtr<IConnectionPointContainer> points;
    CComPtr<IConnectionPoint> point;
    DWORD cookie = 0;
    HRESULT hr = CComPtr<IDispatch>(source).QueryInterface(IID_IConnectionPointContainer, points);
    if (SUCCEEDED(hr)) hr = points->FindConnectionPoint(events, point.Receive());
    if (SUCCEEDED(hr)) hr = point->Advise(sink, &cookie);
    if (status) *status = hr;
    return cookie;
}

inline HRESULT Unadvise(IDispatch* source, const IID& events, DWORD cookie) {
    CComPtr<IConnectionPointContainer> points;
    CComPtr<IConnectionPoint> point;
    HRESULT hr = CComPtr<IDispatch>(source).QueryInterface(IID_IConnectionPointContainer, points);
    if (SUCCEEDED(hr)) hr = points->FindConnectionPoint(events, point.Receive());
    if (SUCCEEDED(hr)) hr = point->Unadvise(cookie);
    return hr;
}

// One variable of each generator the tests need; nothing changes unless told to.
inline tarvo::RuntimeConfig SmallPlant() {
    tarvo::RuntimeConfig config;
    tarvo::ProjectConfig plant;
    plant.name = u"Plant";
    tarvo::VariableConfig level;
    level.name = u"Level";
    level.number = 50;
    tarvo::VariableConfig state;
    state.name = u"State";
    state.isText = true;
    state.text = u"Off";
    tarvo::VariableConfig count;
    count.name = u"Count";
    count.id = 40;
    count.generator.kind = tarvo::GeneratorKind::Counter;
    count.generator.periodMs = 100;
    plant.variables = {level, state, count};
    tarvo::ProjectConfig utilities;
    utilities.name = u"Utilities";
    tarvo::VariableConfig power;
    power.name = u"Power";
    utilities.variables = {power};
    config.projects = {plant, utilities};
    return config;
}

// A started runtime with events delivered on the caller's thread and the
// simulation held, so that tests decide when anything happens.
class RuntimeTest : public ::testing::Test {
protected:
    void SetUp() override {
        m_liveBefore = tarvo::Runtime::LiveObjects();
        runtime =
            std::make_unique<tarvo::Runtime>(SmallPlant(), tarvo::RuntimeOptions{tarvo::Delivery::CallerThread, false});
        std::string error;
        ASSERT_TRUE(runtime->Start(&error)) << error;
    }
    void TearDown() override {
        runtime.reset();
        EXPECT_EQ(tarvo::Runtime::LiveObjects(), m_liveBefore) << "automation objects left alive";
    }

    std::unique_ptr<tarvo::Runtime> runtime;

private:
    long m_liveBefore = 0;
};

}  // namespace tarvo_test
