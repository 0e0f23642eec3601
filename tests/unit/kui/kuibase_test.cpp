// Creation from a base situation: the order of the name checks for old and
// new servers, long names, short-name generation, and the base's row and
// distribution.
#include <cstring>

#include "kuishort.h"
#include "kuitesting.h"

namespace {

class KuiBase : public KuiTest {
protected:
    void SetUp() override {
        KuiTest::SetUp();
        kuiServeBase("BASESIT", {"NODE1", "LIST2"});
    }
    std::vector<std::string> lookups() const {
        std::vector<std::string> l = kuiFake().lookups;
        l.erase(l.begin());  // VERSION
        return l;
    }
    std::string definition() const {
        std::vector<std::string> s = kuiFake().sent("<![CDATA[INSERT INTO O4SRV.TSITDESC(");
        return s.empty() ? "" : s[0];
    }
};

const std::string kLongName = "Disk space on the database servers is low";

TEST_F(KuiBase, AnOldServerKnowsShortNamesOnly) {
    kuiFake().version = "06.20";
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BASESIT"}).message, "005I@S@2@NEWSIT@HP");
    EXPECT_EQ(lookups(), (std::vector<std::string>{"TSITDESC:BASESIT", "TSITDESC:NEWSIT", "UADVISOR:BASESIT"}));
    EXPECT_TRUE(kuiFake().sent("<![CDATA[INSERT INTO O4SRV.TNAME").empty());

    kuiResetState();
    kuiFake().lookups.clear();
    EXPECT_EQ(kuiRun({"-s", kLongName, "-b", "BASESIT"}).message, "037E@S");
    EXPECT_EQ(kuiFake().lookups, (std::vector<std::string>{"VERSION"}));
    kuiResetState();
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "Base situation with a rather long name"}).message, "038E@S");
    kuiResetState();
    EXPECT_EQ(kuiRun({"-s", "BASESIT", "-b", "BASESIT"}).message, "004E@S@2@BASESIT@HP");
    kuiResetState();
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "NOSUCH"}).message, "005E@S@2@NOSUCH@HP");
}

TEST_F(KuiBase, ANewServerChecksLongNamesToo) {
    const std::string longBase = "Base known by its long name only, on this hub";
    kuiFake().longNames[longBase] = "BASESIT";
    EXPECT_EQ(kuiRun({"-s", kLongName, "-b", longBase}).message, "005I@S@2@" + kLongName + "@HP");
    const std::string shortName = "Disk_space_on_the_database_serv";  // 31 bytes
    EXPECT_EQ(lookups(), (std::vector<std::string>{"TNAME:" + longBase, "TNAME:" + shortName, "TSITDESC:" + shortName,
                                                   "TSITDESC:BASESIT", "TNAME:" + kLongName, "UADVISOR:BASESIT"}));
    std::vector<std::string> tname = kuiFake().sent("<![CDATA[INSERT INTO O4SRV.TNAME");
    ASSERT_EQ(tname.size(), 1u);
    EXPECT_EQ(tname[0], "<![CDATA[INSERT INTO O4SRV.TNAME(ID,FULLNAME,OBJCLASS,LSTUSRPRF,QIBCLASSID) VALUES (\"" +
                            shortName + "\", N\"" + kLongName + "\", \"5140\", \"&QIBUSER\", \"2012\")]]>");
    // The base is read under its short name.
    EXPECT_EQ(kuiFake().sent("SELECT NODEL")[0],
              "SELECT NODEL FROM O4SRV.TOBJACCL WHERE OBJNAME =\"BASESIT\" AND SYSTEM.PARMA('QIBNODE', 'QPANOSCOPE', 32)");
    std::string columns;
    for (const std::string& c : kuiSituationColumns()) columns += (columns.empty() ? "" : ",") + c;
    EXPECT_EQ(kuiFake().sent("SELECT ADVISE")[0],
              "SELECT " + columns + " FROM O4SRV.TSITDESC WHERE SITNAME =\"BASESIT\"");
}

TEST_F(KuiBase, ExistingNamesAreRefusedWithTheNameTheUserGave) {
    kuiFake().longNames[kLongName] = "OTHER";
    EXPECT_EQ(kuiRun({"-s", kLongName, "-b", "BASESIT"}).message, "004E@S@2@" + kLongName + "@HP");
    kuiResetState();
    kuiFake().longNames["NEWSIT"] = "SOMETHING";  // a full name is taken as a short name too
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BASESIT"}).message, "004E@S@2@NEWSIT@HP");
    kuiResetState();
    kuiFake().lookups.clear();
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "NOSUCH"}).message, "005E@S@2@NOSUCH@HP");
    EXPECT_EQ(kuiFake().lookups.back(), "TNAME:NOSUCH") << "a new server looks the base up as a full name";
}

