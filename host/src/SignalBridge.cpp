#include "SignalBridge.h"

#include <QSocketNotifier>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <unistd.h>

namespace {

// The pipe's write end for the handler; -1 while no bridge exists.
std::atomic<int> g_writeFd{-1};
static_assert(std::atomic<int>::is_always_lock_free, "the signal handler needs a lock-free descriptor");

void OnSignal(int signal) {
    const int saved = errno;
    const int fd = g_writeFd.load();
    if (fd >= 0) {
        const unsigned char number = static_cast<unsigned char>(signal);
        // A full pipe already holds more wake-ups than the loop needs: drop this one.
        [[maybe_unused]] const ssize_t written = write(fd, &number, 1);
    }
    errno = saved;
}

}  // namespace

CSignalBridge::CSignalBridge(std::initializer_list<int> signalNumbers, std::function<void(int)> callback)
    : m_callback(std::move(callback)) {
    int fds[2];
    if (g_writeFd.load() >= 0 || pipe2(fds, O_CLOEXEC | O_NONBLOCK) != 0) return;
    m_readFd = fds[0];
    g_writeFd.store(fds[1]);
    m_notifier = std::make_unique<QSocketNotifier>(m_readFd, QSocketNotifier::Read);
    QObject::connect(m_notifier.get(), &QSocketNotifier::activated, [this] { ReadPending(); });

    struct sigaction action = {};
    action.sa_handler = OnSignal;
    sigemptyset(&action.sa_mask);
    action.sa_flags = SA_RESTART;
    for (const int signal : signalNumbers) {
        if (m_nSignals == static_cast<int>(std::size(m_signals))) break;
        if (sigaction(signal, &action, &m_previous[m_nSignals]) == 0) m_signals[m_nSignals++] = signal;
    }
}

CSignalBridge::~CSignalBridge() {
    for (int i = 0; i < m_nSignals; ++i) sigaction(m_signals[i], &m_previous[i], nullptr);
    if (m_readFd < 0) return;  // another bridge owns the pipe
    m_notifier.reset();
    close(g_writeFd.exchange(-1));
    close(m_readFd);
}

void CSignalBridge::ReadPending() {
    unsigned char numbers[64];
    ssize_t count;
    while ((count = read(m_readFd, numbers, sizeof numbers)) > 0)
        for (ssize_t i = 0; i < count; ++i) m_callback(numbers[i]);
}
