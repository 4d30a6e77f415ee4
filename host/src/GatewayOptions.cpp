#include "GatewayOptions.h"

#include <charconv>
#include <cmath>

namespace {

constexpr double kLongestSeconds = 2000000;  // about 23 days: every timer interval stays within 32-bit milliseconds

struct OptionInfo {
    const char* name;
    bool forRun;        // run accepts it
    bool forConfigure;  // configure accepts it
};

constexpr OptionInfo kOptions[] = {
    {"--ini", true, true},           {"--simulate", true, true},  {"--simulate-delay", true, false},
    {"--module", true, true},        {"--duration", true, false}, {"--status-interval", true, false},
    {"--metrics-file", true, false},
};

const OptionInfo* FindOption(const std::string& name) {
    for (const OptionInfo& info : kOptions)
        if (name == info.name) return &info;
    return nullptr;
}

// Seconds as a decimal number within 0..one year; zero only where allowed.
bool ParseSeconds(const std::string& name, const std::string& text, bool zeroAllowed, double& seconds,
                  std::string& error) {
    double value = 0;
    const auto [end, code] = std::from_chars(text.data(), text.data() + text.size(), value);
    const bool number = code == std::errc() && end == text.data() + text.size() && std::isfinite(value);
    if (!number || value < 0 || value > kLongestSeconds || (!zeroAllowed && value == 0)) {
        error = name + " needs " + (zeroAllowed ? "a number of seconds from 0" : "a number of seconds above 0") +
                " up to 2000000, not '" + text + "'";
        return false;
    }
    seconds = value;
    return true;
}

bool Apply(const std::string& name, const std::string& value, GatewayOptions& options, std::string& error) {
    if (value.empty() && name != "--simulate-delay") {
        error = name + " needs a value";
        return false;
    }
    if (name == "--ini") options.iniFile = value;
    else if (name == "--simulate") options.projectFile = value;
    else if (name == "--module") options.modulePath = value;
    else if (name == "--metrics-file") options.metricsFile = value;
    else if (name == "--simulate-delay") return ParseSeconds(name, value, true, options.simulateDelay, error);
    else if (name == "--duration") return ParseSeconds(name, value, false, options.duration, error);
    else if (name == "--status-interval") return ParseSeconds(name, value, false, options.statusInterval, error);
    return true;
}

}  // namespace

bool ParseGatewayOptions(const std::vector<std::string>& arguments, GatewayOptions& options, std::string& error) {
    options = GatewayOptions{};
    if (arguments.empty()) {
        error = "a command is needed: run or configure (see --help)";
        return false;
    }
    const std::string& command = arguments[0];
    if (command == "--help" || command == "-h" || command == "--version") {
        options.command = command == "--version" ? GatewayCommand::Version : GatewayCommand::Help;
        if (arguments.size() == 1) return true;
        error = command + " takes nothing else";
        return false;
    }
    if (command == "run") options.command = GatewayCommand::Run;
    else if (command == "configure") options.command = GatewayCommand::Configure;
    else {
        error = "unknown command '" + command + "': use run or configure (see --help)";
        return false;
    }

    std::vector<std::string> seen;
    for (size_t i = 1; i < arguments.size(); ++i) {
        std::string name = arguments[i];
        std::string value;
        bool hasValue = false;
        if (const size_t equals = name.find('='); name.rfind("--", 0) == 0 && equals != std::string::npos) {
            value = name.substr(equals + 1);
            name.resize(equals);
            hasValue = true;
        }
        const OptionInfo* info = FindOption(name);
        const bool accepted = info && (options.command == GatewayCommand::Run ? info->forRun : info->forConfigure);
        if (!accepted) {
            error = info ? name + " does not apply to " + command
                         : "unknown " + std::string(name.rfind("-", 0) == 0 ? "option" : "argument") + " '" + name +
                               "' (see --help)";
            return false;
        }
        for (const std::string& earlier : seen)
            if (earlier == name) {
                error = name + " is given twice";
                return false;
            }
        seen.push_back(name);
        if (!hasValue) {
            if (i + 1 >= arguments.size()) {
                error = name + " needs a value";
                return false;
            }
            value = arguments[++i];
        }
        if (!Apply(name, value, options, error)) return false;
    }
    if (options.iniFile.empty()) {
        error = command + " needs --ini FILE, the module's settings file";
        return false;
    }
    if (options.simulateDelay > 0 && options.projectFile.empty()) {
        error = "--simulate-delay needs --simulate";
        return false;
    }
    return true;
}

