#include "vxhelper/IniDocument.h"

#include "platform/text.h"

#include <algorithm>
#include <optional>

namespace {

bool IsBlank(char16_t c) { return c == u' ' || c == u'\t' || c == u'\r' || c == u'\v' || c == u'\f'; }

std::u16string_view Trim(std::u16string_view text) {
    while (!text.empty() && IsBlank(text.front())) text.remove_prefix(1);
    while (!text.empty() && IsBlank(text.back())) text.remove_suffix(1);
    return text;
}

// Names match ignoring letter case: both sides are compared in lower case.
std::u16string Fold(std::u16string_view name) {
    CString folded{std::u16string(Trim(name))};
    folded.MakeLower();
    return folded.Str();
}

bool IsQuote(char16_t c) { return c == u'"' || c == u'\''; }

bool IsQuoted(std::u16string_view text) {
    return text.size() >= 2 && IsQuote(text.front()) && text.front() == text.back();
}

// A value as read: trimmed, then one pair of enclosing quotes removed.
std::u16string Unquote(std::u16string_view text) {
    text = Trim(text);
    if (IsQuoted(text)) text = text.substr(1, text.size() - 2);
    return std::u16string(text);
}

// A value as written: quoted when reading it back would otherwise lose
// surrounding blanks or enclosing quotes.
std::u16string Quote(std::u16string_view value) {
    const bool needsQuotes = !value.empty() && (IsBlank(value.front()) || IsBlank(value.back()) || IsQuoted(value));
    if (!needsQuotes) return std::u16string(value);
    std::u16string quoted;
    quoted.reserve(value.size() + 2);
    quoted += u'"';
    quoted += value;
    quoted += u'"';
    return quoted;
}

bool HasLineBreakOrNul(std::u16string_view text) {
    return text.find_first_of(std::u16string_view(u"\r\n\0", 3)) != std::u16string_view::npos;
}

// Windows-1252 from 0x80 to 0x9F; the five bytes it leaves undefined map to
// the control characters of the same number, as Windows maps them.
constexpr char16_t kCp1252High[32] = {0x20AC, 0x0081, 0x201A, 0x0192, 0x201E, 0x2026, 0x2020, 0x2021,
                                      0x02C6, 0x2030, 0x0160, 0x2039, 0x0152, 0x008D, 0x017D, 0x008F,
                                      0x0090, 0x2018, 0x2019, 0x201C, 0x201D, 0x2022, 0x2013, 0x2014,
                                      0x02DC, 0x2122, 0x0161, 0x203A, 0x0153, 0x009D, 0x017E, 0x0178};

char16_t FromCp1252(unsigned char byte) {
    return byte >= 0x80 && byte < 0xA0 ? kCp1252High[byte - 0x80] : static_cast<char16_t>(byte);
}

// The Windows-1252 byte of a character, or nothing when the code page lacks it.
std::optional<char> ToCp1252(char16_t c) {
    if (c < 0x80 || (c >= 0xA0 && c <= 0xFF)) return static_cast<char>(c);
    for (int i = 0; i < 32; ++i)
        if (kCp1252High[i] == c) return static_cast<char>(0x80 + i);
    return std::nullopt;
}

}  // namespace

// ---- reading ----------------------------------------------------------------

