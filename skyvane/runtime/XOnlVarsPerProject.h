#pragma once
// One project's subscription: its watcher, its variables, its value queue and
// the mailbox through which project switches reach the module's timer.

#include "runtime/OnlProject.h"
#include "runtime/OnlVariables.h"
#include "runtime/RefCounting.h"
#include "runtime/RuntimeNotifications.h"

#include "platform/sync.h"

#include <atomic>

class CXOnlVarsPerProject : public CCmdTarget, public IOnlProjectNotifications, public IOnlVariablesNtf {
public:
    enum Command { kNoCommand = 0, kDeactivate = 1, kActivate = 2 };

    CXOnlVarsPerProject(IOnlVariablesPerProjectNotification* pNotify, DWORD dwTimeout, int nQueueLimit)
        : m_dwTimeout(dwTimeout), m_pNotify(pNotify), m_nQueueLimit(nQueueLimit) {}
    ~CXOnlVarsPerProject() override;

    bool Attach(const CString& strProject);
    bool AddVariable(const CString& strVariable, CVarItem** ppHolder);
    bool Start();
    // Lets go of the subscription: the container, the names, the holder cells
    // and the queued changes that refer to those cells.
    void ReleaseVariables();
    // Timer work: the pending project command, then the queued changes.
    void ProcessPending();

    CString GetContainerName() const;
    CComPtr<IDispatch> CreateContainer();
    void RemoveContainer();

    // Runtime events (any thread).
    void OnProjectInactive() override;
    void OnProjectActive() override;
    void OnVariableChange(double dId, const VARIANT* pValue, double dStatusLow, double dStatusHigh, double dTime,
                          CVarItem** ppHolder) override;

    const CString& GetProjectName() const { return m_strProject; }
    int GetQueueLimit() const { return m_nQueueLimit; }
    int GetQueuedCount();
    int GetPendingCommand() const { return m_nCommand.load(); }
    COnlVariables* GetVariables() const { return m_pVariables.Get(); }

protected:
    virtual void CreateWatcher();
    virtual void CreateVariables();

private:
    bool PostCommand(int nCommand, bool bWait);
    bool WaitIdle(CSingleLock& lock, DWORD dwDeadline);
    void SetCommand(int nCommand);
    void CommandDone();
    void Deactivate();
    void Activate();
    void DrainValues();
    void DiscardValues();

    VX_KeepRefCmdPtr<COnlProject> m_pWatcher;
    CString m_strProject;
    VX_KeepRefCmdPtr<COnlVariables> m_pVariables;
    CMutex m_mutex;                           // guards m_lstValues and every write of m_nCommand
    std::atomic<int> m_nCommand{kNoCommand};  // pending project command; read by the timer without the lock
    std::atomic<unsigned> m_nCommandsRun{0};  // commands carried out so far; a waiting poster watches it
    DWORD m_dwTimeout;
    CLstOwner<STarvoVarValue> m_lstValues;  // queued changes, oldest first
    IOnlVariablesPerProjectNotification* m_pNotify;
    int m_nQueueLimit;  // 0 = no limit
};
