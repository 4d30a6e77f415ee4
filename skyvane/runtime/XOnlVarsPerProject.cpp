#include "runtime/XOnlVarsPerProject.h"

#include "runtime/BulkChangeArrays.h"
#include "runtime/RuntimeCalls.h"

#include "platform/ticks.h"
#include "tarvo/TarvoIds.h"

#include <memory>

namespace {

// A copy that owns its value: a by-reference value (which points into the
// event's own memory) is copied as the value it refers to.
void CopyByValue(VARIANT* dest, const VARIANT* src) {
    if (!(src->vt & VT_BYREF)) {
        VariantCopy(dest, src);
        return;
    }
    if (!src->byref) return;
    if (src->vt == (VT_VARIANT | VT_BYREF)) {
        if (!(src->pvarVal->vt & VT_BYREF)) VariantCopy(dest, src->pvarVal);
        return;
    }
    VARIANT plain;
    VariantInit(&plain);
    const VARTYPE type = src->vt & ~VT_BYREF;
    plain.vt = type;
    if (type & VT_ARRAY) plain.parray = *src->pparray;
    else switch (type) {
        case VT_I1:
        case VT_UI1: plain.bVal = *src->pbVal; break;
        case VT_I2:
        case VT_UI2:
        case VT_BOOL: plain.iVal = *src->piVal; break;
        case VT_I4:
        case VT_UI4:
        case VT_INT:
        case VT_UINT:
        case VT_R4:
        case VT_ERROR: plain.lVal = *src->plVal; break;
        case VT_I8:
        case VT_UI8:
        case VT_R8:
        case VT_CY:
        case VT_DATE: plain.llVal = *src->pllVal; break;
        case VT_BSTR: plain.bstrVal = *src->pbstrVal; break;
        case VT_DISPATCH:
        case VT_UNKNOWN: plain.punkVal = *src->ppunkVal; break;
        default: return;
        }
    VariantCopy(dest, &plain);  // plain borrows; the copy owns
}

}  // namespace

CXOnlVarsPerProject::~CXOnlVarsPerProject() {
    RemoveContainer();
    m_pVariables.Reset();
    m_pWatcher.Reset();
    DiscardValues();
}

bool CXOnlVarsPerProject::Attach(const CString& strProject) {
    if (!m_pWatcher) CreateWatcher();
    if (m_pWatcher->Attach(strProject)) {
        m_strProject = strProject;
        return true;
    }
    m_pWatcher.Reset();
    return false;
}

bool CXOnlVarsPerProject::AddVariable(const CString& strVariable, CVarItem** ppHolder) {
    if (!m_pWatcher) return false;
    if (!m_pVariables) CreateVariables();
    return m_pVariables->AddVariable(m_pWatcher->GetProject().Get(), strVariable, ppHolder);
}

bool CXOnlVarsPerProject::Start() {
    if (!m_pWatcher) return false;
    if (!m_pVariables) return true;
    if (m_nQueueLimit == 0) m_nQueueLimit = 4 * m_pVariables->Names().GetCount();
    CComPtr<IDispatch> container = CreateContainer();
    if (m_pVariables->Attach(container.Get())) return true;
    ReleaseVariables();
    return false;
}

void CXOnlVarsPerProject::ReleaseVariables() {
    if (!m_pVariables) return;
    // No event may queue a change for these cells any more, and none queued
    // may reach the bridge after the cells are gone.
    m_pVariables->Detach();
    DiscardValues();
    m_pVariables.Reset();
}

CString CXOnlVarsPerProject::GetContainerName() const {
    return CString::Formatted(u"%p_%u_%u_GwOnl", static_cast<const void*>(this), GetCurrentThreadId(),
                              GetCurrentProcessId());
}

void CXOnlVarsPerProject::RemoveContainer() {
    if (m_pVariables) m_pVariables->Detach();
    if (!m_pWatcher) return;
    CComPtr<IDispatch> containers = CallForObject(m_pWatcher->GetProject().Get(), tarvo::dispid::ProjectContainers);
    CallIgnoringResult(containers.Get(), tarvo::dispid::ContainersDelete, GetContainerName().GetString());
}

CComPtr<IDispatch> CXOnlVarsPerProject::CreateContainer() {
    if (!m_pWatcher) return nullptr;
    RemoveContainer();
    const CString name = GetContainerName();
    CComPtr<IDispatch> containers = CallForObject(m_pWatcher->GetProject().Get(), tarvo::dispid::ProjectContainers);
    return CallForObject(containers.Get(), tarvo::dispid::ContainersCreate, name.GetString());
}

void CXOnlVarsPerProject::CreateWatcher() { m_pWatcher = VX_CreateCounted<COnlProject>(this); }

void CXOnlVarsPerProject::CreateVariables() { m_pVariables = VX_CreateCounted<COnlVariables>(this); }

// ---- Event side ------------------------------------------------------------

