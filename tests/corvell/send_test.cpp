// Sending to azure-local, grouped by what can go wrong on the way.

#include <gtest/gtest.h>

#include <QTemporaryDir>

#include <dlfcn.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <cmath>
#include <cstdio>
#include <set>

#include "private/AzureClient.h"
#include "AzureLocalProcess.h"
#include "RecordingLogger.h"
#include "private/Sas.h"

using namespace corvell;
using azurelocal::AzureLocalProcess;
using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

namespace {

// Time moved by hand: a pause moves the steady clock on at once and is noted,
// and the wall clock stands until a test moves it. Tokens it dates are
// checked by the receiver against the real clock, so it starts at the real time.
class ManualClock : public ClientClock {
public:
    std::chrono::steady_clock::time_point Now() override { return m_steady; }
    std::int64_t UnixSeconds() override { return m_unixSeconds; }
    void Sleep(milliseconds wait) override {
        m_pauses.push_back(wait);
        m_steady += wait;
    }
    void AdvanceWallClock(std::chrono::seconds by) { m_unixSeconds += by.count(); }
    const std::vector<milliseconds>& Pauses() const { return m_pauses; }

private:
    std::chrono::steady_clock::time_point m_steady = std::chrono::steady_clock::now();
    std::int64_t m_unixSeconds = std::time(nullptr);
    std::vector<milliseconds> m_pauses;
};

ClientOptions FastOptions() {
    ClientOptions o;
    o.sendBudget = milliseconds(5000);
    o.requestTimeout = milliseconds(2000);
    o.connectTimeout = milliseconds(1000);
    o.firstBackoff = milliseconds(50);
    return o;
}

// For handshakes, which under a sanitizer on a busy machine may take seconds.
ClientOptions PatientOptions() {
    ClientOptions o = FastOptions();
    o.sendBudget = o.requestTimeout = o.connectTimeout = milliseconds(20000);
    return o;
}

std::unique_ptr<AzureLocalProcess> StartServer(const QStringList& arguments = {}) {
    std::string error;
    auto server = AzureLocalProcess::Start(arguments, error);
    EXPECT_TRUE(server) << error;
    return server;
}

struct TestRow {
    std::u16string project, variable, text;
    double value = 0;
    bool isText = false;
    std::uint32_t time = 0;
    std::uint16_t ms = 0;
    std::uint64_t status = 0;
};

std::vector<TestRow> MakeRows(std::size_t n) {
    std::vector<TestRow> rows;
    for (std::size_t i = 0; i < n; ++i) {
        TestRow r;
        r.project = u"Line" + QString::number(i % 3).toStdU16String();
        r.variable = u"Var\u00e9" + QString::number(i).toStdU16String();
        r.isText = i % 4 == 3;
        if (r.isText) r.text = u"text <&> \"" + QString::number(i).toStdU16String();
        r.value = r.isText ? 0 : static_cast<double>(i) * 1.25 - 7;
        r.time = 1700000000u + static_cast<std::uint32_t>(i);
        r.ms = static_cast<std::uint16_t>(i % 1000);
        r.status = (static_cast<std::uint64_t>(i) << 33) | i;
        rows.push_back(r);
    }
    return rows;
}

Row ToRow(const TestRow& t) {
    Row row;
    row.project = t.project;
    row.variable = t.variable;
    row.text = t.text;
    row.value = t.value;
    row.isText = t.isText;
    row.time = t.time;
    row.milliseconds = t.ms;
    row.status = t.status;
    return row;
}

bool SendRows(AzureClient& client, const std::string& connection, const std::string& entity, bool eventHub, int format,
              const std::vector<TestRow>& rows) {
    if (!client.Begin(QString::fromStdString(connection).toStdU16String(),
                      QString::fromStdString(entity).toStdU16String(), eventHub, format))
        return false;
    for (const auto& r : rows)
        if (!client.Add(ToRow(r))) return false;
    return client.Send();
}

void ExpectArrived(const std::vector<TestRow>& sent, const std::vector<azurelocal::ReceivedRow>& received,
                   const std::string& entity) {
    ASSERT_EQ(received.size(), sent.size());
    for (std::size_t i = 0; i < sent.size(); ++i) {
        const auto& got = received[i].row;
        const auto& want = sent[i];
        EXPECT_EQ(received[i].entity, entity);
        EXPECT_FALSE(received[i].messageId.empty());
        EXPECT_EQ(got.project, QString::fromStdU16String(want.project).toStdString());
        EXPECT_EQ(got.variable, QString::fromStdU16String(want.variable).toStdString());
        EXPECT_EQ(got.isText, want.isText);
        if (want.isText) {
            EXPECT_EQ(got.text, QString::fromStdU16String(want.text).toStdString());
        } else {
            EXPECT_EQ(got.value, want.value);
        }
        EXPECT_EQ(got.time, want.time);
        EXPECT_EQ(got.milliseconds, want.ms);
        EXPECT_EQ(got.status, want.status);
    }
}

int FreePortWithNothingListening() {
    const int fd = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address);
    socklen_t length = sizeof address;
    getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length);
    close(fd);
    return ntohs(address.sin_port);
}

