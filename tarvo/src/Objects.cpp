// Application, collections, projects, variables and online variable
// containers, each a dispatch object over the shared engine state. Every
// object works only while its engine runs; afterwards its calls fail with
// RPC_E_DISCONNECTED, and releasing it stays safe in any order.
#include "Objects.h"

#include "automation/dispatch_object.h"

#include <algorithm>

namespace tarvo {

namespace {

std::atomic<long> g_liveObjects{0};

class CTarvoObject : public CDispatchObject {
protected:
    CTarvoObject(std::shared_ptr<Engine> engine, ObjectKind kind) : m_engine(std::move(engine)), m_kind(kind) {
        ++g_liveObjects;
    }
    ~CTarvoObject() override { --g_liveObjects; }

    template <typename T, size_t N>
    HRESULT Dispatch(T* self, const DispatchMember<T> (&table)[N], DISPID member, WORD flags, DISPPARAMS* params,
                     VARIANT* result, EXCEPINFO* exception) {
        if (!m_engine->IsRunning()) return RPC_E_DISCONNECTED;
        try {
            m_engine->CheckFault(m_kind, member);
        } catch (const CAutomationError& error) {
            error.Fill(exception);
            return DISP_E_EXCEPTION;
        }
        return InvokeFromTable(self, table, member, flags, params, result, exception);
    }

    const std::shared_ptr<Engine> m_engine;
    const ObjectKind m_kind;
};

// An object with its own dispatch interface id and one event interface,
// offered through IConnectionPointContainer.
class CTarvoEventSource : public CTarvoObject, public IConnectionPointContainer {
public:
    HRESULT QueryInterface(REFIID iid, void** object) override { return CTarvoObject::QueryInterface(iid, object); }
    ULONG AddRef() override { return CTarvoObject::AddRef(); }
    ULONG Release() override { return CTarvoObject::Release(); }

    HRESULT FindConnectionPoint(REFIID events, IConnectionPoint** point) override {
        if (!point) return E_POINTER;
        *point = nullptr;
        if (!m_engine->IsRunning()) return RPC_E_DISCONNECTED;
        if (!(events == m_eventsIid)) return CONNECT_E_NOCONNECTION;
        *point = CComPtr<IConnectionPoint>(m_point.Get()).Detach();
        return S_OK;
    }

protected:
    CTarvoEventSource(std::shared_ptr<Engine> engine, ObjectKind kind, const IID& dispatchIid, const IID& eventsIid,
                      CComPtr<CConnectionPoint> point)
        : CTarvoObject(std::move(engine), kind), m_dispatchIid(dispatchIid), m_eventsIid(eventsIid),
          m_point(std::move(point)) {}

    IUnknown* FindInterface(REFIID iid) override {
        if (iid == m_dispatchIid) return static_cast<IDispatch*>(this);
        if (iid == IID_IConnectionPointContainer) return static_cast<IConnectionPointContainer*>(this);
        return CTarvoObject::FindInterface(iid);
    }

private:
    const IID m_dispatchIid;
    const IID m_eventsIid;
    const CComPtr<CConnectionPoint> m_point;
};

void ReturnObject(VARIANT* result, CComPtr<IDispatch> object) {
    result->vt = VT_DISPATCH;
    result->pdispVal = object.Detach();  // null: no such object
}

void ReturnBool(VARIANT* result, bool value) {
    result->vt = VT_BOOL;
    result->boolVal = value ? VARIANT_TRUE : VARIANT_FALSE;
}

void ReturnText(VARIANT* result, const std::u16string& text) {
    result->vt = VT_BSTR;
    result->bstrVal = SysAllocStringLen(text.data(), static_cast<UINT>(text.size()));
}

// The position or name that a collection's item member was given.
struct ItemKey {
    bool byName = false;
    std::u16string name;
    LONG position = 0;
};

HRESULT ReadItemKey(const DispatchArgs& args, ItemKey* key) {
    key->byName = args.IsText(0);
    return key->byName ? args.GetText(0, &key->name) : args.GetInteger(0, &key->position);
}

template <typename T, typename... Args>
CComPtr<IDispatch> Make(Args&&... args) {
    return CComPtr<IDispatch>(MakeComObject<T>(std::forward<Args>(args)...));
}

// ---- variable --------------------------------------------------------------

class CVariableObject final : public CTarvoObject {
public:
    CVariableObject(std::shared_ptr<Engine> engine, std::shared_ptr<ProjectState> project, size_t index)
        : CTarvoObject(std::move(engine), ObjectKind::Variable), m_project(std::move(project)), m_index(index) {}

    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override {
        return Dispatch(this, kMembers, member, flags, params, result, exception);
    }

private:
    // Id and name never change after the engine is built: no lock needed.
    HRESULT Id(const DispatchArgs&, VARIANT* result) {
        result->vt = VT_I4;
        result->lVal = m_project->variables[m_index].config.id;
        return S_OK;
    }
    HRESULT Name(const DispatchArgs&, VARIANT* result) {
        ReturnText(result, m_project->variables[m_index].config.name);
        return S_OK;
    }

