#pragma once
// Arrays of a "VariableBulkChange" event as tests fire them raw.

#include "automation/comvariant.h"

#include <vector>

// A one-dimensional array of numbers with the given element type (VT_R8, or
// VT_VARIANT holding doubles) and lower bound.
inline CComVariant ArrayOf(VARTYPE vt, LONG lowerBound, const std::vector<double>& numbers) {
    SAFEARRAY* array = SafeArrayCreateVector(vt, lowerBound, static_cast<std::uint32_t>(numbers.size()));
    for (size_t i = 0; i < numbers.size(); ++i) {
        const LONG index = lowerBound + static_cast<LONG>(i);
        if (vt == VT_VARIANT) {
            CComVariant element(numbers[i]);
            SafeArrayPutElement(array, &index, &element);
        } else {
            SafeArrayPutElement(array, &index, &numbers[i]);
        }
    }
    VARIANT holder;
    VariantInit(&holder);
    holder.vt = VT_ARRAY | vt;
    holder.parray = array;
    CComVariant owned(holder);
    VariantClear(&holder);
    return owned;
}
