#pragma once
// Tick counts, sleeping, thread and process ids.

#include "platform/types.h"

// Milliseconds since an arbitrary start, wrapping at 2^32 like its Windows namesake.
DWORD GetTickCount();
// Milliseconds on the monotonic clock; never wraps.
ULONGLONG GetTickCount64();
void Sleep(DWORD milliseconds);
DWORD GetCurrentThreadId();
DWORD GetCurrentProcessId();
