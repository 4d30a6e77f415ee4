#pragma once
// skyvane-gateway as a child process: its output lines, waiting for a line
// with a deadline, signals, and its end.

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QDir>
#include <QProcess>
#include <QProcessEnvironment>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <functional>
#include <string>
#include <vector>

class GatewayProcess {
public:
    static std::string BinDir() { return QCoreApplication::applicationDirPath().toStdString(); }
    static std::string FakeModule(const std::string& form = "full") {
        return BinDir() + "/fake-skyvane/" + form + "/libSkyvane.so";
    }

    explicit GatewayProcess(const std::vector<std::string>& arguments,
                            const QProcessEnvironment& environment = QProcessEnvironment::systemEnvironment(),
                            const std::string& workingDirectory = {}) {
        QStringList list;
        for (const std::string& argument : arguments) list << QString::fromStdString(argument);
        // The gateway looks for a runtime of another process in the socket folder: a test
        // must not find one that someone else runs on this machine.
        QProcessEnvironment isolated = environment;
        if (!isolated.contains("SKYVANE_AUTOMATION_DIR"))
            isolated.insert("SKYVANE_AUTOMATION_DIR", QDir::temp().filePath(QString("skyvane-gateway-test-%1-no-runtime")
                                                                                .arg(QCoreApplication::applicationPid())));
        m_process.setProcessEnvironment(isolated);
        if (!workingDirectory.empty()) m_process.setWorkingDirectory(QString::fromStdString(workingDirectory));
        m_process.start(QString::fromStdString(BinDir() + "/skyvane-gateway"), list);
        m_process.waitForStarted(10000);
    }
    ~GatewayProcess() {
        if (m_process.state() != QProcess::NotRunning) {
            m_process.kill();
            m_process.waitForFinished(5000);
        }
    }

    // Waits until an output line satisfies the condition; the line, or "" at the deadline.
    std::string WaitForLine(const std::function<bool(const std::string&)>& condition, int timeoutMs = 15000) {
        QDeadlineTimer deadline(timeoutMs);
        for (;;) {
            while (m_nextLine < m_lines.size()) {
                const std::string& line = m_lines[m_nextLine++];
                if (condition(line)) return line;
            }
            if (deadline.hasExpired() || !ReadMore(deadline)) return {};
        }
    }
    std::string WaitForText(const std::string& text, int timeoutMs = 15000) {
        return WaitForLine([&](const std::string& line) { return line.find(text) != std::string::npos; }, timeoutMs);
    }

    void Signal(int signal) { ::kill(static_cast<pid_t>(m_process.processId()), signal); }

    // The exit code once the process ended within the time, else -1.
    int WaitForExit(int timeoutMs = 15000) {
        if (!m_process.waitForFinished(timeoutMs)) return -1;
        ReadAll();
        return m_process.exitStatus() == QProcess::NormalExit ? m_process.exitCode() : -1;
    }

    const std::vector<std::string>& Lines() {
        ReadAll();
        return m_lines;
    }
    std::string Errors() { return m_process.readAllStandardError().toStdString(); }

private:
    bool ReadMore(const QDeadlineTimer& deadline) {
        if (m_process.state() == QProcess::NotRunning) {
            ReadAll();
            return false;
        }
        m_process.waitForReadyRead(static_cast<int>(std::max<qint64>(1, deadline.remainingTime())));
        ReadAll();
        return true;
    }
    void ReadAll() {
        m_partial += m_process.readAllStandardOutput().toStdString();
        size_t end;
        while ((end = m_partial.find('\n')) != std::string::npos) {
            m_lines.push_back(m_partial.substr(0, end));
            m_partial.erase(0, end + 1);
        }
    }

    QProcess m_process;
    std::vector<std::string> m_lines;
    size_t m_nextLine = 0;
    std::string m_partial;
};

// Sums of the status lines: rows, failed cycles, cycles.
struct Sums {
    unsigned long long rows = 0, failed = 0, cycles = 0, lines = 0;
};
inline Sums SumStatusLines(const std::vector<std::string>& lines) {
    Sums sums;
    for (const std::string& line : lines) {
        const size_t at = line.find("status: ");
        unsigned long long rows, failed, cycles;
        if (at == std::string::npos ||
            std::sscanf(line.c_str() + at, "status: %llu rows sent, %llu failed cycles, %llu cycles", &rows, &failed,
                        &cycles) != 3)
            continue;
        sums.rows += rows;
        sums.failed += failed;
        sums.cycles += cycles;
        ++sums.lines;
    }
    return sums;
}

// A status line that counts at least one row sent.
inline bool IsStatusWithRows(const std::string& line) {
    const size_t at = line.find("status: ");
    return at != std::string::npos && line.compare(at, 10, "status: 0 ") != 0;
}
