#pragma once
// The running-object table: where a running server registers its application
// object under its class id, and where clients find it with GetActiveObject.
//
// Besides the objects registered in this process, further sources can be
// plugged in (a server in another process reached through a local socket, for
// one): GetActiveObject asks this process's registrations first, then every
// source in the order they were added.

#include "automation/unknown.h"

#include <memory>

class IRunningObjectSource {
public:
    virtual ~IRunningObjectSource() = default;
    // S_OK with a referenced object, or MK_E_UNAVAILABLE when the source has
    // no running object of that class. May be called from any thread.
    virtual HRESULT GetObject(REFCLSID clsid, IUnknown** object) = 0;
};

// Registers a running object; the table holds a reference on it until it is
// revoked. The registration number (never 0) is for RevokeActiveObject.
HRESULT RegisterActiveObject(IUnknown* object, REFCLSID clsid, DWORD* registration);
// Releases the table's reference; E_INVALIDARG for an unknown registration.
HRESULT RevokeActiveObject(DWORD registration);
// S_OK with a referenced object (the earliest registration of that class wins),
// MK_E_UNAVAILABLE when nothing of that class is running.
HRESULT GetActiveObject(REFCLSID clsid, IUnknown** object);

// Plugs a further source in; the number (never 0) is for RemoveRunningObjectSource.
// A call in progress keeps a removed source alive until it returns.
DWORD AddRunningObjectSource(std::shared_ptr<IRunningObjectSource> source);
void RemoveRunningObjectSource(DWORD number);
