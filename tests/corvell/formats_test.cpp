// Message body formats: Bond bytes against published vectors, the exact JSON
// and XML text of a row, and round trips of awkward texts through the
// receiving side's decoders.

#include <gtest/gtest.h>

#include <QJsonDocument>
#include <QXmlStreamReader>

#include <cmath>
#include <limits>

#include "private/Bond.h"
#include "RowDecoders.h"
#include "private/RowFormats.h"

using namespace corvell;

namespace {

std::string Hex(const std::string& bytes) {
    static constexpr char kHex[] = "0123456789ABCDEF";
    std::string out;
    for (const char c : bytes) {
        if (!out.empty()) out.push_back(' ');
        out.push_back(kHex[static_cast<unsigned char>(c) >> 4]);
        out.push_back(kHex[static_cast<unsigned char>(c) & 0xF]);
    }
    return out;
}

Row NumberRow(double value) {
    Row row;
    row.project = u"Line1";
    row.variable = u"Speed";
    row.value = value;
    row.time = 1700000000;
    row.milliseconds = 250;
    return row;
}

}  // namespace

TEST(BondEncoding, MatchesPublishedVectors) {
    // struct S { 0: uint64 ts; 1: double value; 2: string name; } = {1700000000, 21.5, "T1"}
    std::string s;
    bond::PutFieldHeader(s, 0, bond::kUint64);
    bond::PutVarint(s, 1700000000);
    bond::PutFieldHeader(s, 1, bond::kDouble);
    bond::PutDouble(s, 21.5);
    bond::PutFieldHeader(s, 2, bond::kString);
    bond::PutString(s, "T1");
    s.push_back(bond::kStop);
    EXPECT_EQ(Hex(s), "06 80 E2 CF AA 06 28 00 00 00 00 00 80 35 40 49 02 54 31 00");

    std::string w;
    bond::PutFieldHeader(w, 3, bond::kWString);
    bond::PutWString(w, u"T1");
    EXPECT_EQ(Hex(w), "72 02 54 00 31 00");

    std::string i;
    bond::PutFieldHeader(i, 10, bond::kInt32);
    bond::PutVarint(i, bond::ZigZag(-3));
    EXPECT_EQ(Hex(i), "D0 0A 05");

    std::string b;
    bond::PutFieldHeader(b, 300, bond::kBool);
    b.push_back(1);
    EXPECT_EQ(Hex(b), "E2 2C 01 01");
}

TEST(BondEncoding, RowsMessageBytes) {
    RowBuffer buffer(Format::Bond);
    Row row = NumberRow(21.5);
    row.status = 0x1'0000'0001ull;
    buffer.Add(row);
    Row text;
    text.variable = u"T";
    text.text = u"on";
    text.isText = true;
    buffer.Add(text);  // project empty, time 0, milliseconds 0, status 0: left out
    EXPECT_EQ(Hex(buffer.Compose(0, 2)),
              "43 42 01 00 0B 0A 02 "           // marshal header, field 0 list of 2 structs
              "09 05 4C 69 6E 65 31 "           // 0: project "Line1"
              "29 05 53 70 65 65 64 "           // 1: variable "Speed"
              "48 00 00 00 00 00 80 35 40 "     // 2: value 21.5
              "B1 80 C4 9F D5 0C "              // 5: time 1700000000 (zigzag)
              "C4 06 FA 01 "                    // 6: milliseconds 250
              "C6 07 81 80 80 80 10 "           // 7: status 2^32 + 1
              "00 "                             // end of row
              "29 01 54 69 02 6F 6E 82 01 00 "  // variable "T", text "on", isText true
              "00");                            // end of Rows
    EXPECT_EQ(buffer.MessageSize(0, 2), buffer.Compose(0, 2).size());
}

TEST(JsonEncoding, ExactRowText) {
    RowBuffer buffer(Format::Json);
    Row row = NumberRow(12.5);
    row.status = std::numeric_limits<std::uint64_t>::max();
    buffer.Add(row);
    Row text = NumberRow(0);
    text.isText = true;
    text.text = u"a\"b\\c\n\x01";
    text.time = 0;
    text.milliseconds = 7;
    buffer.Add(text);
    EXPECT_EQ(
        buffer.Compose(0, 2),
        R"([{"project":"Line1","variable":"Speed","value":12.5,"time":"2023-11-14T22:13:20.250Z","status":18446744073709551615},)"
        R"({"project":"Line1","variable":"Speed","value":"a\"b\\c\n\u0001","time":"1970-01-01T00:00:00.007Z","status":0}])");
    EXPECT_EQ(buffer.MessageSize(0, 2), buffer.Compose(0, 2).size());
    EXPECT_EQ(buffer.MessageSize(1, 2), buffer.Compose(1, 2).size());
}

