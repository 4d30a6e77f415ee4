#pragma once
// An ILogger that keeps its records, for tests.

#include <QString>

#include <atomic>
#include <mutex>
#include <string>
#include <vector>

#include "corvell/AzureInstance.h"

struct LogRecord {
    bool error = false;
    std::string text;  // UTF-8
};

class RecordingLogger final : public corvell::ILogger {
public:
    std::atomic<bool> infoEnabled{false};

    void LogError(const char16_t* text) override { Add(true, text); }
    void LogInfo(const char16_t* text) override { Add(false, text); }
    bool IsInfoEnabled() override { return infoEnabled; }

    std::vector<LogRecord> Records() const {
        std::lock_guard lock(m_mutex);
        return m_records;
    }
    std::vector<std::string> Errors() const {
        std::vector<std::string> errors;
        for (const auto& r : Records())
            if (r.error) errors.push_back(r.text);
        return errors;
    }
    std::string All() const {
        std::string all;
        for (const auto& r : Records()) all += (r.error ? "E " : "I ") + r.text + "\n";
        return all;
    }
    void Clear() {
        std::lock_guard lock(m_mutex);
        m_records.clear();
    }

private:
    void Add(bool error, const char16_t* text) {
        std::lock_guard lock(m_mutex);
        m_records.push_back({error, QString::fromStdU16String(text ? text : u"").toStdString()});
    }

    mutable std::mutex m_mutex;  // guards m_records
    std::vector<LogRecord> m_records;
};
