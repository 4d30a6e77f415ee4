#pragma once
// The runtime's state: projects, variables, containers and fault switches,
// shared by the automation objects and the control side.

#include "automation/connection.h"
#include "tarvo/Control.h"

#include <atomic>
#include <map>
#include <memory>
#include <mutex>
#include <random>
#include <set>
#include <deque>
#include <unordered_map>
#include <utility>

namespace tarvo {

// OLE DATE of the current local time, with milliseconds.
DATE NowAsOleDate();

struct VariableState {
    VariableConfig config;
    CComVariant value;
    ULONGLONG status = 0;
    DATE time = 0;
    // Generator state
    double number = 0;
    size_t textIndex = 0;
    double nextChangeMs = 0;
    std::mt19937 random;
    bool dirty = false;  // changed by the generator this tick
};

struct ContainerState {
    std::u16string name;
    // Variable indices in order of adding; a deque, since clients take names
    // out in the order they added them. isMember (by variable index) answers
    // "is it a member" for containers of 100,000 names.
    std::deque<size_t> members;
    std::vector<bool> isMember;
    bool started = false;
    bool sendAll = false;  // send every member's current value at the next tick
    bool deleted = false;
    CComPtr<CConnectionPoint> events;
};

struct ProjectState {
    std::u16string name;
    bool active = true;
    std::vector<VariableState> variables;
    std::unordered_map<std::u16string, size_t> byName;  // fixed after construction
    std::map<std::u16string, std::shared_ptr<ContainerState>> containers;
    CComPtr<CConnectionPoint> events;
};

// Generators: the first state of a variable, and one step at simulated time
// nowMs; true when the variable changed.
void StartGenerator(VariableState& variable);
bool AdvanceGenerator(VariableState& variable, ULONGLONG nowMs);

// One event to fire: a member of a connection point's event interface with
// its arguments in natural order, owned here.
struct Event {
    CComPtr<CConnectionPoint> target;
    DISPID member = 0;
    std::vector<CComVariant> args;
    bool byReference = true;

    void Deliver();
};

// The "VariableBulkChange" of some variables of a project.
Event MakeBulkEvent(const CComPtr<CConnectionPoint>& target, const ProjectState& project,
                    const std::vector<size_t>& members);

struct Faults {
    std::set<std::pair<ObjectKind, DISPID>> raise;
    std::set<std::u16string> refusedNames;
    bool startFails = false;
    bool adviseFails = false;
    bool lookupFails = false;
};

class Engine : public std::enable_shared_from_this<Engine> {
public:
    // Builds the projects of a validated configuration.
    static std::shared_ptr<Engine> Create(const RuntimeConfig& config);

    // Stops every container, ends every connection and makes objects fail.
    void Shutdown();
    bool IsRunning() const { return m_running.load(); }

    // Raises the injected error of a member, if any.
    void CheckFault(ObjectKind object, DISPID member) const;

    // Advances the simulated clock and the generators by one tick; the events
    // of the started containers whose names changed.
    std::vector<Event> Tick(DWORD tickMs);
    // A null value keeps the variable's value (a change of status only).
    bool SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT* value,
                  const ULONGLONG* status, DATE time, std::vector<Event>* events);
    bool SetProjectActive(const std::u16string& project, bool active, std::vector<Event>* events);
    bool RawBulkChange(const std::u16string& project, const std::u16string& container,
                       const std::vector<CComVariant>& args, bool byReference, std::vector<Event>* events);

    // Projects are fixed after construction; their mutable parts need m_lock.
    const std::vector<std::shared_ptr<ProjectState>>& Projects() const { return m_projects; }
    std::shared_ptr<ProjectState> FindProject(const std::u16string& name) const;

    // The lock over every mutable part of the projects, their variables and
    // containers, the fault switches and the simulated clock. Never held while
    // a sink is called or while a connection point's own lock is taken.
    mutable std::mutex m_lock;
    Faults m_faults;              // guarded by m_lock
    ULONGLONG m_simulatedMs = 0;  // guarded by m_lock
    // Changes fired by the simulation (one per variable per event), read without the lock.
    std::atomic<ULONGLONG> m_changesFired{0};

    // A connection point whose advises fail while the advise fault is on.
    CComPtr<CConnectionPoint> NewConnectionPoint(REFIID events);

private:
    Engine() = default;

    std::atomic<bool> m_running{true};
    std::vector<std::shared_ptr<ProjectState>> m_projects;
};

}  // namespace tarvo
