#include "vxhelper/variant.h"

#include "CStringPrint.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace {

SYSTEMTIME Split(DATE date) {
    SYSTEMTIME st{};
    EXPECT_TRUE(ConvertDATE2Systemtime(date, &st)) << date;
    return st;
}

void ExpectTime(const SYSTEMTIME& st, int y, int mo, int d, int h, int mi, int s, int ms) {
    EXPECT_EQ(st.wYear, y);
    EXPECT_EQ(st.wMonth, mo);
    EXPECT_EQ(st.wDay, d);
    EXPECT_EQ(st.wHour, h);
    EXPECT_EQ(st.wMinute, mi);
    EXPECT_EQ(st.wSecond, s);
    EXPECT_EQ(st.wMilliseconds, ms);
}

TEST(DateConversion, CalendarFieldsAndTheSignRule) {
    ExpectTime(Split(0.0), 1899, 12, 30, 0, 0, 0, 0);
    ExpectTime(Split(2.5), 1900, 1, 1, 12, 0, 0, 0);
    ExpectTime(Split(-1.25), 1899, 12, 29, 6, 0, 0, 0);  // days back, time forward
    ExpectTime(Split(-0.25), 1899, 12, 30, 6, 0, 0, 0);
    ExpectTime(Split(60.0), 1900, 2, 28, 0, 0, 0, 0);
    ExpectTime(Split(61.0), 1900, 3, 1, 0, 0, 0, 0);  // 1900 was no leap year
    const SYSTEMTIME sunday = Split(45382.0);          // 2024-03-31
    ExpectTime(sunday, 2024, 3, 31, 0, 0, 0, 0);
    EXPECT_EQ(sunday.wDayOfWeek, 0);
    ExpectTime(Split(-657434.0), 100, 1, 1, 0, 0, 0, 0);
    ExpectTime(Split(2958465.0 + 86399.0 / 86400.0), 9999, 12, 31, 23, 59, 59, 0);
}

TEST(DateConversion, RoundsToTheMillisecondWithoutReaching1000) {
    const DATE day = 45382.0;
    ExpectTime(Split(day + (3723.0 + 0.4567) / 86400.0), 2024, 3, 31, 1, 2, 3, 457);
    ExpectTime(Split(day + 59.9996 / 86400.0), 2024, 3, 31, 0, 1, 0, 0);       // carries into the minute
    ExpectTime(Split(day + 86399.9996 / 86400.0), 2024, 4, 1, 0, 0, 0, 0);     // and into the next day
    ExpectTime(Split(-1.0 - 86399.9996 / 86400.0), 1899, 12, 30, 0, 0, 0, 0);  // before 1899-12-30 too
    SYSTEMTIME st{};
    for (DATE bad : {std::nan(""), std::numeric_limits<double>::infinity(), -657435.0, 2958466.0, 1e300}) {
        EXPECT_FALSE(ConvertDATE2Systemtime(bad, &st)) << bad;
        EXPECT_EQ(st.wYear, 0);
    }
    EXPECT_FALSE(ConvertDATE2Systemtime(2958465.0 + 86399.9999 / 86400.0, &st));  // rounds into year 10000
    EXPECT_FALSE(ConvertDATE2Systemtime(0.0, nullptr));
}

