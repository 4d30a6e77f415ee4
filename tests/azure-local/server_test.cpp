// azure-local over raw HTTP: what it accepts, what it refuses, and its faults.

#include <gtest/gtest.h>

#include <QFile>
#include <QTemporaryDir>

#include <curl/curl.h>
#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <QDateTime>

#include <chrono>
#include <ctime>
#include <future>
#include <string>
#include <vector>

#include "AzureLocalProcess.h"
#include "RowDecoders.h"

using azurelocal::AzureLocalProcess;

namespace {

struct Answer {
    long status = 0;
    std::string body;
    std::string headers;
};

size_t Append(char* data, size_t size, size_t count, void* user) {
    static_cast<std::string*>(user)->append(data, size * count);
    return size * count;
}

// One request on a shared handle, so that consecutive requests reuse the connection.
class RawClient {
public:
    RawClient() : m_curl(curl_easy_init()) {}
    ~RawClient() { curl_easy_cleanup(m_curl); }

    Answer Post(const std::string& url, const std::vector<std::string>& headers, const std::string& body) {
        Answer answer;
        curl_slist* list = nullptr;
        for (const auto& h : headers) list = curl_slist_append(list, h.c_str());
        curl_easy_setopt(m_curl, CURLOPT_URL, url.c_str());
        curl_easy_setopt(m_curl, CURLOPT_NOPROXY, "*");
        curl_easy_setopt(m_curl, CURLOPT_POST, 1L);
        curl_easy_setopt(m_curl, CURLOPT_POSTFIELDS, body.data());
        curl_easy_setopt(m_curl, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size()));
        curl_easy_setopt(m_curl, CURLOPT_HTTPHEADER, list);
        curl_easy_setopt(m_curl, CURLOPT_TIMEOUT, 10L);
        curl_easy_setopt(m_curl, CURLOPT_WRITEFUNCTION, Append);
        curl_easy_setopt(m_curl, CURLOPT_WRITEDATA, &answer.body);
        curl_easy_setopt(m_curl, CURLOPT_HEADERFUNCTION, Append);
        curl_easy_setopt(m_curl, CURLOPT_HEADERDATA, &answer.headers);
        if (curl_easy_perform(m_curl) == CURLE_OK) curl_easy_getinfo(m_curl, CURLINFO_RESPONSE_CODE, &answer.status);
        curl_easy_setopt(m_curl, CURLOPT_HTTPHEADER, nullptr);
        curl_slist_free_all(list);
        return answer;
    }

    long Connections() {
        long count = 0;
        curl_easy_getinfo(m_curl, CURLINFO_NUM_CONNECTS, &count);
        return count;
    }

private:
    CURL* m_curl;
};

std::string SignForTest(const std::string& key, const std::string& text) {
    unsigned char digest[32];
    unsigned int length = 0;
    HMAC(EVP_sha256(), key.data(), static_cast<int>(key.size()), reinterpret_cast<const unsigned char*>(text.data()),
         text.size(), digest, &length);
    unsigned char base64[64];
    EVP_EncodeBlock(base64, digest, 32);
    std::string encoded;
    for (const char* c = reinterpret_cast<char*>(base64); *c; ++c)
        encoded += *c == '+' ? "%2B" : *c == '/' ? "%2F" : *c == '=' ? "%3D" : std::string(1, *c);
    return encoded;
}

// A token made here, independently of the sender's code.
std::string Token(int port, const std::string& entity, const std::string& key = AzureLocalProcess::kKey) {
    const std::string sr = "http%3A%2F%2F127.0.0.1%3A" + std::to_string(port) + "%2F" + entity;
    const std::string se = std::to_string(std::time(nullptr) + 600);
    return "SharedAccessSignature sr=" + sr + "&sig=" + SignForTest(key, sr + "\n" + se) + "&se=" + se +
           "&skn=" + AzureLocalProcess::kKeyName;
}

const std::string kJsonBody =
    R"([{"project":"P","variable":"V","value":2,"time":"2024-01-01T00:00:00.000Z","status":7}])";

}  // namespace

class ServerTest : public ::testing::Test {
protected:
    void SetUp() override {
        std::string error;
        server = AzureLocalProcess::Start({"--record", dir.filePath("rows.jsonl"), "--max-message-bytes", "2000",
                                           "--entity", "q", "--entity", "hub"},
                                          error);
        ASSERT_TRUE(server) << error;
        base = "http://127.0.0.1:" + std::to_string(server->Port());
    }
    std::vector<std::string> Headers(const std::string& entity, const std::string& format = "JSON") {
        return {"Authorization: " + Token(server->Port(), entity), "Format: \"" + format + "\"",
                "BrokerProperties: {\"MessageId\":\"m-1\"}", "Content-Type: application/json"};
    }

    QTemporaryDir dir;
    std::unique_ptr<AzureLocalProcess> server;
    std::string base;
    RawClient client;
};

