// The file server through a real HTTP listener on loopback, and WSQL_File.
#include "kshfile.h"

#include <curl/curl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "kdh1/kdh1.h"
#include "kshdhtp.h"
#include "kshhttp.h"

namespace {

std::string gRoot;  // temporary folder holding the file directory "html" and a secret beside it
std::string gDir;

const char kSecret[] = "TOP-SECRET-CONTENT";
const time_t kModified = 1796119200;  // Tue, 01 Dec 2026 10:00:00 GMT

void writeFile(const std::string& path, const std::string& content) {
    std::ofstream(path, std::ios::binary) << content;
    struct timeval times[2] = {{kModified, 0}, {kModified, 0}};
    utimes(path.c_str(), times);
}

std::string pattern(size_t n) {
    std::string s(n, '\0');
    for (size_t i = 0; i < n; i++) s[i] = static_cast<char>((i * 31 + i / 977) & 0xFF);
    return s;
}

// A stand-in for the hub: the file server needs only its service name.
struct HubStandIn {
    const char* getServiceName() const { return "soap"; }
};

int fileService(KDH1_request_struct* r) {
    WSQL_KDHServer server(r);
    HubStandIn hub;
    return WSQL_FileServer::serveFile(&server, &hub);
}

// Answers a POST with its body inside a SOAP envelope, through the same
// request object the gateway uses.
int echoService(KDH1_request_struct* r) {
    WSQL_KDHServer server(r);
    char* body = nullptr;
    uint32_t length = 0;
    int rc = server.readClient(&body, &length);
    server.parseQueryString();
    std::string facts = std::string(server.getRequestMethod()) + " " + server.getPathInfo() + " " +
                        (server.getQueryValue("n") ? server.getQueryValue("n") : "-") + " " +
                        std::to_string(length) + " ";
    server.appendText(facts.c_str());
    server.appendText(body ? body : "");
    free(body);
    if (rc != 0) server.setRequestError(false, "read failed", nullptr, rc);
    return server.WriteSoapResponse();
}

KDH1_server_t gServer = 0, gEcho = 0;
std::thread gListener, gEchoListener;

class Env : public ::testing::Environment {
public:
    void SetUp() override {
        char tmpl[] = "/tmp/kshfile-XXXXXX";
        gRoot = mkdtemp(tmpl);
        gDir = gRoot + "/html";
        mkdir(gDir.c_str(), 0755);
        mkdir((gDir + "/docs.old").c_str(), 0755);
        mkdir((gDir + "/sub").c_str(), 0755);
        writeFile(gRoot + "/secret", kSecret);
        writeFile(gDir + "/index.htm", "<p>index</p>");
        writeFile(gDir + "/default.htm", "<p>default</p>");
        writeFile(gDir + "/kshhsoap.htm", "<p>front page</p>");
        writeFile(gDir + "/style.css", "p{}");
        writeFile(gDir + "/doc.pdf", "%PDF-1.4");
        writeFile(gDir + "/readme", "read me");
        writeFile(gDir + "/data.tar.gz", "gz");
        writeFile(gDir + "/docs.old/page.xml", "<page/>");
        writeFile(gDir + "/hubs-here.xml", "<ENTERPRISE/>");
        writeFile(gDir + "/.profile", kSecret);
        writeFile(gDir + "/exact.bin", pattern(3 * 10239));
        writeFile(gDir + "/big.bin", pattern(5 * 1024 * 1024 + 17));
        symlink("../secret", (gDir + "/link.htm").c_str());
        symlink("index.htm", (gDir + "/alias.htm").c_str());
        symlink("../..", (gDir + "/sub/out").c_str());
        setenv("KSH_DIRECTORY", gDir.c_str(), 1);
        setenv("KSH_HUB_FILE", "hubs-here.xml", 1);

        curl_global_init(CURL_GLOBAL_ALL);
        KDH1_SetListenAddress("127.0.0.1", 0);
        KDH1_limits_struct limits{};
        limits.maxEntity = 4096;
        KDH1_SetLimits(&limits);
        ASSERT_EQ(KDH1_New(&gServer, "soap", fileService, nullptr, 0, 0), 0u);
        gListener = std::thread([] { KDH1_Listen(gServer, 0); });
        ASSERT_EQ(KDH1_New(&gEcho, "echo", echoService, nullptr, 0, 0), 0u);
        gEchoListener = std::thread([] { KDH1_Listen(gEcho, 0); });
        for (int i = 0; i < 2000 && KDH1_BoundPort() == 0; i++) std::this_thread::sleep_for(std::chrono::milliseconds(5));
        ASSERT_NE(KDH1_BoundPort(), 0);
    }
    void TearDown() override {
        KDH1_Delete(gServer);
        KDH1_Delete(gEcho);
        gListener.join();
        gEchoListener.join();
        curl_global_cleanup();
        std::string cmd = "rm -rf '" + gRoot + "'";
        EXPECT_EQ(system(cmd.c_str()), 0);
    }
};
const auto* env = ::testing::AddGlobalTestEnvironment(new Env);

struct Reply {
    CURLcode rc = CURLE_OK;
    long status = 0;
    std::string body;
    std::map<std::string, std::string> headers;
};

size_t onHeader(char* p, size_t, size_t n, void* ud) {
    std::string line(p, n);
    size_t colon = line.find(':');
    if (colon != std::string::npos) {
        std::string name = line.substr(0, colon);
        for (auto& c : name) c = static_cast<char>(tolower(c));
        std::string value = line.substr(colon + 1);
        value.erase(0, value.find_first_not_of(' '));
        value.erase(value.find_last_not_of("\r\n") + 1);
        static_cast<Reply*>(ud)->headers[name] = value;
    }
    return n;
}

size_t onBody(char* p, size_t, size_t n, void* ud) {
    static_cast<Reply*>(ud)->body.append(p, n);
    return n;
}

// Sends `path` exactly as written (no dot-segment clean-up by the client).
Reply get(const std::string& path, const std::string& postBody = "") {
    Reply r;
    std::string url = "http://127.0.0.1:" + std::to_string(KDH1_BoundPort()) + path;
    CURL* c = curl_easy_init();
    curl_easy_setopt(c, CURLOPT_URL, url.c_str());
    curl_easy_setopt(c, CURLOPT_PATH_AS_IS, 1L);
    curl_easy_setopt(c, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(c, CURLOPT_TIMEOUT, 60L);
    curl_easy_setopt(c, CURLOPT_HEADERFUNCTION, onHeader);
    curl_easy_setopt(c, CURLOPT_HEADERDATA, &r);
    curl_easy_setopt(c, CURLOPT_WRITEFUNCTION, onBody);
    curl_easy_setopt(c, CURLOPT_WRITEDATA, &r);
    if (!postBody.empty()) {
        curl_easy_setopt(c, CURLOPT_POSTFIELDS, postBody.c_str());
        curl_easy_setopt(c, CURLOPT_POSTFIELDSIZE, (long)postBody.size());
    }
    r.rc = curl_easy_perform(c);
    curl_easy_getinfo(c, CURLINFO_RESPONSE_CODE, &r.status);
    curl_easy_cleanup(c);
    return r;
}

std::string notFoundPage(const std::string& name) {
    return "<HTML><HEAD><TITLE>File " + name + " not found</TITLE></HEAD><BODY><H3>File <EM>" + name +
           "</EM> not found</H3> </BODY></HTML>";
}

// Transport double for counting what the file server writes.
class CountingServer : public WSQL_HttpServer {
public:
    explicit CountingServer(std::string p) : path(std::move(p)) {}
    const char* getRequestMethod() override { return "GET"; }
    const char* getQueryString() override { return ""; }
    const char* getPathInfo() override { return path.c_str(); }
    const char* getPathTranslated() override { return path.c_str(); }
    const char* getRequestClient() override { return ""; }
    int writeHeaders(uint32_t, uint32_t, uint64_t length, uint32_t, const KDH1_sendhdr_struct*) override {
        announced = length;
        return 0;
    }
    int writeClient(const char* d, size_t n) override {
        writes.push_back(n);
        body.append(d, n);
        return 0;
    }
    int writeClientUTF8(const char* d, size_t n) override { return writeClient(d, n); }
    int readClient(char**, uint32_t*) override { return 0; }
    std::string path, body;
    std::vector<size_t> writes;
    uint64_t announced = 0;
};

}  // namespace

TEST(KshFileServer, ServesFilesWithTheirMediaTypeLengthAndModificationTime) {
    struct Case {
        const char* path;
        const char* body;
        const char* type;
    };
    const Case cases[] = {
        {"/SOAP/Index.HTM", "<p>index</p>", "text/html"},
        {"/soap/style.css", "p{}", "text/css"},
        {"/soap/DOC.PDF", "%PDF-1.4", "application/pdf"},
        {"/soap/readme", "read me", "text/plain"},
        {"/soap/data.tar.gz", "gz", "application/octet-stream"},
        {"/soap/docs.old/page.xml", "<page/>", "application/octet-stream"},
        {"/soap/alias.htm", "<p>index</p>", "text/html"},  // a link that stays inside is followed
    };
    for (const Case& c : cases) {
        Reply r = get(c.path);
        EXPECT_EQ(r.status, 200) << c.path;
        EXPECT_EQ(r.body, c.body) << c.path;
        EXPECT_EQ(r.headers["content-type"], c.type) << c.path;
        EXPECT_EQ(r.headers["content-length"], std::to_string(strlen(c.body))) << c.path;
        EXPECT_EQ(r.headers["last-modified"], "Tue, 01 Dec 2026 10:00:00 GMT") << c.path;
    }
    EXPECT_EQ(WSQL_FileServer::determineMediaType("report.pdf"), 60u);
    EXPECT_EQ(WSQL_FileServer::determineMediaType("README"), 2u);
    EXPECT_EQ(WSQL_FileServer::determineMediaType("a.wsdl"), 17u);
    EXPECT_EQ(WSQL_FileServer::determineMediaType("a.xs"), 44u) << "a prefix of an extension is no match";
    EXPECT_EQ(WSQL_FileServer::determineMediaType("a."), 44u);
    char mvs[WSQL_MVS_NAME_SIZE];
    WSQL_FileServer::convertMVSFilename("qualifierlong", "averylongname.htm", mvs);
    EXPECT_STREQ(mvs, "AVERYLON.QUALIFIE");
    WSQL_FileServer::convertMVSFilename(nullptr, "x", mvs);
    EXPECT_STREQ(mvs, "X.");
}

TEST(KshFileServer, PathsWithoutAFileServeTheDefaultFiles) {
    EXPECT_EQ(get("/soap").body, "<p>front page</p>");
    EXPECT_EQ(get("/elsewhere").body, "<p>front page</p>") << "no service name in the path";
    EXPECT_EQ(get("/soap/").body, "<p>default</p>");
    EXPECT_EQ(get("/soap/kshxhubs.xml").body, "<ENTERPRISE/>") << "the hub file under its default name";
    setenv("KSH_DEFAULTFILE", "/index.htm", 1);
    EXPECT_EQ(get("/soap").body, "<p>index</p>");
    unsetenv("KSH_DEFAULTFILE");
}

TEST(KshFileServer, NoEncodingOrLinkReachesOutsideTheFileDirectory) {
    const char* refused[] = {
        "/soap/../secret",          "/soap/%2e%2e/secret",     "/soap/%2E%2E%2Fsecret",  "/soap/..%2fsecret",
        "/soap/.%2e/secret",        "/soap/%2e./secret",       "/soap/sub/%2e%2e/%2e%2e/secret",
        "/soap/..\\secret",         "/soap/%5c..%5csecret",    "/soap/sub%5c..%5c..%5csecret",
        "/soap/.profile",           "/soap/%2eprofile",        "/soap/sub/.profile",     "/soap/%2e",
    };
    for (const char* path : refused) {
        Reply r = get(path);
        EXPECT_EQ(r.status, 200) << path;
        EXPECT_EQ(r.body.find(kSecret), std::string::npos) << path;
        EXPECT_NE(r.body.find("Illegal filename specified"), std::string::npos) << path << ": " << r.body;
        EXPECT_NE(r.body.find("<TD>22</TD>"), std::string::npos) << path;
    }
    // Decoded once only: a doubly encoded dot pair is just an odd file name.
    Reply twice = get("/soap/%252e%252e/secret");
    EXPECT_EQ(twice.body, notFoundPage("%2e%2e/secret"));
    // Links that lead out are not followed.
    for (const char* path : {"/soap/link.htm", "/soap/sub/out/secret", "/soap//etc/passwd", "/soap/sub"}) {
        Reply r = get(path);
        EXPECT_EQ(r.body.find(kSecret), std::string::npos) << path;
        EXPECT_EQ(r.body.find("root:"), std::string::npos) << path;
        EXPECT_NE(r.body.find("not found"), std::string::npos) << path << ": " << r.body;
    }
}

TEST(KshFileServer, MissingFilesAnswerWithAnEscapedPageOrXmlDocument) {
    Reply xml = get("/soap/nothere.htm?xsl=err.xsl");
    EXPECT_EQ(xml.status, 200);
    EXPECT_EQ(xml.headers["content-type"], "text/xml");
    EXPECT_EQ(xml.body,
              "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<?xml-stylesheet type=\"text/xsl\" href=\"err.xsl\" ?>\n"
              "<REQUEST>\n<PARMS>\n<error>Not found</error>\n</PARMS>\n</REQUEST>");
    Reply quoted = get("/soap/nothere.htm?xsl=a%22%3e%3cx%3e.xsl");
    EXPECT_NE(quoted.body.find("href=\"a&quot;&gt;&lt;x&gt;.xsl\""), std::string::npos) << quoted.body;

    Reply html = get("/soap/nothere.htm");
    EXPECT_EQ(html.headers["content-type"], "text/html");
    EXPECT_EQ(html.body, notFoundPage("nothere.htm"));
    Reply markup = get("/soap/%3cscript%3ealert(1)%3c%2fscript%3e.htm");
    EXPECT_EQ(markup.body.find("<script>"), std::string::npos);
    EXPECT_NE(markup.body.find("&lt;script&gt;alert(1)&lt;"), std::string::npos) << markup.body;
}

TEST(KshFileServer, FilesGoOutInBufferSizedChunksWithNoEmptyTail) {
    Reply exact = get("/soap/exact.bin");
    EXPECT_EQ(exact.rc, CURLE_OK);
    EXPECT_EQ(exact.headers["content-length"], std::to_string(3 * 10239));
    EXPECT_TRUE(exact.body == pattern(3 * 10239));
    Reply big = get("/soap/big.bin");
    EXPECT_EQ(big.rc, CURLE_OK);
    EXPECT_TRUE(big.body == pattern(5 * 1024 * 1024 + 17));

    CountingServer s("/soap/exact.bin");
    WSQL_FileServer::serveFile(&s, "soap");
    EXPECT_EQ(s.writes, (std::vector<size_t>{10239, 10239, 10239}));
    EXPECT_EQ(s.announced, 3u * 10239);
    writeFile(gDir + "/exact5.bin", pattern(3 * 10239 + 5));
    CountingServer t("/soap/exact5.bin");
    WSQL_FileServer::serveFile(&t, "soap");
    EXPECT_EQ(t.writes, (std::vector<size_t>{10239, 10239, 10239, 5}));
    EXPECT_TRUE(t.body == pattern(3 * 10239 + 5));
}

TEST(KshFileServer, AnOverLargeRequestBodyIsRefusedBeforeServing) {
    EXPECT_EQ(get("/soap/index.htm", std::string(4097, 'x')).status, 413);
    EXPECT_EQ(get("/soap/index.htm", std::string(100, 'x')).body, "<p>index</p>");
}

TEST(KshKDHServer, ARequestBodyComesBackInsideASoapEnvelope) {
    Reply r = get("/echo/x?n=a%26b", "<q>&\"</q>");
    EXPECT_EQ(r.status, 200);
    EXPECT_EQ(r.headers["content-type"], "text/xml");
    EXPECT_EQ(r.headers["cache-control"], "cache");
    EXPECT_EQ(r.headers.count("connection"), 0u) << "a request that read its body may keep the connection";
    EXPECT_NE(r.body.find("xmlns=\"urn:lanthe-soap:attributes\">POST /echo/x a&amp;b 9 &lt;q&gt;&amp;&quot;&lt;/q&gt;"
                          "</SOAP-CHK:Success>"),
              std::string::npos)
        << r.body;
    Reply empty = get("/echo?n=1");
    EXPECT_NE(empty.body.find(">GET /echo 1 0 </SOAP-CHK:Success>"), std::string::npos) << empty.body;
}

TEST(KshFile, WritesReadsAndReportsFailuresToTheRequest) {
    std::string name = gDir + "/export.txt";
    {
        WSQL_File out(name.c_str(), WSQL_FILE_WRITE);
        ASSERT_EQ(out.open(nullptr), 0);
        EXPECT_EQ(out.write("line one\n", 9, nullptr), 0);
        EXPECT_EQ(out.write("line two\n", 9, nullptr), 0);
        EXPECT_EQ(out.getBytesWritten(), 18u);
        // Left open on purpose: the destructor closes and flushes it.
    }
    WSQL_File in(name.c_str(), WSQL_FILE_READ);
    EXPECT_EQ(in.getFileSize(), 19u) << "the size plus room for a NUL";
    ASSERT_EQ(in.open(nullptr), 0);
    char line[6];
    EXPECT_EQ(in.readRecord(line, sizeof line, nullptr), 0);
    EXPECT_STREQ(line, "line ");
    WSQL_ResponseBuffer* rest = nullptr;
    EXPECT_EQ(in.read(&rest, 4, nullptr), 0);
    ASSERT_NE(rest, nullptr);
    EXPECT_EQ(std::string(rest->getBuffer(), rest->getLength()), "one\nline two\n");
    delete rest;
    char byte;
    EXPECT_EQ(in.read(&byte, 1, nullptr), 5) << "end of file";
    in.close();

    WSQL_File relative("export.txt", WSQL_FILE_READ);
    ASSERT_EQ(relative.buildPath(), 0);
    EXPECT_EQ(std::string(relative.getPath()), gDir + "/export.txt");
    std::string longName(300, 'n');
    WSQL_File tooLong(longName.c_str(), WSQL_FILE_READ);
    EXPECT_EQ(tooLong.buildPath(), 7) << "a path that does not fit is not cut";
    EXPECT_EQ(tooLong.getFileSize(), 0u);

    CountingServer request("/soap");
    WSQL_File missing((gDir + "/no/such/file").c_str(), WSQL_FILE_READ);
    EXPECT_EQ(missing.open(&request), 5);
    EXPECT_TRUE(request.isClientFault());
    EXPECT_STREQ(request.getFaultString(), "Unable to open file.");
    EXPECT_EQ(std::string(request.getFaultDetail()), gDir + "/no/such/file");
    WSQL_File odd(name.c_str(), static_cast<WSQL_File_Open_Mode>(3));
    EXPECT_EQ(odd.open(nullptr), 6);

    WSQL_File full("/dev/full", WSQL_FILE_WRITE);
    ASSERT_EQ(full.open(nullptr), 0);
    std::string lots(1 << 16, 'f');
    CountingServer writer("/soap");
    EXPECT_EQ(full.write(lots.data(), lots.size(), &writer), 8);
    EXPECT_STREQ(writer.getFaultString(), "Error writing to file.");
    EXPECT_FALSE(writer.isClientFault());
}
