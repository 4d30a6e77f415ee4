#include "brennic/logsink.h"

#include "logconfig.h"
#include "logoutput.h"

#include "platform/ticks.h"

#include <pthread.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <condition_variable>
#include <cstring>
#include <deque>
#include <fstream>
#include <iterator>
#include <mutex>
#include <sstream>
#include <string>
#include <thread>

using namespace brennic;

namespace {

constexpr const char16_t* kLibraryVersion = u"1.0";
// Field id of the text of the log's own records.
constexpr WORD kLogTextField = 1;
// A configuration file larger than this is not a configuration file.
constexpr std::streamsize kMaxConfigBytes = 1 << 20;
// How long the writer lets records gather after the first one woke it.
constexpr std::chrono::milliseconds kGatherTime(2);
// Problems of one configuration file reported before the rest are only counted.
constexpr size_t kMaxReportedProblems = 20;

std::string ProgramPath() {
    char path[4096];
    const ssize_t n = ::readlink("/proc/self/exe", path, sizeof path - 1);
    return n > 0 ? std::string(path, static_cast<size_t>(n)) : std::string();
}

std::string FileName(const std::string& path) {
    const auto slash = path.rfind('/');
    return slash == std::string::npos ? path : path.substr(slash + 1);
}

std::string FolderOf(const std::string& path) {
    const auto slash = path.rfind('/');
    if (slash == std::string::npos) return ".";
    return slash == 0 ? "/" : path.substr(0, slash);
}

// mkdir -p; problems surface when the file is opened.
void MakeFolders(const std::string& folder) {
    for (size_t pos = folder.find('/', 1);; pos = folder.find('/', pos + 1)) {
        ::mkdir(folder.substr(0, pos).c_str(), 0750);
        if (pos == std::string::npos) break;
    }
}

// A sink name as a file name: no folders, never empty.
std::string FileNameFor(const CString& sinkName) {
    std::string name = sinkName.ToUtf8();
    std::replace(name.begin(), name.end(), '/', '_');
    return name.empty() || name == "." || name == ".." ? std::string("brennic") : name;
}

}  // namespace

std::atomic<CLogSink*> CLogSink::m_pLogSinkSelf{nullptr};

CCliParam::CCliParam(const BYTE* levels, int count) {
    if (levels) std::copy_n(levels, std::clamp(count, 0, LOG_MODULE_COUNT), m_LogLevels);
}

struct CLogSink::Impl {
    enum class State { NotStarted, Running, Stopping, Stopped };

    // settingsLock guards settings, configPath, sinkName and moduleNames.
    mutable std::mutex settingsLock;
    LogSettings settings;
    std::string configPath;
    CString sinkName = CString::FromUtf8(FileName(ProgramPath()));
    std::vector<std::string> moduleNames;
    std::atomic<unsigned> settingsGeneration{1};  // raised by every change the writer must see
    std::atomic<bool> reopenRequested{false};

    // queueLock guards everything from here to 'finished'.
    mutable std::mutex queueLock;
    std::condition_variable writerWake;  // records queued, or stop requested
    std::condition_variable progress;    // records finished, or writer state changed
    std::deque<std::unique_ptr<CLogRec>> queue;
    State state = State::NotStarted;
    size_t capacity = LogSettings().queueCapacity;
    unsigned long long droppedPending = 0;  // dropped since the writer last took the queue
    unsigned long long droppedTotal = 0;
    unsigned long long handedOver = 0;  // records accepted into the queue
    unsigned long long finished = 0;    // of those, written or dropped

    // The destinations: the writer's while it runs, else the starting or stopping thread's.
    std::thread writer;
    LogOutput output;
    unsigned appliedGeneration = 0;

    OutputConfig BuildOutputConfig() const {
        std::lock_guard lock(settingsLock);
        OutputConfig config;
        config.file = settings.fileEnabled;
        config.filePath = ResolvedFilePath();
        config.fileMaxBytes = settings.fileMaxBytes;
        config.fileKeep = settings.fileKeep;
        config.syslog = settings.syslogEnabled;
        config.syslogFacility = settings.syslogFacility;
        config.standardError = settings.stderrEnabled;
        config.moduleNames = moduleNames;
        if (config.file && settings.filePath.empty()) MakeFolders(FolderOf(config.filePath));
        return config;
    }

