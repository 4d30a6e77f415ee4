#include "frame/ConfigFile.h"

#include "CStringPrint.h"
#include "samples.h"

#include <gtest/gtest.h>

#include <vector>

namespace {

std::vector<CString> Names(const CAzureConfig& config) {
    std::vector<CString> names;
    for (const auto& [key, item] : config.m_mapVariables) names.push_back(item->m_strName);
    return names;
}

std::vector<const CConnection*> Connections(const CAzureConfig& config) {
    return {config.m_lstConnections.begin(), config.m_lstConnections.end()};
}

class ConfigFileTest : public ::testing::Test {
protected:
    CAzureConfig Read(const std::string& content) {
        WriteBytes(file, content);
        CAzureConfig config;
        ReadConfig(path, config);
        return config;
    }

    TempFolder dir;
    std::filesystem::path file = dir / "skyvane.ini";
    CString path = CString::FromUtf8(file.string());
};

TEST_F(ConfigFileTest, WindowsWrittenSampleReadsAndSurvivesAWrite) {
    std::filesystem::copy_file(SamplePath("windows-settings-utf16le.ini"), file);
    CAzureConfig config;
    ReadConfig(path, config);
    EXPECT_EQ(config.m_nIntegrityPeriod, 10);
    const std::vector<CString> names = {u"Counter", u"Line1#Speed", u"Line1#Temper\u00e4ture", u"Line2#Tank#Level"};
    EXPECT_EQ(Names(config), names);
    auto connections = Connections(config);
    ASSERT_EQ(connections.size(), 2u);  // CONN_2 lies beyond COUNT
    EXPECT_EQ(connections[0]->m_strQueue, u"telemetry");
    EXPECT_FALSE(connections[0]->m_bEventHub);
    EXPECT_EQ(connections[0]->m_nFormat, 0);
    EXPECT_EQ(connections[1]->m_strQueue, u"values");
    EXPECT_TRUE(connections[1]->m_bEventHub);
    EXPECT_EQ(connections[1]->m_nFormat, 1);

    ASSERT_TRUE(WriteConfig(path, config));
    CAzureConfig back;
    ReadConfig(path, back);
    EXPECT_EQ(Names(back), names);
    EXPECT_EQ(back.m_lstConnections.GetTail()->m_strConnection, connections[1]->m_strConnection);
    const std::string bytes = ReadBytes(file);
    const std::u16string text(reinterpret_cast<const char16_t*>(bytes.data()), bytes.size() / 2);
    EXPECT_EQ(text[0], 0xFEFF);  // still UTF-16LE with its mark
    EXPECT_NE(text.find(u"; entries beyond COUNT stay in the file and are ignored\r\nCONN_2="), std::u16string::npos);
}

TEST_F(ConfigFileTest, DefaultsGapsDuplicatesAndCounts) {
    CAzureConfig config = Read("[VARIABLES]\nCOUNT=3\nNAME_0=A#x\nNAME_2=B#y\n[CONNECTIONS]\nCOUNT=-2\nCONN_0=x\n");
    EXPECT_EQ(config.m_nIntegrityPeriod, 5);  // no section "Azure"
    EXPECT_TRUE(config.m_strProxyUser.IsEmpty());
    EXPECT_EQ(Names(config), (std::vector<CString>{u"", u"A#x", u"B#y"}));  // the gap is an empty name
    EXPECT_TRUE(config.m_lstConnections.IsEmpty());                         // negative COUNT

    config = Read("[VARIABLES]\nCOUNT=3\nNAME_0=A#x\nNAME_1=A#x\nNAME_2=a#X\n[Azure]\nPROXY_PWD=00AAFF\n");
    EXPECT_EQ(Names(config), (std::vector<CString>{u"A#x", u"a#X"}));
    EXPECT_EQ(config.m_strProxyPassword, u"00AAFF");  // moved as stored, never deciphered

    // A COUNT of two billion reads up to the highest numbered key present, gaps included.
    config = Read(
        "[VARIABLES]\nCOUNT=2000000000\nNAME_0=A\nNAME_5=B\nNAME_007=no entry number\n"
        "[CONNECTIONS]\ncount=2000000000\nQUEUE_3=q\n");
    EXPECT_EQ(Names(config), (std::vector<CString>{u"", u"A", u"B"}));
    ASSERT_EQ(config.m_lstConnections.GetCount(), 4);
    EXPECT_EQ(config.m_lstConnections.GetTail()->m_strQueue, u"q");

    // Reading replaces everything; a path that is no file gives the defaults.
    ReadConfig(CString::FromUtf8(dir.Path()), config);
    EXPECT_TRUE(config.m_mapVariables.IsEmpty());
    EXPECT_TRUE(config.m_lstConnections.IsEmpty());
}

TEST_F(ConfigFileTest, ModeFormatAndAShrinkingConnectionList) {
    CAzureConfig config = Read("[CONNECTIONS]\nCOUNT=3\nMODE_0=7\nFORMAT_0=7\nQUEUE_1=b\nQUEUE_2=c\n");
    ASSERT_EQ(config.m_lstConnections.GetCount(), 3);
    EXPECT_TRUE(config.m_lstConnections.GetHead()->m_bEventHub);
    EXPECT_EQ(config.m_lstConnections.GetHead()->m_nFormat, 7);
    delete config.m_lstConnections.RemoveHead();
    delete config.m_lstConnections.RemoveHead();
    config.m_lstConnections.GetHead()->m_bEventHub = true;
    config.m_lstConnections.GetHead()->m_nFormat = 7;
    ASSERT_TRUE(WriteConfig(path, config));
    EXPECT_EQ(ReadBytes(file),
              "[CONNECTIONS]\nCOUNT=1\nMODE_0=1\nFORMAT_0=7\nQUEUE_1=b\nQUEUE_2=c\nCONN_0=\nQUEUE_0=c\n\n"
              "[Azure]\nINTEGRITYPERIOD=5\nPROXY_DOMAIN=\nPROXY_USER=\nPROXY_PWD=\n\n[VARIABLES]\nCOUNT=0\n");
    EXPECT_EQ(Read(ReadBytes(file)).m_lstConnections.GetCount(), 1);
}

TEST_F(ConfigFileTest, RoundTripKeepsCommentsAndUnknownKeys) {
    const std::string original =
        "; written by hand\r\n[Azure]\r\nINTEGRITYPERIOD=15\r\nPROXY_DOMAIN=proxy.example\r\nPROXY_USER=alice\r\n"
        "PROXY_PWD=0123ABCD\r\nUnknown=kept\r\n\r\n; the exported variables\r\n[VARIABLES]\r\nCOUNT=2\r\n"
        "NAME_0=Line1#Speed\r\nNAME_1=Line2#Tank#Level\r\nNAME_7=beyond COUNT\r\n\r\n[Extra]\r\nwhatever = 1\r\n\r\n"
        "[CONNECTIONS]\r\nCOUNT=1\r\nCONN_0=Endpoint=sb://ns/;SharedAccessKey=abc=\r\nQUEUE_0=values\r\nMODE_0=1\r\n"
        "FORMAT_0=2\r\n";
    CAzureConfig config = Read(original);
    EXPECT_EQ(Connections(config)[0]->m_strConnection, u"Endpoint=sb://ns/;SharedAccessKey=abc=");
    ASSERT_TRUE(WriteConfig(path, config));
    EXPECT_EQ(ReadBytes(file), original);  // the same settings write the same bytes

    config.m_nIntegrityPeriod = 20;
    ASSERT_TRUE(WriteConfig(path, config));
    std::string expected = original;
    expected.replace(expected.find("INTEGRITYPERIOD=15"), 18, "INTEGRITYPERIOD=20");
    EXPECT_EQ(ReadBytes(file), expected);  // a change touches only its own line

    // A value that cannot be stored fails the whole write and changes nothing.
    config.m_lstConnections.GetHead()->m_strConnection = u"Endpoint=x\n[Azure]\nINTEGRITYPERIOD=1";
    config.m_nIntegrityPeriod = 60;
    EXPECT_FALSE(WriteConfig(path, config));
    EXPECT_EQ(ReadBytes(file), expected);
}

}  // namespace
