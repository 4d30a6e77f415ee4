#include "vxhelper/IniDocument.h"
#include "vxhelper/profile.h"

#include "CStringPrint.h"
#include "samples.h"

#include <gtest/gtest.h>

#include <dlfcn.h>
#include <sys/stat.h>

#include <atomic>
#include <cerrno>
#include <thread>

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
                                  {u"s", u";k", u"v"},          {u"s]x", u"k", u"v"},     {u" ", u"k", u"v"},
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
        for (int i = 0; i < 50; ++i) ASSERT_TRUE(VX_WritePrivateProfileInt(u"s", CString::Formatted(u"K%d", i), i, path));
        EXPECT_EQ(ReadBytes(file), "[s]\nk=old\n");  // nothing written yet
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
        EXPECT_TRUE(session.Commit());                   // nothing left to write
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
