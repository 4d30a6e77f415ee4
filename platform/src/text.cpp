#include "platform/text.h"

#include <QChar>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <ostream>

namespace {

constexpr char16_t kReplacement = 0xFFFD;

void AppendUtf8(std::string& out, char32_t cp) {
    if (cp < 0x80) {
        out += static_cast<char>(cp);
    } else if (cp < 0x800) {
        out += static_cast<char>(0xC0 | (cp >> 6));
        out += static_cast<char>(0x80 | (cp & 0x3F));
    } else if (cp < 0x10000) {
        out += static_cast<char>(0xE0 | (cp >> 12));
        out += static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
        out += static_cast<char>(0x80 | (cp & 0x3F));
    } else {
        out += static_cast<char>(0xF0 | (cp >> 18));
        out += static_cast<char>(0x80 | ((cp >> 12) & 0x3F));
        out += static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
        out += static_cast<char>(0x80 | (cp & 0x3F));
    }
}

void AppendUtf16(std::u16string& out, char32_t cp) {
    if (cp < 0x10000) {
        out += static_cast<char16_t>(cp);
    } else {
        cp -= 0x10000;
        out += static_cast<char16_t>(0xD800 + (cp >> 10));
        out += static_cast<char16_t>(0xDC00 + (cp & 0x3FF));
    }
}

bool IsHighSurrogate(char16_t c) { return c >= 0xD800 && c <= 0xDBFF; }
bool IsLowSurrogate(char16_t c) { return c >= 0xDC00 && c <= 0xDFFF; }

char16_t FoldCase(char16_t c) {
    if (c < 0x80) return (c >= u'A' && c <= u'Z') ? static_cast<char16_t>(c + 32) : c;
    return QChar::toCaseFolded(c);
}

}  // namespace

namespace {

// One UTF-8 sequence starting at in[i]. A valid one gives its code point and
// length; a broken one (bad lead byte, cut short, overlong, surrogate, beyond
// U+10FFFF) gives how many bytes to skip so that decoding resumes at the next
// byte that could start a character.
struct Utf8Step {
    bool valid;
    size_t length;
    char32_t cp;
};

Utf8Step DecodeUtf8At(std::string_view in, size_t i) {
    const auto b0 = static_cast<unsigned char>(in[i]);
    if (b0 < 0x80) return {true, 1, b0};
    int extra = 0;
    char32_t cp = 0, min = 0;
    if ((b0 & 0xE0) == 0xC0) {
        extra = 1;
        cp = b0 & 0x1F;
        min = 0x80;
    } else if ((b0 & 0xF0) == 0xE0) {
        extra = 2;
        cp = b0 & 0x0F;
        min = 0x800;
    } else if ((b0 & 0xF8) == 0xF0) {
        extra = 3;
        cp = b0 & 0x07;
        min = 0x10000;
    } else return {false, 1, 0};
    size_t j = 1;
    for (; j <= static_cast<size_t>(extra) && i + j < in.size(); ++j) {
        const auto b = static_cast<unsigned char>(in[i + j]);
        if ((b & 0xC0) != 0x80) break;
        cp = (cp << 6) | (b & 0x3F);
    }
    if (j <= static_cast<size_t>(extra) || cp < min || cp > 0x10FFFF || (cp >= 0xD800 && cp <= 0xDFFF)) {
        return {false, std::max<size_t>(1, j), 0};
    }
    return {true, j, cp};
}

}  // namespace

std::u16string Utf8ToUtf16(std::string_view in) {
    std::u16string out;
    out.reserve(in.size());
    for (size_t i = 0; i < in.size();) {
        const Utf8Step step = DecodeUtf8At(in, i);
        if (step.valid) AppendUtf16(out, step.cp);
        else out += kReplacement;  // a broken sequence costs one replacement
        i += step.length;
    }
    return out;
}

