#pragma once
// Client side of late-bound calls: invoke a member by DISPID with arguments
// given in their natural order (first argument first).
//
// The status forms return the call's HRESULT. The *OrThrow forms return the
// result and throw CAutomationError when the call fails, for call sites that
// treat a failing call as a raised error and catch it themselves.

#include "automation/comvariant.h"
#include "automation/error.h"

#include <array>

// Invokes with arguments already in DISPPARAMS order (last argument first).
// result may be null; exception may be null (its texts are the caller's to free).
HRESULT InvokeMember(IDispatch* object, DISPID member, WORD flags, VARIANT* argsLastFirst, UINT count, VARIANT* result,
                     EXCEPINFO* exception);
// As InvokeMember, throwing CAutomationError on failure (also for a null object).
CComVariant InvokeMemberOrThrow(IDispatch* object, DISPID member, WORD flags, VARIANT* argsLastFirst, UINT count);

namespace automation_detail {
// Arguments converted to owning variants, stored last first.
template <typename... Args>
std::array<CComVariant, sizeof...(Args)> LastFirst(const Args&... args) {
    std::array<CComVariant, sizeof...(Args)> list{CComVariant(args)...};
    for (size_t i = 0; i < list.size() / 2; ++i) std::swap(list[i], list[list.size() - 1 - i]);
    return list;
}
}  // namespace automation_detail

template <typename... Args>
HRESULT CallMethod(IDispatch* object, DISPID member, VARIANT* result, const Args&... args) {
    auto list = automation_detail::LastFirst(args...);
    return InvokeMember(object, member, DISPATCH_METHOD, list.data(), static_cast<UINT>(list.size()), result, nullptr);
}

inline HRESULT GetProperty(IDispatch* object, DISPID member, VARIANT* result) {
    return InvokeMember(object, member, DISPATCH_PROPERTYGET, nullptr, 0, result, nullptr);
}

template <typename... Args>
CComVariant CallMethodOrThrow(IDispatch* object, DISPID member, const Args&... args) {
    auto list = automation_detail::LastFirst(args...);
    return InvokeMemberOrThrow(object, member, DISPATCH_METHOD, list.data(), static_cast<UINT>(list.size()));
}

inline CComVariant GetPropertyOrThrow(IDispatch* object, DISPID member) {
    return InvokeMemberOrThrow(object, member, DISPATCH_PROPERTYGET, nullptr, 0);
}
