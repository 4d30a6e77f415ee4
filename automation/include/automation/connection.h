#pragma once
// Connection points: how an automation object calls back into its clients.
//
// A client finds the source's connection point for an event interface id
// (IConnectionPointContainer::FindConnectionPoint) and advises its sink there;
// the sink must answer QueryInterface for that event interface id with an
// IDispatch, through which the source calls it. Unadvise ends the connection.

#include "automation/comptr.h"
#include "automation/dispatch.h"

#include <atomic>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

constexpr IID IID_IConnectionPointContainer = {0xB196B284,
                                               0xBAB4,
                                               0x101A,
                                               {0xB6, 0x9C, 0x00, 0xAA, 0x00, 0x34, 0x1D, 0x07}};
constexpr IID IID_IConnectionPoint = {0xB196B286, 0xBAB4, 0x101A, {0xB6, 0x9C, 0x00, 0xAA, 0x00, 0x34, 0x1D, 0x07}};

class IConnectionPoint;

class IConnectionPointContainer : public IUnknown {
public:
    // S_OK with a referenced connection point, or CONNECT_E_NOCONNECTION when
    // the object has none for that event interface.
    virtual HRESULT FindConnectionPoint(REFIID events, IConnectionPoint** point) = 0;

protected:
    ~IConnectionPointContainer() = default;
};

class IConnectionPoint : public IUnknown {
public:
    virtual HRESULT GetConnectionInterface(IID* events) = 0;
    // Advises a sink; the cookie (never 0) names the connection for Unadvise.
    virtual HRESULT Advise(IUnknown* sink, DWORD* cookie) = 0;
    // CONNECT_E_NOCONNECTION for a cookie that names no connection.
    virtual HRESULT Unadvise(DWORD cookie) = 0;

protected:
    ~IConnectionPoint() = default;
};

// A ready-made connection point for a source object: keeps the advised sinks
// and calls them. Any thread may advise, unadvise and fire at the same time.
//
// Guarantees:
// - Fire calls each sink without holding any lock, with a reference of its own
//   on the sink for the duration of the call.
// - When Unadvise (or Close) returns, no call into that sink is running on
//   another thread and none will start, and the connection's reference on the
//   sink has been released on the calling thread. A sink may unadvise itself
//   from inside its own call (that call is not waited for). A sink's handler
//   must therefore not wait for the thread that unadvises it.
class CConnectionPoint final : public IConnectionPoint {
public:
    // Consulted before every Advise; a failure refuses the advise with that status.
    using AdviseGate = std::function<HRESULT()>;

    static CComPtr<CConnectionPoint> Create(REFIID events, AdviseGate gate = {});

    HRESULT QueryInterface(REFIID iid, void** object) override;
    ULONG AddRef() override;
    ULONG Release() override;
    HRESULT GetConnectionInterface(IID* events) override;
    HRESULT Advise(IUnknown* sink, DWORD* cookie) override;
    HRESULT Unadvise(DWORD cookie) override;

    // Calls Invoke(member, DISPATCH_METHOD, params) on every sink advised when
    // the call starts; results of the sinks are ignored. Returns the number of
    // sinks called.
    size_t Fire(DISPID member, DISPPARAMS* params);
    size_t ConnectionCount() const;
    // Ends every connection (as Unadvise does) and refuses later advises with
    // CONNECT_E_CANNOTCONNECT: the source is gone.
    void Close();

private:
    struct Connection {
        DWORD cookie = 0;
        CComPtr<IDispatch> sink;               // empty once the connection ended
        std::vector<std::thread::id> callers;  // threads calling the sink right now
    };

    CConnectionPoint(REFIID events, AdviseGate gate);
    ~CConnectionPoint();
    // Waits (lock held by the caller) until no other thread calls the connection's
    // sink, then takes the sink out for release outside the lock.
    CComPtr<IDispatch> EndConnection(std::unique_lock<std::mutex>& lock, Connection& connection);
    bool CallSink(const std::shared_ptr<Connection>& connection, DISPID member, DISPPARAMS* params);

    std::atomic<ULONG> m_refs{1};
    const IID m_events;
    const AdviseGate m_gate;

    mutable std::mutex m_lock;            // guards m_connections, m_nextCookie, m_closed and every Connection's fields
    std::condition_variable m_callEnded;  // signalled under m_lock when a sink call returns
    std::vector<std::shared_ptr<Connection>> m_connections;
    DWORD m_nextCookie = 1;
    bool m_closed = false;
};
