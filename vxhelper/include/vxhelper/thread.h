#pragma once
// A worker thread with a run flag: the routine runs while the flag is set,
// EndThread clears it and waits for the routine to end.
//
//   DWORD Work(VX_CThread* thread) {
//       auto* self = static_cast<Worker*>(thread->GetParameter());
//       while (thread->IsRunFlagSet()) { ...; Sleep(10); }
//       return 0;
//   }
//   worker.BeginThread(Work, this);  ...  worker.EndThread(INFINITE);

#include "platform/types.h"

#include <condition_variable>
#include <mutex>
#include <pthread.h>

class VX_CThread {
public:
    using Routine = DWORD (*)(VX_CThread* thread);

    VX_CThread() = default;
    // Ends a running routine and waits for it without limit.
    ~VX_CThread();
    VX_CThread(const VX_CThread&) = delete;
    VX_CThread& operator=(const VX_CThread&) = delete;

    // Starts routine on a new thread with the run flag set. stackSize 0 takes
    // the system default; priority and flags are accepted for the record (a
    // normal thread cannot raise its priority here). False when a routine is
    // still running or the thread cannot be created.
    bool BeginThread(Routine routine, void* parameter, int priority = 0, UINT stackSize = 0, DWORD flags = 0,
                     void* security = nullptr);

    // Clears the run flag and waits up to timeoutMs (INFINITE: without limit)
    // for the routine to end. True when no routine is running any more; false
    // when it is still running at the time-out (a later EndThread waits again).
    bool EndThread(DWORD timeoutMs = INFINITE);

    // Read by the routine: false once a stop has been requested.
    bool IsRunFlagSet() const;
    void* GetParameter() const;
    // True from BeginThread until the routine has returned.
    bool IsRunning() const;
    // What the routine returned last (0 before its first end).
    DWORD GetExitCode() const;

private:
    static void* Trampoline(void* self);

    mutable std::mutex m_lock;        // guards every member below
    std::condition_variable m_ended;  // signalled when the routine returns
    pthread_t m_thread{};
    bool m_joinable = false;  // a thread was created and not yet joined
    bool m_running = false;   // the routine has not returned yet
    bool m_runFlag = false;
    Routine m_routine = nullptr;
    void* m_parameter = nullptr;
    DWORD m_exitCode = 0;
};
