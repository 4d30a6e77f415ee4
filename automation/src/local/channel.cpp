#include "local/channel.h"

#include "local/proxy.h"

#include "automation/error.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

using namespace automation_wire;

namespace {

constexpr int kMaxWorkers = 8;

}  // namespace

std::shared_ptr<CChannel> CChannel::Start(int fd, const LocalSocketOptions& options, CComPtr<IUnknown> root,
                                          std::string peer) {
    std::shared_ptr<CChannel> channel(new CChannel(fd, options, std::move(root), std::move(peer)));
    Writer hello(Kind::Hello);
    hello.U32(kMagic);
    hello.U16(kVersion);
    hello.Finish();
    // The greeting goes first: nothing this end sends may precede it.
    if (!channel->SendFrame(hello.Bytes())) channel->Broken("cannot greet the peer");
    {
        std::lock_guard lock(channel->m_lock);
        channel->m_threads = 1;
    }
    std::thread([channel] { channel->ReadLoop(); }).detach();
    return channel;
}

CChannel::CChannel(int fd, const LocalSocketOptions& options, CComPtr<IUnknown> root, std::string peer)
    : m_fd(fd), m_options(options), m_root(std::move(root)), m_peer(std::move(peer)) {}

CChannel::~CChannel() { ::close(m_fd); }

void CChannel::Log(const std::string& text) const {
    if (m_options.log) m_options.log(m_peer + ": " + text);
}

bool CChannel::IsBroken() const {
    std::lock_guard lock(m_lock);
    return m_broken;
}

void CChannel::Broken(const std::string& reason) {
    {
        std::lock_guard lock(m_lock);
        if (m_broken) return;
        m_broken = true;
    }
    m_replied.notify_all();
    m_work.notify_all();
    ::shutdown(m_fd, SHUT_RDWR);  // wakes the reader
    if (reason.empty()) return;
    Log(reason);
    if (m_options.lost) m_options.lost();
}

void CChannel::Close() {
    Broken({});
    const auto self = std::this_thread::get_id();
    std::unique_lock lock(m_lock);
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(m_options.callTimeoutMs);
    m_threadEnded.wait_until(lock, deadline, [&] {
        return std::all_of(m_threadIds.begin(), m_threadIds.end(), [&](std::thread::id id) { return id == self; }) &&
               m_threads == static_cast<int>(m_threadIds.size());
    });
}

void CChannel::ThreadEnded() {
    {
        std::lock_guard lock(m_lock);
        --m_threads;
        const auto it = std::find(m_threadIds.begin(), m_threadIds.end(), std::this_thread::get_id());
        if (it != m_threadIds.end()) m_threadIds.erase(it);
    }
    m_threadEnded.notify_all();
}

// ---- sending ---------------------------------------------------------------

bool CChannel::SendFrame(const std::vector<std::uint8_t>& frame) {
    std::lock_guard write(m_writeLock);
    size_t sent = 0;
    while (sent < frame.size()) {
        const ssize_t n = ::send(m_fd, frame.data() + sent, frame.size() - sent, MSG_NOSIGNAL | MSG_DONTWAIT);
        if (n > 0) {
            sent += static_cast<size_t>(n);
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
            // The peer reads too slowly: wait for room, but not for ever.
            pollfd p{m_fd, POLLOUT, 0};
            const int ready = ::poll(&p, 1, static_cast<int>(m_options.frameTimeoutMs));
            if (ready > 0 && !(p.revents & (POLLERR | POLLHUP | POLLNVAL))) continue;
            if (ready < 0 && errno == EINTR) continue;
        }
        return false;
    }
    return true;
}

HRESULT CChannel::Call(Op op, const Body& body, const ReplyReader& read) {
    Writer w(Kind::Call);
    auto pending = std::make_shared<Pending>();
    std::uint32_t id = 0;
    {
        std::lock_guard lock(m_lock);
        if (m_broken) return RPC_E_DISCONNECTED;
        id = m_nextCall++;
        if (m_nextCall == 0) m_nextCall = 1;
    }
    w.U32(id);
    w.U8(static_cast<std::uint8_t>(op));
    std::vector<std::uint64_t> exported;
    HRESULT hr = body(w, exported);
    if (SUCCEEDED(hr) && !w.Finish()) hr = E_OUTOFMEMORY;  // larger than a frame may be
    if (FAILED(hr)) {
        for (std::uint64_t e : exported) Unexport(e);
        return hr;
    }
    {
        std::lock_guard lock(m_lock);
        if (m_broken) return RPC_E_DISCONNECTED;
        m_pending.emplace(id, pending);
    }
    if (!SendFrame(w.Bytes())) Broken("cannot send a call");
    std::unique_lock lock(m_lock);
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(m_options.callTimeoutMs);
    const bool answered = m_replied.wait_until(lock, deadline, [&] { return pending->done || m_broken; });
    m_pending.erase(id);
    if (!pending->done) return answered ? RPC_E_DISCONNECTED : RPC_E_TIMEOUT;
    lock.unlock();

    // Reply: kind, call number, status, then the operation's fields.
    Reader r(pending->frame.data() + 5, pending->frame.size() - 5);
    std::int32_t status = 0;
    if (!r.I32(&status) || (read && !read(status, r)) || !r.AtEnd()) {
        Broken("malformed reply");
        return RPC_E_DISCONNECTED;
    }
    return status;
}