VX_CIniDocument VX_CIniDocument::Parse(std::string_view bytes) {
    VX_CIniDocument doc;
    const auto byte = [&](size_t i) { return static_cast<unsigned char>(bytes[i]); };
    if (bytes.size() >= 3 && byte(0) == 0xEF && byte(1) == 0xBB && byte(2) == 0xBF) {
        doc.m_bom = bytes.substr(0, 3);
    } else if (bytes.size() >= 2 && byte(0) == 0xFF && byte(1) == 0xFE) {
        doc.m_encoding = Encoding::Utf16Le;
        doc.m_bom = bytes.substr(0, 2);
    } else if (bytes.size() >= 2 && byte(0) == 0xFE && byte(1) == 0xFF) {
        doc.m_encoding = Encoding::Utf16Be;
        doc.m_bom = bytes.substr(0, 2);
    } else if (bytes.size() >= 2 && byte(0) != 0 && byte(0) < 0x80 && byte(1) == 0) {
        // An ASCII character followed by a zero byte: UTF-16LE saved without a mark.
        doc.m_encoding = Encoding::Utf16Le;
    } else if (!IsValidUtf8(bytes)) {
        // No mark and no UTF-8: the ANSI code page, in which the profile
        // functions of Windows write a file they create.
        doc.m_encoding = Encoding::Windows1252;
    }
    bytes.remove_prefix(doc.m_bom.size());

    // Split at LF, in units of the encoding; a CR before it belongs to the line end.
    const size_t unit = doc.UnitBytes();
    const auto unitAt = [&](size_t i) { return doc.UnitAt(bytes, i); };
    size_t start = 0;
    while (start < bytes.size()) {
        size_t end = start;
        while (end + unit <= bytes.size() && unitAt(end) != u'\n') end += unit;
        Line line;
        if (end + unit <= bytes.size()) {  // found LF
            line.endBytes = unit;
            if (end >= start + unit && unitAt(end - unit) == u'\r') line.endBytes += unit;
            end += unit;
        } else {
            end = bytes.size();  // last line, without line end (an odd byte of UTF-16 stays in it)
        }
        line.raw = bytes.substr(start, end - start);
        if (doc.m_newline.empty() && line.endBytes > 0)
            doc.m_newline = line.raw.substr(line.raw.size() - line.endBytes);
        doc.Classify(line);
        doc.m_lines.push_back(std::move(line));
        start = end;
    }
    doc.BuildIndex();
    return doc;
}

void VX_CIniDocument::Classify(Line& line) const {
    const std::u16string full = Decode(std::string_view(line.raw).substr(0, line.raw.size() - line.endBytes));
    const std::u16string_view text = Trim(full);
    line.kind = text.empty() ? Kind::Blank : Kind::Other;
    line.name.clear();
    line.value.clear();
    if (text.empty() || text.front() == u';') return;
    if (text.front() == u'[') {
        const size_t close = text.find(u']');
        if (close != std::u16string_view::npos) {
            line.kind = Kind::Section;
            line.name = Trim(text.substr(1, close - 1));
            return;
        }
        // Without its "]" the line is no heading (a damaged line must not move
        // the keys after it into a section of its own); Windows reads it like
        // any other line: "[k=1" is the key "[k", "[broken" is ignored.
    }
    const size_t equals = text.find(u'=');
    if (equals == std::u16string_view::npos) return;
    const std::u16string_view key = Trim(text.substr(0, equals));
    if (key.empty()) return;
    line.kind = Kind::Key;
    line.name = key;
    line.value = Unquote(text.substr(equals + 1));
}

void VX_CIniDocument::BuildIndex() {
    m_sections.clear();
    m_sectionIndex.clear();
    Section* current = nullptr;
    for (auto it = m_lines.begin(); it != m_lines.end(); ++it) {
        switch (it->kind) {
        case Kind::Section:
            m_sections.push_back(Section{it, it, {}});
            m_sectionIndex.emplace(Fold(it->name), m_sections.size() - 1);  // the first one wins
            current = &m_sections.back();  // valid until the next push_back, which resets it
            break;
        case Kind::Key:
            if (!current) break;  // keys before the first section belong to none
            current->keys.emplace(Fold(it->name), it);
            current->lastNonBlank = it;
            break;
        case Kind::Other:
            if (current) current->lastNonBlank = it;
            break;
        case Kind::Blank: break;
        }
    }
}

VX_CIniDocument::VX_CIniDocument(const VX_CIniDocument& other)
    : m_encoding(other.m_encoding), m_bom(other.m_bom), m_newline(other.m_newline), m_lines(other.m_lines) {
    BuildIndex();
}

VX_CIniDocument& VX_CIniDocument::operator=(const VX_CIniDocument& other) {
    if (this != &other) {
        VX_CIniDocument copy(other);
        *this = std::move(copy);
    }
    return *this;
}

std::optional<std::u16string> VX_CIniDocument::GetValue(std::u16string_view section, std::u16string_view key) const {
    const auto s = m_sectionIndex.find(Fold(section));
    if (s == m_sectionIndex.end()) return std::nullopt;
    const auto& keys = m_sections[s->second].keys;
    const auto k = keys.find(Fold(key));
    if (k == keys.end()) return std::nullopt;
    return k->second->value;
}

