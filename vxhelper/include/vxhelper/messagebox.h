#pragma once
// Modal message boxes for failures the user must see.
//
// With a widget application running, the box is a modal dialog parented to
// the given window's widget (none when the window has none) and the call
// returns when the user closes it; other events, timers among them, are
// delivered meanwhile. Without one (a headless host, or a call off the
// application's thread) the text goes to standard error and, through the
// error-record writer (vxhelper/logwriter.h), into the log as one error record, and the call returns
// at once with the box's default answer.

#include "platform/text.h"
#include "platform/window.h"

constexpr UINT MB_OK = 0x00000000;
constexpr UINT MB_OKCANCEL = 0x00000001;
constexpr UINT MB_YESNOCANCEL = 0x00000003;
constexpr UINT MB_YESNO = 0x00000004;
constexpr UINT MB_ICONERROR = 0x00000010;
constexpr UINT MB_ICONQUESTION = 0x00000020;
constexpr UINT MB_ICONWARNING = 0x00000030;
constexpr UINT MB_ICONINFORMATION = 0x00000040;

constexpr int IDOK = 1;
constexpr int IDCANCEL = 2;
constexpr int IDYES = 6;
constexpr int IDNO = 7;

// Shows the text of a string id of the loaded modules' string tables.
int VXHelper_MessageBox(HWND parent, UINT stringId, UINT type);
int VXHelper_MessageBox(HWND parent, const CString& text, UINT type);

// Sees every box before it is shown, in both forms, on the calling thread;
// for tests. The box is then shown as always. Null removes it.
using VX_MessageBoxObserver = void (*)(HWND parent, const CString& text, UINT type, void* context);
void VXHelper_SetMessageBoxObserver(VX_MessageBoxObserver observer, void* context);
