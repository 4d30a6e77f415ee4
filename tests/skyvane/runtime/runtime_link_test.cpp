// The runtime link against the runtime stand-in: subscription, bulk changes,
// the per-project queue and project switches.
#include "runtime/MultipleOnlVarsPerPrj.h"

#include "platform/ticks.h"
#include "tarvo/Control.h"

#include "BulkArrays.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <mutex>
#include <thread>
#include <vector>

namespace {

using tarvo::Delivery;

// Records what the runtime link reports, as the bridge would receive it.
class RecordingTarget : public IOnlVariablesPerProjectNotification {
public:
    struct Change {
        CString project;
        DWORD id;
        ULONGLONG status;
        VARTYPE vt;
        double number;
        CString text;
        CVarItem** cell;
    };

    ~RecordingTarget() override {
        for (STarvoVarValue* kept : keptRecords) delete kept;
    }

    void OnValueChange(const CString& project, STarvoVarValue*& value) override {
        std::lock_guard<std::mutex> guard(lock);
        const VARIANT& v = value->vValue;
        changes.push_back({project, value->dwId, value->qwStatus, v.vt, v.vt == VT_R8 ? v.dblVal : 0.0,
                           v.vt == VT_BSTR ? CString(v.bstrVal) : CString(), value->ppHolder});
        if (keepNext) {
            keepNext = false;
            keptRecords.push_back(value);
            value = nullptr;
        }
    }
    void OnProjectDeactivated(const CString& project) override { Note(deactivated, project); }
    void OnProjectActivated(const CString& project) override { Note(activated, project); }
    void OnProjectInactiveFailed(const CString& project) override { Note(inactiveFailed, project); }
    void OnProjectActiveFailed(const CString& project) override { Note(activeFailed, project); }
    void OnValueQueueFull(CString project, DWORD id) override {
        std::lock_guard<std::mutex> guard(lock);
        queueFull.push_back(id);
        (void)project;
    }

    size_t ChangeCount() {
        std::lock_guard<std::mutex> guard(lock);
        return changes.size();
    }

    std::mutex lock;  // guards everything below
    std::vector<Change> changes;
    std::vector<CString> deactivated, activated, inactiveFailed, activeFailed;
    std::vector<DWORD> queueFull;
    std::vector<STarvoVarValue*> keptRecords;
    bool keepNext = false;

private:
    void Note(std::vector<CString>& list, const CString& project) {
        std::lock_guard<std::mutex> guard(lock);
        list.push_back(project);
    }
};

tarvo::VariableConfig Number(const char16_t* name, double value) {
    tarvo::VariableConfig v;
    v.name = name;
    v.number = value;
    return v;
}

tarvo::RuntimeConfig PlantConfig() {
    tarvo::RuntimeConfig config;
    tarvo::ProjectConfig plant;
    plant.name = u"Plant";
    for (const char16_t* name : {u"Level", u"Temp", u"Tank#Level", u"Flow", u"Pressure", u"Speed"})
        plant.variables.push_back(Number(name, 1.0));
    tarvo::VariableConfig text;
    text.name = u"Mode";
    text.isText = true;
    text.text = u"auto";
    plant.variables.push_back(text);
    tarvo::ProjectConfig line;
    line.name = u"Line2";
    line.variables = {Number(u"Speed", 2.0), Number(u"Torque", 3.0)};
    config.projects = {plant, line};
    return config;
}

// Holder cells as the bridge makes them; the link never reads through them.
CVarItem** NewCell(std::uintptr_t tag) { return new CVarItem*(reinterpret_cast<CVarItem*>(tag)); }

class RuntimeLink : public ::testing::Test {
protected:
    void SetUp() override {
        tarvo::RuntimeOptions options;
        options.delivery = Delivery::CallerThread;
        options.simulate = false;
        runtime = std::make_unique<tarvo::Runtime>(PlantConfig(), options);
        std::string error;
        ASSERT_TRUE(runtime->Start(&error)) << error;
    }
    void TearDown() override {
        manager.Reset();
        runtime.reset();
        EXPECT_EQ(tarvo::Runtime::LiveObjects(), 0) << "automation objects leaked";
    }

    void MakeManager(DWORD timeoutMs = 2000) { manager = VX_CreateCounted<CMultipleOnlVarsPerPrj>(&target, CString(), timeoutMs); }

