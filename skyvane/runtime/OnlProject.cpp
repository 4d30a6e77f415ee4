#include "runtime/OnlProject.h"

#include "runtime/RuntimeCalls.h"

#include "automation/rot.h"
#include "tarvo/TarvoIds.h"

bool GetRuntimeProjects(CComPtr<IDispatch>& projects) {
    projects.Release();
    CComPtr<IUnknown> running;
    if (FAILED(GetActiveObject(CLSID_TarvoApplication, running.Receive())) || !running) return false;
    CComPtr<IDispatch> application;
    if (FAILED(running->QueryInterface(IID_ITarvoApplication, application.ReceiveVoid())) || !application) return false;
    projects = CallForObject(application.Get(), tarvo::dispid::ApplicationProjects);
    return static_cast<bool>(projects);
}

bool COnlProject::Attach(const CString& strProject) {
    Detach();
    CComPtr<IDispatch> projects;
    if (GetRuntimeProjects(projects)) {
        m_pProject = CallForObject(projects.Get(), tarvo::dispid::CollectionItem, strProject.GetString());
    }
    if (!m_pProject) return false;
    return m_xProjectEv.Advise(m_pProject.Get()) != 0;
}

void COnlProject::Detach() {
    m_xProjectEv.Unadvise();
    m_pProject.Release();
}

IID COnlProject::XProjectEv::GetEventIID() const { return DIID_IProjectEvents; }

void COnlProject::XProjectEv::OnEvent(DISPID member, const DispatchArgs&) {
    IOnlProjectNotifications* notify = m_pOwner->m_pNotify;
    if (!notify) return;
    if (member == tarvo::dispid::EventProjectActive) notify->OnProjectActive();
    else if (member == tarvo::dispid::EventProjectInactive) notify->OnProjectInactive();
}
