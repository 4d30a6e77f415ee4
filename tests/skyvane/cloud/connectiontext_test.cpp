// What a connection string looks like in the log.
#include "cloud/ConnectionText.h"

#include "CStringPrint.h"

#include <gtest/gtest.h>

TEST(ConnectionText, SecretPartsAreMaskedAndEverythingElseKept) {
    struct Case {
        const char16_t* given;
        const char16_t* logged;
    } cases[] = {
        {u"Endpoint=sb://ns.servicebus.windows.net/;SharedAccessKeyName=Root;SharedAccessKey=abc+/=;EntityPath=q",
         u"Endpoint=sb://ns.servicebus.windows.net/;SharedAccessKeyName=Root;SharedAccessKey=***;EntityPath=q"},
        {u"Endpoint=sb://h/;SharedAccessSignature=SharedAccessSignature sr=h&sig=x%2B&se=1&skn=k",
         u"Endpoint=sb://h/;SharedAccessSignature=***"},
        {u" sharedaccesskey = k1 ;SHAREDACCESSKEY=k2;", u" sharedaccesskey =***;SHAREDACCESSKEY=***;"},
        {u"SharedAccessKeyName=only-a-name", u"SharedAccessKeyName=only-a-name"},
        {u"no parts at all", u"no parts at all"},
        {u"", u""},
    };
    for (const Case& c : cases) EXPECT_EQ(MaskConnectionSecrets(c.given), CString(c.logged)) << CString(c.given);
}
