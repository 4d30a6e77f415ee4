#pragma once
// Calls into the runtime's automation objects, as the runtime link makes them.
// A failing call (an error status or a raised error) is a failed operation for
// the caller; nothing is thrown.

#include "automation/comptr.h"
#include "automation/dispatch_call.h"

// The object that a method returns; null when the call fails or gives none.
template <typename... Args>
CComPtr<IDispatch> CallForObject(IDispatch* object, DISPID member, const Args&... args) {
    if (!object) return nullptr;
    CComVariant result;
    if (FAILED(CallMethod(object, member, &result, args...))) return nullptr;
    CComPtr<IDispatch> found;
    if (result.vt == VT_DISPATCH && result.pdispVal) found = result.pdispVal;
    else if (result.vt == VT_UNKNOWN && result.punkVal)
        result.punkVal->QueryInterface(IID_IDispatch, found.ReceiveVoid());
    return found;
}

// True when the method succeeds and returns a nonzero BOOL or number.
bool IsTrueResult(const VARIANT& result);

template <typename... Args>
bool CallForTrue(IDispatch* object, DISPID member, const Args&... args) {
    if (!object) return false;
    CComVariant result;
    return SUCCEEDED(CallMethod(object, member, &result, args...)) && IsTrueResult(result);
}

// Calls a method whose result is not used.
template <typename... Args>
void CallIgnoringResult(IDispatch* object, DISPID member, const Args&... args) {
    if (object) CallMethod(object, member, nullptr, args...);
}

// Reads a whole-number property; false when the call fails or gives no number.
bool GetLongProperty(IDispatch* object, DISPID member, LONG* value);