TEST_F(ServerTest, AcceptsAndRecordsMessagesOnOneConnection) {
    for (int i = 0; i < 3; ++i) {
        const Answer a = client.Post(base + "/q/messages?timeout=60", Headers("q"), kJsonBody);
        EXPECT_EQ(a.status, 201) << a.body;
    }
    EXPECT_EQ(client.Connections(), 0) << "the last request reused the connection";
    const Answer hub = client.Post(base + "/hub/messages?timeout=60&api-version=2014-01", Headers("hub"), kJsonBody);
    EXPECT_EQ(hub.status, 201) << hub.body;

    const auto stats = server->Stats();
    EXPECT_EQ(stats.requests, 4u);
    EXPECT_EQ(stats.messages, 4u);
    EXPECT_EQ(stats.rows, 4u);
    const auto rows = server->Rows();
    ASSERT_EQ(rows.size(), 4u);
    EXPECT_EQ(rows[0].messageId, "m-1");
    EXPECT_EQ(rows[0].row.status, 7u);
    EXPECT_EQ(rows[3].entity, "hub");

    QFile file(dir.filePath("rows.jsonl"));
    ASSERT_TRUE(file.open(QIODevice::ReadOnly));
    const QList<QByteArray> lines = file.readAll().trimmed().split('\n');
    ASSERT_EQ(lines.size(), 4);
    EXPECT_TRUE(azurelocal::RowFromJsonLine(lines[0].toStdString()));
}

TEST_F(ServerTest, RefusesWhatTheServiceWouldRefuse) {
    // token for another entity, a wrong key, none at all
    auto headers = Headers("other");
    EXPECT_EQ(client.Post(base + "/q/messages", headers, kJsonBody).status, 401);
    headers[0] = "Authorization: " + Token(server->Port(), "q", "wrong");
    EXPECT_EQ(client.Post(base + "/q/messages", headers, kJsonBody).status, 401);
    headers.erase(headers.begin());
    EXPECT_EQ(client.Post(base + "/q/messages", headers, kJsonBody).status, 401);

    EXPECT_EQ(client.Post(base + "/nowhere/messages", Headers("nowhere"), kJsonBody).status, 404);
    const Answer big = client.Post(base + "/q/messages", Headers("q"), "[" + std::string(3000, ' ') + "]");
    EXPECT_EQ(big.status, 413);
    const Answer malformed = client.Post(base + "/q/messages", Headers("q"), "[{]");
    EXPECT_EQ(malformed.status, 400);
    EXPECT_NE(malformed.body.find("JSON body"), std::string::npos) << malformed.body;
    EXPECT_EQ(client.Post(base + "/q/messages", Headers("q", "YAML"), kJsonBody).status, 400);
    EXPECT_EQ(client.Post(base + "/q/messages", {"Transfer-Encoding: chunked", "Authorization: x"}, kJsonBody).status,
              411);
    EXPECT_EQ(client.Post(base + "/q/other", Headers("q"), kJsonBody).status, 404);

    // Still serving after all that.
    EXPECT_EQ(client.Post(base + "/q/messages", Headers("q"), kJsonBody).status, 201);
    EXPECT_EQ(server->Stats().rows, 1u);
}

TEST_F(ServerTest, InjectsFaultsInOrder) {
    ASSERT_TRUE(server->Fault("status=503&count=2&retry-after=3"));
    ASSERT_TRUE(server->Fault("status=429&retry-after-ms=250"));
    const Answer a = client.Post(base + "/q/messages", Headers("q"), kJsonBody);
    EXPECT_EQ(a.status, 503);
    EXPECT_NE(a.headers.find("Retry-After: 3"), std::string::npos) << a.headers;
    EXPECT_EQ(client.Post(base + "/q/messages", Headers("q"), kJsonBody).status, 503);
    const Answer c = client.Post(base + "/q/messages", Headers("q"), kJsonBody);
    EXPECT_EQ(c.status, 429);
    EXPECT_NE(c.headers.find("retry-after-ms: 250"), std::string::npos) << c.headers;
    EXPECT_EQ(client.Post(base + "/q/messages", Headers("q"), kJsonBody).status, 201);

    // libcurl retries once by itself when a reused connection dies, so close twice.
    ASSERT_TRUE(server->Fault("kind=close&count=2"));
    EXPECT_EQ(client.Post(base + "/q/messages", Headers("q"), kJsonBody).status, 0) << "connection closed";
    EXPECT_EQ(client.Post(base + "/q/messages", Headers("q"), kJsonBody).status, 201);

    EXPECT_FALSE(server->Fault("kind=explode"));
    EXPECT_FALSE(server->Fault("status=99"));
    EXPECT_FALSE(server->Fault("count=0"));
    EXPECT_EQ(server->Stats().rejected, 3u);
}

// A row stamped `ageMs` before now, in the JSON the client writes.
std::string JsonRowBody(qint64 ageMs) {
    const QString time = QDateTime::currentDateTimeUtc().addMSecs(-ageMs).toString(Qt::ISODateWithMs);
    return R"([{"project":"P","variable":"V","value":1,"time":")" + time.toStdString() + R"(","status":0}])";
}

