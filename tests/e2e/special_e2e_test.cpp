// End to end: the special requests of a running vemsd over HTTP. Batches
// with every kind of step, routing to a second vemsd, executed files,
// affinity look-ups, mail to a real SMTP server on loopback (aiosmtpd with
// the handler smtp_sink.py beside this file) and exports to files and to
// the warehouse table of the hub store.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <ctime>
#include <string>
#include <thread>
#include <vector>

#include "e2efix.h"

using namespace e2e;

extern char** environ;

namespace {

bool contains(const std::string& text, const std::string& part) { return text.find(part) != std::string::npos; }

std::string credentials() { return std::string("<userid>sysadmin</userid><password>") + kAdminPassword + "</password>"; }

std::string sitGet() {
    return "<CT_Get>" + credentials() +
           "<table>O4SRV.TSITDESC</table><column>SITNAME</column><filter>SITNAME;EQ;ZAG_CPU_Busy</filter></CT_Get>";
}

// The body of a successful SOAP answer, or what came instead.
std::string body(const Reply& r) {
    size_t at = r.body.find("<SOAP-CHK:Success");
    size_t from = at == std::string::npos ? at : r.body.find('>', at);
    size_t to = r.body.find("</SOAP-CHK:Success>");
    if (from == std::string::npos || to == std::string::npos) return "(not a success: " + r.body + ")";
    return r.body.substr(from + 1, to - from - 1);
}

std::string faultString(const Reply& r) {
    size_t from = r.body.find("<faultstring>");
    size_t to = r.body.find("</faultstring>");
    return from == std::string::npos || to == std::string::npos ? "(no fault: " + r.body + ")"
                                                                 : r.body.substr(from + 13, to - from - 13);
}

// A port nobody listens on right now.
int freePort() {
    int fd = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in a{};
    a.sin_family = AF_INET;
    a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    bind(fd, reinterpret_cast<sockaddr*>(&a), sizeof a);
    socklen_t n = sizeof a;
    getsockname(fd, reinterpret_cast<sockaddr*>(&a), &n);
    close(fd);
    return ntohs(a.sin_port);
}

bool accepts(int port) {
    int fd = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in a{};
    a.sin_family = AF_INET;
    a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    a.sin_port = htons(static_cast<uint16_t>(port));
    bool ok = connect(fd, reinterpret_cast<sockaddr*>(&a), sizeof a) == 0;
    close(fd);
    return ok;
}

// aiosmtpd on loopback, writing each message into `dir` (see smtp_sink.py).
class SmtpSink {
public:
    explicit SmtpSink(const fs::path& dir) : dir(dir), port(freePort()) {
        fs::create_directories(dir);
        std::string listen = "127.0.0.1:" + std::to_string(port);
        std::string path = "PYTHONPATH=" + sourceDir() + "/tests/e2e";
        std::vector<std::string> argv = {"/usr/bin/python3", "-m", "aiosmtpd", "-n", "-l", listen,
                                         "-c", "smtp_sink.Sink", dir.string()};
        std::vector<std::string> env;
        for (char** e = environ; *e != nullptr; ++e) env.emplace_back(*e);
        env.push_back(path);
        pid = fork();
        if (pid == 0) {
            std::vector<char*> a, v;
            for (auto& s : argv) a.push_back(s.data());
            a.push_back(nullptr);
            for (auto& s : env) v.push_back(s.data());
            v.push_back(nullptr);
            execve(a[0], a.data(), v.data());
            _exit(127);
        }
        for (int i = 0; i < 500 && !accepts(port); i++) std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    ~SmtpSink() {
        if (pid > 0) {
            kill(pid, SIGTERM);
            int status = 0;
            waitpid(pid, &status, 0);
        }
    }
    SmtpSink(const SmtpSink&) = delete;
    SmtpSink& operator=(const SmtpSink&) = delete;

    bool up() const { return pid > 0 && accepts(port); }
    std::string server() const { return "127.0.0.1:" + std::to_string(port); }
    // Waits (at most 20 s) for message `n` to be complete.
    bool message(int n) const {
        for (int i = 0; i < 1000; i++) {
            if (fs::exists(stem(n) + ".eml")) return true;
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
        }
        return false;
    }
    std::string part(int n, const std::string& what) const { return readFile(stem(n) + what); }

private:
    std::string stem(int n) const {
        char name[16];
        snprintf(name, sizeof name, "msg%03d", n);
        return (dir / name).string();
    }
    fs::path dir;
    int port;
    pid_t pid = -1;
};

class SpecialE2E : public ::testing::Test {
protected:
    void SetUp() override {
        // vemsd runs in its home: the snapshot files and the affinity table
        // copied there are its own, wherever it was started from.
        ASSERT_NE(getcwd(previousDir, sizeof previousDir), nullptr);
        ASSERT_EQ(chdir(tmp.path().c_str()), 0);
        unsetenv("AFF1_TABLE");
        hub = std::make_unique<Vemsd>(tmp.path() / "home");
        ASSERT_TRUE(hub->start()) << hub->output();
        html = hub->home() / "HTML";
    }
    void TearDown() override {
        if (hub && hub->running()) EXPECT_EQ(hub->stop(), 0) << hub->output();
        EXPECT_EQ(chdir(previousDir), 0);
    }
    Reply post(const std::string& methodXml) { return http("POST", hub->url() + "soap", soap(methodXml)); }

