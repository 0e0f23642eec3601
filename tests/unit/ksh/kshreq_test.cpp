// The request engine end to end over a real hub store, with an HTTP object
// of the test's own: rows landing in the store, the XML written, access and
// logon refusals, persisted requests (handle, resume, expiry with a stepped
// clock), cancellation of a waiting asynchronous request, and many threads
// at once against one hub.
#include "kshreq.h"

#include <gtest/gtest.h>
#include <sqlite3.h>

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "kshcol.h"
#include "kshhub.h"
#include "kshreqfix.h"
#include "kshtab.h"
#include "kshxmlxp.h"
#include "wsql_rc.h"

using kshtest::FakeHttp;
using kshtest::FrozenClock;
using kshtest::Record;
using kshtest::TestStore;

namespace {

bool wellFormed(const std::string& xml) {
    KSH_XML doc;
    return doc.parseMessage(xml.c_str(), static_cast<unsigned>(xml.size())) == 0;
}

// The whole SOAP path of one request: InitReq, Start, Fetch, Done, delete.
// Returns the first nonzero result.
int runRequest(WSQL_Hub* hub, Record& rec, const char* action, FakeHttp* http) {
    auto* req = new WSQL_Request(hub, http);
    int rc = req->InitReq(&rec.r, action);
    if (rc == 0) rc = req->Start();
    if (rc == 0) rc = req->Fetch(action, true);
    (void)req->Done(rc);
    delete req;
    return rc;
}

std::string tableHead(const char* table) {
    WSQL_Table* t = kshtest::catalog()->GetTable(table);
    return std::string("<TABLE name=\"") + table + "\">\n<OBJECT>" + (t != nullptr ? t->ObjectName() : "?") +
           "</OBJECT>\n";
}

class KshReq : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_NE(kshtest::catalog(), nullptr);
        setenv("KSH_REQUEST_EXPIRY", "120", 1);
        ASSERT_EQ(WSQL_Request::initialize(), 0);
        unsetenv("KSH_REQUEST_EXPIRY");
    }
    void TearDown() override {
        (void)WSQL_Request::terminate();
        EXPECT_EQ(WSQL_Request::requestCount(), 0u);
    }
};

}  // namespace

TEST_F(KshReq, SelectedRowsAreWrittenAsTableObjectDataAndRows) {
    TestStore store("REQ_ROWS");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "rows", nullptr);
    EXPECT_EQ(WSQL_Request::getRequestExpiry(), 120);

    Record rec;
    rec.soap(WSQL_METHOD_GET).table("ZAG.DISK").column("Mount_Point").column("Used_Percent").column("Space_Status");
    rec.r.attributeForm = 1;
    rec.filter("ORIGINNODE", "EQ", "beta:ZAG");
    FakeHttp http;
    ASSERT_EQ(runRequest(&hub, rec, "start", &http), 0);
    EXPECT_EQ(http.body(), tableHead("ZAG.DISK") +
                               "<DATA>\n"
                               "<ROW>\n<Mount_Point>/</Mount_Point>\n<Used_Percent dt=\"number\">50</Used_Percent>\n"
                               "<Space_Status dt=\"number\">Normal</Space_Status>\n</ROW>\n"
                               "<ROW>\n<Mount_Point>/var</Mount_Point>\n<Used_Percent dt=\"number\">97</Used_Percent>\n"
                               "<Space_Status dt=\"number\">Full</Space_Status>\n</ROW>\n"
                               "</DATA>\n</TABLE>\n");
    EXPECT_FALSE(http.isRequestErrorSet());

    // Scaled integers, 32 and 64 bits.
    ASSERT_TRUE(store.exec("INSERT INTO \"ZAG.DISK\" (ORIGINNODE, MOUNT, SIZEMB, FREEMB, USEDPCT, STATUS) "
                           "VALUES ('delta:ZAG', '/s', 12345, -5, 1, 0)"));
    WSQL_Table* disk = kshtest::catalog()->GetTable("ZAG.DISK");
    disk->GetColumn("SIZEMB")->SetScale(2);
    disk->GetColumn("FREEMB")->SetScale(3);
    Record big;
    big.soap(WSQL_METHOD_GET).table("ZAG.DISK").column("SIZEMB").column("FREEMB").filter("ORIGINNODE", "EQ", "delta:ZAG");
    FakeHttp bigHttp;
    EXPECT_EQ(runRequest(&hub, big, "start", &bigHttp), 0);
    disk->GetColumn("SIZEMB")->SetScale(0);
    disk->GetColumn("FREEMB")->SetScale(0);
    EXPECT_NE(bigHttp.body().find("<Size_MB dt=\"number\">123.45</Size_MB>\n<Free_MB dt=\"number\">-0.005</Free_MB>"),
              std::string::npos)
        << bigHttp.body();

    Record cpu;
    cpu.soap(WSQL_METHOD_GET).table("ZAG.CPU").column("BUSYPCT").filter("ORIGINNODE", "EQ", "alpha:ZAG").filter(
        "CPUID", "EQ", "0");
    FakeHttp cpuHttp;
    EXPECT_EQ(runRequest(&hub, cpu, "start", &cpuHttp), 0);
    EXPECT_NE(cpuHttp.body().find("<Busy_Percent dt=\"number\">95.12</Busy_Percent>"), std::string::npos);
}

