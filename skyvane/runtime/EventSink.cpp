#include "runtime/EventSink.h"

#include "automation/connection.h"

#include <algorithm>

HRESULT CEventSinkDispatch::Invoke(DISPID member, WORD, DISPPARAMS* params, VARIANT*, EXCEPINFO*) {
    const auto self = std::this_thread::get_id();
    IEventHandler* handler;
    {
        std::lock_guard<std::mutex> gate(m_gate);
        handler = m_handler;
        if (!handler) return S_OK;
        m_callers.push_back(self);
    }
    DISPPARAMS none{nullptr, nullptr, 0, 0};
    if (!params || (params->cArgs && !params->rgvarg)) params = &none;
    try {
        handler->OnEvent(member, DispatchArgs(*params));
    } catch (...) {
        // An event handler's failure stays here: the runtime's thread must go on.
    }
    {
        std::lock_guard<std::mutex> gate(m_gate);
        m_callers.erase(std::find(m_callers.begin(), m_callers.end(), self));
    }
    m_callEnded.notify_all();
    return S_OK;
}

void CEventSinkDispatch::Disconnect() {
    const auto self = std::this_thread::get_id();
    std::unique_lock<std::mutex> gate(m_gate);
    m_handler = nullptr;
    // A call on this very thread (the handler disconnecting itself) is not waited for.
    m_callEnded.wait(gate, [&] {
        return std::all_of(m_callers.begin(), m_callers.end(), [&](std::thread::id t) { return t == self; });
    });
}

IUnknown* CEventSinkDispatch::FindInterface(REFIID iid) {
    if (iid == m_events) return static_cast<IDispatch*>(this);
    return CDispatchObject::FindInterface(iid);
}

XEvents::~XEvents() {
    Unadvise();
    DropDispatch();
}

DWORD XEvents::Advise(IDispatch* source) {
    // A connection whose sink was cut off (its Unadvise failed) is stale: forget it.
    if (m_dwCookie != 0 && m_pDispatch) return m_dwCookie;
    m_dwCookie = 0;
    m_pSource.Release();
    if (!source) return 0;

    m_iidEvents = GetEventIID();
    CComPtr<IConnectionPointContainer> container;
    CComPtr<IConnectionPoint> point;
    if (FAILED(source->QueryInterface(IID_IConnectionPointContainer, container.ReceiveVoid())) || !container ||
        FAILED(container->FindConnectionPoint(m_iidEvents, point.Receive())) || !point) {
        return 0;
    }
    auto dispatch = MakeComObject<CEventSinkDispatch>(m_iidEvents, static_cast<IEventHandler*>(this));
    DWORD cookie = 0;
    if (FAILED(point->Advise(static_cast<IDispatch*>(dispatch.Get()), &cookie)) || cookie == 0) {
        dispatch->Disconnect();
        return 0;
    }
    m_pDispatch = dispatch;
    m_pSource = source;
    m_dwCookie = cookie;
    return m_dwCookie;
}

bool XEvents::Unadvise() {
    if (m_dwCookie != 0 && m_pSource) {
        CComPtr<IConnectionPointContainer> container;
        CComPtr<IConnectionPoint> point;
        if (SUCCEEDED(m_pSource->QueryInterface(IID_IConnectionPointContainer, container.ReceiveVoid())) && container &&
            SUCCEEDED(container->FindConnectionPoint(m_iidEvents, point.Receive())) && point &&
            SUCCEEDED(point->Unadvise(m_dwCookie))) {
            m_dwCookie = 0;
        }
    }
    // Whatever the runtime answered, no event reaches the handler from now on.
    DropDispatch();
    return m_dwCookie == 0;
}

void XEvents::DropDispatch() {
    if (m_pDispatch) {
        m_pDispatch->Disconnect();
        m_pDispatch.Release();
    }
}