TEST(JsonEncoding, NumbersJsonCannotHoldBecomeNull) {
    for (const double v : {std::numeric_limits<double>::quiet_NaN(), std::numeric_limits<double>::infinity(),
                           -std::numeric_limits<double>::infinity()}) {
        std::string out;
        AppendJsonRow(out, NumberRow(v));
        EXPECT_NE(out.find("\"value\":null"), std::string::npos) << out;
        EXPECT_FALSE(QJsonDocument::fromJson(QByteArray::fromStdString(out)).isNull()) << out;
    }
    std::string out;
    AppendJsonRow(out, NumberRow(0.1));
    EXPECT_NE(out.find("\"value\":0.1,"), std::string::npos) << "shortest form that reads back exactly";
}

TEST(XmlEncoding, ExactRowTextAndSpecialValues) {
    std::string out;
    Row row = NumberRow(-2.5);
    row.project = u"A&B";
    row.variable = u"<x>\"q\"\t";
    row.status = 3;
    AppendXmlRow(out, row);
    EXPECT_EQ(out,
              "<row project=\"A&amp;B\" variable=\"&lt;x&gt;&quot;q&quot;&#9;\" time=\"2023-11-14T22:13:20.250Z\" "
              "status=\"3\" type=\"number\">-2.5</row>");
    out.clear();
    AppendXmlRow(out, NumberRow(std::numeric_limits<double>::quiet_NaN()));
    EXPECT_NE(out.find(">NaN</row>"), std::string::npos);
    out.clear();
    AppendXmlRow(out, NumberRow(-std::numeric_limits<double>::infinity()));
    EXPECT_NE(out.find(">-INF</row>"), std::string::npos);
}

TEST(IsoTime, CalendarEdges) {
    EXPECT_EQ(FormatIsoTime(0, 0), "1970-01-01T00:00:00.000Z");
    EXPECT_EQ(FormatIsoTime(951782400, 999), "2000-02-29T00:00:00.999Z");  // leap day of a century leap year
    EXPECT_EQ(FormatIsoTime(4294967295, 0), "2106-02-07T06:28:15.000Z");   // largest 32-bit time
    EXPECT_EQ(FormatIsoTime(-1, 0), "1969-12-31T23:59:59.000Z");
    EXPECT_EQ(FormatIsoTime(253402300800, 5), "10000-01-01T00:00:00.005Z");  // past four digits of year
    EXPECT_EQ(FormatIsoTime(-62167219200, 0), "0000-01-01T00:00:00.000Z");
    EXPECT_EQ(FormatIsoTime(-62167219201, 0), "-001-12-31T23:59:59.000Z");
    EXPECT_EQ(FormatIsoTime(1036799999999, 0), "34824-11-18T23:59:59.000Z");  // beyond the standard calendar's years
}

