#pragma once
// Azure Service Bus / Event Hubs connection strings:
//   Endpoint=sb://{namespace}.servicebus.windows.net/;SharedAccessKeyName=..;SharedAccessKey=..[;EntityPath=..]
//   Endpoint=..;SharedAccessSignature=SharedAccessSignature sr=..[;EntityPath=..]
// plus UseDevelopmentEmulator=true, accepted for loopback hosts only, which
// means plain HTTP to that host.

#include <optional>
#include <string>

namespace corvell {

struct ConnectionString {
    std::string host;       // lower case, without brackets for IPv6
    int port = 0;           // 0: the scheme's default
    bool emulator = false;  // plain HTTP to a loopback host
    std::string keyName;
    std::string key;              // the key text as written (HMAC key bytes)
    std::string sharedSignature;  // a ready "SharedAccessSignature sr=..." token
    std::string entityPath;

    // "namespace/entity"-style name of a target for log records: never secret.
    std::string NamespaceName() const;
};

// Parses text; on failure returns nothing and sets error to a reason that
// never quotes a secret.
std::optional<ConnectionString> ParseConnectionString(const std::string& text, std::string& error);

// Checks an entity name (queue or Event Hub, possibly with '/' segments).
bool IsValidEntityName(const std::string& name);

bool IsLoopbackHost(const std::string& host);

}  // namespace corvell