bool VX_CIniDocument::HasSection(std::u16string_view section) const { return m_sectionIndex.contains(Fold(section)); }

std::vector<std::u16string> VX_CIniDocument::GetKeyNames(std::u16string_view section) const {
    std::vector<std::u16string> names;
    const auto s = m_sectionIndex.find(Fold(section));
    if (s == m_sectionIndex.end()) return names;
    const Section& sec = m_sections[s->second];
    for (auto it = std::next(sec.header); it != m_lines.end() && it->kind != Kind::Section; ++it) {
        if (it->kind != Kind::Key) continue;
        const auto first = sec.keys.find(Fold(it->name));
        if (first != sec.keys.end() && first->second == it) names.push_back(it->name);
    }
    return names;
}

// ---- encoding ---------------------------------------------------------------

size_t VX_CIniDocument::UnitBytes() const {
    return m_encoding == Encoding::Utf8 || m_encoding == Encoding::Windows1252 ? 1 : 2;
}

std::u16string VX_CIniDocument::Decode(std::string_view bytes) const {
    if (m_encoding == Encoding::Utf8) return Utf8ToUtf16(bytes);
    std::u16string text;
    if (m_encoding == Encoding::Windows1252) {
        text.reserve(bytes.size());
        for (const char c : bytes) text += FromCp1252(static_cast<unsigned char>(c));
        return text;
    }
    text.reserve(bytes.size() / 2);
    for (size_t i = 0; i + 1 < bytes.size(); i += 2) text += UnitAt(bytes, i);
    return text;
}

bool VX_CIniDocument::CanEncode(std::u16string_view text) const {
    if (m_encoding != Encoding::Windows1252) return true;
    return std::all_of(text.begin(), text.end(), [](char16_t c) { return ToCp1252(c).has_value(); });
}

// Only called for text CanEncode accepts: the code page never gets a replacement character.
std::string VX_CIniDocument::Encode(std::u16string_view text) const {
    if (m_encoding == Encoding::Utf8) return Utf16ToUtf8(text);
    std::string bytes;
    if (m_encoding == Encoding::Windows1252) {
        bytes.reserve(text.size());
        for (const char16_t c : text) bytes += ToCp1252(c).value_or('?');
        return bytes;
    }
    bytes.reserve(text.size() * 2);
    for (const char16_t c : text) {
        const char lo = static_cast<char>(c & 0xFF), hi = static_cast<char>(c >> 8);
        if (m_encoding == Encoding::Utf16Le) {
            bytes += lo;
            bytes += hi;
        } else {
            bytes += hi;
            bytes += lo;
        }
    }
    return bytes;
}

std::string VX_CIniDocument::NewLine() const { return m_newline.empty() ? Encode(u"\n") : m_newline; }

std::string VX_CIniDocument::Serialize() const {
    std::string bytes = m_bom;
    for (const Line& line : m_lines) bytes += line.raw;
    return bytes;
}

// ---- changing ---------------------------------------------------------------

bool VX_CIniDocument::IsValidSection(std::u16string_view section) {
    return !Trim(section).empty() && section.find(u']') == std::u16string_view::npos && !HasLineBreakOrNul(section);
}

bool VX_CIniDocument::IsValidKey(std::u16string_view key) {
    const std::u16string_view name = Trim(key);
    return !name.empty() && name.front() != u';' && name.front() != u'[' &&
           key.find(u'=') == std::u16string_view::npos && !HasLineBreakOrNul(key);
}

bool VX_CIniDocument::IsValidValue(std::u16string_view value) { return !HasLineBreakOrNul(value); }

void VX_CIniDocument::ConvertToUtf16Le() {
    std::vector<std::u16string> texts;
    texts.reserve(m_lines.size());
    for (const Line& line : m_lines) texts.push_back(Decode(line.raw));
    const std::u16string newline = Decode(m_newline);
    m_encoding = Encoding::Utf16Le;
    m_bom = "\xFF\xFE";
    m_newline = Encode(newline);
    auto text = texts.begin();
    for (Line& line : m_lines) {  // in place: the index keeps pointing at the same lines
        line.raw = Encode(*text++);
        line.endBytes *= 2;
    }
}

