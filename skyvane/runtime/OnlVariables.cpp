#include "runtime/OnlVariables.h"

#include "runtime/BulkChangeArrays.h"
#include "runtime/RuntimeCalls.h"

#include "tarvo/TarvoIds.h"

#include <algorithm>

COnlVariables::~COnlVariables() {
    Detach();
    CSingleLock lock(&m_csIds, true);
    m_mapIds.RemoveAll();
    m_lstNames.RemoveAll();
}

bool COnlVariables::AddVariable(IDispatch* pProject, const CString& strVariable, CVarItem** ppHolder) {
    if (!pProject) return false;
    CComPtr<IDispatch> variables = CallForObject(pProject, tarvo::dispid::ProjectVariables);
    CComPtr<IDispatch> variable =
        CallForObject(variables.Get(), tarvo::dispid::CollectionItem, strVariable.GetString());
    if (!variable) return false;
    LONG id = 0;
    // A variable whose id cannot be read could never be matched to its changes.
    if (!GetLongProperty(variable.Get(), tarvo::dispid::VariableId, &id)) return false;
    CSingleLock lock(&m_csIds, true);
    // Ids are unique within a project, so a name added before has its id in
    // the map: searching the list of names made n names cost n^2 / 2 comparisons.
    CVarItem** added = nullptr;
    if (m_mapIds.Lookup(static_cast<DWORD>(id), added)) return false;
    m_mapIds.SetAt(static_cast<DWORD>(id), ppHolder);
    m_lstNames.AddTail(strVariable);
    return true;
}

bool COnlVariables::Attach(IDispatch* pContainer) {
    if (!pContainer) return false;
    Detach();
    m_pContainer = pContainer;
    CallIgnoringResult(pContainer, tarvo::dispid::ContainerReset);
    bool ok = std::all_of(m_lstNames.begin(), m_lstNames.end(), [&](const CString& name) {
        return CallForTrue(pContainer, tarvo::dispid::ContainerAdd, name.GetString());
    });
    ok = ok && m_xOnlVariableEv.Advise(pContainer) != 0 && CallForTrue(pContainer, tarvo::dispid::ContainerStart);
    if (!ok) Detach();
    return ok;
}

void COnlVariables::Detach() {
    if (m_pContainer) {
        CallIgnoringResult(m_pContainer.Get(), tarvo::dispid::ContainerStop);
        for (const CString& name : m_lstNames)
            CallIgnoringResult(m_pContainer.Get(), tarvo::dispid::ContainerRemove, name.GetString());
        m_pContainer.Release();
    }
    m_xOnlVariableEv.Unadvise();
}

CVarItem** COnlVariables::FindCell(DWORD id) {
    CSingleLock lock(&m_csIds, true);
    CVarItem** cell = nullptr;
    return m_mapIds.Lookup(id, cell) ? cell : nullptr;
}

void COnlVariables::OnVariableBulkChange(const DispatchArgs& args) {
    if (!m_pNotify || args.Count() < tarvo::dispid::BulkChangeArgCount) return;
    const BulkChangeArrays changes(args[1], args[2], args[3], args[4], args[5]);
    for (std::uint32_t k = 0; k < changes.Count(); ++k) {
        BulkChangeArrays::Element e;
        DWORD id = 0;
        if (!changes.Get(k, &e) || !TruncatedLow32(e.id, &id)) continue;
        if (CVarItem** cell = FindCell(id)) {
            m_pNotify->OnVariableChange(e.id, e.value, e.statusLow, e.statusHigh, e.time, cell);
        }
    }
}

IID COnlVariables::XOnlVariableEv::GetEventIID() const { return DIID_IOnlineVariableEvents; }

void COnlVariables::XOnlVariableEv::OnEvent(DISPID member, const DispatchArgs& args) {
    if (member == tarvo::dispid::EventVariableBulkChange) m_pOwner->OnVariableBulkChange(args);
}
