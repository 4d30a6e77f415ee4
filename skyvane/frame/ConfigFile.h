#pragma once
// The settings file: sections "Azure", "VARIABLES" and "CONNECTIONS".

#include "cloud/AzureConfig.h"

// Replaces the whole content of config with the file's. Missing keys give
// their defaults; a missing or unreadable file gives the default settings.
void ReadConfig(const CString& path, CAzureConfig& config);

// Writes the whole of config to the file in one atomic replacement; keys it
// does not write (comments, unknown keys, entries beyond a COUNT) stay as
// they are. False, and the file unchanged, when it cannot be written or a
// value cannot be stored in it (a text with a line break).
bool WriteConfig(const CString& path, const CAzureConfig& config);
