// CT_Export through the real SOAP dispatch: output files with date/time
// variables and refused names, and warehouse exports whose snapshot record
// lands in real hub stores, also when several run at the same time.
#include <gtest/gtest.h>

#include <ctime>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "kshanchor.h"
#include "kshexprt.h"
#include "kshspc_fixture.h"

namespace {

using spc::readAll;
using spc::soapBody;

// 2026-03-04 05:06:07 local time.
time_t frozenNow() {
    struct tm t = {};
    t.tm_year = 126;
    t.tm_mon = 2;
    t.tm_mday = 4;
    t.tm_hour = 5;
    t.tm_min = 6;
    t.tm_sec = 7;
    t.tm_isdst = -1;
    return mktime(&t);
}

class Export : public spc::SpecialTest {
protected:
    void SetUp() override {
        spc::SpecialTest::SetUp();
        previousClock = BSS1_SetClock(frozenNow);
        // What gateway start does in the current directory.
        ASSERT_EQ(WSQL_ExportRequest::initOnce(), 0);
    }
    void TearDown() override {
        BSS1_SetClock(previousClock);
        gAnchor = nullptr;
        spc::SpecialTest::TearDown();
    }
    bool exists(const std::string& path) { return access(path.c_str(), F_OK) == 0; }
    std::vector<std::vector<std::string>> snapshots(const std::string& where = "") {
        return rows("SELECT USERID, WRITETIME, HOSTNAME, XMLDATA FROM \"WAREHOUSE.SNAPSHOT\"" + where + " ORDER BY rowid");
    }