TEST_F(KshReq, CharacterValuesWithMarkupGoIntoCDATAThatCannotEndEarly) {
    TestStore store("REQ_CDATA");
    ASSERT_EQ(store.status(), 0);
    ASSERT_TRUE(store.exec("INSERT INTO \"ZAG.PROCESS\" (ORIGINNODE, PID, NAME) VALUES "
                           "('delta:ZAG', 1, 'a<b]]>c'), ('delta:ZAG', 2, 'caf\xc3\xa9'), ('delta:ZAG', 3, 'plain')"));
    WSQL_Hub hub(store.lms(), "soap", "cdata", nullptr);
    Record rec;
    rec.soap(WSQL_METHOD_GET).table("ZAG.PROCESS").column("NAME").column("STATE").filter("ORIGINNODE", "EQ", "delta:ZAG");
    FakeHttp http;
    ASSERT_EQ(runRequest(&hub, rec, "start", &http), 0);
    std::string body = http.body();
    EXPECT_NE(body.find("<Name><![CDATA[a<b]]]]><![CDATA[>c]]></Name>"), std::string::npos) << body;
    EXPECT_NE(body.find("<Name><![CDATA[caf\xc3\xa9]]></Name>"), std::string::npos);
    EXPECT_NE(body.find("<Name>plain</Name>\n<State>Sleeping</State>"), std::string::npos);
    EXPECT_TRUE(wellFormed(body)) << body;
}

