// End to end: opcli createsit against a running vemsd, the rows it leaves
// in the hub store, and the messages of the failures.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <regex>
#include <string>

#include "e2efix.h"

using namespace e2e;

namespace {

const std::string kLongName = "E2E_situation_with_a_rather_long_name";  // 37 characters

std::string count(const fs::path& store, const std::string& table) {
    return scalar(store, "SELECT COUNT(*) FROM \"" + table + "\"");
}

class CreatesitE2E : public ::testing::Test {
protected:
    void startHub(std::vector<std::string> args = {}) {
        hub = std::make_unique<Vemsd>(tmp.path() / "home", std::move(args));
        ASSERT_TRUE(hub->start()) << hub->output();
    }
    Outcome login(const std::string& password = kAdminPassword) {
        return opcli(opcliHome, {"login", "--server", hub->url(), "--user", "sysadmin", "--password", password});
    }
    Outcome createsit(std::vector<std::string> args) {
        args.insert(args.begin(), "createsit");
        return opcli(opcliHome, args);
    }
    void TearDown() override {
        if (hub && hub->running()) EXPECT_EQ(hub->stop(), 0) << hub->output();
    }

    TempDir tmp;
    fs::path opcliHome = tmp.path() / "opcli";
    std::unique_ptr<Vemsd> hub;
};

TEST_F(CreatesitE2E, CreationFromABaseWritesTheDefinitionAndDistributionThroughTheGateway) {
    startHub();
    Outcome r = login();
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("HUB_MAIN"), std::string::npos) << r.out;

    r = createsit({"-s", "E2E_NEW", "-b", "ZAG_CPU_Busy", "-p", "INTERVAL=000/000500", "DESC=Made end to end"});
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("CSIT005I"), std::string::npos) << r.out;
    EXPECT_NE(r.out.find("E2E_NEW"), std::string::npos) << r.out;
    EXPECT_EQ(query(hub->store(), "SELECT REEV_DAYS, REEV_TIME, TEXT, PDT = (SELECT PDT FROM \"O4SRV.TSITDESC\" "
                                  "WHERE SITNAME = 'ZAG_CPU_Busy') FROM \"O4SRV.TSITDESC\" WHERE SITNAME = 'E2E_NEW'"),
              std::vector<std::string>{"000|000500|Made end to end|1"});
    const std::string dist = "SELECT NODEL FROM \"O4SRV.TOBJACCL\" WHERE OBJNAME = '%s' ORDER BY NODEL";
    auto distOf = [&](const std::string& name) {
        return query(hub->store(), std::regex_replace(dist, std::regex("%s"), name));
    };
    EXPECT_FALSE(distOf("ZAG_CPU_Busy").empty());
    EXPECT_EQ(distOf("E2E_NEW"), distOf("ZAG_CPU_Busy"));
    // The gateway answers with the new row too.
    Reply sql = http("POST", hub->url(),
                     ctSql("O4SRV.TSITDESC", "SELECT SITNAME, REEV_TIME FROM O4SRV.TSITDESC WHERE SITNAME = \"E2E_NEW\""));
    EXPECT_NE(sql.body.find("<SITNAME>E2E_NEW</SITNAME>"), std::string::npos) << sql.body;

    // The same name again: message 4, and still one row.
    r = createsit({"-s", "E2E_NEW", "-b", "ZAG_CPU_Busy", "-p", "INTERVAL=000/000500"});
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.err.find("CSIT004E"), std::string::npos) << r.out << r.err;
    EXPECT_EQ(scalar(hub->store(), "SELECT COUNT(*) FROM \"O4SRV.TSITDESC\" WHERE SITNAME = 'E2E_NEW'"), "1");

    // A long name gets a generated short name and a long-name row.
    r = createsit({"-s", kLongName, "-b", "ZAG_CPU_Busy"});
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("CSIT005I"), std::string::npos) << r.out;
    std::string shortName = scalar(hub->store(), "SELECT ID FROM \"O4SRV.TNAME\" WHERE FULLNAME = '" + kLongName + "'");
    ASSERT_FALSE(shortName.empty());
    EXPECT_LE(shortName.size(), 31u);
    EXPECT_NE(shortName, kLongName);
    EXPECT_EQ(scalar(hub->store(), "SELECT COUNT(*) FROM \"O4SRV.TSITDESC\" WHERE SITNAME = '" + shortName + "'"), "1");
    EXPECT_EQ(distOf(shortName), distOf("ZAG_CPU_Busy"));
}

