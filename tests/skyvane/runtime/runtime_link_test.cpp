// The runtime link against the runtime stand-in: subscription, bulk changes,
// the per-project queue and project switches. Every fixture case runs twice:
// with the runtime in this process, and with a tarvo-runtime process reached
// through the local-socket transport.
#include "runtime/MultipleOnlVarsPerPrj.h"

#include "automation/local_socket.h"
#include "platform/ticks.h"
#include "tarvo/Control.h"
#include "tarvo/RemoteControl.h"

#include "runtime_process.h"
#include "temp_folder.h"

#include "BulkArrays.h"
#include "ManualTicks.h"

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
    void OnValuesDiscarded(const CString& project, int count) override {
        std::lock_guard<std::mutex> guard(lock);
        discarded.push_back({project, count});
    }

    size_t ChangeCount() {
        std::lock_guard<std::mutex> guard(lock);
        return changes.size();
    }

    std::mutex lock;  // guards everything below
    std::vector<Change> changes;
    std::vector<CString> deactivated, activated, inactiveFailed, activeFailed;
    std::vector<DWORD> queueFull;
    std::vector<std::pair<CString, int>> discarded;  // every report of queued changes thrown away
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

// What the cases drive: the runtime in this process, or one in another
// process through its control object. Both offer the same operations.
class RuntimeDriver {
public:
    virtual ~RuntimeDriver() = default;
    virtual bool SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT& value) = 0;
    virtual bool SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT& value,
                          ULONGLONG status, DATE time) = 0;
    virtual bool SetProjectActive(const std::u16string& project, bool active) = 0;
    virtual bool FireRawBulkChange(const std::u16string& project, const std::u16string& container,
                                   const std::vector<CComVariant>& args, bool byReference = true) = 0;
    virtual void SetRefusedName(const std::u16string& variable) = 0;
    virtual void SetStartFails(bool on) = 0;
    virtual void SetProjectLookupFails(bool on) = 0;
    virtual void ClearFaults() = 0;
    virtual void SetDelivery(Delivery delivery) = 0;
    virtual void Flush() = 0;
    virtual std::vector<tarvo::ContainerInfo> Containers(const std::u16string& project) = 0;
    virtual std::optional<LONG> VariableId(const std::u16string& project, const std::u16string& variable) = 0;
    virtual size_t ProjectSinks(const std::u16string& project) = 0;
    // Stops the runtime: every object the link holds fails from then on.
    virtual void Stop() = 0;
    // Ends the runtime and starts a new one, as a restart on the plant would.
    virtual bool Restart() = 0;
    // Checks that the link gave every runtime object back.
    virtual void ExpectNoObjectsLeft() = 0;
};

template <typename T>
class DriverOf : public RuntimeDriver {
public:
    bool SetValue(const std::u16string& p, const std::u16string& v, const VARIANT& value) override {
        return Target().SetValue(p, v, value);
    }
    bool SetValue(const std::u16string& p, const std::u16string& v, const VARIANT& value, ULONGLONG status,
                  DATE time) override {
        return Target().SetValue(p, v, value, status, time);
    }
    bool SetProjectActive(const std::u16string& p, bool active) override {
        return Target().SetProjectActive(p, active);
    }
    bool FireRawBulkChange(const std::u16string& p, const std::u16string& c, const std::vector<CComVariant>& args,
                           bool byReference) override {
        return Target().FireRawBulkChange(p, c, args, byReference);
    }
    void SetRefusedName(const std::u16string& v) override { Target().SetRefusedName(v, true); }
    void SetStartFails(bool on) override { Target().SetStartFails(on); }
    void SetProjectLookupFails(bool on) override { Target().SetProjectLookupFails(on); }
    void ClearFaults() override { Target().ClearFaults(); }
    void SetDelivery(Delivery delivery) override { Target().SetDelivery(delivery); }
    void Flush() override { Target().Flush(); }
    std::vector<tarvo::ContainerInfo> Containers(const std::u16string& p) override { return Target().Containers(p); }
    std::optional<LONG> VariableId(const std::u16string& p, const std::u16string& v) override {
        return Target().VariableId(p, v);
    }
    size_t ProjectSinks(const std::u16string& p) override { return Target().ProjectSinks(p); }

protected:
    virtual T& Target() = 0;
};

