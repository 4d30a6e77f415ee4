// The local-socket transport: values, errors, objects and events across a
// socket (server and client in this process, each end on its own connection),
// a lost server, and peers that break the rules.
#include "automation/connection.h"
#include "automation/dispatch_call.h"
#include "automation/dispatch_object.h"
#include "automation/local_socket.h"

#include "RecordingSink.h"
#include "temp_folder.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstring>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr CLSID CLSID_Echo = {0x11112222, 0x3333, 0x4444, {5, 5, 6, 6, 7, 7, 8, 8}};
constexpr IID DIID_IEchoEvents = {0x11112223, 0x3333, 0x4444, {5, 5, 6, 6, 7, 7, 8, 8}};

std::atomic<int> g_liveChildren{0};

class CChild final : public CDispatchObject {
public:
    CChild() { ++g_liveChildren; }
    ~CChild() override { --g_liveChildren; }
    HRESULT Invoke(DISPID, WORD, DISPPARAMS*, VARIANT* result, EXCEPINFO*) override {
        if (result) {
            result->vt = VT_I4;
            result->lVal = 77;
        }
        return S_OK;
    }
};

// 1 echo(any): the argument back; 2 type(any): the argument's own VARTYPE as
// it arrived; 3 raise(): an error with texts; 4 child(): a new object;
// 5 fire(any): fires event 9 with that argument, returns the sinks called.
class CEcho final : public CDispatchObject, public IConnectionPointContainer {
public:
    CEcho() : m_point(CConnectionPoint::Create(DIID_IEchoEvents)) {}
    HRESULT QueryInterface(REFIID iid, void** object) override { return CDispatchObject::QueryInterface(iid, object); }
    ULONG AddRef() override { return CDispatchObject::AddRef(); }
    ULONG Release() override { return CDispatchObject::Release(); }

    HRESULT Invoke(DISPID member, WORD, DISPPARAMS* params, VARIANT* result, EXCEPINFO* exception) override {
        const UINT count = params ? params->cArgs : 0;
        switch (member) {
        case 1:
            if (count != 1) return DISP_E_BADPARAMCOUNT;
            if (result) VariantCopy(result, &DispatchArgs(*params)[0]);
            return S_OK;
        case 2:
            if (count != 1) return DISP_E_BADPARAMCOUNT;
            if (result) {
                result->vt = VT_I4;
                result->lVal = params->rgvarg[0].vt;
            }
            return S_OK;
        case 3:
            CAutomationError(E_INVALIDARG, u"Tank overflow", u"EchoServer").Fill(exception);
            return DISP_E_EXCEPTION;
        case 4:
            if (result) {
                result->vt = VT_DISPATCH;
                result->pdispVal = MakeComObject<CChild>().Detach();
            }
            return S_OK;
        case 5: {
            const size_t called = m_point->Fire(9, params);
            if (result) {
                result->vt = VT_I4;
                result->lVal = static_cast<LONG>(called);
            }
            return S_OK;
        }
        default: return DISP_E_MEMBERNOTFOUND;
        }
    }
    HRESULT FindConnectionPoint(REFIID events, IConnectionPoint** point) override {
        if (!(events == DIID_IEchoEvents)) return CONNECT_E_NOCONNECTION;
        *point = CComPtr<IConnectionPoint>(m_point.Get()).Detach();
        return S_OK;
    }
    size_t Sinks() const { return m_point->ConnectionCount(); }

protected:
    IUnknown* FindInterface(REFIID iid) override {
        if (iid == IID_IConnectionPointContainer) return static_cast<IConnectionPointContainer*>(this);
        return CDispatchObject::FindInterface(iid);
    }

private:
    CComPtr<CConnectionPoint> m_point;
};

CComVariant Array(VARTYPE vt, LONG lower, std::uint32_t count) {
    CComVariant v;
    v.vt = VT_ARRAY | vt;
    v.parray = SafeArrayCreateVector(vt, lower, count);
    return v;
}

