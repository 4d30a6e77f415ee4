#pragma once
// Reading message bodies (JSON, XML, Bond Compact Binary) back into rows, and
// checking shared access signatures: the receiving side of the Azure send
// protocol, shared by azure-local and the tests.

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "Json.h"

namespace azurelocal {

struct DecodedRow {
    std::string project;  // UTF-8
    std::string variable;
    bool isText = false;
    double value = 0;  // NaN when a JSON body held null
    std::string text;
    std::int64_t time = 0;  // seconds since 1970 UTC
    unsigned milliseconds = 0;
    std::uint64_t status = 0;
};

struct DecodeResult {
    bool ok = false;
    std::string error;
    std::vector<DecodedRow> rows;
};

DecodeResult DecodeJsonRows(std::string_view body);
DecodeResult DecodeXmlRows(std::string_view body);
DecodeResult DecodeBondRows(std::string_view body);
// format: "JSON", "XML" or "BOND" (any case).
DecodeResult DecodeRows(std::string_view format, std::string_view body);

// "YYYY-MM-DDThh:mm:ss.mmmZ" to seconds and milliseconds.
bool ParseIsoTime(std::string_view text, std::int64_t& seconds, unsigned& milliseconds);

// One recorded row as a JSON line (without the line feed).
std::string RowToJsonLine(const DecodedRow& row, std::string_view entity, std::string_view format,
                          std::string_view messageId);
// Reads such a line back; entity, format and messageId are optional outputs.
std::optional<DecodedRow> RowFromJsonLine(std::string_view line, std::string* entity = nullptr,
                                          std::string* format = nullptr, std::string* messageId = nullptr);

// Checks "SharedAccessSignature sr=..&sig=..&se=..&skn=.." against the key, for
// a request to resource (host[:port]/entity, no scheme). now: seconds since 1970.
bool CheckSasToken(std::string_view authorization, std::string_view keyName, std::string_view key,
                   std::string_view resource, std::int64_t now, std::string& why);

std::string PercentDecode(std::string_view text);

}  // namespace azurelocal
