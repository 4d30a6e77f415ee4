#include "cloud/AzureConfig.h"

#include "vxhelper/variant.h"

#include "CStringPrint.h"

#include <gtest/gtest.h>

namespace {

// An item that counts how many of its kind have been deleted.
struct CountedItem : CVarItem {
    static inline int deleted = 0;
    ~CountedItem() override { ++deleted; }
};

CConnection* MakeConnection(LPCWSTR queue, bool eventHub, int format) {
    auto* connection = new CConnection;
    connection->m_strConnection = CString(u"Endpoint=sb://ns/;EntityPath=") + queue;
    connection->m_strQueue = queue;
    connection->m_bEventHub = eventHub;
    connection->m_nFormat = format;
    return connection;
}

void Fill(CAzureConfig& config) {
    for (LPCWSTR key : {u"Line1#Speed", u"line1#speed", u"Counter"}) {
        auto* item = new CVarItem;
        item->m_strName = key;
        config.m_mapVariables.SetAt(key, item);
    }
    config.m_lstConnections.AddTail(MakeConnection(u"telemetry", false, 0));
    config.m_lstConnections.AddTail(MakeConnection(u"values", true, 7));
    config.m_nIntegrityPeriod = 30;
    config.m_strProxyDomain = u"proxy.example";
    config.m_strProxyUser = u"user";
    config.m_strProxyPassword = u"A1B2";
}

TEST(AzureConfig, DefaultsAndKeysThatDifferInCase) {
    CAzureConfig config;
    EXPECT_EQ(config.m_nIntegrityPeriod, 5);
    EXPECT_TRUE(config.m_strProxyDomain.IsEmpty());
    EXPECT_TRUE(config.m_strProxyUser.IsEmpty());
    EXPECT_TRUE(config.m_strProxyPassword.IsEmpty());
    EXPECT_TRUE(config.m_mapVariables.IsEmpty());
    EXPECT_TRUE(config.m_lstConnections.IsEmpty());
    Fill(config);
    EXPECT_EQ(config.m_mapVariables.GetCount(), 3);  // Line1#Speed and line1#speed are two
}

TEST(AzureConfig, CopiesShareNothing) {
    CAzureConfig source;
    Fill(source);
    CVarItem* speed = nullptr;
    ASSERT_TRUE(source.m_mapVariables.Lookup(u"Line1#Speed", speed));
    VX_CVariant value(3.0);
    const DATE time = 45382.5;
    ASSERT_TRUE(speed->m_pRtData->Update(&value, 0, 0, &time));

    CAzureConfig copy(source);
    ASSERT_EQ(copy.m_mapVariables.GetCount(), 3);
    for (const auto& [key, item] : copy.m_mapVariables) {
        CVarItem* original = nullptr;
        ASSERT_TRUE(source.m_mapVariables.Lookup(key, original));
        EXPECT_NE(item, original);
        EXPECT_NE(item->m_pRtData, original->m_pRtData);
        EXPECT_EQ(item->m_strName, key);
    }
    CVarItem* copiedSpeed = nullptr;
    ASSERT_TRUE(copy.m_mapVariables.Lookup(u"Line1#Speed", copiedSpeed));
    EXPECT_EQ(copiedSpeed->m_pRtData->m_dValue, 3.0);  // runtime data copied too

    ASSERT_EQ(copy.m_lstConnections.GetCount(), 2);
    const CConnection* hub = copy.m_lstConnections.GetTail();
    EXPECT_NE(hub, source.m_lstConnections.GetTail());
    EXPECT_TRUE(hub->m_bEventHub);
    EXPECT_EQ(hub->m_nFormat, 7);
    EXPECT_EQ(hub->m_strQueue, u"values");
    EXPECT_EQ(copy.m_lstConnections.GetHead()->m_strQueue, u"telemetry");  // list order kept
    EXPECT_EQ(copy.m_nIntegrityPeriod, 30);
    EXPECT_EQ(copy.m_strProxyPassword, u"A1B2");

    // Editing and dropping the copy leaves the source as it was.
    copiedSpeed->m_strName = u"changed";
    copy.m_mapVariables.RemoveKey(u"Counter");
    copy.m_lstConnections.GetHead()->m_strQueue = u"other";
    copy = CAzureConfig();
    EXPECT_EQ(source.m_mapVariables.GetCount(), 3);
    EXPECT_EQ(speed->m_strName, u"Line1#Speed");
    EXPECT_EQ(source.m_lstConnections.GetHead()->m_strQueue, u"telemetry");
}

TEST(AzureConfig, AssignmentReplacesAndDeletes) {
    CAzureConfig config;
    Fill(config);
    CVarItem* before = nullptr;
    ASSERT_TRUE(config.m_mapVariables.Lookup(u"Counter", before));
    config = config;  // self-assignment: the very same items stay
    CVarItem* after = nullptr;
    ASSERT_TRUE(config.m_mapVariables.Lookup(u"Counter", after));
    EXPECT_EQ(before, after);
    EXPECT_EQ(config.m_lstConnections.GetCount(), 2);

    CountedItem::deleted = 0;
    config.m_mapVariables.SetAt(u"Counted", new CountedItem);
    config = CAzureConfig();  // empty source: map and list emptied, items deleted
    EXPECT_EQ(CountedItem::deleted, 1);
    EXPECT_TRUE(config.m_mapVariables.IsEmpty());
    EXPECT_TRUE(config.m_lstConnections.IsEmpty());
    EXPECT_EQ(config.m_nIntegrityPeriod, 5);
    EXPECT_TRUE(config.m_strProxyUser.IsEmpty());
}

}  // namespace