TEST_F(KuiBase, InternalBasesAndMissingRowsAreRefused) {
    kuiServeBase("UADVISOR_ZAG", {});
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "UADVISOR_ZAG"}).message, "039E@S@1@UADVISOR_ZAG");
    EXPECT_TRUE(kuiFake().statements.empty());
    kuiResetState();
    kuiFake().situations.insert("GHOST");  // exists by name, but its row cannot be read
    kuiFake().scripts.insert(kuiFake().scripts.begin(),
                             {"WHERE SITNAME =\"GHOST\"", 0, kuiTableReply("O4SRV.TSITDESC", {})});
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "GHOST"}).message, "005E@S@2@GHOST@HP");
    kuiResetState();
    kuiFake().scripts.insert(kuiFake().scripts.begin(), {"WHERE SITNAME =\"BASESIT\"", 0, kuiFaultReply()});
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BASESIT"}).message, "097E@S");
    kuiResetState();
    kuiFake().scripts.insert(kuiFake().scripts.begin(), {"WHERE SITNAME =\"BASESIT\"", 4, ""});
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BASESIT"}).message, "014E@C");
    EXPECT_TRUE(kuiFake().sent("<![CDATA[INSERT").empty());
}

TEST_F(KuiBase, TheDistributionIsCopiedUnlessOneIsGiven) {
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BASESIT"}).rc, 0);
    std::vector<std::string> rows = kuiFake().sent("INSERT INTO O4SRV.TOBJACCL(");
    ASSERT_EQ(rows.size(), 2u);
    EXPECT_NE(rows[0].find("\"NODE1\""), std::string::npos);
    EXPECT_NE(rows[1].find("\"LIST2\""), std::string::npos);

    kuiResetState();
    kuiFake().statements.clear();
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BASESIT", "-p", "DISTRIBUTION= \t"}).rc, 0);
    EXPECT_TRUE(kuiFake().sent("SELECT NODEL").empty());
    EXPECT_TRUE(kuiFake().sent("INSERT INTO O4SRV.TOBJACCL(").empty());

    kuiResetState();
    kuiFake().statements.clear();
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BASESIT", "-p", "DISTRIBUTION=A, B"}).rc, 0);
    EXPECT_EQ(kuiFake().sent("INSERT INTO O4SRV.TOBJACCL(").size(), 2u);

    kuiResetState();
    kuiFake().statements.clear();
    kuiFake().scripts.insert(kuiFake().scripts.begin(), {"SELECT NODEL", 0, kuiFaultReply()});
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BASESIT"}).message, "097E@S")
        << "an error answer must not pass for a base without distribution";
    EXPECT_TRUE(kuiFake().sent("<![CDATA[INSERT").empty());
}

TEST_F(KuiBase, ALongDistributionKeepsEveryTarget) {
    std::vector<std::string> targets;
    for (int i = 0; i < 60; i++) targets.push_back("MANAGED_SYSTEM_NUMBER_" + std::to_string(i));
    kuiServeBase("BIGBASE", targets);  // far more than 1023 characters
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BIGBASE"}).rc, 0);
    std::vector<std::string> rows = kuiFake().sent("INSERT INTO O4SRV.TOBJACCL(");
    ASSERT_EQ(rows.size(), 60u);
    EXPECT_NE(rows[59].find("\"MANAGED_SYSTEM_NUMBER_59\""), std::string::npos);
}

TEST_F(KuiBase, OverrideItemsOfSitinfoAreNotCopied) {
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BASESIT"}).rc, 0);
    EXPECT_NE(definition().find("\"SEV=Critical;TFWD=Y;\""), std::string::npos) << definition();
    kuiResetState();
    kuiFake().statements.clear();
    EXPECT_EQ(kuiRun({"-s", "NEWSIT", "-b", "BASESIT", "-p", "SITINFO=SEV=Warning;OV=5"}).rc, 0);
    EXPECT_NE(definition().find("\"SEV=Warning;\""), std::string::npos) << definition();
}

class KuiShortName : public KuiTest {
protected:
    // Generates a short name for `longName` on a base-situation run.
    int generate(const std::string& longName, std::string* out) {
        kuiReplace(longSitName, longName.c_str());
        kuiReplace(basesitShortName, "BASESIT");
        std::vector<char> buf(KUI_MSGBUF_SIZE);
        char name[KUI_GEN_NAME_SIZE] = "";
        int rc = generateShortName(name, nullptr, buf.data(), nullptr);
        *out = name;
        return rc;
    }
};

