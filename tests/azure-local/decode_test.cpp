// The receiving side's readers: strict about what they accept, because the
// tests of the sender rely on them to prove that bodies are well-formed.

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>

#include "RowDecoders.h"

using namespace azurelocal;

namespace {

const std::string kRow =
    R"({"project":"P","variable":"V","value":1.5,"time":"2024-02-29T23:59:59.123Z","status":18446744073709551615})";

std::string Bytes(std::initializer_list<int> bytes) {
    std::string s;
    for (const int b : bytes) s.push_back(static_cast<char>(b));
    return s;
}

}  // namespace

TEST(JsonReader, AcceptsRowsAndKeepsLargeIntegers) {
    const auto result = DecodeJsonRows(
        " [" + kRow + "," +
        R"({"project":"","variable":"T","value":"x\u00e9\ud83d\ude00","time":"1970-01-01T00:00:00.000Z","status":0},)"
        R"({"project":"","variable":"N","value":null,"time":"1970-01-01T00:00:00.000Z","status":0}])");
    ASSERT_TRUE(result.ok) << result.error;
    ASSERT_EQ(result.rows.size(), 3u);
    EXPECT_EQ(result.rows[0].status, 18446744073709551615ull);
    EXPECT_EQ(result.rows[0].time, 1709251199);
    EXPECT_EQ(result.rows[0].milliseconds, 123u);
    EXPECT_EQ(result.rows[1].text, "x\xc3\xa9\xf0\x9f\x98\x80");
    EXPECT_TRUE(std::isnan(result.rows[2].value));
}

TEST(JsonReader, RejectsMalformedBodies) {
    const std::string bad[] = {
        "",
        "{}",
        "[" + kRow + ",]",
        "[" + kRow + "] x",
        R"([{"project":"P","variable":"V","value":1,"time":"2024-01-01T00:00:00.000Z"}])",  // no status
        R"([{"project":"P","variable":"V","value":1,"time":"2024-01-01T00:00:00.000Z","status":0,"x":1}])",  // extra
        R"([{"project":"P","variable":"V","value":1,"time":"2024-01-01 00:00:00","status":0}])",
        R"([{"project":"P","variable":"V","value":1,"time":"2024-13-01T00:00:00.000Z","status":0}])",
        R"([{"project":"P","variable":"V","value":1,"time":"2024-01-01T00:00:00.000Z","status":-1}])",
        R"([{"project":"P","variable":"V","value":1,"time":"2024-01-01T00:00:00.000Z","status":18446744073709551616}])",
        R"([{"project":"P","variable":"V","value":01,"time":"2024-01-01T00:00:00.000Z","status":0}])",
        R"([{"project":"P","variable":"V","value":NaN,"time":"2024-01-01T00:00:00.000Z","status":0}])",
        R"([{"project":"\ud800","variable":"V","value":1,"time":"2024-01-01T00:00:00.000Z","status":0}])",
        "[{\"project\":\"\xff\",\"variable\":\"V\",\"value\":1,\"time\":\"2024-01-01T00:00:00.000Z\",\"status\":0}]",
        "[{\"project\":\"a\tb\",\"variable\":\"V\",\"value\":1,\"time\":\"2024-01-01T00:00:00.000Z\",\"status\":0}]",
        "[{\"project\":\"\xed\xa0\x80\",\"variable\":\"V\",\"value\":1,\"time\":\"2024-01-01T00:00:00.000Z\","
        "\"status\":0}]",
        std::string(100, '[') + std::string(100, ']'),
    };
    for (const auto& body : bad) {
        const auto result = DecodeJsonRows(body);
        EXPECT_FALSE(result.ok) << body;
        EXPECT_FALSE(result.error.empty());
    }
}

