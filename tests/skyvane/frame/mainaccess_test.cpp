// The module object's base operations, its log sink and the module's records.
#include "frame/ConfigData.h"
#include "frame/LogMainAccess.h"
#include "frame/MainAccess.h"
#include "frame/ModuleLog.h"

#include "temp_folder.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <vector>

namespace {

// Records what the log sink tells the module object.
class RecordingMainAccess : public CMainAccess {
public:
    void OnFillLogFields(CLogRec*) override { ++filledRecords; }
    void OnFillLogModules(CStringArray& names) override {
        moduleNames.clear();
        for (const CString& name : names) moduleNames.push_back(name);
    }
    CString GetLogSinkName() override { return sinkName; }
    bool OnLogLevels(const BYTE* levels, int count) override {
        levelCalls.emplace_back(levels, levels + count);
        if (auto* sink = GetLogSink()) entry19WhenTold.push_back(sink->GetLevelMask(19));
        return true;
    }

    int filledRecords = 0;
    std::vector<CString> moduleNames;
    CString sinkName;
    std::vector<std::vector<BYTE>> levelCalls;
    std::vector<BYTE> entry19WhenTold;
};

// Points the log at a file of the test's own, through the configuration
// file the library finds by its environment variable.
class MainAccessTest : public ::testing::Test {
protected:
    void SetUp() override { UseLevels(0x81); }
    void TearDown() override { unsetenv("BRENNIC_CONFIG"); }

    // Entry 19 as given; entry 0 (the log's own records) as given, off by default.
    void UseLevels(int entry19, int entry0 = 0) {
        const std::string config = "[file]\npath = " + LogPath() +
                                   "\n[stderr]\nenabled = no\n[levels]\n0 = " + std::to_string(entry0) +
                                   "\n19 = " + std::to_string(entry19) + "\n";
        setenv("BRENNIC_CONFIG", m_folder.Write("brennic.ini", config).c_str(), 1);
    }
    std::string LogPath() const { return m_folder.Path("module.log"); }
    std::vector<std::string> LogLines() const { return TempFolder::ReadLines(LogPath()); }

    TempFolder m_folder;
};

std::string Tail(const std::string& line) { return line.size() > 24 ? line.substr(24) : line; }

}  // namespace

TEST_F(MainAccessTest, ContextIsCopiedFromInitUntilDllExit) {
    RecordingMainAccess module;
    CConfigData context;
    context.m_strIniFile = u"first.ini";
    EXPECT_EQ(module.Konfig(&context), 0);  // no copy before Init
    EXPECT_EQ(module.ExecAction(&context), 0);
    EXPECT_EQ(module.GetConfigData(), nullptr);

    EXPECT_EQ(module.Init(&context), 1);
    ASSERT_NE(module.GetConfigData(), nullptr);
    EXPECT_EQ(module.GetConfigData()->m_strIniFile, u"first.ini");
    EXPECT_EQ(CLogSink::m_pLogSinkSelf.load(), module.GetLogSink());

    context.m_strIniFile = u"second.ini";
    EXPECT_EQ(module.ExecAction(&context), 1);
    EXPECT_EQ(module.GetConfigData()->m_strIniFile, u"second.ini");
    EXPECT_EQ(module.Konfig(nullptr), 0);

    EXPECT_EQ(module.DllExit(0), 1);
    EXPECT_EQ(module.GetConfigData(), nullptr);
    EXPECT_EQ(CLogSink::m_pLogSinkSelf.load(), nullptr);
    EXPECT_EQ(module.ExecAction(&context), 0);
}

TEST_F(MainAccessTest, RepeatedInitKeepsOneSinkAndNamesIt) {
    UseLevels(0x81, LOG_LEVEL_INFO);
    RecordingMainAccess module;
    CConfigData context;
    ASSERT_EQ(module.Init(&context), 1);
    EXPECT_EQ(module.GetLogSink()->GetLogSinkName(), u"skyvane_frame_tests");  // the library's default

    module.sinkName = u"gateway";
    ASSERT_EQ(module.Init(&context), 1);
    EXPECT_EQ(CLogSink::m_pLogSinkSelf.load(), module.GetLogSink());
    EXPECT_EQ(module.GetLogSink()->GetLogSinkName(), u"gateway");
    CModuleLog::LogError(u"once");
    module.DllExit(0);
    // The first sink stopped when the second came.
    std::vector<std::string> events;
    for (const std::string& line : LogLines())
        if (line.find("Log st") != std::string::npos || line.find("once") != std::string::npos)
            events.push_back(Tail(line));
    const std::vector<std::string> expected = {"Log INFO kind=1 field=1: Log started for 'skyvane_frame_tests'",
                                               "Log INFO kind=1 field=1: Log stopped for 'skyvane_frame_tests'",
                                               "Log INFO kind=1 field=1: Log started for 'gateway'",
                                               "PelgradDll ERROR kind=76 field=39: once",
                                               "Log INFO kind=1 field=1: Log stopped for 'gateway'"};
    EXPECT_EQ(events, expected);
}

