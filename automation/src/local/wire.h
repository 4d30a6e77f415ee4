#pragma once
// The byte form of the local-socket transport.
//
// A frame is a 32-bit length (host order: both ends share one machine)
// followed by that many bytes: a kind byte and the kind's fields. Every field
// is read through Reader, which fails instead of reading past the frame; a
// frame that fails to read, or has bytes left over, is a protocol error.

#include "automation/comptr.h"
#include "automation/comvariant.h"

#include <cstdint>
#include <cstring>
#include <vector>

namespace automation_wire {

constexpr std::uint32_t kMagic = 0x55414B53;  // "SKAU"
constexpr std::uint16_t kVersion = 1;
constexpr std::uint32_t kMaxFrame = 64u << 20;  // a bulk change of about a million values fits
constexpr std::uint32_t kMaxArgs = 64;
// Elements of one array: bounds what a frame may make the receiver allocate
// (a variant element is 2 bytes on the wire, 24 in memory).
constexpr std::uint32_t kMaxElements = 1u << 22;
constexpr int kMaxDepth = 4;  // variants inside variants (by-reference targets, variant arrays)

enum class Kind : std::uint8_t { Hello = 1, Call = 2, Reply = 3, Release = 4 };
enum class Op : std::uint8_t {
    Root = 1,
    QueryInterface = 2,
    Invoke = 3,
    FindConnectionPoint = 4,
    Advise = 5,
    Unadvise = 6
};

class Writer {
public:
    // Starts a frame of this kind; Finish fills in its length.
    explicit Writer(Kind kind) : m_bytes(4, 0) { U8(static_cast<std::uint8_t>(kind)); }
    void U8(std::uint8_t v) { m_bytes.push_back(v); }
    void U16(std::uint16_t v) { Raw(&v, sizeof v); }
    void U32(std::uint32_t v) { Raw(&v, sizeof v); }
    void I32(std::int32_t v) { Raw(&v, sizeof v); }
    void U64(std::uint64_t v) { Raw(&v, sizeof v); }
    void Guid(const GUID& g) { Raw(&g, sizeof g); }
    void Raw(const void* data, size_t size) {
        const auto* p = static_cast<const std::uint8_t*>(data);
        m_bytes.insert(m_bytes.end(), p, p + size);
    }
    size_t Size() const { return m_bytes.size(); }
    void Patch32(size_t at, std::uint32_t v) { std::memcpy(m_bytes.data() + at, &v, 4); }
    void Truncate(size_t size) { m_bytes.resize(size); }
    // The frame ready to send; false when it is larger than a frame may be.
    bool Finish() {
        const size_t length = m_bytes.size() - 4;
        if (length > kMaxFrame) return false;
        const auto n = static_cast<std::uint32_t>(length);
        std::memcpy(m_bytes.data(), &n, 4);
        return true;
    }
    const std::vector<std::uint8_t>& Bytes() const { return m_bytes; }

private:
    std::vector<std::uint8_t> m_bytes;
};

class Reader {
public:
    Reader(const std::uint8_t* data, size_t size) : m_p(data), m_left(size) {}
    bool U8(std::uint8_t* v) { return Raw(v, sizeof *v); }
    bool U16(std::uint16_t* v) { return Raw(v, sizeof *v); }
    bool U32(std::uint32_t* v) { return Raw(v, sizeof *v); }
    bool I32(std::int32_t* v) { return Raw(v, sizeof *v); }
    bool U64(std::uint64_t* v) { return Raw(v, sizeof *v); }
    bool Guid(GUID* g) { return Raw(g, sizeof *g); }
    bool Raw(void* out, size_t size) {
        if (size > m_left) return false;
        std::memcpy(out, m_p, size);
        m_p += size;
        m_left -= size;
        return true;
    }
    size_t Left() const { return m_left; }
    bool AtEnd() const { return m_left == 0; }

private:
    const std::uint8_t* m_p;
    size_t m_left;
};

// How interface pointers cross: the sender exports the object under a number,
// the receiver makes a proxy for that number.
class IObjectMarshal {
public:
    virtual std::uint64_t Export(IUnknown* object, bool isDispatch) = 0;
    virtual void Unexport(std::uint64_t id) = 0;  // for a frame that is never sent
    virtual CComPtr<IDispatch> Import(std::uint64_t id) = 0;

protected:
    ~IObjectMarshal() = default;
};

// Writes a variant. A by-reference variant is written as its target's value,
// except as a call's top-level argument (keepByRef), where the reference
// survives as a reference to the receiver's copy. Objects are exported (and
// their numbers added to exported). DISP_E_BADVARTYPE for a type that cannot cross.
HRESULT WriteVariant(Writer& w, const VARIANT& v, IObjectMarshal& marshal, bool keepByRef,
                     std::vector<std::uint64_t>& exported, int depth = 0);
// Reads a variant written without keepByRef into out (VT_EMPTY on entry),
// which then owns its contents. False for anything malformed.
bool ReadVariant(Reader& r, VARIANT* out, IObjectMarshal& marshal, int depth = 0);

// A call's arguments as the receiver holds them: owned values, and the slots
// handed to Invoke, where a by-reference argument points at its owned value.
struct Args {
    std::vector<CComVariant> owned;
    std::vector<VARIANT> slots;
};
bool ReadArgs(Reader& r, std::uint32_t count, Args* args, IObjectMarshal& marshal);

void WriteText(Writer& w, const char16_t* text);  // a BSTR; null stays null
bool ReadText(Reader& r, BSTR* text);

}  // namespace automation_wire