TEST(VariantConversion, NumbersFromEveryAcceptedType) {
    const auto number = [](const VARIANT& v, double expected) {
        bool ok = false;
        EXPECT_EQ(_c_funktionVariantToDoubleEx(&v, ok), expected) << "vt " << v.vt;
        EXPECT_TRUE(ok) << "vt " << v.vt;
    };
    VARIANT v;
    VariantInit(&v);
    v.vt = VT_I1; v.cVal = -3; number(v, -3.0);
    v.vt = VT_UI1; v.bVal = 200; number(v, 200.0);
    v.vt = VT_I2; v.iVal = -300; number(v, -300.0);
    v.vt = VT_UI2; v.uiVal = 60000; number(v, 60000.0);
    v.vt = VT_I4; v.lVal = 5; number(v, 5.0);
    v.vt = VT_INT; v.intVal = -5; number(v, -5.0);
    v.vt = VT_UI4; v.ulVal = 4000000000u; number(v, 4e9);
    v.vt = VT_UINT; v.uintVal = 7; number(v, 7.0);
    v.vt = VT_I8; v.llVal = -(1ll << 40); number(v, -1099511627776.0);
    v.vt = VT_UI8; v.ullVal = 1ull << 63; number(v, 9223372036854775808.0);
    v.vt = VT_R4; v.fltVal = 0.5f; number(v, 0.5);
    v.vt = VT_R8; v.dblVal = -2.25; number(v, -2.25);
    v.vt = VT_DATE; v.date = 45382.5; number(v, 45382.5);
    v.vt = VT_BOOL; v.boolVal = VARIANT_TRUE; number(v, 1.0);
    v.vt = VT_BOOL; v.boolVal = VARIANT_FALSE; number(v, 0.0);
    v.vt = VT_CY; v.cyVal.int64 = 12345; number(v, 1.2345);

    std::int32_t target = 42;
    VARIANT ref;
    VariantInit(&ref);
    ref.vt = VT_I4 | VT_BYREF;
    ref.plVal = &target;
    number(ref, 42.0);
    VARIANT outer;
    VariantInit(&outer);
    outer.vt = VT_VARIANT | VT_BYREF;
    outer.pvarVal = &ref;
    number(outer, 42.0);

    VX_CVariant text(u"  -3.5e2 ");
    number(text, -350.0);
}

TEST(VariantConversion, WhatIsNoNumber) {
    const auto refused = [](const VARIANT* v) {
        bool ok = true;
        EXPECT_EQ(_c_funktionVariantToDoubleEx(v, ok), 0.0);
        EXPECT_FALSE(ok) << "vt " << (v ? v->vt : 0);
    };
    refused(nullptr);
    VARIANT v;
    VariantInit(&v);
    refused(&v);  // VT_EMPTY: no value is not zero
    v.vt = VT_NULL; refused(&v);
    v.vt = VT_ERROR; v.scode = 5; refused(&v);
    v.vt = VT_DISPATCH; v.pdispVal = nullptr; refused(&v);
    for (LPCWSTR text : {u"", u"12abc", u"nan", u"inf", u"0x10", u"1e999", u"- 1", u"1 2"}) {
        VX_CVariant t(text);
        refused(&t);
    }
    VX_CSafeArray array;
    ASSERT_TRUE(array.Create(VT_I4, 0, 1));
    v.vt = VT_ARRAY | VT_I4; v.parray = array.GetArray(); refused(&v);
    v.vt = VT_I4 | VT_BYREF; v.plVal = nullptr; refused(&v);
    VARIANT loop;  // a reference to itself must end, not recurse forever
    VariantInit(&loop);
    loop.vt = VT_VARIANT | VT_BYREF;
    loop.pvarVal = &loop;
    refused(&loop);
}

TEST(VariantConversion, Texts) {
    VARIANT v;
    VariantInit(&v);
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"");
    EXPECT_EQ(_c_funktionVariantToCString(nullptr), u"");
    v.vt = VT_I4; v.lVal = 5;
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"5");
    v.vt = VT_R8; v.dblVal = 0.1;
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"0.1");
    v.vt = VT_R4; v.fltVal = 0.1f;
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"0.1");
    v.vt = VT_CY; v.cyVal.int64 = -5;
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"-0.0005");
    v.cyVal.int64 = std::numeric_limits<std::int64_t>::min();
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"-922337203685477.5808");
    v.vt = VT_BOOL; v.boolVal = VARIANT_TRUE;
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"true");
    v.vt = VT_DATE; v.date = 45382.0 + (3723.0 + 0.25) / 86400.0;
    EXPECT_EQ(_c_funktionVariantToCString(&v), u"2024-03-31 01:02:03.250");

    VX_CVariant text(u"Line1");
    EXPECT_EQ(_c_funktionVariantToCString(&text), u"Line1");
    BSTR target = text.bstrVal;
    VARIANT ref;
    VariantInit(&ref);
    ref.vt = VT_BSTR | VT_BYREF;
    ref.pbstrVal = &target;
    EXPECT_EQ(_c_funktionVariantToCString(&ref), u"Line1");
}

