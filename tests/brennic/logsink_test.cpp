// The sink: current-sink pointer, configuration, queue, writer and destinations.
#include "log_test_support.h"

#include <filesystem>
#include <thread>

namespace {

// The number of the last "n<number>" of a line (texts are made by Numbered).
int TrailingNumber(const std::string& line) {
    const auto pos = line.rfind('n');
    return pos == std::string::npos ? -1 : std::stoi(line.substr(pos + 1));
}

CString Numbered(int n) { return CString::Formatted(u"n%d", n); }

}  // namespace

TEST(LogSinkCurrentTest, NewestSinkIsCurrentUntilItGoes) {
    EXPECT_EQ(CLogSink::m_pLogSinkSelf.load(), nullptr);
    auto first = std::make_unique<CLogSink>();
    EXPECT_EQ(CLogSink::m_pLogSinkSelf.load(), first.get());
    auto second = std::make_unique<CLogSink>();
    EXPECT_EQ(CLogSink::m_pLogSinkSelf.load(), second.get());
    first.reset();  // not the current one: the pointer stays
    EXPECT_EQ(CLogSink::m_pLogSinkSelf.load(), second.get());
    second.reset();
    EXPECT_EQ(CLogSink::m_pLogSinkSelf.load(), nullptr);
}

using LogSinkTest = LogFolderTest;

TEST_F(LogSinkTest, ConfigurationSetsLevelsDestinationsAndReportsBadLines) {
    CLogSink sink;
    // Defaults before any configuration: errors and information of index 19 and of the log itself.
    EXPECT_EQ(sink.GetLevelMask(19), LOG_LEVEL_ERROR | LOG_LEVEL_INFO);
    EXPECT_EQ(sink.GetLevelMask(5), 0);

    UseConfig(sink,
              "; comment\n[levels]\ndefault = 2\n19 = 0x80\n63=1\n64 = 1\n7 = 300\n"
              "[file]\npath = /some/where.log\nkeep = lots\nbogus = 1\n[queue]\ncapacity = 0\nno equals sign\n");
    testing::internal::CaptureStderr();
    EXPECT_TRUE(sink.ReadCfg());
    const std::string reported = testing::internal::GetCapturedStderr();
    EXPECT_EQ(sink.GetLevelMask(19), LOG_LEVEL_INFO);
    EXPECT_EQ(sink.GetLevelMask(63), LOG_LEVEL_ERROR);
    EXPECT_EQ(sink.GetLevelMask(7), LOG_LEVEL_WARNING);  // bad value: the default line stays
    EXPECT_EQ(sink.GetServerStartPath(), u"/some");
    for (const char* expected : {"line 6: a module index", "line 7: a level mask", "line 10: 'keep'",
                                 "line 11: unknown key 'bogus' in [file]", "line 13: 'capacity'", "line 14: expected"})
        EXPECT_NE(reported.find(expected), std::string::npos) << expected << " in:\n" << reported;

    sink.SetConfigPath(CString::FromUtf8(m_folder.Path("missing.ini")));
    testing::internal::CaptureStderr();
    EXPECT_FALSE(sink.ReadCfg());
    EXPECT_NE(testing::internal::GetCapturedStderr().find("cannot read log configuration"), std::string::npos);
    EXPECT_EQ(sink.GetLevelMask(19), LOG_LEVEL_INFO);  // the last good settings stay
}

TEST_F(LogSinkTest, ParameterAndOnlineLogChangeARunningSink) {
    CLogSink sink;
    UseConfig(sink, Config());
    ASSERT_TRUE(sink.StartLogging());
    BYTE levels[LOG_MODULE_COUNT] = {};
    levels[19] = LOG_LEVEL_ERROR;
    levels[63] = 0x7F;
    sink.CmdSetParameter(CCliParam(levels, LOG_MODULE_COUNT));
    BYTE table[LOG_MODULE_COUNT];
    sink.GetLevelTable(table);
    EXPECT_TRUE(std::equal(std::begin(table), std::end(table), std::begin(levels)));

    sink.CmdOnlinelog(true);
    testing::internal::CaptureStderr();
    WriteText(sink, 19, LOG_LEVEL_ERROR, 39, u"to both");
    ASSERT_TRUE(sink.Flush());
    EXPECT_NE(testing::internal::GetCapturedStderr().find("field=39: to both"), std::string::npos);
    EXPECT_EQ(LinesWith("to both").size(), 1u);
}

TEST_F(LogSinkTest, RecordsInQueueAreWrittenWhenTheSinkGoes) {
    {
        CLogSink sink;
        UseConfig(sink, Config());
        ASSERT_TRUE(sink.StartLogging());
        for (int i = 0; i < 2000; ++i) WriteText(sink, 19, LOG_LEVEL_INFO, 49, Numbered(i));
    }
    const auto lines = LinesWith("field=49: n");
    ASSERT_EQ(lines.size(), 2000u);
    for (int i = 0; i < 2000; ++i) ASSERT_EQ(TrailingNumber(lines[static_cast<size_t>(i)]), i);
    EXPECT_EQ(LinesWith("Log stopped").size(), 1u);
}

