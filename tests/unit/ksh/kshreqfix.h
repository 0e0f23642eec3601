// Fixtures shared by the tests of the request engine, the database request
// objects and the hub: a real hub store in a temporary folder registered
// under an LMS name, an HTTP object that keeps what it would send, a test
// clock, and raw SQLite access to look at what landed in the store.
#pragma once

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <unistd.h>

#include <atomic>
#include <deque>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>
#include <utility>
#include <vector>

#include "bss1/bss1.h"
#include "kshcat.h"
#include "kshhttp.h"
#include "kshreqt.h"
#include "sql1/sql1.h"

namespace kshtest {

inline std::string sourceDir() {
    const char* src = std::getenv("CSIT_SOURCE_DIR");
    return src != nullptr ? src : ".";
}

// The catalog reads the attribute files of data/attrlib on first use.
inline WSQL_Catalog* catalog() {
    static bool set = [] {
        setenv("CT_ATTRLIB", (sourceDir() + "/data/attrlib").c_str(), 1);
        return true;
    }();
    (void)set;
    return WSQL_GetCatalog();
}

// A hub store of its own, registered as server `lms`.
class TestStore {
public:
    // `extraSql` (when given) is run after the schema and seed rows, before
    // the client layer first opens the store (it reads the tables once).
    explicit TestStore(const std::string& lms, SQL1_StoreOptions options = {}, const std::string& extraSql = "")
        : lms_(lms) {
        char tmpl[] = "/tmp/kshreq-test-XXXXXX";
        dir_ = mkdtemp(tmpl);
        path_ = dir_ + "/hub.db";
        std::string data = sourceDir() + "/data/store";
        if (!extraSql.empty() && !(exec(readFile(data + "/schema.sql")) && exec(readFile(data + "/seed.sql")) && exec(extraSql))) {
            rc_ = -2;
            return;
        }
        options.dataDir = data.c_str();
        options.adminUser = "sysadmin";
        options.adminPassword = "adminpw";
        options.minimalHash = 1;
        rc_ = SQL1_RegisterServer(lms.c_str(), path_.c_str(), &options);
    }
    ~TestStore() {
        std::error_code ec;
        std::filesystem::remove_all(dir_, ec);
    }
    TestStore(const TestStore&) = delete;
    TestStore& operator=(const TestStore&) = delete;

    int status() const { return rc_; }
    const std::string& path() const { return path_; }
    const char* lms() const { return lms_.c_str(); }

    // Runs `sql` on the store directly; the rows as text.
    std::vector<std::vector<std::string>> query(const std::string& sql) const {
        std::vector<std::vector<std::string>> rows;
        sqlite3* db = nullptr;
        if (sqlite3_open(path_.c_str(), &db) != SQLITE_OK) return rows;
        sqlite3_busy_timeout(db, 5000);
        sqlite3_stmt* st = nullptr;
        if (sqlite3_prepare_v2(db, sql.c_str(), -1, &st, nullptr) == SQLITE_OK) {
            while (sqlite3_step(st) == SQLITE_ROW) {
                std::vector<std::string> row;
                for (int i = 0; i < sqlite3_column_count(st); i++) {
                    const unsigned char* t = sqlite3_column_text(st, i);
                    row.emplace_back(t != nullptr ? reinterpret_cast<const char*>(t) : "<null>");
                }
                rows.push_back(row);
            }
        }
        sqlite3_finalize(st);
        sqlite3_close(db);
        return rows;
    }
    bool exec(const std::string& sql) const {
        sqlite3* db = nullptr;
        if (sqlite3_open(path_.c_str(), &db) != SQLITE_OK) return false;
        sqlite3_busy_timeout(db, 5000);
        bool ok = sqlite3_exec(db, sql.c_str(), nullptr, nullptr, nullptr) == SQLITE_OK;
        sqlite3_close(db);
        return ok;
    }

private:
    static std::string readFile(const std::string& name) {
        std::string out;
        FILE* f = std::fopen(name.c_str(), "rb");
        if (f == nullptr) return out;
        char buf[4096];
        for (size_t n; (n = std::fread(buf, 1, sizeof buf, f)) > 0;) out.append(buf, n);
        std::fclose(f);
        return out;
    }