class LocalSocket : public ::testing::Test {
protected:
    void SetUp() override {
        options.folder = folder.Path("sockets");
        options.frameTimeoutMs = 300;
        options.log = [this](const std::string& text) {
            std::lock_guard lock(logLock);
            log.push_back(text);
        };
        source = AddRunningObjectSource(CreateLocalSocketSource(options));
        Register();
    }
    void TearDown() override {
        if (registration) RevokeLocalServer(registration);
        RemoveRunningObjectSource(source);
        EXPECT_EQ(LocalSocketProxyCount(), 0) << "proxies leaked";
    }
    void Register() {
        std::string error;
        ASSERT_EQ(RegisterLocalServer(static_cast<IDispatch*>(echo.Get()), CLSID_Echo, options, &registration, &error),
                  S_OK)
            << error;
    }
    CComPtr<IDispatch> Find() {
        CComPtr<IUnknown> unknown;
        CComPtr<IDispatch> object;
        if (SUCCEEDED(GetActiveObject(CLSID_Echo, unknown.Receive()))) unknown.QueryInterface(IID_IDispatch, object);
        return object;
    }
    CComVariant Echo(IDispatch* object, const VARIANT& value) {
        CComVariant result;
        EXPECT_EQ(CallMethod(object, 1, &result, value), S_OK);
        return result;
    }
    std::string SocketPath() const { return options.folder + "/11112222-3333-4444-0505-060607070808.sock"; }

    TempFolder folder;
    LocalSocketOptions options;
    std::mutex logLock;  // guards log
    std::vector<std::string> log;
    DWORD source = 0;
    DWORD registration = 0;
    CComPtr<CEcho> echo = MakeComObject<CEcho>();
};

// A frame on the wire: its length in four bytes, then the payload.
std::vector<std::uint8_t> Framed(const std::vector<std::uint8_t>& payload) {
    const auto length = static_cast<std::uint32_t>(payload.size());
    std::vector<std::uint8_t> bytes(reinterpret_cast<const std::uint8_t*>(&length),
                                    reinterpret_cast<const std::uint8_t*>(&length) + 4);
    bytes.insert(bytes.end(), payload.begin(), payload.end());
    return bytes;
}

// A raw client that speaks bytes, not the protocol.
class RawClient {
public:
    explicit RawClient(const std::string& path) {
        m_fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
        connected = ::connect(m_fd, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0;
    }
    ~RawClient() { ::close(m_fd); }
    void Send(const std::vector<std::uint8_t>& bytes) { (void)!::send(m_fd, bytes.data(), bytes.size(), MSG_NOSIGNAL); }
    void SendFrame(const std::vector<std::uint8_t>& payload) { Send(Framed(payload)); }
    void SendHello() {
        std::vector<std::uint8_t> hello{1, 0x53, 0x4B, 0x41, 0x55, 1, 0};
        SendFrame(hello);
    }
    // Reads exactly n bytes within 5 s.
    bool Receive(void* data, size_t n) {
        auto* p = static_cast<char*>(data);
        while (n > 0) {
            pollfd waiting{m_fd, POLLIN, 0};
            if (::poll(&waiting, 1, 5000) <= 0) return false;
            const ssize_t got = ::recv(m_fd, p, n, 0);
            if (got <= 0) return false;
            p += got;
            n -= static_cast<size_t>(got);
        }
        return true;
    }
    // True when the server closes the connection within 5 s (whatever it sent before).
    bool ClosedByServer() {
        char buffer[256];
        for (;;) {
            pollfd p{m_fd, POLLIN, 0};
            if (::poll(&p, 1, 5000) <= 0) return false;
            const ssize_t n = ::recv(m_fd, buffer, sizeof buffer, 0);
            if (n <= 0) return true;
        }
    }
    bool connected = false;

private:
    int m_fd = -1;
};

// A call frame's payload: Invoke of member 1 on an object, with raw argument bytes.
std::vector<std::uint8_t> InvokeFrame(std::uint64_t object, std::uint32_t count,
                                      const std::vector<std::uint8_t>& args) {
    std::vector<std::uint8_t> frame{2, 7, 0, 0, 0, 3};
    auto put = [&](const void* data, size_t size) {
        frame.insert(frame.end(), static_cast<const std::uint8_t*>(data),
                     static_cast<const std::uint8_t*>(data) + size);
    };
    const std::int32_t member = 1;
    const std::uint16_t flags = DISPATCH_METHOD;
    const std::uint8_t wantResult = 1;
    put(&object, 8);
    put(&member, 4);
    put(&flags, 2);
    put(&wantResult, 1);
    put(&count, 4);
    frame.insert(frame.end(), args.begin(), args.end());
    return frame;
}

}  // namespace

