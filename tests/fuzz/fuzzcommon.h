// Shared by the gateway's fuzz targets: an HTTP request object that accepts
// every write and has no body, the checks' failure report, and the check of a
// parsed request record.
#pragma once

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "kshhttp.h"
#include "kshreqt.h"

namespace fuzzcommon {

class FuzzHttp : public WSQL_HttpServer {
public:
    const char* getRequestMethod() override { return "POST"; }
    const char* getQueryString() override { return ""; }
    const char* getPathInfo() override { return "/soap"; }
    const char* getPathTranslated() override { return "/soap"; }
    const char* getRequestClient() override { return "10.0.0.1:4000"; }
    int writeHeaders(uint32_t, uint32_t, uint64_t, uint32_t, const KDH1_sendhdr_struct*) override { return 0; }
    int writeClient(const char*, size_t) override { return 0; }
    int writeClientUTF8(const char*, size_t) override { return 0; }
    int readClient(char** data, uint32_t* n) override {
        *data = nullptr;
        *n = 0;
        return 0;
    }
};

// Reports a failed check and aborts, so that the fuzzer keeps the input.
[[noreturn]] inline void fail(const char* what) {
    fprintf(stderr, "fuzz check failed: %s\n", what);
    abort();
}

// Reads the whole string (ASan reports a string that is not terminated
// inside its allocation).
inline size_t touch(const char* s) { return s ? strlen(s) : 0; }

inline void checkFilters(const WSQL_Filter_t* f, int n, int max) {
    if (n < 0 || n > max) fail("filter count");
    for (int i = 0; i < n; ++i) {
        if (f[i].column == nullptr || f[i].value == nullptr) fail("filter without column or value");
        touch(f[i].column);
        touch(f[i].oper);
        touch(f[i].value);
    }
}

// Every count of the record is within its array, every string readable.
inline void checkRecord(const WSQL_Request_t& r) {
    if (r.numParma < 0 || r.numParma > WSQL_MAX_PARMA) fail("parma count");
    for (int i = 0; i < r.numParma; ++i) {
        touch(r.parma[i].name);
        touch(r.parma[i].value);
    }
    checkFilters(r.filters, r.numFilters, WSQL_MAX_FILTERS);
    checkFilters(r.dataItems, r.numDataItems, WSQL_MAX_DATAITEMS);
    if (r.numColumns < 0 || r.numColumns > WSQL_MAX_COLUMNS) fail("column count");
    if (r.numValues < 0 || r.numValues > WSQL_MAX_COLUMNS) fail("value count");
    for (int i = 0; i < r.numColumns; ++i) touch(r.columns[i]);
    for (int i = 0; i < r.numValues; ++i) touch(r.values[i]);
    for (const char* s : {r.table, r.target, r.sql, r.thrunode, r.subSql, r.requestHandle, r.hubAlias,
                          r.statusSitName, r.expire})
        touch(s);
}

}  // namespace fuzzcommon
