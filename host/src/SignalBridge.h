#pragma once
// Turns signals into work on the event loop of the thread that creates the
// bridge: the handler only writes the signal's number into a pipe (safe in a
// signal handler); a socket notifier reads it on the event loop and calls the
// callback there. One bridge at a time per process.

#include <csignal>
#include <functional>
#include <initializer_list>
#include <memory>

class QSocketNotifier;

class CSignalBridge {
public:
    // Installs the handlers; the callback gets each signal's number, in
    // arrival order. IsValid tells whether it worked.
    CSignalBridge(std::initializer_list<int> signalNumbers, std::function<void(int)> callback);
    // Puts the earlier dispositions back and closes the pipe.
    ~CSignalBridge();
    CSignalBridge(const CSignalBridge&) = delete;
    CSignalBridge& operator=(const CSignalBridge&) = delete;

    bool IsValid() const { return m_notifier != nullptr; }

private:
    void ReadPending();

    std::function<void(int)> m_callback;
    int m_signals[8] = {};
    struct sigaction m_previous[8] = {};
    int m_nSignals = 0;
    int m_readFd = -1;
    std::unique_ptr<QSocketNotifier> m_notifier;
};
