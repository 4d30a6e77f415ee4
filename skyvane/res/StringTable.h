#pragma once
// The module's string table, registered while the module is loaded.

#include "platform/resources.h"
#include "res/resource.h"

#include <cstddef>

extern const STRINGTABLE_ENTRY kModuleStrings[];
extern const std::size_t kModuleStringCount;
