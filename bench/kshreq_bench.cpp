// Cost of the request engine against the libraries under it, on a hub
// store of its own (a temporary folder, 10,000 extra process rows):
//   - a one-row CT_SQL select through the engine (InitReq, Start, Fetch,
//     Done) and through the whole POST entry (SOAP parse, dispatch, engine,
//     envelope), each against the same select prepared and stepped directly
//     on SQLite plus a DOM parse of the SOAP request;
//   - writing a 10,000-row CT_Get as XML, against raw Expat's parse
//     throughput of the same XML.
// After the run the ratios are printed with their goals.
#include <benchmark/benchmark.h>
#include <expat.h>
#include <sqlite3.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "kshcat.h"
#include "kshhttp.h"
#include "kshhub.h"
#include "kshprs.h"
#include "kshreq.h"
#include "kshreqt.h"
#include "kshxmlxp.h"
#include "ras1/ras1.h"
#include "sql1/sql1.h"

namespace {

const char kLms[] = "BENCH_HUB";
const char kSelect[] = "SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = \"ZAG_CPU_Busy\"";
const char kSelectSqlite[] = "SELECT SITNAME FROM \"O4SRV.TSITDESC\" WHERE SITNAME = 'ZAG_CPU_Busy'";
constexpr int kBigRows = 10000;

std::string sourceDir() {
    const char* s = std::getenv("CSIT_SOURCE_DIR");
    return s != nullptr ? s : ".";
}

std::string readFile(const std::string& name) {
    std::string out;
    if (FILE* f = std::fopen(name.c_str(), "rb")) {
        char buf[8192];
        for (size_t n; (n = std::fread(buf, 1, sizeof buf, f)) > 0;) out.append(buf, n);
        std::fclose(f);
    }
    return out;
}

// An HTTP object that keeps the response and serves a fixed body.
class BenchHttp : public WSQL_HttpServer {
public:
    explicit BenchHttp(const std::string* body = nullptr) : body_(body) {}
    const char* getRequestMethod() override { return "POST"; }
    const char* getQueryString() override { return ""; }
    const char* getPathInfo() override { return "/soap"; }
    const char* getPathTranslated() override { return "/soap"; }
    const char* getRequestClient() override { return "127.0.0.1:4000"; }
    int writeHeaders(uint32_t, uint32_t, uint64_t, uint32_t, const KDH1_sendhdr_struct*) override { return 0; }
    int writeClient(const char* data, size_t n) override {
        sent += n;
        benchmark::DoNotOptimize(data);
        return 0;
    }
    int writeClientUTF8(const char* data, size_t n) override { return writeClient(data, n); }
    int readClient(char** data, uint32_t* n) override {
        *data = nullptr;
        *n = 0;
        if (body_ == nullptr) return 0;
        *data = static_cast<char*>(std::malloc(body_->size() + 1));
        if (*data == nullptr) return 7;
        std::memcpy(*data, body_->c_str(), body_->size() + 1);
        *n = static_cast<uint32_t>(body_->size());
        return 0;
    }
    size_t sent = 0;

private:
    const std::string* body_;
};

// The store, the hub and the request layer, set up once.
struct Setup {
    std::string dir, path;
    WSQL_Hub* hub = nullptr;
    sqlite3* db = nullptr;
    bool ok = false;

