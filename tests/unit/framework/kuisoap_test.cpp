// The support library's SOAP requests and look-ups against a local HTTP
// responder: the wire form, the judging of replies, transfer failures.
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>

#include "httpstub.h"
#include "kshlst.h"
#include "kuisupport.h"
#include "opclictx.h"

namespace {

class KuiSoap : public ::testing::Test {
protected:
    void SetUp() override {
        ctx.serverUrl = "http://127.0.0.1:1/";
        ctx.user = "sysadmin";
        ctx.password = "p&ss<word>";
        ctx.loggedIn = true;
        buf.assign(KUI_MSGBUF_SIZE, '\0');
    }
    // Points the context at a responder answering every request with `reply`.
    void serve(StubReply reply) {
        stub = std::make_unique<HttpStub>([reply](const std::string&) { return reply; });
        ctx.serverUrl = stub->url();
    }
    int request(const char* sql, std::string* reply = nullptr) {
        char* r = nullptr;
        int len = -1;
        int rc = issueSoapRequest(&ctx, sql, 0, &r, &len);
        if (r && reply) *reply = r;
        if (r) EXPECT_EQ(len, (int)strlen(r));
        free(r);
        return rc;
    }
    OPCLI_Context ctx;
    std::vector<char> buf;
    std::unique_ptr<HttpStub> stub;
};

TEST_F(KuiSoap, TheRequestCarriesTheSessionTheTableAndTheStatement) {
    serve({200, stubTable({})});
    std::string reply;
    EXPECT_EQ(request("<![CDATA[INSERT INTO O4SRV.TSITDESC(A) VALUES (\"x & <y>\")]]> & \"more\" <![CDATA[a&b]]>", &reply),
              0);
    EXPECT_NE(reply.find("</TABLE>"), std::string::npos);
    ASSERT_EQ(stub->bodies().size(), 1u);
    std::string body = stub->bodies()[0];
    EXPECT_NE(body.find("<CT_SQL><userid>sysadmin</userid><password>p&amp;ss&lt;word&gt;</password>"
                        "<table>O4SRV.TSITDESC</table><sql><![CDATA[INSERT INTO O4SRV.TSITDESC(A) VALUES "
                        "(\"x & <y>\")]]> &amp; &quot;more&quot; <![CDATA[a&b]]></sql></CT_SQL>"),
              std::string::npos)
        << body;
    EXPECT_NE(body.find("<SOAP-ENV:Envelope"), std::string::npos);
    // Without a CDATA section everything is escaped; the table follows FROM.
    EXPECT_EQ(request("SELECT NODEL FROM O4SRV.TOBJACCL WHERE OBJNAME =\"A&B\""), 0);
    body = stub->bodies()[1];
    EXPECT_NE(body.find("<table>O4SRV.TOBJACCL</table><sql>SELECT NODEL FROM O4SRV.TOBJACCL WHERE OBJNAME "
                        "=&quot;A&amp;B&quot;</sql>"),
              std::string::npos)
        << body;
    // An opening without its close is text like any other.
    EXPECT_EQ(request("SELECT X FROM T WHERE A = \"<![CDATA[\""), 0);
    EXPECT_NE(stub->bodies()[2].find("&lt;![CDATA[&quot;</sql>"), std::string::npos) << stub->bodies()[2];
    EXPECT_EQ(stub->connections(), 1) << "one connection serves the whole run";
}

TEST_F(KuiSoap, TransferFailuresAreCommunicationErrors) {
    EXPECT_EQ(request("SELECT 1 FROM T"), KUI_COMM);  // connection refused
    serve({500, "<html>broken</html>"});
    EXPECT_EQ(request("SELECT 1 FROM T"), KUI_COMM);
    serve({404, ""});
    EXPECT_EQ(request("SELECT 1 FROM T"), KUI_COMM);
    serve({200, stubTable({}), 1500});
    ctx.totalTimeoutMs = 200;
    EXPECT_EQ(request("SELECT 1 FROM T"), KUI_COMM);
    ctx.totalTimeoutMs = 60000;
    // A SOAP fault is the server's answer, whatever the status: handed back.
    serve({500, stubFault()});
    std::string reply;
    EXPECT_EQ(request("SELECT 1 FROM T", &reply), 0);
    EXPECT_NE(reply.find("faultstring"), std::string::npos);
    OPCLI_Context none;
    char* r = nullptr;
    EXPECT_EQ(issueSoapRequest(&none, "SELECT 1 FROM T", 0, &r, nullptr), KUI_COMM);
    EXPECT_EQ(issueSoapRequest(nullptr, "SELECT 1 FROM T", 0, &r, nullptr), KUI_COMM);
    EXPECT_EQ(r, nullptr);
}

TEST_F(KuiSoap, LookUpsComposeTheirStatementAndReadTheReply) {
    std::string next;
    stub = std::make_unique<HttpStub>([&next](const std::string&) { return StubReply{200, next}; });
    ctx.serverUrl = stub->url();
    char name[KUI_SHORTNAME_SIZE];

    next = stubTable({{{"ID", "SHORT_01"}}});
    EXPECT_EQ(getSitNamefromTNAME(&ctx, buf.data(), nullptr, "A \"long\" name ]]> x", name), 0);
    EXPECT_STREQ(name, "SHORT_01");
    EXPECT_STREQ(buf.data(),
                 "<![CDATA[SELECT ID FROM O4SRV.TNAME WHERE FULLNAME = N\"A \"\"long\"\" name ]]]]><![CDATA[> x\"]]>");
    next = stubTable({});
    EXPECT_EQ(getSitNamefromTNAME(&ctx, buf.data(), nullptr, "nothing", name), KUI_ABSENT);
    EXPECT_STREQ(name, "");
    next = stubFault();
    EXPECT_EQ(getSitNamefromTNAME(&ctx, buf.data(), nullptr, "x", name), KUI_SERVER);

    next = stubTable({{{"SITNAME", "BASE"}}});
    EXPECT_EQ(checkSitExistsinTSITDESC(&ctx, buf.data(), nullptr, "BASE"), 0);
    EXPECT_STREQ(buf.data(), "<![CDATA[SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = \"BASE\"]]>");
    next = stubTable({});
    EXPECT_EQ(checkSitExistsinTSITDESC(&ctx, buf.data(), nullptr, "BASE"), KUI_ABSENT);
    EXPECT_EQ(checkUADVISORSituation(&ctx, buf.data(), nullptr, "BASE", "BASE"), KUI_ABSENT);
    size_t before = stub->bodies().size();
    EXPECT_EQ(checkUADVISORSituation(&ctx, buf.data(), nullptr, "UADVISOR_ZAG_CPU", "UADVISOR_ZAG_CPU"), KUI_BADINPUT);
    EXPECT_EQ(stub->bodies().size(), before) << "an internal situation is refused without a query";
    next = stubTable({{{"SITNAME", "BASE"}}});
    EXPECT_EQ(checkUADVISORSituation(&ctx, buf.data(), nullptr, "BASE", "BASE"), 0);

    next = stubTable({{{"VALUE", "06.30"}}});
    char* version = nullptr;
    EXPECT_EQ(getVemsVersion(&ctx, buf.data(), nullptr, &version), 0);
    EXPECT_STREQ(version, "06.30");
    next = "<html/>";
    EXPECT_EQ(getVemsVersion(&ctx, buf.data(), nullptr, &version), KUI_SERVER);
    next = "<TABLE><ROW><VALUE>06.30</ROW></TABLE>";  // a table, but not well-formed
    EXPECT_EQ(getVemsVersion(&ctx, buf.data(), nullptr, &version), KUI_INTERNAL);
}

TEST_F(KuiSoap, EventDestinationsNeedTheFacility) {
    int calls = 0;
    std::string eif = "Y";
    stub = std::make_unique<HttpStub>([&](const std::string& body) {
        calls++;
        if (body.find("SERVERINFO") != std::string::npos) return StubReply{200, stubTable({{{"VALUE", eif}}})};
        return StubReply{200, stubTable({{{"DESTID", "0"}}, {{"DESTID", "4"}}})};
    });
    ctx.serverUrl = stub->url();
    LinkedList list([](void* p) { free(p); });
    EXPECT_EQ(GetEventID(&list, &ctx), 0);
    ASSERT_EQ(list.NumEntries(), 2u);
    LinkedListIter it(&list);
    EXPECT_STREQ(static_cast<char*>(it.Next()), "0");
    EXPECT_STREQ(static_cast<char*>(it.Next()), "4");
    eif = "N";
    LinkedList off([](void* p) { free(p); });
    EXPECT_EQ(GetEventID(&off, &ctx), KUI_ABSENT);
    EXPECT_EQ(off.NumEntries(), 0u);
    EXPECT_EQ(calls, 3) << "a disabled facility is not asked for its destinations";
}

TEST_F(KuiSoap, RepliesAreReadIntoAnArrayOfRows) {
    char** values = nullptr;
    int count = 0;
    std::string two = stubTable({{{"A", "1"}, {"B", "x &amp; y"}}, {{"A", "2"}, {"B", ""}}});
    ASSERT_EQ(parseSoapResponseIntoArray(two.c_str(), &count, 2, &values), 0);
    ASSERT_EQ(count, 4);
    EXPECT_STREQ(values[0], "1");
    EXPECT_STREQ(values[1], "x & y");
    EXPECT_STREQ(values[2], "2");
    EXPECT_STREQ(values[3], "");
    releaseSoapResponseArray(values, count);
    EXPECT_EQ(parseSoapResponseIntoArray(stubTable({}).c_str(), &count, 1, &values), 5);
    EXPECT_EQ(parseSoapResponseIntoArray("<TABLE><ROW>", &count, 1, &values), 6);
    EXPECT_EQ(values, nullptr);
}

}  // namespace
