#include "ui/DlgKonfig.h"

#include "cloud/PasswordKey.h"
#include "res/resource.h"
#include "runtime/RuntimeCalls.h"
#include "ui/DialogBuilder.h"
#include "ui/DlgConnection.h"
#include "ui/SortHeaderCtrl.h"

#include "tarvo/TarvoIds.h"
#include "platform/resources.h"
#include "vxhelper/aescrypt.h"
#include "vxhelper/messagebox.h"

#include <QEvent>
#include <QLineEdit>
#include <QMouseEvent>
#include <QPushButton>
#include <QTreeWidget>

#include <algorithm>
#include <iterator>
#include <memory>
#include <vector>

namespace {

namespace dispid = tarvo::dispid;

constexpr char16_t kPasswordPlaceholder[] = u"00000000000000000000";

bool GetTextProperty(IDispatch* object, DISPID member, CString& text) {
    if (!object) return false;
    CComVariant result;
    if (FAILED(GetProperty(object, member, &result)) || result.vt != VT_BSTR) return false;
    text = CString(result.bstrVal ? result.bstrVal : u"");
    return true;
}

CComVariant Position(long position, VARTYPE type) {
    CComVariant value;
    value.vt = type;
    value.lVal = static_cast<std::int32_t>(position);
    return value;
}

// Indexes of the list's selected items, highest first.
std::vector<int> SelectedIndexesHighestFirst(const QTreeWidget& list) {
    std::vector<int> indexes;
    for (int i = 0; i < list.topLevelItemCount(); ++i) {
        if (list.topLevelItem(i)->isSelected()) indexes.insert(indexes.begin(), i);
    }
    return indexes;
}

int FirstSelectedIndex(const QTreeWidget& list) {
    for (int i = 0; i < list.topLevelItemCount(); ++i) {
        if (list.topLevelItem(i)->isSelected()) return i;
    }
    return -1;
}

// A click on empty space of a list view clears its selection.
class CClearOnEmptyClick : public QObject {
public:
    explicit CClearOnEmptyClick(QTreeWidget* list) : QObject(list), m_list(list) {}

protected:
    bool eventFilter(QObject*, QEvent* event) override {
        if (event->type() == QEvent::MouseButtonPress) {
            const auto* mouse = static_cast<QMouseEvent*>(event);
            if (!m_list->itemAt(mouse->position().toPoint())) m_list->clearSelection();
        }
        return false;
    }

private:
    QTreeWidget* m_list;
};

// The integer of a field as the class library reads one: blanks around an
// optional sign and digits. False when the text is no integer.
bool ParseInteger(const QString& text, long long& value) {
    const QString trimmed = text.trimmed();
    int at = 0;
    bool negative = false;
    if (at < trimmed.size() && (trimmed[at] == u'-' || trimmed[at] == u'+')) negative = trimmed[at++] == u'-';
    if (at >= trimmed.size()) return false;
    value = 0;
    for (; at < trimmed.size(); ++at) {
        if (!trimmed[at].isDigit() || trimmed[at].unicode() > u'9') return false;
        value = std::min<long long>(value * 10 + (trimmed[at].unicode() - u'0'), 1LL << 40);
    }
    if (negative) value = -value;
    return true;
}

}  // namespace

