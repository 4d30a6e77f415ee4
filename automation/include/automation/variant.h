#pragma once
// Automation value types: VARIANT, BSTR, one-dimensional SAFEARRAY, DATE, CY.

#include "automation/unknown.h"

class IDispatch;

using VARTYPE = std::uint16_t;
using VARIANT_BOOL = std::int16_t;
using DATE = double;  // days since 1899-12-30 00:00; the fraction is the time of day

constexpr VARIANT_BOOL VARIANT_TRUE = -1;
constexpr VARIANT_BOOL VARIANT_FALSE = 0;

enum : VARTYPE {
    VT_EMPTY = 0,
    VT_NULL = 1,
    VT_I2 = 2,
    VT_I4 = 3,
    VT_R4 = 4,
    VT_R8 = 5,
    VT_CY = 6,
    VT_DATE = 7,
    VT_BSTR = 8,
    VT_DISPATCH = 9,
    VT_ERROR = 10,
    VT_BOOL = 11,
    VT_VARIANT = 12,
    VT_UNKNOWN = 13,
    VT_I1 = 16,
    VT_UI1 = 17,
    VT_UI2 = 18,
    VT_UI4 = 19,
    VT_I8 = 20,
    VT_UI8 = 21,
    VT_INT = 22,
    VT_UINT = 23,
    VT_ARRAY = 0x2000,
    VT_BYREF = 0x4000,
    VT_TYPEMASK = 0x0FFF,
};

// Currency: a 64-bit integer in units of 1/10000.
struct CY {
    std::int64_t int64;
};

// BSTR: owned UTF-16 text with a length prefix; null means the empty text.
using BSTR = char16_t*;
BSTR SysAllocString(const char16_t* text);
BSTR SysAllocStringLen(const char16_t* text, UINT length);
void SysFreeString(BSTR text);
UINT SysStringLen(BSTR text);

// One-dimensional safe array with a lower bound and an element type.
struct SAFEARRAY {
    VARTYPE vt;                // element type (VT_I4, VT_R8, VT_BSTR, VT_VARIANT, ...)
    std::uint32_t cbElements;  // bytes per element
    LONG lLbound;
    std::uint32_t cElements;
    void* pvData;
};

struct VARIANT {
    VARTYPE vt;
    union {
        std::int8_t cVal;
        std::uint8_t bVal;
        std::int16_t iVal;
        std::uint16_t uiVal;
        std::int32_t lVal;
        std::uint32_t ulVal;
        std::int32_t intVal;
        std::uint32_t uintVal;
        std::int64_t llVal;
        std::uint64_t ullVal;
        float fltVal;
        double dblVal;
        VARIANT_BOOL boolVal;
        SCODE scode;
        CY cyVal;
        DATE date;
        BSTR bstrVal;
        IUnknown* punkVal;
        IDispatch* pdispVal;
        SAFEARRAY* parray;
        // By-reference forms (VT_BYREF | type): the variant does not own the target.
        std::int8_t* pcVal;
        std::uint8_t* pbVal;
        std::int16_t* piVal;
        std::uint16_t* puiVal;
        std::int32_t* plVal;
        std::uint32_t* pulVal;
        std::int32_t* pintVal;
        std::uint32_t* puintVal;
        std::int64_t* pllVal;
        std::uint64_t* pullVal;
        float* pfltVal;
        double* pdblVal;
        VARIANT_BOOL* pboolVal;
        SCODE* pscode;
        CY* pcyVal;
        DATE* pdate;
        BSTR* pbstrVal;
        IUnknown** ppunkVal;
        IDispatch** ppdispVal;
        SAFEARRAY** pparray;
        VARIANT* pvarVal;
        void* byref;
    };
};
using VARIANTARG = VARIANT;

void VariantInit(VARIANT* v);
// Frees what the variant owns (text, interface reference, array) and leaves it VT_EMPTY.
HRESULT VariantClear(VARIANT* v);
// Deep copy: text and arrays are duplicated, interfaces referenced; by-reference
// variants copy the reference itself.
HRESULT VariantCopy(VARIANT* dest, const VARIANT* src);

SAFEARRAY* SafeArrayCreateVector(VARTYPE vt, LONG lowerBound, std::uint32_t count);
HRESULT SafeArrayDestroy(SAFEARRAY* array);
HRESULT SafeArrayGetLBound(const SAFEARRAY* array, UINT dimension, LONG* bound);
HRESULT SafeArrayGetUBound(const SAFEARRAY* array, UINT dimension, LONG* bound);
HRESULT SafeArrayGetVartype(const SAFEARRAY* array, VARTYPE* vt);
// Element access by index (lower bound included). Get copies out (text
// duplicated, interfaces referenced); Put copies in and frees what it replaces.
HRESULT SafeArrayGetElement(const SAFEARRAY* array, const LONG* index, void* value);
HRESULT SafeArrayPutElement(SAFEARRAY* array, const LONG* index, const void* value);
HRESULT SafeArrayCopy(const SAFEARRAY* source, SAFEARRAY** copy);