class InProcessRuntime final : public DriverOf<tarvo::Runtime> {
public:
    InProcessRuntime() { started = Restart(); }
    void Stop() override { m_runtime->Stop(); }
    bool Restart() override {
        m_runtime.reset();
        tarvo::RuntimeOptions options;
        options.delivery = Delivery::CallerThread;
        options.simulate = false;
        m_runtime = std::make_unique<tarvo::Runtime>(PlantConfig(), options);
        std::string error;
        const bool ok = m_runtime->Start(&error);
        EXPECT_TRUE(ok) << error;
        return ok;
    }
    void ExpectNoObjectsLeft() override {
        m_runtime.reset();
        EXPECT_EQ(tarvo::Runtime::LiveObjects(), 0) << "automation objects leaked";
    }
    bool started = false;

protected:
    tarvo::Runtime& Target() override { return *m_runtime; }

private:
    std::unique_ptr<tarvo::Runtime> m_runtime;
};

// PlantConfig as a project file.
constexpr const char* kPlantJson = R"({"projects": [
  {"name": "Plant", "variables": [
    {"name": "Level", "value": 1}, {"name": "Temp", "value": 1}, {"name": "Tank#Level", "value": 1},
    {"name": "Flow", "value": 1}, {"name": "Pressure", "value": 1}, {"name": "Speed", "value": 1},
    {"name": "Mode", "type": "text", "value": "auto"}]},
  {"name": "Line2", "variables": [{"name": "Speed", "value": 2}, {"name": "Torque", "value": 3}]}]})";

// A tarvo-runtime process on a socket folder of its own, found by the link
// through the local-socket source while this object lives.
class SocketRuntime final : public DriverOf<tarvo::RemoteControl> {
public:
    SocketRuntime() {
        LocalSocketOptions options;
        options.folder = m_folder.Path("sockets");
        m_source = AddRunningObjectSource(CreateLocalSocketSource(options));
        started = Launch();
    }
    ~SocketRuntime() override {
        m_control.reset();
        m_process.Stop();
        RemoveRunningObjectSource(m_source);
        EXPECT_EQ(LocalSocketProxyCount(), 0) << "proxies leaked";
    }
    // Starts a (new) runtime process, paused, delivering on the calling thread.
    bool Launch() {
        m_control.reset();
        const std::string project = m_folder.Write("plant.json", kPlantJson);
        if (!m_process.Start(project, m_folder.Path("sockets"), {"--paused"})) {
            ADD_FAILURE() << "tarvo-runtime did not start: " << m_process.Output();
            return false;
        }
        m_control = std::make_unique<tarvo::RemoteControl>(tarvo::RemoteControl::Find());
        if (m_control->SetDelivery(Delivery::CallerThread)) return true;
        ADD_FAILURE() << "no control object: status " << std::hex << m_control->LastStatus() << "; "
                      << m_process.Output();
        return false;
    }
    bool Restart() override {
        m_control.reset();
        m_process.Kill(SIGKILL);
        return Launch();
    }
    void Stop() override {
        m_control.reset();
        EXPECT_TRUE(m_process.Stop()) << m_process.Output();
    }
    void ExpectNoObjectsLeft() override {
        if (!m_control) return;
        // A call on the application's connection comes after the link's releases
        // there; then only the application object itself is left.
        CComPtr<IUnknown> application;
        ASSERT_EQ(GetActiveObject(CLSID_TarvoApplication, application.Receive()), S_OK);
        application.Release();
        ASSERT_EQ(GetActiveObject(CLSID_TarvoApplication, application.Receive()), S_OK);
        application.Release();
        EXPECT_EQ(m_control->LiveObjects(), 1) << "automation objects leaked";
    }
    bool started = false;

protected:
    tarvo::RemoteControl& Target() override { return *m_control; }

private:
    TempFolder m_folder;
    RuntimeProcess m_process;
    DWORD m_source = 0;
    std::unique_ptr<tarvo::RemoteControl> m_control;
};

