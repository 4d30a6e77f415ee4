#include "vxhelper/IniDocument.h"
#include "vxhelper/profile.h"

#include "CStringPrint.h"
#include "TempDir.h"

#include <gtest/gtest.h>

#include <sys/stat.h>

#include <thread>

namespace {

CString PathText(const std::filesystem::path& path) { return CString::FromUtf8(path.string()); }

CString ReadText(const CString& file, LPCWSTR section, LPCWSTR key, LPCWSTR fallback = u"<default>") {
    char16_t buffer[1024];
    VX_GetPrivateProfileString(section, key, fallback, buffer, 1024, file);
    return CString(buffer);
}

// Encodes ASCII text as UTF-16LE bytes.
std::string Utf16Le(std::string_view ascii) {
    std::string bytes;
    for (const char c : ascii) {
        bytes += c;
        bytes += '\0';
    }
    return bytes;
}

class ProfileTest : public ::testing::Test {
protected:
    TempDir dir;
    std::filesystem::path file = dir / "settings.ini";
    CString path = PathText(file);
};

TEST_F(ProfileTest, ReadsLikeWin32) {
    WriteBytes(file,
               "orphan=before any section\n"
               "[Azure]\n"
               "  IntegrityPeriod  =  10  \n"
               "no equals sign here\n"
               "; comment=not a key\n"
               "Quoted=\"  padded  \"\n"
               "Single='x'\n"
               "Half=\"open\n"
               "Equals=a=b=c\n"
               "dup=first\n"
               "DUP=second\n"
               "[azure]\n"
               "Late=in a second section of the same name\n"
               "[ Other ]\n"
               "dup=other\n");
    EXPECT_EQ(VX_GetPrivateProfileInt(u"AZURE", u"integrityperiod", 5, path), 10);
    EXPECT_EQ(ReadText(path, u"Azure", u"Quoted"), u"  padded  ");
    EXPECT_EQ(ReadText(path, u"Azure", u"Single"), u"x");
    EXPECT_EQ(ReadText(path, u"Azure", u"Half"), u"\"open");
    EXPECT_EQ(ReadText(path, u"Azure", u"Equals"), u"a=b=c");
    EXPECT_EQ(ReadText(path, u"Azure", u"Dup"), u"first");
    EXPECT_EQ(ReadText(path, u"other", u"dup"), u"other");
    // The first section of a name wins; keys of a later one are not seen.
    EXPECT_EQ(ReadText(path, u"Azure", u"Late"), u"<default>");
    // Keys without a section, comments and lines without "=" are no keys.
    EXPECT_EQ(ReadText(path, u"Azure", u"orphan"), u"<default>");
    EXPECT_EQ(ReadText(path, u"Azure", u"; comment"), u"<default>");
    EXPECT_EQ(ReadText(path, u"Azure", u"no equals sign here"), u"<default>");
    EXPECT_EQ(ReadText(path, u"Missing", u"dup"), u"<default>");
    EXPECT_EQ(ReadText(PathText(dir / "absent.ini"), u"Azure", u"dup"), u"<default>");

    CStringArray keys;
    ASSERT_TRUE(VX_GetPrivateProfileKeyNames(u"AZURE", keys, path));
    ASSERT_EQ(keys.GetSize(), 6);
    EXPECT_EQ(keys[0], u"IntegrityPeriod");
    EXPECT_EQ(keys[5], u"dup");
    EXPECT_FALSE(VX_GetPrivateProfileKeyNames(u"Missing", keys, path));
    EXPECT_EQ(keys.GetSize(), 0);
}

TEST_F(ProfileTest, IntegersAreSignedDecimalOrTheDefault) {
    WriteBytes(file,
               "[n]\nplain=42\nneg=-7\nplus=+3\nunit=10 s\nword=abc\nempty=\nhex=0x10\n"
               "min=-2147483648\nmax=2147483647\nover=2147483648\nhuge=99999999999999999999\nsign=-\n");
    const auto get = [&](LPCWSTR key) { return VX_GetPrivateProfileInt(u"n", key, 99, path); };
    EXPECT_EQ(get(u"plain"), 42);
    EXPECT_EQ(get(u"neg"), -7);
    EXPECT_EQ(get(u"plus"), 3);
    EXPECT_EQ(get(u"unit"), 10);
    EXPECT_EQ(get(u"hex"), 0);  // the digits before "x"
    EXPECT_EQ(get(u"min"), INT_MIN);
    EXPECT_EQ(get(u"max"), INT_MAX);
    for (LPCWSTR key : {u"word", u"empty", u"over", u"huge", u"sign", u"missing"}) EXPECT_EQ(get(key), 99) << CString(key).ToUtf8();
}

TEST_F(ProfileTest, TextIsCutToTheBuffer) {
    WriteBytes(file, "[s]\nk=abcdef\npair=ab\xF0\x9F\x98\x80\n");  // U+1F600 is a surrogate pair
    char16_t buffer[8] = {u'#', u'#', u'#', u'#', u'#', u'#', u'#', u'#'};
    EXPECT_EQ(VX_GetPrivateProfileString(u"s", u"k", u"", buffer, 4, path), 3u);
    EXPECT_EQ(std::u16string(buffer), u"abc");
    EXPECT_EQ(VX_GetPrivateProfileString(u"s", u"pair", u"", buffer, 4, path), 2u);  // not half a pair
    EXPECT_EQ(std::u16string(buffer), u"ab");
    EXPECT_EQ(VX_GetPrivateProfileString(u"s", u"k", u"", buffer, 0, path), 0u);
    EXPECT_EQ(VX_GetPrivateProfileString(u"s", u"none", nullptr, buffer, 8, path), 0u);
    EXPECT_EQ(buffer[0], 0);
}

TEST_F(ProfileTest, WindowsSampleReadsAndKeepsItsFormOnWrite) {
    const std::filesystem::path sample = SamplePath("windows-settings-utf16le.ini");
    const CString samplePath = PathText(sample);
    EXPECT_EQ(VX_GetPrivateProfileInt(u"Azure", u"INTEGRITYPERIOD", 5, samplePath), 10);
    EXPECT_EQ(VX_GetPrivateProfileInt(u"VARIABLES", u"COUNT", 0, samplePath), 4);
    EXPECT_EQ(ReadText(samplePath, u"VARIABLES", u"NAME_1"), u"Line1#Temper\u00e4ture");
    EXPECT_EQ(ReadText(samplePath, u"VARIABLES", u"NAME_2"), u"Line2#Tank#Level");
    EXPECT_EQ(ReadText(samplePath, u"CONNECTIONS", u"QUEUE_1"), u"values");

    const std::string original = ReadBytes(sample);
    std::filesystem::copy_file(sample, file);
    std::filesystem::permissions(file, std::filesystem::perms::owner_read | std::filesystem::perms::owner_write);
    ASSERT_TRUE(VX_WritePrivateProfileString(u"variables", u"name_2", u"Line3#Flow", path));
    ASSERT_TRUE(VX_WritePrivateProfileInt(u"Azure", u"NEW_KEY", 7, path));
    const std::string written = ReadBytes(file);
    // The key line keeps its spelling and blanks; only its value changed.
    std::string expected = original;
    const std::string oldLine = Utf16Le("Name_2 = Line2#Tank#Level\r\n");
    expected.replace(expected.find(oldLine), oldLine.size(), Utf16Le("Name_2 = Line3#Flow\r\n"));
    // The new key goes after the last non-blank line of its section, with CR LF.
    const std::string afterPwd = Utf16Le("PROXY_PWD=\r\n");
    expected.insert(expected.find(afterPwd) + afterPwd.size(), Utf16Le("NEW_KEY=7\r\n"));
    EXPECT_EQ(written, expected);
    EXPECT_EQ(ReadText(path, u"Variables", u"NAME_2"), u"Line3#Flow");
    struct stat st {};
    ASSERT_EQ(stat(file.c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u);  // permissions survive the replacement
}

TEST_F(ProfileTest, WriteKeepsEveryOtherLineByteForByte) {
    const std::string before =
        "; header comment\r\n"
        "\r\n"
        "[Azure]\r\n"
        "PROXY_USER = alice   \r\n"
        "\xFF\xFE garbage that is not UTF-8\r\n"
        "\r\n"
        "[Unknown]\r\n"
        "keep=me\r\n"
        "\r\n"
        "[Last]\r\n"
        "x=1";  // no line end at the end of the file
    WriteBytes(file, before);
    ASSERT_TRUE(VX_WritePrivateProfileString(u"AZURE", u"proxy_user", u"bob", path));
    ASSERT_TRUE(VX_WritePrivateProfileString(u"Azure", u"PROXY_DOMAIN", u"corp", path));
    ASSERT_TRUE(VX_WritePrivateProfileString(u"Last", u"y", u"2", path));
    ASSERT_TRUE(VX_WritePrivateProfileString(u"New", u"z", u"3", path));
    EXPECT_EQ(ReadBytes(file),
              "; header comment\r\n"
              "\r\n"
              "[Azure]\r\n"
              "PROXY_USER = bob\r\n"
              "\xFF\xFE garbage that is not UTF-8\r\n"
              "PROXY_DOMAIN=corp\r\n"
              "\r\n"
              "[Unknown]\r\n"
              "keep=me\r\n"
              "\r\n"
              "[Last]\r\n"
              "x=1\r\n"
              "y=2\r\n"
              "\r\n"
              "[New]\r\n"
              "z=3\r\n");
    // Nothing is left beside the file.
    int entries = 0;
    for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator(dir.Path())) ++entries;
    EXPECT_EQ(entries, 1);
}

TEST_F(ProfileTest, NewFileAndValuesThatNeedQuotesRoundTrip) {
    for (LPCWSTR value : {u"  leading", u"trailing\t", u"\"quoted\"", u"'single'", u"\"\"", u"plain \"inner\" text", u""}) {
        ASSERT_TRUE(VX_WritePrivateProfileString(u"s", u"k", value, path));
        EXPECT_EQ(ReadText(path, u"s", u"k"), value);
    }
    EXPECT_EQ(ReadBytes(file), "[s]\nk=\n");  // a new file: UTF-8, LF
}

TEST_F(ProfileTest, RefusesWhatCannotBeALine) {
    WriteBytes(file, "[s]\nk=v\n");
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k", u"two\nlines", path));
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k", u"carriage\rreturn", path));
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k=x", u"v", path));
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u";k", u"v", path));
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"[k", u"v", path));
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s]x", u"k", u"v", path));
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s\n[t", u"k", u"v", path));
    EXPECT_FALSE(VX_WritePrivateProfileString(u" ", u"k", u"v", path));
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k", nullptr, path));
    EXPECT_FALSE(VX_WritePrivateProfileString(nullptr, u"k", u"v", path));
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k", u"v", nullptr));
    EXPECT_EQ(ReadBytes(file), "[s]\nk=v\n");
}

