#pragma once
// A "VariableBulkChange" sink for benchmarks.

#include "automation/dispatch_object.h"
#include "tarvo/TarvoIds.h"

#include <benchmark/benchmark.h>

#include <atomic>
#include <cstdint>

// Reads every element as a client does: the id as an integer, the value's type.
class CReadingSink final : public CDispatchObject {
public:
    HRESULT Invoke(DISPID member, WORD, DISPPARAMS* params, VARIANT*, EXCEPINFO*) override {
        using namespace tarvo::dispid;
        if (member != EventVariableBulkChange || !params || params->cArgs != BulkChangeArgCount) return S_OK;
        const DispatchArgs args(*params);
        const VARIANT& ids = args[1];
        const VARIANT& values = args[2];
        if (ids.vt != (VT_ARRAY | VT_R8) || values.vt != (VT_ARRAY | VT_VARIANT)) return S_OK;
        const auto* id = static_cast<const double*>(ids.parray->pvData);
        const auto* value = static_cast<const VARIANT*>(values.parray->pvData);
        unsigned long long checksum = 0;
        for (std::uint32_t k = 0; k < ids.parray->cElements; ++k) {
            checksum += static_cast<DWORD>(static_cast<long long>(id[k]));
            checksum += value[k].vt;
        }
        benchmark::DoNotOptimize(checksum);
        changes += ids.parray->cElements;
        return S_OK;
    }
    std::atomic<unsigned long long> changes{0};

protected:
    IUnknown* FindInterface(REFIID iid) override {
        return iid == DIID_IOnlineVariableEvents ? static_cast<IDispatch*>(this) : CDispatchObject::FindInterface(iid);
    }
};