TEST_F(CreatesitE2E, AnOldServerTakesShortNamesButRefusesLongOnes) {
    startHub({"--server-version", "06.20"});
    ASSERT_EQ(login().status, 0);
    std::string before = count(hub->store(), "O4SRV.TSITDESC");
    Outcome r = createsit({"-s", kLongName, "-b", "ZAG_CPU_Busy"});
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.err.find("CSIT037E"), std::string::npos) << r.out << r.err;
    EXPECT_EQ(count(hub->store(), "O4SRV.TSITDESC"), before);
    EXPECT_EQ(scalar(hub->store(), "SELECT COUNT(*) FROM \"O4SRV.TNAME\" WHERE FULLNAME = '" + kLongName + "'"), "0");

    r = createsit({"-s", "E2E_OLD", "-b", "ZAG_Disk_Full", "-p", "INTERVAL=001/000000"});
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_EQ(query(hub->store(), "SELECT REEV_DAYS, REEV_TIME FROM \"O4SRV.TSITDESC\" WHERE SITNAME = 'E2E_OLD'"),
              std::vector<std::string>{"001|000000"});
    EXPECT_EQ(scalar(hub->store(), "SELECT COUNT(*) FROM \"O4SRV.TOBJACCL\" WHERE OBJNAME = 'E2E_OLD'"), "2");
}

TEST_F(CreatesitE2E, ExportFilesLandWithDistributionLongNameSlotsAndSpecialCharacters) {
    startHub();
    ASSERT_EQ(login().status, 0);
    const fs::path exports = fs::path(sourceDir()) / "data" / "export";
    for (const char* f : {"cpu_busy.xml", "disk_space_long_name.xml", "process_missing_slots.xml"}) {
        Outcome r = createsit({"-i", (exports / f).string()});
        ASSERT_EQ(r.status, 0) << f << "\n" << r.out << r.err;
        EXPECT_NE(r.out.find("CSIT005I"), std::string::npos) << r.out;
    }
    const fs::path store = hub->store();
    EXPECT_EQ(query(store, "SELECT REEV_TIME, TEXT FROM \"O4SRV.TSITDESC\" WHERE SITNAME = 'Zag_CPU_Busy_Critical'"),
              std::vector<std::string>{"000200|Processor busy above 95 percent on a ZAG host"});
    EXPECT_EQ(query(store, "SELECT NODEL FROM \"O4SRV.TOBJACCL\" WHERE OBJNAME = 'Zag_CPU_Busy_Critical'"),
              std::vector<std::string>{"*ZAG_HOSTS"});
    EXPECT_EQ(query(store, "SELECT ID FROM \"O4SRV.TNAME\" WHERE FULLNAME = "
                           "'Disk space low on any mounted file system of the database hosts'"),
              std::vector<std::string>{"Disk_space_low_on_any_mounted"});
    EXPECT_EQ(scalar(store, "SELECT COUNT(*) FROM \"O4SRV.TSITDESC\" WHERE SITNAME = 'Disk_space_low_on_any_mounted'"),
              "1");
    std::vector<std::string> slots =
        query(store, "SELECT SEQUENCE, MAP FROM \"O4SRV.EVNTMAP\" WHERE ID = 'Zag_Process_Missing' ORDER BY SEQUENCE");
    ASSERT_EQ(slots.size(), 2u);
    EXPECT_NE(slots[0].find("1|<situation name=\"Zag_Process_Missing\"><slot name=\"process\""), std::string::npos)
        << slots[0];
    EXPECT_NE(slots[1].find("<slot name=\"host\""), std::string::npos) << slots[1];
    EXPECT_EQ(scalar(store, "SELECT CMD FROM \"O4SRV.TSITDESC\" WHERE SITNAME = 'Zag_Process_Missing'"),
              "echo backupd missing on &{ZAG_PROCESS.Origin_Node}");

    // Values holding a double quote, an ampersand or a less-than sign land
    // as they are.
    std::string text = readFile(exports / "cpu_busy.xml");
    text = std::regex_replace(text, std::regex("Zag_CPU_Busy_Critical"), "E2E_Quoted");
    text = std::regex_replace(text, std::regex("<TEXT>[^<]*</TEXT>"),
                              "<TEXT>Say &quot;hi&quot; &amp; wave &lt;bye&gt;</TEXT>");
    text = std::regex_replace(text, std::regex("<ADVISE>[^<]*</ADVISE>"),
                              "<ADVISE><![CDATA[If a<b & \"c\" then 'd']]></ADVISE>");
    writeFile(tmp.path() / "quoted.xml", text);
    Outcome r = createsit({"-i", (tmp.path() / "quoted.xml").string()});
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_EQ(query(store, "SELECT TEXT, ADVISE FROM \"O4SRV.TSITDESC\" WHERE SITNAME = 'E2E_Quoted'"),
              std::vector<std::string>{"Say \"hi\" & wave <bye>|If a<b & \"c\" then 'd'"});
}

