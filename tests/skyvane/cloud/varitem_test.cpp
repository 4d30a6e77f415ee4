#include "cloud/VarItem.h"

#include "vxhelper/variant.h"

#include "CStringPrint.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <limits>
#include <thread>

namespace {

constexpr DATE kMarch31_2024 = 45382.0;  // the spring daylight-saving change in Europe

DATE At(DATE day, int hour, int minute, int second, double ms = 0) {
    return day + (hour * 3600.0 + minute * 60.0 + second + ms / 1000.0) / 86400.0;
}

void SetZone(const char* zone) {
    setenv("TZ", zone, 1);
    tzset();
}

class VarItemTest : public ::testing::Test {
protected:
    void SetUp() override { SetZone("UTC"); }
    void TearDown() override { SetZone("UTC"); }

    bool Report(double number, DWORD low = 0, DWORD high = 0, DATE time = At(kMarch31_2024, 12, 0, 0)) {
        VX_CVariant value(number);
        return data.Update(&value, low, high, &time);
    }
    bool ReportText(LPCWSTR text) {
        VX_CVariant value(text);
        const DATE time = At(kMarch31_2024, 12, 0, 0);
        return data.Update(&value, 0, 0, &time);
    }

    CVarItemRtData data;
};

TEST_F(VarItemTest, ChangeDetection) {
    EXPECT_TRUE(Report(0.0));  // equal to the defaults, but the first value
    EXPECT_FALSE(Report(0.0));
    EXPECT_FALSE(Report(1e-17));  // the band is at least +-2.2e-16 wide
    EXPECT_TRUE(Report(3e-16));
    ASSERT_TRUE(Report(1000.0));
    EXPECT_FALSE(Report(1000.0 + 1e-14));  // inside +-1000 * 2^-52
    EXPECT_EQ(data.m_dValue, 1000.0);      // and not stored
    EXPECT_TRUE(Report(1000.0 + 1e-12));

    const double nan = std::numeric_limits<double>::quiet_NaN(), inf = HUGE_VAL;
    EXPECT_TRUE(Report(nan));
    EXPECT_TRUE(Report(nan));  // NaN is always outside
    EXPECT_TRUE(Report(inf));
    EXPECT_FALSE(Report(inf));  // an infinity equals itself

    ASSERT_TRUE(Report(5.0, 1, 2));
    EXPECT_TRUE(Report(5.0, 1, 3));  // the high status word alone
    EXPECT_TRUE(Report(5.0, 0, 3));  // the low one alone
    const LONGLONG time = data.m_time;
    EXPECT_FALSE(Report(5.0, 0, 3, At(kMarch31_2024, 13, 0, 0)));  // the time alone is no change
    EXPECT_EQ(data.m_time, time);

    ASSERT_TRUE(ReportText(u"Open"));
    EXPECT_TRUE(data.m_bIsString);
    EXPECT_FALSE(ReportText(u"Open"));
    EXPECT_TRUE(ReportText(u"OPEN"));  // letter case counts
}

TEST_F(VarItemTest, ValueForms) {
    BSTR text = SysAllocString(u"Level");
    VARIANT byRef;
    VariantInit(&byRef);
    byRef.vt = VT_BSTR | VT_BYREF;
    byRef.pbstrVal = &text;
    const DATE time = At(kMarch31_2024, 8, 0, 0);
    ASSERT_TRUE(data.Update(&byRef, 0, 0, &time));
    EXPECT_TRUE(data.m_bIsString);
    EXPECT_EQ(data.m_strValue, u"Level");
    SysFreeString(text);

    VX_CVariant five(5);
    ASSERT_TRUE(data.Update(&five, 0, 0, &time));
    EXPECT_FALSE(data.m_bIsString);
    EXPECT_EQ(data.m_dValue, 5.0);
    EXPECT_TRUE(data.m_strValue.IsEmpty());

    VX_CVariant empty;  // no number: no change, nothing stored
    EXPECT_FALSE(data.Update(&empty, 9, 9, &time));
    EXPECT_EQ(data.m_dwStatusLow, 0u);
}

TEST_F(VarItemTest, TimeStamps) {
    ASSERT_TRUE(Report(1.0, 0, 0, At(kMarch31_2024, 1, 2, 3, 456.4)));
    EXPECT_EQ(data.m_time, 1711846923);  // 2024-03-31 01:02:03 UTC
    EXPECT_EQ(data.m_wMilliseconds, 456);
    // 1899-06-01 10:00:00.250 (before 1899-12-30 the time of day counts away from zero).
    ASSERT_TRUE(Report(2.0, 0, 0, -212.0 - 36000.25 / 86400.0));
    EXPECT_EQ(data.m_time, 0);
    EXPECT_EQ(data.m_wMilliseconds, 250);

    // A rejected time stores nothing: the item stays exactly as it was, and no change is reported.
    ASSERT_TRUE(Report(3.0, 0, 0, At(kMarch31_2024, 0, 0, 1, 5)));
    const SVarItemValue before = data;
    double value = 4.0;
    const DATE rejectedTimes[] = {At(18415.0, 12, 0, 0), At(402134.0, 0, 0, 0), std::nan("")};  // 1950, 3001
    for (const DATE rejected : rejectedTimes) {
        EXPECT_FALSE(Report(value, 7, 1, rejected));
        VX_CVariant text(u"text");
        EXPECT_FALSE(data.Update(&text, 0, 0, &rejected));
        EXPECT_FALSE(data.Update(&text, 0, 0, nullptr));
        EXPECT_TRUE(static_cast<const SVarItemValue&>(data) == before);
        value += 1.0;
    }
    CVarItemRtData first;  // a first value with a rejected time leaves the item without a value
    VX_CVariant number(1.5);
    EXPECT_FALSE(first.Update(&number, 0, 0, &rejectedTimes[0]));
    EXPECT_FALSE(first.m_bValid);
    EXPECT_EQ(first.m_dValue, 0.0);
    EXPECT_TRUE(Report(value, 0, 0, At(kMarch31_2024, 0, 0, 2)));  // the values that follow keep flowing
    EXPECT_EQ(data.m_time, 1711843202);
}

TEST_F(VarItemTest, DaylightSavingInTheLocalZone) {
    ASSERT_TRUE(std::filesystem::exists("/usr/share/zoneinfo/Europe/Berlin")) << "time zone data (tzdata) missing";
    SetZone("Europe/Berlin");
    ASSERT_TRUE(Report(1.0, 0, 0, At(kMarch31_2024, 1, 59, 59)));  // last second of CET, UTC+1
    EXPECT_EQ(data.m_time, 1711846799);
    ASSERT_TRUE(Report(2.0, 0, 0, At(kMarch31_2024, 3, 0, 0)));  // first second of CEST, UTC+2
    EXPECT_EQ(data.m_time, 1711846800);
    ASSERT_TRUE(Report(3.0, 0, 0, At(45474.0, 12, 0, 0)));  // 2024-07-01 12:00 CEST
    EXPECT_EQ(data.m_time, 1719828000);
    ASSERT_TRUE(Report(4.0, 0, 0, At(45592.0, 3, 0, 0)));  // 2024-10-27 03:00, CET again
    EXPECT_EQ(data.m_time, 1729994400);
}

// Every second of the hours around both changes, against the C library's own
// conversion: the per-minute conversion must not move any time stamp. In the
// autumn hour that comes twice either reading is right.
TEST_F(VarItemTest, EverySecondAroundTheChangesAsTheCLibraryConvertsIt) {
    SetZone("Europe/Berlin");
    const DATE october27_2024 = 45592.0;
    double value = 0;
    for (const DATE day : {kMarch31_2024, october27_2024}) {
        for (int second = 3600; second < 4 * 3600; ++second) {  // 01:00:00 to 03:59:59 local
            ASSERT_TRUE(Report(++value, 0, 0, At(day, 0, 0, second)));
            std::tm fields{};
            fields.tm_year = 124;
            fields.tm_mon = day == kMarch31_2024 ? 2 : 9;
            fields.tm_mday = day == kMarch31_2024 ? 31 : 27;
            fields.tm_hour = second / 3600;
            fields.tm_min = second / 60 % 60;
            fields.tm_sec = second % 60;
            fields.tm_isdst = -1;
            const LONGLONG expected = std::mktime(&fields);
            const bool twice = day == october27_2024 && second / 3600 == 2;
            if (twice)
                EXPECT_TRUE(data.m_time == expected || data.m_time == expected + 3600 || data.m_time == expected - 3600)
                    << second;
            else ASSERT_EQ(data.m_time, expected) << "second " << second << " of the day";
        }
    }
    SetZone("UTC");  // a changed zone applies at once, also within the same minute
    ASSERT_TRUE(Report(++value, 0, 0, At(kMarch31_2024, 3, 59, 30)));
    EXPECT_EQ(data.m_time, 1711857570);  // 2024-03-31 03:59:30 UTC
}

TEST_F(VarItemTest, ReaderUnderTheLockSeesOneReport) {
    // Report v carries time base + v; a reader holding the lock must never see
    // the value of one report with the time of another.
    const LONGLONG base = 1711886400;  // 2024-03-31 12:00:00 UTC
    std::atomic<bool> done{false};
    std::atomic<int> torn{0};
    std::thread reader([&] {
        while (!done) {
            CSingleLock lock(&data.m_cs, true);
            if (data.m_bValid && data.m_time != base + static_cast<LONGLONG>(data.m_dValue)) ++torn;
        }
    });
    for (int v = 1; v <= 2000; ++v) Report(v, 0, 0, At(kMarch31_2024, 12, 0, v));
    done = true;
    reader.join();
    EXPECT_EQ(torn, 0);
}

TEST(VarItem, CopiesAreSeparateAndKeysSplit) {
    CVarItem item;
    item.m_strName = u"Line1#Speed";
    const DATE time = 45382.5;
    VX_CVariant value(12.5);
    ASSERT_TRUE(item.m_pRtData->Update(&value, 1, 2, &time));
    CVarItem copy(item);
    EXPECT_EQ(copy.m_strName, item.m_strName);
    ASSERT_NE(copy.m_pRtData, item.m_pRtData);
    EXPECT_EQ(copy.m_pRtData->m_dValue, 12.5);
    EXPECT_EQ(copy.m_pRtData->m_time, item.m_pRtData->m_time);
    VX_CVariant other(13.5);
    ASSERT_TRUE(copy.m_pRtData->Update(&other, 1, 2, &time));
    EXPECT_EQ(item.m_pRtData->m_dValue, 12.5);

    CString project, variable;
    CVarItem::SplitKey(u"Line2#Tank#Level", project, variable);
    EXPECT_EQ(project + u"|" + variable, u"Line2|Tank#Level");
    CVarItem::SplitKey(u"Counter", project, variable);
    EXPECT_EQ(project + u"|" + variable, u"|Counter");
}

}  // namespace