TEST_F(ServerTest, ReportsHowOldDecodedRowsAreOnArrival) {
    EXPECT_EQ(server->Stats().latencyP50Ms, -1) << "nothing decoded yet";
    for (int i = 0; i < 9; ++i)
        ASSERT_EQ(client.Post(base + "/q/messages", Headers("q"), JsonRowBody(2000)).status, 201);
    ASSERT_EQ(client.Post(base + "/q/messages", Headers("q"), JsonRowBody(30000)).status, 201);
    const auto stats = server->Stats();
    EXPECT_EQ(stats.latencyRows, 10u);
    EXPECT_GE(stats.latencyP50Ms, 2000);
    EXPECT_LT(stats.latencyP50Ms, 12000);
    EXPECT_GE(stats.latencyP99Ms, 30000) << "the one old row is the 99th percentile";
    ASSERT_TRUE(server->Reset());
    EXPECT_EQ(server->Stats().latencyRows, 0u);
}

// The benchmarks' receiver: rows counted from the body, checked against the
// sender's RowCount, neither decoded nor recorded.
TEST(ServerCountOnly, CountsRowsOfEveryFormatWithoutDecoding) {
    std::string error;
    auto server = AzureLocalProcess::Start({"--count-only"}, error);
    ASSERT_TRUE(server) << error;
    const std::string base = "http://127.0.0.1:" + std::to_string(server->Port());
    RawClient client;
    auto headers = [&](const std::string& format, const std::string& rowCount) {
        std::vector<std::string> list{"Authorization: " + Token(server->Port(), "q"), "Format: \"" + format + "\""};
        if (!rowCount.empty()) list.push_back("RowCount: " + rowCount);
        return list;
    };
    // A text value holding a row's opening is escaped, so it does not count.
    const std::string json = R"([{"project":"P","variable":"A","value":"{\"project\":","time":"x","status":0},)"
                             R"({"project":"P","variable":"B","value":2,"time":"x","status":0}])";
    EXPECT_EQ(client.Post(base + "/q/messages", headers("JSON", "2"), json).status, 201);
    const std::string xml = R"(<?xml version="1.0" encoding="UTF-8"?><rows><row project="P">&lt;row </row>)"
                            R"(<row project="P">2</row><row project="P">3</row></rows>)";
    EXPECT_EQ(client.Post(base + "/q/messages", headers("xml", ""), xml).status, 201) << "the format in any case";
    const std::string bond("CB\x01\x00\x0B\x0A\xAC\x02", 8);  // a list of 300 rows (their bytes are not read)
    EXPECT_EQ(client.Post(base + "/q/messages", headers("BOND", "300"), bond).status, 201);

    const Answer miscounted = client.Post(base + "/q/messages", headers("JSON", "3"), json);
    EXPECT_EQ(miscounted.status, 400);
    EXPECT_NE(miscounted.body.find("RowCount says 3"), std::string::npos) << miscounted.body;
    EXPECT_EQ(client.Post(base + "/q/messages", headers("JSON", ""), "hello").status, 400);
    EXPECT_EQ(client.Post(base + "/q/messages", headers("BOND", ""), "CB").status, 400);
    auto unsigned_ = headers("JSON", "2");
    unsigned_.erase(unsigned_.begin());
    EXPECT_EQ(client.Post(base + "/q/messages", unsigned_, json).status, 401) << "the signature is still checked";

    const auto stats = server->Stats();
    EXPECT_EQ(stats.rows, 2u + 3u + 300u);
    EXPECT_EQ(stats.messages, 3u);
    EXPECT_EQ(stats.latencyRows, 0u);
    EXPECT_TRUE(server->Rows().empty()) << "nothing is recorded";
}

TEST(ServerCountOnly, WaitAnswersWhenTheRowsHaveArrivedOrAtItsTimeOut) {
    std::string error;
    auto server = AzureLocalProcess::Start({"--count-only"}, error);
    ASSERT_TRUE(server) << error;
    EXPECT_TRUE(server->WaitForRows(0, 1000).answered) << "already there: at once";
    const auto timedOut = server->WaitForRows(5, 200);
    EXPECT_TRUE(timedOut.answered);
    EXPECT_EQ(timedOut.rows, 0u);

    using Clock = std::chrono::steady_clock;
    const auto start = Clock::now();
    auto waiting = std::async(std::launch::async, [&] { return server->WaitForRows(2, 60000); });
    RawClient client;
    const std::string json = R"([{"project":"P","variable":"A","value":1,"time":"x","status":0},)"
                             R"({"project":"P","variable":"B","value":2,"time":"x","status":0}])";
    // The message may come before the wait is registered; either way the answer has both rows.
    EXPECT_EQ(client
                  .Post("http://127.0.0.1:" + std::to_string(server->Port()) + "/q/messages",
                        {"Authorization: " + Token(server->Port(), "q"), "Format: \"JSON\""}, json)
                  .status,
              201);
    const auto arrived = waiting.get();
    EXPECT_EQ(arrived.rows, 2u);
    EXPECT_LT(Clock::now() - start, std::chrono::seconds(30)) << "answered by the arrival, not the time-out";
}

TEST(ServerStart, RefusesNonLoopbackAddresses) {
    std::string error;
    EXPECT_FALSE(AzureLocalProcess::Start({"--host", "0.0.0.0"}, error));
    EXPECT_FALSE(error.empty());
}