TEST(XmlReader, AcceptsRowsAndRejectsMalformedBodies) {
    const auto good = DecodeXmlRows(
        "<?xml version=\"1.0\" encoding=\"UTF-8\"?><rows>"
        "<row project=\"a&amp;b\" variable=\"v&#10;\" time=\"2024-01-01T00:00:00.001Z\" status=\"5\" type=\"text\">x "
        "&lt; y</row>"
        "<row project=\"\" variable=\"n\" time=\"2024-01-01T00:00:00.000Z\" status=\"0\" type=\"number\">-INF</row>"
        "</rows>");
    ASSERT_TRUE(good.ok) << good.error;
    ASSERT_EQ(good.rows.size(), 2u);
    EXPECT_EQ(good.rows[0].project, "a&b");
    EXPECT_EQ(good.rows[0].variable, "v\n");
    EXPECT_EQ(good.rows[0].text, "x < y");
    EXPECT_TRUE(std::isinf(good.rows[1].value));

    const std::string row =
        "<row project=\"p\" variable=\"v\" time=\"2024-01-01T00:00:00.000Z\" status=\"1\" type=\"number\">";
    const std::string bad[] = {
        "",
        "<rowz></rowz>",
        "<rows>" + row + "1</row>",                // not closed
        "<rows>" + row + "abc</row></rows>",       // not a number
        "<rows>" + row + "1</row></rows><rows/>",  // a second root
        "<rows><row project=\"p\" variable=\"v\" time=\"x\" status=\"1\" type=\"number\">1</row></rows>",
        "<rows><row project=\"p\" variable=\"v\" time=\"2024-01-01T00:00:00.000Z\" status=\"-1\" "
        "type=\"number\">1</row></rows>",
        "<rows><row project=\"p\" variable=\"v\" time=\"2024-01-01T00:00:00.000Z\" status=\"1\" "
        "type=\"bool\">1</row></rows>",
        "<rows><row variable=\"v\" time=\"2024-01-01T00:00:00.000Z\" status=\"1\" type=\"text\">1</row></rows>",
        "<rows><row project=\"p&\" variable=\"v\" time=\"2024-01-01T00:00:00.000Z\" status=\"1\" "
        "type=\"text\">1</row></rows>",
        "<rows><row project=\"p\" variable=\"v\" time=\"2024-01-01T00:00:00.000Z\" status=\"1\" "
        "type=\"text\">\x01</row></rows>",
        "<rows><other/></rows>",
    };
    for (const auto& body : bad) {
        const auto result = DecodeXmlRows(body);
        EXPECT_FALSE(result.ok) << body;
    }
}

TEST(BondReader, SkipsUnknownFieldsAndFillsDefaults) {
    // Rows { 0: list<Row> } with one Row holding only variable "v" plus an
    // unknown field 9 (a nested list of int32) that a reader must skip.
    const std::string body = Bytes({0x43, 0x42, 0x01, 0x00, 0x0B, 0x0A, 0x01,             //
                                    0x29, 0x01, 'v',                                      // 1: variable
                                    0xCB, 0x09, 0x10, 0x02, 0x02, 0x04,                   // 9: list<int32> {1, 2}
                                    0x00,                                                 // end of Row
                                    0xCD, 0x20, 0x09, 0x09, 0x01, 0x01, 'k',  0x01, 'v',  // 32: map<string,string>
                                    0x00});
    const auto result = DecodeBondRows(body);
    ASSERT_TRUE(result.ok) << result.error;
    ASSERT_EQ(result.rows.size(), 1u);
    EXPECT_EQ(result.rows[0].variable, "v");
    EXPECT_EQ(result.rows[0].project, "");
    EXPECT_EQ(result.rows[0].value, 0.0);
    EXPECT_FALSE(result.rows[0].isText);
    EXPECT_EQ(result.rows[0].time, 0);
}

TEST(BondReader, RejectsMalformedBodies) {
    const std::string bad[] = {
        "",
        Bytes({0x43, 0x42, 0x02, 0x00, 0x00}),                                           // version 2
        Bytes({0x43, 0x42, 0x01, 0x00}),                                                 // no STOP
        Bytes({0x43, 0x42, 0x01, 0x00, 0x0B, 0x0A, 0x05, 0x00, 0x00}),                   // 5 rows promised, 1 given
        Bytes({0x43, 0x42, 0x01, 0x00, 0x0B, 0x0A, 0x01, 0x29, 0x09, 'v', 0x00, 0x00}),  // string runs past the end
        Bytes({0x43, 0x42, 0x01, 0x00, 0x0B, 0x0A, 0x01, 0x28, 0x00, 0x00}),  // variable as double: wrong type
        Bytes({0x43, 0x42, 0x01, 0x00, 0x0B, 0x09, 0x01, 0x01, 'v', 0x00}),   // list of strings
        Bytes({0x43, 0x42, 0x01, 0x00, 0x00, 0x00}),                          // bytes after the end
        Bytes({0x43, 0x42, 0x01, 0x00, 0x0B, 0x0A, 0x01, 0x29, 0x01, 0xFF, 0x00, 0x00}),  // invalid UTF-8
        Bytes({0x43, 0x42, 0x01, 0x00, 0x0B, 0x0A, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0x01}),
        Bytes({0x43, 0x42, 0x01, 0x00, 0x1F, 0x00}),  // unknown type 31
    };
    for (const auto& body : bad) EXPECT_FALSE(DecodeBondRows(body).ok) << body.size();
}