TEST_F(KshReq, InsertsUpdatesAndDeletesLandInTheStore) {
    TestStore store("REQ_WRITES");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "writes", nullptr);
    const std::string rowsOf7 = "SELECT NAME FROM \"O4SRV.TEVTDEST\" WHERE DESTID = 7";

    Record ins;
    ins.soap(WSQL_METHOD_SQL).table("O4SRV.TEVTDEST").value("DESTID", "7").value("NAME", "Ops \"bridge\" it's");
    FakeHttp insHttp;
    ASSERT_EQ(runRequest(&hub, ins, "insert", &insHttp), 0);
    EXPECT_EQ(insHttp.body(), tableHead("O4SRV.TEVTDEST") + "<DATA>\n<ROW>\n<RC>0</RC></ROW>\n</DATA>\n\n</TABLE>\n");
    EXPECT_EQ(store.query(rowsOf7), (std::vector<std::vector<std::string>>{{"Ops \"bridge\" it's"}}));

    Record up;
    up.soap(WSQL_METHOD_SQL).table("O4SRV.TEVTDEST").value("NAME", "renamed").filter("DESTID", "EQ", "7");
    FakeHttp upHttp;
    ASSERT_EQ(runRequest(&hub, up, "update", &upHttp), 0);
    EXPECT_EQ(store.query(rowsOf7), (std::vector<std::vector<std::string>>{{"renamed"}}));

    // A value that tries to widen the WHERE clause stays a value.
    size_t before = store.query("SELECT * FROM \"O4SRV.TEVTDEST\"").size();
    Record evil;
    evil.soap(WSQL_METHOD_SQL).table("O4SRV.TEVTDEST").filter("NAME", "EQ", "x\" OR \"1\"=\"1");
    FakeHttp evilHttp;
    ASSERT_EQ(runRequest(&hub, evil, "delete", &evilHttp), 0);
    EXPECT_EQ(store.query("SELECT * FROM \"O4SRV.TEVTDEST\"").size(), before);
    Record sel;
    sel.soap(WSQL_METHOD_GET).table("O4SRV.TSITDESC").column("SITNAME").filter("SITNAME", "EQ", "x\" OR \"1\"=\"1");
    FakeHttp selHttp;
    ASSERT_EQ(runRequest(&hub, sel, "start", &selHttp), 0);
    EXPECT_EQ(selHttp.body(), tableHead("O4SRV.TSITDESC") + "\n</TABLE>\n");

    Record del;
    del.soap(WSQL_METHOD_SQL).table("O4SRV.TEVTDEST").filter("DESTID", "EQ", "7");
    FakeHttp delHttp;
    ASSERT_EQ(runRequest(&hub, del, "delete", &delHttp), 0);
    EXPECT_TRUE(store.query(rowsOf7).empty());
    EXPECT_EQ(store.query("SELECT * FROM \"O4SRV.TEVTDEST\"").size(), before - 1);

    // Filters as the value list of a bound insert (threshold commands).
    Record cmd;
    cmd.soap(WSQL_METHOD_THRESHOLDS).table("O4SRV.CLACTRMT").filter("ACTSECURE", "EQ", "sysadmin").filter(
        "CLCMD", "EQ", "thresh:<?xml version=\"1.0\"?><overrides/>");
    cmd.r.type |= WSQL_TYPE_BOUNDINPUT;
    FakeHttp cmdHttp;
    ASSERT_EQ(runRequest(&hub, cmd, "insert", &cmdHttp), 0);
    EXPECT_EQ(store.query("SELECT ACTSECURE, CLCMD FROM \"O4SRV.CLACTRMT\""),
              (std::vector<std::vector<std::string>>{{"sysadmin", "thresh:<?xml version=\"1.0\"?><overrides/>"}}));
}

