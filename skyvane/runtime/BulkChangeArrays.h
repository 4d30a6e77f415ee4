#pragma once
// Bounds-checked reading of the arrays of a "VariableBulkChange" event.
//
// Element k of each array is read at that array's own lower bound plus k, so
// arrays with another lower bound than 0 are rebased; elements that are not
// present in all five arrays, or that have the wrong type, are skipped.

#include "automation/variant.h"

#include <cstdint>

// The low 32 bits of a number truncated to an integer; false for NaN,
// infinities and numbers beyond 64 bits, which have no such bits.
bool TruncatedLow32(double number, DWORD* low32);

// Read-only view of a one-dimensional array held by a VARIANT (also by reference).
class SafeArrayReader {
public:
    explicit SafeArrayReader(const VARIANT& holder);

    std::uint32_t Count() const { return m_array ? m_array->cElements : 0; }
    // Element k as a number: numeric element types, or variants holding a number.
    bool GetNumber(std::uint32_t k, double* number) const;
    // Element k as a variant. For arrays of plain types the value is put into
    // scratch without copying (it borrows a text); the result lives as long as
    // the array and scratch, and scratch must not be cleared.
    const VARIANT* GetVariant(std::uint32_t k, VARIANT* scratch) const;

private:
    const void* At(std::uint32_t k) const;

    const SAFEARRAY* m_array = nullptr;
};

class BulkChangeArrays {
public:
    struct Element {
        double id;
        const VARIANT* value;
        double statusLow;
        double statusHigh;
        double time;
        VARIANT scratch;  // backing store of value for arrays of plain types
    };

    BulkChangeArrays(const VARIANT& ids, const VARIANT& values, const VARIANT& statusLow, const VARIANT& statusHigh,
                     const VARIANT& times);

    // Elements present in all five arrays.
    std::uint32_t Count() const { return m_count; }
    // False when element k has an element of the wrong type in any array.
    bool Get(std::uint32_t k, Element* element) const;

private:
    SafeArrayReader m_ids, m_values, m_statusLow, m_statusHigh, m_times;
    std::uint32_t m_count;
};
