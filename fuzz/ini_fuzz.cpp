// libFuzzer target for the INI reader: any bytes must parse without a fault,
// serialise back unchanged, answer lookups consistently, and take a write
// that reads back, also through the profile functions on a real file. A
// Windows-1252 file that takes a character beyond its code page must turn
// into UTF-16LE and keep every value.

#include "vxhelper/IniDocument.h"
#include "vxhelper/profile.h"

#include "FuzzCheck.h"

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <optional>
#include <string>
#include <tuple>
#include <unistd.h>
#include <vector>

namespace {

const std::string& ScratchFile() {
    // In memory where possible: rewriting a file on disk thousands of times a second is slow.
    static const std::string path = [] {
        const char* dir = std::getenv("TMPDIR");
        const std::string base = access("/dev/shm", W_OK) == 0 ? "/dev/shm" : (dir && *dir ? dir : "/tmp");
        return base + "/ini_fuzz-" + std::to_string(getpid()) + ".ini";
    }();
    static const struct RemoveAtExit {
        ~RemoveAtExit() { std::remove(path.c_str()); }
    } cleanup;
    return path;
}

void CheckDocument(std::string_view bytes) {
    VX_CIniDocument doc = VX_CIniDocument::Parse(bytes);
    FuzzCheck(doc.Serialize() == bytes, "an unchanged document must serialise to its input");

    // Every key name the document lists must be found again.
    for (const char16_t* section : {u"Azure", u"VARIABLES", u"CONNECTIONS", u"s"}) {
        for (const std::u16string& key : doc.GetKeyNames(section))
            FuzzCheck(doc.GetValue(section, key).has_value(), "a listed key must be found");
    }

    // A write reads back, also after serialising and parsing again.
    const std::u16string value = u" padded \"quoted\" ";
    FuzzCheck(doc.SetValue(u"Azure", u"PROXY_PWD", value), "a valid write must be accepted");
    FuzzCheck(doc.GetValue(u"azure", u"proxy_pwd") == value, "a write must read back");
    FuzzCheck(doc.SetValue(u"New Section", u"k", u"'x'"), "a valid write must be accepted");
    const VX_CIniDocument again = VX_CIniDocument::Parse(doc.Serialize());
    FuzzCheck(again.GetValue(u"AZURE", u"PROXY_PWD") == value, "a write must survive serialising");
    FuzzCheck(again.GetValue(u"new section", u"K") == u"'x'", "a new section must survive serialising");
}

void CheckReencoding(std::string_view bytes) {
    VX_CIniDocument doc = VX_CIniDocument::Parse(bytes);
    const bool ansi = doc.GetEncoding() == VX_CIniDocument::Encoding::Windows1252;
    std::vector<std::tuple<const char16_t*, std::u16string, std::optional<std::u16string>>> values;
    for (const char16_t* section : {u"Azure", u"VARIABLES", u"CONNECTIONS", u"s"}) {
        for (const std::u16string& key : doc.GetKeyNames(section))
            values.emplace_back(section, key, doc.GetValue(section, key));
    }
    const std::u16string wide = u"Linie#\u6e29\u5ea6 \u20ac";
    FuzzCheck(doc.SetValue(u"VARIABLES", u"NAME_\u4e2d", wide), "a valid write must be accepted");
    if (ansi) {
        FuzzCheck(doc.GetEncoding() == VX_CIniDocument::Encoding::Utf16Le,
                  "a character beyond the code page must give UTF-16LE");
    }
    const VX_CIniDocument again = VX_CIniDocument::Parse(doc.Serialize());
    FuzzCheck(again.GetValue(u"variables", u"name_\u4e2d") == wide, "a write beyond the code page must read back");
    for (const auto& [section, key, value] : values)
        FuzzCheck(again.GetValue(section, key) == value, "a change of encoding must keep every value");
}

void CheckProfileFunctions(std::string_view bytes) {
    const std::string& path = ScratchFile();
    if (FILE* file = std::fopen(path.c_str(), "wb")) {
        std::fwrite(bytes.data(), 1, bytes.size(), file);
        std::fclose(file);
    }
    const CString file = CString::FromUtf8(path);
    VX_CPrivateProfileSession session(file);  // one read of the file for all lookups
    char16_t buffer[16];
    for (const char16_t* key : {u"COUNT", u"INTEGRITYPERIOD", u"NAME_0"}) {
        VX_GetPrivateProfileInt(u"VARIABLES", key, 5, file);
        const DWORD n = VX_GetPrivateProfileString(u"Azure", key, u"default", buffer, 16, file);
        FuzzCheck(n < 16 && buffer[n] == 0, "text must be cut to the buffer and terminated");
    }
    CStringArray keys;
    VX_GetPrivateProfileKeyNames(u"CONNECTIONS", keys, file);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    CheckDocument(bytes);
    CheckReencoding(bytes);
    CheckProfileFunctions(bytes);
    return 0;
}
