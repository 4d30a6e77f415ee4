#pragma once
// Driving modal widgets in tests: message boxes are answered as soon as they
// show (their texts recorded), and a test can act inside the next modal
// dialog with a given object name once it shows.

#include <QDialog>
#include <QObject>
#include <QString>

#include <functional>
#include <string>
#include <vector>

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
