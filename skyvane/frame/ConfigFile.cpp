#include "frame/ConfigFile.h"

#include "vxhelper/profile.h"

#include <algorithm>
#include <initializer_list>

namespace {

constexpr LPCWSTR kAzure = u"Azure";
constexpr LPCWSTR kVariables = u"VARIABLES";
constexpr LPCWSTR kConnections = u"CONNECTIONS";
constexpr DWORD kTextChars = 1024;  // text values are read into a buffer of this size

CString Key(LPCWSTR prefix, int index) { return CString::Formatted(u"%s%d", prefix, index); }

CString ReadText(LPCWSTR section, const CString& key, const CString& path) {
    char16_t buffer[kTextChars];
    VX_GetPrivateProfileString(section, key, u"", buffer, kTextChars, path);
    return CString(buffer);
}

// The entry number of a key "<prefix><number>" as the readers spell it
// (decimal, no leading zeros), or -1.
long long EntryNumber(const CString& key, LPCWSTR prefix) {
    const CString start(prefix);
    if (key.GetLength() <= start.GetLength() || key.Left(start.GetLength()).CompareNoCase(start) != 0) return -1;
    const CString digits = key.Mid(start.GetLength());
    if (digits.GetLength() > 10 || (digits.GetLength() > 1 && digits[0] == u'0')) return -1;
    long long number = 0;
    for (const char16_t c : digits.View()) {
        if (c < u'0' || c > u'9') return -1;
        number = number * 10 + (c - u'0');
    }
    return number;
}

// How many entries of a section to read: COUNT, but no further than the
// highest numbered key the section holds. Up to there the entries come out as
// if all were read, gaps included; beyond it every entry would be made of
// defaults only, and a COUNT of two billion must not make two billion items.
int EntriesToRead(LPCWSTR section, std::initializer_list<LPCWSTR> prefixes, const CString& path) {
    const int count = VX_GetPrivateProfileInt(section, u"COUNT", 0, path);
    if (count <= 0) return 0;
    CStringArray keys;
    VX_GetPrivateProfileKeyNames(section, keys, path);
    long long highest = -1;
    for (const CString& key : keys)
        for (const LPCWSTR prefix : prefixes) highest = std::max(highest, EntryNumber(key, prefix));
    return static_cast<int>(std::min<long long>(count, highest + 1));
}

}  // namespace

void ReadConfig(const CString& path, CAzureConfig& config) {
    VX_CPrivateProfileSession session(path);  // the file is parsed once for all keys

    config.m_nIntegrityPeriod = VX_GetPrivateProfileInt(kAzure, u"INTEGRITYPERIOD", 5, path);
    config.m_strProxyDomain = ReadText(kAzure, u"PROXY_DOMAIN", path);
    config.m_strProxyUser = ReadText(kAzure, u"PROXY_USER", path);
    config.m_strProxyPassword = ReadText(kAzure, u"PROXY_PWD", path);

    config.m_mapVariables.RemoveAll();
    const int variables = EntriesToRead(kVariables, {u"NAME_"}, path);
    for (int i = 0; i < variables; ++i) {
        auto* item = new CVarItem;
        item->m_strName = ReadText(kVariables, Key(u"NAME_", i), path);
        config.m_mapVariables.SetAt(item->m_strName, item);  // a repeated name replaces the older item
    }

    config.m_lstConnections.RemoveAll();
    const int connections = EntriesToRead(kConnections, {u"CONN_", u"QUEUE_", u"MODE_", u"FORMAT_"}, path);
    for (int i = 0; i < connections; ++i) {
        auto* connection = new CConnection;
        connection->m_strConnection = ReadText(kConnections, Key(u"CONN_", i), path);
        connection->m_strQueue = ReadText(kConnections, Key(u"QUEUE_", i), path);
        connection->m_bEventHub = VX_GetPrivateProfileInt(kConnections, Key(u"MODE_", i), 0, path) != 0;
        connection->m_nFormat = VX_GetPrivateProfileInt(kConnections, Key(u"FORMAT_", i), 0, path);
        config.m_lstConnections.AddTail(connection);
    }
}

bool WriteConfig(const CString& path, const CAzureConfig& config) {
    VX_CPrivateProfileSession session(path);  // all keys reach the file in one replacement
    bool ok = VX_WritePrivateProfileInt(kAzure, u"INTEGRITYPERIOD", config.m_nIntegrityPeriod, path);
    ok = VX_WritePrivateProfileString(kAzure, u"PROXY_DOMAIN", config.m_strProxyDomain, path) && ok;
    ok = VX_WritePrivateProfileString(kAzure, u"PROXY_USER", config.m_strProxyUser, path) && ok;
    ok = VX_WritePrivateProfileString(kAzure, u"PROXY_PWD", config.m_strProxyPassword, path) && ok;

    int written = 0;
    for (const auto& [key, item] : config.m_mapVariables)
        ok = VX_WritePrivateProfileString(kVariables, Key(u"NAME_", written++), item->m_strName, path) && ok;
    ok = VX_WritePrivateProfileInt(kVariables, u"COUNT", written, path) && ok;

    written = 0;
    for (const CConnection* connection : config.m_lstConnections) {
        ok = VX_WritePrivateProfileString(kConnections, Key(u"CONN_", written), connection->m_strConnection, path) &&
             ok;
        ok = VX_WritePrivateProfileString(kConnections, Key(u"QUEUE_", written), connection->m_strQueue, path) && ok;
        ok = VX_WritePrivateProfileInt(kConnections, Key(u"MODE_", written), connection->m_bEventHub ? 1 : 0, path) &&
             ok;
        ok = VX_WritePrivateProfileInt(kConnections, Key(u"FORMAT_", written), connection->m_nFormat, path) && ok;
        ++written;
    }
    ok = VX_WritePrivateProfileInt(kConnections, u"COUNT", written, path) && ok;

    // All or nothing: a file with some keys new and others stale would read as other settings.
    if (!ok) {
        session.Discard();
        return false;
    }
    return session.Commit();
}