CDlgKonfig::CDlgKonfig(QWidget* parent, CAzureConfig& config) : QDialog(parent), m_config(config) {
    BuildDialog(*this, kKonfigDialog);
    m_wnd.CreateMessageWindow(u"Settings");
    m_wnd.SetNativeWidget(this);
    m_hWnd = m_wnd.GetSafeHwnd();

    m_listProjects = DialogControl<QTreeWidget>(*this, IDC_LIST_PROJECTS);
    m_listVariables = DialogControl<QTreeWidget>(*this, IDC_LIST_VARIABLES);
    m_listExported = DialogControl<QTreeWidget>(*this, IDC_LIST_EXPORTED);
    m_listConnections = DialogControl<QTreeWidget>(*this, IDC_LIST_CONNECTIONS);
    m_editIntegrity = DialogControl<QLineEdit>(*this, IDC_INTEGRITY_PERIOD);
    m_editDomain = DialogControl<QLineEdit>(*this, IDC_PROXY_DOMAIN);
    m_editUser = DialogControl<QLineEdit>(*this, IDC_PROXY_USER);
    m_editPassword = DialogControl<QLineEdit>(*this, IDC_PROXY_PASSWORD);
    m_editConfirm = DialogControl<QLineEdit>(*this, IDC_PROXY_PASSWORD_CONFIRM);
    m_buttonAdd = DialogControl<QPushButton>(*this, IDC_ADD_VARIABLES);
    m_buttonRemove = DialogControl<QPushButton>(*this, IDC_REMOVE_VARIABLES);
    m_buttonOk = DialogControl<QPushButton>(*this, IDC_OK);
    m_headerVariables = new CSortHeaderCtrl(m_listVariables);
    m_headerProjects = new CSortHeaderCtrl(m_listProjects);
    m_headerExported = new CSortHeaderCtrl(m_listExported);

    connect(m_buttonAdd, &QPushButton::clicked, this, &CDlgKonfig::OnAddVariables);
    connect(m_buttonRemove, &QPushButton::clicked, this, &CDlgKonfig::OnRemoveVariables);
    connect(m_listVariables, &QTreeWidget::itemDoubleClicked, this, &CDlgKonfig::OnAddVariables);
    connect(m_listExported, &QTreeWidget::itemDoubleClicked, this, &CDlgKonfig::OnRemoveVariables);
    connect(DialogControl<QPushButton>(*this, IDC_NEW_CONNECTION), &QPushButton::clicked, this,
            &CDlgKonfig::OnNewConnection);
    connect(DialogControl<QPushButton>(*this, IDC_EDIT_CONNECTION), &QPushButton::clicked, this,
            &CDlgKonfig::OnEditConnection);
    connect(m_listConnections, &QTreeWidget::itemDoubleClicked, this, &CDlgKonfig::OnEditConnection);
    connect(DialogControl<QPushButton>(*this, IDC_DELETE_CONNECTION), &QPushButton::clicked, this,
            &CDlgKonfig::OnDeleteConnection);
    connect(m_buttonOk, &QPushButton::clicked, this, &CDlgKonfig::accept);
    connect(DialogControl<QPushButton>(*this, IDC_CANCEL), &QPushButton::clicked, this, &CDlgKonfig::reject);
    connect(m_listProjects->selectionModel(), &QItemSelectionModel::selectionChanged, this,
            [this](const QItemSelection& selected, const QItemSelection& deselected) {
                OnProjectSelectionChanged(!selected.isEmpty(), !deselected.isEmpty());
            });
    for (QTreeWidget* list : {m_listProjects, m_listVariables, m_listExported, m_listConnections})
        list->viewport()->installEventFilter(new CClearOnEmptyClick(list));

    OnInitDialog();
}

CDlgKonfig::~CDlgKonfig() {
    // Each watcher's release waits for an event handler in progress, so no
    // notification runs once this returns.
    m_watchers.clear();
    m_wnd.DestroyWindow();
    m_cacheNames.clear();
    m_pProjects.Release();
}

LRESULT CDlgKonfig::CMessageWnd::WindowProc(UINT message, WPARAM wParam, LPARAM lParam) {
    switch (message) {
    case WM_PROJECT_ACTIVE: return m_owner.OnProjectActiveMessage();
    case WM_PROJECT_INACTIVE: m_owner.OnProjectInactiveMessage(); return 0;
    default: return CWnd::WindowProc(message, wParam, lParam);
    }
}

// ---- Opening ---------------------------------------------------------------

void CDlgKonfig::OnInitDialog() {
    DoDataExchange(false);
    SetUpSortableList(m_listProjects, m_headerProjects, IDS_COLUMN_PROJECTS);
    SetUpSortableList(m_listVariables, m_headerVariables, IDS_COLUMN_VARIABLES);
    SetUpSortableList(m_listExported, m_headerExported, IDS_COLUMN_POINTS);

    CString connectionTitle, queueTitle;
    AfxLoadString(IDS_COLUMN_CONNECTION, connectionTitle);
    AfxLoadString(IDS_COLUMN_QUEUE, queueTitle);
    m_listConnections->setAllColumnsShowFocus(true);
    m_listConnections->setColumnCount(2);
    m_listConnections->setHeaderLabels({ToQString(connectionTitle), ToQString(queueTitle)});
    m_listConnections->header()->setStretchLastSection(false);
    const int width = m_listConnections->width() - 2 * m_listConnections->frameWidth();
    m_listConnections->setColumnWidth(0, width * 2 / 3);
    m_listConnections->setColumnWidth(1, width / 3);

    FillExportedList();
    FillProjectList();
    FillVariableList(GetSelectedProjectIndex());
    FillConnectionList();
}

