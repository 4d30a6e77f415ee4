#pragma once
// UTF-16 <-> UTF-8 for texts crossing the library's interface.

#include <string>
#include <string_view>

namespace corvell {

// Appends the UTF-8 form of a UTF-16 text; lone surrogates become U+FFFD.
void AppendUtf8(std::string& out, std::u16string_view text);
std::string ToUtf8(std::u16string_view text);
// A null pointer reads as an empty text.
std::u16string_view View(const char16_t* text);

// UTF-16 form of a UTF-8 text; malformed sequences become U+FFFD.
std::u16string ToUtf16(std::string_view text);

}  // namespace corvell
