#include "vxhelper/aescrypt.h"

#include "CStringPrint.h"

#include <gtest/gtest.h>

namespace {

constexpr ULONGLONG kHigh = 0x0123456789ABCDEFull;
constexpr ULONGLONG kLow = 0x0FEDCBA987654321ull;

TEST(AesCrypt, RoundTripsAndHidesTheText) {
    const CAesCrypt crypt(kHigh, kLow);
    for (const CString& plain : {CString(u"s3cr\u00e9t \U0001F600"), CString(u"x"), CString(std::u16string(300, u'p'))}) {
        CString text = plain;
        ASSERT_TRUE(crypt.EncryptHexString(text));
        EXPECT_NE(text, plain);
        EXPECT_EQ(text.View().find_first_not_of(u"0123456789ABCDEF"), std::u16string_view::npos);
        CString again = plain;
        ASSERT_TRUE(crypt.EncryptHexString(again));
        EXPECT_NE(again, text);  // a fresh nonce every time
        CString lower = text;
        lower.MakeLower();
        ASSERT_TRUE(crypt.DecryptHexString(text));
        EXPECT_EQ(text, plain);
        ASSERT_TRUE(crypt.DecryptHexString(lower));
        EXPECT_EQ(lower, plain);
    }
    CString empty;
    EXPECT_TRUE(crypt.EncryptHexString(empty));
    EXPECT_TRUE(empty.IsEmpty());
    EXPECT_TRUE(crypt.DecryptHexString(empty));
    EXPECT_TRUE(empty.IsEmpty());
}

TEST(AesCrypt, DamagedFormsAndOtherKeysAreDetected) {
    const CAesCrypt crypt(kHigh, kLow);
    CString form = u"proxy password";
    ASSERT_TRUE(crypt.EncryptHexString(form));

    std::vector<CString> damaged;
    for (int at : {0, 30, form.GetLength() - 1}) {  // nonce, cipher text, tag
        CString flipped = form;
        flipped.SetAt(at, flipped[at] == u'0' ? u'1' : u'0');
        damaged.push_back(flipped);
    }
    damaged.push_back(form.Left(form.GetLength() - 2));  // shortened
    damaged.push_back(form + u"00");                     // lengthened
    damaged.push_back(form.Left(form.GetLength() - 1));  // odd length
    damaged.push_back(form.Left(20));                    // shorter than nonce and tag
    CString foreign = form;
    foreign.SetAt(4, u'G');
    damaged.push_back(foreign);
    for (CString text : damaged) {
        EXPECT_FALSE(crypt.DecryptHexString(text)) << text.ToUtf8();
        EXPECT_TRUE(text.IsEmpty());  // nothing half-decrypted is left behind
    }
    CString other = form;
    EXPECT_FALSE(CAesCrypt(kHigh, kLow ^ 1).DecryptHexString(other));
    EXPECT_FALSE(CAesCrypt(kLow, kHigh).DecryptHexString(form));
}

TEST(AesCrypt, SecureClearStringOverwritesTheCharacters) {
    CString secret(std::u16string(64, u'S'));
    const char16_t* chars = secret.GetString();
    SecureClearString(secret);
    EXPECT_TRUE(secret.IsEmpty());
    EXPECT_EQ(secret.GetString(), chars);  // same storage, still owned by the string
    for (int i = 0; i < 64; ++i) ASSERT_EQ(chars[i], 0) << i;
    CString empty;
    SecureClearString(empty);
    EXPECT_TRUE(empty.IsEmpty());
}

}  // namespace
