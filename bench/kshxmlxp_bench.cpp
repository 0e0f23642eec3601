// Throughput of the document model against the bare streaming parser on a
// 1 MiB table of 1,000 rows with 30 columns each: building the tree
// (parseMessage, construction to destruction), serialising it
// (extractDocumentXML), and Expat alone with empty callbacks. After the run
// the ratios tree/parser and serialise/parser are printed.
#include <benchmark/benchmark.h>
#include <expat.h>

#include <cstdio>
#include <map>
#include <string>
#include <vector>

#include "kshxmlxp.h"
#include "ras1/ras1.h"

namespace {

constexpr int kRows = 1000;
constexpr int kColumns = 30;
constexpr size_t kTarget = 1 << 20;

// An indented table like the gateway's result rows, padded to about 1 MiB.
std::string makeDocument() {
    const size_t markup = 10 + 13 + 5 + 5;  // per column: indent, tags, line break
    size_t perValue = kTarget / ((size_t)kRows * kColumns) - markup;
    std::string doc = "<TABLE name=\"O4SRV.TSITDESC\">\n<OBJECT>TSITDESC</OBJECT>\n<DATA>\n";
    char cell[64];
    for (int r = 0; r < kRows; ++r) {
        doc += "  <ROW>\n";
        for (int c = 0; c < kColumns; ++c) {
            snprintf(cell, sizeof cell, "    <COL%02d>", c);
            doc += cell;
            std::string v = "r" + std::to_string(r) + "c" + std::to_string(c) + " &amp; ";
            while (v.size() < perValue) v += (char)('a' + (v.size() % 26));
            doc += v;
            snprintf(cell, sizeof cell, "</COL%02d>\n", c);
            doc += cell;
        }
        doc += "  </ROW>\n";
    }
    doc += "</DATA>\n</TABLE>\n";
    return doc;
}

const std::string& document() {
    static const std::string doc = makeDocument();
    return doc;
}

void XMLCALL noStart(void*, const XML_Char*, const XML_Char**) {}
void XMLCALL noEnd(void*, const XML_Char*) {}
void XMLCALL noText(void*, const XML_Char*, int) {}

void BM_RawExpat(benchmark::State& state) {
    const std::string& doc = document();
    for (auto _ : state) {
        XML_Parser p = XML_ParserCreate(nullptr);
        XML_SetElementHandler(p, noStart, noEnd);
        XML_SetCharacterDataHandler(p, noText);
        if (XML_Parse(p, doc.data(), (int)doc.size(), 1) != XML_STATUS_OK) state.SkipWithError("parse failed");
        XML_ParserFree(p);
    }
    state.SetBytesProcessed((int64_t)state.iterations() * (int64_t)doc.size());
}

void BM_DomBuild(benchmark::State& state) {
    const std::string& doc = document();
    for (auto _ : state) {
        KSH_XML xml;
        if (xml.parseMessage(doc.data(), (unsigned)doc.size()) != 0) state.SkipWithError("parse failed");
        benchmark::DoNotOptimize(xml.getRoot());
    }
    state.SetBytesProcessed((int64_t)state.iterations() * (int64_t)doc.size());
}

void BM_Serialise(benchmark::State& state) {
    const std::string& doc = document();
    KSH_XML xml;
    if (xml.parseMessage(doc.data(), (unsigned)doc.size()) != 0) {
        state.SkipWithError("parse failed");
        return;
    }
    unsigned length = 0;
    for (auto _ : state) {
        char* text = nullptr;
        if (xml.extractDocumentXML(&text, &length) != 0) state.SkipWithError("serialise failed");
        benchmark::DoNotOptimize(text);
    }
    state.SetBytesProcessed((int64_t)state.iterations() * (int64_t)length);
}

BENCHMARK(BM_RawExpat)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_DomBuild)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Serialise)->Unit(benchmark::kMillisecond);

// The console output, plus the bytes per second of each benchmark kept for
// the summary.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    std::map<std::string, double> rate;
    void ReportRuns(const std::vector<Run>& runs) override {
        for (const Run& run : runs) {
            auto it = run.counters.find("bytes_per_second");
            if (it != run.counters.end() && !run.error_occurred) rate[run.benchmark_name()] = it->second.value;
        }
        ConsoleReporter::ReportRuns(runs);
    }
};

}  // namespace

int main(int argc, char** argv) {
    RAS1_Configure("NONE", nullptr);
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
    RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();
    // With --benchmark_repetitions the medians are compared.
    auto rate = [&reporter](const std::string& name) {
        auto it = reporter.rate.find(name + "_median");
        if (it == reporter.rate.end()) it = reporter.rate.find(name);
        return it == reporter.rate.end() ? 0.0 : it->second;
    };
    double raw = rate("BM_RawExpat");
    if (raw <= 0) return 0;
    printf("document: %zu bytes, %d rows x %d columns\n", document().size(), kRows, kColumns);
    printf("ratio DOM build / raw Expat:   %.2f (goal >= 0.5)\n", rate("BM_DomBuild") / raw);
    printf("ratio serialise / raw Expat:   %.2f (goal >= 1.0)\n", rate("BM_Serialise") / raw);
    return 0;
}
