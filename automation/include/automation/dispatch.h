#pragma once
// IDispatch: late-bound calls by DISPID with VARIANT arguments.

#include "automation/variant.h"

using DISPID = LONG;

constexpr WORD DISPATCH_METHOD = 0x1;
constexpr WORD DISPATCH_PROPERTYGET = 0x2;
constexpr WORD DISPATCH_PROPERTYPUT = 0x4;

// Arguments of one call, last argument first (rgvarg[0] is the last one).
struct DISPPARAMS {
    VARIANTARG* rgvarg;
    DISPID* rgdispidNamedArgs;
    UINT cArgs;
    UINT cNamedArgs;
};

// What a call that raised an error reports (with DISP_E_EXCEPTION).
struct EXCEPINFO {
    WORD wCode;
    BSTR bstrSource;
    BSTR bstrDescription;
    SCODE scode;
};

constexpr IID IID_IDispatch = {0x00020400, 0x0000, 0x0000, {0xC0, 0, 0, 0, 0, 0, 0, 0x46}};

class IDispatch : public IUnknown {
public:
    virtual HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) = 0;

protected:
    ~IDispatch() = default;
};
