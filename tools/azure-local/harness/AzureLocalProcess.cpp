#include "AzureLocalProcess.h"

#include "child_process.h"

#include <QCoreApplication>

#include <curl/curl.h>
#include <openssl/pem.h>
#include <openssl/x509v3.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <fcntl.h>
#include <poll.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace azurelocal {

namespace {

size_t Collect(char* data, size_t size, size_t count, void* user) {
    static_cast<std::string*>(user)->append(data, size * count);
    return size * count;
}

std::uint64_t Number(const JsonValue& object, const char* name) {
    const JsonValue* v = object.Find(name);
    return v ? v->AsUnsigned().value_or(0) : 0;
}

}  // namespace

std::string BuildBinaryDir() { return QCoreApplication::applicationDirPath().toStdString(); }

// Started as child_process.h starts every child of a test: fork and exec.
bool AzureLocalProcess::Spawn(const std::vector<std::string>& arguments, std::string& error) {
    int toChild[2], fromChild[2];
    if (pipe2(toChild, O_CLOEXEC) != 0) {
        error = std::string("pipe: ") + std::strerror(errno);
        return false;
    }
    if (pipe2(fromChild, O_CLOEXEC) != 0) {
        error = std::string("pipe: ") + std::strerror(errno);
        close(toChild[0]);
        close(toChild[1]);
        return false;
    }
    m_pid = StartChild(arguments, {toChild[0], fromChild[1], -1});
    close(toChild[0]);
    close(fromChild[1]);
    m_stdin = toChild[1];
    m_stdout = fromChild[0];
    if (m_pid < 0) {
        error = std::string("fork: ") + std::strerror(errno);
        return false;
    }
    return true;
}

// The first line the child prints, within the time limit.
bool AzureLocalProcess::ReadFirstLine(std::string& line, int timeoutMs) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
    while (line.find('\n') == std::string::npos) {
        const auto left =
            std::chrono::duration_cast<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
        pollfd wait{m_stdout, POLLIN, 0};
        if (left.count() <= 0 || poll(&wait, 1, static_cast<int>(left.count())) <= 0) return false;
        char buffer[256];
        const ssize_t n = read(m_stdout, buffer, sizeof buffer);
        if (n <= 0) return false;
        line.append(buffer, static_cast<size_t>(n));
    }
    line.resize(line.find('\n'));
    return true;
}

std::unique_ptr<AzureLocalProcess> AzureLocalProcess::Start(const QStringList& arguments, std::string& error) {
    std::unique_ptr<AzureLocalProcess> server(new AzureLocalProcess());
    std::vector<std::string> argv{BuildBinaryDir() + "/azure-local", "--port", "0", "--quit-on-eof"};
    for (const QString& a : arguments) argv.push_back(a.toStdString());
    if (!server->Spawn(argv, error)) {
        error = "azure-local did not start: " + error;
        return nullptr;
    }
    std::string line;
    if (!server->ReadFirstLine(line, 10000)) {
        error = "azure-local did not report its port";
        return nullptr;
    }
    if (line.rfind("PORT ", 0) != 0) {
        error = "azure-local printed '" + line + "' instead of its port";
        return nullptr;
    }
    server->m_port = std::atoi(line.c_str() + 5);
    const qsizetype cert = arguments.indexOf("--tls-cert");
    if (cert >= 0 && cert + 1 < arguments.size()) server->m_tlsCertificate = arguments[cert + 1].toStdString();
    return server;
}

// Waits up to timeoutMs for the child to end; true once it is reaped.
bool AzureLocalProcess::WaitForExit(int timeoutMs) {
    const int pidfd = static_cast<int>(syscall(SYS_pidfd_open, m_pid, 0));
    if (pidfd >= 0) {
        pollfd wait{pidfd, POLLIN, 0};
        poll(&wait, 1, timeoutMs);
        close(pidfd);
    }
    return waitpid(m_pid, nullptr, WNOHANG) == m_pid;
}

AzureLocalProcess::~AzureLocalProcess() {
    if (m_stdin >= 0) close(m_stdin);  // --quit-on-eof ends it
    if (m_pid > 0 && !WaitForExit(3000)) {
        kill(m_pid, SIGKILL);
        waitpid(m_pid, nullptr, 0);
    }
    if (m_stdout >= 0) close(m_stdout);
}

std::string AzureLocalProcess::ConnectionString(const std::string& extra) const {
    return "Endpoint=sb://127.0.0.1:" + std::to_string(m_port) + "/;SharedAccessKeyName=" + kKeyName +
           ";SharedAccessKey=" + kKey + ";UseDevelopmentEmulator=true" + extra;
}

bool AzureLocalProcess::Control(const std::string& method, const std::string& path, std::string* body,
                                long timeoutSeconds) {
    CURL* curl = curl_easy_init();
    if (!curl) return false;
    std::string answer;
    const std::string scheme = m_tlsCertificate.empty() ? "http" : "https";
    const std::string url = scheme + "://127.0.0.1:" + std::to_string(m_port) + path;
    curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
    if (!m_tlsCertificate.empty()) curl_easy_setopt(curl, CURLOPT_CAINFO, m_tlsCertificate.c_str());
    curl_easy_setopt(curl, CURLOPT_NOPROXY, "*");
    curl_easy_setopt(curl, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(curl, CURLOPT_TIMEOUT, timeoutSeconds);
    if (method == "POST") {
        curl_easy_setopt(curl, CURLOPT_POST, 1L);
        curl_easy_setopt(curl, CURLOPT_POSTFIELDS, "");
    }
    curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, Collect);
    curl_easy_setopt(curl, CURLOPT_WRITEDATA, &answer);
    const CURLcode code = curl_easy_perform(curl);
    long status = 0;
    curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &status);
    curl_easy_cleanup(curl);
    if (body) *body = answer;
    return code == CURLE_OK && status == 200;
}

