#pragma once
// CComVariant: a VARIANT that owns its contents and frees them when it goes.
// It is a VARIANT, so &value passes wherever a VARIANT* is expected.

#include "automation/dispatch.h"

#include <string_view>

class CComVariant : public VARIANT {
public:
    CComVariant() { VariantInit(this); }
    CComVariant(const char16_t* text);  // VT_BSTR (null gives an empty text)
    CComVariant(std::u16string_view text);
    CComVariant(int value) : CComVariant() {
        vt = VT_I4;
        lVal = value;
    }
    CComVariant(double value) : CComVariant() {
        vt = VT_R8;
        dblVal = value;
    }
    CComVariant(bool value) : CComVariant() {
        vt = VT_BOOL;
        boolVal = value ? VARIANT_TRUE : VARIANT_FALSE;
    }
    CComVariant(IDispatch* object);  // VT_DISPATCH, with a reference of its own
    // Deep copy (VariantCopy); a copy that cannot be made leaves the variant empty.
    CComVariant(const VARIANT& other) : CComVariant() { VariantCopy(this, &other); }
    CComVariant(const CComVariant& other) : CComVariant(static_cast<const VARIANT&>(other)) {}
    CComVariant(CComVariant&& other) noexcept : VARIANT(other) { VariantInit(&other); }
    ~CComVariant() { VariantClear(this); }

    CComVariant& operator=(const CComVariant& other) {
        VariantCopy(this, &other);
        return *this;
    }
    CComVariant& operator=(CComVariant&& other) noexcept {
        if (this != &other) {
            VariantClear(this);
            static_cast<VARIANT&>(*this) = other;
            VariantInit(&other);
        }
        return *this;
    }

    void Clear() { VariantClear(this); }
    // Gives the contents to dest (which must hold nothing that needs freeing);
    // this variant becomes empty.
    void Detach(VARIANT* dest) {
        *dest = *this;
        VariantInit(this);
    }
};