TEST_F(ProfileTest, PathsThatAreNoRegularFile) {
    // A directory reads as empty and is never written.
    const CString dirPath = PathText(dir.Path());
    EXPECT_EQ(VX_GetPrivateProfileInt(u"s", u"k", 5, dirPath), 5);
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k", u"v", dirPath));
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k", u"v", PathText(dir / "missing" / "x.ini")));
    // A FIFO must not block the reader.
    const std::filesystem::path fifo = dir / "fifo.ini";
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    EXPECT_EQ(VX_GetPrivateProfileInt(u"s", u"k", 5, PathText(fifo)), 5);
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k", u"v", PathText(fifo)));

    // A symbolic link stays a link; its target gets the change.
    WriteBytes(file, "[s]\nk=old\n");
    const std::filesystem::path link = dir / "link.ini";
    std::filesystem::create_symlink(file, link);
    ASSERT_TRUE(VX_WritePrivateProfileString(u"s", u"k", u"new", PathText(link)));
    EXPECT_TRUE(std::filesystem::is_symlink(link));
    EXPECT_EQ(ReadBytes(file), "[s]\nk=new\n");
}

TEST_F(ProfileTest, SessionWritesOnceAtTheEnd) {
    WriteBytes(file, "[s]\nk=old\n");
    {
        VX_CPrivateProfileSession session(path);
        for (int i = 0; i < 50; ++i) ASSERT_TRUE(VX_WritePrivateProfileInt(u"s", CString::Formatted(u"K%d", i), i, path));
        ASSERT_TRUE(VX_WritePrivateProfileString(u"s", u"k", u"new", path));
        EXPECT_EQ(ReadBytes(file), "[s]\nk=old\n");  // nothing written yet
        EXPECT_EQ(ReadText(path, u"s", u"k"), u"new");  // but the session reads its own writes
        EXPECT_EQ(VX_GetPrivateProfileInt(u"s", u"K49", 0, path), 49);
    }
    EXPECT_EQ(ReadText(path, u"s", u"k"), u"new");
    EXPECT_EQ(VX_GetPrivateProfileInt(u"s", u"K49", 0, path), 49);

    // A session on a path that cannot be written reports the failure on Commit.
    const CString dirPath = PathText(dir.Path());
    VX_CPrivateProfileSession bad(dirPath);
    EXPECT_FALSE(VX_WritePrivateProfileString(u"s", u"k", u"v", dirPath));
    EXPECT_TRUE(bad.Commit());  // nothing pending
}

