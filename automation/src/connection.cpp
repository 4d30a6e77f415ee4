#include "automation/connection.h"

#include <algorithm>

CComPtr<CConnectionPoint> CConnectionPoint::Create(REFIID events, AdviseGate gate) {
    return CComPtr<CConnectionPoint>::Adopt(new CConnectionPoint(events, std::move(gate)));
}

CConnectionPoint::CConnectionPoint(REFIID events, AdviseGate gate) : m_events(events), m_gate(std::move(gate)) {}

CConnectionPoint::~CConnectionPoint() = default;

HRESULT CConnectionPoint::QueryInterface(REFIID iid, void** object) {
    if (!object) return E_POINTER;
    *object = nullptr;
    if (!(iid == IID_IUnknown || iid == IID_IConnectionPoint)) return E_NOINTERFACE;
    AddRef();
    *object = static_cast<IConnectionPoint*>(this);
    return S_OK;
}

ULONG CConnectionPoint::AddRef() { return m_refs.fetch_add(1, std::memory_order_relaxed) + 1; }

ULONG CConnectionPoint::Release() {
    const ULONG left = m_refs.fetch_sub(1, std::memory_order_acq_rel) - 1;
    if (left == 0) delete this;
    return left;
}

HRESULT CConnectionPoint::GetConnectionInterface(IID* events) {
    if (!events) return E_POINTER;
    *events = m_events;
    return S_OK;
}

HRESULT CConnectionPoint::Advise(IUnknown* sink, DWORD* cookie) {
    if (!cookie) return E_POINTER;
    *cookie = 0;
    if (!sink) return E_POINTER;
    if (m_gate) {
        if (const HRESULT hr = m_gate(); FAILED(hr)) return hr;
    }
    // Ask the sink for its event dispatch outside the lock: that is a call into client code.
    CComPtr<IDispatch> dispatch;
    if (FAILED(sink->QueryInterface(m_events, dispatch.ReceiveVoid())) || !dispatch) return CONNECT_E_CANNOTCONNECT;

    auto connection = std::make_shared<Connection>();
    connection->sink = std::move(dispatch);
    std::lock_guard lock(m_lock);
    if (m_closed) return CONNECT_E_CANNOTCONNECT;
    connection->cookie = m_nextCookie++;
    if (m_nextCookie == 0) m_nextCookie = 1;  // 0 means "not advised" to clients
    m_connections.push_back(connection);
    *cookie = connection->cookie;
    return S_OK;
}

CComPtr<IDispatch> CConnectionPoint::EndConnection(std::unique_lock<std::mutex>& lock, Connection& connection) {
    const auto self = std::this_thread::get_id();
    m_callEnded.wait(lock, [&] {
        return std::all_of(connection.callers.begin(), connection.callers.end(), [&](auto id) { return id == self; });
    });
    return std::move(connection.sink);
}

HRESULT CConnectionPoint::Unadvise(DWORD cookie) {
    CComPtr<IDispatch> released;  // goes after the lock, on this thread
    std::unique_lock lock(m_lock);
    const auto it = std::find_if(m_connections.begin(), m_connections.end(),
                                 [cookie](const auto& c) { return c->cookie == cookie; });
    if (cookie == 0 || it == m_connections.end()) return CONNECT_E_NOCONNECTION;
    const std::shared_ptr<Connection> connection = *it;
    m_connections.erase(it);
    released = EndConnection(lock, *connection);
    return S_OK;
}

void CConnectionPoint::Close() {
    std::vector<CComPtr<IDispatch>> released;  // go after the lock, on this thread
    std::unique_lock lock(m_lock);
    m_closed = true;
    const auto connections = std::move(m_connections);
    m_connections.clear();
    for (const auto& connection : connections) released.push_back(EndConnection(lock, *connection));
}

size_t CConnectionPoint::ConnectionCount() const {
    std::lock_guard lock(m_lock);
    return m_connections.size();
}

bool CConnectionPoint::CallSink(const std::shared_ptr<Connection>& connection, DISPID member, DISPPARAMS* params) {
    CComPtr<IDispatch> sink;
    {
        std::lock_guard lock(m_lock);
        if (!connection->sink) return false;  // unadvised since the snapshot
        sink = connection->sink;
        connection->callers.push_back(std::this_thread::get_id());
    }
    try {
        sink->Invoke(member, DISPATCH_METHOD, params, nullptr, nullptr);
    } catch (...) {
        // An exception must not cross into the source; the connection stays usable.
    }
    // Drop our reference before Unadvise may release the connection's: the
    // last release then happens on the unadvising thread, unless the sink
    // unadvised itself during this call.
    sink.Release();
    {
        std::lock_guard lock(m_lock);
        auto& callers = connection->callers;
        callers.erase(std::find(callers.begin(), callers.end(), std::this_thread::get_id()));
    }
    m_callEnded.notify_all();
    return true;
}

size_t CConnectionPoint::Fire(DISPID member, DISPPARAMS* params) {
    std::vector<std::shared_ptr<Connection>> snapshot;
    {
        std::lock_guard lock(m_lock);
        snapshot = m_connections;
    }
    size_t called = 0;
    for (const auto& connection : snapshot) {
        if (CallSink(connection, member, params)) ++called;
    }
    return called;
}
