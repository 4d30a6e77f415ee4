#include "logconfig.h"

#include <dlfcn.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdlib>
#include <optional>
#include <sys/stat.h>

namespace brennic {

LogSettings::LogSettings() : levels{}, syslogFacility(LOG_USER) {
    levels[kLogModuleIndex] = LOG_LEVEL_ERROR | LOG_LEVEL_WARNING | LOG_LEVEL_INFO;
    levels[kDefaultClientIndex] = LOG_LEVEL_ERROR | LOG_LEVEL_INFO;
}

namespace {

std::string Trim(std::string_view s) {
    const auto first = s.find_first_not_of(" \t\r");
    if (first == std::string_view::npos) return {};
    const auto last = s.find_last_not_of(" \t\r");
    return std::string(s.substr(first, last - first + 1));
}

std::string Lower(std::string s) {
    std::transform(s.begin(), s.end(), s.begin(), [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return s;
}

// Whole decimal or 0x-hexadecimal number, with an optional K, M or G factor.
std::optional<unsigned long long> ParseNumber(const std::string& text, bool allowSuffix) {
    if (text.empty() || text[0] == '-' || text[0] == '+') return std::nullopt;
    errno = 0;
    char* end = nullptr;
    unsigned long long value = std::strtoull(text.c_str(), &end, 0);
    if (errno != 0 || end == text.c_str()) return std::nullopt;
    std::string rest = Lower(Trim(end));
    unsigned long long factor = 1;
    if (allowSuffix && rest.size() == 1) {
        if (rest == "k") factor = 1024ull;
        else if (rest == "m") factor = 1024ull * 1024;
        else if (rest == "g") factor = 1024ull * 1024 * 1024;
        else return std::nullopt;
    } else if (!rest.empty()) {
        return std::nullopt;
    }
    if (value > ~0ull / factor) return std::nullopt;
    return value * factor;
}

std::optional<bool> ParseBool(const std::string& text) {
    const std::string v = Lower(text);
    if (v == "1" || v == "yes" || v == "true" || v == "on") return true;
    if (v == "0" || v == "no" || v == "false" || v == "off") return false;
    return std::nullopt;
}

std::optional<int> ParseFacility(const std::string& text) {
    static const struct {
        const char* name;
        int value;
    } kFacilities[] = {{"user", LOG_USER},     {"daemon", LOG_DAEMON}, {"local0", LOG_LOCAL0}, {"local1", LOG_LOCAL1},
                       {"local2", LOG_LOCAL2}, {"local3", LOG_LOCAL3}, {"local4", LOG_LOCAL4}, {"local5", LOG_LOCAL5},
                       {"local6", LOG_LOCAL6}, {"local7", LOG_LOCAL7}};
    const std::string v = Lower(text);
    for (const auto& f : kFacilities)
        if (v == f.name) return f.value;
    return std::nullopt;
}

// Applies one "key = value" of a section; returns an error text or empty.
std::string ApplySetting(LogSettings& s, const std::string& section, const std::string& key, const std::string& value) {
    if (section == "levels") {
        const auto mask = ParseNumber(value, false);
        if (!mask || *mask > 0xFF) return "a level mask is a number from 0 to 255";
        if (key == "default") {
            std::fill(std::begin(s.levels), std::end(s.levels), static_cast<BYTE>(*mask));
            return {};
        }
        const auto index = ParseNumber(key, false);
        if (!index || *index >= LOG_MODULE_COUNT) return "a module index is a number from 0 to 63, or 'default'";
        s.levels[*index] = static_cast<BYTE>(*mask);
        return {};
    }
    if (key == "enabled" && (section == "file" || section == "syslog" || section == "stderr")) {
        const auto on = ParseBool(value);
        if (!on) return "'enabled' takes yes or no";
        (section == "file" ? s.fileEnabled : section == "syslog" ? s.syslogEnabled : s.stderrEnabled) = *on;
        return {};
    }
    if (section == "file" && key == "path") {
        s.filePath = value;
        return {};
    }
    if (section == "file" && key == "max_size") {
        const auto bytes = ParseNumber(value, true);
        if (!bytes || *bytes < 1024) return "'max_size' is a size of at least 1024 bytes (K, M or G allowed)";
        s.fileMaxBytes = *bytes;
        return {};
    }
    if (section == "file" && key == "keep") {
        const auto keep = ParseNumber(value, false);
        if (!keep || *keep > 100) return "'keep' is a number from 0 to 100";
        s.fileKeep = static_cast<int>(*keep);
        return {};
    }
    if (section == "syslog" && key == "facility") {
        const auto facility = ParseFacility(value);
        if (!facility) return "'facility' is user, daemon or local0 to local7";
        s.syslogFacility = *facility;
        return {};
    }
    if (section == "queue" && key == "capacity") {
        const auto capacity = ParseNumber(value, false);
        if (!capacity || *capacity < 1 || *capacity > 10000000) return "'capacity' is a number from 1 to 10000000";
        s.queueCapacity = static_cast<size_t>(*capacity);
        return {};
    }
    return "unknown key '" + key + "' in [" + section + "]";
}

}  // namespace

LogSettings ParseLogConfig(std::string_view text, std::vector<std::string>& problems) {
    LogSettings settings;
    std::string section;
    int lineNumber = 0;
    while (!text.empty()) {
        const auto end = text.find('\n');
        const std::string line = Trim(text.substr(0, end));
        text = end == std::string_view::npos ? std::string_view() : text.substr(end + 1);
        ++lineNumber;
        if (line.empty() || line[0] == ';' || line[0] == '#') continue;
        const std::string where = "line " + std::to_string(lineNumber) + ": ";
        if (line.front() == '[') {
            if (line.back() != ']') {
                problems.push_back(where + "a section name ends with ']'");
                continue;
            }
            section = Lower(Trim(std::string_view(line).substr(1, line.size() - 2)));
            continue;
        }
        const auto eq = line.find('=');
        if (eq == std::string::npos) {
            problems.push_back(where + "expected 'key = value'");
            continue;
        }
        const std::string error = ApplySetting(settings, section, Lower(Trim(std::string_view(line).substr(0, eq))),
                                               Trim(std::string_view(line).substr(eq + 1)));
        if (!error.empty()) problems.push_back(where + error);
    }
    return settings;
}

std::string FindLogConfig() {
    if (const char* env = std::getenv("BRENNIC_CONFIG"); env && *env) return env;
    Dl_info info{};
    if (dladdr(reinterpret_cast<void*>(&FindLogConfig), &info) && info.dli_fname) {
        std::string path = info.dli_fname;
        const auto slash = path.rfind('/');
        path = (slash == std::string::npos ? std::string() : path.substr(0, slash + 1)) + "brennic.ini";
        struct stat st {};
        if (stat(path.c_str(), &st) == 0) return path;
    }
    return {};
}

std::string DefaultLogFolder() {
    if (const char* state = std::getenv("XDG_STATE_HOME"); state && *state) return std::string(state) + "/brennic";
    if (const char* home = std::getenv("HOME"); home && *home) return std::string(home) + "/.local/state/brennic";
    return ".";
}

void ReportProblem(const std::string& message) {
    const std::string line = "brennic: " + message + "\n";
    // One write keeps the line whole among other writers; its result is of no use here.
    if (::write(STDERR_FILENO, line.data(), line.size()) < 0) return;
}

}  // namespace brennic