bool IsValidUtf8(std::string_view bytes) {
    for (size_t i = 0; i < bytes.size();) {
        const Utf8Step step = DecodeUtf8At(bytes, i);
        if (!step.valid) return false;
        i += step.length;
    }
    return true;
}

std::string Utf16ToUtf8(std::u16string_view in) {
    std::string out;
    out.reserve(in.size());
    for (size_t i = 0; i < in.size(); ++i) {
        const char16_t c = in[i];
        if (IsHighSurrogate(c) && i + 1 < in.size() && IsLowSurrogate(in[i + 1])) {
            AppendUtf8(out, 0x10000 + ((char32_t(c) - 0xD800) << 10) + (in[i + 1] - 0xDC00));
            ++i;
        } else if (IsHighSurrogate(c) || IsLowSurrogate(c)) {
            AppendUtf8(out, kReplacement);
        } else {
            AppendUtf8(out, c);
        }
    }
    return out;
}

int CString::Compare(const char16_t* other) const {
    const std::u16string_view b = other ? other : u"";
    const int r = std::u16string_view(m_str).compare(b);
    return r < 0 ? -1 : (r > 0 ? 1 : 0);
}

int CString::CompareNoCase(const char16_t* other) const {
    const std::u16string_view b = other ? other : u"";
    const size_t n = std::min(m_str.size(), b.size());
    for (size_t i = 0; i < n; ++i) {
        const char16_t x = FoldCase(m_str[i]), y = FoldCase(b[i]);
        if (x != y) return x < y ? -1 : 1;
    }
    if (m_str.size() == b.size()) return 0;
    return m_str.size() < b.size() ? -1 : 1;
}

int CString::Find(char16_t ch, int start) const {
    if (start < 0 || start >= GetLength()) return -1;
    const size_t pos = m_str.find(ch, static_cast<size_t>(start));
    return pos == std::u16string::npos ? -1 : static_cast<int>(pos);
}

int CString::Find(const char16_t* sub, int start) const {
    if (!sub || start < 0 || start > GetLength()) return -1;
    const size_t pos = m_str.find(sub, static_cast<size_t>(start));
    return pos == std::u16string::npos ? -1 : static_cast<int>(pos);
}

int CString::ReverseFind(char16_t ch) const {
    const size_t pos = m_str.rfind(ch);
    return pos == std::u16string::npos ? -1 : static_cast<int>(pos);
}

CString CString::Left(int count) const {
    count = std::clamp(count, 0, GetLength());
    return CString(m_str.substr(0, static_cast<size_t>(count)));
}

CString CString::Mid(int first) const { return Mid(first, GetLength()); }

CString CString::Mid(int first, int count) const {
    first = std::clamp(first, 0, GetLength());
    count = std::clamp(count, 0, GetLength() - first);
    return CString(m_str.substr(static_cast<size_t>(first), static_cast<size_t>(count)));
}

CString CString::Right(int count) const {
    count = std::clamp(count, 0, GetLength());
    return CString(m_str.substr(m_str.size() - static_cast<size_t>(count)));
}

CString& CString::MakeUpper() {
    for (auto& c : m_str) c = QChar::toUpper(c);
    return *this;
}

CString& CString::MakeLower() {
    for (auto& c : m_str) c = QChar::toLower(c);
    return *this;
}

static bool IsBlank(char16_t c) {
    return c == u' ' || c == u'\t' || c == u'\r' || c == u'\n' || c == u'\v' || c == u'\f';
}

CString& CString::TrimLeft() {
    size_t i = 0;
    while (i < m_str.size() && IsBlank(m_str[i])) ++i;
    m_str.erase(0, i);
    return *this;
}

CString& CString::TrimRight() {
    size_t n = m_str.size();
    while (n > 0 && IsBlank(m_str[n - 1])) --n;
    m_str.resize(n);
    return *this;
}

CString& CString::Trim() { return TrimRight().TrimLeft(); }