TEST_F(CreatesitE2E, WithoutAValidLoginOrAGatewayNothingIsWritten) {
    startHub();
    const std::string before = count(hub->store(), "O4SRV.TSITDESC");
    const std::vector<std::string> args = {"-s", "E2E_NOPE", "-b", "ZAG_CPU_Busy"};
    auto notLoggedIn = [](const Outcome& r) {
        return r.status == 1 &&
               (r.err.find("CSIT008E") != std::string::npos || r.err.find("CSIT003E") != std::string::npos);
    };

    Outcome r = createsit(args);
    EXPECT_TRUE(notLoggedIn(r)) << r.out << r.err;

    r = login("wrong-password");
    EXPECT_NE(r.status, 0);
    EXPECT_NE(r.err.find("refused"), std::string::npos) << r.err;
    r = createsit(args);
    EXPECT_TRUE(notLoggedIn(r)) << r.out << r.err;
    EXPECT_EQ(count(hub->store(), "O4SRV.TSITDESC"), before);

    // Logged in, but the gateway is gone.
    ASSERT_EQ(login().status, 0);
    ASSERT_EQ(hub->stop(), 0);
    r = createsit(args);
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.err.find("CSIT014E"), std::string::npos) << r.out << r.err;
    EXPECT_EQ(count(hub->store(), "O4SRV.TSITDESC"), before);
    EXPECT_EQ(scalar(hub->store(), "SELECT COUNT(*) FROM \"O4SRV.TSITDESC\" WHERE SITNAME = 'E2E_NOPE'"), "0");
}

TEST_F(CreatesitE2E, ANewStoreWithoutPasswordGetsARandomOneWrittenOnce) {
    hub = std::make_unique<Vemsd>(tmp.path() / "home", std::vector<std::string>{}, false);
    ASSERT_TRUE(hub->start()) << hub->output();
    const fs::path secret = hub->home() / "initial-admin-password";
    std::string password = readFile(secret);
    ASSERT_FALSE(password.empty());
    password.pop_back();  // the line feed
    EXPECT_EQ(password.size(), 16u);
    struct stat st;
    ASSERT_EQ(stat(secret.c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u);
    EXPECT_NE(hub->output().find(password), std::string::npos);
    EXPECT_EQ(login(password).status, 0);
    ASSERT_EQ(hub->stop(), 0);

    // The next start opens the store: no new password, none printed.
    ASSERT_TRUE(hub->start()) << hub->output();
    EXPECT_EQ(hub->output().find(password), std::string::npos) << hub->output();
    EXPECT_EQ(readFile(secret), password + "\n");
    EXPECT_EQ(login(password).status, 0);
}

}  // namespace
