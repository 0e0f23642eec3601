// The request/response object over a transport double, its buffer and the
// URL helpers.
#include "kshhttp.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <string>
#include <utility>
#include <vector>

namespace {

// Records what the object sends instead of sending it.
class FakeServer : public WSQL_HttpServer {
public:
    explicit FakeServer(std::string q = "", size_t bufferSize = 0) : WSQL_HttpServer(bufferSize), query(std::move(q)) {}

    struct Headers {
        uint32_t status, media;
        uint64_t length;
        std::vector<std::pair<uint32_t, std::string>> extra;
    };

    const char* getRequestMethod() override { return "GET"; }
    const char* getQueryString() override { return query.c_str(); }
    const char* getPathInfo() override { return "/soap"; }
    const char* getPathTranslated() override { return "/soap"; }
    const char* getRequestClient() override { return "127.0.0.1:5000"; }
    int writeHeaders(uint32_t status, uint32_t media, uint64_t length, uint32_t n,
                     const KDH1_sendhdr_struct* hs) override {
        Headers h{status, media, length, {}};
        for (uint32_t i = 0; i < n; i++) h.extra.emplace_back(hs[i].kind, std::string(hs[i].value, hs[i].length));
        headers.push_back(h);
        return 0;
    }
    int writeClient(const char* data, size_t n) override {
        if (failWrites) return failWrites;
        sent.append(data, n);
        return 0;
    }
    int writeClientUTF8(const char* data, size_t n) override {
        utf8Writes++;
        return writeClient(data, n);
    }
    int readClient(char** data, uint32_t* n) override {
        *data = nullptr;
        *n = 0;
        return 0;
    }

    std::string query;
    std::string sent;
    std::vector<Headers> headers;
    int failWrites = 0;
    int utf8Writes = 0;
};

const std::string kDecl = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n";
const std::string kHead =
    "<SOAP-ENV:Envelope xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\"  "
    "SOAP-ENV:encodingStyle=\"http://schemas.xmlsoap.org/soap/encoding/\"> <SOAP-ENV:Body>";

// Allocator double: fails every allocation once armed.
bool failAllocations = false;
void* maybeAllocate(size_t n) { return failAllocations ? nullptr : calloc(n, 1); }

struct AllocatorGuard {
    AllocatorGuard() { WSQL_SetBufferAllocator(maybeAllocate); }
    ~AllocatorGuard() {
        failAllocations = false;
        WSQL_SetBufferAllocator(nullptr);
    }
};

}  // namespace

TEST(KshResponseBuffer, GrowsByDoublingTheNeedAndCountsTextWrittenInPlace) {
    WSQL_ResponseBuffer b;
    EXPECT_EQ(b.getMaxLength(), 10239u);
    std::string big(10240, 'x');
    ASSERT_EQ(b.append(big.data(), big.size()), 0);
    EXPECT_EQ(b.getMaxLength(), 40957u);
    EXPECT_EQ(b.getLength(), 10240u);
    EXPECT_EQ(std::string(b.getBuffer()), big) << "content kept and terminated by the zeroed growth";

    strcpy(static_cast<char*>(b), "tail");  // writing at the end directly
    EXPECT_EQ(b.getLength(), 10244u);
    EXPECT_EQ(b.freeSpace(), 40957u - 10244u);
    b.clear();
    EXPECT_EQ(b.getLength(), 0u);
    ASSERT_EQ(b.append("again"), 0);
    EXPECT_EQ(std::string(b.getBuffer(), b.getLength()), "again");
}

TEST(KshResponseBuffer, EscapingReplacesTheFiveSpecialCharactersAcrossGrowth) {
    FakeServer s("", 16);  // capacity 15: escaping must grow several times
    ASSERT_EQ(s.appendText("a<b & \"c\""), 0);
    ASSERT_EQ(s.appendText(" it's >"), 0);
    ASSERT_EQ(s.append("<raw/>"), 0);
    ASSERT_EQ(s.appendTextUTF8("plain text"), 0);
    WSQL_ResponseBuffer* b = s.getBuffer();
    EXPECT_EQ(std::string(b->getBuffer(), b->getLength()),
              "a&lt;b &amp; &quot;c&quot; it&apos;s &gt;<raw/>plain text");

    std::string many(1000, '&'), expected;
    for (int i = 0; i < 1000; i++) expected += "&amp;";
    b->clear();
    ASSERT_EQ(s.appendText(many.c_str()), 0);
    EXPECT_EQ(std::string(b->getBuffer(), b->getLength()), expected);
    EXPECT_LE(b->getLength(), b->getMaxLength());
}

