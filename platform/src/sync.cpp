#include "platform/sync.h"

#include <chrono>

bool CMutex::Lock(DWORD timeoutMs) {
    if (timeoutMs == INFINITE) {
        m_mutex.lock();
        return true;
    }
    if (timeoutMs == 0) return m_mutex.try_lock();
    return m_mutex.try_lock_for(std::chrono::milliseconds(timeoutMs));
}
