// The settings and connection dialogs driven by their controls' ids, on the
// offscreen platform, against the runtime stand-in in this process.
#include "UiTestSupport.h"

#include "ModuleHost.h"
#include "cloud/PasswordKey.h"
#include "res/resource.h"
#include "ui/DlgConnection.h"
#include "ui/DlgKonfig.h"
#include "ui/SortHeaderCtrl.h"

#include "vxhelper/aescrypt.h"

#include <QApplication>
#include <QComboBox>
#include <QLineEdit>
#include <QRadioButton>
#include <QTest>
#include <QTreeWidget>

#include <gtest/gtest.h>

namespace {

std::vector<std::string> Texts(QTreeWidget* list, int column = 0) {
    std::vector<std::string> texts;
    for (int i = 0; i < list->topLevelItemCount(); ++i)
        texts.push_back(list->topLevelItem(i)->text(column).toStdString());
    return texts;
}

QTreeWidget* List(QWidget& dialog, UINT id) { return Control<QTreeWidget>(dialog, id); }

void ClickHeader(QTreeWidget* list) {
    QHeaderView* header = list->header();
    QTest::mouseClick(header->viewport(), Qt::LeftButton, {}, QPoint(header->sectionSize(0) / 2, header->height() / 2));
}

// What the header's arrow adds to the header's picture, from the top left of
// the changed pixels: g grey, s light grey, w white, . unchanged (transparent).
std::vector<std::string> DrawnArrow(CSortHeaderCtrl* header) {
    const QImage with = header->grab().toImage();
    const int column = header->GetSortColumn();
    const bool descending = header->IsDescending();
    header->SetSortArrow(-1, false);  // takes the arrow away
    const QImage without = header->grab().toImage();
    header->SetSortArrow(column, descending);
    QRect changed;
    for (int y = 0; y < with.height(); ++y)
        for (int x = 0; x < with.width(); ++x)
            if (with.pixel(x, y) != without.pixel(x, y)) changed |= QRect(x, y, 1, 1);
    std::vector<std::string> rows;
    for (int y = changed.top(); changed.isValid() && y <= changed.bottom(); ++y) {
        std::string row;
        for (int x = changed.left(); x <= changed.right(); ++x) {
            const QRgb pixel = with.pixel(x, y);
            row += pixel == without.pixel(x, y)   ? '.'
                   : pixel == qRgb(128, 128, 128) ? 'g'
                   : pixel == qRgb(192, 192, 192) ? 's'
                   : pixel == qRgb(255, 255, 255) ? 'w'
                                                  : '?';
        }
        rows.push_back(row);
    }
    return rows;
}

void SetText(QWidget& dialog, UINT id, const QString& text) { Control<QLineEdit>(dialog, id)->setText(text); }

CConnection* AddConnection(CAzureConfig& config, const char* text, const char* queue, bool eventHub, int format) {
    auto* connection = new CConnection;
    connection->m_strConnection = CString(text);
    connection->m_strQueue = CString(queue);
    connection->m_bEventHub = eventHub;
    connection->m_nFormat = format;
    config.m_lstConnections.AddTail(connection);
    return connection;
}

void AddVariable(CAzureConfig& config, const char* key) {
    auto* item = new CVarItem;
    item->m_strName = CString(key);
    config.m_mapVariables.SetAt(item->m_strName, item);
}

std::vector<std::string> Keys(const CAzureConfig& config) {
    std::vector<std::string> keys;
    for (const auto& [key, item] : config.m_mapVariables) keys.push_back(key.ToUtf8());
    return keys;
}

class SettingsDialogTest : public ::testing::Test {
protected:
    void StartRuntime() {
        tarvo::RuntimeConfig runtimeConfig;
        runtimeConfig.projects = {Project(u"Plant", {u"Level", u"Flow", u"Temp", u"10", u"9", u"alpha", u"Beta"}),
                                  Project(u"Line2", {u"Speed"})};
        tarvo::RuntimeOptions options;
        options.simulate = false;
        runtime = std::make_unique<tarvo::Runtime>(runtimeConfig, options);
        std::string error;
        ASSERT_TRUE(runtime->Start(&error)) << error;
    }
    void TearDown() override {
        dialog.reset();
        if (runtime) runtime->Stop();
    }
    CDlgKonfig& Open() {
        dialog = std::make_unique<CDlgKonfig>(nullptr, config);
        dialog->show();
        // Item views lay out their headers and rows from posted events.
        EXPECT_TRUE(QTest::qWaitForWindowExposed(dialog.get()));
        QCoreApplication::processEvents();
        return *dialog;
    }

