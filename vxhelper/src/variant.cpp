#include "vxhelper/variant.h"

// ---- VX_CVariant -------------------------------------------------------------

VX_CVariant::VX_CVariant(const VARIANT& other) {
    VariantInit(this);
    VariantCopy(this, &other);  // out of memory leaves it empty
}

VX_CVariant::VX_CVariant(VX_CVariant&& other) noexcept {
    *static_cast<VARIANT*>(this) = other;
    VariantInit(&other);
}

VX_CVariant::VX_CVariant(std::int32_t value) {
    VariantInit(this);
    vt = VT_I4;
    lVal = value;
}

VX_CVariant::VX_CVariant(std::int64_t value) {
    VariantInit(this);
    vt = VT_I8;
    llVal = value;
}

VX_CVariant::VX_CVariant(double value, VARTYPE type) {
    VariantInit(this);
    vt = type == VT_DATE ? VT_DATE : VT_R8;
    dblVal = value;
}

VX_CVariant::VX_CVariant(bool value) {
    VariantInit(this);
    vt = VT_BOOL;
    boolVal = value ? VARIANT_TRUE : VARIANT_FALSE;
}

VX_CVariant::VX_CVariant(const char16_t* text) {
    VariantInit(this);
    vt = VT_BSTR;
    bstrVal = SysAllocString(text ? text : u"");
}

VX_CVariant& VX_CVariant::operator=(const VARIANT& other) {
    VariantCopy(this, &other);
    return *this;
}

VX_CVariant& VX_CVariant::operator=(VX_CVariant&& other) noexcept {
    if (this != &other) Attach(other);
    return *this;
}

void VX_CVariant::Attach(VARIANT& value) {
    if (&value == this) return;
    VariantClear(this);
    *static_cast<VARIANT*>(this) = value;
    VariantInit(&value);
}

VARIANT VX_CVariant::Detach() {
    VARIANT content = *this;
    VariantInit(this);
    return content;
}

bool VX_CVariant::ToDouble(double& number) const {
    bool ok = false;
    number = _c_funktionVariantToDoubleEx(this, ok);
    return ok;
}

// ---- VX_CSafeArray -----------------------------------------------------------

bool VX_CSafeArray::Create(VARTYPE elementType, LONG lowerBound, std::uint32_t count) {
    Release();
    m_array = SafeArrayCreateVector(elementType, lowerBound, count);
    m_owned = m_array != nullptr;
    return m_owned;
}

void VX_CSafeArray::Attach(SAFEARRAY* array) {
    Release();
    m_array = array;
}

bool VX_CSafeArray::Attach(const VARIANT* value) {
    Release();
    if (!value || !(value->vt & VT_ARRAY)) return false;
    if (value->vt & VT_BYREF) m_array = value->pparray ? *value->pparray : nullptr;
    else m_array = value->parray;
    return m_array != nullptr;
}

SAFEARRAY* VX_CSafeArray::Detach() {
    SAFEARRAY* array = m_array;
    m_array = nullptr;
    m_owned = false;
    return array;
}

void VX_CSafeArray::Release() {
    if (m_owned) SafeArrayDestroy(m_array);
    m_array = nullptr;
    m_owned = false;
}

LONG VX_CSafeArray::GetUBound() const {
    if (!m_array) return -1;
    return static_cast<LONG>(static_cast<long long>(m_array->lLbound) + m_array->cElements - 1);
}

bool VX_CSafeArray::IsIndexValid(LONG index) const {
    if (!m_array) return false;
    const long long offset = static_cast<long long>(index) - m_array->lLbound;
    return offset >= 0 && offset < static_cast<long long>(m_array->cElements);
}

HRESULT VX_CSafeArray::GetElement(LONG index, void* value) const {
    if (!m_array) return E_POINTER;
    return SafeArrayGetElement(m_array, &index, value);
}

HRESULT VX_CSafeArray::PutElement(LONG index, const void* value) {
    if (!m_array) return E_POINTER;
    return SafeArrayPutElement(m_array, &index, value);
}

bool VX_CSafeArray::GetVariant(LONG index, VX_CVariant& value) const {
    value.Clear();
    if (!IsIndexValid(index)) return false;
    if (m_array->vt == VT_VARIANT)
        return SUCCEEDED(SafeArrayGetElement(m_array, &index, static_cast<VARIANT*>(&value)));
    // Any other element fits the variant's value slot; the copy takes its own text or reference.
    if (FAILED(SafeArrayGetElement(m_array, &index, &value.llVal))) return false;
    value.vt = m_array->vt;
    return true;
}

bool VX_CSafeArray::GetDouble(LONG index, double& number) const {
    VX_CVariant element;
    number = 0.0;
    return GetVariant(index, element) && element.ToDouble(number);
}