TEST_F(LocalSocket, ValuesCrossBothWays) {
    CComPtr<IDispatch> object = Find();
    ASSERT_TRUE(object);
    EXPECT_EQ(Echo(object.Get(), CComVariant(42)).lVal, 42);
    EXPECT_EQ(Echo(object.Get(), CComVariant(-2.5)).dblVal, -2.5);
    EXPECT_EQ(Echo(object.Get(), CComVariant(true)).boolVal, VARIANT_TRUE);
    CComVariant date;
    date.vt = VT_DATE;
    date.date = 45000.75;
    EXPECT_EQ(Echo(object.Get(), date).vt, VT_DATE);
    EXPECT_EQ(Echo(object.Get(), date).date, 45000.75);
    CComVariant big;
    big.vt = VT_I8;
    big.llVal = -(1LL << 60);
    EXPECT_EQ(Echo(object.Get(), big).llVal, -(1LL << 60));
    EXPECT_EQ(Echo(object.Get(), CComVariant()).vt, VT_EMPTY);

    const char16_t withZero[] = {u'a', 0, u'b'};
    const CComVariant text = Echo(object.Get(), CComVariant(std::u16string_view(withZero, 3)));
    ASSERT_EQ(text.vt, VT_BSTR);
    EXPECT_EQ(std::u16string(text.bstrVal, SysStringLen(text.bstrVal)), std::u16string(withZero, 3));
    CComVariant nullText;
    nullText.vt = VT_BSTR;
    EXPECT_EQ(Echo(object.Get(), nullText).bstrVal, nullptr);

    // Arrays keep their bounds; variant arrays carry texts and nested arrays.
    CComVariant numbers = Array(VT_R8, 1, 3);
    for (int i = 0; i < 3; ++i) static_cast<double*>(numbers.parray->pvData)[i] = i * 1.5;
    const CComVariant numbersBack = Echo(object.Get(), numbers);
    ASSERT_EQ(numbersBack.vt, VT_ARRAY | VT_R8);
    EXPECT_EQ(numbersBack.parray->lLbound, 1);
    ASSERT_EQ(numbersBack.parray->cElements, 3u);
    EXPECT_EQ(static_cast<double*>(numbersBack.parray->pvData)[2], 3.0);
    CComVariant mixed = Array(VT_VARIANT, 0, 2);
    LONG i0 = 0, i1 = 1;
    const CComVariant level(u"level");
    SafeArrayPutElement(mixed.parray, &i0, &level);
    SafeArrayPutElement(mixed.parray, &i1, &numbers);
    const CComVariant mixedBack = Echo(object.Get(), mixed);
    ASSERT_EQ(mixedBack.vt, VT_ARRAY | VT_VARIANT);
    const auto* elements = static_cast<const VARIANT*>(mixedBack.parray->pvData);
    EXPECT_EQ(std::u16string(elements[0].bstrVal), u"level");
    EXPECT_EQ(elements[1].vt, VT_ARRAY | VT_R8);
    EXPECT_EQ(elements[1].parray->cElements, 3u);

    // A by-reference argument arrives as a reference; a reference inside an array as its value.
    LONG number = 5;
    VARIANT byRef;
    VariantInit(&byRef);
    byRef.vt = VT_I4 | VT_BYREF;
    byRef.plVal = &number;
    CComVariant type;
    ASSERT_EQ(CallMethod(object.Get(), 2, &type, byRef), S_OK);
    EXPECT_EQ(type.lVal, VT_I4 | VT_BYREF);
    EXPECT_EQ(Echo(object.Get(), byRef).lVal, 5);
    CComVariant holder = Array(VT_VARIANT, 0, 1);
    SafeArrayPutElement(holder.parray, &i0, &byRef);
    const CComVariant holderBack = Echo(object.Get(), holder);
    EXPECT_EQ(static_cast<const VARIANT*>(holderBack.parray->pvData)[0].vt, VT_I4);

    // What cannot cross is refused at the caller, and the connection stays.
    CComVariant odd;
    odd.vt = 0x0FFF;
    CComVariant ignored;
    EXPECT_EQ(CallMethod(object.Get(), 1, &ignored, odd), DISP_E_BADVARTYPE);
    EXPECT_EQ(Echo(object.Get(), CComVariant(1)).lVal, 1);
}

