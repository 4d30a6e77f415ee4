// What the runtime fires: the layout of "VariableBulkChange", which changes
// reach a container, project events, and the threads events come from.
#include "TarvoClient.h"

#include <cmath>
#include <ctime>

using namespace tarvo_test;

namespace {

// The five arrays of one bulk change, checked for the layout clients rely on.
struct BulkChange {
    std::vector<double> ids;
    std::vector<CComVariant> values;
    std::vector<double> lows, highs, times;
};

std::vector<double> Doubles(const VARIANT& v) {
    EXPECT_EQ(v.vt, VT_ARRAY | VT_R8);
    if (v.vt != (VT_ARRAY | VT_R8)) return {};
    const auto* data = static_cast<const double*>(v.parray->pvData);
    return std::vector<double>(data, data + v.parray->cElements);
}

BulkChange ReadBulkChange(const RecordingSink::Call& call) {
    BulkChange change;
    EXPECT_EQ(call.member, EventVariableBulkChange);
    EXPECT_EQ(call.args.size(), 6u);
    if (call.args.size() != 6) return change;
    for (size_t i = 1; i < 6; ++i) {
        EXPECT_NE(call.args[i].vt & VT_ARRAY, 0) << "argument " << i + 1;
        if (!(call.args[i].vt & VT_ARRAY)) return change;
        EXPECT_EQ(call.args[i].parray->lLbound, 0) << "arrays are zero-based";
        EXPECT_EQ(call.args[i].parray->cElements, call.args[1].parray->cElements) << "arrays of equal length";
    }
    change.ids = Doubles(call.args[1]);
    EXPECT_EQ(call.args[2].vt, VT_ARRAY | VT_VARIANT);
    const auto* values = static_cast<const VARIANT*>(call.args[2].parray->pvData);
    for (size_t k = 0; k < change.ids.size(); ++k) change.values.emplace_back(values[k]);
    change.lows = Doubles(call.args[3]);
    change.highs = Doubles(call.args[4]);
    change.times = Doubles(call.args[5]);
    EXPECT_EQ(call.args[0].vt, VT_I4);
    EXPECT_EQ(static_cast<size_t>(call.args[0].lVal), change.ids.size());
    return change;
}

// Today as an OLE DATE, from the local calendar.
double LocalToday() {
    const std::time_t now = std::time(nullptr);
    std::tm local{};
    localtime_r(&now, &local);
    local.tm_hour = 12;  // away from the edges of a day
    std::tm epoch{};
    epoch.tm_year = 70;
    epoch.tm_mday = 1;
    epoch.tm_hour = 12;
    const double days = std::round(std::difftime(std::mktime(&local), std::mktime(&epoch)) / 86400.0);
    return 25569.0 + days;  // 1970-01-01 is day 25569 of the OLE calendar
}

}  // namespace

using TarvoEvents = RuntimeTest;