TEST_F(ProfileTest, ConcurrentWritersLoseNothing) {
    const auto writer = [&](const char16_t* section) {
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

TEST(IniDocument, EncodingsAndRoundTrip) {
    // Parsing and serialising unchanged gives back every byte, whatever they are.
    for (const std::string& bytes : {std::string(""), std::string("\n\n"), std::string("\xEF\xBB\xBF[a]\r\nk=v"),
                                    std::string("\xFF\xFE[\0a\0]\0\r\0", 9), std::string("[a]\nk=\x80\x81\n"),
                                    std::string("\0\0\0[", 4)}) {
        EXPECT_EQ(VX_CIniDocument::Parse(bytes).Serialize(), bytes);
    }
    // UTF-16BE with BOM and UTF-16LE without one.
    const std::string be("\xFE\xFF\0[\0s\0]\0\n\0k\0=\0v\0\n", 18);
    VX_CIniDocument doc = VX_CIniDocument::Parse(be);
    EXPECT_EQ(doc.GetEncoding(), VX_CIniDocument::Encoding::Utf16Be);
    EXPECT_EQ(doc.GetValue(u"S", u"K"), u"v");
    ASSERT_TRUE(doc.SetValue(u"s", u"n", u"\u00e4"));
    EXPECT_EQ(doc.Serialize(), be + std::string("\0n\0=\0\xE4\0\n", 8));

    VX_CIniDocument le = VX_CIniDocument::Parse(Utf16Le("[s]\r\nk=v\r\n"));
    EXPECT_EQ(le.GetEncoding(), VX_CIniDocument::Encoding::Utf16Le);
    EXPECT_EQ(le.GetValue(u"s", u"k"), u"v");
    VX_CIniDocument copy = le;  // copies keep working on their own lines
    ASSERT_TRUE(copy.SetValue(u"s", u"k", u"w"));
    EXPECT_EQ(le.GetValue(u"s", u"k"), u"v");
    EXPECT_EQ(copy.GetValue(u"s", u"k"), u"w");
}

}  // namespace
