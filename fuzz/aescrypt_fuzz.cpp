// The hexadecimal cipher text of CAesCrypt. Any text read as a form either
// decrypts (and then enciphers again into a form that decrypts to the same
// text) or is refused and wiped. Any text enciphers into an upper-case form
// of the expected length that decrypts back to it in either letter case,
// while a form with one character changed is refused.

#include "vxhelper/aescrypt.h"

#include "FuzzCheck.h"

#include <string>

namespace {

// The key the seed forms in fuzz/seeds/aescrypt were made with.
constexpr ULONGLONG kKeyHigh = 0x0123456789ABCDEFull;
constexpr ULONGLONG kKeyLow = 0x0FEDCBA987654321ull;
constexpr int kOverheadBytes = 12 + 16;  // nonce and tag

bool IsUpperHex(const CString& text) {
    return text.View().find_first_not_of(u"0123456789ABCDEF") == std::u16string_view::npos;
}

// The input read as a form, one character a byte.
void CheckForm(const CAesCrypt& crypt, std::string_view bytes) {
    CString form(std::u16string(bytes.begin(), bytes.end()));
    CString text = form;
    if (!crypt.DecryptHexString(text)) {
        FuzzCheck(text.IsEmpty(), "a refused form is wiped");
        return;
    }
    if (form.IsEmpty()) return;
    CString again = text;
    FuzzCheck(crypt.EncryptHexString(again), "a decrypted text enciphers again");
    FuzzCheck(crypt.DecryptHexString(again) && again == text, "encrypt(decrypt(form)) decrypts to the same text");
}

// The input read as UTF-16 text, two bytes a character.
void CheckText(const CAesCrypt& crypt, std::string_view bytes, std::size_t damageAt) {
    std::u16string chars;
    for (std::size_t i = 0; i + 1 < bytes.size(); i += 2)
        chars.push_back(static_cast<char16_t>(static_cast<unsigned char>(bytes[i]) |
                                              static_cast<unsigned char>(bytes[i + 1]) << 8));
    const CString plain(chars);
    CString form = plain;
    if (!crypt.EncryptHexString(form)) {
        FuzzCheck(form == plain, "a text that cannot be enciphered is kept");
        return;
    }
    if (plain.IsEmpty()) {
        FuzzCheck(form.IsEmpty(), "the empty text stays empty");
        return;
    }
    FuzzCheck(IsUpperHex(form), "a form is upper-case hexadecimal");
    FuzzCheck(form.GetLength() == 2 * (kOverheadBytes + static_cast<int>(plain.ToUtf8().size())),
              "a form has the expected length");

    CString lower = form;
    lower.MakeLower();
    FuzzCheck(crypt.DecryptHexString(lower) && lower == plain, "a form in lower case decrypts to the text");

    CString damaged = form;
    const int at = static_cast<int>(damageAt % static_cast<std::size_t>(form.GetLength()));
    damaged.SetAt(at, damaged[at] == u'0' ? u'1' : u'0');
    FuzzCheck(!crypt.DecryptHexString(damaged) && damaged.IsEmpty(), "a damaged form is refused and wiped");

    FuzzCheck(crypt.DecryptHexString(form), "a form decrypts");
    FuzzCheck(form == plain, "a form decrypts to the text it was made of");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const CAesCrypt crypt(kKeyHigh, kKeyLow);
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    CheckForm(crypt, bytes);
    CheckText(crypt, bytes, size);
    return 0;
}
