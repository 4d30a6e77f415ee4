#include "cloud/AzureConfig.h"

#include "CStringPrint.h"

#include <gtest/gtest.h>

namespace {

// An item that counts how many of its kind have been deleted.
struct CountedItem : CVarItem {
    static inline int deleted = 0;
    ~CountedItem() override { ++deleted; }
};

void Fill(CAzureConfig& config) {
    for (LPCWSTR key : {u"Line1#Speed", u"line1#speed", u"Counter"}) {
        auto* item = new CVarItem;
        item->m_strName = key;
        config.m_mapVariables.SetAt(key, item);
    }
    for (LPCWSTR queue : {u"telemetry", u"values"}) {
        auto* connection = new CConnection;
        connection->m_strQueue = queue;
        config.m_lstConnections.AddTail(connection);
    }
    config.m_nIntegrityPeriod = 30;
    config.m_strProxyDomain = u"proxy:3128";
    config.m_strProxyUser = u"CORP\\user";
    config.m_strProxyPassword = u"A1B2";
}

TEST(AzureConfig, CopiesShareNothing) {
    CAzureConfig source;
    Fill(source);
    EXPECT_EQ(source.m_mapVariables.GetCount(), 3);  // keys differing in case are two entries

    CAzureConfig copy(source);
    ASSERT_EQ(copy.m_mapVariables.GetCount(), 3);
    for (const auto& [key, item] : copy.m_mapVariables) {
        CVarItem* original = nullptr;
        ASSERT_TRUE(source.m_mapVariables.Lookup(key, original));
        EXPECT_NE(item, original);
        EXPECT_NE(item->m_pRtData, original->m_pRtData);
        EXPECT_EQ(item->m_strName, key);
    }
    ASSERT_EQ(copy.m_lstConnections.GetCount(), 2);
    EXPECT_NE(copy.m_lstConnections.GetHead(), source.m_lstConnections.GetHead());
    EXPECT_EQ(copy.m_lstConnections.GetHead()->m_strQueue, u"telemetry");  // list order kept
    EXPECT_EQ(copy.m_nIntegrityPeriod, 30);
    EXPECT_EQ(copy.m_strProxyDomain, u"proxy:3128");
    EXPECT_EQ(copy.m_strProxyUser, u"CORP\\user");
    EXPECT_EQ(copy.m_strProxyPassword, u"A1B2");

    // Editing and dropping the copy leaves the source as it was.
    copy.m_lstConnections.GetHead()->m_strQueue = u"other";
    copy.m_mapVariables.RemoveKey(u"Counter");
    copy = CAzureConfig();
    EXPECT_EQ(source.m_mapVariables.GetCount(), 3);
    EXPECT_EQ(source.m_lstConnections.GetHead()->m_strQueue, u"telemetry");
}

TEST(AzureConfig, AssignmentReplacesAndDeletes) {
    CAzureConfig config;
    Fill(config);
    CVarItem *before = nullptr, *after = nullptr;
    ASSERT_TRUE(config.m_mapVariables.Lookup(u"Counter", before));
    config = config;  // self-assignment: the very same items stay
    ASSERT_TRUE(config.m_mapVariables.Lookup(u"Counter", after));
    EXPECT_EQ(before, after);
    EXPECT_EQ(config.m_lstConnections.GetCount(), 2);

    CountedItem::deleted = 0;
    config.m_mapVariables.SetAt(u"Counted", new CountedItem);
    config = CAzureConfig();  // an empty source empties map and list and deletes their items
    EXPECT_EQ(CountedItem::deleted, 1);
    EXPECT_TRUE(config.m_mapVariables.IsEmpty());
    EXPECT_TRUE(config.m_lstConnections.IsEmpty());
    EXPECT_EQ(config.m_nIntegrityPeriod, 5);
}

}  // namespace
