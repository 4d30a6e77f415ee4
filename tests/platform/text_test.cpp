#include "platform/text.h"

#include <gtest/gtest.h>

#include <climits>
#include <cmath>
#include <limits>

TEST(CStringFormat, Conversions) {
    const CString nonAscii =
        CString::Formatted(u"<%s> <%s> <%s>", CString(u"Temperäture °C \U0001F600"), "Grüße", std::u16string(u"Ω"));
    const struct Case {
        const char* name;
        CString got;
        const char16_t* want;
    } cases[] = {
        {"each conversion", CString::Formatted(u"%s|%d|%u|%x|%X|%i", u"abc", -42, 42u, 255, 0xBEEFu, 7),
         u"abc|-42|42|ff|BEEF|7"},
        {"width, flags and precision", CString::Formatted(u"%5d|%-5d|%05d|%+d|%.3d|%%", 42, 42, -42, 5, 7),
         u"   42|42   |-0042|+5|007|%"},
        {"text width and precision", CString::Formatted(u"[%6s][%-6s][%.2s]", u"ab", u"ab", u"abcdef"),
         u"[    ab][ab    ][ab]"},
        {"floating point", CString::Formatted(u"%.3f %g %e", 3.14159, 0.5, 1234.5), u"3.142 0.5 1.234500e+03"},
        {"width from the arguments", CString::Formatted(u"%*d|%-*d|", 4, 1, 3, 2), u"   1|2  |"},
        {"negative numbers as unsigned keep their width",
         CString::Formatted(u"%u %x %x", -1, static_cast<short>(-1), -1LL), u"4294967295 ffff ffffffffffffffff"},
        {"64-bit limits", CString::Formatted(u"%d %u %I64u %lld", LLONG_MIN, ULLONG_MAX, 1ULL << 40, -5LL),
         u"-9223372036854775808 18446744073709551615 1099511627776 -5"},
        {"pointer is full-width upper hex", CString::Formatted(u"%p_%u", reinterpret_cast<void*>(0xABCDEF), 3u),
         u"0000000000ABCDEF_3"},
        {"null pointer", CString::Formatted(u"%p", nullptr), u"0000000000000000"},
        {"non-ASCII text, narrow UTF-8 and std::u16string", nonAscii, u"<Temperäture °C \U0001F600> <Grüße> <Ω>"},
        // Mismatched or missing arguments are never misread.
        {"mismatched types", CString::Formatted(u"%d/%s/%s", u"text", 12, 1.5), u"text/12/1.5"},
        {"missing argument", CString::Formatted(u"%d and %s", 1), u"1 and "},
        {"trailing percent", CString::Formatted(u"trailing %"), u"trailing %"},
        {"null text", CString::Formatted(u"%s", static_cast<const char16_t*>(nullptr)), u"(null)"},
        {"NaN and infinity", CString::Formatted(u"%f %f", std::numeric_limits<double>::quiet_NaN(), -INFINITY),
         u"nan -inf"},
    };
    for (const Case& c : cases) EXPECT_EQ(c.got, CString(c.want)) << c.name;
    EXPECT_EQ(nonAscii.ToUtf8(), "<Temperäture °C \U0001F600> <Grüße> <Ω>");
}

TEST(CStringUtf8, InvalidInputBecomesReplacementCharacters) {
    const struct Case {
        const char* name;
        const char* utf8;
        const char16_t* want;
    } cases[] = {
        {"invalid byte",
         "a\xFF"
         "b",
         u"a\uFFFDb"},
        {"truncated sequence", "\xE2\x82", u"\uFFFD"},
        {"overlong '/' is refused", "\xC0\xAF/", u"\uFFFD/"},
        {"encoded surrogate", "\xED\xA0\x80", u"\uFFFD"},
    };
    for (const Case& c : cases) EXPECT_EQ(CString::FromUtf8(c.utf8).Str(), std::u16string(c.want)) << c.name;
    const char16_t lone[] = {u'x', 0xD800, u'y', 0xDC00, 0};
    EXPECT_EQ(CString(lone).ToUtf8(), "x\xEF\xBF\xBDy\xEF\xBF\xBD");
    EXPECT_EQ(CString(u"\U0001F600").ToUtf8(), "\xF0\x9F\x98\x80");
}

TEST(CStringOps, CompareFindAndSubstrings) {
    const CString key(u"Plant#Tank#Level");
    EXPECT_EQ(key.Find(u'#'), 5);
    EXPECT_EQ(key.Find(u'#', 6), 10);
    EXPECT_EQ(key.Find(u"Level"), 11);
    EXPECT_EQ(key.Find(u'?'), -1);
    EXPECT_EQ(key.Find(u'#', 100), -1);
    EXPECT_EQ(key.ReverseFind(u'#'), 10);
    EXPECT_EQ(key.Left(5), CString(u"Plant"));
    EXPECT_EQ(key.Mid(6), CString(u"Tank#Level"));
    EXPECT_EQ(key.Mid(6, 4), CString(u"Tank"));
    EXPECT_EQ(key.Right(5), CString(u"Level"));
    EXPECT_EQ(key.Left(-3), CString());
    EXPECT_EQ(key.Mid(40), CString());
    EXPECT_EQ(key.Left(99), key);

    EXPECT_EQ(CString(u"Azure").CompareNoCase(u"AZURE"), 0);
    EXPECT_EQ(CString(u"äÖü").CompareNoCase(u"ÄöÜ"), 0);
    EXPECT_NE(CString(u"Azure").Compare(u"AZURE"), 0);
    EXPECT_LT(CString(u"a").CompareNoCase(u"B"), 0);
    EXPECT_GT(CString(u"ab").CompareNoCase(u"A"), 0);
    EXPECT_TRUE(CString().IsEmpty());
    EXPECT_EQ(CString(u"  x y \t").Trim(), CString(u"x y"));
}

TEST(CStringOps, BufferAccess) {
    CString s;
    char16_t* buffer = s.GetBuffer(10);
    buffer[0] = u'h';
    buffer[1] = u'i';
    buffer[2] = 0;
    s.ReleaseBuffer();
    EXPECT_EQ(s, CString(u"hi"));
    EXPECT_EQ(s.GetLength(), 2);
}