    // Subscribes keys; returns how many were accepted. Refused cells are deleted here.
    int Subscribe(std::initializer_list<const char16_t*> keys) {
        int accepted = 0;
        for (const char16_t* key : keys) {
            CVarItem** cell = NewCell(reinterpret_cast<std::uintptr_t>(key));
            if (manager->AddVariable(key, cell)) ++accepted;
            else delete cell;
        }
        return accepted;
    }

    LONG Id(const char16_t* project, const char16_t* variable) { return runtime->VariableId(project, variable).value_or(-1); }

    CXOnlVarsPerProject* Project(const char16_t* name) {
        auto it = manager->Projects().find(name);
        return it == manager->Projects().end() ? nullptr : it->second.Get();
    }

    // Fires a bulk change with the given ids (values 10, 11, ...; status low = index, high = 1).
    void FireIds(const char16_t* project, const std::vector<double>& ids) {
        std::vector<double> values, lows, highs, times;
        for (size_t i = 0; i < ids.size(); ++i) {
            values.push_back(10.0 + static_cast<double>(i));
            lows.push_back(static_cast<double>(i));
            highs.push_back(1.0);
            times.push_back(45000.5);
        }
        ASSERT_TRUE(runtime->FireRawBulkChange(project, u"", {CComVariant(static_cast<int>(ids.size())), ArrayOf(VT_R8, 0, ids),
                                                           ArrayOf(VT_VARIANT, 0, values), ArrayOf(VT_R8, 0, lows),
                                                           ArrayOf(VT_R8, 0, highs), ArrayOf(VT_R8, 0, times)}));
    }

    RecordingTarget target;
    std::unique_ptr<tarvo::Runtime> runtime;
    VX_KeepRefCmdPtr<CMultipleOnlVarsPerPrj> manager;
};

}  // namespace

TEST(VariableKey, SplitsAtTheFirstHash) {
    CString project, variable;
    SplitVariableKey(u"Plant#Tank#Level", u"", project, variable);
    EXPECT_EQ(project, CString(u"Plant"));
    EXPECT_EQ(variable, CString(u"Tank#Level"));
    SplitVariableKey(u"Level", u"", project, variable);
    EXPECT_EQ(project, CString());
    EXPECT_EQ(variable, CString(u"Level"));
    SplitVariableKey(u"#Level", u"Default", project, variable);
    EXPECT_EQ(project, CString(u"Default"));
    EXPECT_EQ(variable, CString(u"Level"));
}

TEST_F(RuntimeLink, SubscribesPerProjectAndRefusesUnknownOrRepeatedNames) {
    MakeManager();
    EXPECT_EQ(Subscribe({u"Plant#Level", u"Plant#Tank#Level", u"Line2#Speed"}), 3);
    EXPECT_EQ(manager->Projects().size(), 2u);
    EXPECT_EQ(runtime->ProjectSinks(u"Plant"), 1u);  // two keys, one attach

    EXPECT_EQ(Subscribe({u"Plant#NoSuchVariable", u"Plant#Level", u"Nowhere#Level", u"Level"}), 0);
    EXPECT_EQ(manager->Projects().size(), 2u);  // no per-project object for a project that is not there

    runtime->SetProjectLookupFails(true);
    EXPECT_EQ(Subscribe({u"Line3#X"}), 0);
}

TEST_F(RuntimeLink, StartSubscribesNamesInOrderAndSetsTheLimitOnce) {
    MakeManager();
    EXPECT_TRUE(manager->Start());  // nothing to start
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Plant#Tank#Level", u"Plant#Flow"}), 3);
    ASSERT_TRUE(manager->Start());
    const auto containers = runtime->Containers(u"Plant");
    ASSERT_EQ(containers.size(), 1u);
    EXPECT_TRUE(containers[0].started);
    EXPECT_EQ(containers[0].variables, (std::vector<std::u16string>{u"Level", u"Tank#Level", u"Flow"}));
    EXPECT_TRUE(CString(containers[0].name.c_str()).Find(u"_GwOnl") > 0);
    EXPECT_EQ(Project(u"Plant")->GetQueueLimit(), 12);

    Subscribe({u"Plant#Speed"});
    ASSERT_TRUE(manager->Start());
    EXPECT_EQ(Project(u"Plant")->GetQueueLimit(), 12);  // kept from the first start
}

