// The cloud communication object: loading the Azure library, its instance,
// the proxy password, rows through the real library to azure-local, and the
// library's records in the module's log.
#include "cloud/AzureComm.h"
#include "cloud/PasswordKey.h"
#include "frame/ConfigData.h"
#include "frame/MainAccess.h"
#include "vxhelper/aescrypt.h"
#include "vxhelper/dirmanager.h"

#include "AzureLocalProcess.h"
#include "FakeCorvell.h"
#include "temp_folder.h"

#include <gtest/gtest.h>

#include <dlfcn.h>

#include <cstdlib>

using azurelocal::AzureLocalProcess;

namespace {

const char g_objectInTestProgram = 0;

// The folder of this program, where the build puts every library.
CString BinDir() { return VX_DirManager::GetModuleDir(&g_objectInTestProgram); }
CString FakeDir(const char16_t* form) { return BinDir() + u"fake-corvell/" + form + u"/"; }

bool IsLoaded(const CString& dir) {
    void* handle = dlopen((dir + u"libCorvell.so").ToUtf8().c_str(), RTLD_NOW | RTLD_NOLOAD);
    if (handle) dlclose(handle);
    return handle != nullptr;
}

// Keeps a stand-in loaded while the test looks at its state.
class FakeLibrary {
public:
    explicit FakeLibrary(const CString& dir) : m_handle(LoadLibrary(dir + u"libCorvell.so")) {
        auto stateOf = reinterpret_cast<PFN_FakeCorvell_State>(GetProcAddress(m_handle, "FakeCorvell_State"));
        m_state = stateOf ? stateOf() : nullptr;
    }
    ~FakeLibrary() { FreeLibrary(m_handle); }
    FakeCorvellState* operator->() const { return m_state; }
    explicit operator bool() const { return m_state != nullptr; }

private:
    HMODULE m_handle;
    FakeCorvellState* m_state;
};

CString Encipher(CString text, ULONGLONG high = kProxyPasswordKeyHigh, ULONGLONG low = kProxyPasswordKeyLow) {
    EXPECT_TRUE(CAesCrypt(high, low).EncryptHexString(text));
    return text;
}

void ExpectRowOperationsFail(CAzureComm& comm) {
    EXPECT_FALSE(comm.BeginOnlineRows(u"Endpoint=sb://127.0.0.1/", u"q", false, 1));
    EXPECT_FALSE(comm.AddOnlineRow(u"P#V", 1.0, u"", false, 0, 0, 0, 0));
    EXPECT_FALSE(comm.SendOnlineRows());
}

}  // namespace

// --- Loading the library and its instance -------------------------------------------

TEST(AzureCommLifecycle, LoadsOnceCreatesOnceAndUnloadsOnExit) {
    const CString dir = FakeDir(u"full");
    {
        CAzureComm comm(dir);
        comm.Exit();  // never loaded: nothing to do
        ExpectRowOperationsFail(comm);
        ASSERT_FALSE(IsLoaded(dir));

        ASSERT_TRUE(comm.Init(u"", u"", u""));
        ASSERT_TRUE(comm.Init(u"", u"", u""));
        FakeLibrary fake(dir);
        ASSERT_TRUE(fake);
        EXPECT_EQ(fake->created, 1);
        EXPECT_EQ(fake->logger, static_cast<corvell::ILogger*>(&comm));

        EXPECT_TRUE(comm.BeginOnlineRows(u"Endpoint=sb://127.0.0.1/", u"q", false, 1));
        EXPECT_TRUE(comm.AddOnlineRow(u"P#V", 1.0, u"", false, 1700000000, 0, 0, 0));
        EXPECT_TRUE(comm.SendOnlineRows());
        EXPECT_EQ(fake->rowsAdded, 1);

        comm.Exit();
        comm.Exit();
        EXPECT_EQ(fake->destroyed, 1);
        ExpectRowOperationsFail(comm);
        EXPECT_EQ(fake->rowsAdded, 1);
    }
    // Two Inits took one reference, which Exit gave back.
    EXPECT_FALSE(IsLoaded(dir));
}

