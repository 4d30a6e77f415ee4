#pragma once
// Log records: one record names its client module, its level and kind, carries
// a time stamp and one or more text fields. A client builds a record with
// CLogRec::CreateLogRec and CLogField::CreateLogField and hands it to the
// sink with CLogSink::AddDirect, which takes it over.

#include "platform/text.h"
#include "platform/types.h"

#include <chrono>
#include <memory>
#include <vector>

class CLogSink;

// Level bits. Each entry of a sink's level table is a mask of these; a record
// carries one of them.
enum LOG_LEVELS : BYTE {
    LOG_LEVEL_ERROR = 0x01,
    LOG_LEVEL_WARNING = 0x02,
    LOG_LEVEL_DEBUG1 = 0x04,
    LOG_LEVEL_DEBUG2 = 0x08,
    LOG_LEVEL_DEBUG3 = 0x10,
    LOG_LEVEL_DEBUG4 = 0x20,
    LOG_LEVEL_TRACE = 0x40,
    LOG_LEVEL_INFO = 0x80,
};

// What a record is about. The log writes the number as it is; clients choose
// their own kinds beside the log's.
enum LOGREC_KINDOF : BYTE {
    LOGREC_KIND_GENERAL = 0,
    LOGREC_KIND_LOG = 1,  // the log's own records: start, stop, lost records
    LOGREC_KIND_MODULE_TEXT = 76,
};

// Field flag: the text is confidential and never reaches a destination.
constexpr BYTE LOGFIELD_CONFIDENTIAL = 0x01;

class CLogField {
public:
    // Longer texts are cut (keeping whole characters) and marked as cut, so a
    // runaway text cannot fill the memory of the log's queue.
    static constexpr int kMaxTextLength = 8192;

    // A text field; never fails except for lack of memory (null then).
    static CLogField* CreateLogField(WORD id, const CString& text, BYTE flags);
    // The same for a terminated UTF-16 string; null reads as the empty text.
    static CLogField* CreateLogField(WORD id, const char16_t* text, BYTE flags);

    WORD GetId() const { return m_wId; }
    BYTE GetFlags() const { return m_nFlags; }
    const std::u16string& GetText() const { return m_strText; }

private:
    CLogField(WORD id, std::u16string_view text, BYTE flags);

    WORD m_wId;
    BYTE m_nFlags;
    std::u16string m_strText;
};

class CLogRec {
public:
    using Clock = std::chrono::system_clock;

    // A record of a client module (index taken modulo 64) at one level. Null
    // when there is no sink or the sink's level table does not enable the
    // level for that module (such a record would never be written), or when
    // memory runs out. A null time means "now".
    static CLogRec* CreateLogRec(const CLogSink* sink, BYTE moduleIndex, LOG_LEVELS level, LOGREC_KINDOF kind,
                                 const FILETIME* time);
    // A record that bypasses the level table, for the log's own notices.
    static std::unique_ptr<CLogRec> CreateUnfiltered(BYTE moduleIndex, LOG_LEVELS level, LOGREC_KINDOF kind);

    ~CLogRec();
    CLogRec(const CLogRec&) = delete;
    CLogRec& operator=(const CLogRec&) = delete;

    // The record owns the field from now on; a null field is ignored.
    void AddField(CLogField* field);

    BYTE GetModuleIndex() const { return m_nModule; }
    LOG_LEVELS GetLevel() const { return m_eLevel; }
    LOGREC_KINDOF GetKind() const { return m_eKind; }
    Clock::time_point GetTime() const { return m_time; }
    const std::vector<std::unique_ptr<CLogField>>& GetFields() const { return m_fields; }

private:
    CLogRec(BYTE moduleIndex, LOG_LEVELS level, LOGREC_KINDOF kind, Clock::time_point time);

    BYTE m_nModule;
    LOG_LEVELS m_eLevel;
    LOGREC_KINDOF m_eKind;
    Clock::time_point m_time;
    std::vector<std::unique_ptr<CLogField>> m_fields;
};

// FILETIME <-> the clock of the records.
CLogRec::Clock::time_point FileTimeToTimePoint(const FILETIME& time);
FILETIME TimePointToFileTime(CLogRec::Clock::time_point time);
