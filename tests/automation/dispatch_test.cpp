#include "automation/dispatch_call.h"
#include "automation/dispatch_object.h"

#include <gtest/gtest.h>

#include <stdexcept>

namespace {

constexpr IID IID_ITestObject = {0x1234, 0, 0, {1, 2, 3, 4, 5, 6, 7, 8}};
constexpr IID IID_IOther = {0x5678, 0, 0, {1, 2, 3, 4, 5, 6, 7, 8}};

// A small object served from a dispatch table.
class CTestObject final : public CDispatchObject {
public:
    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override {
        return InvokeFromTable(this, kMembers, member, flags, params, result, exception);
    }
    ULONG RefCount() {
        AddRef();
        return Release();
    }

protected:
    IUnknown* FindInterface(REFIID iid) override {
        return iid == IID_ITestObject ? static_cast<IDispatch*>(this) : CDispatchObject::FindInterface(iid);
    }

private:
    // Joins a text and a whole number, in argument order: ("a", 7) gives "a7".
    HRESULT Join(const DispatchArgs& args, VARIANT* result) {
        std::u16string text;
        LONG number = 0;
        if (HRESULT hr = args.GetText(0, &text); FAILED(hr)) return hr;
        if (HRESULT hr = args.GetInteger(1, &number); FAILED(hr)) return hr;
        for (char c : std::to_string(number)) text += static_cast<char16_t>(c);
        result->vt = VT_BSTR;
        result->bstrVal = SysAllocStringLen(text.data(), static_cast<UINT>(text.size()));
        return S_OK;
    }
    HRESULT Name(const DispatchArgs&, VARIANT* result) {
        result->vt = VT_I4;
        result->lVal = 42;
        return S_OK;
    }
    HRESULT Raise(const DispatchArgs&, VARIANT* result) {
        result->vt = VT_I4;  // must not reach the caller
        result->lVal = 1;
        throw CAutomationError(E_ACCESSDENIED_TEST, u"not allowed", u"Test");
    }
    HRESULT Crash(const DispatchArgs&, VARIANT*) { throw std::runtime_error("broken"); }

    static constexpr HRESULT E_ACCESSDENIED_TEST = static_cast<HRESULT>(0x80070005u);
    static constexpr DispatchMember<CTestObject> kMembers[] = {
        {1, DISPATCH_METHOD, 2, &CTestObject::Join},
        {2, DISPATCH_PROPERTYGET, 0, &CTestObject::Name},
        {3, DISPATCH_METHOD, 0, &CTestObject::Raise},
        {4, DISPATCH_METHOD, 0, &CTestObject::Crash},
    };
};

std::u16string Text(const VARIANT& v) { return v.vt == VT_BSTR && v.bstrVal ? v.bstrVal : u"<not a text>"; }

}  // namespace

TEST(DispatchTable, CallsTakeArgumentsInNaturalOrderByValueOrByReference) {
    auto object = MakeComObject<CTestObject>();
    CComVariant result;
    ASSERT_EQ(CallMethod(object.Get(), 1, &result, u"level", 7), S_OK);
    EXPECT_EQ(Text(result), u"level7");

    // The same call with both arguments passed by reference, as event sources may.
    BSTR text = SysAllocString(u"x");
    double number = 3.9;  // cut off to 3
    VARIANT args[2];
    args[1].vt = VT_BSTR | VT_BYREF;  // first argument, last in DISPPARAMS
    args[1].pbstrVal = &text;
    CComVariant inner(number);
    args[0].vt = VT_VARIANT | VT_BYREF;
    args[0].pvarVal = &inner;
    CComVariant byRef;
    ASSERT_EQ(InvokeMember(object.Get(), 1, DISPATCH_METHOD, args, 2, &byRef, nullptr), S_OK);
    EXPECT_EQ(Text(byRef), u"x3");
    SysFreeString(text);

    CComVariant property;
    ASSERT_EQ(GetProperty(object.Get(), 2, &property), S_OK);
    EXPECT_EQ(property.lVal, 42);
}

