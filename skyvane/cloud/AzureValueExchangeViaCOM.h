#pragma once
// The bridge from the runtime link to the module object: owns the link's
// project manager, turns queued value records into updates of the variable
// items (handing real changes to the module's value queue) and project
// events into variable checks or error records.

#include "runtime/MultipleOnlVarsPerPrj.h"
#include "runtime/RuntimeNotifications.h"

class CVarItem;
class IMainAzureAccess;

class CAzureValueExchangeViaCOM : public IOnlVariablesPerProjectNotification {
public:
    explicit CAzureValueExchangeViaCOM(IMainAzureAccess* pMain) : m_pMain(pMain) {}
    ~CAzureValueExchangeViaCOM() override;
    CAzureValueExchangeViaCOM(const CAzureValueExchangeViaCOM&) = delete;
    CAzureValueExchangeViaCOM& operator=(const CAzureValueExchangeViaCOM&) = delete;

    // Creates a new project manager (replacing an earlier one); whether there is one.
    bool Connect();
    void Disconnect();
    // Timer work: every project's pending switch, then its queued values.
    void ProcessAllProjects();
    // Subscribes the item's variable; its holder cell then belongs to the link.
    bool AddVariable(CVarItem* pItem);
    bool StartLink();
    // Whether a runtime answers now (it may not run at all).
    static bool IsRuntimeReachable();

    void OnValueChange(const CString& strProject, STarvoVarValue*& pValue) override;
    void OnProjectDeactivated(const CString& strProject) override;
    void OnProjectActivated(const CString& strProject) override;
    void OnProjectInactiveFailed(const CString& strProject) override;
    void OnProjectActiveFailed(const CString& strProject) override;
    void OnValueQueueFull(CString strProject, DWORD dwId) override;
    void OnValuesDiscarded(const CString& strProject, int nCount) override;

private:
    VX_KeepRefCmdPtr<CMultipleOnlVarsPerPrj> m_pLink;  // window thread only
    IMainAzureAccess* m_pMain;                         // not owned
};
