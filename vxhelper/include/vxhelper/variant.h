#pragma once
// VARIANT and DATE helpers: conversions to text, number and calendar fields,
// an owning VARIANT (VX_CVariant) and a checked one-dimensional array wrapper
// (VX_CSafeArray).

#include "automation/variant.h"
#include "platform/text.h"

// Calendar date and time of day, as the Win32 structure of that name.
struct SYSTEMTIME {
    WORD wYear;
    WORD wMonth;      // 1 to 12
    WORD wDayOfWeek;  // 0 Sunday to 6 Saturday
    WORD wDay;        // 1 to 31
    WORD wHour;
    WORD wMinute;
    WORD wSecond;
    WORD wMilliseconds;  // 0 to 999
};

// Splits an OLE DATE into its calendar date, time of day and milliseconds, as
// written (no time zone is applied). The time is rounded to the nearest
// millisecond; a rounding that reaches the next second carries into it, so
// the milliseconds never read 1000. For dates before 1899-12-30 the integer
// part counts days back and the fraction still runs forward from midnight
// (-1.25 is 1899-12-29 06:00). False, and st zeroed, for NaN, infinities and
// dates outside the years 100 to 9999.
bool ConvertDATE2Systemtime(DATE date, SYSTEMTIME* st);

// The text of a value: VT_BSTR (also by reference) as it is; integers in
// decimal; VT_R4/VT_R8 in the shortest form that reads back to the same
// number; VT_BOOL as "true" or "false"; VT_CY in decimal with up to four
// decimals; VT_DATE as "YYYY-MM-DD hh:mm:ss.mmm"; VT_VARIANT by reference as
// its target. Null, VT_EMPTY, VT_NULL and every other type give "".
CString _c_funktionVariantToCString(const VARIANT* value);

// The number of a value, with success in ok. Accepted: every integer type,
// VT_R4, VT_R8, VT_BOOL (true 1.0, false 0.0), VT_DATE (the day count),
// VT_CY (units / 10000), VT_BSTR holding a decimal number in C notation
// (surrounding blanks allowed, nothing else), the by-reference forms of all
// of these, and VT_VARIANT by reference to one of them. Everything else
// (null, VT_EMPTY, VT_NULL, VT_ERROR, interfaces, arrays, other text) gives
// 0.0 with ok false.
double _c_funktionVariantToDoubleEx(const VARIANT* value, bool& ok);

// A VARIANT that owns its content: cleared when it ends, deep-copied when copied.
class VX_CVariant : public VARIANT {
public:
    VX_CVariant() { VariantInit(this); }
    VX_CVariant(const VARIANT& other);
    VX_CVariant(const VX_CVariant& other) : VX_CVariant(static_cast<const VARIANT&>(other)) {}
    VX_CVariant(VX_CVariant&& other) noexcept;
    explicit VX_CVariant(std::int32_t value);                  // VT_I4
    explicit VX_CVariant(std::int64_t value);                  // VT_I8
    explicit VX_CVariant(double value, VARTYPE type = VT_R8);  // VT_R8 or VT_DATE
    explicit VX_CVariant(bool value);                          // VT_BOOL
    explicit VX_CVariant(const char16_t* text);                // VT_BSTR (null: empty text)
    explicit VX_CVariant(const CString& text) : VX_CVariant(text.GetString()) {}
    ~VX_CVariant() { VariantClear(this); }

    VX_CVariant& operator=(const VARIANT& other);
    VX_CVariant& operator=(const VX_CVariant& other) { return *this = static_cast<const VARIANT&>(other); }
    VX_CVariant& operator=(VX_CVariant&& other) noexcept;

    void Clear() { VariantClear(this); }
    // Takes over the content of value, which is left VT_EMPTY.
    void Attach(VARIANT& value);
    // Hands the content over to the caller, who must clear it; this is left VT_EMPTY.
    VARIANT Detach();

    CString ToString() const { return _c_funktionVariantToCString(this); }
    bool ToDouble(double& number) const;
};

// A checked view of a one-dimensional SAFEARRAY. Attach borrows an array (it
// is not destroyed), Create makes one that the wrapper owns. Every index is
// checked against the bounds.
class VX_CSafeArray {
public:
    VX_CSafeArray() = default;
    ~VX_CSafeArray() { Release(); }
    VX_CSafeArray(const VX_CSafeArray&) = delete;
    VX_CSafeArray& operator=(const VX_CSafeArray&) = delete;

    // Makes a new array owned by the wrapper; false for an element type arrays cannot hold.
    bool Create(VARTYPE elementType, LONG lowerBound, std::uint32_t count);
    // Borrows an array: the caller keeps it alive while the wrapper uses it.
    void Attach(SAFEARRAY* array);
    // Borrows the array of a VT_ARRAY variant (also by reference); false otherwise.
    bool Attach(const VARIANT* value);
    // Lets go of the array without destroying it; returns it.
    SAFEARRAY* Detach();
    // Lets go of the array, destroying it when owned.
    void Release();

    SAFEARRAY* GetArray() const { return m_array; }
    bool IsValid() const { return m_array != nullptr; }
    VARTYPE GetElementType() const { return m_array ? m_array->vt : VARTYPE{VT_EMPTY}; }
    LONG GetLBound() const { return m_array ? m_array->lLbound : 0; }
    // The last valid index; GetLBound() - 1 when the array is empty.
    LONG GetUBound() const;
    std::uint32_t GetCount() const { return m_array ? m_array->cElements : 0; }
    bool IsIndexValid(LONG index) const;

    // Copies element index out (text duplicated, interfaces referenced) or in.
    HRESULT GetElement(LONG index, void* value) const;
    HRESULT PutElement(LONG index, const void* value);
    // Element index as a variant of the array's element type (a copy).
    bool GetVariant(LONG index, VX_CVariant& value) const;
    // Element index converted to a number (_c_funktionVariantToDoubleEx rules).
    bool GetDouble(LONG index, double& value) const;

private:
    SAFEARRAY* m_array = nullptr;
    bool m_owned = false;
};