    static constexpr DispatchMember<CVariableObject> kMembers[] = {
        {dispid::VariableId, DISPATCH_PROPERTYGET, 0, &CVariableObject::Id},
        {dispid::VariableName, DISPATCH_PROPERTYGET, 0, &CVariableObject::Name},
    };

    const std::shared_ptr<ProjectState> m_project;
    const size_t m_index;
};

// ---- variables collection --------------------------------------------------

class CVariablesObject final : public CTarvoObject {
public:
    CVariablesObject(std::shared_ptr<Engine> engine, std::shared_ptr<ProjectState> project)
        : CTarvoObject(std::move(engine), ObjectKind::Variables), m_project(std::move(project)) {}

    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override {
        return Dispatch(this, kMembers, member, flags, params, result, exception);
    }

private:
    HRESULT Count(const DispatchArgs&, VARIANT* result) {
        result->vt = VT_I4;
        result->lVal = static_cast<LONG>(m_project->variables.size());
        return S_OK;
    }
    HRESULT Item(const DispatchArgs& args, VARIANT* result) {
        ItemKey key;
        if (const HRESULT hr = ReadItemKey(args, &key); FAILED(hr)) return hr;
        size_t index = 0;
        bool found = false;
        if (key.byName) {
            const auto it = m_project->byName.find(key.name);
            found = it != m_project->byName.end();
            if (found) index = it->second;
        } else {
            found = key.position >= 0 && static_cast<size_t>(key.position) < m_project->variables.size();
            index = static_cast<size_t>(key.position);
        }
        ReturnObject(result, found ? Make<CVariableObject>(m_engine, m_project, index) : nullptr);
        return S_OK;
    }

    static constexpr DispatchMember<CVariablesObject> kMembers[] = {
        {dispid::CollectionCount, DISPATCH_PROPERTYGET, 0, &CVariablesObject::Count},
        {dispid::CollectionItem, DISPATCH_METHOD, 1, &CVariablesObject::Item},
    };

    const std::shared_ptr<ProjectState> m_project;
};

// ---- online variable container ---------------------------------------------

class CContainerObject final : public CTarvoEventSource {
public:
    CContainerObject(std::shared_ptr<Engine> engine, std::shared_ptr<ProjectState> project,
                     std::shared_ptr<ContainerState> container)
        : CTarvoEventSource(std::move(engine), ObjectKind::Container, IID_IOnlineVariable, DIID_IOnlineVariableEvents,
                            container->events),
          m_project(std::move(project)), m_container(std::move(container)) {}

    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override {
        return Dispatch(this, kMembers, member, flags, params, result, exception);
    }

private:
    // Every member works on the container's state under the engine lock.
    void CheckUsable() const {
        if (m_container->deleted) throw CAutomationError(E_FAIL, u"The container was deleted", u"Tarvo");
    }

