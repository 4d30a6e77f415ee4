#include "private/Retry.h"

#include <curl/curl.h>

#include <algorithm>
#include <cctype>
#include <charconv>
#include <cmath>
#include <cstring>

namespace corvell {

namespace {

std::string Lower(std::string s) {
    std::transform(s.begin(), s.end(), s.begin(), [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return s;
}

std::optional<double> ParseNumber(const std::string& text) {
    double value = 0;
    const char* end = text.data() + text.size();
    const auto [ptr, ec] = std::from_chars(text.data(), end, value);
    if (ec != std::errc() || ptr != end || !std::isfinite(value) || value < 0) return std::nullopt;
    return value;
}

// The five predefined entities; the error document uses no others.
std::string XmlUnescape(const std::string& text) {
    static const std::pair<const char*, char> kEntities[] = {
        {"&amp;", '&'}, {"&lt;", '<'}, {"&gt;", '>'}, {"&quot;", '"'}, {"&apos;", '\''}};
    std::string out;
    for (std::size_t i = 0; i < text.size(); ++i) {
        bool replaced = false;
        if (text[i] == '&') {
            for (const auto& [entity, c] : kEntities) {
                if (text.compare(i, std::strlen(entity), entity) == 0) {
                    out.push_back(c);
                    i += std::strlen(entity) - 1;
                    replaced = true;
                    break;
                }
            }
        }
        if (!replaced) out.push_back(text[i]);
    }
    return out;
}

}  // namespace

Outcome Classify(const HttpResponse& response) {
    if (response.status == 0) {
        if (response.tlsFailure) return Outcome::Permanent;
        switch (static_cast<CURLcode>(response.curlCode)) {
        case CURLE_COULDNT_RESOLVE_HOST:
        case CURLE_COULDNT_RESOLVE_PROXY:
        case CURLE_COULDNT_CONNECT:
        case CURLE_OPERATION_TIMEDOUT:
        case CURLE_SEND_ERROR:
        case CURLE_RECV_ERROR:
        case CURLE_GOT_NOTHING:
        case CURLE_PARTIAL_FILE:
        case CURLE_WEIRD_SERVER_REPLY:
        case CURLE_HTTP2:
        case CURLE_HTTP2_STREAM: return Outcome::Transient;
        default: return Outcome::Permanent;
        }
    }
    const long status = response.status;
    if (status >= 200 && status < 300) return Outcome::Accepted;
    if (status == 401) return Outcome::Unauthorized;
    if (status == 413) return Outcome::TooLarge;
    if (status == 403) {
        // 403 covers both a full entity or quota and an oversized message; only
        // the latter is cured by splitting.
        const std::string body = Lower(response.body);
        const bool oversized = body.find("too large") != std::string::npos ||
                               body.find("message size") != std::string::npos ||
                               body.find("size limit") != std::string::npos;
        const bool quota = body.find("quota") != std::string::npos || body.find("entity size") != std::string::npos;
        return oversized && !quota ? Outcome::TooLarge : Outcome::Permanent;
    }
    switch (status) {
    case 408:
    case 429:
    case 500:
    case 502:
    case 503:
    case 504: return Outcome::Transient;
    default: return Outcome::Permanent;
    }
}

std::optional<std::chrono::milliseconds> RetryAfter(const HttpResponse& response) {
    for (const char* name : {"retry-after-ms", "x-ms-retry-after-ms"}) {
        const auto it = response.headers.find(name);
        if (it == response.headers.end()) continue;
        if (const auto ms = ParseNumber(it->second)) return std::chrono::milliseconds(static_cast<long long>(*ms));
    }
    const auto it = response.headers.find("retry-after");
    if (it != response.headers.end()) {
        // Seconds; an HTTP date is not used by the service and falls back to back-off.
        if (const auto seconds = ParseNumber(it->second))
            return std::chrono::milliseconds(static_cast<long long>(std::min(*seconds, 86400.0) * 1000));
    }
    return std::nullopt;
}

std::string ServiceErrorText(const HttpResponse& response) {
    std::string text = response.body;
    const auto open = text.find("<Detail>");
    const auto close = text.find("</Detail>");
    if (open != std::string::npos && close != std::string::npos && close > open)
        text = XmlUnescape(text.substr(open + 8, close - open - 8));
    std::string line;
    for (const char c : text) {
        const auto u = static_cast<unsigned char>(c);
        if (u < 0x20 || u == 0x7F) {
            if (!line.empty() && line.back() != ' ') line.push_back(' ');
        } else {
            line.push_back(c);
        }
    }
    while (!line.empty() && line.back() == ' ') line.pop_back();
    return line;
}

std::chrono::milliseconds Backoff::Delay(int attempt) {
    std::uniform_real_distribution<double> jitter(0.8, 1.3);
    const double base = static_cast<double>(m_first.count()) * std::pow(2.0, std::min(attempt, 30));
    const double delay = std::min(base * jitter(m_random), static_cast<double>(m_cap.count()));
    return std::chrono::milliseconds(static_cast<long long>(delay));
}

}  // namespace corvell
