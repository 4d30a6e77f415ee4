#include "vxhelper/variant.h"

#include "CStringPrint.h"

#include <gtest/gtest.h>

#include <cmath>

namespace {

constexpr DATE kMarch31_2024 = 45382.0;  // a Sunday

// "YYYY-MM-DD hh:mm:ss.mmm", or "invalid".
std::string Fields(DATE date) {
    SYSTEMTIME st{};
    if (!ConvertDATE2Systemtime(date, &st)) return st.wYear == 0 ? "invalid" : "invalid with fields";
    char text[64];
    std::snprintf(text, sizeof text, "%04u-%02u-%02u %02u:%02u:%02u.%03u", st.wYear, st.wMonth, st.wDay, st.wHour,
                  st.wMinute, st.wSecond, st.wMilliseconds);
    return text;
}

TEST(DateConversion, SignRuleRoundingAndRange) {
    EXPECT_EQ(Fields(0.0), "1899-12-30 00:00:00.000");
    EXPECT_EQ(Fields(-1.25), "1899-12-29 06:00:00.000");  // days back, time of day forward
    EXPECT_EQ(Fields(-0.25), "1899-12-30 06:00:00.000");
    EXPECT_EQ(Fields(61.0), "1900-03-01 00:00:00.000");  // 1900 was no leap year
    EXPECT_EQ(Fields(kMarch31_2024 + 3723.4567 / 86400), "2024-03-31 01:02:03.457");
    // Rounding carries instead of giving 1000 milliseconds, before 1899-12-30 too.
    EXPECT_EQ(Fields(kMarch31_2024 + 86399.9996 / 86400), "2024-04-01 00:00:00.000");
    EXPECT_EQ(Fields(-1.0 - 86399.9996 / 86400), "1899-12-30 00:00:00.000");
    EXPECT_EQ(Fields(-657434.0), "0100-01-01 00:00:00.000");
    const DATE invalid[] = {std::nan(""), HUGE_VAL, -657435.0, 2958466.0, 2958465.0 + 86399.9999 / 86400};
    for (const DATE bad : invalid) EXPECT_EQ(Fields(bad), "invalid") << bad;
    SYSTEMTIME st{};
    ASSERT_TRUE(ConvertDATE2Systemtime(kMarch31_2024, &st));
    EXPECT_EQ(st.wDayOfWeek, 0);
}

TEST(VariantConversion, Numbers) {
    const auto number = [](const VARIANT& v) {
        bool ok = false;
        const double n = _c_funktionVariantToDoubleEx(&v, ok);
        return ok ? n : -999.0;
    };
    VARIANT v;
    VariantInit(&v);
    v.vt = VT_I1;
    v.cVal = -3;
    EXPECT_EQ(number(v), -3.0);
    v.vt = VT_UI4;
    v.ulVal = 4000000000u;
    EXPECT_EQ(number(v), 4e9);
    v.vt = VT_UI8;
    v.ullVal = 1ull << 63;
    EXPECT_EQ(number(v), 9223372036854775808.0);
    v.vt = VT_R4;
    v.fltVal = 0.5f;
    EXPECT_EQ(number(v), 0.5);
    v.vt = VT_BOOL;
    v.boolVal = VARIANT_TRUE;
    EXPECT_EQ(number(v), 1.0);
    v.vt = VT_CY;
    v.cyVal.int64 = 12345;
    EXPECT_EQ(number(v), 1.2345);
    EXPECT_EQ(number(VX_CVariant(u"  -3.5e2 ")), -350.0);
    std::int32_t target = 42;
    VARIANT ref, outer;
    VariantInit(&ref);
    ref.vt = VT_I4 | VT_BYREF;
    ref.plVal = &target;
    EXPECT_EQ(number(ref), 42.0);
    VariantInit(&outer);
    outer.vt = VT_VARIANT | VT_BYREF;
    outer.pvarVal = &ref;
    EXPECT_EQ(number(outer), 42.0);

    // No number: no value, errors, interfaces, arrays, null references, other text.
    v.vt = VT_EMPTY;
    EXPECT_EQ(number(v), -999.0);
    v.vt = VT_ERROR;
    EXPECT_EQ(number(v), -999.0);
    v.vt = VT_DISPATCH;
    v.pdispVal = nullptr;
    EXPECT_EQ(number(v), -999.0);
    v.vt = VT_ARRAY | VT_I4;
    v.parray = nullptr;
    EXPECT_EQ(number(v), -999.0);
    ref.plVal = nullptr;
    EXPECT_EQ(number(ref), -999.0);
    for (LPCWSTR text : {u"", u"12abc", u"nan", u"inf", u"0x10", u"1e999", u"- 1"})
        EXPECT_EQ(number(VX_CVariant(text)), -999.0) << CString(text).ToUtf8();
    VARIANT loop;  // a reference to itself must end, not recurse forever
    loop.vt = VT_VARIANT | VT_BYREF;
    loop.pvarVal = &loop;
    EXPECT_EQ(number(loop), -999.0);
    bool ok = true;
    EXPECT_EQ(_c_funktionVariantToDoubleEx(nullptr, ok), 0.0);
    EXPECT_FALSE(ok);
}

TEST(VariantConversion, Texts) {
    VARIANT v;
    VariantInit(&v);
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"");
    v.vt = VT_I4;
    v.lVal = 5;
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"5");
    v.vt = VT_R8;
    v.dblVal = 0.1;
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"0.1");
    v.vt = VT_CY;
    v.cyVal.int64 = INT64_MIN;
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"-922337203685477.5808");
    v.vt = VT_DATE;
    v.date = kMarch31_2024 + 3723.25 / 86400;
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"2024-03-31 01:02:03.250");
    VX_CVariant text(u"Line1");
    BSTR target = text.bstrVal;
    VARIANT ref;
    ref.vt = VT_BSTR | VT_BYREF;
    ref.pbstrVal = &target;
    EXPECT_EQ(_c_funktionVariantToCString(&ref), u"Line1");
}

