// Requests through the entry points WSQL_ParseRequest and
// WSQL_ParsePostRequest, against a real hub store and the real request
// engine and catalog, with an HTTP double that captures the answer. The SQL
// sent is read back from the engine's trace; the rows are read from the
// store with SQLite directly.
#include <gtest/gtest.h>
#include <sqlite3.h>
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
#include "kshlst.h"
#include "kshprs.h"
#include "kshprs_double.h"
#include "kshreq.h"
#include "kshutil.h"
#include "ras1/ras1.h"
#include "sql1/sql1.h"

namespace {

using Rows = std::vector<std::vector<std::string>>;

// 2026-03-04 05:06:07 local time, frozen.
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
const char kStamp[] = "1260304050607000";

std::string sourceDir() {
    const char* s = getenv("CSIT_SOURCE_DIR");
    return s ? s : ".";
}

std::string creds(const char* user = "ops", const char* password = "secret") {
    return std::string("<userid>") + user + "</userid><password>" + password + "</password>";
}

bool contains(const std::string& text, const std::string& part) { return text.find(part) != std::string::npos; }

class KshPrs : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        setenv("CT_ATTRLIB", (sourceDir() + "/data/attrlib").c_str(), 1);
        setenv("SQL1_PWHASH", "min", 1);
        ASSERT_NE(WSQL_GetCatalog(), nullptr);
        ASSERT_EQ(WSQL_Request::initialize(), 0);
    }
    static void TearDownTestSuite() { WSQL_Request::terminate(); }

    void SetUp() override {
        char tmpl[] = "/tmp/kshprs_test.XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        dir = tmpl;
        store = dir + "/hub.db";
        static int serial = 0;
        lms = "PRSHUB" + std::to_string(++serial);
        createStore(1);
        previousClock = BSS1_SetClock(frozenNow);
        traceFile = dir + "/trace.log";
        RAS1_Configure("ERROR,kshreqsql:STATE", traceFile.c_str());
        hub = std::make_unique<WSQL_Hub>(lms.c_str(), "soap", "soap", nullptr);
        setenv("KSH_DIRECTORY", dir.c_str(), 1);
        std::ofstream(dir + "/index.htm") << "<html>front page</html>";
    }
    void TearDown() override {
        hub.reset();
        RAS1_Configure(nullptr, nullptr);
        BSS1_SetClock(previousClock);
        std::string cmd = "rm -rf '" + dir + "'";
        (void)system(cmd.c_str());
    }

    void createStore(int validate, int nls = -1) {
        SQL1_StoreOptions o;
        std::string data = sourceDir() + "/data/store";
        o.dataDir = data.c_str();
        o.adminPassword = "adminpw";
        o.minimalHash = 1;
        o.validate = validate;
        o.nls = nls;
        ASSERT_EQ(SQL1_RegisterServer(lms.c_str(), store.c_str(), &o), 0);
        ASSERT_EQ(SQL1_SetUser(store.c_str(), "ops", "secret", 1, 1), 0);
        ASSERT_EQ(SQL1_SetUser(store.c_str(), "reader", "readpw", 1, 1), 0);
    }

    std::unique_ptr<PrsHttp> post(const std::string& doc) {
        auto http = std::make_unique<PrsHttp>("", doc);
        lastRc = WSQL_ParsePostRequest(http.get(), hub.get());
        return http;
    }
    std::unique_ptr<PrsHttp> get(const std::string& query) {
        auto http = std::make_unique<PrsHttp>(query);
        lastRc = WSQL_ParseRequest(http.get(), hub.get());
        return http;
    }

    Rows rows(const std::string& sql) {
        Rows out;
        sqlite3* db = nullptr;
        EXPECT_EQ(sqlite3_open_v2(store.c_str(), &db, SQLITE_OPEN_READONLY, nullptr), SQLITE_OK);
        sqlite3_stmt* st = nullptr;
        EXPECT_EQ(sqlite3_prepare_v2(db, sql.c_str(), -1, &st, nullptr), SQLITE_OK) << sql << sqlite3_errmsg(db);
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
    size_t count(const std::string& table, const std::string& where = "1") {
        return std::stoul(rows("SELECT COUNT(*) FROM \"" + table + "\" WHERE " + where)[0][0]);
    }
    // A fingerprint of the tables requests write, to show that nothing did.
    std::string storeState() {
        std::string s;
        for (const char* t : {"O4SRV.TSITSTSH", "O4SRV.TOBJACCL", "O4SRV.CLACTLCL", "O4SRV.CLACTRMT", "O4SRV.TNAME"})
            s += std::to_string(count(t)) + "/";
        return s;
    }

    // The statements the engine built since the last call.
    std::vector<std::string> sqlSent() {
        std::ifstream in(traceFile);
        std::vector<std::string> out;
        std::string line;
        size_t n = 0;
        while (std::getline(in, line)) {
            for (const char* mark : {"Using SQL: ", "Using pre-built SQL: "}) {
                size_t at = line.find(mark);
                if (at != std::string::npos && n++ >= seenSql) out.push_back(line.substr(at + strlen(mark)));
            }
        }
        seenSql = n;
        return out;
    }
    std::string lastSql() {
        auto all = sqlSent();
        return all.empty() ? "(none)" : all.back();
    }

    std::string dir, store, lms, traceFile;
    std::unique_ptr<WSQL_Hub> hub;
    BSS1_Clock previousClock = nullptr;
    int lastRc = -1;
    size_t seenSql = 0;
};