void CChannel::SendRelease(std::uint64_t id) {
    if (IsBroken()) return;
    Writer w(Kind::Release);
    w.U64(id);
    w.Finish();
    if (!SendFrame(w.Bytes())) Broken("cannot send a release");
}

// ---- objects ---------------------------------------------------------------

std::uint64_t CChannel::Export(IUnknown* object, bool isDispatch) {
    std::lock_guard lock(m_lock);
    const std::uint64_t id = m_nextExport++;
    m_exports.emplace(id, Exported{CComPtr<IUnknown>(object), isDispatch});
    return id;
}

void CChannel::Unexport(std::uint64_t id) {
    CComPtr<IUnknown> released;  // after the lock
    std::lock_guard lock(m_lock);
    const auto it = m_exports.find(id);
    if (it == m_exports.end()) return;
    released = std::move(it->second.object);
    m_exports.erase(it);
}

CComPtr<IDispatch> CChannel::Import(std::uint64_t id) {
    return CComPtr<IDispatch>::Adopt(new CDispatchProxy(shared_from_this(), id));
}

bool CChannel::FindExport(std::uint64_t id, Exported* found) {
    std::lock_guard lock(m_lock);
    const auto it = m_exports.find(id);
    if (it == m_exports.end()) return false;
    *found = it->second;
    return true;
}

void CChannel::ReleaseEverything() {
    std::map<std::uint64_t, Exported> exports;
    std::vector<Advised> advised;
    {
        std::lock_guard lock(m_lock);
        exports.swap(m_exports);
        advised.swap(m_advised);
    }
    // The peer is gone: end its advises and drop its references, outside the lock.
    for (Advised& a : advised) a.point->Unadvise(a.cookie);
    advised.clear();
    exports.clear();
}

// ---- receiving -------------------------------------------------------------

bool CChannel::ReadExact(std::uint8_t* data, size_t size, bool mayIdle) {
    size_t got = 0;
    while (got < size) {
        const ssize_t n = ::recv(m_fd, data + got, size - got, MSG_DONTWAIT);
        if (n > 0) {
            got += static_cast<size_t>(n);
            continue;
        }
        if (n == 0) return false;  // the peer closed
        if (errno == EINTR) continue;
        if (errno != EAGAIN && errno != EWOULDBLOCK) return false;
        // Between frames the connection may idle; inside a frame the rest must come soon.
        pollfd p{m_fd, POLLIN, 0};
        const int timeout = (mayIdle && got == 0) ? -1 : static_cast<int>(m_options.frameTimeoutMs);
        const int ready = ::poll(&p, 1, timeout);
        if (ready < 0 && errno == EINTR) continue;
        if (ready <= 0) return false;
        if (IsBroken()) return false;
    }
    return true;
}

bool CChannel::ReadFrame(std::vector<std::uint8_t>* frame) {
    std::uint32_t length = 0;
    if (!ReadExact(reinterpret_cast<std::uint8_t*>(&length), 4, true)) return false;
    if (length == 0 || length > kMaxFrame) {
        Broken("frame of a size out of bounds");
        return false;
    }
    frame->resize(length);
    return ReadExact(frame->data(), length, false);
}

void CChannel::ReadLoop() {
    {
        std::lock_guard lock(m_lock);
        m_threadIds.push_back(std::this_thread::get_id());
    }
    std::vector<std::uint8_t> frame;
    while (!IsBroken()) {
        if (!ReadFrame(&frame)) {
            Broken("disconnected");
            break;
        }
        if (!TakeFrame(std::move(frame))) {
            Broken("malformed frame");
            break;
        }
        frame = {};
    }
    ReleaseEverything();
    ThreadEnded();
}