TEST_F(KshReq, AccessListsAndLogonFailuresRefuseBeforeAnyRowIsTouched) {
    TestStore store("REQ_ACCESS");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "access", nullptr);
    auto* readers = new LinkedList(WSQL_FreeText);
    ASSERT_EQ(readers->AppendEntry(strdup("sysadmin")), 0);
    hub.setQueryUserList(readers);
    size_t before = store.query("SELECT * FROM \"O4SRV.TSITSTSH\"").size();

    Record alert;
    alert.soap(WSQL_METHOD_ALERT).table("O4SRV.TSITSTSH").value("SITNAME", "S").value("DELTASTAT", "Y");
    FakeHttp alertHttp;
    EXPECT_EQ(runRequest(&hub, alert, "insert", &alertHttp), WSQL_BADINPUT);
    EXPECT_STREQ(alertHttp.getFaultString(), "Hub User Access List Validation Failed.");
    EXPECT_TRUE(alertHttp.isClientFault());
    EXPECT_EQ(store.query("SELECT * FROM \"O4SRV.TSITSTSH\"").size(), before);

    Record get;
    get.soap(WSQL_METHOD_GET).table("O4SRV.TSITDESC").column("SITNAME").filter("SITNAME", "EQ", "ZAG_CPU_Busy");
    FakeHttp getHttp;
    EXPECT_EQ(runRequest(&hub, get, "start", &getHttp), 0);
    EXPECT_NE(getHttp.body().find("ZAG_CPU_Busy"), std::string::npos);

    Record wrong;
    wrong.soap(WSQL_METHOD_GET, "sysadmin", "wrong").table("O4SRV.TSITDESC").column("SITNAME");
    FakeHttp wrongHttp;
    EXPECT_EQ(runRequest(&hub, wrong, "start", &wrongHttp), SQL1_ST_LOGON_PASSWORD);
    EXPECT_STREQ(wrongHttp.getFaultString(), "LMS logon validation failed.");
    EXPECT_STREQ(wrongHttp.getFaultDetail(), "sysadmin");

    WSQL_Hub nowhere("REQ_NO_SUCH_LMS", "soap", "nowhere", nullptr);
    Record lost;
    lost.soap(WSQL_METHOD_GET).table("O4SRV.TSITDESC").column("SITNAME");
    FakeHttp lostHttp;
    EXPECT_EQ(runRequest(&nowhere, lost, "start", &lostHttp), WSQL_NOTFOUND);
    EXPECT_STREQ(lostHttp.getFaultString(), "Unable to connect to LMS.");
    EXPECT_STREQ(lostHttp.getFaultDetail(), "REQ_NO_SUCH_LMS");
}

TEST_F(KshReq, QueryStringResponseEchoesItemsEscapedAndSkipsBadNames) {
    TestStore store("REQ_QUERY");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "query", nullptr);
    FakeHttp http("action=insert&table=O4SRV.TEVTDEST&sql=SECRET&note=a%3Cb&bad%3Cname=1&filter=DESTID;EQ;9&xsl=x.xsl");
    ASSERT_GT(http.parseQueryString(), 0);
    Record rec;
    rec.table("O4SRV.TEVTDEST").value("DESTID", "9").value("NAME", "nine");
    WSQL_Request req(&hub, &http);
    ASSERT_EQ(req.InitReq(&rec.r, "insert"), 0);
    ASSERT_EQ(req.Start(), 0);
    ASSERT_EQ(req.WriteResponse(), 0);
    (void)req.Done(0);

    ASSERT_FALSE(http.extra.empty());
    EXPECT_EQ(http.extra[0], (std::pair<uint32_t, std::string>{KDH1_HDR_CACHE, "cache"}));
    const std::string& sent = http.sent;
    EXPECT_NE(sent.find("<REQUEST xmlns:dt=\"urn:createsit:xml-data:datatypes\" >\n<PARMS>\n<action>insert</action>"
                        "<table>O4SRV.TEVTDEST</table><sql></sql><note>a&lt;b</note><filter>DESTID;EQ;9</filter>"
                        "<xsl>x.xsl</xsl></PARMS>"),
              std::string::npos)
        << sent;
    EXPECT_EQ(sent.find("SECRET"), std::string::npos);
    EXPECT_EQ(sent.find("bad"), std::string::npos);
    EXPECT_NE(sent.find("<DATA>\n<ROW>\n<RC>0</RC><action>insert</action><sql></sql><note>a&lt;b</note>"
                        "<DESTID>9</DESTID></ROW>\n</DATA>\n\n</TABLE>\n</REQUEST>\n"),
              std::string::npos)
        << sent;
    size_t decl = sent.find("<?xml");
    ASSERT_NE(decl, std::string::npos);
    EXPECT_TRUE(wellFormed(sent.substr(decl))) << sent;
    EXPECT_EQ(store.query("SELECT NAME FROM \"O4SRV.TEVTDEST\" WHERE DESTID = 9"),
              (std::vector<std::vector<std::string>>{{"nine"}}));
}