TEST_F(TarvoEvents, BulkChangeLayout) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    CComPtr<IDispatch> container = OpenContainer(plant.Get(), u"Gw", {u"Level", u"State"});
    auto sink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    ASSERT_NE(Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get()), 0u);

    // A started container reports every current value with the next tick.
    ASSERT_TRUE(runtime->Tick());
    ASSERT_EQ(sink->CallCount(), 1u);
    BulkChange initial = ReadBulkChange(sink->Calls()[0]);
    ASSERT_EQ(initial.ids.size(), 2u);
    EXPECT_EQ(initial.ids[0], *runtime->VariableId(u"Plant", u"Level"));
    EXPECT_EQ(initial.ids[1], *runtime->VariableId(u"Plant", u"State"));
    EXPECT_EQ(initial.values[0].vt, VT_R8);
    EXPECT_EQ(initial.values[0].dblVal, 50.0);
    EXPECT_EQ(AsText(initial.values[1]), u"Off");
    EXPECT_EQ(std::floor(initial.times[0]), LocalToday()) << "time stamps are local OLE DATEs of today";

    // A set value arrives alone, with its 64-bit status split in two words.
    sink->ClearCalls();
    const ULONGLONG status = 0x0000000580000007ull;
    ASSERT_TRUE(runtime->SetValue(u"Plant", u"State", CComVariant(u"On"), status, 45000.25));
    ASSERT_EQ(sink->CallCount(), 1u);
    BulkChange one = ReadBulkChange(sink->Calls()[0]);
    ASSERT_EQ(one.ids.size(), 1u);
    EXPECT_EQ(AsText(one.values[0]), u"On");
    EXPECT_EQ(one.lows[0], static_cast<double>(0x80000007u));
    EXPECT_EQ(one.highs[0], 5.0);
    EXPECT_EQ(one.times[0], 45000.25);

    // The arguments come by reference, as VT_VARIANT|VT_BYREF.
    auto raw = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    bool byReference = false;
    struct ByRefProbe final : CDispatchObject {
        bool* seen;
        explicit ByRefProbe(bool* s) : seen(s) {}
        HRESULT Invoke(DISPID, WORD, DISPPARAMS* p, VARIANT*, EXCEPINFO*) override {
            *seen = p && p->cArgs == 6 && p->rgvarg[0].vt == (VT_VARIANT | VT_BYREF);
            return S_OK;
        }
        IUnknown* FindInterface(REFIID iid) override {
            return iid == DIID_IOnlineVariableEvents ? static_cast<IDispatch*>(this)
                                                     : CDispatchObject::FindInterface(iid);
        }
    };
    auto probe = MakeComObject<ByRefProbe>(&byReference);
    ASSERT_NE(Advise(container.Get(), DIID_IOnlineVariableEvents, probe.Get()), 0u);
    runtime->SetValue(u"Plant", u"Level", CComVariant(1.5));
    EXPECT_TRUE(byReference);
}

TEST_F(TarvoEvents, ContainerReportsOnlyItsNamesWhileStartedAndActive) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    CComPtr<IDispatch> container = OpenContainer(plant.Get(), u"Gw", {u"Level"}, false);
    auto sink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    ASSERT_NE(Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get()), 0u);

    runtime->SetValue(u"Plant", u"Level", CComVariant(1.0));  // not started yet
    runtime->Tick();
    EXPECT_EQ(sink->CallCount(), 0u);

    CallMethodOrThrow(container.Get(), ContainerStart);
    runtime->Tick();  // current values
    sink->ClearCalls();
    runtime->SetValue(u"Plant", u"State", CComVariant(u"x"));     // not added
    runtime->SetValue(u"Utilities", u"Power", CComVariant(3.0));  // another project
    runtime->SetValue(u"Plant", u"Level", CComVariant(2.0));
    ASSERT_EQ(sink->CallCount(), 1u);
    EXPECT_EQ(ReadBulkChange(sink->Calls()[0]).values[0].dblVal, 2.0);

    // Inactive: nothing, not even the generators' changes.
    sink->ClearCalls();
    runtime->SetProjectActive(u"Plant", false);
    CallMethodOrThrow(container.Get(), ContainerAdd, u"Count");
    runtime->SetValue(u"Plant", u"Level", CComVariant(3.0));
    runtime->Tick();
    runtime->Tick();
    EXPECT_EQ(sink->CallCount(), 0u);
    // Active again: the current values of every name at the next tick.
    runtime->SetProjectActive(u"Plant", true);
    runtime->Tick();
    ASSERT_EQ(sink->CallCount(), 1u);
    BulkChange all = ReadBulkChange(sink->Calls()[0]);
    ASSERT_EQ(all.values.size(), 2u);
    EXPECT_EQ(all.values[0].dblVal, 3.0);

    // Stopped: nothing; removed: nothing of that name.
    sink->ClearCalls();
    CallMethodOrThrow(container.Get(), ContainerStop);
    runtime->SetValue(u"Plant", u"Level", CComVariant(4.0));
    EXPECT_EQ(sink->CallCount(), 0u);
    CallMethodOrThrow(container.Get(), ContainerStart);
    runtime->Tick();
    sink->ClearCalls();
    CallMethodOrThrow(container.Get(), ContainerRemove, u"Level");
    runtime->SetValue(u"Plant", u"Level", CComVariant(5.0));
    EXPECT_EQ(sink->CallCount(), 0u);
}

