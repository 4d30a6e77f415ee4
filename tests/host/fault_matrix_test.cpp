// The fault matrix: the gateway with the real module between a runtime in
// another process and azure-local, under every fault the receiver, the network
// and the runtime can show. Each case checks the loss accounting: every change
// the runtime delivered arrived, or the module's log counts it as a failed row,
// as dropped by a full queue or as thrown away unsent; nothing arrives twice but a
// retried message (same message id) or a value the design sends again.
#include "FaultBench.h"

#include "cloud/PasswordKey.h"
#include "vxhelper/aescrypt.h"

#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <sys/resource.h>

#include <cctype>
#include <ctime>
#include <random>

namespace {

using Clock = std::chrono::steady_clock;

enum class Target { Receiver, MissingEntity, ClosedPort, UnverifiedTls, InvalidEntityName };

struct MatrixCase {
    const char* name;
    const char* fault;  // the receiver's fault, set after the first changes arrived; empty: none
    bool loses;         // whether the case loses changes (they must then be recorded)
    Target target = Target::Receiver;
    int ticks = 10;
    int pauseMs = 20;
};

void PrintTo(const MatrixCase& c, std::ostream* out) { *out << c.name; }

class FaultMatrix : public ::testing::TestWithParam<MatrixCase> {};

TEST_P(FaultMatrix, EveryChangeArrivesOrIsRecordedAsLost) {
    const MatrixCase& c = GetParam();
    FaultBench bench;
    QStringList arguments;
    if (c.target == Target::MissingEntity)
        arguments << "--entity"
                  << "elsewhere";
    if (c.target == Target::UnverifiedTls) {
        std::string certificate, key;
        ASSERT_TRUE(azurelocal::MakeSelfSignedCertificate(bench.Folder().Path(), certificate, key));
        arguments << "--tls-cert" << QString::fromStdString(certificate) << "--tls-key" << QString::fromStdString(key);
    }
    ASSERT_TRUE(bench.StartReceiver(arguments));
    FaultBench::Settings settings;
    if (c.target == Target::ClosedPort) settings.connection = bench.Connection(FaultBench::ClosedPort());
    if (c.target == Target::UnverifiedTls)
        settings.connection = bench.Connection(bench.Receiver().Port(), azurelocal::AzureLocalProcess::kKey, false);
    if (c.target == Target::InvalidEntityName) settings.entity = "no such entity";
    ASSERT_TRUE(bench.StartRuntime());
    ASSERT_TRUE(bench.StartGateway(settings));
    if (c.target == Target::Receiver) {
        ASSERT_TRUE(bench.Warm()) << bench.Account().Text();
    }
    if (*c.fault) {
        ASSERT_TRUE(bench.Fault(c.fault));
    }

    bench.Tick(c.ticks, c.pauseMs);
    bench.ExpectExactAccount();
    const Ledger ledger = bench.Account();
    EXPECT_EQ(ledger.Missing() > 0, c.loses) << ledger.Text();
    if (c.target == Target::UnverifiedTls) {
        EXPECT_NE(bench.LogTail(1000).find("TLS failure"), std::string::npos) << "refused for its certificate";
    }
    EXPECT_GE(bench.StopGateway(), 0) << "the gateway stops cleanly after the fault";
}

INSTANTIATE_TEST_SUITE_P(
    Statuses, FaultMatrix,
    ::testing::Values(
        MatrixCase{"Unauthorized401Once", "kind=status&status=401&count=1", false},
        MatrixCase{"Unauthorized401Always", "kind=status&status=401&count=100000", true},
        MatrixCase{"Forbidden403Quota", "kind=status&status=403&count=100000&detail=Quota%20exceeded", true},
        MatrixCase{"Forbidden403OversizeOnce", "kind=status&status=403&count=1&detail=The%20message%20is%20too%20large",
                   false},
        MatrixCase{"EntityNotFound404", "", true, Target::MissingEntity},
        MatrixCase{"TooLarge413Once", "kind=status&status=413&count=1", false},
        // Three ticks wait in the queue while the worker waits to retry: no more than it holds.
        MatrixCase{"Throttled429RetryAfter", "kind=status&status=429&count=2&retry-after=1", false, Target::Receiver,
                   3},
        MatrixCase{"Unavailable503RetryAfter", "kind=status&status=503&count=2&retry-after=1", false, Target::Receiver,
                   3},
        // Ten ticks during a 3 s retry overflow the queue: dropped, and recorded so.
        MatrixCase{"Throttled429RetryAfterQueueOverflows", "kind=status&status=429&count=3&retry-after=1", true},
        MatrixCase{"Unavailable503Always", "kind=status&status=503&count=100000&retry-after=1", true}),
    [](const auto& info) { return std::string(info.param.name); });

// A stalled answer costs the request time-out (20 s): the changes made
// meanwhile overflow the queue and are reported dropped.
INSTANTIATE_TEST_SUITE_P(
    Transport, FaultMatrix,
    ::testing::Values(MatrixCase{"ConnectionResetMidRequest", "kind=close&count=2", false, Target::Receiver, 3},
                      MatrixCase{"RefusedConnection", "", true, Target::ClosedPort},
                      MatrixCase{"CertificateThatDoesNotVerify", "", true, Target::UnverifiedTls},
                      MatrixCase{"EntityNameTheClientRefuses", "", true, Target::InvalidEntityName},
                      MatrixCase{"StalledReceiver", "kind=stall&count=1", true, Target::Receiver, 10, 300}),
    [](const auto& info) { return std::string(info.param.name); });

// The receiver is away for 60 s while changes go on; once it is back, the
// integrity cycle brings every current value.
TEST(FaultMatrixLong, ReceiverBackAfterSixtySecondsGetsEveryCurrentValue) {
    FaultBench bench;
    FaultBench::Settings settings;
    settings.integritySeconds = 5;
    ASSERT_TRUE(bench.StartSending(settings));
    const int port = bench.Receiver().Port();

    bench.StopReceiver();
    const auto back = Clock::now() + std::chrono::seconds(60);
    while (Clock::now() < back) bench.Tick(1, 3000);
    ASSERT_TRUE(bench.StartReceiver({"--port", QString::number(port)}));

    EXPECT_TRUE(FaultBench::WaitUntil([&] { return bench.LastValuesArrived(); }, 60000)) << bench.Account().Text();
    const Ledger ledger = bench.Account();
    // Integrity rows count among the failed ones and arrive again: at most as many missing as recorded.
    EXPECT_GT(ledger.Missing(), 0u) << ledger.Text();
    EXPECT_LE(ledger.Missing(), ledger.Recorded()) << ledger.Text();
    EXPECT_EQ(ledger.unexpected, 0u) << ledger.Text();
    EXPECT_GE(bench.StopGateway(), 0);
}

// A switch throws the queued changes of every project away (recorded) and
// subscribes again; changes the runtime makes before the new subscription
// started reach no one, so this case cannot settle an exact account. It checks
// that records never exceed what is missing, that nothing arrives twice, and
// that once the switching ends every current value arrives.
TEST(FaultMatrixLong, ProjectsSwitchedInactiveAndActiveAHundredTimesUnderLoad) {
    FaultBench bench;
    ASSERT_TRUE(bench.StartSending());
    for (int i = 0; i < 100; ++i) {
        bench.SetActive("Line", false);
        ASSERT_TRUE(bench.WaitForSubscriptions()) << "round " << i;
        bench.Tick();
        bench.SetActive("Line", true);
        ASSERT_TRUE(bench.WaitForSubscriptions()) << "round " << i;
        bench.Tick();
    }
    bool arrived = false;
    for (int attempt = 0; attempt < 20 && !arrived; ++attempt) {
        bench.Tick();
        arrived = FaultBench::WaitUntil([&] { return bench.LastValuesArrived(); }, 3000);
    }
    EXPECT_TRUE(arrived) << bench.Account().Text();
    const Ledger ledger = bench.Account();
    EXPECT_GT(ledger.discarded, 0u) << ledger.Text();
    EXPECT_LE(ledger.Recorded(), ledger.Missing()) << ledger.Text();
    EXPECT_EQ(ledger.duplicates, 0u) << ledger.Text();
    EXPECT_EQ(ledger.unexpected, 0u) << ledger.Text();
    EXPECT_GE(bench.StopGateway(), 0);
}

// A runtime stopped while changes wait in the module's queue: the module
// stops with it, and what it could not send is recorded; the next runtime's
// changes arrive again.
TEST(FaultMatrixLong, RuntimeStoppedAndStartedAgainUnderTheModule) {
    FaultBench bench;
    ASSERT_TRUE(bench.StartSending());
    bench.HoldWorkerInRetry(2);
    bench.Tick(3);
    EXPECT_TRUE(bench.StopRuntime());
    EXPECT_NE(bench.Gateway().WaitForText("the SCADA runtime went away"), "") << bench.Gateway().Errors();

    ASSERT_TRUE(bench.StartRuntime(1000000));
    ASSERT_TRUE(bench.WaitForModuleRun(60000)) << bench.Gateway().Errors();
    ASSERT_TRUE(bench.Warm()) << bench.Account().Text();
    bench.Tick(3, 20);
    bench.ExpectExactAccount();
    EXPECT_TRUE(bench.LastValuesArrived()) << bench.Account().Text();
    EXPECT_GE(bench.StopGateway(), 0);
}

TEST(FaultMatrixLong, SighupEverySecondForAMinuteUnderLoad) {
    FaultBench bench;
    ASSERT_TRUE(bench.StartSending());
    const auto start = Clock::now();
    constexpr int kReloads = 60;
    for (int i = 1; i <= kReloads; ++i) {
        bench.Gateway().Signal(SIGHUP);
        ASSERT_NE(bench.Gateway().WaitForText("reload: the module runs with the new settings", 30000), "")
            << "reload " << i << ": " << bench.Gateway().Errors();
        // Changes until the next second, while the worker sends what the last one queued.
        while (Clock::now() < start + std::chrono::seconds(i)) bench.Tick(1, 50);
    }
    bench.Tick(2);
    EXPECT_TRUE(FaultBench::WaitUntil([&] { return bench.LastValuesArrived(); }, 60000)) << bench.Account().Text();
    const Ledger ledger = bench.Account();
    EXPECT_LE(ledger.Missing(), ledger.Recorded()) << ledger.Text();
    EXPECT_EQ(ledger.unexpected, 0u) << ledger.Text();
    // A restarted worker's first cycle sends every current value once more.
    EXPECT_LE(ledger.duplicates, static_cast<size_t>(kReloads * 2 * FaultBench::kPerProject)) << ledger.Text();
    EXPECT_GE(bench.StopGateway(), 0);
}

// SIGTERM while the worker holds a batch and more changes wait in the queue.
TEST(FaultMatrixLong, SigtermUnderFullLoadEndsWithinTwoSecondsAndRecordsWhatWasNotSent) {
    FaultBench bench;
    ASSERT_TRUE(bench.StartSending());
    bench.HoldWorkerInRetry(1);
    bench.Tick(3);
    const long long stopMs = bench.StopGateway();
    EXPECT_GE(stopMs, 0);
    EXPECT_LT(stopMs, 2000) << "SIGTERM ends the gateway within 2 s";
    const auto log = bench.LogLines();
    ASSERT_FALSE(log.empty());
    EXPECT_NE(log.back().find("Log stopped"), std::string::npos) << "the log is written out: " << log.back();
    bench.ExpectExactAccount(5000);
    EXPECT_GT(bench.Account().discarded, 0u) << bench.Account().Text();
}

// ---- secrets ---------------------------------------------------------------

std::string RandomText(size_t length) {
    static const char kLetters[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789";
    std::random_device random;
    std::string text;
    for (size_t i = 0; i < length; ++i) text += kLetters[random() % (sizeof kLetters - 1)];
    return text;
}

std::string Base64(const unsigned char* data, size_t size) {
    std::string text(4 * ((size + 2) / 3), '\0');
    text.resize(static_cast<size_t>(
        EVP_EncodeBlock(reinterpret_cast<unsigned char*>(text.data()), data, static_cast<int>(size))));
    return text;
}

std::string PercentEncoded(const std::string& text) {
    std::string out;
    for (const unsigned char c : text) {
        if (std::isalnum(c) || c == '-' || c == '_' || c == '.' || c == '~') {
            out += static_cast<char>(c);
        } else {
            char escaped[4];
            std::snprintf(escaped, sizeof escaped, "%%%02X", c);
            out += escaped;
        }
    }
    return out;
}

// Every spelling of every token signature the gateway can have made for the
// resource while tokens were made with expiries in [firstExpiry, lastExpiry].
std::vector<std::string> Signatures(const std::string& resource, const std::string& key, std::int64_t firstExpiry,
                                    std::int64_t lastExpiry) {
    std::vector<std::string> spellings;
    for (std::int64_t expiry = firstExpiry; expiry <= lastExpiry; ++expiry) {
        const std::string signed_ = PercentEncoded(resource) + "\n" + std::to_string(expiry);
        unsigned char mac[EVP_MAX_MD_SIZE];
        unsigned int size = 0;
        HMAC(EVP_sha256(), key.data(), static_cast<int>(key.size()),
             reinterpret_cast<const unsigned char*>(signed_.data()), signed_.size(), mac, &size);
        const std::string plain = Base64(mac, size);
        std::string url = plain;
        for (char& c : url) c = c == '+' ? '-' : c == '/' ? '_' : c;
        while (!url.empty() && url.back() == '=') url.pop_back();
        spellings.insert(spellings.end(), {plain, PercentEncoded(plain), url});
    }
    return spellings;
}

std::string Enciphered(const std::string& password) {
    CString text(password);
    EXPECT_TRUE(CAesCrypt(kProxyPasswordKeyHigh, kProxyPasswordKeyLow).EncryptHexString(text));
    return text.ToUtf8();
}

std::string OutputOf(GatewayProcess& gateway) {
    std::string text;
    for (const std::string& line : gateway.Lines()) text += line + "\n";
    return text + gateway.Errors();
}

// A gateway whose every send is refused with its token, signature and key
// quoted back, then one that sends through a proxy with a password: nothing
// either wrote holds the key, a signature or the password in clear.
TEST(FaultMatrixSecrets, NoKeySignatureOrPasswordInAnythingTheGatewayWrites) {
    const rlimit noCoreDumps{0, 0};
    ASSERT_EQ(setrlimit(RLIMIT_CORE, &noCoreDumps), 0);  // inherited by the gateway
    const std::string key = RandomText(44), user = "plant-gateway", password = "Pw-" + RandomText(16);
    FaultBench bench;
    ASSERT_TRUE(bench.StartReceiver(
        {"--key", QString::fromStdString(key), "--proxy-auth", QString::fromStdString(user + ":" + password)}));
    const std::string port = std::to_string(bench.Receiver().Port());
    FaultBench::Settings settings;
    settings.connection = bench.Connection(bench.Receiver().Port(), key);
    settings.proxy = "http://127.0.0.1:" + port;
    settings.proxyUser = user;
    settings.proxyPassword = Enciphered(password);
    ASSERT_TRUE(bench.StartRuntime());
    const std::int64_t firstToken = std::time(nullptr);

    ASSERT_TRUE(bench.Fault("kind=echo-signature&status=401&count=2"));
    ASSERT_TRUE(bench.Fault("kind=echo-auth&status=401&count=100000"));
    ASSERT_TRUE(bench.StartGateway(settings));
    const std::string settingsFile = bench.Folder().Path("settings.ini");
    const std::string settingsText = TempFolder::Read(settingsFile);
    bench.Tick(3, 50);
    EXPECT_TRUE(bench.WaitFor([](const Ledger& l) { return l.failedRows >= l.produced; }, 60000))
        << bench.Account().Text();
    EXPECT_GE(bench.StopGateway(), 0);
    std::string written = OutputOf(bench.Gateway());
    EXPECT_GT(bench.Receiver().Stats().proxied, 0u) << "the refused sends went through the proxy";

    ASSERT_TRUE(bench.Receiver().Reset());
    ASSERT_TRUE(bench.StartGateway(settings));
    ASSERT_TRUE(bench.Warm()) << bench.Account().Text();
    EXPECT_GE(bench.StopGateway(), 0);
    EXPECT_GT(bench.Receiver().Stats().proxied, 0u);
    written += OutputOf(bench.Gateway());
    const std::int64_t lastToken = std::time(nullptr);

    const std::string log = TempFolder::Read(bench.LogFile());
    EXPECT_NE(log.find("was checked with the key"), std::string::npos)
        << "the refusals quoting the secrets were logged";
    written += log;
    EXPECT_EQ(TempFolder::Read(settingsFile), settingsText) << "the gateway does not write its settings file";
    EXPECT_EQ(settingsText.find(password), std::string::npos) << "the settings file holds the password enciphered";

    const std::string basic = user + ":" + password;
    std::vector<std::string> secrets = {key, password,
                                        Base64(reinterpret_cast<const unsigned char*>(basic.data()), basic.size())};
    constexpr std::int64_t kValidity = 3600;  // the client's token life
    const auto signatures = Signatures("http://127.0.0.1:" + port + "/" + FaultBench::kEntity, key,
                                       firstToken + kValidity - 2, lastToken + kValidity + 2);
    secrets.insert(secrets.end(), signatures.begin(), signatures.end());
    for (const std::string& secret : secrets)
        EXPECT_EQ(written.find(secret), std::string::npos) << "written in clear: " << secret;
}

}  // namespace
