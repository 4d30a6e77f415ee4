#pragma once
// The module's one contact with the Azure client library libCorvell.so: loads
// it at run time, creates its instance with the proxy settings, forwards the
// row operations, and is the logger through which the library writes into the
// module's log. Owned and used by the worker thread only; the logger
// operations may be called from any thread and touch no field.

#include "corvell/AzureInstance.h"
#include "platform/library.h"
#include "platform/text.h"
#include "platform/types.h"

#include <string>

class CAzureComm : public corvell::ILogger {
public:
    // The library is looked for in wrapperDir (ending in "/"); empty means the
    // directory this module was loaded from.
    explicit CAzureComm(const CString& wrapperDir = CString());
    virtual ~CAzureComm();
    CAzureComm(const CAzureComm&) = delete;
    CAzureComm& operator=(const CAzureComm&) = delete;

    // Loads the library (once) and creates the instance (once). The password
    // is the stored, enciphered hexadecimal form; it is deciphered only for
    // the creating call. True when an instance exists afterwards.
    bool Init(const CString& strProxyDomain, const CString& strProxyUser, const CString& strProxyPassword);
    // Destroys the instance and unloads the library; harmless when repeated.
    void Exit();

    // Without an instance these return false and call nothing.
    bool BeginOnlineRows(const CString& strConnection, const CString& strQueue, bool bEventHub, int nFormat);
    // strKey is the variable key "project#variable"; time is seconds since
    // 1970-01-01 UTC and must fit the library's unsigned 32 bits.
    bool AddOnlineRow(const CString& strKey, double dValue, const CString& strValue, bool bIsString, LONGLONG time,
                      WORD wMilliseconds, DWORD dwStatusLow, DWORD dwStatusHigh);
    bool SendOnlineRows();

    // corvell::ILogger: records of the module's log.
    void LogError(const char16_t* pszText) override;
    void LogInfo(const char16_t* pszText) override;
    bool IsInfoEnabled() override;

private:
    corvell::IAzureInstance* CreateInstance(const CString& strProxyDomain, const CString& strProxyUser,
                                            const CString& strProxyPassword);

    PFN_CreateAzureInstance m_pfnCreate = nullptr;
    PFN_DestroyAzureInstance m_pfnDestroy = nullptr;
    HMODULE m_hWrapper = nullptr;
    corvell::IAzureInstance* m_pInstance = nullptr;
    CString m_strWrapperDir;   // empty: this module's directory
    std::u16string m_project;  // the project part of the row being added
};
