#include "private/Bond.h"

#include <cstring>

namespace corvell::bond {

void PutVarint(std::string& out, std::uint64_t value) {
    while (value >= 0x80) {
        out.push_back(static_cast<char>((value & 0x7F) | 0x80));
        value >>= 7;
    }
    out.push_back(static_cast<char>(value));
}

std::size_t VarintSize(std::uint64_t value) {
    std::size_t n = 1;
    while (value >= 0x80) value >>= 7, ++n;
    return n;
}

void PutFieldHeader(std::string& out, unsigned id, Type type) {
    if (id <= 5) {
        out.push_back(static_cast<char>((id << 5) | type));
    } else if (id <= 0xFF) {
        out.push_back(static_cast<char>(0xC0 | type));
        out.push_back(static_cast<char>(id));
    } else {
        out.push_back(static_cast<char>(0xE0 | type));
        out.push_back(static_cast<char>(id & 0xFF));
        out.push_back(static_cast<char>((id >> 8) & 0xFF));
    }
}

void PutDouble(std::string& out, double value) {
    std::uint64_t bits = 0;
    std::memcpy(&bits, &value, sizeof bits);
    for (int i = 0; i < 8; ++i) out.push_back(static_cast<char>(bits >> (8 * i)));
}

void PutString(std::string& out, std::string_view utf8) {
    PutVarint(out, utf8.size());
    out.append(utf8);
}

void PutWString(std::string& out, std::u16string_view text) {
    PutVarint(out, text.size());
    for (const char16_t c : text) {
        out.push_back(static_cast<char>(c & 0xFF));
        out.push_back(static_cast<char>(c >> 8));
    }
}

}  // namespace corvell::bond
