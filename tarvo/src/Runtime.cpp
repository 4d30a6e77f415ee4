#include "Engine.h"
#include "Objects.h"

#include "automation/rot.h"

#include <chrono>
#include <condition_variable>
#include <deque>
#include <thread>

namespace tarvo {

struct Runtime::Impl {
    RuntimeConfig config;
    const bool simulate;

    DWORD registration = 0;  // used by the controlling thread only
    std::thread thread;      // used by the controlling thread only

    // The runtime's thread and what it is handed.
    mutable std::mutex queueLock;       // guards everything down to the end of this block
    std::shared_ptr<Engine> engine;     // set while running
    CComPtr<IDispatch> application;     // set while running
    std::condition_variable wake;       // new events, a change of pause, or the end
    std::condition_variable delivered;  // m_delivered moved on
    std::deque<std::vector<Event>> queue;
    ULONGLONG queued = 0;          // event batches handed to the thread so far
    ULONGLONG deliveredCount = 0;  // of those, delivered (or dropped at the end)
    bool paused = false;
    bool threadRunning = false;
    bool stopping = false;
    Delivery delivery;
    std::thread::id threadId;

    Impl(RuntimeConfig c, RuntimeOptions options)
        : config(std::move(c)), simulate(options.simulate), delivery(options.delivery) {}

    void Run();
    // Delivers on this thread or hands over to the runtime's thread.
    void Dispatch(std::vector<Event> events);
    std::shared_ptr<Engine> CurrentEngine() const {
        std::lock_guard lock(queueLock);
        return engine;
    }
};

void Runtime::Impl::Run() {
    using Clock = std::chrono::steady_clock;
    const auto tick = std::chrono::milliseconds(config.tickMs);
    auto nextTick = Clock::now() + tick;
    std::unique_lock lock(queueLock);
    threadId = std::this_thread::get_id();
    while (!stopping) {
        wake.wait_until(lock, nextTick, [&] { return stopping || !queue.empty(); });
        if (stopping) break;
        if (!queue.empty()) {
            std::vector<Event> events = std::move(queue.front());
            queue.pop_front();
            lock.unlock();
            for (Event& event : events) event.Deliver();
            events.clear();  // arguments freed before the batch counts as delivered
            lock.lock();
            ++deliveredCount;
            delivered.notify_all();
            continue;
        }
        if (Clock::now() < nextTick) continue;
        nextTick += tick;
        if (nextTick < Clock::now()) nextTick = Clock::now() + tick;  // fell behind: do not catch up in bursts
        if (!simulate || paused) continue;
        const auto current = engine;
        lock.unlock();
        std::vector<Event> events = current->Tick(config.tickMs);
        for (Event& event : events) event.Deliver();
        events.clear();
        lock.lock();
    }
    // Whatever was not delivered is dropped; waiting Flush calls return.
    deliveredCount = queued;
    queue.clear();
    delivered.notify_all();
}

void Runtime::Impl::Dispatch(std::vector<Event> events) {
    if (events.empty()) return;
    {
        std::lock_guard lock(queueLock);
        if (delivery == Delivery::OwnThread && threadRunning && !stopping) {
            queue.push_back(std::move(events));
            ++queued;
            wake.notify_all();
            return;
        }
    }
    for (Event& event : events) event.Deliver();
}

Runtime::Runtime(RuntimeConfig config, RuntimeOptions options)
    : m(std::make_unique<Impl>(std::move(config), options)) {}

Runtime::~Runtime() { Stop(); }

bool Runtime::Start(std::string* error) {
    std::string message;
    if (IsRunning()) message = "the runtime is running already";
    else ValidateConfig(m->config, &message);
    if (!message.empty()) {
        if (error) *error = message;
        return false;
    }
    auto engine = Engine::Create(m->config);
    CComPtr<IDispatch> application = CreateApplicationObject(engine);
    {
        std::lock_guard lock(m->queueLock);
        m->engine = engine;
        m->application = application;
        m->stopping = false;
        m->threadRunning = true;
        m->queue.clear();
    }
    m->thread = std::thread([impl = m.get()] { impl->Run(); });
    RegisterActiveObject(application.Get(), CLSID_TarvoApplication, &m->registration);
    return true;
}

void Runtime::Stop() {
    if (!m->thread.joinable()) return;
    RevokeActiveObject(m->registration);
    m->registration = 0;
    {
        std::lock_guard lock(m->queueLock);
        m->stopping = true;
        m->wake.notify_all();
    }
    m->thread.join();
    {
        std::lock_guard lock(m->queueLock);
        m->threadRunning = false;
        m->threadId = {};
    }
    std::shared_ptr<Engine> engine;
    CComPtr<IDispatch> application;  // released after the lock
    {
        std::lock_guard lock(m->queueLock);
        engine = std::exchange(m->engine, nullptr);  // objects clients still hold keep its state alive
        application = std::exchange(m->application, nullptr);
    }
    engine->Shutdown();
}

bool Runtime::IsRunning() const { return m->CurrentEngine() != nullptr; }

CComPtr<IDispatch> Runtime::Application() const {
    std::lock_guard lock(m->queueLock);
    return m->application;
}

void Runtime::SetDelivery(Delivery delivery) {
    std::lock_guard lock(m->queueLock);
    m->delivery = delivery;
}

void Runtime::SetSimulationPaused(bool paused) {
    std::lock_guard lock(m->queueLock);
    m->paused = paused;
}

bool Runtime::Tick() {
    const auto engine = m->CurrentEngine();
    if (!engine) return false;
    m->Dispatch(engine->Tick(m->config.tickMs));
    return true;
}

void Runtime::Flush() {
    std::unique_lock lock(m->queueLock);
    if (std::this_thread::get_id() == m->threadId) return;
    const ULONGLONG target = m->queued;
    m->delivered.wait(lock, [&] { return m->deliveredCount >= target; });
}

bool Runtime::SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT& value,
                       ULONGLONG status, DATE time) {
    const auto engine = m->CurrentEngine();
    std::vector<Event> events;
    if (!engine || !engine->SetValue(project, variable, &value, &status, time, &events)) return false;
    m->Dispatch(std::move(events));
    return true;
}

