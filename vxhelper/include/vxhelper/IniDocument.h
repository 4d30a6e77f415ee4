#pragma once
// The text of an INI file, as the private-profile functions read and change it.
//
// Every line keeps its original bytes, so that serialising a document gives
// back the file byte for byte except for the lines a change touched. Section
// and key names match ignoring letter case, and the first match wins. A line
// is a section heading only with its closing "]"; one that begins with "["
// without it reads as Windows reads it, as a key when it holds "=" ("[k=1")
// and else not at all. Lines before the first section, lines without "=",
// comment lines (";") and anything unreadable are kept and otherwise ignored.

#include <cstddef>
#include <list>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

class VX_CIniDocument {
public:
    // How the file's characters are stored; a byte-order mark is kept as found.
    // Windows1252 is the ANSI code page in which Windows writes a new file.
    enum class Encoding { Utf8, Utf16Le, Utf16Be, Windows1252 };

    VX_CIniDocument() = default;
    // Copies rebuild their own index; moves keep it (list nodes move along).
    VX_CIniDocument(const VX_CIniDocument& other);
    VX_CIniDocument& operator=(const VX_CIniDocument& other);
    VX_CIniDocument(VX_CIniDocument&&) noexcept = default;
    VX_CIniDocument& operator=(VX_CIniDocument&&) noexcept = default;

    // Reads a file's bytes. UTF-8 (with or without BOM) and UTF-16 (LE with or
    // without BOM, BE with BOM); a file without BOM that is not valid UTF-8 is
    // Windows-1252 (all 256 byte values). CR LF or LF line ends. Never fails.
    static VX_CIniDocument Parse(std::string_view bytes);
    std::string Serialize() const;

    Encoding GetEncoding() const { return m_encoding; }
    bool IsEmpty() const { return m_lines.empty(); }

    // The value of the first key of the first section with these names, with
    // surrounding blanks and one pair of enclosing quotes removed; nothing when
    // the section or key does not exist.
    std::optional<std::u16string> GetValue(std::u16string_view section, std::u16string_view key) const;

    bool HasSection(std::u16string_view section) const;

    // The key names of the first section with that name, in file order, each once.
    std::vector<std::u16string> GetKeyNames(std::u16string_view section) const;

    // Sets the value of a key: an existing key line is rewritten in place,
    // a new key goes after the last non-blank line of its section, a new
    // section at the end of the file. False, and nothing changes, when a name
    // or the value cannot be stored in a line (see IsValid...). A Windows-1252
    // file stays so while what is written fits the code page; otherwise the
    // whole document becomes UTF-16LE with a byte-order mark (GetEncoding
    // tells), so no character is ever replaced.
    bool SetValue(std::u16string_view section, std::u16string_view key, std::u16string_view value);

    // A section name must be non-empty after trimming and hold no "]" and no
    // line break or NUL. A key name must be non-empty after trimming, hold no
    // "=", line break or NUL, and not start with ";" or "[". A value must hold
    // no line break or NUL.
    static bool IsValidSection(std::u16string_view section);
    static bool IsValidKey(std::u16string_view key);
    static bool IsValidValue(std::u16string_view value);

private:
    enum class Kind { Blank, Other, Section, Key };
    struct Line {
        std::string raw;           // the line's bytes, line end included
        std::size_t endBytes = 0;  // how many of them are the line end
        Kind kind = Kind::Other;
        std::u16string name;   // section or key name, trimmed
        std::u16string value;  // a key's value as read
    };
    using LineIt = std::list<Line>::iterator;
    struct Section {
        LineIt header;
        LineIt lastNonBlank;                              // where new keys go after
        std::unordered_map<std::u16string, LineIt> keys;  // folded key -> first line
    };

    void Classify(Line& line) const;
    void BuildIndex();
    std::size_t UnitBytes() const;                                      // bytes of one character unit
    char16_t UnitAt(std::string_view bytes, std::size_t offset) const;  // one character unit
    bool CanEncode(std::u16string_view text) const;
    std::string Encode(std::u16string_view text) const;
    void ConvertToUtf16Le();
    std::u16string Decode(std::string_view bytes) const;
    std::string NewLine() const;
    void EnsureLastLineEnds();
    LineIt InsertLine(LineIt before, std::u16string_view text);
    void RewriteValue(Line& line, std::u16string_view stored);

    Encoding m_encoding = Encoding::Utf8;
    std::string m_bom;      // byte-order mark as found (may be empty)
    std::string m_newline;  // line end of the first ended line, in file encoding
    std::list<Line> m_lines;
    std::vector<Section> m_sections;
    std::unordered_map<std::u16string, std::size_t> m_sectionIndex;  // folded name -> first section
};
