#pragma once
// The settings dialog as the module object runs it, without toolkit types.

#include "cloud/AzureConfig.h"

class CWnd;

// Shows the settings dialog modally over the parent window's widget, editing
// config in place. IDOK when the user confirmed the settings, IDCANCEL
// otherwise (config may then be changed all the same). Without a widget
// application on the calling thread nothing can be shown: a message says so
// and the result is IDCANCEL.
int ShowSettingsDialog(CWnd* parent, CAzureConfig& config);
