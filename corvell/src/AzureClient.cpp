#include "private/AzureClient.h"

#include <openssl/crypto.h>

#include <algorithm>
#include <cctype>
#include <ctime>
#include <deque>
#include <thread>

#include "private/Sas.h"
#include "private/Utf.h"

namespace corvell {

namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::duration_cast;
using std::chrono::milliseconds;

bool EqualIgnoringCase(const std::string& a, const std::string& b) {
    return a.size() == b.size() && std::equal(a.begin(), a.end(), b.begin(), [](char x, char y) {
               return std::tolower(static_cast<unsigned char>(x)) == std::tolower(static_cast<unsigned char>(y));
           });
}

// The sig value of a ready "SharedAccessSignature sr=..&sig=..&se=.." token.
std::string SignatureOf(const std::string& token) {
    const auto start = token.find("sig=");
    if (start == std::string::npos) return {};
    const auto end = token.find('&', start);
    return token.substr(start + 4, end == std::string::npos ? std::string::npos : end - start - 4);
}

}  // namespace

std::int64_t ClientClock::UnixSeconds() { return std::time(nullptr); }

void ClientClock::Sleep(milliseconds wait) { std::this_thread::sleep_for(wait); }

struct AzureClient::Target {
    ConnectionString connection;
    std::string entity;
    bool eventHub = false;
    std::string name;         // "namespace/entity", for log records
    std::string resourceUri;  // what a token is signed for
    std::string url;          // where messages are posted
    std::unique_ptr<HttpConnection> http;
    std::string token;
    std::int64_t tokenExpiry = 0;  // seconds since 1970; 0: none made yet
    std::uint64_t id = 0;          // names its signatures in the log's masks
    // What the service said about sizes: the smallest message it refused as
    // too large (0: none yet) and the largest it accepted. Later messages are
    // cut below the refused size, so a target with a lower limit than
    // configured costs refused requests once, not in every batch.
    std::size_t refusedBytes = 0;
    std::size_t acceptedBytes = 0;

    void Accepted(std::size_t bytes) {
        acceptedBytes = std::max(acceptedBytes, bytes);
        if (refusedBytes != 0 && bytes >= refusedBytes) refusedBytes = 0;  // the limit was raised
    }
    void TooLarge(std::size_t bytes) {
        if (refusedBytes == 0 || bytes < refusedBytes) refusedBytes = bytes;
        if (acceptedBytes >= bytes) acceptedBytes = 0;  // the limit was lowered
    }

    ~Target() {
        if (!token.empty()) OPENSSL_cleanse(token.data(), token.size());
        if (!connection.key.empty()) OPENSSL_cleanse(connection.key.data(), connection.key.size());
    }
};

AzureClient::AzureClient(ILogger* logger, ProxySettings proxy, ClientOptions options)
    : m_log(logger), m_proxy(std::move(proxy)), m_options(std::move(options)),
      m_backoff(m_options.firstBackoff, m_options.maxBackoff) {
    if (!m_options.clock) m_options.clock = std::make_shared<ClientClock>();
    m_log.AddSecret(m_proxy.password);
}

AzureClient::~AzureClient() = default;

AzureClient::Target* AzureClient::FindOrAddTarget(const std::string& connectionText, ConnectionString connection,
                                                  const std::string& entity, bool eventHub) {
    const std::string key = connectionText + '\n' + entity + (eventHub ? "\nEH" : "\nSB");
    if (const auto it = m_targets.find(key); it != m_targets.end()) return it->second.get();
    // Targets come from a fixed list of connections; a bound guards against a caller that varies them.
    if (m_targets.size() >= 64) {
        for (const auto& [text, old] : m_targets) m_log.DropSignatures(old->id);
        m_targets.clear();
    }

    auto target = std::make_unique<Target>();
    target->connection = std::move(connection);
    target->entity = entity;
    target->eventHub = eventHub;
    target->id = m_nextTargetId++;
    const ConnectionString& c = target->connection;
    target->name = c.NamespaceName() + "/" + Shorten(entity);
    const std::string host = c.host.find(':') != std::string::npos ? "[" + c.host + "]" : c.host;
    target->resourceUri = std::string(c.emulator ? "http://" : "https://") + host +
                          (c.port ? ":" + std::to_string(c.port) : "") + "/" + entity;
    target->url = target->resourceUri + "/messages?timeout=60" + (eventHub ? "&api-version=2014-01" : "");
    TransportSettings transport;
    transport.proxy = &m_proxy;
    transport.plainHttp = c.emulator;
    transport.caFile = m_options.caFile;
    target->http = std::make_unique<HttpConnection>(std::move(transport));
    m_log.AddSecret(c.key);
    m_log.AddSecret(c.sharedSignature);
    m_log.AddSignature(target->id, SignatureOf(c.sharedSignature));
    Target* result = target.get();
    m_targets.emplace(key, std::move(target));
    return result;
}

