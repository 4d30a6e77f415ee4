#include "private/Http.h"

#include <curl/curl.h>
#include <openssl/crypto.h>

#include <algorithm>
#include <cctype>
#include <memory>

namespace corvell {

namespace {

constexpr std::size_t kMaxBodyKept = 16 * 1024;

size_t OnBody(char* data, size_t size, size_t count, void* user) {
    auto* response = static_cast<HttpResponse*>(user);
    const size_t bytes = size * count;
    const size_t room = kMaxBodyKept - std::min(kMaxBodyKept, response->body.size());
    response->body.append(data, std::min(room, bytes));
    return bytes;
}

size_t OnHeader(char* data, size_t size, size_t count, void* user) {
    auto* response = static_cast<HttpResponse*>(user);
    const size_t bytes = size * count;
    std::string line(data, bytes);
    while (!line.empty() && (line.back() == '\r' || line.back() == '\n')) line.pop_back();
    if (line.rfind("HTTP/", 0) == 0) {
        response->headers.clear();  // a new answer (after 100 Continue or a proxy's 407)
        return bytes;
    }
    const auto colon = line.find(':');
    if (colon == std::string::npos) return bytes;
    std::string name = line.substr(0, colon);
    std::transform(name.begin(), name.end(), name.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    std::string value = line.substr(colon + 1);
    const auto first = value.find_first_not_of(" \t");
    value = first == std::string::npos ? std::string() : value.substr(first);
    response->headers[name] = value;
    return bytes;
}

bool IsTlsFailure(CURLcode code) {
    return code == CURLE_PEER_FAILED_VERIFICATION || code == CURLE_SSL_CACERT_BADFILE ||
           code == CURLE_SSL_CERTPROBLEM || code == CURLE_SSL_CIPHER || code == CURLE_SSL_ISSUER_ERROR ||
           code == CURLE_SSL_PINNEDPUBKEYNOTMATCH || code == CURLE_SSL_INVALIDCERTSTATUS ||
           code == CURLE_SSL_CONNECT_ERROR;
}

struct HeaderList {
    curl_slist* list = nullptr;
    ~HeaderList() { curl_slist_free_all(list); }
};

}  // namespace

ProxySettings::~ProxySettings() {
    if (!password.empty()) OPENSSL_cleanse(password.data(), password.size());
}

HttpConnection::HttpConnection(TransportSettings settings) : m_settings(std::move(settings)) {
    m_curl = curl_easy_init();
}

HttpConnection::~HttpConnection() {
    if (m_curl) curl_easy_cleanup(static_cast<CURL*>(m_curl));
}

HttpResponse HttpConnection::Post(const std::string& url, const std::vector<std::string>& headers,
                                  const std::string& body, std::chrono::milliseconds timeout,
                                  std::chrono::milliseconds connectTimeout) {
    HttpResponse response;
    auto* curl = static_cast<CURL*>(m_curl);
    if (!curl) {
        response.transportError = "libcurl could not create a handle";
        return response;
    }
    HeaderList list;
    for (const auto& header : headers) list.list = curl_slist_append(list.list, header.c_str());
    list.list = curl_slist_append(list.list, "Expect:");  // send the body at once, no 100-continue round trip

    char errorText[CURL_ERROR_SIZE] = {};
    curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
    curl_easy_setopt(curl, CURLOPT_PROTOCOLS_STR, m_settings.plainHttp ? "http" : "https");
    curl_easy_setopt(curl, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(curl, CURLOPT_FOLLOWLOCATION, 0L);
    curl_easy_setopt(curl, CURLOPT_TCP_KEEPALIVE, 1L);
    curl_easy_setopt(curl, CURLOPT_POST, 1L);
    curl_easy_setopt(curl, CURLOPT_POSTFIELDS, body.data());
    curl_easy_setopt(curl, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size()));
    curl_easy_setopt(curl, CURLOPT_HTTPHEADER, list.list);
    curl_easy_setopt(curl, CURLOPT_TIMEOUT_MS, static_cast<long>(std::max<long long>(1, timeout.count())));
    curl_easy_setopt(curl, CURLOPT_CONNECTTIMEOUT_MS,
                     static_cast<long>(std::max<long long>(1, connectTimeout.count())));
    curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, OnBody);
    curl_easy_setopt(curl, CURLOPT_WRITEDATA, &response);
    curl_easy_setopt(curl, CURLOPT_HEADERFUNCTION, OnHeader);
    curl_easy_setopt(curl, CURLOPT_HEADERDATA, &response);
    curl_easy_setopt(curl, CURLOPT_ERRORBUFFER, errorText);
    // Certificates are always checked; nothing here can turn that off.
    curl_easy_setopt(curl, CURLOPT_SSL_VERIFYPEER, 1L);
    curl_easy_setopt(curl, CURLOPT_SSL_VERIFYHOST, 2L);
    curl_easy_setopt(curl, CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
    if (!m_settings.caFile.empty()) curl_easy_setopt(curl, CURLOPT_CAINFO, m_settings.caFile.c_str());

    const ProxySettings* proxy = m_settings.proxy;
    if (proxy && !proxy->address.empty()) {
        curl_easy_setopt(curl, CURLOPT_PROXY, proxy->address.c_str());
        curl_easy_setopt(curl, CURLOPT_NOPROXY, "");  // the configured proxy serves every host
        if (!proxy->user.empty()) {
            curl_easy_setopt(curl, CURLOPT_PROXYUSERNAME, proxy->user.c_str());
            curl_easy_setopt(curl, CURLOPT_PROXYPASSWORD, proxy->password.c_str());
            curl_easy_setopt(curl, CURLOPT_PROXYAUTH, static_cast<long>(CURLAUTH_ANY));
        }
    } else if (m_settings.plainHttp) {
        curl_easy_setopt(curl, CURLOPT_NOPROXY, "*");  // a loopback emulator is never reached through a proxy
    }

    const CURLcode code = curl_easy_perform(curl);
    response.curlCode = static_cast<int>(code);
    if (code == CURLE_OK) {
        curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &response.status);
    } else {
        response.status = 0;
        response.tlsFailure = IsTlsFailure(code);
        response.transportError = errorText[0] ? errorText : curl_easy_strerror(code);
    }
    // The handle must not keep pointers into this call's header list and body.
    curl_easy_setopt(curl, CURLOPT_HTTPHEADER, nullptr);
    curl_easy_setopt(curl, CURLOPT_POSTFIELDS, nullptr);
    curl_easy_setopt(curl, CURLOPT_ERRORBUFFER, nullptr);
    return response;
}

}  // namespace corvell
