#include "Log.h"

#include <algorithm>

#include "Utf.h"

namespace corvell {

namespace {
// Shorter texts would mask ordinary words; a secret that short is no secret.
constexpr std::size_t kMinSecretLength = 3;
}  // namespace

void Log::AddSecret(std::string_view secret) {
    if (secret.size() < kMinSecretLength) return;
    if (std::find(m_secrets.begin(), m_secrets.end(), secret) != m_secrets.end()) return;
    m_secrets.emplace_back(secret);
    // Longest first, so that a secret containing another is masked whole.
    std::sort(m_secrets.begin(), m_secrets.end(),
              [](const std::string& a, const std::string& b) { return a.size() > b.size(); });
}

std::string Log::Mask(std::string text) const {
    for (const auto& secret : m_secrets) {
        std::size_t pos = 0;
        while ((pos = text.find(secret, pos)) != std::string::npos) {
            text.replace(pos, secret.size(), "***");
            pos += 3;
        }
    }
    return text;
}

void Log::Error(std::string_view text) {
    if (!m_logger) return;
    const std::u16string record = ToUtf16(Mask(std::string(text)));
    m_logger->LogError(record.c_str());
}

void Log::Info(std::string_view text) {
    if (!InfoEnabled()) return;
    const std::u16string record = ToUtf16(Mask(std::string(text)));
    m_logger->LogInfo(record.c_str());
}

bool Log::InfoEnabled() const { return m_logger && m_logger->IsInfoEnabled(); }

}  // namespace corvell
