#pragma once
// Shared pieces of the log tests: a sink configured to write into a test's
// own folder, and a short way to write one text record.

#include "brennic/logsink.h"

#include "temp_folder.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

class LogFolderTest : public ::testing::Test {
protected:
    // A configuration that writes to LogPath() only; extra is appended as it is.
    std::string Config(const std::string& extra = {}) const {
        return "[file]\npath = " + LogPath() + "\n[stderr]\nenabled = no\n" + extra;
    }
    void UseConfig(CLogSink& sink, const std::string& text) const {
        sink.SetConfigPath(CString::FromUtf8(m_folder.Write("brennic.ini", text)));
    }
    std::string LogPath() const { return m_folder.Path("test.log"); }
    std::vector<std::string> LogLines() const { return TempFolder::ReadLines(LogPath()); }

    // The lines of the log file that contain the given text.
    std::vector<std::string> LinesWith(const std::string& text) const {
        std::vector<std::string> lines = LogLines();
        std::erase_if(lines, [&](const std::string& line) { return line.find(text) == std::string::npos; });
        return lines;
    }

    TempFolder m_folder;
};

inline void WriteText(CLogSink& sink, BYTE module, LOG_LEVELS level, WORD field, const CString& text) {
    CLogRec* record = CLogRec::CreateLogRec(&sink, module, level, LOGREC_KIND_MODULE_TEXT, nullptr);
    ASSERT_NE(record, nullptr);
    record->AddField(CLogField::CreateLogField(field, text, 0));
    sink.AddDirect(record);
    EXPECT_EQ(record, nullptr);
}
