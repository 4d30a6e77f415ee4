#include "vxhelper/aescrypt.h"

#include "CStringPrint.h"

#include <gtest/gtest.h>

namespace {

constexpr ULONGLONG kHigh = 0x0123456789ABCDEFull;
constexpr ULONGLONG kLow = 0x0FEDCBA987654321ull;

TEST(AesCrypt, RoundTripsWithAFreshNonce) {
    const CAesCrypt crypt(kHigh, kLow);
    const CString plain = u"s3cr\u00e9t \U0001F600";
    CString text = plain, again = plain;
    ASSERT_TRUE(crypt.EncryptHexString(text));
    ASSERT_TRUE(crypt.EncryptHexString(again));
    EXPECT_EQ(text.View().find_first_not_of(u"0123456789ABCDEF"), std::u16string_view::npos);
    EXPECT_NE(text, again);
    again.MakeLower();  // either letter case reads
    ASSERT_TRUE(crypt.DecryptHexString(text));
    ASSERT_TRUE(crypt.DecryptHexString(again));
    EXPECT_EQ(text, plain);
    EXPECT_EQ(again, plain);
    CString empty;
    EXPECT_TRUE(crypt.EncryptHexString(empty));
    EXPECT_TRUE(empty.IsEmpty());
}

TEST(AesCrypt, DamagedFormsAndOtherKeysAreDetected) {
    const CAesCrypt crypt(kHigh, kLow);
    CString form = u"proxy password";
    ASSERT_TRUE(crypt.EncryptHexString(form));
    std::vector<CString> damaged = {form.Left(form.GetLength() - 2), form + u"00", form.Left(form.GetLength() - 1),
                                    form.Left(20)};
    for (int at : {0, 30, form.GetLength() - 1}) {  // in nonce, cipher text, tag
        CString flipped = form;
        flipped.SetAt(at, flipped[at] == u'0' ? u'1' : u'0');
        damaged.push_back(flipped);
    }
    CString foreign = form;
    foreign.SetAt(4, u'G');
    damaged.push_back(foreign);
    for (CString text : damaged) {
        EXPECT_FALSE(crypt.DecryptHexString(text)) << text.ToUtf8();
        EXPECT_TRUE(text.IsEmpty());  // nothing half-decrypted is left behind
    }
    CString other = form;
    EXPECT_FALSE(CAesCrypt(kHigh, kLow ^ 1).DecryptHexString(other));
}

TEST(AesCrypt, TextsThatAreNotValidUtf16AreRefusedAndKept) {
    const CAesCrypt crypt(kHigh, kLow);
    // A lone surrogate has no UTF-8 form; enciphering it would give back U+FFFD.
    for (const std::u16string& chars :
         {std::u16string(u"pass") + char16_t(0xD83D), std::u16string(1, char16_t(0xDC00)) + u"x"}) {
        CString text(chars);
        EXPECT_FALSE(crypt.EncryptHexString(text));
        EXPECT_EQ(text.View(), chars);
    }
    CString pair = u"pass😀";  // a whole surrogate pair is fine
    ASSERT_TRUE(crypt.EncryptHexString(pair));
    ASSERT_TRUE(crypt.DecryptHexString(pair));
    EXPECT_EQ(pair, CString(u"pass😀"));
}

TEST(AesCrypt, SecureClearStringOverwritesTheCharacters) {
    CString secret(std::u16string(64, u'S'));
    const char16_t* chars = secret.GetString();
    SecureClearString(secret);
    EXPECT_TRUE(secret.IsEmpty());
    ASSERT_EQ(secret.GetString(), chars);  // same storage, still owned by the string
    for (int i = 0; i < 64; ++i) ASSERT_EQ(chars[i], 0) << i;
}

}  // namespace