// The whole body of a successful SOAP response, between the envelope.
std::string soapBody(const PrsHttp& h) {
    size_t at = h.sent.find("<SOAP-CHK:Success");
    size_t from = at == std::string::npos ? std::string::npos : h.sent.find('>', at);
    size_t to = h.sent.find("</SOAP-CHK:Success>");
    if (from == std::string::npos || to == std::string::npos) return "(no success envelope: " + h.sent + ")";
    return h.sent.substr(from + 1, to - from - 1);
}

std::string soap(const std::string& method, const std::string& inner) {
    return soapEnvelope("<" + method + ">" + inner + "</" + method + ">");
}

}  // namespace

TEST_F(KshPrs, QueryStringActionsRunAgainstTheStore) {
    auto start = get("action=start&table=O4SRV.TSITDESC&column=SITNAME&column=REEV_TIME&filter1=SITNAME;EQ;ZAG_CPU_Busy");
    EXPECT_EQ(lastRc, 0);
    EXPECT_EQ(lastSql(), "SELECT SITNAME,REEV_TIME FROM O4SRV.TSITDESC WHERE  SITNAME = \"ZAG_CPU_Busy\"");
    ASSERT_FALSE(start->headers.empty());
    EXPECT_EQ(start->headers[0].media, KDH1_MEDIA_XML);
    EXPECT_TRUE(contains(start->sent, "<REQUEST xmlns:dt="));
    EXPECT_TRUE(contains(start->sent, "<TABLE name=\"O4SRV.TSITDESC\">"));
    EXPECT_TRUE(contains(start->sent, "<ROW>\n<SITNAME>ZAG_CPU_Busy</SITNAME>\n")) << start->sent;
    EXPECT_TRUE(contains(start->sent, "</TABLE>\n</REQUEST>\n"));

    auto insert = get("action=insert&table=O4SRV.TNAME&filter1=ID;EQ;NEWSIT&filter2=FULLNAME;EQ;A%20long%20name");
    EXPECT_EQ(lastRc, 0);
    EXPECT_TRUE(contains(insert->sent, "<RC>0</RC>")) << insert->sent;
    EXPECT_EQ(rows("SELECT FULLNAME FROM \"O4SRV.TNAME\" WHERE ID = 'NEWSIT'"), Rows{{"A long name"}});

    // A query string carries no values to set: an update is refused.
    auto update = get("action=update&table=O4SRV.TNAME&filter1=ID;EQ;NEWSIT&column=FULLNAME");
    EXPECT_NE(lastRc, 0);
    EXPECT_TRUE(contains(update->sent, "<TD>25</TD>")) << update->sent;
    EXPECT_TRUE(contains(update->sent, "Unable to start request."));
    EXPECT_EQ(rows("SELECT FULLNAME FROM \"O4SRV.TNAME\" WHERE ID = 'NEWSIT'"), Rows{{"A long name"}});

    get("action=delete&table=O4SRV.TNAME&filter1=ID;EQ;NEWSIT");
    EXPECT_EQ(lastRc, 0);
    EXPECT_EQ(lastSql(), "DELETE FROM O4SRV.TNAME AT (\"*HUB\") WHERE  ID = \"NEWSIT\"");
    EXPECT_EQ(count("O4SRV.TNAME", "ID = 'NEWSIT'"), 0u);

    // Raised situations with the managed objects that cover their origin.
    auto events = get("action=events&table=O4SRV.ISITSTSH");
    EXPECT_EQ(lastRc, 0);
    EXPECT_TRUE(contains(events->sent, "<Situation name='ZAG_Disk_Full' atom='/var'")) << events->sent;
    EXPECT_TRUE(contains(events->sent, "origin='beta:ZAG'"));
    EXPECT_TRUE(contains(events->sent, "<MO name='Storage east' state='Critical' />"));
    EXPECT_FALSE(contains(events->sent, "deltastat='N'"));
}