TEST_F(LocalSocket, ErrorsAndObjectsCross) {
    CComPtr<IDispatch> object = Find();
    ASSERT_TRUE(object);
    try {
        CallMethodOrThrow(object.Get(), 3);
        ADD_FAILURE() << "no error raised";
    } catch (const CAutomationError& error) {
        EXPECT_EQ(error.Status(), E_INVALIDARG);
        EXPECT_EQ(error.Description(), u"Tank overflow");
        EXPECT_EQ(error.Source(), u"EchoServer");
    }
    CComVariant ignored;
    EXPECT_EQ(CallMethod(object.Get(), 99, &ignored), DISP_E_MEMBERNOTFOUND);
    CComPtr<IUnknown> none;
    EXPECT_EQ(object->QueryInterface(DIID_IEchoEvents, none.ReceiveVoid()), E_NOINTERFACE);

    {
        const CComVariant child = CallMethodOrThrow(object.Get(), 4);
        ASSERT_EQ(child.vt, VT_DISPATCH);
        EXPECT_EQ(CallMethodOrThrow(child.pdispVal, 1).lVal, 77);
        EXPECT_EQ(g_liveChildren, 1);
    }
    // The release went out before this call, so the server has taken it when the call returns.
    Echo(object.Get(), CComVariant(0));
    EXPECT_EQ(g_liveChildren, 0);
}

TEST_F(LocalSocket, EventsReachTheSinkOnATransportThreadBeforeTheFiringCallReturns) {
    CComPtr<IDispatch> object = Find();
    ASSERT_TRUE(object);
    CComPtr<IConnectionPointContainer> points;
    CComPtr<IConnectionPoint> point;
    ASSERT_EQ(object.QueryInterface(IID_IConnectionPointContainer, points), S_OK);
    ASSERT_EQ(points->FindConnectionPoint(DIID_IEchoEvents, point.Receive()), S_OK);
    EXPECT_EQ(points->FindConnectionPoint(IID_IDispatch, CComPtr<IConnectionPoint>().Receive()),
              CONNECT_E_NOCONNECTION);
    auto sink = MakeComObject<RecordingSink>(DIID_IEchoEvents);
    DWORD cookie = 0;
    ASSERT_EQ(point->Advise(sink.Get(), &cookie), S_OK);
    EXPECT_NE(cookie, 0u);
    EXPECT_EQ(echo->Sinks(), 1u);

    CComVariant called;
    ASSERT_EQ(CallMethod(object.Get(), 5, &called, u"tick"), S_OK);
    EXPECT_EQ(called.lVal, 1);
    const auto calls = sink->Calls();
    ASSERT_EQ(calls.size(), 1u);  // delivered before the call returned
    EXPECT_EQ(calls[0].member, 9);
    EXPECT_NE(calls[0].thread, std::this_thread::get_id());
    EXPECT_EQ(std::u16string(calls[0].args.at(0).bstrVal), u"tick");

    EXPECT_EQ(point->Unadvise(cookie + 100), CONNECT_E_NOCONNECTION);
    ASSERT_EQ(point->Unadvise(cookie), S_OK);
    EXPECT_EQ(echo->Sinks(), 0u);
    ASSERT_EQ(CallMethod(object.Get(), 5, &called, u"tock"), S_OK);
    EXPECT_EQ(called.lVal, 0);
    EXPECT_EQ(sink->CallCount(), 1u);
    // The server gave its reference on the sink back (the Release frame precedes this reply).
    Echo(object.Get(), CComVariant(0));
    EXPECT_EQ(sink->RefCount(), 1u);
}

