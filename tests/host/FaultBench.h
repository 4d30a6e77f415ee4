#pragma once
// The fault matrix's bench: skyvane-gateway with the real module, a
// tarvo-runtime in another process whose changes the test makes one tick at a
// time (every counter variable changes by one a tick), azure-local with its
// fault controls, and the loss accounting that ties them together.

#include "AzureLocalProcess.h"
#include "GatewayProcess.h"
#include "runtime_process.h"
#include "temp_folder.h"

#include "automation/local_socket.h"
#include "automation/rot.h"
#include "tarvo/RemoteControl.h"

#include <QProcessEnvironment>

#include <gtest/gtest.h>

#include <netinet/in.h>
#include <sys/socket.h>

#include <chrono>
#include <cstdio>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <thread>
#include <vector>

// What became of every change the runtime delivered to the module.
struct Ledger {
    size_t produced = 0;    // changes the runtime delivered to the module
    size_t received = 0;    // of them, the ones that arrived (each counted once)
    size_t duplicates = 0;  // further rows of a change that arrived already, in another message
    size_t resent = 0;      // further rows of a change in a message of the same id: a retry's resend
    size_t unexpected = 0;  // rows of values the runtime never produced
    size_t failedRows = 0;  // rows the module's log counts as failed
    size_t dropped = 0;     // changes the module's log reports lost to a full queue
    size_t discarded = 0;   // queued changes the module's log reports thrown away unsent

    size_t Missing() const { return produced - received; }
    size_t Recorded() const { return failedRows + dropped + discarded; }
    std::string Text() const {
        char text[320];
        std::snprintf(text, sizeof text,
                      "produced %zu, received %zu, missing %zu; failed rows %zu, dropped %zu, discarded %zu; "
                      "duplicates %zu, resent %zu, unexpected %zu",
                      produced, received, Missing(), failedRows, dropped, discarded, duplicates, resent, unexpected);
        return text;
    }
};

class FaultBench {
public:
    static constexpr int kPerProject = 20;
    inline static const std::vector<std::string> kProjects = {"Plant", "Line"};
    static constexpr const char* kEntity = "values";

    struct Settings {
        std::string connection;  // empty: the receiver's plain loopback connection
        std::string entity = kEntity;
        int integritySeconds = 86400;
        std::string proxy, proxyUser, proxyPassword;  // the password as the settings file stores it
    };

    FaultBench() {
        LocalSocketOptions options;
        options.folder = Sockets();
        m_source = AddRunningObjectSource(CreateLocalSocketSource(options));
        m_logFile = m_folder.Path("gateway.log");
        m_environment = QProcessEnvironment::systemEnvironment();
        m_environment.insert("SKYVANE_AUTOMATION_DIR", QString::fromStdString(Sockets()));
        m_environment.insert("BRENNIC_CONFIG",
                             QString::fromStdString(m_folder.Write("brennic.ini", "[file]\npath = " + m_logFile +
                                                                                      "\n[stderr]\nenabled = no\n")));
    }
    ~FaultBench() {
        if (m_receiver && !m_epochs.empty()) std::printf("[ ledger   ] %s\n", Account().Text().c_str());
        m_gateway.reset();
        m_control.reset();
        m_runtime.Kill(SIGKILL);
        RemoveRunningObjectSource(m_source);
    }

    // ---- the receiver --------------------------------------------------------
    bool StartReceiver(QStringList arguments = {}) {
        std::string error;
        m_receiver = azurelocal::AzureLocalProcess::Start(arguments, error);
        EXPECT_TRUE(m_receiver) << error;
        return m_receiver != nullptr;
    }
    void StopReceiver() {
        Harvest();
        m_receiver.reset();
    }
    azurelocal::AzureLocalProcess& Receiver() { return *m_receiver; }
    bool Fault(const std::string& query) { return m_receiver->Fault(query); }
    std::string Connection(int port, const std::string& key = azurelocal::AzureLocalProcess::kKey,
                           bool emulator = true) const {
        return "Endpoint=sb://127.0.0.1:" + std::to_string(port) +
               "/;SharedAccessKeyName=" + azurelocal::AzureLocalProcess::kKeyName + ";SharedAccessKey=" + key +
               (emulator ? ";UseDevelopmentEmulator=true" : "");
    }

