#pragma once
// Proxies: local stand-ins for objects of the other end of a connection.
// Each holds one reference on its remote object and gives it back when it
// goes; after the connection is lost every call fails with
// RPC_E_DISCONNECTED and releasing stays safe.

#include "local/channel.h"

#include <atomic>

class CDispatchProxy final : public IDispatch, public IConnectionPointContainer {
public:
    CDispatchProxy(std::shared_ptr<CChannel> channel, std::uint64_t id);

    HRESULT QueryInterface(REFIID iid, void** object) override;
    ULONG AddRef() override { return m_refs.fetch_add(1, std::memory_order_relaxed) + 1; }
    ULONG Release() override;
    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override;
    HRESULT FindConnectionPoint(REFIID events, IConnectionPoint** point) override;

private:
    ~CDispatchProxy();
    bool RemoteAnswers(REFIID iid);

    std::atomic<ULONG> m_refs{1};
    const std::shared_ptr<CChannel> m_channel;
    const std::uint64_t m_id;
    std::mutex m_lock;            // guards m_answered
    std::vector<IID> m_answered;  // interface ids the remote object answered
};

class CConnectionPointProxy final : public IConnectionPoint {
public:
    CConnectionPointProxy(std::shared_ptr<CChannel> channel, std::uint64_t id, REFIID events);

    HRESULT QueryInterface(REFIID iid, void** object) override;
    ULONG AddRef() override { return m_refs.fetch_add(1, std::memory_order_relaxed) + 1; }
    ULONG Release() override;
    HRESULT GetConnectionInterface(IID* events) override;
    HRESULT Advise(IUnknown* sink, DWORD* cookie) override;
    HRESULT Unadvise(DWORD cookie) override;

private:
    ~CConnectionPointProxy();

    std::atomic<ULONG> m_refs{1};
    const std::shared_ptr<CChannel> m_channel;
    const std::uint64_t m_id;
    const IID m_events;
};

void CountProxy(int change);