TEST_F(KshPrs, QueryStringRefusalsAnswerWithTheirPages) {
    // Actions are matched exactly.
    auto wrongCase = get("action=Start&table=O4SRV.TSITDESC");
    EXPECT_EQ(lastRc, 0);
    ASSERT_EQ(wrongCase->headers.size(), 1u);
    EXPECT_EQ(wrongCase->headers[0].status, KDH1_STC_BADREQUEST);
    EXPECT_EQ(wrongCase->headers[0].media, KDH1_MEDIA_HTML);
    EXPECT_EQ(wrongCase->sent,
              "<HTML><TITLE>Error</TITLE><BODY><H1>Error 400</H1><P>Invalid or missing action in query string.</P>"
              "</BODY></HTML>");
    auto noAction = get("table=O4SRV.TSITDESC");
    EXPECT_EQ(noAction->headers[0].status, KDH1_STC_BADREQUEST);

    std::string tenParma;
    for (int i = 0; i < 11; ++i) tenParma += "&parma=P" + std::to_string(i) + ";v";
    const struct {
        std::string query;
        int code;
    } refused[] = {
        {"action=start&column=SITNAME", 1},                                // no table
        {"action=start&table=O4SRV.TSITDESC&filter1=SITNAME;EQ", 1},       // malformed filter
        {"action=start&table=O4SRV.TSITDESC&parma=NOVALUE", 1},            // malformed parma
        {"action=start&table=O4SRV.TSITDESC" + tenParma, 1},               // eleven parma
        {"action=start&table=O4SRV.TSITDESC%22%3BDROP&column=SITNAME", 5},  // not a plain name
    };
    for (const auto& r : refused) {
        std::string before = storeState();
        auto page = get(r.query);
        EXPECT_EQ(lastRc, r.code) << r.query;
        EXPECT_TRUE(contains(page->sent, "<TD>25</TD><TD>" + std::to_string(r.code) +
                                             "</TD><TD>Unable to start request.</TD>"))
            << r.query << page->sent;
        EXPECT_EQ(storeState(), before);
    }
    EXPECT_TRUE(sqlSent().empty());

    // A quoted value stays a value: it matches no situation.
    auto injected = get("action=start&table=O4SRV.TSITDESC&column=SITNAME&filter1=SITNAME;EQ;x%22%20OR%20%221%22%3D%221");
    EXPECT_EQ(lastRc, 0);
    EXPECT_FALSE(contains(injected->sent, "<ROW>")) << injected->sent;
}

TEST_F(KshPrs, LoginActionServesTheFileOrTheRefusalPage) {
    auto ok = get("action=login&userid=ops&password=secret");
    EXPECT_EQ(lastRc, 0);
    EXPECT_TRUE(contains(ok->sent, "<html>front page</html>")) << ok->sent;

    const char* badOnes[] = {"action=login&userid=ops&password=wrong",
                             "action=login&USERID=nosuchuser&Password=secret",
                             "action=login&userid=abcdefghijklmnopq&password=secret"};
    for (const char* q : badOnes) {
        auto bad = get(q);
        EXPECT_EQ(lastRc, 0) << q;
        ASSERT_EQ(bad->headers.size(), 1u) << q;
        EXPECT_EQ(bad->headers[0].status, KDH1_STC_UNAUTHORIZED);
        EXPECT_EQ(bad->headers[0].media, KDH1_MEDIA_HTML);
        EXPECT_TRUE(contains(bad->sent, "<H1>Error 401</H1> <P>Invalid user ID or password.</P>")) << q;
        EXPECT_FALSE(contains(bad->sent, "front page"));
    }
    // Another item, or a missing value, makes the request invalid: nothing
    // is written.
    for (const char* q : {"action=login&userid=ops&password=secret&extra=1", "action=login&userid=ops"}) {
        auto invalid = get(q);
        EXPECT_EQ(lastRc, 1) << q;
        EXPECT_TRUE(invalid->sent.empty()) << q;
        EXPECT_TRUE(invalid->headers.empty()) << q;
    }
}

TEST_F(KshPrs, ValidatingHubRefusesSoapRequestsWithoutGoodCredentials) {
    const std::string alert = "<name>ZAG_CPU_Busy</name><source>HUB_MAIN</source>";
    const size_t before = count("O4SRV.TSITSTSH");

    auto none = post(soap("CT_Alert", alert));
    EXPECT_TRUE(none->isClientFault());
    EXPECT_EQ(none->fault(), "Missing Userid or Password for LMS validation.");
    EXPECT_TRUE(contains(none->sent, "<faultcode>SOAP-ENV:Client</faultcode>"));
    EXPECT_EQ(hub->getValidate(), WSQL_VALIDATE_ON);

    auto wrong = post(soap("CT_Alert", alert + creds("ops", "wrong")));
    EXPECT_TRUE(wrong->isClientFault());
    EXPECT_EQ(wrong->fault(), "LMS logon validation failed.");
    EXPECT_EQ(wrong->detail(), "ops");
    EXPECT_FALSE(contains(wrong->sent, "wrong"));  // the password is never echoed

    auto unknown = post(soap("CT_Get", "<object>ZAG_CPU</object>" + creds("nobody", "x")));
    EXPECT_EQ(unknown->fault(), "LMS logon validation failed.");
    EXPECT_EQ(count("O4SRV.TSITSTSH"), before);

    auto good = post(soap("CT_Alert", alert + creds()));
    EXPECT_FALSE(good->isRequestErrorSet()) << good->fault();
    EXPECT_EQ(count("O4SRV.TSITSTSH"), before + 1);
}