TEST(DispatchTable, BadCallsGiveStatusCodes) {
    auto object = MakeComObject<CTestObject>();
    CComVariant result;
    EXPECT_EQ(CallMethod(object.Get(), 99, &result), DISP_E_MEMBERNOTFOUND);
    EXPECT_EQ(CallMethod(object.Get(), 1, &result, u"only one"), DISP_E_BADPARAMCOUNT);
    EXPECT_EQ(CallMethod(object.Get(), 1, &result, 5, 7), DISP_E_TYPEMISMATCH);
    EXPECT_EQ(CallMethod(object.Get(), 1, &result, u"big", 1e12), DISP_E_OVERFLOW);
    EXPECT_EQ(CallMethod(object.Get(), 2, &result), DISP_E_MEMBERNOTFOUND);  // a property is no method
    EXPECT_EQ(result.vt, VT_EMPTY);

    // Named arguments, a null argument array, null parameters and a null result.
    CComVariant arg(1);
    DISPID named = 0;
    DISPPARAMS withNames{&arg, &named, 1, 1};
    EXPECT_EQ(object->Invoke(2, DISPATCH_PROPERTYGET, &withNames, &result, nullptr), DISP_E_NONAMEDARGS);
    DISPPARAMS noArray{nullptr, nullptr, 2, 0};
    EXPECT_EQ(object->Invoke(1, DISPATCH_METHOD, &noArray, &result, nullptr), E_INVALIDARG);
    EXPECT_EQ(object->Invoke(2, DISPATCH_PROPERTYGET, nullptr, nullptr, nullptr), S_OK);
    EXPECT_EQ(CallMethod(nullptr, 1, &result), E_POINTER);
}

TEST(DispatchTable, RaisedErrorsBecomeExceptionInfoAndTypedErrors) {
    auto object = MakeComObject<CTestObject>();
    CComVariant result;
    EXCEPINFO info{0, nullptr, nullptr, 0};
    EXPECT_EQ(InvokeMember(object.Get(), 3, DISPATCH_METHOD, nullptr, 0, &result, &info), DISP_E_EXCEPTION);
    EXPECT_EQ(result.vt, VT_EMPTY);
    EXPECT_EQ(static_cast<unsigned>(info.scode), 0x80070005u);
    EXPECT_EQ(std::u16string(info.bstrDescription), u"not allowed");
    EXPECT_EQ(std::u16string(info.bstrSource), u"Test");
    ClearExcepInfo(&info);

    try {
        CallMethodOrThrow(object.Get(), 3);
        FAIL() << "no error raised";
    } catch (const CAutomationError& error) {
        EXPECT_EQ(static_cast<unsigned>(error.Status()), 0x80070005u);
        EXPECT_EQ(error.Description(), u"not allowed");
        EXPECT_STREQ(error.what(), "not allowed (0x80070005)");
    }
    // Any other exception stays inside Invoke as well.
    EXPECT_EQ(CallMethod(object.Get(), 4, &result), DISP_E_EXCEPTION);
    try {
        CallMethodOrThrow(object.Get(), 4);
        FAIL() << "no error raised";
    } catch (const CAutomationError& error) {
        EXPECT_EQ(error.Description(), u"broken");
    }
    // A failing status without exception info keeps its own code.
    try {
        GetPropertyOrThrow(object.Get(), 99);
        FAIL() << "no error raised";
    } catch (const CAutomationError& error) {
        EXPECT_EQ(error.Status(), DISP_E_MEMBERNOTFOUND);
    }
    EXPECT_THROW(CallMethodOrThrow(nullptr, 1), CAutomationError);
    EXPECT_EQ(object->RefCount(), 1u);
}

TEST(ComPtr, CountsReferencesAndQueriesInterfaces) {
    auto object = MakeComObject<CTestObject>();
    EXPECT_EQ(object->RefCount(), 1u);
    {
        CComPtr<IDispatch> copy(object.Get());
        CComPtr<IDispatch> second = copy;
        EXPECT_EQ(object->RefCount(), 3u);
        CComPtr<IDispatch> moved = std::move(second);
        EXPECT_EQ(object->RefCount(), 3u);
        EXPECT_FALSE(second);
        copy = copy.Get();  // self-assignment keeps the reference
        EXPECT_EQ(object->RefCount(), 3u);

        CComPtr<IUnknown> unknown;
        EXPECT_EQ(copy.QueryInterface(IID_ITestObject, unknown), S_OK);
        EXPECT_EQ(object->RefCount(), 4u);
        CComPtr<IUnknown> none;
        EXPECT_EQ(copy.QueryInterface(IID_IOther, none), E_NOINTERFACE);
        EXPECT_FALSE(none);
    }
    EXPECT_EQ(object->RefCount(), 1u);
    IDispatch* raw = CComPtr<IDispatch>(object.Get()).Detach();
    EXPECT_EQ(object->RefCount(), 2u);
    CComPtr<IDispatch> adopted = CComPtr<IDispatch>::Adopt(raw);
    EXPECT_EQ(object->RefCount(), 2u);
    adopted.Release();
    EXPECT_EQ(object->RefCount(), 1u);
}
