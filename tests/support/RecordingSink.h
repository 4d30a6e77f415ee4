#pragma once
// An event sink for tests: answers QueryInterface for one event interface id
// and records every call it gets (member, thread, a copy of the arguments in
// natural order with by-reference variants resolved).

#include "automation/comvariant.h"
#include "automation/dispatch_object.h"

#include <chrono>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

class RecordingSink final : public CDispatchObject {
public:
    struct Call {
        DISPID member;
        std::thread::id thread;
        std::vector<CComVariant> args;
    };

    explicit RecordingSink(const IID& events) : m_events(events) {}

    HRESULT Invoke(DISPID member, WORD, DISPPARAMS* params, VARIANT*, EXCEPINFO*) override {
        Call call{member, std::this_thread::get_id(), {}};
        if (params) {
            DispatchArgs args(*params);
            for (UINT i = 0; i < args.Count(); ++i) call.args.emplace_back(args[i]);
        }
        if (onCall) onCall(call);
        std::lock_guard lock(m_lock);
        m_calls.push_back(std::move(call));
        m_changed.notify_all();
        return S_OK;
    }

    // Waits up to the time-out until at least n calls arrived.
    bool WaitForCalls(size_t n, std::chrono::milliseconds timeout = std::chrono::seconds(5)) {
        std::unique_lock lock(m_lock);
        return m_changed.wait_for(lock, timeout, [&] { return m_calls.size() >= n; });
    }
    std::vector<Call> Calls() const {
        std::lock_guard lock(m_lock);
        return m_calls;
    }
    size_t CallCount() const {
        std::lock_guard lock(m_lock);
        return m_calls.size();
    }
    void ClearCalls() {
        std::lock_guard lock(m_lock);
        m_calls.clear();
    }
    ULONG RefCount() {
        AddRef();
        return Release();
    }

    std::function<void(const Call&)> onCall;  // set before advising; runs on the calling thread

protected:
    IUnknown* FindInterface(REFIID iid) override {
        if (iid == m_events) return static_cast<IDispatch*>(this);
        return CDispatchObject::FindInterface(iid);
    }

private:
    const IID m_events;
    mutable std::mutex m_lock;  // guards m_calls
    std::condition_variable m_changed;
    std::vector<Call> m_calls;
};