// The counts of a send's error record: failed, of total, delivered.
struct SendCounts {
    std::size_t failed = 0, total = 0, delivered = 0;
};
SendCounts CountsOf(const std::string& record) {
    SendCounts counts;
    const auto at = record.find("failed for ");
    const bool found = at != std::string::npos &&
                       std::sscanf(record.c_str() + at, "failed for %zu of %zu rows (%zu delivered)", &counts.failed,
                                   &counts.total, &counts.delivered) == 3;
    EXPECT_TRUE(found) << record;
    return counts;
}

// Rows with JSON bodies of about 100 bytes each, whose variable names can be
// matched in a body ("Row42," cannot be found inside "Row420,").
std::vector<TestRow> NumberedRows(std::size_t n) {
    std::vector<TestRow> rows = MakeRows(n);
    for (std::size_t i = 0; i < n; ++i) rows[i].variable = u"Row" + QString::number(i).toStdU16String() + u",";
    return rows;
}

std::set<std::string> ArrivedNames(const std::vector<azurelocal::ReceivedRow>& received) {
    std::set<std::string> names;
    for (const auto& r : received) names.insert(r.row.variable);
    return names;
}

class SendTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { s_server = StartServer().release(); }
    static void TearDownTestSuite() {
        delete s_server;
        s_server = nullptr;
    }
    void SetUp() override {
        ASSERT_TRUE(s_server);
        ASSERT_TRUE(s_server->Reset());
    }
    void TearDown() override {
        // No record of any test may carry the key or a signature.
        const std::string all = logger.All();
        EXPECT_EQ(all.find(AzureLocalProcess::kKey), std::string::npos) << all;
        for (auto at = all.find("sig="); at != std::string::npos; at = all.find("sig=", at + 1))
            EXPECT_EQ(all.substr(at + 4, 3), "***") << all;
    }

    AzureLocalProcess& server() { return *s_server; }

    static AzureLocalProcess* s_server;
    RecordingLogger logger;
};
AzureLocalProcess* SendTest::s_server = nullptr;

}  // namespace

// --- Rows arrive intact -------------------------------------------------------

TEST_F(SendTest, RowsArriveIntactInEveryFormatAndMode) {
    AzureClient client(&logger, {}, FastOptions());
    const auto rows = MakeRows(40);
    for (const int format : {0, 1, 2}) {
        for (const bool eventHub : {false, true}) {
            ASSERT_TRUE(server().Reset());
            const std::string entity = eventHub ? "hub-1" : "queue.1";
            ASSERT_TRUE(SendRows(client, server().ConnectionString(), entity, eventHub, format, rows)) << logger.All();
            const auto received = server().Rows();
            ExpectArrived(rows, received, entity);
            const char* formats[] = {"XML", "JSON", "BOND"};
            if (!received.empty()) {
                EXPECT_EQ(received[0].format, formats[format]);
            }
            EXPECT_EQ(server().Stats().messages, 1u) << "many rows go in one message";
            EXPECT_EQ(client.LastSend().rows, rows.size());
        }
    }
    EXPECT_TRUE(logger.Errors().empty()) << logger.All();
}

TEST_F(SendTest, EntityComesFromEntityPathAndAMismatchIsRefused) {
    AzureClient client(&logger, {}, FastOptions());
    const auto rows = MakeRows(3);
    ASSERT_TRUE(SendRows(client, server().ConnectionString(";EntityPath=from-path"), "", false, 1, rows));
    ASSERT_TRUE(SendRows(client, server().ConnectionString(";EntityPath=same"), "SAME", false, 1, rows));
    const auto received = server().Rows();
    ASSERT_EQ(received.size(), 6u);
    EXPECT_EQ(received[0].entity, "from-path");

    EXPECT_FALSE(SendRows(client, server().ConnectionString(";EntityPath=one"), "other", false, 1, rows));
    ASSERT_EQ(logger.Errors().size(), 1u);
    EXPECT_NE(logger.Errors()[0].find("'other' differs from the connection string's EntityPath 'one'"),
              std::string::npos)
        << logger.Errors()[0];
    EXPECT_FALSE(client.Add(ToRow(rows[0]))) << "no batch is open after a refused Begin";
    EXPECT_FALSE(client.Send());
    EXPECT_FALSE(SendRows(client, server().ConnectionString(), "", false, 1, rows)) << "no entity at all";
    EXPECT_EQ(server().Stats().requests, 2u);
}

