#include "vxhelper/profile.h"

#include "logwriter.h"

#include "vxhelper/IniDocument.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr off_t kMaxFileBytes = 16 * 1024 * 1024;

// One file as the profile functions see it.
struct ProfileFile {
    VX_CIniDocument doc;
    bool writable = true;    // false when the file exists but could not be read
    bool dirty = false;      // a session holds writes not yet saved
    bool reencoded = false;  // those writes turned a Windows-1252 file into UTF-16LE
    int sessions = 0;
};

std::mutex g_lock;                              // guards g_sessions; serialises every read-modify-write
std::map<std::string, ProfileFile> g_sessions;  // path -> file held by open sessions

std::string PathOf(LPCWSTR path) { return path ? Utf16ToUtf8(path) : std::string(); }

// Called with no lock of this file held.
void LogReencoded(const std::string& path) {
    VX_WriteInfoRecord(CString::FromUtf8("The settings file " + path +
                                         " was rewritten as UTF-16LE with a byte-order mark: a value written to it "
                                         "does not fit its Windows-1252 code page"));
}

// Reads a file; a missing file reads as empty and writable, anything that is
// not a readable regular file of sensible size as empty and not writable.
ProfileFile Load(const std::string& path) {
    ProfileFile file;
    if (path.empty()) {
        file.writable = false;
        return file;
    }
    // O_NONBLOCK: opening a FIFO must not wait for a writer.
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (fd < 0) {
        file.writable = errno == ENOENT;
        return file;
    }
    struct stat st {};
    std::string bytes;
    bool ok = ::fstat(fd, &st) == 0 && S_ISREG(st.st_mode) && st.st_size <= kMaxFileBytes;
    if (ok) {
        bytes.resize(static_cast<size_t>(st.st_size));
        size_t done = 0;
        while (ok && done < bytes.size()) {
            const ssize_t n = ::read(fd, bytes.data() + done, bytes.size() - done);
            if (n < 0 && errno == EINTR) continue;
            if (n <= 0) ok = n == 0;  // the file shrank while we read: keep what is there
            if (n <= 0) break;
            done += static_cast<size_t>(n);
        }
        bytes.resize(done);
    }
    ::close(fd);
    if (!ok) {
        file.writable = false;
        return file;
    }
    file.doc = VX_CIniDocument::Parse(bytes);
    return file;
}

bool WriteAll(int fd, const std::string& bytes) {
    size_t done = 0;
    while (done < bytes.size()) {
        const ssize_t n = ::write(fd, bytes.data() + done, bytes.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        done += static_cast<size_t>(n);
    }
    return true;
}

// Replaces the file atomically: temporary file beside it, flushed, renamed over it.
bool Save(const std::string& path, const std::string& bytes) {
    std::string target = path;
    struct stat st {};
    if (::lstat(path.c_str(), &st) == 0 && S_ISLNK(st.st_mode)) {
        // Replace the link's target and keep the link.
        char* resolved = ::realpath(path.c_str(), nullptr);
        if (!resolved) return false;
        target = resolved;
        std::free(resolved);
    }
    const bool exists = ::stat(target.c_str(), &st) == 0;
    if (exists && !S_ISREG(st.st_mode)) return false;

    static std::atomic<unsigned> counter{0};
    const std::string temp = target + ".tmp-" + std::to_string(::getpid()) + "-" + std::to_string(counter++);
    const int fd = ::open(temp.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666);
    if (fd < 0) return false;
    bool ok = true;
    if (exists) ::fchmod(fd, st.st_mode & 07777);  // keep the file's permissions; best effort
    ok = WriteAll(fd, bytes) && ::fsync(fd) == 0;
    ok = ::close(fd) == 0 && ok;
    ok = ok && ::rename(temp.c_str(), target.c_str()) == 0;
    if (!ok) {
        ::unlink(temp.c_str());
        return false;
    }
    // Make the rename itself durable.
    const size_t slash = target.rfind('/');
    const std::string dir = slash == std::string::npos ? "." : (slash == 0 ? "/" : target.substr(0, slash));
    if (const int dirFd = ::open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC); dirFd >= 0) {
        ::fsync(dirFd);
        ::close(dirFd);
    }
    return true;
}

// Runs op on the file, under the lock: on the session's copy when a session
// holds the path, else on a fresh read of the file.
template <typename Op>
auto WithFile(const std::string& path, Op op) {
    std::lock_guard lock(g_lock);
    if (auto it = g_sessions.find(path); it != g_sessions.end()) return op(it->second, true);
    ProfileFile file = Load(path);
    return op(file, false);
}

bool ParseInt(std::u16string_view text, int& value) {
    size_t i = 0;
    while (i < text.size() && (text[i] == u' ' || text[i] == u'\t')) ++i;
    bool negative = false;
    if (i < text.size() && (text[i] == u'-' || text[i] == u'+')) negative = text[i++] == u'-';
    const size_t firstDigit = i;
    long long number = 0;
    for (; i < text.size() && text[i] >= u'0' && text[i] <= u'9'; ++i) {
        number = number * 10 + (text[i] - u'0');
        if (number > static_cast<long long>(INT_MAX) + 1) return false;
    }
    if (i == firstDigit) return false;
    if (negative) number = -number;
    if (number > INT_MAX || number < INT_MIN) return false;
    value = static_cast<int>(number);
    return true;
}

