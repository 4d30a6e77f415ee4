// A stand-in for libSkyvane.so with the same four exports, for the gateway's
// tests. It records every call and sends and posts the module's messages to
// the host window; what it does comes from the settings file's [Fake] section:
//   CALLS       file each export call is appended to as one line
//   INIT        results of successive init calls, e.g. "0,0,1"; the last one repeats (default 1)
//   ROWS        rows reported per cycle (default 5)
//   CYCLE_MS    time between two cycles (default 20)
//   FAIL_EVERY  every n-th cycle also posts 1025 (default 0: never)
//   RESTART     0: exec_action posts 1126 instead of restarting (default 1)
#include "frame/ConfigData.h"
#include "platform/window.h"
#include "vxhelper/profile.h"

#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace {

constexpr UINT kFailedCycle = WM_USER + 1;
constexpr UINT kCycle = WM_USER + 2;
constexpr UINT kRestartFailed = WM_USER + 102;
constexpr UINT kStarting = WM_USER + 103;

const std::thread::id g_loader = std::this_thread::get_id();  // the thread that loaded the library

struct Settings {
    std::string calls;
    std::vector<int> initResults;
    int rows = 5;
    int cycleMs = 20;
    int failEvery = 0;
    bool restart = true;
};

std::string ReadText(const CString& path, LPCWSTR key, LPCWSTR fallback) {
    char16_t buffer[1024];
    VX_GetPrivateProfileString(u"Fake", key, fallback, buffer, 1024, path);
    return CString(buffer).ToUtf8();
}

Settings ReadSettings(const CString& path) {
    Settings settings;
    settings.calls = ReadText(path, u"CALLS", u"");
    const std::string results = ReadText(path, u"INIT", u"1");
    for (size_t start = 0; start < results.size();) {
        size_t end = results.find(',', start);
        if (end == std::string::npos) end = results.size();
        settings.initResults.push_back(std::stoi(results.substr(start, end - start)));
        start = end + 1;
    }
    settings.rows = VX_GetPrivateProfileInt(u"Fake", u"ROWS", 5, path);
    settings.cycleMs = VX_GetPrivateProfileInt(u"Fake", u"CYCLE_MS", 20, path);
    settings.failEvery = VX_GetPrivateProfileInt(u"Fake", u"FAIL_EVERY", 0, path);
    settings.restart = VX_GetPrivateProfileInt(u"Fake", u"RESTART", 1, path) != 0;
    return settings;
}

void Record(const Settings& settings, const std::string& line) {
    if (settings.calls.empty()) return;
    if (FILE* file = std::fopen(settings.calls.c_str(), "a")) {
        const bool loaderThread = std::this_thread::get_id() == g_loader;
        std::fprintf(file, "%s loader_thread=%d\n", line.c_str(), loaderThread ? 1 : 0);
        std::fclose(file);
    }
}

// Posts one cycle after another to the host window until stopped.
class FakeWorker {
public:
    ~FakeWorker() { Stop(); }
    void Start(HWND window, const Settings& settings) {
        Stop();
        m_stop = false;
        m_thread = std::thread([this, window, settings] { Run(window, settings); });
    }
    void Stop() {
        {
            std::lock_guard<std::mutex> guard(m_lock);
            m_stop = true;
        }
        m_wake.notify_all();
        if (m_thread.joinable()) m_thread.join();
    }

private:
    void Run(HWND window, const Settings& settings) {
        for (int cycle = 1;; ++cycle) {
            {
                std::unique_lock<std::mutex> guard(m_lock);
                if (m_wake.wait_for(guard, std::chrono::milliseconds(settings.cycleMs), [this] { return m_stop; }))
                    return;
            }
            PostMessage(window, kCycle, static_cast<WPARAM>(settings.rows), cycle % 7);
            if (settings.failEvery > 0 && cycle % settings.failEvery == 0) PostMessage(window, kFailedCycle, 0, 0);
        }
    }

    std::mutex m_lock;  // guards m_stop
    std::condition_variable m_wake;
    bool m_stop = false;
    std::thread m_thread;
};

FakeWorker g_worker;
size_t g_initCalls = 0;
bool g_running = false;
CString g_iniFile;

}  // namespace

extern "C" int init(CConfigData* context) {
    const HWND window = SafeHwnd(context->m_pWnd);
    if (window) SendMessage(window, kStarting, 1, 0);
    g_iniFile = context->m_strIniFile;
    const Settings settings = ReadSettings(g_iniFile);
    const int result = settings.initResults[std::min(g_initCalls, settings.initResults.size() - 1)];
    ++g_initCalls;
    Record(settings, "init window=" + std::to_string(window != nullptr) + " ini=" + g_iniFile.ToUtf8() +
                         " result=" + std::to_string(result));
    if (result != 1) return 0;
    g_running = true;
    g_worker.Start(window, settings);
    if (window) SendMessage(window, kCycle, 0, 0);
    return 1;
}

extern "C" int konfig(CConfigData* context) {
    Record(ReadSettings(context->m_strIniFile), "konfig");
    return 0;
}

extern "C" int exec_action(CConfigData* context) {
    const Settings settings = ReadSettings(context->m_strIniFile);
    Record(settings, "exec_action");
    if (!g_running) return 0;
    g_worker.Stop();
    if (settings.restart) g_worker.Start(SafeHwnd(context->m_pWnd), settings);
    else PostMessage(SafeHwnd(context->m_pWnd), kRestartFailed, 0, 0);
    return 1;
}

#ifndef FAKE_WITHOUT_DLL_EXIT
extern "C" int dll_exit(int) {
    g_worker.Stop();
    g_running = false;
    if (!g_iniFile.IsEmpty()) Record(ReadSettings(g_iniFile), "dll_exit");
    return 1;
}
#endif
