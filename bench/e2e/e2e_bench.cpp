// The whole road measured in processes, each figure beside its reference in
// the same run: the runtime stand-in and libSkyvane.so in skyvane-gateway,
// libCorvell.so, azure-local on loopback. Prints one table.
//
//   build/release/bin/skyvane_e2e_bench [--smoke]
//
// --smoke runs every stage briefly with 1,000 variables (seconds, for CI); its
// figures say nothing about speed.
#include "E2eRuns.h"

#include "AzureLocalProcess.h"
#include "private/RowFormats.h"
#include "private/Sas.h"
#include "corvell/AzureInstance.h"

#include <QCoreApplication>

#include <curl/curl.h>
#include <dlfcn.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

namespace {

using azurelocal::AzureLocalProcess;
using e2e::BodyFormat;

struct Plan {
    bool smoke = false;
    int variables = 10000;
    int bigVariables = 100000;
    double warm = 1.0;    // after the first values, before a window
    double window = 5.0;  // a measured window
    double idle = 60.0;
    double clientSeconds = 3.0;  // each bare-sender and receiver-ceiling loop
    std::vector<double> rates{100000, 200000, 300000, 400000, 500000};
    int integrityEvery = 5;  // seconds, for the full-send stage
};

Plan SmokePlan() {
    Plan plan;
    plan.smoke = true;
    plan.variables = 1000;
    plan.bigVariables = 2000;
    plan.warm = 0.2;
    plan.window = 0.5;
    plan.idle = 1.0;
    plan.clientSeconds = 0.3;
    plan.rates = {20000};
    plan.integrityEvery = 2;
    return plan;
}

double LoadAverage() {
    double load[3] = {0, 0, 0};
    return getloadavg(load, 3) > 0 ? load[0] : -1;
}

std::string Format(const char* format, double value) {
    char text[64];
    std::snprintf(text, sizeof text, format, value);
    return text;
}

// ---- The table -------------------------------------------------------------

struct Line {
    std::string figure, setup, measured, reference, ratio, target, verdict;
    double load = 0;
};

class Table {
public:
    void Add(Line line) {
        line.load = LoadAverage();
        std::fprintf(stderr, "e2e: %s, %s: %s\n", line.figure.c_str(), line.setup.c_str(), line.measured.c_str());
        m_lines.push_back(std::move(line));
    }
    void Print() const {
        std::printf("| figure | setup | measured | reference | ratio | target | met | load 1 min |\n");
        std::printf("|---|---|---|---|---|---|---|---|\n");
        for (const Line& l : m_lines) {
            std::printf("| %s | %s | %s | %s | %s | %s | %s | %.2f |\n", l.figure.c_str(), l.setup.c_str(),
                        l.measured.c_str(), l.reference.c_str(), l.ratio.c_str(), l.target.c_str(), l.verdict.c_str(),
                        l.load);
        }
    }

private:
    std::vector<Line> m_lines;
};

std::string Verdict(bool met) { return met ? "yes" : "NO"; }

// ---- References: the receiver's own ceiling and a bare sender ----------------

size_t Collect(char*, size_t size, size_t count, void*) { return size * count; }

// Rows per second that azure-local takes when one connection posts the same
// ready-made JSON message (2,000 rows, as the client cuts them) in a tight loop.
double ReceiverCeiling(AzureLocalProcess& receiver, double seconds) {
    corvell::RowBuffer rows(corvell::Format::Json);
    const std::u16string project = u"Bench";
    std::vector<std::u16string> names;
    constexpr int kRows = 2000;
    for (int i = 1; i <= kRows; ++i) {
        const std::string name = "Tag" + std::to_string(i);
        names.emplace_back(name.begin(), name.end());
    }
    for (int i = 0; i < kRows; ++i) {
        corvell::Row row;
        row.project = project;
        row.variable = names[static_cast<size_t>(i)];
        row.value = 1000.0 + i;
        row.time = std::time(nullptr);
        rows.Add(row);
    }
    const std::string body = rows.Compose(0, kRows);
    const std::string resource = "http://127.0.0.1:" + std::to_string(receiver.Port()) + "/ceiling";
    const corvell::SasToken token = corvell::MakeSasToken(resource, AzureLocalProcess::kKeyName,
                                                          AzureLocalProcess::kKey, std::time(nullptr) + 3600);
    curl_slist* headers = nullptr;
    for (const std::string& h : {"Authorization: " + token.token, std::string("Format: \"JSON\""),
                                 std::string("Content-Type: application/json"), "RowCount: " + std::to_string(kRows)})
        headers = curl_slist_append(headers, h.c_str());
    CURL* curl = curl_easy_init();
    const std::string url = resource + "/messages?timeout=60";
    curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
    curl_easy_setopt(curl, CURLOPT_NOPROXY, "*");
    curl_easy_setopt(curl, CURLOPT_HTTPHEADER, headers);
    curl_easy_setopt(curl, CURLOPT_POSTFIELDS, body.data());
    curl_easy_setopt(curl, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size()));
    curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, Collect);
    const double start = e2e::Now();
    long accepted = 0;
    while (e2e::Now() - start < seconds) {
        long status = 0;
        if (curl_easy_perform(curl) == CURLE_OK) curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &status);
        if (status != 201) throw std::runtime_error("the receiver refused a ready-made message");
        accepted += kRows;
    }
    const double rate = static_cast<double>(accepted) / (e2e::Now() - start);
    curl_easy_cleanup(curl);
    curl_slist_free_all(headers);
    return rate;
}

