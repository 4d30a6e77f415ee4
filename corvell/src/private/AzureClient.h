#pragma once
// Batches of rows for one Service Bus queue or Event Hub at a time, sent over
// HTTPS with SAS tokens, size limits and bounded retries.

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "private/ConnectionString.h"
#include "private/Http.h"
#include "private/Log.h"
#include "private/Retry.h"
#include "private/RowFormats.h"

namespace corvell {

// The time the client reads and waits: the steady clock bounds sends, the
// wall clock dates tokens, and Sleep pauses between retries. Tests install
// one that they move by hand, so retries and token renewals take no time.
class ClientClock {
public:
    virtual ~ClientClock() = default;
    virtual std::chrono::steady_clock::time_point Now() { return std::chrono::steady_clock::now(); }
    virtual std::int64_t UnixSeconds();
    virtual void Sleep(std::chrono::milliseconds wait);
};

struct ClientOptions {
    // Everything one SendOnlineRows may take, retries and waits included.
    std::chrono::milliseconds sendBudget{30000};
    std::chrono::milliseconds requestTimeout{20000};
    std::chrono::milliseconds connectTimeout{10000};
    int maxRetries = 3;  // transient failures retried per message
    std::chrono::milliseconds firstBackoff{800};
    std::chrono::milliseconds maxBackoff{60000};
    // Largest message (and request) body per kind of target.
    std::size_t serviceBusMessageBytes = 256 * 1024;
    std::size_t eventHubMessageBytes = 1024 * 1024;
    std::size_t headroomBytes = 4096;  // properties and headers count toward the service's limit
    std::size_t maxBatchBytes = 64 * 1024 * 1024;
    std::chrono::seconds tokenValidity{3600};
    std::chrono::seconds tokenRenewBefore{300};
    std::string caFile;  // extra trust anchors (tests); empty: the system's store
    std::shared_ptr<ClientClock> clock = std::make_shared<ClientClock>();  // never null
};

// What the last SendOnlineRows did, for tests and information records.
struct SendStats {
    std::size_t rows = 0;
    std::size_t messages = 0;  // messages accepted
    std::size_t requests = 0;  // HTTP requests made
    std::size_t bytes = 0;     // body bytes accepted
    std::size_t tokens = 0;    // tokens signed for it
};

class AzureClient {
public:
    AzureClient(ILogger* logger, ProxySettings proxy, ClientOptions options = {});
    ~AzureClient();

    bool Begin(std::u16string_view connectionString, std::u16string_view entity, bool eventHub, int format);
    bool Add(const Row& row);
    bool Send();

    const SendStats& LastSend() const { return m_lastSend; }
    // An error record through the client's masking and bounds.
    void ReportError(std::string_view text);

private:
    struct Target;
    enum class MessageResult {
        Accepted,
        TooLarge,  // cut it smaller, or drop it when it holds a single row
        Refused,   // this message is refused for good (400): drop it, go on with the rest
        Failed     // the target refuses, or time ran out: end the send
    };
    struct MessageOutcome {
        MessageResult result = MessageResult::Failed;
        std::string reason;  // why it was not accepted, for the records
    };

    Target* FindOrAddTarget(const std::string& connectionText, ConnectionString connection, const std::string& entity,
                            bool eventHub);
    std::size_t MessageLimit(const Target& target) const;
    MessageOutcome SendMessage(std::size_t first, std::size_t last, std::chrono::steady_clock::time_point deadline);
    const std::string& Token(Target& target, bool renew);
    std::string Describe(const HttpResponse& response) const;
    std::string TargetName() const;

    Log m_log;
    ProxySettings m_proxy;
    ClientOptions m_options;
    Backoff m_backoff;
    std::map<std::string, std::unique_ptr<Target>> m_targets;  // by connection string, entity and kind
    Target* m_current = nullptr;                               // target of the open batch
    std::optional<RowBuffer> m_rows;                           // the open batch
    std::size_t m_maxMessageBytes = 0;  // the configured bound for the open batch's kind of target
    std::uint64_t m_nextTargetId = 1;
    SendStats m_lastSend;
};

}  // namespace corvell
