#pragma once
// Drives a runtime stand-in through its control object (ControlIds.h), in
// this process or, through the local-socket transport, in another one. The
// operations mirror Runtime's; one that cannot reach the runtime reports
// failure (false, empty, -1) and leaves its status in LastStatus().

#include "tarvo/Control.h"
#include "tarvo/ControlIds.h"

namespace tarvo {

class RemoteControl {
public:
    explicit RemoteControl(CComPtr<IDispatch> control) : m_control(std::move(control)) {}
    // The control object that GetActiveObject finds; empty when none runs.
    static CComPtr<IDispatch> Find();

    bool SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT& value);
    bool SetValue(const std::u16string& project, const std::u16string& variable, const VARIANT& value, ULONGLONG status,
                  DATE time);
    bool SetStatus(const std::u16string& project, const std::u16string& variable, ULONGLONG status);
    bool SetProjectActive(const std::u16string& project, bool active);
    bool FireRawBulkChange(const std::u16string& project, const std::u16string& container,
                           const std::vector<CComVariant>& args, bool byReference = true);
    bool SetRaiseError(ObjectKind object, DISPID member, bool on = true);
    bool SetRefusedName(const std::u16string& variable, bool on = true);
    bool SetStartFails(bool on);
    bool SetAdviseFails(bool on);
    bool SetProjectLookupFails(bool on);
    bool ClearFaults();
    std::vector<ContainerInfo> Containers(const std::u16string& project);
    std::optional<LONG> VariableId(const std::u16string& project, const std::u16string& variable);
    size_t ProjectSinks(const std::u16string& project);
    long LiveObjects();
    bool SetDelivery(Delivery delivery);
    bool SetSimulationPaused(bool paused);
    bool Tick();
    bool Flush();

    HRESULT LastStatus() const { return m_status; }

private:
    template <typename... Args>
    CComVariant Call(DISPID member, const Args&... args);
    bool CallForTrue(const CComVariant& result) const;

    CComPtr<IDispatch> m_control;
    HRESULT m_status = S_OK;
};

}  // namespace tarvo
