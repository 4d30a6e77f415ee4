#pragma once
// A tarvo-runtime child process for tests and benchmarks: started from the
// folder of the running program, on a socket folder of the caller's, and
// waited for until it reports that it is ready. Its standard error is
// collected by a thread of its own (so the child never blocks on it). It is
// killed when the thread that started it ends (see child_process.h).

#include "child_process.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

class RuntimeProcess {
public:
    RuntimeProcess() = default;
    ~RuntimeProcess() { Kill(SIGKILL); }
    RuntimeProcess(const RuntimeProcess&) = delete;
    RuntimeProcess& operator=(const RuntimeProcess&) = delete;

    // Starts tarvo-runtime PROJECT_FILE --socket-dir DIR plus options and waits
    // up to 20 s for its "ready" line. False (with what it said) otherwise.
    bool Start(const std::string& projectFile, const std::string& socketDir,
               const std::vector<std::string>& options = {}) {
        const std::string program =
            (std::filesystem::read_symlink("/proc/self/exe").parent_path() / "tarvo-runtime").string();
        std::vector<std::string> args{program, projectFile, "--socket-dir", socketDir};
        args.insert(args.end(), options.begin(), options.end());
        {
            std::lock_guard lock(m_lock);
            m_output.clear();
            m_ended = false;
        }
        int pipeFds[2];
        if (::pipe2(pipeFds, O_CLOEXEC) != 0) return false;
        m_pid = StartChild(args, {-1, -1, pipeFds[1]});
        ::close(pipeFds[1]);
        if (m_pid < 0) {
            ::close(pipeFds[0]);
            return false;
        }
        m_reader = std::thread([this, fd = pipeFds[0]] { Collect(fd); });
        std::unique_lock lock(m_lock);
        return m_changed.wait_for(lock, std::chrono::seconds(20), [&] {
            return m_ended || m_output.find(": ready,") != std::string::npos;
        }) && !m_ended;
    }

    // Signals the child, reaps it and returns its wait status (-1 when none ran).
    int Kill(int signal) {
        if (m_pid <= 0) return -1;
        ::kill(m_pid, signal);
        int status = 0;
        ::waitpid(m_pid, &status, 0);
        m_pid = -1;
        if (m_reader.joinable()) m_reader.join();
        return status;
    }
    // SIGTERM: true when it stopped cleanly (exit status 0).
    bool Stop() {
        const int status = Kill(SIGTERM);
        return WIFEXITED(status) && WEXITSTATUS(status) == 0;
    }
    bool Running() const { return m_pid > 0; }

    std::string Output() {
        std::lock_guard lock(m_lock);
        return m_output;
    }

private:
    void Collect(int fd) {
        char buffer[4096];
        for (;;) {
            const ssize_t n = ::read(fd, buffer, sizeof buffer);
            if (n <= 0) break;
            std::lock_guard lock(m_lock);
            m_output.append(buffer, static_cast<size_t>(n));
            m_changed.notify_all();
        }
        ::close(fd);
        std::lock_guard lock(m_lock);
        m_ended = true;
        m_changed.notify_all();
    }

    pid_t m_pid = -1;
    std::thread m_reader;
    std::mutex m_lock;  // guards m_output and m_ended
    std::condition_variable m_changed;
    std::string m_output;
    bool m_ended = false;
};
