#include "cloud/AzureComm.h"

#include "cloud/PasswordKey.h"
#include "cloud/VarItem.h"
#include "frame/ModuleLog.h"
#include "vxhelper/aescrypt.h"
#include "vxhelper/dirmanager.h"

#include <cstdint>
#include <limits>

namespace {

constexpr char16_t kWrapperFileName[] = u"libCorvell.so";

// An object of this module, so the directory manager can tell where the module lives.
const char g_addressInModule = 0;

}  // namespace

CAzureComm::CAzureComm(const CString& wrapperDir) : m_strWrapperDir(wrapperDir) {}

CAzureComm::~CAzureComm() { Exit(); }

bool CAzureComm::Init(const CString& strProxyDomain, const CString& strProxyUser, const CString& strProxyPassword) {
    if (!m_hWrapper) {
        // The directory text ends in "/": the file name is appended directly.
        const CString dir = m_strWrapperDir.IsEmpty() ? VX_DirManager::GetModuleDir(&g_addressInModule)
                                                      : m_strWrapperDir;
        m_hWrapper = LoadLibrary(dir + kWrapperFileName);
        if (m_hWrapper) {
            m_pfnCreate = reinterpret_cast<PFN_CreateAzureInstance>(GetProcAddress(m_hWrapper, "CreateAzureInstance"));
            m_pfnDestroy =
                reinterpret_cast<PFN_DestroyAzureInstance>(GetProcAddress(m_hWrapper, "DestroyAzureInstance"));
        }
    }
    if (!m_pInstance) m_pInstance = CreateInstance(strProxyDomain, strProxyUser, strProxyPassword);
    return m_pInstance != nullptr;
}

corvell::IAzureInstance* CAzureComm::CreateInstance(const CString& strProxyDomain, const CString& strProxyUser,
                                                    const CString& strProxyPassword) {
    if (!m_pfnCreate) return nullptr;
    if (strProxyDomain.IsEmpty() || strProxyUser.IsEmpty() || strProxyPassword.IsEmpty())
        return m_pfnCreate(this, nullptr, nullptr, nullptr);  // no proxy settings

    // The plain password exists only for this call.
    CString password = strProxyPassword;
    if (!CAesCrypt(kProxyPasswordKeyHigh, kProxyPasswordKeyLow).DecryptHexString(password))
        LogError(u"The stored proxy password cannot be deciphered; the proxy gets an empty password");
    corvell::IAzureInstance* instance = m_pfnCreate(this, strProxyDomain, strProxyUser, password);
    SecureClearString(password);
    return instance;
}

void CAzureComm::Exit() {
    bool instanceLeftAlive = false;
    if (m_pInstance) {
        if (m_pfnDestroy) m_pfnDestroy(m_pInstance);
        else instanceLeftAlive = true;
        m_pInstance = nullptr;
    }
    if (m_hWrapper) {
        m_pfnCreate = nullptr;
        m_pfnDestroy = nullptr;
        // An instance that could not be destroyed may still run code of the
        // library (its vtable, its threads): the library then stays mapped.
        if (instanceLeftAlive) LogError(u"The Azure wrapper cannot destroy its instance; the library stays loaded");
        else FreeLibrary(m_hWrapper);
        m_hWrapper = nullptr;
    }
}

bool CAzureComm::BeginOnlineRows(const CString& strConnection, const CString& strQueue, bool bEventHub, int nFormat) {
    return m_pInstance && m_pInstance->BeginOnlineRows(strConnection, strQueue, bEventHub, nFormat);
}

bool CAzureComm::AddOnlineRow(const CString& strKey, double dValue, const CString& strValue, bool bIsString,
                              LONGLONG time, WORD wMilliseconds, DWORD dwStatusLow, DWORD dwStatusHigh) {
    if (!m_pInstance) return false;
    // The library takes unsigned 32-bit seconds (up to 2106); a time beyond
    // would arrive as a wrong date near 1970, so the row fails instead.
    if (time < 0 || time > std::numeric_limits<std::uint32_t>::max()) {
        CModuleLog::LogError(
            CString::Formatted(u"Value of %s not sent: its time stamp (%d s) lies outside 1970 to 2106", strKey, time));
        return false;
    }
    // Split as CVarItem::SplitKey does, without two new texts per row: the
    // variable is the key's own tail, the project goes into a reused buffer.
    const int hash = strKey.Find(u'#');
    m_project.assign(strKey.GetString(), static_cast<size_t>(hash < 0 ? 0 : hash));
    const char16_t* variable = strKey.GetString() + (hash < 0 ? 0 : hash + 1);
    return m_pInstance->AddOnlineRow(m_project.c_str(), variable, 0, dValue, strValue, bIsString,
                                     static_cast<std::uint32_t>(time), wMilliseconds, dwStatusLow, dwStatusHigh);
}

bool CAzureComm::SendOnlineRows() { return m_pInstance && m_pInstance->SendOnlineRows(); }

void CAzureComm::LogError(const char16_t* pszText) { CModuleLog::LogError(pszText); }

void CAzureComm::LogInfo(const char16_t* pszText) { CModuleLog::LogInfo(pszText); }

bool CAzureComm::IsInfoEnabled() { return CModuleLog::IsInfoEnabled(); }
