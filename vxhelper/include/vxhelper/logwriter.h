#pragma once
// Where the helper library's own records go: into the log of the module that
// uses it, in that module's layout. The module sets the writers when it is
// loaded and clears them before it is unloaded; without writers the library
// writes no records (message boxes still reach standard error).

#include "platform/text.h"

using VX_LogWriter = void (*)(const CString& text);
void VXHelper_SetLogWriters(VX_LogWriter error, VX_LogWriter info);
