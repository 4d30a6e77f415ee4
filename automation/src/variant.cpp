#include "automation/dispatch.h"
#include "automation/variant.h"
#include "value_size.h"

#include <cstdlib>
#include <new>
#include <string>

// ---- BSTR: [uint32 length in bytes][characters][0] -------------------------

BSTR SysAllocStringLen(const char16_t* text, UINT length) {
    if (length > 0x3FFFFFF0u) return nullptr;
    auto* block = static_cast<std::uint32_t*>(std::malloc(sizeof(std::uint32_t) + (length + 1u) * sizeof(char16_t)));
    if (!block) return nullptr;
    block[0] = length * static_cast<std::uint32_t>(sizeof(char16_t));
    auto* chars = reinterpret_cast<char16_t*>(block + 1);
    if (text) std::memcpy(chars, text, length * sizeof(char16_t));
    else std::memset(chars, 0, length * sizeof(char16_t));
    chars[length] = 0;
    return chars;
}

BSTR SysAllocString(const char16_t* text) {
    if (!text) return nullptr;
    return SysAllocStringLen(text, static_cast<UINT>(std::char_traits<char16_t>::length(text)));
}

void SysFreeString(BSTR text) {
    if (text) std::free(reinterpret_cast<std::uint32_t*>(text) - 1);
}

UINT SysStringLen(BSTR text) { return text ? reinterpret_cast<const std::uint32_t*>(text)[-1] / sizeof(char16_t) : 0; }

// ---- VARIANT ---------------------------------------------------------------

void VariantInit(VARIANT* v) {
    std::memset(v, 0, sizeof(VARIANT));
    v->vt = VT_EMPTY;
}

HRESULT VariantClear(VARIANT* v) {
    if (!v) return E_INVALIDARG;
    if (!(v->vt & VT_BYREF)) {
        if (v->vt & VT_ARRAY) SafeArrayDestroy(v->parray);
        else if (v->vt == VT_BSTR) SysFreeString(v->bstrVal);
        else if ((v->vt == VT_DISPATCH || v->vt == VT_UNKNOWN) && v->punkVal) v->punkVal->Release();
    }
    VariantInit(v);
    return S_OK;
}

HRESULT VariantCopy(VARIANT* dest, const VARIANT* src) {
    if (!dest || !src) return E_INVALIDARG;
    if (dest == src) return S_OK;
    VARIANT copy = *src;
    if (!(src->vt & VT_BYREF)) {
        if (src->vt & VT_ARRAY) {
            copy.parray = nullptr;
            if (src->parray && FAILED(SafeArrayCopy(src->parray, &copy.parray))) return E_OUTOFMEMORY;
        } else if (src->vt == VT_BSTR && src->bstrVal) {
            copy.bstrVal = SysAllocStringLen(src->bstrVal, SysStringLen(src->bstrVal));
            if (!copy.bstrVal) return E_OUTOFMEMORY;
        } else if ((src->vt == VT_DISPATCH || src->vt == VT_UNKNOWN) && src->punkVal) {
            src->punkVal->AddRef();
        }
    }
    VariantClear(dest);
    *dest = copy;
    return S_OK;
}

// ---- SAFEARRAY -------------------------------------------------------------

std::uint32_t FixedValueSize(VARTYPE vt) {
    switch (vt) {
    case VT_I1:
    case VT_UI1: return 1;
    case VT_I2:
    case VT_UI2:
    case VT_BOOL: return 2;
    case VT_I4:
    case VT_UI4:
    case VT_INT:
    case VT_UINT:
    case VT_R4:
    case VT_ERROR: return 4;
    case VT_I8:
    case VT_UI8:
    case VT_R8:
    case VT_CY:
    case VT_DATE: return 8;
    default: return 0;
    }
}

