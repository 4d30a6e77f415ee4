// Signatures, connection strings, answer classification and log masking.

#include <gtest/gtest.h>

#include "private/ConnectionString.h"
#include "private/Log.h"
#include "RecordingLogger.h"
#include "private/Retry.h"
#include "RowDecoders.h"
#include "private/Sas.h"
#include "private/Utf.h"

using namespace corvell;

TEST(SasToken, MatchesWorkedExampleByteForByte) {
    const SasToken token = MakeSasToken("https://contoso-ns.servicebus.windows.net/telemetry",
                                        "RootManageSharedAccessKey", "ZmFrZS1rZXktZm9yLXRlc3RzLW9ubHk=", 1800000000);
    EXPECT_EQ(token.token,
              "SharedAccessSignature sr=https%3A%2F%2Fcontoso-ns.servicebus.windows.net%2Ftelemetry"
              "&sig=swBtL5xDPLJ17OMjQ2WyV1QHJZ5oL69ThNM3z4dpDYE%3D&se=1800000000&skn=RootManageSharedAccessKey");
    EXPECT_EQ(token.signature, "swBtL5xDPLJ17OMjQ2WyV1QHJZ5oL69ThNM3z4dpDYE%3D");
    // The receiving side's check, written separately, accepts it for the entity and below only.
    std::string why;
    EXPECT_TRUE(azurelocal::CheckSasToken(token.token, "RootManageSharedAccessKey", "ZmFrZS1rZXktZm9yLXRlc3RzLW9ubHk=",
                                          "contoso-ns.servicebus.windows.net/telemetry", 1700000000, why))
        << why;
    EXPECT_FALSE(azurelocal::CheckSasToken(token.token, "RootManageSharedAccessKey", "other-key",
                                           "contoso-ns.servicebus.windows.net/telemetry", 1700000000, why));
    EXPECT_FALSE(azurelocal::CheckSasToken(token.token, "RootManageSharedAccessKey", "ZmFrZS1rZXktZm9yLXRlc3RzLW9ubHk=",
                                           "contoso-ns.servicebus.windows.net/telemetry2", 1700000000, why));
    EXPECT_FALSE(azurelocal::CheckSasToken(token.token, "RootManageSharedAccessKey", "ZmFrZS1rZXktZm9yLXRlc3RzLW9ubHk=",
                                           "contoso-ns.servicebus.windows.net/telemetry", 1800000000, why))
        << "expired";
}

TEST(SasToken, EncodingAndBase64Edges) {
    EXPECT_EQ(PercentEncode("aZ09-_.~ /:%+="), "aZ09-_.~%20%2F%3A%25%2B%3D");
    EXPECT_EQ(Base64Encode(""), "");
    EXPECT_EQ(Base64Encode("f"), "Zg==");
    EXPECT_EQ(Base64Encode("fo"), "Zm8=");
    EXPECT_EQ(Base64Encode("foo"), "Zm9v");
    EXPECT_EQ(Base64Encode(std::string("\xff\xfe\x00", 3)), "//4A");
    const std::string a = NewUuid(), b = NewUuid();
    EXPECT_EQ(a.size(), 36u);
    EXPECT_EQ(a[14], '4');
    EXPECT_NE(a, b);
}

TEST(ConnectionStrings, AcceptedForms) {
    std::string error;
    auto c = ParseConnectionString(
        " Endpoint = sb://Contoso-NS.servicebus.windows.net/ ; sharedaccesskeyname=Root;"
        "SharedAccessKey=abc=def==;EntityPath=telemetry;",
        error);
    ASSERT_TRUE(c) << error;
    EXPECT_EQ(c->host, "contoso-ns.servicebus.windows.net");
    EXPECT_EQ(c->port, 0);
    EXPECT_EQ(c->keyName, "Root");
    EXPECT_EQ(c->key, "abc=def==") << "split at the first '=' only";
    EXPECT_EQ(c->entityPath, "telemetry");
    EXPECT_FALSE(c->emulator);
    EXPECT_EQ(c->NamespaceName(), "contoso-ns");

    c = ParseConnectionString(
        "Endpoint=sb://ns.servicebus.windows.net;SharedAccessSignature=SharedAccessSignature "
        "sr=x&sig=y&se=1&skn=k",
        error);
    ASSERT_TRUE(c) << error;
    EXPECT_EQ(c->sharedSignature, "SharedAccessSignature sr=x&sig=y&se=1&skn=k");

    for (const char* host : {"localhost", "127.0.0.1", "127.1.2.3", "[::1]"}) {
        c = ParseConnectionString(std::string("Endpoint=sb://") + host +
                                      ":5300;SharedAccessKeyName=k;SharedAccessKey=v;UseDevelopmentEmulator=true",
                                  error);
        ASSERT_TRUE(c) << host << ": " << error;
        EXPECT_TRUE(c->emulator);
        EXPECT_EQ(c->port, 5300);
    }
}

