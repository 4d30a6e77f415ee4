#pragma once
// Starting the programs of this build as children of a test or a benchmark.
//
// Children are started with a plain fork and exec, never with QProcess or
// posix_spawn: those start the child with a clone that shares the parent's
// memory, and a sanitizer's bookkeeping in such a child corrupts the
// parent's (ThreadSanitizer then stopped seeing later locking in the test
// process and reported races the locking rules out).
//
// A child gets SIGKILL when the thread that started it ends, so a test that
// crashes or is killed leaves no process behind. Start children from the
// test's own thread, not from a helper thread that ends before them.

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <string>
#include <vector>

// Descriptors that become the child's standard input, output and error; -1
// leaves the parent's.
struct ChildStreams {
    int in = -1, out = -1, err = -1;
};

// Starts arguments[0] (a path) with these arguments; environment null keeps
// the parent's, folder empty the parent's working folder. The child's pid, or
// -1 when fork failed. Exit code 126: the folder could not be entered, 127:
// the program could not be started.
inline pid_t StartChild(const std::vector<std::string>& arguments, ChildStreams streams = {},
                        const std::vector<std::string>* environment = nullptr, const std::string& folder = {}) {
    // Everything the child needs is made before the fork: after it, the child
    // may only make async-signal-safe calls.
    std::vector<char*> argv, envp;
    for (const std::string& a : arguments) argv.push_back(const_cast<char*>(a.c_str()));
    argv.push_back(nullptr);
    if (environment) {
        for (const std::string& e : *environment) envp.push_back(const_cast<char*>(e.c_str()));
        envp.push_back(nullptr);
    }
    const pid_t parent = ::getpid();
    const pid_t pid = ::fork();
    if (pid != 0) return pid;
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (::getppid() != parent) ::_exit(125);  // the parent ended before the line above
    if (streams.in >= 0) ::dup2(streams.in, STDIN_FILENO);
    if (streams.out >= 0) ::dup2(streams.out, STDOUT_FILENO);
    if (streams.err >= 0) ::dup2(streams.err, STDERR_FILENO);
    if (!folder.empty() && ::chdir(folder.c_str()) != 0) ::_exit(126);
    if (environment) ::execve(argv[0], argv.data(), envp.data());
    else ::execv(argv[0], argv.data());
    ::_exit(127);
}

struct ChildResult {
    int exitCode = -1;   // -1: a signal ended it, or it did not end in time (then it was killed)
    std::string output;  // its standard output, and its standard error when asked for
};

// Runs a program to its end, at most timeoutMs; its standard error joins its
// output when withErrors is set, else it is discarded.
inline ChildResult RunChild(const std::vector<std::string>& arguments, bool withErrors, int timeoutMs = 30000) {
    ChildResult result;
    int out[2];
    if (::pipe2(out, O_CLOEXEC) != 0) return result;
    const int null = withErrors ? -1 : ::open("/dev/null", O_WRONLY | O_CLOEXEC);
    const pid_t pid = StartChild(arguments, {-1, out[1], withErrors ? out[1] : null});
    ::close(out[1]);
    if (null >= 0) ::close(null);
    if (pid < 0) {
        ::close(out[0]);
        return result;
    }
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
    bool ended = false;
    for (;;) {
        const auto left =
            std::chrono::duration_cast<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
        pollfd wait{out[0], POLLIN, 0};
        if (::poll(&wait, 1, static_cast<int>(std::max<long long>(0, left.count()))) <= 0) break;
        char buffer[4096];
        const ssize_t n = ::read(out[0], buffer, sizeof buffer);
        if (n <= 0) {
            ended = true;  // every writer closed its end: the child has ended or is ending
            break;
        }
        result.output.append(buffer, static_cast<size_t>(n));
    }
    ::close(out[0]);
    if (!ended) ::kill(pid, SIGKILL);
    int status = 0;
    ::waitpid(pid, &status, 0);
    if (ended && WIFEXITED(status)) result.exitCode = WEXITSTATUS(status);
    return result;
}