TEST_F(KshReq, EventsNameTheManagedObjectsOfRaisedSituations) {
    TestStore store("REQ_EVENTS");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "events", nullptr);
    Record rec;
    rec.table("O4SRV.ISITSTSH");
    for (const char* c : {"SITNAME", "ORIGINNODE", "NODE", "ATOMIZE", "LCLTMSTMP", "GBLTMSTMP", "DELTASTAT"}) rec.column(c);
    FakeHttp http;
    ASSERT_EQ(runRequest(&hub, rec, "events", &http), 0);
    EXPECT_EQ(http.body(),
              tableHead("O4SRV.ISITSTSH") +
                  "<DATA>\n"
                  "<Situation name='ZAG_Disk_Full' atom='/var' gbltime='1260115091500000' lcltime='1260115091500000' "
                  "origin='beta:ZAG' node='REMOTE_EAST' deltastat='Y'><MO name='Production hosts' state='Critical' />"
                  "<MO name='Storage east' state='Critical' /></Situation>"
                  "<Situation name='ZAG_CPU_Busy' atom='0' gbltime='1260115092000000' lcltime='1260115092000000' "
                  "origin='alpha:ZAG' node='HUB_MAIN' deltastat='Y'><MO name='Production hosts' state='Critical' />"
                  "</Situation></DATA>\n</TABLE>\n");
}

TEST_F(KshReq, PackedStatusResultsExpandIntoNestedTables) {
    FakeHttp http;
    WSQL_Hub hub("REQ_PACKED", "soap", "packed", nullptr);
    WSQL_Request req(&hub, &http);
    auto expand = [&](std::string text, int* rc) {
        WSQL_ResponseBuffer* b = http.getBuffer();
        b->clear();
        std::string work(text.size() + 1, '\0');
        *rc = req.writeResultColumn(text.data(), text.size(), work.data());
        return http.body();
    };
    int rc = -1;
    std::string disk = tableHead("ZAG.DISK");
    EXPECT_EQ(expand("*PREDICATE=A>1;DISK.MOUNT=/x;DISK.USEDPCT=5~", &rc),
              "<PREDICATE>A&gt;1</PREDICATE>\n" + disk +
                  "<DATA>\n<ROW>\n<Mount_Point>/x</Mount_Point><Used_Percent>5</Used_Percent></ROW>\n</DATA>\n</TABLE>\n");
    EXPECT_EQ(rc, 0);
    EXPECT_EQ(expand("DISK.MOUNT=/a~DISK.MOUNT=/b;CPU.CPUID=1~", &rc),
              disk + "<DATA>\n<ROW>\n<Mount_Point>/a</Mount_Point></ROW>\n<ROW>\n<Mount_Point>/b</Mount_Point>"
                     "</ROW>\n</DATA>\n</TABLE>\n" +
                  tableHead("ZAG.CPU") + "<DATA>\n<ROW>\n<CPU_ID>1</CPU_ID></ROW>\n</DATA>\n</TABLE>\n");
    EXPECT_EQ(expand("NOPE.X=1;DISK.MOUNT=/c<~", &rc),
              disk + "<DATA>\n<ROW>\n<Mount_Point>/c&lt;</Mount_Point></ROW>\n</DATA>\n</TABLE>\n");
    EXPECT_EQ(expand("*PREDICATE=A>1 and no end~", &rc), "");
    EXPECT_EQ(rc, WSQL_BADINPUT);
    EXPECT_EQ(expand("DISK.MOUNT/x~", &rc), "");
    EXPECT_EQ(rc, WSQL_BADINPUT);
    expand("DISK.MOUNT=/y;MOUNT=/x~", &rc);
    EXPECT_EQ(rc, WSQL_BADINPUT);
    EXPECT_EQ(expand("~", &rc), "");
    EXPECT_EQ(rc, 0);
}