    HRESULT Reset(const DispatchArgs&, VARIANT* result) {
        std::lock_guard lock(m_engine->m_lock);
        CheckUsable();
        m_container->members.clear();
        m_container->isMember.clear();
        m_container->started = false;
        ReturnBool(result, true);
        return S_OK;
    }
    HRESULT Add(const DispatchArgs& args, VARIANT* result) {
        std::u16string name;
        if (const HRESULT hr = args.GetText(0, &name); FAILED(hr)) return hr;
        std::lock_guard lock(m_engine->m_lock);
        CheckUsable();
        const auto it = m_project->byName.find(name);
        if (it == m_project->byName.end() || m_engine->m_faults.refusedNames.count(name)) {
            ReturnBool(result, false);
            return S_OK;
        }
        auto& isMember = m_container->isMember;
        if (isMember.size() < m_project->variables.size()) isMember.resize(m_project->variables.size());
        if (!isMember[it->second]) {
            isMember[it->second] = true;
            m_container->members.push_back(it->second);
            m_container->sendAll = true;  // a started container reports the new name's value too
        }
        ReturnBool(result, true);
        return S_OK;
    }
    HRESULT Remove(const DispatchArgs& args, VARIANT* result) {
        std::u16string name;
        if (const HRESULT hr = args.GetText(0, &name); FAILED(hr)) return hr;
        std::lock_guard lock(m_engine->m_lock);
        CheckUsable();
        const auto it = m_project->byName.find(name);
        auto& members = m_container->members;
        auto& isMember = m_container->isMember;
        const bool removed = it != m_project->byName.end() && it->second < isMember.size() && isMember[it->second];
        if (removed) {
            isMember[it->second] = false;
            members.erase(std::find(members.begin(), members.end(), it->second));
        }
        ReturnBool(result, removed);
        return S_OK;
    }
    HRESULT Start(const DispatchArgs&, VARIANT* result) {
        std::lock_guard lock(m_engine->m_lock);
        CheckUsable();
        const bool started = !m_engine->m_faults.startFails;
        if (started) {
            m_container->started = true;
            m_container->sendAll = true;  // the current values follow with the next tick
        }
        ReturnBool(result, started);
        return S_OK;
    }
    HRESULT Stop(const DispatchArgs&, VARIANT*) {
        std::lock_guard lock(m_engine->m_lock);
        CheckUsable();
        m_container->started = false;
        return S_OK;
    }

    static constexpr DispatchMember<CContainerObject> kMembers[] = {
        {dispid::ContainerReset, DISPATCH_METHOD, 0, &CContainerObject::Reset},
        {dispid::ContainerAdd, DISPATCH_METHOD, 1, &CContainerObject::Add},
        {dispid::ContainerRemove, DISPATCH_METHOD, 1, &CContainerObject::Remove},
        {dispid::ContainerStart, DISPATCH_METHOD, 0, &CContainerObject::Start},
        {dispid::ContainerStop, DISPATCH_METHOD, 0, &CContainerObject::Stop},
    };

    const std::shared_ptr<ProjectState> m_project;
    const std::shared_ptr<ContainerState> m_container;
};

// ---- containers collection -------------------------------------------------

class CContainersObject final : public CTarvoObject {
public:
    CContainersObject(std::shared_ptr<Engine> engine, std::shared_ptr<ProjectState> project)
        : CTarvoObject(std::move(engine), ObjectKind::Containers), m_project(std::move(project)) {}

    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override {
        return Dispatch(this, kMembers, member, flags, params, result, exception);
    }

private:
    HRESULT Create(const DispatchArgs& args, VARIANT* result) {
        std::u16string name;
        if (const HRESULT hr = args.GetText(0, &name); FAILED(hr)) return hr;
        if (name.empty()) throw CAutomationError(E_INVALIDARG, u"A container needs a name", u"Tarvo");
        auto container = std::make_shared<ContainerState>();
        container->name = name;
        container->events = m_engine->NewConnectionPoint(DIID_IOnlineVariableEvents);
        {
            std::lock_guard lock(m_engine->m_lock);
            if (!m_project->containers.emplace(name, container).second)
                throw CAutomationError(E_INVALIDARG, u"A container of that name exists already", u"Tarvo");
        }
        ReturnObject(result, Make<CContainerObject>(m_engine, m_project, std::move(container)));
        return S_OK;
    }
    HRESULT Delete(const DispatchArgs& args, VARIANT* result) {
        std::u16string name;
        if (const HRESULT hr = args.GetText(0, &name); FAILED(hr)) return hr;
        std::shared_ptr<ContainerState> container;
        {
            std::lock_guard lock(m_engine->m_lock);
            const auto it = m_project->containers.find(name);
            if (it != m_project->containers.end()) {
                container = it->second;
                container->deleted = true;
                container->started = false;
                m_project->containers.erase(it);
            }
        }
        if (container) container->events->Close();  // outside the lock: it releases sinks
        ReturnBool(result, container != nullptr);
        return S_OK;
    }

    static constexpr DispatchMember<CContainersObject> kMembers[] = {
        {dispid::ContainersCreate, DISPATCH_METHOD, 1, &CContainersObject::Create},
        {dispid::ContainersDelete, DISPATCH_METHOD, 1, &CContainersObject::Delete},
    };

