// The library's two exports and the instance behind IAzureInstance.

#include "corvell/AzureInstance.h"

#include <curl/curl.h>

#include <exception>
#include <new>

#include "private/AzureClient.h"
#include "private/Utf.h"

namespace corvell {

namespace {

class AzureInstance final : public IAzureInstance {
public:
    AzureInstance(ILogger* logger, ProxySettings proxy) : m_client(logger, std::move(proxy)) {}
    ~AzureInstance() = default;

    void Reserved1() override {}
    void Reserved2() override {}
    void Reserved3() override {}

    bool BeginOnlineRows(const char16_t* connectionString, const char16_t* entity, bool eventHub,
                         std::int32_t format) override {
        return Guard([&] { return m_client.Begin(View(connectionString), View(entity), eventHub, format); });
    }

    bool AddOnlineRow(const char16_t* project, const char16_t* variable, std::int32_t /*reserved*/, double value,
                      const char16_t* text, bool isText, std::uint32_t time, std::uint16_t milliseconds,
                      std::uint32_t statusLow, std::uint32_t statusHigh) override {
        return Guard([&] {
            Row row;
            row.project = View(project);
            row.variable = View(variable);
            row.value = value;
            row.text = View(text);
            row.isText = isText;
            row.time = time;
            row.milliseconds = milliseconds;
            row.status = (static_cast<std::uint64_t>(statusHigh) << 32) | statusLow;
            return m_client.Add(row);
        });
    }

    bool SendOnlineRows() override {
        return Guard([&] { return m_client.Send(); });
    }

private:
    // Nothing thrown inside may cross into the caller.
    template <typename F>
    bool Guard(F&& operation) {
        try {
            return operation();
        } catch (const std::exception& e) {
            Report(e.what());
        } catch (...) {
            Report("unknown exception");
        }
        return false;
    }

    void Report(const char* what) { m_client.ReportError(std::string("Azure operation failed: ") + what); }

    AzureClient m_client;
};

}  // namespace

}  // namespace corvell

extern "C" corvell::IAzureInstance* CreateAzureInstance(corvell::ILogger* logger, const char16_t* proxyAddress,
                                                        const char16_t* proxyUser, const char16_t* proxyPassword) {
    using namespace corvell;
    if (curl_global_init(CURL_GLOBAL_DEFAULT) != CURLE_OK) {
        if (logger) logger->LogError(u"Azure client not created: libcurl could not be initialised");
        return nullptr;
    }
    try {
        ProxySettings proxy;
        proxy.address = ToUtf8(View(proxyAddress));
        if (!proxy.address.empty()) {
            proxy.user = ToUtf8(View(proxyUser));
            proxy.password = ToUtf8(View(proxyPassword));
        }
        return new AzureInstance(logger, std::move(proxy));
    } catch (...) {
        curl_global_cleanup();
        if (logger) logger->LogError(u"Azure client not created: out of memory");
        return nullptr;
    }
}

extern "C" void DestroyAzureInstance(corvell::IAzureInstance* instance) {
    if (!instance) return;
    delete static_cast<corvell::AzureInstance*>(instance);
    curl_global_cleanup();  // counted: pairs with the init of CreateAzureInstance
}
