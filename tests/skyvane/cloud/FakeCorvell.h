#pragma once
// A stand-in for libCorvell.so, built in three forms (both exports, only
// CreateAzureInstance, none), each as libCorvell.so in a folder of its own.
// The test reaches the state of a loaded copy through FakeCorvell_State.

#include "corvell/AzureInstance.h"

#include <string>

struct FakeCorvellState {
    bool createReturnsNull = false;  // set by the test
    int created = 0;
    int destroyed = 0;
    int rowsAdded = 0;
    bool proxyGiven = false;  // the three proxy texts were not null
    std::u16string proxyAddress, proxyUser, proxyPassword;
    corvell::ILogger* logger = nullptr;
    corvell::IAzureInstance* lastInstance = nullptr;
};

using PFN_FakeCorvell_State = FakeCorvellState* (*)();