    const std::shared_ptr<ProjectState> m_project;
};

// ---- project ---------------------------------------------------------------

class CProjectObject final : public CTarvoEventSource {
public:
    CProjectObject(std::shared_ptr<Engine> engine, std::shared_ptr<ProjectState> project)
        : CTarvoEventSource(std::move(engine), ObjectKind::Project, IID_IProject, DIID_IProjectEvents, project->events),
          m_project(std::move(project)) {}

    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override {
        return Dispatch(this, kMembers, member, flags, params, result, exception);
    }

private:
    HRESULT Name(const DispatchArgs&, VARIANT* result) {
        ReturnText(result, m_project->name);
        return S_OK;
    }
    HRESULT Variables(const DispatchArgs&, VARIANT* result) {
        ReturnObject(result, Make<CVariablesObject>(m_engine, m_project));
        return S_OK;
    }
    HRESULT Containers(const DispatchArgs&, VARIANT* result) {
        ReturnObject(result, Make<CContainersObject>(m_engine, m_project));
        return S_OK;
    }

    static constexpr DispatchMember<CProjectObject> kMembers[] = {
        {dispid::ProjectName, DISPATCH_PROPERTYGET, 0, &CProjectObject::Name},
        {dispid::ProjectVariables, DISPATCH_METHOD, 0, &CProjectObject::Variables},
        {dispid::ProjectContainers, DISPATCH_METHOD, 0, &CProjectObject::Containers},
    };

    const std::shared_ptr<ProjectState> m_project;
};

// ---- projects collection ---------------------------------------------------

class CProjectsObject final : public CTarvoObject {
public:
    explicit CProjectsObject(std::shared_ptr<Engine> engine) : CTarvoObject(std::move(engine), ObjectKind::Projects) {}

    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override {
        return Dispatch(this, kMembers, member, flags, params, result, exception);
    }

private:
    HRESULT Count(const DispatchArgs&, VARIANT* result) {
        result->vt = VT_I4;
        result->lVal = static_cast<LONG>(m_engine->Projects().size());
        return S_OK;
    }
    HRESULT Item(const DispatchArgs& args, VARIANT* result) {
        ItemKey key;
        if (const HRESULT hr = ReadItemKey(args, &key); FAILED(hr)) return hr;
        {
            std::lock_guard lock(m_engine->m_lock);
            if (m_engine->m_faults.lookupFails) {
                ReturnObject(result, nullptr);
                return S_OK;
            }
        }
        const auto& projects = m_engine->Projects();
        std::shared_ptr<ProjectState> project;
        if (key.byName) project = m_engine->FindProject(key.name);
        else if (key.position >= 0 && static_cast<size_t>(key.position) < projects.size())
            project = projects[static_cast<size_t>(key.position)];
        ReturnObject(result, project ? Make<CProjectObject>(m_engine, project) : nullptr);
        return S_OK;
    }

    static constexpr DispatchMember<CProjectsObject> kMembers[] = {
        {dispid::CollectionCount, DISPATCH_PROPERTYGET, 0, &CProjectsObject::Count},
        {dispid::CollectionItem, DISPATCH_METHOD, 1, &CProjectsObject::Item},
    };
};

// ---- application -----------------------------------------------------------

class CApplicationObject final : public CTarvoObject {
public:
    explicit CApplicationObject(std::shared_ptr<Engine> engine)
        : CTarvoObject(std::move(engine), ObjectKind::Application) {}

    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override {
        return Dispatch(this, kMembers, member, flags, params, result, exception);
    }

protected:
    IUnknown* FindInterface(REFIID iid) override {
        if (iid == IID_ITarvoApplication) return static_cast<IDispatch*>(this);
        return CTarvoObject::FindInterface(iid);
    }

private:
    HRESULT Projects(const DispatchArgs&, VARIANT* result) {
        ReturnObject(result, Make<CProjectsObject>(m_engine));
        return S_OK;
    }

    static constexpr DispatchMember<CApplicationObject> kMembers[] = {
        {dispid::ApplicationProjects, DISPATCH_METHOD, 0, &CApplicationObject::Projects},
    };
};

}  // namespace

CComPtr<IDispatch> CreateApplicationObject(std::shared_ptr<Engine> engine) {
    return Make<CApplicationObject>(std::move(engine));
}

long LiveObjectCount() { return g_liveObjects.load(); }

}  // namespace tarvo
