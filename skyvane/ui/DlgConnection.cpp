#include "ui/DlgConnection.h"

#include "res/resource.h"
#include "ui/DialogBuilder.h"

#include <QComboBox>
#include <QLineEdit>
#include <QPushButton>
#include <QRadioButton>

namespace {

bool IsKnownFormat(int format) { return format >= 0 && format <= 2; }

}  // namespace

CDlgConnection::CDlgConnection(QWidget* parent, CConnection& connection)
    : QDialog(parent), m_connection(connection), m_strConnection(connection.m_strConnection),
      m_strQueue(connection.m_strQueue), m_nMode(connection.m_bEventHub ? 1 : 0),
      m_nFormat(IsKnownFormat(connection.m_nFormat) ? connection.m_nFormat : 0) {
    BuildDialog(*this, kConnectionDialog);
    ApplyDialogInit(*this, kConnectionDialogInit, kConnectionDialogInitSize);
    m_editConnection = DialogControl<QLineEdit>(*this, IDC_CONNECTION_TEXT);
    m_editQueue = DialogControl<QLineEdit>(*this, IDC_CONNECTION_QUEUE);
    m_radioQueue = DialogControl<QRadioButton>(*this, IDC_MODE_QUEUE);
    m_radioEventHub = DialogControl<QRadioButton>(*this, IDC_MODE_EVENTHUB);
    m_comboFormat = DialogControl<QComboBox>(*this, IDC_FORMAT);
    connect(DialogControl<QPushButton>(*this, IDC_OK), &QPushButton::clicked, this, &CDlgConnection::accept);
    connect(DialogControl<QPushButton>(*this, IDC_CANCEL), &QPushButton::clicked, this, &CDlgConnection::reject);
    connect(m_radioQueue, &QRadioButton::clicked, this, &CDlgConnection::UpdateModeControls);
    connect(m_radioEventHub, &QRadioButton::clicked, this, &CDlgConnection::UpdateModeControls);

    DoDataExchange(false);
    UpdateModeControls();
}

CDlgConnection::~CDlgConnection() = default;

void CDlgConnection::DoDataExchange(bool save) {
    if (save) {
        m_strConnection = ToCString(m_editConnection->text());
        m_strQueue = ToCString(m_editQueue->text());
        m_nMode = m_radioEventHub->isChecked() ? 1 : m_radioQueue->isChecked() ? 0 : -1;
        // A text typed into the box's field selects no item.
        const int index = m_comboFormat->currentIndex();
        m_nFormat = index >= 0 && m_comboFormat->currentText() == m_comboFormat->itemText(index) ? index : -1;
        return;
    }
    m_editConnection->setText(ToQString(m_strConnection));
    m_editQueue->setText(ToQString(m_strQueue));
    m_editConnection->setCursorPosition(0);  // a long connection text shows its start
    m_editQueue->setCursorPosition(0);
    m_radioQueue->setChecked(m_nMode == 0);
    m_radioEventHub->setChecked(m_nMode == 1);
    m_comboFormat->setCurrentIndex(m_nFormat);
}

void CDlgConnection::UpdateModeControls() {
    DoDataExchange(true);
    m_comboFormat->setEnabled(m_nMode == 1);
}

void CDlgConnection::accept() {
    DoDataExchange(true);
    QDialog::accept();
    m_connection.m_strConnection = m_strConnection;
    m_connection.m_strQueue = m_strQueue;
    m_connection.m_bEventHub = m_nMode == 1;
    if (IsKnownFormat(m_nFormat)) m_connection.m_nFormat = m_nFormat;
}
