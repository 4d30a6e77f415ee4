// The host context record and its copy rules.
#include "frame/ConfigData.h"

#include <gtest/gtest.h>

namespace {

// Counts references; never deletes itself (it lives on the test's stack).
class CountedInterface : public IUnknown {
public:
    HRESULT QueryInterface(REFIID, void**) override { return E_NOINTERFACE; }
    ULONG AddRef() override { return ++refs; }
    ULONG Release() override { return --refs; }
    ULONG refs = 1;
};

}  // namespace

// What a copy does beyond assigning fields: containers are replaced, not
// added to; the progress bar stays the copy's own; copying into itself is safe.
TEST(ConfigDataTest, CopyReplacesContainersKeepsTheProgressBarAndSurvivesSelfCopy) {
    CConfigData source;
    source.m_strIniFile = u"/etc/skyvane/module.ini";
    source.m_lstFirst.AddTail(u"a");
    source.m_mapTexts.SetAt(u"k", u"v");
    source.m_ProgressBar.m_adwState[0] = 42;

    CConfigData copy;
    copy.m_lstFirst.AddTail(u"stale");
    copy.m_mapTexts.SetAt(u"stale", u"x");
    copy.CopyFrom(source);
    ASSERT_EQ(copy.m_lstFirst.GetCount(), 1);
    EXPECT_EQ(*copy.m_lstFirst.begin(), u"a");
    CString text;
    EXPECT_FALSE(copy.m_mapTexts.Lookup(u"stale", text));
    EXPECT_EQ(copy.m_ProgressBar.m_adwState[0], 0u);

    // The module copies its own record into itself when konfig applies saved settings.
    copy.CopyFrom(copy);
    EXPECT_EQ(copy.m_lstFirst.GetCount(), 1);
    EXPECT_EQ(copy.m_mapTexts.GetCount(), 1);
    EXPECT_EQ(copy.m_strIniFile, u"/etc/skyvane/module.ini");
}

TEST(ConfigDataTest, InterfacesAreCountedOnCopyReplacementAndDestruction) {
    CountedInterface first, second, replacement;
    {
        CConfigData source;
        CConfigData::AssignInterface(source.m_pFirstInterface, &first);
        CConfigData::AssignInterface(source.m_pSecondInterface, &second);
        EXPECT_EQ(first.refs, 2u);
        {
            CConfigData copy;
            copy.CopyFrom(source);
            EXPECT_EQ(first.refs, 3u);
            EXPECT_EQ(second.refs, 3u);
            copy.CopyFrom(source);  // same pointers: no change
            EXPECT_EQ(first.refs, 3u);

            CConfigData::AssignInterface(source.m_pFirstInterface, &replacement);
            copy.CopyFrom(source);
            EXPECT_EQ(first.refs, 1u);  // released by both records
            EXPECT_EQ(replacement.refs, 3u);

            CConfigData::AssignInterface(source.m_pSecondInterface, nullptr);
            copy.CopyFrom(source);
            EXPECT_EQ(copy.m_pSecondInterface, nullptr);
            EXPECT_EQ(second.refs, 1u);
        }
        EXPECT_EQ(replacement.refs, 2u);
    }
    EXPECT_EQ(replacement.refs, 1u);
    EXPECT_EQ(first.refs, 1u);
}
