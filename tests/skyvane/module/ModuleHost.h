#pragma once
// A host for tests: loads libSkyvane.so by path as a gateway would, gives it
// a recording host window and a settings file, and waits on the event loop
// for what the test expects. Also the settings and the log a test needs.

#include "frame/ConfigData.h"

#include "platform/library.h"
#include "platform/window.h"
#include "tarvo/Control.h"

#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "temp_folder.h"

// The host window: records every message the module sends or posts to it.
class CRecordingHostWnd : public CWnd {
public:
    struct Message {
        UINT message;
        WPARAM wParam;
        LPARAM lParam;
    };

    CRecordingHostWnd() { CreateMessageWindow(u"test host"); }
    ~CRecordingHostWnd() override { DestroyWindow(); }

    LRESULT WindowProc(UINT message, WPARAM wParam, LPARAM lParam) override;

    std::vector<Message> Messages() const;
    int Count(UINT message) const;
    void Clear();

private:
    mutable std::mutex m_lock;  // guards m_messages
    std::vector<Message> m_messages;
};

// One target of the settings file.
struct TargetSettings {
    std::string connection;
    std::string queue;
    bool eventHub = false;
    int format = 1;  // 0 XML, 1 JSON, 2 BOND
};

struct ModuleSettings {
    std::vector<std::string> variables;  // keys "project#variable"
    std::vector<TargetSettings> targets;
    int integrityPeriod = 3600;
};

// Writes the settings file the module reads.
void WriteSettingsFile(const std::string& path, const ModuleSettings& settings);

// The loaded module with its four exports.
class CModuleUnderTest {
public:
    // Loads the library at path (libSkyvane.so of this build when empty).
    explicit CModuleUnderTest(const std::string& path = {});
    ~CModuleUnderTest();

    bool Loaded() const { return m_init && m_konfig && m_execAction && m_dllExit; }
    int Init(CConfigData* context) { return m_init(context); }
    int Konfig(CConfigData* context) { return m_konfig(context); }
    int ExecAction(CConfigData* context) { return m_execAction(context); }
    int DllExit() { return m_dllExit(0); }

private:
    using ContextExport = int (*)(CConfigData*);
    HMODULE m_library = nullptr;
    ContextExport m_init = nullptr, m_konfig = nullptr, m_execAction = nullptr;
    int (*m_dllExit)(int) = nullptr;
};

// What a host holds: its window, a context naming the settings file, and the
// loaded module (libSkyvane.so of this build when library is empty).
struct CHostedModule {
    explicit CHostedModule(const std::string& settingsPath, const std::string& library = {}) : module(library) {
        context.m_pWnd = &host;
        context.m_strIniFile = CString(settingsPath);
    }
    int Init() { return module.Init(&context); }

    CRecordingHostWnd host;
    CConfigData context;
    CModuleUnderTest module;
};

// Runs the event loop until done() holds or the time is up; returns done().
bool PumpUntil(const std::function<bool()>& done, std::chrono::milliseconds limit = std::chrono::seconds(20));

// Every message box the module shows, captured as it is shown.
class CMessageBoxRecorder {
public:
    CMessageBoxRecorder();
    ~CMessageBoxRecorder();
    std::vector<std::string> Texts() const;
    // Runs inside each box, as its modal loop would let events in.
    std::function<void()> onShow;

private:
    static void Observe(HWND parent, const CString& text, UINT type, void* self);
    mutable std::mutex m_lock;  // guards m_texts
    std::vector<std::string> m_texts;
};

// The central log written to a file of the test's folder, without standard error.
class CTestLog {
public:
    explicit CTestLog(const TempFolder& folder);
    ~CTestLog();
    // Lines of the log file (complete once the module's dll_exit has run).
    std::vector<std::string> Lines() const;
    int CountContaining(const std::string& text) const;

private:
    std::string m_path;
};

// The stand-in with one project "Plant" of number variables V0, V1, ...
// (values change only when fired), for load.
class CBulkPlant {
public:
    explicit CBulkPlant(int variables);
    // One event in which every variable takes the value.
    bool FireRound(double value);
    // The variable keys, "Plant#V0" ...
    std::vector<std::string> Keys() const;

    std::unique_ptr<tarvo::Runtime> runtime;
    std::vector<double> ids;
    bool started = false;
};

// Stand-in configuration helpers.
tarvo::VariableConfig NumberVariable(const std::u16string& name, double value);
tarvo::ProjectConfig Project(const std::u16string& name, const std::vector<std::u16string>& numberVariables);
