#pragma once
// Where a loaded program or shared library lives on disk.

#include "platform/text.h"

class VX_DirManager {
public:
    // The directory of the program or shared library that contains the given
    // address (pass the address of a function or object of your own), as an
    // absolute path ending in "/". Empty when the address belongs to no
    // loaded file.
    static CString GetModuleDir(const void* addressInModule);
};
