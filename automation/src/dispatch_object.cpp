#include "automation/dispatch_object.h"

#include "platform/text.h"

#include <cmath>
#include <new>

namespace {

const VARIANT& Resolve(const VARIANT& v) {
    if (v.vt == (VT_VARIANT | VT_BYREF) && v.pvarVal) return *v.pvarVal;
    return v;
}

// The value of a numeric variant (by value or by reference) as a double.
bool NumberOf(const VARIANT& v, double* number) {
    const bool byRef = (v.vt & VT_BYREF) != 0;
    if (byRef && !v.byref) return false;
    switch (v.vt & ~VT_BYREF) {
    case VT_I1: *number = byRef ? *v.pcVal : v.cVal; return true;
    case VT_UI1: *number = byRef ? *v.pbVal : v.bVal; return true;
    case VT_I2: *number = byRef ? *v.piVal : v.iVal; return true;
    case VT_UI2: *number = byRef ? *v.puiVal : v.uiVal; return true;
    case VT_I4:
    case VT_INT: *number = byRef ? *v.plVal : v.lVal; return true;
    case VT_UI4:
    case VT_UINT: *number = byRef ? *v.pulVal : v.ulVal; return true;
    case VT_I8: *number = static_cast<double>(byRef ? *v.pllVal : v.llVal); return true;
    case VT_UI8: *number = static_cast<double>(byRef ? *v.pullVal : v.ullVal); return true;
    case VT_R4: *number = byRef ? *v.pfltVal : v.fltVal; return true;
    case VT_R8: *number = byRef ? *v.pdblVal : v.dblVal; return true;
    case VT_BOOL: *number = (byRef ? *v.pboolVal : v.boolVal) ? -1 : 0; return true;
    default: return false;
    }
}

}  // namespace

const VARIANT& DispatchArgs::operator[](UINT i) const { return Resolve(m_params.rgvarg[m_params.cArgs - 1 - i]); }

bool DispatchArgs::IsText(UINT i) const {
    const VARIANT& v = (*this)[i];
    return v.vt == VT_BSTR || (v.vt == (VT_BSTR | VT_BYREF) && v.pbstrVal);
}

HRESULT DispatchArgs::GetText(UINT i, std::u16string* text) const {
    if (!IsText(i)) return DISP_E_TYPEMISMATCH;
    const VARIANT& v = (*this)[i];
    const BSTR s = v.vt == VT_BSTR ? v.bstrVal : *v.pbstrVal;
    text->assign(s ? s : u"", SysStringLen(s));
    return S_OK;
}

HRESULT DispatchArgs::GetInteger(UINT i, LONG* value) const {
    double number = 0;
    if (!NumberOf((*this)[i], &number) || std::isnan(number)) return DISP_E_TYPEMISMATCH;
    number = std::trunc(number);
    if (number < -2147483648.0 || number > 2147483647.0) return DISP_E_OVERFLOW;
    *value = static_cast<LONG>(number);
    return S_OK;
}

HRESULT RunDispatchMember(WORD kind, UINT argCount, WORD flags, DISPPARAMS* params, VARIANT* result,
                          EXCEPINFO* exception, HRESULT (*call)(void*, const DispatchArgs&, VARIANT*), void* context) {
    if (!(flags & kind)) return DISP_E_MEMBERNOTFOUND;
    DISPPARAMS none{nullptr, nullptr, 0, 0};
    if (!params) params = &none;
    if (params->cNamedArgs != 0) return DISP_E_NONAMEDARGS;
    if (params->cArgs != argCount) return DISP_E_BADPARAMCOUNT;
    if (argCount > 0 && !params->rgvarg) return E_INVALIDARG;
    try {
        CComVariant value;
        const HRESULT hr = call(context, DispatchArgs(*params), &value);
        if (SUCCEEDED(hr) && result) value.Detach(result);
        return hr;
    } catch (const CAutomationError& error) {
        error.Fill(exception);
    } catch (const std::bad_alloc&) {
        return E_OUTOFMEMORY;
    } catch (const std::exception& error) {
        CAutomationError(E_FAIL, Utf8ToUtf16(error.what())).Fill(exception);
    } catch (...) {
        return E_UNEXPECTED;
    }
    return DISP_E_EXCEPTION;
}

HRESULT CDispatchObject::QueryInterface(REFIID iid, void** object) {
    if (!object) return E_POINTER;
    IUnknown* found = FindInterface(iid);
    *object = found;
    if (!found) return E_NOINTERFACE;
    found->AddRef();
    return S_OK;
}

ULONG CDispatchObject::Release() {
    const ULONG left = m_refs.fetch_sub(1, std::memory_order_acq_rel) - 1;
    if (left == 0) delete this;
    return left;
}

IUnknown* CDispatchObject::FindInterface(REFIID iid) {
    if (iid == IID_IUnknown || iid == IID_IDispatch) return static_cast<IDispatch*>(this);
    return nullptr;
}
