#include "vxhelper/IniDocument.h"
#include "vxhelper/profile.h"

#include "vxhelper/logwriter.h"

#include "CStringPrint.h"
#include "samples.h"

#include <gtest/gtest.h>

#include <dlfcn.h>
#include <sys/stat.h>

#include <atomic>
#include <cerrno>
#include <mutex>
#include <thread>
#include <vector>

namespace {
std::atomic<bool> g_failRename{false};  // set: rename(2) fails, as on a file system that refuses it
}  // namespace

// Stands in for the C library's rename for the whole test program (the helper
// library's calls resolve to it), so a test can make the replacement fail.
extern "C" int rename(const char* from, const char* to) noexcept {
    using Rename = int (*)(const char*, const char*);
    static const auto real = reinterpret_cast<Rename>(dlsym(RTLD_NEXT, "rename"));
    if (g_failRename) {
        errno = EIO;
        return -1;
    }
    return real(from, to);
}

namespace {

struct FailingRename {
    FailingRename() { g_failRename = true; }
    ~FailingRename() { g_failRename = false; }
};

CString ReadText(const CString& file, LPCWSTR section, LPCWSTR key) {
    char16_t buffer[1024];
    VX_GetPrivateProfileString(section, key, u"<default>", buffer, 1024, file);
    return CString(buffer);
}

std::string Utf16Le(std::string_view ascii) {
    std::string bytes;
    for (const char c : ascii) bytes += {c, '\0'};
    return bytes;
}

std::string Utf16Le(std::u16string_view text) {
    std::string bytes;
    for (const char16_t c : text) bytes += {static_cast<char>(c & 0xFF), static_cast<char>(c >> 8)};
    return bytes;
}

// Keeps the text of every information record of the helper library while it lives.
class RecordingSink {
public:
    RecordingSink() {
        Texts().clear();
        VXHelper_SetLogWriters(nullptr, &Record);
    }
    ~RecordingSink() { VXHelper_SetLogWriters(nullptr, nullptr); }
    static std::vector<std::string>& Texts() {
        static std::vector<std::string> texts;  // written by the test's own thread only
        return texts;
    }

private:
    static void Record(const CString& text) { Texts().push_back(text.ToUtf8()); }
};

class ProfileTest : public ::testing::Test {
protected:
    TempFolder dir;
    std::filesystem::path file = dir / "settings.ini";
    CString path = CString::FromUtf8(file.string());
};

TEST_F(ProfileTest, ReadsLikeWin32) {
    WriteBytes(file,
               "orphan=before any section\n[Azure]\n  IntegrityPeriod  =  10  \nno equals sign\n; c=comment\n"
               "Quoted=\"  padded  \"\nHalf=\"open\nEquals=a=b\ndup=first\nDUP=second\n"
               "[azure]\nLate=in a second section of that name\n[ Other ]\ndup=other\n");
    EXPECT_EQ(VX_GetPrivateProfileInt(u"AZURE", u"integrityperiod", 5, path), 10);
    EXPECT_EQ(ReadText(path, u"Azure", u"Quoted"), u"  padded  ");
    EXPECT_EQ(ReadText(path, u"Azure", u"Half"), u"\"open");
    EXPECT_EQ(ReadText(path, u"Azure", u"Equals"), u"a=b");
    EXPECT_EQ(ReadText(path, u"Azure", u"Dup"), u"first");
    EXPECT_EQ(ReadText(path, u"other", u"dup"), u"other");
    for (LPCWSTR key : {u"Late", u"orphan", u"; c", u"no equals sign"})
        EXPECT_EQ(ReadText(path, u"Azure", key), u"<default>") << CString(key).ToUtf8();
    EXPECT_EQ(ReadText(CString::FromUtf8((dir / "absent").string()), u"Azure", u"dup"), u"<default>");
    CStringArray keys;
    ASSERT_TRUE(VX_GetPrivateProfileKeyNames(u"AZURE", keys, path));
    EXPECT_EQ(keys.GetSize(), 5);  // IntegrityPeriod Quoted Half Equals dup
    EXPECT_FALSE(VX_GetPrivateProfileKeyNames(u"Missing", keys, path));

    // Integers: signed decimal, digits first; anything else is the default.
    WriteBytes(file, "[n]\na=-7\nb=+3\nc=10 s\nd=-2147483648\ne=abc\nf=\ng=2147483648\nh=-\n");
    const int expected[] = {-7, 3, 10, INT_MIN, 99, 99, 99, 99};
    for (char16_t key = u'a'; key <= u'h'; ++key)
        EXPECT_EQ(VX_GetPrivateProfileInt(u"n", CString(key), 99, path), expected[key - u'a']) << char(key);

    // Text is cut to the buffer, never between the halves of a surrogate pair.
    WriteBytes(file, "[s]\nk=abcdef\npair=ab\xF0\x9F\x98\x80\n");
    char16_t buffer[4];
    EXPECT_EQ(VX_GetPrivateProfileString(u"s", u"k", u"", buffer, 4, path), 3u);
    EXPECT_EQ(std::u16string(buffer), u"abc");
    EXPECT_EQ(VX_GetPrivateProfileString(u"s", u"pair", u"", buffer, 4, path), 2u);
    EXPECT_EQ(VX_GetPrivateProfileString(u"s", u"none", nullptr, buffer, 4, path), 0u);
}

TEST_F(ProfileTest, WindowsSampleKeepsItsFormOnWrite) {
    const std::filesystem::path sample = SamplePath("windows-settings-utf16le.ini");
    std::filesystem::copy_file(sample, file);
    std::filesystem::permissions(file, std::filesystem::perms::owner_read | std::filesystem::perms::owner_write);
    EXPECT_EQ(ReadText(path, u"VARIABLES", u"NAME_1"), u"Line1#Temper\u00e4ture");
    ASSERT_TRUE(VX_WritePrivateProfileString(u"variables", u"name_2", u"Line3#Flow", path));
    ASSERT_TRUE(VX_WritePrivateProfileInt(u"Azure", u"NEW_KEY", 7, path));

    // The key line keeps its spelling and blanks; the new key follows the
    // section's last non-blank line, in UTF-16LE with CR LF; nothing else moves.
    std::string expected = ReadBytes(sample);
    const std::string oldLine = Utf16Le("Name_2 = Line2#Tank#Level\r\n");
    expected.replace(expected.find(oldLine), oldLine.size(), Utf16Le("Name_2 = Line3#Flow\r\n"));
    const std::string pwd = Utf16Le("PROXY_PWD=\r\n");
    expected.insert(expected.find(pwd) + pwd.size(), Utf16Le("NEW_KEY=7\r\n"));
    EXPECT_EQ(ReadBytes(file), expected);
    struct stat st {};
    ASSERT_EQ(stat(file.c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u);  // permissions survive the replacement
}

TEST_F(ProfileTest, AnsiSampleReadsInPlace) {
    const CString sample = CString::FromUtf8(SamplePath("windows-settings-ansi.ini").string());
    EXPECT_EQ(VX_GetPrivateProfileInt(u"Azure", u"INTEGRITYPERIOD", 5, sample), 10);
    ASSERT_EQ(VX_GetPrivateProfileInt(u"VARIABLES", u"COUNT", 0, sample), 5);
    const LPCWSTR names[] = {u"Line1#Speed", u"Line1#Temper\u00e4ture", u"Line2#Tank#Level", u"Counter",
                             u"Kessel#Druck\u2013Soll \u20ac"};
    for (int i = 0; i < 5; ++i) EXPECT_EQ(ReadText(sample, u"VARIABLES", CString::Formatted(u"NAME_%d", i)), names[i]);
    ASSERT_EQ(VX_GetPrivateProfileInt(u"CONNECTIONS", u"COUNT", 0, sample), 2);
    EXPECT_EQ(ReadText(sample, u"CONNECTIONS", u"QUEUE_0"), u"telemetry");
    EXPECT_EQ(VX_GetPrivateProfileInt(u"CONNECTIONS", u"MODE_0", 9, sample), 0);
    EXPECT_EQ(VX_GetPrivateProfileInt(u"CONNECTIONS", u"FORMAT_0", 9, sample), 0);
    EXPECT_EQ(ReadText(sample, u"CONNECTIONS", u"QUEUE_1"), u"values");
    EXPECT_EQ(VX_GetPrivateProfileInt(u"CONNECTIONS", u"MODE_1", 9, sample), 1);
    EXPECT_EQ(VX_GetPrivateProfileInt(u"CONNECTIONS", u"FORMAT_1", 9, sample), 1);
}

TEST_F(ProfileTest, AnsiFileStaysAnsiWhileValuesFit) {
    const std::string original = ReadBytes(SamplePath("windows-settings-ansi.ini"));
    WriteBytes(file, original);
    RecordingSink sink;
    ASSERT_TRUE(VX_WritePrivateProfileString(u"VARIABLES", u"NAME_4", u"Kessel#Druck\u2013Soll \u20ac", path));
    ASSERT_TRUE(VX_WritePrivateProfileString(u"Variables", u"Name_2", u"Line2#Tank#Level", path));
    EXPECT_EQ(ReadBytes(file), original) << "an unchanged value leaves the file as it was";

    // New values that fit stay Windows-1252 with CR LF, byte for byte outside the changed lines.
    ASSERT_TRUE(VX_WritePrivateProfileString(u"VARIABLES", u"NAME_5", u"Kessel#F\u00fcllstand \u2030\u0178", path));
    ASSERT_TRUE(VX_WritePrivateProfileString(u"VARIABLES", u"NAME_0", u"Line1#\u0081\u00ff", path));
    std::string expected = original;
    expected.replace(expected.find("Line1#Speed"), 11, "Line1#\x81\xFF");
    const std::string name4 = "NAME_4=Kessel#Druck\x96Soll \x80\r\n";
    expected.insert(expected.find(name4) + name4.size(), "NAME_5=Kessel#F\xFCllstand \x89\x9F\r\n");
    EXPECT_EQ(ReadBytes(file), expected);
    EXPECT_EQ(ReadText(path, u"VARIABLES", u"NAME_5"), u"Kessel#F\u00fcllstand \u2030\u0178");
    EXPECT_TRUE(RecordingSink::Texts().empty());
}

TEST_F(ProfileTest, AValueBeyondTheCodePageTurnsTheFileIntoUtf16) {
    const std::string original = ReadBytes(SamplePath("windows-settings-ansi.ini"));
    WriteBytes(file, original);
    RecordingSink sink;
    {
        VX_CPrivateProfileSession session(path);  // as the module writes its settings
        ASSERT_TRUE(VX_WritePrivateProfileString(u"VARIABLES", u"NAME_5", u"Linie#\u6e29\u5ea6", path));
        ASSERT_TRUE(VX_WritePrivateProfileInt(u"VARIABLES", u"COUNT", 6, path));
        EXPECT_TRUE(RecordingSink::Texts().empty()) << "nothing is written before the commit";
    }
    ASSERT_TRUE(VX_WritePrivateProfileString(u"VARIABLES", u"NAME_6", u"\u2603", path));

    // The whole file in UTF-16LE with a mark: the old text as Windows-1252 read it, and the new lines.
    std::u16string text;
    for (const char c : original) {
        const auto byte = static_cast<unsigned char>(c);
        text += byte == 0xE4 ? u'\u00e4' : byte == 0x96 ? u'\u2013' : byte == 0x80 ? u'\u20ac' : char16_t(byte);
    }
    ASSERT_EQ(text.find(u'\u0080'), std::u16string::npos) << "the sample holds only these three non-ASCII bytes";
    text.replace(text.find(u"COUNT=5"), 7, u"COUNT=6");
    const std::u16string name4 = u"NAME_4=Kessel#Druck\u2013Soll \u20ac\r\n";
    text.insert(text.find(name4) + name4.size(), u"NAME_5=Linie#\u6e29\u5ea6\r\nNAME_6=\u2603\r\n");
    EXPECT_EQ(ReadBytes(file), "\xFF\xFE" + Utf16Le(text));
    EXPECT_EQ(ReadText(path, u"VARIABLES", u"NAME_1"), u"Line1#Temper\u00e4ture");
    EXPECT_EQ(ReadText(path, u"VARIABLES", u"NAME_4"), u"Kessel#Druck\u2013Soll \u20ac");
    EXPECT_EQ(ReadText(path, u"VARIABLES", u"NAME_5"), u"Linie#\u6e29\u5ea6");

    const auto records = RecordingSink::Texts();
    ASSERT_EQ(records.size(), 1u) << "one record for the change of encoding, none for later writes";
    EXPECT_NE(records[0].find(file.string() + " was rewritten as UTF-16LE"), std::string::npos) << records[0];
}

TEST_F(ProfileTest, AnUnclosedHeadingIsNoSection) {
    const std::string original = "[Azure]\r\nINTEGRITYPERIOD=7\r\n[broken\r\nPROXY_USER=bob\r\n[k=1\r\nPROXY_PWD=x\r\n";
    WriteBytes(file, original);
    EXPECT_EQ(ReadText(path, u"Azure", u"PROXY_USER"), u"bob");
    EXPECT_EQ(ReadText(path, u"Azure", u"PROXY_PWD"), u"x");
    EXPECT_EQ(ReadText(path, u"Azure", u"[k"), u"1") << "Windows reads such a line as a key";
    EXPECT_EQ(ReadText(path, u"broken", u"PROXY_USER"), u"<default>");
    ASSERT_TRUE(VX_WritePrivateProfileString(u"Azure", u"PROXY_USER", u"alice", path));
    ASSERT_TRUE(VX_WritePrivateProfileString(u"Azure", u"PROXY_DOMAIN", u"corp", path));
    EXPECT_EQ(ReadBytes(file),
              "[Azure]\r\nINTEGRITYPERIOD=7\r\n[broken\r\nPROXY_USER=alice\r\n[k=1\r\nPROXY_PWD=x\r\n"
              "PROXY_DOMAIN=corp\r\n");
}

TEST_F(ProfileTest, WriteKeepsEveryOtherLineByteForByte) {
    WriteBytes(file, "; header\r\n\r\n[Azure]\r\nPROXY_USER = alice   \r\n\xFF\xFE not UTF-8\r\n\r\n[Last]\r\nx=1");
    ASSERT_TRUE(VX_WritePrivateProfileString(u"AZURE", u"proxy_user", u"bob", path));
    ASSERT_TRUE(VX_WritePrivateProfileString(u"Azure", u"PROXY_DOMAIN", u"corp", path));
    ASSERT_TRUE(VX_WritePrivateProfileString(u"Last", u"y", u"2", path));
    ASSERT_TRUE(VX_WritePrivateProfileString(u"New", u"z", u"3", path));
    EXPECT_EQ(ReadBytes(file),
              "; header\r\n\r\n[Azure]\r\nPROXY_USER = bob\r\n\xFF\xFE not UTF-8\r\nPROXY_DOMAIN=corp\r\n\r\n"
              "[Last]\r\nx=1\r\ny=2\r\n\r\n[New]\r\nz=3\r\n");
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(dir.Path()), {}), 1);  // no temporary file left

