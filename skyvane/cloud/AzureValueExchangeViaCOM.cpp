#include "cloud/AzureValueExchangeViaCOM.h"

#include "cloud/VarItem.h"
#include "frame/MainAzureAccess.h"
#include "runtime/OnlProject.h"

#include <memory>

namespace {

constexpr DWORD kProjectTimeoutMs = 2000;  // how long an event waits for the timer to take over a project switch

}  // namespace

CAzureValueExchangeViaCOM::~CAzureValueExchangeViaCOM() { Disconnect(); }

bool CAzureValueExchangeViaCOM::Connect() {
    m_pLink = VX_CreateCounted<CMultipleOnlVarsPerPrj>(this, CString(), kProjectTimeoutMs);
    return static_cast<bool>(m_pLink);
}

void CAzureValueExchangeViaCOM::Disconnect() { m_pLink.Reset(); }

void CAzureValueExchangeViaCOM::ProcessAllProjects() {
    if (m_pLink) m_pLink->ProcessPending();
}

bool CAzureValueExchangeViaCOM::AddVariable(CVarItem* pItem) {
    if (!m_pLink || !pItem) return false;
    auto cell = std::make_unique<CVarItem*>(pItem);
    if (!m_pLink->AddVariable(pItem->m_strName, cell.get())) return false;
    cell.release();  // the link owns the cell now
    return true;
}

bool CAzureValueExchangeViaCOM::StartLink() { return m_pLink && m_pLink->Start(); }

bool CAzureValueExchangeViaCOM::IsRuntimeReachable() {
    CComPtr<IDispatch> projects;
    return GetRuntimeProjects(projects);
}

void CAzureValueExchangeViaCOM::OnValueChange(const CString&, STarvoVarValue*& pValue) {
    if (!pValue || !pValue->ppHolder) return;
    CVarItem* item = *pValue->ppHolder;
    if (!item) return;  // the item's runtime data always exists (CVarItem keeps it for its lifetime)
    const auto low = static_cast<DWORD>(pValue->qwStatus & 0xFFFFFFFFu);
    const auto high = static_cast<DWORD>(pValue->qwStatus >> 32);
    const DATE time = pValue->dTime;
    if (item->m_pRtData->Update(&pValue->vValue, low, high, &time)) m_pMain->QueueValueChange(item);
}

void CAzureValueExchangeViaCOM::OnProjectDeactivated(const CString&) {
    if (!m_pLink) return;
    m_pLink->ReleaseVariables();
    // Releasing stops every project's export, not only the inactive one's:
    // subscribe again at once so that the other projects' values flow on.
    m_pMain->RequestVariableCheck();
}

void CAzureValueExchangeViaCOM::OnProjectActivated(const CString&) {
    // An "Active" may come without a completed deactivation (a timed-out
    // "Inactive", or two "Active" in a row); the check would then refuse
    // every still-subscribed name as a repeat.
    if (m_pLink) m_pLink->ReleaseVariables();
    m_pMain->RequestVariableCheck();
}

void CAzureValueExchangeViaCOM::OnProjectInactiveFailed(const CString& strProject) {
    m_pMain->LogError(CString::Formatted(u"Project %s inactive fail!", strProject));
}

void CAzureValueExchangeViaCOM::OnProjectActiveFailed(const CString& strProject) {
    m_pMain->LogError(CString::Formatted(u"Project %s active fail!", strProject));
}

void CAzureValueExchangeViaCOM::OnValuesDiscarded(const CString& strProject, int nCount) {
    m_pMain->LogError(CString::Formatted(u"Project %s: %d queued value changes were discarded unsent and are lost",
                                         strProject, nCount));
}

void CAzureValueExchangeViaCOM::OnValueQueueFull(CString strProject, DWORD dwId) {
    m_pMain->LogError(
        CString::Formatted(u"Value change queue full: Value change for id:%u of project:%s lost!", dwId, strProject));
}