TEST_F(RuntimeLink, ContainerNamesDifferPerProjectObject) {
    MakeManager();
    Subscribe({u"Plant#Level", u"Line2#Speed"});
    EXPECT_NE(Project(u"Plant")->GetContainerName(), Project(u"Line2")->GetContainerName());
    const CString plant = Project(u"Plant")->GetContainerName(), line = Project(u"Line2")->GetContainerName();
    EXPECT_NE(plant.Left(plant.Find(u'_')), line.Left(line.Find(u'_')));  // the object's address
}

TEST_F(RuntimeLink, OneFailingProjectDropsEveryProject) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Line2#Speed", u"Plant#Level", u"Plant#Flow"}), 3);
    runtime->SetRefusedName(u"Level");  // Plant's container refuses it
    EXPECT_FALSE(manager->Start());
    EXPECT_TRUE(manager->Projects().empty());
    EXPECT_TRUE(runtime->Containers(u"Line2").empty());  // the one that had started is gone from the runtime too
    EXPECT_TRUE(runtime->Containers(u"Plant").empty());

    runtime->ClearFaults();
    Subscribe({u"Plant#Level"});
    runtime->SetStartFails(true);
    EXPECT_FALSE(manager->Start());
    EXPECT_TRUE(manager->Projects().empty());
}

TEST_F(RuntimeLink, BulkChangeQueuesSubscribedElementsInOrder) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Plant#Flow"}), 2);
    ASSERT_TRUE(manager->Start());
    FireIds(u"Plant", {double(Id(u"Plant", u"Level")), double(Id(u"Plant", u"Temp")), double(Id(u"Plant", u"Flow"))});
    EXPECT_EQ(Project(u"Plant")->GetQueuedCount(), 2);
    target.keepNext = true;  // the bridge takes the first record over
    manager->ProcessPending();
    ASSERT_EQ(target.changes.size(), 2u);
    EXPECT_EQ(target.changes[0].id, static_cast<DWORD>(Id(u"Plant", u"Level")));
    EXPECT_EQ(target.changes[0].number, 10.0);
    EXPECT_EQ(target.changes[0].status, (1ULL << 32) | 0u);
    EXPECT_EQ(target.changes[1].id, static_cast<DWORD>(Id(u"Plant", u"Flow")));
    EXPECT_EQ(target.changes[1].number, 12.0);
    EXPECT_EQ(target.changes[1].status, (1ULL << 32) | 2u);
    EXPECT_EQ(target.changes[1].project, CString(u"Plant"));
    // The kept record is still whole (ASan would report it freed).
    ASSERT_EQ(target.keptRecords.size(), 1u);
    EXPECT_EQ(target.keptRecords[0]->vValue.dblVal, 10.0);
    EXPECT_EQ(Project(u"Plant")->GetQueuedCount(), 0);
}

TEST_F(RuntimeLink, ValuesFromTheRuntimeArriveWithTheirHolderCell) {
    MakeManager();
    CVarItem** cell = NewCell(0xC0FFEE);
    ASSERT_TRUE(manager->AddVariable(u"Plant#Mode", cell));
    ASSERT_TRUE(manager->Start());
    ASSERT_TRUE(runtime->SetValue(u"Plant", u"Mode", CComVariant(u"manual"), 0x100000002ULL, 45000.25));
    manager->ProcessPending();
    ASSERT_EQ(target.changes.size(), 1u);
    EXPECT_EQ(target.changes[0].vt, VT_BSTR);
    EXPECT_EQ(target.changes[0].text, CString(u"manual"));
    EXPECT_EQ(target.changes[0].status, 0x100000002ULL);
    EXPECT_EQ(target.changes[0].cell, cell);
}

TEST_F(RuntimeLink, QueueLimitTakesOneMoreThenRefuses) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Plant#Temp", u"Plant#Flow", u"Plant#Pressure", u"Plant#Speed"}), 5);
    ASSERT_TRUE(manager->Start());
    ASSERT_EQ(Project(u"Plant")->GetQueueLimit(), 20);
    const double level = Id(u"Plant", u"Level");
    FireIds(u"Plant", std::vector<double>(22, level));
    EXPECT_EQ(Project(u"Plant")->GetQueuedCount(), 21);
    EXPECT_EQ(target.queueFull, (std::vector<DWORD>{static_cast<DWORD>(level)}));
}

