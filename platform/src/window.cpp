#include "platform/window.h"

#include <QCoreApplication>
#include <QEvent>
#include <QEventLoop>
#include <QObject>
#include <QTimer>
#include <QTimerEvent>

#include <atomic>
#include <condition_variable>
#include <map>
#include <memory>
#include <mutex>
#include <thread>
#include <unordered_map>

namespace {

// Completion of one SendMessage across threads. The event that carries it
// completes it with 0 when it is dropped unhandled (window destroyed first).
struct SendState {
    std::mutex lock;
    std::condition_variable done;
    bool finished = false;
    LRESULT result = 0;

    void Finish(LRESULT r) {
        std::lock_guard<std::mutex> guard(lock);
        if (finished) return;
        result = r;
        finished = true;
        done.notify_all();
    }
};

class WindowReceiver;
struct WindowRecord;
std::mutex g_windowsLock;  // guards g_windows and g_nextHandle

const QEvent::Type kMessageEvent = static_cast<QEvent::Type>(QEvent::registerEventType());

class MessageEvent : public QEvent {
public:
    MessageEvent(UINT m, WPARAM w, LPARAM l, std::shared_ptr<SendState> s = nullptr)
        : QEvent(kMessageEvent), message(m), wParam(w), lParam(l), send(std::move(s)) {}
    ~MessageEvent() override {
        if (send) send->Finish(0);
    }
    UINT message;
    WPARAM wParam;
    LPARAM lParam;
    std::shared_ptr<SendState> send;
};

// Lives on the window's thread and turns Qt events into window messages.
class WindowReceiver : public QObject {
public:
    explicit WindowReceiver(CWnd* window) : m_window(window) {}

    bool event(QEvent* e) override {
        // Qt's queue hands the event over under a lock that ThreadSanitizer
        // cannot see; taking the lock the poster held makes the hand-off visible.
        { std::lock_guard<std::mutex> handoff(g_windowsLock); }
        if (e->type() != kMessageEvent) return QObject::event(e);
        auto* m = static_cast<MessageEvent*>(e);
        if (m_window) {
            const LRESULT r = Deliver(m->message, m->wParam, m->lParam);
            if (m->send) m->send->Finish(r);
        }
        return true;
    }

    void timerEvent(QTimerEvent* e) override {
        for (const auto& [id, qtId] : m_timers) {
            if (qtId == e->timerId()) {
                Deliver(WM_TIMER, id, 0);
                return;
            }
        }
    }

    // Destruction from a thread that does not own the window (a misuse, or
    // static destruction at exit): nothing is delivered any more, and the
    // owning thread's loop deletes the receiver if it still runs.
    void Abandon() {
        m_window = nullptr;
        deleteLater();
    }

    // Cuts the link to the window. The receiver deletes itself now, or, when
    // the window is destroyed from inside one of its own handlers, once the
    // handler has returned.
    void Retire() {
        m_window = nullptr;
        StopAll();
        if (m_depth == 0) delete this;
        else deleteLater();
    }

    UINT_PTR Start(UINT_PTR id, UINT ms) {
        Stop(id);
        const int qtId = startTimer(static_cast<int>(ms), Qt::PreciseTimer);
        if (qtId == 0) return 0;
        m_timers[id] = qtId;
        return id;
    }

    bool Stop(UINT_PTR id) {
        auto it = m_timers.find(id);
        if (it == m_timers.end()) return false;
        killTimer(it->second);
        m_timers.erase(it);
        return true;
    }

    void StopAll() {
        for (const auto& [id, qtId] : m_timers) killTimer(qtId);
        m_timers.clear();
    }

private:
    LRESULT Deliver(UINT message, WPARAM wParam, LPARAM lParam) {
        ++m_depth;
        CWnd* window = m_window.load();
        const LRESULT r = window ? window->WindowProc(message, wParam, lParam) : 0;
        --m_depth;
        return r;
    }

    std::atomic<CWnd*> m_window;  // null once the window is gone
    int m_depth = 0;              // handlers of this window currently running (nested loops)
    std::map<UINT_PTR, int> m_timers;
};

struct WindowRecord {
    CWnd* window;
    WindowReceiver* receiver;
    std::thread::id owner;
};

// Every live window by handle. Handles are never reused, so a stale handle
// simply finds nothing.
std::unordered_map<HWND, WindowRecord> g_windows;
std::uintptr_t g_nextHandle = 0x10000;

}  // namespace

CWnd::~CWnd() { DestroyWindow(); }