TEST_F(KshPrs, HubUserListsLimitWhoMayQueryAndUpdate) {
    auto* query = new LinkedList(WSQL_FreeText);
    auto* update = new LinkedList(WSQL_FreeText);
    ASSERT_EQ(query->AppendEntry(WSQL_Strdup("reader")), 0);
    ASSERT_EQ(update->AppendEntry(WSQL_Strdup("ops")), 0);
    hub->setQueryUserList(query);
    hub->setUpdateUserList(update);
    const std::string alert = "<name>ZAG_CPU_Busy</name><source>HUB_MAIN</source>";
    const size_t before = count("O4SRV.TSITSTSH");

    auto readerGet = post(soap("CT_Get", "<object>ZAG_CPU</object><attribute>Busy_Percent</attribute>" +
                                             creds("reader", "readpw")));
    EXPECT_FALSE(readerGet->isRequestErrorSet()) << readerGet->fault();
    auto readerAlert = post(soap("CT_Alert", alert + creds("reader", "readpw")));
    EXPECT_EQ(readerAlert->fault(), "Hub User Access List Validation Failed.");
    EXPECT_EQ(count("O4SRV.TSITSTSH"), before);

    ASSERT_EQ(SQL1_SetUser(store.c_str(), "stranger", "pw", 1, 1), 0);
    auto strangerGet = post(soap("CT_Get", "<object>ZAG_CPU</object>" + creds("stranger", "pw")));
    EXPECT_EQ(strangerGet->fault(), "Hub User Access List Validation Failed.");

    auto opsAlert = post(soap("CT_Alert", alert + creds()));
    EXPECT_FALSE(opsAlert->isRequestErrorSet()) << opsAlert->fault();
    EXPECT_EQ(count("O4SRV.TSITSTSH"), before + 1);
}

TEST_F(KshPrs, CtSqlRunsTheCallersStatement) {
    auto sel = post(soap("CT_SQL", "<table>O4SRV.TSITDESC</table><sql>SELECT SITNAME,REEV_TIME FROM O4SRV.TSITDESC "
                                   "WHERE SITNAME = \"ZAG_Disk_Full\"</sql>" +
                                       creds()));
    EXPECT_EQ(lastRc, 0) << sel->fault();
    EXPECT_EQ(lastSql(), "SELECT SITNAME,REEV_TIME FROM O4SRV.TSITDESC WHERE SITNAME = \"ZAG_Disk_Full\"");
    std::string body = soapBody(*sel);
    EXPECT_TRUE(contains(body, "<TABLE name=\"O4SRV.TSITDESC\">\n<OBJECT>Situation_Definition</OBJECT>\n<DATA>\n<ROW>\n"
                               "<SITNAME>ZAG_Disk_Full</SITNAME>\n"))
        << body;
    EXPECT_TRUE(contains(body, "</ROW>\n</DATA>\n</TABLE>\n"));

    auto ins = post(soap("CT_SQL", "<table>O4SRV.TNAME</table><sql><![CDATA[INSERT INTO O4SRV.TNAME (ID, FULLNAME) "
                                   "VALUES (\"S_0001\", N\"Long \"\"quoted\"\" name\")]]></sql>" +
                                       creds()));
    EXPECT_EQ(lastRc, 0) << ins->fault();
    EXPECT_TRUE(contains(soapBody(*ins), "</TABLE>"));
    EXPECT_EQ(rows("SELECT FULLNAME FROM \"O4SRV.TNAME\" WHERE ID = 'S_0001'"), Rows{{"Long \"quoted\" name"}});
}

