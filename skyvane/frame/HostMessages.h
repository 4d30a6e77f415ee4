#pragma once
// Window messages between the module and its host.

#include "platform/types.h"

// To the host window.
constexpr UINT WM_SKYVANE_ROWS_FAILED = WM_USER + 1;       // 1025, posted after a cycle in which rows failed
constexpr UINT WM_SKYVANE_STATUS = WM_USER + 2;            // 1026: end of init (sent, 0, 0); after each
                                                           // worker cycle (posted, rows sent, duration in ms)
constexpr UINT WM_SKYVANE_RESTART_FAILED = WM_USER + 102;  // 1126, posted when exec_action could not restart
constexpr UINT WM_SKYVANE_INIT_BEGIN = WM_USER + 103;      // 1127, sent first in init with wParam 1

// To the module's own window.
constexpr UINT WM_SKYVANE_CHECK_VARIABLES = WM_USER + 104;  // 1128: subscribe the configured variables
