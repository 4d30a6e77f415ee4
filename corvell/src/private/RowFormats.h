#pragma once
// The three message body formats and the buffer of encoded rows of one batch.
//
// A message body is a list of rows:
//   JSON  [{"project":..,"variable":..,"value":..,"time":"..Z","status":..},...]
//   XML   <?xml ..?><rows><row project=.. variable=.. time=.. status=.. type="number|text">value</row>...</rows>
//   BOND  Compact Binary v1, marshaled, of struct Rows { 0: list<Row> rows; } (see schema/rows.bond)
// Rows are encoded once when added; a message of any run of them is composed
// at send time, so a batch can be cut at any row boundary.

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace corvell {

enum class Format { Xml = 0, Json = 1, Bond = 2 };

struct Row {
    std::u16string_view project;
    std::u16string_view variable;
    double value = 0;
    std::u16string_view text;
    bool isText = false;
    std::int64_t time = 0;           // whole seconds since 1970-01-01 UTC
    std::uint16_t milliseconds = 0;  // 0..999
    std::uint64_t status = 0;
};

// "YYYY-MM-DDThh:mm:ss.mmmZ"
std::string FormatIsoTime(std::int64_t seconds, unsigned milliseconds);
void AppendIsoTime(std::string& out, std::int64_t seconds, unsigned milliseconds);

void AppendJsonRow(std::string& out, const Row& row);
void AppendXmlRow(std::string& out, const Row& row);
void AppendBondRow(std::string& out, const Row& row);

class RowBuffer {
public:
    explicit RowBuffer(Format format) : m_format(format) {}

    Format format() const { return m_format; }
    std::size_t Count() const { return m_ends.size(); }
    std::size_t RowBytes(std::size_t index) const;
    std::size_t TotalRowBytes() const { return m_bytes.size(); }

    // Encodes and appends one row; returns its encoded size.
    std::size_t Add(const Row& row);
    void RemoveLast();
    void Clear();

    // The size of the message holding rows [first, last), without building it.
    std::size_t MessageSize(std::size_t first, std::size_t last) const;
    // The largest size a message of one row of rowBytes can have.
    std::size_t SingleRowMessageSize(std::size_t rowBytes) const;
    std::string Compose(std::size_t first, std::size_t last) const;

    const char* ContentType() const;
    const char* FormatName() const;

private:
    Format m_format;
    std::string m_bytes;              // encoded rows back to back
    std::vector<std::size_t> m_ends;  // end offset of each row in m_bytes
};

}  // namespace corvell