TEST_F(KshPrs, CtGetSelectsColumnsAttributesFiltersAndTargets) {
    // Attributes over all managing servers that run the application; the
    // agents behind the offline one and behind the others all answer.
    auto all = post(soap("CT_Get", "<object>ZAG_CPU</object><target>*ALL</target><attribute>ZAG_CPU.Origin_Node"
                                   "</attribute><attribute>Busy_Percent</attribute>"
                                   "<afilter>Busy_Percent;GT;5000</afilter>" +
                                       creds()));
    EXPECT_EQ(lastRc, 0) << all->fault();
    EXPECT_EQ(lastSql(), "SELECT ORIGINNODE,BUSYPCT FROM ZAG.CPU AT (\"*HUB\",\"REMOTE_EAST\")   WHERE  "
                         "SYSTEM.PARMA(\"NODELIST\", \"*ALL\", 4) AND  BUSYPCT > 5000");
    std::string body = soapBody(*all);
    EXPECT_TRUE(contains(body, "<OBJECT>ZAG_CPU</OBJECT>"));
    EXPECT_TRUE(contains(body, "<Origin_Node>alpha:ZAG</Origin_Node>\n<Busy_Percent dt=\"number\">95.12</Busy_Percent>"))
        << body;
    EXPECT_EQ(body.find("<ROW>"), body.rfind("<ROW>"));  // one row only

    // Without a target the request goes to all managing servers too.
    post(soap("CT_Get", "<table>ZAG.DISK</table><column>ORIGINNODE</column><column>MOUNT</column>"
                        "<filter>USEDPCT;GE;95</filter><parma>TIMEOUT;30</parma>" +
                            creds()));
    EXPECT_EQ(lastSql(), "SELECT ORIGINNODE,MOUNT FROM ZAG.DISK AT (\"*HUB\",\"REMOTE_EAST\")   WHERE  "
                         "SYSTEM.PARMA(\"TIMEOUT\", \"30\", 2) AND SYSTEM.PARMA(\"NODELIST\", \"*ALL\", 4) AND  "
                         "USEDPCT >= 95");

    // History with the write time, and a date/time variable in a filter
    // (the frozen date is 2026-03-04; every history row is older).
    auto hist = post(soap("CT_Get", "<object>ZAG_CPU</object><target>*ALL</target><history>Y</history>"
                                    "<attribute>Write_Time</attribute><attribute>Busy_Percent</attribute>"
                                    "<afilter>Origin_Node;EQ;alpha:ZAG</afilter>"
                                    "<afilter>Write_Time;LT;1$yymmdd$000000000</afilter>" +
                                        creds()));
    EXPECT_EQ(lastRc, 0) << hist->fault();
    std::string sql = lastSql();
    EXPECT_TRUE(contains(sql, " HISTORY() WHERE ")) << sql;
    EXPECT_TRUE(contains(sql, "WRITETIME < \"1260304000000000\"")) << sql;
    body = soapBody(*hist);
    EXPECT_TRUE(contains(body, "<Write_Time>1260115081500000</Write_Time>")) << body;
    size_t rowsWritten = 0;
    for (size_t at = body.find("<ROW>"); at != std::string::npos; at = body.find("<ROW>", at + 1)) ++rowsWritten;
    EXPECT_EQ(rowsWritten, 3u);

    // A quoted value stays a value.
    auto injected = post(soap("CT_Get", "<table>O4SRV.TSITDESC</table><column>SITNAME</column>"
                                        "<filter>SITNAME;EQ;x\" OR \"1\"=\"1</filter>" +
                                            creds()));
    EXPECT_EQ(lastRc, 0) << injected->fault();
    EXPECT_FALSE(contains(soapBody(*injected), "<ROW>"));
}

TEST_F(KshPrs, StatusMethodsWriteTheStatusHistory) {
    // LOCFLAG is a fixed character column: its two blanks are read trimmed.
    const std::string q = "SELECT ORIGINNODE, ATOMIZE, TYPE, NODE, DELTASTAT, RESULTS, LCLTMSTMP, GBLTMSTMP, RTRIM(LOCFLAG) "
                          "FROM \"O4SRV.TSITSTSH\" WHERE SITNAME = ";

    auto alert = post(soap("CT_Alert", "<name>New_Sit</name><source>HUB_MAIN</source>" + creds()));
    EXPECT_EQ(lastRc, 0) << alert->fault();
    EXPECT_TRUE(contains(soapBody(*alert), "<RC>0</RC>"));
    EXPECT_EQ(rows(q + "'New_Sit'"),
              (Rows{{"HUB_MAIN", "", "0", "HUB_MAIN", "Y", "USR=ops;DATA=No data was provided~", kStamp, kStamp, ""}}));

    // The acknowledgement copies each raised row with the new status.
    auto ack = post(soap("CT_Acknowledge", "<name>ZAG_Disk_Full</name><source>beta:ZAG</source><expire>3600</expire>" +
                                               creds()));
    EXPECT_EQ(lastRc, 0) << ack->fault();
    std::string stamps = std::string(kStamp) + ";LTM=" + kStamp + ";ATM=" + kStamp;
    EXPECT_EQ(rows(q + "'ZAG_Disk_Full' AND DELTASTAT = 'A'"),
              (Rows{{"beta:ZAG", "/var", "0", "REMOTE_EAST", "A",
                     "USR=ops;IUS=ops;GTM=" + stamps + ";EXP=3600~", kStamp, "3600", ""}}));

    // Resurfacing needs the acknowledged row; a reset needs a raised one.
    post(soap("CT_Resurface", "<name>ZAG_Disk_Full</name><data>back again</data>" + creds()));
    EXPECT_EQ(rows(q + "'ZAG_Disk_Full' AND DELTASTAT = 'E'"),
              (Rows{{"beta:ZAG", "/var", "0", "REMOTE_EAST", "E", "USR=ops;DATA=back again~", kStamp, kStamp, ""}}));
    const size_t before = count("O4SRV.TSITSTSH");
    post(soap("CT_Resurface", "<name>New_Sit</name>" + creds()));  // nothing acknowledged: nothing to copy
    EXPECT_EQ(count("O4SRV.TSITSTSH"), before);
    post(soap("CT_Reset", "<name>ZAG_Disk_Full</name><item>/var</item>" + creds()));
    EXPECT_EQ(count("O4SRV.TSITSTSH", "SITNAME = 'ZAG_Disk_Full' AND DELTASTAT = 'N'"), 1u);

    // Data items pack a predicate; quotes in the name stay in the name.
    auto items = post(soap("CT_Alert", "<name>Quo\"te</name><source>HUB_MAIN</source><data>"
                                       "<ZAG_DISK.Mount_Point>/tmp</ZAG_DISK.Mount_Point></data>" +
                                           creds()));
    EXPECT_EQ(lastRc, 0) << items->fault();
    EXPECT_EQ(rows("SELECT RESULTS FROM \"O4SRV.TSITSTSH\" WHERE SITNAME = 'Quo\"te'"),
              Rows{{"*PREDICATE=SYSTEM.PARMA(\"SITNAME\", \"Quo\"\"te\", 6);DISK.MOUNT=/tmp~"}});
}