enum class Transport { InProcess, LocalSocket };

class RuntimeLink : public ::testing::TestWithParam<Transport> {
protected:
    void SetUp() override {
        if (GetParam() == Transport::InProcess) {
            auto local = std::make_unique<InProcessRuntime>();
            ASSERT_TRUE(local->started);
            runtime = std::move(local);
        } else {
            auto remote = std::make_unique<SocketRuntime>();
            ASSERT_TRUE(remote->started);
            runtime = std::move(remote);
        }
    }
    void TearDown() override {
        manager.Reset();
        if (runtime) runtime->ExpectNoObjectsLeft();
        runtime.reset();
    }

    void MakeManager(DWORD timeoutMs = 2000) {
        manager = VX_CreateCounted<CMultipleOnlVarsPerPrj>(&target, CString(), timeoutMs);
    }

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

    LONG Id(const char16_t* project, const char16_t* variable) {
        return runtime->VariableId(project, variable).value_or(-1);
    }

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
        ASSERT_TRUE(runtime->FireRawBulkChange(project, u"",
                                               {CComVariant(static_cast<int>(ids.size())), ArrayOf(VT_R8, 0, ids),
                                                ArrayOf(VT_VARIANT, 0, values), ArrayOf(VT_R8, 0, lows),
                                                ArrayOf(VT_R8, 0, highs), ArrayOf(VT_R8, 0, times)}));
    }

    RecordingTarget target;
    std::unique_ptr<RuntimeDriver> runtime;
    VX_KeepRefCmdPtr<CMultipleOnlVarsPerPrj> manager;
};

}  // namespace

INSTANTIATE_TEST_SUITE_P(Transports, RuntimeLink, ::testing::Values(Transport::InProcess, Transport::LocalSocket),
                         [](const auto& info) {
                             return info.param == Transport::InProcess ? "InProcess" : "LocalSocket";
                         });