bool VX_CIniDocument::SetValue(std::u16string_view section, std::u16string_view key, std::u16string_view value) {
    if (!IsValidSection(section) || !IsValidKey(key) || !IsValidValue(value)) return false;
    const std::u16string sectionName(Trim(section)), keyName(Trim(key));
    const std::u16string keyLine = keyName + u"=" + Quote(value);

    // What reaches the file must fit its encoding; a code page that cannot
    // hold it gives way to UTF-16LE for the whole file.
    const auto found = m_sectionIndex.find(Fold(sectionName));
    const bool keyExists = found != m_sectionIndex.end() && m_sections[found->second].keys.contains(Fold(keyName));
    const std::u16string written = keyExists                       ? Quote(value)
                                   : found != m_sectionIndex.end() ? keyLine
                                                                   : u"[" + sectionName + u"]" + keyLine;
    if (!CanEncode(written)) ConvertToUtf16Le();

    if (const auto s = found; s != m_sectionIndex.end()) {
        Section& sec = m_sections[s->second];
        if (const auto k = sec.keys.find(Fold(keyName)); k != sec.keys.end()) {
            RewriteValue(*k->second, Quote(value));
            return true;
        }
        if (sec.lastNonBlank->endBytes == 0) EnsureLastLineEnds();  // only the file's last line has no end
        const LineIt inserted = InsertLine(std::next(sec.lastNonBlank), keyLine);
        sec.keys.emplace(Fold(keyName), inserted);
        sec.lastNonBlank = inserted;
        return true;
    }

    EnsureLastLineEnds();
    if (!m_lines.empty() && m_lines.back().kind != Kind::Blank) InsertLine(m_lines.end(), u"");
    const LineIt header = InsertLine(m_lines.end(), u"[" + sectionName + u"]");
    const LineIt inserted = InsertLine(m_lines.end(), keyLine);
    m_sections.push_back(Section{header, inserted, {{Fold(keyName), inserted}}});
    m_sectionIndex.emplace(Fold(sectionName), m_sections.size() - 1);
    return true;
}

char16_t VX_CIniDocument::UnitAt(std::string_view bytes, size_t i) const {
    if (UnitBytes() == 1) return static_cast<unsigned char>(bytes[i]);
    const auto a = static_cast<unsigned char>(bytes[i]), b = static_cast<unsigned char>(bytes[i + 1]);
    return m_encoding == Encoding::Utf16Le ? static_cast<char16_t>(a | b << 8) : static_cast<char16_t>(b | a << 8);
}

// Keeps the line's bytes up to the "=" and the blanks after it (the key as the
// file spells it) and its line end; only the value between them changes.
void VX_CIniDocument::RewriteValue(Line& line, std::u16string_view stored) {
    const size_t unit = UnitBytes();
    const size_t textBytes = (line.raw.size() - line.endBytes) / unit * unit;
    size_t pos = 0;
    while (pos < textBytes && UnitAt(line.raw, pos) != u'=') pos += unit;
    pos = std::min(pos + unit, textBytes);
    while (pos < textBytes && (UnitAt(line.raw, pos) == u' ' || UnitAt(line.raw, pos) == u'\t')) pos += unit;
    const std::string end = line.raw.substr(line.raw.size() - line.endBytes);
    line.raw.resize(pos);
    line.raw += Encode(stored);
    line.raw += end;
    line.value = Unquote(stored);
}

VX_CIniDocument::LineIt VX_CIniDocument::InsertLine(LineIt before, std::u16string_view text) {
    Line line;
    const std::string newline = NewLine();
    line.raw = Encode(text) + newline;
    line.endBytes = newline.size();
    Classify(line);
    return m_lines.insert(before, std::move(line));
}

void VX_CIniDocument::EnsureLastLineEnds() {
    if (m_lines.empty() || m_lines.back().endBytes > 0) return;
    Line& last = m_lines.back();
    if (UnitBytes() == 2 && last.raw.size() % 2 == 1) last.raw.pop_back();  // a stray odd byte
    const std::string newline = NewLine();
    last.raw += newline;
    last.endBytes = newline.size();
}
