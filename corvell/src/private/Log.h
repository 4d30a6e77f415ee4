#pragma once
// Log records through the module's logger, with every known secret masked.

#include <cstdint>
#include <deque>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "corvell/AzureInstance.h"

namespace corvell {

class Log {
public:
    explicit Log(ILogger* logger) : m_logger(logger) {}

    // Texts that must never reach a record (keys, passwords): each occurrence,
    // also percent-encoded, is written as "***".
    void AddSecret(std::string_view secret);
    // A token's signature, given as in the token (percent-encoded) or plain:
    // masked in every spelling (plain base64, percent-encoded, base64url, with
    // or without padding). A new signature of the same owner (a renewed token)
    // joins the one before, which stays valid a while; older ones are dropped.
    void AddSignature(std::uint64_t owner, std::string_view signature);
    void DropSignatures(std::uint64_t owner);

    void Error(std::string_view text);
    void Info(std::string_view text);
    bool InfoEnabled() const;

    // Masks the known secrets, a whole "SharedAccessSignature ..." token, and
    // the values of "sig=" and "SharedAccessKey=" wherever they appear.
    std::string Mask(std::string text) const;
    // A text from outside (a service's answer) for quoting in a record:
    // masked first, then shortened, so a cut never leaves part of a secret.
    std::string Quote(std::string_view text) const;

private:
    void Rebuild();

    ILogger* m_logger;
    std::vector<std::string> m_secrets;                                          // as added
    std::map<std::uint64_t, std::deque<std::vector<std::string>>> m_signatures;  // owner -> spellings, newest last
    std::vector<std::string> m_masks;                                            // all of them, longest first
};

}  // namespace corvell