TEST_F(SendTest, LibraryExportsDriveTheWholeRoad) {
    const std::string path = azurelocal::BuildBinaryDir() + "/libCorvell.so";
    void* library = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
    ASSERT_TRUE(library) << dlerror();
    auto create = reinterpret_cast<PFN_CreateAzureInstance>(dlsym(library, "CreateAzureInstance"));
    auto destroy = reinterpret_cast<PFN_DestroyAzureInstance>(dlsym(library, "DestroyAzureInstance"));
    ASSERT_TRUE(create && destroy);
    IAzureInstance* instance = create(&logger, nullptr, nullptr, nullptr);
    ASSERT_TRUE(instance);
    instance->Reserved1();  // harmless
    const std::u16string connection = QString::fromStdString(server().ConnectionString()).toStdU16String();

    EXPECT_FALSE(instance->BeginOnlineRows(u"Endpoint=nonsense", u"q", false, 1));
    EXPECT_FALSE(instance->BeginOnlineRows(connection.c_str(), u"q", false, 7)) << "unknown format";
    EXPECT_EQ(logger.Errors().size(), 2u);

    ASSERT_TRUE(instance->BeginOnlineRows(connection.c_str(), u"q", true, FormatBond));
    EXPECT_TRUE(instance->AddOnlineRow(u"P", u"V", 0, 3.5, nullptr, false, 1700000000u, 1500, 0xFFFFFFFFu, 0x7u));
    EXPECT_TRUE(instance->AddOnlineRow(nullptr, u"T", 0, 0, u"txt", true, 4294967295u, 0, 1, 0));
    EXPECT_TRUE(instance->SendOnlineRows());
    EXPECT_FALSE(instance->SendOnlineRows()) << "the batch was closed by the first send";
    destroy(instance);
    dlclose(library);

    const auto received = server().Rows();
    ASSERT_EQ(received.size(), 2u);
    EXPECT_EQ(received[0].row.project, "P");
    EXPECT_EQ(received[0].row.value, 3.5);
    EXPECT_EQ(received[0].row.time, 1700000001) << "1500 ms carry into the seconds";
    EXPECT_EQ(received[0].row.milliseconds, 500u);
    EXPECT_EQ(received[0].row.status, 0x7'FFFFFFFFull) << "low word first";
    EXPECT_EQ(received[1].row.project, "");
    EXPECT_EQ(received[1].row.text, "txt");
    EXPECT_EQ(received[1].row.time, 4294967295);
}

// --- Size limits ----------------------------------------------------------------

TEST_F(SendTest, ABatchOverTheLimitIsSplitAndArrivesComplete) {
    ClientOptions options = FastOptions();
    options.serviceBusMessageBytes = 8 * 1024;
    options.headroomBytes = 512;
    AzureClient client(&logger, {}, options);
    ASSERT_TRUE(server().SetLimit(8 * 1024));
    const auto rows = MakeRows(600);
    for (const int format : {0, 1, 2}) {
        ASSERT_TRUE(server().Reset());
        ASSERT_TRUE(server().SetLimit(8 * 1024));
        ASSERT_TRUE(SendRows(client, server().ConnectionString(), "q", false, format, rows)) << logger.All();
        ExpectArrived(rows, server().Rows(), "q");
        const auto stats = server().Stats();
        EXPECT_GT(stats.messages, 3u);
        EXPECT_EQ(stats.tooLarge, 0u) << "cut to the limit before sending";
        EXPECT_LE(stats.bytes / stats.messages, 8u * 1024);
    }
}

TEST_F(SendTest, TooLargeAnswersHalveTheMessageUntilItFits) {
    AzureClient client(&logger, {}, FastOptions());  // believes 256 KB fit
    ASSERT_TRUE(server().SetLimit(6000));
    const auto rows = MakeRows(500);
    ASSERT_TRUE(SendRows(client, server().ConnectionString(), "q", false, 1, rows)) << logger.All();
    ExpectArrived(rows, server().Rows(), "q");
    const auto stats = server().Stats();
    EXPECT_GT(stats.tooLarge, 0u);
    EXPECT_EQ(stats.rows, rows.size()) << "nothing sent twice";
    EXPECT_TRUE(logger.Errors().empty()) << logger.All();
}

TEST_F(SendTest, ARowLargerThanAnyMessageIsRefusedAlone) {
    ClientOptions options = FastOptions();
    options.serviceBusMessageBytes = 4096;
    options.headroomBytes = 256;
    AzureClient client(&logger, {}, options);
    ASSERT_TRUE(client.Begin(QString::fromStdString(server().ConnectionString()).toStdU16String(), u"q", false, 1));
    const auto rows = MakeRows(2);
    EXPECT_TRUE(client.Add(ToRow(rows[0])));
    TestRow huge = rows[1];
    huge.isText = true;
    huge.text = std::u16string(5000, u'x');
    EXPECT_FALSE(client.Add(ToRow(huge)));
    EXPECT_TRUE(client.Add(ToRow(rows[1])));
    EXPECT_TRUE(client.Send());
    EXPECT_EQ(server().Rows().size(), 2u);
    ASSERT_EQ(logger.Errors().size(), 1u);
    EXPECT_NE(logger.Errors()[0].find("more than a message may hold"), std::string::npos);

    // A service that refuses even one row fails the send instead of looping.
    ASSERT_TRUE(server().SetLimit(10));
    EXPECT_FALSE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(4)));
    EXPECT_LE(server().Stats().requests, 10u);
}

