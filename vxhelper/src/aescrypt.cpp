#include "vxhelper/aescrypt.h"

#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/rand.h>

#include <memory>
#include <string>
#include <vector>

namespace {

constexpr int kNonceBytes = 12;
constexpr int kTagBytes = 16;
constexpr size_t kMaxPlainBytes = 64 * 1024;  // secrets are short; refuse anything absurd

// A byte buffer that is wiped before its memory goes back.
struct SecretBytes {
    std::vector<unsigned char> bytes;
    explicit SecretBytes(size_t n) : bytes(n) {}
    ~SecretBytes() { OPENSSL_cleanse(bytes.data(), bytes.size()); }
    SecretBytes(const SecretBytes&) = delete;
    SecretBytes& operator=(const SecretBytes&) = delete;
};

struct CipherCtxDeleter {
    void operator()(EVP_CIPHER_CTX* ctx) const { EVP_CIPHER_CTX_free(ctx); }
};
using CipherCtx = std::unique_ptr<EVP_CIPHER_CTX, CipherCtxDeleter>;

int HexDigit(char16_t c) {
    if (c >= u'0' && c <= u'9') return c - u'0';
    if (c >= u'a' && c <= u'f') return c - u'a' + 10;
    if (c >= u'A' && c <= u'F') return c - u'A' + 10;
    return -1;
}

}  // namespace

void SecureClearString(CString& text) {
    const int capacity = static_cast<int>(text.Str().capacity());
    char16_t* chars = text.GetBuffer(capacity);  // within capacity: no reallocation
    OPENSSL_cleanse(chars, static_cast<size_t>(capacity) * sizeof(char16_t));
    text.ReleaseBuffer(0);
}

CAesCrypt::CAesCrypt(ULONGLONG keyHigh, ULONGLONG keyLow) {
    for (int i = 0; i < 8; ++i) {
        m_key[i] = static_cast<unsigned char>(keyHigh >> (56 - 8 * i));
        m_key[8 + i] = static_cast<unsigned char>(keyLow >> (56 - 8 * i));
    }
}

CAesCrypt::~CAesCrypt() { OPENSSL_cleanse(m_key, sizeof m_key); }

bool CAesCrypt::EncryptHexString(CString& text) const {
    if (text.IsEmpty()) return true;
    std::string utf8 = text.ToUtf8();
    // A lone surrogate has no UTF-8 form: it would come back as U+FFFD.
    if (Utf8ToUtf16(utf8) != text.View()) {
        OPENSSL_cleanse(utf8.data(), utf8.size());
        return false;
    }
    SecretBytes plain(utf8.size());
    std::copy(utf8.begin(), utf8.end(), plain.bytes.begin());
    OPENSSL_cleanse(utf8.data(), utf8.size());
    if (plain.bytes.size() > kMaxPlainBytes) return false;

    std::vector<unsigned char> out(kNonceBytes + plain.bytes.size() + kTagBytes);
    unsigned char* nonce = out.data();
    unsigned char* cipher = nonce + kNonceBytes;
    unsigned char* tag = cipher + plain.bytes.size();
    CipherCtx ctx(EVP_CIPHER_CTX_new());
    int written = 0, last = 0;
    const bool ok =
        ctx && RAND_bytes(nonce, kNonceBytes) == 1 &&
        EVP_EncryptInit_ex(ctx.get(), EVP_aes_128_gcm(), nullptr, m_key, nonce) == 1 &&
        EVP_EncryptUpdate(ctx.get(), cipher, &written, plain.bytes.data(), static_cast<int>(plain.bytes.size())) == 1 &&
        EVP_EncryptFinal_ex(ctx.get(), cipher + written, &last) == 1 &&
        EVP_CIPHER_CTX_ctrl(ctx.get(), EVP_CTRL_GCM_GET_TAG, kTagBytes, tag) == 1;
    if (!ok) return false;

    static constexpr char16_t kHex[] = u"0123456789ABCDEF";
    std::u16string hex;
    hex.reserve(out.size() * 2);
    for (const unsigned char b : out) {
        hex += kHex[b >> 4];
        hex += kHex[b & 0x0F];
    }
    SecureClearString(text);
    text = CString(std::move(hex));
    return true;
}

bool CAesCrypt::DecryptHexString(CString& text) const {
    if (text.IsEmpty()) return true;
    const std::u16string_view hex = text.View();
    const size_t bytes = hex.size() / 2;
    if (hex.size() % 2 != 0 || bytes < kNonceBytes + kTagBytes || bytes - kNonceBytes - kTagBytes > kMaxPlainBytes) {
        SecureClearString(text);
        return false;
    }
    std::vector<unsigned char> in(bytes);
    for (size_t i = 0; i < bytes; ++i) {
        const int hi = HexDigit(hex[2 * i]), lo = HexDigit(hex[2 * i + 1]);
        if (hi < 0 || lo < 0) {
            SecureClearString(text);
            return false;
        }
        in[i] = static_cast<unsigned char>(hi << 4 | lo);
    }
    const unsigned char* nonce = in.data();
    const unsigned char* cipher = nonce + kNonceBytes;
    const int cipherBytes = static_cast<int>(bytes - kNonceBytes - kTagBytes);
    unsigned char tag[kTagBytes];
    std::copy(cipher + cipherBytes, cipher + cipherBytes + kTagBytes, tag);

    SecretBytes plain(static_cast<size_t>(cipherBytes) + 1);  // +1: never a zero-sized output pointer
    CipherCtx ctx(EVP_CIPHER_CTX_new());
    int written = 0, last = 0;
    const bool ok = ctx && EVP_DecryptInit_ex(ctx.get(), EVP_aes_128_gcm(), nullptr, m_key, nonce) == 1 &&
                    EVP_DecryptUpdate(ctx.get(), plain.bytes.data(), &written, cipher, cipherBytes) == 1 &&
                    EVP_CIPHER_CTX_ctrl(ctx.get(), EVP_CTRL_GCM_SET_TAG, kTagBytes, tag) == 1 &&
                    EVP_DecryptFinal_ex(ctx.get(), plain.bytes.data() + written, &last) == 1;
    SecureClearString(text);
    if (!ok) return false;
    std::u16string decoded = Utf8ToUtf16(
        std::string_view(reinterpret_cast<const char*>(plain.bytes.data()), static_cast<size_t>(written + last)));
    text = CString(std::move(decoded));
    return true;
}