    // Caller holds settingsLock.
    std::string ResolvedFilePath() const {
        if (!settings.filePath.empty()) return settings.filePath;
        return DefaultLogFolder() + "/" + FileNameFor(sinkName) + ".log";
    }

    // Brings the destinations up to date with the settings; on the thread that owns them.
    void RefreshOutput() {
        const unsigned generation = settingsGeneration.load();
        if (generation != appliedGeneration) {
            output.Apply(BuildOutputConfig());
            appliedGeneration = generation;
        }
        if (reopenRequested.exchange(false)) output.Reopen();
    }

    void ApplySettings(const LogSettings& newSettings) {
        {
            std::lock_guard lock(settingsLock);
            settings = newSettings;
        }
        ++settingsGeneration;
        std::lock_guard lock(queueLock);
        capacity = newSettings.queueCapacity;
    }
};

CLogSink::CLogSink() : m_pImpl(std::make_unique<Impl>()) {
    const LogSettings defaults;
    for (int i = 0; i < LOG_MODULE_COUNT; ++i) SetLevelMask(static_cast<unsigned>(i), defaults.levels[i]);
    m_pLogSinkSelf.store(this);
}

CLogSink::~CLogSink() {
    CLogSink* self = this;
    m_pLogSinkSelf.compare_exchange_strong(self, nullptr);
    CLogSink::StopLogging();
}

void CLogSink::GetLevelTable(BYTE (&table)[LOG_MODULE_COUNT]) const {
    for (int i = 0; i < LOG_MODULE_COUNT; ++i) table[i] = GetLevelMask(static_cast<unsigned>(i));
}

bool CLogSink::StartLogging() {
    {
        std::lock_guard lock(m_pImpl->queueLock);
        if (m_pImpl->state == Impl::State::Running) return true;
    }
    ReadCfg();
    CStringArray names;
    FillClientModules(names);
    {
        std::lock_guard lock(m_pImpl->settingsLock);
        m_pImpl->moduleNames.clear();
        for (const CString& name : names) m_pImpl->moduleNames.push_back(name.ToUtf8());
    }
    ++m_pImpl->settingsGeneration;
    CreateLogTransfer();
    if (!StartServer()) return false;
    StartupMsg();
    LogVersioninfo();
    return true;
}

void CLogSink::StopLogging() {
    {
        std::lock_guard lock(m_pImpl->queueLock);
        if (m_pImpl->state != Impl::State::Running) return;
    }
    StopMsg();
    StopWriter();
}

void CLogSink::StopWriter() {
    {
        std::lock_guard lock(m_pImpl->queueLock);
        if (m_pImpl->state != Impl::State::Running) return;
        m_pImpl->state = Impl::State::Stopping;
    }
    m_pImpl->writerWake.notify_one();
    m_pImpl->writer.join();
    m_pImpl->output.Apply(OutputConfig{});  // closes the destinations
    m_pImpl->appliedGeneration = 0;
    {
        std::lock_guard lock(m_pImpl->queueLock);
        m_pImpl->state = Impl::State::Stopped;
    }
    m_pImpl->progress.notify_all();
}

bool CLogSink::ReadCfg() {
    std::string path;
    {
        std::lock_guard lock(m_pImpl->settingsLock);
        path = m_pImpl->configPath;
    }
    if (path.empty()) path = FindLogConfig();
    if (path.empty()) {
        m_pImpl->ApplySettings(LogSettings());
    } else {
        std::ifstream file(path, std::ios::binary);
        std::string text(static_cast<size_t>(kMaxConfigBytes) + 1, '\0');
        if (file) file.read(text.data(), static_cast<std::streamsize>(text.size()));
        if (!file && !file.eof()) {
            ReportProblem("cannot read log configuration '" + path + "': " + std::strerror(errno));
            return false;
        }
        if (file.gcount() > kMaxConfigBytes) {
            ReportProblem("log configuration '" + path + "' is larger than 1 MiB; not read");
            return false;
        }
        text.resize(static_cast<size_t>(file.gcount()));
        std::vector<std::string> problems;
        const LogSettings settings = ParseLogConfig(text, problems);
        for (size_t i = 0; i < std::min(problems.size(), kMaxReportedProblems); ++i)
            ReportProblem(path + ": " + problems[i]);
        if (problems.size() > kMaxReportedProblems)
            ReportProblem(path + ": " + std::to_string(problems.size() - kMaxReportedProblems) + " more problems");
        m_pImpl->ApplySettings(settings);
    }
    LogSettings applied;
    {
        std::lock_guard lock(m_pImpl->settingsLock);
        applied = m_pImpl->settings;
    }
    for (int i = 0; i < LOG_MODULE_COUNT; ++i) SetLevelMask(static_cast<unsigned>(i), applied.levels[i]);
    return true;
}

