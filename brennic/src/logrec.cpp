#include "brennic/logrec.h"

#include "brennic/logsink.h"

#include <new>

namespace {

// 100-ns intervals between 1601-01-01 and 1970-01-01.
constexpr long long kFileTimeEpochOffset = 116444736000000000LL;
using FileTimeTicks = std::chrono::duration<long long, std::ratio<1, 10000000>>;

bool IsHighSurrogate(char16_t c) { return c >= 0xD800 && c <= 0xDBFF; }

// Cuts an overlong text at a character boundary and says how much was cut.
std::u16string Bounded(std::u16string_view text) {
    if (text.size() <= static_cast<size_t>(CLogField::kMaxTextLength)) return std::u16string(text);
    size_t keep = CLogField::kMaxTextLength;
    if (IsHighSurrogate(text[keep - 1])) --keep;
    std::u16string cut(text.substr(0, keep));
    cut += Utf8ToUtf16(" ... (" + std::to_string(text.size() - keep) + " more characters)");
    return cut;
}

}  // namespace

CLogRec::Clock::time_point FileTimeToTimePoint(const FILETIME& time) {
    const long long ticks =
        static_cast<long long>((static_cast<unsigned long long>(time.dwHighDateTime) << 32) | time.dwLowDateTime);
    return CLogRec::Clock::time_point(
        std::chrono::duration_cast<CLogRec::Clock::duration>(FileTimeTicks(ticks - kFileTimeEpochOffset)));
}

FILETIME TimePointToFileTime(CLogRec::Clock::time_point time) {
    const auto ticks = std::chrono::duration_cast<FileTimeTicks>(time.time_since_epoch()).count() +
                       kFileTimeEpochOffset;
    const auto bits = static_cast<unsigned long long>(ticks);
    return FILETIME{static_cast<DWORD>(bits & 0xFFFFFFFFu), static_cast<DWORD>(bits >> 32)};
}

CLogField::CLogField(WORD id, std::u16string_view text, BYTE flags)
    : m_wId(id), m_nFlags(flags), m_strText(Bounded(text)) {}

CLogField* CLogField::CreateLogField(WORD id, const CString& text, BYTE flags) {
    return new (std::nothrow) CLogField(id, text.View(), flags);
}

CLogField* CLogField::CreateLogField(WORD id, const char16_t* text, BYTE flags) {
    return new (std::nothrow) CLogField(id, text ? std::u16string_view(text) : std::u16string_view(), flags);
}

CLogRec::CLogRec(BYTE moduleIndex, LOG_LEVELS level, LOGREC_KINDOF kind, Clock::time_point time)
    : m_nModule(static_cast<BYTE>(moduleIndex % LOG_MODULE_COUNT)), m_eLevel(level), m_eKind(kind), m_time(time) {}

CLogRec::~CLogRec() = default;

CLogRec* CLogRec::CreateLogRec(const CLogSink* sink, BYTE moduleIndex, LOG_LEVELS level, LOGREC_KINDOF kind,
                               const FILETIME* time) {
    if (!sink || !sink->IsLevelEnabled(moduleIndex, level)) return nullptr;
    return new (std::nothrow) CLogRec(moduleIndex, level, kind, time ? FileTimeToTimePoint(*time) : Clock::now());
}

std::unique_ptr<CLogRec> CLogRec::CreateUnfiltered(BYTE moduleIndex, LOG_LEVELS level, LOGREC_KINDOF kind) {
    return std::unique_ptr<CLogRec>(new CLogRec(moduleIndex, level, kind, Clock::now()));
}

void CLogRec::AddField(CLogField* field) {
    if (field) m_fields.emplace_back(field);
}