class QuietLogger final : public corvell::ILogger {
public:
    void LogError(const char16_t*) override { ++errors; }
    void LogInfo(const char16_t*) override {}
    bool IsInfoEnabled() override { return false; }
    int errors = 0;
};

// Rows per second of batches of 10,000 rows added and sent straight through
// libCorvell.so, as the module's worker would, with nothing else around.
double BareSender(AzureLocalProcess& receiver, BodyFormat format, int rowsPerBatch, double seconds) {
    const std::string library = azurelocal::BuildBinaryDir() + "/libCorvell.so";
    void* handle = dlopen(library.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (!handle) throw std::runtime_error("cannot load " + library);
    auto create = reinterpret_cast<PFN_CreateAzureInstance>(dlsym(handle, "CreateAzureInstance"));
    auto destroy = reinterpret_cast<PFN_DestroyAzureInstance>(dlsym(handle, "DestroyAzureInstance"));
    QuietLogger logger;
    corvell::IAzureInstance* instance = create ? create(&logger, nullptr, nullptr, nullptr) : nullptr;
    if (!instance || !destroy) throw std::runtime_error("libCorvell.so gave no instance");
    const std::string text = receiver.ConnectionString();
    const std::u16string connection(text.begin(), text.end());
    std::vector<std::u16string> names;
    for (int i = 1; i <= rowsPerBatch; ++i) {
        const std::string name = "Tag" + std::to_string(i);
        names.emplace_back(name.begin(), name.end());
    }
    const double start = e2e::Now();
    long sent = 0;
    double value = 0;
    while (e2e::Now() - start < seconds) {
        instance->BeginOnlineRows(connection.c_str(), u"bare", false, static_cast<std::int32_t>(format));
        const auto now = static_cast<std::uint32_t>(std::time(nullptr));
        ++value;
        for (const std::u16string& name : names)
            instance->AddOnlineRow(u"Bench", name.c_str(), 0, value, u"", false, now, 500, 0, 0);
        if (instance->SendOnlineRows()) sent += rowsPerBatch;
    }
    const double rate = static_cast<double>(sent) / (e2e::Now() - start);
    destroy(instance);
    dlclose(handle);
    if (logger.errors > 0) throw std::runtime_error("the bare sender's rows were refused");
    return rate;
}

// ---- The module in the gateway ---------------------------------------------

struct RateRun {
    double offered = 0;   // changes per second the stand-in fired in the window
    double received = 0;  // changes per second that arrived (rows / connections)
    std::uint64_t fired = 0, dropped = 0;
    long long lost = 0;  // neither received nor reported dropped
    bool clean = false;
};

void Require(bool condition, const std::string& what) {
    if (!condition) throw std::runtime_error(what);
}

// Waits (bounded) until the stand-in has stopped firing and every change it
// fired has arrived or was reported dropped. The metrics count only when they
// are fresh: a window thread busy draining writes none.
void WaitForTheRest(e2e::GatewayRun& gateway, const e2e::RunFolder& folder, AzureLocalProcess& receiver,
                    int connections) {
    for (int attempt = 0; attempt < 60; ++attempt) {
        const e2e::Metrics before = gateway.ReadMetrics();
        e2e::Pause(0.6);  // one metrics interval and a little
        const e2e::Metrics after = gateway.ReadMetrics();
        if (after.writtenAt <= before.writtenAt || after.changesFired != before.changesFired) continue;
        const std::uint64_t dropped = e2e::CountDropReports(folder.Path("gateway.log")).changes;
        const auto expected = static_cast<std::uint64_t>(connections) * (after.changesFired - dropped);
        if (receiver.WaitForRows(expected, 3000).rows >= expected) return;
    }
}

RateRun RunRate(AzureLocalProcess& receiver, const e2e::GatewayShape& shape, double rate, const Plan& plan) {
    e2e::RunFolder folder;
    e2e::ProjectShape project{plan.variables, rate, 10, 0};
    project.stopMs = static_cast<long>(1000 * (3 + plan.warm + plan.window));
    folder.WriteProject(project);
    folder.WriteSettings(shape, receiver);
    folder.WriteLogConfig();
    Require(receiver.Reset(), "the receiver does not answer");
    e2e::GatewayRun gateway(folder);
    const auto connections = static_cast<std::uint64_t>(shape.connections);
    Require(receiver.WaitForRows(connections * static_cast<std::uint64_t>(plan.variables), 60000).rows >=
                connections * static_cast<std::uint64_t>(plan.variables),
            "the first values did not arrive");
    e2e::Pause(plan.warm);
    const e2e::Metrics m0 = gateway.ReadMetrics();
    const auto s0 = receiver.Stats();
    const double t0 = e2e::Now();
    e2e::Pause(plan.window);
    const e2e::Metrics m1 = gateway.ReadMetrics();
    const auto s1 = receiver.Stats();
    const double t1 = e2e::Now();
    const double simulationEnd = gateway.StartedAt() + static_cast<double>(project.stopMs) / 1000 + 0.5;
    if (e2e::Now() < simulationEnd) e2e::Pause(simulationEnd - e2e::Now());
    WaitForTheRest(gateway, folder, receiver, shape.connections);
    Require(gateway.Stop() == 0, "the gateway did not stop cleanly");

    RateRun run;
    // No metrics written in the window: the window thread was busy all along.
    run.offered = m1.writtenAt > m0.writtenAt
                      ? static_cast<double>(m1.changesFired - m0.changesFired) / (m1.writtenAt - m0.writtenAt)
                      : std::nan("");
    run.received = static_cast<double>(s1.rows - s0.rows) / (t1 - t0) / static_cast<double>(connections);
    const e2e::Metrics end = e2e::ReadMetrics(folder.Path("gateway.prom"));
    const e2e::DropReport drops = e2e::CountDropReports(folder.Path("gateway.log"));
    Require(!drops.logDropped, "the log dropped records: the drop count is incomplete");
    run.fired = end.changesFired;
    run.dropped = drops.changes;
    const auto arrived = receiver.Stats().rows;
    run.lost = static_cast<long long>(run.fired - run.dropped) - static_cast<long long>(arrived / connections);
    run.clean = run.dropped == 0 && run.lost == 0 && !std::isnan(run.offered) && run.received >= 0.9 * run.offered;
    std::fprintf(stderr,
                 "e2e:   %s x%d at %.0f/s: offered %.0f/s, received %.0f/s, fired %llu, dropped %llu, lost %lld\n",
                 e2e::FormatName(shape.format), shape.connections, rate, run.offered, run.received,
                 static_cast<unsigned long long>(run.fired), static_cast<unsigned long long>(run.dropped), run.lost);
    return run;
}

// Raises the rate until changes are dropped or lost; the highest clean run.
RateRun Sweep(AzureLocalProcess& receiver, const e2e::GatewayShape& shape, const Plan& plan, std::string& account) {
    RateRun best;
    for (double rate : plan.rates) {
        const RateRun run = RunRate(receiver, shape, rate, plan);
        if (!run.clean) {
            account = "at " + Format("%.0f", rate) + "/s: " + std::to_string(run.dropped) + " reported dropped, " +
                      std::to_string(run.lost) + " lost of " + std::to_string(run.fired);
            break;
        }
        best = run;
        account = "every change received up to " + Format("%.0f", rate) + "/s";
    }
    return best;
}

struct Footprint {
    std::uint64_t rss = 0;
    double firstRow = -1, allRows = -1;  // seconds from the call of init
};

// RSS once the module runs (and its first values have arrived), and the time
// from init to the first rows. The stand-in has built its project before
// the gateway says it runs, so both runs of a pair hold all of it.
Footprint RunFootprint(AzureLocalProcess& receiver, int projectVariables, int configured) {
    e2e::RunFolder folder;
    folder.WriteProject({projectVariables, 0, 100, 0});
    folder.WriteSettings({configured, 1, BodyFormat::Json, 3600}, receiver);
    folder.WriteLogConfig();
    Require(receiver.Reset(), "the receiver does not answer");
    e2e::GatewayRun gateway(folder);
    Require(gateway.WaitForLine("the runtime stand-in runs", 120000), "the stand-in did not start");
    const double init = e2e::Now();  // the gateway calls init right after that line
    Footprint footprint;
    if (configured > 0) {
        Require(receiver.WaitForRows(1, 120000).rows >= 1, "no row arrived");
        footprint.firstRow = e2e::Now() - init;
        const auto all = static_cast<std::uint64_t>(configured);
        Require(receiver.WaitForRows(all, 120000).rows >= all, "the first values did not all arrive");
        footprint.allRows = e2e::Now() - init;
    }
    Require(gateway.WaitForLine("the module runs", 120000), "the module did not start");
    e2e::Pause(1.0);
    footprint.rss = e2e::ProcessRssBytes(gateway.Pid());
    Require(gateway.Stop() == 0, "the gateway did not stop cleanly");
    return footprint;
}

// CPU of the gateway process while the configured variables keep still, with
// the stand-in's default tick and the gateway's default status interval.
double RunIdle(AzureLocalProcess& receiver, int variables, int configured, int integritySeconds, double seconds) {
    e2e::RunFolder folder;
    folder.WriteProject({variables, 0, 100, 0});
    folder.WriteSettings({configured, 1, BodyFormat::Json, integritySeconds}, receiver);
    folder.WriteLogConfig();
    Require(receiver.Reset(), "the receiver does not answer");
    e2e::GatewayRun gateway(folder, "10");
    const auto all = static_cast<std::uint64_t>(configured);
    Require(receiver.WaitForRows(all, 60000).rows >= all, "the first values did not arrive");
    e2e::Pause(2.0);
    const double cpu0 = e2e::ProcessCpuSeconds(gateway.Pid()), t0 = e2e::Now();
    e2e::Pause(seconds);
    const double share = (e2e::ProcessCpuSeconds(gateway.Pid()) - cpu0) / (e2e::Now() - t0) * 100;
    Require(gateway.Stop() == 0, "the gateway did not stop cleanly");
    return share;
}

struct FullSend {
    double workerCpu = 0, processCpu = 0, seconds = 0;
    std::uint64_t bytes = 0;
};

// One full send of every variable's current value: the CPU of the thread
// that did most in the interval holding it (the worker: encoding and HTTP),
// the whole process's, and the body bytes sent.
FullSend RunFullSend(AzureLocalProcess& receiver, int variables, int integritySeconds) {
    e2e::RunFolder folder;
    folder.WriteProject({variables, 0, 100, 0});
    folder.WriteSettings({variables, 1, BodyFormat::Json, integritySeconds}, receiver);
    folder.WriteLogConfig();
    Require(receiver.Reset(), "the receiver does not answer");
    e2e::GatewayRun gateway(folder);
    const auto all = static_cast<std::uint64_t>(variables);
    Require(receiver.WaitForRows(all, 120000).rows >= all, "the first values did not arrive");
    const auto threads0 = e2e::ThreadCpuSeconds(gateway.Pid());
    const double cpu0 = e2e::ProcessCpuSeconds(gateway.Pid()), t0 = e2e::Now();
    const auto s0 = receiver.Stats();
    const auto s1 = receiver.WaitForRows(s0.rows + all, 60000);
    Require(s1.rows >= s0.rows + all, "no full send came");
    FullSend send{0, e2e::ProcessCpuSeconds(gateway.Pid()) - cpu0, e2e::Now() - t0, s1.bytes - s0.bytes};
    for (const auto& [tid, cpu] : e2e::ThreadCpuSeconds(gateway.Pid())) {
        const auto before = threads0.find(tid);
        send.workerCpu = std::max(send.workerCpu, cpu - (before == threads0.end() ? 0.0 : before->second));
    }
    Require(gateway.Stop() == 0, "the gateway did not stop cleanly");
    return send;
}

struct Latency {
    std::int64_t p50 = -1, p99 = -1;
    std::uint64_t rows = 0;
};

Latency RunLatency(AzureLocalProcess& decoding, double rate, const Plan& plan) {
    e2e::RunFolder folder;
    folder.WriteProject({plan.variables, rate, 10, 0});
    folder.WriteSettings({plan.variables, 1, BodyFormat::Json, 3600}, decoding);
    folder.WriteLogConfig();
    e2e::GatewayRun gateway(folder);
    Require(decoding.WaitForRows(static_cast<std::uint64_t>(plan.variables), 60000).rows >=
                static_cast<std::uint64_t>(plan.variables),
            "the first values did not arrive");
    e2e::Pause(plan.warm);
    Require(decoding.Reset(), "the receiver does not answer");  // only rows of the steady state count
    e2e::Pause(plan.window);
    const auto stats = decoding.Stats();
    Require(gateway.Stop() == 0, "the gateway did not stop cleanly");
    return {stats.latencyP50Ms, stats.latencyP99Ms, stats.latencyRows};
}

// ---- The stages --------------------------------------------------------------

struct Receivers {
    std::unique_ptr<AzureLocalProcess> counting, decoding;
};

std::string Rate(double perSecond) { return Format("%.0f/s", perSecond); }

void MeasureThroughput(Receivers& receivers, const Plan& plan, Table& table, double& sustainedJson) {
    AzureLocalProcess& receiver = *receivers.counting;
    const double ceiling = ReceiverCeiling(receiver, plan.clientSeconds);
    table.Add({"receiver ceiling, counting", "azure-local --count-only, one connection, 2,000-row JSON messages",
               Rate(ceiling) + " rows", "", "", "above every sustained rate", ""});
    const double decodingCeiling = ReceiverCeiling(*receivers.decoding, plan.clientSeconds);
    table.Add({"receiver ceiling, decoding", "azure-local decoding every row (used for the latency only)",
               Rate(decodingCeiling) + " rows", "", "", "", ""});

    struct Setup {
        BodyFormat format;
        int connections;
    };
    const std::vector<Setup> setups = plan.smoke ? std::vector<Setup>{{BodyFormat::Json, 1}}
                                                 : std::vector<Setup>{{BodyFormat::Json, 1},
                                                                      {BodyFormat::Json, 2},
                                                                      {BodyFormat::Xml, 1},
                                                                      {BodyFormat::Bond, 1}};
    for (const Setup& setup : setups) {
        const double bare = BareSender(receiver, setup.format, plan.variables, plan.clientSeconds);
        const std::string name = std::string(e2e::FormatName(setup.format)) + " x" + std::to_string(setup.connections);
        table.Add({"bare sender",
                   std::string(e2e::FormatName(setup.format)) + ", " + std::to_string(plan.variables) +
                       "-row batches through libCorvell.so",
                   Rate(bare) + " rows", "", "", "", ""});
        std::string account;
        const RateRun best = Sweep(receiver, {plan.variables, setup.connections, setup.format, 3600}, plan, account);
        // Each change is a row to every connection: rows per second against the bare sender's.
        const double ratio = best.received * setup.connections / bare;
        const bool json1 = setup.format == BodyFormat::Json && setup.connections == 1;
        if (json1) sustainedJson = best.received;
        table.Add({"sustained changes/s", name + ", " + std::to_string(plan.variables) + " variables; " + account,
                   Rate(best.received), "bare sender " + Rate(bare) + " rows", Format("%.2f", ratio),
                   json1 ? ">= 200000/s, ratio >= 0.5" : "",
                   json1 ? Verdict(best.received >= 200000 && ratio >= 0.5) : ""});
        if (ceiling < 1.5 * best.received * setup.connections)
            std::fprintf(stderr, "e2e: warning: the receiver's ceiling is close to the rate measured\n");
    }
}

void MeasureLatency(Receivers& receivers, const Plan& plan, double sustainedJson, Table& table) {
    const double rate = std::max(1000.0, 0.1 * sustainedJson);
    const Latency latency = RunLatency(*receivers.decoding, rate, plan);
    table.Add({"change to receiver latency",
               "JSON x1 at " + Rate(rate) + " (10 % of sustained), " + std::to_string(latency.rows) + " rows",
               "p50 " + std::to_string(latency.p50) + " ms, p99 " + std::to_string(latency.p99) + " ms",
               "floor 50 ms tick + 10 ms sleep", "", "p50 <= 60 ms, p99 <= 150 ms",
               Verdict(latency.p50 >= 0 && latency.p50 <= 60 && latency.p99 <= 150)});
}

void MeasureIdle(Receivers& receivers, const Plan& plan, Table& table) {
    AzureLocalProcess& receiver = *receivers.counting;
    const double standIn = RunIdle(receiver, plan.variables, 0, 3600, plan.idle);
    const double still = RunIdle(receiver, plan.variables, plan.variables, 3600, plan.idle);
    table.Add({"idle cost",
               std::to_string(plan.variables) + " variables configured, no changes, " + Format("%.0f s", plan.idle) +
                   ", no full send in the window",
               Format("%.2f %% of one core", still), Format("stand-in alone %.2f %%", standIn), "", "<= 1 %",
               Verdict(still <= 1.0)});
    const double integrity = RunIdle(receiver, plan.variables, plan.variables, 5, plan.smoke ? plan.idle : 20);
    table.Add({"idle cost with full sends",
               std::to_string(plan.variables) + " variables, no changes, full send every 5 s",
               Format("%.2f %% of one core", integrity), "", "", "", ""});
}

void MeasureFootprints(Receivers& receivers, const Plan& plan, Table& table) {
    for (int variables : {plan.variables, plan.bigVariables}) {
        const Footprint empty = RunFootprint(*receivers.counting, variables, 0);
        const Footprint full = RunFootprint(*receivers.counting, variables, variables);
        const double perVariable = (static_cast<double>(full.rss) - static_cast<double>(empty.rss)) /
                                   static_cast<double>(variables);
        table.Add({"memory per variable", std::to_string(variables) + " configured; the same stand-in project without",
                   Format("%.0f bytes", perVariable),
                   Format("RSS %.1f MB", static_cast<double>(full.rss) / 1e6) +
                       Format(" vs %.1f MB", static_cast<double>(empty.rss) / 1e6),
                   "", "<= 1024 bytes", Verdict(perVariable <= 1024)});
        table.Add({"start", std::to_string(variables) + " variables, from init",
                   Format("first row %.2f s", full.firstRow) + Format(", all first values %.2f s", full.allRows), "",
                   "", "report", ""});
    }
}

void MeasureFullSend(Receivers& receivers, const Plan& plan, Table& table) {
    const FullSend send = RunFullSend(*receivers.counting, plan.bigVariables, plan.integrityEvery);
    table.Add({"full send", std::to_string(plan.bigVariables) + " valid variables, JSON x1, worker thread",
               Format("%.2f s CPU", send.workerCpu) + Format(", %.1f MB", static_cast<double>(send.bytes) / 1e6),
               Format("whole process %.2f s CPU", send.processCpu) + Format(" over %.1f s", send.seconds), "",
               "<= 1 s CPU", Verdict(send.workerCpu <= 1.0)});
}

}  // namespace

int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    const bool smoke = argc > 1 && std::string(argv[1]) == "--smoke";
    if (argc > 2 || (argc == 2 && !smoke)) {
        std::fprintf(stderr, "usage: skyvane_e2e_bench [--smoke]\n");
        return 2;
    }
    const Plan plan = smoke ? SmokePlan() : Plan{};
    curl_global_init(CURL_GLOBAL_DEFAULT);
    std::string error;
    Receivers receivers{e2e::StartReceiver(false, error), nullptr};
    if (receivers.counting) receivers.decoding = e2e::StartReceiver(true, error);
    if (!receivers.counting || !receivers.decoding) {
        std::fprintf(stderr, "e2e: azure-local: %s\n", error.c_str());
        return 1;
    }
    Table table;
    try {
        double sustainedJson = 0;
        MeasureThroughput(receivers, plan, table, sustainedJson);
        MeasureLatency(receivers, plan, sustainedJson, table);
        MeasureIdle(receivers, plan, table);
        MeasureFootprints(receivers, plan, table);
        MeasureFullSend(receivers, plan, table);
    } catch (const std::exception& e) {
        table.Print();
        std::fprintf(stderr, "e2e: %s\n", e.what());
        return 1;
    }
    table.Print();
    return 0;
}