TEST(VariableKey, SplitsAtTheFirstHash) {
    const struct {
        const char16_t *key, *defaultProject, *project, *variable;
    } cases[] = {
        {u"Plant#Tank#Level", u"", u"Plant", u"Tank#Level"},
        {u"Level", u"", u"", u"Level"},
        {u"#Level", u"Default", u"Default", u"Level"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(CString(c.key).ToUtf8());
        CString project = u"stale", variable = u"stale";
        SplitVariableKey(c.key, c.defaultProject, project, variable);
        EXPECT_EQ(project, CString(c.project));
        EXPECT_EQ(variable, CString(c.variable));
    }
}

TEST_P(RuntimeLink, SubscribesPerProjectAndRefusesUnknownOrRepeatedNames) {
    MakeManager();
    EXPECT_EQ(Subscribe({u"Plant#Level", u"Plant#Tank#Level", u"Line2#Speed"}), 3);
    EXPECT_EQ(manager->Projects().size(), 2u);
    EXPECT_EQ(runtime->ProjectSinks(u"Plant"), 1u);  // two keys, one attach

    EXPECT_EQ(Subscribe({u"Plant#NoSuchVariable", u"Plant#Level", u"Nowhere#Level", u"Level"}), 0);
    EXPECT_EQ(manager->Projects().size(), 2u);  // no per-project object for a project that is not there

    runtime->SetProjectLookupFails(true);
    EXPECT_EQ(Subscribe({u"Line3#X"}), 0);
}

TEST_P(RuntimeLink, StartSubscribesNamesInOrderAndSetsTheLimitOnce) {
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

TEST_P(RuntimeLink, ContainerNamesDifferPerProjectObject) {
    MakeManager();
    Subscribe({u"Plant#Level", u"Line2#Speed"});
    const CString plant = Project(u"Plant")->GetContainerName(), line = Project(u"Line2")->GetContainerName();
    EXPECT_NE(plant.Left(plant.Find(u'_')), line.Left(line.Find(u'_')));  // the object's address
}

TEST_P(RuntimeLink, OneFailingProjectDropsEveryProject) {
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

TEST_P(RuntimeLink, BulkChangeQueuesSubscribedElementsInOrder) {
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

TEST_P(RuntimeLink, ValuesFromTheRuntimeArriveWithTheirHolderCell) {
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

TEST_P(RuntimeLink, QueueLimitTakesOneMoreThenRefuses) {
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

TEST_P(RuntimeLink, DeactivationDiscardsAndStopsThenActivationResubscribes) {
    CManualTicks ticks(CManualTicks::Sleeps::StandStill);  // the handler waits for our tick, however long
    runtime->SetDelivery(Delivery::OwnThread);
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Plant#Tank#Level", u"Plant#Flow"}), 3);
    ASSERT_TRUE(manager->Start());
    const auto before = runtime->Containers(u"Plant");
    FireIds(u"Plant", {double(Id(u"Plant", u"Level"))});
    runtime->Flush();
    ASSERT_EQ(Project(u"Plant")->GetQueuedCount(), 1);

    ASSERT_TRUE(runtime->SetProjectActive(u"Plant", false));
    ASSERT_TRUE(
        ticks.WaitUntil([&] { return Project(u"Plant")->GetPendingCommand() == CXOnlVarsPerProject::kDeactivate; }));
    manager->ProcessPending();
    runtime->Flush();
    ASSERT_EQ(target.deactivated.size(), 1u);
    EXPECT_TRUE(target.inactiveFailed.empty());
    EXPECT_TRUE(target.changes.empty());  // discarded, not forwarded
    EXPECT_EQ(target.discarded, (std::vector<std::pair<CString, int>>{{u"Plant", 1}})) << "and said so";
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

TEST_P(RuntimeLink, ActiveOnAnotherThreadWaitsForThePendingInactive) {
    CManualTicks ticks(CManualTicks::Sleeps::StandStill);  // both handlers wait as long as it takes
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level"}), 1);
    ASSERT_TRUE(manager->Start());
    CXOnlVarsPerProject* plant = Project(u"Plant");
    std::thread inactive([&] { plant->OnProjectInactive(); });
    ASSERT_TRUE(ticks.WaitUntil([&] { return plant->GetPendingCommand() == CXOnlVarsPerProject::kDeactivate; }));
    std::atomic<DWORD> activeThread{0};
    std::atomic<bool> activeDone{false};
    std::thread active([&] {
        activeThread = GetCurrentThreadId();
        plant->OnProjectActive();
        activeDone = true;
    });
    // Once the "Active" handler has slept it is polling the full mailbox.
    EXPECT_TRUE(ticks.WaitUntil([&] { return activeThread != 0 && ticks.HasSlept(activeThread); }));
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

TEST_P(RuntimeLink, InactiveOnTheTimerThreadFailsAtTheDeadline) {
    CManualTicks ticks(CManualTicks::Sleeps::MoveTheClock);  // its polls are all the time that passes
    MakeManager(230);  // caller-thread delivery: the event arrives on the "timer" thread
    ASSERT_EQ(Subscribe({u"Plant#Level"}), 1);
    ASSERT_TRUE(manager->Start());
    const ULONGLONG start = ticks.Now();
    ASSERT_TRUE(runtime->SetProjectActive(u"Plant", false));
    EXPECT_GE(ticks.Now() - start, 230u) << "not before the deadline";
    EXPECT_LT(ticks.Now() - start, 230u + 50u) << "within one poll after it";
    EXPECT_EQ(target.inactiveFailed, (std::vector<CString>{u"Plant"}));
    manager->ProcessPending();  // the stored command still runs
    EXPECT_EQ(target.deactivated.size(), 1u);
}

TEST_P(RuntimeLink, MalformedBulkArraysAreReadSafely) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Plant#Flow"}), 2);
    ASSERT_TRUE(manager->Start());
    const double level = Id(u"Plant", u"Level"), flow = Id(u"Plant", u"Flow");
    const CComVariant count(2);

    // Lower bound 1 everywhere: rebased, both delivered.
    runtime->FireRawBulkChange(u"Plant", u"",
                               {count, ArrayOf(VT_R8, 1, {level, flow}), ArrayOf(VT_VARIANT, 1, {5, 6}),
                                ArrayOf(VT_R8, 1, {0, 0}), ArrayOf(VT_R8, 1, {0, 0}), ArrayOf(VT_R8, 1, {1, 1})});
    // Value and time arrays shorter than the ids: only the first element is whole.
    runtime->FireRawBulkChange(u"Plant", u"",
                               {count, ArrayOf(VT_R8, 0, {level, flow}), ArrayOf(VT_VARIANT, 0, {7}),
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
    runtime->FireRawBulkChange(u"Plant", u"",
                               {count, textIds, ArrayOf(VT_VARIANT, 0, {1}), ArrayOf(VT_R8, 0, {0}),
                                ArrayOf(VT_R8, 0, {0}), ArrayOf(VT_R8, 0, {0})});
    runtime->FireRawBulkChange(u"Plant", u"",
                               {count, CComVariant(), CComVariant(), CComVariant(), CComVariant(), CComVariant()});
    runtime->FireRawBulkChange(u"Plant", u"", {count, ArrayOf(VT_R8, 0, {level})});
    runtime->FireRawBulkChange(u"Plant", u"", {});
    // Values as a plain number array rather than variants: still read.
    runtime->FireRawBulkChange(u"Plant", u"",
                               {count, ArrayOf(VT_R8, 0, {flow}), ArrayOf(VT_R8, 0, {9}), ArrayOf(VT_R8, 0, {0}),
                                ArrayOf(VT_R8, 0, {0}), ArrayOf(VT_R8, 0, {0})},
                               false);

    manager->ProcessPending();
    ASSERT_EQ(target.changes.size(), 4u);
    EXPECT_EQ(target.changes[0].number, 5.0);
    EXPECT_EQ(target.changes[1].number, 6.0);
    EXPECT_EQ(target.changes[2].number, 7.0);
    EXPECT_EQ(target.changes[3].number, 9.0);
}

TEST_P(RuntimeLink, RuntimeThreadFiresWhileTheTimerDrains) {
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

TEST_P(RuntimeLink, StoppedRuntimeLeavesNothingBehind) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Line2#Speed"}), 2);
    ASSERT_TRUE(manager->Start());
    runtime->Stop();  // every object the link holds now fails its calls
    manager->ProcessPending();
    manager->ReleaseVariables();
    EXPECT_EQ(manager->Projects().size(), 2u);
    manager.Reset();  // tear-down against a dead runtime: no crash, and no leak (checked in TearDown)
}

TEST_P(RuntimeLink, ReleasingVariablesDropsChangesThatReferToTheirCells) {
    MakeManager();
    ASSERT_EQ(Subscribe({u"Plant#Level", u"Line2#Speed"}), 2);
    ASSERT_TRUE(manager->Start());
    FireIds(u"Line2", {double(Id(u"Line2", u"Speed"))});
    ASSERT_EQ(Project(u"Line2")->GetQueuedCount(), 1);
    manager->ReleaseVariables();  // what a deactivation of any project leads to
    EXPECT_EQ(Project(u"Line2")->GetQueuedCount(), 0);
    manager->ProcessPending();
    EXPECT_TRUE(target.changes.empty());  // no record with a freed holder cell reaches the bridge
    EXPECT_EQ(target.discarded, (std::vector<std::pair<CString, int>>{{u"Line2", 1}}));
    EXPECT_FALSE(runtime->Containers(u"Line2").at(0).started);
}

TEST_P(RuntimeLink, ValuesPassedByReferenceAreQueuedAsValues) {
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
    ASSERT_TRUE(
        runtime->FireRawBulkChange(u"Plant", u"",
                                   {CComVariant(1), ArrayOf(VT_R8, 0, {double(Id(u"Plant", u"Level"))}), valuesArg,
                                    ArrayOf(VT_R8, 0, {0}), ArrayOf(VT_R8, 0, {0}), ArrayOf(VT_R8, 0, {0})}));
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

TEST_P(RuntimeLink, ProjectWatcherFollowsARestartedRuntimeAfterAFailedUnadvise) {
    CountingProjectTarget projectTarget;
    auto watcher = VX_CreateCounted<COnlProject>(&projectTarget);
    ASSERT_TRUE(watcher->Attach(u"Plant"));
    ASSERT_TRUE(runtime->Restart());         // gone: unadvising at the old runtime can only fail now
    ASSERT_TRUE(watcher->Attach(u"Plant"));  // must advise anew, not keep the dead cookie
    EXPECT_EQ(runtime->ProjectSinks(u"Plant"), 1u);
    runtime->SetProjectActive(u"Plant", false);  // delivered before the call returns
    EXPECT_EQ(projectTarget.inactive, 1);
    watcher.Reset();
    EXPECT_EQ(runtime->ProjectSinks(u"Plant"), 0u);
}

namespace {

// A plant whose 400 variables all change every 10 ms.
std::string LoadProjectJson() {
    return R"({"tick_ms": 10, "projects": [{"name": "Load", "variables": [
      {"name": "V{n}", "repeat": 400, "generator": {"kind": "counter", "period_ms": 10}}]}]})";
}

// Runs the module's timer (ProcessPending) until at least n more changes
// arrived or 10 s passed; true when they did.
bool ChangesFlow(CMultipleOnlVarsPerPrj* manager, RecordingTarget& target, size_t n) {
    const size_t goal = target.ChangeCount() + n;
    const ULONGLONG end = GetTickCount64() + 10000;
    while (target.ChangeCount() < goal && GetTickCount64() < end) {
        manager->ProcessPending();
        Sleep(10);  // the timer's period
    }
    return target.ChangeCount() >= goal;
}

int SubscribeLoad(CMultipleOnlVarsPerPrj* manager) {
    int accepted = 0;
    for (int i = 1; i <= 400; ++i) {
        CVarItem** cell = NewCell(static_cast<std::uintptr_t>(i));
        if (manager->AddVariable(CString(u"Load#V") + CString(std::to_string(i)), cell)) ++accepted;
        else delete cell;
    }
    return accepted;
}

}  // namespace

// The runtime process killed while its changes stream in: the link's calls
// fail at once (not at the 30 s call time-out), nothing hangs or crashes, and
// a new runtime process is attached to again.
TEST(RuntimeProcess, KilledUnderLoadThenFoundAgain) {
    TempFolder folder;
    LocalSocketOptions options;
    options.folder = folder.Path("sockets");
    const DWORD source = AddRunningObjectSource(CreateLocalSocketSource(options));
    const std::string project = folder.Write("load.json", LoadProjectJson());
    RecordingTarget target;
    {
        RuntimeProcess first;
        ASSERT_TRUE(first.Start(project, options.folder)) << first.Output();
        auto manager = VX_CreateCounted<CMultipleOnlVarsPerPrj>(&target, CString(), 2000);
        ASSERT_EQ(SubscribeLoad(manager.Get()), 400);
        ASSERT_TRUE(manager->Start());
        ASSERT_TRUE(ChangesFlow(manager.Get(), target, 4000));

        first.Kill(SIGKILL);
        const ULONGLONG start = GetTickCount64();
        manager->ProcessPending();
        manager->ReleaseVariables();
        CVarItem** cell = NewCell(1);
        EXPECT_FALSE(manager->AddVariable(u"Load#V1", cell));  // no runtime to attach to
        delete cell;
        manager.Reset();
        EXPECT_LT(GetTickCount64() - start, 5000u) << "calls waited instead of failing";
    }
    {
        RuntimeProcess second;
        ASSERT_TRUE(second.Start(project, options.folder)) << second.Output();
        auto manager = VX_CreateCounted<CMultipleOnlVarsPerPrj>(&target, CString(), 2000);
        ASSERT_EQ(SubscribeLoad(manager.Get()), 400);
        ASSERT_TRUE(manager->Start());
        EXPECT_TRUE(ChangesFlow(manager.Get(), target, 4000));
        manager.Reset();
        EXPECT_TRUE(second.Stop()) << second.Output();
    }
    RemoveRunningObjectSource(source);
    EXPECT_EQ(LocalSocketProxyCount(), 0);
}