TEST(PerProjectQueue, LimitZeroHasNoBoundAndNullValuesArriveEmpty) {
    RecordingTarget target;
    auto project = VX_CreateCounted<CXOnlVarsPerProject>(&target, 2000, 0);
    CVarItem* item = nullptr;
    for (int i = 0; i < 500; ++i) project->OnVariableChange(7.9, nullptr, 1, 0, 0, &item);
    EXPECT_EQ(project->GetQueuedCount(), 500);
    project->ProcessPending();
    ASSERT_EQ(target.changes.size(), 500u);
    EXPECT_EQ(target.changes[0].id, 7u);  // truncated
    EXPECT_EQ(target.changes[0].vt, VT_EMPTY);
    EXPECT_TRUE(target.queueFull.empty());

    // Ids and status words that are no numbers at all do not crash the queue.
    project->OnVariableChange(std::nan(""), nullptr, 1e300, -1e300, 0, &item);
    project->ProcessPending();
    EXPECT_EQ(target.changes.back().id, 0u);
}

TEST_F(RuntimeLink, DeactivationDiscardsAndStopsThenActivationResubscribes) {
    runtime->SetDelivery(Delivery::OwnThread);
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Plant#Tank#Level", u"Plant#Flow"}), 3);
    ASSERT_TRUE(manager->Start());
    const auto before = runtime->Containers(u"Plant");
    FireIds(u"Plant", {double(Id(u"Plant", u"Level"))});
    runtime->Flush();
    ASSERT_EQ(Project(u"Plant")->GetQueuedCount(), 1);

    ASSERT_TRUE(runtime->SetProjectActive(u"Plant", false));  // its handler waits for our tick
    const ULONGLONG end = GetTickCount64() + 3000;
    while (Project(u"Plant")->GetPendingCommand() != CXOnlVarsPerProject::kDeactivate && GetTickCount64() < end) Sleep(1);
    manager->ProcessPending();
    runtime->Flush();
    ASSERT_EQ(target.deactivated.size(), 1u);
    EXPECT_TRUE(target.inactiveFailed.empty());
    EXPECT_TRUE(target.changes.empty());  // discarded, not forwarded
    auto stopped = runtime->Containers(u"Plant");
    ASSERT_EQ(stopped.size(), 1u);
    EXPECT_FALSE(stopped[0].started);
    EXPECT_TRUE(stopped[0].variables.empty());

    ASSERT_TRUE(runtime->SetProjectActive(u"Plant", true));
    runtime->Flush();
    manager->ProcessPending();
    EXPECT_EQ(target.activated.size(), 1u);
    const auto after = runtime->Containers(u"Plant");
    ASSERT_EQ(after.size(), 1u);  // the old one was deleted by name first
    EXPECT_TRUE(after[0].started);
    EXPECT_EQ(after[0].variables, before[0].variables);
}

TEST_F(RuntimeLink, ActiveOnAnotherThreadWaitsForThePendingInactive) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level"}), 1);
    ASSERT_TRUE(manager->Start());
    CXOnlVarsPerProject* plant = Project(u"Plant");
    std::thread inactive([&] { plant->OnProjectInactive(); });
    const ULONGLONG end = GetTickCount64() + 1500;
    while (plant->GetPendingCommand() != CXOnlVarsPerProject::kDeactivate && GetTickCount64() < end) Sleep(1);
    std::atomic<bool> activeDone{false};
    std::thread active([&] {
        plant->OnProjectActive();
        activeDone = true;
    });
    Sleep(120);  // the "Active" handler is polling now
    EXPECT_FALSE(activeDone);
    manager->ProcessPending();  // runs command 1
    inactive.join();
    active.join();
    EXPECT_EQ(plant->GetPendingCommand(), CXOnlVarsPerProject::kActivate);
    manager->ProcessPending();  // runs command 2
    EXPECT_EQ(target.deactivated.size(), 1u);
    EXPECT_EQ(target.activated.size(), 1u);
    EXPECT_TRUE(target.inactiveFailed.empty());
    EXPECT_TRUE(target.activeFailed.empty());
}

