#pragma once
// What an answer means for the sender, and how long to wait before retrying.

#include <chrono>
#include <optional>
#include <random>
#include <string>

#include "private/Http.h"

namespace corvell {

enum class Outcome {
    Accepted,      // 2xx
    TooLarge,      // 413, or 403 for a message over the size limit: split and resend
    Unauthorized,  // 401: a new token may help once
    Transient,     // throttling, server trouble, transport errors: retry after a pause
    Permanent      // anything else: fail at once
};

Outcome Classify(const HttpResponse& response);

// The wait the service asks for (retry-after-ms, x-ms-retry-after-ms,
// Retry-After in seconds), if any.
std::optional<std::chrono::milliseconds> RetryAfter(const HttpResponse& response);

// The service's own error text on one line: the Detail of an Azure error
// document, else the body (at most what HttpResponse keeps). Records quote it
// masked and shortened (Log::Quote).
std::string ServiceErrorText(const HttpResponse& response);

// Exponential back-off with jitter: first * 2^attempt * [0.8, 1.3], at most cap.
class Backoff {
public:
    Backoff(std::chrono::milliseconds first, std::chrono::milliseconds cap) : m_first(first), m_cap(cap) {}
    std::chrono::milliseconds Delay(int attempt);

private:
    std::chrono::milliseconds m_first;
    std::chrono::milliseconds m_cap;
    std::mt19937 m_random{std::random_device{}()};
};

}  // namespace corvell