TEST(AzureCommLifecycle, InitFailsWithoutAUsableLibrary) {
    TempFolder empty;
    const CString emptyDir = CString::FromUtf8(empty.Path() + "/");
    for (const CString& dir : {emptyDir, FakeDir(u"none")}) {
        SCOPED_TRACE(dir.ToUtf8());
        CAzureComm comm(dir);
        EXPECT_FALSE(comm.Init(u"", u"", u""));
        EXPECT_FALSE(comm.Init(u"", u"", u""));
        ExpectRowOperationsFail(comm);
        comm.Exit();
        comm.Exit();
        EXPECT_FALSE(IsLoaded(dir));
    }

    // A null instance: the library stays loaded and a later Init retries the creation only.
    const CString dir = FakeDir(u"full");
    FakeLibrary fake(dir);
    ASSERT_TRUE(fake);
    fake->createReturnsNull = true;
    CAzureComm comm(dir);
    EXPECT_FALSE(comm.Init(u"", u"", u""));
    ExpectRowOperationsFail(comm);
    fake->createReturnsNull = false;
    EXPECT_TRUE(comm.Init(u"", u"", u""));
    EXPECT_EQ(fake->created, 1);
    comm.Exit();
    EXPECT_EQ(fake->destroyed, 1);
}

// Without DestroyAzureInstance the instance cannot be ended, so its code must stay mapped.
TEST(AzureCommLifecycle, AnInstanceThatCannotBeDestroyedKeepsItsLibrary) {
    const CString dir = FakeDir(u"create-only");
    {
        CAzureComm comm(dir);
        ASSERT_TRUE(comm.Init(u"", u"", u""));
    }
    ASSERT_TRUE(IsLoaded(dir));
    FakeLibrary fake(dir);
    ASSERT_TRUE(fake);
    ASSERT_NE(fake->lastInstance, nullptr);
    EXPECT_TRUE(fake->lastInstance->SendOnlineRows());  // its code is still there
}

// --- Proxy settings ------------------------------------------------------------------

TEST(AzureCommProxy, PasswordIsDecipheredForTheCallOrNoProxyIsUsed) {
    const struct {
        const char16_t* domain;
        const char16_t* user;
        CString storedPassword;
        bool proxyGiven;
        std::u16string passwordPassed;
    } cases[] = {
        {u"proxy:3128", u"CORP\\user", Encipher(u"s3cret \u00e4"), true, u"s3cret \u00e4"},
        {u"proxy:3128", u"CORP\\user", u"", false, u""},
        {u"proxy:3128", u"", Encipher(u"s3cret"), false, u""},
        {u"", u"CORP\\user", Encipher(u"s3cret"), false, u""},
        // Stored with another key: the proxy is still named, with an empty password.
        {u"proxy:3128", u"CORP\\user", Encipher(u"s3cret", 1, 2), true, u""},
    };
    const CString dir = FakeDir(u"full");
    FakeLibrary fake(dir);
    ASSERT_TRUE(fake);
    for (const auto& c : cases) {
        SCOPED_TRACE(c.storedPassword.ToUtf8());
        const CString stored = c.storedPassword;
        CAzureComm comm(dir);
        ASSERT_TRUE(comm.Init(c.domain, c.user, stored));
        EXPECT_EQ(fake->proxyGiven, c.proxyGiven);
        EXPECT_EQ(fake->proxyAddress, c.proxyGiven ? std::u16string(c.domain) : u"");
        EXPECT_EQ(fake->proxyUser, c.proxyGiven ? std::u16string(c.user) : u"");
        EXPECT_EQ(fake->proxyPassword, c.passwordPassed);
        EXPECT_EQ(stored, c.storedPassword);  // the stored form is left as it was
    }
}

// --- Through the real library to azure-local -----------------------------------------

namespace {

std::unique_ptr<AzureLocalProcess> StartServer(const QStringList& arguments = {}) {
    std::string error;
    auto server = AzureLocalProcess::Start(arguments, error);
    EXPECT_TRUE(server) << error;
    return server;
}

}  // namespace