TEST_F(TarvoEvents, ProjectActiveAndInactive) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    auto sink = MakeComObject<RecordingSink>(DIID_IProjectEvents);
    const DWORD cookie = Advise(plant.Get(), DIID_IProjectEvents, sink.Get());
    ASSERT_NE(cookie, 0u);
    EXPECT_EQ(runtime->ProjectSinks(u"Plant"), 1u);
    ASSERT_TRUE(runtime->SetProjectActive(u"Plant", false));
    ASSERT_TRUE(runtime->SetProjectActive(u"Plant", true));
    EXPECT_FALSE(runtime->SetProjectActive(u"Nothing", true));
    const auto calls = sink->Calls();
    ASSERT_EQ(calls.size(), 2u);
    EXPECT_EQ(calls[0].member, EventProjectInactive);
    EXPECT_EQ(calls[1].member, EventProjectActive);
    EXPECT_TRUE(calls[0].args.empty());

    EXPECT_EQ(Unadvise(plant.Get(), DIID_IProjectEvents, cookie), S_OK);
    EXPECT_EQ(Unadvise(plant.Get(), DIID_IProjectEvents, cookie), CONNECT_E_NOCONNECTION);
    EXPECT_EQ(runtime->ProjectSinks(u"Plant"), 0u);
    EXPECT_EQ(sink->RefCount(), 1u);
}

TEST_F(TarvoEvents, DeliveryThreads) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    CComPtr<IDispatch> container = OpenContainer(plant.Get(), u"Gw", {u"Level"});
    auto sink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    auto projectSink = MakeComObject<RecordingSink>(DIID_IProjectEvents);
    ASSERT_NE(Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get()), 0u);
    ASSERT_NE(Advise(plant.Get(), DIID_IProjectEvents, projectSink.Get()), 0u);
    runtime->Tick();

    runtime->SetDelivery(tarvo::Delivery::OwnThread);
    runtime->SetValue(u"Plant", u"Level", CComVariant(7.0));
    runtime->SetProjectActive(u"Plant", true);
    runtime->Flush();
    ASSERT_EQ(sink->CallCount(), 2u);
    ASSERT_EQ(projectSink->CallCount(), 1u);
    const std::thread::id runtimeThread = sink->Calls()[1].thread;
    EXPECT_EQ(sink->Calls()[0].thread, std::this_thread::get_id());
    EXPECT_NE(runtimeThread, std::this_thread::get_id());
    EXPECT_EQ(projectSink->Calls()[0].thread, runtimeThread);

    runtime->SetDelivery(tarvo::Delivery::CallerThread);
    runtime->SetValue(u"Plant", u"Level", CComVariant(8.0));
    ASSERT_EQ(sink->CallCount(), 3u);
    EXPECT_EQ(sink->Calls()[2].thread, std::this_thread::get_id());
}

TEST_F(TarvoEvents, RawBulkChangeArrivesAsGiven) {
    CComPtr<IDispatch> plant = Project(u"Plant");
    CComPtr<IDispatch> container = OpenContainer(plant.Get(), u"Gw", {u"Level"}, false);
    auto sink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    ASSERT_NE(Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get()), 0u);

    // Ids with lower bound 1, a shorter value array of texts, a null value.
    CComVariant ids;
    ids.vt = VT_ARRAY | VT_R8;
    ids.parray = SafeArrayCreateVector(VT_R8, 1, 3);
    CComVariant values;
    values.vt = VT_ARRAY | VT_BSTR;
    values.parray = SafeArrayCreateVector(VT_BSTR, 0, 1);
    CComVariant null;
    null.vt = VT_NULL;
    const std::vector<CComVariant> args{CComVariant(3), ids, values, null, CComVariant(u"x"), CComVariant()};
    ASSERT_TRUE(runtime->FireRawBulkChange(u"Plant", u"Gw", args, false));
    ASSERT_TRUE(runtime->FireRawBulkChange(u"Plant", u"", {CComVariant(1)}, true));  // even a wrong count
    EXPECT_FALSE(runtime->FireRawBulkChange(u"Plant", u"Nothing", args));
    EXPECT_FALSE(runtime->FireRawBulkChange(u"Nothing", u"", args));

    const auto calls = sink->Calls();
    ASSERT_EQ(calls.size(), 2u);
    ASSERT_EQ(calls[0].args.size(), 6u);
    EXPECT_EQ(calls[0].args[1].parray->lLbound, 1);
    EXPECT_EQ(calls[0].args[1].parray->cElements, 3u);
    EXPECT_EQ(calls[0].args[2].vt, VT_ARRAY | VT_BSTR);
    EXPECT_EQ(calls[0].args[3].vt, VT_NULL);
    EXPECT_EQ(calls[0].args[5].vt, VT_EMPTY);
    EXPECT_EQ(calls[1].args.size(), 1u);
}

