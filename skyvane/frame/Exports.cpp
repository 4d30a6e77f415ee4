// The module's four exports and its one module object.
#include "frame/ConfigData.h"
#include "frame/MainSkyvane.h"
#include "frame/ModuleLog.h"
#include "res/StringTable.h"

#include "vxhelper/logwriter.h"

#define SKYVANE_EXPORT extern "C" __attribute__((visibility("default")))

namespace {

void WriteErrorRecord(const CString& text) { CModuleLog::LogError(text); }
void WriteInfoRecord(const CString& text) { CModuleLog::LogInfo(text); }

// While the module is loaded, the helper library's records (message boxes of
// a headless host, a settings file changing its encoding) go to its log.
struct HelperLibraryLog {
    HelperLibraryLog() { VXHelper_SetLogWriters(&WriteErrorRecord, &WriteInfoRecord); }
    ~HelperLibraryLog() { VXHelper_SetLogWriters(nullptr, nullptr); }
};

// In this order: the string table and the log writer exist before the
// module object and go after it.
CStringTableRegistration g_strings(kModuleStrings, kModuleStringCount);
HelperLibraryLog g_helperLibraryLog;
CMainSkyvane g_module;

}  // namespace

SKYVANE_EXPORT int init(CConfigData* context) { return g_module.Init(context); }

SKYVANE_EXPORT int konfig(CConfigData* context) { return g_module.Konfig(context); }

SKYVANE_EXPORT int exec_action(CConfigData* context) { return g_module.ExecAction(context); }

SKYVANE_EXPORT int dll_exit(int unused) { return g_module.DllExit(unused); }