    Setup() {
        RAS1_Configure("NONE", nullptr);
        setenv("CT_ATTRLIB", (sourceDir() + "/data/attrlib").c_str(), 1);
        char tmpl[] = "/tmp/kshreq-bench-XXXXXX";
        dir = mkdtemp(tmpl);
        path = dir + "/hub.db";
        std::string data = sourceDir() + "/data/store";
        std::string rows =
            "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < " + std::to_string(kBigRows) +
            ") INSERT INTO \"ZAG.PROCESS\" (ORIGINNODE, TIMESTAMP, PID, NAME, STATE, RSSKB, CPUPCT) "
            "SELECT 'bench:ZAG', '1260115093000000', i, 'process-' || i, 'S', i * 10, i % 10000 FROM n;";
        if (sqlite3_open(path.c_str(), &db) != SQLITE_OK) return;
        for (const std::string& sql : {readFile(data + "/schema.sql"), readFile(data + "/seed.sql"), rows}) {
            if (sqlite3_exec(db, sql.c_str(), nullptr, nullptr, nullptr) != SQLITE_OK) return;
        }
        SQL1_StoreOptions o;
        o.dataDir = data.c_str();
        o.adminPassword = "benchpw";
        o.minimalHash = 1;
        o.validate = 0;
        if (SQL1_RegisterServer(kLms, path.c_str(), &o) != 0) return;
        if (WSQL_GetCatalog() == nullptr || WSQL_Request::initialize() != 0) return;
        hub = new WSQL_Hub(kLms, "soap", "soap", nullptr);
        ok = true;
    }
    ~Setup() {
        delete hub;
        (void)WSQL_Request::terminate();
        sqlite3_close(db);
        std::error_code ec;
        std::filesystem::remove_all(dir, ec);
    }
};

Setup& setup() {
    static Setup* s = new Setup;
    return *s;
}

const std::string& soapSelect() {
    static const std::string body = std::string(
        "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
        "<SOAP-ENV:Envelope xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\">"
        "<SOAP-ENV:Body><CT_SQL><table>O4SRV.TSITDESC</table><sql><![CDATA[") + kSelect +
        "]]></sql></CT_SQL></SOAP-ENV:Body></SOAP-ENV:Envelope>";
    return body;
}

// One request of the engine over `rec`; false on failure.
bool runEngine(WSQL_Request_t* rec, const char* action, BenchHttp* http) {
    WSQL_Request req(setup().hub, http);
    int rc = req.InitReq(rec, action);
    if (rc == 0) rc = req.Start();
    if (rc == 0) rc = req.Fetch(action, true);
    (void)req.Done(rc);
    return rc == 0;
}

void BM_DirectSelectAndParse(benchmark::State& state) {
    Setup& s = setup();
    if (!s.ok) return state.SkipWithError("setup failed");
    for (auto _ : state) {
        KSH_XML doc;
        if (doc.parseMessage(soapSelect().c_str(), static_cast<unsigned>(soapSelect().size())) != 0)
            state.SkipWithError("parse failed");
        sqlite3_stmt* st = nullptr;
        if (sqlite3_prepare_v2(s.db, kSelectSqlite, -1, &st, nullptr) != SQLITE_OK) state.SkipWithError("prepare");
        int rows = 0;
        while (sqlite3_step(st) == SQLITE_ROW) {
            benchmark::DoNotOptimize(sqlite3_column_text(st, 0));
            rows++;
        }
        sqlite3_finalize(st);
        if (rows != 1) state.SkipWithError("expected one row");
    }
}

void BM_EngineSelect(benchmark::State& state) {
    Setup& s = setup();
    if (!s.ok) return state.SkipWithError("setup failed");
    char table[] = "O4SRV.TSITDESC";
    char sql[sizeof kSelect];
    std::memcpy(sql, kSelect, sizeof kSelect);
    for (auto _ : state) {
        WSQL_Request_t rec;
        std::memset(&rec, 0, sizeof rec);
        rec.table = table;
        rec.sql = sql;
        BenchHttp http;
        if (!runEngine(&rec, "sql", &http)) state.SkipWithError("request failed");
    }
}

void BM_PostSelect(benchmark::State& state) {
    Setup& s = setup();
    if (!s.ok) return state.SkipWithError("setup failed");
    for (auto _ : state) {
        BenchHttp http(&soapSelect());
        if (WSQL_ParsePostRequest(&http, s.hub) != 0 || http.sent == 0) state.SkipWithError("post failed");
    }
}

// The 10,000-row answer, written once to measure Expat on it.
const std::string& bigAnswer() {
    static std::string xml;
    if (xml.empty() && setup().ok) {
        char table[] = "ZAG.PROCESS";
        char col[] = "ORIGINNODE", op[] = "EQ", val[] = "bench:ZAG";
        WSQL_Request_t rec;
        std::memset(&rec, 0, sizeof rec);
        rec.table = table;
        rec.numFilters = 1;
        rec.filters[0] = {col, op, val, 0};
        BenchHttp http;
        if (runEngine(&rec, "start", &http)) xml = std::string(http.getBuffer()->getBuffer(), http.getBuffer()->getLength());
    }
    return xml;
}

void BM_Write10kRows(benchmark::State& state) {
    Setup& s = setup();
    if (!s.ok || bigAnswer().empty()) return state.SkipWithError("setup failed");
    char table[] = "ZAG.PROCESS";
    char col[] = "ORIGINNODE", op[] = "EQ", val[] = "bench:ZAG";
    size_t bytes = 0;
    for (auto _ : state) {
        WSQL_Request_t rec;
        std::memset(&rec, 0, sizeof rec);
        rec.table = table;
        rec.numFilters = 1;
        rec.filters[0] = {col, op, val, 0};
        BenchHttp http;
        if (!runEngine(&rec, "start", &http)) state.SkipWithError("request failed");
        bytes += http.getBuffer()->getLength();
    }
    state.SetBytesProcessed(static_cast<int64_t>(bytes));
}

void XMLCALL noStart(void*, const XML_Char*, const XML_Char**) {}
void XMLCALL noEnd(void*, const XML_Char*) {}
void XMLCALL noText(void*, const XML_Char*, int) {}

void BM_RawExpat10kRows(benchmark::State& state) {
    const std::string& xml = bigAnswer();
    if (xml.empty()) return state.SkipWithError("setup failed");
    for (auto _ : state) {
        XML_Parser p = XML_ParserCreate(nullptr);
        XML_SetElementHandler(p, noStart, noEnd);
        XML_SetCharacterDataHandler(p, noText);
        if (XML_Parse(p, xml.data(), static_cast<int>(xml.size()), 1) != XML_STATUS_OK) state.SkipWithError("parse");
        XML_ParserFree(p);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * static_cast<int64_t>(xml.size()));
}

BENCHMARK(BM_DirectSelectAndParse)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_EngineSelect)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_PostSelect)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_Write10kRows)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_RawExpat10kRows)->Unit(benchmark::kMillisecond);

