#pragma once
// String tables of loaded modules, looked up by id as the class library's
// resource chain does: a module registers its table when it is loaded and
// takes it back when it is unloaded; a lookup searches the tables newest
// first.

#include "platform/text.h"

#include <cstddef>

struct STRINGTABLE_ENTRY {
    UINT id;
    const char16_t* text;
};

// Registers a table for the lifetime of the object. The entries must outlive it.
class CStringTableRegistration {
public:
    CStringTableRegistration(const STRINGTABLE_ENTRY* entries, std::size_t count);
    ~CStringTableRegistration();
    CStringTableRegistration(const CStringTableRegistration&) = delete;
    CStringTableRegistration& operator=(const CStringTableRegistration&) = delete;

private:
    const STRINGTABLE_ENTRY* m_entries;
    std::size_t m_count;
};

// The text of string id; false (and text emptied) when no table has it.
bool AfxLoadString(UINT id, CString& text);
