// Test main of the dialog tests: a widget application (the shared test main
// makes a core one), and the module's string table for the dialogs' texts.
#include "res/StringTable.h"

#include <QApplication>
#include <gtest/gtest.h>

int main(int argc, char** argv) {
    QApplication app(argc, argv);
    CStringTableRegistration strings(kModuleStrings, kModuleStringCount);
    ::testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
