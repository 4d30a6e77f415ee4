// Connection strings: the library's parser and the module's masking for the
// log. A failure names no secret; an accepted string is consistent and reads
// back the same from its canonical form; the masked text holds no secret
// value where the parser would find one, and keeps every other part.

#include "private/ConnectionString.h"
#include "cloud/ConnectionText.h"

#include "FuzzCheck.h"

#include <cctype>
#include <string>
#include <vector>

namespace {

struct Part {
    std::string name;   // trimmed, lower case, as the parser compares it
    std::string value;  // trimmed
    std::string whole;  // as written
};

std::string Trimmed(const std::string& s) {
    std::size_t b = 0, e = s.size();
    while (b < e && std::isspace(static_cast<unsigned char>(s[b]))) ++b;
    while (e > b && std::isspace(static_cast<unsigned char>(s[e - 1]))) --e;
    return s.substr(b, e - b);
}

std::vector<Part> Parts(const std::string& text) {
    std::vector<Part> parts;
    std::size_t start = 0;
    for (;;) {
        const std::size_t semi = text.find(';', start);
        Part part;
        part.whole = text.substr(start, semi == std::string::npos ? std::string::npos : semi - start);
        const std::size_t eq = part.whole.find('=');
        if (eq != std::string::npos) {
            part.name = Trimmed(part.whole.substr(0, eq));
            for (char& c : part.name) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
            part.value = Trimmed(part.whole.substr(eq + 1));
        }
        parts.push_back(part);
        if (semi == std::string::npos) return parts;
        start = semi + 1;
    }
}

bool IsSecretName(const std::string& name) { return name == "sharedaccesskey" || name == "sharedaccesssignature"; }

// Long secret values that appear nowhere else in the text (a short one may
// match a fixed word of a message by chance).
std::vector<std::string> Secrets(const std::vector<Part>& parts) {
    std::vector<std::string> secrets;
    for (const Part& part : parts) {
        if (!IsSecretName(part.name) || part.value.size() < 8) continue;
        bool elsewhere = false;
        for (const Part& other : parts)
            elsewhere |= !IsSecretName(other.name) && other.whole.find(part.value) != std::string::npos;
        if (!elsewhere) secrets.push_back(part.value);
    }
    return secrets;
}

void CheckNoSecretIn(const std::string& text, const std::vector<std::string>& secrets, const char* what) {
    for (const std::string& secret : secrets) FuzzCheck(text.find(secret) == std::string::npos, what);
}

// The text with every secret value replaced by zeros of the same length.
std::string WithoutSecrets(const std::vector<Part>& parts) {
    std::string text;
    for (const Part& part : parts) {
        if (&part != &parts.front()) text += ';';
        if (!IsSecretName(part.name)) {
            text += part.whole;
            continue;
        }
        const std::size_t eq = part.whole.find('=');
        const std::size_t at = part.whole.find(part.value, eq);
        text += part.whole.substr(0, at) + std::string(part.value.size(), '0') +
                part.whole.substr(at + part.value.size());
    }
    return text;
}

// A reason may hold a secret's characters only where it holds them whatever
// the secret is (a fixed word of the message, a part that is not secret).
void CheckReason(const std::string& error, const std::vector<Part>& parts, const std::vector<std::string>& secrets) {
    FuzzCheck(!error.empty(), "a refusal gives a reason");
    std::string neutralError;
    corvell::ParseConnectionString(WithoutSecrets(parts), neutralError);
    for (const std::string& secret : secrets) {
        if (error.find(secret) != std::string::npos)
            FuzzCheck(neutralError.find(secret) != std::string::npos, "the reason quotes a secret");
    }
}

std::string Canonical(const corvell::ConnectionString& c) {
    const bool ipv6 = c.host.find(':') != std::string::npos;
    std::string text = "Endpoint=sb://" + (ipv6 ? "[" + c.host + "]" : c.host);
    if (c.port != 0) text += ":" + std::to_string(c.port);
    text += "/";
    if (!c.sharedSignature.empty()) text += ";SharedAccessSignature=" + c.sharedSignature;
    else text += ";SharedAccessKeyName=" + c.keyName + ";SharedAccessKey=" + c.key;
    if (!c.entityPath.empty()) text += ";EntityPath=" + c.entityPath;
    if (c.emulator) text += ";UseDevelopmentEmulator=true";
    return text;
}

void CheckAccepted(const corvell::ConnectionString& c, const std::vector<std::string>& secrets) {
    FuzzCheck(!c.host.empty(), "an accepted string has a host");
    for (char ch : c.host) FuzzCheck(!std::isupper(static_cast<unsigned char>(ch)), "the host is lower case");
    FuzzCheck(c.port >= 0 && c.port <= 65535, "the port is in range");
    const bool keyPair = !c.keyName.empty() && !c.key.empty();
    FuzzCheck(keyPair != !c.sharedSignature.empty(), "either a key pair or a signature");
    FuzzCheck(c.entityPath.empty() || corvell::IsValidEntityName(c.entityPath), "the entity path is valid");
    FuzzCheck(!c.emulator || corvell::IsLoopbackHost(c.host), "the emulator only on a loopback host");
    CheckNoSecretIn(c.NamespaceName(), secrets, "the namespace name quotes a secret");

    std::string error;
    const auto again = corvell::ParseConnectionString(Canonical(c), error);
    FuzzCheck(again.has_value(), "the canonical form is accepted");
    FuzzCheck(again->host == c.host && again->port == c.port && again->emulator == c.emulator &&
                  again->keyName == c.keyName && again->key == c.key && again->sharedSignature == c.sharedSignature &&
                  again->entityPath == c.entityPath,
              "the canonical form reads back the same");
}

// What the log shows: every part the parser reads as a secret is masked;
// the other parts stay as written.
void CheckMasking(const std::string& text) {
    const CString wide = CString::FromUtf8(text);
    const std::string original = wide.ToUtf8();  // malformed UTF-8 already replaced
    const std::string masked = MaskConnectionSecrets(wide).ToUtf8();
    const std::vector<Part> before = Parts(original), after = Parts(masked);
    FuzzCheck(before.size() == after.size(), "masking keeps the number of parts");
    for (std::size_t i = 0; i < before.size(); ++i) {
        if (IsSecretName(after[i].name)) FuzzCheck(after[i].value == "***", "a secret part is masked");
        else FuzzCheck(after[i].whole == before[i].whole, "a part that is not secret is kept");
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string text(reinterpret_cast<const char*>(data), size);
    const std::vector<Part> parts = Parts(text);
    const std::vector<std::string> secrets = Secrets(parts);
    std::string error;
    const auto parsed = corvell::ParseConnectionString(text, error);
    if (parsed) CheckAccepted(*parsed, secrets);
    else CheckReason(error, parts, secrets);
    CheckMasking(text);
    return 0;
}
