#include "private/Log.h"

#include <algorithm>
#include <cctype>

#include "private/Sas.h"
#include "private/Utf.h"

namespace corvell {

namespace {
// Shorter texts would mask ordinary words; a secret that short is no secret.
constexpr std::size_t kMinSecretLength = 3;
// Signatures kept per owner: the current token's and the one it replaced.
constexpr std::size_t kSignaturesPerOwner = 2;

std::string PercentDecode(std::string_view text) {
    const auto hex = [](char c) -> int {
        if (c >= '0' && c <= '9') return c - '0';
        if (c >= 'a' && c <= 'f') return c - 'a' + 10;
        if (c >= 'A' && c <= 'F') return c - 'A' + 10;
        return -1;
    };
    std::string out;
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (text[i] == '%' && i + 2 < text.size() && hex(text[i + 1]) >= 0 && hex(text[i + 2]) >= 0) {
            out.push_back(static_cast<char>(hex(text[i + 1]) * 16 + hex(text[i + 2])));
            i += 2;
        } else {
            out.push_back(text[i]);
        }
    }
    return out;
}

std::string LowerHexEscapes(std::string text) {
    for (std::size_t i = 0; i + 2 < text.size(); ++i) {
        if (text[i] != '%') continue;
        text[i + 1] = static_cast<char>(std::tolower(static_cast<unsigned char>(text[i + 1])));
        text[i + 2] = static_cast<char>(std::tolower(static_cast<unsigned char>(text[i + 2])));
    }
    return text;
}

std::string WithoutPadding(std::string text) {
    while (!text.empty() && text.back() == '=') text.pop_back();
    return text;
}

// Every spelling in which a base64 signature can reach a text.
std::vector<std::string> SignatureSpellings(std::string_view signature) {
    const std::string plain = PercentDecode(signature);
    std::string url = WithoutPadding(plain);
    std::replace(url.begin(), url.end(), '+', '-');
    std::replace(url.begin(), url.end(), '/', '_');
    const std::string encoded = PercentEncode(plain);
    return {std::string(signature),
            plain,
            WithoutPadding(plain),
            encoded,
            LowerHexEscapes(encoded),
            PercentEncode(WithoutPadding(plain)),
            url};
}

bool StartsWithIgnoringCase(std::string_view text, std::size_t at, std::string_view word) {
    if (text.size() - at < word.size()) return false;
    for (std::size_t i = 0; i < word.size(); ++i) {
        if (std::tolower(static_cast<unsigned char>(text[at + i])) != word[i]) return false;
    }
    return true;
}

// Where a token or a value quoted in a text ends.
bool IsDelimiter(char c, bool stopAtAmpersand) {
    return std::isspace(static_cast<unsigned char>(c)) || c == '"' || c == '\'' || c == '<' || c == '>' || c == ';' ||
           c == ',' || c == ')' || c == ']' || (stopAtAmpersand && c == '&');
}

// Replaces, after every occurrence of word (lower case), what follows it up to
// a delimiter with "***". A word directly followed by itself again (the
// "SharedAccessSignature=SharedAccessSignature sr=..." of a connection string)
// is skipped over first.
void MaskAfter(std::string& text, std::string_view word, bool stopAtAmpersand, std::string_view separators) {
    std::size_t pos = 0;
    while (pos < text.size()) {
        std::size_t at = pos;
        while (at < text.size() && !StartsWithIgnoringCase(text, at, word)) ++at;
        if (at >= text.size()) return;
        std::size_t start = at + word.size();
        while (true) {
            while (start < text.size() && separators.find(text[start]) != std::string_view::npos) ++start;
            if (!StartsWithIgnoringCase(text, start, word)) break;
            start += word.size();
        }
        std::size_t end = start;
        while (end < text.size() && !IsDelimiter(text[end], stopAtAmpersand)) ++end;
        if (end > start) text.replace(start, end - start, "***");
        pos = start + (end > start ? 3 : 0);
    }
}

}  // namespace

void Log::AddSecret(std::string_view secret) {
    if (secret.size() < kMinSecretLength) return;
    if (std::find(m_secrets.begin(), m_secrets.end(), secret) != m_secrets.end()) return;
    m_secrets.emplace_back(secret);
    const std::string encoded = PercentEncode(secret);
    if (encoded != secret) {
        m_secrets.push_back(encoded);
        m_secrets.push_back(LowerHexEscapes(encoded));
    }
    Rebuild();
}

void Log::AddSignature(std::uint64_t owner, std::string_view signature) {
    if (signature.size() < kMinSecretLength) return;
    auto& kept = m_signatures[owner];
    std::vector<std::string> spellings = SignatureSpellings(signature);
    if (!kept.empty() && kept.back() == spellings) return;
    kept.push_back(std::move(spellings));
    while (kept.size() > kSignaturesPerOwner) kept.pop_front();
    Rebuild();
}

void Log::DropSignatures(std::uint64_t owner) {
    if (m_signatures.erase(owner) > 0) Rebuild();
}

void Log::Rebuild() {
    m_masks = m_secrets;
    for (const auto& [owner, kept] : m_signatures) {
        for (const auto& spellings : kept) m_masks.insert(m_masks.end(), spellings.begin(), spellings.end());
    }
    m_masks.erase(std::remove_if(m_masks.begin(), m_masks.end(),
                                 [](const std::string& s) { return s.size() < kMinSecretLength; }),
                  m_masks.end());
    // Longest first, so that a secret containing another is masked whole.
    std::sort(m_masks.begin(), m_masks.end(),
              [](const std::string& a, const std::string& b) { return a.size() > b.size(); });
    m_masks.erase(std::unique(m_masks.begin(), m_masks.end()), m_masks.end());
}

std::string Log::Mask(std::string text) const {
    for (const auto& secret : m_masks) {
        std::size_t pos = 0;
        while ((pos = text.find(secret, pos)) != std::string::npos) {
            text.replace(pos, secret.size(), "***");
            pos += 3;
        }
    }
    // Secrets this instance never saw: tokens and keys quoted by their names.
    MaskAfter(text, "sharedaccesssignature", false, " =:\"'");
    MaskAfter(text, "sig=", true, "");
    MaskAfter(text, "sharedaccesskey=", false, "");
    return text;
}

std::string Log::Quote(std::string_view text) const { return Shorten(Mask(std::string(text))); }

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
