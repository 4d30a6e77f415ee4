#include "ModuleHost.h"

#include "AzureLocalProcess.h"
#include "BulkArrays.h"

#include "vxhelper/messagebox.h"

#include <cstdlib>
#include <fstream>

#include <QCoreApplication>
#include <QDeadlineTimer>

LRESULT CRecordingHostWnd::WindowProc(UINT message, WPARAM wParam, LPARAM lParam) {
    std::lock_guard<std::mutex> guard(m_lock);
    m_messages.push_back({message, wParam, lParam});
    return 0;
}

std::vector<CRecordingHostWnd::Message> CRecordingHostWnd::Messages() const {
    std::lock_guard<std::mutex> guard(m_lock);
    return m_messages;
}

int CRecordingHostWnd::Count(UINT message) const {
    std::lock_guard<std::mutex> guard(m_lock);
    int count = 0;
    for (const Message& m : m_messages) count += m.message == message;
    return count;
}

void CRecordingHostWnd::Clear() {
    std::lock_guard<std::mutex> guard(m_lock);
    m_messages.clear();
}

void WriteSettingsFile(const std::string& path, const ModuleSettings& settings) {
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file << "[Azure]\nINTEGRITYPERIOD=" << settings.integrityPeriod
         << "\n\n[VARIABLES]\nCOUNT=" << settings.variables.size() << "\n";
    for (size_t i = 0; i < settings.variables.size(); ++i) file << "NAME_" << i << "=" << settings.variables[i] << "\n";
    file << "\n[CONNECTIONS]\nCOUNT=" << settings.targets.size() << "\n";
    for (size_t i = 0; i < settings.targets.size(); ++i) {
        const TargetSettings& t = settings.targets[i];
        file << "CONN_" << i << "=" << t.connection << "\nQUEUE_" << i << "=" << t.queue << "\nMODE_" << i << "="
             << (t.eventHub ? 1 : 0) << "\nFORMAT_" << i << "=" << t.format << "\n";
    }
}

CModuleUnderTest::CModuleUnderTest(const std::string& path) {
    const std::string file = path.empty() ? azurelocal::BuildBinaryDir() + "/libSkyvane.so" : path;
    m_library = LoadLibrary(CString(file));
    if (!m_library) return;
    m_init = reinterpret_cast<ContextExport>(GetProcAddress(m_library, "init"));
    m_konfig = reinterpret_cast<ContextExport>(GetProcAddress(m_library, "konfig"));
    m_execAction = reinterpret_cast<ContextExport>(GetProcAddress(m_library, "exec_action"));
    m_dllExit = reinterpret_cast<int (*)(int)>(GetProcAddress(m_library, "dll_exit"));
}

CModuleUnderTest::~CModuleUnderTest() {
    if (m_library) FreeLibrary(m_library);
}

bool PumpUntil(const std::function<bool()>& done, std::chrono::milliseconds limit) {
    QDeadlineTimer deadline(limit.count());
    while (!done()) {
        if (deadline.hasExpired()) return done();
        VX_PumpMessages(20);
    }
    return true;
}

CMessageBoxRecorder::CMessageBoxRecorder() { VXHelper_SetMessageBoxObserver(&CMessageBoxRecorder::Observe, this); }

CMessageBoxRecorder::~CMessageBoxRecorder() { VXHelper_SetMessageBoxObserver(nullptr, nullptr); }

std::vector<std::string> CMessageBoxRecorder::Texts() const {
    std::lock_guard<std::mutex> guard(m_lock);
    return m_texts;
}

void CMessageBoxRecorder::Observe(HWND, const CString& text, UINT, void* self) {
    auto* recorder = static_cast<CMessageBoxRecorder*>(self);
    {
        std::lock_guard<std::mutex> guard(recorder->m_lock);
        recorder->m_texts.push_back(text.ToUtf8());
    }
    if (recorder->onShow) recorder->onShow();
}

CTestLog::CTestLog(const TempFolder& folder) : m_path(folder.Path("module.log")) {
    const std::string config =
        folder.Write("brennic.ini", "[levels]\n19 = 129\n[file]\npath = " + m_path + "\n[stderr]\nenabled = no\n");
    setenv("BRENNIC_CONFIG", config.c_str(), 1);
}

CTestLog::~CTestLog() { unsetenv("BRENNIC_CONFIG"); }

std::vector<std::string> CTestLog::Lines() const { return TempFolder::ReadLines(m_path); }

int CTestLog::CountContaining(const std::string& text) const {
    int count = 0;
    for (const std::string& line : Lines()) count += line.find(text) != std::string::npos;
    return count;
}

tarvo::VariableConfig NumberVariable(const std::u16string& name, double value) {
    tarvo::VariableConfig v;
    v.name = name;
    v.number = value;
    return v;
}

tarvo::ProjectConfig Project(const std::u16string& name, const std::vector<std::u16string>& numberVariables) {
    tarvo::ProjectConfig project;
    project.name = name;
    for (const auto& variable : numberVariables) project.variables.push_back(NumberVariable(variable, 0.0));
    return project;
}

namespace {

std::u16string VariableName(int i) { return u"V" + CString::Formatted(u"%d", i).Str(); }

}  // namespace

CBulkPlant::CBulkPlant(int variables) {
    tarvo::ProjectConfig plant;
    plant.name = u"Plant";
    for (int i = 0; i < variables; ++i) plant.variables.push_back(NumberVariable(VariableName(i), 0.0));
    tarvo::RuntimeConfig config;
    config.projects = {plant};
    tarvo::RuntimeOptions options;
    options.simulate = false;
    runtime = std::make_unique<tarvo::Runtime>(config, options);
    std::string error;
    started = runtime->Start(&error);
    for (int i = 0; started && i < variables; ++i) ids.push_back(*runtime->VariableId(u"Plant", VariableName(i)));
}

bool CBulkPlant::FireRound(double value) {
    const std::vector<double> values(ids.size(), value), zeros(ids.size(), 0.0), times(ids.size(), 45000.25);
    return runtime->FireRawBulkChange(u"Plant", u"",
                                      {CComVariant(static_cast<int>(ids.size())), ArrayOf(VT_R8, 0, ids),
                                       ArrayOf(VT_VARIANT, 0, values), ArrayOf(VT_R8, 0, zeros),
                                       ArrayOf(VT_R8, 0, zeros), ArrayOf(VT_R8, 0, times)});
}

std::vector<std::string> CBulkPlant::Keys() const {
    std::vector<std::string> keys;
    for (size_t i = 0; i < ids.size(); ++i)
        keys.push_back("Plant#" + CString(VariableName(static_cast<int>(i))).ToUtf8());
    return keys;
}
