#include "automation/dispatch_call.h"

HRESULT InvokeMember(IDispatch* object, DISPID member, WORD flags, VARIANT* argsLastFirst, UINT count, VARIANT* result,
                     EXCEPINFO* exception) {
    if (!object) return E_POINTER;
    DISPPARAMS params{count ? argsLastFirst : nullptr, nullptr, count, 0};
    return object->Invoke(member, flags, &params, result, exception);
}

CComVariant InvokeMemberOrThrow(IDispatch* object, DISPID member, WORD flags, VARIANT* argsLastFirst, UINT count) {
    if (!object) throw CAutomationError(E_POINTER, u"call on a null object");
    CComVariant result;
    EXCEPINFO info{0, nullptr, nullptr, 0};
    const HRESULT hr = InvokeMember(object, member, flags, argsLastFirst, count, &result, &info);
    if (FAILED(hr)) {
        CAutomationError error = CAutomationError::FromCall(hr, info);
        ClearExcepInfo(&info);
        throw error;
    }
    ClearExcepInfo(&info);
    return result;
}
