// The socket folder, the client's running-object source and the server's
// registrations of the local-socket transport.
#include "automation/local_socket.h"

#include "local/channel.h"

#include "automation/error.h"

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <list>
#include <map>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>
#include <utility>

namespace {

constexpr int kMaxConnections = 64;

std::string ClsidText(REFCLSID clsid) {
    char text[40];
    std::snprintf(text, sizeof text, "%08X-%04X-%04X-%02X%02X-%02X%02X%02X%02X%02X%02X", clsid.Data1, clsid.Data2,
                  clsid.Data3, clsid.Data4[0], clsid.Data4[1], clsid.Data4[2], clsid.Data4[3], clsid.Data4[4],
                  clsid.Data4[5], clsid.Data4[6], clsid.Data4[7]);
    return text;
}

bool SocketAddress(const std::string& path, sockaddr_un* address) {
    std::memset(address, 0, sizeof *address);
    address->sun_family = AF_UNIX;
    if (path.size() >= sizeof address->sun_path) return false;
    std::memcpy(address->sun_path, path.c_str(), path.size() + 1);
    return true;
}

// The folder must be this user's own, a real folder, and closed to everyone else.
bool CheckFolder(const std::string& folder, bool create, std::string* error) {
    if (create && ::mkdir(folder.c_str(), 0700) != 0 && errno != EEXIST) {
        *error = "cannot create the socket folder " + folder + ": " + std::strerror(errno);
        return false;
    }
    struct stat info {};
    if (::lstat(folder.c_str(), &info) != 0) {
        *error = "no socket folder " + folder;
        return false;
    }
    if (!S_ISDIR(info.st_mode) || info.st_uid != ::geteuid() || (info.st_mode & 077) != 0) {
        *error = "the socket folder " + folder + " is not a folder of this user closed to others (mode 0700)";
        return false;
    }
    return true;
}

// The user id of the process at the other end of a connected socket.
bool PeerUser(int fd, uid_t* uid, pid_t* pid) {
    ucred credentials{};
    socklen_t size = sizeof credentials;
    if (::getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) return false;
    *uid = credentials.uid;
    *pid = credentials.pid;
    return true;
}

void SetNonBlocking(int fd) { ::fcntl(fd, F_SETFL, ::fcntl(fd, F_GETFL) | O_NONBLOCK); }

// ---- client ----------------------------------------------------------------

class CLocalSocketSource final : public IRunningObjectSource {
public:
    explicit CLocalSocketSource(LocalSocketOptions options) : m_options(std::move(options)) {
        m_folder = LocalSocketFolder(m_options);
    }
    ~CLocalSocketSource() override {
        std::map<std::string, std::shared_ptr<CChannel>> channels;
        {
            std::lock_guard lock(m_lock);
            channels.swap(m_channels);
        }
        for (auto& [name, channel] : channels) channel->Close();
    }

    HRESULT GetObject(REFCLSID clsid, IUnknown** object) override {
        if (!object) return E_POINTER;
        *object = nullptr;
        const std::string name = ClsidText(clsid);
        for (int attempt = 0; attempt < 2; ++attempt) {
            std::shared_ptr<CChannel> channel = Cached(name);
            const bool cached = channel != nullptr;
            if (!channel) channel = Connect(name);
            if (!channel) return MK_E_UNAVAILABLE;
            std::uint64_t id = 0;
            const HRESULT hr = channel->Call(
                automation_wire::Op::Root, [](automation_wire::Writer&, auto&) { return S_OK; },
                [&](HRESULT, automation_wire::Reader& r) { return r.U64(&id); });
            if (SUCCEEDED(hr) && id) {
                Keep(name, channel);
                *object = channel->Import(id).Detach();
                return S_OK;
            }
            Forget(name, channel);
            // A connection kept from an earlier server may be stale: try once with a fresh one.
            if (!cached) return hr == RPC_E_DISCONNECTED || hr == RPC_E_TIMEOUT ? MK_E_UNAVAILABLE : hr;
        }
        return MK_E_UNAVAILABLE;
    }

private:
    std::shared_ptr<CChannel> Cached(const std::string& name) {
        std::shared_ptr<CChannel> dropped;  // closed after the lock
        std::lock_guard lock(m_lock);
        const auto it = m_channels.find(name);
        if (it == m_channels.end()) return nullptr;
        if (!it->second->IsBroken()) return it->second;
        dropped = std::move(it->second);
        m_channels.erase(it);
        return nullptr;
    }
    void Keep(const std::string& name, const std::shared_ptr<CChannel>& channel) {
        std::shared_ptr<CChannel> dropped;  // released after the lock
        std::lock_guard lock(m_lock);
        auto& slot = m_channels[name];
        if (!slot || slot->IsBroken()) dropped = std::exchange(slot, channel);
    }
    void Forget(const std::string& name, const std::shared_ptr<CChannel>& channel) {
        {
            std::lock_guard lock(m_lock);
            const auto it = m_channels.find(name);
            if (it != m_channels.end() && it->second == channel) m_channels.erase(it);  // channel still holds it
        }
        channel->Close();
    }