TEST(ConnectionStrings, RejectedFormsNameNoSecret) {
    const char* bad[] = {
        "",
        "garbage",
        "SharedAccessKeyName=k;SharedAccessKey=SECRETKEY",                                     // no endpoint
        "Endpoint=ns.servicebus.windows.net;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY",  // no scheme
        "Endpoint=ftp://ns;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY",
        "Endpoint=sb://ns/path;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY",
        "Endpoint=sb://user@ns;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY",
        "Endpoint=sb://ns:0;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY",
        "Endpoint=sb://ns:99999;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY",
        "Endpoint=sb://ns:;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY",
        "Endpoint=sb://bad host;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY",
        "Endpoint=sb://ns;SharedAccessKeyName=k",      // key missing
        "Endpoint=sb://ns;SharedAccessKey=SECRETKEY",  // key name missing
        "Endpoint=sb://ns;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY;SharedAccessSignature=SharedAccessSignature "
        "sr=a&sig=b",
        "Endpoint=sb://ns;SharedAccessSignature=SECRETKEY",  // not a token
        "Endpoint=sb://ns;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY;EntityPath=a b",
        "Endpoint=sb://ns;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY;EntityPath=../x",
        "Endpoint=sb://"
        "ns.servicebus.windows.net;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY;UseDevelopmentEmulator=true",
        "Endpoint=sb://128.0.0.1;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY;UseDevelopmentEmulator=true",
        "Endpoint=sb://localhost;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY;UseDevelopmentEmulator=yes",
        "Endpoint=sb://localhost;novalue;SharedAccessKeyName=k;SharedAccessKey=SECRETKEY",
    };
    for (const char* text : bad) {
        std::string error;
        EXPECT_FALSE(ParseConnectionString(text, error)) << text;
        EXPECT_FALSE(error.empty()) << text;
        EXPECT_EQ(error.find("SECRETKEY"), std::string::npos) << error;
    }
}

TEST(ConnectionStrings, EntityNamesAndLoopback) {
    for (const char* ok : {"q", "telemetry-1", "a.b_c", "topic/sub"}) EXPECT_TRUE(IsValidEntityName(ok)) << ok;
    for (const char* no : {"", "/q", "q/", "a//b", "a/../b", "a?b", "a b", "a%2F", "..", "\xc3\xa9"})
        EXPECT_FALSE(IsValidEntityName(no)) << no;
    EXPECT_FALSE(IsValidEntityName(std::string(261, 'a')));
    EXPECT_TRUE(IsLoopbackHost("127.255.0.1"));
    EXPECT_FALSE(IsLoopbackHost("127.0.0.256"));
    EXPECT_FALSE(IsLoopbackHost("127.0.0"));
    EXPECT_FALSE(IsLoopbackHost("127.0.0.1.evil.example"));
    EXPECT_FALSE(IsLoopbackHost("localhost.example"));
}

TEST(Answers, Classification) {
    auto status = [](long code, std::string body = {}) {
        HttpResponse r;
        r.status = code;
        r.body = std::move(body);
        return Classify(r);
    };
    EXPECT_EQ(status(201), Outcome::Accepted);
    EXPECT_EQ(status(200), Outcome::Accepted);
    EXPECT_EQ(status(400), Outcome::Permanent);
    EXPECT_EQ(status(401), Outcome::Unauthorized);
    EXPECT_EQ(status(404), Outcome::Permanent);
    EXPECT_EQ(status(410), Outcome::Permanent);
    EXPECT_EQ(status(413), Outcome::TooLarge);
    EXPECT_EQ(status(403, "<Detail>The message size exceeds the limit</Detail>"), Outcome::TooLarge);
    EXPECT_EQ(status(403, "<Detail>Quota exceeded for this entity</Detail>"), Outcome::Permanent);
    EXPECT_EQ(status(403, "<Detail>The maximum entity size has been reached or exceeded</Detail>"), Outcome::Permanent);
    EXPECT_EQ(status(403, "<Detail>The request body is too large</Detail>"), Outcome::TooLarge);
    EXPECT_EQ(status(403), Outcome::Permanent);
    for (long transient : {408L, 429L, 500L, 502L, 503L, 504L}) EXPECT_EQ(status(transient), Outcome::Transient);
    HttpResponse refused;
    refused.curlCode = 7;  // could not connect
    EXPECT_EQ(Classify(refused), Outcome::Transient);
    HttpResponse tls;
    tls.curlCode = 60;
    tls.tlsFailure = true;
    EXPECT_EQ(Classify(tls), Outcome::Permanent);
}