bool CWnd::CreateEx(DWORD, const char16_t*, const char16_t* title, DWORD, int, int, int, int, HWND, UINT) {
    if (m_hWnd) return false;
    m_title = title;
    auto* receiver = new WindowReceiver(this);
    std::lock_guard<std::mutex> guard(g_windowsLock);
    g_nextHandle += 4;
    m_hWnd = reinterpret_cast<HWND>(g_nextHandle);
    g_windows.emplace(m_hWnd, WindowRecord{this, receiver, std::this_thread::get_id()});
    return true;
}

bool CWnd::DestroyWindow() {
    if (!m_hWnd) return false;
    WindowRecord record;
    {
        std::lock_guard<std::mutex> guard(g_windowsLock);
        auto it = g_windows.find(m_hWnd);
        if (it == g_windows.end()) return false;
        record = it->second;
    }
    const bool onOwner = record.owner == std::this_thread::get_id();
    if (onOwner) WindowProc(WM_DESTROY, 0, 0);
    {
        std::lock_guard<std::mutex> guard(g_windowsLock);
        g_windows.erase(m_hWnd);
    }
    m_hWnd = nullptr;
    // Deleting the receiver drops its pending messages; waiting senders get 0.
    if (onOwner) record.receiver->Retire();
    else record.receiver->Abandon();
    return true;
}

LRESULT CWnd::WindowProc(UINT message, WPARAM wParam, LPARAM lParam) { return DefWindowProc(message, wParam, lParam); }

LRESULT CWnd::DefWindowProc(UINT, WPARAM, LPARAM) { return 0; }

bool CWnd::PostMessage(UINT message, WPARAM wParam, LPARAM lParam) {
    return ::PostMessage(m_hWnd, message, wParam, lParam);
}

LRESULT CWnd::SendMessage(UINT message, WPARAM wParam, LPARAM lParam) {
    return ::SendMessage(m_hWnd, message, wParam, lParam);
}

UINT_PTR CWnd::SetTimer(UINT_PTR id, UINT elapseMs, void*) {
    std::lock_guard<std::mutex> guard(g_windowsLock);
    auto it = g_windows.find(m_hWnd);
    if (it == g_windows.end() || it->second.owner != std::this_thread::get_id()) return 0;
    return it->second.receiver->Start(id, elapseMs);
}

bool CWnd::KillTimer(UINT_PTR id) {
    std::lock_guard<std::mutex> guard(g_windowsLock);
    auto it = g_windows.find(m_hWnd);
    if (it == g_windows.end() || it->second.owner != std::this_thread::get_id()) return false;
    return it->second.receiver->Stop(id);
}

bool PostMessage(HWND window, UINT message, WPARAM wParam, LPARAM lParam) {
    std::lock_guard<std::mutex> guard(g_windowsLock);
    auto it = g_windows.find(window);
    if (it == g_windows.end()) return false;
    QCoreApplication::postEvent(it->second.receiver, new MessageEvent(message, wParam, lParam));
    return true;
}

LRESULT SendMessage(HWND window, UINT message, WPARAM wParam, LPARAM lParam) {
    auto state = std::make_shared<SendState>();
    {
        std::unique_lock<std::mutex> guard(g_windowsLock);
        auto it = g_windows.find(window);
        if (it == g_windows.end()) return 0;
        if (it->second.owner == std::this_thread::get_id()) {
            CWnd* target = it->second.window;
            guard.unlock();
            return target->WindowProc(message, wParam, lParam);
        }
        QCoreApplication::postEvent(it->second.receiver, new MessageEvent(message, wParam, lParam, state));
    }
    std::unique_lock<std::mutex> wait(state->lock);
    state->done.wait(wait, [&] { return state->finished; });
    return state->result;
}

bool IsWindow(HWND window) {
    std::lock_guard<std::mutex> guard(g_windowsLock);
    return g_windows.count(window) != 0;
}

void* GetNativeWidget(HWND window) {
    std::lock_guard<std::mutex> guard(g_windowsLock);
    auto it = g_windows.find(window);
    return it == g_windows.end() ? nullptr : it->second.window->GetNativeWidget();
}

// A nested loop that a timer ends: the thread sleeps in the event loop's wait
// between events rather than spinning through empty passes.
void VX_PumpMessages(DWORD milliseconds) {
    QEventLoop loop;
    QTimer::singleShot(std::chrono::milliseconds(milliseconds), Qt::PreciseTimer, &loop, &QEventLoop::quit);
    loop.exec();
}

struct CNestedLoop::Impl {
    QEventLoop loop;
};

CNestedLoop::CNestedLoop() : m_impl(new Impl) {}
CNestedLoop::~CNestedLoop() { delete m_impl; }
int CNestedLoop::Run() { return m_impl->loop.exec(); }
void CNestedLoop::Exit(int code) { m_impl->loop.exit(code); }
