#pragma once
// A small strict JSON reader (RFC 8259) that keeps numbers as written, so that
// 64-bit integers survive, and a writer of quoted texts.

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace azurelocal {

struct JsonValue {
    enum class Kind { Null, Bool, Number, String, Array, Object } kind = Kind::Null;
    bool boolean = false;
    std::string text;  // a string's UTF-8, or a number as written
    std::vector<JsonValue> items;
    std::vector<std::pair<std::string, JsonValue>> members;

    // Out of line, where JsonValue is complete: clang with libstdc++ refuses
    // the implicit ones while a pair holding JsonValue is still incomplete.
    JsonValue();
    JsonValue(const JsonValue&);
    JsonValue(JsonValue&&) noexcept;
    JsonValue& operator=(const JsonValue&);
    JsonValue& operator=(JsonValue&&) noexcept;
    ~JsonValue();

    const JsonValue* Find(std::string_view name) const;
    std::optional<double> AsDouble() const;
    std::optional<std::uint64_t> AsUnsigned() const;
};

// Parses a whole document; on failure returns nothing and sets error.
std::optional<JsonValue> ParseJson(std::string_view text, std::string& error);

// A JSON string literal of UTF-8 text.
std::string JsonQuote(std::string_view utf8);

// Whether bytes are well-formed UTF-8 (no surrogates, no overlong forms).
bool IsValidUtf8(std::string_view bytes);

}  // namespace azurelocal