TEST(Answers, RetryAfterAndErrorText) {
    HttpResponse r;
    EXPECT_FALSE(RetryAfter(r));
    r.headers["retry-after"] = "2";
    EXPECT_EQ(RetryAfter(r)->count(), 2000);
    r.headers["retry-after"] = "Wed, 21 Oct 2015 07:28:00 GMT";
    EXPECT_FALSE(RetryAfter(r)) << "a date falls back to back-off";
    r.headers["x-ms-retry-after-ms"] = "150";
    EXPECT_EQ(RetryAfter(r)->count(), 150);
    r.headers["retry-after-ms"] = "-5";
    EXPECT_EQ(RetryAfter(r)->count(), 150) << "a negative wait is ignored";

    r.body = "<Error><Code>404</Code><Detail>The entity\r\nwas not found.</Detail></Error>";
    EXPECT_EQ(ServiceErrorText(r), "The entity was not found.");
    r.body = "<Error><Detail>a &lt;b&gt; &amp;amp; &quot;c&quot; &apos;d&apos; &#38;</Detail></Error>";
    EXPECT_EQ(ServiceErrorText(r), "a <b> &amp; \"c\" 'd' &#38;");

    Backoff backoff(std::chrono::milliseconds(800), std::chrono::milliseconds(5000));
    for (int attempt = 0; attempt < 3; ++attempt) {
        const auto d = backoff.Delay(attempt).count();
        EXPECT_GE(d, 800 * (1 << attempt) * 8 / 10);
        EXPECT_LE(d, 800 * (1 << attempt) * 13 / 10);
    }
    EXPECT_EQ(backoff.Delay(20).count(), 5000);
}

TEST(LogRecords, SecretsAreMaskedEverywhere) {
    RecordingLogger logger;
    logger.infoEnabled = true;
    Log log(&logger);
    log.AddSecret("s3cr3t-key");
    log.AddSecret("ab");  // too short to mask without mangling ordinary words
    log.Error("token s3cr3t-key and again s3cr3t-key, ab stays");
    log.Info("s3cr3t-key");
    ASSERT_EQ(logger.Records().size(), 2u);
    EXPECT_EQ(logger.Records()[0].text, "token *** and again ***, ab stays");
    EXPECT_EQ(logger.Records()[1].text, "***");
    logger.infoEnabled = false;
    log.Info("not written");
    EXPECT_EQ(logger.Records().size(), 2u);

    // A signature in every spelling: as in the token, plain base64, lower-case escapes, base64url.
    log.AddSignature(1, "ab+/cdEFgh%2B%2Fij%3D");
    EXPECT_EQ(log.Mask("ab+/cdEFgh%2B%2Fij%3D | ab+/cdEFgh+/ij= | ab%2b%2fcdEFgh%2b%2fij%3d | ab-_cdEFgh-_ij | "
                       "ab+/cdEFgh+/ij"),
              "*** | *** | *** | *** | ***");
    // A renewed token's signature joins the last one; the one before that is dropped.
    log.AddSignature(1, "second-signature-text");
    log.AddSignature(1, "third-signature-text");
    EXPECT_EQ(log.Mask("ab+/cdEFgh+/ij= second-signature-text third-signature-text"), "ab+/cdEFgh+/ij= *** ***");

    // Tokens and keys never seen are masked by their names.
    EXPECT_EQ(log.Mask("got 'SharedAccessSignature sr=x%3A&sig=AbC&se=1&skn=k' and sig=QQ%3D&se=2"),
              "got 'SharedAccessSignature ***' and sig=***&se=2");
    EXPECT_EQ(log.Mask("Endpoint=sb://n/;SharedAccessSignature=SharedAccessSignature sr=a&sig=b;EntityPath=q"),
              "Endpoint=sb://n/;SharedAccessSignature=SharedAccessSignature ***;EntityPath=q");
    EXPECT_EQ(log.Mask("SharedAccessKeyName=Root;SharedAccessKey=c2VjcmV0=;x"),
              "SharedAccessKeyName=Root;SharedAccessKey=***;x");
    EXPECT_EQ(log.Quote(std::string(300, 'x') + " sig=" + std::string(300, 'y')),
              std::string(256, 'x') + "...(52 more characters)");
}

TEST(LogRecords, QuotedTextsAreShortenedByCharacters) {
    EXPECT_EQ(Shorten("abc", 3), "abc");
    EXPECT_EQ(Shorten("abcd", 3), "abc...(1 more characters)");
    EXPECT_EQ(Shorten("\xC3\xA4\xF0\x9F\x98\x80\xC3\xA4x", 2), "\xC3\xA4\xF0\x9F\x98\x80...(2 more characters)")
        << "never cuts inside a character";
    EXPECT_EQ(Shorten(std::string(300000, 'n')), std::string(kMaxQuotedChars, 'n') + "...(299744 more characters)");
}

TEST(TextConversion, MalformedInputBecomesReplacementCharacters) {
    EXPECT_EQ(ToUtf8(std::u16string(u"a\xD800"
                                    u"b\U0001F600")),
              "a\xEF\xBF\xBD"
              "b\xF0\x9F\x98\x80");
    EXPECT_EQ(ToUtf16("a\xC3\xA9\xF0\x9F\x98\x80"), u"a\u00e9\U0001F600");
    EXPECT_EQ(ToUtf16("\xFF"), u"\uFFFD");
    EXPECT_EQ(ToUtf16("\xC0\x80"), u"\uFFFD") << "overlong";
    EXPECT_EQ(ToUtf16("\xED\xA0\x80"), u"\uFFFD") << "encoded surrogate";
    EXPECT_EQ(ToUtf16("\xE2\x82"), u"\uFFFD\uFFFD") << "cut short";
    EXPECT_EQ(View(nullptr), u"");
}
