#include "vxhelper/variant.h"

#include <cctype>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <string>

namespace {

constexpr double kMsPerDay = 86400000.0;
constexpr long long kDaysFrom1970To18991230 = -25569;
// OLE dates run from 0100-01-01 to 9999-12-31; by the sign rule the integer
// part of the earliest day is -657434, so anything above -657435 belongs to it.
constexpr double kFirstDate = -657435.0;
constexpr double kEndDate = 2958466.0;  // 10000-01-01

// A by-value view of value: by-reference forms are read through, nested
// VT_VARIANT references up to a small depth (a reference cycle must not loop).
// Shallow: a text is not copied and stays owned by the original.
bool ValueOf(const VARIANT* value, VARIANT& out, int depth = 0) {
    if (!value) return false;
    if (!(value->vt & VT_BYREF)) {
        out = *value;
        return true;
    }
    const auto type = static_cast<VARTYPE>(value->vt & ~VT_BYREF);
    if (!value->byref || (type & VT_ARRAY)) return false;
    VariantInit(&out);
    out.vt = type;
    switch (type) {
    case VT_VARIANT: return depth < 8 && ValueOf(value->pvarVal, out, depth + 1);
    case VT_I1: out.cVal = *value->pcVal; return true;
    case VT_UI1: out.bVal = *value->pbVal; return true;
    case VT_I2: out.iVal = *value->piVal; return true;
    case VT_UI2: out.uiVal = *value->puiVal; return true;
    case VT_I4:
    case VT_INT: out.lVal = *value->plVal; return true;
    case VT_UI4:
    case VT_UINT: out.ulVal = *value->pulVal; return true;
    case VT_I8: out.llVal = *value->pllVal; return true;
    case VT_UI8: out.ullVal = *value->pullVal; return true;
    case VT_R4: out.fltVal = *value->pfltVal; return true;
    case VT_R8: out.dblVal = *value->pdblVal; return true;
    case VT_DATE: out.date = *value->pdate; return true;
    case VT_CY: out.cyVal = *value->pcyVal; return true;
    case VT_BOOL: out.boolVal = *value->pboolVal; return true;
    case VT_BSTR: out.bstrVal = *value->pbstrVal; return true;
    default: return false;
    }
}

std::u16string Ascii(std::string_view text) { return std::u16string(text.begin(), text.end()); }

template <typename T>
std::u16string Shortest(T number) {
    char buffer[64];
    const auto result = std::to_chars(buffer, buffer + sizeof buffer, number);
    return Ascii(std::string_view(buffer, static_cast<size_t>(result.ptr - buffer)));
}

std::u16string CurrencyText(std::int64_t units) {
    const bool negative = units < 0;
    const std::uint64_t magnitude = negative ? 0 - static_cast<std::uint64_t>(units)
                                             : static_cast<std::uint64_t>(units);
    std::u16string text = Ascii(std::to_string(magnitude / 10000));
    std::string fraction = std::to_string(magnitude % 10000);
    fraction.insert(0, 4 - fraction.size(), '0');
    while (!fraction.empty() && fraction.back() == '0') fraction.pop_back();
    if (!fraction.empty()) text += u'.' + Ascii(fraction);
    return negative ? u'-' + text : text;
}

// A whole decimal number in C notation, surrounded by nothing but blanks.
bool ParseNumber(BSTR text, double& number) {
    std::string utf8 = Utf16ToUtf8(std::u16string_view(text ? text : u"", SysStringLen(text)));
    const size_t first = utf8.find_first_not_of(" \t");
    if (first == std::string::npos) return false;
    const size_t last = utf8.find_last_not_of(" \t");
    std::string_view s(utf8.data() + first, last - first + 1);
    if (s.front() == '+') s.remove_prefix(1);
    const size_t digitAt = !s.empty() && s.front() == '-' ? 1 : 0;
    if (digitAt >= s.size() || !(std::isdigit(static_cast<unsigned char>(s[digitAt])) || s[digitAt] == '.'))
        return false;
    const auto result = std::from_chars(s.data(), s.data() + s.size(), number);
    return result.ec == std::errc() && result.ptr == s.data() + s.size();
}

}  // namespace