TEST_F(LogSinkTest, FullQueueDropsTheOldestAndLogsHowMany) {
    CLogSink sink;
    UseConfig(sink, Config("[queue]\ncapacity = 5\n[levels]\n0 = 0\n"));
    ASSERT_TRUE(sink.ReadCfg());
    // The writer does not run yet, so the queue fills up for certain.
    for (int i = 0; i < 12; ++i) WriteText(sink, 19, LOG_LEVEL_ERROR, 39, Numbered(i));
    EXPECT_EQ(sink.GetDroppedCount(), 7u);
    EXPECT_FALSE(sink.Flush(0));  // nothing writes yet

    ASSERT_TRUE(sink.StartLogging());
    ASSERT_TRUE(sink.Flush());
    const auto lines = LogLines();
    ASSERT_EQ(lines.size(), 6u);
    EXPECT_NE(lines[0].find("Log WARNING kind=1 field=1: 7 log records were dropped: the log queue was full"),
              std::string::npos)
        << lines[0];
    for (int i = 0; i < 5; ++i) EXPECT_EQ(TrailingNumber(lines[static_cast<size_t>(i) + 1]), 7 + i);

    sink.StopLogging();
    WriteText(sink, 19, LOG_LEVEL_ERROR, 39, u"after stop");
    EXPECT_TRUE(sink.Flush());
    EXPECT_EQ(LogLines().size(), 6u);
}

TEST_F(LogSinkTest, ManyThreadsWriteAtOnceWithoutLossOrReordering) {
    constexpr int kThreads = 4;
    constexpr int kEach = 2500;
    CLogSink sink;
    UseConfig(sink, Config("[queue]\ncapacity = 100000\n"));
    ASSERT_TRUE(sink.StartLogging());
    std::vector<std::thread> writers;
    for (int t = 0; t < kThreads; ++t)
        writers.emplace_back([&sink, t] {
            for (int i = 0; i < kEach; ++i)
                WriteText(sink, 19, LOG_LEVEL_INFO, static_cast<WORD>(100 + t), Numbered(i));
        });
    for (auto& writer : writers) writer.join();
    ASSERT_TRUE(sink.Flush());
    EXPECT_EQ(sink.GetDroppedCount(), 0u);
    for (int t = 0; t < kThreads; ++t) {
        const auto lines = LinesWith("field=" + std::to_string(100 + t) + ": n");
        ASSERT_EQ(lines.size(), static_cast<size_t>(kEach));
        for (int i = 0; i < kEach; ++i) ASSERT_EQ(TrailingNumber(lines[static_cast<size_t>(i)]), i);
    }
}

TEST_F(LogSinkTest, FileRotatesAtTheConfiguredSizeKeepingTheNewest) {
    CLogSink sink;
    UseConfig(sink, Config("[file]\nmax_size = 1K\nkeep = 2\n[levels]\n0 = 0\n"));
    ASSERT_TRUE(sink.StartLogging());
    const CString padding(u'p', 40);
    for (int i = 0; i < 100; ++i) {
        WriteText(sink, 19, LOG_LEVEL_ERROR, 39, padding + Numbered(i));
        if (i % 10 == 9) {
            ASSERT_TRUE(sink.Flush());  // rotation also across batches
        }
    }
    ASSERT_TRUE(sink.Flush());

    const std::string files[] = {LogPath() + ".2", LogPath() + ".1", LogPath()};
    EXPECT_FALSE(std::filesystem::exists(LogPath() + ".3"));
    int expected = -1;
    for (const std::string& file : files) {
        ASSERT_TRUE(std::filesystem::exists(file)) << file;
        EXPECT_LE(std::filesystem::file_size(file), 1024u) << file;
        EXPECT_GT(std::filesystem::file_size(file), 1024u - 110u) << file;  // filled, not rotated early
        for (const std::string& line : TempFolder::ReadLines(file)) {
            const int n = TrailingNumber(line);
            if (expected >= 0) {
                EXPECT_EQ(n, expected + 1) << file;  // no gap across files
            }
            expected = n;
        }
    }
    EXPECT_EQ(expected, 99);
}

TEST_F(LogSinkTest, UnopenableFileLeavesOtherDestinationsAndIsReportedOnce) {
    CLogSink sink;
    UseConfig(sink, "[file]\npath = " + m_folder.Path("missing/test.log") + "\n[stderr]\nenabled = yes\n");
    testing::internal::CaptureStderr();
    ASSERT_TRUE(sink.StartLogging());
    for (int batch = 0; batch < 3; ++batch) {
        WriteText(sink, 19, LOG_LEVEL_ERROR, 39, Numbered(batch));
        ASSERT_TRUE(sink.Flush());
    }
    sink.StopLogging();
    const std::string reported = testing::internal::GetCapturedStderr();
    const auto first = reported.find("cannot open log file");
    ASSERT_NE(first, std::string::npos) << reported;
    EXPECT_EQ(reported.find("cannot open log file", first + 1), std::string::npos) << reported;
    for (int batch = 0; batch < 3; ++batch)
        EXPECT_NE(reported.find("field=39: n" + std::to_string(batch)), std::string::npos) << reported;
}

TEST_F(LogSinkTest, ReconnectedReopensAFileMovedAway) {
    CLogSink sink;
    UseConfig(sink, Config());
    ASSERT_TRUE(sink.StartLogging());
    WriteText(sink, 19, LOG_LEVEL_ERROR, 39, u"before");
    ASSERT_TRUE(sink.Flush());
    std::filesystem::rename(LogPath(), LogPath() + ".old");
    sink.ReConnected();
    WriteText(sink, 19, LOG_LEVEL_ERROR, 39, u"after");
    ASSERT_TRUE(sink.Flush());
    EXPECT_EQ(LinesWith("before").size(), 0u);
    EXPECT_EQ(LinesWith("Log destinations reopened").size(), 1u);
    EXPECT_EQ(LinesWith("after").size(), 1u);
}
