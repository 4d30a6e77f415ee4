#pragma once
// The log sink: the one object of a process through which its client modules
// write to the central log.
//
// The newest sink is the current one (CLogSink::m_pLogSinkSelf) until it is
// destroyed. Each sink holds a table of 64 level masks, one per client module
// index, read by clients before they build a record, so a disabled level
// costs one byte read. Records handed over with AddDirect go through a
// bounded queue to the sink's writer thread, which writes them to the
// destinations the log's configuration file names (a file with size-based
// rotation, the system log, standard error). AddDirect never waits for a
// destination; when the queue is full the oldest records give way and their
// number is logged as soon as there is room again.
//
// A sink may be used from any number of threads at once. Deleting a sink
// while other threads still write to it is the caller's error: stop them first.

#include "brennic/logrec.h"

#include "platform/collections.h"
#include "platform/object.h"
#include "platform/text.h"
#include "platform/types.h"

#include <atomic>
#include <memory>

constexpr int LOG_MODULE_COUNT = 64;

// Parameters a client hands to a running sink; this build carries the level table.
class CCliParam {
public:
    CCliParam() = default;
    // Takes count entries (at most 64) of a level table; the rest stay 0.
    CCliParam(const BYTE* levels, int count);

    BYTE m_LogLevels[LOG_MODULE_COUNT] = {};
};

class CLogSink : public CObject {
public:
    // Registers the new sink as the current one.
    CLogSink();
    // Flushes what is queued, stops the writer and, if this sink is the
    // current one, clears the current-sink pointer.
    ~CLogSink() override;
    CLogSink(const CLogSink&) = delete;
    CLogSink& operator=(const CLogSink&) = delete;

    // The current sink, or null.
    static std::atomic<CLogSink*> m_pLogSinkSelf;

    // Level table: one mask of LOG_LEVELS per client module (index modulo 64).
    BYTE GetLevelMask(unsigned moduleIndex) const {
        return m_LogLevels[moduleIndex % LOG_MODULE_COUNT].load(std::memory_order_relaxed);
    }
    bool IsLevelEnabled(unsigned moduleIndex, BYTE level) const { return (GetLevelMask(moduleIndex) & level) != 0; }
    void SetLevelMask(unsigned moduleIndex, BYTE mask) {
        m_LogLevels[moduleIndex % LOG_MODULE_COUNT].store(mask, std::memory_order_relaxed);
    }
    // A snapshot of the whole table.
    void GetLevelTable(BYTE (&table)[LOG_MODULE_COUNT]) const;

    // Reads the configuration, learns the client module names, opens the
    // destinations and starts the writer. Records handed over before this are
    // kept (within the queue's bound) and written then. Returns false only if
    // the writer could not start.
    virtual bool StartLogging();
    // Writes what is queued, then stops the writer and closes the
    // destinations. Records handed over afterwards are discarded.
    virtual void StopLogging();
    // Reads the log's configuration file (see the README, "Logging") and
    // applies it: level table, destinations, queue bound. Without a file the
    // defaults apply. Returns false when the file exists but cannot be read;
    // lines it cannot use are reported on standard error and skipped.
    virtual bool ReadCfg();
    // This build writes locally and has no log server to address: these
    // change nothing and return false.
    virtual bool ModifyServerName(const CString& name);
    virtual bool ModifyServerPort(WORD port);
    virtual bool ModifyServerTimeout(DWORD timeoutMs);
    // Opens the destinations named by the configuration. Problems are
    // reported on standard error; returns whether at least one destination is open.
    virtual bool CreateLogTransfer();
    // The log's own records at start and stop.
    virtual void StartupMsg();
    virtual void StopMsg();
    // Tells the sink that its destinations may be back (a remounted disk, a
    // log file moved away by rotation tools): the writer reopens them before
    // its next write and logs that it did.
    virtual void ReConnected();
    // The names of the client modules by index, used in every line. The base
    // fills the log's 16 standard names.
    virtual void FillClientModules(CStringArray& names);
    // Called for every record handed over, on the caller's thread, before it
    // is queued, so that a client can add fields of its own. The base adds none.
    virtual void FillClientFields(CLogRec* record);
    // Switches the standard-error destination on or off while running.
    virtual void CmdOnlinelog(bool on);
    // Applies the level table carried by the parameter.
    virtual void CmdSetParameter(const CCliParam& param);
    // The folder the log file is written to.
    virtual CString GetServerStartPath();
    // Starts the writer thread; true when it runs.
    virtual bool StartServer();
    // Logs the program's path, the log library's version and the process id.
    virtual void LogVersioninfo();
    // The full path of the running program.
    virtual CString GetModuleFileNameW();

    // The sink's name; the default is the program's file name. The default
    // log file is named after it.
    void SetLogSinkName(const CString& name);
    CString GetLogSinkName() const;

    // Hands a finished record to the sink, which takes it over (record is
    // set to null). Never waits for a destination. A null record is ignored.
    void AddDirect(CLogRec*& record);

    // The configuration file ReadCfg reads; empty selects the default search.
    void SetConfigPath(const CString& path);
    CString GetConfigPath() const;

    // Waits until every record handed over before the call is written or
    // dropped. False on time-out, or when records wait for a writer that does not run.
    bool Flush(DWORD timeoutMs = INFINITE);
    // Records dropped so far because the queue was full.
    ULONGLONG GetDroppedCount() const;

private:
    void StopWriter();
    void WriterLoop();
    void Enqueue(std::unique_ptr<CLogRec> record);
    void LogOwnRecord(LOG_LEVELS level, const CString& text);

    std::atomic<BYTE> m_LogLevels[LOG_MODULE_COUNT];

    struct Impl;
    std::unique_ptr<Impl> m_pImpl;
};