    // ---- the runtime ---------------------------------------------------------
    // A runtime whose counters start at `base`, paused: only Tick changes them.
    bool StartRuntime(long base = 0) {
        m_control.reset();
        if (!m_runtime.Start(WriteProject(base), Sockets(), {"--paused"})) {
            ADD_FAILURE() << "tarvo-runtime did not start: " << m_runtime.Output();
            return false;
        }
        m_control = std::make_unique<tarvo::RemoteControl>(tarvo::RemoteControl::Find());
        if (!m_control->SetDelivery(tarvo::Delivery::CallerThread)) {
            ADD_FAILURE() << "no control object: " << m_runtime.Output();
            return false;
        }
        m_epochs.push_back({base, {}});
        m_active = {kProjects.begin(), kProjects.end()};
        return true;
    }
    bool StopRuntime() {
        m_control.reset();
        return m_runtime.Stop();
    }
    // One tick changes every variable of the active projects; delivered to the
    // module before it returns.
    void Tick(int count = 1, int pauseMs = 0) {
        for (int i = 0; i < count; ++i) {
            ASSERT_TRUE(m_control->Tick()) << "the runtime did not tick";
            for (const std::string& project : m_active) ++m_epochs.back().ticks[project];
            if (pauseMs > 0) std::this_thread::sleep_for(std::chrono::milliseconds(pauseMs));
        }
    }
    void SetActive(const std::string& project, bool active) {
        ASSERT_TRUE(m_control->SetProjectActive(std::u16string(project.begin(), project.end()), active));
        if (active) m_active.insert(project);
        else m_active.erase(project);
    }

    // Waits until every active project has a started subscription of all its variables.
    bool WaitForSubscriptions(int timeoutMs = 30000) {
        return WaitUntil(
            [this] {
                for (const std::string& project : m_active) {
                    bool started = false;
                    for (const auto& c : m_control->Containers(std::u16string(project.begin(), project.end())))
                        started = started || (c.started && c.variables.size() == kPerProject);
                    if (!started) return false;
                }
                return true;
            },
            timeoutMs);
    }

    // Makes a change whose send the receiver answers with 503 and Retry-After,
    // and waits for that answer: the worker then waits to retry its batch.
    void HoldWorkerInRetry(int seconds) {
        const auto rejectedBefore = m_receiver->Stats().rejected;
        ASSERT_TRUE(Fault("kind=status&status=503&count=1&retry-after=" + std::to_string(seconds)));
        Tick();
        ASSERT_TRUE(WaitUntil([&] { return m_receiver->Stats().rejected > rejectedBefore; }, 30000));
    }

