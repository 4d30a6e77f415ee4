#pragma once
// The module's fixed key for the proxy password as stored in the settings
// file (CAesCrypt(kProxyPasswordKeyHigh, kProxyPasswordKeyLow)). The settings
// dialog enciphers with it and the cloud object deciphers with it; changing
// it makes every stored password unreadable.

#include "platform/types.h"

inline constexpr ULONGLONG kProxyPasswordKeyHigh = 0xD1DB97AB029A2A0Aull;
inline constexpr ULONGLONG kProxyPasswordKeyLow = 0xBB4AFD84136D5530ull;
