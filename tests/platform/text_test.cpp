#include "platform/text.h"

#include <gtest/gtest.h>

#include <climits>
#include <cmath>
#include <limits>

TEST(CStringFormat, EachConversion) {
    CString s;
    s.Format(u"%s|%d|%u|%x|%X|%i", u"abc", -42, 42u, 255, 0xBEEFu, 7);
    EXPECT_EQ(s, CString(u"abc|-42|42|ff|BEEF|7"));

    s.Format(u"%5d|%-5d|%05d|%+d|%.3d|%%", 42, 42, -42, 5, 7);
    EXPECT_EQ(s, CString(u"   42|42   |-0042|+5|007|%"));

    s.Format(u"[%6s][%-6s][%.2s]", u"ab", u"ab", u"abcdef");
    EXPECT_EQ(s, CString(u"[    ab][ab    ][ab]"));

    s.Format(u"%.3f %g %e", 3.14159, 0.5, 1234.5);
    EXPECT_EQ(s, CString(u"3.142 0.5 1.234500e+03"));

    s.Format(u"%*d|%-*d|", 4, 1, 3, 2);
    EXPECT_EQ(s, CString(u"   1|2  |"));
}

TEST(CStringFormat, NegativeNumbersAsUnsignedKeepTheirWidth) {
    CString s;
    s.Format(u"%u %x %x", -1, static_cast<short>(-1), -1LL);
    EXPECT_EQ(s, CString(u"4294967295 ffff ffffffffffffffff"));
    s.Format(u"%d %u %I64u %lld", LLONG_MIN, ULLONG_MAX, 1ULL << 40, -5LL);
    EXPECT_EQ(s, CString(u"-9223372036854775808 18446744073709551615 1099511627776 -5"));
}

TEST(CStringFormat, PointerIsFullWidthUpperHex) {
    CString s;
    s.Format(u"%p_%u", reinterpret_cast<void*>(0xABCDEF), 3u);
    EXPECT_EQ(s, CString(u"0000000000ABCDEF_3"));
    s.Format(u"%p", nullptr);
    EXPECT_EQ(s, CString(u"0000000000000000"));
}

TEST(CStringFormat, NonAsciiTextAndNarrowUtf8) {
    CString s;
    const CString name(u"Temperäture °C \U0001F600");
    s.Format(u"<%s> <%s> <%s>", name, "Grüße", std::u16string(u"Ω"));
    EXPECT_EQ(s, CString(u"<Temperäture °C \U0001F600> <Grüße> <Ω>"));
    EXPECT_EQ(s.ToUtf8(), "<Temperäture °C \U0001F600> <Grüße> <Ω>");
}

TEST(CStringFormat, MismatchedOrMissingArgumentsNeverMisread) {
    CString s;
    s.Format(u"%d/%s/%s", u"text", 12, 1.5);
    EXPECT_EQ(s, CString(u"text/12/1.5"));
    s.Format(u"%d and %s", 1);
    EXPECT_EQ(s, CString(u"1 and "));
    s.Format(u"trailing %");
    EXPECT_EQ(s, CString(u"trailing %"));
    s.Format(u"%s", static_cast<const char16_t*>(nullptr));
    EXPECT_EQ(s, CString(u"(null)"));
    s.Format(u"%f %f", std::numeric_limits<double>::quiet_NaN(), -INFINITY);
    EXPECT_EQ(s, CString(u"nan -inf"));
}

TEST(CStringUtf8, InvalidInputBecomesReplacementCharacters) {
    EXPECT_EQ(CString::FromUtf8("a\xFF"
                                "b")
                  .Str(),
              std::u16string(u"a\uFFFDb"));
    EXPECT_EQ(CString::FromUtf8("\xE2\x82").Str(), std::u16string(u"\uFFFD"));      // truncated sequence
    EXPECT_EQ(CString::FromUtf8("\xC0\xAF/").Str(), std::u16string(u"\uFFFD/"));    // overlong '/' is refused
    EXPECT_EQ(CString::FromUtf8("\xED\xA0\x80").Str(), std::u16string(u"\uFFFD"));  // encoded surrogate
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
