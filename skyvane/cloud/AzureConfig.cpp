#include "cloud/AzureConfig.h"

CAzureConfig& CAzureConfig::operator=(const CAzureConfig& other) {
    if (this == &other) return *this;
    m_mapVariables.RemoveAll();
    for (const auto& [key, item] : other.m_mapVariables) m_mapVariables.SetAt(key, new CVarItem(*item));
    m_lstConnections.RemoveAll();
    for (const CConnection* connection : other.m_lstConnections) m_lstConnections.AddTail(new CConnection(*connection));
    m_nIntegrityPeriod = other.m_nIntegrityPeriod;
    m_strProxyDomain = other.m_strProxyDomain;
    m_strProxyUser = other.m_strProxyUser;
    m_strProxyPassword = other.m_strProxyPassword;
    return *this;
}
