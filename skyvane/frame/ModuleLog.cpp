#include "frame/ModuleLog.h"

#include "brennic/logsink.h"

namespace {

template <typename Text>
void WriteRecord(LOG_LEVELS level, WORD fieldId, const Text& text) {
    CLogSink* sink = CLogSink::m_pLogSinkSelf.load(std::memory_order_acquire);
    if (!sink || !sink->IsLevelEnabled(CModuleLog::kModuleIndex, level)) return;
    CLogRec* record = CLogRec::CreateLogRec(sink, CModuleLog::kModuleIndex, level, CModuleLog::kRecordKind, nullptr);
    if (!record) return;
    record->AddField(CLogField::CreateLogField(fieldId, text, 0));
    sink->AddDirect(record);
}

}  // namespace

void CModuleLog::LogError(const CString& text) { WriteRecord(LOG_LEVEL_ERROR, kErrorField, text); }

void CModuleLog::LogInfo(const CString& text) { WriteRecord(LOG_LEVEL_INFO, kInfoField, text); }

void CModuleLog::LogError(const char16_t* text) { WriteRecord(LOG_LEVEL_ERROR, kErrorField, text); }

void CModuleLog::LogInfo(const char16_t* text) { WriteRecord(LOG_LEVEL_INFO, kInfoField, text); }

bool CModuleLog::IsInfoEnabled() {
    const CLogSink* sink = CLogSink::m_pLogSinkSelf.load(std::memory_order_acquire);
    return sink && sink->IsLevelEnabled(kModuleIndex, LOG_LEVEL_INFO);
}
