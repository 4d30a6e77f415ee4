#pragma once
// The module's records in the central log. Every writer of the module (the
// module object, the runtime bridge, the cloud communication's logger) writes
// errors and information through here, so all of them share one layout:
// client module 19, kind 76, one text field (39 for errors, 49 for
// information). A level that is off costs one byte read; without a current
// sink nothing is written.

#include "brennic/logrec.h"

#include "platform/text.h"

class CModuleLog {
public:
    static constexpr BYTE kModuleIndex = 19;
    static constexpr LOGREC_KINDOF kRecordKind = LOGREC_KIND_MODULE_TEXT;
    static constexpr WORD kErrorField = 39;
    static constexpr WORD kInfoField = 49;

    static void LogError(const CString& text);
    static void LogInfo(const CString& text);
    // The same for a terminated UTF-16 string (null writes an empty text).
    static void LogError(const char16_t* text);
    static void LogInfo(const char16_t* text);
    // Whether information records would be written now.
    static bool IsInfoEnabled();
};
