#include "private/RowFormats.h"

#include "private/Bond.h"
#include "private/Utf.h"

#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstring>

namespace corvell {

namespace {

void PutJsonString(std::string& out, std::u16string_view text) {
    static constexpr char kHex[] = "0123456789abcdef";
    out.push_back('"');
    ForEachCodePoint(text, [&out](char32_t cp) {
        switch (cp) {
        case '"': out += "\\\""; return;
        case '\\': out += "\\\\"; return;
        case '\n': out += "\\n"; return;
        case '\r': out += "\\r"; return;
        case '\t': out += "\\t"; return;
        default: break;
        }
        if (cp < 0x20) {
            out += "\\u00";
            out.push_back(kHex[cp >> 4]);
            out.push_back(kHex[cp & 0xF]);
        } else {
            PutUtf8(out, cp);
        }
    });
    out.push_back('"');
}

// XML 1.0 cannot carry most control characters even as references: they
// become U+FFFD. In attributes, tab, line feed and carriage return are written
// as references so that attribute normalisation keeps them.
void PutXmlText(std::string& out, std::u16string_view text, bool attribute) {
    ForEachCodePoint(text, [&out, attribute](char32_t cp) {
        switch (cp) {
        case '&': out += "&amp;"; return;
        case '<': out += "&lt;"; return;
        case '>': out += "&gt;"; return;
        case '"': out += attribute ? "&quot;" : "\""; return;
        case '\r': out += "&#13;"; return;
        case '\n': out += attribute ? "&#10;" : "\n"; return;
        case '\t': out += attribute ? "&#9;" : "\t"; return;
        default: break;
        }
        if (cp < 0x20 || cp == 0xFFFE || cp == 0xFFFF) cp = 0xFFFD;
        PutUtf8(out, cp);
    });
}

void PutNumber(std::string& out, double value) {
    char buffer[32];
    const auto result = std::to_chars(buffer, buffer + sizeof buffer, value);
    out.append(buffer, result.ptr);
}

void PutUnsigned(std::string& out, std::uint64_t value) {
    char buffer[24];
    const auto result = std::to_chars(buffer, buffer + sizeof buffer, value);
    out.append(buffer, result.ptr);
}

// Days since 1970-01-01 to a civil date (proleptic Gregorian). The standard
// calendar covers the years -32767 to 32767; the Gregorian calendar repeats
// every 400 years (146,097 days), so whole cycles are set aside first and any
// 64-bit day count works.
void CivilFromDays(std::int64_t days, std::int64_t& year, unsigned& month, unsigned& day) {
    constexpr std::int64_t kDaysPer400Years = 146097;
    std::int64_t cycles = days / kDaysPer400Years;
    std::int64_t rest = days % kDaysPer400Years;
    if (rest < 0) rest += kDaysPer400Years, --cycles;
    const std::chrono::year_month_day date{std::chrono::sys_days{std::chrono::days{rest}}};
    year = static_cast<int>(date.year()) + cycles * 400;
    month = static_cast<unsigned>(date.month());
    day = static_cast<unsigned>(date.day());
}

// Fields equal to their default are left out, as Bond writers do; readers
// fill in the default.
void PutBondString(std::string& out, unsigned id, std::u16string_view text, std::string& scratch) {
    if (text.empty()) return;
    scratch.clear();
    ForEachCodePoint(text, [&scratch](char32_t cp) { PutUtf8(scratch, cp); });
    bond::PutFieldHeader(out, id, bond::kString);
    bond::PutString(out, scratch);
}

constexpr std::string_view kXmlPrefix = "<?xml version=\"1.0\" encoding=\"UTF-8\"?><rows>";
constexpr std::string_view kXmlSuffix = "</rows>";
// Marshal header, then field 0 of Rows: a list of structs.
constexpr char kBondMessagePrefix[] = {0x43, 0x42, 0x01, 0x00, (0 << 5) | bond::kList, bond::kStruct};

}  // namespace

void AppendIsoTime(std::string& out, std::int64_t seconds, unsigned milliseconds) {
    std::int64_t days = seconds / 86400;
    std::int64_t secondOfDay = seconds % 86400;
    if (secondOfDay < 0) secondOfDay += 86400, --days;
    std::int64_t year = 0;
    unsigned month = 0, day = 0;
    CivilFromDays(days, year, month, day);
    const auto hour = static_cast<unsigned>(secondOfDay / 3600), minute = static_cast<unsigned>(secondOfDay / 60 % 60),
               second = static_cast<unsigned>(secondOfDay % 60);
    milliseconds %= 1000;
    if (year < 0 || year > 9999) {  // rare: the general (and slower) way
        char buffer[48];
        const int n = std::snprintf(buffer, sizeof buffer, "%04lld-%02u-%02uT%02u:%02u:%02u.%03uZ",
                                    static_cast<long long>(year), month, day, hour, minute, second, milliseconds);
        out.append(buffer, static_cast<std::size_t>(n));
        return;
    }
    // Written digit by digit: this runs once per row, and snprintf was a good part of a row's cost.
    char text[24] = {'0', '0', '0', '0', '-', '0', '0', '-', '0', '0', 'T', '0',
                     '0', ':', '0', '0', ':', '0', '0', '.', '0', '0', '0', 'Z'};
    auto put = [&text](int end, unsigned value, int digits) {
        for (int i = 0; i < digits; ++i, value /= 10) text[end - i] = static_cast<char>('0' + value % 10);
    };
    put(3, static_cast<unsigned>(year), 4);
    put(6, month, 2);
    put(9, day, 2);
    put(12, hour, 2);
    put(15, minute, 2);
    put(18, second, 2);
    put(22, milliseconds, 3);
    out.append(text, sizeof text);
}

std::string FormatIsoTime(std::int64_t seconds, unsigned milliseconds) {
    std::string text;
    AppendIsoTime(text, seconds, milliseconds);
    return text;
}

void AppendJsonRow(std::string& out, const Row& row) {
    out += "{\"project\":";
    PutJsonString(out, row.project);
    out += ",\"variable\":";
    PutJsonString(out, row.variable);
    out += ",\"value\":";
    if (row.isText) {
        PutJsonString(out, row.text);
    } else if (std::isfinite(row.value)) {
        PutNumber(out, row.value);
    } else {
        out += "null";  // JSON has no NaN or infinity
    }
    out += ",\"time\":\"";
    AppendIsoTime(out, row.time, row.milliseconds);
    out += "\",\"status\":";
    PutUnsigned(out, row.status);
    out.push_back('}');
}

void AppendXmlRow(std::string& out, const Row& row) {
    out += "<row project=\"";
    PutXmlText(out, row.project, true);
    out += "\" variable=\"";
    PutXmlText(out, row.variable, true);
    out += "\" time=\"";
    AppendIsoTime(out, row.time, row.milliseconds);
    out += "\" status=\"";
    PutUnsigned(out, row.status);
    if (row.isText) {
        out += "\" type=\"text\">";
        PutXmlText(out, row.text, false);
    } else {
        out += "\" type=\"number\">";
        if (std::isnan(row.value)) {
            out += "NaN";  // the XML Schema spellings of the special values
        } else if (std::isinf(row.value)) {
            out += row.value > 0 ? "INF" : "-INF";
        } else {
            PutNumber(out, row.value);
        }
    }
    out += "</row>";
}

void AppendBondRow(std::string& out, const Row& row) {
    std::string scratch;
    PutBondString(out, 0, row.project, scratch);
    PutBondString(out, 1, row.variable, scratch);
    if (!row.isText && (row.value != 0.0 || std::signbit(row.value))) {  // keeps -0.0 and NaN
        bond::PutFieldHeader(out, 2, bond::kDouble);
        bond::PutDouble(out, row.value);
    }
    if (row.isText) {
        PutBondString(out, 3, row.text, scratch);
        bond::PutFieldHeader(out, 4, bond::kBool);
        out.push_back(1);
    }
    if (row.time != 0) {
        bond::PutFieldHeader(out, 5, bond::kInt64);
        bond::PutVarint(out, bond::ZigZag(row.time));
    }
    if (row.milliseconds != 0) {
        bond::PutFieldHeader(out, 6, bond::kUint16);
        bond::PutVarint(out, row.milliseconds);
    }
    if (row.status != 0) {
        bond::PutFieldHeader(out, 7, bond::kUint64);
        bond::PutVarint(out, row.status);
    }
    out.push_back(bond::kStop);
}

std::size_t RowBuffer::RowBytes(std::size_t index) const {
    return m_ends[index] - (index == 0 ? 0 : m_ends[index - 1]);
}

std::size_t RowBuffer::Add(const Row& row) {
    const std::size_t before = m_bytes.size();
    switch (m_format) {
    case Format::Json: AppendJsonRow(m_bytes, row); break;
    case Format::Xml: AppendXmlRow(m_bytes, row); break;
    case Format::Bond: AppendBondRow(m_bytes, row); break;
    }
    m_ends.push_back(m_bytes.size());
    return m_bytes.size() - before;
}

void RowBuffer::RemoveLast() {
    m_ends.pop_back();
    m_bytes.resize(m_ends.empty() ? 0 : m_ends.back());
}

void RowBuffer::Clear() {
    m_bytes.clear();
    m_ends.clear();
}

std::size_t RowBuffer::MessageSize(std::size_t first, std::size_t last) const {
    const std::size_t start = first == 0 ? 0 : m_ends[first - 1];
    const std::size_t rows = m_ends[last - 1] - start;
    const std::size_t count = last - first;
    switch (m_format) {
    case Format::Json: return rows + count + 1;  // brackets and commas
    case Format::Xml: return kXmlPrefix.size() + rows + kXmlSuffix.size();
    case Format::Bond: return sizeof kBondMessagePrefix + bond::VarintSize(count) + rows + 1;
    }
    return rows;
}

std::size_t RowBuffer::SingleRowMessageSize(std::size_t rowBytes) const {
    switch (m_format) {
    case Format::Json: return rowBytes + 2;
    case Format::Xml: return kXmlPrefix.size() + rowBytes + kXmlSuffix.size();
    case Format::Bond: return sizeof kBondMessagePrefix + 1 + rowBytes + 1;
    }
    return rowBytes;
}

std::string RowBuffer::Compose(std::size_t first, std::size_t last) const {
    std::string body;
    body.reserve(MessageSize(first, last));
    switch (m_format) {
    case Format::Json:
        body.push_back('[');
        for (std::size_t i = first; i < last; ++i) {
            if (i != first) body.push_back(',');
            const std::size_t start = i == 0 ? 0 : m_ends[i - 1];
            body.append(m_bytes, start, m_ends[i] - start);
        }
        body.push_back(']');
        break;
    case Format::Xml: {
        const std::size_t start = first == 0 ? 0 : m_ends[first - 1];
        body += kXmlPrefix;
        body.append(m_bytes, start, m_ends[last - 1] - start);
        body += kXmlSuffix;
        break;
    }
    case Format::Bond: {
        const std::size_t start = first == 0 ? 0 : m_ends[first - 1];
        body.append(kBondMessagePrefix, sizeof kBondMessagePrefix);
        bond::PutVarint(body, last - first);
        body.append(m_bytes, start, m_ends[last - 1] - start);
        body.push_back(bond::kStop);  // end of struct Rows
        break;
    }
    }
    return body;
}

const char* RowBuffer::ContentType() const {
    switch (m_format) {
    case Format::Json: return "application/json; charset=utf-8";
    case Format::Xml: return "application/xml; charset=utf-8";
    case Format::Bond: return "application/x-bond-compact-binary";
    }
    return "application/octet-stream";
}

const char* RowBuffer::FormatName() const {
    switch (m_format) {
    case Format::Json: return "JSON";
    case Format::Xml: return "XML";
    case Format::Bond: return "BOND";
    }
    return "";
}

}  // namespace corvell