bool ConvertDATE2Systemtime(DATE date, SYSTEMTIME* st) {
    if (!st) return false;
    *st = SYSTEMTIME{};
    if (!std::isfinite(date) || date <= kFirstDate || date >= kEndDate) return false;
    const double whole = std::trunc(date);
    long long days = static_cast<long long>(whole);
    long long ms = std::llround(std::fabs(date - whole) * kMsPerDay);
    if (ms >= static_cast<long long>(kMsPerDay)) {  // rounded up to midnight: the next day
        ms -= static_cast<long long>(kMsPerDay);
        ++days;
    }
    const std::chrono::sys_days unixDay{std::chrono::days(days + kDaysFrom1970To18991230)};
    const std::chrono::year_month_day calendar{unixDay};
    const int year = static_cast<int>(calendar.year());
    if (year < 100 || year > 9999) return false;
    st->wYear = static_cast<WORD>(year);
    st->wMonth = static_cast<WORD>(static_cast<unsigned>(calendar.month()));
    st->wDay = static_cast<WORD>(static_cast<unsigned>(calendar.day()));
    st->wDayOfWeek = static_cast<WORD>(std::chrono::weekday(unixDay).c_encoding());  // 0 is Sunday
    st->wHour = static_cast<WORD>(ms / 3600000);
    st->wMinute = static_cast<WORD>(ms / 60000 % 60);
    st->wSecond = static_cast<WORD>(ms / 1000 % 60);
    st->wMilliseconds = static_cast<WORD>(ms % 1000);
    return true;
}

CString _c_funktionVariantToCString(const VARIANT* value) {
    VARIANT v;
    if (!ValueOf(value, v)) return CString();
    switch (v.vt) {
    case VT_BSTR: return CString(std::u16string(v.bstrVal ? v.bstrVal : u"", SysStringLen(v.bstrVal)));
    case VT_I1: return CString::Formatted(u"%d", v.cVal);
    case VT_UI1: return CString::Formatted(u"%u", v.bVal);
    case VT_I2: return CString::Formatted(u"%d", v.iVal);
    case VT_UI2: return CString::Formatted(u"%u", v.uiVal);
    case VT_I4:
    case VT_INT: return CString::Formatted(u"%d", v.lVal);
    case VT_UI4:
    case VT_UINT: return CString::Formatted(u"%u", v.ulVal);
    case VT_I8: return CString(Ascii(std::to_string(v.llVal)));
    case VT_UI8: return CString(Ascii(std::to_string(v.ullVal)));
    case VT_R4: return CString(Shortest(v.fltVal));
    case VT_R8: return CString(Shortest(v.dblVal));
    case VT_BOOL: return CString(v.boolVal ? u"true" : u"false");
    case VT_CY: return CString(CurrencyText(v.cyVal.int64));
    case VT_DATE: {
        SYSTEMTIME st;
        if (!ConvertDATE2Systemtime(v.date, &st)) return CString();
        return CString::Formatted(u"%04u-%02u-%02u %02u:%02u:%02u.%03u", st.wYear, st.wMonth, st.wDay, st.wHour,
                                  st.wMinute, st.wSecond, st.wMilliseconds);
    }
    default: return CString();
    }
}

double _c_funktionVariantToDoubleEx(const VARIANT* value, bool& ok) {
    ok = false;
    VARIANT v;
    if (!ValueOf(value, v)) return 0.0;
    double number = 0.0;
    switch (v.vt) {
    case VT_I1: number = v.cVal; break;
    case VT_UI1: number = v.bVal; break;
    case VT_I2: number = v.iVal; break;
    case VT_UI2: number = v.uiVal; break;
    case VT_I4:
    case VT_INT: number = v.lVal; break;
    case VT_UI4:
    case VT_UINT: number = v.ulVal; break;
    case VT_I8: number = static_cast<double>(v.llVal); break;
    case VT_UI8: number = static_cast<double>(v.ullVal); break;
    case VT_R4: number = v.fltVal; break;
    case VT_R8: number = v.dblVal; break;
    case VT_DATE: number = v.date; break;
    case VT_BOOL: number = v.boolVal ? 1.0 : 0.0; break;
    case VT_CY: number = static_cast<double>(v.cyVal.int64) / 10000.0; break;
    case VT_BSTR:
        if (!ParseNumber(v.bstrVal, number)) return 0.0;
        break;
    default: return 0.0;
    }
    ok = true;
    return number;
}