TEST_F(KshReq, PersistedRequestsAnswerWithTheirHandleResumeAndExpire) {
    FrozenClock clock;
    TestStore store("REQ_PERSIST");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "persist", nullptr);

    Record rec;
    rec.soap(WSQL_METHOD_GET).table("ZAG.CPU").column("CPUID").filter("ORIGINNODE", "EQ", "alpha:ZAG").persist();
    FakeHttp first;
    auto* req = new WSQL_Request(&hub, &first);
    ASSERT_EQ(req->InitReq(&rec.r, "start"), 0);
    ASSERT_EQ(req->Start(), 0);
    ASSERT_EQ(req->Fetch("start", true), 0);
    unsigned handle = req->getAlias();
    ASSERT_NE(handle, 0u);
    std::string head = "<TABLE name=\"ZAG.CPU\" handle=\"" + std::to_string(handle) + "\">";
    EXPECT_EQ(first.body().rfind(head, 0), 0u) << first.body();
    EXPECT_EQ(kshtest::countOf(first.body(), "<ROW>"), 2);
    req->deactiveRequest();

    // Resumed by handle with new input values; one HTTP request at a time.
    FakeHttp second;
    WSQL_Request* again = WSQL_Request::locateRequest(handle, &second);
    ASSERT_EQ(again, req);
    EXPECT_EQ(WSQL_Request::locateRequest(handle, &second), nullptr);
    Record next;
    next.filter("ORIGINNODE", "EQ", "beta:ZAG");
    ASSERT_EQ(again->buildInput(&next.r), 0);
    ASSERT_EQ(again->Fetch("start", true), 0);
    EXPECT_EQ(second.body().rfind(head, 0), 0u);
    EXPECT_EQ(kshtest::countOf(second.body(), "<ROW>"), 1);
    again->deactiveRequest();
    EXPECT_EQ(WSQL_Request::locateRequest(0x7FFF0001u, &second), nullptr);  // never issued

    // Expiry: 120 seconds after the last fetch, on the next pass.
    clock.step(119);
    ASSERT_EQ(WSQL_Request::expiryPassNow(), 0);
    EXPECT_EQ(WSQL_Request::requestCount(), 1u);
    clock.step(1);
    ASSERT_EQ(WSQL_Request::expiryPassNow(), 0);
    EXPECT_EQ(WSQL_Request::requestCount(), 0u);
    EXPECT_EQ(WSQL_Request::locateRequest(handle, &second), nullptr);

    // An active request outlives its expiry until it is let go.
    Record kept;
    kept.soap(WSQL_METHOD_GET).table("ZAG.CPU").column("CPUID").persist();
    FakeHttp third;
    auto* busy = new WSQL_Request(&hub, &third);
    ASSERT_EQ(busy->InitReq(&kept.r, "start"), 0);
    ASSERT_EQ(busy->Start(), 0);
    ASSERT_EQ(busy->Fetch("start", true), 0);
    clock.step(500);
    ASSERT_EQ(WSQL_Request::expiryPassNow(), 0);
    EXPECT_EQ(WSQL_Request::requestCount(), 1u);
    busy->deactiveRequest();
    ASSERT_EQ(WSQL_Request::expiryPassNow(), 0);
    EXPECT_EQ(WSQL_Request::requestCount(), 0u);

    // terminate deletes what is left inactive.
    auto* left = new WSQL_Request(&hub, &third);
    ASSERT_EQ(left->InitReq(&kept.r, "start"), 0);
    left->deactiveRequest();
    EXPECT_EQ(WSQL_Request::requestCount(), 1u);
}

