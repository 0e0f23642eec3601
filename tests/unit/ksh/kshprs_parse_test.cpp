// SOAP documents parsed into the request record, and the method defaults
// and CT_Get completion applied to the parsed records. No database work:
// the hub has a node name but no store.
#include <gtest/gtest.h>

#include <cstdlib>
#include <memory>
#include <string>

#include "bss1/bss1.h"
#include "kshhub.h"
#include "kshprs.h"
#include "kshprs_double.h"
#include "kshutil.h"
#include "kshxmlxp.h"

namespace {

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

struct Parsed {
    std::string body;
    PrsHttp http;
    KSH_XML doc;
    WSQL_Request_t req{};
    char* action = nullptr;
    int rc = -1;
    char defaults[WSQL_DEFAULTS_SIZE] = {};

    std::string column(const char* name) const {
        for (int i = 0; i < req.numColumns; ++i)
            if (std::string(req.columns[i]) == name) return str(req.values[i]);
        return "(none)";
    }
    int columnIndex(const char* name) const {
        for (int i = 0; i < req.numColumns; ++i)
            if (std::string(req.columns[i]) == name) return i;
        return -1;
    }
    std::string filter(const char* name) const {
        for (int i = 0; i < req.numFilters; ++i)
            if (std::string(req.filters[i].column) == name) return str(req.filters[i].value);
        return "(none)";
    }
    // Method defaults with the record's method bits, as the request start
    // calls them.
    int defaultsRc(int size = WSQL_DEFAULTS_SIZE, WSQL_Hub* hub = nullptr) {
        return WSQL_SetupMethodDefaults(&http, hub, &req, defaults, size, req.methods & ~WSQL_METHODS_LOW);
    }
};

class KshPrsParse : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        const char* src = getenv("CSIT_SOURCE_DIR");
        std::string dir = std::string(src ? src : ".") + "/data/attrlib";
        setenv("CT_ATTRLIB", dir.c_str(), 1);
        ASSERT_NE(WSQL_GetCatalog(), nullptr);
    }
    void SetUp() override {
        previousClock = BSS1_SetClock(frozenNow);
        hub.setServerPath("HUBLMS", "HUB_MAIN");
    }
    void TearDown() override { BSS1_SetClock(previousClock); }

    std::unique_ptr<Parsed> parse(const std::string& text, const std::string& client = "10.1.2.3:4567") {
        auto p = std::make_unique<Parsed>();
        p->body = text;
        p->http.client = client;
        // The client host, as the request start takes it.
        size_t colon = client.find(':');
        if (colon != std::string::npos) memcpy(p->req.clientHost, client.data(), colon < 16 ? colon : 16);
        char* buffer = p->body.data();
        unsigned long length = p->body.size();
        p->rc = WSQL_ParseSoapRequest(&p->http, &hub, buffer, &length, &p->req, &p->action, &p->doc);
        return p;
    }

    WSQL_Hub hub{"HUBLMS", "soap", "soap", nullptr};
    BSS1_Clock previousClock = nullptr;
};

}  // namespace

TEST_F(KshPrsParse, FindsTheMethodInAnEnvelopeOrABareDocumentAndRefusesBrokenDocuments) {
    auto get = parse(soapEnvelope("<CT_Get><object>ZAG_CPU</object></CT_Get>"));
    EXPECT_EQ(get->rc, 0);
    EXPECT_EQ(get->req.methods, WSQL_METHOD_GET | WSQL_ACTION_START);
    EXPECT_EQ(get->req.type & WSQL_TYPE_SOAP, WSQL_TYPE_SOAP);
    EXPECT_STREQ(get->action, "start");

    auto bare = parse("<CT_Reset><name>S1</name></CT_Reset>");
    EXPECT_EQ(bare->rc, 0);
    EXPECT_EQ(bare->req.methods, WSQL_METHOD_RESET);
    EXPECT_STREQ(bare->action, "insert");

    // The method may sit below first children of the top element.
    auto nested = parse("<wrap><inner><CT_Alert persist=\"YES\" handle=\"42\"/></inner></wrap>");
    EXPECT_EQ(nested->req.methods, WSQL_METHOD_ALERT);
    EXPECT_EQ(nested->req.elements & WSQL_ELEM_PERSIST, WSQL_ELEM_PERSIST);
    EXPECT_STREQ(nested->req.requestHandle, "42");

    auto none = parse("<wrap><CT_Unknown/></wrap>");
    EXPECT_EQ(none->rc, 0);
    EXPECT_EQ(none->req.methods, 0u);

    auto login = parse(soapEnvelope("<CT_Login/>"));
    EXPECT_EQ(login->req.methods, WSQL_METHOD_LOGIN);

    // Both spellings of the mail method; a special method reads nothing more.
    for (const char* tag : {"CT_EMail", "CT_Email"}) {
        auto mail = parse(std::string("<") + tag + "><table>T</table></" + tag + ">");
        EXPECT_EQ(mail->req.methods, WSQL_METHOD_EMAIL) << tag;
        EXPECT_EQ(mail->req.table, nullptr) << tag;
    }

    auto noBody = parse("<SOAP-ENV:Envelope><SOAP-ENV:Header/></SOAP-ENV:Envelope>");
    EXPECT_EQ(noBody->rc, 1);
    EXPECT_TRUE(noBody->http.isClientFault());
    EXPECT_EQ(noBody->http.fault(), "Invalid SOAP message");

    auto broken = parse("<CT_Get><table>T</CT_Get>");
    EXPECT_EQ(broken->rc, 1);
    EXPECT_TRUE(broken->http.isClientFault());
    EXPECT_EQ(broken->http.fault(), "XML parse error");
    EXPECT_FALSE(broken->http.detail().empty());
}

