#pragma once
// Driving modal widgets in tests: message boxes are answered as soon as they
// show (their texts recorded), and a test can act inside the next modal
// dialog with a given object name once it shows. Controls are found by their
// ids, which the dialogs give them as object names.

#include <QDialog>
#include <QObject>
#include <QPushButton>
#include <QString>
#include <QTest>
#include <QTreeWidget>

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

template <typename T = QWidget>
T* Control(QWidget& dialog, unsigned id) {
    T* control = dialog.findChild<T*>(QString::number(id));
    EXPECT_NE(control, nullptr) << "control " << id;
    return control;
}

inline void Click(QWidget& dialog, unsigned id) { QTest::mouseClick(Control<QPushButton>(dialog, id), Qt::LeftButton); }

// Selects exactly the rows with these texts.
inline void SelectRows(QTreeWidget* list, const std::vector<std::string>& texts) {
    list->clearSelection();
    for (const std::string& text : texts) {
        const auto found = list->findItems(QString::fromStdString(text), Qt::MatchExactly);
        ASSERT_EQ(found.size(), 1) << text;
        found.front()->setSelected(true);
    }
}

class CModalDriver : public QObject {
public:
    CModalDriver();
    ~CModalDriver() override;

    // Texts of the message boxes shown so far (each closed with its default button).
    std::vector<std::string> BoxTexts() const { return m_boxTexts; }
    void ClearBoxTexts() { m_boxTexts.clear(); }
    // Runs action in the event loop of the next dialog named objectName, once it shows.
    void OnNextDialog(const QString& objectName, std::function<void(QDialog&)> action);
    int DialogsShown(const QString& objectName) const;

protected:
    bool eventFilter(QObject* watched, QEvent* event) override;

private:
    struct Pending {
        QString objectName;
        std::function<void(QDialog&)> action;
    };
    std::vector<std::string> m_boxTexts;
    std::vector<Pending> m_pending;
    std::vector<QString> m_shown;
};
