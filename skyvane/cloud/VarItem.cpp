#include "cloud/VarItem.h"

#include "vxhelper/variant.h"

#include <algorithm>
#include <cfloat>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <ctime>

namespace {

// The latest time the conversion accepts: 3000-12-31 23:59:59 UTC.
constexpr LONGLONG kLastTime = 32535215999;

// mktime reads the system's time zone anew on every call (glibc looks at
// /etc/localtime each time), and it runs once per value change. Within one
// minute of local time the offset to UTC stays the same (zones change it at
// whole minutes), so each thread converts a minute's start once and adds the
// seconds. The key holds TZ as well, so a changed zone setting converts anew.
struct MinuteCache {
    int year = -1, month = 0, day = 0, hour = 0, minute = 0;
    char zone[64] = {};  // TZ when the minute was converted
    std::time_t start = 0;
};
thread_local MinuteCache t_minute;

bool SameZone(const char* zone) {
    return zone ? std::strncmp(t_minute.zone, zone, sizeof t_minute.zone) == 0 : t_minute.zone[0] == '\0';
}

std::time_t MinuteStart(const SYSTEMTIME& st) {
    const char* zone = std::getenv("TZ");
    const bool cachable = !zone || std::strlen(zone) < sizeof t_minute.zone;
    if (cachable && t_minute.year == st.wYear && t_minute.month == st.wMonth && t_minute.day == st.wDay &&
        t_minute.hour == st.wHour && t_minute.minute == st.wMinute && SameZone(zone))
        return t_minute.start;
    std::tm fields{};
    fields.tm_year = st.wYear - 1900;
    fields.tm_mon = st.wMonth - 1;
    fields.tm_mday = st.wDay;
    fields.tm_hour = st.wHour;
    fields.tm_min = st.wMinute;
    fields.tm_isdst = -1;  // the system decides whether daylight saving applies
    const std::time_t start = std::mktime(&fields);
    if (cachable && start != -1) {
        t_minute = MinuteCache{st.wYear, st.wMonth, st.wDay, st.wHour, st.wMinute, {}, start};
        std::strncpy(t_minute.zone, zone ? zone : "", sizeof t_minute.zone - 1);
    }
    return start;
}

// Seconds since 1970 of calendar fields read as local time; false when the
// fields are out of range or the time lies outside what is accepted.
bool LocalTimeToSeconds(const SYSTEMTIME& st, LONGLONG& seconds) {
    if (st.wMonth < 1 || st.wMonth > 12 || st.wDay < 1 || st.wDay > 31 || st.wHour > 23 || st.wMinute > 59 ||
        st.wSecond > 59)
        return false;
    const std::time_t start = MinuteStart(st);
    if (start == -1) return false;  // mktime's failure
    const std::time_t result = start + st.wSecond;
    if (result < 0 || result > kLastTime) return false;
    seconds = result;
    return true;
}

}  // namespace

bool CVarItemRtData::ConvertValue(const VARIANT* value, CString& text, double& number, bool& isText) {
    isText = value && (value->vt == VT_BSTR || value->vt == (VT_BSTR | VT_BYREF));
    if (isText) {
        text = _c_funktionVariantToCString(value);
        number = 0.0;
        return true;
    }
    bool ok = false;
    number = _c_funktionVariantToDoubleEx(value, ok);
    text.Empty();
    return ok;
}

bool CVarItemRtData::Update(const VARIANT* value, DWORD statusLow, DWORD statusHigh, const DATE* time) {
    CString text;
    double number = 0.0;
    bool isText = false;
    if (!ConvertValue(value, text, number, isText)) return false;

    CSingleLock lock(&m_cs, true);
    const double halfWidth = std::max(1.0, std::fabs(m_dValue)) * DBL_EPSILON;
    // Equal numbers are inside even where the band is not a number (infinities).
    const bool inside = number == m_dValue || (number >= m_dValue - halfWidth && number <= m_dValue + halfWidth);
    const bool changed = text != m_strValue || !inside || statusLow != m_dwStatusLow || statusHigh != m_dwStatusHigh ||
                         !m_bValid;
    if (!changed) return false;
    return SetValue(text, number, isText, statusLow, statusHigh, time);
}

bool CVarItemRtData::SetValue(const CString& text, double number, bool isText, DWORD statusLow, DWORD statusHigh,
                              const DATE* time) {
    // The time first: a report whose time cannot be stored stores nothing, so
    // no value is ever exported with the time of the report before it.
    SYSTEMTIME st{};
    if (!time || !ConvertDATE2Systemtime(*time, &st)) return false;  // no usable time stamp
    LONGLONG seconds = 0;                                            // 0 for a year before 1900
    if (st.wYear >= 1900 && !LocalTimeToSeconds(st, seconds)) return false;

    CSingleLock lock(&m_cs, true);
    m_dwStatusLow = statusLow;
    m_dwStatusHigh = statusHigh;
    m_strValue = text;
    m_dValue = number;
    m_bIsString = isText;
    m_bValid = true;
    m_time = seconds;
    m_wMilliseconds = st.wMilliseconds;
    return true;
}

void CVarItem::SplitKey(const CString& key, CString& project, CString& variable) {
    const int hash = key.Find(u'#');
    project = hash < 0 ? CString() : key.Left(hash);
    variable = hash < 0 ? key : key.Mid(hash + 1);
}