const char* GatewayManual() {
    return R"(NAME
    skyvane-gateway - export live SCADA values to Azure through the Skyvane module

SYNOPSIS
    skyvane-gateway run --ini FILE [--simulate PROJECT.json [--simulate-delay S]]
                        [--duration S] [--status-interval S] [--metrics-file FILE]
                        [--module PATH]
    skyvane-gateway configure --ini FILE [--simulate PROJECT.json] [--module PATH]
    skyvane-gateway --help | --version

DESCRIPTION
    The gateway host loads the protocol module libSkyvane.so, hands it the
    settings file and a window of its own for the module's status messages,
    and runs the event loop on which the module's timer and window live. The
    module attaches to the SCADA runtime, subscribes the variables the
    settings file names and sends their changes to every configured Azure
    Service Bus queue or Event Hub.

    When the module cannot start (no runtime reachable yet, unknown
    variables, a runtime link that does not start), the gateway says why,
    stops the module and tries again after 1 s, 2 s, 4 s ... up to 30 s
    between attempts, until it starts or the gateway is stopped.

COMMANDS
    run        Run until SIGINT or SIGTERM (or --duration).
    configure  Show the module's settings dialog; needs a display. The
               module is started first, since it takes the host's context
               at start, and stopped when the dialog closes.

OPTIONS
    --ini FILE
        The module's settings file (sections Azure, VARIABLES, CONNECTIONS).
        It must exist and be readable.
    --simulate PROJECT.json
        Start the SCADA runtime stand-in in this process with that project
        file, instead of attaching to the runtime that is running. Without
        it, the gateway reaches a runtime of the same user in another
        process through its local socket (see SKYVANE_AUTOMATION_DIR).
    --simulate-delay S
        Start the stand-in only S seconds after the gateway, as a runtime
        that comes up after the service does.
    --duration S
        Stop after S seconds, as on SIGTERM.
    --status-interval S
        Seconds between two status lines (default 10).
    --metrics-file FILE
        Write the counters as cumulative totals in the Prometheus text
        format to FILE at every status interval, replacing it atomically
        (for node_exporter's textfile collector).
    --module PATH
        The module to load (default: libSkyvane.so beside the program).

OUTPUT
    Every status interval one line on standard output:
        status: R rows sent, F failed cycles, C cycles, longest cycle M ms (last S s)
    R sums the rows the module reported as sent to all targets, C the
    export cycles that did work, F those in which rows failed. Each start
    attempt, each reload and each failed restart of the export gets a line
    at once. Errors go to standard error; the module writes its own records
    to the central log (see brennic.ini).

SIGNALS
    SIGINT, SIGTERM  Stop the module (its log is written out), unload it and
                     exit with status 0.
    SIGHUP           Read the settings file again and restart the export.
                     The result is reported; after a failed restart the
                     gateway stops the module and retries as at start. A
                     settings file that cannot be read is not applied.

EXIT STATUS
    0  stopped by a signal or after --duration
    1  the module cannot be loaded or lacks one of its exports
    2  a usage error, a settings or project file that does not exist or
       cannot be read, or configure without a display

ENVIRONMENT
    BRENNIC_CONFIG          the central log's configuration file
    SKYVANE_AUTOMATION_DIR  the folder of the runtime's sockets (default:
                            $XDG_RUNTIME_DIR/skyvane-automation, else
                            /tmp/skyvane-automation-UID)

EXAMPLES
    skyvane-gateway run --ini /etc/skyvane/skyvane.ini --metrics-file \
        /var/lib/node_exporter/textfile/skyvane.prom
    skyvane-gateway run --ini demo.ini --simulate plant.json --duration 20
)";
}