namespace {

// Holds the store's write lock so that an insert's open waits.
class WriteLock {
public:
    explicit WriteLock(const std::string& path) {
        if (sqlite3_open(path.c_str(), &db) == SQLITE_OK) held = sqlite3_exec(db, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr) == SQLITE_OK;
    }
    ~WriteLock() {
        release();
        sqlite3_close(db);
    }
    void release() {
        if (held) (void)sqlite3_exec(db, "ROLLBACK", nullptr, nullptr, nullptr);
        held = false;
    }
    bool held = false;

private:
    sqlite3* db = nullptr;
};

// Runs a persisted asynchronous insert on its own thread; it waits for its
// open until someone cancels it.
struct WaitingInsert {
    explicit WaitingInsert(WSQL_Hub* hub) {
        rec.soap(WSQL_METHOD_SQL).table("O4SRV.TEVTDEST").value("DESTID", "77").value("NAME", "late").persist();
        worker = std::thread([this, hub] {
            auto* req = new WSQL_Request(hub, &http);
            int rc = req->InitReq(&rec.r, "insert");
            if (rc == 0) rc = req->Start();
            request.store(req);
            if (rc == 0) rc = req->Fetch("insert", true);
            result.store(rc);
            fetched.store(true);
            (void)req->Done(rc);
            delete req;
        });
    }
    // Waits until the request waits for its open.
    bool waiting() {
        for (int i = 0; i < 5000; i++) {
            WSQL_Request* r = request.load();
            if (r != nullptr && (r->getState() & WSQL_Request::STATE_WAITING)) return true;
            if (fetched.load()) return false;
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
        return false;
    }
    bool fetchReturned() {
        for (int i = 0; i < 5000 && !fetched.load(); i++) std::this_thread::sleep_for(std::chrono::milliseconds(1));
        return fetched.load();
    }

    Record rec;
    FakeHttp http;
    std::atomic<WSQL_Request*> request{nullptr};
    std::atomic<int> result{-1};
    std::atomic<bool> fetched{false};
    std::thread worker;
};

}  // namespace

TEST_F(KshReq, StoppingCancelsARequestWaitingForItsOpen) {
    SQL1_StoreOptions slow;
    slow.busyMillis = 30000;
    TestStore store("REQ_STOP", slow);
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "stop", nullptr);
    WriteLock lock(store.path());
    ASSERT_TRUE(lock.held);
    WaitingInsert w(&hub);
    ASSERT_TRUE(w.waiting());
    ASSERT_EQ(WSQL_Request::terminate(), 0);
    ASSERT_TRUE(w.fetchReturned());
    EXPECT_EQ(w.result.load(), WSQL_CANCELLED);
    EXPECT_STREQ(w.http.getFaultString(), "Request has been cancelled");
    EXPECT_FALSE(w.http.isClientFault());
    lock.release();  // the abandoned open may finish now; its exit finds no request
    w.worker.join();
    EXPECT_EQ(WSQL_Request::requestCount(), 0u);
}

TEST_F(KshReq, TheExpiryThreadCancelsAnExpiredRequestWaitingForItsOpen) {
    FrozenClock clock;
    SQL1_StoreOptions slow;
    slow.busyMillis = 30000;
    TestStore store("REQ_EXPIRE_WAIT", slow);
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "expwait", nullptr);
    WriteLock lock(store.path());
    ASSERT_TRUE(lock.held);
    WaitingInsert w(&hub);
    ASSERT_TRUE(w.waiting());
    ASSERT_EQ(WSQL_Request::expiryPassNow(), 0);  // not expired yet
    EXPECT_FALSE(w.fetched.load());
    clock.step(121);
    ASSERT_EQ(WSQL_Request::expiryPassNow(), 0);
    ASSERT_TRUE(w.fetchReturned());
    EXPECT_EQ(w.result.load(), WSQL_CANCELLED);
    EXPECT_STREQ(w.http.getFaultString(), "Request has been cancelled");
    lock.release();
    w.worker.join();
}

