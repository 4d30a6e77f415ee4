#include "cloud/VarItem.h"

#include "vxhelper/variant.h"

#include "CStringPrint.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <limits>
#include <optional>
#include <string>
#include <thread>

namespace {

constexpr DATE kMarch31_2024 = 45382.0;  // a Sunday, the spring daylight-saving change in Europe

DATE At(DATE day, int hour, int minute, int second, double ms = 0) {
    return day + (hour * 3600.0 + minute * 60.0 + second + ms / 1000.0) / 86400.0;
}

// Runs the test body with TZ set, and restores the former zone afterwards.
class LocalZone {
public:
    explicit LocalZone(const char* zone) {
        if (const char* old = std::getenv("TZ")) m_old = old;
        setenv("TZ", zone, 1);
        tzset();
    }
    ~LocalZone() {
        if (m_old) setenv("TZ", m_old->c_str(), 1);
        else unsetenv("TZ");
        tzset();
    }

private:
    std::optional<std::string> m_old;
};

class VarItemTest : public ::testing::Test {
protected:
    // Reports a number (or text) with status and time; returns Update's result.
    bool Report(double number, DWORD low = 0, DWORD high = 0, DATE time = At(kMarch31_2024, 12, 0, 0)) {
        VX_CVariant value(number);
        return data.Update(&value, low, high, &time);
    }
    bool ReportText(LPCWSTR text, DATE time = At(kMarch31_2024, 12, 0, 0)) {
        VX_CVariant value(text);
        return data.Update(&value, 0, 0, &time);
    }

