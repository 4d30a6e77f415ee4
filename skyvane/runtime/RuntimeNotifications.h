#pragma once
// The record of one queued value change and the notification interfaces
// between the runtime link's objects and the bridge.

#include "platform/text.h"
#include "vxhelper/variant.h"

class CVarItem;

// One value change of one runtime variable, queued per project.
struct STarvoVarValue {
    VX_CVariant vValue;             // new value; VT_EMPTY when the event gave none
    DWORD dwId = 0;                 // runtime variable id
    ULONGLONG qwStatus = 0;         // high word from the event's high status, low from its low status
    double dTime = 0;               // time stamp, OLE DATE
    CVarItem** ppHolder = nullptr;  // holder cell of the variable, not owned
};

// Events of one watched project.
class IOnlProjectNotifications {
public:
    virtual ~IOnlProjectNotifications() = default;
    virtual void OnProjectInactive() = 0;
    virtual void OnProjectActive() = 0;
};

// Changes of one subscribed variable, from the runtime's event thread.
class IOnlVariablesNtf {
public:
    virtual ~IOnlVariablesNtf() = default;
    virtual void OnVariableChange(double dId, const VARIANT* pValue, double dStatusLow, double dStatusHigh,
                                  double dTime, CVarItem** ppHolder) = 0;
};

// What the per-project objects report to the bridge.
class IOnlVariablesPerProjectNotification {
public:
    virtual ~IOnlVariablesPerProjectNotification() = default;
    // The bridge may take the record by setting pValue to null; otherwise the caller deletes it.
    virtual void OnValueChange(const CString& strProject, STarvoVarValue*& pValue) = 0;
    virtual void OnProjectDeactivated(const CString& strProject) = 0;
    virtual void OnProjectActivated(const CString& strProject) = 0;
    virtual void OnProjectInactiveFailed(const CString& strProject) = 0;
    virtual void OnProjectActiveFailed(const CString& strProject) = 0;
    virtual void OnValueQueueFull(CString strProject, DWORD dwId) = 0;
    // Queued changes thrown away unsent: a deactivation, a released subscription, the end.
    virtual void OnValuesDiscarded(const CString& strProject, int nCount) = 0;
};
