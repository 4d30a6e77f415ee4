#pragma once
// Private-profile (INI file) functions, with the argument order and the
// behaviour of their Win32 namesakes:
//
// - section and key names match ignoring letter case; the first matching
//   section and, within it, the first matching key win;
// - names and values are read with surrounding blanks removed, and a value
//   enclosed in a pair of quotes ("..." or '...') loses them;
// - a missing file, section or key reads as the default;
// - files may be UTF-8 (with or without BOM), UTF-16 with BOM, or, without
//   BOM and not valid UTF-8, Windows-1252, with CR LF or LF line ends; a
//   write keeps the file's encoding and line ends, except that a Windows-1252
//   file that must take a character beyond its code page becomes UTF-16LE
//   with BOM (one information record in the central log says so);
// - a line is a section heading only with its closing "]";
// - a write changes only the line of its key (or adds one: a new key after the
//   last non-blank line of its section, a new section at the end of the file)
//   and replaces the file atomically: a temporary file beside it is written,
//   flushed to disk and renamed over it, so a crash leaves the old or the new
//   file, never a mixture.
//
// A file that is not a regular file, cannot be read or is larger than 16 MiB
// reads as empty, and writes to it fail rather than overwrite what could not
// be read. All functions are safe to call from several threads.

#include "platform/collections.h"
#include "platform/text.h"

// The integer value of a key, read as signed decimal: optional blanks, an
// optional sign and at least one digit; what follows the digits is ignored
// ("10 s" reads as 10). A value that does not start that way, or that does
// not fit 32 bits, gives the default.
int VX_GetPrivateProfileInt(LPCWSTR section, LPCWSTR key, int defaultValue, LPCWSTR path);

// Copies the value of a key (or the default, null meaning empty) into buffer,
// cut to size - 1 characters and terminated; a cut never splits a surrogate
// pair. Returns the number of characters copied, without the terminator.
DWORD VX_GetPrivateProfileString(LPCWSTR section, LPCWSTR key, LPCWSTR defaultValue, LPWSTR buffer, DWORD size,
                                 LPCWSTR path);

// Writes the decimal form of value.
bool VX_WritePrivateProfileInt(LPCWSTR section, LPCWSTR key, int value, LPCWSTR path);

// Writes a text value. A value with surrounding blanks, or that is itself
// enclosed in quotes, is written in quotes so that it reads back unchanged.
// False when the file cannot be written, or when a name or the value cannot be
// stored in a line: null or empty names, a line break or NUL anywhere, "]" in
// the section name, "=" in the key name, a key starting with ";" or "[".
bool VX_WritePrivateProfileString(LPCWSTR section, LPCWSTR key, LPCWSTR value, LPCWSTR path);

// The names of the keys of a section, in file order, each once (the first
// section of that name). False when the section does not exist.
bool VX_GetPrivateProfileKeyNames(LPCWSTR section, CStringArray& keys, LPCWSTR path);

// Groups the profile calls on one file. While a session on a path lives, reads
// and writes of that path work on one copy of the file read when the session
// began, and the writes reach the file together, in one atomic replacement, on
// Commit or when the session ends. Reading many keys then parses the file once,
// and a crash during a long series of writes leaves the old file whole.
// Sessions on the same path nest; the file is written when one commits.
class VX_CPrivateProfileSession {
public:
    explicit VX_CPrivateProfileSession(LPCWSTR path);
    ~VX_CPrivateProfileSession();  // commits what is pending
    VX_CPrivateProfileSession(const VX_CPrivateProfileSession&) = delete;
    VX_CPrivateProfileSession& operator=(const VX_CPrivateProfileSession&) = delete;

    // Writes pending changes to the file. True when nothing was pending or
    // the file was replaced; false when it could not be: then the changes are
    // dropped (as by Discard), so the file stays as it was, also when the
    // session ends.
    bool Commit();
    // Drops pending changes: the session reads the file as it is now.
    void Discard();

private:
    std::string m_path;
};