bool CLogSink::ModifyServerName(const CString&) { return false; }
bool CLogSink::ModifyServerPort(WORD) { return false; }
bool CLogSink::ModifyServerTimeout(DWORD) { return false; }

bool CLogSink::CreateLogTransfer() {
    {
        std::lock_guard lock(m_pImpl->queueLock);
        if (m_pImpl->state == Impl::State::Running || m_pImpl->state == Impl::State::Stopping) {
            // The writer owns the destinations now: let it reopen them.
            m_pImpl->reopenRequested = true;
            return true;
        }
    }
    m_pImpl->RefreshOutput();
    return m_pImpl->output.Open();
}

void CLogSink::StartupMsg() { LogOwnRecord(LOG_LEVEL_INFO, u"Log started for '" + GetLogSinkName() + u"'"); }

void CLogSink::StopMsg() { LogOwnRecord(LOG_LEVEL_INFO, u"Log stopped for '" + GetLogSinkName() + u"'"); }

void CLogSink::ReConnected() {
    m_pImpl->reopenRequested = true;
    LogOwnRecord(LOG_LEVEL_INFO, u"Log destinations reopened");
}

void CLogSink::FillClientModules(CStringArray& names) {
    static const char16_t* const kStandardNames[] = {u"Log",      u"System", u"Runtime", u"Editor",
                                                     u"Network",  u"Driver", u"Archive", u"Alarm",
                                                     u"Recipe",   u"Report", u"Script",  u"User",
                                                     u"Database", u"Web",    u"Service", u"Gateway"};
    for (const char16_t* name : kStandardNames) names.Add(name);
}

void CLogSink::FillClientFields(CLogRec*) {}

void CLogSink::CmdOnlinelog(bool on) {
    {
        std::lock_guard lock(m_pImpl->settingsLock);
        m_pImpl->settings.stderrEnabled = on;
    }
    ++m_pImpl->settingsGeneration;
}

void CLogSink::CmdSetParameter(const CCliParam& param) {
    for (int i = 0; i < LOG_MODULE_COUNT; ++i) SetLevelMask(static_cast<unsigned>(i), param.m_LogLevels[i]);
}

CString CLogSink::GetServerStartPath() {
    std::lock_guard lock(m_pImpl->settingsLock);
    return CString::FromUtf8(FolderOf(m_pImpl->ResolvedFilePath()));
}

bool CLogSink::StartServer() {
    {
        std::lock_guard lock(m_pImpl->queueLock);
        if (m_pImpl->state == Impl::State::Running) return true;
        if (m_pImpl->state == Impl::State::Stopping) return false;
        try {
            m_pImpl->writer = std::thread(&CLogSink::WriterLoop, this);
        } catch (const std::system_error& e) {
            ReportProblem(std::string("cannot start the log writer: ") + e.what());
            return false;
        }
        m_pImpl->state = Impl::State::Running;
    }
    m_pImpl->progress.notify_all();
    return true;
}

void CLogSink::LogVersioninfo() {
    LogOwnRecord(LOG_LEVEL_INFO, CString::Formatted(u"Program '%s', log library %s, process %u", GetModuleFileNameW(),
                                                    kLibraryVersion, GetCurrentProcessId()));
}

CString CLogSink::GetModuleFileNameW() { return CString::FromUtf8(ProgramPath()); }

void CLogSink::SetLogSinkName(const CString& name) {
    {
        std::lock_guard lock(m_pImpl->settingsLock);
        m_pImpl->sinkName = name;
    }
    ++m_pImpl->settingsGeneration;
}

CString CLogSink::GetLogSinkName() const {
    std::lock_guard lock(m_pImpl->settingsLock);
    return m_pImpl->sinkName;
}

void CLogSink::SetConfigPath(const CString& path) {
    std::lock_guard lock(m_pImpl->settingsLock);
    m_pImpl->configPath = path.ToUtf8();
}

