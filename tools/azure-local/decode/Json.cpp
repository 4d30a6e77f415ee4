#include "Json.h"

#include <QString>

#include <charconv>
#include <cmath>

namespace azurelocal {

namespace {

class Parser {
public:
    explicit Parser(std::string_view text) : m_text(text) {}

    std::optional<JsonValue> Document(std::string& error) {
        JsonValue value;
        SkipSpace();
        if (!Value(value, 0)) {
            error = m_error + " at offset " + std::to_string(m_pos);
            return std::nullopt;
        }
        SkipSpace();
        if (m_pos != m_text.size()) {
            error = "text after the document at offset " + std::to_string(m_pos);
            return std::nullopt;
        }
        return value;
    }

private:
    bool Fail(const char* why) {
        m_error = why;
        return false;
    }

    void SkipSpace() {
        while (m_pos < m_text.size() &&
               (m_text[m_pos] == ' ' || m_text[m_pos] == '\t' || m_text[m_pos] == '\n' || m_text[m_pos] == '\r'))
            ++m_pos;
    }

    bool Literal(std::string_view word) {
        if (m_text.substr(m_pos, word.size()) != word) return Fail("unknown literal");
        m_pos += word.size();
        return true;
    }

    bool Value(JsonValue& out, int depth) {
        if (depth > 64) return Fail("nested too deeply");
        if (m_pos >= m_text.size()) return Fail("unexpected end");
        const char c = m_text[m_pos];
        if (c == '{') return Object(out, depth);
        if (c == '[') return Array(out, depth);
        if (c == '"') {
            out.kind = JsonValue::Kind::String;
            return String(out.text);
        }
        if (c == 't') {
            out.kind = JsonValue::Kind::Bool, out.boolean = true;
            return Literal("true");
        }
        if (c == 'f') {
            out.kind = JsonValue::Kind::Bool, out.boolean = false;
            return Literal("false");
        }
        if (c == 'n') {
            out.kind = JsonValue::Kind::Null;
            return Literal("null");
        }
        return Number(out);
    }

    bool Object(JsonValue& out, int depth) {
        out.kind = JsonValue::Kind::Object;
        ++m_pos;
        SkipSpace();
        if (m_pos < m_text.size() && m_text[m_pos] == '}') return ++m_pos, true;
        while (true) {
            SkipSpace();
            if (m_pos >= m_text.size() || m_text[m_pos] != '"') return Fail("expected a member name");
            std::string name;
            if (!String(name)) return false;
            SkipSpace();
            if (m_pos >= m_text.size() || m_text[m_pos] != ':') return Fail("expected ':'");
            ++m_pos;
            SkipSpace();
            JsonValue value;
            if (!Value(value, depth + 1)) return false;
            out.members.emplace_back(std::move(name), std::move(value));
            SkipSpace();
            if (m_pos >= m_text.size()) return Fail("unexpected end in an object");
            if (m_text[m_pos] == '}') return ++m_pos, true;
            if (m_text[m_pos] != ',') return Fail("expected ',' or '}'");
            ++m_pos;
        }
    }

    bool Array(JsonValue& out, int depth) {
        out.kind = JsonValue::Kind::Array;
        ++m_pos;
        SkipSpace();
        if (m_pos < m_text.size() && m_text[m_pos] == ']') return ++m_pos, true;
        while (true) {
            SkipSpace();
            JsonValue value;
            if (!Value(value, depth + 1)) return false;
            out.items.push_back(std::move(value));
            SkipSpace();
            if (m_pos >= m_text.size()) return Fail("unexpected end in an array");
            if (m_text[m_pos] == ']') return ++m_pos, true;
            if (m_text[m_pos] != ',') return Fail("expected ',' or ']'");
            ++m_pos;
        }
    }

    bool Hex4(char32_t& out) {
        if (m_pos + 4 > m_text.size()) return Fail("short \\u escape");
        out = 0;
        for (int i = 0; i < 4; ++i) {
            const char c = m_text[m_pos++];
            out <<= 4;
            if (c >= '0' && c <= '9') out |= static_cast<char32_t>(c - '0');
            else if (c >= 'a' && c <= 'f') out |= static_cast<char32_t>(c - 'a' + 10);
            else if (c >= 'A' && c <= 'F') out |= static_cast<char32_t>(c - 'A' + 10);
            else return Fail("bad \\u escape");
        }
        return true;
    }

    bool String(std::string& out) {
        ++m_pos;  // opening quote
        const std::size_t start = m_pos;
        while (true) {
            if (m_pos >= m_text.size()) return Fail("unterminated string");
            const auto c = static_cast<unsigned char>(m_text[m_pos]);
            if (c == '"') break;
            if (c < 0x20) return Fail("raw control character in a string");
            if (c != '\\') {
                out.push_back(static_cast<char>(c));
                ++m_pos;
                continue;
            }
            if (++m_pos >= m_text.size()) return Fail("unterminated escape");
            const char e = m_text[m_pos++];
            switch (e) {
            case '"': out.push_back('"'); break;
            case '\\': out.push_back('\\'); break;
            case '/': out.push_back('/'); break;
            case 'b': out.push_back('\b'); break;
            case 'f': out.push_back('\f'); break;
            case 'n': out.push_back('\n'); break;
            case 'r': out.push_back('\r'); break;
            case 't': out.push_back('\t'); break;
            case 'u': {
                char32_t cp = 0;
                if (!Hex4(cp)) return false;
                if (cp >= 0xD800 && cp <= 0xDBFF) {
                    char32_t low = 0;
                    if (m_text.substr(m_pos, 2) != "\\u") return Fail("lone surrogate escape");
                    m_pos += 2;
                    if (!Hex4(low)) return false;
                    if (low < 0xDC00 || low > 0xDFFF) return Fail("lone surrogate escape");
                    cp = 0x10000 + ((cp - 0xD800) << 10) + (low - 0xDC00);
                } else if (cp >= 0xDC00 && cp <= 0xDFFF) {
                    return Fail("lone surrogate escape");
                }
                out += QString::fromUcs4(&cp, 1).toStdString();
                break;
            }
            default: return Fail("unknown escape");
            }
        }
        ++m_pos;  // closing quote
        if (!IsValidUtf8(m_text.substr(start, m_pos - 1 - start))) return Fail("string is not valid UTF-8");
        return true;
    }

