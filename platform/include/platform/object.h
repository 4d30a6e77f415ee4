#pragma once
// Root classes of the class-library layer.

#include <atomic>
#include <cstddef>

class CObject {
public:
    virtual ~CObject() = default;
};

// A command target counts its references. The count starts at 1 (the
// creator's reference); InternalRelease deletes the object when it reaches 0.
// Objects are allocated zero-filled, as the module's counted objects expect.
class CCmdTarget : public CObject {
public:
    CCmdTarget() = default;
    CCmdTarget(const CCmdTarget&) = delete;
    CCmdTarget& operator=(const CCmdTarget&) = delete;

    long InternalAddRef() { return m_dwRef.fetch_add(1, std::memory_order_relaxed) + 1; }
    long InternalRelease() {
        const long left = m_dwRef.fetch_sub(1, std::memory_order_acq_rel) - 1;
        if (left == 0) OnFinalRelease();
        return left;
    }
    long GetRefCount() const { return m_dwRef.load(std::memory_order_relaxed); }

    static void* operator new(std::size_t size);
    static void operator delete(void* p) noexcept;

protected:
    // Called when the last reference is gone; the default deletes the object.
    virtual void OnFinalRelease() { delete this; }

private:
    std::atomic<long> m_dwRef{1};
};

struct VX_TContMemPtrKeepRef_Tag {};
template <typename TBase>
struct VX_TContMemPtrKeepRef {
    static void AddRef(TBase* p) { p->InternalAddRef(); }
    static void Release(TBase* p) { p->InternalRelease(); }
};

// Holds exactly one reference on a command target: taking a pointer adds one,
// dropping it (reset, reassignment, destruction) releases one.
template <typename T, typename TBase = CCmdTarget, typename TPolicy = VX_TContMemPtrKeepRef<CCmdTarget>>
class VX_KeepRefCmdPtr {
public:
    VX_KeepRefCmdPtr() = default;
    VX_KeepRefCmdPtr(T* p) : m_p(p) {
        if (m_p) TPolicy::AddRef(static_cast<TBase*>(m_p));
    }
    VX_KeepRefCmdPtr(const VX_KeepRefCmdPtr& other) : VX_KeepRefCmdPtr(other.m_p) {}
    VX_KeepRefCmdPtr(VX_KeepRefCmdPtr&& other) noexcept : m_p(other.m_p) { other.m_p = nullptr; }
    ~VX_KeepRefCmdPtr() { Reset(); }

    VX_KeepRefCmdPtr& operator=(T* p) {
        if (p != m_p) {
            if (p) TPolicy::AddRef(static_cast<TBase*>(p));
            T* old = m_p;
            m_p = p;
            if (old) TPolicy::Release(static_cast<TBase*>(old));
        }
        return *this;
    }
    VX_KeepRefCmdPtr& operator=(const VX_KeepRefCmdPtr& other) { return *this = other.m_p; }
    VX_KeepRefCmdPtr& operator=(VX_KeepRefCmdPtr&& other) noexcept {
        if (this != &other) {
            Reset();
            m_p = other.m_p;
            other.m_p = nullptr;
        }
        return *this;
    }

    void Reset() {
        if (T* old = m_p) {
            m_p = nullptr;
            TPolicy::Release(static_cast<TBase*>(old));
        }
    }
    T* Get() const { return m_p; }
    T* operator->() const { return m_p; }
    T& operator*() const { return *m_p; }
    explicit operator bool() const { return m_p != nullptr; }
    bool operator==(const T* p) const { return m_p == p; }

private:
    T* m_p = nullptr;
};

// Creates a counted object the module's way: zero-filled memory, constructed
// (count 1), taken by the smart pointer (2), construction reference dropped (1).
template <typename T, typename... Args>
VX_KeepRefCmdPtr<T> VX_CreateCounted(Args&&... args) {
    T* raw = new T(std::forward<Args>(args)...);
    VX_KeepRefCmdPtr<T> held(raw);
    raw->InternalRelease();
    return held;
}