int CString::Replace(const char16_t* old, const char16_t* replacement) {
    const std::u16string_view from = old ? old : u"";
    const std::u16string_view to = replacement ? replacement : u"";
    if (from.empty()) return 0;
    int count = 0;
    std::u16string out;
    size_t pos = 0;
    for (size_t hit; (hit = m_str.find(from, pos)) != std::u16string::npos; pos = hit + from.size()) {
        out.append(m_str, pos, hit - pos).append(to);
        ++count;
    }
    if (count) {
        out.append(m_str, pos);
        m_str.swap(out);
    }
    return count;
}

int CString::Remove(char16_t ch) {
    const auto before = m_str.size();
    std::erase(m_str, ch);
    return static_cast<int>(before - m_str.size());
}

char16_t* CString::GetBuffer(int minLength) {
    if (minLength > GetLength()) m_str.resize(static_cast<size_t>(minLength));
    return m_str.data();
}

void CString::ReleaseBuffer(int newLength) {
    if (newLength < 0) newLength = static_cast<int>(std::char_traits<char16_t>::length(m_str.c_str()));
    m_str.resize(static_cast<size_t>(std::min(newLength, GetLength())));
}

// ---- Format -----------------------------------------------------------------

namespace {

struct Spec {
    bool left = false, zero = false, plus = false, space = false, alt = false;
    int width = 0;
    int precision = -1;
    char conv = 0;
};

void Pad(std::u16string& out, std::u16string_view body, const Spec& spec, bool numeric) {
    const size_t width = spec.width > 0 ? static_cast<size_t>(spec.width) : 0;
    if (body.size() >= width) {
        out += body;
        return;
    }
    const size_t fill = width - body.size();
    if (spec.left) {
        out += body;
        out.append(fill, u' ');
        return;
    }
    if (numeric && spec.zero && spec.precision < 0) {
        // Zeros go between the sign or 0x prefix and the digits.
        size_t prefix = 0;
        if (!body.empty() && (body[0] == u'-' || body[0] == u'+' || body[0] == u' ')) prefix = 1;
        if (body.size() >= prefix + 2 && body[prefix] == u'0' && (body[prefix + 1] == u'x' || body[prefix + 1] == u'X'))
            prefix += 2;
        out += body.substr(0, prefix);
        out.append(fill, u'0');
        out += body.substr(prefix);
        return;
    }
    out.append(fill, u' ');
    out += body;
}

std::u16string Digits(unsigned long long v, unsigned base, bool upper) {
    const char* set = upper ? "0123456789ABCDEF" : "0123456789abcdef";
    std::u16string d;
    do {
        d += static_cast<char16_t>(set[v % base]);
        v /= base;
    } while (v);
    std::reverse(d.begin(), d.end());
    return d;
}

unsigned long long AsUnsigned(const FormatArg& a) {
    if (a.kind == FormatArg::Kind::Signed && a.s < 0 && a.bytes < 8) {
        // A negative number read as unsigned keeps its own width, as printf does for int.
        return static_cast<unsigned long long>(a.s) & ((1ULL << (a.bytes * 8)) - 1);
    }
    if (a.kind == FormatArg::Kind::Pointer) return reinterpret_cast<std::uintptr_t>(a.p);
    if (a.kind == FormatArg::Kind::Floating) return static_cast<unsigned long long>(static_cast<long long>(a.f));
    return a.u;
}

std::u16string TextOf(const FormatArg& a) {
    if (a.kind == FormatArg::Kind::Text16) return std::u16string(a.text16);
    if (a.kind == FormatArg::Kind::Text8) return Utf8ToUtf16(a.text8);
    if (a.kind == FormatArg::Kind::Char) return std::u16string(1, static_cast<char16_t>(a.u));
    return {};
}

void FormatInteger(std::u16string& out, const FormatArg& a, const Spec& spec) {
    std::u16string body;
    bool negative = false;
    unsigned long long magnitude;
    const bool isSignedConv = spec.conv == 'd' || spec.conv == 'i';
    if (isSignedConv && a.kind == FormatArg::Kind::Signed) {
        negative = a.s < 0;
        magnitude = negative ? 0ULL - static_cast<unsigned long long>(a.s) : static_cast<unsigned long long>(a.s);
    } else if (isSignedConv && a.kind == FormatArg::Kind::Floating) {
        negative = a.f < 0;
        magnitude = static_cast<unsigned long long>(std::fabs(a.f));
    } else {
        magnitude = AsUnsigned(a);
    }
    const unsigned base = (spec.conv == 'x' || spec.conv == 'X') ? 16 : (spec.conv == 'o' ? 8 : 10);
    std::u16string digits = (spec.precision == 0 && magnitude == 0) ? u"" : Digits(magnitude, base, spec.conv == 'X');
    if (spec.precision > 0 && digits.size() < static_cast<size_t>(spec.precision))
        digits.insert(0, static_cast<size_t>(spec.precision) - digits.size(), u'0');
    if (negative) body = u"-";
    else if (isSignedConv && spec.plus) body = u"+";
    else if (isSignedConv && spec.space) body = u" ";
    if (spec.alt && base == 16 && magnitude) body += spec.conv == 'X' ? u"0X" : u"0x";
    if (spec.alt && base == 8 && (digits.empty() || digits[0] != u'0')) body += u"0";
    body += digits;
    Pad(out, body, spec, true);
}

void FormatFloating(std::u16string& out, const FormatArg& a, const Spec& spec) {
    double v = a.f;
    if (a.kind == FormatArg::Kind::Signed) v = static_cast<double>(a.s);
    else if (a.kind != FormatArg::Kind::Floating) v = static_cast<double>(AsUnsigned(a));
    char fmt[16];
    int n = 0;
    fmt[n++] = '%';
    if (spec.plus) fmt[n++] = '+';
    if (spec.space) fmt[n++] = ' ';
    if (spec.alt) fmt[n++] = '#';
    fmt[n++] = '.';
    fmt[n++] = '*';
    fmt[n++] = spec.conv;
    fmt[n] = 0;
    char buf[512];
    const int precision = spec.precision < 0 ? 6 : std::min(spec.precision, 100);
    int len = std::snprintf(buf, sizeof buf, fmt, precision, v);
    std::string text = len < static_cast<int>(sizeof buf) ? std::string(buf, static_cast<size_t>(len)) : std::string();
    if (text.empty() && len > 0) {
        text.resize(static_cast<size_t>(len) + 1);
        std::snprintf(text.data(), text.size(), fmt, precision, v);
        text.resize(static_cast<size_t>(len));
    }
    Pad(out, Utf8ToUtf16(text), spec, std::isfinite(v));
}

void FormatPointer(std::u16string& out, const FormatArg& a, const Spec& spec) {
    // Fixed width, upper case, no prefix: the whole address, as the platform's %p prints it.
    std::u16string digits = Digits(AsUnsigned(a), 16, true);
    digits.insert(0, sizeof(void*) * 2 - std::min(digits.size(), sizeof(void*) * 2), u'0');
    Pad(out, digits, spec, false);
}

// A text given for a number is written as the text, never read as a number.
bool PadIfText(std::u16string& out, const FormatArg& a, const Spec& spec) {
    if (a.kind != FormatArg::Kind::Text16 && a.kind != FormatArg::Kind::Text8) return false;
    Pad(out, TextOf(a), spec, false);
    return true;
}

void FormatOne(std::u16string& out, const FormatArg& a, const Spec& spec) {
    switch (spec.conv) {
    case 's':
    case 'S':
    case 'c':
    case 'C': {
        if (a.kind == FormatArg::Kind::Text16 || a.kind == FormatArg::Kind::Text8 || a.kind == FormatArg::Kind::Char) {
            std::u16string text = TextOf(a);
            if (spec.precision >= 0 && text.size() > static_cast<size_t>(spec.precision))
                text.resize(static_cast<size_t>(spec.precision));
            Pad(out, text, spec, false);
        } else if (spec.conv == 'c' || spec.conv == 'C') {
            Pad(out, std::u16string(1, static_cast<char16_t>(AsUnsigned(a))), spec, false);
        } else if (a.kind == FormatArg::Kind::Pointer) {
            FormatPointer(out, a, spec);
        } else {
            Spec asNumber = spec;
            asNumber.conv = a.kind == FormatArg::Kind::Floating ? 'g' : (a.kind == FormatArg::Kind::Signed ? 'd' : 'u');
            FormatOne(out, a, asNumber);
        }
        return;
    }
    case 'd':
    case 'i':
    case 'u':
    case 'x':
    case 'X':
    case 'o':
        if (!PadIfText(out, a, spec)) FormatInteger(out, a, spec);
        return;
    case 'e':
    case 'E':
    case 'f':
    case 'F':
    case 'g':
    case 'G':
    case 'a':
    case 'A':
        if (!PadIfText(out, a, spec)) FormatFloating(out, a, spec);
        return;
    case 'p': FormatPointer(out, a, spec); return;
    default: return;
    }
}

int IntOf(const FormatArg& a) {
    if (a.kind == FormatArg::Kind::Signed) return static_cast<int>(a.s);
    if (a.kind == FormatArg::Kind::Unsigned) return static_cast<int>(a.u);
    return 0;
}

}  // namespace

