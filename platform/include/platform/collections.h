#pragma once
// The few class-library containers that cross the host/module boundary.

#include "platform/text.h"

#include <list>
#include <map>
#include <vector>

class CStringArray {
public:
    int GetSize() const { return static_cast<int>(m_items.size()); }
    int GetCount() const { return GetSize(); }
    bool IsEmpty() const { return m_items.empty(); }
    int Add(const CString& s) {
        m_items.push_back(s);
        return GetSize() - 1;
    }
    const CString& GetAt(int i) const { return m_items.at(static_cast<size_t>(i)); }
    CString& ElementAt(int i) { return m_items.at(static_cast<size_t>(i)); }
    const CString& operator[](int i) const { return GetAt(i); }
    CString& operator[](int i) { return ElementAt(i); }
    void RemoveAll() { m_items.clear(); }
    void RemoveAt(int i) { m_items.erase(m_items.begin() + i); }
    auto begin() const { return m_items.begin(); }
    auto end() const { return m_items.end(); }

private:
    std::vector<CString> m_items;
};

class CStringList {
public:
    int GetCount() const { return static_cast<int>(m_items.size()); }
    bool IsEmpty() const { return m_items.empty(); }
    void AddTail(const CString& s) { m_items.push_back(s); }
    void AddHead(const CString& s) { m_items.push_front(s); }
    void RemoveAll() { m_items.clear(); }
    auto begin() const { return m_items.begin(); }
    auto end() const { return m_items.end(); }

private:
    std::list<CString> m_items;
};

// String-keyed maps, iterated in key order.
template <typename VALUE>
class CMapStringTo {
public:
    int GetCount() const { return static_cast<int>(m_items.size()); }
    bool IsEmpty() const { return m_items.empty(); }
    void SetAt(const CString& key, const VALUE& value) { m_items[key] = value; }
    bool Lookup(const CString& key, VALUE& value) const {
        auto it = m_items.find(key);
        if (it == m_items.end()) return false;
        value = it->second;
        return true;
    }
    bool RemoveKey(const CString& key) { return m_items.erase(key) > 0; }
    void RemoveAll() { m_items.clear(); }
    auto begin() const { return m_items.begin(); }
    auto end() const { return m_items.end(); }

private:
    std::map<CString, VALUE> m_items;
};

using CMapStringToPtr = CMapStringTo<void*>;
using CMapStringToString = CMapStringTo<CString>;
