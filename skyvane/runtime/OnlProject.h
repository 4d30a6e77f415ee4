#pragma once
// Finding the running runtime, and watching one of its projects.

#include "runtime/EventSink.h"
#include "runtime/RuntimeNotifications.h"

#include "platform/object.h"

// Empties projects; then finds the running runtime and stores its projects
// collection there. False when the runtime is not running or does not answer.
bool GetRuntimeProjects(CComPtr<IDispatch>& projects);

// Watcher of one runtime project: follows its "Active" and "Inactive" events.
class COnlProject : public CCmdTarget {
public:
    explicit COnlProject(IOnlProjectNotifications* pNotify) : m_xProjectEv(this), m_pNotify(pNotify) {}
    ~COnlProject() override { Detach(); }

    // Looks the project up by name and advises on its events.
    bool Attach(const CString& strProject);
    void Detach();
    // The runtime project (with a reference of its own), null while detached.
    CComPtr<IDispatch> GetProject() const { return m_pProject; }

    class XProjectEv final : public XEvents {
    public:
        explicit XProjectEv(COnlProject* owner) : m_pOwner(owner) {}
        ~XProjectEv() override { Unadvise(); }
        IID GetEventIID() const override;

    protected:
        void OnEvent(DISPID member, const DispatchArgs& args) override;

    private:
        COnlProject* m_pOwner;
    };

private:
    XProjectEv m_xProjectEv;
    CComPtr<IDispatch> m_pProject;
    IOnlProjectNotifications* m_pNotify;
};