    // ---- the gateway ---------------------------------------------------------
    std::string WriteSettings(const Settings& settings) {
        std::string text = "[Azure]\nINTEGRITYPERIOD=" + std::to_string(settings.integritySeconds) + "\n";
        if (!settings.proxy.empty())
            text += "PROXY_DOMAIN=" + settings.proxy + "\nPROXY_USER=" + settings.proxyUser +
                    "\nPROXY_PWD=" + settings.proxyPassword + "\n";
        text += "[VARIABLES]\nCOUNT=" + std::to_string(kProjects.size() * kPerProject) + "\n";
        int n = 0;
        for (const std::string& project : kProjects)
            for (int i = 1; i <= kPerProject; ++i)
                text += "NAME_" + std::to_string(n++) + "=" + project + "#C" + std::to_string(i) + "\n";
        const std::string connection = settings.connection.empty() ? Connection(m_receiver->Port())
                                                                   : settings.connection;
        text += "[CONNECTIONS]\nCOUNT=1\nCONN_0=" + connection + "\nQUEUE_0=" + settings.entity +
                "\nMODE_0=0\nFORMAT_0=1\n";
        return m_folder.Write("settings.ini", text);
    }
    // Starts the gateway and waits until the module runs.
    bool StartGateway() { return StartGateway(Settings{}); }
    bool StartGateway(const Settings& settings) {
        m_gateway = std::make_unique<GatewayProcess>(std::vector<std::string>{"run", "--ini", WriteSettings(settings),
                                                                              "--status-interval", "1"},
                                                     m_environment);
        const bool runs = WaitForModuleRun();
        EXPECT_TRUE(runs) << m_gateway->Errors();
        return runs;
    }
    // Receiver, runtime and gateway, and the first changes arrived.
    bool StartSending() { return StartSending(Settings{}); }
    bool StartSending(const Settings& settings) {
        if (!StartReceiver() || !StartRuntime() || !StartGateway(settings)) return false;
        const bool arrived = Warm();
        EXPECT_TRUE(arrived) << Account().Text();
        return arrived;
    }
    bool WaitForModuleRun(int timeoutMs = 30000) {
        return m_gateway->WaitForLine(
                   [](const std::string& line) {
                       return line.find("start attempt") != std::string::npos &&
                              line.find("the module runs") != std::string::npos;
                   },
                   timeoutMs) != "";
    }
    GatewayProcess& Gateway() { return *m_gateway; }
    // SIGTERM; the milliseconds until the gateway ended with 0, or -1.
    long long StopGateway(int timeoutMs = 15000) {
        const auto start = std::chrono::steady_clock::now();
        m_gateway->Signal(SIGTERM);
        if (m_gateway->WaitForExit(timeoutMs) != 0) return -1;
        return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - start).count();
    }
    std::vector<std::string> LogLines() const { return TempFolder::ReadLines(m_logFile); }
    TempFolder& Folder() { return m_folder; }
    std::string LogFile() const { return m_logFile; }

    // ---- the accounting ------------------------------------------------------
    // Ticks once and waits until that tick's change of every variable arrived.
    bool Warm() {
        Tick();
        return WaitUntil([this] { return LastValuesArrived(); }, 30000);
    }
    Ledger Account() {
        Ledger ledger;
        std::map<std::string, std::set<std::string>> messagesOfChange;  // change -> message ids
        for (const auto& row : Received()) {
            const std::string change = row.row.project + "#" + row.row.variable + "=" + std::to_string(row.row.value);
            if (!WasProduced(row.row)) {
                ++ledger.unexpected;
                continue;
            }
            auto& messages = messagesOfChange[change];
            if (messages.empty()) ++ledger.received;
            else if (messages.count(row.messageId)) ++ledger.resent;
            else ++ledger.duplicates;
            messages.insert(row.messageId);
        }
        for (const Epoch& epoch : m_epochs)
            for (const auto& [project, ticks] : epoch.ticks)
                ledger.produced += static_cast<size_t>(ticks) * kPerProject;
        ReadRecords(ledger);
        return ledger;
    }
    // Waits until the ledger satisfies the condition; false at the deadline.
    bool WaitFor(const std::function<bool(const Ledger&)>& condition, int timeoutMs = 60000) {
        return WaitUntil([&] { return condition(Account()); }, timeoutMs);
    }
    // Reads the receiver's rows and the log again until the condition holds; false at the deadline.
    static bool WaitUntil(const std::function<bool()>& condition, int timeoutMs) {
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
        while (!condition()) {
            if (std::chrono::steady_clock::now() > deadline) return false;
            std::this_thread::sleep_for(std::chrono::milliseconds(100));
        }
        return true;
    }
    // Every change arrived once or was recorded as lost, and nothing else arrived.
    void ExpectExactAccount(int timeoutMs = 60000) {
        WaitFor([](const Ledger& l) { return l.received + l.Recorded() >= l.produced; }, timeoutMs);
        const Ledger ledger = Account();
        EXPECT_EQ(ledger.Missing(), ledger.Recorded()) << ledger.Text() << "\nthe log's end:\n" << LogTail();
        EXPECT_EQ(ledger.duplicates, 0u) << ledger.Text();
        EXPECT_EQ(ledger.unexpected, 0u) << ledger.Text();
        EXPECT_GT(ledger.produced, 0u);
    }
    // The last value of every variable arrived (once the receiver is reachable).
    bool LastValuesArrived() {
        const std::set<std::string> received = ReceivedChanges();
        for (const auto& [project, ticks] : m_epochs.back().ticks)
            for (int i = 1; i <= kPerProject; ++i)
                if (!received.count(project + "#C" + std::to_string(i) + "=" +
                                    std::to_string(static_cast<double>(m_epochs.back().base + ticks))))
                    return false;
        return true;
    }

    std::string LogTail(size_t count = 25) const {
        const auto lines = LogLines();
        std::string tail;
        for (size_t i = lines.size() > count ? lines.size() - count : 0; i < lines.size(); ++i) tail += lines[i] + "\n";
        return tail;
    }

    // A loopback port that nothing listens on.
    static int ClosedPort() {
        const int fd = ::socket(AF_INET, SOCK_STREAM, 0);
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t size = sizeof address;
        ::bind(fd, reinterpret_cast<sockaddr*>(&address), size);
        ::getsockname(fd, reinterpret_cast<sockaddr*>(&address), &size);
        ::close(fd);
        return ntohs(address.sin_port);
    }

