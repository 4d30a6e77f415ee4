#include "vxhelper/thread.h"

#include <chrono>

VX_CThread::~VX_CThread() { EndThread(INFINITE); }

bool VX_CThread::BeginThread(Routine routine, void* parameter, int /*priority*/, UINT stackSize, DWORD /*flags*/,
                             void* /*security*/) {
    if (!routine) return false;
    std::unique_lock lock(m_lock);
    if (m_running) return false;
    if (m_joinable) {  // the last run ended; collect its thread first
        m_joinable = false;
        const pthread_t previous = m_thread;
        lock.unlock();
        pthread_join(previous, nullptr);
        lock.lock();
        if (m_running || m_joinable) return false;  // another caller started one meanwhile
    }
    pthread_attr_t attributes;
    if (pthread_attr_init(&attributes) != 0) return false;
    if (stackSize != 0) pthread_attr_setstacksize(&attributes, stackSize);  // too small: default kept
    m_routine = routine;
    m_parameter = parameter;
    m_runFlag = true;
    m_running = true;
    const bool created = pthread_create(&m_thread, &attributes, &VX_CThread::Trampoline, this) == 0;
    pthread_attr_destroy(&attributes);
    m_joinable = created;
    m_running = created;
    m_runFlag = created;
    return created;
}

void* VX_CThread::Trampoline(void* self) {
    auto* thread = static_cast<VX_CThread*>(self);
    Routine routine;
    {
        std::lock_guard lock(thread->m_lock);
        routine = thread->m_routine;
    }
    const DWORD code = routine(thread);
    std::lock_guard lock(thread->m_lock);
    thread->m_exitCode = code;
    thread->m_running = false;
    thread->m_ended.notify_all();
    return nullptr;
}

bool VX_CThread::EndThread(DWORD timeoutMs) {
    std::unique_lock lock(m_lock);
    m_runFlag = false;
    if (m_joinable && pthread_equal(m_thread, pthread_self())) return !m_running;  // the routine cannot wait for itself
    const auto ended = [this] { return !m_running; };
    if (timeoutMs == INFINITE) m_ended.wait(lock, ended);
    else if (!m_ended.wait_for(lock, std::chrono::milliseconds(timeoutMs), ended)) return false;
    if (m_joinable) {
        m_joinable = false;
        const pthread_t thread = m_thread;
        lock.unlock();
        pthread_join(thread, nullptr);  // the routine has returned: this is quick
    }
    return true;
}

bool VX_CThread::IsRunFlagSet() const {
    std::lock_guard lock(m_lock);
    return m_runFlag;
}

void* VX_CThread::GetParameter() const {
    std::lock_guard lock(m_lock);
    return m_parameter;
}

bool VX_CThread::IsRunning() const {
    std::lock_guard lock(m_lock);
    return m_running;
}

DWORD VX_CThread::GetExitCode() const {
    std::lock_guard lock(m_lock);
    return m_exitCode;
}
