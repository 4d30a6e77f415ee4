#include "cloud/ConnectionText.h"

namespace {

bool IsSecretPart(CString name) {
    name.Trim();
    return name.CompareNoCase(u"SharedAccessKey") == 0 || name.CompareNoCase(u"SharedAccessSignature") == 0;
}

}  // namespace

CString MaskConnectionSecrets(const CString& strConnection) {
    CString masked;
    int start = 0;
    for (;;) {
        const int end = strConnection.Find(u';', start);
        const CString part = end < 0 ? strConnection.Mid(start) : strConnection.Mid(start, end - start);
        const int equals = part.Find(u'=');
        masked += (equals >= 0 && IsSecretPart(part.Left(equals))) ? part.Left(equals + 1) + u"***" : part;
        if (end < 0) return masked;
        masked += u';';
        start = end + 1;
    }
}