    // Values that need quotes to read back unchanged; a new file is UTF-8 with LF.
    std::filesystem::remove(file);
    for (LPCWSTR value : {u"  leading", u"trailing\t", u"\"quoted\"", u"'single'", u"\"\"", u"a \"b\" c", u""}) {
        ASSERT_TRUE(VX_WritePrivateProfileString(u"s", u"k", value, path));
        EXPECT_EQ(ReadText(path, u"s", u"k"), value);
    }
    EXPECT_EQ(ReadBytes(file), "[s]\nk=\n");
}

TEST_F(ProfileTest, RefusesWhatIsNoLineOrNoFile) {
    WriteBytes(file, "[s]\nk=v\n");
    const LPCWSTR refused[][3] = {{u"s", u"k", u"two\nlines"}, {u"s", u"k", u"cr\rhere"}, {u"s", u"k=x", u"v"},
                                  {u"s", u";k", u"v"},         {u"s]x", u"k", u"v"},      {u" ", u"k", u"v"},
                                  {u"s", u"k", nullptr}};
    for (const auto& [section, key, value] : refused)
        EXPECT_FALSE(VX_WritePrivateProfileString(section, key, value, path)) << CString(section).ToUtf8();
    EXPECT_EQ(ReadBytes(file), "[s]\nk=v\n");

    // A directory or a FIFO reads as empty (without blocking) and is never written.
    const std::filesystem::path fifo = dir / "fifo.ini";
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    for (const auto& other : {std::filesystem::path(dir.Path()), fifo, dir / "missing" / "x.ini"}) {
        const CString otherPath = CString::FromUtf8(other.string());
        EXPECT_EQ(VX_GetPrivateProfileInt(u"s", u"k", 5, otherPath), 5);
        EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k", u"v", otherPath));
    }
    // A symbolic link stays a link; its target gets the change.
    const std::filesystem::path link = dir / "link.ini";
    std::filesystem::create_symlink(file, link);
    ASSERT_TRUE(VX_WritePrivateProfileString(u"s", u"k", u"new", CString::FromUtf8(link.string())));
    EXPECT_TRUE(std::filesystem::is_symlink(link));
    EXPECT_EQ(ReadBytes(file), "[s]\nk=new\n");
}