TEST(TarvoSimulation, GeneratorsChangeValuesEveryPeriod) {
    tarvo::RuntimeConfig config;
    tarvo::ProjectConfig project;
    project.name = u"Sim";
    auto add = [&](const char16_t* name, tarvo::GeneratorKind kind, auto setUp) {
        tarvo::VariableConfig v;
        v.name = name;
        v.generator.kind = kind;
        v.generator.periodMs = 100;
        setUp(v);
        project.variables.push_back(v);
    };
    add(u"Ramp", tarvo::GeneratorKind::Ramp, [](auto& v) {
        v.generator.step = 4;
        v.generator.maximum = 10;
    });
    add(u"Text", tarvo::GeneratorKind::TextCycle, [](auto& v) {
        v.isText = true;
        v.text = u"b";
        v.generator.texts = {u"a", u"b", u"c"};
    });
    add(u"Flip", tarvo::GeneratorKind::StatusFlip, [](auto& v) {
        v.status = 1;
        v.generator.alternateStatus = 1ull << 40;
    });
    add(u"Walk", tarvo::GeneratorKind::RandomWalk, [](auto& v) {
        v.number = 5;
        v.generator.step = 3;
        v.generator.minimum = 0;
        v.generator.maximum = 6;
    });
    add(u"Sine", tarvo::GeneratorKind::Sine, [](auto& v) {
        v.generator.amplitude = 2;
        v.generator.offset = 10;
        v.generator.cycleMs = 400;
    });
    add(u"Slow", tarvo::GeneratorKind::Counter, [](auto& v) { v.generator.periodMs = 200; });
    config.projects = {project};
    tarvo::Runtime sim(config, {tarvo::Delivery::CallerThread, false});
    ASSERT_TRUE(sim.Start());
    auto sink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    {
        CComPtr<IDispatch> container =
            OpenContainer(Project(u"Sim").Get(), u"Gw", {u"Ramp", u"Text", u"Flip", u"Walk", u"Sine", u"Slow"});
        ASSERT_NE(Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get()), 0u);
    }
    std::vector<BulkChange> ticks;
    for (int i = 0; i < 6; ++i) {
        sink->ClearCalls();
        sim.Tick();
        ASSERT_EQ(sink->CallCount(), 1u) << "tick " << i;
        ticks.push_back(ReadBulkChange(sink->Calls()[0]));
    }
    // The first tick carries all six; the slow counter changes at 200, 400 and 600 ms.
    for (size_t i = 0; i < ticks.size(); ++i) EXPECT_EQ(ticks[i].ids.size(), i == 0 || i % 2 == 1 ? 6u : 5u) << i;
    std::vector<double> ramp;
    std::vector<std::u16string> texts;
    std::vector<double> highs;
    for (const BulkChange& t : ticks) {
        ramp.push_back(t.values[0].dblVal);
        texts.push_back(AsText(t.values[1]));
        highs.push_back(t.highs[2]);
        EXPECT_GE(t.values[3].dblVal, 0.0);
        EXPECT_LE(t.values[3].dblVal, 6.0);
        EXPECT_GE(t.values[4].dblVal, 8.0);
        EXPECT_LE(t.values[4].dblVal, 12.0);
    }
    EXPECT_EQ(ramp, (std::vector<double>{4, 8, 0, 4, 8, 0}));
    EXPECT_EQ(texts, (std::vector<std::u16string>{u"c", u"a", u"b", u"c", u"a", u"b"}));
    EXPECT_EQ(highs, (std::vector<double>{256, 0, 256, 0, 256, 0}));
    EXPECT_EQ(ticks[1].values[4].dblVal, 10.0);  // the sine crosses its offset at half the cycle
    EXPECT_EQ(ticks[3].values[5].dblVal, 2.0);   // the slow counter at its second change
}