    bool Number(JsonValue& out) {
        const std::size_t start = m_pos;
        auto digits = [this] {
            const std::size_t from = m_pos;
            while (m_pos < m_text.size() && m_text[m_pos] >= '0' && m_text[m_pos] <= '9') ++m_pos;
            return m_pos - from;
        };
        if (m_pos < m_text.size() && m_text[m_pos] == '-') ++m_pos;
        if (m_pos < m_text.size() && m_text[m_pos] == '0') {
            ++m_pos;
        } else if (digits() == 0) {
            return Fail("unexpected character");
        }
        if (m_pos < m_text.size() && m_text[m_pos] == '.') {
            ++m_pos;
            if (digits() == 0) return Fail("digits expected after '.'");
        }
        if (m_pos < m_text.size() && (m_text[m_pos] == 'e' || m_text[m_pos] == 'E')) {
            ++m_pos;
            if (m_pos < m_text.size() && (m_text[m_pos] == '+' || m_text[m_pos] == '-')) ++m_pos;
            if (digits() == 0) return Fail("digits expected in the exponent");
        }
        out.kind = JsonValue::Kind::Number;
        out.text = std::string(m_text.substr(start, m_pos - start));
        return true;
    }

    std::string_view m_text;
    std::size_t m_pos = 0;
    std::string m_error;
};

}  // namespace

const JsonValue* JsonValue::Find(std::string_view name) const {
    for (const auto& [key, value] : members)
        if (key == name) return &value;
    return nullptr;
}

JsonValue::JsonValue() = default;
JsonValue::JsonValue(const JsonValue&) = default;
JsonValue::JsonValue(JsonValue&&) noexcept = default;
JsonValue& JsonValue::operator=(const JsonValue&) = default;
JsonValue& JsonValue::operator=(JsonValue&&) noexcept = default;
JsonValue::~JsonValue() = default;

std::optional<double> JsonValue::AsDouble() const {
    if (kind != Kind::Number) return std::nullopt;
    double value = 0;
    const auto [ptr, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (ptr != text.data() + text.size()) return std::nullopt;
    if (ec == std::errc::result_out_of_range) return std::nullopt;
    return value;
}

std::optional<std::uint64_t> JsonValue::AsUnsigned() const {
    if (kind != Kind::Number) return std::nullopt;
    std::uint64_t value = 0;
    const auto [ptr, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (ec != std::errc() || ptr != text.data() + text.size()) return std::nullopt;
    return value;
}

std::optional<JsonValue> ParseJson(std::string_view text, std::string& error) { return Parser(text).Document(error); }

std::string JsonQuote(std::string_view utf8) {
    static constexpr char kHex[] = "0123456789abcdef";
    std::string out = "\"";
    for (const char ch : utf8) {
        const auto c = static_cast<unsigned char>(ch);
        if (c == '"') out += "\\\"";
        else if (c == '\\') out += "\\\\";
        else if (c == '\n') out += "\\n";
        else if (c == '\r') out += "\\r";
        else if (c == '\t') out += "\\t";
        else if (c < 0x20) out += std::string("\\u00") + kHex[c >> 4] + kHex[c & 0xF];
        else out.push_back(ch);
    }
    out.push_back('"');
    return out;
}

bool IsValidUtf8(std::string_view bytes) {
    std::size_t i = 0;
    while (i < bytes.size()) {
        const auto c = static_cast<unsigned char>(bytes[i]);
        int extra = 0;
        char32_t cp = 0, min = 0;
        if (c < 0x80) {
            ++i;
            continue;
        } else if ((c & 0xE0) == 0xC0) {
            extra = 1, cp = c & 0x1F, min = 0x80;
        } else if ((c & 0xF0) == 0xE0) {
            extra = 2, cp = c & 0x0F, min = 0x800;
        } else if ((c & 0xF8) == 0xF0) {
            extra = 3, cp = c & 0x07, min = 0x10000;
        } else {
            return false;
        }
        if (i + static_cast<std::size_t>(extra) >= bytes.size()) return false;
        for (int k = 1; k <= extra; ++k) {
            const auto n = static_cast<unsigned char>(bytes[i + static_cast<std::size_t>(k)]);
            if ((n & 0xC0) != 0x80) return false;
            cp = (cp << 6) | (n & 0x3F);
        }
        if (cp < min || cp > 0x10FFFF || (cp >= 0xD800 && cp <= 0xDFFF)) return false;
        i += static_cast<std::size_t>(extra) + 1;
    }
    return true;
}

}  // namespace azurelocal