void CXOnlVarsPerProject::OnVariableChange(double dId, const VARIANT* pValue, double dStatusLow, double dStatusHigh,
                                           double dTime, CVarItem** ppHolder) {
    auto record = std::make_unique<STarvoVarValue>();
    DWORD low = 0, high = 0;
    TruncatedLow32(dId, &record->dwId);
    TruncatedLow32(dStatusLow, &low);
    TruncatedLow32(dStatusHigh, &high);
    record->qwStatus = (static_cast<ULONGLONG>(high) << 32) | low;
    if (pValue) CopyByValue(&record->vValue, pValue);
    record->dTime = dTime;
    record->ppHolder = ppHolder;

    CSingleLock lock(&m_mutex);
    if (!lock.Lock(m_dwTimeout)) return;
    if (m_nQueueLimit == 0 || m_lstValues.GetCount() <= m_nQueueLimit) {
        m_lstValues.AddTail(record.release());  // the queue owns its records
        return;
    }
    // Still under the queue lock: the design reports a full queue from here.
    m_pNotify->OnValueQueueFull(m_strProject, record->dwId);
}

void CXOnlVarsPerProject::OnProjectInactive() {
    if (!PostCommand(kDeactivate, true)) m_pNotify->OnProjectInactiveFailed(m_strProject);
}

void CXOnlVarsPerProject::OnProjectActive() {
    if (!PostCommand(kActivate, false)) m_pNotify->OnProjectActiveFailed(m_strProject);
}

bool CXOnlVarsPerProject::PostCommand(int nCommand, bool bWait) {
    const DWORD deadline = GetTickCount() + m_dwTimeout;
    CSingleLock lock(&m_mutex);
    if (!WaitIdle(lock, deadline)) return false;
    SetCommand(nCommand);  // still holding the lock (it is recursive): no other command slips in
    if (!bWait) return true;
    // Wait for this command to be carried out. Waiting for the mailbox to be
    // empty again would not do: a command posted by another thread right
    // after ours ran would keep it full and make ours look failed.
    const unsigned ticket = m_nCommandsRun;
    lock.Unlock();
    while (m_nCommandsRun == ticket) {
        if (static_cast<std::int32_t>(deadline - GetTickCount()) <= 0) return false;
        Sleep(50);
    }
    return true;
}

bool CXOnlVarsPerProject::WaitIdle(CSingleLock& lock, DWORD dwDeadline) {
    lock.Unlock();
    for (;;) {
        if (static_cast<std::int32_t>(dwDeadline - GetTickCount()) <= 0) return false;
        if (lock.Lock(0)) {
            if (m_nCommand == kNoCommand) return true;
            lock.Unlock();
        }
        Sleep(50);
    }
}

void CXOnlVarsPerProject::SetCommand(int nCommand) {
    CSingleLock lock(&m_mutex, true);
    m_nCommand = nCommand;
}

void CXOnlVarsPerProject::CommandDone() {
    CSingleLock lock(&m_mutex, true);
    m_nCommand = kNoCommand;
    ++m_nCommandsRun;
}

// ---- Timer side ------------------------------------------------------------

void CXOnlVarsPerProject::ProcessPending() {
    static VX_CRefCnt busy;  // one guard for every project: nested ticks do nothing
    VX_ReentranceGuard guard(busy);
    if (!guard.Entered()) return;
    switch (m_nCommand.load()) {
    case kDeactivate: Deactivate(); break;
    case kActivate: Activate(); break;
    default: break;
    }
    DrainValues();
}

void CXOnlVarsPerProject::Deactivate() {
    DiscardValues();
    if (m_pVariables) m_pVariables->Detach();
    m_pNotify->OnProjectDeactivated(m_strProject);
    CommandDone();
}

void CXOnlVarsPerProject::Activate() {
    if (m_pVariables) {
        CComPtr<IDispatch> container = CreateContainer();
        m_pVariables->Attach(container.Get());
    }
    m_pNotify->OnProjectActivated(m_strProject);
    CommandDone();
}

void CXOnlVarsPerProject::DrainValues() {
    CSingleLock lock(&m_mutex, true);
    while (!m_lstValues.IsEmpty()) {
        STarvoVarValue* record = m_lstValues.RemoveHead();
        lock.Unlock();
        m_pNotify->OnValueChange(m_strProject, record);
        delete record;  // null when the bridge took it
        lock.Lock();
    }
}

void CXOnlVarsPerProject::DiscardValues() {
    int discarded = 0;
    {
        CSingleLock lock(&m_mutex, true);
        discarded = m_lstValues.GetCount();
        m_lstValues.RemoveAll();
    }
    // Said outside the lock: the bridge writes a log record.
    if (discarded > 0) m_pNotify->OnValuesDiscarded(m_strProject, discarded);
}

int CXOnlVarsPerProject::GetQueuedCount() {
    CSingleLock lock(&m_mutex, true);
    return m_lstValues.GetCount();
}
