#pragma once
// One libcurl handle per target: its connection is kept alive between requests.

#include <chrono>
#include <map>
#include <string>
#include <vector>

namespace corvell {

struct ProxySettings {
    std::string address;  // "host:port" or a URL; empty: libcurl's environment variables apply
    std::string user;     // "DOMAIN\user" for NTLM
    std::string password;
    ~ProxySettings();  // wipes the password
};

struct TransportSettings {
    const ProxySettings* proxy = nullptr;  // outlives every connection
    bool plainHttp = false;                // the development emulator on a loopback host
    std::string caFile;                    // trust anchors; empty: the system's store
};

struct HttpResponse {
    long status = 0;  // 0: no HTTP answer (see transportError)
    int curlCode = 0;
    bool tlsFailure = false;                     // certificate or handshake refused
    std::string transportError;                  // libcurl's text when status is 0
    std::string body;                            // at most the first 16 KB
    std::map<std::string, std::string> headers;  // lower-case names, of the final answer
};

class HttpConnection {
public:
    explicit HttpConnection(TransportSettings settings);
    ~HttpConnection();
    HttpConnection(const HttpConnection&) = delete;
    HttpConnection& operator=(const HttpConnection&) = delete;

    bool IsValid() const { return m_curl != nullptr; }
    HttpResponse Post(const std::string& url, const std::vector<std::string>& headers, const std::string& body,
                      std::chrono::milliseconds timeout, std::chrono::milliseconds connectTimeout);

private:
    TransportSettings m_settings;
    void* m_curl = nullptr;  // CURL*
};

}  // namespace corvell
