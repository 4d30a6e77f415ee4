#pragma once
// azure-local: a loopback HTTP(S) server that receives messages the way the
// Service Bus and Event Hubs send endpoints do.

#include <QByteArray>
#include <QFile>
#include <QHash>
#include <QHostAddress>
#include <QList>
#include <QMap>
#include <QObject>
#include <QSet>
#include <QString>
#include <QTcpServer>

#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <vector>

#include "RowDecoders.h"

class QTcpSocket;

namespace azurelocal {

struct ServerConfig {
    QHostAddress address = QHostAddress::LocalHost;
    quint16 port = 0;
    QString keyName = "RootManageSharedAccessKey";
    QString key = "azure-local-key";
    QSet<QString> entities;  // empty: every entity exists
    qint64 serviceBusLimit = 256 * 1024;
    qint64 eventHubLimit = 1024 * 1024;
    QString recordPath;  // JSON lines of received rows; "-": standard output
    std::size_t keepRows = 100000;
    QString tlsCertificate;
    QString tlsKey;
    QString proxyCredentials;  // "user:password": answer requests in proxy form only with them
    // Checks signature, entity, size and the rows' count, and counts, but
    // neither decodes nor records (the receiver of the benchmarks).
    bool countOnly = false;
};

struct HttpRequest {
    QByteArray method;
    QByteArray target;
    QMap<QByteArray, QByteArray> headers;  // lower-case names
    QByteArray body;
};

struct HttpReply {
    int status = 201;
    QList<QPair<QByteArray, QByteArray>> headers;
    QByteArray body;
};

// An injected fault, used for the next `remaining` send requests it applies to.
struct Fault {
    // EchoAuthorization quotes the Authorization header in the error text;
    // EchoSignature quotes the token's signature decoded (plain base64 and
    // base64url), the whole token decoded and the server's key.
    enum class Kind { Status, Stall, Close, EchoAuthorization, EchoSignature } kind = Kind::Status;
    int status = 503;
    QByteArray retryAfter;    // seconds, sent as Retry-After
    QByteArray retryAfterMs;  // sent as retry-after-ms
    int remaining = 1;
    int skip = 0;       // requests to let through first (at=N: the Nth request from now)
    QByteArray match;   // applies only to requests whose body holds this text
    QByteArray detail;  // the error text of a status fault; empty: "injected fault"
};

class Server : public QObject {
    Q_OBJECT
public:
    explicit Server(ServerConfig config, QObject* parent = nullptr);
    // Listens; false with a reason on failure.
    bool Start(QString& error);
    quint16 Port() const;

private:
    struct SocketState {
        QByteArray buffer;
        bool continued = false;  // "100 Continue" sent for the request being read
        bool stalled = false;    // a stall fault: never answer again
    };

    void OnNewConnection();
    void OnReadyRead(QTcpSocket* socket);
    void Handle(QTcpSocket* socket, const HttpRequest& request);
    HttpReply HandleSend(const HttpRequest& request, const QByteArray& path, const QByteArray& query,
                         const QByteArray& authority);
    HttpReply HandleControl(const HttpRequest& request, const QByteArray& path, const QByteArray& query);
    // The fault that applies to this request, taken off the queue when used up.
    std::optional<Fault> TakeFault(const HttpRequest& request);
    HttpReply FaultReply(const Fault& fault, const HttpRequest& request) const;
    void Write(QTcpSocket* socket, const HttpReply& reply, bool close);
    void Record(const std::vector<std::string>& lines);
    // GET /_control/wait?rows=N&timeout-ms=T: the stats once N rows have
    // arrived, or at the time-out, whichever comes first.
    void Wait(QTcpSocket* socket, const QByteArray& query);
    void AnswerWaiters();
    QByteArray StatsBody() const;
    // Arrival time minus each row's time stamp, for the latency percentiles.
    void NoteLatencies(const std::vector<DecodedRow>& rows);

    ServerConfig m_config;
    qint64 m_startServiceBusLimit = 0;  // limits restored by a reset
    qint64 m_startEventHubLimit = 0;
    QHash<QTcpSocket*, SocketState> m_states;  // open connections
    QTcpServer* m_server = nullptr;
    QFile m_recordFile;
    std::deque<Fault> m_faults;
    std::deque<std::string> m_rows;         // the last keepRows rows as JSON lines
    QHash<QTcpSocket*, quint64> m_waiters;  // connections waiting for this many rows
    std::vector<quint64> m_latencyMs;       // rows by whole milliseconds of latency; the last counts the rest
    struct Counters {
        quint64 requests = 0, messages = 0, rows = 0, rejected = 0, bytes = 0, proxied = 0, unauthorized = 0,
                tooLarge = 0;
    } m_counters;
};

}  // namespace azurelocal
