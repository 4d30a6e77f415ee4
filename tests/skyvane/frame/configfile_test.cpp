#include "frame/ConfigFile.h"

#include "CStringPrint.h"
#include "TempDir.h"

#include <gtest/gtest.h>

#include <vector>

namespace {

std::vector<CString> Names(const CAzureConfig& config) {
    std::vector<CString> names;
    for (const auto& [key, item] : config.m_mapVariables) {
        EXPECT_EQ(item->m_strName, key);
        names.push_back(key);
    }
    return names;
}

std::vector<const CConnection*> Connections(const CAzureConfig& config) {
    return std::vector<const CConnection*>(config.m_lstConnections.begin(), config.m_lstConnections.end());
}

class ConfigFileTest : public ::testing::Test {
protected:
    CAzureConfig Read(const std::string& content) {
        WriteBytes(file, content);
        CAzureConfig config;
        ReadConfig(path, config);
        return config;
    }

    TempDir dir;
    std::filesystem::path file = dir / "skyvane.ini";
    CString path = CString::FromUtf8(file.string());
};

TEST_F(ConfigFileTest, WindowsWrittenSample) {
    CAzureConfig config;
    ReadConfig(CString::FromUtf8(SamplePath("windows-settings-utf16le.ini").string()), config);
    EXPECT_EQ(config.m_nIntegrityPeriod, 10);
    EXPECT_TRUE(config.m_strProxyDomain.IsEmpty());
    const std::vector<CString> expected = {u"Counter", u"Line1#Speed", u"Line1#Temper\u00e4ture", u"Line2#Tank#Level"};
    EXPECT_EQ(Names(config), expected);
    const auto connections = Connections(config);
    ASSERT_EQ(connections.size(), 2u);  // CONN_2 lies beyond COUNT
    EXPECT_EQ(connections[0]->m_strQueue, u"telemetry");
    EXPECT_FALSE(connections[0]->m_bEventHub);
    EXPECT_EQ(connections[0]->m_nFormat, 0);
    EXPECT_EQ(connections[1]->m_strQueue, u"values");
    EXPECT_TRUE(connections[1]->m_bEventHub);
    EXPECT_EQ(connections[1]->m_nFormat, 1);
    EXPECT_TRUE(connections[1]->m_strConnection.View().ends_with(u";EntityPath=values"));
}

TEST_F(ConfigFileTest, DefaultsGapsDuplicatesAndNegativeCounts) {
    CAzureConfig config = Read(
        "[VARIABLES]\nCOUNT=3\nNAME_0=A#x\nNAME_2=B#y\n"
        "[CONNECTIONS]\nCOUNT=-2\nCONN_0=ignored\n");
    EXPECT_EQ(config.m_nIntegrityPeriod, 5);  // no section "Azure"
    EXPECT_TRUE(config.m_strProxyUser.IsEmpty());
    const std::vector<CString> withGap = {u"", u"A#x", u"B#y"};
    EXPECT_EQ(Names(config), withGap);
    EXPECT_TRUE(config.m_lstConnections.IsEmpty());

    config = Read("[VARIABLES]\nCOUNT=3\nNAME_0=A#x\nNAME_1=A#x\nNAME_2=a#X\n[Azure]\nPROXY_PWD=00AAFF\n");
    const std::vector<CString> distinct = {u"A#x", u"a#X"};
    EXPECT_EQ(Names(config), distinct);
    EXPECT_EQ(config.m_strProxyPassword, u"00AAFF");  // moved as stored, never deciphered

    config = Read("[VARIABLES]\nCOUNT=-1\nNAME_0=A\n");
    EXPECT_TRUE(config.m_mapVariables.IsEmpty());
}

TEST_F(ConfigFileTest, ReadingReplacesEverything) {
    CAzureConfig config = Read("[VARIABLES]\nCOUNT=1\nNAME_0=A\n[CONNECTIONS]\nCOUNT=1\nQUEUE_0=q\n[Azure]\nINTEGRITYPERIOD=9\n");
    ASSERT_EQ(config.m_mapVariables.GetCount(), 1);
    ReadConfig(CString::FromUtf8(dir.Path().string()), config);  // a directory: all defaults
    EXPECT_TRUE(config.m_mapVariables.IsEmpty());
    EXPECT_TRUE(config.m_lstConnections.IsEmpty());
    EXPECT_EQ(config.m_nIntegrityPeriod, 5);
}

TEST_F(ConfigFileTest, HugeCountStopsAtTheHighestKeyPresent) {
    CAzureConfig config = Read(
        "[VARIABLES]\nCOUNT=2000000000\nNAME_0=A\nNAME_5=B\nNAME_007=not an entry number\n"
        "[CONNECTIONS]\ncount=2000000000\nQUEUE_3=q\n");
    const std::vector<CString> names = {u"", u"A", u"B"};  // entries 0 to 5, four of them empty
    EXPECT_EQ(Names(config), names);
    const auto connections = Connections(config);
    ASSERT_EQ(connections.size(), 4u);
    EXPECT_EQ(connections[3]->m_strQueue, u"q");
    EXPECT_TRUE(connections[0]->m_strQueue.IsEmpty());

    config = Read("[VARIABLES]\nCOUNT=2000000000\n");
    EXPECT_TRUE(config.m_mapVariables.IsEmpty());
}

TEST_F(ConfigFileTest, ModeAndFormatAsReadAndWritten) {
    CAzureConfig config = Read("[CONNECTIONS]\nCOUNT=2\nMODE_0=7\nFORMAT_0=7\nMODE_1=0\nFORMAT_1=2\n");
    auto connections = Connections(config);
    ASSERT_EQ(connections.size(), 2u);
    EXPECT_TRUE(connections[0]->m_bEventHub);
    EXPECT_EQ(connections[0]->m_nFormat, 7);
    EXPECT_FALSE(connections[1]->m_bEventHub);
    EXPECT_EQ(connections[1]->m_nFormat, 2);

    ASSERT_TRUE(WriteConfig(path, config));
    const std::string written = ReadBytes(file);
    EXPECT_NE(written.find("MODE_0=1\n"), std::string::npos);
    EXPECT_NE(written.find("FORMAT_0=7\n"), std::string::npos);
}

TEST_F(ConfigFileTest, ShrinkingTheConnectionListLeavesOldEntries) {
    CAzureConfig config;
    for (LPCWSTR queue : {u"a", u"b", u"c"}) {
        auto* connection = new CConnection;
        connection->m_strConnection = CString(u"Endpoint=") + queue;
        connection->m_strQueue = queue;
        config.m_lstConnections.AddTail(connection);
    }
    ASSERT_TRUE(WriteConfig(path, config));
    delete config.m_lstConnections.RemoveHead();
    delete config.m_lstConnections.RemoveHead();
    ASSERT_TRUE(WriteConfig(path, config));

    EXPECT_EQ(ReadBytes(file),
              "[Azure]\nINTEGRITYPERIOD=5\nPROXY_DOMAIN=\nPROXY_USER=\nPROXY_PWD=\n\n"
              "[VARIABLES]\nCOUNT=0\n\n"
              "[CONNECTIONS]\nCONN_0=Endpoint=c\nQUEUE_0=c\nMODE_0=0\nFORMAT_0=0\n"
              "CONN_1=Endpoint=b\nQUEUE_1=b\nMODE_1=0\nFORMAT_1=0\n"
              "CONN_2=Endpoint=c\nQUEUE_2=c\nMODE_2=0\nFORMAT_2=0\nCOUNT=1\n");
    CAzureConfig back;
    ReadConfig(path, back);
    const auto connections = Connections(back);
    ASSERT_EQ(connections.size(), 1u);
    EXPECT_EQ(connections[0]->m_strQueue, u"c");
}

TEST_F(ConfigFileTest, RoundTripKeepsCommentsAndUnknownKeys) {
    const std::string original =
        "; written by hand\r\n"
        "[Azure]\r\n"
        "INTEGRITYPERIOD=15\r\n"
        "PROXY_DOMAIN=proxy.example\r\n"
        "PROXY_USER=alice\r\n"
        "PROXY_PWD=0123ABCD\r\n"
        "Unknown=kept\r\n"
        "\r\n"
        "; the exported variables\r\n"
        "[VARIABLES]\r\n"
        "COUNT=2\r\n"
        "NAME_0=Line1#Speed\r\n"
        "NAME_1=Line2#Tank#Level\r\n"
        "NAME_7=beyond COUNT\r\n"
        "\r\n"
        "[Extra]\r\n"
        "whatever = 1\r\n"
        "\r\n"
        "[CONNECTIONS]\r\n"
        "COUNT=1\r\n"
        "CONN_0=Endpoint=sb://ns/;SharedAccessKeyName=k;SharedAccessKey=abc=\r\n"
        "QUEUE_0=values\r\n"
        "MODE_0=1\r\n"
        "FORMAT_0=2\r\n";
    CAzureConfig config = Read(original);
    EXPECT_EQ(config.m_nIntegrityPeriod, 15);
    EXPECT_EQ(config.m_strProxyPassword, u"0123ABCD");
    EXPECT_EQ(Connections(config)[0]->m_strConnection, u"Endpoint=sb://ns/;SharedAccessKeyName=k;SharedAccessKey=abc=");
    ASSERT_TRUE(WriteConfig(path, config));
    EXPECT_EQ(ReadBytes(file), original);  // the same settings write the same bytes

    // A change touches only its own lines.
    config.m_nIntegrityPeriod = 20;
    ASSERT_TRUE(WriteConfig(path, config));
    std::string expected = original;
    expected.replace(expected.find("INTEGRITYPERIOD=15"), 18, "INTEGRITYPERIOD=20");
    EXPECT_EQ(ReadBytes(file), expected);
}

TEST_F(ConfigFileTest, WindowsSampleSurvivesAWrite) {
    std::filesystem::copy_file(SamplePath("windows-settings-utf16le.ini"), file);
    CAzureConfig config;
    ReadConfig(path, config);
    ASSERT_TRUE(WriteConfig(path, config));
    CAzureConfig back;
    ReadConfig(path, back);
    EXPECT_EQ(Names(back), Names(config));
    ASSERT_EQ(back.m_lstConnections.GetCount(), 2);
    EXPECT_EQ(back.m_lstConnections.GetTail()->m_strConnection, config.m_lstConnections.GetTail()->m_strConnection);
    const std::string bytes = ReadBytes(file);
    EXPECT_EQ(bytes.substr(0, 2), "\xFF\xFE");  // still UTF-16LE with its mark
    const std::u16string text(reinterpret_cast<const char16_t*>(bytes.data() + 2), (bytes.size() - 2) / 2);
    EXPECT_NE(text.find(u"; entries beyond COUNT stay in the file and are ignored\r\n"), std::u16string::npos);
    EXPECT_NE(text.find(u"CONN_2=Endpoint=sb://old-ns"), std::u16string::npos);
}

TEST_F(ConfigFileTest, AValueThatCannotBeStoredChangesNothing) {
    const std::string original = "[Azure]\nINTEGRITYPERIOD=5\n";
    WriteBytes(file, original);
    CAzureConfig config;
    config.m_nIntegrityPeriod = 60;
    auto* connection = new CConnection;
    connection->m_strConnection = u"Endpoint=x\n[Azure]\nINTEGRITYPERIOD=1";
    config.m_lstConnections.AddTail(connection);
    EXPECT_FALSE(WriteConfig(path, config));
    EXPECT_EQ(ReadBytes(file), original);
    EXPECT_FALSE(WriteConfig(CString::FromUtf8((dir / "no" / "such.ini").string()), CAzureConfig()));
}

}  // namespace
