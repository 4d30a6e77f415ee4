#include "platform/library.h"

#include <gtest/gtest.h>

TEST(LibraryLoading, LoadLookUpAndFree) {
    HMODULE libm = LoadLibrary(u"libm.so.6");
    ASSERT_NE(libm, nullptr) << GetLoaderError().ToUtf8();
    using CosFn = double (*)(double);
    auto cosine = reinterpret_cast<CosFn>(GetProcAddress(libm, "cos"));
    ASSERT_NE(cosine, nullptr);
    EXPECT_DOUBLE_EQ(cosine(0.0), 1.0);
    EXPECT_EQ(GetProcAddress(libm, "no_such_export_here"), nullptr);
    EXPECT_NE(GetLoaderError().Find(u"no_such_export_here"), -1);
    EXPECT_TRUE(FreeLibrary(libm));
}

TEST(LibraryLoading, MissingLibraryReportsWhy) {
    EXPECT_EQ(LoadLibrary(u"./libDoesNotExist.so"), nullptr);
    EXPECT_NE(GetLoaderError().Find(u"libDoesNotExist.so"), -1);
    EXPECT_FALSE(FreeLibrary(nullptr));
    EXPECT_EQ(GetProcAddress(nullptr, "x"), nullptr);
}
