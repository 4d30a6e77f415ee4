#include "platform/sync.h"

#include <chrono>

bool CMutex::Lock(DWORD timeoutMs) {
    const auto self = std::this_thread::get_id();
    std::unique_lock<std::mutex> state(m_state);
    if (m_depth > 0 && m_owner == self) {
        ++m_depth;
        return true;
    }
    const auto free = [&] { return m_depth == 0; };
    if (timeoutMs == INFINITE) {
        m_released.wait(state, free);
    } else if (!m_released.wait_for(state, std::chrono::milliseconds(timeoutMs), free)) {
        return false;
    }
    m_owner = self;
    m_depth = 1;
    return true;
}

bool CMutex::Unlock() {
    std::lock_guard<std::mutex> state(m_state);
    if (m_depth == 0 || m_owner != std::this_thread::get_id()) return false;
    if (--m_depth == 0) {
        m_owner = {};
        m_released.notify_one();
    }
    return true;
}