    CModalDriver driver;
    CAzureConfig config;
    std::unique_ptr<tarvo::Runtime> runtime;
    std::unique_ptr<CDlgKonfig> dialog;
};

TEST_F(SettingsDialogTest, WithoutARuntimeShowsTheSettingsOnlyAndNoMessage) {
    AddVariable(config, "Plant#Level");
    AddVariable(config, "Line2#Speed");
    AddConnection(config, "Endpoint=sb://one", "values", false, 1);
    AddConnection(config, "Endpoint=sb://two", "hub", true, 2);
    CDlgKonfig& dlg = Open();
    EXPECT_EQ(List(dlg, IDC_LIST_PROJECTS)->topLevelItemCount(), 0);
    EXPECT_EQ(List(dlg, IDC_LIST_VARIABLES)->topLevelItemCount(), 0);
    EXPECT_EQ(Texts(List(dlg, IDC_LIST_EXPORTED)), (std::vector<std::string>{"Line2#Speed", "Plant#Level"}));
    EXPECT_EQ(Texts(List(dlg, IDC_LIST_CONNECTIONS)),
              (std::vector<std::string>{"Endpoint=sb://one", "Endpoint=sb://two"}));
    EXPECT_EQ(Texts(List(dlg, IDC_LIST_CONNECTIONS), 1), (std::vector<std::string>{"values", "hub"}));
    EXPECT_EQ(List(dlg, IDC_LIST_CONNECTIONS)->headerItem()->text(1).toStdString(), "Service Bus Queue Name");
    EXPECT_TRUE(driver.BoxTexts().empty());
    // Removing still works without a runtime.
    SelectRows(List(dlg, IDC_LIST_EXPORTED), {"Plant#Level"});
    Click(dlg, IDC_REMOVE_VARIABLES);
    EXPECT_EQ(Keys(config), std::vector<std::string>{"Line2#Speed"});
}

TEST_F(SettingsDialogTest, VariablesMoveBetweenTheListsAndAreNeverOfferedTwice) {
    StartRuntime();
    AddVariable(config, "Plant#Level");
    AddVariable(config, "Line2#Speed");
    AddVariable(config, "plant#Flow");  // another project's key: the map compares exactly
    CDlgKonfig& dlg = Open();
    QTreeWidget* variables = List(dlg, IDC_LIST_VARIABLES);
    QTreeWidget* exported = List(dlg, IDC_LIST_EXPORTED);
    EXPECT_EQ(Texts(List(dlg, IDC_LIST_PROJECTS)), (std::vector<std::string>{"Line2", "Plant"}));
    ASSERT_EQ(List(dlg, IDC_LIST_PROJECTS)->selectedItems().size(), 1);
    SelectRows(List(dlg, IDC_LIST_PROJECTS), {"Plant"});
    // Level is exported already and not offered.
    EXPECT_EQ(Texts(variables), (std::vector<std::string>{"10", "9", "alpha", "Beta", "Flow", "Temp"}));

    SelectRows(variables, {"9", "Beta", "Temp"});
    Click(dlg, IDC_ADD_VARIABLES);
    EXPECT_EQ(Texts(variables), (std::vector<std::string>{"10", "alpha", "Flow"}));
    EXPECT_EQ(Texts(exported), (std::vector<std::string>{"Line2#Speed", "Plant#9", "Plant#Beta", "plant#Flow",
                                                         "Plant#Level", "Plant#Temp"}));
    EXPECT_EQ(config.m_mapVariables.GetCount(), 6);

    // "<" of a Plant key brings the variable back.
    SelectRows(exported, {"Plant#Beta"});
    Click(dlg, IDC_REMOVE_VARIABLES);
    EXPECT_EQ(Texts(variables), (std::vector<std::string>{"10", "alpha", "Beta", "Flow"}));

    // "<" of another project's key leaves the variables list alone (its selection stays) ...
    SelectRows(variables, {"alpha"});
    SelectRows(exported, {"Line2#Speed"});
    Click(dlg, IDC_REMOVE_VARIABLES);
    EXPECT_TRUE(variables->findItems("alpha", Qt::MatchExactly).front()->isSelected());
    // ... while a key of the selected project in other letter case refills it.
    SelectRows(exported, {"plant#Flow"});
    Click(dlg, IDC_REMOVE_VARIABLES);
    EXPECT_TRUE(variables->selectedItems().isEmpty());
    EXPECT_EQ(Texts(variables), (std::vector<std::string>{"10", "alpha", "Beta", "Flow"}));
    EXPECT_EQ(Keys(config), (std::vector<std::string>{"Plant#9", "Plant#Level", "Plant#Temp"}));

    // A double click moves one variable.
    QTreeWidgetItem* flow = variables->findItems("Flow", Qt::MatchExactly).front();
    variables->clearSelection();
    flow->setSelected(true);
    emit variables->itemDoubleClicked(flow, 0);
    EXPECT_EQ(Texts(variables), (std::vector<std::string>{"10", "alpha", "Beta"}));
    EXPECT_EQ(config.m_mapVariables.GetCount(), 4);
}

TEST_F(SettingsDialogTest, DeselectingTheProjectEmptiesTheVariablesAndHeadersSortBothWays) {
    StartRuntime();
    CDlgKonfig& dlg = Open();
    QTreeWidget* projects = List(dlg, IDC_LIST_PROJECTS);
    QTreeWidget* variables = List(dlg, IDC_LIST_VARIABLES);
    SelectRows(projects, {"Plant"});
    ASSERT_EQ(variables->topLevelItemCount(), 7);

    auto* header = static_cast<CSortHeaderCtrl*>(variables->header());
    EXPECT_EQ(header->GetColumnImage(0), 1);  // up arrow from the start
    ClickHeader(variables);
    EXPECT_TRUE(header->IsDescending());
    EXPECT_EQ(header->GetColumnImage(0), 0);
    EXPECT_EQ(DrawnArrow(header), (std::vector<std::string>{"ggggggggw", ".gsssssw.", ".gsssssw.", "..gsssw..",
                                                            "..gsssw..", "...gsw...", "...gsw...", "....w...."}));
    EXPECT_EQ(Texts(variables), (std::vector<std::string>{"Temp", "Level", "Flow", "Beta", "alpha", "9", "10"}));
    ClickHeader(variables);
    EXPECT_EQ(header->GetColumnImage(0), 1);
    EXPECT_EQ(DrawnArrow(header), (std::vector<std::string>{"....g....", "...gsw...", "...gsw...", "..gsssw..",
                                                            "..gsssw..", ".gsssssw.", ".gsssssw.", "gwwwwwwww"}));
    EXPECT_EQ(Texts(variables), (std::vector<std::string>{"10", "9", "alpha", "Beta", "Flow", "Level", "Temp"}));

    // A click on empty space below the items.
    QTest::mouseClick(projects->viewport(), Qt::LeftButton, {}, QPoint(5, projects->viewport()->height() - 3));
    EXPECT_TRUE(projects->selectedItems().isEmpty());
    EXPECT_EQ(variables->topLevelItemCount(), 0);
}

TEST(SortHeaderCtrl, ArrowsKeepTheirPatternAndMaskColour) {
    QTreeWidget list;
    auto* header = new CSortHeaderCtrl(&list);
    list.setHeader(header);
    list.setHeaderLabels({"Points"});
    header->SetSortArrow(5, true);  // no such column: nothing recorded
    EXPECT_EQ(header->GetSortColumn(), -1);
    header->SetSortArrow(0, true);
    ASSERT_EQ(header->GetImages().size(), 2u);
    const QImage down = header->GetImages()[0].toImage(), up = header->GetImages()[1].toImage();
    ASSERT_EQ(down.size(), QSize(9, 11));
    EXPECT_EQ(down.pixelColor(0, 0).alpha(), 0);  // mask colour: transparent
    EXPECT_EQ(down.pixelColor(0, 2).rgb(), qRgb(128, 128, 128));
    EXPECT_EQ(down.pixelColor(8, 2).rgb(), qRgb(255, 255, 255));
    EXPECT_EQ(down.pixelColor(4, 9).rgb(), qRgb(255, 255, 255));
    EXPECT_EQ(up.pixelColor(4, 2).rgb(), qRgb(128, 128, 128));
    EXPECT_EQ(up.pixelColor(4, 3).rgb(), qRgb(192, 192, 192));
    EXPECT_EQ(up.pixelColor(4, 1).alpha(), 0);
}

TEST(SortList, SortsByTheTextsAlsoAfterDeletionsRepeatedItemData) {
    QTreeWidget list;
    EXPECT_EQ(AppendListItem(list, u"b"), 0);
    EXPECT_EQ(list.topLevelItem(0)->data(0, Qt::UserRole).toInt(), 1);
    AppendListItem(list, u"C");
    AppendListItem(list, u"a");
    delete list.takeTopLevelItem(0);
    AppendListItem(list, u"D");  // carries 3, as "a" does
    AppendListItem(list, u"c");
    SortList(list, true);
    EXPECT_EQ(Texts(&list), (std::vector<std::string>{"D", "C", "c", "a"}));
    SortList(list, false);
    EXPECT_EQ(Texts(&list), (std::vector<std::string>{"a", "C", "c", "D"}));
}

TEST_F(SettingsDialogTest, PasswordsAreCheckedEncipheredAndKept) {
    CAesCrypt crypt(kProxyPasswordKeyHigh, kProxyPasswordKeyLow);
    CString stored = u"old secret";
    ASSERT_TRUE(crypt.EncryptHexString(stored));
    config.m_strProxyDomain = u"proxy.local";
    config.m_strProxyUser = u"user";
    config.m_strProxyPassword = stored;
    CDlgKonfig& dlg = Open();
    EXPECT_EQ(Control<QLineEdit>(dlg, IDC_PROXY_PASSWORD)->text().toStdString(), std::string(20, '0'));
    EXPECT_EQ(Control<QLineEdit>(dlg, IDC_PROXY_PASSWORD_CONFIRM)->text().toStdString(), std::string(20, '0'));

    // The placeholder keeps the stored form as it is.
    EXPECT_TRUE(dlg.DoDataExchange(true));
    EXPECT_EQ(config.m_strProxyPassword, stored);

    // Empty or differing fields: a message, and the dialog stays open.
    const std::vector<std::pair<QString, QString>> refused{{"", ""}, {"new", ""}, {"", "new"}, {"new", "New"}};
    for (const auto& [password, confirmation] : refused) {
        SetText(dlg, IDC_PROXY_PASSWORD, password);
        SetText(dlg, IDC_PROXY_PASSWORD_CONFIRM, confirmation);
        Click(dlg, IDC_OK);
        EXPECT_TRUE(dlg.isVisible());
        EXPECT_EQ(config.m_strProxyPassword, stored);
    }
    const std::string both = "The password has to be entered in both text boxes!";
    EXPECT_EQ(driver.BoxTexts(), (std::vector<std::string>{both, both, both,
                                                           "The passwords you typed do not match. Please retype the "
                                                           "password in both boxes."}));
    EXPECT_EQ(dlg.focusWidget(), Control(dlg, IDC_PROXY_PASSWORD_CONFIRM));

    SetText(dlg, IDC_PROXY_PASSWORD, "n\u00e9w secret");
    SetText(dlg, IDC_PROXY_PASSWORD_CONFIRM, "n\u00e9w secret");
    Click(dlg, IDC_OK);
    EXPECT_EQ(dlg.result(), QDialog::Accepted);
    CString form = config.m_strProxyPassword;
    EXPECT_EQ(form.ToUtf8().find_first_not_of("0123456789ABCDEF"), std::string::npos);
    ASSERT_TRUE(crypt.DecryptHexString(form));
    EXPECT_EQ(form.ToUtf8(), "n\u00e9w secret");

    // Without domain and user there is no password, whatever the fields hold.
    SetText(dlg, IDC_PROXY_DOMAIN, "");
    SetText(dlg, IDC_PROXY_USER, "");
    SetText(dlg, IDC_PROXY_PASSWORD_CONFIRM, "other");
    EXPECT_TRUE(dlg.DoDataExchange(true));
    EXPECT_TRUE(config.m_strProxyPassword.IsEmpty());
    EXPECT_TRUE(config.m_strProxyDomain.IsEmpty());
}

TEST_F(SettingsDialogTest, IntegrityPeriodMustBeOneToThreeThousandSixHundred) {
    CDlgKonfig& dlg = Open();
    EXPECT_EQ(Control<QLineEdit>(dlg, IDC_INTEGRITY_PERIOD)->text().toStdString(), "5");
    for (const char* refused : {"0", "3601", "", "99999999999999"}) {
        SetText(dlg, IDC_INTEGRITY_PERIOD, refused);
        EXPECT_FALSE(dlg.DoDataExchange(true)) << refused;
        EXPECT_EQ(config.m_nIntegrityPeriod, 5);
    }
    EXPECT_EQ(driver.BoxTexts().size(), 4u);
    EXPECT_EQ(driver.BoxTexts()[2], "Please enter an integer.");
    EXPECT_EQ(driver.BoxTexts()[0], "Please enter an integer between 1 and 3600.");
    for (int accepted : {1, 3600}) {
        SetText(dlg, IDC_INTEGRITY_PERIOD, QString::number(accepted));
        EXPECT_TRUE(dlg.DoDataExchange(true));
        EXPECT_EQ(config.m_nIntegrityPeriod, accepted);
    }
}

TEST_F(SettingsDialogTest, InactiveProjectDisablesTheVariableControlsUntilActive) {
    StartRuntime();
    AddVariable(config, "Plant#Level");
    CDlgKonfig& dlg = Open();
    QTreeWidget* variables = List(dlg, IDC_LIST_VARIABLES);
    SelectRows(List(dlg, IDC_LIST_PROJECTS), {"Plant"});
    const std::vector<UINT> ids{IDC_LIST_PROJECTS, IDC_LIST_VARIABLES,   IDC_LIST_EXPORTED,
                                IDC_ADD_VARIABLES, IDC_REMOVE_VARIABLES, IDC_OK};
    auto allEnabled = [&](bool enabled) {
        for (UINT id : ids) {
            if (Control(dlg, id)->isEnabled() != enabled) return false;
        }
        return true;
    };
    ASSERT_TRUE(allEnabled(true));
    variables->topLevelItem(0)->setSelected(true);

    ASSERT_TRUE(runtime->SetProjectActive(u"Line2", false));  // fired on the stand-in's own thread
    runtime->Flush();
    // The event thread only posted: the widgets change on the dialog's thread.
    EXPECT_TRUE(allEnabled(true));
    ASSERT_TRUE(PumpUntil([&] { return allEnabled(false); }));
    EXPECT_TRUE(Control(dlg, IDC_LIST_CONNECTIONS)->isEnabled());
    EXPECT_TRUE(Control(dlg, IDC_CANCEL)->isEnabled());
    EXPECT_TRUE(Control(dlg, IDC_PROXY_DOMAIN)->isEnabled());

    ASSERT_TRUE(runtime->SetProjectActive(u"Line2", true));
    ASSERT_TRUE(PumpUntil([&] { return allEnabled(true); }));
    EXPECT_TRUE(variables->selectedItems().isEmpty());  // refilled
    EXPECT_EQ(variables->topLevelItemCount(), 6);
}

TEST_F(SettingsDialogTest, ConnectionsAreAddedEditedAndDeletedInTheirDialog) {
    AddConnection(config, "Endpoint=sb://one", "first", false, 0);
    AddConnection(config, "Endpoint=sb://two", "second", false, 0);
    AddConnection(config, "Endpoint=sb://three", "third", true, 1);
    CDlgKonfig& dlg = Open();
    QTreeWidget* connections = List(dlg, IDC_LIST_CONNECTIONS);

    driver.OnNextDialog("2000", [](QDialog& connection) {
        Control<QLineEdit>(connection, IDC_CONNECTION_TEXT)->setText("Endpoint=sb://four");
        Control<QLineEdit>(connection, IDC_CONNECTION_QUEUE)->setText("hub");
        QTest::mouseClick(Control<QRadioButton>(connection, IDC_MODE_EVENTHUB), Qt::LeftButton);
        Control<QComboBox>(connection, IDC_FORMAT)->setCurrentIndex(2);
        Click(connection, IDC_OK);
    });
    Click(dlg, IDC_NEW_CONNECTION);
    ASSERT_EQ(config.m_lstConnections.GetCount(), 4);
    const CConnection* added = config.m_lstConnections.GetTail();
    EXPECT_EQ(added->m_strQueue.ToUtf8(), "hub");
    EXPECT_TRUE(added->m_bEventHub);
    EXPECT_EQ(added->m_nFormat, 2);
    EXPECT_EQ(Texts(connections, 1), (std::vector<std::string>{"first", "second", "third", "hub"}));

    driver.OnNextDialog("2000", [](QDialog& connection) {
        Control<QLineEdit>(connection, IDC_CONNECTION_QUEUE)->setText("renamed");
        Click(connection, IDC_CANCEL);
    });
    Click(dlg, IDC_NEW_CONNECTION);  // cancelled: nothing added
    EXPECT_EQ(config.m_lstConnections.GetCount(), 4);

    SelectRows(connections, {"Endpoint=sb://two"});
    driver.OnNextDialog("2000", [](QDialog& connection) {
        Control<QLineEdit>(connection, IDC_CONNECTION_QUEUE)->setText("renamed");
        Click(connection, IDC_OK);
    });
    Click(dlg, IDC_EDIT_CONNECTION);
    EXPECT_EQ(Texts(connections, 1), (std::vector<std::string>{"first", "renamed", "third", "hub"}));

    SelectRows(connections, {"Endpoint=sb://one", "Endpoint=sb://three"});
    Click(dlg, IDC_DELETE_CONNECTION);
    std::vector<std::string> queues;
    for (const CConnection* c : config.m_lstConnections) queues.push_back(c->m_strQueue.ToUtf8());
    EXPECT_EQ(queues, (std::vector<std::string>{"renamed", "hub"}));
    EXPECT_EQ(Texts(connections, 1), queues);
    EXPECT_EQ(driver.DialogsShown("2000"), 3);
}

TEST(ConnectionDialog, ModeAndFormatRules) {
    CConnection record;
    // Event Hub enables the format, Queue disables it again and keeps the choice.
    auto chooseJsonThenQueue = [](CDlgConnection& dlg) {
        dlg.show();
        auto* format = Control<QComboBox>(dlg, IDC_FORMAT);
        ASSERT_EQ(format->count(), 3);
        EXPECT_EQ(format->itemText(2).toStdString(), "BOND");
        EXPECT_TRUE(Control<QRadioButton>(dlg, IDC_MODE_QUEUE)->isChecked());
        EXPECT_EQ(format->currentText().toStdString(), "XML");
        EXPECT_FALSE(format->isEnabled());
        QTest::mouseClick(Control<QRadioButton>(dlg, IDC_MODE_EVENTHUB), Qt::LeftButton);
        EXPECT_TRUE(format->isEnabled());
        format->setCurrentIndex(1);
        QTest::mouseClick(Control<QRadioButton>(dlg, IDC_MODE_QUEUE), Qt::LeftButton);
        EXPECT_FALSE(format->isEnabled());
        EXPECT_EQ(format->currentIndex(), 1);
        Control<QLineEdit>(dlg, IDC_CONNECTION_QUEUE)->setText("values");
    };
    {
        CDlgConnection dlg(nullptr, record);
        chooseJsonThenQueue(dlg);
        Click(dlg, IDC_CANCEL);
        EXPECT_EQ(dlg.result(), QDialog::Rejected);
    }
    EXPECT_EQ(record.m_nFormat, 0);  // Cancel changes nothing
    EXPECT_TRUE(record.m_strQueue.IsEmpty());
    {
        CDlgConnection dlg(nullptr, record);
        chooseJsonThenQueue(dlg);
        Click(dlg, IDC_OK);
        EXPECT_EQ(dlg.result(), QDialog::Accepted);
    }
    EXPECT_FALSE(record.m_bEventHub);
    EXPECT_EQ(record.m_nFormat, 1);  // the format chosen while Event Hub was on
    EXPECT_EQ(record.m_strQueue.ToUtf8(), "values");

    record.m_nFormat = 7;  // unknown: shows XML, kept unless another is chosen
    record.m_bEventHub = true;
    {
        CDlgConnection dlg(nullptr, record);
        dlg.show();
        auto* format = Control<QComboBox>(dlg, IDC_FORMAT);
        EXPECT_EQ(format->currentIndex(), 0);
        EXPECT_TRUE(format->isEnabled());
        format->setEditText("YAML");  // typed: no item selected
        Click(dlg, IDC_OK);
    }
    EXPECT_EQ(record.m_nFormat, 7);
    EXPECT_TRUE(record.m_bEventHub);
}

}  // namespace