TEST_F(KshPrs, ActivationWtoAndThresholdsInsertTheirRows) {
    post(soap("CT_Deactivate", "<name>ZAG_CPU_Busy</name><type>situation</type><source>alpha:ZAG</source>" + creds()));
    EXPECT_EQ(lastRc, 0);
    EXPECT_EQ(rows("SELECT OBJCLASS, NODEL, LSTUSRPRF, OPERATION, QIBCLASSID FROM \"O4SRV.TOBJACCL\" "
                   "WHERE OBJNAME = 'ZAG_CPU_Busy' AND OPERATION = 'T'"),
              (Rows{{"5140", "alpha:ZAG", "ops", "T", "5625"}}));
    post(soap("CT_Activate", "<name>Pol1</name><type>policy</type>" + creds()));
    EXPECT_EQ(rows("SELECT OBJCLASS, NODEL, OPERATION FROM \"O4SRV.TOBJACCL\" WHERE OBJNAME = 'Pol1'"),
              (Rows{{"5130", "HUB_MAIN", "R"}}));

    auto wto = post(soap("CT_WTO", "<data>say \"hello\"; then stop</data><category>ops</category>" + creds()));
    EXPECT_EQ(lastRc, 0) << wto->fault();
    EXPECT_EQ(rows("SELECT ACTSECURE, CLCMD FROM \"O4SRV.CLACTLCL\""),
              (Rows{{"ops", "message:severity= ;Category=ops;message=say \"hello\"; then stop"}}));

    const std::string head = "<target>alpha:ZAG</target><name>ZAG_Disk_Full</name>"
                             "<thresholdname>ZAG_DISK.Used_Percent</thresholdname><thresholdvalue>80</thresholdvalue>";
    const std::string sit = "thresh:<?xml version=\"1.0\"?><overrides><situation name=\"ZAG_Disk_Full\">";
    const struct {
        std::string extra;
        std::string command;
    } cases[] = {
        {"", sit + "<threshold column=\"USEDPCT\">80</threshold></situation></overrides>"},
        {"<thresholddefault>90</thresholddefault>",
         sit + "<threshold column=\"USEDPCT\">80</threshold><default><threshold column=\"USEDPCT\">90</threshold>"
               "</default></situation></overrides>"},
        {"<keyname>ZAG_DISK.Mount_Point</keyname><keyvalue>/var</keyvalue>",
         sit + "<key column=\"MOUNT\" value=\"/var\"><threshold column=\"USEDPCT\">80</threshold></key></situation>"
               "</overrides>"},
        {"<keyname>ZAG_DISK.Mount_Point</keyname><keyvalue>/var</keyvalue><thresholddefault>90</thresholddefault>",
         sit + "<key column=\"MOUNT\" value=\"/var\"><threshold column=\"USEDPCT\">80</threshold></key><default>"
               "<threshold column=\"USEDPCT\">90</threshold></default></situation></overrides>"},
    };
    Rows expected;
    for (const auto& c : cases) {
        auto thr = post(soap("CT_Thresholds", head + c.extra + creds()));
        EXPECT_EQ(lastRc, 0) << c.extra << thr->fault();
        expected.push_back({"ops", c.command});
    }
    post(soap("CT_Thresholds", "<target>t</target><overrides><situation name=\"S\"/></overrides>" + creds()));
    expected.push_back({"ops", "thresh:<?xml version=\"1.0\"?><overrides><situation name=\"S\"></situation></overrides>"});
    EXPECT_EQ(rows("SELECT ACTSECURE, CLCMD FROM \"O4SRV.CLACTRMT\" ORDER BY rowid"), expected);
}