TEST_F(KshPrsParse, CTGetElementsLandInTheRecord) {
    auto p = parse(soapEnvelope(
        "<CT_Get><userid>user1</userid><password>pw</password><object>ZAG_DISK</object>"
        "<target>*ALL</target><parma>A;b;c</parma><parma>X;y</parma>"
        "<afilter>ZAG_DISK.Used_Percent;GE;90</afilter><afilter>Mount_Point;EQ;/var</afilter>"
        "<attribute>ZAG_DISK.Mount_Point</attribute><attribute>Free_MB</attribute>"
        "<history>yes</history><results>PARSE</results><intv>300</intv><thrunode>REMOTE_EAST</thrunode>"
        "<hub>east</hub><sql>ignored by CT_Get</sql></CT_Get>"));
    ASSERT_EQ(p->rc, 0);
    const WSQL_Request_t& r = p->req;
    EXPECT_EQ(str(r.table), "ZAG_DISK");
    EXPECT_EQ(r.elements & WSQL_ELEM_OBJECT, WSQL_ELEM_OBJECT);
    EXPECT_EQ(str(r.target), "*ALL");
    EXPECT_EQ(r.type & WSQL_TYPE_ALLTARGETS, WSQL_TYPE_ALLTARGETS);
    ASSERT_EQ(r.numParma, 3);
    EXPECT_EQ(str(r.parma[0].name) + "=" + str(r.parma[0].value), "NODELIST=*ALL");
    EXPECT_EQ(str(r.parma[1].name) + "=" + str(r.parma[1].value), "A=b;c");  // split at the first ";" only
    EXPECT_EQ(str(r.parma[2].name) + "=" + str(r.parma[2].value), "X=y");
    ASSERT_EQ(r.numFilters, 2);
    EXPECT_EQ(str(r.filters[0].column), "ZAG_DISK.Used_Percent");
    EXPECT_EQ(str(r.filters[0].oper), "GE");
    EXPECT_EQ(str(r.filters[0].value), "90");
    EXPECT_EQ(r.filters[1].isAfilter, 1);
    ASSERT_EQ(r.numColumns, 2);
    EXPECT_EQ(r.attributeForm, 1);
    EXPECT_EQ(str(r.columns[0]), "Mount_Point");
    EXPECT_EQ(str(r.columns[1]), "Free_MB");
    EXPECT_EQ(r.history, 1);
    EXPECT_EQ(r.parse, 1);
    EXPECT_EQ(r.intv, 300);
    EXPECT_EQ(str(r.thrunode), "REMOTE_EAST");
    EXPECT_EQ(str(r.hubAlias), "east");
    EXPECT_EQ(std::string(r.userid), "user1");
    EXPECT_EQ(r.elements & (WSQL_ELEM_USERID | WSQL_ELEM_PASSWORD), WSQL_ELEM_USERID | WSQL_ELEM_PASSWORD);

    // "filter" elements win over "afilter" ones; the object of the first
    // attribute names the table when none is given.
    auto q = parse("<CT_Get><filter>ORIGINNODE;EQ;a</filter><afilter>X;EQ;b</afilter>"
                   "<attribute>ZAG_CPU.Busy_Percent</attribute><attribute>Nodot</attribute></CT_Get>");
    ASSERT_EQ(q->req.numFilters, 1);
    EXPECT_EQ(q->req.filters[0].isAfilter, 0);
    EXPECT_EQ(str(q->req.table), "ZAG_CPU");
    EXPECT_EQ(str(q->req.columns[1]), "Nodot");
    EXPECT_EQ(q->req.type & WSQL_TYPE_ALLTARGETS, 0u);

    // Empty column elements name nothing (and leave no static text to be
    // cleaned in place later).
    auto empty = parse("<CT_Get><object>ZAG_DISK</object><attribute></attribute><attribute>Free_MB</attribute>"
                       "<attribute/></CT_Get>");
    ASSERT_EQ(empty->req.numColumns, 1);
    EXPECT_EQ(WSQL_SetupGetMethod(&empty->http, &empty->req), 0);

    // Columns are read only for a "start" action.
    auto ins = parse("<CT_Get><action>insert</action><table>T</table><column>A</column></CT_Get>");
    EXPECT_EQ(ins->req.numColumns, 0);
    EXPECT_EQ(ins->req.methods, WSQL_METHOD_GET | WSQL_METHOD_ACTION | WSQL_ACTION_INSERT);
    EXPECT_STREQ(ins->action, "insert");
}