TEST_F(SendTest, ARefusedMessageIsDroppedAloneAndTheRestArrive) {
    ClientOptions options = FastOptions();
    options.serviceBusMessageBytes = 4096;  // about 40 rows a message
    options.headroomBytes = 256;
    AzureClient client(&logger, {}, options);
    const auto rows = NumberedRows(300);

    // A 400 for the message holding one row, and one for the third message: both are dropped alone.
    ASSERT_TRUE(server().Fault("status=400&match=%22Row77,%22"));
    ASSERT_TRUE(server().Fault("status=400&at=3"));
    EXPECT_FALSE(SendRows(client, server().ConnectionString(), "q", false, 1, rows));
    const auto received = server().Rows();
    const auto names = ArrivedNames(received);
    EXPECT_EQ(names.count("Row77,"), 0u);
    EXPECT_EQ(names.count("Row299,"), 1u) << "the rows after the refused messages arrive";
    ASSERT_EQ(logger.Errors().size(), 1u) << logger.All();
    const SendCounts counts = CountsOf(logger.Errors()[0]);
    EXPECT_EQ(counts.total, rows.size());
    EXPECT_EQ(counts.delivered, received.size());
    EXPECT_EQ(counts.failed + counts.delivered, rows.size());
    EXPECT_GT(counts.failed, 40u);  // two whole messages
    EXPECT_NE(logger.Errors()[0].find("in 2 messages refused (HTTP 400 (injected fault))"), std::string::npos)
        << logger.Errors()[0];
    EXPECT_EQ(client.LastSend().rows, received.size());

    // A single row too large for the service even alone is dropped; the others arrive.
    ASSERT_TRUE(server().Reset());
    logger.Clear();
    AzureClient believing(&logger, {}, FastOptions());  // believes 256 KB fit
    ASSERT_TRUE(server().SetLimit(3000));
    std::vector<TestRow> withHuge = NumberedRows(60);
    withHuge[30].isText = true;
    withHuge[30].text = std::u16string(4000, u'x');
    EXPECT_FALSE(SendRows(believing, server().ConnectionString(), "q", false, 1, withHuge));
    EXPECT_EQ(server().Rows().size(), 59u);
    ASSERT_EQ(logger.Errors().size(), 1u) << logger.All();
    const SendCounts single = CountsOf(logger.Errors()[0]);
    EXPECT_EQ(single.failed, 1u);
    EXPECT_EQ(single.delivered, 59u);
    EXPECT_NE(logger.Errors()[0].find("a single row is too large"), std::string::npos) << logger.Errors()[0];
}

TEST_F(SendTest, ARefusalOfTheTargetEndsTheSendAtOnce) {
    ClientOptions options = FastOptions();
    options.serviceBusMessageBytes = 4096;
    options.headroomBytes = 256;
    AzureClient client(&logger, {}, options);
    const auto rows = NumberedRows(300);
    for (const char* fault : {"status=404&at=2", "status=410&at=2", "status=403&at=2", "status=401&at=2&count=2"}) {
        ASSERT_TRUE(server().Reset());
        logger.Clear();
        ASSERT_TRUE(server().Fault(fault));
        EXPECT_FALSE(SendRows(client, server().ConnectionString(), "q", false, 1, rows));
        const auto stats = server().Stats();
        EXPECT_EQ(stats.requests, std::string(fault).find("401") != std::string::npos ? 3u : 2u) << fault;
        ASSERT_EQ(logger.Errors().size(), 1u) << logger.All();
        const SendCounts counts = CountsOf(logger.Errors()[0]);
        EXPECT_EQ(counts.delivered, stats.rows) << fault;
        EXPECT_EQ(counts.failed, rows.size() - stats.rows) << fault;
        EXPECT_NE(logger.Errors()[0].find(" rows not sent: HTTP "), std::string::npos) << logger.Errors()[0];
    }
}

