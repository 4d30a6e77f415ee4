#include "private/ConnectionString.h"

#include <algorithm>
#include <cctype>
#include <charconv>

#include "private/Utf.h"

namespace corvell {

namespace {

std::string Trim(const std::string& s) {
    std::size_t b = 0, e = s.size();
    while (b < e && std::isspace(static_cast<unsigned char>(s[b]))) ++b;
    while (e > b && std::isspace(static_cast<unsigned char>(s[e - 1]))) --e;
    return s.substr(b, e - b);
}

std::string Lower(std::string s) {
    std::transform(s.begin(), s.end(), s.begin(), [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return s;
}

bool IsHostChar(char c) { return std::isalnum(static_cast<unsigned char>(c)) || c == '-' || c == '.' || c == '_'; }

// Splits "scheme://host[:port][/]" into its parts.
bool ParseEndpoint(const std::string& endpoint, ConnectionString& out, std::string& error) {
    const std::string lower = Lower(endpoint);
    const auto schemeEnd = lower.find("://");
    if (schemeEnd == std::string::npos) {
        error = "the Endpoint has no scheme (expected sb://namespace.servicebus.windows.net/)";
        return false;
    }
    const std::string scheme = lower.substr(0, schemeEnd);
    if (scheme != "sb" && scheme != "https") {
        error = "the Endpoint scheme '" + Shorten(scheme) + "' is not supported (expected sb://)";
        return false;
    }
    std::string rest = lower.substr(schemeEnd + 3);
    while (!rest.empty() && rest.back() == '/') rest.pop_back();
    if (rest.find('/') != std::string::npos || rest.find('@') != std::string::npos ||
        rest.find('?') != std::string::npos) {
        error = "the Endpoint must name only a host (and port)";
        return false;
    }
    std::string portText;
    bool hasPort = false;
    if (!rest.empty() && rest.front() == '[') {  // [IPv6]:port
        const auto close = rest.find(']');
        if (close == std::string::npos) {
            error = "the Endpoint host is malformed";
            return false;
        }
        out.host = rest.substr(1, close - 1);
        const std::string after = rest.substr(close + 1);
        if (!after.empty()) {
            if (after.front() != ':') {
                error = "the Endpoint host is malformed";
                return false;
            }
            portText = after.substr(1);
            hasPort = true;
        }
        if (out.host.empty() || !std::all_of(out.host.begin(), out.host.end(), [](char c) {
                return std::isxdigit(static_cast<unsigned char>(c)) || c == ':' || c == '.';
            })) {
            error = "the Endpoint host is malformed";
            return false;
        }
    } else {
        const auto colon = rest.find(':');
        out.host = rest.substr(0, colon);
        if (colon != std::string::npos) {
            portText = rest.substr(colon + 1);
            hasPort = true;
        }
        if (out.host.empty() || !std::all_of(out.host.begin(), out.host.end(), IsHostChar)) {
            error = "the Endpoint host is malformed";
            return false;
        }
    }
    if (hasPort) {
        int port = 0;
        const auto [ptr, ec] = std::from_chars(portText.data(), portText.data() + portText.size(), port);
        if (ec != std::errc() || ptr != portText.data() + portText.size() || port < 1 || port > 65535) {
            error = "the Endpoint port is not a number from 1 to 65535";
            return false;
        }
        out.port = port;
    }
    return true;
}

}  // namespace

std::string ConnectionString::NamespaceName() const {
    // The first label of a DNS name; an address stays whole.
    const bool isAddress =
        std::all_of(host.begin(), host.end(),
                    [](char c) { return std::isdigit(static_cast<unsigned char>(c)) || c == '.' || c == ':'; }) ||
        host.find(':') != std::string::npos;
    std::string name = isAddress ? host : host.substr(0, host.find('.'));
    if (port != 0) name += ":" + std::to_string(port);
    return Shorten(name);
}

bool IsLoopbackHost(const std::string& host) {
    if (host == "localhost" || host == "::1") return true;
    // 127.0.0.0/8 in dotted form
    if (host.rfind("127.", 0) != 0) return false;
    int parts = 0;
    std::size_t pos = 0;
    while (pos <= host.size()) {
        const auto dot = std::min(host.find('.', pos), host.size());
        int value = -1;
        const auto [ptr, ec] = std::from_chars(host.data() + pos, host.data() + dot, value);
        if (ec != std::errc() || ptr != host.data() + dot || value < 0 || value > 255) return false;
        ++parts;
        pos = dot + 1;
    }
    return parts == 4;
}

bool IsValidEntityName(const std::string& name) {
    if (name.empty() || name.size() > 260 || name.front() == '/' || name.back() == '/') return false;
    if (name.find("//") != std::string::npos) return false;
    std::size_t start = 0;
    while (start <= name.size()) {
        const auto slash = std::min(name.find('/', start), name.size());
        const std::string segment = name.substr(start, slash - start);
        if (segment == "." || segment == "..") return false;
        start = slash + 1;
    }
    return std::all_of(name.begin(), name.end(), [](char c) {
        return std::isalnum(static_cast<unsigned char>(c)) || c == '-' || c == '_' || c == '.' || c == '/';
    });
}

std::optional<ConnectionString> ParseConnectionString(const std::string& text, std::string& error) {
    ConnectionString out;
    std::string endpoint;
    bool emulatorFlag = false;
    std::size_t start = 0;
    while (start < text.size()) {
        auto semi = text.find(';', start);
        if (semi == std::string::npos) semi = text.size();
        const std::string part = Trim(text.substr(start, semi - start));
        start = semi + 1;
        if (part.empty()) continue;
        const auto eq = part.find('=');
        if (eq == std::string::npos) {
            error = "a part of the connection string has no '='";
            return std::nullopt;
        }
        const std::string name = Lower(Trim(part.substr(0, eq)));
        const std::string value = Trim(part.substr(eq + 1));
        if (name == "endpoint") {
            endpoint = value;
        } else if (name == "sharedaccesskeyname") {
            out.keyName = value;
        } else if (name == "sharedaccesskey") {
            out.key = value;
        } else if (name == "sharedaccesssignature") {
            out.sharedSignature = value;
        } else if (name == "entitypath") {
            out.entityPath = value;
        } else if (name == "usedevelopmentemulator") {
            const std::string flag = Lower(value);
            if (flag != "true" && flag != "false") {
                error = "UseDevelopmentEmulator must be true or false";
                return std::nullopt;
            }
            emulatorFlag = flag == "true";
        }
        // Other keys (TransportType, ...) do not concern HTTPS sending.
    }
    if (endpoint.empty()) {
        error = "the connection string has no Endpoint";
        return std::nullopt;
    }
    if (!ParseEndpoint(endpoint, out, error)) return std::nullopt;
    const bool hasKeyPair = !out.keyName.empty() || !out.key.empty();
    if (hasKeyPair && !out.sharedSignature.empty()) {
        error = "the connection string has both a key and a shared access signature";
        return std::nullopt;
    }
    if (!out.sharedSignature.empty()) {
        if (out.sharedSignature.rfind("SharedAccessSignature ", 0) != 0 ||
            out.sharedSignature.find("sr=") == std::string::npos ||
            out.sharedSignature.find("sig=") == std::string::npos) {
            error = "the shared access signature is malformed";
            return std::nullopt;
        }
    } else if (out.keyName.empty() || out.key.empty()) {
        error = "the connection string needs SharedAccessKeyName and SharedAccessKey, or SharedAccessSignature";
        return std::nullopt;
    }
    if (!out.entityPath.empty() && !IsValidEntityName(out.entityPath)) {
        error = "the EntityPath is not a valid entity name";
        return std::nullopt;
    }
    if (emulatorFlag) {
        if (!IsLoopbackHost(out.host)) {
            error = "UseDevelopmentEmulator=true is accepted only for a loopback host";
            return std::nullopt;
        }
        out.emulator = true;
    }
    return out;
}

}  // namespace corvell