TEST_F(KshPrsParse, OverfullOrMalformedPartsRefuseTheDocumentWithAClientFault) {
    std::string parma;
    for (int i = 0; i < 11; ++i) parma += "<parma>P" + std::to_string(i) + ";v</parma>";
    auto tooManyParma = parse("<CT_Get><table>T</table>" + parma + "</CT_Get>");
    EXPECT_EQ(tooManyParma->rc, 1);
    EXPECT_TRUE(tooManyParma->http.isClientFault());
    EXPECT_EQ(tooManyParma->http.fault(), "Too many parma settings in request.");

    // A target takes a parma slot too: ten parma and a target are eleven.
    auto targetPlusTen = parse("<CT_Get><target>N</target>" + parma.substr(parma.find("<parma>P1;")) + "</CT_Get>");
    EXPECT_EQ(targetPlusTen->req.numParma, 10);
    EXPECT_EQ(targetPlusTen->rc, 1);

    std::string filters;
    for (int i = 0; i < 21; ++i) filters += "<filter>C;EQ;" + std::to_string(i) + "</filter>";
    auto tooManyFilters = parse("<CT_Get><table>T</table>" + filters + "</CT_Get>");
    EXPECT_EQ(tooManyFilters->rc, 1);
    EXPECT_EQ(tooManyFilters->req.numFilters, 20);
    EXPECT_TRUE(tooManyFilters->http.isRequestErrorSet());

    auto malformed = parse("<CT_Get><filter>C;EQ</filter></CT_Get>");
    EXPECT_EQ(malformed->rc, 1);
    EXPECT_EQ(malformed->http.fault(), "Malformed filter in request.");
    auto badParma = parse("<CT_Get><parma>NOSEMICOLON</parma></CT_Get>");
    EXPECT_EQ(badParma->rc, 1);
    EXPECT_EQ(badParma->http.fault(), "Incorrectly formatted parma in request.");

    // A malformed date/time variable in a filter value is answered with 6;
    // a well-formed one and a value without one are accepted.
    auto badDate = parse("<CT_Get><afilter>Timestamp;GE;$mm$</afilter></CT_Get>");
    EXPECT_EQ(badDate->rc, 6);
    EXPECT_EQ(badDate->http.fault(), "Invalid afilter date/time stamp variable.");
    EXPECT_EQ(badDate->http.detail(), "$mm$");
    auto goodDate = parse("<CT_Get><afilter>Timestamp;GE;1$yymmdd$000000000</afilter></CT_Get>");
    EXPECT_EQ(goodDate->rc, 0);
    EXPECT_EQ(goodDate->filter("Timestamp"), "1260304000000000");  // expanded with the frozen date
    auto plain = parse("<CT_Get><filter>A;EQ;no variable</filter></CT_Get>");
    EXPECT_EQ(plain->rc, 0);
    EXPECT_EQ(plain->filter("A"), "no variable");

    // Credentials: exactly 16 characters fill the field without a
    // terminator; 17 refuse the document.
    auto sixteen = parse("<CT_Get><userid>abcdefghijklmnop</userid><password>0123456789abcdef</password></CT_Get>");
    EXPECT_EQ(sixteen->rc, 0);
    EXPECT_EQ(std::string(sixteen->req.userid, 16), "abcdefghijklmnop");
    EXPECT_EQ(std::string(sixteen->req.password, 16), "0123456789abcdef");
    auto longUser = parse("<CT_Get><userid>abcdefghijklmnopq</userid></CT_Get>");
    EXPECT_EQ(longUser->rc, 1);
    EXPECT_EQ(longUser->http.fault(), "Userid length exceeds 16 characters.");
    EXPECT_EQ(longUser->req.userid[0], '\0');
    auto longPassword = parse("<CT_Get><password>abcdefghijklmnopq</password></CT_Get>");
    EXPECT_EQ(longPassword->rc, 1);
    EXPECT_EQ(longPassword->http.fault(), "Password length exceeds 16 characters.");
    EXPECT_EQ(longPassword->http.detail(), "");  // the password is never echoed
}

