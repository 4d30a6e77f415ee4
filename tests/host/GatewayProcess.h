#pragma once
// skyvane-gateway as a child process: its output lines, waiting for a line
// with a deadline, signals, and its end.

#include <QCoreApplication>
#include <QDir>
#include <QProcessEnvironment>

#include "child_process.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
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
        // The gateway looks for a runtime of another process in the socket folder: a test
        // must not find one that someone else runs on this machine.
        QProcessEnvironment isolated = environment;
        if (!isolated.contains("SKYVANE_AUTOMATION_DIR"))
            isolated.insert("SKYVANE_AUTOMATION_DIR",
                            QDir::temp().filePath(
                                QString("skyvane-gateway-test-%1-no-runtime").arg(QCoreApplication::applicationPid())));
        std::vector<std::string> args{BinDir() + "/skyvane-gateway"};
        args.insert(args.end(), arguments.begin(), arguments.end());
        std::vector<std::string> env;
        for (const QString& entry : isolated.toStringList()) env.push_back(entry.toStdString());
        Spawn(args, env, workingDirectory);
    }
    ~GatewayProcess() {
        if (m_pid > 0) {
            ::kill(m_pid, SIGKILL);
            ::waitpid(m_pid, nullptr, 0);
        }
        for (const int fd : {m_out, m_err})
            if (fd >= 0) ::close(fd);
    }
    GatewayProcess(const GatewayProcess&) = delete;
    GatewayProcess& operator=(const GatewayProcess&) = delete;

    // Waits until an output line satisfies the condition; the line, or "" at the deadline.
    std::string WaitForLine(const std::function<bool(const std::string&)>& condition, int timeoutMs = 15000) {
        const auto deadline = Deadline(timeoutMs);
        for (;;) {
            while (m_nextLine < m_lines.size()) {
                const std::string& line = m_lines[m_nextLine++];
                if (condition(line)) return line;
            }
            if (!ReadMore(deadline)) return {};
        }
    }
    std::string WaitForText(const std::string& text, int timeoutMs = 15000) {
        return WaitForLine([&](const std::string& line) { return line.find(text) != std::string::npos; }, timeoutMs);
    }

    void Signal(int signal) {
        if (m_pid > 0) ::kill(m_pid, signal);
    }

    // The exit code once the process ended within the time, else -1 (also when a signal ended it).
    int WaitForExit(int timeoutMs = 15000) {
        if (m_pid <= 0) return m_exitCode;
        const auto deadline = Deadline(timeoutMs);
        while (ReadMore(deadline)) {}
        if (m_out >= 0 || m_err >= 0) return -1;  // still writing at the deadline
        const int pidfd = static_cast<int>(syscall(SYS_pidfd_open, m_pid, 0));
        if (pidfd < 0) return -1;
        pollfd wait{pidfd, POLLIN, 0};
        const bool ended = ::poll(&wait, 1, Remaining(deadline)) > 0;
        ::close(pidfd);
        if (!ended) return -1;
        int status = 0;
        ::waitpid(m_pid, &status, 0);
        m_pid = -1;
        m_exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
        return m_exitCode;
    }

    pid_t Pid() const { return m_pid; }
    const std::vector<std::string>& Lines() { return m_lines; }
    std::string Errors() { return m_errors; }

private:
    using Clock = std::chrono::steady_clock;
    static Clock::time_point Deadline(int ms) { return Clock::now() + std::chrono::milliseconds(ms); }
    static int Remaining(Clock::time_point deadline) {
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
        return static_cast<int>(std::max<long long>(0, left));
    }

    void Spawn(const std::vector<std::string>& args, const std::vector<std::string>& env, const std::string& folder) {
        int out[2], err[2];
        if (pipe2(out, O_CLOEXEC) != 0) return;
        if (pipe2(err, O_CLOEXEC) != 0) {
            ::close(out[0]);
            ::close(out[1]);
            return;
        }
        m_pid = StartChild(args, {-1, out[1], err[1]}, &env, folder);
        ::close(out[1]);
        ::close(err[1]);
        m_out = out[0];
        m_err = err[0];
    }

    // Reads what the child wrote until the deadline brings something; false at
    // the deadline or once both its outputs are closed.
    bool ReadMore(Clock::time_point deadline) {
        pollfd fds[2] = {{m_out, POLLIN, 0}, {m_err, POLLIN, 0}};
        if ((m_out < 0 && m_err < 0) || ::poll(fds, 2, Remaining(deadline)) <= 0) return false;
        if (fds[0].revents) Drain(m_out, m_partial);
        if (fds[1].revents) Drain(m_err, m_errors);
        size_t end;
        while ((end = m_partial.find('\n')) != std::string::npos) {
            m_lines.push_back(m_partial.substr(0, end));
            m_partial.erase(0, end + 1);
        }
        return true;
    }
    static void Drain(int& fd, std::string& into) {
        char buffer[4096];
        const ssize_t n = ::read(fd, buffer, sizeof buffer);
        if (n > 0) {
            into.append(buffer, static_cast<size_t>(n));
            return;
        }
        ::close(fd);  // end of file: poll skips a negative descriptor
        fd = -1;
    }

    pid_t m_pid = -1;
    int m_exitCode = -1;
    int m_out = -1;
    int m_err = -1;
    std::vector<std::string> m_lines;
    size_t m_nextLine = 0;
    std::string m_partial;
    std::string m_errors;
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
