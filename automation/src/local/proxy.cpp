#include "local/proxy.h"

#include "automation/error.h"

#include <algorithm>

using namespace automation_wire;

namespace {
std::atomic<long> g_proxies{0};
}  // namespace

void CountProxy(int change) { g_proxies.fetch_add(change, std::memory_order_relaxed); }
long LocalSocketProxyCount() { return g_proxies.load(std::memory_order_relaxed); }

CDispatchProxy::CDispatchProxy(std::shared_ptr<CChannel> channel, std::uint64_t id)
    : m_channel(std::move(channel)), m_id(id) {
    CountProxy(1);
}

CDispatchProxy::~CDispatchProxy() {
    m_channel->SendRelease(m_id);
    CountProxy(-1);
}

ULONG CDispatchProxy::Release() {
    const ULONG left = m_refs.fetch_sub(1, std::memory_order_acq_rel) - 1;
    if (left == 0) delete this;
    return left;
}

bool CDispatchProxy::RemoteAnswers(REFIID iid) {
    {
        std::lock_guard lock(m_lock);
        if (std::find(m_answered.begin(), m_answered.end(), iid) != m_answered.end()) return true;
    }
    const HRESULT hr = m_channel->Call(Op::QueryInterface, [&](Writer& w, std::vector<std::uint64_t>&) {
        w.U64(m_id);
        w.Guid(iid);
        return S_OK;
    });
    if (FAILED(hr)) return false;
    std::lock_guard lock(m_lock);
    m_answered.push_back(iid);
    return true;
}

HRESULT CDispatchProxy::QueryInterface(REFIID iid, void** object) {
    if (!object) return E_POINTER;
    *object = nullptr;
    if (iid == IID_IUnknown || iid == IID_IDispatch) {
        *object = static_cast<IDispatch*>(this);
    } else if (iid == IID_IConnectionPoint || !RemoteAnswers(iid)) {  // connection points have proxies of their own
        return E_NOINTERFACE;
    } else if (iid == IID_IConnectionPointContainer) {
        *object = static_cast<IConnectionPointContainer*>(this);
    } else {
        *object = static_cast<IDispatch*>(this);  // the remote ends only serve dispatch interfaces
    }
    AddRef();
    return S_OK;
}

HRESULT CDispatchProxy::Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) {
    if (result) VariantInit(result);
    DISPPARAMS none{nullptr, nullptr, 0, 0};
    if (!params) params = &none;
    if (params->cNamedArgs != 0) return DISP_E_NONAMEDARGS;
    if (params->cArgs > kMaxArgs) return DISP_E_BADPARAMCOUNT;
    if (params->cArgs && !params->rgvarg) return E_INVALIDARG;
    return m_channel->Call(
        Op::Invoke,
        [&](Writer& w, std::vector<std::uint64_t>& exported) {
            w.U64(m_id);
            w.I32(member);
            w.U16(flags);
            w.U8(result ? 1 : 0);
            w.U32(params->cArgs);
            for (UINT i = 0; i < params->cArgs; ++i) {
                if (const HRESULT hr = WriteVariant(w, params->rgvarg[i], *m_channel, true, exported); FAILED(hr))
                    return hr;
            }
            return S_OK;
        },
        [&](HRESULT status, Reader& r) {
            if (SUCCEEDED(status) && result) {
                CComVariant value;
                if (!ReadVariant(r, &value, *m_channel)) return false;
                value.Detach(result);
            }
            if (status == DISP_E_EXCEPTION) {
                EXCEPINFO info{0, nullptr, nullptr, 0};
                std::int32_t scode = 0;
                const bool ok = r.U16(&info.wCode) && r.I32(&scode) && ReadText(r, &info.bstrSource) &&
                                ReadText(r, &info.bstrDescription);
                info.scode = scode;
                if (ok && exception) {
                    ClearExcepInfo(exception);
                    *exception = info;
                } else {
                    ClearExcepInfo(&info);
                }
                return ok;
            }
            return true;
        });
}

HRESULT CDispatchProxy::FindConnectionPoint(REFIID events, IConnectionPoint** point) {
    if (!point) return E_POINTER;
    *point = nullptr;
    std::uint64_t id = 0;
    const HRESULT hr = m_channel->Call(
        Op::FindConnectionPoint,
        [&](Writer& w, std::vector<std::uint64_t>&) {
            w.U64(m_id);
            w.Guid(events);
            return S_OK;
        },
        [&](HRESULT, Reader& r) { return r.U64(&id); });
    if (SUCCEEDED(hr) && id == 0) return E_UNEXPECTED;
    if (FAILED(hr)) {
        if (id) m_channel->SendRelease(id);
        return hr;
    }
    *point = new CConnectionPointProxy(m_channel, id, events);
    return S_OK;
}

CConnectionPointProxy::CConnectionPointProxy(std::shared_ptr<CChannel> channel, std::uint64_t id, REFIID events)
    : m_channel(std::move(channel)), m_id(id), m_events(events) {
    CountProxy(1);
}

CConnectionPointProxy::~CConnectionPointProxy() {
    m_channel->SendRelease(m_id);
    CountProxy(-1);
}

ULONG CConnectionPointProxy::Release() {
    const ULONG left = m_refs.fetch_sub(1, std::memory_order_acq_rel) - 1;
    if (left == 0) delete this;
    return left;
}

HRESULT CConnectionPointProxy::QueryInterface(REFIID iid, void** object) {
    if (!object) return E_POINTER;
    *object = nullptr;
    if (!(iid == IID_IUnknown || iid == IID_IConnectionPoint)) return E_NOINTERFACE;
    AddRef();
    *object = static_cast<IConnectionPoint*>(this);
    return S_OK;
}

HRESULT CConnectionPointProxy::GetConnectionInterface(IID* events) {
    if (!events) return E_POINTER;
    *events = m_events;
    return S_OK;
}

HRESULT CConnectionPointProxy::Advise(IUnknown* sink, DWORD* cookie) {
    if (!cookie) return E_POINTER;
    *cookie = 0;
    if (!sink) return E_POINTER;
    // The sink's event interface is taken here, so the server calls exactly that.
    CComPtr<IDispatch> dispatch;
    if (FAILED(sink->QueryInterface(m_events, dispatch.ReceiveVoid())) || !dispatch) return CONNECT_E_CANNOTCONNECT;
    std::uint32_t given = 0;
    const HRESULT hr = m_channel->Call(
        Op::Advise,
        [&](Writer& w, std::vector<std::uint64_t>& exported) {
            w.U64(m_id);
            const std::uint64_t sinkId = m_channel->Export(dispatch.Get(), true);
            exported.push_back(sinkId);
            w.U64(sinkId);
            return S_OK;
        },
        [&](HRESULT, Reader& r) { return r.U32(&given); });
    if (FAILED(hr)) return hr;
    *cookie = given;
    return S_OK;
}

HRESULT CConnectionPointProxy::Unadvise(DWORD cookie) {
    return m_channel->Call(Op::Unadvise, [&](Writer& w, std::vector<std::uint64_t>&) {
        w.U64(m_id);
        w.U32(cookie);
        return S_OK;
    });
}
