#include "platform/resources.h"

#include <algorithm>
#include <mutex>
#include <vector>

namespace {

struct Table {
    const STRINGTABLE_ENTRY* entries;
    std::size_t count;
};

std::mutex g_tablesLock;      // guards g_tables
std::vector<Table> g_tables;  // registration order; searched from the back

}  // namespace

CStringTableRegistration::CStringTableRegistration(const STRINGTABLE_ENTRY* entries, std::size_t count)
    : m_entries(entries), m_count(count) {
    std::lock_guard<std::mutex> guard(g_tablesLock);
    g_tables.push_back({entries, count});
}

CStringTableRegistration::~CStringTableRegistration() {
    std::lock_guard<std::mutex> guard(g_tablesLock);
    auto it = std::find_if(g_tables.rbegin(), g_tables.rend(), [&](const Table& t) { return t.entries == m_entries; });
    if (it != g_tables.rend()) g_tables.erase(std::next(it).base());
}

bool AfxLoadString(UINT id, CString& text) {
    std::lock_guard<std::mutex> guard(g_tablesLock);
    for (auto table = g_tables.rbegin(); table != g_tables.rend(); ++table) {
        const STRINGTABLE_ENTRY* end = table->entries + table->count;
        const STRINGTABLE_ENTRY* hit =
            std::find_if(table->entries, end, [&](const STRINGTABLE_ENTRY& e) { return e.id == id; });
        if (hit != end) {
            text = hit->text;
            return true;
        }
    }
    text.Empty();
    return false;
}