void CDlgKonfig::SetUpSortableList(QTreeWidget* list, CSortHeaderCtrl* header, UINT titleId) {
    CString title;
    AfxLoadString(titleId, title);
    list->setAllColumnsShowFocus(true);
    list->setHeader(header);
    header->setSectionsClickable(true);  // the view makes a header it takes unclickable
    list->setColumnCount(1);
    list->setHeaderLabels({ToQString(title)});
    header->setStretchLastSection(false);
    list->setColumnWidth(0, list->width() - 2 * list->frameWidth());
    header->SetSortArrow(0, header->IsDescending());
    connect(header, &QHeaderView::sectionClicked, this, [this, list, header] { OnSortColumn(list, header); });
}

void CDlgKonfig::OnSortColumn(QTreeWidget* list, CSortHeaderCtrl* header) {
    header->SetSortArrow(0, !header->IsDescending());
    SortList(*list, header->IsDescending());
}

void CDlgKonfig::FillExportedList() {
    m_listExported->clear();
    for (const auto& [key, item] : m_config.m_mapVariables) AppendListItem(*m_listExported, key);
    SortList(*m_listExported, m_headerExported->IsDescending());
}

void CDlgKonfig::FillConnectionList() {
    m_listConnections->clear();
    for (const CConnection* connection : m_config.m_lstConnections) {
        const int row = AppendListItem(*m_listConnections, connection->m_strConnection);
        m_listConnections->topLevelItem(row)->setText(1, ToQString(connection->m_strQueue));
    }
}

void CDlgKonfig::FillProjectList() {
    m_listProjects->clear();
    if (!GetRuntimeProjects(m_pProjects)) {
        SortList(*m_listProjects, m_headerProjects->IsDescending());
        return;
    }
    LONG count = 0;
    for (long i = 0; GetLongProperty(m_pProjects.Get(), dispid::CollectionCount, &count) && i < count; ++i) {
        CComPtr<IDispatch> project = CallForObject(m_pProjects.Get(), dispid::CollectionItem, Position(i, VT_INT));
        if (project) InsertProject(project.Get(), i);
    }
    if (QTreeWidgetItem* first = m_listProjects->topLevelItem(0)) {
        m_listProjects->setCurrentItem(first);  // selects and focuses it, which fills the variables list
        m_listProjects->scrollToItem(first);
    }
    SortList(*m_listProjects, m_headerProjects->IsDescending());
}

void CDlgKonfig::InsertProject(IDispatch* project, long position) {
    CString name;
    GetTextProperty(project, dispid::ProjectName, name);
    auto* item = new QTreeWidgetItem(QStringList{ToQString(name)});
    m_listProjects->insertTopLevelItem(std::min<int>(static_cast<int>(position), m_listProjects->topLevelItemCount()),
                                       item);
    item->setData(0, Qt::UserRole, static_cast<qlonglong>(position));

    ProjectWatcher watcher = VX_CreateCounted<COnlProject>(static_cast<IOnlProjectNotifications*>(this));
    watcher->Attach(name);  // a project that cannot be watched is listed all the same
    m_watchers[position] = std::move(watcher);
}

long CDlgKonfig::GetSelectedProjectIndex() const {
    const int row = FirstSelectedIndex(*m_listProjects);
    if (row < 0) return -1;
    return static_cast<long>(m_listProjects->topLevelItem(row)->data(0, Qt::UserRole).toLongLong() & 0x7FFFFFFF);
}

CString CDlgKonfig::GetSelectedProjectName() const {
    const int row = FirstSelectedIndex(*m_listProjects);
    return row < 0 ? CString() : ToCString(m_listProjects->topLevelItem(row)->text(0));
}

void CDlgKonfig::FillVariableList(long position) {
    m_listVariables->clear();
    if (position < 0 || !m_pProjects) return;
    CComPtr<IDispatch> project = CallForObject(m_pProjects.Get(), dispid::CollectionItem, Position(position, VT_I4));
    CString projectName;
    if (!project || !GetTextProperty(project.Get(), dispid::ProjectName, projectName)) return;
    const CStringArray names = GetVariableNames(position, project.Get());
    CVarItem* exported = nullptr;
    for (const CString& name : names) {
        if (!m_config.m_mapVariables.Lookup(projectName + u"#" + name, exported))
            AppendListItem(*m_listVariables, name);
    }
    SortList(*m_listVariables, m_headerVariables->IsDescending());
}