CString CLogSink::GetConfigPath() const {
    std::lock_guard lock(m_pImpl->settingsLock);
    return CString::FromUtf8(m_pImpl->configPath);
}

void CLogSink::AddDirect(CLogRec*& record) {
    if (!record) return;
    std::unique_ptr<CLogRec> owned(record);
    record = nullptr;
    FillClientFields(owned.get());
    Enqueue(std::move(owned));
}

void CLogSink::Enqueue(std::unique_ptr<CLogRec> record) {
    std::deque<std::unique_ptr<CLogRec>> evicted;  // declared before the lock: freed after it is released
    bool wakeWriter = false;
    {
        std::lock_guard lock(m_pImpl->queueLock);
        auto& q = *m_pImpl;
        if (q.state == Impl::State::Stopping || q.state == Impl::State::Stopped) {
            evicted.push_back(std::move(record));
            return;
        }
        ++q.handedOver;
        while (!q.queue.empty() && q.queue.size() >= q.capacity) {
            evicted.push_back(std::move(q.queue.front()));
            q.queue.pop_front();
            ++q.droppedPending;
            ++q.droppedTotal;
            ++q.finished;
        }
        // The writer only sleeps on an empty queue, so only the first record needs to wake it.
        wakeWriter = q.queue.empty() && q.state == Impl::State::Running;
        q.queue.push_back(std::move(record));
    }
    if (wakeWriter) m_pImpl->writerWake.notify_one();
}

bool CLogSink::Flush(DWORD timeoutMs) {
    std::unique_lock lock(m_pImpl->queueLock);
    auto& q = *m_pImpl;
    const unsigned long long target = q.handedOver;
    const auto settled = [&] {
        const bool writerGone = q.state == Impl::State::NotStarted || q.state == Impl::State::Stopped;
        return q.finished >= target || writerGone;
    };
    if (timeoutMs == INFINITE) q.progress.wait(lock, settled);
    else q.progress.wait_for(lock, std::chrono::milliseconds(timeoutMs), settled);
    return q.finished >= target;
}

ULONGLONG CLogSink::GetDroppedCount() const {
    std::lock_guard lock(m_pImpl->queueLock);
    return m_pImpl->droppedTotal;
}

void CLogSink::LogOwnRecord(LOG_LEVELS level, const CString& text) {
    CLogRec* record = CLogRec::CreateLogRec(this, kLogModuleIndex, level, LOGREC_KIND_LOG, nullptr);
    if (!record) return;
    record->AddField(CLogField::CreateLogField(kLogTextField, text, 0));
    Enqueue(std::unique_ptr<CLogRec>(record));
}

void CLogSink::WriterLoop() {
    // The host's signals belong to its own threads; a broken standard error
    // then fails the write with EPIPE instead of ending the process.
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_BLOCK, &all, nullptr);

    auto& q = *m_pImpl;
    for (;;) {
        std::deque<std::unique_ptr<CLogRec>> batch;
        unsigned long long dropped = 0;
        {
            std::unique_lock lock(q.queueLock);
            const auto stopping = [&] { return q.state == Impl::State::Stopping; };
            if (q.queue.empty() && !stopping()) {
                q.writerWake.wait(lock, [&] { return !q.queue.empty() || stopping(); });
                // Woken by the first record of a burst: let the burst gather, so
                // that its writers find the queue non-empty and need not wake us.
                q.writerWake.wait_for(lock, kGatherTime, stopping);
            }
            if (q.queue.empty()) break;  // stopping, and everything is written
            batch.swap(q.queue);
            std::swap(dropped, q.droppedPending);
        }
        q.RefreshOutput();
        if (dropped > 0) {
            auto notice = CLogRec::CreateUnfiltered(kLogModuleIndex, LOG_LEVEL_WARNING, LOGREC_KIND_LOG);
            notice->AddField(CLogField::CreateLogField(
                kLogTextField, CString::Formatted(u"%u log records were dropped: the log queue was full", dropped), 0));
            q.output.Write(*notice);
        }
        for (const auto& record : batch) q.output.Write(*record);
        q.output.Commit();
        const size_t written = batch.size();
        batch.clear();
        {
            std::lock_guard lock(q.queueLock);
            q.finished += written;
        }
        q.progress.notify_all();
    }
}