TEST_F(RuntimeLink, InactiveOnTheTimerThreadFailsAtTheDeadline) {
    MakeManager(200);  // caller-thread delivery: the event arrives on the "timer" thread
    ASSERT_EQ(Subscribe({u"Plant#Level"}), 1);
    ASSERT_TRUE(manager->Start());
    const ULONGLONG start = GetTickCount64();
    ASSERT_TRUE(runtime->SetProjectActive(u"Plant", false));
    EXPECT_GE(GetTickCount64() - start, 150u);
    EXPECT_EQ(target.inactiveFailed, (std::vector<CString>{u"Plant"}));
    manager->ProcessPending();  // the stored command still runs
    EXPECT_EQ(target.deactivated.size(), 1u);
}

TEST_F(RuntimeLink, MalformedBulkArraysAreReadSafely) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Plant#Flow"}), 2);
    ASSERT_TRUE(manager->Start());
    const double level = Id(u"Plant", u"Level"), flow = Id(u"Plant", u"Flow");
    const CComVariant count(2);

    // Lower bound 1 everywhere: rebased, both delivered.
    runtime->FireRawBulkChange(u"Plant", u"", {count, ArrayOf(VT_R8, 1, {level, flow}), ArrayOf(VT_VARIANT, 1, {5, 6}),
                                               ArrayOf(VT_R8, 1, {0, 0}), ArrayOf(VT_R8, 1, {0, 0}), ArrayOf(VT_R8, 1, {1, 1})});
    // Value and time arrays shorter than the ids: only the first element is whole.
    runtime->FireRawBulkChange(u"Plant", u"", {count, ArrayOf(VT_R8, 0, {level, flow}), ArrayOf(VT_VARIANT, 0, {7}),
                                               ArrayOf(VT_R8, 0, {0, 0}), ArrayOf(VT_R8, 0, {0, 0}), ArrayOf(VT_R8, 0, {1})});
    // Wrong element types, texts for ids, empty arguments, too few arguments.
    CComVariant textIds;
    {
        SAFEARRAY* texts = SafeArrayCreateVector(VT_BSTR, 0, 1);
        LONG i = 0;
        BSTR s = SysAllocString(u"17");
        SafeArrayPutElement(texts, &i, &s);
        SysFreeString(s);
        textIds.vt = VT_ARRAY | VT_BSTR;
        textIds.parray = texts;
    }
    runtime->FireRawBulkChange(u"Plant", u"", {count, textIds, ArrayOf(VT_VARIANT, 0, {1}), ArrayOf(VT_R8, 0, {0}),
                                               ArrayOf(VT_R8, 0, {0}), ArrayOf(VT_R8, 0, {0})});
    runtime->FireRawBulkChange(u"Plant", u"", {count, CComVariant(), CComVariant(), CComVariant(), CComVariant(), CComVariant()});
    runtime->FireRawBulkChange(u"Plant", u"", {count, ArrayOf(VT_R8, 0, {level})});
    runtime->FireRawBulkChange(u"Plant", u"", {});
    // Values as a plain number array rather than variants: still read.
    runtime->FireRawBulkChange(u"Plant", u"", {count, ArrayOf(VT_R8, 0, {flow}), ArrayOf(VT_R8, 0, {9}), ArrayOf(VT_R8, 0, {0}),
                                               ArrayOf(VT_R8, 0, {0}), ArrayOf(VT_R8, 0, {0})}, false);

    manager->ProcessPending();
    ASSERT_EQ(target.changes.size(), 4u);
    EXPECT_EQ(target.changes[0].number, 5.0);
    EXPECT_EQ(target.changes[1].number, 6.0);
    EXPECT_EQ(target.changes[2].number, 7.0);
    EXPECT_EQ(target.changes[3].number, 9.0);
}

TEST_F(RuntimeLink, RuntimeThreadFiresWhileTheTimerDrains) {
    runtime->SetDelivery(Delivery::OwnThread);
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Plant#Flow"}), 2);
    ASSERT_TRUE(manager->Start());
    std::atomic<bool> produced{false};
    std::thread producer([&] {
        for (int i = 0; i < 300; ++i) {
            runtime->SetValue(u"Plant", i % 2 ? u"Flow" : u"Level", CComVariant(static_cast<double>(i)));
            if (i % 50 == 0) Sleep(1);
        }
        produced = true;
    });
    while (!produced) {  // the timer drains while the runtime's thread queues
        manager->ProcessPending();
        Sleep(1);
    }
    producer.join();
    runtime->Flush();
    manager->ProcessPending();
    // Every change is either forwarded or reported as dropped by the queue
    // limit (8); what arrives is in order per variable.
    EXPECT_GT(target.ChangeCount(), 0u);
    EXPECT_EQ(target.ChangeCount() + target.queueFull.size(), 300u);
    double lastLevel = -1;
    for (const auto& c : target.changes) {
        if (c.id != static_cast<DWORD>(Id(u"Plant", u"Level"))) continue;
        EXPECT_GT(c.number, lastLevel);
        lastLevel = c.number;
    }
}

