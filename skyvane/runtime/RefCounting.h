#pragma once
// Counters with scope holders (used as re-entrance guards) and the owning
// containers of the module.

#include "platform/object.h"
#include "platform/sync.h"

#include <list>
#include <map>

// A plain counter with hooks for the first reference and the last release.
class VX_CRefCnt : public CObject {
public:
    // Drops the count by n, never below 0; runs OnLastRelease when that ends
    // the last reference. A negative n, or a counter not referenced, changes nothing.
    virtual int Release(int n);
    virtual bool IsReferenced() const { return m_nRefCount > 0; }
    virtual void OnFirstReference() {}
    virtual void OnLastRelease() {}
    virtual int AddRef();

    int m_nRefCount = 0;
};

// Holds references on a VX_CRefCnt and gives them all back when it ends.
class VX_CRef : public CObject {
public:
    VX_CRef() = default;
    explicit VX_CRef(VX_CRefCnt* counter) : m_pRefCnt(counter) {}
    ~VX_CRef() override { ReleaseAll(); }
    VX_CRef(const VX_CRef&) = delete;
    VX_CRef& operator=(const VX_CRef&) = delete;

    int AddRef();
    void ReleaseAll();

    int m_nHeld = 0;
    VX_CRefCnt* m_pRefCnt = nullptr;
};

// Re-entrance guard of one routine: the routine's own static counter, held
// for the routine's duration. A nested call finds it held and returns.
//
//   static VX_CRefCnt busy;
//   VX_ReentranceGuard guard(busy);
//   if (!guard.Entered()) return;
class VX_ReentranceGuard {
public:
    explicit VX_ReentranceGuard(VX_CRefCnt& counter) {
        if (counter.IsReferenced()) return;
        m_ref.m_pRefCnt = &counter;
        m_ref.AddRef();
    }
    bool Entered() const { return m_ref.m_pRefCnt != nullptr; }

private:
    VX_CRef m_ref;
};

// A map that owns the objects its values point to. Iteration is in key order.
template <typename KEY, typename ARG_KEY, typename VALUE>
class CMapOwner {
public:
    CMapOwner() = default;
    CMapOwner(const CMapOwner&) = delete;
    CMapOwner& operator=(const CMapOwner&) = delete;
    virtual ~CMapOwner() { RemoveAll(); }

    bool Lookup(ARG_KEY key, VALUE*& value) const {
        auto it = m_map.find(KEY(key));
        if (it == m_map.end()) return false;
        value = it->second;
        return true;
    }
    // Stores value (now owned) under key; an old value under that key is deleted.
    void SetAt(ARG_KEY key, VALUE* value) {
        RemoveKey(key);
        m_map[KEY(key)] = value;
    }
    // Removes the entry and deletes its value; returns whether the key was present.
    bool RemoveKey(ARG_KEY key) {
        auto it = m_map.find(KEY(key));
        if (it == m_map.end()) return false;
        VALUE* old = it->second;
        m_map.erase(it);
        delete old;
        return true;
    }
    void RemoveAll() {
        std::map<KEY, VALUE*> old;
        old.swap(m_map);
        for (auto& [key, value] : old) delete value;
    }
    int GetCount() const { return static_cast<int>(m_map.size()); }
    bool IsEmpty() const { return m_map.empty(); }

    auto begin() const { return m_map.begin(); }
    auto end() const { return m_map.end(); }

private:
    std::map<KEY, VALUE*> m_map;
};

// An owning map whose lookup, store and RemoveAll each hold its own lock.
template <typename KEY, typename ARG_KEY, typename VALUE>
class CMapSyncOwner : public CMapOwner<KEY, ARG_KEY, VALUE> {
    using Base = CMapOwner<KEY, ARG_KEY, VALUE>;

public:
    bool Lookup(ARG_KEY key, VALUE*& value) {
        CSingleLock lock(&m_cs, true);
        return Base::Lookup(key, value);
    }
    void SetAt(ARG_KEY key, VALUE* value) {
        CSingleLock lock(&m_cs, true);
        Base::SetAt(key, value);
    }
    void RemoveAll() {
        CSingleLock lock(&m_cs, true);
        Base::RemoveAll();
    }

    CCriticalSection m_cs;  // guards the map's entries
};

// A list that owns its elements.
template <typename TYPE>
class CLstOwner {
public:
    using POSITION = typename std::list<TYPE*>::iterator;

    CLstOwner() = default;
    CLstOwner(const CLstOwner&) = delete;
    CLstOwner& operator=(const CLstOwner&) = delete;
    virtual ~CLstOwner() { RemoveAll(); }

    void AddTail(TYPE* item) { m_list.push_back(item); }
    void AddHead(TYPE* item) { m_list.push_front(item); }
    // Takes the head out of the list; the caller owns it from then on.
    TYPE* RemoveHead() {
        TYPE* head = m_list.front();
        m_list.pop_front();
        return head;
    }
    // Deletes the element, then removes its node.
    void RemoveAt(POSITION position) {
        delete *position;
        m_list.erase(position);
    }
    // Takes the elements from the head one by one and deletes each.
    void RemoveAll() {
        while (!m_list.empty()) delete RemoveHead();
    }
    // Moves every element of other to the end of this list.
    void TakeAll(CLstOwner& other) { m_list.splice(m_list.end(), other.m_list); }

    int GetCount() const { return static_cast<int>(m_list.size()); }
    bool IsEmpty() const { return m_list.empty(); }
    TYPE* GetHead() const { return m_list.front(); }
    TYPE* GetTail() const { return m_list.back(); }

    auto begin() { return m_list.begin(); }
    auto end() { return m_list.end(); }
    auto begin() const { return m_list.begin(); }
    auto end() const { return m_list.end(); }

private:
    std::list<TYPE*> m_list;
};
