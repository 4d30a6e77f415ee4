#pragma once
// The module's cloud settings: the Azure targets, the exported variables,
// the integrity period and the HTTP proxy.

#include "cloud/VarItem.h"
#include "runtime/RefCounting.h"

// One Azure target.
class CConnection : public CObject {
public:
    CConnection() = default;
    CConnection(const CConnection&) = default;
    CConnection& operator=(const CConnection&) = default;
    ~CConnection() override = default;

    CString m_strConnection;   // Azure connection string
    CString m_strQueue;        // Service Bus queue or Event Hub name
    bool m_bEventHub = false;  // false: Service Bus queue
    int m_nFormat = 0;         // 0 XML, 1 JSON, 2 BOND; kept as read
};

// Variable key -> item (owned; keys compared exactly) and the targets in export order (owned).
using CVarItemMap = CMapOwner<CString, LPCWSTR, CVarItem>;
using CConnectionList = CLstOwner<CConnection>;

class CAzureConfig {
public:
    CAzureConfig() = default;
    // Copies are deep: a copy shares no item or record with its source.
    CAzureConfig(const CAzureConfig& other) : CAzureConfig() { *this = other; }
    CAzureConfig& operator=(const CAzureConfig& other);

    CVarItemMap m_mapVariables;
    CConnectionList m_lstConnections;
    int m_nIntegrityPeriod = 5;  // seconds
    CString m_strProxyDomain;
    CString m_strProxyUser;
    CString m_strProxyPassword;  // enciphered, as hexadecimal text
};
