#include "logoutput.h"

#include "logconfig.h"

#include "platform/ticks.h"

#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace brennic {

namespace {

// Seconds before a log file that could not be opened is tried again.
constexpr unsigned long long kReopenIntervalMs = 5000;

// Writes all of data to fd; returns 0 or the errno of the failure.
int WriteAll(int fd, std::string_view data) {
    while (!data.empty()) {
        const ssize_t n = ::write(fd, data.data(), data.size());
        if (n < 0) {
            if (errno == EINTR) continue;
            return errno;
        }
        data.remove_prefix(static_cast<size_t>(n));
    }
    return 0;
}

int SyslogPriority(BYTE level) {
    switch (level) {
    case LOG_LEVEL_ERROR: return LOG_ERR;
    case LOG_LEVEL_WARNING: return LOG_WARNING;
    case LOG_LEVEL_INFO: return LOG_INFO;
    default: return LOG_DEBUG;
    }
}

void AppendTwoDigits(std::string& out, unsigned value) {
    out += static_cast<char>('0' + value / 10 % 10);
    out += static_cast<char>('0' + value % 10);
}

}  // namespace

void AppendEscaped(std::string& out, std::u16string_view text) {
    static const char kHex[] = "0123456789ABCDEF";
    const std::string utf8 = Utf16ToUtf8(text);
    size_t runStart = 0;
    for (size_t i = 0; i < utf8.size(); ++i) {
        const auto byte = static_cast<unsigned char>(utf8[i]);
        if (byte >= 0x20 && byte != 0x7F) continue;
        out.append(utf8, runStart, i - runStart);
        runStart = i + 1;
        switch (byte) {
        case '\n': out += "\\n"; break;
        case '\r': out += "\\r"; break;
        case '\t': out += "\\t"; break;
        default: {
            const char escaped[] = {'\\', 'x', kHex[byte >> 4], kHex[byte & 0xF]};
            out.append(escaped, sizeof escaped);
        }
        }
    }
    out.append(utf8, runStart, std::string::npos);
}

void AppendLevelName(std::string& out, BYTE level) {
    switch (level) {
    case LOG_LEVEL_ERROR: out += "ERROR"; return;
    case LOG_LEVEL_WARNING: out += "WARNING"; return;
    case LOG_LEVEL_DEBUG1: out += "DEBUG1"; return;
    case LOG_LEVEL_DEBUG2: out += "DEBUG2"; return;
    case LOG_LEVEL_DEBUG3: out += "DEBUG3"; return;
    case LOG_LEVEL_DEBUG4: out += "DEBUG4"; return;
    case LOG_LEVEL_TRACE: out += "TRACE"; return;
    case LOG_LEVEL_INFO: out += "INFO"; return;
    default: {
        static const char kHex[] = "0123456789ABCDEF";
        const char text[] = {'L', 'E', 'V', 'E', 'L', '(', '0', 'x', kHex[level >> 4], kHex[level & 0xF], ')'};
        out.append(text, sizeof text);
    }
    }
}

void LineFormatter::AppendModuleName(std::string& out, BYTE index) const {
    if (index < m_moduleNames.size() && !m_moduleNames[index].empty()) {
        out += m_moduleNames[index];
    } else {
        out += "module";
        out += std::to_string(index);
    }
}

void LineFormatter::AppendTime(std::string& out, CLogRec::Clock::time_point time) {
    const auto second = std::chrono::floor<std::chrono::seconds>(time);
    const std::time_t t = CLogRec::Clock::to_time_t(second);
    if (t != m_cachedSecond) {
        std::tm local{};
        localtime_r(&t, &local);
        char text[32];
        const size_t n = std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &local);
        m_cachedSecondText.assign(text, n);
        m_cachedSecond = t;
    }
    const auto ms = static_cast<unsigned>(std::chrono::duration_cast<std::chrono::milliseconds>(time - second).count());
    out += m_cachedSecondText;
    out += '.';
    out += static_cast<char>('0' + ms / 100);
    AppendTwoDigits(out, ms % 100);
    out += ' ';
}

void LineFormatter::AppendBody(std::string& out, const CLogRec& record) const {
    AppendModuleName(out, record.GetModuleIndex());
    out += ' ';
    AppendLevelName(out, record.GetLevel());
    out += " kind=";
    out += std::to_string(record.GetKind());
    bool first = true;
    for (const auto& field : record.GetFields()) {
        out += first ? " field=" : " | field=";
        first = false;
        out += std::to_string(field->GetId());
        out += ": ";
        if (field->GetFlags() & LOGFIELD_CONFIDENTIAL) out += "(confidential)";
        else AppendEscaped(out, field->GetText());
    }
}

