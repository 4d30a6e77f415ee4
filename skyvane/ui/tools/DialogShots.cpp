// skyvane-dialog-shots: shows the settings dialog and the connection dialog
// with the runtime stand-in running a project file, and writes a PNG of each
// (and one of the settings dialog with its variables sorted descending).
//
//   skyvane-dialog-shots <project file> <settings file> <output folder>
#include "frame/ConfigFile.h"
#include "res/StringTable.h"
#include "ui/DlgConnection.h"
#include "ui/DlgKonfig.h"
#include "ui/SortHeaderCtrl.h"

#include "tarvo/Config.h"
#include "tarvo/Control.h"

#include <QApplication>
#include <QDeadlineTimer>
#include <QDir>
#include <QTreeWidget>
#include <QWindow>

#include <cstdio>

namespace {

// Runs the event loop until the widget is on screen and laid out.
bool ShowAndSettle(QWidget& widget) {
    widget.show();
    QDeadlineTimer deadline(10000);
    while (!(widget.windowHandle() && widget.windowHandle()->isExposed())) {
        if (deadline.hasExpired()) return false;
        QCoreApplication::processEvents(QEventLoop::WaitForMoreEvents, 50);
    }
    QCoreApplication::processEvents();
    return true;
}

bool Save(QWidget& widget, const QString& path) {
    QCoreApplication::processEvents();
    if (!widget.grab().save(path, "PNG")) {
        std::fprintf(stderr, "cannot write %s\n", qPrintable(path));
        return false;
    }
    std::printf("%s\n", qPrintable(path));
    return true;
}

}  // namespace

int main(int argc, char** argv) {
    QApplication app(argc, argv);
    if (argc != 4) {
        std::fprintf(stderr, "usage: %s <project file> <settings file> <output folder>\n", argv[0]);
        return 2;
    }
    CStringTableRegistration strings(kModuleStrings, kModuleStringCount);
    tarvo::RuntimeConfig runtimeConfig;
    std::string error;
    if (!tarvo::LoadProjectFile(argv[1], &runtimeConfig, &error)) {
        std::fprintf(stderr, "%s: %s\n", argv[1], error.c_str());
        return 1;
    }
    tarvo::RuntimeOptions options;
    options.simulate = false;
    tarvo::Runtime runtime(runtimeConfig, options);
    if (!runtime.Start(&error)) {
        std::fprintf(stderr, "the runtime stand-in does not start: %s\n", error.c_str());
        return 1;
    }
    const QDir out(QString::fromLocal8Bit(argv[3]));
    if (!QDir().mkpath(out.path())) {
        std::fprintf(stderr, "cannot create %s\n", argv[3]);
        return 1;
    }

    CAzureConfig config;
    ReadConfig(CString(argv[2]), config);
    bool ok = true;
    {
        CDlgKonfig settings(nullptr, config);
        if (!ShowAndSettle(settings)) return 1;
        auto* variables = settings.findChild<QTreeWidget*>(QString::number(IDC_LIST_VARIABLES));
        for (int i = 1; i < variables->topLevelItemCount() && i < 3; ++i) variables->topLevelItem(i)->setSelected(true);
        ok = Save(settings, out.filePath("settings.png")) && ok;
        emit variables->header()->sectionClicked(0);  // as a click on the header: descending, down arrow
        ok = Save(settings, out.filePath("settings-sorted.png")) && ok;
        if (!config.m_lstConnections.IsEmpty()) {
            CDlgConnection connection(&settings, *config.m_lstConnections.GetHead());
            if (!ShowAndSettle(connection)) return 1;
            ok = Save(connection, out.filePath("connection.png")) && ok;
        }
    }
    runtime.Stop();
    return ok ? 0 : 1;
}
