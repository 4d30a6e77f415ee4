#pragma once
// Enciphering short secrets (the proxy password) into hexadecimal text.

#include "platform/text.h"

// Overwrites every character of text, including unused capacity, in a way the
// compiler cannot leave out, and leaves text empty.
void SecureClearString(CString& text);

// AES-128 in GCM mode with a key made of two 64-bit values (the first gives
// the key's first eight bytes, most significant first). A text is enciphered
// as its UTF-8 bytes; the hexadecimal form (upper case) is a fresh random
// 12-byte nonce, the cipher text and the 16-byte authentication tag, so the
// same text gives a different form each time and any change to the form, or
// a different key, is detected. The empty text stays empty both ways.
class CAesCrypt {
public:
    CAesCrypt(ULONGLONG keyHigh, ULONGLONG keyLow);
    ~CAesCrypt();  // wipes the key
    CAesCrypt(const CAesCrypt&) = delete;
    CAesCrypt& operator=(const CAesCrypt&) = delete;

    // Replaces text by the hexadecimal form of its encryption. False, and text
    // unchanged, when that is not possible, also for a text that is not valid
    // UTF-16 (a lone surrogate), which would not decrypt to itself.
    bool EncryptHexString(CString& text) const;

    // Replaces the hexadecimal form by the text it enciphers (either letter
    // case is read). False when the form is malformed, damaged or made with
    // another key; text is then wiped and left empty.
    bool DecryptHexString(CString& text) const;

private:
    unsigned char m_key[16];
};