bool Runtime::SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT& value) {
    const auto engine = m->CurrentEngine();
    std::vector<Event> events;
    if (!engine || !engine->SetValue(project, variable, &value, nullptr, NowAsOleDate(), &events)) return false;
    m->Dispatch(std::move(events));
    return true;
}

bool Runtime::SetStatus(const std::u16string& project, const std::u16string& variable, ULONGLONG status) {
    const auto engine = m->CurrentEngine();
    std::vector<Event> events;
    if (!engine || !engine->SetValue(project, variable, nullptr, &status, NowAsOleDate(), &events)) return false;
    m->Dispatch(std::move(events));
    return true;
}

bool Runtime::SetProjectActive(const std::u16string& project, bool active) {
    const auto engine = m->CurrentEngine();
    std::vector<Event> events;
    if (!engine || !engine->SetProjectActive(project, active, &events)) return false;
    m->Dispatch(std::move(events));
    return true;
}

bool Runtime::FireRawBulkChange(const std::u16string& project, const std::u16string& container,
                                const std::vector<CComVariant>& args, bool byReference) {
    const auto engine = m->CurrentEngine();
    std::vector<Event> events;
    if (!engine || !engine->RawBulkChange(project, container, args, byReference, &events)) return false;
    m->Dispatch(std::move(events));
    return true;
}

namespace {

// Changes the fault switches of a running engine.
template <typename Change>
void ChangeFaults(const std::shared_ptr<Engine>& engine, Change change) {
    if (!engine) return;
    std::lock_guard lock(engine->m_lock);
    change(engine->m_faults);
}

}  // namespace

void Runtime::SetRaiseError(ObjectKind object, DISPID member, bool on) {
    ChangeFaults(m->CurrentEngine(), [&](Faults& f) {
        if (on) f.raise.insert({object, member});
        else f.raise.erase({object, member});
    });
}

void Runtime::SetRefusedName(const std::u16string& variable, bool on) {
    ChangeFaults(m->CurrentEngine(), [&](Faults& f) {
        if (on) f.refusedNames.insert(variable);
        else f.refusedNames.erase(variable);
    });
}

void Runtime::SetStartFails(bool on) {
    ChangeFaults(m->CurrentEngine(), [&](Faults& f) { f.startFails = on; });
}

void Runtime::SetAdviseFails(bool on) {
    ChangeFaults(m->CurrentEngine(), [&](Faults& f) { f.adviseFails = on; });
}

void Runtime::SetProjectLookupFails(bool on) {
    ChangeFaults(m->CurrentEngine(), [&](Faults& f) { f.lookupFails = on; });
}

void Runtime::ClearFaults() {
    ChangeFaults(m->CurrentEngine(), [](Faults& f) { f = Faults{}; });
}

std::vector<ContainerInfo> Runtime::Containers(const std::u16string& projectName) const {
    std::vector<ContainerInfo> list;
    const auto engine = m->CurrentEngine();
    const auto project = engine ? engine->FindProject(projectName) : nullptr;
    if (!project) return list;
    std::vector<CComPtr<CConnectionPoint>> points;
    {
        std::lock_guard lock(engine->m_lock);
        for (const auto& [name, container] : project->containers) {
            ContainerInfo info{name, {}, container->started, 0};
            for (size_t index : container->members) info.variables.push_back(project->variables[index].config.name);
            list.push_back(std::move(info));
            points.push_back(container->events);
        }
    }
    // Connection points have their own lock, never taken under the engine's.
    for (size_t i = 0; i < list.size(); ++i) list[i].sinks = points[i]->ConnectionCount();
    return list;
}

std::optional<LONG> Runtime::VariableId(const std::u16string& projectName, const std::u16string& variable) const {
    const auto engine = m->CurrentEngine();
    const auto project = engine ? engine->FindProject(projectName) : nullptr;
    if (!project) return std::nullopt;
    const auto it = project->byName.find(variable);
    if (it == project->byName.end()) return std::nullopt;
    return project->variables[it->second].config.id;
}

size_t Runtime::ProjectSinks(const std::u16string& projectName) const {
    const auto engine = m->CurrentEngine();
    const auto project = engine ? engine->FindProject(projectName) : nullptr;
    return project ? project->events->ConnectionCount() : 0;
}

ULONGLONG Runtime::ChangesFired() const {
    const auto engine = m->CurrentEngine();
    return engine ? engine->m_changesFired.load(std::memory_order_relaxed) : 0;
}

long Runtime::LiveObjects() { return LiveObjectCount(); }

}  // namespace tarvo