    BSS1_Clock previousClock = nullptr;
};

TEST_F(Export, OutputFilesAndTheirNames) {
    const std::string batch = "<request><insert><row>1 &amp; 2</row></insert></request>";
    auto dated = post("CT_Export", "<filename>exp$yymmddhhmiss$.xml</filename>" + batch);
    EXPECT_EQ(lastRc, 0);
    EXPECT_EQ(soapBody(*dated), "<row>1 &amp; 2</row>");
    EXPECT_EQ(readAll(html + "/exp260304050607.xml"), "<row>1 &amp; 2</row>");

    // A name with "/" is a path of its own.
    const std::string own = dir + "/own-$yymm$.xml";
    post("CT_Export", "<filename>" + own + "</filename>" + batch);
    EXPECT_EQ(readAll(dir + "/own-2603.xml"), "<row>1 &amp; 2</row>");
    EXPECT_FALSE(exists(html + "/own-2603.xml"));

    struct {
        std::string name;
        std::string fault;
        int rc;
    } refused[] = {
        {".profile", "Invalid export filename.", 6},
        {"$..$x", "Invalid export filename.", 6},  // a pair the variable keeps as it is
        {"exp$mm$.xml", "Invalid export filename date/time stamp variable.", 6},
        {std::string(300, 'n'), "Export filename too long.", 6},
    };
    for (const auto& r : refused) {
        auto h = post("CT_Export", "<filename>" + r.name + "</filename>" + batch);
        EXPECT_EQ(lastRc, r.rc) << r.name;
        EXPECT_TRUE(h->isClientFault()) << r.name;
        EXPECT_EQ(h->fault(), r.fault) << r.name;
        EXPECT_EQ(h->detail(), r.name);
    }
    EXPECT_FALSE(exists(html + "/.profile"));
    EXPECT_FALSE(exists(html + "/..x"));
    EXPECT_FALSE(exists(dir + "/x"));

    auto neither = post("CT_Export", batch);
    EXPECT_EQ(lastRc, 6);
    EXPECT_EQ(neither->fault(), "Unable to start request (6)");

    auto unwritable = post("CT_Export", "<filename>nodir/out.xml</filename>" + batch);
    EXPECT_EQ(unwritable->fault(), "Unable to open file.");
}

TEST_F(Export, WarehouseRecordOfTheLastGetAndTheCutOutput) {
    std::string header = readAll(dir + "/kshsnap.hdr");
    EXPECT_EQ(header.size(), 80u);
    EXPECT_EQ(header, "SNAPSHOT.USERID(char,0,16)\tWRITETIME(char,16,16)\tSNAPSHOT.XMLDATA(char,32,32000)");

    // The file name is ignored when the warehouse is asked for.
    const std::string large(33000, 'z');
    auto h = post("CT_Export", "<warehouse/><filename>ignored.xml</filename><request>" + spc::sitGet() +
                                   "</request><request><insert><big>" + large + "</big></insert></request>");
    EXPECT_EQ(lastRc, 0);
    ASSERT_FALSE(h->isRequestErrorSet()) << h->fault();
    EXPECT_FALSE(exists(html + "/ignored.xml"));
    const std::string body = soapBody(*h);
    ASSERT_GT(body.size(), 33000u);

    const std::string record = readAll(dir + "/kshsnap");
    ASSERT_EQ(record.size(), 32032u);
    EXPECT_EQ(record.substr(0, 16), "ops             ");
    EXPECT_EQ(record.substr(16, 16), "1260304050607000");
    EXPECT_EQ(record.substr(32), body.substr(0, 32000));

    auto stored = snapshots();
    ASSERT_EQ(stored.size(), 1u);
    EXPECT_EQ(stored[0][0], "ops");
    EXPECT_EQ(stored[0][1], "1260304050607000");
    EXPECT_EQ(stored[0][2], "");  // no host anchor
    EXPECT_EQ(stored[0][3], body.substr(0, 32000));

    // A short output is padded with blanks in the record, not in the row;
    // the anchor gives the host name.
    WSQL_LocalServer local{};
    snprintf(local.alias, sizeof local.alias, "HUBHOST");
    WSQL_Anchor anchor;
    anchor.localServer = &local;
    gAnchor = &anchor;
    post("CT_Export", "<warehouse/><request><insert><s>short</s></insert></request>");
    const std::string shortRecord = readAll(dir + "/kshsnap");
    ASSERT_EQ(shortRecord.size(), 32032u);
    EXPECT_EQ(shortRecord.substr(0, 16), std::string(16, ' '));  // no CT_Get ran
    EXPECT_EQ(shortRecord.substr(32, 12), "<s>short</s>");
    EXPECT_EQ(shortRecord.substr(44), std::string(32032 - 44, ' '));
    stored = snapshots();
    ASSERT_EQ(stored.size(), 2u);
    EXPECT_EQ(stored[1], (std::vector<std::string>{"", "1260304050607000", "HUBHOST", "<s>short</s>"}));
}

TEST_F(Export, AnchorNamesChooseTheWarehouses) {
    const std::string otherStore = dir + "/other.db";
    SQL1_StoreOptions o;
    std::string data = spc::sourceDir() + "/data/store";
    o.dataDir = data.c_str();
    o.adminPassword = "adminpw";
    o.minimalHash = 1;
    ASSERT_EQ(SQL1_RegisterServer((lms + "X").c_str(), otherStore.c_str(), &o), 0);
    char names[2][33] = {};
    snprintf(names[0], sizeof names[0], "%sX", lms.c_str());
    WSQL_LocalServer local{};
    local.numNames = 1;
    local.names = names;
    WSQL_Anchor anchor;
    anchor.localServer = &local;
    gAnchor = &anchor;
    auto h = post("CT_Export", "<warehouse/><request><insert><o>1</o></insert></request>");
    EXPECT_FALSE(h->isRequestErrorSet()) << h->fault();
    EXPECT_TRUE(snapshots().empty());
    sqlite3* db = nullptr;
    ASSERT_EQ(sqlite3_open_v2(otherStore.c_str(), &db, SQLITE_OPEN_READONLY, nullptr), SQLITE_OK);
    sqlite3_stmt* st = nullptr;
    ASSERT_EQ(sqlite3_prepare_v2(db, "SELECT XMLDATA FROM \"WAREHOUSE.SNAPSHOT\"", -1, &st, nullptr), SQLITE_OK);
    ASSERT_EQ(sqlite3_step(st), SQLITE_ROW);
    EXPECT_STREQ(reinterpret_cast<const char*>(sqlite3_column_text(st, 0)), "<o>1</o>");
    sqlite3_finalize(st);
    sqlite3_close(db);

    // A name the server look-up does not know fails the export.
    snprintf(names[0], sizeof names[0], "NOSUCHHUB");
    auto failed = post("CT_Export", "<warehouse/><request><insert><o>2</o></insert></request>");
    EXPECT_FALSE(failed->isClientFault());
    EXPECT_EQ(failed->fault(), "Error attempting to export to Data Warehouse.");
}

TEST_F(Export, ConcurrentWarehouseExportsKeepTheirOwnRecords) {
    constexpr int kThreads = 4;
    constexpr int kEach = 6;
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; t++) {
        threads.emplace_back([this, t] {
            for (int i = 0; i < kEach; i++) {
                std::string doc = soapEnvelope("<CT_Export><warehouse/><request><insert><r>" + std::to_string(t) + "-" +
                                               std::to_string(i) + std::string(2000, 'p') +
                                               "</r></insert></request></CT_Export>");
                PrsHttp http("", doc);
                WSQL_ParsePostRequest(&http, hub.get());
                EXPECT_FALSE(http.isRequestErrorSet()) << http.fault();
            }
        });
    }
    for (auto& th : threads) th.join();
    std::set<std::string> expected, got;
    for (int t = 0; t < kThreads; t++)
        for (int i = 0; i < kEach; i++)
            expected.insert("<r>" + std::to_string(t) + "-" + std::to_string(i) + std::string(2000, 'p') + "</r>");
    for (const auto& r : snapshots()) got.insert(r[3]);
    EXPECT_EQ(snapshots().size(), static_cast<size_t>(kThreads * kEach));
    EXPECT_EQ(got, expected);
}

}  // namespace