TEST_F(ProfileTest, SessionWritesOnceAtTheEnd) {
    WriteBytes(file, "[s]\nk=old\n");
    {
        VX_CPrivateProfileSession session(path);
        for (int i = 0; i < 50; ++i)
            ASSERT_TRUE(VX_WritePrivateProfileInt(u"s", CString::Formatted(u"K%d", i), i, path));
        EXPECT_EQ(ReadBytes(file), "[s]\nk=old\n");                     // nothing written yet
        EXPECT_EQ(VX_GetPrivateProfileInt(u"s", u"K49", 0, path), 49);  // but the session reads its writes
        ASSERT_TRUE(VX_WritePrivateProfileString(u"s", u"k", u"gone", path));
        session.Discard();
        ASSERT_TRUE(VX_WritePrivateProfileString(u"s", u"k", u"new", path));
    }
    EXPECT_EQ(ReadBytes(file), "[s]\nk=new\n");
}

TEST_F(ProfileTest, AFailedReplacementLeavesTheFileAsItWas) {
    const std::string original = "[s]\r\nk=old\r\n";
    WriteBytes(file, original);
    {
        VX_CPrivateProfileSession session(path);
        ASSERT_TRUE(VX_WritePrivateProfileString(u"s", u"k", u"new", path));
        ASSERT_TRUE(VX_WritePrivateProfileString(u"t", u"added", u"1", path));
        {
            FailingRename failing;
            EXPECT_FALSE(session.Commit());
        }
        EXPECT_EQ(ReadText(path, u"s", u"k"), u"old");  // the changes are gone from the session too
        EXPECT_TRUE(session.Commit());                  // nothing left to write
    }  // the session's end must not write what the failed commit did not
    EXPECT_EQ(ReadBytes(file), original);

    {
        FailingRename failing;
        EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k", u"new", path));
    }
    EXPECT_EQ(ReadBytes(file), original);
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(dir.Path()), {}), 1);  // no temporary file left
}

