#pragma once
// The pieces of an end-to-end run: the files a gateway needs (project of the
// runtime stand-in, settings, log configuration), the gateway as a child
// process with what /proc tells about it, and its metrics and log afterwards.

#include "AzureLocalProcess.h"
#include "GatewayProcess.h"

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

namespace e2e {

enum class BodyFormat { Xml = 0, Json = 1, Bond = 2 };
const char* FormatName(BodyFormat format);

// A project of `variables` counters changing at `rate` changes per second in
// total (0: constant values), that stop changing after stopMs of simulated
// time (0: never).
struct ProjectShape {
    int variables = 10000;
    double rate = 0;
    int tickMs = 10;
    long stopMs = 0;
};

struct GatewayShape {
    int configured = 10000;  // variables named in the settings (the first of the project)
    int connections = 1;     // targets, all on the same receiver, each its own queue
    BodyFormat format = BodyFormat::Json;
    int integritySeconds = 3600;  // long: only the first cycle is a full send
};

// One folder of files for one gateway run.
class RunFolder {
public:
    RunFolder();
    ~RunFolder();
    std::string Path(const std::string& name) const { return m_path + "/" + name; }
    void WriteProject(const ProjectShape& shape) const;
    void WriteSettings(const GatewayShape& shape, const azurelocal::AzureLocalProcess& receiver) const;
    // The module's log into a file of this folder, with room for every record.
    void WriteLogConfig() const;

private:
    std::string m_path;
};

// What the gateway's metrics file says, and when it was written.
struct Metrics {
    std::uint64_t changesFired = 0;  // by the runtime stand-in
    std::uint64_t rowsSent = 0;
    double writtenAt = 0;  // seconds, the file's modification time
    bool read = false;
};
Metrics ReadMetrics(const std::string& path);

// Changes the log reports as dropped (module queue and per-project queues),
// and whether the log dropped records of its own (then the count is low).
struct DropReport {
    std::uint64_t changes = 0;
    bool logDropped = false;
};
DropReport CountDropReports(const std::string& logPath);

// CPU seconds (user and system) and resident memory of a process.
double ProcessCpuSeconds(pid_t pid);
// CPU seconds of each thread of a process, by thread id.
std::map<int, double> ThreadCpuSeconds(pid_t pid);
std::uint64_t ProcessRssBytes(pid_t pid);
double Now();  // seconds, monotonic

// skyvane-gateway with the folder's settings and project, status lines and
// metrics every statusInterval seconds.
class GatewayRun {
public:
    explicit GatewayRun(const RunFolder& folder, const std::string& statusInterval = "0.5");
    ~GatewayRun();
    pid_t Pid() const { return m_process.Pid(); }
    double StartedAt() const { return m_startedAt; }
    Metrics ReadMetrics() const { return e2e::ReadMetrics(m_metricsPath); }
    // Waits for an output line holding the text; false at the time-out.
    bool WaitForLine(const std::string& text, int timeoutMs) { return !m_process.WaitForText(text, timeoutMs).empty(); }
    // SIGTERM and the exit code (-1: it did not end in time).
    int Stop();

private:
    GatewayProcess m_process;
    std::string m_metricsPath;
    double m_startedAt = 0;
};

// A receiver that only checks and counts (the benchmarks' peer), or decodes
// every row (for the latency, which needs each row's time stamp).
std::unique_ptr<azurelocal::AzureLocalProcess> StartReceiver(bool decode, std::string& error);

// Sleeps; a measurement window, not a wait for a condition.
void Pause(double seconds);

}  // namespace e2e