TEST_F(KshReq, ManyThreadsRunMixedRequestsAgainstOneHub) {
    TestStore store("REQ_STRESS");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "stress", nullptr);
    const char* env = std::getenv("KSHREQ_STRESS_SECONDS");
    int seconds = env != nullptr ? std::atoi(env) : 3;
    auto until = std::chrono::steady_clock::now() + std::chrono::seconds(seconds > 0 ? seconds : 3);
    std::atomic<int> failures{0}, inserts{0}, operations{0}, cancelled{0};
    std::atomic<bool> stop{false};

    auto work = [&](int t) {
        for (int i = 0; std::chrono::steady_clock::now() < until; i++) {
            FakeHttp http;
            Record rec;
            int rc = 0;
            switch ((t + i) % 5) {
            case 0:
                rec.soap(WSQL_METHOD_GET).table("ZAG.CPU").column("Busy_Percent").column("CPU_ID");
                rec.r.attributeForm = 1;
                rec.filter("ORIGINNODE", "EQ", "alpha:ZAG");
                rc = runRequest(&hub, rec, "start", &http);
                if (rc == 0 && kshtest::countOf(http.body(), "<ROW>") != 2) rc = -100;
                break;
            case 1:
                rec.table("ZAG.DISK").column("MOUNT").parma("NODELIST", "*ALL");
                rec.r.type = WSQL_TYPE_ALLTARGETS;
                rc = runRequest(&hub, rec, "start", &http);
                break;
            case 2:
                rec.soap(WSQL_METHOD_SQL)
                    .table("O4SRV.TEVTDEST")
                    .value("DESTID", std::to_string(1000 + t * 100000 + i))
                    .value("NAME", "t" + std::to_string(t));
                rc = runRequest(&hub, rec, "insert", &http);
                if (rc == 0) inserts++;
                break;
            case 3: {
                rec.soap(WSQL_METHOD_GET).table("ZAG.CPU").column("CPUID").filter("ORIGINNODE", "EQ", "beta:ZAG").persist();
                auto* req = new WSQL_Request(&hub, &http);
                rc = req->InitReq(&rec.r, "start");
                if (rc == 0) rc = req->Start();
                if (rc == 0) rc = req->Fetch("start", true);
                if (rc != 0) {
                    (void)req->Done(rc);
                    delete req;
                    break;
                }
                unsigned h = req->getAlias();
                req->deactiveRequest();
                // Resumed, unless the expiry thread took it meanwhile.
                FakeHttp later;
                WSQL_Request* again = WSQL_Request::locateRequest(h, &later);
                if (again != nullptr) {
                    rc = again->Fetch("start", true);
                    if (i % 7 == 0 && rc == 0) {  // as the dispatcher does: kept only when all went well
                        again->deactiveRequest();  // left for expiry or stop
                    } else {
                        (void)again->Done(rc);
                        delete again;
                    }
                }
                break;
            }
            default:
                rec.table("O4SRV.ISITSTSH").column("SITNAME").column("ORIGINNODE").column("DELTASTAT");
                rc = runRequest(&hub, rec, "events", &http);
                break;
            }
            // A persisted request's open may outlast its expiry on the
            // racing clock: then it is cancelled, which is its due.
            if (rc == WSQL_CANCELLED && (t + i) % 5 == 3) {
                cancelled++;
                rc = 0;
            }
            if (rc != 0) {
                failures++;
                ADD_FAILURE() << "thread " << t << " op " << (t + i) % 5 << " rc " << rc << " "
                              << (http.getFaultString() != nullptr ? http.getFaultString() : "");
            }
            operations++;
        }
    };
    // Expiry passes run meanwhile on a stepped clock.
    FrozenClock clock;
    std::thread expirer([&] {
        while (!stop.load()) {
            clock.step(40);
            (void)WSQL_Request::expiryPassNow();
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
        }
    });
    std::vector<std::thread> threads;
    for (int t = 0; t < 16; t++) threads.emplace_back(work, t);
    for (auto& th : threads) th.join();
    stop.store(true);
    expirer.join();
    EXPECT_EQ(failures.load(), 0);
    EXPECT_GT(operations.load(), 16);
    auto rows = store.query("SELECT COUNT(*) FROM \"O4SRV.TEVTDEST\" WHERE DESTID >= 1000");
    ASSERT_EQ(rows.size(), 1u);
    EXPECT_EQ(std::stoi(rows[0][0]), inserts.load());
    ASSERT_EQ(WSQL_Request::terminate(), 0);
    EXPECT_EQ(WSQL_Request::requestCount(), 0u);
}
