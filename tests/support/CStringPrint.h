#pragma once
// Lets GoogleTest show a CString as text in failure messages.

#include "platform/text.h"

#include <ostream>

inline void PrintTo(const CString& text, std::ostream* out) { *out << '"' << text.ToUtf8() << '"'; }
