#include "local/wire.h"
#include "value_size.h"

namespace automation_wire {

namespace {

constexpr std::uint32_t kNullText = 0xFFFFFFFFu;

bool IsObject(VARTYPE vt) { return vt == VT_DISPATCH || vt == VT_UNKNOWN; }

// Fewest bytes one array element of this type takes on the wire; 0 = not allowed.
std::uint32_t MinWireSize(VARTYPE vt) {
    if (const std::uint32_t size = FixedValueSize(vt)) return size;
    if (vt == VT_BSTR) return 4;
    if (IsObject(vt)) return 8;
    if (vt == VT_VARIANT) return 2;
    return 0;
}

// The value a by-reference variant points at, borrowed (nothing is owned).
bool Dereference(const VARIANT& v, VARIANT* plain) {
    if (!v.byref) return false;
    const VARTYPE type = v.vt & ~VT_BYREF;
    if (type == VT_VARIANT) {
        *plain = *v.pvarVal;
        return true;
    }
    VariantInit(plain);
    plain->vt = type;
    if (type & VT_ARRAY) {
        plain->parray = *v.pparray;
        return true;
    }
    if (const std::uint32_t size = FixedValueSize(type)) {
        std::memcpy(&plain->llVal, v.byref, size);
        return true;
    }
    if (type == VT_BSTR) plain->bstrVal = *v.pbstrVal;
    else if (IsObject(type)) plain->punkVal = *v.ppunkVal;
    else return false;
    return true;
}

HRESULT WriteObject(Writer& w, IUnknown* object, bool isDispatch, IObjectMarshal& marshal,
                    std::vector<std::uint64_t>& exported) {
    if (!object) {
        w.U64(0);
        return S_OK;
    }
    const std::uint64_t id = marshal.Export(object, isDispatch);
    exported.push_back(id);
    w.U64(id);
    return S_OK;
}

HRESULT WriteArray(Writer& w, VARTYPE element, const SAFEARRAY* array, IObjectMarshal& marshal,
                   std::vector<std::uint64_t>& exported, int depth) {
    if (!array) {
        w.U8(0);
        return S_OK;
    }
    if (array->vt != element || MinWireSize(element) == 0 || array->cElements > kMaxElements ||
        (array->cElements && !array->pvData))
        return DISP_E_BADVARTYPE;
    w.U8(1);
    w.I32(array->lLbound);
    w.U32(array->cElements);
    const auto* data = static_cast<const std::uint8_t*>(array->pvData);
    if (const std::uint32_t size = FixedValueSize(element)) {
        if (array->cbElements != size) return DISP_E_BADVARTYPE;
        w.Raw(data, static_cast<size_t>(size) * array->cElements);
        return S_OK;
    }
    for (std::uint32_t i = 0; i < array->cElements; ++i) {
        const void* at = data + static_cast<size_t>(i) * array->cbElements;
        HRESULT hr = S_OK;
        if (element == VT_BSTR) WriteText(w, *static_cast<const BSTR*>(at));
        else if (IsObject(element))
            hr = WriteObject(w, *static_cast<IUnknown* const*>(at), element == VT_DISPATCH, marshal, exported);
        else hr = WriteVariant(w, *static_cast<const VARIANT*>(at), marshal, false, exported, depth + 1);
        if (FAILED(hr)) return hr;
        if (w.Size() > kMaxFrame + 4u) return E_OUTOFMEMORY;  // stop early: the frame cannot be sent
    }
    return S_OK;
}

bool ReadArray(Reader& r, VARTYPE element, SAFEARRAY** out, IObjectMarshal& marshal, int depth) {
    *out = nullptr;
    std::uint8_t present = 0;
    if (!r.U8(&present) || present > 1) return false;
    if (!present) return true;
    std::int32_t lower = 0;
    std::uint32_t count = 0;
    const std::uint32_t minSize = MinWireSize(element);
    if (minSize == 0 || !r.I32(&lower) || !r.U32(&count) || count > kMaxElements) return false;
    if (static_cast<std::uint64_t>(count) * minSize > r.Left()) return false;  // before allocating anything
    SAFEARRAY* array = SafeArrayCreateVector(element, lower, count);
    if (!array) return false;
    auto* data = static_cast<std::uint8_t*>(array->pvData);
    bool ok = true;
    if (const std::uint32_t size = FixedValueSize(element)) {
        ok = r.Raw(data, static_cast<size_t>(size) * count);
    } else {
        for (std::uint32_t i = 0; ok && i < count; ++i) {
            void* at = data + static_cast<size_t>(i) * array->cbElements;
            if (element == VT_BSTR) {
                ok = ReadText(r, static_cast<BSTR*>(at));
            } else if (IsObject(element)) {
                std::uint64_t id = 0;
                ok = r.U64(&id);
                if (ok && id) *static_cast<IUnknown**>(at) = marshal.Import(id).Detach();
            } else {
                ok = ReadVariant(r, static_cast<VARIANT*>(at), marshal, depth + 1);
            }
        }
    }
    if (!ok) {
        SafeArrayDestroy(array);
        return false;
    }
    *out = array;
    return true;
}

}  // namespace

void WriteText(Writer& w, const char16_t* text) {
    if (!text) {
        w.U32(kNullText);
        return;
    }
    const UINT length = SysStringLen(const_cast<BSTR>(text));
    w.U32(length);
    w.Raw(text, static_cast<size_t>(length) * sizeof(char16_t));
}

bool ReadText(Reader& r, BSTR* text) {
    *text = nullptr;
    std::uint32_t length = 0;
    if (!r.U32(&length)) return false;
    if (length == kNullText) return true;
    if (static_cast<std::uint64_t>(length) * sizeof(char16_t) > r.Left()) return false;
    BSTR s = SysAllocStringLen(nullptr, length);
    if (!s || !r.Raw(s, static_cast<size_t>(length) * sizeof(char16_t))) {
        SysFreeString(s);
        return false;
    }
    *text = s;
    return true;
}

HRESULT WriteVariant(Writer& w, const VARIANT& v, IObjectMarshal& marshal, bool keepByRef,
                     std::vector<std::uint64_t>& exported, int depth) {
    if (depth > kMaxDepth) return DISP_E_BADVARTYPE;
    if (v.vt & VT_BYREF) {
        VARIANT plain;
        if (!Dereference(v, &plain)) return DISP_E_BADVARTYPE;
        if (keepByRef) w.U16(v.vt);  // the reference's tag, then its target as a whole variant
        return WriteVariant(w, plain, marshal, false, exported, depth + 1);
    }
    const VARTYPE type = v.vt & VT_TYPEMASK;
    if ((v.vt & ~(VT_TYPEMASK | VT_ARRAY)) != 0) return DISP_E_BADVARTYPE;
    if (v.vt & VT_ARRAY) {
        w.U16(v.vt);
        return WriteArray(w, type, v.parray, marshal, exported, depth);
    }
    if (type == VT_EMPTY || type == VT_NULL) {
        w.U16(v.vt);
        return S_OK;
    }
    if (const std::uint32_t size = FixedValueSize(type)) {
        w.U16(v.vt);
        w.Raw(&v.llVal, size);
        return S_OK;
    }
    if (type == VT_BSTR) {
        w.U16(v.vt);
        WriteText(w, v.bstrVal);
        return S_OK;
    }
    if (IsObject(type)) {
        w.U16(v.vt);
        return WriteObject(w, v.punkVal, type == VT_DISPATCH, marshal, exported);
    }
    return DISP_E_BADVARTYPE;
}

bool ReadVariant(Reader& r, VARIANT* out, IObjectMarshal& marshal, int depth) {
    if (depth > kMaxDepth) return false;
    std::uint16_t vt = 0;
    if (!r.U16(&vt)) return false;
    const VARTYPE type = vt & VT_TYPEMASK;
    if ((vt & ~(VT_TYPEMASK | VT_ARRAY)) != 0) return false;  // references only as top-level arguments
    if (vt & VT_ARRAY) {
        SAFEARRAY* array = nullptr;
        if (!ReadArray(r, type, &array, marshal, depth)) return false;
        out->vt = vt;
        out->parray = array;
        return true;
    }
    if (type == VT_EMPTY || type == VT_NULL) {
        out->vt = vt;
        return true;
    }
    if (const std::uint32_t size = FixedValueSize(type)) {
        out->llVal = 0;
        if (!r.Raw(&out->llVal, size)) return false;
        out->vt = vt;
        return true;
    }
    if (type == VT_BSTR) {
        BSTR text = nullptr;
        if (!ReadText(r, &text)) return false;
        out->vt = VT_BSTR;
        out->bstrVal = text;
        return true;
    }
    if (IsObject(type)) {
        std::uint64_t id = 0;
        if (!r.U64(&id)) return false;
        out->vt = vt;
        out->pdispVal = id ? marshal.Import(id).Detach() : nullptr;  // the proxy's IDispatch is its IUnknown
        return true;
    }
    return false;
}

bool ReadArgs(Reader& r, std::uint32_t count, Args* args, IObjectMarshal& marshal) {
    if (count > kMaxArgs) return false;
    args->owned.resize(count);  // fixed from here: slots point into it
    args->slots.resize(count);
    for (std::uint32_t i = 0; i < count; ++i) {
        VARIANT& slot = args->slots[i];
        CComVariant& owned = args->owned[i];
        VariantInit(&slot);
        std::uint16_t tag = 0;
        Reader peek = r;
        if (!peek.U16(&tag)) return false;
        if (!(tag & VT_BYREF)) {
            if (!ReadVariant(r, &owned, marshal)) return false;
            slot = owned;  // borrowed: owned keeps it
            continue;
        }
        r.U16(&tag);
        if (!ReadVariant(r, &owned, marshal, 1)) return false;
        const VARTYPE target = tag & ~VT_BYREF;
        if (target == VT_VARIANT) {
            slot.vt = tag;
            slot.pvarVal = &owned;
        } else if (target == owned.vt) {
            slot.vt = tag;
            slot.byref = &owned.llVal;  // every member of the union starts here
        } else {
            return false;
        }
    }
    return true;
}

}  // namespace automation_wire
