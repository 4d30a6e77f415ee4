#pragma once
// Server side of late-bound calls: an IDispatch object whose members come from
// a table of handlers, with argument checks done once for all of them.
//
// Invoke never lets an exception out: a handler that throws CAutomationError
// makes the call return DISP_E_EXCEPTION with EXCEPINFO filled; any other
// exception does the same with its message (E_OUTOFMEMORY for bad_alloc).

#include "automation/comptr.h"
#include "automation/comvariant.h"
#include "automation/error.h"

#include <atomic>
#include <cstddef>
#include <string>

// The arguments of one call in their natural order (0 = first argument).
class DispatchArgs {
public:
    explicit DispatchArgs(const DISPPARAMS& params) : m_params(params) {}

    UINT Count() const { return m_params.cArgs; }
    // Argument i; an argument passed as VT_VARIANT|VT_BYREF gives the variant it points to.
    const VARIANT& operator[](UINT i) const;
    // A text argument (VT_BSTR, also by reference); DISP_E_TYPEMISMATCH otherwise.
    HRESULT GetText(UINT i, std::u16string* text) const;
    // A whole-number argument (integer, floating point or bool types, also by
    // reference; fractions are cut off); DISP_E_TYPEMISMATCH otherwise,
    // DISP_E_OVERFLOW when it does not fit.
    HRESULT GetInteger(UINT i, LONG* value) const;
    bool IsText(UINT i) const;

private:
    const DISPPARAMS& m_params;
};

// One member of a dispatch table: a method or a property get, with the exact
// number of arguments it takes.
template <typename T>
struct DispatchMember {
    DISPID id;
    WORD kind;  // DISPATCH_METHOD or DISPATCH_PROPERTYGET
    UINT argCount;
    HRESULT (T::*handler)(const DispatchArgs& args, VARIANT* result);
};

// Checks a call against a member's kind and argument count and runs it:
// DISP_E_MEMBERNOTFOUND for a wrong kind, DISP_E_NONAMEDARGS for named
// arguments, DISP_E_BADPARAMCOUNT for a wrong count. The handler fills a
// result of its own, handed to the caller's result (when given) on success.
HRESULT RunDispatchMember(WORD kind, UINT argCount, WORD flags, DISPPARAMS* params, VARIANT* result,
                          EXCEPINFO* exception, HRESULT (*call)(void* context, const DispatchArgs&, VARIANT*),
                          void* context);

template <typename T, std::size_t N>
HRESULT InvokeFromTable(T* self, const DispatchMember<T> (&table)[N], DISPID member, WORD flags, DISPPARAMS* params,
                        VARIANT* result, EXCEPINFO* exception) {
    for (const DispatchMember<T>& entry : table) {
        if (entry.id != member) continue;
        struct Context {
            T* self;
            const DispatchMember<T>* entry;
        } context{self, &entry};
        auto call = [](void* c, const DispatchArgs& args, VARIANT* out) {
            auto* ctx = static_cast<Context*>(c);
            return (ctx->self->*(ctx->entry->handler))(args, out);
        };
        return RunDispatchMember(entry.kind, entry.argCount, flags, params, result, exception, call, &context);
    }
    return DISP_E_MEMBERNOTFOUND;
}

// Reference counting and QueryInterface for an object with a dispatch
// interface. The count starts at 1, the creator's reference (see MakeComObject).
class CDispatchObject : public IDispatch {
public:
    HRESULT QueryInterface(REFIID iid, void** object) override;
    ULONG AddRef() override { return m_refs.fetch_add(1, std::memory_order_relaxed) + 1; }
    ULONG Release() override;

protected:
    CDispatchObject() = default;
    virtual ~CDispatchObject() = default;
    CDispatchObject(const CDispatchObject&) = delete;
    CDispatchObject& operator=(const CDispatchObject&) = delete;

    // The interface answered for iid, without a reference, or null. The
    // default answers IUnknown and IDispatch; an override adds its own ids
    // (a dispatch interface id, an event interface id, a container of
    // connection points) and falls back to this one.
    virtual IUnknown* FindInterface(REFIID iid);

private:
    std::atomic<ULONG> m_refs{1};
};
