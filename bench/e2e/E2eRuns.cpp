#include "E2eRuns.h"

#include <QDir>
#include <QFile>
#include <QTemporaryDir>

#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <thread>

namespace e2e {

namespace {

void WriteFile(const std::string& path, const std::string& text) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out << text;
    if (!out) throw std::runtime_error("cannot write " + path);
}

// The value of one sample line "name value" of a Prometheus text file.
std::uint64_t Sample(const std::string& text, const std::string& name) {
    const std::string start = "\n" + name + " ";
    const size_t at = ("\n" + text).find(start);
    if (at == std::string::npos) return 0;
    return std::strtoull(text.c_str() + at + start.size() - 1, nullptr, 10);
}

}  // namespace

const char* FormatName(BodyFormat format) {
    switch (format) {
    case BodyFormat::Xml: return "XML";
    case BodyFormat::Json: return "JSON";
    case BodyFormat::Bond: return "BOND";
    }
    return "?";
}

RunFolder::RunFolder() {
    QTemporaryDir dir(QDir::temp().filePath("skyvane-e2e-XXXXXX"));
    dir.setAutoRemove(false);
    if (!dir.isValid()) throw std::runtime_error("cannot create a temporary folder");
    m_path = dir.path().toStdString();
}

RunFolder::~RunFolder() { QDir(QString::fromStdString(m_path)).removeRecursively(); }

void RunFolder::WriteProject(const ProjectShape& shape) const {
    std::ostringstream json;
    json << R"({"tick_ms": )" << shape.tickMs << R"(, "projects": [{"name": "Bench", "variables": [)";
    if (shape.variables > 0) {
        json << R"({"name": "Tag{n}", "repeat": )" << shape.variables;
        if (shape.rate > 0) {
            json << R"(, "rate": )" << shape.rate << R"(, "generator": {"kind": "counter")";
            if (shape.stopMs > 0) json << R"(, "stop_ms": )" << shape.stopMs;
            json << "}";
        }
        json << "}";
    }
    json << "]}]}";
    WriteFile(Path("project.json"), json.str());
}

void RunFolder::WriteSettings(const GatewayShape& shape, const azurelocal::AzureLocalProcess& receiver) const {
    std::ostringstream ini;
    ini << "[Azure]\nINTEGRITYPERIOD=" << shape.integritySeconds << "\n[VARIABLES]\nCOUNT=" << shape.configured << "\n";
    for (int i = 0; i < shape.configured; ++i) ini << "NAME_" << i << "=Bench#Tag" << i + 1 << "\n";
    ini << "[CONNECTIONS]\nCOUNT=" << shape.connections << "\n";
    for (int i = 0; i < shape.connections; ++i) {
        ini << "CONN_" << i << "=" << receiver.ConnectionString() << "\nQUEUE_" << i << "=values" << i << "\nMODE_" << i
            << "=0\nFORMAT_" << i << "=" << static_cast<int>(shape.format) << "\n";
    }
    WriteFile(Path("skyvane.ini"), ini.str());
}

void RunFolder::WriteLogConfig() const {
    WriteFile(Path("brennic.ini"),
              "[file]\npath = " + Path("gateway.log") +
                  "\nkeep = 0\nmax_size = 1G\n[stderr]\nenabled = no\n[queue]\ncapacity = 10000000\n");
}

Metrics ReadMetrics(const std::string& path) {
    Metrics metrics;
    std::ifstream in(path, std::ios::binary);
    struct stat info {};
    if (!in || ::stat(path.c_str(), &info) != 0) return metrics;
    std::ostringstream text;
    text << in.rdbuf();
    metrics.changesFired = Sample(text.str(), "skyvane_gateway_simulated_changes_total");
    metrics.rowsSent = Sample(text.str(), "skyvane_gateway_rows_sent_total");
    metrics.writtenAt = static_cast<double>(info.st_mtim.tv_sec) + static_cast<double>(info.st_mtim.tv_nsec) / 1e9;
    metrics.read = true;
    return metrics;
}