TEST_F(KuiShortName, AFreeReadableFormIsUsedAsItIs) {
    std::string out;
    EXPECT_EQ(generate("cpu busy  on   all  hosts of the east region", &out), 0);
    EXPECT_EQ(out, "cpu_busy__on___all__hosts_of_th");
    EXPECT_EQ(generate("Trailing blanks are cut at the end     x", &out), 0);
    EXPECT_EQ(out, "Trailing_blanks_are_cut_at_the");  // 31 bytes ended in "_": cut to 30
    EXPECT_EQ(generate("1 digit first and short enough here", &out), 0);
    EXPECT_EQ(out, "Z1_digit_first_and_short_enough") << "30 bytes or fewer: the Z is inserted";
    EXPECT_EQ(generate("9 digit first but with a trailing   x", &out), 0);
    EXPECT_EQ(out, "Z_digit_first_but_with_a_traili") << "31 bytes: the Z replaces the digit";
    EXPECT_EQ(generate("_starts with underscore ends_ ", &out), 0);
    EXPECT_EQ(out, "Z_starts_with_underscore_ends") << "30 bytes or fewer: the Z is inserted";
    EXPECT_EQ(kuiFake().uuids, 0);
}

TEST_F(KuiShortName, ATakenNameGetsAPrefixAndAnIdentifier) {
    kuiFake().situations.insert("cpu_busy_on_all_hosts_of_the_ea");
    std::string out;
    EXPECT_EQ(generate("cpu busy on all hosts of the east region", &out), 0);
    EXPECT_EQ(out, "cpu_busy_on_all" + std::string("ID00000000000001"));
    // Short names: the prefix is padded with "_"; taken identifiers are replaced.
    kuiFake().forced["TSITDESC"] = {0, 0};  // readable form and first identifier taken
    EXPECT_EQ(generate("short name " + std::string(25, ' ') + "x", &out), 0);
    EXPECT_EQ(out, "short_name_____ID00000000000003");
    EXPECT_EQ(out.size(), 31u);
    // A taken name is taken whether TNAME or TSITDESC holds it.
    kuiFake().longNames["cpu_busy_on_all_hosts_of_the_ea"] = "X";
    kuiFake().situations.clear();
    EXPECT_EQ(generate("cpu busy on all hosts of the east region", &out), 0);
    EXPECT_EQ(out, "cpu_busy_on_allID00000000000004");
}

TEST_F(KuiShortName, NonLatinNamesArePrefixedWithTheAffinity) {
    // Japanese text: three bytes a character.
    const std::string name = "\xE3\x83\x87\xE3\x82\xA3\xE3\x82\xB9\xE3\x82\xAF\xE4\xB8\x8D\xE8\xB6\xB3";
    kuiFake().scripts.push_back({"SELECT AFFINITIES", 0, kuiTableReply("O4SRV.TSITDESC", {{{"AFFINITIES", "%XYZ.ZAG#01"}}})});
    std::string out;
    EXPECT_EQ(generate(name, &out), 0);
    EXPECT_EQ(out, "ZXYZ_ZAG_01____ID00000000000001");
    ASSERT_EQ(kuiFake().sent("SELECT AFFINITIES").size(), 1u);
    EXPECT_EQ(kuiFake().sent("SELECT AFFINITIES")[0], "SELECT AFFINITIES FROM O4SRV.TSITDESC WHERE SITNAME = \"BASESIT\"");
    kuiFake().scripts[0].reply = kuiTableReply("O4SRV.TSITDESC", {{{"AFFINITIES", ""}}});
    EXPECT_EQ(generate(name, &out), 0);
    EXPECT_EQ(out, "Z00000000000000ID00000000000002");
    kuiFake().scripts[0].reply = kuiTableReply("O4SRV.TSITDESC", {});
    EXPECT_EQ(generate(name, &out), KUIR_ABSENT);
    EXPECT_EQ(errCode, KUIE_NOSUCHBASE);
    // The cut at 31 bytes never splits a character: the readable form ends
    // before the three-byte character that would straddle it.
    EXPECT_EQ(generate("Latin characters first, then \xE3\x83\x87", &out), 0);
    EXPECT_EQ(out, "Latin_characters_first,_then");
}

TEST_F(KuiShortName, AFailingQueryStopsGeneration) {
    kuiFake().situations.insert("cpu_busy_on_all_hosts_of_the_ea");
    kuiFake().forced["TSITDESC"] = {0, 7};
    std::string out;
    EXPECT_EQ(generate("cpu busy on all hosts of the east region", &out), KUIR_SERVER);
    EXPECT_EQ(errCode, KUIE_SERVER);
    kuiFake().forced["TNAME"] = {4};
    EXPECT_EQ(generate("cpu busy on all hosts of the east region", &out), KUIR_COMM);
    EXPECT_EQ(errCode, KUIE_COMM);
    // A server that calls every name taken does not keep the command looping.
    kuiFake().forced["TSITDESC"] = std::vector<int>(200, 0);
    EXPECT_EQ(generate("cpu busy on all hosts of the east region", &out), KUIR_INTERNAL);
    EXPECT_EQ(errCode, KUIE_INTERNAL);
}

}  // namespace
