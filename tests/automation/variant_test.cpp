#include "automation/dispatch.h"

#include <gtest/gtest.h>

namespace {

// Counts its references; never deleted by Release (lives on the stack).
class CountedUnknown : public IDispatch {
public:
    HRESULT QueryInterface(REFIID, void**) override { return E_NOINTERFACE; }
    ULONG AddRef() override { return ++refs; }
    ULONG Release() override { return --refs; }
    HRESULT Invoke(DISPID, WORD, DISPPARAMS*, VARIANT*, EXCEPINFO*) override { return E_NOTIMPL; }
    ULONG refs = 1;
};

}  // namespace

TEST(Bstr, LengthPrefixAndNullAsEmpty) {
    BSTR s = SysAllocString(u"Level");
    EXPECT_EQ(SysStringLen(s), 5u);
    EXPECT_EQ(std::u16string(s), u"Level");
    BSTR withNul = SysAllocStringLen(u"a\0b", 3);
    EXPECT_EQ(SysStringLen(withNul), 3u);
    EXPECT_EQ(SysStringLen(nullptr), 0u);
    EXPECT_EQ(SysAllocString(nullptr), nullptr);
    SysFreeString(s);
    SysFreeString(withNul);
    SysFreeString(nullptr);
}

TEST(Variant, CopyIsDeepAndClearFreesOwnedParts) {
    VARIANT text;
    VariantInit(&text);
    text.vt = VT_BSTR;
    text.bstrVal = SysAllocString(u"x");
    VARIANT copy;
    VariantInit(&copy);
    ASSERT_EQ(VariantCopy(&copy, &text), S_OK);
    EXPECT_NE(copy.bstrVal, text.bstrVal);
    EXPECT_EQ(std::u16string(copy.bstrVal), u"x");
    VariantClear(&text);
    EXPECT_EQ(text.vt, VT_EMPTY);
    EXPECT_EQ(std::u16string(copy.bstrVal), u"x");  // the copy owns its own text

    CountedUnknown object;
    VARIANT disp;
    VariantInit(&disp);
    disp.vt = VT_DISPATCH;
    disp.pdispVal = &object;
    ASSERT_EQ(VariantCopy(&copy, &disp), S_OK);  // replaces the text in copy
    EXPECT_EQ(object.refs, 2u);
    VariantClear(&copy);
    EXPECT_EQ(object.refs, 1u);

    // A by-reference variant copies the reference and frees nothing on clear.
    BSTR target = SysAllocString(u"by ref");
    VARIANT ref;
    VariantInit(&ref);
    ref.vt = VT_BSTR | VT_BYREF;
    ref.pbstrVal = &target;
    ASSERT_EQ(VariantCopy(&copy, &ref), S_OK);
    EXPECT_EQ(copy.pbstrVal, &target);
    VariantClear(&copy);
    VariantClear(&ref);
    EXPECT_EQ(std::u16string(target), u"by ref");
    SysFreeString(target);
}

TEST(SafeArray, BoundsAreCheckedAndElementsOwned) {
    SAFEARRAY* ids = SafeArrayCreateVector(VT_R8, 1, 3);  // lower bound other than 0
    ASSERT_NE(ids, nullptr);
    LONG lower = 0, upper = 0;
    SafeArrayGetLBound(ids, 1, &lower);
    SafeArrayGetUBound(ids, 1, &upper);
    EXPECT_EQ(lower, 1);
    EXPECT_EQ(upper, 3);
    double value = 4.5;
    LONG index = 0;
    EXPECT_EQ(SafeArrayPutElement(ids, &index, &value), DISP_E_BADINDEX);
    index = 4;
    EXPECT_EQ(SafeArrayGetElement(ids, &index, &value), DISP_E_BADINDEX);
    index = 3;
    ASSERT_EQ(SafeArrayPutElement(ids, &index, &value), S_OK);
    double out = 0;
    ASSERT_EQ(SafeArrayGetElement(ids, &index, &out), S_OK);
    EXPECT_EQ(out, 4.5);
    SafeArrayDestroy(ids);

    SAFEARRAY* empty = SafeArrayCreateVector(VT_I4, 0, 0);
    ASSERT_NE(empty, nullptr);
    SafeArrayGetUBound(empty, 1, &upper);
    EXPECT_EQ(upper, -1);
    SafeArrayDestroy(empty);

    // Variant elements: put copies, get copies, destroy frees (ASan checks the rest).
    SAFEARRAY* values = SafeArrayCreateVector(VT_VARIANT, 0, 2);
    VARIANT v;
    VariantInit(&v);
    v.vt = VT_BSTR;
    v.bstrVal = SysAllocString(u"text value");
    index = 0;
    ASSERT_EQ(SafeArrayPutElement(values, &index, &v), S_OK);
    ASSERT_EQ(SafeArrayPutElement(values, &index, &v), S_OK);  // replacing frees the old copy
    VariantClear(&v);
    VARIANT got;
    VariantInit(&got);
    ASSERT_EQ(SafeArrayGetElement(values, &index, &got), S_OK);
    EXPECT_EQ(std::u16string(got.bstrVal), u"text value");
    VariantClear(&got);
    SAFEARRAY* copy = nullptr;
    ASSERT_EQ(SafeArrayCopy(values, &copy), S_OK);
    SafeArrayDestroy(values);
    ASSERT_EQ(SafeArrayGetElement(copy, &index, &got), S_OK);
    EXPECT_EQ(std::u16string(got.bstrVal), u"text value");
    VariantClear(&got);
    SafeArrayDestroy(copy);

    EXPECT_EQ(SafeArrayCreateVector(VT_EMPTY, 0, 1), nullptr);
}
