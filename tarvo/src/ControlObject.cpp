// The runtime's control operations as an automation object, so that tools in
// other processes drive a runtime the way tests drive it in process.
#include "tarvo/Control.h"
#include "tarvo/ControlIds.h"

#include "automation/dispatch_object.h"

namespace tarvo {

namespace {

void ReturnBool(VARIANT* result, bool value) {
    result->vt = VT_BOOL;
    result->boolVal = value ? VARIANT_TRUE : VARIANT_FALSE;
}

void ReturnLong(VARIANT* result, long value) {
    result->vt = VT_I4;
    result->lVal = static_cast<LONG>(value);
}

// A variant array built from owned variants.
HRESULT ReturnArray(VARIANT* result, const std::vector<CComVariant>& items) {
    SAFEARRAY* array = SafeArrayCreateVector(VT_VARIANT, 0, static_cast<std::uint32_t>(items.size()));
    if (!array) return E_OUTOFMEMORY;
    for (LONG i = 0; i < static_cast<LONG>(items.size()); ++i)
        SafeArrayPutElement(array, &i, &items[static_cast<size_t>(i)]);
    result->vt = VT_ARRAY | VT_VARIANT;
    result->parray = array;
    return S_OK;
}

class CControlObject final : public CDispatchObject {
public:
    explicit CControlObject(Runtime& runtime) : m_runtime(runtime) {}

