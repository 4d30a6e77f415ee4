#pragma once
// Tick counts, sleeping, thread and process ids.

#include "platform/types.h"

// Milliseconds since an arbitrary start, wrapping at 2^32 like its Windows namesake.
DWORD GetTickCount();
// Milliseconds on the monotonic clock; never wraps.
ULONGLONG GetTickCount64();
void Sleep(DWORD milliseconds);

// Where both tick counts come from. Tests install a clock they move by hand,
// so schedules and deadlines run without waiting; null restores the
// monotonic clock. Sleep always sleeps.
using TickSource = ULONGLONG (*)();
void SetTickSource(TickSource source);
DWORD GetCurrentThreadId();
DWORD GetCurrentProcessId();
