// The module object's value queue and the worker thread that exports it.
#include "frame/MainSkyvane.h"

#include "cloud/AzureComm.h"
#include "cloud/ConnectionText.h"
#include "frame/HostMessages.h"
#include "frame/ModuleLog.h"

#include "platform/ticks.h"

namespace {

constexpr DWORD kWorkerSleepMs = 10;

// Format codes of the client library: 0 XML, 1 JSON, 2 BOND; anything else is XML.
int FormatCode(int nFormat) { return nFormat >= 0 && nFormat <= 2 ? nFormat : 0; }

}  // namespace

void CMainSkyvane::QueueValueChange(CVarItem* item) {
    if (!item) return;
    // The snapshot is made before the lock; the worker waits only for the append.
    auto snapshot = std::make_unique<CVarItem>(*item);
    {
        CSingleLock lock(&m_csQueue, true);
        if (m_lstValueQueue.GetCount() <= m_nQueueLimit) {
            m_lstValueQueue.AddTail(snapshot.release());  // the queue owns its items
            m_nQueued.store(m_lstValueQueue.GetCount(), std::memory_order_release);
            return;
        }
    }
    LogError(CString::Formatted(u"Value change queue full: Value change for %s is lost!", item->m_strName));
}

void CMainSkyvane::TakeQueuedValues(CLstOwner<CVarItem>& batch) {
    CSingleLock lock(&m_csQueue, true);
    batch.TakeAll(m_lstValueQueue);
    m_nQueued.store(0, std::memory_order_release);
}

// Once the export has stopped for good nothing sends the queue any more: its
// changes are lost, and the log says how many.
void CMainSkyvane::DiscardQueuedValues() {
    CLstOwner<CVarItem> unsent;
    TakeQueuedValues(unsent);
    if (unsent.GetCount() > 0)
        LogError(CString::Formatted(u"Export stopped: %d queued value changes were not sent and are lost",
                                    unsent.GetCount()));
}

DWORD CMainSkyvane::WorkerProc(VX_CThread* thread) {
    if (!thread) return 1;
    return static_cast<CMainSkyvane*>(thread->GetParameter())->RunWorker(*thread);
}

DWORD CMainSkyvane::RunWorker(VX_CThread& thread) {
    CAzureComm comm;
    if (!comm.Init(m_config.m_strProxyDomain, m_config.m_strProxyUser, m_config.m_strProxyPassword)) {
        LogError(u"Creating Azure Wrapper failed");
        return 2;
    }
    // The first cycle sends every current value; later ones are counted from each check.
    ULONGLONG nextIntegrity = GetTickCount64();
    while (thread.IsRunFlagSet()) {
        const ULONGLONG now = GetTickCount64();
        const bool integrity = static_cast<LONGLONG>(nextIntegrity - now) <= 0;
        if (integrity) nextIntegrity = now + static_cast<LONGLONG>(m_config.m_nIntegrityPeriod) * 1000;
        if (integrity || m_nQueued.load(std::memory_order_acquire) > 0) RunCycle(comm, integrity);
        Sleep(kWorkerSleepMs);
    }
    comm.Exit();
    return 0;
}

void CMainSkyvane::RunCycle(CAzureComm& comm, bool integrity) {
    const DWORD start = GetTickCount();
    CLstOwner<CVarItem> batch;
    TakeQueuedValues(batch);
    RowCounts cycle;
    for (const CConnection* connection : m_config.m_lstConnections) {
        SendToConnection(comm, *connection, batch, integrity, cycle);
    }
    const DWORD duration = GetTickCount() - start;
    if (HWND host = m_hHostWnd.load()) {
        ::PostMessage(host, WM_SKYVANE_STATUS, static_cast<WPARAM>(cycle.succeeded), static_cast<LPARAM>(duration));
        if (cycle.failed > 0) ::PostMessage(host, WM_SKYVANE_ROWS_FAILED, 0, 0);
    }
}

// One batch to one target: the queued rows, then, when due, every current value.
void CMainSkyvane::SendToConnection(CAzureComm& comm, const CConnection& connection, const CLstOwner<CVarItem>& batch,
                                    bool integrity, RowCounts& cycle) {
    RowCounts counts;
    if (comm.BeginOnlineRows(connection.m_strConnection, connection.m_strQueue, connection.m_bEventHub,
                             FormatCode(connection.m_nFormat))) {
        AddRows(comm, batch, integrity, counts);
        if (!comm.SendOnlineRows()) {
            counts.failed += counts.succeeded;
            counts.succeeded = 0;
        }
    } else {
        LogError(CString::Formatted(u"Starting to add Online Rows failed for '%s' Queue '%s'",
                                    MaskConnectionSecrets(connection.m_strConnection), connection.m_strQueue));
        // Without a batch the rows are lost as those of a failed send are, and counted so.
        counts.failed = CountRows(batch, integrity);
    }
    cycle.succeeded += counts.succeeded;
    cycle.failed += counts.failed;
    if (counts.failed > 0) {
        LogError(CString::Formatted(u"Adding of %d Online Rows failed for '%s' Queue '%s'", counts.failed,
                                    MaskConnectionSecrets(connection.m_strConnection), connection.m_strQueue));
    }
    if (counts.succeeded > 0 && CModuleLog::IsInfoEnabled()) {
        LogInfo(CString::Formatted(u"Adding of %d Online Rows succeeded for '%s' Queue '%s'", counts.succeeded,
                                   MaskConnectionSecrets(connection.m_strConnection), connection.m_strQueue));
    }
}

// The queued changes, then, when due, every current value.
void CMainSkyvane::AddRows(CAzureComm& comm, const CLstOwner<CVarItem>& batch, bool integrity, RowCounts& counts) {
    for (const CVarItem* item : batch) AddRow(comm, item->m_strName, *item->m_pRtData, counts);
    if (!integrity) return;
    for (const auto& [key, item] : m_config.m_mapVariables) {
        // A snapshot under the item's lock; the row is added after it is released.
        SVarItemValue current;
        {
            CSingleLock lock(&item->m_pRtData->m_cs, true);
            current = *item->m_pRtData;
        }
        AddRow(comm, item->m_strName, current, counts);
    }
}

// The rows AddRows would add.
int CMainSkyvane::CountRows(const CLstOwner<CVarItem>& batch, bool integrity) const {
    int rows = 0;
    for (const CVarItem* item : batch) rows += item->m_pRtData->m_bValid ? 1 : 0;
    if (!integrity) return rows;
    for (const auto& [key, item] : m_config.m_mapVariables) {
        CSingleLock lock(&item->m_pRtData->m_cs, true);
        rows += item->m_pRtData->m_bValid ? 1 : 0;
    }
    return rows;
}

// Rows only for values the runtime has reported; others are not counted.
void CMainSkyvane::AddRow(CAzureComm& comm, const CString& key, const SVarItemValue& data, RowCounts& counts) {
    if (!data.m_bValid) return;
    const bool added = comm.AddOnlineRow(key, data.m_dValue, data.m_strValue, data.m_bIsString, data.m_time,
                                         data.m_wMilliseconds, data.m_dwStatusLow, data.m_dwStatusHigh);
    ++(added ? counts.succeeded : counts.failed);
}
