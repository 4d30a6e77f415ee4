#include "runtime/RuntimeCalls.h"

bool IsTrueResult(const VARIANT& result) {
    switch (result.vt) {
    case VT_BOOL: return result.boolVal != VARIANT_FALSE;
    case VT_I2: return result.iVal != 0;
    case VT_I4:
    case VT_INT: return result.lVal != 0;
    case VT_UI4:
    case VT_UINT: return result.ulVal != 0;
    case VT_R8: return result.dblVal != 0.0;
    default: return false;
    }
}

bool GetLongProperty(IDispatch* object, DISPID member, LONG* value) {
    if (!object) return false;
    CComVariant result;
    if (FAILED(GetProperty(object, member, &result))) return false;
    switch (result.vt) {
    case VT_I4:
    case VT_INT: *value = result.lVal; return true;
    case VT_I2: *value = result.iVal; return true;
    case VT_UI4:
    case VT_UINT: *value = static_cast<LONG>(result.ulVal); return true;
    default: return false;
    }
}