TEST(VxVariantAndSafeArray, OwnershipAndCheckedBounds) {
    VX_CVariant a(u"text");
    VX_CVariant b = a;
    EXPECT_NE(a.bstrVal, b.bstrVal);  // deep copy
    VX_CVariant c = std::move(a);
    EXPECT_EQ(a.vt, VT_EMPTY);
    EXPECT_EQ(c.ToString(), u"text");

    VX_CSafeArray array;
    ASSERT_TRUE(array.Create(VT_BSTR, 3, 2));
    EXPECT_EQ(array.GetUBound(), 4);
    BSTR name = SysAllocString(u"Speed");
    EXPECT_EQ(array.PutElement(4, &name), S_OK);
    EXPECT_EQ(array.PutElement(5, &name), DISP_E_BADINDEX);
    SysFreeString(name);  // the array holds its own copy
    VX_CVariant element;
    ASSERT_TRUE(array.GetVariant(4, element));
    EXPECT_EQ(element.ToString(), u"Speed");
    EXPECT_FALSE(array.GetVariant(2, element));

    // A borrowed array of variants, reached through a VARIANT by reference, stays its owner's.
    SAFEARRAY* values = SafeArrayCreateVector(VT_VARIANT, 0, 2);
    VX_CVariant five(5);
    LONG index = 1;
    ASSERT_EQ(SafeArrayPutElement(values, &index, &five), S_OK);
    VARIANT holder;
    holder.vt = VT_ARRAY | VT_VARIANT | VT_BYREF;
    holder.pparray = &values;
    VX_CSafeArray view;
    ASSERT_TRUE(view.Attach(&holder));
    double number = 0;
    EXPECT_TRUE(view.GetDouble(1, number));
    EXPECT_EQ(number, 5.0);
    EXPECT_FALSE(view.GetDouble(0, number));  // VT_EMPTY
    view.Release();
    SafeArrayDestroy(values);  // ASan reports a double free if the view destroyed it
}

}  // namespace