bool AzureClient::Begin(std::u16string_view connectionString, std::u16string_view entityName, bool eventHub,
                        int format) {
    if (m_rows) m_log.Info("A batch that was not sent is discarded");
    m_rows.reset();
    m_current = nullptr;

    if (format < 0 || format > 2) {
        m_log.Error("Azure batch not opened: unknown format code " + std::to_string(format) +
                    " (0 XML, 1 JSON, 2 BOND)");
        return false;
    }
    const std::string text = ToUtf8(connectionString);
    std::string error;
    auto connection = ParseConnectionString(text, error);
    if (!connection) {
        m_log.Error("Azure batch not opened: the connection string is not valid: " +
                    Shorten(error, 4 * kMaxQuotedChars));
        return false;
    }
    std::string entity = ToUtf8(entityName);
    const std::string where = "namespace " + connection->NamespaceName();
    if (entity.empty()) {
        entity = connection->entityPath;
    } else if (!connection->entityPath.empty() && !EqualIgnoringCase(entity, connection->entityPath)) {
        m_log.Error("Azure batch not opened for " + where + ": the " + (eventHub ? "Event Hub" : "queue") + " name '" +
                    Shorten(entity) + "' differs from the connection string's EntityPath '" +
                    Shorten(connection->entityPath) + "'");
        return false;
    }
    if (entity.empty()) {
        m_log.Error("Azure batch not opened for " + where + ": no " + (eventHub ? "Event Hub" : "queue") +
                    " name, and the connection string has no EntityPath");
        return false;
    }
    if (!IsValidEntityName(entity)) {
        m_log.Error("Azure batch not opened for " + where + ": '" + Shorten(entity) +
                    "' is not a valid entity name (letters, digits, . - _ and /, at most 260)");
        return false;
    }
    Target* target = FindOrAddTarget(text, std::move(*connection), entity, eventHub);
    if (!target->http->IsValid()) {
        m_log.Error("Azure batch not opened for " + target->name + ": libcurl could not create a handle");
        return false;
    }
    m_current = target;
    m_rows.emplace(static_cast<Format>(format));
    const std::size_t limit = eventHub ? m_options.eventHubMessageBytes : m_options.serviceBusMessageBytes;
    m_maxMessageBytes = limit > m_options.headroomBytes * 2 ? limit - m_options.headroomBytes : limit / 2;
    return true;
}

bool AzureClient::Add(const Row& input) {
    if (!m_rows) {
        m_log.Error("Azure row not added: no batch is open");
        return false;
    }
    Row row = input;
    // Milliseconds past a whole second carry into the seconds.
    row.time += row.milliseconds / 1000;
    row.milliseconds = static_cast<std::uint16_t>(row.milliseconds % 1000);
    if (m_rows->TotalRowBytes() >= m_options.maxBatchBytes) {
        m_log.Error("Azure row not added for " + m_current->name + ": the batch holds " +
                    std::to_string(m_rows->TotalRowBytes()) + " bytes already");
        return false;
    }
    const std::size_t bytes = m_rows->Add(row);
    if (m_rows->SingleRowMessageSize(bytes) > m_maxMessageBytes) {
        m_rows->RemoveLast();
        m_log.Error("Azure row not added for " + m_current->name + ": variable '" + Shorten(ToUtf8(row.variable)) +
                    "' needs " + std::to_string(bytes) + " bytes, more than a message may hold (" +
                    std::to_string(m_maxMessageBytes) + ")");
        return false;
    }
    return true;
}

