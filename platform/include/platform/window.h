#pragma once
// Message windows over the Qt event loop of the thread that creates them.
//
// A window's handle stays safe after the window is gone: posting or sending
// to a dead handle returns 0 and does nothing. PostMessage works from any
// thread; SendMessage calls the handler directly on the owning thread and
// waits for it from other threads. Timers deliver WM_TIMER on the owning
// thread, also inside nested event loops (modal dialogs, message boxes).
// The owning thread needs a running Qt event loop (a QCoreApplication).

#include "platform/object.h"
#include "platform/text.h"

struct HWND__;
using HWND = HWND__*;

class CWnd : public CCmdTarget {
public:
    CWnd() = default;
    ~CWnd() override;

    // Creates the hidden window on the calling thread; class, style and
    // geometry are accepted for the record only. Returns false if it exists.
    bool CreateEx(DWORD exStyle, const char16_t* className, const char16_t* title, DWORD style, int x = 0, int y = 0,
                  int width = 0, int height = 0, HWND parent = nullptr, UINT id = 0);
    bool CreateMessageWindow(const char16_t* title) { return CreateEx(0, u"Static", title, 0); }
    bool DestroyWindow();

    HWND GetSafeHwnd() const { return m_hWnd; }
    const CString& GetTitle() const { return m_title; }

    bool PostMessage(UINT message, WPARAM wParam = 0, LPARAM lParam = 0);
    LRESULT SendMessage(UINT message, WPARAM wParam = 0, LPARAM lParam = 0);
    // Starts (or restarts) timer id; returns id, or 0 when called off the owning thread.
    UINT_PTR SetTimer(UINT_PTR id, UINT elapseMs, void* unusedCallback = nullptr);
    bool KillTimer(UINT_PTR id);

    // The window's message handler; the default hands every message to DefWindowProc.
    virtual LRESULT WindowProc(UINT message, WPARAM wParam, LPARAM lParam);
    virtual LRESULT DefWindowProc(UINT message, WPARAM wParam, LPARAM lParam);

    // The toolkit widget that shows this window, if any (a QWidget*, kept
    // untyped so that module code never sees toolkit headers). Dialogs and
    // message boxes parented to the window are parented to it.
    void SetNativeWidget(void* widget) { m_pNativeWidget = widget; }
    void* GetNativeWidget() const { return m_pNativeWidget; }

    HWND m_hWnd = nullptr;

private:
    CString m_title;
    void* m_pNativeWidget = nullptr;
};

bool PostMessage(HWND window, UINT message, WPARAM wParam = 0, LPARAM lParam = 0);
LRESULT SendMessage(HWND window, UINT message, WPARAM wParam = 0, LPARAM lParam = 0);
bool IsWindow(HWND window);
// The native widget of a live window (see CWnd::SetNativeWidget), or null.
void* GetNativeWidget(HWND window);
// The handle of a window that may be null.
inline HWND SafeHwnd(const CWnd* window) { return window ? window->m_hWnd : nullptr; }

// Runs the calling thread's event loop for about the given time, delivering
// posted messages and timers. For tests and tools.
void VX_PumpMessages(DWORD milliseconds);

// A nested event loop, as a modal dialog or message box runs one.
class CNestedLoop {
public:
    CNestedLoop();
    ~CNestedLoop();
    CNestedLoop(const CNestedLoop&) = delete;
    CNestedLoop& operator=(const CNestedLoop&) = delete;
    // Runs until Exit; returns the code given to Exit.
    int Run();
    void Exit(int code = 0);

private:
    struct Impl;
    Impl* m_impl;
};
