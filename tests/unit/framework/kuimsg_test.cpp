// Rendering coded messages with the shipped message file, and the sealed
// session on disk.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdlib>
#include <fstream>
#include <sstream>

#include "kuimsg.h"
#include "opclictx.h"

namespace {

std::string sourceDir() {
    const char* s = getenv("CSIT_SOURCE_DIR");
    return s ? s : ".";
}

class KuiMsg : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_EQ(file.load(sourceDir() + "/framework/kuicreatesitErr.xml"), 0); }
    KUI_MessageFile file;
};

TEST_F(KuiMsg, EveryMessageTheCommandCanProduceHasAText) {
    const char* ids[] = {"005I", "034I", "025I", "098W", "001E", "002E", "003E", "004E", "005E", "006E",
                         "007E", "008E", "009E", "011E", "014E", "015E", "016E", "017E", "019E", "021E",
                         "022E", "024E", "026E", "027E", "028E", "029E", "030E", "031E", "032E", "033E",
                         "035E", "036E", "037E", "038E", "039E", "097E", "099E"};
    for (const char* id : ids) {
        const std::string* t = file.text(id);
        ASSERT_NE(t, nullptr) << id;
        EXPECT_GT(t->size(), 20u) << id;
        EXPECT_EQ(t->find('\n'), std::string::npos) << "texts are flattened to one line";
    }
    EXPECT_NE(file.classText('C'), nullptr);
}

TEST_F(KuiMsg, CodedMessagesAreRenderedWithTheirValuesAndClass) {
    std::string out;
    EXPECT_EQ(file.render("005I@S@2@NEWSIT@HP", "HUB_MAIN", &out), 'I');
    EXPECT_EQ(out, "CSIT005I: Situation NEWSIT was created on hub HUB_MAIN.\n");
    EXPECT_EQ(file.render("004E@S@2@name@with@at@HP", "H", &out), 'E');
    EXPECT_EQ(out, "CSIT004E: A situation named name@with@at already exists on hub H.\n");
    EXPECT_EQ(file.render("011E@C@1@/tmp/a@b.xml", "H", &out), 'E');
    EXPECT_EQ(out, "CSIT011E: The file /tmp/a@b.xml was not found.\n  " + *file.classText('C') + "\n");
    EXPECT_EQ(file.render("014E@C", "H", &out), 'E');
    EXPECT_NE(out.find("\n  Check"), std::string::npos) << out;
    EXPECT_EQ(file.render("003E@S", "H", &out), 'E');
    EXPECT_EQ(out.find("\n  "), std::string::npos) << "class S has no second line";
    EXPECT_EQ(file.render("777E@S@1@v", "H", &out), 'E');
    EXPECT_EQ(out, "CSIT777E: v\n") << "an unknown id keeps its values";
    EXPECT_EQ(file.render("garbage", "H", &out), 0);
    EXPECT_EQ(out, "garbage\n");
    EXPECT_EQ(file.render("005I@S@3@a@b@c", "H", &out), 0);
}

TEST(KuiMsgFile, AFileThatIsNoMessageFileIsRefused) {
    KUI_MessageFile f;
    EXPECT_EQ(f.load("/nonexistent/kuicreatesitErr.xml"), 5);
    std::string path = testing::TempDir() + "/bad.xml";
    std::ofstream(path) << "<OTHER/>";
    EXPECT_EQ(f.load(path), 6);
    std::ofstream(path) << "<MESSAGES><MESSAGE id=\"001E\">x</MESSAGES>";
    EXPECT_EQ(f.load(path), 6);
}

class Session : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/opclisess.XXXXXX";
        home = mkdtemp(tmpl);
        setenv("OPCLI_HOME", (home + "/h").c_str(), 1);
    }
    void TearDown() override {
        unsetenv("OPCLI_HOME");
        if (system(("rm -rf '" + home + "'").c_str()) != 0) ADD_FAILURE();
    }
    std::string read(const std::string& name) {
        std::ifstream in(home + "/h/" + name);
        std::stringstream s;
        s << in.rdbuf();
        return s.str();
    }
    std::string home;
};

TEST_F(Session, TheSessionRoundTripsWithoutItsPasswordInClearText) {
    OPCLI_Session s{"http://127.0.0.1:15200/", "sysadmin", "Secret-Pw-42", "HUB_MAIN"};
    ASSERT_EQ(OPCLI_SaveSession(s), 0);
    struct stat st;
    ASSERT_EQ(stat((home + "/h/session").c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u);
    ASSERT_EQ(stat((home + "/h/session.key").c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u);
    EXPECT_EQ(read("session").find("Secret-Pw-42"), std::string::npos);
    EXPECT_NE(read("session").find("user=sysadmin"), std::string::npos);
    OPCLI_Session back;
    ASSERT_EQ(OPCLI_LoadSession(&back), 0);
    EXPECT_EQ(back.password, "Secret-Pw-42");
    EXPECT_EQ(back.server, s.server);
    EXPECT_EQ(back.hub, "HUB_MAIN");
    // The same password sealed twice never gives the same text.
    std::string first = read("session");
    ASSERT_EQ(OPCLI_SaveSession(s), 0);
    EXPECT_NE(read("session"), first);
    EXPECT_EQ(OPCLI_RemoveSession(), 0);
    EXPECT_EQ(OPCLI_LoadSession(&back), 5);
    EXPECT_EQ(OPCLI_RemoveSession(), 5);
}

TEST_F(Session, ATamperedSessionOrAnOpenKeyIsRefused) {
    OPCLI_Session s{"http://h/", "u", "pw", ""};
    ASSERT_EQ(OPCLI_SaveSession(s), 0);
    std::string text = read("session");
    size_t at = text.find("password=v1:") + 20;
    text[at] = text[at] == 'a' ? 'b' : 'a';
    std::ofstream(home + "/h/session") << text;
    OPCLI_Session back;
    EXPECT_EQ(OPCLI_LoadSession(&back), 6);
    EXPECT_TRUE(back.password.empty());
    ASSERT_EQ(OPCLI_SaveSession(s), 0);
    chmod((home + "/h/session.key").c_str(), 0644);
    EXPECT_EQ(OPCLI_LoadSession(&back), 6);
    OPCLI_Session bad{"http://h/\nuser=evil", "u", "pw", ""};
    EXPECT_EQ(OPCLI_SaveSession(bad), 6);
}

}  // namespace
