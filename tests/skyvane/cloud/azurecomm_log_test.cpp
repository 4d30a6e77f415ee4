// The cloud communication object's logger: the Azure library's records reach
// the module's log. A program of its own, so that the log sink starts in a
// process that has not started a child process yet: under ThreadSanitizer the
// sink's locks went unseen after that (see the README's notes on sanitizer
// builds).
#include "cloud/AzureComm.h"
#include "frame/ConfigData.h"
#include "frame/MainAccess.h"

#include "temp_folder.h"

#include <gtest/gtest.h>

#include <cstdlib>

// The library's records reach the module's log through the object's logger.
TEST(AzureCommSend, LibraryRecordsReachTheModuleLog) {
    TempFolder folder;
    const std::string logPath = folder.Path("module.log");
    setenv("BRENNIC_CONFIG",
           folder.Write("brennic.ini", "[file]\npath = " + logPath + "\n[stderr]\nenabled = no\n[levels]\n0 = 0\n19 = 1\n")
               .c_str(),
           1);
    CMainAccess module;
    CConfigData context;
    ASSERT_EQ(module.Init(&context), 1);
    {
        CAzureComm comm;
        ASSERT_TRUE(comm.Init(u"", u"", u""));
        EXPECT_FALSE(comm.IsInfoEnabled());
        EXPECT_FALSE(comm.BeginOnlineRows(u"no connection string", u"q", false, 1));
    }
    module.DllExit(0);
    unsetenv("BRENNIC_CONFIG");
    const auto lines = TempFolder::ReadLines(logPath);
    ASSERT_EQ(lines.size(), 1u) << lines.back();
    EXPECT_NE(lines[0].find("PelgradDll ERROR kind=76 field=39: "), std::string::npos) << lines[0];
}
