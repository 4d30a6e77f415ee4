#pragma once
// CString: the module's UTF-16 text, with the operations the module and its
// neighbours call. Narrow texts crossing into it are UTF-8.

#include "platform/types.h"

#include <concepts>
#include <cstddef>
#include <functional>
#include <iosfwd>
#include <string>
#include <string_view>

// UTF-8 <-> UTF-16. Invalid input (bad UTF-8 sequences, lone surrogates)
// becomes U+FFFD, so any text converts without failing.
std::u16string Utf8ToUtf16(std::string_view utf8);
std::string Utf16ToUtf8(std::u16string_view utf16);
// Strict UTF-8: no broken or overlong sequences, no surrogates, nothing beyond U+10FFFF.
bool IsValidUtf8(std::string_view bytes);

// One argument of CString::Format, captured with its real type so that a
// conversion never reads an argument as something it is not.
struct FormatArg {
    enum class Kind { Signed, Unsigned, Floating, Text16, Text8, Pointer, Char };
    Kind kind;
    int bytes = 0;  // width of an integer argument, for %u and %x of negative numbers
    union {
        long long s;
        unsigned long long u;
        double f;
        const void* p;
    };
    std::u16string_view text16;
    std::string_view text8;

    template <std::integral T>
    requires(!std::same_as<T, bool> && !std::same_as<T, char16_t> && !std::same_as<T, char>) FormatArg(T v)
        : bytes(sizeof(T)) {
        if constexpr (std::is_signed_v<T>) {
            kind = Kind::Signed;
            s = v;
        } else {
            kind = Kind::Unsigned;
            u = v;
        }
    }
    FormatArg(bool v) : kind(Kind::Signed), bytes(sizeof(int)), s(v ? 1 : 0) {}
    FormatArg(char16_t c) : kind(Kind::Char), bytes(2), u(c) {}
    FormatArg(char c) : kind(Kind::Char), bytes(1), u(static_cast<unsigned char>(c)) {}
    FormatArg(double v) : kind(Kind::Floating), f(v) {}
    FormatArg(float v) : kind(Kind::Floating), f(v) {}
    FormatArg(const char16_t* t) : kind(Kind::Text16), p(t), text16(t ? t : u"(null)") {}
    FormatArg(char16_t* t) : FormatArg(static_cast<const char16_t*>(t)) {}
    FormatArg(std::u16string_view t) : kind(Kind::Text16), p(t.data()), text16(t) {}
    FormatArg(const std::u16string& t) : FormatArg(std::u16string_view(t)) {}
    FormatArg(const class CString& t);
    FormatArg(const char* t) : kind(Kind::Text8), p(t), text8(t ? t : "(null)") {}
    FormatArg(char* t) : FormatArg(static_cast<const char*>(t)) {}
    FormatArg(const std::string& t) : kind(Kind::Text8), p(t.data()), text8(t) {}
    FormatArg(std::nullptr_t) : kind(Kind::Pointer), p(nullptr) {}
    template <typename T>
    FormatArg(T* ptr) : kind(Kind::Pointer), p(static_cast<const void*>(ptr)) {}
};

class CString {
public:
    CString() = default;
    CString(const char16_t* text) : m_str(text ? text : u"") {}
    CString(const char16_t* text, int length)
        : m_str(text ? std::u16string(text, static_cast<size_t>(length > 0 ? length : 0)) : std::u16string()) {}
    CString(char16_t ch, int repeat = 1) : m_str(static_cast<size_t>(repeat > 0 ? repeat : 0), ch) {}
    CString(std::u16string text) : m_str(std::move(text)) {}
    CString(std::u16string_view text) : m_str(text) {}
    // Narrow text is read as UTF-8.
    CString(const char* utf8) : m_str(utf8 ? Utf8ToUtf16(utf8) : std::u16string()) {}
    CString(const std::string& utf8) : m_str(Utf8ToUtf16(utf8)) {}

    static CString FromUtf8(std::string_view utf8) { return CString(Utf8ToUtf16(utf8)); }
    std::string ToUtf8() const { return Utf16ToUtf8(m_str); }

