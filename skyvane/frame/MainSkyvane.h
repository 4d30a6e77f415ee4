#pragma once
// The module object: one per process, created when the module is loaded. It
// owns the settings, the runtime bridge, the value queue and the worker
// thread that exports the queue; its hidden window's 50 ms timer delivers
// the runtime's value changes into the queue.
//
// Threads: the window, its timer, the variable check and the body of every
// export run on the thread that loaded the module (an export called on
// another thread is handed over and waited for). The worker thread reads the
// settings only while it runs; they change only while it is stopped.

#include "cloud/AzureConfig.h"
#include "cloud/AzureValueExchangeViaCOM.h"
#include "frame/MainAccess.h"
#include "frame/MainAzureAccess.h"
#include "runtime/RefCounting.h"

#include "platform/sync.h"
#include "vxhelper/thread.h"

#include <atomic>
#include <functional>
#include <memory>

class CAzureComm;

class CMainSkyvane : public CMainAccess, public IMainAzureAccess {
public:
    static constexpr UINT_PTR kTickTimerId = 1;
    static constexpr UINT kTickMs = 50;
    static constexpr int kTickIdle = 0, kTickBusy = 1, kTickClosed = 9999;

    // Creates the hidden window on the calling thread.
    CMainSkyvane();
    ~CMainSkyvane() override;

    int Init(CConfigData* context) override;
    // Runs the settings dialog; when the settings were saved, applies them
    // as ExecAction does. Always 0.
    int Konfig(CConfigData* context) override;
    int ExecAction(CConfigData* context) override;
    int DllExit(int unused) override;

    // IMainAzureAccess
    void QueueValueChange(CVarItem* item) override;
    void LogError(const CString& text) override;
    void LogInfo(const CString& text) override;
    bool RequestVariableCheck() override;

    bool StartExport();
    void StopExport();
    // Handler of WM_SKYVANE_CHECK_VARIABLES: subscribes every configured
    // variable and starts the runtime link; 1 on success, 0 on failure.
    LRESULT CheckVariables(WPARAM wParam, LPARAM lParam);
    static DWORD WorkerProc(VX_CThread* thread);

    LRESULT WindowProc(UINT message, WPARAM wParam, LPARAM lParam) override;

private:
    struct RowCounts {
        int succeeded = 0;
        int failed = 0;
    };

    int RunOnWindowThread(const std::function<int()>& body);
    int InitOnWindowThread(CConfigData* context);
    // 0 saved, 1 not saved (cancelled, or the file could not be written), 2 already open.
    int RunSettingsDialog(CConfigData* context);
    int ExecActionOnWindowThread(CConfigData* context);
    int DllExitOnWindowThread(int unused);
    void PublishHostWindow();
    void OnTick();
    LRESULT SubscribeVariables();
    void ShowUnknownVariables(const CStringArray& refused);

    // Worker side (ExportWorker.cpp).
    DWORD RunWorker(VX_CThread& thread);
    void RunCycle(CAzureComm& comm, bool integrity);
    void TakeQueuedValues(CLstOwner<CVarItem>& batch);
    void DiscardQueuedValues();
    void SendToConnection(CAzureComm& comm, const CConnection& connection, const CLstOwner<CVarItem>& batch,
                          bool integrity, RowCounts& cycle);
    void AddRows(CAzureComm& comm, const CLstOwner<CVarItem>& batch, bool integrity, RowCounts& counts);
    int CountRows(const CLstOwner<CVarItem>& batch, bool integrity) const;
    static void AddRow(CAzureComm& comm, const CString& key, const SVarItemValue& data, RowCounts& counts);

    CAzureConfig m_config;         // written on the window thread only while the worker is stopped
    int m_nTickState = kTickIdle;  // window thread only
    std::unique_ptr<CAzureValueExchangeViaCOM> m_pBridge;  // window thread only
    CLstOwner<CVarItem> m_lstValueQueue;                   // snapshots of changed items, oldest first
    CCriticalSection m_csQueue;                            // guards m_lstValueQueue
    std::atomic<int> m_nQueued{0};                         // entries of m_lstValueQueue, for the worker's unlocked test
    int m_nQueueLimit = 0x7FFFFFFF;                        // window thread only
    std::atomic<HWND> m_hHostWnd{nullptr};                 // the context copy's host window, read by the worker
    VX_CRefCnt m_checkBusy;        // held while a variable check runs (re-entry through message boxes)
    bool m_bCheckRefused = false;  // a nested check was refused: check again when the outer one ends
    VX_CThread m_worker;           // declared last: ended before anything it reads goes
};