TEST_F(LocalSocket, LostServerFailsEveryCallAndANewOneIsFound) {
    CComPtr<IDispatch> object = Find();
    ASSERT_TRUE(object);
    CComPtr<IConnectionPointContainer> points;
    CComPtr<IConnectionPoint> point;
    ASSERT_EQ(object.QueryInterface(IID_IConnectionPointContainer, points), S_OK);
    ASSERT_EQ(points->FindConnectionPoint(DIID_IEchoEvents, point.Receive()), S_OK);
    auto sink = MakeComObject<RecordingSink>(DIID_IEchoEvents);
    DWORD cookie = 0;
    ASSERT_EQ(point->Advise(sink.Get(), &cookie), S_OK);

    ASSERT_EQ(RevokeLocalServer(registration), S_OK);
    registration = 0;
    EXPECT_EQ(echo->Sinks(), 0u) << "the lost client's advise was ended";
    CComVariant ignored;
    EXPECT_EQ(CallMethod(object.Get(), 1, &ignored, 1), RPC_E_DISCONNECTED);
    EXPECT_EQ(point->Unadvise(cookie), RPC_E_DISCONNECTED);
    CComPtr<IUnknown> none;
    EXPECT_EQ(GetActiveObject(CLSID_Echo, none.Receive()), MK_E_UNAVAILABLE);

    Register();
    CComPtr<IDispatch> again = Find();
    ASSERT_TRUE(again);
    EXPECT_EQ(Echo(again.Get(), CComVariant(3)).lVal, 3);
    // The old proxies stay dead and safe to release.
    EXPECT_EQ(CallMethod(object.Get(), 1, &ignored, 1), RPC_E_DISCONNECTED);
    point.Release();
    points.Release();
    object.Release();
}

TEST_F(LocalSocket, MalformedOrTruncatedFramesCloseOnlyThatConnection) {
    CComPtr<IDispatch> object = Find();
    ASSERT_TRUE(object);
    // What each client sends after its greeting (if it greets).
    const struct Case {
        const char* name;
        std::vector<std::uint8_t> bytes;
        bool hello = true;
    } cases[] = {
        {"unknown kind", Framed({9, 9, 9})},
        {"a call cut short inside its fields", Framed({2, 1, 0, 0, 0, 3, 1, 0, 0, 0, 0, 0, 0, 0})},
        {"release of an object never exported", Framed({4, 99, 0, 0, 0, 0, 0, 0, 0})},
        {"a reply too short for its status", Framed({3, 1, 0})},
        {"an array larger than the frame",
         Framed(InvokeFrame(1, 1, {0x05, 0x20, 1, 0, 0, 0, 0, 0xFF, 0xFF, 0xFF, 0x7F}))},
        {"a text larger than the frame", Framed(InvokeFrame(1, 1, {0x08, 0, 0xFE, 0xFF, 0xFF, 0x7F}))},
        {"a type that does not exist", Framed(InvokeFrame(1, 1, {0xFF, 0x0F}))},
        {"more arguments than allowed", Framed(InvokeFrame(1, 65, {}))},
        {"a reference to I4 whose target is a text", Framed(InvokeFrame(1, 1, {0x03, 0x40, 0x08, 0, 0, 0, 0, 0}))},
        {"a reference inside a reference", Framed(InvokeFrame(1, 1, {0x0C, 0x40, 0x0C, 0x40, 0, 0}))},
        {"bytes after the last field", Framed(InvokeFrame(1, 0, {0}))},
        {"no greeting first", Framed({2, 1, 0, 0, 0, 1}), false},
        {"a length too large", {0xFF, 0xFF, 0xFF, 0x7F}},
        // Closed after the frame time-out.
        {"a frame that starts and never ends", {100, 0, 0, 0, 'a', 'b', 'c', 'd', 'e', 'f', 'g', 'h', 'i', 'j'}},
    };
    for (const Case& c : cases) {
        RawClient raw(SocketPath());
        ASSERT_TRUE(raw.connected);
        if (c.hello) raw.SendHello();
        raw.Send(c.bytes);
        EXPECT_TRUE(raw.ClosedByServer()) << c.name;
    }
    {
        // A well-formed call to an object that does not exist gets an error, and the connection stays.
        RawClient raw(SocketPath());
        raw.SendHello();
        std::uint8_t hello[11];
        ASSERT_TRUE(raw.Receive(hello, sizeof hello));
        for (int i = 0; i < 2; ++i) {
            raw.SendFrame(InvokeFrame(12345, 0, {}));
            std::uint8_t reply[13];
            ASSERT_TRUE(raw.Receive(reply, sizeof reply));
            std::int32_t status = 0;
            std::memcpy(&status, reply + 9, 4);
            EXPECT_EQ(reply[4], 3);  // a reply
            EXPECT_EQ(status, CO_E_OBJNOTCONNECTED);
        }
    }
    // The well-behaved client never noticed.
    EXPECT_EQ(Echo(object.Get(), CComVariant(8)).lVal, 8);
}