TEST_F(MainAccessTest, SinkReportsTheModuleNamesAndCallsTheHooks) {
    RecordingMainAccess module;
    CConfigData context;
    ASSERT_EQ(module.Init(&context), 1);

    // 16 library names, then the module's.
    ASSERT_EQ(module.moduleNames.size(), 20u);
    EXPECT_FALSE(module.moduleNames[15].IsEmpty());
    EXPECT_EQ(module.moduleNames[16], u"Pelgrad");
    EXPECT_EQ(module.moduleNames[17], u"KAP");
    EXPECT_EQ(module.moduleNames[18], u"");
    EXPECT_EQ(module.moduleNames[19], u"PelgradDll");

    // Reading the configuration told the module the table.
    ASSERT_EQ(module.levelCalls.size(), 1u);
    ASSERT_EQ(module.levelCalls[0].size(), 64u);
    EXPECT_EQ(module.levelCalls[0][19], 0x81);

    // A new parameter reaches the module before the sink applies it.
    BYTE levels[LOG_MODULE_COUNT] = {};
    levels[19] = LOG_LEVEL_ERROR;
    module.GetLogSink()->CmdSetParameter(CCliParam(levels, LOG_MODULE_COUNT));
    ASSERT_EQ(module.levelCalls.size(), 2u);
    EXPECT_EQ(module.levelCalls[1][19], LOG_LEVEL_ERROR);
    EXPECT_EQ(module.entry19WhenTold.back(), 0x81);
    EXPECT_EQ(module.GetLogSink()->GetLevelMask(19), LOG_LEVEL_ERROR);

    CModuleLog::LogError(u"hooked");
    EXPECT_EQ(module.filledRecords, 1);
    module.DllExit(0);
    const auto lines = LogLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(Tail(lines[0]), "PelgradDll ERROR kind=76 field=39: hooked");
}

// Entry 19 of the level table selects errors (1) or information (128); each
// kind of record is written in both text forms.
TEST_F(MainAccessTest, Entry19SelectsErrorsOrInformation) {
    const struct {
        int entry19;
        bool infoEnabled;
        std::vector<std::string> lines;
    } cases[] = {
        {LOG_LEVEL_ERROR,
         false,
         {"PelgradDll ERROR kind=76 field=39: error text", "PelgradDll ERROR kind=76 field=39: "}},
        {LOG_LEVEL_INFO,
         true,
         {"PelgradDll INFO kind=76 field=49: info text", "PelgradDll INFO kind=76 field=49: wide info"}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.entry19);
        std::remove(LogPath().c_str());
        UseLevels(c.entry19);
        RecordingMainAccess module;
        CConfigData context;
        ASSERT_EQ(module.Init(&context), 1);
        EXPECT_EQ(CModuleLog::IsInfoEnabled(), c.infoEnabled);
        CModuleLog::LogError(CString(u"error text"));
        CModuleLog::LogInfo(CString(u"info text"));
        CModuleLog::LogError(static_cast<const char16_t*>(nullptr));
        CModuleLog::LogInfo(u"wide info");
        module.DllExit(0);
        std::vector<std::string> lines;
        for (const std::string& line : LogLines()) lines.push_back(Tail(line));
        EXPECT_EQ(lines, c.lines);
    }
}

TEST_F(MainAccessTest, NothingIsWrittenWithoutACurrentSink) {
    ASSERT_EQ(CLogSink::m_pLogSinkSelf.load(), nullptr);
    CModuleLog::LogError(u"before init");
    CModuleLog::LogInfo(CString(u"before init"));
    EXPECT_FALSE(CModuleLog::IsInfoEnabled());

    RecordingMainAccess module;
    CConfigData context;
    ASSERT_EQ(module.Init(&context), 1);
    module.DllExit(0);
    CModuleLog::LogError(u"after exit");
    CModuleLog::LogInfo(u"after exit");
    EXPECT_FALSE(CModuleLog::IsInfoEnabled());
    EXPECT_TRUE(LogLines().empty());
}
