#include "RowDecoders.h"

#include <QString>
#include <QXmlStreamReader>

#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <algorithm>
#include <cctype>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstring>
#include <limits>

namespace azurelocal {

namespace {

bool ParseDouble(std::string_view text, double& value) {
    if (text == "NaN") return value = std::numeric_limits<double>::quiet_NaN(), true;
    if (text == "INF") return value = std::numeric_limits<double>::infinity(), true;
    if (text == "-INF") return value = -std::numeric_limits<double>::infinity(), true;
    const auto [ptr, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
    return ec == std::errc() && ptr == text.data() + text.size();
}

bool ParseUnsigned(std::string_view text, std::uint64_t& value) {
    const auto [ptr, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
    return !text.empty() && ec == std::errc() && ptr == text.data() + text.size();
}

bool ParseSigned(std::string_view text, std::int64_t& value) {
    std::int64_t parsed = 0;
    const auto [ptr, ec] = std::from_chars(text.data(), text.data() + text.size(), parsed);
    if (text.empty() || ec != std::errc() || ptr != text.data() + text.size()) return false;
    value = parsed;
    return true;
}

DecodeResult Failure(std::string why) {
    DecodeResult result;
    result.error = std::move(why);
    return result;
}

// Reads Compact Binary v1.
class BondReader {
public:
    explicit BondReader(std::string_view data) : m_data(data) {}

    bool AtEnd() const { return m_pos == m_data.size(); }
    std::size_t Position() const { return m_pos; }

    bool Byte(std::uint8_t& out) {
        if (m_pos >= m_data.size()) return false;
        out = static_cast<std::uint8_t>(m_data[m_pos++]);
        return true;
    }

    bool Varint(std::uint64_t& out) {
        out = 0;
        for (int shift = 0; shift < 64; shift += 7) {
            std::uint8_t b = 0;
            if (!Byte(b)) return false;
            out |= static_cast<std::uint64_t>(b & 0x7F) << shift;
            if (!(b & 0x80)) return true;
        }
        return false;
    }

    bool FieldHeader(std::uint8_t& type, unsigned& id) {
        std::uint8_t b = 0;
        if (!Byte(b)) return false;
        type = b & 0x1F;
        const unsigned small = b >> 5;
        if (small <= 5) {
            id = small;
        } else if (small == 6) {
            std::uint8_t x = 0;
            if (!Byte(x)) return false;
            id = x;
        } else {
            std::uint8_t lo = 0, hi = 0;
            if (!Byte(lo) || !Byte(hi)) return false;
            id = static_cast<unsigned>(lo | (hi << 8));
        }
        return true;
    }

    bool String(std::string& out) {
        std::uint64_t size = 0;
        if (!Varint(size) || size > m_data.size() - m_pos) return false;
        out.assign(m_data.substr(m_pos, static_cast<std::size_t>(size)));
        m_pos += static_cast<std::size_t>(size);
        return true;
    }

    bool Double(double& out) {
        if (m_data.size() - m_pos < 8) return false;
        std::uint64_t bits = 0;
        for (int i = 0; i < 8; ++i)
            bits |= static_cast<std::uint64_t>(static_cast<std::uint8_t>(m_data[m_pos + i])) << (8 * i);
        std::memcpy(&out, &bits, sizeof out);
        m_pos += 8;
        return true;
    }

    // Skips a value of a type this reader does not need.
    bool Skip(std::uint8_t type, int depth = 0) {
        if (depth > 32) return false;
        std::uint64_t n = 0;
        std::uint8_t b = 0;
        switch (type) {
        case 2:
        case 3:
        case 14: return Byte(b);
        case 4:
        case 5:
        case 6:
        case 15:
        case 16:
        case 17: return Varint(n);
        case 7: return Advance(4);
        case 8: return Advance(8);
        case 9: return Varint(n) && Advance(n);
        case 18: return Varint(n) && n <= m_data.size() && Advance(n * 2);
        case 10: return SkipStruct(depth + 1);
        case 11:
        case 12: {
            if (!Byte(b) || !Varint(n)) return false;
            for (std::uint64_t i = 0; i < n; ++i)
                if (!Skip(b & 0x1F, depth + 1)) return false;
            return true;
        }
        case 13: {
            std::uint8_t k = 0, v = 0;
            if (!Byte(k) || !Byte(v) || !Varint(n)) return false;
            for (std::uint64_t i = 0; i < n; ++i)
                if (!Skip(k & 0x1F, depth + 1) || !Skip(v & 0x1F, depth + 1)) return false;
            return true;
        }
        default: return false;
        }
    }

    bool SkipStruct(int depth) {
        while (true) {
            std::uint8_t type = 0;
            unsigned id = 0;
            if (!FieldHeader(type, id)) return false;
            if (type == 0) return true;
            if (type == 1) continue;  // end of a base struct
            if (!Skip(type, depth)) return false;
        }
    }

private:
    bool Advance(std::uint64_t n) {
        if (n > m_data.size() - m_pos) return false;
        m_pos += static_cast<std::size_t>(n);
        return true;
    }

    std::string_view m_data;
    std::size_t m_pos = 0;
};

bool ReadBondRow(BondReader& reader, DecodedRow& row, std::string& error) {
    while (true) {
        std::uint8_t type = 0;
        unsigned id = 0;
        if (!reader.FieldHeader(type, id)) return error = "truncated row", false;
        if (type == 0) return true;
        bool ok = true;
        std::uint64_t n = 0;
        std::uint8_t b = 0;
        if (id == 0 && type == 9) ok = reader.String(row.project);
        else if (id == 1 && type == 9) ok = reader.String(row.variable);
        else if (id == 2 && type == 8) ok = reader.Double(row.value);
        else if (id == 3 && type == 9) ok = reader.String(row.text);
        else if (id == 4 && type == 2) ok = reader.Byte(b), row.isText = b != 0;
        else if (id == 5 && type == 17) {
            ok = reader.Varint(n);
            row.time = static_cast<std::int64_t>((n >> 1) ^ (~(n & 1) + 1));  // zigzag
        } else if (id == 6 && type == 4) {
            ok = reader.Varint(n) && n <= 0xFFFF;
            row.milliseconds = static_cast<unsigned>(n);
        } else if (id == 7 && type == 6) ok = reader.Varint(row.status);
        else if (id <= 7)
            return error = "field " + std::to_string(id) + " has the wrong type " + std::to_string(type), false;
        else ok = reader.Skip(type);
        if (!ok) return error = "malformed field " + std::to_string(id), false;
    }
}

std::string Hmac(std::string_view key, std::string_view data) {
    unsigned char digest[EVP_MAX_MD_SIZE];
    unsigned int length = 0;
    HMAC(EVP_sha256(), key.data(), static_cast<int>(key.size()), reinterpret_cast<const unsigned char*>(data.data()),
         data.size(), digest, &length);
    unsigned char base64[64];
    const int n = EVP_EncodeBlock(base64, digest, static_cast<int>(length));
    return std::string(reinterpret_cast<const char*>(base64), static_cast<std::size_t>(n));
}

std::string Lower(std::string_view text) {
    std::string out(text);
    std::transform(out.begin(), out.end(), out.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return out;
}

}  // namespace

bool ParseIsoTime(std::string_view text, std::int64_t& seconds, unsigned& milliseconds) {
    // Exactly this form, digits where the pattern has 'd': no signs, blanks or
    // short fields, which a sender's time stamps never have.
    constexpr std::string_view kPattern = "dddd-dd-ddTdd:dd:dd.dddZ";
    if (text.size() != kPattern.size()) return false;
    for (std::size_t i = 0; i < text.size(); ++i) {
        const bool digit = text[i] >= '0' && text[i] <= '9';
        if (kPattern[i] == 'd' ? !digit : text[i] != kPattern[i]) return false;
    }
    const auto field = [&](std::size_t at, std::size_t length) {
        unsigned value = 0;
        for (std::size_t i = at; i < at + length; ++i) value = value * 10 + static_cast<unsigned>(text[i] - '0');
        return value;
    };
    const unsigned year = field(0, 4), month = field(5, 2), day = field(8, 2);
    const unsigned hour = field(11, 2), minute = field(14, 2), second = field(17, 2);
    const std::chrono::year_month_day date{std::chrono::year(static_cast<int>(year)), std::chrono::month(month),
                                           std::chrono::day(day)};
    if (!date.ok() || hour > 23 || minute > 59 || second > 59) return false;  // also 30 February and the like
    const auto days = std::chrono::sys_days(date).time_since_epoch().count();
    seconds = static_cast<std::int64_t>(days) * 86400 + hour * 3600 + minute * 60 + second;
    milliseconds = field(20, 3);
    return true;
}

DecodeResult DecodeJsonRows(std::string_view body) {
    std::string error;
    const auto document = ParseJson(body, error);
    if (!document) return Failure("JSON body: " + error);
    if (document->kind != JsonValue::Kind::Array) return Failure("JSON body: not an array");
    DecodeResult result;
    for (const JsonValue& item : document->items) {
        if (item.kind != JsonValue::Kind::Object) return Failure("JSON body: a row is not an object");
        const JsonValue* project = item.Find("project");
        const JsonValue* variable = item.Find("variable");
        const JsonValue* value = item.Find("value");
        const JsonValue* time = item.Find("time");
        const JsonValue* status = item.Find("status");
        if (!project || !variable || !value || !time || !status || item.members.size() != 5)
            return Failure("JSON body: a row does not have exactly project, variable, value, time, status");
        if (project->kind != JsonValue::Kind::String || variable->kind != JsonValue::Kind::String ||
            time->kind != JsonValue::Kind::String)
            return Failure("JSON body: project, variable and time must be strings");
        DecodedRow row;
        row.project = project->text;
        row.variable = variable->text;
        if (value->kind == JsonValue::Kind::String) {
            row.isText = true;
            row.text = value->text;
        } else if (value->kind == JsonValue::Kind::Null) {
            row.value = std::numeric_limits<double>::quiet_NaN();
        } else if (const auto number = value->AsDouble()) {
            row.value = *number;
        } else {
            return Failure("JSON body: value is neither a number, a string nor null");
        }
        if (!ParseIsoTime(time->text, row.time, row.milliseconds)) return Failure("JSON body: malformed time");
        const auto s = status->AsUnsigned();
        if (!s) return Failure("JSON body: status is not an unsigned 64-bit integer");
        row.status = *s;
        result.rows.push_back(std::move(row));
    }
    result.ok = true;
    return result;
}

DecodeResult DecodeXmlRows(std::string_view body) {
    QXmlStreamReader xml(QByteArray(body.data(), static_cast<qsizetype>(body.size())));
    DecodeResult result;
    if (!xml.readNextStartElement() || xml.name() != u"rows") return Failure("XML body: the root is not <rows>");
    while (xml.readNextStartElement()) {
        if (xml.name() != u"row") return Failure("XML body: unexpected element inside <rows>");
        const QXmlStreamAttributes attributes = xml.attributes();
        DecodedRow row;
        row.project = attributes.value(QLatin1String("project")).toString().toStdString();
        row.variable = attributes.value(QLatin1String("variable")).toString().toStdString();
        const std::string type = attributes.value(QLatin1String("type")).toString().toStdString();
        const std::string time = attributes.value(QLatin1String("time")).toString().toStdString();
        const std::string status = attributes.value(QLatin1String("status")).toString().toStdString();
        if (!attributes.hasAttribute(QLatin1String("project")) || !attributes.hasAttribute(QLatin1String("variable")))
            return Failure("XML body: a row lacks project or variable");
        if (!ParseIsoTime(time, row.time, row.milliseconds)) return Failure("XML body: malformed time");
        if (!ParseUnsigned(status, row.status)) return Failure("XML body: malformed status");
        const std::string value = xml.readElementText().toStdString();
        if (xml.hasError()) break;
        if (type == "text") {
            row.isText = true;
            row.text = value;
        } else if (type == "number") {
            if (!ParseDouble(value, row.value)) return Failure("XML body: malformed number '" + value + "'");
        } else {
            return Failure("XML body: type must be number or text");
        }
        result.rows.push_back(std::move(row));
    }
    if (!xml.hasError()) {
        // Nothing but the end of the document may follow </rows>.
        while (!xml.atEnd() && xml.readNext() != QXmlStreamReader::Invalid) {
            if (xml.isStartElement()) return Failure("XML body: content after </rows>");
        }
    }
    if (xml.hasError() && xml.error() != QXmlStreamReader::PrematureEndOfDocumentError)
        return Failure("XML body: " + xml.errorString().toStdString());
    if (xml.hasError()) return Failure("XML body: document ends early");
    result.ok = true;
    return result;
}

DecodeResult DecodeBondRows(std::string_view body) {
    if (body.size() < 4 || body.substr(0, 4) != std::string_view("\x43\x42\x01\x00", 4))
        return Failure("Bond body: not marshaled Compact Binary v1 (43 42 01 00)");
    BondReader reader(body.substr(4));
    DecodeResult result;
    std::string error;
    while (true) {
        std::uint8_t type = 0;
        unsigned id = 0;
        if (!reader.FieldHeader(type, id)) return Failure("Bond body: truncated");
        if (type == 0) break;
        if (id == 0 && type == 11) {
            std::uint8_t elementType = 0;
            std::uint64_t count = 0;
            if (!reader.Byte(elementType) || !reader.Varint(count)) return Failure("Bond body: malformed list");
            if ((elementType & 0x1F) != 10) return Failure("Bond body: rows are not structs");
            if (count > body.size()) return Failure("Bond body: row count larger than the body");
            for (std::uint64_t i = 0; i < count; ++i) {
                DecodedRow row;
                if (!ReadBondRow(reader, row, error)) return Failure("Bond body: " + error);
                result.rows.push_back(std::move(row));
            }
        } else if (!reader.Skip(type)) {
            return Failure("Bond body: malformed field " + std::to_string(id));
        }
    }
    if (!reader.AtEnd()) return Failure("Bond body: bytes after the end of the struct");
    for (const auto& row : result.rows) {
        if (!IsValidUtf8(row.project) || !IsValidUtf8(row.variable) || !IsValidUtf8(row.text))
            return Failure("Bond body: a string is not valid UTF-8");
    }
    result.ok = true;
    return result;
}

DecodeResult DecodeRows(std::string_view format, std::string_view body) {
    const std::string f = Lower(format);
    if (f == "json") return DecodeJsonRows(body);
    if (f == "xml") return DecodeXmlRows(body);
    if (f == "bond") return DecodeBondRows(body);
    return Failure("unknown format '" + std::string(format) + "'");
}

std::string RowToJsonLine(const DecodedRow& row, std::string_view entity, std::string_view format,
                          std::string_view messageId) {
    std::string line = "{\"entity\":" + JsonQuote(entity) + ",\"format\":" + JsonQuote(format) +
                       ",\"messageId\":" + JsonQuote(messageId) + ",\"project\":" + JsonQuote(row.project) +
                       ",\"variable\":" + JsonQuote(row.variable) + ",\"isText\":" + (row.isText ? "true" : "false") +
                       ",\"value\":";
    if (std::isfinite(row.value)) {
        char buffer[32];
        const auto r = std::to_chars(buffer, buffer + sizeof buffer, row.value);
        line.append(buffer, r.ptr);
    } else {
        line += std::isnan(row.value) ? "\"NaN\"" : (row.value > 0 ? "\"INF\"" : "\"-INF\"");
    }
    line += ",\"text\":" + JsonQuote(row.text) + ",\"time\":" + std::to_string(row.time) +
            ",\"milliseconds\":" + std::to_string(row.milliseconds) + ",\"status\":" + std::to_string(row.status) + "}";
    return line;
}

std::optional<DecodedRow> RowFromJsonLine(std::string_view line, std::string* entity, std::string* format,
                                          std::string* messageId) {
    std::string error;
    const auto document = ParseJson(line, error);
    if (!document || document->kind != JsonValue::Kind::Object) return std::nullopt;
    auto text = [&](const char* name) -> std::string {
        const JsonValue* v = document->Find(name);
        return v && v->kind == JsonValue::Kind::String ? v->text : std::string();
    };
    DecodedRow row;
    row.project = text("project");
    row.variable = text("variable");
    row.text = text("text");
    const JsonValue* isText = document->Find("isText");
    row.isText = isText && isText->boolean;
    const JsonValue* value = document->Find("value");
    if (value && value->kind == JsonValue::Kind::String) {
        ParseDouble(value->text, row.value);
    } else if (value) {
        row.value = value->AsDouble().value_or(0);
    }
    // Read exactly: a Bond body carries any 64-bit time, which a double would round.
    if (const JsonValue* v = document->Find("time"); v && v->kind == JsonValue::Kind::Number)
        ParseSigned(v->text, row.time);
    if (const JsonValue* v = document->Find("milliseconds"))
        row.milliseconds = static_cast<unsigned>(v->AsUnsigned().value_or(0));
    if (const JsonValue* v = document->Find("status")) row.status = v->AsUnsigned().value_or(0);
    if (entity) *entity = text("entity");
    if (format) *format = text("format");
    if (messageId) *messageId = text("messageId");
    return row;
}

std::string PercentDecode(std::string_view text) {
    std::string out;
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (text[i] == '%' && i + 2 < text.size() && std::isxdigit(static_cast<unsigned char>(text[i + 1])) &&
            std::isxdigit(static_cast<unsigned char>(text[i + 2]))) {
            out.push_back(static_cast<char>(std::stoi(std::string(text.substr(i + 1, 2)), nullptr, 16)));
            i += 2;
        } else {
            out.push_back(text[i]);
        }
    }
    return out;
}

bool CheckSasToken(std::string_view authorization, std::string_view keyName, std::string_view key,
                   std::string_view resource, std::int64_t now, std::string& why) {
    constexpr std::string_view kPrefix = "SharedAccessSignature ";
    if (authorization.substr(0, kPrefix.size()) != kPrefix) return why = "no shared access signature", false;
    std::string sr, sig, se, skn;
    std::string_view rest = authorization.substr(kPrefix.size());
    while (!rest.empty()) {
        const auto amp = rest.find('&');
        const std::string_view part = rest.substr(0, amp);
        rest = amp == std::string_view::npos ? std::string_view() : rest.substr(amp + 1);
        const auto eq = part.find('=');
        if (eq == std::string_view::npos) continue;
        const std::string_view name = part.substr(0, eq), value = part.substr(eq + 1);
        if (name == "sr") sr = value;
        else if (name == "sig") sig = value;
        else if (name == "se") se = value;
        else if (name == "skn") skn = value;
    }
    if (sr.empty() || sig.empty() || se.empty() || skn.empty())
        return why = "the token lacks sr, sig, se or skn", false;
    if (skn != keyName) return why = "unknown key name", false;
    std::uint64_t expiry = 0;
    if (!ParseUnsigned(se, expiry)) return why = "malformed expiry", false;
    if (static_cast<std::int64_t>(expiry) <= now) return why = "the token has expired", false;
    const std::string expected = Hmac(key, sr + "\n" + se);
    const std::string given = PercentDecode(sig);
    if (given.size() != expected.size() || CRYPTO_memcmp(given.data(), expected.data(), given.size()) != 0)
        return why = "the signature does not match", false;
    // The token is valid for every address that starts with its resource.
    std::string scope = Lower(PercentDecode(sr));
    if (const auto scheme = scope.find("://"); scheme != std::string::npos) scope = scope.substr(scheme + 3);
    while (!scope.empty() && scope.back() == '/') scope.pop_back();
    const std::string target = Lower(resource);
    if (target.compare(0, scope.size(), scope) != 0 || (target.size() > scope.size() && target[scope.size()] != '/'))
        return why = "the token is for another resource", false;
    return true;
}

}  // namespace azurelocal
