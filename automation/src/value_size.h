#pragma once
// The size of a value type that is stored as raw bytes, shared by the
// SAFEARRAY code and the local-socket transport's encoding.

#include "automation/variant.h"

#include <cstdint>

// Bytes of a number, boolean, date, currency or error value; 0 for every
// other type (texts, objects, variants), which are not plain bytes.
std::uint32_t FixedValueSize(VARTYPE vt);
