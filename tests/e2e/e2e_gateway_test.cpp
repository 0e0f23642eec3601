// End to end: SOAP and GET requests to a running vemsd over HTTP, the hub
// administration actions with a restart, and stopping under load.
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "e2efix.h"

using namespace e2e;

namespace {

bool contains(const std::string& text, const std::string& part) { return text.find(part) != std::string::npos; }

std::string credentials() { return std::string("<userid>sysadmin</userid><password>") + kAdminPassword + "</password>"; }

class GatewayE2E : public ::testing::Test {
protected:
    void SetUp() override {
        hub = std::make_unique<Vemsd>(tmp.path() / "home");
        ASSERT_TRUE(hub->start()) << hub->output();
    }
    void TearDown() override {
        if (hub && hub->running()) EXPECT_EQ(hub->stop(), 0) << hub->output();
    }
    std::string page(const std::string& path) { return http("GET", hub->url() + path).body; }

    TempDir tmp;
    std::unique_ptr<Vemsd> hub;
};

TEST_F(GatewayE2E, SoapMethodsGetActionsAndFilesAnswerOverHttp) {
    // CT_Get of two columns of the situation table.
    Reply r = http("POST", hub->url() + "soap/",
                   soap("<CT_Get>" + credentials() +
                        "<table>O4SRV.TSITDESC</table><column>SITNAME</column><column>REEV_TIME</column></CT_Get>"));
    EXPECT_EQ(r.status, 200);
    EXPECT_TRUE(contains(r.body, "<SOAP-CHK:Success")) << r.body;
    EXPECT_TRUE(contains(r.body, "<ROW>\n<SITNAME>ZAG_CPU_Busy</SITNAME>\n<REEV_TIME>000500</REEV_TIME>\n</ROW>"))
        << r.body;

    // CT_Alert raises a status row in the status history.
    r = http("POST", hub->url(),
             soap("<CT_Alert>" + credentials() +
                  "<name>ZAG_CPU_Busy</name><source>alpha:ZAG</source><item>e2e-cpu</item></CT_Alert>"));
    EXPECT_TRUE(contains(r.body, "<RC>0</RC>")) << r.body;
    EXPECT_EQ(query(hub->store(), "SELECT DELTASTAT, ORIGINNODE, TYPE, RESULTS FROM \"O4SRV.TSITSTSH\" "
                                  "WHERE ATOMIZE = 'e2e-cpu'"),
              std::vector<std::string>{"Y|alpha:ZAG|0|USR=sysadmin;DATA=No data was provided~"});

    // CT_SQL posted to a path that names no service reaches the local hub.
    r = http("POST", hub->url() + "no/such/service",
             ctSql("O4SRV.TOBJACCL", "SELECT NODEL FROM O4SRV.TOBJACCL WHERE OBJNAME = \"ZAG_Disk_Full\""));
    EXPECT_TRUE(contains(r.body, "<NODEL>alpha:ZAG</NODEL>")) << r.body;
    EXPECT_TRUE(contains(r.body, "<NODEL>beta:ZAG</NODEL>")) << r.body;

    // A wrong password is refused and nothing is inserted.
    std::string badInsert = soap("<CT_SQL><userid>sysadmin</userid><password>nope</password><table>O4SRV.TNAME"
                                 "</table><sql>INSERT INTO O4SRV.TNAME (ID, FULLNAME) VALUES (\"E2E_X\", \"x\")"
                                 "</sql></CT_SQL>");
    r = http("POST", hub->url(), badInsert);
    EXPECT_TRUE(contains(r.body, "<SOAP-ENV:Fault>")) << r.body;
    EXPECT_EQ(scalar(hub->store(), "SELECT COUNT(*) FROM \"O4SRV.TNAME\" WHERE ID = 'E2E_X'"), "0");

    // A GET action runs a select and answers with the whole document.
    std::string doc = page("soap/?action=start&table=O4SRV.TSITDESC&column=SITNAME");
    EXPECT_TRUE(contains(doc, "<REQUEST")) << doc;
    EXPECT_TRUE(contains(doc, "<SITNAME>ZAG_Proc_Missing</SITNAME>")) << doc;
    EXPECT_TRUE(contains(doc, "</REQUEST>")) << doc;

    // The front end: files, and the login action serving the asked-for page.
    EXPECT_TRUE(contains(page(""), "Hub web services"));
    EXPECT_TRUE(contains(page("soap/login.htm"), "name=\"action\" value=\"login\""));
    EXPECT_TRUE(contains(page("soap/situations.htm?action=login&userid=sysadmin&password=bad"), "Error 401"));
    std::string ok = page(std::string("soap/situations.htm?action=login&userid=sysadmin&password=") + kAdminPassword);
    EXPECT_TRUE(contains(ok, "Situations of the hub")) << ok;
    EXPECT_TRUE(contains(page("soap/sitlist.xsl"), "xsl:stylesheet"));
}

TEST(GatewayValidationE2E, ValidationDecidesWhetherRequestsNeedCredentials) {
    TempDir tmp;
    const std::string select =
        soap("<CT_SQL><table>O4SRV.TSITDESC</table><sql>SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = "
             "\"ZAG_CPU_Busy\"</sql></CT_SQL>");
    Vemsd strict(tmp.path() / "strict");
    ASSERT_TRUE(strict.start()) << strict.output();
    Reply r = http("POST", strict.url(), select);
    EXPECT_TRUE(contains(r.body, "<SOAP-ENV:Fault>")) << r.body;
    EXPECT_FALSE(contains(r.body, "ZAG_CPU_Busy")) << r.body;
    EXPECT_EQ(strict.stop(), 0);

    Vemsd open(tmp.path() / "open", {"--validate", "no", "--store", (tmp.path() / "open.db").string()});
    ASSERT_TRUE(open.start()) << open.output();
    r = http("POST", open.url(), select);
    EXPECT_TRUE(contains(r.body, "<SITNAME>ZAG_CPU_Busy</SITNAME>")) << r.body;
    EXPECT_TRUE(fs::exists(tmp.path() / "open.db"));
    EXPECT_FALSE(fs::exists(tmp.path() / "open" / "hub.db"));
    EXPECT_EQ(open.stop(), 0);
}

TEST_F(GatewayE2E, AddedAndRemovedHubsRewriteTheHubListFileAndServeAfterARestart) {
    // A second hub with a store of its own and one situation only it has.
    Vemsd east(tmp.path() / "east");
    ASSERT_TRUE(east.start()) << east.output();
    const fs::path eastCli = tmp.path() / "east-cli";
    ASSERT_EQ(opcli(eastCli, {"login", "--server", east.url(), "--user", "sysadmin", "--password", kAdminPassword}).status,
              0);
    Outcome made = opcli(eastCli, {"createsit", "-s", "EAST_ONLY", "-b", "ZAG_CPU_Busy"});
    ASSERT_EQ(made.status, 0) << made.out << made.err;
    ASSERT_EQ(east.stop(), 0);
    // Both stores come from the same seed; hubs are told apart by their node
    // names, so the second one gets a name of its own.
    ASSERT_TRUE(execute(tmp.path() / "east" / "hub.db",
                        "UPDATE \"SYSTEM.SERVERINFO\" SET VALUE = 'HUB_EAST' WHERE NAME = 'HUBNODE'"));
    writeFile(hub->home() / "servers.conf", "HUB_EAST sqlite:" + (tmp.path() / "east" / "hub.db").string() + "\n");

    const fs::path file = hub->home() / "HTML" / "kshxhubs.xml";
    const fs::path backup = hub->home() / "HTML" / "_kshxhubs.xml~";
    const std::string original = readFile(file);
    // Without an alias the hub is refused and the file stays.
    EXPECT_TRUE(contains(page("soap/index.htm?action=addhub&lmsname=HUB_EAST&servicename=east"),
                         "Unable to start request."));
    EXPECT_EQ(readFile(file), original);

    EXPECT_TRUE(contains(page("soap/index.htm?action=addhub&lmsname=HUB_EAST&servicename=east&aliasname=east"),
                         "Hub web services"));
    const std::string added = readFile(file);
    EXPECT_TRUE(contains(added, "<HUB>\n<LMS_Name>HUB_EAST</LMS_Name>\n<Service_Name>east</Service_Name>\n"
                                "<Alias>east</Alias>\n</HUB>\n\n</ENTERPRISE>"))
        << added;
    EXPECT_EQ(readFile(backup), original);

    const std::string select = ctSql("O4SRV.TSITDESC", "SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = \"EAST_ONLY\"");
    ASSERT_EQ(hub->stop(), 0) << hub->output();
    ASSERT_TRUE(hub->start()) << hub->output();
    Reply viaEast = http("POST", hub->url() + "east/", select);
    EXPECT_TRUE(contains(viaEast.body, "<SITNAME>EAST_ONLY</SITNAME>")) << viaEast.body;
    Reply viaLocal = http("POST", hub->url() + "soap/", select);
    EXPECT_TRUE(contains(viaLocal.body, "<SOAP-CHK:Success")) << viaLocal.body;
    EXPECT_FALSE(contains(viaLocal.body, "EAST_ONLY")) << viaLocal.body;

    // Removing the second hub of the file; it still serves until the restart.
    EXPECT_TRUE(contains(page("soap/index.htm?action=delhub&DelHubList=%232"), "Hub web services"));
    EXPECT_EQ(readFile(file), original);
    EXPECT_EQ(readFile(backup), added);
    ASSERT_EQ(hub->stop(), 0) << hub->output();
    ASSERT_TRUE(hub->start()) << hub->output();
    viaEast = http("POST", hub->url() + "east/", select);
    EXPECT_TRUE(contains(viaEast.body, "<SOAP-CHK:Success")) << viaEast.body;  // the local hub answers now
    EXPECT_FALSE(contains(viaEast.body, "EAST_ONLY")) << viaEast.body;
}

TEST_F(GatewayE2E, SigtermDuringABurstEndsPromptlyWithEveryAnswerCompleteAndEveryAckedRowStored) {
    constexpr int kClients = 8;
    std::atomic<bool> signalled{false};
    std::atomic<int> truncated{0};
    std::vector<std::vector<std::string>> acked(kClients);
    std::vector<std::thread> clients;
    for (int c = 0; c < kClients; ++c) {
        clients.emplace_back([&, c] {
            for (int i = 0; i < 100000; ++i) {
                std::string id = "E2E_" + std::to_string(c) + "_" + std::to_string(i);
                Reply r = http("POST", hub->url(),
                               ctSql("O4SRV.TNAME", "INSERT INTO O4SRV.TNAME (ID, FULLNAME) VALUES (\"" + id +
                                                        "\", \"full name of " + id + "\")"));
                if (!r.transferOk) {
                    if (signalled) return;  // the gateway is gone
                    continue;
                }
                // A request that was served has its whole answer: it ends with
                // the envelope. Services being deleted refuse with 503.
                if (r.status != 200) {
                    if (r.status != 503) ++truncated;
                    continue;
                }
                if (!contains(r.body, "</SOAP-ENV:Envelope>")) ++truncated;
                if (contains(r.body, "<SOAP-CHK:Success")) acked[c].push_back(id);
            }
        });
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(1500));
    signalled = true;
    int status = hub->stop(60);
    for (auto& t : clients) t.join();
    EXPECT_EQ(status, 0) << hub->output();
    EXPECT_EQ(truncated.load(), 0);

    std::set<std::string> stored;
    for (const std::string& row : query(hub->store(), "SELECT ID, FULLNAME FROM \"O4SRV.TNAME\" WHERE ID LIKE 'E2E_%'")) {
        std::string id = row.substr(0, row.find('|'));
        EXPECT_EQ(row, id + "|full name of " + id);  // no half-written row
        stored.insert(id);
    }
    size_t total = 0;
    for (const auto& list : acked) {
        total += list.size();
        for (const std::string& id : list) EXPECT_EQ(stored.count(id), 1u) << id;
    }
    EXPECT_GT(total, 0u);
    EXPECT_GE(stored.size(), total);
}

}  // namespace