bool CChannel::TakeFrame(std::vector<std::uint8_t> frame) {
    Reader r(frame.data(), frame.size());
    std::uint8_t kind = 0;
    r.U8(&kind);
    if (!m_helloSeen) {
        std::uint32_t magic = 0;
        std::uint16_t version = 0;
        if (kind != static_cast<std::uint8_t>(Kind::Hello) || !r.U32(&magic) || !r.U16(&version) || !r.AtEnd() ||
            magic != kMagic || version != kVersion)
            return false;
        m_helloSeen = true;
        return true;
    }
    switch (static_cast<Kind>(kind)) {
    case Kind::Reply: {
        std::uint32_t id = 0;
        if (!r.U32(&id) || r.Left() < 4) return false;
        {
            std::lock_guard lock(m_lock);
            const auto it = m_pending.find(id);
            if (it == m_pending.end()) return true;  // its caller gave up waiting
            it->second->frame = std::move(frame);
            it->second->done = true;
        }
        m_replied.notify_all();
        return true;
    }
    case Kind::Call:
        if (r.Left() < 5) return false;
        QueueCall(std::move(frame));
        return true;
    case Kind::Release: {
        std::uint64_t id = 0;
        if (!r.U64(&id) || !r.AtEnd()) return false;
        CComPtr<IUnknown> released;  // after the lock
        std::lock_guard lock(m_lock);
        const auto it = m_exports.find(id);
        if (it == m_exports.end()) return false;
        released = std::move(it->second.object);
        m_exports.erase(it);
        return true;
    }
    default: return false;
    }
}

void CChannel::QueueCall(std::vector<std::uint8_t> frame) {
    bool startWorker = false;
    {
        std::lock_guard lock(m_lock);
        m_calls.push_back(std::move(frame));
        if (m_idle == 0 && m_workers < kMaxWorkers) {
            ++m_workers;
            ++m_threads;
            startWorker = true;
        }
    }
    if (startWorker) std::thread([self = shared_from_this()] { self->WorkLoop(); }).detach();
    else m_work.notify_one();
}

void CChannel::WorkLoop() {
    std::unique_lock lock(m_lock);
    m_threadIds.push_back(std::this_thread::get_id());
    for (;;) {
        ++m_idle;
        m_work.wait(lock, [&] { return m_broken || !m_calls.empty(); });
        --m_idle;
        if (m_broken) break;
        std::vector<std::uint8_t> frame = std::move(m_calls.front());
        m_calls.pop_front();
        lock.unlock();
        HandleCall(frame);
        lock.lock();
    }
    --m_workers;
    lock.unlock();
    ThreadEnded();
}

void CChannel::HandleCall(const std::vector<std::uint8_t>& frame) {
    Reader r(frame.data() + 1, frame.size() - 1);
    std::uint32_t id = 0;
    std::uint8_t op = 0;
    r.U32(&id);
    r.U8(&op);
    Writer reply(Kind::Reply);
    reply.U32(id);
    const size_t statusAt = reply.Size();
    reply.I32(0);
    std::vector<std::uint64_t> exported;
    HRESULT status = S_OK;
    if (!Execute(static_cast<Op>(op), r, reply, exported, &status)) {
        for (std::uint64_t e : exported) Unexport(e);
        Broken("malformed call");
        return;
    }
    if (!reply.Finish()) {  // the answer is too large to send: say so instead
        for (std::uint64_t e : exported) Unexport(e);
        reply.Truncate(statusAt + 4);
        status = E_OUTOFMEMORY;
        reply.Finish();
    }
    reply.Patch32(statusAt, static_cast<std::uint32_t>(status));
    if (!SendFrame(reply.Bytes())) Broken("cannot send a reply");
}

