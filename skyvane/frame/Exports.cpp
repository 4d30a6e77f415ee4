// The module's four exports and its one module object.
#include "frame/ConfigData.h"
#include "frame/MainSkyvane.h"
#include "frame/ModuleLog.h"
#include "res/StringTable.h"

#include "vxhelper/messagebox.h"

#define SKYVANE_EXPORT extern "C" __attribute__((visibility("default")))

namespace {

void WriteMessageBoxRecord(const CString& text) { CModuleLog::LogError(text); }

// While the module is loaded, message boxes of a headless host are written to its log.
struct MessageBoxLog {
    MessageBoxLog() { VXHelper_SetMessageLogWriter(&WriteMessageBoxRecord); }
    ~MessageBoxLog() { VXHelper_SetMessageLogWriter(nullptr); }
};

// In this order: the string table and the log writer exist before the
// module object and go after it.
CStringTableRegistration g_strings(kModuleStrings, kModuleStringCount);
MessageBoxLog g_messageBoxLog;
CMainSkyvane g_module;

}  // namespace

SKYVANE_EXPORT int init(CConfigData* context) { return g_module.Init(context); }

SKYVANE_EXPORT int konfig(CConfigData* context) { return g_module.Konfig(context); }

SKYVANE_EXPORT int exec_action(CConfigData* context) { return g_module.ExecAction(context); }

SKYVANE_EXPORT int dll_exit(int unused) { return g_module.DllExit(unused); }
