#pragma once
// Log records through the module's logger, with every known secret masked.

#include <string>
#include <string_view>
#include <vector>

#include "corvell/AzureInstance.h"

namespace corvell {

class Log {
public:
    explicit Log(ILogger* logger) : m_logger(logger) {}

    // Texts that must never reach a record (keys, signatures, passwords):
    // each occurrence is written as "***".
    void AddSecret(std::string_view secret);

    void Error(std::string_view text);
    void Info(std::string_view text);
    bool InfoEnabled() const;

    std::string Mask(std::string text) const;

private:
    ILogger* m_logger;
    std::vector<std::string> m_secrets;
};

}  // namespace corvell
