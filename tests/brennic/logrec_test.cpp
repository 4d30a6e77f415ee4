// Records, fields and the layout of the lines they become.
#include "log_test_support.h"

#include <cctype>

namespace {

// Whether a line starts with "YYYY-MM-DD HH:MM:SS.mmm ".
bool StartsWithTime(const std::string& line) {
    const std::string shape = "dddd-dd-dd dd:dd:dd.ddd ";
    if (line.size() < shape.size()) return false;
    for (size_t i = 0; i < shape.size(); ++i) {
        const bool digit = std::isdigit(static_cast<unsigned char>(line[i])) != 0;
        if (shape[i] == 'd' ? !digit : line[i] != shape[i]) return false;
    }
    return true;
}

}  // namespace

TEST(LogRecTest, CreatedOnlyForAnEnabledLevelOfASink) {
    EXPECT_EQ(CLogRec::CreateLogRec(nullptr, 19, LOG_LEVEL_ERROR, LOGREC_KIND_MODULE_TEXT, nullptr), nullptr);

    CLogSink sink;
    sink.SetLevelMask(19, LOG_LEVEL_ERROR);
    EXPECT_EQ(CLogRec::CreateLogRec(&sink, 19, LOG_LEVEL_INFO, LOGREC_KIND_MODULE_TEXT, nullptr), nullptr);

    std::unique_ptr<CLogRec> record(
        CLogRec::CreateLogRec(&sink, 19 + 64, LOG_LEVEL_ERROR, LOGREC_KIND_MODULE_TEXT, nullptr));
    ASSERT_NE(record, nullptr);
    EXPECT_EQ(record->GetModuleIndex(), 19);  // index taken modulo 64
    EXPECT_EQ(record->GetKind(), LOGREC_KIND_MODULE_TEXT);
    const auto age = CLogRec::Clock::now() - record->GetTime();
    EXPECT_LT(std::chrono::abs(age), std::chrono::seconds(5));  // stamped now

    const FILETIME given = TimePointToFileTime(CLogRec::Clock::time_point(std::chrono::milliseconds(1700000000123)));
    EXPECT_EQ(given.dwHighDateTime, 0x01DA1747u);  // 2023-11-14 22:13:20.123 UTC
    EXPECT_EQ(given.dwLowDateTime, 0xC67FC4B0u);
    std::unique_ptr<CLogRec> stamped(CLogRec::CreateLogRec(&sink, 19, LOG_LEVEL_ERROR, LOGREC_KIND_GENERAL, &given));
    EXPECT_EQ(std::chrono::duration_cast<std::chrono::milliseconds>(stamped->GetTime().time_since_epoch()).count(),
              1700000000123);
}

TEST(LogRecTest, FieldsKeepTextBoundedAtWholeCharacters) {
    std::unique_ptr<CLogField> empty(CLogField::CreateLogField(7, static_cast<const char16_t*>(nullptr), 0));
    EXPECT_TRUE(empty->GetText().empty());
    EXPECT_EQ(empty->GetId(), 7);

    // A surrogate pair straddling the limit is kept out whole.
    std::u16string text(CLogField::kMaxTextLength - 1, u'a');
    text += u"\U0001F600";
    text += std::u16string(100, u'b');
    std::unique_ptr<CLogField> cut(CLogField::CreateLogField(1, CString(text), 0));
    const std::u16string& kept = cut->GetText();
    EXPECT_EQ(kept.substr(0, CLogField::kMaxTextLength - 1), text.substr(0, CLogField::kMaxTextLength - 1));
    EXPECT_EQ(kept.substr(CLogField::kMaxTextLength - 1), u" ... (102 more characters)");

    const std::u16string exact(CLogField::kMaxTextLength, u'x');
    std::unique_ptr<CLogField> whole(CLogField::CreateLogField(1, exact.c_str(), 0));
    EXPECT_EQ(whole->GetText(), exact);
}

using LogLineTest = LogFolderTest;

TEST_F(LogLineTest, OneLinePerRecordWithTimeModuleLevelKindFieldAndText) {
    {
        CLogSink sink;
        UseConfig(sink, Config("[levels]\n0 = 0\n2 = 255\n"));
        ASSERT_TRUE(sink.StartLogging());
        WriteText(sink, 2, LOG_LEVEL_ERROR, 39, u"first line\r\nsecond\tline \\ end");
        std::u16string odd = u"lone ";
        odd += char16_t(0xD800);
        odd += u" nul ";
        odd += char16_t(0);
        odd += u" \u00e4\U0001F600";
        WriteText(sink, 2, LOG_LEVEL_INFO, 49, CString(odd));

        CLogRec* record = CLogRec::CreateLogRec(&sink, 40, LOG_LEVEL_WARNING, LOGREC_KIND_GENERAL, nullptr);
        EXPECT_EQ(record, nullptr);  // module 40 is off
        sink.SetLevelMask(40, 0xFF);
        record = CLogRec::CreateLogRec(&sink, 40, LOG_LEVELS(0x81), LOGREC_KIND_GENERAL, nullptr);
        record->AddField(CLogField::CreateLogField(5, u"password", LOGFIELD_CONFIDENTIAL));
        record->AddField(CLogField::CreateLogField(6, u"visible", 0));
        sink.AddDirect(record);
    }
    const std::vector<std::string> lines = LogLines();
    ASSERT_EQ(lines.size(), 3u);
    for (const std::string& line : lines) EXPECT_TRUE(StartsWithTime(line)) << line;
    EXPECT_EQ(lines[0].substr(24), R"(Runtime ERROR kind=76 field=39: first line\r\nsecond\tline \ end)");
    EXPECT_EQ(lines[1].substr(24),
              "Runtime INFO kind=76 field=49: lone \xEF\xBF\xBD nul \\x00 \xC3\xA4\xF0\x9F\x98\x80");
    EXPECT_EQ(lines[2].substr(24), "module40 LEVEL(0x81) kind=0 field=5: (confidential) | field=6: visible");
}
