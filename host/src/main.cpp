// skyvane-gateway: the gateway host. Loads libSkyvane.so, gives it a host
// window and the settings file, and runs the event loop until a signal (or
// --duration) stops it. See GatewayManual() for the command line.

#include "Gateway.h"
#include "GatewayOptions.h"
#include "SignalBridge.h"

#include "tarvo/Config.h"

#include <QApplication>
#include <QCoreApplication>
#include <QDir>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <memory>

namespace {

bool HasDisplay() {
    for (const char* name : {"DISPLAY", "WAYLAND_DISPLAY", "QT_QPA_PLATFORM"}) {
        const char* value = std::getenv(name);
        if (value && *value) return true;
    }
    return false;
}

// The checks that need no event loop: options, files, display. -1 to go on, else the exit code.
int CheckArguments(int argc, char** argv, GatewayOptions& options, tarvo::RuntimeConfig& project) {
    std::string error;
    if (!ParseGatewayOptions(std::vector<std::string>(argv + 1, argv + argc), options, error)) {
        GatewayError(error);
        return 2;
    }
    if (options.command == GatewayCommand::Help) {
        std::fputs(GatewayManual(), stdout);
        return 0;
    }
    if (options.command == GatewayCommand::Version) {
        std::printf("skyvane-gateway %s\n", SKYVANE_GATEWAY_VERSION);
        return 0;
    }
    if (!CheckSettingsFile(options.iniFile, error)) {
        GatewayError(error);
        return 2;
    }
    if (!options.projectFile.empty() && !tarvo::LoadProjectFile(options.projectFile, &project, &error)) {
        GatewayError("project file: " + error);
        return 2;
    }
    if (options.command == GatewayCommand::Configure && !HasDisplay()) {
        GatewayError("configure shows a dialog and needs a display (DISPLAY or WAYLAND_DISPLAY is not set)");
        return 2;
    }
    return -1;
}

}  // namespace

int main(int argc, char** argv) {
    GatewayOptions options;
    tarvo::RuntimeConfig project;
    if (const int code = CheckArguments(argc, argv, options, project); code >= 0) return code;

    // The application object comes first: the module creates its window when it is loaded.
    std::unique_ptr<QCoreApplication> application;
    if (options.command == GatewayCommand::Configure) application = std::make_unique<QApplication>(argc, argv);
    else application = std::make_unique<QCoreApplication>(argc, argv);

    const CString modulePath =
        options.modulePath.empty()
            ? CString::FromUtf8(QDir(QCoreApplication::applicationDirPath()).filePath("libSkyvane.so").toStdString())
            : CString::FromUtf8(options.modulePath);
    CSkyvaneModule module;
    CString error;
    if (!module.Load(modulePath, error)) {
        GatewayError(error.ToUtf8());
        return 1;
    }

    CGateway gateway(options, module, std::move(project));
    if (options.command == GatewayCommand::Configure) return gateway.Configure();

    CSignalBridge signalBridge({SIGINT, SIGTERM, SIGHUP}, [&gateway](int signal) {
        if (signal == SIGHUP) gateway.Reload();
        else gateway.Stop(signal == SIGINT ? "SIGINT" : "SIGTERM");
    });
    if (!signalBridge.IsValid()) {
        GatewayError("cannot set up signal handling");
        return 1;
    }
    if (!gateway.Start()) return 2;
    return QCoreApplication::exec();
}