    std::shared_ptr<CChannel> Connect(const std::string& name) {
        std::string error;
        if (!CheckFolder(m_folder, false, &error)) return nullptr;  // nothing registered there
        const std::string path = m_folder + "/" + name + ".sock";
        sockaddr_un address{};
        if (!SocketAddress(path, &address)) return nullptr;
        // Non-blocking, so that a server whose backlog is full cannot hold the caller up.
        const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
        if (fd < 0) return nullptr;
        uid_t uid = 0;
        pid_t pid = 0;
        if (::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
            !PeerUser(fd, &uid, &pid)) {
            ::close(fd);
            return nullptr;
        }
        if (uid != ::geteuid()) {
            if (m_options.log)
                m_options.log(path + ": served by another user (uid " + std::to_string(uid) + "), not used");
            ::close(fd);
            return nullptr;
        }
        return CChannel::Start(fd, m_options, nullptr, "server " + std::to_string(pid));
    }

    const LocalSocketOptions m_options;
    std::string m_folder;
    std::mutex m_lock;                                            // guards m_channels
    std::map<std::string, std::shared_ptr<CChannel>> m_channels;  // one kept connection per class
};

// ---- server ----------------------------------------------------------------

class CLocalServer {
public:
    CLocalServer(CComPtr<IUnknown> object, LocalSocketOptions options)
        : m_object(std::move(object)), m_options(std::move(options)) {}
    ~CLocalServer() { Stop(); }

    bool Listen(const std::string& folder, REFCLSID clsid, std::string* error) {
        if (!CheckFolder(folder, true, error)) return false;
        m_path = folder + "/" + ClsidText(clsid) + ".sock";
        sockaddr_un address{};
        if (!SocketAddress(m_path, &address)) {
            *error = "socket path too long: " + m_path;
            return false;
        }
        m_listen = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        if (m_listen < 0) {
            *error = std::string("cannot make a socket: ") + std::strerror(errno);
            return false;
        }
        const auto* at = reinterpret_cast<const sockaddr*>(&address);
        int bound = ::bind(m_listen, at, sizeof address);
        if (bound != 0 && errno == EADDRINUSE) {
            // Left behind by a server that is gone, or still served?
            const int probe = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
            const bool served = probe >= 0 && (::connect(probe, at, sizeof address) == 0 || errno == EAGAIN);
            if (probe >= 0) ::close(probe);
            if (served) {
                *error = "a server of this class is running already (" + m_path + ")";
                m_path.clear();
                return false;
            }
            ::unlink(m_path.c_str());
            bound = ::bind(m_listen, at, sizeof address);
        }
        if (bound != 0) {
            *error = "cannot bind " + m_path + ": " + std::strerror(errno);
            m_path.clear();
            return false;
        }
        ::chmod(m_path.c_str(), 0600);
        struct stat info {};
        ::stat(m_path.c_str(), &info);
        m_inode = info.st_ino;
        m_wake = ::eventfd(0, EFD_CLOEXEC);
        if (m_wake < 0 || ::listen(m_listen, 16) != 0) {
            *error = std::string("cannot listen: ") + std::strerror(errno);
            return false;
        }
        m_thread = std::thread([this] { AcceptLoop(); });
        return true;
    }

