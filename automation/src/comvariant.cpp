#include "automation/comvariant.h"

CComVariant::CComVariant(const char16_t* text) : CComVariant() {
    vt = VT_BSTR;
    bstrVal = SysAllocString(text ? text : u"");
}

CComVariant::CComVariant(std::u16string_view text) : CComVariant() {
    vt = VT_BSTR;
    bstrVal = SysAllocStringLen(text.data(), static_cast<UINT>(text.size()));
}

CComVariant::CComVariant(IDispatch* object) : CComVariant() {
    vt = VT_DISPATCH;
    pdispVal = object;
    if (object) object->AddRef();
}
