#include "tarvo/RemoteControl.h"

#include "automation/dispatch_call.h"
#include "automation/rot.h"

namespace tarvo {

namespace {

CComVariant VariantList(const std::vector<CComVariant>& items) {
    CComVariant list;
    SAFEARRAY* array = SafeArrayCreateVector(VT_VARIANT, 0, static_cast<std::uint32_t>(items.size()));
    if (!array) return list;
    for (LONG i = 0; i < static_cast<LONG>(items.size()); ++i)
        SafeArrayPutElement(array, &i, &items[static_cast<size_t>(i)]);
    list.vt = VT_ARRAY | VT_VARIANT;
    list.parray = array;
    return list;
}

const VARIANT* Elements(const VARIANT& v) {
    return v.vt == (VT_ARRAY | VT_VARIANT) && v.parray ? static_cast<const VARIANT*>(v.parray->pvData) : nullptr;
}

std::u16string TextOf(const VARIANT& v) { return v.vt == VT_BSTR && v.bstrVal ? v.bstrVal : u""; }

int Low(ULONGLONG status) { return static_cast<int>(static_cast<std::uint32_t>(status)); }
int High(ULONGLONG status) { return static_cast<int>(static_cast<std::uint32_t>(status >> 32)); }

}  // namespace

CComPtr<IDispatch> RemoteControl::Find() {
    CComPtr<IUnknown> unknown;
    CComPtr<IDispatch> control;
    if (SUCCEEDED(GetActiveObject(CLSID_TarvoControl, unknown.Receive())))
        unknown.QueryInterface(IID_IDispatch, control);
    return control;
}

template <typename... Args>
CComVariant RemoteControl::Call(DISPID member, const Args&... args) {
    CComVariant result;
    m_status = m_control ? CallMethod(m_control.Get(), member, &result, args...) : E_POINTER;
    if (FAILED(m_status)) result.Clear();
    return result;
}

bool RemoteControl::CallForTrue(const CComVariant& result) const {
    return SUCCEEDED(m_status) && result.vt == VT_BOOL && result.boolVal != VARIANT_FALSE;
}

bool RemoteControl::SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT& value) {
    return CallForTrue(Call(control::SetValue, project, variable, value));
}

bool RemoteControl::SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT& value,
                             ULONGLONG status, DATE time) {
    return CallForTrue(Call(control::SetValueFull, project, variable, value, Low(status), High(status), time));
}

bool RemoteControl::SetStatus(const std::u16string& project, const std::u16string& variable, ULONGLONG status) {
    return CallForTrue(Call(control::SetStatus, project, variable, Low(status), High(status)));
}

bool RemoteControl::SetProjectActive(const std::u16string& project, bool active) {
    return CallForTrue(Call(control::SetProjectActive, project, active));
}

bool RemoteControl::FireRawBulkChange(const std::u16string& project, const std::u16string& container,
                                      const std::vector<CComVariant>& args, bool byReference) {
    return CallForTrue(Call(control::FireRawBulkChange, project, container, VariantList(args), byReference));
}

bool RemoteControl::SetRaiseError(ObjectKind object, DISPID member, bool on) {
    Call(control::SetRaiseError, static_cast<int>(object), static_cast<int>(member), on);
    return SUCCEEDED(m_status);
}

bool RemoteControl::SetRefusedName(const std::u16string& variable, bool on) {
    Call(control::SetRefusedName, variable, on);
    return SUCCEEDED(m_status);
}

bool RemoteControl::SetStartFails(bool on) {
    Call(control::SetStartFails, on);
    return SUCCEEDED(m_status);
}

bool RemoteControl::SetAdviseFails(bool on) {
    Call(control::SetAdviseFails, on);
    return SUCCEEDED(m_status);
}

bool RemoteControl::SetProjectLookupFails(bool on) {
    Call(control::SetLookupFails, on);
    return SUCCEEDED(m_status);
}

bool RemoteControl::ClearFaults() {
    Call(control::ClearFaults);
    return SUCCEEDED(m_status);
}

std::vector<ContainerInfo> RemoteControl::Containers(const std::u16string& project) {
    std::vector<ContainerInfo> list;
    const CComVariant result = Call(control::Containers, project);
    const VARIANT* items = Elements(result);
    for (std::uint32_t i = 0; items && i < result.parray->cElements; ++i) {
        const VARIANT* fields = Elements(items[i]);
        const std::uint32_t count = fields ? items[i].parray->cElements : 0;
        if (count < 3) continue;
        ContainerInfo info{TextOf(fields[0]),
                           {},
                           fields[1].vt == VT_BOOL && fields[1].boolVal != VARIANT_FALSE,
                           fields[2].vt == VT_I4 ? static_cast<size_t>(fields[2].lVal) : 0};
        for (std::uint32_t k = 3; k < count; ++k) info.variables.push_back(TextOf(fields[k]));
        list.push_back(std::move(info));
    }
    return list;
}

std::optional<LONG> RemoteControl::VariableId(const std::u16string& project, const std::u16string& variable) {
    const CComVariant result = Call(control::VariableId, project, variable);
    if (result.vt != VT_I4) return std::nullopt;
    return result.lVal;
}

size_t RemoteControl::ProjectSinks(const std::u16string& project) {
    const CComVariant result = Call(control::ProjectSinks, project);
    return result.vt == VT_I4 ? static_cast<size_t>(result.lVal) : 0;
}

long RemoteControl::LiveObjects() {
    const CComVariant result = Call(control::LiveObjects);
    return result.vt == VT_I4 ? result.lVal : -1;
}

bool RemoteControl::SetDelivery(Delivery delivery) {
    Call(control::SetDelivery, delivery == Delivery::CallerThread);
    return SUCCEEDED(m_status);
}

bool RemoteControl::SetSimulationPaused(bool paused) {
    Call(control::SetPaused, paused);
    return SUCCEEDED(m_status);
}

bool RemoteControl::Tick() { return CallForTrue(Call(control::Tick)); }

bool RemoteControl::Flush() {
    Call(control::Flush);
    return SUCCEEDED(m_status);
}

}  // namespace tarvo
