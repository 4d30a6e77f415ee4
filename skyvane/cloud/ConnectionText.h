#pragma once
// Connection strings as they may appear in the log.

#include "platform/text.h"

// The connection string with the value of every secret part
// ("SharedAccessKey", "SharedAccessSignature"; names in any letter case)
// replaced by "***"; every other part is kept as written.
CString MaskConnectionSecrets(const CString& strConnection);
