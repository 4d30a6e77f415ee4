#include "Engine.h"

#include "automation/error.h"

#include <chrono>
#include <ctime>

namespace tarvo {

DATE NowAsOleDate() {
    using namespace std::chrono;
    const auto now = system_clock::now();
    const std::time_t seconds = system_clock::to_time_t(now);
    const auto ms = duration_cast<milliseconds>(now.time_since_epoch()).count() % 1000;
    std::tm local{};
    localtime_r(&seconds, &local);
    const sys_days day{year{local.tm_year + 1900} / month{static_cast<unsigned>(local.tm_mon + 1)} /
                       static_cast<unsigned>(local.tm_mday)};
    const sys_days oleEpoch{year{1899} / December / 30};
    const double dayTime = local.tm_hour * 3600.0 + local.tm_min * 60.0 + local.tm_sec + (ms < 0 ? 0 : ms) / 1000.0;
    return static_cast<double>((day - oleEpoch).count()) + dayTime / 86400.0;
}

void Event::Deliver() {
    // DISPPARAMS hold the arguments last first.
    std::vector<VARIANT> lastFirst(args.size());
    for (size_t i = 0; i < args.size(); ++i) {
        VARIANT& slot = lastFirst[args.size() - 1 - i];
        if (byReference) {
            VariantInit(&slot);
            slot.vt = VT_VARIANT | VT_BYREF;
            slot.pvarVal = &args[i];
        } else {
            slot = args[i];  // shallow: the sinks get the values, these args keep owning them
        }
    }
    DISPPARAMS params{lastFirst.empty() ? nullptr : lastFirst.data(), nullptr, static_cast<UINT>(lastFirst.size()), 0};
    target->Fire(member, &params);
}

namespace {

CComVariant ArrayVariant(SAFEARRAY* array) {
    if (!array) throw std::bad_alloc();
    CComVariant v;
    v.vt = VT_ARRAY | array->vt;
    v.parray = array;
    return v;
}

}  // namespace

Event MakeBulkEvent(const CComPtr<CConnectionPoint>& target, const ProjectState& project,
                    const std::vector<size_t>& members) {
    const auto count = static_cast<std::uint32_t>(members.size());
    CComVariant ids = ArrayVariant(SafeArrayCreateVector(VT_R8, 0, count));
    CComVariant values = ArrayVariant(SafeArrayCreateVector(VT_VARIANT, 0, count));
    CComVariant lows = ArrayVariant(SafeArrayCreateVector(VT_R8, 0, count));
    CComVariant highs = ArrayVariant(SafeArrayCreateVector(VT_R8, 0, count));
    CComVariant times = ArrayVariant(SafeArrayCreateVector(VT_R8, 0, count));
    for (std::uint32_t k = 0; k < count; ++k) {
        const VariableState& v = project.variables[members[k]];
        static_cast<double*>(ids.parray->pvData)[k] = v.config.id;
        VariantCopy(&static_cast<VARIANT*>(values.parray->pvData)[k], &v.value);
        static_cast<double*>(lows.parray->pvData)[k] = static_cast<double>(v.status & 0xFFFFFFFFu);
        static_cast<double*>(highs.parray->pvData)[k] = static_cast<double>(v.status >> 32);
        static_cast<double*>(times.parray->pvData)[k] = v.time;
    }
    Event event{target, dispid::EventVariableBulkChange, {}, true};
    event.args.reserve(dispid::BulkChangeArgCount);
    event.args.emplace_back(static_cast<int>(count));
    event.args.push_back(std::move(ids));
    event.args.push_back(std::move(values));
    event.args.push_back(std::move(lows));
    event.args.push_back(std::move(highs));
    event.args.push_back(std::move(times));
    return event;
}

std::shared_ptr<Engine> Engine::Create(const RuntimeConfig& config) {
    std::shared_ptr<Engine> engine(new Engine);
    for (const ProjectConfig& projectConfig : config.projects) {
        auto project = std::make_shared<ProjectState>();
        project->name = projectConfig.name;
        project->active = projectConfig.active;
        project->events = engine->NewConnectionPoint(DIID_IProjectEvents);
        project->variables.resize(projectConfig.variables.size());
        for (size_t i = 0; i < projectConfig.variables.size(); ++i) {
            VariableState& v = project->variables[i];
            v.config = projectConfig.variables[i];
            StartGenerator(v);
            project->byName.emplace(v.config.name, i);
        }
        engine->m_projects.push_back(std::move(project));
    }
    return engine;
}

CComPtr<CConnectionPoint> Engine::NewConnectionPoint(REFIID events) {
    std::weak_ptr<Engine> weak = weak_from_this();
    return CConnectionPoint::Create(events, [weak]() -> HRESULT {
        const auto engine = weak.lock();
        if (!engine || !engine->IsRunning()) return CONNECT_E_CANNOTCONNECT;
        std::lock_guard lock(engine->m_lock);
        return engine->m_faults.adviseFails ? CONNECT_E_CANNOTCONNECT : S_OK;
    });
}

void Engine::Shutdown() {
    std::vector<CComPtr<CConnectionPoint>> points;
    {
        std::lock_guard lock(m_lock);
        m_running = false;
        for (const auto& project : m_projects) {
            points.push_back(project->events);
            for (auto& [name, container] : project->containers) {
                container->started = false;
                container->deleted = true;
                points.push_back(container->events);
            }
            project->containers.clear();
        }
    }
    // Sinks are released outside the lock: their destructors may call back.
    for (const auto& point : points) point->Close();
}

void Engine::CheckFault(ObjectKind object, DISPID member) const {
    std::lock_guard lock(m_lock);
    if (m_faults.raise.count({object, member}))
        throw CAutomationError(E_FAIL, u"Injected fault: this call raises an error", u"Tarvo");
}

std::shared_ptr<ProjectState> Engine::FindProject(const std::u16string& name) const {
    for (const auto& project : m_projects) {
        if (project->name == name) return project;
    }
    return nullptr;
}

std::vector<Event> Engine::Tick(DWORD tickMs) {
    std::vector<Event> events;
    std::lock_guard lock(m_lock);
    m_simulatedMs += tickMs;
    for (const auto& project : m_projects) {
        if (!project->active) continue;
        for (auto& v : project->variables) v.dirty = AdvanceGenerator(v, m_simulatedMs);
        for (auto& [name, container] : project->containers) {
            if (!container->started) continue;
            std::vector<size_t> changed;
            for (size_t index : container->members) {
                if (container->sendAll || project->variables[index].dirty) changed.push_back(index);
            }
            container->sendAll = false;
            if (changed.empty()) continue;
            m_changesFired.fetch_add(changed.size(), std::memory_order_relaxed);
            events.push_back(MakeBulkEvent(container->events, *project, changed));
        }
    }
    return events;
}

bool Engine::SetValue(const std::u16string& projectName, const std::u16string& variable, const VARIANT* value,
                      const ULONGLONG* status, DATE time, std::vector<Event>* events) {
    const auto project = FindProject(projectName);
    if (!project) return false;
    const auto found = project->byName.find(variable);
    if (found == project->byName.end()) return false;
    std::lock_guard lock(m_lock);
    VariableState& v = project->variables[found->second];
    if (value) {
        v.value = CComVariant(*value);
        // Generators go on from a number that was set.
        if (value->vt == VT_R8) v.number = value->dblVal;
        if (value->vt == VT_I4) v.number = value->lVal;
    }
    if (status) v.status = *status;
    v.time = time;
    if (!project->active) return true;
    for (auto& [name, container] : project->containers) {
        if (!container->started) continue;
        for (size_t index : container->members) {
            if (index == found->second) events->push_back(MakeBulkEvent(container->events, *project, {index}));
        }
    }
    return true;
}

bool Engine::SetProjectActive(const std::u16string& projectName, bool active, std::vector<Event>* events) {
    const auto project = FindProject(projectName);
    if (!project) return false;
    std::lock_guard lock(m_lock);
    project->active = active;
    if (active) {
        for (auto& [name, container] : project->containers) container->sendAll = true;
    }
    events->push_back(
        Event{project->events, active ? dispid::EventProjectActive : dispid::EventProjectInactive, {}, true});
    return true;
}

bool Engine::RawBulkChange(const std::u16string& projectName, const std::u16string& containerName,
                           const std::vector<CComVariant>& args, bool byReference, std::vector<Event>* events) {
    const auto project = FindProject(projectName);
    if (!project) return false;
    std::lock_guard lock(m_lock);
    for (auto& [name, container] : project->containers) {
        if (containerName.empty() || name == containerName)
            events->push_back(Event{container->events, dispid::EventVariableBulkChange, args, byReference});
    }
    return !events->empty();
}

}  // namespace tarvo