TEST_F(KshPrsParse, StatusAndActivationElementsBecomeTheirColumns) {
    auto alert = parse("<CT_Alert><name>SIT1</name><source>alpha:ZAG</source><data>disk full</data>"
                       "<item>/var</item><type>pure</type></CT_Alert>");
    ASSERT_EQ(alert->rc, 0);
    EXPECT_EQ(str(alert->req.statusSitName), "SIT1");
    EXPECT_EQ(alert->column("SITNAME"), "SIT1");
    EXPECT_EQ(alert->column("ORIGINNODE"), "alpha:ZAG");
    EXPECT_EQ(alert->column("RESULTS"), "disk full");
    EXPECT_EQ(alert->column("ATOMIZE"), "/var");
    EXPECT_EQ(alert->column("TYPE"), "1");
    EXPECT_EQ(alert->req.elements & (WSQL_ELEM_DATA | WSQL_ELEM_ITEM | WSQL_ELEM_TYPE | WSQL_ELEM_SOURCE),
              WSQL_ELEM_DATA | WSQL_ELEM_ITEM | WSQL_ELEM_TYPE | WSQL_ELEM_SOURCE);
    for (auto [text, value] : {std::pair{"meta", "2"}, {"SAMPLED", "0"}, {"1", "1"}, {"other", "0"}}) {
        auto t = parse(std::string("<CT_Alert><name>S</name><type>") + text + "</type></CT_Alert>");
        EXPECT_EQ(t->column("TYPE"), value) << text;
    }

    // A type does not apply to the other status methods: no column, no bit.
    auto reset = parse("<CT_Reset><name>S</name><type>pure</type></CT_Reset>");
    EXPECT_EQ(reset->columnIndex("TYPE"), -1);
    EXPECT_EQ(reset->req.elements & WSQL_ELEM_TYPE, 0u);

    // Named children of "data" are data items (at most ten).
    std::string items;
    for (int i = 0; i < 12; ++i) items += "<ZAG_DISK.Mount_Point>/m" + std::to_string(i) + "</ZAG_DISK.Mount_Point>";
    auto data = parse("<CT_Alert><name>S</name><data>" + items + "</data></CT_Alert>");
    EXPECT_EQ(data->req.numDataItems, 10);
    EXPECT_EQ(str(data->req.dataItems[9].value), "/m9");
    EXPECT_EQ(str(data->req.dataItems[0].oper), "=");
    EXPECT_EQ(data->columnIndex("RESULTS"), -1);

    auto act = parse("<CT_Activate><name>SIT2</name><type>Policy</type><source>beta:ZAG</source></CT_Activate>");
    EXPECT_EQ(act->column("OBJNAME"), "SIT2");
    EXPECT_EQ(act->column("OBJCLASS"), "5130");
    EXPECT_EQ(act->column("NODEL"), "beta:ZAG");
    auto sit = parse("<CT_Deactivate><name>SIT2</name><type>situation</type></CT_Deactivate>");
    EXPECT_EQ(sit->column("OBJCLASS"), "5140");

    // Under CT_Action the name is a parma and the source no column.
    auto ctAction = parse("<CT_Action><action>start</action><table>T</table><name>S</name><source>n</source>"
                          "</CT_Action>");
    EXPECT_EQ(ctAction->columnIndex("ORIGINNODE"), -1);
    ASSERT_EQ(ctAction->req.numParma, 1);
    EXPECT_EQ(str(ctAction->req.parma[0].name) + "=" + str(ctAction->req.parma[0].value), "SITNAME=S");

    // The first row's named columns.
    auto row = parse("<CT_Action><action>insert</action><table>O4SRV.TNAME</table><row>"
                     "<column name=\"ID\">S1</column><column>unnamed</column><other name=\"X\">x</other>"
                     "<column name=\"FULLNAME\">Long name</column></row><row><column name=\"Z\">z</column></row>"
                     "</CT_Action>");
    ASSERT_EQ(row->req.numColumns, 2);
    EXPECT_EQ(row->column("ID"), "S1");
    EXPECT_EQ(row->column("FULLNAME"), "Long name");
    EXPECT_EQ(row->req.rowNumber, 1);
}