// A copy of the cached names: the cache may be emptied while the caller still walks them.
CStringArray CDlgKonfig::GetVariableNames(long position, IDispatch* project) {
    const auto cached = m_cacheNames.find(position);
    if (cached != m_cacheNames.end()) return cached->second;
    CStringArray names;
    LoadVariableNames(CallForObject(project, dispid::ProjectVariables).Get(), names);
    m_cacheNames[position] = names;
    return names;
}

void CDlgKonfig::LoadVariableNames(IDispatch* variables, CStringArray& names) {
    names.RemoveAll();
    LONG count = 0;
    if (!GetLongProperty(variables, dispid::CollectionCount, &count)) return;
    for (long i = 0; i < count; ++i) {
        CComPtr<IDispatch> variable = CallForObject(variables, dispid::CollectionItem, Position(i, VT_INT));
        CString name;
        if (variable && GetTextProperty(variable.Get(), dispid::VariableName, name)) names.Add(name);
    }
}

void CDlgKonfig::OnProjectSelectionChanged(bool selected, bool deselected) {
    if (selected) FillVariableList(GetSelectedProjectIndex());
    else if (deselected) FillVariableList(-1);
}

// ---- Exported variables ----------------------------------------------------

void CDlgKonfig::OnAddVariables() {
    const CString project = GetSelectedProjectName();
    const std::vector<int> indexes = SelectedIndexesHighestFirst(*m_listVariables);
    for (auto it = indexes.rbegin(); it != indexes.rend(); ++it) {
        auto* item = new CVarItem;
        item->m_strName = project + u"#" + ToCString(m_listVariables->topLevelItem(*it)->text(0));
        AddExportedVariable(item);
    }
    for (const int index : indexes) delete m_listVariables->takeTopLevelItem(index);
    SortList(*m_listExported, m_headerExported->IsDescending());
}

void CDlgKonfig::AddExportedVariable(CVarItem* item) {
    AppendListItem(*m_listExported, item->m_strName);
    m_config.m_mapVariables.SetAt(item->m_strName, item);
}

void CDlgKonfig::OnRemoveVariables() {
    const std::vector<int> indexes = SelectedIndexesHighestFirst(*m_listExported);
    for (auto it = indexes.rbegin(); it != indexes.rend(); ++it) RemoveExportedVariable(*it);
    for (const int index : indexes) delete m_listExported->takeTopLevelItem(index);
}

void CDlgKonfig::RemoveExportedVariable(int index) {
    const CString key = ToCString(m_listExported->topLevelItem(index)->text(0));
    m_config.m_mapVariables.RemoveKey(key);
    const int hash = key.Find(u'#');
    const CString project = hash < 0 ? CString() : key.Left(hash);
    if (project.CompareNoCase(GetSelectedProjectName()) == 0) FillVariableList(GetSelectedProjectIndex());
}

// ---- Connections -----------------------------------------------------------

void CDlgKonfig::OnNewConnection() {
    auto connection = std::make_unique<CConnection>();
    CDlgConnection dialog(this, *connection);
    if (dialog.exec() != QDialog::Accepted) return;
    const int row = AppendListItem(*m_listConnections, connection->m_strConnection);
    m_listConnections->topLevelItem(row)->setText(1, ToQString(connection->m_strQueue));
    m_config.m_lstConnections.AddTail(connection.release());
}

void CDlgKonfig::OnEditConnection() {
    const int row = FirstSelectedIndex(*m_listConnections);
    if (row < 0 || row >= m_config.m_lstConnections.GetCount()) return;
    CConnection& connection = **std::next(m_config.m_lstConnections.begin(), row);
    CDlgConnection dialog(this, connection);
    if (dialog.exec() != QDialog::Accepted) return;
    QTreeWidgetItem* item = m_listConnections->topLevelItem(row);
    item->setText(0, ToQString(connection.m_strConnection));
    item->setText(1, ToQString(connection.m_strQueue));
}

void CDlgKonfig::OnDeleteConnection() {
    for (const int row : SelectedIndexesHighestFirst(*m_listConnections)) {
        delete m_listConnections->takeTopLevelItem(row);
        if (row < m_config.m_lstConnections.GetCount())
            m_config.m_lstConnections.RemoveAt(std::next(m_config.m_lstConnections.begin(), row));
    }
}

// ---- Project events --------------------------------------------------------

// Widgets and the name cache belong to the dialog's thread, and a call that
// waited for it could deadlock with a watcher's release that waits for this
// handler: both events are posted.
void CDlgKonfig::OnProjectInactive() { ::PostMessage(m_hWnd, WM_PROJECT_INACTIVE, 0, 0); }

