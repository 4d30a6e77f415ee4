// See FakeCorvell.h. FAKE_EXPORTS: 2 both exports, 1 CreateAzureInstance only, 0 none.

#include "FakeCorvell.h"

namespace {

FakeCorvellState g_state;

class FakeInstance final : public corvell::IAzureInstance {
public:
    void Reserved1() override {}
    void Reserved2() override {}
    void Reserved3() override {}
    bool BeginOnlineRows(const char16_t*, const char16_t*, bool, std::int32_t) override { return true; }
    bool AddOnlineRow(const char16_t*, const char16_t*, std::int32_t, double, const char16_t*, bool, std::uint32_t,
                      std::uint16_t, std::uint32_t, std::uint32_t) override {
        ++g_state.rowsAdded;
        return true;
    }
    bool SendOnlineRows() override { return true; }
    ~FakeInstance() = default;
};

}  // namespace

extern "C" __attribute__((visibility("default"))) FakeCorvellState* FakeCorvell_State() { return &g_state; }

#if FAKE_EXPORTS >= 1
extern "C" corvell::IAzureInstance* CreateAzureInstance(corvell::ILogger* logger, const char16_t* proxyAddress,
                                                        const char16_t* proxyUser, const char16_t* proxyPassword) {
    g_state.logger = logger;
    g_state.proxyGiven = proxyAddress && proxyUser && proxyPassword;
    g_state.proxyAddress = proxyAddress ? proxyAddress : u"";
    g_state.proxyUser = proxyUser ? proxyUser : u"";
    g_state.proxyPassword = proxyPassword ? proxyPassword : u"";
    if (g_state.createReturnsNull) return nullptr;
    ++g_state.created;
    g_state.lastInstance = new FakeInstance;
    return g_state.lastInstance;
}
#endif

#if FAKE_EXPORTS >= 2
extern "C" void DestroyAzureInstance(corvell::IAzureInstance* instance) {
    ++g_state.destroyed;
    delete static_cast<FakeInstance*>(instance);
}
#endif