// 1,000 variables at 50,000 changes/s, ticks of 10 ms: 500 changes in every
// tick, each variable once per 20 ms, and the runtime counts what it fired
// (the first tick's current values included).
TEST(TarvoSimulation, RateIsSpreadEvenlyOverTheTicksUntilTheStop) {
    tarvo::RuntimeConfig config;
    std::string error;
    ASSERT_TRUE(tarvo::ParseProjectJson(R"({"tick_ms": 10, "projects": [{"name": "Fast", "variables": [
        {"name": "V{n}", "repeat": 1000, "rate": 50000, "generator": {"kind": "counter", "stop_ms": 110}}]}]})",
                                        &config, &error))
        << error;
    tarvo::Runtime sim(config, {tarvo::Delivery::CallerThread, false});
    ASSERT_TRUE(sim.Start());
    auto sink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    std::vector<std::u16string> names;
    for (int n = 1; n <= 1000; ++n) {
        const std::string name = "V" + std::to_string(n);
        names.emplace_back(name.begin(), name.end());
    }
    CComPtr<IDispatch> container = OpenContainer(Project(u"Fast").Get(), u"Gw", names);
    ASSERT_NE(Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get()), 0u);
    sim.Tick();  // the first tick sends every current value
    EXPECT_EQ(ReadBulkChange(sink->Calls()[0]).ids.size(), 1000u);
    std::vector<double> perVariable(1000, 0.0);
    for (int tick = 0; tick < 10; ++tick) {
        sink->ClearCalls();
        sim.Tick();
        ASSERT_EQ(sink->CallCount(), 1u) << "tick " << tick;
        const BulkChange change = ReadBulkChange(sink->Calls()[0]);
        EXPECT_EQ(change.ids.size(), 500u) << "tick " << tick;
        for (size_t k = 0; k < change.ids.size(); ++k)
            perVariable[static_cast<size_t>(change.ids[k]) - 1] = change.values[k].dblVal;
    }
    // 110 ms of simulated time: the first half changed first at 0.02 to 10 ms,
    // six times since; the second half at 10.02 to 20 ms, five times.
    for (size_t n = 0; n < perVariable.size(); ++n) EXPECT_EQ(perVariable[n], n < 500 ? 6.0 : 5.0) << n;
    EXPECT_EQ(sim.ChangesFired(), 1000u + 10u * 500u);
    sink->ClearCalls();
    sim.Tick();  // 120 ms: past stop_ms
    EXPECT_EQ(sink->CallCount(), 0u);
    EXPECT_EQ(sim.ChangesFired(), 1000u + 10u * 500u);
}

TEST(TarvoSimulation, ChangesComeFromTheRuntimeThread) {
    tarvo::RuntimeConfig config = SmallPlant();
    config.tickMs = 5;
    config.projects[0].variables[2].generator.periodMs = 5;
    tarvo::Runtime runtime(config);
    ASSERT_TRUE(runtime.Start());
    auto sink = MakeComObject<RecordingSink>(DIID_IOnlineVariableEvents);
    CComPtr<IDispatch> container = OpenContainer(Project(u"Plant").Get(), u"Gw", {u"Count"});
    ASSERT_NE(Advise(container.Get(), DIID_IOnlineVariableEvents, sink.Get()), 0u);
    ASSERT_TRUE(sink->WaitForCalls(4)) << "the simulation sent nothing";
    runtime.Stop();
    const auto calls = sink->Calls();
    double last = -1;
    for (const auto& call : calls) {
        EXPECT_NE(call.thread, std::this_thread::get_id());
        const BulkChange change = ReadBulkChange(call);
        ASSERT_EQ(change.values.size(), 1u);
        EXPECT_GT(change.values[0].dblVal, last) << "a counter only goes up";
        last = change.values[0].dblVal;
    }
    EXPECT_EQ(sink->RefCount(), 1u);
}
