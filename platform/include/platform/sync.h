#pragma once
// Locks: CCriticalSection (recursive), CMutex (recursive, with time-outs) and
// the scope object CSingleLock.

#include "platform/types.h"

#include <mutex>

class CSyncObject {
public:
    virtual ~CSyncObject() = default;
    // Returns whether the lock was taken within timeoutMs (INFINITE waits, 0 tries once).
    virtual bool Lock(DWORD timeoutMs = INFINITE) = 0;
    virtual bool Unlock() = 0;
};

class CCriticalSection : public CSyncObject {
public:
    // A critical section always waits; the time-out is ignored.
    bool Lock(DWORD = INFINITE) override { m_mutex.lock(); return true; }
    bool Unlock() override { m_mutex.unlock(); return true; }

private:
    std::recursive_mutex m_mutex;
};

class CMutex : public CSyncObject {
public:
    bool Lock(DWORD timeoutMs = INFINITE) override;
    bool Unlock() override { m_mutex.unlock(); return true; }

private:
    std::recursive_timed_mutex m_mutex;
};

// Scope lock: unlocks on destruction if it holds the lock.
class CSingleLock {
public:
    explicit CSingleLock(CSyncObject* object, bool initialLock = false) : m_object(object) {
        if (initialLock) Lock();
    }
    ~CSingleLock() { Unlock(); }
    CSingleLock(const CSingleLock&) = delete;
    CSingleLock& operator=(const CSingleLock&) = delete;

    bool Lock(DWORD timeoutMs = INFINITE) {
        if (m_locked) return true;
        m_locked = m_object && m_object->Lock(timeoutMs);
        return m_locked;
    }
    bool Unlock() {
        if (!m_locked) return false;
        m_locked = false;
        return m_object->Unlock();
    }
    bool IsLocked() const { return m_locked; }

private:
    CSyncObject* m_object;
    bool m_locked = false;
};