TEST_F(LocalSocket, OnlyTheOwningUserConnects) {
    if (::geteuid() != 0) GTEST_SKIP() << "needs root to act as another user";
    // Open the folder and the socket to everyone, so that only the credential check stands in the way.
    ASSERT_EQ(::chmod(folder.Path().c_str(), 0755), 0);
    ASSERT_EQ(::chmod(options.folder.c_str(), 0755), 0);
    ASSERT_EQ(::chmod(SocketPath().c_str(), 0777), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        if (::setgid(65534) != 0 || ::setuid(65534) != 0) ::_exit(3);
        RawClient raw(SocketPath());
        if (!raw.connected) ::_exit(4);
        raw.SendHello();
        ::_exit(raw.ClosedByServer() ? 0 : 5);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 0) << "3: no setuid, 4: no connect, 5: not refused";
    std::lock_guard lock(logLock);
    bool reported = false;
    for (const auto& line : log) reported = reported || line.find("another user (uid 65534") != std::string::npos;
    EXPECT_TRUE(reported);
}

TEST_F(LocalSocket, FolderAndSocketRules) {
    // A second server of the same class is refused while the first runs.
    DWORD second = 0;
    std::string error;
    EXPECT_EQ(RegisterLocalServer(static_cast<IDispatch*>(echo.Get()), CLSID_Echo, options, &second, &error), E_FAIL);
    EXPECT_NE(error.find("running already"), std::string::npos) << error;

    // A socket left behind by a server that is gone is replaced.
    ASSERT_EQ(RevokeLocalServer(registration), S_OK);
    registration = 0;
    {
        const int stale = ::socket(AF_UNIX, SOCK_STREAM, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strncpy(address.sun_path, SocketPath().c_str(), sizeof address.sun_path - 1);
        ASSERT_EQ(::bind(stale, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
        ::close(stale);
    }
    Register();
    EXPECT_TRUE(Find());

    // A folder others may enter is refused.
    LocalSocketOptions open = options;
    open.folder = folder.Path("open");
    ASSERT_EQ(::mkdir(open.folder.c_str(), 0755), 0);
    ASSERT_EQ(::chmod(open.folder.c_str(), 0755), 0);
    EXPECT_EQ(RegisterLocalServer(static_cast<IDispatch*>(echo.Get()), CLSID_Echo, open, &second, &error), E_FAIL);
    EXPECT_NE(error.find("0700"), std::string::npos) << error;
}
