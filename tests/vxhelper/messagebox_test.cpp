// Message boxes without a widget application, and string tables by id.
#include "vxhelper/messagebox.h"
#include "vxhelper/logwriter.h"

#include "platform/resources.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace {

std::vector<std::string> g_logged;
void RecordLogged(const CString& text) { g_logged.push_back(text.ToUtf8()); }

struct Seen {
    std::vector<std::string> texts;
    std::vector<UINT> types;
};

void Observe(HWND, const CString& text, UINT type, void* context) {
    auto* seen = static_cast<Seen*>(context);
    seen->texts.push_back(text.ToUtf8());
    seen->types.push_back(type);
}

}  // namespace

TEST(MessageBox, HeadlessBoxesGoToTheLogAndAnswerHarmlessly) {
    const STRINGTABLE_ENTRY older[] = {{7001, u"old text"}, {7002, u"only here"}};
    const STRINGTABLE_ENTRY newer[] = {{7001, u"new text"}};
    CStringTableRegistration first(older, 2);
    Seen seen;
    g_logged.clear();
    VXHelper_SetLogWriters(&RecordLogged, nullptr);
    VXHelper_SetMessageBoxObserver(&Observe, &seen);
    {
        CStringTableRegistration second(newer, 1);
        EXPECT_EQ(VXHelper_MessageBox(nullptr, 7001, MB_ICONERROR), IDOK);  // the newest table wins
    }
    EXPECT_EQ(VXHelper_MessageBox(nullptr, 7001, MB_OKCANCEL), IDCANCEL);
    EXPECT_EQ(VXHelper_MessageBox(nullptr, 7002, MB_YESNO), IDNO);
    EXPECT_EQ(VXHelper_MessageBox(nullptr, 7999, MB_OK), IDOK);
    EXPECT_EQ(VXHelper_MessageBox(nullptr, CString(u"two\nlines"), MB_ICONERROR), IDOK);
    VXHelper_SetMessageBoxObserver(nullptr, nullptr);
    VXHelper_SetLogWriters(nullptr, nullptr);
    VXHelper_MessageBox(nullptr, CString(u"not seen"), MB_OK);

    const std::vector<std::string> expected{"new text", "old text", "only here", "(string 7999)", "two\nlines"};
    EXPECT_EQ(seen.texts, expected);
    EXPECT_EQ(g_logged, expected);
    EXPECT_EQ(seen.types.front(), MB_ICONERROR);
    CString text;
    EXPECT_FALSE(AfxLoadString(7999, text));
    EXPECT_TRUE(text.IsEmpty());
}