TEST_F(SendTest, ARefusedSizeIsRememberedPerTarget) {
    AzureClient client(&logger, {}, FastOptions());  // believes 1 MB fit an Event Hub
    ASSERT_TRUE(server().SetLimit(256 * 1024, "event-hub"));
    const auto rows = MakeRows(12000);  // about 1.2 MB of JSON
    ASSERT_TRUE(SendRows(client, server().ConnectionString(), "hub", true, 1, rows)) << logger.All();
    auto stats = server().Stats();
    EXPECT_EQ(stats.rows, rows.size());
    EXPECT_GT(stats.tooLarge, 0u);
    EXPECT_LE(stats.tooLarge, 2u) << "later messages of the first batch are cut below the refused size";
    for (int batch = 0; batch < 3; ++batch) {
        const auto before = server().Stats();
        ASSERT_TRUE(SendRows(client, server().ConnectionString(), "hub", true, 1, rows)) << logger.All();
        stats = server().Stats();
        EXPECT_EQ(stats.tooLarge, before.tooLarge) << "batch " << batch + 2 << " needs no refused request";
        EXPECT_EQ(stats.rows - before.rows, rows.size());
        EXPECT_GT((stats.bytes - before.bytes) / (stats.messages - before.messages), 200u * 1024)
            << "messages stay close to the limit";
    }
    // Another target of the same client keeps its own limit: a Service Bus queue takes 256 KB as configured.
    const auto before = server().Stats();
    ASSERT_TRUE(SendRows(client, server().ConnectionString(), "queue", false, 1, rows)) << logger.All();
    EXPECT_EQ(server().Stats().tooLarge, before.tooLarge);
    EXPECT_TRUE(logger.Errors().empty()) << logger.All();
}

TEST_F(SendTest, RecordsQuoteNamesAndServiceTextsWithinABound) {
    AzureClient client(&logger, {}, FastOptions());
    const std::u16string connection = QString::fromStdString(server().ConnectionString()).toStdU16String();
    ASSERT_TRUE(client.Begin(connection, u"q", false, 1));
    TestRow huge = MakeRows(1)[0];
    huge.variable = std::u16string(300000, u'v');
    EXPECT_FALSE(client.Add(ToRow(huge)));
    EXPECT_FALSE(client.Begin(connection, std::u16string(300000, u'e'), false, 1));
    EXPECT_FALSE(client.Begin(u"Endpoint=" + std::u16string(300000, u's') +
                                  u"://x/;SharedAccessKeyName=k;"
                                  u"SharedAccessKey=k-text",
                              u"q", false, 1));

    // The receiver's 404 quotes the entity name of 260 characters.
    auto limited = StartServer({"--entity", "known"});
    ASSERT_TRUE(limited);
    const std::string entity(260, 'n');
    EXPECT_FALSE(SendRows(client, limited->ConnectionString(), entity, false, 1, MakeRows(2)));

    const auto errors = logger.Errors();
    ASSERT_EQ(errors.size(), 4u) << logger.All();
    for (const std::string& record : errors) {
        // At most two quoted texts (a target name and a service text) beside the fixed text.
        EXPECT_LT(record.size(), 2 * 256u + 300u) << record.substr(0, 1000);
        EXPECT_NE(record.find("more characters)"), std::string::npos) << record.substr(0, 400);
    }
}

// --- Tokens ---------------------------------------------------------------------

TEST_F(SendTest, A401RenewsTheTokenOnceAndThenSucceeds) {
    AzureClient client(&logger, {}, FastOptions());
    ASSERT_TRUE(server().Fault("status=401&count=1"));
    ASSERT_TRUE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(5))) << logger.All();
    EXPECT_EQ(server().Stats().requests, 2u);
    EXPECT_EQ(server().Rows().size(), 5u);
}

TEST_F(SendTest, AWrongKeyFailsAfterOneRenewal) {
    AzureClient client(&logger, {}, FastOptions());
    const std::string connection = "Endpoint=sb://127.0.0.1:" + std::to_string(server().Port()) +
                                   "/;SharedAccessKeyName=RootManageSharedAccessKey;SharedAccessKey=wrong-key-text;"
                                   "UseDevelopmentEmulator=true";
    EXPECT_FALSE(SendRows(client, connection, "q", false, 1, MakeRows(5)));
    EXPECT_EQ(server().Stats().requests, 2u);
    EXPECT_EQ(server().Stats().unauthorized, 2u);
    ASSERT_EQ(logger.Errors().size(), 1u);
    EXPECT_NE(logger.Errors()[0].find("HTTP 401"), std::string::npos) << logger.Errors()[0];
    EXPECT_NE(logger.Errors()[0].find("127.0.0.1:" + std::to_string(server().Port()) + "/q"), std::string::npos)
        << "names namespace and entity: " << logger.Errors()[0];
    EXPECT_EQ(logger.All().find("wrong-key-text"), std::string::npos);
}

