#pragma once
// UTF-16 <-> UTF-8 for texts crossing the library's interface.

#include <string>
#include <string_view>

namespace corvell {

inline void PutUtf8(std::string& out, char32_t cp) {
    if (cp < 0x80) {
        out.push_back(static_cast<char>(cp));
    } else if (cp < 0x800) {
        out.push_back(static_cast<char>(0xC0 | (cp >> 6)));
        out.push_back(static_cast<char>(0x80 | (cp & 0x3F)));
    } else if (cp < 0x10000) {
        out.push_back(static_cast<char>(0xE0 | (cp >> 12)));
        out.push_back(static_cast<char>(0x80 | ((cp >> 6) & 0x3F)));
        out.push_back(static_cast<char>(0x80 | (cp & 0x3F)));
    } else {
        out.push_back(static_cast<char>(0xF0 | (cp >> 18)));
        out.push_back(static_cast<char>(0x80 | ((cp >> 12) & 0x3F)));
        out.push_back(static_cast<char>(0x80 | ((cp >> 6) & 0x3F)));
        out.push_back(static_cast<char>(0x80 | (cp & 0x3F)));
    }
}

// Walks the code points of a UTF-16 text; lone surrogates read as U+FFFD.
template <typename Sink>
void ForEachCodePoint(std::u16string_view text, Sink&& sink) {
    for (std::size_t i = 0; i < text.size(); ++i) {
        const char16_t c = text[i];
        if (c >= 0xD800 && c <= 0xDBFF && i + 1 < text.size() && text[i + 1] >= 0xDC00 && text[i + 1] <= 0xDFFF) {
            sink(0x10000 + ((static_cast<char32_t>(c) - 0xD800) << 10) + (text[i + 1] - 0xDC00));
            ++i;
        } else if (c >= 0xD800 && c <= 0xDFFF) {
            sink(char32_t{0xFFFD});
        } else {
            sink(static_cast<char32_t>(c));
        }
    }
}

// Appends the UTF-8 form of a UTF-16 text; lone surrogates become U+FFFD.
void AppendUtf8(std::string& out, std::u16string_view text);
std::string ToUtf8(std::u16string_view text);
// A null pointer reads as an empty text.
std::u16string_view View(const char16_t* text);

// UTF-16 form of a UTF-8 text; malformed sequences become U+FFFD.
std::u16string ToUtf16(std::string_view text);

// Names and service texts quoted in log records keep at most this many characters.
constexpr std::size_t kMaxQuotedChars = 256;
// A UTF-8 text cut after limit characters (code points), marked
// "...(N more characters)" when cut, so a record stays readable whatever it quotes.
std::string Shorten(std::string_view text, std::size_t limit = kMaxQuotedChars);

}  // namespace corvell