bool AzureLocalProcess::Fault(const std::string& query) { return Control("POST", "/_control/fault?" + query); }
bool AzureLocalProcess::Reset() { return Control("POST", "/_control/reset"); }
bool AzureLocalProcess::SetLimit(std::size_t bytes, const std::string& kind) {
    return Control("POST", "/_control/limit?bytes=" + std::to_string(bytes) + (kind.empty() ? "" : "&kind=" + kind));
}

ServerStats AzureLocalProcess::Stats() { return ReadStats("/_control/stats", 10); }

ServerStats AzureLocalProcess::WaitForRows(std::uint64_t rows, int timeoutMs) {
    return ReadStats("/_control/wait?rows=" + std::to_string(rows) + "&timeout-ms=" + std::to_string(timeoutMs),
                     timeoutMs / 1000 + 10);
}

ServerStats AzureLocalProcess::ReadStats(const std::string& path, long timeoutSeconds) {
    std::string body, error;
    ServerStats stats;
    if (!Control("GET", path, &body, timeoutSeconds)) return stats;
    const auto json = ParseJson(body, error);
    if (!json) return stats;
    stats.answered = true;
    stats.requests = Number(*json, "requests");
    stats.messages = Number(*json, "messages");
    stats.rows = Number(*json, "rows");
    stats.rejected = Number(*json, "rejected");
    stats.bytes = Number(*json, "bytes");
    stats.proxied = Number(*json, "proxied");
    stats.unauthorized = Number(*json, "unauthorized");
    stats.tooLarge = Number(*json, "tooLarge");
    stats.latencyRows = Number(*json, "latencyRows");
    for (auto [name, field] :
         {std::pair{"latencyP50Ms", &stats.latencyP50Ms}, std::pair{"latencyP99Ms", &stats.latencyP99Ms}}) {
        if (const JsonValue* v = json->Find(name)) *field = static_cast<std::int64_t>(v->AsDouble().value_or(-1));
    }
    return stats;
}

std::vector<ReceivedRow> AzureLocalProcess::Rows() {
    std::string body;
    std::vector<ReceivedRow> rows;
    if (!Control("GET", "/_control/rows", &body)) return rows;
    std::size_t start = 0;
    while (start < body.size()) {
        auto end = body.find('\n', start);
        if (end == std::string::npos) end = body.size();
        ReceivedRow received;
        if (auto row = RowFromJsonLine(std::string_view(body).substr(start, end - start), &received.entity,
                                       &received.format, &received.messageId)) {
            received.row = std::move(*row);
            rows.push_back(std::move(received));
        }
        start = end + 1;
    }
    return rows;
}

bool MakeSelfSignedCertificate(const std::string& dir, std::string& certFile, std::string& keyFile) {
    EVP_PKEY* key = EVP_RSA_gen(2048);
    X509* cert = X509_new();
    bool ok = key && cert;
    if (ok) {
        ASN1_INTEGER_set(X509_get_serialNumber(cert), 1);
        X509_gmtime_adj(X509_getm_notBefore(cert), -3600);
        X509_gmtime_adj(X509_getm_notAfter(cert), 24 * 3600);
        X509_set_pubkey(cert, key);
        X509_NAME* name = X509_get_subject_name(cert);
        X509_NAME_add_entry_by_txt(name, "CN", MBSTRING_ASC, reinterpret_cast<const unsigned char*>("127.0.0.1"), -1,
                                   -1, 0);
        X509_set_issuer_name(cert, name);
        X509V3_CTX ctx;
        X509V3_set_ctx_nodb(&ctx);
        X509V3_set_ctx(&ctx, cert, cert, nullptr, nullptr, 0);
        for (const auto& [nid, value] :
             {std::pair{NID_subject_alt_name, "IP:127.0.0.1"}, std::pair{NID_basic_constraints, "critical,CA:TRUE"}}) {
            X509_EXTENSION* ext = X509V3_EXT_conf_nid(nullptr, &ctx, nid, value);
            ok = ok && ext && X509_add_ext(cert, ext, -1);
            X509_EXTENSION_free(ext);
        }
        ok = ok && X509_sign(cert, key, EVP_sha256()) > 0;
    }
    certFile = dir + "/cert.pem";
    keyFile = dir + "/key.pem";
    if (ok) {
        FILE* c = std::fopen(certFile.c_str(), "w");
        FILE* k = std::fopen(keyFile.c_str(), "w");
        ok = c && k && PEM_write_X509(c, cert) && PEM_write_PrivateKey(k, key, nullptr, nullptr, 0, nullptr, nullptr);
        if (c) std::fclose(c);
        if (k) std::fclose(k);
    }
    X509_free(cert);
    EVP_PKEY_free(key);
    return ok;
}

}  // namespace azurelocal