void CDlgKonfig::OnProjectActive() { ::PostMessage(m_hWnd, WM_PROJECT_ACTIVE, 0, 0); }

void CDlgKonfig::OnProjectInactiveMessage() {
    m_cacheNames.clear();
    SetProjectControlsEnabled(false);
}

LRESULT CDlgKonfig::OnProjectActiveMessage() {
    FillVariableList(GetSelectedProjectIndex());
    SetProjectControlsEnabled(true);
    return 0;
}

void CDlgKonfig::SetProjectControlsEnabled(bool enabled) {
    for (QWidget* control : std::initializer_list<QWidget*>{m_listProjects, m_listVariables, m_listExported,
                                                            m_buttonAdd, m_buttonRemove, m_buttonOk})
        control->setEnabled(enabled);
}

// ---- Data exchange ---------------------------------------------------------

void CDlgKonfig::accept() {
    if (DoDataExchange(true)) QDialog::accept();
}

bool CDlgKonfig::DoDataExchange(bool save) {
    if (!save) {
        m_editIntegrity->setText(QString::number(m_config.m_nIntegrityPeriod));
        m_editDomain->setText(ToQString(m_config.m_strProxyDomain));
        m_editUser->setText(ToQString(m_config.m_strProxyUser));
        const QString shown = m_config.m_strProxyPassword.IsEmpty() ? QString() : ToQString(kPasswordPlaceholder);
        m_editPassword->setText(shown);
        m_editConfirm->setText(shown);
        return true;
    }
    if (!ExchangeIntegrityPeriod()) return false;
    m_config.m_strProxyDomain = ToCString(m_editDomain->text());
    m_config.m_strProxyUser = ToCString(m_editUser->text());
    return ExchangeProxyPassword();
}

bool CDlgKonfig::ExchangeIntegrityPeriod() {
    long long value = 0;
    if (!ParseInteger(m_editIntegrity->text(), value)) {
        VXHelper_MessageBox(m_hWnd, CString(u"Please enter an integer."), MB_ICONWARNING);
        FailAt(m_editIntegrity);
        return false;
    }
    if (value < kMinIntegrityPeriod || value > kMaxIntegrityPeriod) {
        VXHelper_MessageBox(m_hWnd,
                            CString::Formatted(u"Please enter an integer between %d and %d.", kMinIntegrityPeriod,
                                               kMaxIntegrityPeriod),
                            MB_ICONWARNING);
        FailAt(m_editIntegrity);
        return false;
    }
    m_config.m_nIntegrityPeriod = static_cast<int>(value);
    return true;
}

bool CDlgKonfig::ExchangeProxyPassword() {
    // Without a proxy domain and user there is no proxy, and no password to keep.
    if (m_config.m_strProxyDomain.IsEmpty() && m_config.m_strProxyUser.IsEmpty()) {
        SecureClearString(m_config.m_strProxyPassword);
        return true;
    }
    CString password = ToCString(m_editPassword->text());
    CString confirmation = ToCString(m_editConfirm->text());
    if (password == kPasswordPlaceholder && confirmation == kPasswordPlaceholder) return true;  // unchanged
    if (!CheckPasswords(password, confirmation)) {
        SecureClearString(password);
        SecureClearString(confirmation);
        FailAt(m_editConfirm);
        return false;
    }
    SecureClearString(confirmation);
    const CAesCrypt crypt(kProxyPasswordKeyHigh, kProxyPasswordKeyLow);
    if (!crypt.EncryptHexString(password)) {
        SecureClearString(password);
        VXHelper_MessageBox(m_hWnd, IDS_PASSWORD_NOT_ENCRYPTED, MB_ICONERROR);
        FailAt(m_editConfirm);
        return false;
    }
    m_config.m_strProxyPassword = password;
    return true;
}

bool CDlgKonfig::CheckPasswords(const CString& password, const CString& confirmation) {
    if (password.IsEmpty() || confirmation.IsEmpty()) {
        VXHelper_MessageBox(m_hWnd, IDS_PASSWORD_BOTH_BOXES, MB_ICONERROR);
        return false;
    }
    if (password != confirmation) {
        VXHelper_MessageBox(m_hWnd, IDS_PASSWORD_MISMATCH, MB_ICONERROR);
        return false;
    }
    return true;
}

void CDlgKonfig::FailAt(QWidget* control) {
    control->setFocus();
    if (auto* edit = qobject_cast<QLineEdit*>(control)) edit->selectAll();
}