TEST_F(KshPrs, EveryClientRefusalAnswersWithItsFault) {
    const std::string c = creds();
    const std::string name = "<name>ZAG_CPU_Busy</name>";
    const std::string thr = "<target>t</target>" + name;
    const struct {
        std::string doc;
        const char* fault;
    } refused[] = {
        {"<CT_Get><table>", "XML parse error"},
        {"<SOAP-ENV:Envelope><x/></SOAP-ENV:Envelope>", "Invalid SOAP message"},
        {soap("CT_Get", "<hub>elsewhere</hub>" + c), "Invalid Hub Alias."},
        {soap("CT_Login", c), "Invalid or missing CT method in string."},
        {soapEnvelope("<NotAMethod/>"), "Invalid or missing CT method in string."},
        {soap("CT_Alert", name + c), "Invalid or missing source name for CT_Alert."},
        {soap("CT_Reset", name + "<results>r</results>" + c), "Missing timestamp for results in CT status method."},
        {soap("CT_Reset", name + "<results>r</results><timestamp>1</timestamp><data>d</data>" + c),
         "Results and data cannot both be specified in CT status method."},
        {soap("CT_Acknowledge", name + "<expire>0</expire>" + c), "Invalid CT_Alert expire value."},
        {soap("CT_Reset", c), "Invalid or missing object name."},
        {soap("CT_Activate", name + c), "Invalid or missing object name."},
        {soap("CT_WTO", c), "Must specify data for CT WTO method"},
        {soap("CT_Thresholds", name + c), "Must specify a target with CT Thresholds method"},
        {soap("CT_Thresholds", "<target>t</target>" + c), "Must specify a situation name with CT Thresholds method"},
        {soap("CT_Thresholds", thr + c), "Must specify Threshold Name/Value with CT Thresholds method."},
        {soap("CT_Thresholds", thr + "<thresholdname>ZAG_DISK.Used_Percent</thresholdname><thresholdvalue>1"
                                     "</thresholdvalue><keyname>ZAG_DISK.Mount_Point</keyname>" + c),
         "Must specify a key value with key name for CT Thresholds method"},
        {soap("CT_Thresholds", thr + "<thresholdname>ZAG_DISK.Used_Percent</thresholdname><thresholdvalue>1"
                                     "</thresholdvalue><keyvalue>v</keyvalue>" + c),
         "Must specify a key name with key value for CT Thresholds method"},
        {soap("CT_Thresholds", thr + "<thresholdname>NOPE.X</thresholdname><thresholdvalue>1</thresholdvalue>" + c),
         "Missing or Invalid Object for key, threshold Name for CT_Thresholds method."},
        {soap("CT_Thresholds", thr + "<thresholdname>ZAG_DISK.X</thresholdname><thresholdvalue>1</thresholdvalue>" + c),
         "Invalid thresholdname for CT_Thresholds method."},
        {soap("CT_Alert", name + "<source>s</source><data><NoDot>1</NoDot></data>" + c),
         "Invalid alert attribute.  Must be of form object.attribute."},
        {soap("CT_Action", "<table>O4SRV.TNAME</table>" + c), "Invalid or missing action in query string."},
        {soap("CT_Action", "<action>update</action><table>O4SRV.TNAME</table>" + c),
         "Invalid or missing action in query string."},
        {soap("CT_Get", "<object>NOSUCH</object><column>A</column>" + c), "CT_Get object \"NOSUCH\" Not Found."},
        {soap("CT_Get", "<object>ZAG_CPU</object><attribute>Nope</attribute>" + c),
         "CT_Get attribute \"Nope\" Not Found."},
        {soap("CT_Get", "<object>NOSUCH</object>" + c), "Invalid object name"},
        {soap("CT_Get", "<filter>A;EQ;$mm$</filter><table>ZAG.CPU</table>" + c),
         "Invalid afilter date/time stamp variable."},
        {soap("CT_Get", "<table>ZAG.CPU</table><parma>NOSEMICOLON</parma>" + c),
         "Incorrectly formatted parma in request."},
        {soap("CT_Get", "<table>ZAG.CPU</table><userid>abcdefghijklmnopq</userid>"),
         "Userid length exceeds 16 characters."},
        {soap("CT_Action", "<action>insert</action><table>O4SRV.TNAME\"x</table><row><column name=\"ID\">1</column>"
                           "</row>" + c),
         "Invalid object name"},
    };
    const std::string before = storeState();
    for (const auto& r : refused) {
        auto h = post(r.doc);
        EXPECT_TRUE(h->isClientFault()) << r.doc << " -> " << h->fault();
        EXPECT_EQ(h->fault(), r.fault) << r.doc;
        EXPECT_TRUE(contains(h->sent, "<faultcode>SOAP-ENV:Client</faultcode>")) << r.doc;
        EXPECT_FALSE(contains(h->sent, "SOAP-CHK:Success")) << r.doc;
    }
    EXPECT_EQ(storeState(), before);

    // A body that cannot be read is a server fault.
    auto unreadable = std::make_unique<PrsHttp>("", "x");
    unreadable->readStatus = 5;
    WSQL_ParsePostRequest(unreadable.get(), hub.get());
    EXPECT_FALSE(unreadable->isClientFault());
    EXPECT_EQ(unreadable->fault(), "Unable to extract client data from posted request.");
    EXPECT_TRUE(contains(unreadable->sent, "<faultcode>SOAP-ENV:Server</faultcode>"));
}

