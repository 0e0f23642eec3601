// The opcli program run as a user would: help, exit statuses, login and
// logout, and createsit through the real command module against a local
// responder that answers like a hub.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <sstream>

#include "httpstub.h"

namespace {

struct Outcome {
    int status;
    std::string out, err;
};

class Opcli : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/opclitest.XXXXXX";
        home = mkdtemp(tmpl);
        const char* bin = getenv("CSIT_BINARY_DIR");
        ASSERT_NE(bin, nullptr);
        opcli = std::string(bin) + "/bin/opcli";
    }
    void TearDown() override {
        if (system(("rm -rf '" + home + "'").c_str()) != 0) ADD_FAILURE();
    }
    static std::string slurp(const std::string& path) {
        std::ifstream in(path);
        std::stringstream s;
        s << in.rdbuf();
        return s.str();
    }
    // Runs opcli with `args` and this test's OPCLI_HOME; stdin is `input`.
    Outcome run(const std::vector<std::string>& args, const std::string& input = "") {
        std::string in = home + "/stdin", out = home + "/stdout", err = home + "/stderr";
        std::ofstream(in) << input;
        pid_t pid = fork();
        if (pid == 0) {
            setenv("OPCLI_HOME", (home + "/opcli").c_str(), 1);
            unsetenv("RAS1_LOG");
            unsetenv("OPCLI_MODULE_PATH");
            unsetenv("OPCLI_MSGDIR");
            int i = open(in.c_str(), O_RDONLY), o = open(out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600),
                e = open(err.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
            dup2(i, 0);
            dup2(o, 1);
            dup2(e, 2);
            std::vector<char*> argv = {const_cast<char*>(opcli.c_str())};
            for (const std::string& a : args) argv.push_back(const_cast<char*>(a.c_str()));
            argv.push_back(nullptr);
            execv(opcli.c_str(), argv.data());
            _exit(127);
        }
        int status = 0;
        waitpid(pid, &status, 0);
        return {WIFEXITED(status) ? WEXITSTATUS(status) : 128, slurp(out), slurp(err)};
    }
    std::string home, opcli;
};

// A responder that answers the command's statements as a hub with base
// situation BASESIT (distributed to NODE1) would.
StubReply hub(const std::string& body) {
    auto has = [&](const char* s) { return body.find(s) != std::string::npos; };
    if (has("<password>wrong</password>")) return {200, stubFault()};
    if (has("NAME = \"HUBNODE\"")) return {200, stubTable({{{"VALUE", "HUB_TEST"}}})};
    if (has("NAME = \"VERSION\"")) return {200, stubTable({{{"VALUE", "06.30"}}})};
    if (has("WHERE SITNAME = \"BASESIT\"")) return {200, stubTable({{{"SITNAME", "BASESIT"}}})};
    if (has("SELECT ADVISE"))
        return {200, stubTable({{{"SITNAME", "BASESIT"}, {"TEXT", "base"}, {"PDT", "*IF *VALUE ZAG_CPU.Busy_Percent *GT 1"},
                                 {"AUTOSTART", "*YES"}, {"SITINFO", "SEV=Minor;"}}})};
    if (has("SELECT NODEL")) return {200, stubTable({{{"NODEL", "NODE1"}}})};
    return {200, stubTable({})};  // look-ups find nothing; inserts succeed
}

TEST_F(Opcli, HelpExplainsTheCommandsAndBadCommandLinesFail) {
    Outcome h = run({"help", "createsit"});
    EXPECT_EQ(h.status, 0);
    for (const char* s : {"-i, --import FILE", "-s, --situation NAME", "-b, --basedon BASE", "-p, --property",
                          "INTERVAL", "RUNONSTART", "SITINFO", "DISTRIBUTION"})
        EXPECT_NE(h.out.find(s), std::string::npos) << s;
    EXPECT_EQ(run({"help"}).status, 0);
    EXPECT_EQ(run({"help", "nosuch"}).status, 1);
    EXPECT_EQ(run({}).status, 1);
    EXPECT_EQ(run({"frobnicate"}).status, 1);
    EXPECT_EQ(run({"login", "--server", "ftp://x", "--user", "u", "--password", "p"}).status, 1);
    EXPECT_EQ(run({"login", "--server", "http://127.0.0.1:1/", "--user", std::string(17, 'u'), "--password", "p"}).status,
              1);
}

TEST_F(Opcli, WithoutALoginTheCommandReportsIt) {
    Outcome r = run({"createsit", "-s", "NEWSIT", "-b", "BASESIT"});
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.err.find("CSIT003E: You are not logged in."), std::string::npos) << r.err;
    EXPECT_EQ(r.out, "");
}

TEST_F(Opcli, ALoggedInUserCreatesASituation) {
    HttpStub stub(hub);
    Outcome login = run({"login", "--server", stub.url(), "--user", "sysadmin"}, "s3cret\n");
    ASSERT_EQ(login.status, 0) << login.err;
    EXPECT_EQ(login.out, "Logged in to HUB_TEST as sysadmin.\n");
    struct stat st;
    ASSERT_EQ(stat((home + "/opcli/session").c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u);
    EXPECT_EQ(slurp(home + "/opcli/session").find("s3cret"), std::string::npos);

    Outcome made = run({"createsit", "-s", "NEWSIT", "-b", "BASESIT", "-p", "DESC=made by a test"});
    EXPECT_EQ(made.status, 0) << made.err;
    EXPECT_EQ(made.out, "CSIT005I: Situation NEWSIT was created on hub HUB_TEST.\n");
    std::vector<std::string> bodies = stub.bodies();
    bool definition = false, distribution = false;
    for (const std::string& b : bodies) {
        if (b.find("<password>s3cret</password>") == std::string::npos) ADD_FAILURE() << "session password not sent";
        definition = definition || b.find("N\"made by a test\"") != std::string::npos;
        distribution = distribution || b.find("INSERT INTO O4SRV.TOBJACCL") != std::string::npos;
    }
    EXPECT_TRUE(definition);
    EXPECT_TRUE(distribution);

    Outcome missing = run({"createsit", "-i", home + "/none.xml"});
    EXPECT_EQ(missing.status, 1);
    EXPECT_NE(missing.err.find("CSIT011E: The file " + home + "/none.xml was not found.\n  Check"), std::string::npos)
        << missing.err;

    EXPECT_EQ(run({"logout"}).status, 0);
    EXPECT_NE(stat((home + "/opcli/session").c_str(), &st), 0);
    EXPECT_EQ(run({"createsit", "-i", home + "/none.xml"}).err.find("CSIT008E"), 0u);
}

TEST_F(Opcli, ARefusedLoginIsNotKeptAndAnUnreachableOneIsKeptUnchecked) {
    HttpStub stub(hub);
    Outcome r = run({"login", "--server", stub.url(), "--user", "sysadmin", "--password", "wrong"});
    EXPECT_EQ(r.status, 1);
    struct stat st;
    EXPECT_NE(stat((home + "/opcli/session").c_str(), &st), 0);
    Outcome u = run({"login", "--server=http://127.0.0.1:1/", "--user=sysadmin", "--password=pw"});
    EXPECT_EQ(u.status, 0);
    EXPECT_NE(u.err.find("cannot be reached"), std::string::npos);
    EXPECT_EQ(stat((home + "/opcli/session").c_str(), &st), 0);
    Outcome c = run({"createsit", "-s", "NEWSIT", "-b", "BASESIT"});
    EXPECT_EQ(c.status, 1);
    EXPECT_NE(c.err.find("CSIT014E"), std::string::npos) << c.err;
}

}  // namespace