// Every UTF-16 text, including lone surrogates and characters XML cannot carry,
// gives a body that strict readers accept, with the same text where it can be kept.
TEST(AllFormats, AwkwardTextsRoundTrip) {
    const std::u16string samples[] = {
        u"plain",
        u"\u00e9\u4e2d\U0001F600",          // 2, 3 and 4 UTF-8 bytes
        std::u16string(u"lone\xD800high"),  // lone high surrogate
        std::u16string(u"lone\xDC00low"),   // lone low surrogate
        std::u16string(u"end\xD83D"),       // high surrogate at the end
        u"quotes \" ' & < > ]]> \\ / \t\r\n",
        std::u16string(u"ctl\x01\x1f\x7f", 6),
        std::u16string(u"nul\0in", 6),
        u"a\uFFFE\uFFFF",
        u"",
    };
    auto expected = [](const std::u16string& s, Format f) {
        std::u16string e;
        for (std::size_t i = 0; i < s.size(); ++i) {
            char16_t c = s[i];
            const bool high = c >= 0xD800 && c <= 0xDBFF, low = c >= 0xDC00 && c <= 0xDFFF;
            if (high && i + 1 < s.size() && s[i + 1] >= 0xDC00 && s[i + 1] <= 0xDFFF) {
                e.push_back(c);
                e.push_back(s[++i]);
                continue;
            }
            if (high || low) c = 0xFFFD;
            if (f == Format::Xml && ((c < 0x20 && c != '\t' && c != '\n' && c != '\r') || c == 0xFFFE || c == 0xFFFF))
                c = 0xFFFD;
            e.push_back(c);
        }
        return QString::fromStdU16String(e).toStdString();
    };
    for (const Format format : {Format::Json, Format::Xml, Format::Bond}) {
        RowBuffer buffer(format);
        for (const auto& sample : samples) {
            Row row = NumberRow(1);
            row.project = sample;
            row.variable = sample;
            row.text = sample;
            row.isText = true;
            buffer.Add(row);
        }
        const std::string body = buffer.Compose(0, buffer.Count());
        ASSERT_EQ(body.size(), buffer.MessageSize(0, buffer.Count()));
        const char* name = buffer.FormatName();
        const azurelocal::DecodeResult decoded = azurelocal::DecodeRows(name, body);
        ASSERT_TRUE(decoded.ok) << name << ": " << decoded.error;
        ASSERT_EQ(decoded.rows.size(), std::size(samples));
        if (format == Format::Json) {
            QJsonParseError error{};
            QJsonDocument::fromJson(QByteArray::fromStdString(body), &error);
            EXPECT_EQ(error.error, QJsonParseError::NoError) << error.errorString().toStdString();
        }
        for (std::size_t i = 0; i < std::size(samples); ++i) {
            const std::string want = expected(samples[i], format);
            EXPECT_EQ(decoded.rows[i].project, want) << name << " sample " << i;
            EXPECT_EQ(decoded.rows[i].variable, want) << name << " sample " << i;
            EXPECT_EQ(decoded.rows[i].text, want) << name << " sample " << i;
            EXPECT_TRUE(decoded.rows[i].isText);
        }
    }
}

TEST(AllFormats, ValuesTimesAndStatusRoundTrip) {
    const double values[] = {0.0, -0.0, 1e-300, 1.7976931348623157e308, -123456.789, 0.1 + 0.2};
    for (const Format format : {Format::Json, Format::Xml, Format::Bond}) {
        RowBuffer buffer(format);
        for (std::size_t i = 0; i < std::size(values); ++i) {
            Row row = NumberRow(values[i]);
            row.time = 4294967295 - static_cast<std::int64_t>(i);
            row.milliseconds = static_cast<std::uint16_t>(999 - i);
            row.status = std::numeric_limits<std::uint64_t>::max() - i;
            buffer.Add(row);
        }
        const auto decoded = azurelocal::DecodeRows(buffer.FormatName(), buffer.Compose(0, buffer.Count()));
        ASSERT_TRUE(decoded.ok) << decoded.error;
        ASSERT_EQ(decoded.rows.size(), std::size(values));
        for (std::size_t i = 0; i < std::size(values); ++i) {
            const auto& r = decoded.rows[i];
            EXPECT_EQ(r.value, values[i]) << buffer.FormatName() << " " << i;
            EXPECT_EQ(std::signbit(r.value), std::signbit(values[i])) << buffer.FormatName() << " " << i;
            EXPECT_FALSE(r.isText);
            EXPECT_EQ(r.time, 4294967295 - static_cast<std::int64_t>(i));
            EXPECT_EQ(r.milliseconds, 999 - i);
            EXPECT_EQ(r.status, std::numeric_limits<std::uint64_t>::max() - i);
        }
    }
}

TEST(RowBuffer, AnyRunOfRowsComposesToItsPredictedSize) {
    for (const Format format : {Format::Json, Format::Xml, Format::Bond}) {
        RowBuffer buffer(format);
        for (int i = 0; i < 200; ++i) {
            Row row = NumberRow(i);
            const std::u16string name(static_cast<std::size_t>(i % 7), u'v');
            row.variable = name;
            buffer.Add(row);
        }
        for (std::size_t first = 0; first < 200; first += 37) {
            for (std::size_t last = first + 1; last <= 200; last += 41) {
                const std::string body = buffer.Compose(first, last);
                ASSERT_EQ(body.size(), buffer.MessageSize(first, last));
                const auto decoded = azurelocal::DecodeRows(buffer.FormatName(), body);
                ASSERT_TRUE(decoded.ok) << decoded.error;
                ASSERT_EQ(decoded.rows.size(), last - first);
                EXPECT_EQ(decoded.rows.front().value, static_cast<double>(first));
            }
        }
        buffer.RemoveLast();
        EXPECT_EQ(buffer.Count(), 199u);
        EXPECT_EQ(azurelocal::DecodeRows(buffer.FormatName(), buffer.Compose(0, 199)).rows.size(), 199u);
    }
}