DropReport CountDropReports(const std::string& logPath) {
    DropReport report;
    std::ifstream in(logPath);
    std::string line;
    while (std::getline(in, line)) {
        if (line.find("Value change queue full") != std::string::npos) ++report.changes;
        if (line.find("log records were dropped") != std::string::npos) report.logDropped = true;
    }
    return report;
}

namespace {

// utime + stime of a /proc stat file: fields 14 and 15, counted after the
// command's closing parenthesis (the command may hold blanks).
double CpuSecondsOfStatFile(const std::string& path) {
    std::ifstream in(path);
    std::string text;
    std::getline(in, text);
    const size_t close = text.rfind(')');
    if (close == std::string::npos) return 0;
    std::istringstream fields(text.substr(close + 2));
    std::string field;
    unsigned long long utime = 0, stime = 0;
    for (int index = 3; fields >> field; ++index) {
        if (index == 14) utime = std::stoull(field);
        if (index == 15) {
            stime = std::stoull(field);
            break;
        }
    }
    return static_cast<double>(utime + stime) / static_cast<double>(sysconf(_SC_CLK_TCK));
}

}  // namespace

double ProcessCpuSeconds(pid_t pid) { return CpuSecondsOfStatFile("/proc/" + std::to_string(pid) + "/stat"); }

std::map<int, double> ThreadCpuSeconds(pid_t pid) {
    std::map<int, double> threads;
    const QDir tasks(QString("/proc/%1/task").arg(pid));
    for (const QString& tid : tasks.entryList(QDir::Dirs | QDir::NoDotAndDotDot))
        threads[tid.toInt()] = CpuSecondsOfStatFile(tasks.filePath(tid + "/stat").toStdString());
    return threads;
}

std::uint64_t ProcessRssBytes(pid_t pid) {
    std::ifstream in("/proc/" + std::to_string(pid) + "/status");
    std::string line;
    while (std::getline(in, line)) {
        if (line.rfind("VmRSS:", 0) == 0) return std::stoull(line.substr(6)) * 1024;
    }
    return 0;
}

double Now() { return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count(); }

void Pause(double seconds) { std::this_thread::sleep_for(std::chrono::duration<double>(seconds)); }

namespace {

QProcessEnvironment GatewayEnvironment(const RunFolder& folder) {
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert("BRENNIC_CONFIG", QString::fromStdString(folder.Path("brennic.ini")));
    return environment;
}

}  // namespace

GatewayRun::GatewayRun(const RunFolder& folder, const std::string& statusInterval)
    : m_process({"run", "--ini", folder.Path("skyvane.ini"), "--simulate", folder.Path("project.json"),
                 "--status-interval", statusInterval, "--metrics-file", folder.Path("gateway.prom")},
                GatewayEnvironment(folder)),
      m_metricsPath(folder.Path("gateway.prom")), m_startedAt(Now()) {
    if (m_process.Pid() <= 0) throw std::runtime_error("skyvane-gateway did not start");
}

GatewayRun::~GatewayRun() = default;  // the process object kills a gateway still running

int GatewayRun::Stop() {
    m_process.Signal(SIGTERM);
    const int code = m_process.WaitForExit(60000);
    if (code != 0) {
        std::fprintf(stderr, "skyvane-gateway ended with %d:\n%s", code, m_process.Errors().c_str());
        for (const std::string& line : m_process.Lines()) std::fprintf(stderr, "  %s\n", line.c_str());
    }
    return code;
}

std::unique_ptr<azurelocal::AzureLocalProcess> StartReceiver(bool decode, std::string& error) {
    return azurelocal::AzureLocalProcess::Start(decode ? QStringList{"--keep-rows", "0"} : QStringList{"--count-only"},
                                                error);
}

}  // namespace e2e