TEST_F(SendTest, ATokenIsRenewedFiveMinutesBeforeItExpires) {
    ClientOptions options = FastOptions();
    const auto clock = std::make_shared<ManualClock>();
    options.clock = clock;
    AzureClient client(&logger, {}, options);  // tokens for an hour, renewed 300 s before
    const auto send = [&] {
        EXPECT_TRUE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(1))) << logger.All();
        return client.LastSend().tokens;
    };
    EXPECT_EQ(send(), 1u);
    EXPECT_EQ(send(), 0u) << "the first token is kept";
    clock->AdvanceWallClock(std::chrono::seconds(3299));
    EXPECT_EQ(send(), 0u);
    clock->AdvanceWallClock(std::chrono::seconds(1));
    EXPECT_EQ(send(), 1u) << "renewed at its expiry less 300 s";
    EXPECT_EQ(send(), 0u);
    EXPECT_EQ(server().Stats().unauthorized, 0u);
    EXPECT_EQ(server().Rows().size(), 5u);
}

TEST_F(SendTest, AReadySignatureIsUsedAsGiven) {
    AzureClient client(&logger, {}, FastOptions());
    const std::string resource = "http://127.0.0.1:" + std::to_string(server().Port()) + "/q";
    const SasToken token =
        MakeSasToken(resource, AzureLocalProcess::kKeyName, AzureLocalProcess::kKey, std::time(nullptr) + 600);
    const std::string connection = "Endpoint=sb://127.0.0.1:" + std::to_string(server().Port()) +
                                   "/;SharedAccessSignature=" + token.token + ";UseDevelopmentEmulator=true";
    ASSERT_TRUE(SendRows(client, connection, "q", false, 2, MakeRows(3))) << logger.All();
    EXPECT_EQ(server().Rows().size(), 3u);

    ASSERT_TRUE(server().Fault("status=401&count=1"));
    EXPECT_FALSE(SendRows(client, connection, "q", false, 2, MakeRows(3))) << "a given token cannot be renewed";
    EXPECT_EQ(server().Stats().requests, 2u);
    EXPECT_EQ(logger.All().find(token.signature), std::string::npos);
}

// --- Transient answers and transport errors ---------------------------------------

TEST_F(SendTest, ServerBusyWithRetryAfterIsRetriedAndSucceeds) {
    ClientOptions options = FastOptions();
    const auto clock = std::make_shared<ManualClock>();
    options.clock = clock;
    AzureClient client(&logger, {}, options);
    ASSERT_TRUE(server().Fault("status=503&count=2&retry-after-ms=150"));
    ASSERT_TRUE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(5))) << logger.All();
    EXPECT_EQ(server().Stats().requests, 3u);
    EXPECT_EQ(server().Rows().size(), 5u);

    ASSERT_TRUE(server().Reset());
    ASSERT_TRUE(server().Fault("status=503&count=1&retry-after=1"));
    ASSERT_TRUE(SendRows(client, server().ConnectionString(), "q", true, 2, MakeRows(5))) << logger.All();
    EXPECT_EQ(server().Rows().size(), 5u);
    EXPECT_EQ(clock->Pauses(), (std::vector<milliseconds>{milliseconds(150), milliseconds(150), milliseconds(1000)}))
        << "the waits the service asked for";
    EXPECT_TRUE(logger.Errors().empty()) << logger.All();
}

TEST_F(SendTest, ARetriedMessageKeepsItsMessageId) {
    AzureClient client(&logger, {}, FastOptions());
    ASSERT_TRUE(server().Fault("kind=close&count=1"));
    ASSERT_TRUE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(2))) << logger.All();
    ASSERT_TRUE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(2)));
    const auto rows = server().Rows();
    ASSERT_EQ(rows.size(), 4u);
    EXPECT_EQ(rows[0].messageId, rows[1].messageId);
    EXPECT_NE(rows[0].messageId, rows[2].messageId) << "a new message gets a new id";
    EXPECT_EQ(server().Stats().requests, 3u) << "the closed connection was retried once";
}

