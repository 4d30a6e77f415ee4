// Reads arbitrary bytes as the arguments of a call, the way the local-socket
// transport reads a peer's frame: nothing may be read past the input, and
// whatever is accepted must be freed cleanly.
#include "local/wire.h"

#include "automation/dispatch_object.h"

#include <cstddef>
#include <cstdint>

namespace {

class CNothing final : public CDispatchObject {
public:
    HRESULT Invoke(DISPID, WORD, DISPPARAMS*, VARIANT*, EXCEPINFO*) override { return S_OK; }
};

class CMarshal final : public automation_wire::IObjectMarshal {
public:
    std::uint64_t Export(IUnknown*, bool) override { return 1; }
    void Unexport(std::uint64_t) override {}
    CComPtr<IDispatch> Import(std::uint64_t) override { return CComPtr<IDispatch>(MakeComObject<CNothing>()); }
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size < 1) return 0;
    CMarshal marshal;
    automation_wire::Reader r(data + 1, size - 1);
    automation_wire::Args args;
    if (automation_wire::ReadArgs(r, data[0] % 8, &args, marshal)) {
        // What was accepted must write back out as well.
        automation_wire::Writer w(automation_wire::Kind::Call);
        std::vector<std::uint64_t> exported;
        for (const VARIANT& slot : args.slots) automation_wire::WriteVariant(w, slot, marshal, true, exported);
    }
    return 0;
}
