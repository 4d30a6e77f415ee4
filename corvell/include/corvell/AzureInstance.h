#pragma once
// The interface of libCorvell.so, the Azure client library that a module loads
// at run time. Texts across this interface are UTF-16 and null-terminated; a
// null text counts as empty.
//
// Threads: one instance is used by one thread at a time. The logger may be
// called from inside any instance operation.

#include <cstdint>

namespace corvell {

// Implemented by the module: the sink for the library's log records. The
// library never deletes it; it stays valid until the instance is destroyed.
class ILogger {
public:
    virtual void LogError(const char16_t* text) = 0;
    virtual void LogInfo(const char16_t* text) = 0;
    virtual bool IsInfoEnabled() = 0;

protected:
    ~ILogger() = default;  // not deleted through this interface
};

// Body formats of BeginOnlineRows.
enum RowFormat : std::int32_t { FormatXml = 0, FormatJson = 1, FormatBond = 2 };

class IAzureInstance {
public:
    // Three slots kept for callers of an older layout; they do nothing.
    virtual void Reserved1() = 0;
    virtual void Reserved2() = 0;
    virtual void Reserved3() = 0;

    // Opens a batch for one target: a Service Bus queue (eventHub false) or an
    // Event Hub. entity may be empty when the connection string names it
    // (EntityPath). false: nothing was opened, and the reason is logged.
    virtual bool BeginOnlineRows(const char16_t* connectionString, const char16_t* entity, bool eventHub,
                                 std::int32_t format) = 0;

    // Adds one row to the open batch. time is whole seconds since 1970-01-01
    // UTC; the value is the text when isText, the number otherwise; reserved is 0.
    virtual bool AddOnlineRow(const char16_t* project, const char16_t* variable, std::int32_t reserved, double value,
                              const char16_t* text, bool isText, std::uint32_t time, std::uint16_t milliseconds,
                              std::uint32_t statusLow, std::uint32_t statusHigh) = 0;

    // Sends the open batch and closes it. true only when every row of the
    // batch was accepted by the service.
    virtual bool SendOnlineRows() = 0;

protected:
    ~IAzureInstance() = default;  // destroyed through DestroyAzureInstance
};

}  // namespace corvell

extern "C" {
// Creates an instance. The proxy texts are either all null (libcurl's proxy
// environment variables apply) or all given: proxy address ("host:port" or a
// URL), user ("DOMAIN\user" for NTLM) and password. Null on failure.
__attribute__((visibility("default"))) corvell::IAzureInstance* CreateAzureInstance(corvell::ILogger* logger,
                                                                                    const char16_t* proxyAddress,
                                                                                    const char16_t* proxyUser,
                                                                                    const char16_t* proxyPassword);
__attribute__((visibility("default"))) void DestroyAzureInstance(corvell::IAzureInstance* instance);
}

// Types of the two exports, for callers that look them up by name.
using PFN_CreateAzureInstance = corvell::IAzureInstance* (*)(corvell::ILogger*, const char16_t*, const char16_t*,
                                                             const char16_t*);
using PFN_DestroyAzureInstance = void (*)(corvell::IAzureInstance*);