void LogFile::Configure(const std::string& path, unsigned long long maxBytes, int keep) {
    if (path != m_path) {
        Close();
        m_path = path;
        m_failing = false;
        m_nextOpenAttemptMs = 0;
    }
    m_maxBytes = maxBytes;
    m_keep = keep;
}

void LogFile::Close() {
    WritePending();
    if (m_fd >= 0) ::close(m_fd);
    m_fd = -1;
    m_size = 0;
}

void LogFile::Reopen() {
    Close();
    m_nextOpenAttemptMs = 0;
}

bool LogFile::Open() {
    if (m_fd >= 0) return true;
    if (m_path.empty() || GetTickCount64() < m_nextOpenAttemptMs) return false;
    m_fd = ::open(m_path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0640);
    if (m_fd < 0) {
        Fail("cannot open", errno);
        m_nextOpenAttemptMs = GetTickCount64() + kReopenIntervalMs;
        return false;
    }
    const off_t end = ::lseek(m_fd, 0, SEEK_END);
    m_size = end > 0 ? static_cast<unsigned long long>(end) : 0;
    return true;
}

void LogFile::Append(std::string_view line) {
    if (!Open()) return;  // the problem is reported; the line is lost for this destination
    if (m_size > 0 && m_size + line.size() > m_maxBytes) {
        WritePending();
        Rotate();
        if (m_fd < 0) return;
    }
    m_pending += line;
    m_size += line.size();
}

void LogFile::Commit() { WritePending(); }

bool LogFile::WritePending() {
    if (m_pending.empty() || m_fd < 0) {
        m_pending.clear();
        return m_fd >= 0;
    }
    const int error = WriteAll(m_fd, m_pending);
    if (error != 0) {
        Fail("cannot write", error);
        const off_t end = ::lseek(m_fd, 0, SEEK_END);
        m_size = end > 0 ? static_cast<unsigned long long>(end) : 0;
    } else if (m_failing) {
        m_failing = false;
        ReportProblem("log file '" + m_path + "' is written again");
    }
    m_pending.clear();
    return error == 0;
}

void LogFile::Rotate() {
    ::close(m_fd);
    m_fd = -1;
    m_size = 0;
    int flags = O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC;
    if (m_keep == 0) {
        flags |= O_TRUNC;
    } else {
        for (int i = m_keep - 1; i >= 1; --i)
            ::rename((m_path + "." + std::to_string(i)).c_str(), (m_path + "." + std::to_string(i + 1)).c_str());
        if (::rename(m_path.c_str(), (m_path + ".1").c_str()) != 0) {
            // Without the rename the file would grow without bound: start it afresh instead.
            Fail("cannot rotate", errno);
            flags |= O_TRUNC;
        }
    }
    m_fd = ::open(m_path.c_str(), flags, 0640);
    if (m_fd < 0) {
        Fail("cannot open", errno);
        m_nextOpenAttemptMs = GetTickCount64() + kReopenIntervalMs;
    }
}

void LogFile::Fail(const std::string& what, int error) {
    if (m_failing) return;
    m_failing = true;
    ReportProblem(what + " log file '" + m_path + "': " + std::strerror(error));
}

void LogOutput::Apply(const OutputConfig& config) {
    m_config = config;
    m_format.SetModuleNames(config.moduleNames);
    if (config.file) m_file.Configure(config.filePath, config.fileMaxBytes, config.fileKeep);
    else m_file.Close();
}

bool LogOutput::Open() {
    const bool fileOpen = m_config.file && m_file.Open();
    return fileOpen || m_config.syslog || m_config.standardError;
}

void LogOutput::Write(const CLogRec& record) {
    m_line.clear();
    m_format.AppendTime(m_line, record.GetTime());
    const size_t bodyStart = m_line.size();
    m_format.AppendBody(m_line, record);
    if (m_config.syslog)
        ::syslog(m_config.syslogFacility | SyslogPriority(record.GetLevel()), "%s", m_line.c_str() + bodyStart);
    m_line += '\n';
    if (m_config.file) m_file.Append(m_line);
    if (m_config.standardError) m_standardError += m_line;
}

void LogOutput::Commit() {
    m_file.Commit();
    if (!m_standardError.empty()) {
        WriteAll(STDERR_FILENO, m_standardError);  // nowhere to report a failing standard error
        m_standardError.clear();
    }
}

}  // namespace brennic
