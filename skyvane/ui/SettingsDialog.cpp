#include "ui/SettingsDialog.h"

#include "res/resource.h"
#include "ui/DlgKonfig.h"

#include "vxhelper/messagebox.h"

#include <QApplication>
#include <QThread>

int ShowSettingsDialog(CWnd* parent, CAzureConfig& config) {
    const HWND parentWnd = SafeHwnd(parent);
    auto* app = qobject_cast<QApplication*>(QCoreApplication::instance());
    if (!app || QThread::currentThread() != app->thread()) {
        VXHelper_MessageBox(parentWnd, IDS_SETTINGS_NEED_DESKTOP, MB_ICONERROR);
        return IDCANCEL;
    }
    CDlgKonfig dialog(static_cast<QWidget*>(GetNativeWidget(parentWnd)), config);
    return dialog.exec() == QDialog::Accepted ? IDOK : IDCANCEL;
}
