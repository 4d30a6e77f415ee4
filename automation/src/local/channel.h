#pragma once
// One connection of the local-socket transport, the same at both ends.
//
// Either end may call objects the other end exported: a call frame goes out
// and the calling thread waits (at most the call time-out) for the reply
// frame with the same number. A reader thread takes frames in; calls from the
// peer run on a small pool of worker threads of this connection, so a call
// may call back (an event sink calling the server) without waiting for
// itself. Releases of exported objects are done by the reader in frame order.
//
// Lost connection: the first failure (peer gone, malformed frame, a frame cut
// short, a write that makes no progress) marks the connection broken; calls
// waiting and every later call fail with RPC_E_DISCONNECTED, the objects the
// peer held are released and the advises it made are ended.

#include "local/wire.h"

#include "automation/connection.h"
#include "automation/local_socket.h"

#include <condition_variable>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

class CChannel final : public std::enable_shared_from_this<CChannel>, public automation_wire::IObjectMarshal {
public:
    using Body = std::function<HRESULT(automation_wire::Writer&, std::vector<std::uint64_t>& exported)>;
    // Reads the reply's fields after its status; false = malformed.
    using ReplyReader = std::function<bool(HRESULT status, automation_wire::Reader&)>;

    // Takes the connected socket over and starts the reader. root is what the
    // peer's Root call gives (the server's registered object), or null.
    static std::shared_ptr<CChannel> Start(int fd, const LocalSocketOptions& options, CComPtr<IUnknown> root,
                                           std::string peer);
    ~CChannel();
    CChannel(const CChannel&) = delete;
    CChannel& operator=(const CChannel&) = delete;

    // Sends a call and waits for its reply. The peer's status, or
    // RPC_E_DISCONNECTED, RPC_E_TIMEOUT, or the body's own failure.
    HRESULT Call(automation_wire::Op op, const Body& body, const ReplyReader& read = {});
    // Tells the peer that one reference on its object is gone (nothing when broken).
    void SendRelease(std::uint64_t id);
    // Breaks the connection without waiting.
    void Break() { Broken({}); }
    // Breaks the connection and waits (bounded) for its threads, except the calling one.
    void Close();
    bool IsBroken() const;

    std::uint64_t Export(IUnknown* object, bool isDispatch) override;
    void Unexport(std::uint64_t id) override;
    CComPtr<IDispatch> Import(std::uint64_t id) override;

private:
    struct Pending {
        bool done = false;
        std::vector<std::uint8_t> frame;
    };
    struct Exported {
        CComPtr<IUnknown> object;
        bool isDispatch = false;
    };
    struct Advised {
        CComPtr<IConnectionPoint> point;
        DWORD cookie = 0;
    };

    CChannel(int fd, const LocalSocketOptions& options, CComPtr<IUnknown> root, std::string peer);

    void ReadLoop();
    void WorkLoop();
    void ThreadEnded();
    bool ReadFrame(std::vector<std::uint8_t>* frame);
    bool ReadExact(std::uint8_t* data, size_t size, bool mayIdle);
    bool SendFrame(const std::vector<std::uint8_t>& frame);
    // Marks the connection broken; a reason (empty for a close of our own) goes to the log.
    void Broken(const std::string& reason);
    void ReleaseEverything();
    bool TakeFrame(std::vector<std::uint8_t> frame);
    void QueueCall(std::vector<std::uint8_t> frame);
    void HandleCall(const std::vector<std::uint8_t>& frame);
    bool Execute(automation_wire::Op op, automation_wire::Reader& r, automation_wire::Writer& reply,
                 std::vector<std::uint64_t>& exported, HRESULT* status);
    bool FindExport(std::uint64_t id, Exported* found);
    void Log(const std::string& text) const;

    const int m_fd;
    const LocalSocketOptions m_options;
    const CComPtr<IUnknown> m_root;
    const std::string m_peer;
    bool m_helloSeen = false;  // used by the reader thread only

    std::mutex m_writeLock;  // guards writing to m_fd: one frame at a time

    mutable std::mutex m_lock;              // guards every member below
    std::condition_variable m_replied;      // a reply arrived or the connection broke
    std::condition_variable m_work;         // a call arrived or the connection broke
    std::condition_variable m_threadEnded;  // m_threads went down
    bool m_broken = false;
    std::uint32_t m_nextCall = 1;
    std::map<std::uint32_t, std::shared_ptr<Pending>> m_pending;
    std::uint64_t m_nextExport = 1;
    std::map<std::uint64_t, Exported> m_exports;
    std::vector<Advised> m_advised;  // advises the peer made here, ended when it goes
    std::deque<std::vector<std::uint8_t>> m_calls;
    int m_workers = 0;
    int m_idle = 0;
    int m_threads = 0;
    std::vector<std::thread::id> m_threadIds;
};
