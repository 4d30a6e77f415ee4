// Rows per second and bytes per row of each body format: encoding alone (ours
// and, for comparison, Qt's JSON and XML writers), and end to end through
// libcurl to azure-local on loopback.

#include <benchmark/benchmark.h>

#include <QCoreApplication>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QXmlStreamWriter>

#include <memory>
#include <string>

#include "private/AzureClient.h"
#include "AzureLocalProcess.h"
#include "private/RowFormats.h"

using namespace corvell;

namespace {

constexpr int kRowsPerBatch = 1000;

// A typical row: short project and variable names, a changing number.
Row TypicalRow(int i) {
    Row row;
    row.project = u"Line1";
    row.variable = u"Motor.Speed";
    row.value = 1450.0 + (i % 200) * 0.25;
    row.time = 1700000000 + i / 10;
    row.milliseconds = static_cast<std::uint16_t>((i * 100) % 1000);
    row.status = 0;
    return row;
}

void Encode(benchmark::State& state, Format format) {
    RowBuffer buffer(format);
    std::size_t rows = 0, bytes = 0;
    for (auto _ : state) {
        buffer.Clear();
        for (int i = 0; i < kRowsPerBatch; ++i) buffer.Add(TypicalRow(i));
        const std::string body = buffer.Compose(0, buffer.Count());
        benchmark::DoNotOptimize(body.data());
        rows += kRowsPerBatch;
        bytes += body.size();
    }
    state.SetItemsProcessed(static_cast<int64_t>(rows));
    state.counters["bytes_per_row"] = static_cast<double>(bytes) / static_cast<double>(rows);
}

void BM_EncodeJson(benchmark::State& state) { Encode(state, Format::Json); }
void BM_EncodeXml(benchmark::State& state) { Encode(state, Format::Xml); }
void BM_EncodeBond(benchmark::State& state) { Encode(state, Format::Bond); }

// The same rows through Qt's JSON document and XML stream writer.
void BM_EncodeJsonWithQt(benchmark::State& state) {
    std::size_t rows = 0, bytes = 0;
    for (auto _ : state) {
        QJsonArray array;
        for (int i = 0; i < kRowsPerBatch; ++i) {
            const Row row = TypicalRow(i);
            QJsonObject object;
            object.insert("project", QString::fromStdU16String(std::u16string(row.project)));
            object.insert("variable", QString::fromStdU16String(std::u16string(row.variable)));
            object.insert("value", row.value);
            object.insert("time", QString::fromStdString(FormatIsoTime(row.time, row.milliseconds)));
            object.insert("status", static_cast<qint64>(row.status));
            array.append(object);
        }
        const QByteArray body = QJsonDocument(array).toJson(QJsonDocument::Compact);
        benchmark::DoNotOptimize(body.data());
        rows += kRowsPerBatch;
        bytes += static_cast<std::size_t>(body.size());
    }
    state.SetItemsProcessed(static_cast<int64_t>(rows));
    state.counters["bytes_per_row"] = static_cast<double>(bytes) / static_cast<double>(rows);
}

void BM_EncodeXmlWithQt(benchmark::State& state) {
    std::size_t rows = 0, bytes = 0;
    for (auto _ : state) {
        QByteArray body;
        QXmlStreamWriter xml(&body);
        xml.writeStartDocument();
        xml.writeStartElement("rows");
        for (int i = 0; i < kRowsPerBatch; ++i) {
            const Row row = TypicalRow(i);
            xml.writeStartElement("row");
            xml.writeAttribute("project", QString::fromStdU16String(std::u16string(row.project)));
            xml.writeAttribute("variable", QString::fromStdU16String(std::u16string(row.variable)));
            xml.writeAttribute("time", QString::fromStdString(FormatIsoTime(row.time, row.milliseconds)));
            xml.writeAttribute("status", QString::number(row.status));
            xml.writeAttribute("type", "number");
            xml.writeCharacters(QString::number(row.value, 'g', 17));
            xml.writeEndElement();
        }
        xml.writeEndDocument();
        benchmark::DoNotOptimize(body.data());
        rows += kRowsPerBatch;
        bytes += static_cast<std::size_t>(body.size());
    }
    state.SetItemsProcessed(static_cast<int64_t>(rows));
    state.counters["bytes_per_row"] = static_cast<double>(bytes) / static_cast<double>(rows);
}

azurelocal::AzureLocalProcess* Server() {
    static std::unique_ptr<azurelocal::AzureLocalProcess> server = [] {
        std::string error;
        auto s = azurelocal::AzureLocalProcess::Start({"--keep-rows", "0"}, error);
        if (!s) std::fprintf(stderr, "azure-local: %s\n", error.c_str());
        return s;
    }();
    return server.get();
}

// Batches of rows sent through libcurl to azure-local, which decodes every row.
void EndToEnd(benchmark::State& state, Format format, bool eventHub) {
    azurelocal::AzureLocalProcess* server = Server();
    if (!server) {
        state.SkipWithError("azure-local did not start");
        return;
    }
    const auto rowsPerBatch = static_cast<int>(state.range(0));
    AzureClient client(nullptr, {});
    const std::u16string connection = QString::fromStdString(server->ConnectionString()).toStdU16String();
    server->Reset();
    std::size_t rows = 0;
    for (auto _ : state) {
        client.Begin(connection, u"bench", eventHub, static_cast<int>(format));
        for (int i = 0; i < rowsPerBatch; ++i) client.Add(TypicalRow(i));
        if (!client.Send()) {
            state.SkipWithError("send failed");
            return;
        }
        rows += static_cast<std::size_t>(rowsPerBatch);
    }
    const auto stats = server->Stats();
    state.SetItemsProcessed(static_cast<int64_t>(rows));
    state.counters["bytes_per_row"] = stats.rows ? static_cast<double>(stats.bytes) / static_cast<double>(stats.rows)
                                                 : 0;
    state.counters["rows_per_message"] =
        stats.messages ? static_cast<double>(stats.rows) / static_cast<double>(stats.messages) : 0;
}

void BM_SendJson(benchmark::State& state) { EndToEnd(state, Format::Json, false); }
void BM_SendXml(benchmark::State& state) { EndToEnd(state, Format::Xml, false); }
void BM_SendBond(benchmark::State& state) { EndToEnd(state, Format::Bond, false); }
void BM_SendBondEventHub(benchmark::State& state) { EndToEnd(state, Format::Bond, true); }

}  // namespace

BENCHMARK(BM_EncodeJson);
BENCHMARK(BM_EncodeXml);
BENCHMARK(BM_EncodeBond);
BENCHMARK(BM_EncodeJsonWithQt);
BENCHMARK(BM_EncodeXmlWithQt);
BENCHMARK(BM_SendJson)->Arg(1)->Arg(100)->Arg(10000)->UseRealTime();
BENCHMARK(BM_SendXml)->Arg(100)->Arg(10000)->UseRealTime();
BENCHMARK(BM_SendBond)->Arg(1)->Arg(100)->Arg(10000)->UseRealTime();
BENCHMARK(BM_SendBondEventHub)->Arg(10000)->UseRealTime();

int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