const std::string& AzureClient::Token(Target& target, bool renew) {
    const ConnectionString& c = target.connection;
    if (!c.sharedSignature.empty()) return c.sharedSignature;  // given whole, cannot be renewed
    const std::int64_t now = m_options.clock->UnixSeconds();
    if (renew || target.token.empty() || now >= target.tokenExpiry - m_options.tokenRenewBefore.count()) {
        const std::int64_t expiry = now + m_options.tokenValidity.count();
        SasToken token = MakeSasToken(target.resourceUri, c.keyName, c.key, expiry);
        ++m_lastSend.tokens;
        m_log.AddSignature(target.id, token.signature);
        if (!target.token.empty()) OPENSSL_cleanse(target.token.data(), target.token.size());
        target.token = std::move(token.token);
        target.tokenExpiry = expiry;
    }
    return target.token;
}

std::string AzureClient::Describe(const HttpResponse& response) const {
    if (response.status == 0) {
        return (response.tlsFailure ? "TLS failure: " : "transport error: ") + m_log.Quote(response.transportError);
    }
    std::string text = "HTTP " + std::to_string(response.status);
    const std::string detail = ServiceErrorText(response);
    if (!detail.empty()) text += " (" + m_log.Quote(detail) + ")";
    return text;
}

std::string AzureClient::TargetName() const {
    return m_current->name + (m_current->eventHub ? " (Event Hub)" : " (queue)");
}

void AzureClient::ReportError(std::string_view text) { m_log.Error(Shorten(text, 4 * kMaxQuotedChars)); }

std::size_t AzureClient::MessageLimit(const Target& target) const {
    if (target.refusedBytes == 0) return m_maxMessageBytes;
    // Below the refused size: what is known to pass, or half the refused size
    // while nothing that large has passed yet (as halving the message would).
    const std::size_t learned = std::max(target.acceptedBytes, target.refusedBytes / 2);
    return std::max<std::size_t>(1, std::min(m_maxMessageBytes, learned));
}

AzureClient::MessageOutcome AzureClient::SendMessage(std::size_t first, std::size_t last, Clock::time_point deadline) {
    Target& target = *m_current;
    const std::string body = m_rows->Compose(first, last);
    const std::size_t rows = last - first;
    // A retried message keeps its id, so duplicate detection can drop a copy that did arrive.
    const std::string messageId = NewUuid();
    bool renewed = false;
    int attempt = 0;
    while (true) {
        const auto remaining = duration_cast<milliseconds>(deadline - m_options.clock->Now());
        if (remaining <= milliseconds(0)) {
            return {MessageResult::Failed,
                    "the send time bound of " + std::to_string(m_options.sendBudget.count()) + " ms ran out"};
        }
        const std::vector<std::string> headers = {
            "Authorization: " + Token(target, false),
            std::string("Content-Type: ") + m_rows->ContentType(),
            "BrokerProperties: {\"MessageId\":\"" + messageId + "\"}",
            std::string("Format: \"") + m_rows->FormatName() + "\"",
            "RowCount: " + std::to_string(rows),
            "x-ms-retrypolicy: NoRetry",
        };
        ++m_lastSend.requests;
        const HttpResponse response = target.http->Post(target.url, headers, body,
                                                        std::min(m_options.requestTimeout, remaining),
                                                        std::min(m_options.connectTimeout, remaining));
        const Outcome outcome = Classify(response);
        switch (outcome) {
        case Outcome::Accepted:
            ++m_lastSend.messages;
            m_lastSend.bytes += body.size();
            target.Accepted(body.size());
            return {MessageResult::Accepted, {}};
        case Outcome::TooLarge:
            target.TooLarge(body.size());
            m_log.Info("Azure " + target.name + " refused a message of " + std::to_string(body.size()) + " bytes (" +
                       std::to_string(rows) + " rows) as too large (" + Describe(response) +
                       "); messages to it are cut to " + std::to_string(MessageLimit(target)) + " bytes from now on");
            return {MessageResult::TooLarge, Describe(response)};
        case Outcome::Unauthorized:
            if (renewed || !target.connection.sharedSignature.empty()) {
                return {MessageResult::Failed, Describe(response)};
            }
            renewed = true;
            Token(target, true);
            m_log.Info("Azure " + target.name + " refused the token; retrying once with a new one");
            continue;
        case Outcome::Permanent:
            // A malformed message concerns that message only; every other
            // refusal (403, 404, 410, TLS, ...) concerns the target.
            return {response.status == 400 ? MessageResult::Refused : MessageResult::Failed, Describe(response)};
        case Outcome::Transient: break;
        }
        if (attempt >= m_options.maxRetries) {
            return {MessageResult::Failed, Describe(response) + " after " + std::to_string(attempt + 1) + " attempts"};
        }
        const auto asked = RetryAfter(response);
        const milliseconds wait = asked ? *asked : m_backoff.Delay(attempt);
        if (m_options.clock->Now() + wait >= deadline) {
            return {MessageResult::Failed, Describe(response) + "; waiting " + std::to_string(wait.count()) +
                                               " ms more would pass the send time bound of " +
                                               std::to_string(m_options.sendBudget.count()) + " ms"};
        }
        ++attempt;
        m_log.Info("Azure " + target.name + ": " + Describe(response) + "; retry " + std::to_string(attempt) + " of " +
                   std::to_string(m_options.maxRetries) + " in " + std::to_string(wait.count()) + " ms");
        m_options.clock->Sleep(wait);
    }
}

