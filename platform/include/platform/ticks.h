#pragma once
// Tick counts, sleeping, thread and process ids.

#include "platform/types.h"

// Milliseconds since an arbitrary start, wrapping at 2^32 like its Windows namesake.
DWORD GetTickCount();
// Milliseconds on the monotonic clock; never wraps.
ULONGLONG GetTickCount64();
void Sleep(DWORD milliseconds);

// Where both tick counts come from, and what Sleep does. Tests install a
// clock they move by hand, so schedules and deadlines run without waiting;
// a sleep hook lets a polling wait see that clock instead of the real one.
// Null restores the monotonic clock and a real sleep.
using TickSource = ULONGLONG (*)();
using SleepHook = void (*)(DWORD milliseconds);
void SetTickSource(TickSource source, SleepHook sleep = nullptr);
DWORD GetCurrentThreadId();
DWORD GetCurrentProcessId();
