#pragma once
// CAutomationError: a failed automation call as a typed error.
//
// A server handler may throw it; the dispatch helpers turn it into
// DISP_E_EXCEPTION with EXCEPINFO filled. A client call site that wants
// "raises an error" semantics gets it from the *OrThrow call helpers and
// catches it right there: it never travels further than the call site.

#include "automation/dispatch.h"

#include <exception>
#include <string>

constexpr HRESULT DISP_E_NONAMEDARGS = static_cast<HRESULT>(0x80020007u);
// The object's server has stopped; the object no longer works.
constexpr HRESULT RPC_E_DISCONNECTED = static_cast<HRESULT>(0x80010108u);
// A call to another process got no answer within its time-out.
constexpr HRESULT RPC_E_TIMEOUT = static_cast<HRESULT>(0x8001011Fu);
// The object named in a call to another process is not (or no longer) there.
constexpr HRESULT CO_E_OBJNOTCONNECTED = static_cast<HRESULT>(0x800401FDu);

class CAutomationError : public std::exception {
public:
    explicit CAutomationError(HRESULT status, std::u16string description = {}, std::u16string source = {});
    // The error as a call's EXCEPINFO reports it (status DISP_E_EXCEPTION),
    // or a plain failure status with no further information.
    static CAutomationError FromCall(HRESULT status, const EXCEPINFO& info);

    // The failure: the EXCEPINFO code of a raised error, else the call's status.
    HRESULT Status() const { return m_status; }
    const std::u16string& Description() const { return m_description; }
    const std::u16string& Source() const { return m_source; }
    const char* what() const noexcept override { return m_what.c_str(); }

    // Fills a call's EXCEPINFO (when given) with this error; the caller frees its texts.
    void Fill(EXCEPINFO* info) const;

private:
    HRESULT m_status;
    std::u16string m_description;
    std::u16string m_source;
    std::string m_what;  // UTF-8: "description (0x80004005)"
};

// Frees the texts of an EXCEPINFO and zeroes it.
void ClearExcepInfo(EXCEPINFO* info);