TEST_F(KshPrsParse, WtoAndThresholdElementsBecomeFilters) {
    auto wto = parse("<CT_WTO><data>backup done</data><severity>2</severity><category>ops</category></CT_WTO>");
    ASSERT_EQ(wto->rc, 0);
    EXPECT_EQ(wto->filter("data"), "backup done");
    EXPECT_EQ(wto->filter("severity"), "2");
    EXPECT_EQ(wto->filter("category"), "ops");

    auto thr = parse("<CT_Thresholds><target>alpha:ZAG</target><name>ZAG_Disk_Full</name>"
                     "<keyname>ZAG_DISK.Mount_Point</keyname><keyvalue>/var</keyvalue>"
                     "<thresholdname>ZAG_DISK.Used_Percent</thresholdname><thresholdvalue>80</thresholdvalue>"
                     "</CT_Thresholds>");
    ASSERT_EQ(thr->rc, 0);
    EXPECT_EQ(str(thr->req.table), "ZAG_DISK");
    EXPECT_EQ(thr->filter("name"), "ZAG_Disk_Full");
    EXPECT_EQ(thr->filter("keyname"), "Mount_Point");
    EXPECT_EQ(thr->filter("thresholdname"), "Used_Percent");
    EXPECT_EQ(thr->req.elements & (WSQL_ELEM_KEYNAME | WSQL_ELEM_KEYVALUE | WSQL_ELEM_THRESHOLDNAME |
                                   WSQL_ELEM_THRESHOLDVALUE | WSQL_ELEM_THRESHOLDDEFAULT),
              WSQL_ELEM_KEYNAME | WSQL_ELEM_KEYVALUE | WSQL_ELEM_THRESHOLDNAME | WSQL_ELEM_THRESHOLDVALUE);

    // Overrides travel as the XML of the element's children.
    auto ov = parse("<CT_Thresholds><target>t</target><overrides>ignored<situation name=\"A&amp;B\"><threshold "
                    "column=\"C\">5</threshold></situation><situation name=\"Z\"/></overrides></CT_Thresholds>");
    ASSERT_EQ(ov->rc, 0);
    EXPECT_EQ(ov->req.type & WSQL_TYPE_OVERRIDES, WSQL_TYPE_OVERRIDES);
    EXPECT_EQ(ov->filter("overrides"),
              "<situation name=\"A&amp;B\"><threshold column=\"C\">5</threshold></situation><situation "
              "name=\"Z\"></situation>");
}

// ------------------------------------------------------------ defaults

TEST_F(KshPrsParse, AlertDefaultsFillTheStatusHistoryInsert) {
    auto p = parse("<CT_Alert><name>SIT1</name><source>HUB_MAIN</source><userid>ops</userid></CT_Alert>");
    ASSERT_EQ(p->rc, 0);
    ASSERT_EQ(p->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 0);
    const WSQL_Request_t& r = p->req;
    EXPECT_EQ(str(r.table), "O4SRV.TSITSTSH");
    EXPECT_EQ(r.type & (WSQL_TYPE_BOUNDINPUT | WSQL_TYPE_SUBSELECT), WSQL_TYPE_BOUNDINPUT);
    EXPECT_EQ(r.subSql, nullptr);
    EXPECT_EQ(p->column("TYPE"), "0");
    EXPECT_EQ(p->column("ATOMIZE"), "");
    EXPECT_EQ(p->column("NODE"), "HUB_MAIN");
    EXPECT_EQ(p->column("DELTASTAT"), "Y");
    EXPECT_EQ(p->column("RESULTS"), "USR=ops;DATA=No data was provided~");
    EXPECT_EQ(p->column("LCLTMSTMP"), kStamp);
    EXPECT_EQ(p->column("GBLTMSTMP"), kStamp);
    EXPECT_EQ(p->column("LOCFLAG"), "  ");

    // Without a userid the client host is the user; a data text is packed
    // into RESULTS; a given timestamp keeps LCLTMSTMP.
    auto q = parse("<CT_Alert><name>S</name><source>HUB_MAIN</source><data>it \"broke\"</data>"
                   "<timestamp>1260101000000000</timestamp></CT_Alert>",
                   "192.168.100.200:5555");
    ASSERT_EQ(q->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 0);
    EXPECT_EQ(q->column("RESULTS"), "USR=192.168.100.200;DATA=it \"broke\"~");
    EXPECT_EQ(q->column("LCLTMSTMP"), "1260101000000000");
    EXPECT_EQ(q->column("GBLTMSTMP"), kStamp);
}