TEST_F(SendTest, RetriesEndAfterTheirNumberOrTheTimeBound) {
    ClientOptions options = FastOptions();
    const auto clock = std::make_shared<ManualClock>();
    options.clock = clock;
    AzureClient client(&logger, {}, options);
    ASSERT_TRUE(server().Fault("status=500&count=20"));
    EXPECT_FALSE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(5)));
    EXPECT_EQ(server().Stats().requests, 4u) << "one attempt and three retries";
    ASSERT_EQ(clock->Pauses().size(), 3u);
    for (std::size_t i = 0; i < 3; ++i) {  // 50 ms doubled per retry, with jitter of -20 % to +30 %
        const auto base = 50 << i;
        EXPECT_GE(clock->Pauses()[i].count(), base * 8 / 10) << i;
        EXPECT_LE(clock->Pauses()[i].count(), base * 13 / 10) << i;
    }
    ASSERT_EQ(logger.Errors().size(), 1u) << logger.All();
    EXPECT_NE(logger.Errors()[0].find("HTTP 500"), std::string::npos);

    // A wait the service asks for beyond the bound fails at once rather than sleeping.
    ASSERT_TRUE(server().Reset());
    logger.Clear();
    ASSERT_TRUE(server().Fault("status=429&count=1&retry-after=60"));
    EXPECT_FALSE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(5)));
    EXPECT_EQ(clock->Pauses().size(), 3u) << "no pause";
    ASSERT_EQ(logger.Errors().size(), 1u);
    EXPECT_NE(logger.Errors()[0].find("time bound"), std::string::npos) << logger.Errors()[0];

    // Time spent waiting counts: once the bound has passed, nothing more is tried.
    ASSERT_TRUE(server().Reset());
    logger.Clear();
    ASSERT_TRUE(server().Fault("status=503&count=2&retry-after=3"));
    EXPECT_FALSE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(5)));
    EXPECT_EQ(server().Stats().requests, 2u) << "3 s waited of 5 s; 3 s more would pass the bound";
    EXPECT_EQ(clock->Pauses().size(), 4u);
}

TEST_F(SendTest, AStalledServerEndsWithinTheTimeBound) {
    ClientOptions options = FastOptions();
    options.sendBudget = milliseconds(1500);
    options.requestTimeout = milliseconds(600);
    AzureClient client(&logger, {}, options);
    ASSERT_TRUE(server().Fault("kind=stall&count=50"));
    const auto start = Clock::now();
    EXPECT_FALSE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(5)));
    const auto elapsed = Clock::now() - start;
    EXPECT_GE(elapsed, milliseconds(600));
    EXPECT_LT(elapsed, milliseconds(1500 + 1000));
    EXPECT_EQ(logger.Errors().size(), 1u) << logger.All();
}

TEST_F(SendTest, ARefusedConnectionFailsWithinTheTimeBound) {
    ClientOptions options = FastOptions();
    options.sendBudget = milliseconds(1000);
    AzureClient client(&logger, {}, options);
    const std::string connection = "Endpoint=sb://127.0.0.1:" + std::to_string(FreePortWithNothingListening()) +
                                   "/;SharedAccessKeyName=k;SharedAccessKey=some-key;UseDevelopmentEmulator=true";
    const auto start = Clock::now();
    EXPECT_FALSE(SendRows(client, connection, "q", false, 1, MakeRows(5)));
    EXPECT_LT(Clock::now() - start, milliseconds(2500));
    ASSERT_EQ(logger.Errors().size(), 1u) << logger.All();
    EXPECT_NE(logger.Errors()[0].find("transport error"), std::string::npos) << logger.Errors()[0];
}

// --- Permanent answers ------------------------------------------------------------

TEST_F(SendTest, BadRequestAndMissingEntityFailAtOnce) {
    AzureClient client(&logger, {}, FastOptions());
    for (const int status : {400, 404, 410, 403}) {
        ASSERT_TRUE(server().Reset());
        logger.Clear();
        ASSERT_TRUE(server().Fault("status=" + std::to_string(status) + "&count=5"));
        EXPECT_FALSE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(3)));
        EXPECT_EQ(server().Stats().requests, 1u) << status;
        ASSERT_EQ(logger.Errors().size(), 1u);
        EXPECT_NE(logger.Errors()[0].find("HTTP " + std::to_string(status)), std::string::npos);
        EXPECT_NE(logger.Errors()[0].find("injected fault"), std::string::npos) << "the service's error text";
    }
}

TEST(SendToOtherServers, AnUnknownEntityGets404FromTheReceiver) {
    auto server = StartServer({"--entity", "known"});
    ASSERT_TRUE(server);
    RecordingLogger logger;
    AzureClient client(&logger, {}, FastOptions());
    EXPECT_TRUE(SendRows(client, server->ConnectionString(), "known", false, 1, MakeRows(2)));
    EXPECT_FALSE(SendRows(client, server->ConnectionString(), "unknown", false, 1, MakeRows(2)));
    ASSERT_EQ(logger.Errors().size(), 1u);
    EXPECT_NE(logger.Errors()[0].find("HTTP 404 (The messaging entity 'unknown' could not be found.)"),
              std::string::npos)
        << logger.Errors()[0];
}