TEST(KshResponseBuffer, GrowthFailuresKeepWhatWasCollected) {
    AllocatorGuard guard;
    FakeServer s("", 16);
    ASSERT_EQ(s.append("0123456789"), 0);
    failAllocations = true;
    EXPECT_EQ(s.append("0123456789"), 1) << "does not fit, cannot grow";
    EXPECT_EQ(s.appendText("<<<<"), 1) << "escaping stops when it cannot grow";
    WSQL_ResponseBuffer* b = s.getBuffer();
    std::string kept(b->getBuffer(), b->getLength());
    EXPECT_EQ(kept, "0123456789");
    EXPECT_EQ(b->getBuffer()[b->getLength()], '\0');

    EXPECT_EQ(s.setBuffer(0), 1) << "no memory for a new buffer";
    EXPECT_EQ(s.getBuffer(), nullptr);
    EXPECT_EQ(s.append("x"), 1);
    EXPECT_EQ(s.appendText("x"), 1);
    EXPECT_EQ(s.writeClientBuffer(), 1);
    EXPECT_EQ(s.WriteSoapResponse(), 6) << "the body could not be sent";
}

TEST(KshQueryString, ItemsAreSplitAndValuesDecoded) {
    FakeServer s("a=1&b=x%41y+z&c&d=&Name=%7e%7E&e=%4&f=%&x%41=2");
    ASSERT_EQ(s.parseQueryString(), 8);
    EXPECT_STREQ(s.getQueryValue("a"), "1");
    EXPECT_STREQ(s.getQueryValue("b"), "xAy z");
    EXPECT_STREQ(s.getQueryValue("c"), "");
    EXPECT_STREQ(s.getQueryValue("d"), "");
    EXPECT_STREQ(s.getQueryValue("Name"), "~~");
    EXPECT_EQ(s.getQueryValue("name"), nullptr) << "names match exactly";
    EXPECT_STREQ(s.getQueryValue("e"), "%4") << "a cut-off escape stays as it is";
    EXPECT_STREQ(s.getQueryValue("f"), "%");
    EXPECT_STREQ(s.getQueryValue("x%41"), "2") << "names are not decoded";
    EXPECT_EQ(s.query, "a=1&b=x%41y+z&c&d=&Name=%7e%7E&e=%4&f=%&x%41=2") << "the request's own text is untouched";

    std::string many;
    for (int i = 0; i < 25; i++) many += (i ? "&k" : "k") + std::to_string(i) + "=" + std::to_string(i);
    FakeServer t(many);
    EXPECT_EQ(t.parseQueryString(), 20);
    EXPECT_STREQ(t.getQueryValue("k19"), "19");
    EXPECT_EQ(t.getQueryValue("k20"), nullptr);
    EXPECT_STREQ(t.getQueryItems()[19].name, "k19");
}

TEST(KshQueryString, UnescapingStaysInsideTheText) {
    // Each text sits at the very end of its own allocation, so a read past
    // the terminating NUL is caught by the address sanitizer.
    for (const char* text : {"%", "%4", "abc%", "a+b%2", "%41%42%43"}) {
        size_t n = strlen(text) + 1;
        char* p = static_cast<char*>(malloc(n));
        memcpy(p, text, n);
        WSQL_UnescapeURL(p);
        EXPECT_LE(strlen(p), strlen(text));
        free(p);
    }
    char decoded[] = "%41%62+%7a%2F";
    WSQL_UnescapeURL(decoded);
    EXPECT_STREQ(decoded, "Ab z/");
    EXPECT_EQ(x2c("4a"), 'J');
    EXPECT_EQ(x2c("4A"), 'J');
}

