#include "runtime/BulkChangeArrays.h"

#include <algorithm>
#include <cmath>

bool TruncatedLow32(double number, DWORD* low32) {
    if (!std::isfinite(number) || std::fabs(number) >= 9223372036854775808.0) return false;
    *low32 = static_cast<DWORD>(static_cast<std::uint64_t>(static_cast<std::int64_t>(number)));
    return true;
}

namespace {

bool NumberOfVariant(const VARIANT& v, double* number) {
    switch (v.vt) {
    case VT_R8:
    case VT_DATE: *number = v.dblVal; return true;
    case VT_R4: *number = v.fltVal; return true;
    case VT_I4:
    case VT_INT: *number = v.lVal; return true;
    case VT_UI4:
    case VT_UINT: *number = v.ulVal; return true;
    case VT_I2: *number = v.iVal; return true;
    case VT_UI2: *number = v.uiVal; return true;
    case VT_I8: *number = static_cast<double>(v.llVal); return true;
    case VT_UI8: *number = static_cast<double>(v.ullVal); return true;
    case VT_VARIANT | VT_BYREF: return v.pvarVal && v.pvarVal != &v && NumberOfVariant(*v.pvarVal, number);
    default: return false;
    }
}

}  // namespace

SafeArrayReader::SafeArrayReader(const VARIANT& holder) {
    if (!(holder.vt & VT_ARRAY)) return;
    m_array = (holder.vt & VT_BYREF) ? (holder.pparray ? *holder.pparray : nullptr) : holder.parray;
    if (m_array && !m_array->pvData) m_array = nullptr;
}

const void* SafeArrayReader::At(std::uint32_t k) const {
    return static_cast<const char*>(m_array->pvData) + static_cast<size_t>(k) * m_array->cbElements;
}

bool SafeArrayReader::GetNumber(std::uint32_t k, double* number) const {
    if (k >= Count()) return false;
    const void* p = At(k);
    switch (m_array->vt) {
    case VT_R8:
    case VT_DATE: *number = *static_cast<const double*>(p); return true;
    case VT_R4: *number = *static_cast<const float*>(p); return true;
    case VT_I4:
    case VT_INT: *number = *static_cast<const std::int32_t*>(p); return true;
    case VT_UI4:
    case VT_UINT: *number = *static_cast<const std::uint32_t*>(p); return true;
    case VT_I8: *number = static_cast<double>(*static_cast<const std::int64_t*>(p)); return true;
    case VT_VARIANT: return NumberOfVariant(*static_cast<const VARIANT*>(p), number);
    default: return false;
    }
}

const VARIANT* SafeArrayReader::GetVariant(std::uint32_t k, VARIANT* scratch) const {
    if (k >= Count()) return nullptr;
    if (m_array->vt == VT_VARIANT) return static_cast<const VARIANT*>(At(k));
    VariantInit(scratch);
    if (m_array->vt == VT_BSTR) {
        scratch->vt = VT_BSTR;
        scratch->bstrVal = *static_cast<const BSTR*>(At(k));
        return scratch;
    }
    if (!GetNumber(k, &scratch->dblVal)) return nullptr;
    scratch->vt = VT_R8;
    return scratch;
}

BulkChangeArrays::BulkChangeArrays(const VARIANT& ids, const VARIANT& values, const VARIANT& statusLow,
                                   const VARIANT& statusHigh, const VARIANT& times)
    : m_ids(ids), m_values(values), m_statusLow(statusLow), m_statusHigh(statusHigh), m_times(times) {
    m_count = std::min({m_ids.Count(), m_values.Count(), m_statusLow.Count(), m_statusHigh.Count(), m_times.Count()});
}

bool BulkChangeArrays::Get(std::uint32_t k, Element* e) const {
    if (k >= m_count) return false;
    e->value = m_values.GetVariant(k, &e->scratch);
    return e->value && m_ids.GetNumber(k, &e->id) && m_statusLow.GetNumber(k, &e->statusLow) &&
           m_statusHigh.GetNumber(k, &e->statusHigh) && m_times.GetNumber(k, &e->time);
}
