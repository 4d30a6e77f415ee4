#pragma once
// The "Settings" dialog: which runtime variables are exported, the Azure
// connections, the integrity period and the HTTP proxy. It lists the running
// runtime's projects and their variables and follows the projects' "Active"
// and "Inactive" events. List operations change the record at once; the
// fields are written into it on OK.
//
// Threads: everything runs on the dialog's thread except the two project
// notifications, which come on the runtime's event threads and only post a
// message to the dialog's own window.

#include "cloud/AzureConfig.h"
#include "runtime/OnlProject.h"
#include "runtime/RuntimeNotifications.h"

#include "platform/collections.h"
#include "platform/window.h"

#include <QDialog>

#include <map>

class CSortHeaderCtrl;
class QLineEdit;
class QPushButton;
class QTreeWidget;

class CDlgKonfig : public QDialog, public IOnlProjectNotifications {
public:
    // To the dialog's own window.
    static constexpr UINT WM_PROJECT_ACTIVE = WM_USER + 101;
    static constexpr UINT WM_PROJECT_INACTIVE = WM_USER + 102;
    static constexpr int kMinIntegrityPeriod = 1, kMaxIntegrityPeriod = 3600;

    // Lists the runtime's projects and fills every control from config,
    // which the dialog then edits in place.
    CDlgKonfig(QWidget* parent, CAzureConfig& config);
    // Stops watching the projects before anything they report to goes.
    ~CDlgKonfig() override;

    // IOnlProjectNotifications: on a runtime event thread.
    void OnProjectInactive() override;
    void OnProjectActive() override;

    // Controls -> record (save; false, with a message, when a check fails and
    // the dialog must stay open) or record -> controls (load).
    bool DoDataExchange(bool save);
    // OK: closes with Accepted only when the save exchange succeeds.
    void accept() override;

    void OnAddVariables();
    void OnRemoveVariables();
    void OnNewConnection();
    void OnEditConnection();
    void OnDeleteConnection();

    // The window that parents the dialog's message boxes and receives its messages.
    HWND GetSafeHwnd() const { return m_hWnd; }

private:
    class CMessageWnd : public CWnd {
    public:
        explicit CMessageWnd(CDlgKonfig& owner) : m_owner(owner) {}
        LRESULT WindowProc(UINT message, WPARAM wParam, LPARAM lParam) override;

    private:
        CDlgKonfig& m_owner;
    };
    using ProjectWatcher = VX_KeepRefCmdPtr<COnlProject>;

    void OnInitDialog();
    void SetUpSortableList(QTreeWidget* list, CSortHeaderCtrl* header, UINT titleId);
    void OnSortColumn(QTreeWidget* list, CSortHeaderCtrl* header);
    void FillExportedList();
    void FillConnectionList();
    void FillProjectList();
    void InsertProject(IDispatch* project, long position);
    void FillVariableList(long position);
    CStringArray GetVariableNames(long position, IDispatch* project);
    static void LoadVariableNames(IDispatch* variables, CStringArray& names);
    long GetSelectedProjectIndex() const;
    CString GetSelectedProjectName() const;
    void OnProjectSelectionChanged(bool selected, bool deselected);
    void AddExportedVariable(CVarItem* item);
    void RemoveExportedVariable(int index);
    void OnProjectInactiveMessage();
    LRESULT OnProjectActiveMessage();
    void SetProjectControlsEnabled(bool enabled);
    bool ExchangeIntegrityPeriod();
    bool ExchangeProxyPassword();
    bool CheckPasswords(const CString& password, const CString& confirmation);
    void FailAt(QWidget* control);

    CAzureConfig& m_config;
    QTreeWidget* m_listProjects;
    QTreeWidget* m_listVariables;
    QTreeWidget* m_listExported;
    QTreeWidget* m_listConnections;
    CSortHeaderCtrl* m_headerVariables;
    CSortHeaderCtrl* m_headerProjects;
    CSortHeaderCtrl* m_headerExported;
    QLineEdit* m_editIntegrity;
    QLineEdit* m_editDomain;
    QLineEdit* m_editUser;
    QLineEdit* m_editPassword;
    QLineEdit* m_editConfirm;
    QPushButton* m_buttonAdd;
    QPushButton* m_buttonRemove;
    QPushButton* m_buttonOk;
    CComPtr<IDispatch> m_pProjects;  // the runtime's projects collection; null without a runtime
    // Project position -> its variables' names, read once. Dialog thread only:
    // the "Inactive" that empties it is handed over to this thread.
    std::map<long, CStringArray> m_cacheNames;
    std::map<long, ProjectWatcher> m_watchers;  // project position -> watcher of its events
    CMessageWnd m_wnd{*this};
    HWND m_hWnd = nullptr;  // m_wnd's handle; set before the first watcher exists, read by event threads
};