TEST_F(KshPrsParse, AcknowledgeReadsTheRaisedRowsThroughASecondStatement) {
    auto p = parse("<CT_Acknowledge><name>SIT1</name><source>alpha:ZAG</source><expire>3600</expire>"
                   "<data>seen</data><userid>ops</userid></CT_Acknowledge>");
    ASSERT_EQ(p->rc, 0);
    ASSERT_EQ(p->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 0);
    const WSQL_Request_t& r = p->req;
    EXPECT_EQ(r.type & (WSQL_TYPE_BOUNDINPUT | WSQL_TYPE_SUBSELECT | WSQL_TYPE_SUBINPUT),
              WSQL_TYPE_BOUNDINPUT | WSQL_TYPE_SUBSELECT | WSQL_TYPE_SUBINPUT);
    // The five columns the second statement selects come first, in its order.
    const char* order[] = {"SITNAME", "ORIGINNODE", "ATOMIZE", "TYPE", "NODE"};
    for (int i = 0; i < 5; ++i) EXPECT_EQ(str(r.columns[i]), order[i]);
    EXPECT_EQ(str(r.values[0]), "SIT1");
    EXPECT_EQ(str(r.values[1]), "alpha:ZAG");
    EXPECT_EQ(str(r.values[2]), "");  // taken from the raised row
    EXPECT_EQ(p->column("DELTASTAT"), "A");
    EXPECT_EQ(p->column("GBLTMSTMP"), "3600");
    EXPECT_EQ(p->column("RESULTS"), std::string("USR=ops;IUS=ops;GTM=") + kStamp + ";LTM=" + kStamp + ";ATM=" + kStamp +
                                        ";EXP=3600;TXT=seen;~");
    EXPECT_EQ(str(r.subSql),
              "SELECT SITNAME, ORIGINNODE, ATOMIZE, TYPE, NODE,DELTASTAT FROM O4SRV.ISITSTSH AT (\"*HUB\") "
              "WHERE SITNAME = ? AND ORIGINNODE = ? AND DELTASTAT = ?");
    ASSERT_EQ(r.numFilters, 3);
    EXPECT_EQ(p->filter("SITNAME"), "SIT1");
    EXPECT_EQ(p->filter("ORIGINNODE"), "alpha:ZAG");
    EXPECT_EQ(p->filter("DELTASTAT"), "Y");

    // Resurface needs an acknowledged row; without data its RESULTS is "~".
    auto s = parse("<CT_Resurface><name>SIT1</name><item>/var</item></CT_Resurface>");
    ASSERT_EQ(s->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 0);
    EXPECT_EQ(s->column("DELTASTAT"), "E");
    EXPECT_EQ(s->filter("DELTASTAT"), "A");
    EXPECT_EQ(s->filter("ATOMIZE"), "/var");
    EXPECT_EQ(s->column("RESULTS"), "USR=10.1.2.3~");
    EXPECT_NE(str(s->req.subSql).find("AND ATOMIZE = ? AND DELTASTAT = ?"), std::string::npos);
}

TEST_F(KshPrsParse, LiteralStatusStatementDoublesQuotesSoValuesNeverEndTheLiteral) {
    auto p = parse("<CT_Reset><name>S\"1</name><source>x\" OR \"1\"=\"1</source><item>a\"b</item>"
                   "<filter>SITNAME;EQ;S</filter></CT_Reset>");
    ASSERT_EQ(p->rc, 0);
    ASSERT_EQ(p->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 0);
    EXPECT_EQ(p->req.type & WSQL_TYPE_SUBINPUT, 0u);
    EXPECT_EQ(str(p->req.subSql),
              "SELECT SITNAME, ORIGINNODE, ATOMIZE, TYPE, NODE,DELTASTAT FROM O4SRV.ISITSTSH AT (\"*HUB\") "
              "WHERE SITNAME = \"S\"\"1\" AND DELTASTAT = \"Y\" AND ORIGINNODE = \"x\"\" OR \"\"1\"\"=\"\"1\" "
              "AND ATOMIZE = N\"a\"\"b\"");
    EXPECT_EQ(p->column("DELTASTAT"), "N");
}