namespace {

std::uint32_t ElementSize(VARTYPE vt) {
    if (const std::uint32_t size = FixedValueSize(vt)) return size;
    switch (vt) {
    case VT_BSTR: return sizeof(BSTR);
    case VT_DISPATCH:
    case VT_UNKNOWN: return sizeof(IUnknown*);
    case VT_VARIANT: return sizeof(VARIANT);
    default: return 0;
    }
}

void* ElementAt(const SAFEARRAY* a, std::uint32_t offset) {
    return static_cast<char*>(a->pvData) + static_cast<size_t>(offset) * a->cbElements;
}

// Frees what one element owns.
void ClearElement(const SAFEARRAY* a, void* element) {
    switch (a->vt) {
    case VT_BSTR:
        SysFreeString(*static_cast<BSTR*>(element));
        *static_cast<BSTR*>(element) = nullptr;
        break;
    case VT_DISPATCH:
    case VT_UNKNOWN: {
        auto*& p = *static_cast<IUnknown**>(element);
        if (p) p->Release();
        p = nullptr;
        break;
    }
    case VT_VARIANT: VariantClear(static_cast<VARIANT*>(element)); break;
    default: break;
    }
}

// Copies one element, duplicating what it owns, into raw (uninitialised) space.
HRESULT CopyElement(VARTYPE vt, std::uint32_t size, void* dest, const void* src) {
    switch (vt) {
    case VT_BSTR: {
        BSTR s = *static_cast<const BSTR*>(src);
        BSTR copy = s ? SysAllocStringLen(s, SysStringLen(s)) : nullptr;
        if (s && !copy) return E_OUTOFMEMORY;
        *static_cast<BSTR*>(dest) = copy;
        return S_OK;
    }
    case VT_DISPATCH:
    case VT_UNKNOWN: {
        IUnknown* p = *static_cast<IUnknown* const*>(src);
        if (p) p->AddRef();
        *static_cast<IUnknown**>(dest) = p;
        return S_OK;
    }
    case VT_VARIANT:
        VariantInit(static_cast<VARIANT*>(dest));
        return VariantCopy(static_cast<VARIANT*>(dest), static_cast<const VARIANT*>(src));
    default: std::memcpy(dest, src, size); return S_OK;
    }
}

HRESULT Offset(const SAFEARRAY* a, const LONG* index, std::uint32_t* offset) {
    if (!a || !index) return E_INVALIDARG;
    const long long o = static_cast<long long>(*index) - a->lLbound;
    if (o < 0 || o >= static_cast<long long>(a->cElements)) return DISP_E_BADINDEX;
    *offset = static_cast<std::uint32_t>(o);
    return S_OK;
}

}  // namespace

SAFEARRAY* SafeArrayCreateVector(VARTYPE vt, LONG lowerBound, std::uint32_t count) {
    const std::uint32_t size = ElementSize(vt);
    if (size == 0 || count > 0x10000000u) return nullptr;
    auto* a = new (std::nothrow) SAFEARRAY{vt, size, lowerBound, count, nullptr};
    if (!a) return nullptr;
    a->pvData = std::calloc(count ? count : 1, size);  // zero: empty texts, null interfaces, VT_EMPTY variants
    if (!a->pvData) {
        delete a;
        return nullptr;
    }
    return a;
}

HRESULT SafeArrayDestroy(SAFEARRAY* a) {
    if (!a) return S_OK;
    for (std::uint32_t i = 0; i < a->cElements; ++i) ClearElement(a, ElementAt(a, i));
    std::free(a->pvData);
    delete a;
    return S_OK;
}

HRESULT SafeArrayGetLBound(const SAFEARRAY* a, UINT dimension, LONG* bound) {
    if (!a || !bound) return E_INVALIDARG;
    if (dimension != 1) return DISP_E_BADINDEX;
    *bound = a->lLbound;
    return S_OK;
}

HRESULT SafeArrayGetUBound(const SAFEARRAY* a, UINT dimension, LONG* bound) {
    if (!a || !bound) return E_INVALIDARG;
    if (dimension != 1) return DISP_E_BADINDEX;
    *bound = static_cast<LONG>(static_cast<long long>(a->lLbound) + a->cElements - 1);
    return S_OK;
}

HRESULT SafeArrayGetVartype(const SAFEARRAY* a, VARTYPE* vt) {
    if (!a || !vt) return E_INVALIDARG;
    *vt = a->vt;
    return S_OK;
}

HRESULT SafeArrayGetElement(const SAFEARRAY* a, const LONG* index, void* value) {
    std::uint32_t offset = 0;
    if (const HRESULT hr = Offset(a, index, &offset); FAILED(hr)) return hr;
    if (!value) return E_INVALIDARG;
    return CopyElement(a->vt, a->cbElements, value, ElementAt(a, offset));
}

HRESULT SafeArrayPutElement(SAFEARRAY* a, const LONG* index, const void* value) {
    std::uint32_t offset = 0;
    if (const HRESULT hr = Offset(a, index, &offset); FAILED(hr)) return hr;
    if (!value) return E_INVALIDARG;
    // Copy first, so that putting an element onto itself stays valid.
    alignas(VARIANT) unsigned char fresh[sizeof(VARIANT)];
    if (const HRESULT hr = CopyElement(a->vt, a->cbElements, fresh, value); FAILED(hr)) return hr;
    void* slot = ElementAt(a, offset);
    ClearElement(a, slot);
    std::memcpy(slot, fresh, a->cbElements);
    return S_OK;
}

HRESULT SafeArrayCopy(const SAFEARRAY* source, SAFEARRAY** copy) {
    if (!source || !copy) return E_INVALIDARG;
    SAFEARRAY* a = SafeArrayCreateVector(source->vt, source->lLbound, source->cElements);
    if (!a) return E_OUTOFMEMORY;
    for (std::uint32_t i = 0; i < source->cElements; ++i) {
        if (FAILED(CopyElement(a->vt, a->cbElements, ElementAt(a, i), ElementAt(source, i)))) {
            SafeArrayDestroy(a);
            return E_OUTOFMEMORY;
        }
    }
    *copy = a;
    return S_OK;
}