TEST_F(KshPrs, HubThatCannotBeReachedOrTakeNationalTextIsRefused) {
    auto other = std::make_unique<WSQL_Hub>("NO_SUCH_LMS", "soap", "soap", nullptr);
    auto http = std::make_unique<PrsHttp>("", soap("CT_Get", "<object>ZAG_CPU</object>" + creds()));
    WSQL_ParsePostRequest(http.get(), other.get());
    EXPECT_EQ(http->fault(), "Unable to contact LMS server.");

    createStore(1, 0);  // the same store, no longer NLS capable
    hub = std::make_unique<WSQL_Hub>(lms.c_str(), "soap", "soap", nullptr);
    auto old = post(soap("CT_Get", "<object>ZAG_CPU</object>" + creds()));
    EXPECT_EQ(old->fault(), "HUB Version is incompatible.");
    EXPECT_EQ(old->detail(), lms);
}

TEST_F(KshPrs, HubListActionsRewriteTheHubFileOrAnswerWithTheErrorPage) {
    const std::string hubs = dir + "/kshxhubs.xml";
    std::ofstream(hubs) << "<ENTERPRISE>\n<HUB>\n<Alias>one</Alias>\n<LMS_Name>L1</LMS_Name>\n</HUB>\n\n"
                           "<HUB>\n<Alias>two</Alias>\n<LMS_Name>L2</LMS_Name>\n</HUB>\n\n"
                           "<HUB>\n<Alias>three</Alias>\n<LMS_Name>L3</LMS_Name>\n</HUB>\n</ENTERPRISE>\n";
    auto del = get("action=delhub&DelHubList=%232");
    EXPECT_EQ(lastRc, 0);
    EXPECT_TRUE(contains(del->sent, "front page")) << del->sent;
    std::stringstream now;
    now << std::ifstream(hubs).rdbuf();
    EXPECT_FALSE(contains(now.str(), "two"));
    EXPECT_TRUE(contains(now.str(), "one") && contains(now.str(), "three")) << now.str();

    // Without a usable list, or without the three names, nothing changes.
    for (const char* q : {"action=delhub&DelHubList=abc", "action=delhub", "action=addhub&lmsname=L4&aliasname=four",
                          "action=addhub&lmsname=L4&servicename=&aliasname=four"}) {
        auto bad = get(q);
        EXPECT_EQ(lastRc, 1) << q;
        EXPECT_TRUE(contains(bad->sent, "<TD>25</TD><TD>1</TD><TD>Unable to start request.</TD>")) << q;
        std::stringstream after;
        after << std::ifstream(hubs).rdbuf();
        EXPECT_EQ(after.str(), now.str()) << q;
    }
}

TEST_F(KshPrs, PersistedRequestIsResumedByItsHandle) {
    const std::string select = "<table>O4SRV.TSITDESC</table><column>SITNAME</column>" + creds();
    auto first = post(soapEnvelope("<CT_Get persist=\"yes\">" + select + "<filter>SITNAME;EQ;ZAG_CPU_Busy</filter>"
                                   "</CT_Get>"));
    EXPECT_EQ(lastRc, 0) << first->fault();
    std::string body = soapBody(*first);
    size_t at = body.find("handle=\"");
    ASSERT_NE(at, std::string::npos) << body;
    std::string handle = body.substr(at + 8, body.find('"', at + 8) - at - 8);
    EXPECT_TRUE(contains(body, "<SITNAME>ZAG_CPU_Busy</SITNAME>"));

    // The filter was bound: a resume must bring new values, which select
    // another row through the same statement.
    auto bare = post(soapEnvelope("<CT_Get handle=\"" + handle + "\">" + select + "</CT_Get>"));
    EXPECT_EQ(bare->fault(), "Invalid or missing updates to resume request.");
    auto again = post(soapEnvelope("<CT_Get handle=\"" + handle + "\">" + select +
                                   "<filter>SITNAME;EQ;ZAG_Disk_Full</filter></CT_Get>"));
    EXPECT_EQ(lastRc, 0) << again->fault();
    body = soapBody(*again);
    EXPECT_TRUE(contains(body, "<SITNAME>ZAG_Disk_Full</SITNAME>")) << body;
    EXPECT_FALSE(contains(body, "ZAG_CPU_Busy"));
    EXPECT_TRUE(sqlSent().size() == 1);  // built once, at the first request

    // A handle nobody issued starts a new request.
    auto unknown = post(soapEnvelope("<CT_Get handle=\"999999\">" + select + "</CT_Get>"));
    EXPECT_EQ(lastRc, 0) << unknown->fault();
    EXPECT_TRUE(contains(soapBody(*unknown), "<SITNAME>ZAG_Disk_Full</SITNAME>"));
}