TEST(KshSoap, ASuccessfulResponseWrapsTheBodyInTheEnvelope) {
    FakeServer s;
    ASSERT_EQ(s.addRawXMLHeader("<?first ?>\n"), 0);
    ASSERT_EQ(s.addXSLReference("view.xsl?a=1&b=\"2\""), 0);
    s.append("<DATA>1</DATA>");
    ASSERT_EQ(s.WriteSoapResponse(), 0);
    ASSERT_EQ(s.headers.size(), 1u);
    EXPECT_EQ(s.headers[0].status, 0u);
    EXPECT_EQ(s.headers[0].media, 17u);
    EXPECT_EQ(s.headers[0].length, 0u);
    ASSERT_EQ(s.headers[0].extra.size(), 1u);
    EXPECT_EQ(s.headers[0].extra[0], std::make_pair(59u, std::string("cache")));
    EXPECT_EQ(s.sent, kDecl + "<?first ?>\n" +
                          "<?xml-stylesheet type=\"text/xsl\" href=\"view.xsl?a=1&amp;b=&quot;2&quot;\" ?>\n" +
                          kHead +
                          "<SOAP-CHK:Success xmlns:SOAP-CHK = \"urn:lanthe-soap:check\" "
                          "xmlns=\"urn:lanthe-soap:attributes\"><DATA>1</DATA>"
                          "</SOAP-CHK:Success></SOAP-ENV:Body></SOAP-ENV:Envelope>");
    EXPECT_EQ(s.utf8Writes, 1) << "the body goes out through the UTF-8 writer";
    EXPECT_EQ(s.getBuffer()->getLength(), 0u) << "the buffer is emptied once sent";
}

TEST(KshSoap, OnlyTheFirstErrorIsRecordedAndItsTextsAreEscaped) {
    FakeServer s;
    s.append("<PARTIAL/>");
    s.setRequestError(true, "Bad <name> & more", "row \"7\"", 42);
    s.setRequestError(false, "second", "ignored", 43);
    EXPECT_TRUE(s.isRequestErrorSet());
    EXPECT_EQ(s.getErrorCode(), 42u);
    ASSERT_EQ(s.WriteSoapResponse(), 0);
    EXPECT_EQ(s.sent, kDecl + kHead +
                          "<SOAP-ENV:Fault>\n<faultcode>SOAP-ENV:Client</faultcode>\n"
                          "<faultstring>Bad &lt;name&gt; &amp; more</faultstring>\n<detail>row &quot;7&quot;</detail>\n"
                          "</SOAP-ENV:Fault></SOAP-ENV:Body></SOAP-ENV:Envelope>");

    FakeServer server;
    server.setRequestError(false, "Disk gone", "no detail for server faults", 9);
    server.WriteSoapResponse();
    EXPECT_NE(server.sent.find("<faultcode>SOAP-ENV:Server</faultcode>\n<faultstring>Disk gone</faultstring></SOAP-ENV:Fault>"),
              std::string::npos)
        << server.sent;

    FakeServer memory;
    memory.setRequestMemoryError();
    memory.setRequestError(true, "later", nullptr, 1);
    EXPECT_FALSE(memory.isClientFault());
    EXPECT_STREQ(memory.getFaultString(), "Unable to obtain memory.");
    EXPECT_EQ(memory.getFaultDetail(), nullptr);
}

TEST(KshSoap, TheErrorPageShowsTheStatusLessTheBaseAndAnEscapedMessage) {
    FakeServer s;
    ASSERT_EQ(s.returnError(KDH1_STC_BASE + 22, "No <b>file</b>", 3), 0);
    ASSERT_EQ(s.headers.size(), 1u);
    EXPECT_EQ(s.headers[0].status, 0u);
    EXPECT_EQ(s.headers[0].media, 6u);
    EXPECT_EQ(s.sent,
              "<HTML><HEAD><TITLE>Request Failed</TITLE></HEAD><BODY><H2>Request Failed:</H2><TABLE><TR><TH>Error "
              "Code</TH><TH>Status</TH><TH>Message</TH></TR><TD>22</TD><TD>3</TD><TD>No &lt;b&gt;file&lt;/b&gt;</TD>"
              "</TABLE></BODY></HTML>");
    FakeServer low;
    low.returnError(0x5C4C8002u, "Unable to allocate memory for filename.", 0);
    EXPECT_NE(low.sent.find("<TD>-536870910</TD>"), std::string::npos);
}
