#pragma once
// Bond Compact Binary v1 writing primitives.

#include <cstdint>
#include <string>
#include <string_view>

namespace corvell::bond {

enum Type : std::uint8_t {
    kStop = 0,
    kStopBase = 1,
    kBool = 2,
    kUint8 = 3,
    kUint16 = 4,
    kUint32 = 5,
    kUint64 = 6,
    kFloat = 7,
    kDouble = 8,
    kString = 9,
    kStruct = 10,
    kList = 11,
    kSet = 12,
    kMap = 13,
    kInt8 = 14,
    kInt16 = 15,
    kInt32 = 16,
    kInt64 = 17,
    kWString = 18
};

// The marshaled form's first bytes: magic 0x4243 and version 1, little-endian.
inline constexpr char kMarshalHeader[] = {0x43, 0x42, 0x01, 0x00};

void PutVarint(std::string& out, std::uint64_t value);
std::size_t VarintSize(std::uint64_t value);
inline std::uint64_t ZigZag(std::int64_t value) {
    return (static_cast<std::uint64_t>(value) << 1) ^ static_cast<std::uint64_t>(value >> 63);
}
void PutFieldHeader(std::string& out, unsigned id, Type type);
void PutDouble(std::string& out, double value);
// A string field's value: varint byte count, then the UTF-8 bytes.
void PutString(std::string& out, std::string_view utf8);
// A wstring field's value: varint count of UTF-16 code units, then UTF-16LE.
void PutWString(std::string& out, std::u16string_view text);

}  // namespace corvell::bond