TEST_F(RuntimeLink, StoppedRuntimeLeavesNothingBehind) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Line2#Speed"}), 2);
    ASSERT_TRUE(manager->Start());
    runtime->Stop();  // every object the link holds now fails its calls
    manager->ProcessPending();
    manager->ReleaseVariables();
    EXPECT_TRUE(manager->Projects().size() == 2u);
    manager.Reset();  // tear-down against a dead runtime: no crash, and no leak (checked in TearDown)
}

TEST_F(RuntimeLink, ReleasingVariablesDropsChangesThatReferToTheirCells) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Line2#Speed"}), 2);
    ASSERT_TRUE(manager->Start());
    FireIds(u"Line2", {double(Id(u"Line2", u"Speed"))});
    ASSERT_EQ(Project(u"Line2")->GetQueuedCount(), 1);
    manager->ReleaseVariables();  // what a deactivation of any project leads to
    EXPECT_EQ(Project(u"Line2")->GetQueuedCount(), 0);
    manager->ProcessPending();
    EXPECT_TRUE(target.changes.empty());  // no record with a freed holder cell reaches the bridge
    EXPECT_FALSE(runtime->Containers(u"Line2").at(0).started);
}

TEST_F(RuntimeLink, ValuesPassedByReferenceAreQueuedAsValues) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level"}), 1);
    ASSERT_TRUE(manager->Start());
    double live = 42.5;  // the event's own memory
    SAFEARRAY* values = SafeArrayCreateVector(VT_VARIANT, 0, 1);
    LONG index = 0;
    VARIANT byRef;
    VariantInit(&byRef);
    byRef.vt = VT_R8 | VT_BYREF;
    byRef.pdblVal = &live;
    SafeArrayPutElement(values, &index, &byRef);
    CComVariant valuesArg;
    valuesArg.vt = VT_ARRAY | VT_VARIANT;
    valuesArg.parray = values;
    ASSERT_TRUE(runtime->FireRawBulkChange(u"Plant", u"", {CComVariant(1), ArrayOf(VT_R8, 0, {double(Id(u"Plant", u"Level"))}),
                                                       valuesArg, ArrayOf(VT_R8, 0, {0}), ArrayOf(VT_R8, 0, {0}),
                                                       ArrayOf(VT_R8, 0, {0})}));
    live = -1;  // gone or changed once the event has returned
    manager->ProcessPending();
    ASSERT_EQ(target.changes.size(), 1u);
    EXPECT_EQ(target.changes[0].vt, VT_R8);
    EXPECT_EQ(target.changes[0].number, 42.5);
}

namespace {
class CountingProjectTarget : public IOnlProjectNotifications {
public:
    void OnProjectInactive() override { ++inactive; }
    void OnProjectActive() override { ++active; }
    int inactive = 0, active = 0;
};
}  // namespace

TEST(ProjectWatcher, FollowsARestartedRuntimeAfterAFailedUnadvise) {
    tarvo::RuntimeOptions options;
    options.delivery = Delivery::CallerThread;
    options.simulate = false;
    CountingProjectTarget target;
    auto watcher = VX_CreateCounted<COnlProject>(&target);
    {
        tarvo::Runtime first(PlantConfig(), options);
        ASSERT_TRUE(first.Start());
        ASSERT_TRUE(watcher->Attach(u"Plant"));
    }  // gone: unadvising at the old runtime can only fail now
    tarvo::Runtime second(PlantConfig(), options);
    ASSERT_TRUE(second.Start());
    ASSERT_TRUE(watcher->Attach(u"Plant"));  // must advise anew, not keep the dead cookie
    EXPECT_EQ(second.ProjectSinks(u"Plant"), 1u);
    second.SetProjectActive(u"Plant", false);
    EXPECT_EQ(target.inactive, 1);
    watcher.Reset();
    EXPECT_EQ(second.ProjectSinks(u"Plant"), 0u);
}