    LocalZone zone{"UTC"};
    CVarItemRtData data;
};

TEST_F(VarItemTest, FirstValueIsAlwaysAChange) {
    EXPECT_FALSE(data.m_bValid);
    EXPECT_TRUE(Report(0.0));  // equal to the defaults, but the first
    EXPECT_TRUE(data.m_bValid);
    EXPECT_FALSE(Report(0.0));
}

TEST_F(VarItemTest, ToleranceBandAroundTheStoredNumber) {
    ASSERT_TRUE(Report(1000.0));
    EXPECT_FALSE(Report(1000.0 + 1e-14));  // inside +-1000 * 2^-52
    EXPECT_EQ(data.m_dValue, 1000.0);      // not stored
    EXPECT_TRUE(Report(1000.0 + 1e-12));
    EXPECT_EQ(data.m_dValue, 1000.0 + 1e-12);

    ASSERT_TRUE(Report(0.0));
    EXPECT_FALSE(Report(1e-17));  // the band is at least +-2.2e-16 wide
    EXPECT_FALSE(Report(-2e-16));
    EXPECT_TRUE(Report(3e-16));

    ASSERT_TRUE(Report(-1000.0));
    EXPECT_FALSE(Report(-1000.0 - 1e-14));
    EXPECT_TRUE(Report(-1000.0 - 1e-12));
}

TEST_F(VarItemTest, NotANumberIsAlwaysOutsideAndInfinityEqualsItself) {
    const double nan = std::numeric_limits<double>::quiet_NaN();
    const double inf = std::numeric_limits<double>::infinity();
    ASSERT_TRUE(Report(1.0));
    EXPECT_TRUE(Report(nan));
    EXPECT_TRUE(Report(nan));  // NaN never equals the stored NaN
    EXPECT_TRUE(Report(1.0));
    EXPECT_TRUE(Report(inf));
    EXPECT_FALSE(Report(inf));
    EXPECT_TRUE(Report(-inf));
}

TEST_F(VarItemTest, StatusWordsTextAndTime) {
    ASSERT_TRUE(Report(5.0, 1, 2));
    EXPECT_FALSE(Report(5.0, 1, 2));
    EXPECT_TRUE(Report(5.0, 1, 3));  // high word only
    EXPECT_TRUE(Report(5.0, 0, 3));  // low word only
    EXPECT_EQ(data.m_dwStatusLow, 0u);
    EXPECT_EQ(data.m_dwStatusHigh, 3u);

    // A report that differs only in its time is dropped, and the time stays.
    const LONGLONG stored = data.m_time;
    EXPECT_FALSE(Report(5.0, 0, 3, At(kMarch31_2024, 13, 0, 0)));
    EXPECT_EQ(data.m_time, stored);

    ASSERT_TRUE(ReportText(u"Open"));
    EXPECT_TRUE(data.m_bIsString);
    EXPECT_EQ(data.m_dValue, 0.0);
    EXPECT_FALSE(ReportText(u"Open"));
    EXPECT_TRUE(ReportText(u"OPEN"));  // letter case counts
    EXPECT_EQ(data.m_strValue, u"OPEN");
}

TEST_F(VarItemTest, ValueForms) {
    // Text by reference is text.
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

    // VT_I4 5 is the number 5.0 with an empty text.
    VX_CVariant five(5);
    ASSERT_TRUE(data.Update(&five, 0, 0, &time));
    EXPECT_FALSE(data.m_bIsString);
    EXPECT_EQ(data.m_dValue, 5.0);
    EXPECT_TRUE(data.m_strValue.IsEmpty());

    // What is no number is no change, and nothing is stored.
    VX_CVariant empty;
    EXPECT_FALSE(data.Update(&empty, 9, 9, &time));
    EXPECT_FALSE(data.Update(nullptr, 9, 9, &time));
    EXPECT_EQ(data.m_dwStatusLow, 0u);
    EXPECT_EQ(data.m_dValue, 5.0);
}

TEST_F(VarItemTest, TimeStampsBecomeSecondsSince1970) {
    ASSERT_TRUE(Report(1.0, 0, 0, At(kMarch31_2024, 1, 2, 3, 456.4)));
    EXPECT_EQ(data.m_time, 1711846923);  // 2024-03-31 01:02:03 UTC
    EXPECT_EQ(data.m_wMilliseconds, 456);

    // A year before 1900 stores time 0, the milliseconds still count. Before
    // 1899-12-30 the time of day is added away from zero: 1899-06-01 10:00:00.250.
    ASSERT_TRUE(Report(2.0, 0, 0, -212.0 - (36000.25 / 86400.0)));
    EXPECT_EQ(data.m_time, 0);
    EXPECT_EQ(data.m_wMilliseconds, 250);
}

TEST_F(VarItemTest, RejectedTimeStoresTheValueButReportsNoChange) {
    ASSERT_TRUE(Report(1.0, 0, 0, At(kMarch31_2024, 0, 0, 1, 5)));
    const LONGLONG time = data.m_time;
    const DATE rejected[] = {At(18415.0, 12, 0, 0),   // 1950: before 1970
                             At(402134.0, 0, 0, 0),   // 3001-01-01: after 3000
                             std::nan("")};           // no date at all
    double value = 2.0;
    for (const DATE when : rejected) {
        EXPECT_FALSE(Report(value, 7, 0, when));
        EXPECT_EQ(data.m_dValue, value);  // value and status are in
        EXPECT_EQ(data.m_dwStatusLow, 7u);
        EXPECT_EQ(data.m_time, time);  // the time is not
        EXPECT_EQ(data.m_wMilliseconds, 5);
        value += 1.0;
    }
    VX_CVariant next(100.0);
    EXPECT_FALSE(data.Update(&next, 0, 0, nullptr));
    // The values that follow keep flowing.
    EXPECT_TRUE(Report(200.0, 0, 0, At(kMarch31_2024, 0, 0, 2)));
    EXPECT_EQ(data.m_time, time + 1);
}

TEST_F(VarItemTest, DaylightSavingChangeInTheLocalZone) {
    ASSERT_TRUE(std::filesystem::exists("/usr/share/zoneinfo/Europe/Berlin")) << "time zone data (tzdata) missing";
    LocalZone berlin("Europe/Berlin");
    ASSERT_TRUE(Report(1.0, 0, 0, At(kMarch31_2024, 1, 59, 59)));  // last second of CET (UTC+1)
    EXPECT_EQ(data.m_time, 1711846799);
    ASSERT_TRUE(Report(2.0, 0, 0, At(kMarch31_2024, 3, 0, 0)));  // first second of CEST (UTC+2)
    EXPECT_EQ(data.m_time, 1711846800);
    ASSERT_TRUE(Report(3.0, 0, 0, At(45474.0, 12, 0, 0)));  // 2024-07-01 12:00 CEST
    EXPECT_EQ(data.m_time, 1719828000);
    ASSERT_TRUE(Report(4.0, 0, 0, At(45306.0, 12, 0, 0)));  // 2024-01-15 12:00 CET
    EXPECT_EQ(data.m_time, 1705316400);
    ASSERT_TRUE(Report(5.0, 0, 0, At(45592.0, 3, 0, 0)));  // 2024-10-27 03:00, CET again
    EXPECT_EQ(data.m_time, 1729994400);
}

TEST_F(VarItemTest, ReaderUnderTheLockSeesOneReport) {
    // Each report pairs value v with time base + v seconds; a reader holding
    // the lock must never see the value of one report with the time of another.
    constexpr int kReports = 2000;
    const LONGLONG base = 1711886400;  // 2024-03-31 12:00:00 UTC
    std::atomic<bool> done{false};
    std::atomic<int> torn{0};
    std::thread reader([&] {
        while (!done) {
            CSingleLock lock(&data.m_cs, true);
            if (data.m_bValid && data.m_time != base + static_cast<LONGLONG>(data.m_dValue)) ++torn;
        }
    });
    for (int v = 1; v <= kReports; ++v) Report(v, 0, 0, At(kMarch31_2024, 12, 0, v));
    done = true;
    reader.join();
    EXPECT_EQ(torn, 0);
    EXPECT_EQ(data.m_time, base + kReports);
}

TEST(VarItem, CopiesAreSeparate) {
    CVarItem item;
    item.m_strName = u"Line1#Speed";
    const DATE time = At(kMarch31_2024, 0, 0, 0);
    VX_CVariant value(12.5);
    ASSERT_TRUE(item.m_pRtData->Update(&value, 1, 2, &time));

    CVarItem copy(item);
    EXPECT_EQ(copy.m_strName, item.m_strName);
    ASSERT_NE(copy.m_pRtData, item.m_pRtData);
    EXPECT_EQ(copy.m_pRtData->m_dValue, 12.5);
    EXPECT_EQ(copy.m_pRtData->m_dwStatusHigh, 2u);
    EXPECT_EQ(copy.m_pRtData->m_time, item.m_pRtData->m_time);
    EXPECT_TRUE(copy.m_pRtData->m_bValid);
    VX_CVariant other(13.5);
    ASSERT_TRUE(copy.m_pRtData->Update(&other, 1, 2, &time));
    EXPECT_EQ(item.m_pRtData->m_dValue, 12.5);

    CVarItemRtData& data = *copy.m_pRtData;
    data = data;  // self-assignment changes nothing
    EXPECT_EQ(data.m_dValue, 13.5);
    data = *item.m_pRtData;
    EXPECT_EQ(data.m_dValue, 12.5);
}

TEST(VarItem, KeysSplitAtTheFirstHash) {
    CString project, variable;
    CVarItem::SplitKey(u"Line1#Speed", project, variable);
    EXPECT_EQ(project, u"Line1");
    EXPECT_EQ(variable, u"Speed");
    CVarItem::SplitKey(u"Line2#Tank#Level", project, variable);
    EXPECT_EQ(project, u"Line2");
    EXPECT_EQ(variable, u"Tank#Level");
    CVarItem::SplitKey(u"Counter", project, variable);
    EXPECT_TRUE(project.IsEmpty());
    EXPECT_EQ(variable, u"Counter");
}

}  // namespace
