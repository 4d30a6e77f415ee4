#pragma once
// Ids of the module's resources.

#include "platform/types.h"

// Dialog templates (DialogTemplates.h).
constexpr UINT IDD_KONFIG = 1000;
constexpr UINT IDD_CONNECTION = 2000;

// Controls of the settings dialog.
constexpr UINT IDC_LIST_VARIABLES = 1001;
constexpr UINT IDC_LIST_PROJECTS = 1002;
constexpr UINT IDC_LIST_EXPORTED = 1003;
constexpr UINT IDC_LIST_CONNECTIONS = 1004;
constexpr UINT IDC_NEW_CONNECTION = 1005;
constexpr UINT IDC_DELETE_CONNECTION = 1006;
constexpr UINT IDC_EDIT_CONNECTION = 1007;
constexpr UINT IDC_INTEGRITY_PERIOD = 1008;
constexpr UINT IDC_PROXY_DOMAIN = 1009;
constexpr UINT IDC_PROXY_USER = 1010;
constexpr UINT IDC_PROXY_PASSWORD = 1011;
constexpr UINT IDC_PROXY_PASSWORD_CONFIRM = 1012;
constexpr UINT IDC_ADD_VARIABLES = 1971;
constexpr UINT IDC_REMOVE_VARIABLES = 1972;

// Controls of the connection dialog.
constexpr UINT IDC_CONNECTION_TEXT = 2001;
constexpr UINT IDC_CONNECTION_QUEUE = 2002;
constexpr UINT IDC_MODE_QUEUE = 2003;
constexpr UINT IDC_MODE_EVENTHUB = 2004;
constexpr UINT IDC_FORMAT = 2005;

// Buttons every dialog has.
constexpr UINT IDC_OK = 1;
constexpr UINT IDC_CANCEL = 2;

// Sort arrows of the list headers (SortArrows.h).
constexpr UINT IDB_SORT_UP = 1064;
constexpr UINT IDB_SORT_DOWN = 1065;

// Strings (texts in StringTable.inc).
constexpr UINT IDS_COLUMN_PROJECTS = 5001;
constexpr UINT IDS_COLUMN_VARIABLES = 5002;
constexpr UINT IDS_COLUMN_POINTS = 5003;
constexpr UINT IDS_COLUMN_CONNECTION = 5004;
constexpr UINT IDS_COLUMN_QUEUE = 5005;
constexpr UINT IDS_UNKNOWN_VARIABLES = 5006;
constexpr UINT IDS_MANY_UNKNOWN_VARIABLES = 5007;
constexpr UINT IDS_UNKNOWN_VARIABLE = 5008;
constexpr UINT IDS_CONNECTION_FAILED = 5009;
constexpr UINT IDS_PASSWORD_NOT_ENCRYPTED = 5010;
constexpr UINT IDS_PASSWORD_BOTH_BOXES = 5011;
constexpr UINT IDS_PASSWORD_MISMATCH = 5012;
constexpr UINT IDS_SETTINGS_NOT_SAVED = 5013;  // %s: the settings file
constexpr UINT IDS_SETTINGS_NEED_DESKTOP = 5014;