TEST_F(KshPrsParse, DataItemsBecomeAPackedPredicateOrAreRefused) {
    auto p = parse("<CT_Alert><name>Sit\"X</name><source>HUB_MAIN</source><data>"
                   "<ZAG_DISK.Mount_Point>/var</ZAG_DISK.Mount_Point><ZAG_DISK.Used_Percent>97</ZAG_DISK.Used_Percent>"
                   "</data></CT_Alert>");
    ASSERT_EQ(p->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 0);
    EXPECT_EQ(p->column("RESULTS"),
              "*PREDICATE=SYSTEM.PARMA(\"SITNAME\", \"Sit\"\"X\", 5);DISK.MOUNT=/var;DISK.USEDPCT=97~");

    const struct {
        const char* tag;
        const char* fault;
        const char* detail;
    } bad[] = {
        {"NoDot", "Invalid alert attribute.  Must be of form object.attribute.", "NoDot"},
        {"NOSUCH.Mount_Point", "Invalid alert attribute.  Object name not found.", "NOSUCH.Mount_Point"},
        {"ZAG_DISK.Nothing", "Invalid alert attribute.  Attribute name not found.", "Nothing"},
    };
    for (const auto& b : bad) {
        auto q = parse(std::string("<CT_Alert><name>S</name><source>HUB_MAIN</source><data><") + b.tag + ">v</" +
                       b.tag + "></data></CT_Alert>");
        EXPECT_EQ(q->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 1) << b.tag;
        EXPECT_TRUE(q->http.isClientFault()) << b.tag;
        EXPECT_EQ(q->http.fault(), b.fault);
        EXPECT_EQ(q->http.detail(), b.detail);
    }
}

TEST_F(KshPrsParse, ThresholdTemplatesAndTheirRefusals) {
    // Values are escaped for the XML of the command; the situation name is
    // cut to 32 characters before that.
    auto esc = parse("<CT_Thresholds><target>t</target><name>" + std::string(30, 'n') + "&lt;&amp;x</name>"
                     "<keyname>ZAG_DISK.Mount_Point</keyname><keyvalue>/v&quot;r</keyvalue>"
                     "<thresholdname>ZAG_DISK.Used_Percent</thresholdname><thresholdvalue>80</thresholdvalue>"
                     "<userid>ops</userid></CT_Thresholds>");
    ASSERT_EQ(esc->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 0) << esc->http.fault();
    EXPECT_EQ(str(esc->req.table), "O4SRV.CLACTRMT");
    EXPECT_EQ(esc->filter("ACTSECURE"), "ops");
    EXPECT_EQ(esc->filter("CLCMD"), "thresh:<?xml version=\"1.0\"?><overrides><situation name=\"" +
                                        std::string(30, 'n') + "&lt;&amp;\"><key column=\"MOUNT\" value=\"/v&quot;r\">"
                                        "<threshold column=\"USEDPCT\">80</threshold></key></situation></overrides>");
    auto ov = parse("<CT_Thresholds><target>t</target><overrides><situation name=\"S\"/></overrides></CT_Thresholds>");
    ASSERT_EQ(ov->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 0);
    EXPECT_EQ(ov->filter("CLCMD"),
              "thresh:<?xml version=\"1.0\"?><overrides><situation name=\"S\"></situation></overrides>");

    const struct {
        std::string doc;
        const char* fault;
    } refused[] = {
        {"<thresholdname>NOSUCH.Used_Percent</thresholdname><thresholdvalue>1</thresholdvalue>",
         "Missing or Invalid Object for key, threshold Name for CT_Thresholds method."},
        {"<thresholdname>ZAG_DISK.Nothing</thresholdname><thresholdvalue>1</thresholdvalue>",
         "Invalid thresholdname for CT_Thresholds method."},
        {"<keyname>ZAG_DISK.Nope</keyname><keyvalue>k</keyvalue><thresholdname>ZAG_DISK.Used_Percent</thresholdname>"
         "<thresholdvalue>1</thresholdvalue>",
         "Invalid keyname for CT_Thresholds method."},
    };
    for (const auto& c : refused) {
        auto p = parse("<CT_Thresholds><target>t</target><name>S</name>" + c.doc + "</CT_Thresholds>");
        EXPECT_EQ(p->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 400) << c.doc;
        EXPECT_TRUE(p->http.isClientFault());
        EXPECT_EQ(p->http.fault(), c.fault);
    }
}