std::optional<std::u16string> Lookup(LPCWSTR section, LPCWSTR key, LPCWSTR path) {
    if (!section || !key || !path) return std::nullopt;
    return WithFile(PathOf(path), [&](ProfileFile& file, bool) { return file.doc.GetValue(section, key); });
}

}  // namespace

int VX_GetPrivateProfileInt(LPCWSTR section, LPCWSTR key, int defaultValue, LPCWSTR path) {
    const auto text = Lookup(section, key, path);
    int value = defaultValue;
    if (!text || !ParseInt(*text, value)) return defaultValue;
    return value;
}

DWORD VX_GetPrivateProfileString(LPCWSTR section, LPCWSTR key, LPCWSTR defaultValue, LPWSTR buffer, DWORD size,
                                 LPCWSTR path) {
    if (!buffer || size == 0) return 0;
    const auto found = Lookup(section, key, path);
    const std::u16string_view text = found ? std::u16string_view(*found)
                                           : std::u16string_view(defaultValue ? defaultValue : u"");
    size_t n = std::min<size_t>(text.size(), size - 1);
    if (n < text.size() && n > 0 && text[n - 1] >= 0xD800 && text[n - 1] <= 0xDBFF) --n;  // keep pairs whole
    text.copy(buffer, n);
    buffer[n] = 0;
    return static_cast<DWORD>(n);
}

bool VX_WritePrivateProfileInt(LPCWSTR section, LPCWSTR key, int value, LPCWSTR path) {
    return VX_WritePrivateProfileString(section, key, CString::Formatted(u"%d", value), path);
}

bool VX_WritePrivateProfileString(LPCWSTR section, LPCWSTR key, LPCWSTR value, LPCWSTR path) {
    if (!section || !key || !value || !path) return false;
    bool reencoded = false;
    const bool ok = WithFile(PathOf(path), [&](ProfileFile& file, bool inSession) {
        if (!file.writable) return false;
        const auto encoding = file.doc.GetEncoding();
        if (!file.doc.SetValue(section, key, value)) return false;
        const bool changed = file.doc.GetEncoding() != encoding;
        if (inSession) {
            file.dirty = true;
            file.reencoded = file.reencoded || changed;
            return true;
        }
        reencoded = changed;
        return Save(PathOf(path), file.doc.Serialize());
    });
    if (ok && reencoded) LogReencoded(PathOf(path));
    return ok;
}

bool VX_GetPrivateProfileKeyNames(LPCWSTR section, CStringArray& keys, LPCWSTR path) {
    keys.RemoveAll();
    if (!section || !path) return false;
    return WithFile(PathOf(path), [&](ProfileFile& file, bool) {
        const auto names = file.doc.GetKeyNames(section);
        for (const auto& name : names) keys.Add(CString(name));
        return file.doc.HasSection(section);
    });
}

// ---- sessions ---------------------------------------------------------------

VX_CPrivateProfileSession::VX_CPrivateProfileSession(LPCWSTR path) : m_path(PathOf(path)) {
    std::lock_guard lock(g_lock);
    auto it = g_sessions.find(m_path);
    if (it == g_sessions.end()) it = g_sessions.emplace(m_path, Load(m_path)).first;
    ++it->second.sessions;
}

VX_CPrivateProfileSession::~VX_CPrivateProfileSession() {
    Commit();
    std::lock_guard lock(g_lock);
    auto it = g_sessions.find(m_path);
    if (it != g_sessions.end() && --it->second.sessions == 0) g_sessions.erase(it);
}

namespace {

// Drops a session's pending changes: it reads the file as it is now.
void Reload(const std::string& path, ProfileFile& file) {
    const int sessions = file.sessions;
    file = Load(path);
    file.sessions = sessions;
}

}  // namespace

bool VX_CPrivateProfileSession::Commit() {
    bool reencoded = false;
    {
        std::lock_guard lock(g_lock);
        auto it = g_sessions.find(m_path);
        if (it == g_sessions.end() || !it->second.dirty) return true;
        if (!it->second.writable || !Save(m_path, it->second.doc.Serialize())) {
            // A commit that failed never writes later (the session's end would retry
            // it): a caller told that nothing was written must find the file unchanged.
            Reload(m_path, it->second);
            return false;
        }
        it->second.dirty = false;
        reencoded = std::exchange(it->second.reencoded, false);
    }
    if (reencoded) LogReencoded(m_path);
    return true;
}

void VX_CPrivateProfileSession::Discard() {
    std::lock_guard lock(g_lock);
    auto it = g_sessions.find(m_path);
    if (it != g_sessions.end()) Reload(m_path, it->second);
}
