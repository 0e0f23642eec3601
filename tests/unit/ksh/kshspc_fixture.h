// Fixture of the tests of the special requests: a real hub store registered
// as the local server, its hub, the request engine and catalog, a file
// directory of its own, and SOAP posts through WSQL_ParsePostRequest with
// the HTTP double that keeps what would be sent.
#pragma once

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "bss1/bss1.h"
#include "kshhub.h"
#include "kshprs.h"
#include "kshprs_double.h"
#include "kshreq.h"
#include "kshssrv.h"
#include "kshutil.h"
#include "ras1/ras1.h"
#include "sql1/sql1.h"

namespace spc {

inline std::string sourceDir() {
    const char* s = std::getenv("CSIT_SOURCE_DIR");
    return s ? s : ".";
}

inline bool contains(const std::string& text, const std::string& part) { return text.find(part) != std::string::npos; }

inline int countOf(const std::string& text, const std::string& what) {
    int n = 0;
    for (size_t at = text.find(what); at != std::string::npos; at = text.find(what, at + what.size())) n++;
    return n;
}

inline std::string creds() { return "<userid>ops</userid><password>secret</password>"; }

// A CT_Get of one situation's name; its rows read <SITNAME>ZAG_CPU_Busy</SITNAME>.
inline std::string sitGet() {
    return "<CT_Get><table>O4SRV.TSITDESC</table><column>SITNAME</column>"
           "<filter>SITNAME;EQ;ZAG_CPU_Busy</filter>" + creds() + "</CT_Get>";
}

// The body of a successful SOAP response (between the envelope's success
// element), or a text saying what came instead.
inline std::string soapBody(const PrsHttp& h) {
    size_t at = h.sent.find("<SOAP-CHK:Success");
    size_t from = at == std::string::npos ? std::string::npos : h.sent.find('>', at);
    size_t to = h.sent.find("</SOAP-CHK:Success>");
    if (from == std::string::npos || to == std::string::npos) return "(no success envelope: " + h.sent + ")";
    return h.sent.substr(from + 1, to - from - 1);
}

inline std::string readAll(const std::string& name) {
    std::ifstream in(name, std::ios::binary);
    std::stringstream s;
    s << in.rdbuf();
    return s.str();
}

class SpecialTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        setenv("CT_ATTRLIB", (sourceDir() + "/data/attrlib").c_str(), 1);
        setenv("SQL1_PWHASH", "min", 1);
        ASSERT_NE(WSQL_GetCatalog(), nullptr);
        ASSERT_EQ(WSQL_Request::initialize(), 0);
    }
    static void TearDownTestSuite() { WSQL_Request::terminate(); }

    void SetUp() override {
        char tmpl[] = "/tmp/kshspc_test.XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        dir = tmpl;
        html = dir + "/HTML";
        ASSERT_EQ(mkdir(html.c_str(), 0700), 0);
        static int serial = 0;
        lms = "SPCHUB" + std::to_string(++serial);
        store = dir + "/hub.db";
        SQL1_StoreOptions o;
        std::string data = sourceDir() + "/data/store";
        o.dataDir = data.c_str();
        o.adminPassword = "adminpw";
        o.minimalHash = 1;
        o.validate = 1;
        o.local = 1;
        ASSERT_EQ(SQL1_RegisterServer(lms.c_str(), store.c_str(), &o), 0);
        ASSERT_EQ(SQL1_SetUser(store.c_str(), "ops", "secret", 1, 1), 0);
        setenv("KSH_DIRECTORY", html.c_str(), 1);
        WSQL_SetFileDirectory(html.c_str());
        hub = std::make_unique<WSQL_Hub>(lms.c_str(), "soap", "soap", nullptr);
        // The snapshot files go to the current directory.
        ASSERT_NE(getcwd(previousDir, sizeof previousDir), nullptr);
        ASSERT_EQ(chdir(dir.c_str()), 0);
    }
    void TearDown() override {
        hub.reset();
        ASSERT_EQ(chdir(previousDir), 0);
        std::string cmd = "rm -rf '" + dir + "'";
        (void)system(cmd.c_str());
    }

    // A file of the file directory.
    void file(const std::string& name, const std::string& text) {
        std::ofstream(html + "/" + name, std::ios::binary) << text;
    }

    std::unique_ptr<PrsHttp> post(const std::string& method, const std::string& inner) {
        return postDoc(soapEnvelope("<" + method + ">" + inner + "</" + method + ">"));
    }
    std::unique_ptr<PrsHttp> postDoc(const std::string& doc) {
        auto http = std::make_unique<PrsHttp>("", doc);
        lastRc = WSQL_ParsePostRequest(http.get(), hub.get());
        return http;
    }

    std::vector<std::vector<std::string>> rows(const std::string& sql) {
        std::vector<std::vector<std::string>> out;
        sqlite3* db = nullptr;
        EXPECT_EQ(sqlite3_open_v2(store.c_str(), &db, SQLITE_OPEN_READONLY, nullptr), SQLITE_OK);
        sqlite3_stmt* st = nullptr;
        EXPECT_EQ(sqlite3_prepare_v2(db, sql.c_str(), -1, &st, nullptr), SQLITE_OK) << sql;
        while (st && sqlite3_step(st) == SQLITE_ROW) {
            std::vector<std::string> row;
            for (int i = 0; i < sqlite3_column_count(st); ++i) {
                const unsigned char* t = sqlite3_column_text(st, i);
                row.emplace_back(t ? reinterpret_cast<const char*>(t) : "(null)");
            }
            out.push_back(row);
        }
        sqlite3_finalize(st);
        sqlite3_close(db);
        return out;
    }

    std::string dir, html, lms, store;
    std::unique_ptr<WSQL_Hub> hub;
    char previousDir[4096] = {};
    int lastRc = -1;
};

}  // namespace spc
