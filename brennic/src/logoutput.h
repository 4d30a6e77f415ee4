#pragma once
// The destinations of a sink and the layout of its lines. Used by the sink's
// writer thread alone (and by the starting and stopping thread while the
// writer does not run), so nothing here locks.

#include "brennic/logrec.h"

#include <ctime>
#include <string>
#include <string_view>
#include <vector>

namespace brennic {

// Appends UTF-16 text as UTF-8 on one line: control characters become \n,
// \r, \t or \xHH, invalid surrogates become U+FFFD.
void AppendEscaped(std::string& out, std::u16string_view text);

// Appends "ERROR", "INFO", ... for a single level bit, else "LEVEL(0xHH)".
void AppendLevelName(std::string& out, BYTE level);

// Builds the lines of records:
//   2025-03-04 10:11:12.345 PelgradDll ERROR kind=76 field=39: text
// several fields are separated by " | ".
class LineFormatter {
public:
    void SetModuleNames(std::vector<std::string> names) { m_moduleNames = std::move(names); }
    // Appends the module's name, or "module<index>" when the list has none for it.
    void AppendModuleName(std::string& out, BYTE index) const;
    // Local time with milliseconds and a trailing space.
    void AppendTime(std::string& out, CLogRec::Clock::time_point time);
    // Everything after the time, without the line break.
    void AppendBody(std::string& out, const CLogRec& record) const;

private:
    std::vector<std::string> m_moduleNames;
    std::time_t m_cachedSecond = -1;
    std::string m_cachedSecondText;  // "YYYY-MM-DD HH:MM:SS" of m_cachedSecond
};

// An append-only log file that rotates by size: the current file is renamed
// to <path>.1 (older ones move up to <path>.<keep>, the oldest goes) when the
// next line would take it past its size. Problems are reported on standard
// error once, until the file works again.
class LogFile {
public:
    ~LogFile() { Close(); }
    void Configure(const std::string& path, unsigned long long maxBytes, int keep);
    // Opens the file unless it is open; a file that could not be opened is
    // tried again at most every few seconds.
    bool Open();
    void Close();
    void Append(std::string_view line);
    // Writes what was appended.
    void Commit();
    // Closes and opens the file again at the next commit, at once.
    void Reopen();
    const std::string& Path() const { return m_path; }

private:
    void Rotate();
    bool WritePending();
    void Fail(const std::string& what, int error);

    std::string m_path;
    unsigned long long m_maxBytes = 0;
    int m_keep = 0;
    int m_fd = -1;
    unsigned long long m_size = 0;  // bytes in the current file, written or pending
    std::string m_pending;          // lines appended since the last commit
    bool m_failing = false;         // a problem was reported and has not cleared
    unsigned long long m_nextOpenAttemptMs = 0;
};

// Everything a writer needs to know about its destinations.
struct OutputConfig {
    bool file = false;
    std::string filePath;
    unsigned long long fileMaxBytes = 0;
    int fileKeep = 0;
    bool syslog = false;
    int syslogFacility = 0;
    bool standardError = false;
    std::vector<std::string> moduleNames;
};

class LogOutput {
public:
    void Apply(const OutputConfig& config);
    // Opens what can be opened now; true when at least one destination works.
    bool Open();
    // Formats one record for every active destination.
    void Write(const CLogRec& record);
    // Hands what was written to the file and standard error.
    void Commit();
    void Reopen() { m_file.Reopen(); }
    bool HasDestination() const { return m_config.file || m_config.syslog || m_config.standardError; }

private:
    OutputConfig m_config;
    LineFormatter m_format;
    LogFile m_file;
    std::string m_line;           // scratch buffer of the current record
    std::string m_standardError;  // lines for standard error since the last commit
};

}  // namespace brennic