    HRESULT Invoke(DISPID member, WORD flags, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override {
        return InvokeFromTable(this, kMembers, member, flags, params, result, exception);
    }

private:
    // Reads text and whole-number arguments in order; a failure status for the first that does not fit.
    struct Reader {
        const DispatchArgs& args;
        HRESULT status = S_OK;
        std::u16string Text(UINT i) {
            std::u16string text;
            if (SUCCEEDED(status)) status = args.GetText(i, &text);
            return text;
        }
        LONG Long(UINT i) {
            LONG value = 0;
            if (SUCCEEDED(status)) status = args.GetInteger(i, &value);
            return value;
        }
        bool Flag(UINT i) { return Long(i) != 0; }
        ULONGLONG Status(UINT low) {
            const auto lo = static_cast<ULONGLONG>(static_cast<std::uint32_t>(Long(low)));
            const auto hi = static_cast<ULONGLONG>(static_cast<std::uint32_t>(Long(low + 1)));
            return lo | (hi << 32);
        }
    };

    HRESULT SetValue(const DispatchArgs& args, VARIANT* result) {
        Reader r{args};
        const auto project = r.Text(0), variable = r.Text(1);
        if (FAILED(r.status)) return r.status;
        ReturnBool(result, m_runtime.SetValue(project, variable, args[2]));
        return S_OK;
    }
    HRESULT SetValueFull(const DispatchArgs& args, VARIANT* result) {
        Reader r{args};
        const auto project = r.Text(0), variable = r.Text(1);
        const ULONGLONG status = r.Status(3);
        double time = 0;
        const VARIANT& t = args[5];
        if (t.vt == VT_R8 || t.vt == VT_DATE) time = t.dblVal;
        else if (SUCCEEDED(r.status)) r.status = DISP_E_TYPEMISMATCH;
        if (FAILED(r.status)) return r.status;
        ReturnBool(result, m_runtime.SetValue(project, variable, args[2], status, time));
        return S_OK;
    }
    HRESULT SetStatus(const DispatchArgs& args, VARIANT* result) {
        Reader r{args};
        const auto project = r.Text(0), variable = r.Text(1);
        const ULONGLONG status = r.Status(2);
        if (FAILED(r.status)) return r.status;
        ReturnBool(result, m_runtime.SetStatus(project, variable, status));
        return S_OK;
    }
    HRESULT SetProjectActive(const DispatchArgs& args, VARIANT* result) {
        Reader r{args};
        const auto project = r.Text(0);
        const bool active = r.Flag(1);
        if (FAILED(r.status)) return r.status;
        ReturnBool(result, m_runtime.SetProjectActive(project, active));
        return S_OK;
    }
    HRESULT FireRawBulkChange(const DispatchArgs& args, VARIANT* result) {
        Reader r{args};
        const auto project = r.Text(0), container = r.Text(1);
        const bool byReference = r.Flag(3);
        if (FAILED(r.status)) return r.status;
        const VARIANT& list = args[2];
        if (list.vt != (VT_ARRAY | VT_VARIANT) || !list.parray) return DISP_E_TYPEMISMATCH;
        std::vector<CComVariant> eventArgs;
        for (std::uint32_t i = 0; i < list.parray->cElements; ++i)
            eventArgs.emplace_back(static_cast<const VARIANT*>(list.parray->pvData)[i]);
        ReturnBool(result, m_runtime.FireRawBulkChange(project, container, eventArgs, byReference));
        return S_OK;
    }
    HRESULT SetRaiseError(const DispatchArgs& args, VARIANT*) {
        Reader r{args};
        const LONG kind = r.Long(0), member = r.Long(1);
        const bool on = r.Flag(2);
        if (FAILED(r.status)) return r.status;
        if (kind < 0 || kind > static_cast<LONG>(ObjectKind::Container)) return E_INVALIDARG;
        m_runtime.SetRaiseError(static_cast<ObjectKind>(kind), member, on);
        return S_OK;
    }
    HRESULT SetRefusedName(const DispatchArgs& args, VARIANT*) {
        Reader r{args};
        const auto name = r.Text(0);
        const bool on = r.Flag(1);
        if (FAILED(r.status)) return r.status;
        m_runtime.SetRefusedName(name, on);
        return S_OK;
    }
    template <void (Runtime::*Switch)(bool)>
    HRESULT SetSwitch(const DispatchArgs& args, VARIANT*) {
        Reader r{args};
        const bool on = r.Flag(0);
        if (FAILED(r.status)) return r.status;
        (m_runtime.*Switch)(on);
        return S_OK;
    }
    HRESULT ClearFaults(const DispatchArgs&, VARIANT*) {
        m_runtime.ClearFaults();
        return S_OK;
    }
    HRESULT Containers(const DispatchArgs& args, VARIANT* result) {
        Reader r{args};
        const auto project = r.Text(0);
        if (FAILED(r.status)) return r.status;
        std::vector<CComVariant> list;
        for (const ContainerInfo& info : m_runtime.Containers(project)) {
            std::vector<CComVariant> item{CComVariant(std::u16string_view(info.name)), CComVariant(info.started),
                                          CComVariant(static_cast<int>(info.sinks))};
            for (const auto& name : info.variables) item.emplace_back(std::u16string_view(name));
            CComVariant packed;
            if (const HRESULT hr = ReturnArray(&packed, item); FAILED(hr)) return hr;
            list.push_back(std::move(packed));
        }
        return ReturnArray(result, list);
    }
    HRESULT VariableId(const DispatchArgs& args, VARIANT* result) {
        Reader r{args};
        const auto project = r.Text(0), variable = r.Text(1);
        if (FAILED(r.status)) return r.status;
        if (const auto id = m_runtime.VariableId(project, variable)) ReturnLong(result, *id);
        return S_OK;
    }
    HRESULT ProjectSinks(const DispatchArgs& args, VARIANT* result) {
        Reader r{args};
        const auto project = r.Text(0);
        if (FAILED(r.status)) return r.status;
        ReturnLong(result, static_cast<long>(m_runtime.ProjectSinks(project)));
        return S_OK;
    }
    HRESULT LiveObjects(const DispatchArgs&, VARIANT* result) {
        ReturnLong(result, Runtime::LiveObjects());
        return S_OK;
    }
    HRESULT SetDelivery(const DispatchArgs& args, VARIANT*) {
        Reader r{args};
        const bool callerThread = r.Flag(0);
        if (FAILED(r.status)) return r.status;
        m_runtime.SetDelivery(callerThread ? Delivery::CallerThread : Delivery::OwnThread);
        return S_OK;
    }
    HRESULT Tick(const DispatchArgs&, VARIANT* result) {
        ReturnBool(result, m_runtime.Tick());
        return S_OK;
    }
    HRESULT Flush(const DispatchArgs&, VARIANT*) {
        m_runtime.Flush();
        return S_OK;
    }

    static constexpr DispatchMember<CControlObject> kMembers[] = {
        {control::SetValue, DISPATCH_METHOD, 3, &CControlObject::SetValue},
        {control::SetValueFull, DISPATCH_METHOD, 6, &CControlObject::SetValueFull},
        {control::SetStatus, DISPATCH_METHOD, 4, &CControlObject::SetStatus},
        {control::SetProjectActive, DISPATCH_METHOD, 2, &CControlObject::SetProjectActive},
        {control::FireRawBulkChange, DISPATCH_METHOD, 4, &CControlObject::FireRawBulkChange},
        {control::SetRaiseError, DISPATCH_METHOD, 3, &CControlObject::SetRaiseError},
        {control::SetRefusedName, DISPATCH_METHOD, 2, &CControlObject::SetRefusedName},
        {control::SetStartFails, DISPATCH_METHOD, 1, &CControlObject::SetSwitch<&Runtime::SetStartFails>},
        {control::SetAdviseFails, DISPATCH_METHOD, 1, &CControlObject::SetSwitch<&Runtime::SetAdviseFails>},
        {control::SetLookupFails, DISPATCH_METHOD, 1, &CControlObject::SetSwitch<&Runtime::SetProjectLookupFails>},
        {control::ClearFaults, DISPATCH_METHOD, 0, &CControlObject::ClearFaults},
        {control::Containers, DISPATCH_METHOD, 1, &CControlObject::Containers},
        {control::VariableId, DISPATCH_METHOD, 2, &CControlObject::VariableId},
        {control::ProjectSinks, DISPATCH_METHOD, 1, &CControlObject::ProjectSinks},
        {control::LiveObjects, DISPATCH_METHOD, 0, &CControlObject::LiveObjects},
        {control::SetDelivery, DISPATCH_METHOD, 1, &CControlObject::SetDelivery},
        {control::SetPaused, DISPATCH_METHOD, 1, &CControlObject::SetSwitch<&Runtime::SetSimulationPaused>},
        {control::Tick, DISPATCH_METHOD, 0, &CControlObject::Tick},
        {control::Flush, DISPATCH_METHOD, 0, &CControlObject::Flush},
    };

    Runtime& m_runtime;
};

}  // namespace

CComPtr<IDispatch> Runtime::ControlObject() { return CComPtr<IDispatch>(MakeComObject<CControlObject>(*this)); }

}  // namespace tarvo