bool CChannel::Execute(Op op, Reader& r, Writer& reply, std::vector<std::uint64_t>& exported, HRESULT* status) {
    std::uint64_t objectId = 0;
    Exported target;
    auto lookUp = [&] {
        if (!r.U64(&objectId)) return false;
        if (!FindExport(objectId, &target)) *status = CO_E_OBJNOTCONNECTED;
        return true;
    };
    switch (op) {
    case Op::Root: {
        if (!r.AtEnd()) return false;
        CComPtr<IDispatch> root;
        if (!m_root || FAILED(m_root.QueryInterface(IID_IDispatch, root))) {
            *status = MK_E_UNAVAILABLE;
            reply.U64(0);
            return true;
        }
        const std::uint64_t id = Export(root.Get(), true);
        exported.push_back(id);
        reply.U64(id);
        return true;
    }
    case Op::QueryInterface: {
        IID iid{};
        if (!lookUp() || !r.Guid(&iid) || !r.AtEnd()) return false;
        if (FAILED(*status)) return true;
        CComPtr<IUnknown> answer;
        *status = target.object->QueryInterface(iid, answer.ReceiveVoid());
        return true;
    }
    case Op::FindConnectionPoint: {
        IID iid{};
        if (!lookUp() || !r.Guid(&iid) || !r.AtEnd()) return false;
        CComPtr<IConnectionPointContainer> container;
        CComPtr<IConnectionPoint> point;
        if (SUCCEEDED(*status)) *status = target.object.QueryInterface(IID_IConnectionPointContainer, container);
        if (SUCCEEDED(*status)) *status = container->FindConnectionPoint(iid, point.Receive());
        if (SUCCEEDED(*status) && !point) *status = E_UNEXPECTED;
        std::uint64_t id = 0;
        if (SUCCEEDED(*status)) {
            id = Export(point.Get(), false);
            exported.push_back(id);
        }
        reply.U64(id);
        return true;
    }
    case Op::Advise: {
        std::uint64_t sinkId = 0;
        if (!lookUp() || !r.U64(&sinkId) || sinkId == 0 || !r.AtEnd()) return false;
        // The sink is imported in every case, so that the peer's reference on it is given back.
        CComPtr<IDispatch> sink = Import(sinkId);
        CComPtr<IConnectionPoint> point;
        if (SUCCEEDED(*status)) *status = target.object.QueryInterface(IID_IConnectionPoint, point);
        DWORD cookie = 0;
        if (SUCCEEDED(*status)) *status = point->Advise(sink.Get(), &cookie);
        if (SUCCEEDED(*status)) {
            std::lock_guard lock(m_lock);
            m_advised.push_back({point, cookie});
        }
        reply.U32(cookie);
        return true;
    }
    case Op::Unadvise: {
        std::uint32_t cookie = 0;
        if (!lookUp() || !r.U32(&cookie) || !r.AtEnd()) return false;
        CComPtr<IConnectionPoint> point;
        if (SUCCEEDED(*status)) *status = target.object.QueryInterface(IID_IConnectionPoint, point);
        if (SUCCEEDED(*status)) *status = point->Unadvise(cookie);
        Advised ended;  // released after the lock
        if (SUCCEEDED(*status)) {
            std::lock_guard lock(m_lock);
            const auto it = std::find_if(m_advised.begin(), m_advised.end(),
                                         [&](const Advised& a) { return a.point == point && a.cookie == cookie; });
            if (it != m_advised.end()) {
                ended = std::move(*it);
                m_advised.erase(it);
            }
        }
        return true;
    }
    case Op::Invoke: {
        std::int32_t member = 0;
        std::uint16_t flags = 0;
        std::uint8_t wantResult = 0;
        std::uint32_t count = 0;
        if (!lookUp() || !r.I32(&member) || !r.U16(&flags) || !r.U8(&wantResult) || wantResult > 1 || !r.U32(&count))
            return false;
        Args args;
        if (!ReadArgs(r, count, &args, *this) || !r.AtEnd()) return false;
        if (FAILED(*status)) return true;
        CComPtr<IDispatch> dispatch;
        if (target.isDispatch) dispatch = static_cast<IDispatch*>(target.object.Get());
        else if (FAILED(target.object.QueryInterface(IID_IDispatch, dispatch))) {
            *status = E_NOINTERFACE;
            return true;
        }
        DISPPARAMS params{count ? args.slots.data() : nullptr, nullptr, count, 0};
        CComVariant result;
        EXCEPINFO info{0, nullptr, nullptr, 0};
        *status = dispatch->Invoke(member, flags, &params, wantResult ? &result : nullptr, &info);
        if (SUCCEEDED(*status) && wantResult) {
            const size_t at = reply.Size();
            if (const HRESULT hr = WriteVariant(reply, result, *this, false, exported); FAILED(hr)) {
                for (std::uint64_t e : exported) Unexport(e);
                exported.clear();
                reply.Truncate(at);
                *status = hr;
            }
        }
        if (*status == DISP_E_EXCEPTION) {
            reply.U16(info.wCode);
            reply.I32(info.scode);
            WriteText(reply, info.bstrSource);
            WriteText(reply, info.bstrDescription);
        }
        ClearExcepInfo(&info);
        return true;
    }
    }
    return false;
}