    void Stop() {
        if (m_thread.joinable()) {
            const std::uint64_t one = 1;
            if (::write(m_wake, &one, sizeof one) < 0) {
                // cannot happen with a fresh eventfd; the join below would then wait for the next client
            }
            m_thread.join();
        }
        struct stat info {};
        if (!m_path.empty() && ::stat(m_path.c_str(), &info) == 0 && info.st_ino == m_inode) ::unlink(m_path.c_str());
        if (m_listen >= 0) ::close(m_listen);
        if (m_wake >= 0) ::close(m_wake);
        m_listen = m_wake = -1;
        m_path.clear();
        std::list<std::weak_ptr<CChannel>> channels;
        {
            std::lock_guard lock(m_lock);
            channels.swap(m_channels);
        }
        // Break them all first, so that none waits for another one's peer, then wait for each.
        std::vector<std::shared_ptr<CChannel>> live;
        for (auto& weak : channels) {
            if (auto channel = weak.lock()) live.push_back(std::move(channel));
        }
        for (auto& channel : live) channel->Break();
        for (auto& channel : live) channel->Close();
    }

private:
    void Log(const std::string& text) const {
        if (m_options.log) m_options.log(text);
    }

    void AcceptLoop() {
        for (;;) {
            pollfd p[2] = {{m_listen, POLLIN, 0}, {m_wake, POLLIN, 0}};
            if (::poll(p, 2, -1) < 0) {
                if (errno == EINTR) continue;
                return;
            }
            if (p[1].revents) return;
            const int fd = ::accept4(m_listen, nullptr, nullptr, SOCK_CLOEXEC);
            if (fd < 0) continue;
            uid_t uid = 0;
            pid_t pid = 0;
            if (!PeerUser(fd, &uid, &pid) || uid != ::geteuid()) {
                Log("refused a client of another user (uid " + std::to_string(uid) + ", pid " + std::to_string(pid) +
                    ")");
                ::close(fd);
                continue;
            }
            std::lock_guard lock(m_lock);
            m_channels.remove_if([](const std::weak_ptr<CChannel>& c) {
                const auto channel = c.lock();
                return !channel || channel->IsBroken();
            });
            if (m_channels.size() >= kMaxConnections) {
                Log("refused a client: too many connections");
                ::close(fd);
                continue;
            }
            SetNonBlocking(fd);
            m_channels.push_back(CChannel::Start(fd, m_options, m_object, "client " + std::to_string(pid)));
        }
    }

    const CComPtr<IUnknown> m_object;
    const LocalSocketOptions m_options;
    std::string m_path;
    ino_t m_inode = 0;
    int m_listen = -1;
    int m_wake = -1;
    std::thread m_thread;
    std::mutex m_lock;  // guards m_channels
    std::list<std::weak_ptr<CChannel>> m_channels;
};

struct Servers {
    std::mutex lock;  // guards list and next
    std::map<DWORD, std::unique_ptr<CLocalServer>> list;
    DWORD next = 1;
};

Servers& AllServers() {
    static auto* servers = new Servers;  // never destroyed: registrations may outlive static objects
    return *servers;
}

}  // namespace

std::string LocalSocketFolder(const LocalSocketOptions& options) {
    if (!options.folder.empty()) return options.folder;
    if (const char* dir = std::getenv("SKYVANE_AUTOMATION_DIR"); dir && *dir) return dir;
    if (const char* runtime = std::getenv("XDG_RUNTIME_DIR"); runtime && *runtime)
        return std::string(runtime) + "/skyvane-automation";
    return "/tmp/skyvane-automation-" + std::to_string(::geteuid());
}

std::shared_ptr<IRunningObjectSource> CreateLocalSocketSource(LocalSocketOptions options) {
    return std::make_shared<CLocalSocketSource>(std::move(options));
}

HRESULT RegisterLocalServer(IUnknown* object, REFCLSID clsid, const LocalSocketOptions& options, DWORD* registration,
                            std::string* error) {
    if (!registration) return E_POINTER;
    *registration = 0;
    if (!object) return E_INVALIDARG;
    auto server = std::make_unique<CLocalServer>(CComPtr<IUnknown>(object), options);
    std::string message;
    if (!server->Listen(LocalSocketFolder(options), clsid, &message)) {
        if (error) *error = message;
        return E_FAIL;
    }
    Servers& servers = AllServers();
    std::lock_guard lock(servers.lock);
    *registration = servers.next++;
    if (servers.next == 0) servers.next = 1;
    servers.list.emplace(*registration, std::move(server));
    return S_OK;
}

HRESULT RevokeLocalServer(DWORD registration) {
    std::unique_ptr<CLocalServer> server;
    {
        Servers& servers = AllServers();
        std::lock_guard lock(servers.lock);
        const auto it = servers.list.find(registration);
        if (it == servers.list.end()) return E_INVALIDARG;
        server = std::move(it->second);
        servers.list.erase(it);
    }
    server->Stop();  // outside the lock: it waits for the connections' threads
    return S_OK;
}