std::u16string CString::FormatList(const char16_t* format, const FormatArg* args, size_t count) {
    std::u16string out;
    if (!format) return out;
    size_t next = 0;
    auto take = [&]() -> const FormatArg* { return next < count ? &args[next++] : nullptr; };
    for (const char16_t* p = format; *p; ++p) {
        if (*p != u'%') {
            out += *p;
            continue;
        }
        const char16_t* start = p++;
        if (*p == u'%') {
            out += u'%';
            continue;
        }
        Spec spec;
        for (;; ++p) {
            if (*p == u'-') spec.left = true;
            else if (*p == u'0') spec.zero = true;
            else if (*p == u'+') spec.plus = true;
            else if (*p == u' ') spec.space = true;
            else if (*p == u'#') spec.alt = true;
            else break;
        }
        if (*p == u'*') {
            const FormatArg* w = take();
            spec.width = w ? IntOf(*w) : 0;
            if (spec.width < 0) {
                spec.left = true;
                spec.width = -spec.width;
            }
            ++p;
        } else {
            while (*p >= u'0' && *p <= u'9') spec.width = std::min(spec.width * 10 + (*p++ - u'0'), 4096);
        }
        if (*p == u'.') {
            ++p;
            spec.precision = 0;
            if (*p == u'*') {
                const FormatArg* pr = take();
                spec.precision = pr ? IntOf(*pr) : -1;
                ++p;
            } else {
                while (*p >= u'0' && *p <= u'9') spec.precision = std::min(spec.precision * 10 + (*p++ - u'0'), 4096);
            }
        }
        // Length modifiers are accepted and ignored: the argument's own type decides.
        while (*p == u'h' || *p == u'l' || *p == u'L' || *p == u'z' || *p == u'j' || *p == u't' || *p == u'q' ||
               *p == u'w')
            ++p;
        if (p[0] == u'I' && ((p[1] == u'6' && p[2] == u'4') || (p[1] == u'3' && p[2] == u'2'))) p += 3;
        if (!*p) {
            out.append(start, p);
            break;
        }
        spec.conv = static_cast<char>(*p < 0x80 ? *p : '?');
        if (const FormatArg* a = take()) FormatOne(out, *a, spec);
    }
    return out;
}

std::ostream& operator<<(std::ostream& out, const CString& text) { return out << text.ToUtf8(); }
