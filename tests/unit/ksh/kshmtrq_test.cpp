// The meta request's batch, with the route and execute requests, through the
// real SOAP dispatch against a real hub store. CT_Export to a file carries
// the batches: its file holds the output even when a sub-request's fault
// replaces the SOAP body. Routed envelopes go to a small HTTP server on
// loopback.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "kshexreq.h"
#include "kshmtrq.h"
#include "kshspc_fixture.h"
#include "kshxslt.h"
#include "platform/loopback.h"

namespace {

using spc::contains;
using spc::readAll;
using spc::sitGet;
using spc::soapBody;

// True when the parts occur in `text` in this order.
::testing::AssertionResult inOrder(const std::string& text, const std::vector<std::string>& parts) {
    size_t at = 0;
    for (const std::string& p : parts) {
        size_t found = text.find(p, at);
        if (found == std::string::npos) return ::testing::AssertionFailure() << "\"" << p << "\" missing or out of order in\n" << text;
        at = found + p.size();
    }
    return ::testing::AssertionSuccess();
}

class MetaRequest : public spc::SpecialTest {};

TEST_F(MetaRequest, BatchWritesEveryStepBetweenPrefixAndSuffix) {
    file("pre.xml", "<report>");
    file("post.xml", "</report>");
    file("note.txt", "attached & raw");
    auto h = post("CT_Export",
                  "<filename>out.xml</filename><prefix>pre.xml</prefix><suffix>post.xml</suffix>"
                  "<stylesheet>any.xsl</stylesheet>"
                  "<request id=\"get\">" + sitGet() + "</request>"
                  "<request id=\"att\"><attach>note.txt</attach></request>"
                  "<request><insert><row a=\"1\">v</row></insert></request>"
                  "<request id=\"miss\"><attach>missing.txt</attach></request>"
                  "<request id=\"esc\"><attach>../hub.db</attach></request>"
                  "<request id=\"q&quot;&lt;\"><unknown/></request>");
    EXPECT_EQ(lastRc, 0);
    ASSERT_FALSE(h->isRequestErrorSet()) << h->fault();
    const std::string body = soapBody(*h);
    const std::string error = "\n<error>Unable to attach file</error>\n";
    EXPECT_TRUE(inOrder(body, {"<report>", "<XML ID=\"get\"><TABLE name=\"O4SRV.TSITDESC\">",
                               "<SITNAME>ZAG_CPU_Busy</SITNAME>", "</TABLE>\n</XML>",
                               "<XML ID=\"att\">attached & raw</XML>", "<row a=\"1\">v</row>",
                               "<XML ID=\"miss\">" + error + "</XML>", "<XML ID=\"esc\">" + error + "</XML>",
                               "<XML ID=\"q&quot;&lt;\"></XML>", "</report>"}));
    // Only the request with an id gets a wrapper, and the stylesheet's
    // failure ends the answer.
    EXPECT_EQ(spc::countOf(body, "<XML ID="), 5);
    EXPECT_EQ(body.rfind("</report><transform>FAILED</transform>"), body.size() - 38);
    // The exported output is the same text without the transform's mark.
    EXPECT_EQ(readAll(html + "/out.xml"), body.substr(0, body.size() - 29));
}

TEST_F(MetaRequest, OutputStaysValidWhenTheFailureMarkGrowsTheBuffer) {
    // An output that nearly fills the first response buffer (10239 bytes):
    // appending the transform's mark moves the buffer, and the exported
    // output must be read from where it is now.
    const std::string row = "<p>" + std::string(10223, 'x') + "</p>";
    ASSERT_EQ(row.size(), 10230u);
    auto h = post("CT_Export", "<filename>full.xml</filename><stylesheet>s.xsl</stylesheet>"
                               "<request><insert>" + row + "</insert></request>");
    EXPECT_EQ(lastRc, 0);
    EXPECT_EQ(soapBody(*h), row + "<transform>FAILED</transform>");
    EXPECT_EQ(readAll(html + "/full.xml"), row);
}

TEST_F(MetaRequest, BatchWithoutRequestsOrPrefixFile) {
    file("post.xml", "</report>");
    auto h = post("CT_Export", "<filename>out.xml</filename><prefix>none.xml</prefix><suffix>post.xml</suffix>");
    EXPECT_EQ(lastRc, 0);
    EXPECT_EQ(soapBody(*h), "</report>");
    EXPECT_EQ(readAll(html + "/out.xml"), "</report>");

    // Prefix and suffix names that could leave the file directory are not
    // read at all.
    file("../outside.xml", "SECRET");
    auto refused = post("CT_Export", "<filename>out2.xml</filename><prefix>../outside.xml</prefix>"
                                     "<suffix>/etc/hostname</suffix>");
    EXPECT_EQ(soapBody(*refused), "");
}

TEST_F(MetaRequest, FailingSubRequestsLeaveTheBatchGoingOn) {
    auto h = post("CT_Export", "<filename>out.xml</filename>"
                               "<request id=\"a\"><CT_Get><hub>nowhere</hub><table>O4SRV.TSITDESC</table>" +
                                   spc::creds() + "</CT_Get></request>"
                               "<request id=\"b\"><insert><ok>k</ok></insert></request>");
    EXPECT_TRUE(h->isClientFault());
    EXPECT_EQ(h->fault(), "Invalid Hub Alias.");
    EXPECT_TRUE(contains(h->sent, "<faultstring>Invalid Hub Alias.</faultstring>"));
    EXPECT_EQ(readAll(html + "/out.xml"), "<XML ID=\"a\"></XML><XML ID=\"b\"><ok>k</ok></XML>");

    // A request element without a sub-request is an internal error that
    // ends the batch.
    auto broken = post("CT_Export", "<filename>out2.xml</filename>"
                                    "<request id=\"1\"><insert><one>1</one></insert></request><request id=\"2\"/>"
                                    "<request id=\"3\"><insert><three>3</three></insert></request>");
    EXPECT_FALSE(broken->isClientFault());
    EXPECT_EQ(broken->fault(), "Internal error processing sub-request");
    EXPECT_EQ(readAll(html + "/out2.xml"), "<XML ID=\"1\"><one>1</one></XML>");
}

TEST_F(MetaRequest, ExecutedFilesRunIntoTheSameResponse) {
    file("inner.xml", "<CT_Export><filename>inner-out.xml</filename>"
                      "<request id=\"in\"><insert><inner>i</inner></insert></request></CT_Export>");
    auto top = post("CT_Execute", "<filename>inner.xml</filename>");
    EXPECT_EQ(lastRc, 0);
    EXPECT_EQ(soapBody(*top), "<XML ID=\"in\"><inner>i</inner></XML>");
    EXPECT_EQ(readAll(html + "/inner-out.xml"), "<XML ID=\"in\"><inner>i</inner></XML>");

    // An execute step of a batch: the element's own text names the file.
    auto step = post("CT_Export", "<filename>outer.xml</filename>"
                                  "<request id=\"ex\"><execute>inner.xml</execute></request>");
    EXPECT_EQ(soapBody(*step), "<XML ID=\"ex\"><XML ID=\"in\"><inner>i</inner></XML></XML>");

    // A file that executes itself ends with a fault, not with the stack.
    file("self.xml", "<CT_Execute><filename>self.xml</filename></CT_Execute>");
    auto self = post("CT_Execute", "<filename>self.xml</filename>");
    EXPECT_EQ(self->fault(), "Execute files nested too deeply.");

    struct {
        std::string inner;
        std::string fault;
        std::string detail;
    } failing[] = {
        {"<filename>nothere.xml</filename>", "Unable to open or read execute file.", "nothere.xml"},
        {"<filename>../hub.db</filename>", "Unable to open or read execute file.", "../hub.db"},
        {"<filename/>", "Execute filename missing.", ""},
        {"<file>inner.xml</file>", "Execute filename tag missing.", ""},
    };
    for (const auto& f : failing) {
        auto h = post("CT_Execute", f.inner);
        EXPECT_TRUE(h->isClientFault()) << f.inner;
        EXPECT_EQ(h->fault(), f.fault) << f.inner;
        EXPECT_EQ(h->detail(), f.detail) << f.inner;
    }
}

TEST_F(MetaRequest, RoutedEnvelopesAnswerWithTheirBody) {
    loopback::MiniHttp withBody;
    withBody.body = "<?xml version=\"1.0\"?><SOAP-ENV:Envelope><SOAP-ENV:Body xmlns:x=\"u\"><TABLE>r</TABLE>"
                    "</SOAP-ENV:Body></SOAP-ENV:Envelope>";
    loopback::MiniHttp plain;
    plain.body = "<plain>no body here</plain>";
    const std::string envelope =
        "<SOAP-ENV:Envelope xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\"><SOAP-ENV:Body>"
        "<CT_Get><x>1 &amp; 2</x></CT_Get></SOAP-ENV:Body></SOAP-ENV:Envelope>";
    auto h = post("CT_Redirect", "<request endpoint=\"" + withBody.url() + "\" id=\"r1\">" + envelope + "</request>"
                                 "<request endpoint=\"" + plain.url() + "\">" + envelope + "</request>");
    EXPECT_EQ(lastRc, 0);
    EXPECT_EQ(soapBody(*h), "<TABLE>r</TABLE>" + plain.body);
    auto sent = withBody.requests();
    ASSERT_EQ(sent.size(), 1u);
    EXPECT_EQ(sent[0].substr(sent[0].find("\r\n\r\n") + 4).rfind("<SOAP-ENV:Envelope", 0), 0u) << sent[0];
    EXPECT_TRUE(contains(sent[0], "<CT_Get><x>1 &amp; 2</x></CT_Get></SOAP-ENV:Body></SOAP-ENV:Envelope>"));

    // A request without an endpoint, or without an envelope, sends nothing
    // and faults; the following request is still routed.
    auto faults = post("CT_Redirect", "<request><x/></request>"
                                      "<request endpoint=\"" + withBody.url() + "\"><x/></request>"
                                      "<request endpoint=\"" + withBody.url() + "\">" + envelope + "</request>");
    EXPECT_EQ(faults->fault(), "No endpoint attribute specified for CT_Redirect request.");
    EXPECT_EQ(withBody.requests().size(), 2u);
    auto noEnvelope = post("CT_Redirect", "<request endpoint=\"" + withBody.url() + "\"><x/></request>");
    EXPECT_EQ(noEnvelope->fault(), "Unable to redirect SOAP request - SOAP-ENV:Envelope element missing.");
    EXPECT_EQ(withBody.requests().size(), 2u);

    std::string gone;
    {
        loopback::MiniHttp closed;
        gone = closed.url();
    }
    auto unreachable = post("CT_Redirect", "<request endpoint=\"" + gone + "\">" + envelope + "</request>");
    EXPECT_TRUE(unreachable->isClientFault());
    EXPECT_EQ(unreachable->fault(), "Unable to redirect SOAP request.");
    EXPECT_EQ(unreachable->detail(), gone);

    // A CT_Redirect step of a batch routes the envelope inside it.
    auto step = post("CT_Export", "<filename>routed.xml</filename><request id=\"rt\"><CT_Redirect endpoint=\"" +
                                      withBody.url() + "\">" + envelope + "</CT_Redirect></request>");
    EXPECT_EQ(readAll(html + "/routed.xml"), "<XML ID=\"rt\"><TABLE>r</TABLE></XML>");
    EXPECT_EQ(withBody.requests().size(), 3u);
}

TEST(MetaRequestNames, OnlyNamesInsideTheFileDirectory) {
    for (const char* ok : {"a.xml", "sub/a.xml", "a..b.xml", "sub/dir/x"})
        EXPECT_TRUE(WSQL_MetaRequest::staysInFileDirectory(ok)) << ok;
    for (const char* bad : {"", "/etc/hostname", ".hidden", "..", "../x", "sub/../../x", "sub/.x", static_cast<const char*>(nullptr)})
        EXPECT_FALSE(WSQL_MetaRequest::staysInFileDirectory(bad)) << (bad ? bad : "(null)");

    WSQL_XSLT xslt;
    char* out = reinterpret_cast<char*>(&xslt);
    uint32_t n = 77;
    EXPECT_EQ(xslt.transformObject("<a/>", 4, "s.xsl", &out, &n), WSQL_XSLT_FAILED);
    EXPECT_EQ(out, reinterpret_cast<char*>(&xslt));
    EXPECT_EQ(n, 77u);
}

}  // namespace
