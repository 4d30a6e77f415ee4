#pragma once
// Runs azure-local as a child process on a free loopback port and drives it
// through its control endpoints. For tests and benchmarks.

#include <QStringList>

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "RowDecoders.h"

namespace azurelocal {

struct ReceivedRow {
    DecodedRow row;
    std::string entity;
    std::string format;
    std::string messageId;
};

struct ServerStats {
    std::uint64_t requests = 0, messages = 0, rows = 0, rejected = 0, bytes = 0, proxied = 0, unauthorized = 0,
                  tooLarge = 0;
    // Arrival minus row time of the decoded rows, in ms; -1 when none was decoded.
    std::int64_t latencyP50Ms = -1, latencyP99Ms = -1;
    std::uint64_t latencyRows = 0;
    bool answered = false;  // false: the receiver could not be asked
};

class AzureLocalProcess {
public:
    static constexpr const char* kKeyName = "RootManageSharedAccessKey";
    static constexpr const char* kKey = "azure-local-key";

    // Starts the program found beside the running one; null with a reason on failure.
    static std::unique_ptr<AzureLocalProcess> Start(const QStringList& arguments, std::string& error);
    ~AzureLocalProcess();

    int Port() const { return m_port; }
    // "Endpoint=sb://127.0.0.1:<port>/;SharedAccessKeyName=..;SharedAccessKey=..;UseDevelopmentEmulator=true"
    std::string ConnectionString(const std::string& extra = "") const;

    bool Fault(const std::string& query);  // e.g. "kind=status&status=503&count=2&retry-after=1"
    bool Reset();
    // Largest body accepted; kind "service-bus" or "event-hub" sets one of them, empty both.
    bool SetLimit(std::size_t bytes, const std::string& kind = "");
    ServerStats Stats();
    // The stats once `rows` rows have arrived, or after timeoutMs.
    ServerStats WaitForRows(std::uint64_t rows, int timeoutMs);
    std::vector<ReceivedRow> Rows();

private:
    AzureLocalProcess() = default;
    bool Control(const std::string& method, const std::string& path, std::string* body = nullptr,
                 long timeoutSeconds = 10);
    ServerStats ReadStats(const std::string& path, long timeoutSeconds);

    bool Spawn(const std::vector<std::string>& arguments, std::string& error);
    bool ReadFirstLine(std::string& line, int timeoutMs);
    bool WaitForExit(int timeoutMs);

    pid_t m_pid = -1;
    int m_stdin = -1;   // closing it ends the child
    int m_stdout = -1;  // the child's standard output, read for its port
    int m_port = 0;
    std::string m_tlsCertificate;  // the server's certificate when it serves HTTPS
};

// Where the programs of this build are (the running program's folder).
std::string BuildBinaryDir();

// Writes a self-signed certificate for 127.0.0.1 and its RSA key (PEM) into
// dir; false on failure.
bool MakeSelfSignedCertificate(const std::string& dir, std::string& certFile, std::string& keyFile);

}  // namespace azurelocal