bool AzureClient::Send() {
    m_lastSend = SendStats{};
    if (!m_rows) {
        m_log.Error("Azure send failed: no batch is open");
        return false;
    }
    const auto start = m_options.clock->Now();
    const auto deadline = start + m_options.sendBudget;
    const std::size_t count = m_rows->Count();

    std::size_t refusedRows = 0, refusedMessages = 0;
    std::string refusal;  // why the first refused message was refused
    std::size_t unsentRows = 0;
    std::string stop;             // why the send ended before the last row
    std::size_t maxRows = count;  // after a too-large answer: fewer rows than that message held
    for (std::size_t first = 0; first < count;) {
        // Greedy cut: as many rows as the target's size limit allows, at least one.
        const std::size_t limit = MessageLimit(*m_current);
        std::size_t last = first + 1;
        while (last < count && last - first < maxRows && m_rows->MessageSize(first, last + 1) <= limit) ++last;
        const std::size_t rows = last - first;
        MessageOutcome outcome = SendMessage(first, last, deadline);
        if (outcome.result == MessageResult::TooLarge && rows == 1) {
            outcome.result = MessageResult::Refused;
            outcome.reason = "a single row is too large for the service: " + outcome.reason;
        }
        maxRows = count;
        switch (outcome.result) {
        case MessageResult::Accepted:
            m_lastSend.rows += rows;
            first = last;
            break;
        case MessageResult::TooLarge:
            maxRows = rows - 1;  // cut again, below the refused size
            break;
        case MessageResult::Refused:
            ++refusedMessages;
            refusedRows += rows;
            if (refusal.empty()) refusal = outcome.reason;
            first = last;
            m_log.Info("Azure " + TargetName() + " refused a message of " + std::to_string(rows) + " rows (" +
                       outcome.reason + "); " + std::to_string(m_lastSend.rows) + " rows delivered so far, " +
                       std::to_string(count - first) + " still to send");
            break;
        case MessageResult::Failed:
            unsentRows = count - first;
            stop = outcome.reason;
            first = count;
            break;
        }
    }
    const std::size_t failed = refusedRows + unsentRows;
    if (failed > 0) {
        std::string text = "Azure send to " + TargetName() + " failed for " + std::to_string(failed) + " of " +
                           std::to_string(count) + " rows (" + std::to_string(m_lastSend.rows) + " delivered): ";
        if (refusedRows > 0) {
            text += std::to_string(refusedRows) + " rows in " + std::to_string(refusedMessages) +
                    (refusedMessages == 1 ? " message" : " messages") + " refused (" + refusal + ")";
            if (unsentRows > 0) text += "; ";
        }
        if (unsentRows > 0) text += std::to_string(unsentRows) + " rows not sent: " + stop;
        m_log.Error(text);
    } else if (m_log.InfoEnabled()) {
        m_log.Info("Azure " + m_current->name + ": sent " + std::to_string(m_lastSend.rows) + " rows in " +
                   std::to_string(m_lastSend.messages) + " messages (" + std::to_string(m_lastSend.bytes) + " bytes, " +
                   std::to_string(m_lastSend.requests) + " requests) in " +
                   std::to_string(duration_cast<milliseconds>(m_options.clock->Now() - start).count()) + " ms");
    }
    m_rows.reset();  // the batch is closed, sent or not
    return failed == 0;
}

}  // namespace corvell