    std::string lms_, dir_, path_;
    int rc_ = -1;
};

// Keeps what a request would send to its client.
class FakeHttp : public WSQL_HttpServer {
public:
    explicit FakeHttp(std::string q = "") : query(std::move(q)) {}

    const char* getRequestMethod() override { return query.empty() ? "POST" : "GET"; }
    const char* getQueryString() override { return query.c_str(); }
    const char* getPathInfo() override { return "/soap"; }
    const char* getPathTranslated() override { return "/soap"; }
    const char* getRequestClient() override { return "127.0.0.1:5000"; }
    int writeHeaders(uint32_t status, uint32_t media, uint64_t, uint32_t n, const KDH1_sendhdr_struct* hs) override {
        headers.push_back(status);
        for (uint32_t i = 0; i < n; i++) extra.emplace_back(hs[i].kind, std::string(hs[i].value, hs[i].length));
        return 0;
    }
    int writeClient(const char* data, size_t n) override {
        sent.append(data, n);
        return 0;
    }
    int writeClientUTF8(const char* data, size_t n) override { return writeClient(data, n); }
    int readClient(char** data, uint32_t* n) override {
        *data = nullptr;
        *n = 0;
        return 0;
    }

    // The response body collected so far (not yet sent).
    std::string body() {
        WSQL_ResponseBuffer* b = getBuffer();
        return b != nullptr && b->getBuffer() != nullptr ? std::string(b->getBuffer(), b->getLength()) : "";
    }

    std::string query;
    std::string sent;
    std::vector<uint32_t> headers;
    std::vector<std::pair<uint32_t, std::string>> extra;
};

// A clock the test steps.
inline std::atomic<time_t>& clockNow() {
    static std::atomic<time_t> now{1767000000};
    return now;
}
inline time_t testClock() { return clockNow().load(); }

class FrozenClock {
public:
    FrozenClock() { previous = BSS1_SetClock(testClock); }
    ~FrozenClock() { BSS1_SetClock(previous); }
    void step(time_t seconds) { clockNow() += seconds; }

private:
    BSS1_Clock previous;
};

// A parsed request record whose strings the builder keeps alive.
class Record {
public:
    Record() { std::memset(&r, 0, sizeof r); }
    Record(const Record&) = delete;
    Record& operator=(const Record&) = delete;

    char* keep(const std::string& s) {
        texts.push_back(s);
        return texts.back().data();
    }
    Record& table(const std::string& t) {
        r.table = keep(t);
        return *this;
    }
    Record& column(const std::string& c) {
        r.columns[r.numColumns++] = keep(c);
        return *this;
    }
    Record& value(const std::string& c, const std::string& v) {
        r.columns[r.numColumns++] = keep(c);
        r.values[r.numValues++] = keep(v);
        return *this;
    }
    Record& filter(const std::string& c, const std::string& op, const std::string& v, bool attr = false) {
        WSQL_Filter_t& f = r.filters[r.numFilters++];
        f.column = keep(c);
        f.oper = keep(op);
        f.value = keep(v);
        f.isAfilter = attr ? 1 : 0;
        return *this;
    }
    Record& parma(const std::string& n, const std::string& v) {
        r.parma[r.numParma].name = keep(n);
        r.parma[r.numParma++].value = keep(v);
        return *this;
    }
    // A SOAP method request with credentials.
    Record& soap(uint32_t methods, const char* user = "sysadmin", const char* password = "adminpw") {
        r.type |= WSQL_TYPE_SOAP;
        r.methods |= methods;
        std::strncpy(r.userid, user, sizeof r.userid);
        std::strncpy(r.password, password, sizeof r.password);
        std::strncpy(r.clientHost, "127.0.0.1", sizeof r.clientHost);
        return *this;
    }
    Record& persist() {
        r.elements |= WSQL_ELEM_PERSIST;
        return *this;
    }

    WSQL_Request_t r;

private:
    std::deque<std::string> texts;
};

inline int countOf(const std::string& text, const std::string& what) {
    int n = 0;
    for (size_t at = text.find(what); at != std::string::npos; at = text.find(what, at + what.size())) n++;
    return n;
}

}  // namespace kshtest
