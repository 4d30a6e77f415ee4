#pragma once
// CComPtr: holds one counted reference on an interface pointer.

#include "automation/unknown.h"

#include <cstddef>
#include <type_traits>
#include <utility>

template <typename T>
class CComPtr {
public:
    CComPtr() = default;
    CComPtr(std::nullptr_t) {}
    // Takes a reference of its own (AddRef).
    CComPtr(T* p) : m_p(p) {
        if (m_p) m_p->AddRef();
    }
    CComPtr(const CComPtr& other) : CComPtr(other.m_p) {}
    CComPtr(CComPtr&& other) noexcept : m_p(std::exchange(other.m_p, nullptr)) {}
    template <typename U>
    requires std::is_convertible_v<U*, T*> CComPtr(const CComPtr<U>& other) : CComPtr(static_cast<T*>(other.Get())) {}
    ~CComPtr() { Release(); }

    CComPtr& operator=(T* p) {
        if (p) p->AddRef();  // first, so that assigning the held pointer stays valid
        Reset(p);
        return *this;
    }
    CComPtr& operator=(const CComPtr& other) { return *this = other.m_p; }
    CComPtr& operator=(CComPtr&& other) noexcept {
        if (this != &other) Reset(std::exchange(other.m_p, nullptr));
        return *this;
    }

    // Adopts a pointer whose reference the caller hands over (no AddRef).
    static CComPtr Adopt(T* p) {
        CComPtr held;
        held.m_p = p;
        return held;
    }
    void Attach(T* p) { Reset(p); }
    // Hands the reference over to the caller; the pointer becomes empty.
    [[nodiscard]] T* Detach() { return std::exchange(m_p, nullptr); }
    void Release() { Reset(nullptr); }
    // Empties the pointer and gives its address to a call that fills it with a
    // referenced interface (an out parameter).
    T** Receive() {
        Release();
        return &m_p;
    }
    void** ReceiveVoid() { return reinterpret_cast<void**>(Receive()); }

    // Queries the held object for another interface.
    template <typename Q>
    HRESULT QueryInterface(REFIID iid, CComPtr<Q>& out) const {
        if (!m_p) return E_POINTER;
        return m_p->QueryInterface(iid, out.ReceiveVoid());
    }

    T* Get() const { return m_p; }
    T* operator->() const { return m_p; }
    T& operator*() const { return *m_p; }
    explicit operator bool() const { return m_p != nullptr; }
    friend bool operator==(const CComPtr& a, const CComPtr& b) { return a.m_p == b.m_p; }
    friend bool operator==(const CComPtr& a, std::nullptr_t) { return a.m_p == nullptr; }

private:
    void Reset(T* p) {
        T* old = std::exchange(m_p, p);
        if (old) old->Release();
    }

    T* m_p = nullptr;
};

// Creates an object whose count starts at 1 and adopts that first reference.
template <typename T, typename... Args>
CComPtr<T> MakeComObject(Args&&... args) {
    return CComPtr<T>::Adopt(new T(std::forward<Args>(args)...));
}