    int GetLength() const { return static_cast<int>(m_str.size()); }
    bool IsEmpty() const { return m_str.empty(); }
    void Empty() { m_str.clear(); }
    const char16_t* GetString() const { return m_str.c_str(); }
    operator const char16_t*() const { return m_str.c_str(); }
    const std::u16string& Str() const { return m_str; }
    std::u16string_view View() const { return m_str; }

    char16_t GetAt(int index) const { return m_str.at(static_cast<size_t>(index)); }
    void SetAt(int index, char16_t ch) { m_str.at(static_cast<size_t>(index)) = ch; }
    char16_t operator[](int index) const { return GetAt(index); }

    // Exact comparison (<0, 0, >0) and comparison ignoring letter case.
    int Compare(const char16_t* other) const;
    int CompareNoCase(const char16_t* other) const;

    // Positions are 0-based; -1 when not found.
    int Find(char16_t ch, int start = 0) const;
    int Find(const char16_t* sub, int start = 0) const;
    int ReverseFind(char16_t ch) const;

    // Substrings clamp their arguments to the text, as the class library does.
    CString Left(int count) const;
    CString Mid(int first) const;
    CString Mid(int first, int count) const;
    CString Right(int count) const;

    CString& MakeUpper();
    CString& MakeLower();
    CString& Trim();
    CString& TrimLeft();
    CString& TrimRight();
    int Replace(const char16_t* old, const char16_t* replacement);
    int Remove(char16_t ch);

    // Direct access for APIs that fill a buffer: at least minLength characters
    // plus a terminator; ReleaseBuffer(-1) takes the length up to the first 0.
    char16_t* GetBuffer(int minLength);
    void ReleaseBuffer(int newLength = -1);

    // printf-style formatting: %s (any text), %c, %d/%i, %u, %x/%X, %o, %p,
    // %e/%f/%g, with flags, width, precision and '*'. Each argument is
    // written according to its real type, so a mismatch never misreads memory.
    template <typename... Args>
    void Format(const char16_t* format, const Args&... args) {
        const FormatArg list[] = {FormatArg(args)..., FormatArg(0)};
        m_str = FormatList(format, list, sizeof...(Args));
    }
    template <typename... Args>
    void AppendFormat(const char16_t* format, const Args&... args) {
        const FormatArg list[] = {FormatArg(args)..., FormatArg(0)};
        m_str += FormatList(format, list, sizeof...(Args));
    }
    template <typename... Args>
    static CString Formatted(const char16_t* format, const Args&... args) {
        CString s;
        s.Format(format, args...);
        return s;
    }
    static std::u16string FormatList(const char16_t* format, const FormatArg* args, size_t count);

    CString& operator+=(const CString& other) {
        m_str += other.m_str;
        return *this;
    }
    CString& operator+=(const char16_t* other) {
        if (other) m_str += other;
        return *this;
    }
    CString& operator+=(char16_t ch) {
        m_str += ch;
        return *this;
    }

    friend CString operator+(CString a, const CString& b) {
        a += b;
        return a;
    }
    friend CString operator+(CString a, const char16_t* b) {
        a += b;
        return a;
    }
    friend CString operator+(const char16_t* a, const CString& b) {
        CString r(a);
        r += b;
        return r;
    }
    friend CString operator+(CString a, char16_t b) {
        a += b;
        return a;
    }

    friend bool operator==(const CString& a, const CString& b) { return a.m_str == b.m_str; }
    friend bool operator==(const CString& a, const char16_t* b) { return a.Compare(b) == 0; }
    friend bool operator!=(const CString& a, const CString& b) { return !(a == b); }
    friend bool operator!=(const CString& a, const char16_t* b) { return !(a == b); }
    friend bool operator<(const CString& a, const CString& b) { return a.m_str < b.m_str; }

private:
    std::u16string m_str;
};

// Writes the text as UTF-8 (test output, diagnostics).
std::ostream& operator<<(std::ostream& out, const CString& text);

inline FormatArg::FormatArg(const CString& t) : FormatArg(t.View()) {}

template <>
struct std::hash<CString> {
    size_t operator()(const CString& s) const noexcept { return std::hash<std::u16string>()(s.Str()); }
};
