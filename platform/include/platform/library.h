#pragma once
// Loading shared libraries at run time.

#include "platform/text.h"

struct HINSTANCE__;
using HMODULE = HINSTANCE__*;

// Loads the library at path (symbols resolved now, kept local); null on failure.
HMODULE LoadLibrary(const CString& path);
bool FreeLibrary(HMODULE module);
// The address of an exported symbol, or null.
void* GetProcAddress(HMODULE module, const char* name);
// The loader's text for the last failure on this thread ("" when none).
CString GetLoaderError();