TEST_F(KshPrsParse, DefaultsNeverWritePastTheirBuffer) {
    // A data text that cannot fit the 4096-byte buffer fails with 7 and the
    // memory error; so does any buffer too small for the defaults.
    auto big = parse("<CT_Alert><name>S</name><source>HUB_MAIN</source><data>" + std::string(5000, 'd') +
                     "</data></CT_Alert>");
    EXPECT_EQ(big->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 7);
    EXPECT_EQ(big->http.fault(), "Unable to obtain memory.");
    EXPECT_FALSE(big->http.isClientFault());
    for (int size : {1, 16, 40, 120}) {
        auto p = parse("<CT_Acknowledge><name>SIT1</name><source>alpha:ZAG</source><expire>3600</expire>"
                       "</CT_Acknowledge>");
        std::string guard(64, 'G');
        char area[WSQL_DEFAULTS_SIZE + 64];
        memcpy(area + size, guard.data(), guard.size());
        EXPECT_EQ(WSQL_SetupMethodDefaults(&p->http, &hub, &p->req, area, size,
                                           p->req.methods & ~WSQL_METHODS_LOW),
                  7)
            << size;
        EXPECT_EQ(std::string(area + size, guard.size()), guard) << size;
    }
    // A long data item list overflows the predicate cleanly.
    std::string items;
    for (int i = 0; i < 10; ++i)
        items += "<ZAG_DISK.Mount_Point>" + std::string(450, 'm') + "</ZAG_DISK.Mount_Point>";
    auto pred = parse("<CT_Alert><name>S</name><source>HUB_MAIN</source><data>" + items + "</data></CT_Alert>");
    EXPECT_EQ(pred->defaultsRc(WSQL_DEFAULTS_SIZE, &hub), 7);
}

TEST_F(KshPrsParse, GetCompletionChecksNamesAgainstTheCatalog) {
    auto all = parse("<CT_Get><object>ZAG_CPU</object></CT_Get>");
    ASSERT_EQ(WSQL_SetupGetMethod(&all->http, &all->req), 0);
    ASSERT_EQ(all->req.numParma, 1);
    EXPECT_EQ(str(all->req.parma[0].name) + "=" + str(all->req.parma[0].value), "NODELIST=*ALL");
    EXPECT_EQ(all->req.type & WSQL_TYPE_ALLTARGETS, WSQL_TYPE_ALLTARGETS);

    // Attribute names are cleaned in the record; a history request may name
    // the write time.
    auto attrs = parse("<CT_Get><target>alpha:ZAG</target><attribute>ZAG_CPU.1.Busy_Percent%</attribute>"
                       "<attribute>ZAG_CPU.Write_Time</attribute><history>Y</history>"
                       "<afilter>CPU_ID;EQ;1</afilter><filter>BUSYPCT;GT;5</filter></CT_Get>");
    ASSERT_EQ(WSQL_SetupGetMethod(&attrs->http, &attrs->req), 0) << attrs->http.fault();
    EXPECT_EQ(str(attrs->req.columns[0]), "Busy_Percent");
    EXPECT_EQ(attrs->req.numParma, 1);  // the target's only

    const struct {
        std::string doc;
        const char* fault;
    } refused[] = {
        {"<object>NOSUCH</object><column>A</column>", "CT_Get object \"NOSUCH\" Not Found."},
        {"<table>ZAG.NOSUCH</table><column>A</column>", "CT_Get table \"ZAG.NOSUCH\" Not Found."},
        {"<table>ZAG.CPU</table><column>BUSYPCT</column><column>NOPE</column>", "CT_Get column \"NOPE\" Not Found."},
        {"<attribute>ZAG_CPU.Bad%Name!</attribute>", "CT_Get attribute \"Bad%Name!\" Not Found."},
        {"<table>ZAG.CPU</table><filter>NOPE;EQ;1</filter>", "CT_Get filter column \"NOPE\" Not Found."},
        {"<table>ZAG.CPU</table><afilter>Nope;EQ;1</afilter>", "CT_Get filter attribute \"Nope\" Not Found."},
        {"<table>ZAG.CPU</table><column>WRITETIME</column>", "CT_Get column \"WRITETIME\" Not Found."},
        // With CT_Action an unknown table is tolerated, but not a name that
        // could not stand in SQL.
        {"<action>start</action><table>T; DROP</table><column>A</column>", "CT_Get table \"T; DROP\" Not Found."},
        {"<action>start</action><table>NEWTAB</table><column>A B</column>", "CT_Get column \"A B\" Not Found."},
    };
    for (const auto& c : refused) {
        auto p = parse("<CT_Get>" + c.doc + "</CT_Get>");
        ASSERT_EQ(p->rc, 0) << c.doc;
        EXPECT_EQ(WSQL_SetupGetMethod(&p->http, &p->req), 400) << c.doc;
        EXPECT_TRUE(p->http.isClientFault());
        EXPECT_EQ(p->http.fault(), c.fault);
    }
    auto dynamic = parse("<CT_Get><action>start</action><table>NEWTAB</table><column>A</column></CT_Get>");
    EXPECT_EQ(WSQL_SetupGetMethod(&dynamic->http, &dynamic->req), 0);
    EXPECT_EQ(dynamic->req.numParma, 0);  // CT_Action: no implicit target
}
