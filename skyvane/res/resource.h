#pragma once
// Ids of the module's resources.

#include "platform/types.h"

// Strings (texts in StringTable.inc).
constexpr UINT IDS_UNKNOWN_VARIABLES = 5006;
constexpr UINT IDS_MANY_UNKNOWN_VARIABLES = 5007;
constexpr UINT IDS_UNKNOWN_VARIABLE = 5008;
constexpr UINT IDS_CONNECTION_FAILED = 5009;