TEST(AzureCommSend, RowsArriveWithTheKeySplitInEveryFormat) {
    auto server = StartServer();
    ASSERT_TRUE(server);
    const CString connection = CString::FromUtf8(server->ConnectionString());
    CAzureComm comm;  // the library beside this program
    ASSERT_TRUE(comm.Init(u"", u"", u""));

    for (int format : {0, 1, 2}) {
        SCOPED_TRACE(format);
        ASSERT_TRUE(server->Reset());
        ASSERT_TRUE(comm.BeginOnlineRows(connection, u"q", false, format));
        EXPECT_TRUE(comm.AddOnlineRow(u"Line1#Speed", 12.5, u"", false, 1700000000, 250, 0x80000001u, 2));
        EXPECT_TRUE(comm.AddOnlineRow(u"Speed", 0.0, u"on <&>", true, 0xFFFFFFFFll, 999, 0, 0));
        EXPECT_TRUE(comm.AddOnlineRow(u"A#B#C", -1.0, u"", false, 0, 0, 0, 0xFFFFFFFFu));
        // Beyond 32-bit seconds the row fails rather than arriving with a wrong date.
        EXPECT_FALSE(comm.AddOnlineRow(u"Late#Row", 1.0, u"", false, 0x100000000ll, 0, 0, 0));
        EXPECT_FALSE(comm.AddOnlineRow(u"Early#Row", 1.0, u"", false, -1, 0, 0, 0));
        ASSERT_TRUE(comm.SendOnlineRows());

        const auto rows = server->Rows();
        ASSERT_EQ(rows.size(), 3u);
        EXPECT_EQ(rows[0].row.project, "Line1");
        EXPECT_EQ(rows[0].row.variable, "Speed");
        EXPECT_EQ(rows[0].row.value, 12.5);
        EXPECT_EQ(rows[0].row.time, 1700000000);
        EXPECT_EQ(rows[0].row.milliseconds, 250u);
        EXPECT_EQ(rows[0].row.status, 0x280000001ull);
        EXPECT_EQ(rows[1].row.project, "");
        EXPECT_EQ(rows[1].row.variable, "Speed");
        EXPECT_TRUE(rows[1].row.isText);
        EXPECT_EQ(rows[1].row.text, "on <&>");
        EXPECT_EQ(rows[1].row.time, 0xFFFFFFFFll);
        EXPECT_EQ(rows[2].row.project, "A");
        EXPECT_EQ(rows[2].row.variable, "B#C");
        EXPECT_EQ(rows[2].row.status, 0xFFFFFFFF00000000ull);
    }
}

TEST(AzureCommSend, TheDecipheredPasswordOpensTheProxy) {
    // azure-local serves as the proxy and, behind it, as the target.
    auto server = StartServer({"--proxy-auth", "CORP\\user:proxy-pass"});
    ASSERT_TRUE(server);
    CAzureComm comm;
    ASSERT_TRUE(comm.Init(CString::Formatted(u"127.0.0.1:%d", server->Port()), u"CORP\\user", Encipher(u"proxy-pass")));
    ASSERT_TRUE(comm.BeginOnlineRows(CString::FromUtf8(server->ConnectionString()), u"q", false, 1));
    EXPECT_TRUE(comm.AddOnlineRow(u"Line1#Speed", 1.0, u"", false, 1700000000, 0, 0, 0));
    EXPECT_TRUE(comm.SendOnlineRows());
    EXPECT_EQ(server->Rows().size(), 1u);
    EXPECT_GE(server->Stats().proxied, 1u);
}

// The library's records reach the module's log through the object's logger.
TEST(AzureCommSend, LibraryRecordsReachTheModuleLog) {
    TempFolder folder;
    const std::string logPath = folder.Path("module.log");
    setenv("BRENNIC_CONFIG",
           folder
               .Write("brennic.ini",
                      "[file]\npath = " + logPath + "\n[stderr]\nenabled = no\n[levels]\n0 = 0\n19 = 1\n")
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
