#pragma once
// Connection-point event sinks of the runtime link.
//
// The runtime holds its reference on a small dispatch object of its own
// (CEventSinkDispatch), not on the watcher that handles the events. Unadvise
// cuts that object off from its handler and waits for calls in progress on
// other threads, so an event that arrives late, or a runtime that keeps the
// sink, can never reach an object that is gone.

#include "automation/comptr.h"
#include "automation/dispatch_object.h"
#include "platform/object.h"

#include <condition_variable>
#include <mutex>
#include <thread>
#include <vector>

class IEventHandler {
public:
    virtual void OnEvent(DISPID member, const DispatchArgs& args) = 0;

protected:
    ~IEventHandler() = default;
};

class CEventSinkDispatch final : public CDispatchObject {
public:
    CEventSinkDispatch(REFIID events, IEventHandler* handler) : m_events(events), m_handler(handler) {}

    // Hands an event to the handler while one is connected; never throws.
    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override;
    // After this returns, the handler is not called any more, and no call is
    // in progress on another thread.
    void Disconnect();

protected:
    IUnknown* FindInterface(REFIID iid) override;

private:
    const IID m_events;
    std::mutex m_gate;  // guards m_handler and m_callers
    std::condition_variable m_callEnded;
    IEventHandler* m_handler;
    std::vector<std::thread::id> m_callers;  // threads inside the handler right now
};

// A sink advised on one source object's connection point for one event interface.
class XEvents : public CObject, protected IEventHandler {
public:
    ~XEvents() override;

    // Advises the sink on source; returns the cookie (0 = failed). A sink that
    // is already advised returns its cookie and advises nothing.
    virtual DWORD Advise(IDispatch* source);
    // Ends the connection; true when no connection is left.
    virtual bool Unadvise();
    virtual IID GetEventIID() const = 0;

    DWORD GetCookie() const { return m_dwCookie; }

protected:
    CComPtr<IDispatch> m_pSource;  // advised source, kept from Advise until advised anew or destroyed
    DWORD m_dwCookie = 0;          // 0 = not advised
    IID m_iidEvents{};

private:
    void DropDispatch();

    CComPtr<CEventSinkDispatch> m_pDispatch;  // what the runtime calls; null while not advised
};
