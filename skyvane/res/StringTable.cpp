#include "res/StringTable.h"

const STRINGTABLE_ENTRY kModuleStrings[] = {
#define SKYVANE_STRING(id, text) {id, text},
#include "res/StringTable.inc"
#undef SKYVANE_STRING
};

const std::size_t kModuleStringCount = sizeof(kModuleStrings) / sizeof(kModuleStrings[0]);
