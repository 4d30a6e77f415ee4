#pragma once
// Locks: CCriticalSection (recursive), CMutex (recursive, with time-outs) and
// the scope object CSingleLock.

#include "platform/types.h"

#include <condition_variable>
#include <mutex>
#include <thread>

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
    bool Lock(DWORD = INFINITE) override {
        m_mutex.lock();
        return true;
    }
    bool Unlock() override {
        m_mutex.unlock();
        return true;
    }

private:
    std::recursive_mutex m_mutex;
};

// Recursive, with time-outs. Built on a plain mutex and a condition variable
// (rather than a timed mutex) so that every wait is visible to ThreadSanitizer.
class CMutex : public CSyncObject {
public:
    bool Lock(DWORD timeoutMs = INFINITE) override;
    // Returns false when the calling thread does not hold the mutex.
    bool Unlock() override;

private:
    std::mutex m_state;  // guards m_owner and m_depth
    std::condition_variable m_released;
    std::thread::id m_owner;
    unsigned m_depth = 0;
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
