#pragma once
// Shared access signatures and the small encodings they need.

#include <cstdint>
#include <string>
#include <string_view>

namespace corvell {

// Percent-encodes every byte outside A-Z a-z 0-9 - _ . ~ (upper-case hex).
std::string PercentEncode(std::string_view text);
std::string Base64Encode(std::string_view bytes);
// HMAC-SHA256 of data with the key bytes, raw 32 bytes.
std::string HmacSha256(std::string_view key, std::string_view data);

// "SharedAccessSignature sr=..&sig=..&se=..&skn=.." for the resource address
// (e.g. https://ns.servicebus.windows.net/queue), valid until expiry (seconds
// since 1970 UTC). key is the key text as written in the connection string.
struct SasToken {
    std::string token;
    std::string signature;  // the encoded sig value, to keep it out of logs
};
SasToken MakeSasToken(std::string_view resourceUri, std::string_view keyName, std::string_view key,
                      std::int64_t expiry);

// A random version-4 UUID in its usual text form.
std::string NewUuid();

}  // namespace corvell
