#pragma once
// The SCADA runtime stand-in, and how tests and tools drive it.
//
// A started Runtime registers its application object in the running-object
// table under CLSID_TarvoApplication and serves the automation tables of
// TarvoIds.h. A simulation thread (the runtime's own thread) advances the
// variables' generators every tick and fires one "VariableBulkChange" per
// started container of an active project whose names changed. The control
// operations below set values and states and fire at once; injected faults
// make chosen calls fail.
//
// Threads: Start, Stop and the destructor belong to one controlling thread
// (never a sink call on the runtime's own thread); every other operation may
// be called from any thread. No lock of the runtime is held while a sink is
// called.

#include "automation/comptr.h"
#include "automation/comvariant.h"
#include "tarvo/Config.h"
#include "tarvo/TarvoIds.h"

#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace tarvo {

// Where events caused by control operations (SetValue, SetProjectActive,
// Tick, FireRawBulkChange) are delivered: on the runtime's own thread (as a
// separate server would), or on the calling thread before the operation
// returns. Changes of the simulation thread always come from the runtime's thread.
enum class Delivery { OwnThread, CallerThread };

// The automation objects, for injecting an error into one of their members.
enum class ObjectKind { Application, Projects, Project, Variables, Variable, Containers, Container };

struct RuntimeOptions {
    Delivery delivery = Delivery::OwnThread;
    bool simulate = true;  // advance the generators every tick on the runtime's thread
};

struct ContainerInfo {
    std::u16string name;
    std::vector<std::u16string> variables;  // names added, in order
    bool started = false;
    size_t sinks = 0;
};

class Runtime {
public:
    explicit Runtime(RuntimeConfig config, RuntimeOptions options = {});
    ~Runtime();  // stops
    Runtime(const Runtime&) = delete;
    Runtime& operator=(const Runtime&) = delete;

    // Checks the configuration, builds the projects afresh, registers the
    // application object and starts the runtime's thread. False (with a
    // message) for a bad configuration or when already running.
    bool Start(std::string* error = nullptr);
    // Unregisters, ends the runtime's thread (undelivered events are dropped),
    // disconnects every sink and makes every object a client still holds fail
    // its calls with RPC_E_DISCONNECTED. Objects stay valid to release.
    void Stop();
    bool IsRunning() const;

    // The application object while running (what GetActiveObject gives).
    CComPtr<IDispatch> Application() const;

    void SetDelivery(Delivery delivery);
    void SetSimulationPaused(bool paused);
    // Runs one tick of the simulation now (also while paused); its events are
    // delivered as SetDelivery says.
    bool Tick();
    // Waits until every event handed to the runtime's thread so far has been
    // delivered. Returns at once on the runtime's thread or when stopped.
    void Flush();

    // Sets a variable's value, status and time stamp and fires the change to
    // every started container of the (active) project that holds the variable.
    // Any VARIANT is taken as the value. False for an unknown project or variable.
    bool SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT& value, ULONGLONG status,
                  DATE time);
    // As above with the status kept and the current time.
    bool SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT& value);
    // Sets a variable's status (value kept, time now) and fires the change as SetValue does.
    bool SetStatus(const std::u16string& project, const std::u16string& variable, ULONGLONG status);
    // Switches a project and fires "Active" or "Inactive" (also when it already
    // was in that state). An active project sends all current values of its
    // started containers at the next tick. False for an unknown project.
    bool SetProjectActive(const std::u16string& project, bool active);
    // Fires "VariableBulkChange" with exactly these arguments (natural order,
    // any number and any types), passed by reference or by value, to the
    // sinks of one container (every container of the project when the name is
    // empty), started or not. False when no such container exists.
    bool FireRawBulkChange(const std::u16string& project, const std::u16string& container,
                           const std::vector<CComVariant>& args, bool byReference = true);

    // Faults, until switched off or ClearFaults.
    void SetRaiseError(ObjectKind object, DISPID member, bool on = true);  // the member raises an error
    void SetRefusedName(const std::u16string& variable, bool on = true);   // containers refuse to add it
    void SetStartFails(bool on);                                           // container start returns FALSE
    void SetAdviseFails(bool on);         // every Advise fails with CONNECT_E_CANNOTCONNECT
    void SetProjectLookupFails(bool on);  // project lookups give null
    void ClearFaults();

    // State for checks.
    std::vector<ContainerInfo> Containers(const std::u16string& project) const;
    std::optional<LONG> VariableId(const std::u16string& project, const std::u16string& variable) const;
    size_t ProjectSinks(const std::u16string& project) const;
    // Variable changes the simulation's ticks have fired since the start (each
    // variable of each bulk event counts once); 0 when not running.
    ULONGLONG ChangesFired() const;

    // Automation objects of every runtime in this process that are still alive.
    static long LiveObjects();

    // An automation object (CLSID_TarvoControl, ControlIds.h) that drives this
    // runtime as the operations above do, for tools in other processes. It
    // must be released before the runtime is destroyed.
    CComPtr<IDispatch> ControlObject();

private:
    struct Impl;
    std::unique_ptr<Impl> m;
};

}  // namespace tarvo
