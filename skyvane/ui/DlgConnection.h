#pragma once
// The dialog "MS Azure Connection Settings": one Azure target's connection
// text, queue or Event Hub name, mode and message format. It edits the
// record it is given, and only when the user presses OK.

#include "cloud/AzureConfig.h"

#include <QDialog>

class QComboBox;
class QLineEdit;
class QRadioButton;

class CDlgConnection : public QDialog {
public:
    // Copies the record into the form; a stored format other than 0, 1 or 2 shows as XML.
    CDlgConnection(QWidget* parent, CConnection& connection);
    ~CDlgConnection() override;

    // Form -> members (save) or members -> form (load).
    void DoDataExchange(bool save);
    // The format box can be changed only while "Event Hub" is chosen.
    void UpdateModeControls();

    void accept() override;

private:
    CConnection& m_connection;
    CString m_strConnection;
    CString m_strQueue;
    int m_nMode = 0;    // 0 queue, 1 Event Hub
    int m_nFormat = 0;  // 0 XML, 1 JSON, 2 BOND; -1 when no item of the box is selected
    QLineEdit* m_editConnection;
    QLineEdit* m_editQueue;
    QRadioButton* m_radioQueue;
    QRadioButton* m_radioEventHub;
    QComboBox* m_comboFormat;
};
