#include "Server.h"

#include <QDateTime>
#include <QHash>
#include <QSslCertificate>
#include <QSslConfiguration>
#include <QSslKey>
#include <QSslServer>
#include <QSslSocket>
#include <QTcpSocket>
#include <QTimer>
#include <QUrlQuery>

#include <algorithm>
#include <cstdio>

#include "RowDecoders.h"

namespace azurelocal {

namespace {

constexpr qsizetype kMaxHeaderBytes = 64 * 1024;
constexpr qint64 kMaxBodyBytes = 64 * 1024 * 1024;

QByteArray ReasonPhrase(int status) {
    switch (status) {
    case 100: return "Continue";
    case 200: return "OK";
    case 201: return "Created";
    case 400: return "Bad Request";
    case 401: return "Unauthorized";
    case 403: return "Forbidden";
    case 404: return "Not Found";
    case 405: return "Method Not Allowed";
    case 407: return "Proxy Authentication Required";
    case 411: return "Length Required";
    case 413: return "Request Entity Too Large";
    case 429: return "Too Many Requests";
    case 431: return "Request Header Fields Too Large";
    case 500: return "Internal Server Error";
    case 503: return "Service Unavailable";
    default: return "Status";
    }
}

QByteArray XmlEscape(const QByteArray& text) { return QString::fromUtf8(text).toHtmlEscaped().toUtf8(); }

// An answer in the shape the service uses for errors.
HttpReply ErrorReply(int status, const QByteArray& detail) {
    HttpReply reply;
    reply.status = status;
    reply.headers.append(qMakePair(QByteArray("Content-Type"), QByteArray("application/xml; charset=utf-8")));
    reply.body = "<Error><Code>" + QByteArray::number(status) + "</Code><Detail>" + XmlEscape(detail) +
                 "</Detail></Error>";
    return reply;
}

HttpReply TextReply(const QByteArray& contentType, const QByteArray& body) {
    HttpReply reply;
    reply.status = 200;
    reply.headers.append(qMakePair(QByteArray("Content-Type"), QByteArray(contentType)));
    reply.body = body;
    return reply;
}

QByteArray Unquote(QByteArray text) {
    text = text.trimmed();
    if (text.size() >= 2 && text.startsWith('"') && text.endsWith('"')) text = text.mid(1, text.size() - 2);
    return text;
}

std::string FormatOf(const HttpRequest& request) {
    const QByteArray format = Unquote(request.headers.value("format"));
    if (!format.isEmpty()) return format.toStdString();
    const QByteArray type = request.headers.value("content-type").toLower();
    if (type.startsWith("application/json")) return "JSON";
    if (type.contains("xml")) return "XML";
    if (type.contains("bond")) return "BOND";
    return {};
}

// Rows of a body without decoding it. Exact for bodies as the client writes
// them: a quote or "<" inside a text is escaped, so the row openings below
// appear nowhere else. Empty when the body is not of that format.
std::optional<quint64> CountRows(const std::string& formatAnyCase, const QByteArray& body) {
    const std::string format = QByteArray::fromStdString(formatAnyCase).toUpper().toStdString();
    const std::string_view text(body.constData(), static_cast<std::size_t>(body.size()));
    auto occurrences = [&text](std::string_view opening) {
        quint64 count = 0;
        for (std::size_t at = text.find(opening); at != std::string_view::npos; at = text.find(opening, at + 1))
            ++count;
        return count;
    };
    if (format == "JSON" && text.starts_with('[')) return occurrences("{\"project\":");
    if (format == "XML" && text.starts_with("<?xml")) return occurrences("<row ");
    if (format == "BOND" && text.size() > 6 && text.starts_with("CB\x01")) {
        // The list's element count follows the marshal header and the list's type bytes.
        quint64 count = 0;
        for (std::size_t at = 6, shift = 0; at < text.size() && shift < 64; ++at, shift += 7) {
            count |= static_cast<quint64>(static_cast<unsigned char>(text[at]) & 0x7F) << shift;
            if (!(static_cast<unsigned char>(text[at]) & 0x80)) return count;
        }
    }
    return std::nullopt;
}

constexpr std::size_t kLatencyBuckets = 60001;  // 0 to 60 s by the millisecond, then "longer"

}  // namespace

Server::Server(ServerConfig config, QObject* parent)
    : QObject(parent), m_config(std::move(config)), m_startServiceBusLimit(m_config.serviceBusLimit),
      m_startEventHubLimit(m_config.eventHubLimit) {}

bool Server::Start(QString& error) {
    if (!m_config.address.isLoopback()) {
        error = "azure-local listens on loopback addresses only";
        return false;
    }
    if (!m_config.tlsCertificate.isEmpty()) {
        QFile certFile(m_config.tlsCertificate), keyFile(m_config.tlsKey);
        if (!certFile.open(QIODevice::ReadOnly) || !keyFile.open(QIODevice::ReadOnly)) {
            error = "cannot read the TLS certificate or key";
            return false;
        }
        const QSslCertificate certificate(&certFile, QSsl::Pem);
        const QSslKey key(&keyFile, QSsl::Rsa, QSsl::Pem);
        if (certificate.isNull() || key.isNull()) {
            error = "the TLS certificate or key is not valid PEM (RSA key expected)";
            return false;
        }
        QSslConfiguration tls = QSslConfiguration::defaultConfiguration();
        tls.setLocalCertificate(certificate);
        tls.setPrivateKey(key);
        tls.setPeerVerifyMode(QSslSocket::VerifyNone);
        auto* server = new QSslServer(this);
        server->setSslConfiguration(tls);
        m_server = server;
    } else {
        m_server = new QTcpServer(this);
    }
    if (!m_config.recordPath.isEmpty()) {
        const bool opened = m_config.recordPath == "-" ? m_recordFile.open(stdout, QIODevice::WriteOnly)
                                                       : (m_recordFile.setFileName(m_config.recordPath),
                                                          m_recordFile.open(QIODevice::WriteOnly | QIODevice::Append));
        if (!opened) {
            error = "cannot open the record file " + m_config.recordPath;
            return false;
        }
    }
    connect(m_server, &QTcpServer::pendingConnectionAvailable, this, &Server::OnNewConnection);
    if (!m_server->listen(m_config.address, m_config.port)) {
        error = m_server->errorString();
        return false;
    }
    return true;
}

quint16 Server::Port() const { return m_server ? m_server->serverPort() : 0; }

void Server::OnNewConnection() {
    while (QTcpSocket* socket = m_server->nextPendingConnection()) {
        m_states.insert(socket, Server::SocketState{});
        connect(socket, &QTcpSocket::readyRead, this, [this, socket] { OnReadyRead(socket); });
        connect(socket, &QTcpSocket::disconnected, this, [this, socket] {
            m_states.remove(socket);
            m_waiters.remove(socket);
            socket->deleteLater();
        });
        if (socket->bytesAvailable() > 0) OnReadyRead(socket);
    }
}

void Server::OnReadyRead(QTcpSocket* socket) {
    while (true) {
        auto it = m_states.find(socket);
        if (it == m_states.end()) return;
        SocketState& state = *it;
        state.buffer += socket->readAll();
        if (state.stalled) {
            state.buffer.clear();
            return;
        }
        const qsizetype headerEnd = state.buffer.indexOf("\r\n\r\n");
        if (headerEnd < 0) {
            if (state.buffer.size() > kMaxHeaderBytes) Write(socket, ErrorReply(431, "headers too large"), true);
            return;
        }
        HttpRequest request;
        const QList<QByteArray> lines = state.buffer.left(headerEnd).split('\n');
        const QList<QByteArray> requestLine = lines.value(0).trimmed().split(' ');
        if (requestLine.size() != 3 || !requestLine[2].startsWith("HTTP/1.")) {
            Write(socket, ErrorReply(400, "malformed request line"), true);
            return;
        }
        request.method = requestLine[0];
        request.target = requestLine[1];
        for (qsizetype i = 1; i < lines.size(); ++i) {
            const QByteArray line = lines[i].trimmed();
            const qsizetype colon = line.indexOf(':');
            if (colon <= 0) continue;
            request.headers.insert(line.left(colon).trimmed().toLower(), line.mid(colon + 1).trimmed());
        }
        if (request.headers.contains("transfer-encoding")) {
            Write(socket, ErrorReply(411, "send a Content-Length"), true);
            return;
        }
        bool numeric = true;
        const qint64 length = request.headers.value("content-length", "0").toLongLong(&numeric);
        if (!numeric || length < 0) {
            Write(socket, ErrorReply(400, "malformed Content-Length"), true);
            return;
        }
        if (length > kMaxBodyBytes) {
            Write(socket, ErrorReply(413, "the request body is too large"), true);
            return;
        }
        if (state.buffer.size() < headerEnd + 4 + length) {
            if (!state.continued && request.headers.value("expect").toLower() == "100-continue") {
                state.continued = true;
                socket->write("HTTP/1.1 100 Continue\r\n\r\n");
            }
            return;
        }
        request.body = state.buffer.mid(headerEnd + 4, length);
        state.buffer.remove(0, headerEnd + 4 + length);
        state.continued = false;
        Handle(socket, request);
        if (!m_states.contains(socket) || socket->state() != QAbstractSocket::ConnectedState) return;
    }
}

void Server::Handle(QTcpSocket* socket, const HttpRequest& request) {
    QByteArray target = request.target;
    QByteArray authority = request.headers.value("host");
    const bool proxied = target.startsWith("http://") || target.startsWith("https://");
    if (proxied) {
        const qsizetype hostStart = target.indexOf("://") + 3;
        qsizetype pathStart = target.indexOf('/', hostStart);
        if (pathStart < 0) pathStart = target.size();
        authority = target.mid(hostStart, pathStart - hostStart);
        target = target.mid(pathStart);
        if (!m_config.proxyCredentials.isEmpty() &&
            request.headers.value("proxy-authorization") != "Basic " + m_config.proxyCredentials.toUtf8().toBase64()) {
            HttpReply reply = ErrorReply(407, "proxy credentials required");
            reply.headers.append(
                qMakePair(QByteArray("Proxy-Authenticate"), QByteArray("Basic realm=\"azure-local\"")));
            Write(socket, reply, false);
            return;
        }
        ++m_counters.proxied;
    }
    const qsizetype queryStart = target.indexOf('?');
    const QByteArray path = queryStart < 0 ? target : target.left(queryStart);
    const QByteArray query = queryStart < 0 ? QByteArray() : target.mid(queryStart + 1);

    if (path == "/_control/wait") {
        Wait(socket, query);
        return;
    }
    if (path.startsWith("/_control/")) {
        Write(socket, HandleControl(request, path, query), false);
        return;
    }
    if (!path.endsWith("/messages") || path.size() <= 10) {
        Write(socket, ErrorReply(404, "no such endpoint"), false);
        return;
    }
    if (request.method != "POST") {
        Write(socket, ErrorReply(405, "messages are sent with POST"), false);
        return;
    }
    ++m_counters.requests;
    if (const auto fault = TakeFault(request)) {
        switch (fault->kind) {
        case Fault::Kind::Stall: m_states[socket].stalled = true; return;
        case Fault::Kind::Close:
            m_states.remove(socket);
            socket->abort();
            return;
        case Fault::Kind::Status:
        case Fault::Kind::EchoAuthorization:
        case Fault::Kind::EchoSignature:
            ++m_counters.rejected;
            Write(socket, FaultReply(*fault, request), false);
            return;
        }
    }
    const HttpReply reply = HandleSend(request, path, query, authority);
    if (reply.status >= 300) ++m_counters.rejected;
    Write(socket, reply, false);
    if (reply.status < 300) AnswerWaiters();
}

std::optional<Fault> Server::TakeFault(const HttpRequest& request) {
    if (m_faults.empty()) return std::nullopt;
    Fault& next = m_faults.front();
    if (!next.match.isEmpty() && !request.body.contains(next.match)) return std::nullopt;
    if (next.skip > 0) {
        --next.skip;
        return std::nullopt;
    }
    const Fault fault = next;
    if (--next.remaining <= 0) m_faults.pop_front();
    return fault;
}

HttpReply Server::FaultReply(const Fault& fault, const HttpRequest& request) const {
    const QByteArray authorization = request.headers.value("authorization");
    QByteArray detail = fault.detail.isEmpty() ? QByteArray("injected fault") : fault.detail;
    if (fault.kind == Fault::Kind::EchoAuthorization) {
        detail = "token " + authorization;
    } else if (fault.kind == Fault::Kind::EchoSignature) {
        QByteArray signature;
        for (const QByteArray& part : authorization.mid(authorization.indexOf(' ') + 1).split('&'))
            if (part.startsWith("sig=")) signature = QByteArray::fromPercentEncoding(part.mid(4));
        QByteArray url = signature;
        url.replace('+', '-').replace('/', '_');
        while (url.endsWith('=')) url.chop(1);
        detail = "the signature " + signature + " (" + url + ") of " + QByteArray::fromPercentEncoding(authorization) +
                 " was checked with the key " + m_config.key.toUtf8();
    }
    HttpReply reply = ErrorReply(fault.status, detail);
    if (!fault.retryAfter.isEmpty()) reply.headers.append(qMakePair(QByteArray("Retry-After"), fault.retryAfter));
    if (!fault.retryAfterMs.isEmpty())
        reply.headers.append(qMakePair(QByteArray("retry-after-ms"), fault.retryAfterMs));
    return reply;
}

HttpReply Server::HandleSend(const HttpRequest& request, const QByteArray& path, const QByteArray& query,
                             const QByteArray& authority) {
    const QByteArray entity = QByteArray::fromPercentEncoding(path.mid(1, path.size() - 1 - 9));
    std::string why;
    const std::string resource = (authority + "/" + entity).toStdString();
    if (!CheckSasToken(request.headers.value("authorization").toStdString(), m_config.keyName.toStdString(),
                       m_config.key.toStdString(), resource, QDateTime::currentSecsSinceEpoch(), why)) {
        ++m_counters.unauthorized;
        return ErrorReply(401, QByteArray("InvalidSignature: ") + why.c_str());
    }
    if (!m_config.entities.isEmpty() && !m_config.entities.contains(QString::fromUtf8(entity)))
        return ErrorReply(404, "The messaging entity '" + entity + "' could not be found.");
    const bool eventHub = QUrlQuery(QString::fromUtf8(query)).hasQueryItem("api-version");
    const qint64 limit = eventHub ? m_config.eventHubLimit : m_config.serviceBusLimit;
    if (request.body.size() > limit) {
        ++m_counters.tooLarge;
        return ErrorReply(413, "The request body of " + QByteArray::number(request.body.size()) +
                                   " bytes is too large; the limit is " + QByteArray::number(limit) + ".");
    }
    const std::string format = FormatOf(request);
    if (m_config.countOnly) {
        const std::optional<quint64> rows = CountRows(format, request.body);
        if (!rows) return ErrorReply(400, "the body is no " + QByteArray::fromStdString(format) + " list of rows");
        const QByteArray announced = request.headers.value("rowcount");
        if (!announced.isEmpty() && announced.toULongLong() != *rows)
            return ErrorReply(400, "RowCount says " + announced + ", the body holds " + QByteArray::number(*rows));
        ++m_counters.messages;
        m_counters.rows += *rows;
        m_counters.bytes += static_cast<quint64>(request.body.size());
        return HttpReply{};
    }
    const DecodeResult decoded =
        DecodeRows(format, std::string_view(request.body.constData(), static_cast<std::size_t>(request.body.size())));
    if (!decoded.ok) return ErrorReply(400, QByteArray::fromStdString(decoded.error));

    std::string messageId;
    std::string error;
    if (const auto properties = ParseJson(request.headers.value("brokerproperties").toStdString(), error)) {
        if (const JsonValue* id = properties->Find("MessageId")) messageId = id->text;
    }
    std::vector<std::string> lines;
    lines.reserve(decoded.rows.size());
    for (const DecodedRow& row : decoded.rows)
        lines.push_back(RowToJsonLine(row, entity.toStdString(), format, messageId));
    Record(lines);
    NoteLatencies(decoded.rows);
    ++m_counters.messages;
    m_counters.rows += decoded.rows.size();
    m_counters.bytes += static_cast<quint64>(request.body.size());
    HttpReply reply;
    reply.status = 201;
    return reply;
}

HttpReply Server::HandleControl(const HttpRequest& request, const QByteArray& path, const QByteArray& query) {
    const QUrlQuery q(QString::fromUtf8(query));
    if (path == "/_control/stats") return TextReply("application/json", StatsBody());
    if (path == "/_control/rows") {
        QByteArray body;
        for (const auto& line : m_rows) body += QByteArray::fromStdString(line) + '\n';
        return TextReply("application/x-ndjson", body);
    }
    if (request.method != "POST") return ErrorReply(405, "control commands are sent with POST");
    if (path == "/_control/reset") {
        m_counters = Counters{};
        m_rows.clear();
        m_latencyMs.clear();
        m_faults.clear();
        m_config.serviceBusLimit = m_startServiceBusLimit;
        m_config.eventHubLimit = m_startEventHubLimit;
        return TextReply("text/plain", "reset\n");
    }
    if (path == "/_control/limit") {
        bool ok = false;
        const qint64 bytes = q.queryItemValue("bytes").toLongLong(&ok);
        if (!ok || bytes <= 0) return ErrorReply(400, "limit?bytes=N[&kind=service-bus|event-hub]");
        const QString kind = q.queryItemValue("kind");
        if (kind.isEmpty() || kind == "service-bus") m_config.serviceBusLimit = bytes;
        if (kind.isEmpty() || kind == "event-hub") m_config.eventHubLimit = bytes;
        if (!kind.isEmpty() && kind != "service-bus" && kind != "event-hub")
            return ErrorReply(400, "kind is service-bus or event-hub");
        return TextReply("text/plain", "limit set\n");
    }
    if (path == "/_control/fault") {
        Fault fault;
        const QString kind = q.queryItemValue("kind");
        if (kind.isEmpty() || kind == "status") fault.kind = Fault::Kind::Status;
        else if (kind == "stall") fault.kind = Fault::Kind::Stall;
        else if (kind == "close") fault.kind = Fault::Kind::Close;
        else if (kind == "echo-auth") fault.kind = Fault::Kind::EchoAuthorization;
        else if (kind == "echo-signature") fault.kind = Fault::Kind::EchoSignature;
        else return ErrorReply(400, "kind is status, stall, close, echo-auth or echo-signature");
        bool ok = true;
        if (q.hasQueryItem("status")) fault.status = q.queryItemValue("status").toInt(&ok);
        if (!ok || fault.status < 200 || fault.status > 599) return ErrorReply(400, "status is 200..599");
        if (q.hasQueryItem("count")) fault.remaining = q.queryItemValue("count").toInt(&ok);
        if (!ok || fault.remaining < 1) return ErrorReply(400, "count is a positive number");
        if (q.hasQueryItem("at")) fault.skip = q.queryItemValue("at").toInt(&ok) - 1;
        if (!ok || fault.skip < 0) return ErrorReply(400, "at is a positive number");
        fault.match = q.queryItemValue("match", QUrl::FullyDecoded).toUtf8();
        fault.detail = q.queryItemValue("detail", QUrl::FullyDecoded).toUtf8();
        fault.retryAfter = q.queryItemValue("retry-after").toUtf8();
        fault.retryAfterMs = q.queryItemValue("retry-after-ms").toUtf8();
        m_faults.push_back(fault);
        return TextReply("text/plain", "fault queued\n");
    }
    return ErrorReply(404, "unknown control command");
}

void Server::Write(QTcpSocket* socket, const HttpReply& reply, bool close) {
    QByteArray head = "HTTP/1.1 " + QByteArray::number(reply.status) + " " + ReasonPhrase(reply.status) + "\r\n";
    for (const auto& [name, value] : reply.headers) head += name + ": " + value + "\r\n";
    head += "Content-Length: " + QByteArray::number(reply.body.size()) + "\r\n";
    if (close) head += "Connection: close\r\n";
    head += "\r\n";
    socket->write(head + reply.body);
    if (close) {
        m_states.remove(socket);
        socket->disconnectFromHost();
    }
}

void Server::Record(const std::vector<std::string>& lines) {
    for (const auto& line : lines) {
        m_rows.push_back(line);
        if (m_rows.size() > m_config.keepRows) m_rows.pop_front();
    }
    if (m_recordFile.isOpen()) {
        for (const auto& line : lines) {
            m_recordFile.write(line.data(), static_cast<qint64>(line.size()));
            m_recordFile.write("\n", 1);
        }
        m_recordFile.flush();
    }
}

QByteArray Server::StatsBody() const {
    const auto& c = m_counters;
    QByteArray body =
        "{\"requests\":" + QByteArray::number(c.requests) + ",\"messages\":" + QByteArray::number(c.messages) +
        ",\"rows\":" + QByteArray::number(c.rows) + ",\"rejected\":" + QByteArray::number(c.rejected) +
        ",\"bytes\":" + QByteArray::number(c.bytes) + ",\"proxied\":" + QByteArray::number(c.proxied) +
        ",\"unauthorized\":" + QByteArray::number(c.unauthorized) + ",\"tooLarge\":" + QByteArray::number(c.tooLarge);
    // Percentiles of the decoded rows' latency, in whole milliseconds (-1: none decoded).
    quint64 total = 0;
    for (const quint64 n : m_latencyMs) total += n;
    for (const auto& [name, share] : {std::pair{"latencyP50Ms", 0.50}, std::pair{"latencyP99Ms", 0.99}}) {
        qint64 value = -1;
        quint64 seen = 0;
        for (std::size_t ms = 0; total > 0 && ms < m_latencyMs.size(); ++ms) {
            seen += m_latencyMs[ms];
            if (static_cast<double>(seen) >= share * static_cast<double>(total)) {
                value = static_cast<qint64>(ms);
                break;
            }
        }
        body += ",\"" + QByteArray(name) + "\":" + QByteArray::number(value);
    }
    return body + ",\"latencyRows\":" + QByteArray::number(total) + "}";
}

void Server::NoteLatencies(const std::vector<DecodedRow>& rows) {
    if (m_latencyMs.empty()) m_latencyMs.assign(kLatencyBuckets, 0);
    const qint64 now = QDateTime::currentMSecsSinceEpoch();
    for (const DecodedRow& row : rows) {
        // A row stamped after its arrival (clock steps) counts as 0 ms.
        const qint64 latency = std::max<qint64>(0, now - (row.time * 1000 + row.milliseconds));
        ++m_latencyMs[static_cast<std::size_t>(std::min<qint64>(latency, kLatencyBuckets - 1))];
    }
}

void Server::Wait(QTcpSocket* socket, const QByteArray& query) {
    const QUrlQuery q(QString::fromUtf8(query));
    bool rowsOk = false, timeOk = false;
    const quint64 rows = q.queryItemValue("rows").toULongLong(&rowsOk);
    const int timeoutMs = q.queryItemValue("timeout-ms").toInt(&timeOk);
    if (!rowsOk || !timeOk || timeoutMs < 0 || timeoutMs > 600000) {
        Write(socket, ErrorReply(400, "wait?rows=N&timeout-ms=T (T up to 600000)"), false);
        return;
    }
    if (m_counters.rows >= rows) {
        Write(socket, TextReply("application/json", StatsBody()), false);
        return;
    }
    m_waiters.insert(socket, rows);
    // The socket is the timer's context: a connection that closes takes its timer with it.
    QTimer::singleShot(timeoutMs, socket, [this, socket] {
        if (m_waiters.remove(socket) > 0) Write(socket, TextReply("application/json", StatsBody()), false);
    });
}

void Server::AnswerWaiters() {
    for (auto it = m_waiters.begin(); it != m_waiters.end();) {
        if (m_counters.rows < it.value()) {
            ++it;
            continue;
        }
        QTcpSocket* socket = it.key();
        it = m_waiters.erase(it);
        Write(socket, TextReply("application/json", StatsBody()), false);
    }
}

}  // namespace azurelocal
