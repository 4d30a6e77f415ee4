// azure-local: receives Service Bus / Event Hubs messages on loopback, for
// tests, benchmarks and the demo. Prints "PORT <n>" on its first line.

#include <QCommandLineParser>
#include <QCoreApplication>
#include <QMetaObject>

#include <cstdio>
#include <iostream>
#include <thread>

#include "Server.h"

int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    QCoreApplication::setApplicationName("azure-local");
    QCommandLineParser parser;
    parser.setApplicationDescription(
        "Loopback receiver for the Azure Service Bus and Event Hubs send endpoints.\n"
        "Control: GET /_control/stats, GET /_control/rows, GET /_control/wait?rows=N&timeout-ms=T,\n"
        "POST /_control/reset,\n"
        "POST /_control/limit?bytes=N[&kind=service-bus|event-hub],\n"
        "POST /_control/fault?kind=status|stall|close|echo-auth|echo-signature"
        "&status=N&count=N&at=N&match=TEXT&detail=TEXT&retry-after=S&retry-after-ms=MS");
    parser.addHelpOption();
    parser.addOptions({
        {"port", "Port to listen on (0: a free one).", "n", "0"},
        {"host", "Loopback address to listen on (127.0.0.1 or ::1).", "address", "127.0.0.1"},
        {"key-name", "Shared access key name accepted.", "name", "RootManageSharedAccessKey"},
        {"key", "Shared access key accepted.", "key", "azure-local-key"},
        {"entity", "An existing queue or Event Hub (repeatable; none: all exist).", "name"},
        {"max-message-bytes", "Largest body accepted for both kinds of target.", "n"},
        {"event-hub-max-message-bytes", "Largest body accepted by Event Hubs (after --max-message-bytes).", "n"},
        {"record", "Append received rows as JSON lines to this file ('-': standard output).", "file"},
        {"keep-rows", "Rows kept for GET /_control/rows.", "n", "100000"},
        {"tls-cert", "Serve HTTPS with this PEM certificate.", "file"},
        {"tls-key", "PEM RSA key of the certificate.", "file"},
        {"proxy-auth", "Require these proxy credentials (user:password) on proxy-form requests.", "credentials"},
        {"quit-on-eof", "End when standard input closes (the parent has gone)."},
        {"count-only", "Check and count rows without decoding or recording them (for benchmarks)."},
    });
    parser.process(app);

    azurelocal::ServerConfig config;
    bool ok = true;
    config.port = static_cast<quint16>(parser.value("port").toUInt(&ok));
    if (!ok) {
        std::cerr << "azure-local: --port must be a number\n";
        return 2;
    }
    config.address = QHostAddress(parser.value("host"));
    config.keyName = parser.value("key-name");
    config.key = parser.value("key");
    for (const QString& entity : parser.values("entity")) config.entities.insert(entity);
    if (parser.isSet("max-message-bytes")) {
        const qint64 limit = parser.value("max-message-bytes").toLongLong(&ok);
        if (!ok || limit <= 0) {
            std::cerr << "azure-local: --max-message-bytes must be a positive number\n";
            return 2;
        }
        config.serviceBusLimit = config.eventHubLimit = limit;
    }
    if (parser.isSet("event-hub-max-message-bytes")) {
        const qint64 limit = parser.value("event-hub-max-message-bytes").toLongLong(&ok);
        if (!ok || limit <= 0) {
            std::cerr << "azure-local: --event-hub-max-message-bytes must be a positive number\n";
            return 2;
        }
        config.eventHubLimit = limit;
    }
    config.recordPath = parser.value("record");
    config.keepRows = parser.value("keep-rows").toULongLong(&ok);
    if (!ok) {
        std::cerr << "azure-local: --keep-rows must be a number\n";
        return 2;
    }
    config.tlsCertificate = parser.value("tls-cert");
    config.tlsKey = parser.value("tls-key");
    config.proxyCredentials = parser.value("proxy-auth");
    config.countOnly = parser.isSet("count-only");
    if (config.countOnly && !config.recordPath.isEmpty()) {
        std::cerr << "azure-local: --count-only records nothing; leave out --record\n";
        return 2;
    }
    if (config.tlsCertificate.isEmpty() != config.tlsKey.isEmpty()) {
        std::cerr << "azure-local: --tls-cert and --tls-key go together\n";
        return 2;
    }

    azurelocal::Server server(config);
    QString error;
    if (!server.Start(error)) {
        std::cerr << "azure-local: " << error.toStdString() << "\n";
        return 1;
    }
    std::printf("PORT %u\n", static_cast<unsigned>(server.Port()));
    std::fflush(stdout);

    if (parser.isSet("quit-on-eof")) {
        std::thread([&app] {
            char buffer[256];
            while (std::fread(buffer, 1, sizeof buffer, stdin) > 0) {}
            QMetaObject::invokeMethod(
                &app, [] { QCoreApplication::quit(); }, Qt::QueuedConnection);
        }).detach();
    }
    return app.exec();
}