TEST(RecordLines, RoundTrip) {
    DecodedRow row;
    row.project = "p\"q";
    row.variable = "v\n";
    row.value = -0.5;
    row.time = 1700000000;
    row.milliseconds = 42;
    row.status = 18446744073709551615ull;
    const std::string line = RowToJsonLine(row, "queue", "JSON", "id-1");
    std::string entity, format, id;
    const auto back = RowFromJsonLine(line, &entity, &format, &id);
    ASSERT_TRUE(back);
    EXPECT_EQ(back->project, row.project);
    EXPECT_EQ(back->variable, row.variable);
    EXPECT_EQ(back->value, row.value);
    EXPECT_EQ(back->status, row.status);
    EXPECT_EQ(back->milliseconds, 42u);
    EXPECT_EQ(entity, "queue");
    EXPECT_EQ(id, "id-1");
    EXPECT_FALSE(RowFromJsonLine("not json"));
}

TEST(RecordLines, KeepEverySixtyFourBitTime) {
    // A Bond body carries any 64-bit time; a line must not round it (nor
    // overflow converting it back).
    for (const std::int64_t time : {std::int64_t{9007199254740993}, std::numeric_limits<std::int64_t>::max(),
                                    std::numeric_limits<std::int64_t>::min(), std::int64_t{-1}}) {
        DecodedRow row;
        row.time = time;
        const auto back = RowFromJsonLine(RowToJsonLine(row, "q", "BOND", "m"));
        ASSERT_TRUE(back);
        EXPECT_EQ(back->time, time);
    }
}

TEST(IsoTimes, OnlyTheExactFormIsRead) {
    std::int64_t seconds = 0;
    unsigned ms = 0;
    ASSERT_TRUE(ParseIsoTime("2023-11-14T22:13:20.042Z", seconds, ms));
    EXPECT_EQ(seconds, 1700000000);
    EXPECT_EQ(ms, 42u);
    ASSERT_TRUE(ParseIsoTime("0000-01-01T00:00:00.000Z", seconds, ms));
    EXPECT_EQ(seconds, -62167219200);
    ASSERT_TRUE(ParseIsoTime("2024-02-29T00:00:00.000Z", seconds, ms));  // a leap day
    EXPECT_EQ(seconds, 1709164800);
    // Each has the right length, but a sign, a blank or a short field: no
    // sender writes them, and a five-digit year cannot be written back.
    for (const char* text : {"19993-2-11T23:59:59.999Z", "+024-01-01T00:00:00.000Z", "-001-01-01T00:00:00.000Z",
                             " 024-01-01T00:00:00.000Z", "2024-01-01T 1:00:00.000Z", "2024-01-01T00:00:00.+12Z",
                             "2024-01-01T00:00:00.000z", "2024-01-01T00:00:60.000Z", "2024-00-01T00:00:00.000Z",
                             "2023-02-29T00:00:00.000Z", "2024-04-31T00:00:00.000Z"}) {
        EXPECT_FALSE(ParseIsoTime(text, seconds, ms)) << text;
    }
    const auto xml = DecodeXmlRows(
        "<rows><row project=\"p\" variable=\"v\" time=\"19993-2-11T23:59:59.999Z\" status=\"1\" "
        "type=\"number\">1</row></rows>");
    EXPECT_FALSE(xml.ok);
    EXPECT_EQ(xml.error, "XML body: malformed time");
}