TEST_F(ProfileTest, ConcurrentWritersLoseNothing) {
    const auto writer = [&](LPCWSTR section) {
        for (int i = 0; i < 15; ++i) VX_WritePrivateProfileInt(section, CString::Formatted(u"K%d", i), i, path);
    };
    std::thread a(writer, u"A"), b(writer, u"B");
    a.join();
    b.join();
    for (int i = 0; i < 15; ++i) {
        EXPECT_EQ(VX_GetPrivateProfileInt(u"A", CString::Formatted(u"K%d", i), -1, path), i);
        EXPECT_EQ(VX_GetPrivateProfileInt(u"B", CString::Formatted(u"K%d", i), -1, path), i);
    }
}

TEST(IniDocument, EveryByteOfWindows1252) {
    std::string high;
    for (int byte = 0x80; byte <= 0xFF; ++byte) high += static_cast<char>(byte);
    const std::string bytes = "[s]\nv=" + high + "\n";
    VX_CIniDocument doc = VX_CIniDocument::Parse(bytes);
    ASSERT_EQ(doc.GetEncoding(), VX_CIniDocument::Encoding::Windows1252);
    const std::u16string value = doc.GetValue(u"s", u"v").value_or(u"");
    ASSERT_EQ(value.size(), 128u);
    const std::pair<int, char16_t> samples[] = {{0x80, u'\u20ac'}, {0x81, u'\u0081'}, {0x8D, u'\u008d'},
                                                {0x96, u'\u2013'}, {0x9F, u'\u0178'}, {0xA0, u'\u00a0'},
                                                {0xE4, u'\u00e4'}, {0xFF, u'\u00ff'}};
    for (const auto& [byte, character] : samples) EXPECT_EQ(value[byte - 0x80], character) << byte;
    // Every character maps back to its byte.
    ASSERT_TRUE(doc.SetValue(u"s", u"w", value));
    EXPECT_EQ(doc.Serialize(), bytes + "w=" + high + "\n");
    EXPECT_EQ(doc.GetEncoding(), VX_CIniDocument::Encoding::Windows1252);
    // Valid UTF-8 without a mark stays UTF-8.
    EXPECT_EQ(VX_CIniDocument::Parse("[s]\nv=\xC3\xA4\n").GetValue(u"s", u"v"), u"\u00e4");
}

TEST(IniDocument, OtherEncodingsAndCopies) {
    const std::string be("\xFE\xFF\0[\0s\0]\0\n\0k\0=\0v\0\n", 18);  // UTF-16BE with BOM
    VX_CIniDocument doc = VX_CIniDocument::Parse(be);
    EXPECT_EQ(doc.Serialize(), be);
    EXPECT_EQ(doc.GetValue(u"S", u"K"), u"v");
    ASSERT_TRUE(doc.SetValue(u"s", u"n", u"\u00e4"));
    EXPECT_EQ(doc.Serialize(), be + std::string("\0n\0=\0\xE4\0\n", 8));

    VX_CIniDocument le = VX_CIniDocument::Parse(Utf16Le("[s]\r\nk=v\r\n"));  // UTF-16LE without BOM
    EXPECT_EQ(le.GetEncoding(), VX_CIniDocument::Encoding::Utf16Le);
    VX_CIniDocument copy = le;  // a copy works on its own lines
    ASSERT_TRUE(copy.SetValue(u"s", u"k", u"w"));
    EXPECT_EQ(le.GetValue(u"s", u"k"), u"v");
    EXPECT_EQ(copy.GetValue(u"s", u"k"), u"w");
}

}  // namespace