private:
    struct Epoch {  // one runtime's life: its counters' start and the ticks of each project
        long base = 0;
        std::map<std::string, long> ticks;
    };

    std::string Sockets() const { return m_folder.Path("sockets"); }

    std::string WriteProject(long base) {
        std::string text = "{\"tick_ms\": 1000, \"projects\": [";
        for (size_t i = 0; i < kProjects.size(); ++i) {
            text += std::string(i ? "," : "") + "{\"name\": \"" + kProjects[i] +
                    "\", \"variables\": [{\"name\": \"C{n}\", \"repeat\": " + std::to_string(kPerProject) +
                    ", \"value\": " + std::to_string(base) +
                    ", \"generator\": {\"kind\": \"counter\", \"period_ms\": 1000, \"step\": 1}}]}";
        }
        return m_folder.Write("project-" + std::to_string(base) + ".json", text + "]}");
    }

    bool WasProduced(const azurelocal::DecodedRow& row) const {
        for (const Epoch& epoch : m_epochs) {
            const auto ticks = epoch.ticks.find(row.project);
            if (ticks == epoch.ticks.end()) continue;
            const double first = static_cast<double>(epoch.base + 1),
                         last = static_cast<double>(epoch.base + ticks->second);
            if (!row.isText && row.value >= first && row.value <= last && row.value == static_cast<long>(row.value))
                return true;
        }
        return false;
    }

    // Rows of receivers that were stopped, then those of the running one.
    std::vector<azurelocal::ReceivedRow> Received() {
        std::vector<azurelocal::ReceivedRow> rows = m_harvested;
        if (m_receiver) {
            auto current = m_receiver->Rows();
            rows.insert(rows.end(), current.begin(), current.end());
        }
        return rows;
    }
    std::set<std::string> ReceivedChanges() {
        std::set<std::string> changes;
        for (const auto& row : Received())
            changes.insert(row.row.project + "#" + row.row.variable + "=" + std::to_string(row.row.value));
        return changes;
    }
    void Harvest() {
        if (!m_receiver) return;
        auto rows = m_receiver->Rows();
        m_harvested.insert(m_harvested.end(), rows.begin(), rows.end());
    }

    // The module's own records of rows it failed to send or dropped.
    void ReadRecords(Ledger& ledger) const {
        for (const std::string& line : LogLines()) {
            int count = 0;
            size_t at;
            if ((at = line.find("Adding of ")) != std::string::npos &&
                line.find("Online Rows failed") != std::string::npos &&
                std::sscanf(line.c_str() + at, "Adding of %d Online Rows failed", &count) == 1)
                ledger.failedRows += static_cast<size_t>(count);
            else if (line.find("Value change queue full") != std::string::npos) ++ledger.dropped;
            else if (line.find("queued value changes") != std::string::npos &&
                     line.find("are lost") != std::string::npos)
                ledger.discarded += static_cast<size_t>(QueuedCount(line));
        }
    }

    // The count before "queued value changes" in a record of changes thrown away.
    static int QueuedCount(const std::string& line) {
        const size_t end = line.find(" queued value changes");
        const size_t start = line.rfind(' ', end - 1);
        return std::atoi(line.c_str() + start + 1);
    }

    TempFolder m_folder;
    DWORD m_source = 0;
    std::string m_logFile;
    QProcessEnvironment m_environment;
    RuntimeProcess m_runtime;
    std::unique_ptr<tarvo::RemoteControl> m_control;
    std::unique_ptr<azurelocal::AzureLocalProcess> m_receiver;
    std::unique_ptr<GatewayProcess> m_gateway;
    std::vector<Epoch> m_epochs;
    std::set<std::string> m_active;
    std::vector<azurelocal::ReceivedRow> m_harvested;
};
