#pragma once
// The log's configuration: its defaults, the file that overrides them and
// where that file is looked for. The file's keys are listed in the README
// ("Logging").

#include "brennic/logsink.h"

#include <string>
#include <string_view>
#include <vector>

namespace brennic {

// Module index of the log's own records.
constexpr BYTE kLogModuleIndex = 0;
// Module index whose errors and information are on by default.
constexpr BYTE kDefaultClientIndex = 19;

struct LogSettings {
    LogSettings();

    BYTE levels[LOG_MODULE_COUNT];
    bool fileEnabled = true;
    std::string filePath;  // empty: DefaultLogFolder()/<sink name>.log
    unsigned long long fileMaxBytes = 10ull * 1024 * 1024;
    int fileKeep = 5;  // rotated files kept beside the current one
    bool syslogEnabled = false;
    int syslogFacility;
    bool stderrEnabled = true;
    size_t queueCapacity = 10000;
};

// Reads a configuration text over the defaults. Each line it cannot use is
// skipped and described in problems.
LogSettings ParseLogConfig(std::string_view text, std::vector<std::string>& problems);

// The configuration file: $BRENNIC_CONFIG when set, else brennic.ini in the
// folder of the log library when it exists; empty when there is none.
std::string FindLogConfig();

// The default folder of log files: $XDG_STATE_HOME/brennic, else
// $HOME/.local/state/brennic, else the working folder.
std::string DefaultLogFolder();

// Writes "brennic: <message>" to standard error in one write.
void ReportProblem(const std::string& message);

}  // namespace brennic