// The console output, plus the time per iteration and bytes per second of
// each benchmark for the summary.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    std::map<std::string, double> time, rate;
    void ReportRuns(const std::vector<Run>& runs) override {
        for (const Run& run : runs) {
            if (run.error_occurred) continue;
            time[run.benchmark_name()] = run.GetAdjustedRealTime();
            auto it = run.counters.find("bytes_per_second");
            if (it != run.counters.end()) rate[run.benchmark_name()] = it->second.value;
        }
        ConsoleReporter::ReportRuns(runs);
    }
};

}  // namespace

int main(int argc, char** argv) {
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
    RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();
    auto pick = [](const std::map<std::string, double>& m, const std::string& name) {
        auto it = m.find(name + "_median");
        if (it == m.end()) it = m.find(name);
        return it == m.end() ? 0.0 : it->second;
    };
    double direct = pick(reporter.time, "BM_DirectSelectAndParse");
    double expat = pick(reporter.rate, "BM_RawExpat10kRows");
    if (direct > 0) {
        std::printf("ratio engine select / direct SQLite + DOM parse: %.2f (goal <= 3)\n",
                    pick(reporter.time, "BM_EngineSelect") / direct);
        std::printf("ratio POST select / direct SQLite + DOM parse:   %.2f (goal <= 3)\n",
                    pick(reporter.time, "BM_PostSelect") / direct);
    }
    if (expat > 0) {
        std::printf("answer: %zu bytes, %d rows\n", bigAnswer().size(), kBigRows);
        std::printf("ratio 10k-row writing / raw Expat parse:         %.2f (goal >= 0.3)\n",
                    pick(reporter.rate, "BM_Write10kRows") / expat);
    }
    std::fflush(stdout);
    (void)WSQL_Request::terminate();
    return 0;
}