TEST(VxVariant, OwnsItsContent) {
    VX_CVariant a(u"text");
    VX_CVariant b = a;
    EXPECT_EQ(b.vt, VT_BSTR);
    EXPECT_NE(a.bstrVal, b.bstrVal);  // deep copy
    VX_CVariant c = std::move(a);
    EXPECT_EQ(a.vt, VT_EMPTY);
    EXPECT_EQ(c.ToString(), u"text");
    c = VX_CVariant(7);
    EXPECT_EQ(c.vt, VT_I4);
    c = c;  // self-assignment keeps the value
    EXPECT_EQ(c.lVal, 7);
    VARIANT raw = b.Detach();
    EXPECT_EQ(b.vt, VT_EMPTY);
    c.Attach(raw);
    EXPECT_EQ(raw.vt, VT_EMPTY);
    EXPECT_EQ(c.ToString(), u"text");
    double number = 0;
    EXPECT_TRUE(VX_CVariant(45382.5, VT_DATE).ToDouble(number));
    EXPECT_EQ(number, 45382.5);
    EXPECT_EQ(VX_CVariant(true).boolVal, VARIANT_TRUE);
}

TEST(VxSafeArray, BoundsAreChecked) {
    VX_CSafeArray array;
    EXPECT_FALSE(array.IsValid());
    EXPECT_EQ(array.GetCount(), 0u);
    ASSERT_TRUE(array.Create(VT_BSTR, 3, 2));
    EXPECT_EQ(array.GetLBound(), 3);
    EXPECT_EQ(array.GetUBound(), 4);
    BSTR name = SysAllocString(u"Speed");
    EXPECT_EQ(array.PutElement(4, &name), S_OK);
    SysFreeString(name);  // the array keeps its own copy
    EXPECT_EQ(array.PutElement(5, &name), DISP_E_BADINDEX);
    EXPECT_FALSE(array.IsIndexValid(2));
    VX_CVariant element;
    ASSERT_TRUE(array.GetVariant(4, element));
    EXPECT_EQ(element.ToString(), u"Speed");
    EXPECT_FALSE(array.GetVariant(5, element));
    EXPECT_EQ(element.vt, VT_EMPTY);

    // A borrowed array of variants, reached through a VARIANT by reference.
    SAFEARRAY* values = SafeArrayCreateVector(VT_VARIANT, 0, 2);
    VX_CVariant five(5);
    LONG index = 1;
    ASSERT_EQ(SafeArrayPutElement(values, &index, &five), S_OK);
    VARIANT holder;
    VariantInit(&holder);
    holder.vt = VT_ARRAY | VT_VARIANT | VT_BYREF;
    holder.pparray = &values;
    VX_CSafeArray view;
    ASSERT_TRUE(view.Attach(&holder));
    double number = 0;
    EXPECT_TRUE(view.GetDouble(1, number));
    EXPECT_EQ(number, 5.0);
    EXPECT_FALSE(view.GetDouble(0, number));  // VT_EMPTY element
    EXPECT_FALSE(view.GetDouble(-1, number));
    view.Release();  // borrowed: not destroyed
    EXPECT_EQ(SafeArrayGetElement(values, &index, &holder), S_OK);
    EXPECT_EQ(holder.lVal, 5);
    SafeArrayDestroy(values);

    VARIANT notArray;
    VariantInit(&notArray);
    EXPECT_FALSE(view.Attach(&notArray));
    EXPECT_FALSE(view.Attach(static_cast<const VARIANT*>(nullptr)));
}

}  // namespace