    TempDir tmp;
    std::unique_ptr<Vemsd> hub;
    fs::path html;
    char previousDir[4096] = {};
};

TEST_F(SpecialE2E, BatchOfEveryStepKindWithPrefixSuffixAndStylesheet) {
    writeFile(html / "pre.xml", "<batch>");
    writeFile(html / "post.xml", "</batch>");
    writeFile(html / "note.txt", "attached text");
    writeFile(html / "inner.xml", "<CT_Affinity><resid>KSH.GATEWAY</resid></CT_Affinity>");
    Reply r = post("<CT_Export><filename>batch-out.xml</filename><prefix>pre.xml</prefix><suffix>post.xml</suffix>"
                   "<stylesheet>report.xsl</stylesheet>"
                   "<request id=\"get\">" + sitGet() + "</request>"
                   "<request id=\"att\"><attach>note.txt</attach></request>"
                   "<request id=\"ins\"><insert><note kind=\"fixed\">inserted</note></insert></request>"
                   "<request><attach>no-such-file.txt</attach></request>"
                   "<request id=\"exe\"><execute>inner.xml</execute></request>"
                   "</CT_Export>");
    ASSERT_EQ(r.status, 200);
    const std::string b = body(r);
    const std::string expectedTail =
        "<XML ID=\"att\">attached text</XML>"
        "<XML ID=\"ins\"><note kind=\"fixed\">inserted</note></XML>"
        "\n<error>Unable to attach file</error>\n"
        "<XML ID=\"exe\">\n<DATA>\n<AFFINITY><STATIC>2100</STATIC><TEXT>SOAP gateway of the monitoring server</TEXT>"
        "<PRODUCT>KSH</PRODUCT><RESID>KSH.GATEWAY</RESID></AFFINITY>\n</DATA>\n</XML>"
        "</batch><transform>FAILED</transform>";
    EXPECT_EQ(b.rfind("<batch><XML ID=\"get\"><TABLE name=\"O4SRV.TSITDESC\">", 0), 0u) << b;
    EXPECT_TRUE(contains(b, "<SITNAME>ZAG_CPU_Busy</SITNAME>")) << b;
    ASSERT_GE(b.size(), expectedTail.size());
    EXPECT_EQ(b.substr(b.size() - expectedTail.size()), expectedTail) << b;
    // The export file has the output without the transform's mark.
    EXPECT_EQ(readFile(html / "batch-out.xml"), b.substr(0, b.size() - 29));
}

TEST_F(SpecialE2E, RedirectToASecondGatewayAndToOneThatDoesNotAnswer) {
    Vemsd second(tmp.path() / "home2");
    ASSERT_TRUE(second.start()) << second.output();
    ASSERT_TRUE(execute(second.store(), "INSERT INTO \"O4SRV.TNAME\" (ID, FULLNAME) VALUES ('ONLY2', 'Only in the second hub')"));
    const std::string envelope = soap("<CT_Get>" + credentials() +
                                      "<table>O4SRV.TNAME</table><column>FULLNAME</column>"
                                      "<filter>ID;EQ;ONLY2</filter></CT_Get>");
    // The routed envelope without its XML declaration.
    const std::string inner = envelope.substr(envelope.find("<SOAP-ENV:Envelope"));
    const std::string endpoint = second.url() + "soap";
    Reply r = post("<CT_Redirect><request endpoint=\"" + endpoint + "\" id=\"r\">" + inner + "</request></CT_Redirect>");
    // The second gateway's body (its success element with the rows) sits in
    // the first one's body; its envelope and body tags do not.
    const std::string b = body(r);
    EXPECT_EQ(b.rfind("<SOAP-CHK:Success", 0), 0u) << b;
    EXPECT_TRUE(contains(b, "><TABLE name=\"O4SRV.TNAME\">")) << b;
    EXPECT_TRUE(contains(r.body, "<FULLNAME>Only in the second hub</FULLNAME>")) << r.body;
    EXPECT_EQ(r.body.find("<SOAP-ENV:Body"), r.body.rfind("<SOAP-ENV:Body")) << r.body;
    EXPECT_TRUE(contains(r.body, "</SOAP-CHK:Success></SOAP-CHK:Success>")) << r.body;

    // The same request once the second gateway has stopped.
    ASSERT_EQ(second.stop(), 0) << second.output();
    r = post("<CT_Redirect><request endpoint=\"" + endpoint + "\">" + inner + "</request></CT_Redirect>");
    EXPECT_TRUE(contains(r.body, "<faultcode>SOAP-ENV:Client</faultcode>")) << r.body;
    EXPECT_EQ(faultString(r), "Unable to redirect SOAP request.");
    EXPECT_TRUE(contains(r.body, endpoint)) << r.body;
}

TEST_F(SpecialE2E, ExecutedBatchFileRunsIntoTheSameResponse) {
    writeFile(html / "nightly.xml",
              soap("<CT_Affinity><resid>O4SRV.HUB</resid><request id=\"sits\">" + sitGet() +
                   "</request><request id=\"mark\"><insert><done>yes</done></insert></request></CT_Affinity>"));
    Reply r = post("<CT_Execute><filename>nightly.xml</filename></CT_Execute>");
    const std::string b = body(r);
    EXPECT_EQ(b.rfind("<XML ID=\"sits\"><TABLE name=\"O4SRV.TSITDESC\">", 0), 0u) << b;
    EXPECT_TRUE(contains(b, "<SITNAME>ZAG_CPU_Busy</SITNAME>")) << b;
    EXPECT_TRUE(contains(b, "</XML><XML ID=\"mark\"><done>yes</done></XML>\n<DATA>\n<AFFINITY><STATIC>4100</STATIC>"))
        << b;

    r = post("<CT_Execute><filename>../hub.db</filename></CT_Execute>");
    EXPECT_EQ(faultString(r), "Unable to open or read execute file.");
}

TEST_F(SpecialE2E, AffinityByIdProductTextAndResid) {
    auto products = [&](const std::string& inner) {
        std::string b = body(post("<CT_Affinity>" + inner + "</CT_Affinity>"));
        std::vector<std::string> out;
        for (size_t at = b.find("<RESID>"); at != std::string::npos; at = b.find("<RESID>", at + 1))
            out.push_back(b.substr(at + 7, b.find("</RESID>", at) - at - 7));
        return out;
    };
    using V = std::vector<std::string>;
    EXPECT_EQ(products("<id>82</id>"), V{"ZAG.CPU"});
    EXPECT_EQ(products("<id match=\"subset\">8</id>"), (V{"ZAG.AGENT", "ZAG.CPU", "ZAG.DISK", "ZAG.PROCESS"}));
    EXPECT_EQ(products("<id match=\"Subset\">41</id>"), V{"O4SRV.HUB"});
    EXPECT_EQ(products("<product>o4srv</product>"), (V{"O4SRV.HUB", "O4SRV.REMOTE"}));
    EXPECT_EQ(products("<text>Sample host agent, file system collector</text>"), V{"ZAG.DISK"});
    EXPECT_EQ(products("<resid>ZAG.PROCESS</resid>"), V{"ZAG.PROCESS"});
    // An entry without ids or resource id still names its text and product.
    EXPECT_EQ(body(post("<CT_Affinity><product>UNCLASSIFIED</product></CT_Affinity>")),
              "\n<DATA>\n<AFFINITY><TEXT>Agent without a registered affinity</TEXT><PRODUCT>UNCLASSIFIED</PRODUCT>"
              "</AFFINITY>\n</DATA>\n");
    EXPECT_EQ(faultString(post("<CT_Affinity><name>x</name></CT_Affinity>")), "Specify id, product, resid or text");
}

TEST_F(SpecialE2E, MailArrivesWithTheOutputAttached) {
    SmtpSink smtp(tmp.path() / "mail");
    ASSERT_TRUE(smtp.up()) << "aiosmtpd did not start";
    Reply r = post("<CT_EMail><server>" + smtp.server() + "</server><sender>gateway@example.net</sender>"
                   "<receiver>operator@example.net</receiver><subject>Busy situations</subject>"
                   "<message>Situations as of today.</message><attachmenttitle>situations.xml</attachmenttitle>"
                   "<request id=\"s\">" + sitGet() + "</request></CT_EMail>");
    ASSERT_TRUE(contains(r.body, "<SOAP-CHK:Success")) << r.body;
    const std::string b = body(r);
    EXPECT_EQ(b.rfind("<XML ID=\"s\"><MESSAGE>Situations as of today.</MESSAGE>\n<TABLE", 0), 0u) << b;
    ASSERT_TRUE(smtp.message(1));
    EXPECT_EQ(smtp.part(1, ".from"), "gateway@example.net");
    EXPECT_EQ(smtp.part(1, ".to"), "operator@example.net");
    EXPECT_EQ(smtp.part(1, ".subject"), "Busy situations");
    EXPECT_TRUE(contains(smtp.part(1, ".text"), "Situations as of today.")) << smtp.part(1, ".text");
    EXPECT_EQ(smtp.part(1, ".name"), "situations.xml");
    EXPECT_EQ(smtp.part(1, ".att"), b);

    // Missing fields: their faults, and nothing is sent.
    struct {
        std::string inner;
        std::string fault;
    } missing[] = {
        {"<sender>a@example.net</sender><receiver>b@example.net</receiver>", "Email server name/address missing."},
        {"<server>" + smtp.server() + "</server><receiver>b@example.net</receiver>", "Email sender name missing."},
        {"<server>" + smtp.server() + "</server><sender>a@example.net</sender>", "Email receiver name missing."},
        {"<subject>nothing else</subject>", "Email server name/address missing."},
    };
    for (const auto& m : missing) {
        Reply f = post("<CT_Email>" + m.inner + "</CT_Email>");
        EXPECT_EQ(faultString(f), m.fault) << m.inner;
    }
    EXPECT_FALSE(fs::exists(tmp.path() / "mail" / "msg002.eml"));
}

TEST_F(SpecialE2E, ExportToADatedFileAndToTheWarehouse) {
    auto today = [] {
        time_t now = time(nullptr);
        struct tm t;
        localtime_r(&now, &t);
        char s[16];
        strftime(s, sizeof s, "%y%m%d", &t);
        return std::string(s);
    };
    const std::string before = today();
    Reply r = post("<CT_Export><filename>daily-$yymmdd$.xml</filename>"
                   "<request><insert><row>exported</row></insert></request></CT_Export>");
    const std::string after = today();
    EXPECT_EQ(body(r), "<row>exported</row>");
    fs::path file = html / ("daily-" + before + ".xml");
    if (!fs::exists(file)) file = html / ("daily-" + after + ".xml");
    EXPECT_EQ(readFile(file), "<row>exported</row>");
    EXPECT_EQ(faultString(post("<CT_Export><filename>.hidden</filename></CT_Export>")), "Invalid export filename.");

    // The warehouse: the record of the CT_Get's user, the output cut at
    // 32000 bytes.
    const std::string big(40000, 'w');
    r = post("<CT_Export><warehouse/><request>" + sitGet() + "</request><request><insert><big>" + big +
             "</big></insert></request></CT_Export>");
    const std::string b = body(r);
    ASSERT_GT(b.size(), 40000u) << b.substr(0, 300);
    const std::string record = readFile(hub->home() / "kshsnap");
    ASSERT_EQ(record.size(), 32032u);
    EXPECT_EQ(record.substr(0, 16), "sysadmin        ");
    EXPECT_EQ(record.substr(32), b.substr(0, 32000));
    EXPECT_EQ(readFile(hub->home() / "kshsnap.hdr").size(), 80u);
    auto rows = query(hub->store(), "SELECT USERID, length(WRITETIME), length(XMLDATA), HOSTNAME FROM \"WAREHOUSE.SNAPSHOT\"");
    ASSERT_EQ(rows.size(), 1u);
    // The host name is the hub's node name, which vemsd announces.
    const std::string out = hub->output();
    const size_t at = out.find("vemsd: hub ");
    ASSERT_NE(at, std::string::npos) << out;
    const std::string node = out.substr(at + 11, out.find(',', at) - at - 11);
    EXPECT_EQ(rows[0], "sysadmin|16|32000|" + node);
    EXPECT_EQ(scalar(hub->store(), "SELECT XMLDATA FROM \"WAREHOUSE.SNAPSHOT\""), b.substr(0, 32000));
}

}  // namespace