// --- Secrets ----------------------------------------------------------------------

// A service error text that echoes the token, or spells its signature and the
// key, is masked. TearDown checks that neither the key nor any "sig=" value
// reaches a record.
TEST_F(SendTest, ServiceTextsEchoingSecretsAreMasked) {
    const struct {
        const char* fault;
        const char* masked;
    } cases[] = {
        {"kind=echo-auth&status=400", "***"},
        {"kind=echo-signature&status=400",
         "the signature *** (***) of SharedAccessSignature *** was checked with the key ***"},
    };
    AzureClient client(&logger, {}, FastOptions());
    for (std::size_t i = 0; i < std::size(cases); ++i) {
        ASSERT_TRUE(server().Reset());
        ASSERT_TRUE(server().Fault(cases[i].fault));
        EXPECT_FALSE(SendRows(client, server().ConnectionString(), "q", false, 1, MakeRows(1))) << cases[i].fault;
        const auto errors = logger.Errors();  // kept for TearDown's check, so one more per case
        ASSERT_EQ(errors.size(), i + 1) << logger.All();
        EXPECT_NE(errors.back().find(cases[i].masked), std::string::npos) << errors.back();
    }
}

// --- TLS and proxy --------------------------------------------------------------------

TEST(SendToOtherServers, CertificatesAreVerified) {
    QTemporaryDir dir;
    std::string cert, key;
    ASSERT_TRUE(azurelocal::MakeSelfSignedCertificate(dir.path().toStdString(), cert, key));
    auto server = StartServer({"--tls-cert", QString::fromStdString(cert), "--tls-key", QString::fromStdString(key)});
    ASSERT_TRUE(server);
    const std::string connection = "Endpoint=sb://127.0.0.1:" + std::to_string(server->Port()) +
                                   "/;SharedAccessKeyName=" + AzureLocalProcess::kKeyName +
                                   ";SharedAccessKey=" + AzureLocalProcess::kKey;

    ClientOptions untrustingOptions = PatientOptions();
    const auto clock = std::make_shared<ManualClock>();
    untrustingOptions.clock = clock;
    RecordingLogger logger;
    AzureClient untrusting(&logger, {}, untrustingOptions);
    EXPECT_FALSE(SendRows(untrusting, connection, "q", false, 1, MakeRows(2)));
    EXPECT_TRUE(clock->Pauses().empty()) << "a TLS failure is not retried";
    ASSERT_EQ(logger.Errors().size(), 1u);
    EXPECT_NE(logger.Errors()[0].find("TLS failure"), std::string::npos) << logger.Errors()[0];

    ClientOptions options = PatientOptions();
    options.caFile = cert;
    RecordingLogger logger2;
    AzureClient trusting(&logger2, {}, options);
    EXPECT_TRUE(SendRows(trusting, connection, "q", false, 1, MakeRows(2))) << logger2.All();
    EXPECT_EQ(server->Rows().size(), 2u);
}

TEST(SendToOtherServers, ProxySettingsReachTheProxy) {
    auto proxy = StartServer({"--proxy-auth", "CORP\\user:proxy-pass"});
    ASSERT_TRUE(proxy);
    // The target itself is unreachable: only the proxy can deliver.
    const std::string connection = "Endpoint=sb://127.0.0.1:" + std::to_string(FreePortWithNothingListening()) +
                                   "/;SharedAccessKeyName=" + AzureLocalProcess::kKeyName +
                                   ";SharedAccessKey=" + AzureLocalProcess::kKey + ";UseDevelopmentEmulator=true";
    RecordingLogger logger;
    ProxySettings settings;
    settings.address = "127.0.0.1:" + std::to_string(proxy->Port());
    settings.user = "CORP\\user";
    settings.password = "proxy-pass";
    AzureClient client(&logger, settings, FastOptions());
    ASSERT_TRUE(SendRows(client, connection, "q", false, 1, MakeRows(3))) << logger.All();
    EXPECT_EQ(proxy->Rows().size(), 3u);
    EXPECT_GE(proxy->Stats().proxied, 1u);

    ProxySettings wrong;
    wrong.address = settings.address;
    wrong.user = "CORP\\user";
    wrong.password = "bad-pass";
    RecordingLogger logger2;
    AzureClient refused(&logger2, wrong, FastOptions());
    EXPECT_FALSE(SendRows(refused, connection, "q", false, 1, MakeRows(3)));
    ASSERT_EQ(logger2.Errors().size(), 1u);
    EXPECT_NE(logger2.Errors()[0].find("407"), std::string::npos) << logger2.Errors()[0];
    EXPECT_EQ(logger2.All().find("bad-pass"), std::string::npos);
}
