// azure-local's readers. The first byte picks the entry point: a JSON, XML or
// Bond message body, a recorded row line, a JSON document, or a shared access
// signature. Whatever a body reader accepts must be well-formed (valid UTF-8,
// a reason exactly on refusal) and come back the same after the module's
// encoder writes it again and after a round through a recorded row line.

#include "RowDecoders.h"
#include "private/RowFormats.h"
#include "private/Sas.h"
#include "private/Utf.h"

#include "FuzzCheck.h"

#include <cmath>
#include <cstring>
#include <string>

namespace {

using azurelocal::DecodedRow;
using azurelocal::DecodeResult;

bool SameNumber(double a, double b) {
    return std::memcmp(&a, &b, sizeof a) == 0 || (std::isnan(a) && std::isnan(b)) || a == b;
}

// What a row says; a text row's number and a number row's text are not sent.
bool SameContent(const DecodedRow& a, const DecodedRow& b) {
    return a.project == b.project && a.variable == b.variable && a.isText == b.isText &&
           (a.isText ? a.text == b.text : SameNumber(a.value, b.value)) && a.time == b.time &&
           a.milliseconds == b.milliseconds && a.status == b.status;
}

// What the module's encoder gives for these rows in that format.
std::string Reencode(corvell::Format format, const std::vector<DecodedRow>& rows) {
    corvell::RowBuffer buffer(format);
    for (const DecodedRow& d : rows) {
        const std::u16string project = corvell::ToUtf16(d.project), variable = corvell::ToUtf16(d.variable),
                             text = corvell::ToUtf16(d.text);
        corvell::Row row;
        row.project = project;
        row.variable = variable;
        row.text = text;
        row.isText = d.isText;
        row.value = d.value;
        row.time = d.time;
        row.milliseconds = static_cast<std::uint16_t>(d.milliseconds);
        row.status = d.status;
        buffer.Add(row);
    }
    return buffer.Count() == 0 ? std::string() : buffer.Compose(0, buffer.Count());
}

void CheckLineRoundTrip(const DecodedRow& row) {
    std::string entity, format, id;
    const auto back =
        azurelocal::RowFromJsonLine(azurelocal::RowToJsonLine(row, "queue/a", "JSON", "m-1"), &entity, &format, &id);
    FuzzCheck(back.has_value(), "a recorded line reads back");
    FuzzCheck(back->project == row.project && back->variable == row.variable && back->isText == row.isText &&
                  back->text == row.text && SameNumber(back->value, row.value) &&
                  back->milliseconds == row.milliseconds && back->status == row.status,
              "a recorded line keeps the row");
    FuzzCheck(back->time == row.time, "a recorded line keeps the time");
    FuzzCheck(entity == "queue/a" && format == "JSON" && id == "m-1", "a recorded line keeps its labels");
}

void CheckBody(corvell::Format format, std::string_view body) {
    const char* name = format == corvell::Format::Json ? "JSON" : format == corvell::Format::Xml ? "XML" : "BOND";
    const DecodeResult result = azurelocal::DecodeRows(name, body);
    FuzzCheck(result.ok == result.error.empty(), "a reason exactly when refused");
    if (!result.ok) {
        FuzzCheck(result.rows.empty(), "a refused body gives no rows");
        return;
    }
    for (const DecodedRow& row : result.rows) {
        FuzzCheck(azurelocal::IsValidUtf8(row.project) && azurelocal::IsValidUtf8(row.variable) &&
                      azurelocal::IsValidUtf8(row.text),
                  "accepted texts are valid UTF-8");
        FuzzCheck(format == corvell::Format::Bond || row.milliseconds <= 999,
                  "milliseconds of a time stamp are below 1000");
        CheckLineRoundTrip(row);
    }
    if (result.rows.empty()) return;
    const DecodeResult again = azurelocal::DecodeRows(name, Reencode(format, result.rows));
    FuzzCheck(again.ok, "the encoder's form of accepted rows is accepted");
    FuzzCheck(again.rows.size() == result.rows.size(), "the encoder's form keeps every row");
    for (std::size_t i = 0; i < again.rows.size(); ++i)
        FuzzCheck(SameContent(again.rows[i], result.rows[i]), "the encoder's form keeps each row");
}

void CheckLine(std::string_view line) {
    if (const auto row = azurelocal::RowFromJsonLine(line)) CheckLineRoundTrip(*row);
}

void CheckJson(std::string_view text) {
    std::string error;
    const auto value = azurelocal::ParseJson(text, error);
    FuzzCheck(value.has_value() == error.empty(), "a JSON reason exactly when refused");
    if (!value || value->kind != azurelocal::JsonValue::Kind::String) return;
    const auto quoted = azurelocal::ParseJson(azurelocal::JsonQuote(value->text), error);
    FuzzCheck(quoted && quoted->text == value->text, "a quoted string reads back");
}

// A token the module makes for a resource is accepted for it (and what lies
// below it), not for another key; any other authorization is refused with a reason.
void CheckSignature(FuzzBytes& in) {
    const std::string key(in.Text(40)), entity(in.Text(40));
    const std::string authorization(in.Rest());
    std::string why;
    if (!azurelocal::CheckSasToken(authorization, "k", key, "ns/" + entity, 1000, why))
        FuzzCheck(!why.empty(), "a refused signature gives a reason");
    const std::string resource = "ns/" + corvell::PercentEncode(entity);
    const corvell::SasToken token = corvell::MakeSasToken("https://" + resource, "k", key, 2000);
    FuzzCheck(azurelocal::CheckSasToken(token.token, "k", key, resource, 1000, why), "a made token is accepted");
    FuzzCheck(azurelocal::CheckSasToken(token.token, "k", key, resource + "/x", 1000, why),
              "a made token covers what lies below");
    FuzzCheck(!azurelocal::CheckSasToken(token.token, "k", key + "x", resource, 1000, why), "another key is refused");
    FuzzCheck(!azurelocal::CheckSasToken(token.token, "k", key, resource, 2000, why), "an expired token is refused");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    FuzzBytes in(data, size);
    switch (in.Byte() % 6) {
    case 0: CheckBody(corvell::Format::Json, in.Rest()); break;
    case 1: CheckBody(corvell::Format::Xml, in.Rest()); break;
    case 2: CheckBody(corvell::Format::Bond, in.Rest()); break;
    case 3: CheckLine(in.Rest()); break;
    case 4: CheckJson(in.Rest()); break;
    default: CheckSignature(in); break;
    }
    return 0;
}
