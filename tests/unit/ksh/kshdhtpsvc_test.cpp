// Tests of the hub services and the request callback: service-point names,
// the modes of kshstart, and a gateway started in START mode on a real store
// whose requests are routed by method and query string.
#include "kshdhtpsvc.h"

#include <curl/curl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>

#include "bss1/bss1.h"
#include "kdh1/kdh1.h"
#include "kshanchor.h"
#include "kshhub.h"
#include "kshssrv.h"
#include "kshstrt.h"
#include "sql1/sql1.h"

namespace fs = std::filesystem;

namespace {

std::string sourceDir() {
    const char* s = std::getenv("CSIT_SOURCE_DIR");
    return s != nullptr ? s : ".";
}

class ServicePointTest : public ::testing::Test {
protected:
    void SetUp() override {
        for (const char* v : {"KSH_SERVICEID", "KSH_SERVICETITLE", "KSH_SERVICEPOINT"}) unsetenv(v);
    }
    void TearDown() override { SetUp(); }
    std::string name(const char* node) {
        char out[WSQL_SERVICE_POINT_SIZE];
        WSQL_ServicePointName(node, out);
        return out;
    }
};

TEST_F(ServicePointTest, NamesComeFromTheNodeAndTheServiceIdentifier) {
    EXPECT_EQ(name("MYHOST"), "MYHOST_lms");
    EXPECT_EQ(name("HOST_ms"), "HOST_lms");
    EXPECT_EQ(name("HOST_msx"), "HOST_msx_lms");
    EXPECT_EQ(name("A_ms_ms"), "A_ms_lms");
    setenv("KSH_SERVICEID", "web", 1);
    EXPECT_EQ(name("MYHOST"), "MYHOST_web");
    setenv("KSH_SERVICEPOINT", "POINT_ms", 1);
    EXPECT_EQ(name("MYHOST"), "POINT_web");
}

TEST_F(ServicePointTest, AMissingOrOverlongNodeIsReplacedByTheHostName) {
    BSS1_HostInfo info;
    ASSERT_EQ(BSS1_Info(&info), 0);
    std::string host = info.hostName;
    size_t cut = host.rfind('_');
    if (cut != std::string::npos && host.substr(cut) == "_ms") host.erase(cut);
    EXPECT_EQ(name(nullptr), host + "_lms");
    EXPECT_EQ(name(""), host + "_lms");
    // 250 characters do not fit beside "_lms" in 256 bytes.
    EXPECT_EQ(name(std::string(250, 'N').c_str()), host + "_lms");
    EXPECT_EQ(name(std::string(249, 'N').c_str()), std::string(249, 'N') + "_lms");
    // An identifier that leaves no room for a node part stands alone.
    setenv("KSH_SERVICEID", std::string(254, 'i').c_str(), 1);
    EXPECT_EQ(name("MYHOST"), std::string(254, 'i'));
}

TEST_F(ServicePointTest, TheTitleIsTheDefaultOrTheVariableAndStarMeansNone) {
    ASSERT_NE(WSQL_ServiceTitle(), nullptr);
    EXPECT_STREQ(WSQL_ServiceTitle(), "Ondex Velstra Monitoring Web Services");
    setenv("KSH_SERVICETITLE", "My hub", 1);
    EXPECT_STREQ(WSQL_ServiceTitle(), "My hub");
    setenv("KSH_SERVICETITLE", "*", 1);
    EXPECT_EQ(WSQL_ServiceTitle(), nullptr);
}

TEST(GatewayModes, UnsupportedParametersAndAFailingHostStartNothing) {
    EXPECT_EQ(WSQL_KDH_StopServer(), 2);  // no hub list: nothing to delete
    WSQL_KDH_ResetStop();

    WSQL_Anchor bad;
    bad.parmPresent = 1;
    bad.startParm = "begin";
    EXPECT_EQ(kshstart(&bad), 0);
    EXPECT_EQ(gHubList, nullptr);
    EXPECT_EQ(bad.completion.posted, 0u);

    WSQL_Anchor noHost;
    noHost.parmPresent = 1;
    noHost.startParm = "start";  // any case; but the host cannot describe the local server
    noHost.serverInfo = [](void**, WSQL_LocalServer**) { return 8; };
    EXPECT_EQ(kshstart(&noHost), 0);
    EXPECT_EQ(noHost.flags & WSQL_ANCHOR_EMBEDDED, 0u);
    EXPECT_EQ(noHost.completion.posted, 0u);
}

// ---- a running gateway

size_t collect(char* data, size_t size, size_t n, void* out) {
    static_cast<std::string*>(out)->append(data, size * n);
    return size * n;
}

struct Reply {
    long status = 0;
    std::string body;
};

Reply request(const std::string& method, const std::string& url, const std::string& body = "") {
    Reply r;
    CURL* c = curl_easy_init();
    curl_easy_setopt(c, CURLOPT_URL, url.c_str());
    curl_easy_setopt(c, CURLOPT_CUSTOMREQUEST, method.c_str());
    curl_easy_setopt(c, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(c, CURLOPT_TIMEOUT, 20L);
    curl_easy_setopt(c, CURLOPT_WRITEFUNCTION, collect);
    curl_easy_setopt(c, CURLOPT_WRITEDATA, &r.body);
    if (!body.empty() || method == "POST" || method == "PUT") {
        curl_easy_setopt(c, CURLOPT_POSTFIELDS, body.c_str());
        curl_easy_setopt(c, CURLOPT_POSTFIELDSIZE, static_cast<long>(body.size()));
    }
    if (curl_easy_perform(c) == CURLE_OK) curl_easy_getinfo(c, CURLINFO_RESPONSE_CODE, &r.status);
    curl_easy_cleanup(c);
    return r;
}

WSQL_LocalServer gLocal{};
bool gValidate = true;

int hostInfo(void**, WSQL_LocalServer** out) {
    *out = &gLocal;
    return 0;
}
int hostConfig(const char* name, const char* value) {
    return std::string(name) == "VALIDATE" && std::string(value) == (gValidate ? "YES" : "NO") ? 0 : 1;
}

class RunningGateway : public ::testing::Test {
protected:
    static void SetUpTestSuite() { curl_global_init(CURL_GLOBAL_ALL); }
    static void TearDownTestSuite() { curl_global_cleanup(); }

    void SetUp() override {
        char tmpl[] = "/tmp/kshdhtpsvc_test.XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        root = tmpl;
        fs::create_directories(root / "HTML");
        std::ofstream(root / "HTML" / "default.htm") << "<html>default page</html>";
        setenv("KSH_DIRECTORY", (root / "HTML").c_str(), 1);
        setenv("CT_ATTRLIB", (sourceDir() + "/data/attrlib").c_str(), 1);
        setenv("KSH_SERVICETITLE", "*", 1);
        setenv("SQL1_PWHASH", "min", 1);
        unsetenv("KSH_HUB_FILE");
        unsetenv("KSH_SERVICEPOINT");

        std::string data = sourceDir() + "/data/store";
        SQL1_StoreOptions o;
        o.dataDir = data.c_str();
        o.adminPassword = "secret1";
        o.local = 1;
        store = (root / "hub.db").string();
        ASSERT_EQ(SQL1_RegisterServer("TEST_LMS", store.c_str(), &o), 0);

        std::snprintf(gLocal.alias, sizeof gLocal.alias, "TESTHUB_ms");
        gLocal.aliasLength = 10;
        std::snprintf(gLocal.lmsName, sizeof gLocal.lmsName, "TEST_LMS");
        SQL1_StoreInfo info{};
        ASSERT_EQ(SQL1_GetStoreInfo(store.c_str(), &info), 0);
        gLocal.version = std::atoi(info.version) * 100 + std::atoi(info.version + 3);
        gLocal.build = info.build;
        gLocal.options = info.nls ? WSQL_LOCAL_NLS : 0u;
        anchor.parmPresent = 1;
        anchor.startParm = "START";
        anchor.serverInfo = hostInfo;
        anchor.configCompare = hostConfig;
        ASSERT_EQ(KDH1_SetListenAddress("127.0.0.1", 0), 0u);
        starter = std::thread([this] { (void)kshstart(&anchor); });
        for (int i = 0; i < 1000 && port == 0; ++i) {
            port = KDH1_BoundPort();
            if (port == 0) std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        ASSERT_NE(port, 0);
        base = "http://127.0.0.1:" + std::to_string(port);
    }
    void TearDown() override {
        if (starter.joinable()) {
            EXPECT_EQ(kshstop(&anchor), 0);
            starter.join();
        }
        fs::remove_all(root);
    }

    fs::path root;
    std::string store;
    WSQL_Anchor anchor;
    std::thread starter;
    int port = 0;
    std::string base;
};

TEST_F(RunningGateway, RequestsAreRoutedByMethodAndAnExactLowerCaseActionQuery) {
    EXPECT_NE(anchor.flags & WSQL_ANCHOR_EMBEDDED, 0u);
    EXPECT_NE(anchor.flags & WSQL_ANCHOR_VALIDATE, 0u);
    EXPECT_EQ(anchor.threadStackSize % (64 * 4096), 0u);

    // "action" goes to the URL parser: an unknown action is its Error 400 page.
    Reply r = request("GET", base + "/soap/?action=Start");
    EXPECT_EQ(r.status, 400);
    EXPECT_NE(r.body.find("Invalid or missing action in query string."), std::string::npos) << r.body;
    // "Action" (capital A), PUT and HEAD go to the file server.
    r = request("GET", base + "/soap/?Action=start");
    EXPECT_NE(r.body.find("default page"), std::string::npos) << r.body;
    r = request("PUT", base + "/soap/", "x");
    EXPECT_NE(r.body.find("default page"), std::string::npos) << r.body;
    r = request("GET", base + "/soap/missing.htm");
    EXPECT_NE(r.body.find("File <EM>missing.htm</EM> not found"), std::string::npos) << r.body;
    // Any POST goes to the SOAP parser, whatever its query string.
    r = request("POST", base + "/soap/?action=start", "not xml at all");
    EXPECT_NE(r.body.find("<faultstring>XML parse error</faultstring>"), std::string::npos) << r.body;
    // A path that names no service reaches the local hub: a CT_SQL answers
    // with rows of its store.
    r = request("POST", base + "/nothing/here",
                "<CT_SQL><userid>sysadmin</userid><password>secret1</password><table>O4SRV.TSITDESC</table>"
                "<sql>SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = \"ZAG_CPU_Busy\"</sql></CT_SQL>");
    EXPECT_NE(r.body.find("<SITNAME>ZAG_CPU_Busy</SITNAME>"), std::string::npos) << r.body;
}

TEST_F(RunningGateway, TheLocalHubIsPublishedUnderItsServicePointWithoutTitle) {
    WSQL_Hub* local = searchHubList("testhub_MS");
    ASSERT_NE(local, nullptr);
    EXPECT_STREQ(local->getServiceName(), "soap");
    KDH1_service_info info{};
    ASSERT_EQ(KDH1_QueryService(local->getKDHServer(), &info), 0u);
    EXPECT_STREQ(info.name, "soap");
    EXPECT_STREQ(info.servicePoint, "TESTHUB_lms");
    EXPECT_FALSE(info.hasTitle);
    EXPECT_TRUE(info.listening);
}

TEST_F(RunningGateway, StopEndsTheMainRoutineAndPostsTheCompletionEvent) {
    WSQL_Hub* local = searchHubList("TESTHUB_ms");
    ASSERT_NE(local, nullptr);
    EXPECT_EQ(kshstop(&anchor), 0);
    starter.join();
    // kshstop consumed the event; the hub list is gone, the service deleted.
    EXPECT_EQ(anchor.completion.posted, 0u);
    EXPECT_EQ(gHubList, nullptr);
    EXPECT_EQ(searchHubList("TESTHUB_ms"), nullptr);
    EXPECT_FALSE(WSQL_KDH_Stopping());
    EXPECT_EQ(request("GET", base + "/soap/").status, 0);  // no listener any more
}

}  // namespace
