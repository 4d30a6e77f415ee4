#include "UiTestSupport.h"

#include <QApplication>
#include <QEvent>
#include <QMessageBox>
#include <QPointer>

CModalDriver::CModalDriver() { qApp->installEventFilter(this); }

CModalDriver::~CModalDriver() { qApp->removeEventFilter(this); }

void CModalDriver::OnNextDialog(const QString& objectName, std::function<void(QDialog&)> action) {
    m_pending.push_back({objectName, std::move(action)});
}

int CModalDriver::DialogsShown(const QString& objectName) const {
    int count = 0;
    for (const QString& name : m_shown) count += name == objectName;
    return count;
}

bool CModalDriver::eventFilter(QObject* watched, QEvent* event) {
    if (event->type() != QEvent::Show) return false;
    if (auto* box = qobject_cast<QMessageBox*>(watched)) {
        m_boxTexts.push_back(box->text().toStdString());
        QMetaObject::invokeMethod(
            box, [box] { box->done(QMessageBox::Ok); }, Qt::QueuedConnection);
        return false;
    }
    auto* dialog = qobject_cast<QDialog*>(watched);
    if (!dialog || !dialog->isModal()) return false;
    m_shown.push_back(dialog->objectName());
    for (auto it = m_pending.begin(); it != m_pending.end(); ++it) {
        if (it->objectName != dialog->objectName()) continue;
        auto action = std::move(it->action);
        m_pending.erase(it);
        QPointer<QDialog> guarded(dialog);
        QMetaObject::invokeMethod(
            dialog,
            [guarded, action] {
                if (guarded) action(*guarded);
            },
            Qt::QueuedConnection);
        break;
    }
    return false;
}
