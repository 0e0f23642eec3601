// The run flow of createsit: result messages, the login check, the option
// checks and property validation.
#include <cstring>

#include "kgl/kglcnmnt.h"
#include "kuitesting.h"

namespace {

class KuiRun : public KuiTest {
protected:
    // Runs a copy of BASESIT named NEWSIT with the given -p pairs.
    KuiRunResult copyWith(const std::vector<std::string>& pairs) {
        std::vector<std::string> args = {"-s", "NEWSIT", "-b", "BASESIT"};
        if (!pairs.empty()) args.push_back("-p");
        args.insert(args.end(), pairs.begin(), pairs.end());
        return kuiRun(args);
    }
    // The definition row statement of the run (empty when none was sent).
    std::string definition() const {
        std::vector<std::string> s = kuiFake().sent("<![CDATA[INSERT INTO O4SRV.TSITDESC(");
        return s.empty() ? "" : s[0];
    }
    void SetUp() override {
        KuiTest::SetUp();
        kuiServeBase("BASESIT", {"NODE1", "NODE2"});
    }
};

// Every run ends with the completion flag set and nothing but the coded
// message in the buffer.
void expectClosed(const KuiRunResult& r) {
    EXPECT_EQ(r.done, 'Y');
    EXPECT_EQ(r.message.find("SELECT"), std::string::npos) << r.message;
    EXPECT_EQ(r.message.find("INSERT"), std::string::npos) << r.message;
}

TEST_F(KuiRun, ACopyWithAnIntervalWritesTheRowsAndReportsTheNewName) {
    KuiRunResult r = copyWith({"INTERVAL=000/000500"});
    EXPECT_EQ(r.rc, 0);
    EXPECT_EQ(r.message, "005I@S@2@NEWSIT@HP");
    expectClosed(r);
    std::string def = definition();
    EXPECT_NE(def.find("\"000\" ,\"000500\""), std::string::npos) << def;  // REEV_DAYS, REEV_TIME
    EXPECT_NE(def.find("\"NEWSIT\""), std::string::npos);
    EXPECT_EQ(def.find("BASESIT"), std::string::npos) << "the base name must not survive in the new row";
    ASSERT_EQ(kuiFake().sent("INSERT INTO O4SRV.TOBJACCL(").size(), 2u);
    EXPECT_NE(kuiFake().sent("INSERT INTO O4SRV.TOBJACCL(")[1].find("\"NODE2\""), std::string::npos);
}

TEST_F(KuiRun, NotLoggedInStopsBeforeAnyServerCallWithTheCodeOfTheRunKind) {
    kuiFake().loggedIn = false;
    KuiRunResult s = copyWith({});
    EXPECT_EQ(s.rc, 2);
    EXPECT_EQ(s.message, "003E@S");
    expectClosed(s);
    kuiResetState();
    KuiRunResult i = kuiRun({"-i", "whatever.xml"});
    EXPECT_EQ(i.rc, 2);
    EXPECT_EQ(i.message, "008E@S");
    EXPECT_TRUE(kuiFake().lookups.empty());
    EXPECT_TRUE(kuiFake().statements.empty());
}

TEST_F(KuiRun, OptionCombinationsAreCheckedInOrder) {
    struct Case {
        std::vector<std::string> args;
        const char* message;
    } cases[] = {
        {{}, "006E@S"},
        {{"-s", "NEWSIT"}, "001E@S"},
        {{"-b", "BASESIT"}, "006E@S"},
        {{"-i", "f.xml", "-b", "BASESIT"}, "015E@S"},
        {{"-I", "f.xml", "--PROPERTY", "DESC=x"}, "015E@S"},            // options in any case
        {{"-s", "-b", "BASESIT"}, "001E@S"},                            // "-b" became the name
        {{"-s", "NEWSIT", "-p", "DESC=x", "-b", "BASESIT"}, "002E@S"},  // -p must be last
        {{"-s", "NEWSIT", "-b", "BASESIT", "-p"}, "002E@S"},
        {{"-s", "NEWSIT", "-b", "BASESIT", "-p", "=x"}, "002E@S"},
        {{"-s", "NEWSIT", "-b", "BASESIT", "-p", "DESC=a", "-p", "ADVICE=b"}, "002E@S"},  // a second -p
        {{"-s", "NEWSIT", "-b", "BASESIT", "-p", "A=1", "B=2", "C=3", "D=4", "E=5", "F=6", "G=7", "H=8"}, "002E@S"},
        {{"-s", std::string(257, 'N'), "-b", "BASESIT"}, "035E@S"},
        {{"-s", "NEWSIT", "-b", std::string(257, 'B')}, "036E@S"},
    };
    for (const Case& c : cases) {
        kuiResetState();
        KuiRunResult r = kuiRun(c.args);
        EXPECT_EQ(r.message, c.message) << testing::PrintToString(c.args);
        EXPECT_NE(r.rc, 0);
        expectClosed(r);
    }
    EXPECT_TRUE(kuiFake().statements.empty());
}

TEST_F(KuiRun, NamesAreTrimmedAndAtMost256BytesLongAfterConversion) {
    KuiRunResult r = kuiRun({"-s", "  " + std::string(254, 'N') + " ", "-b", "BASESIT"});
    EXPECT_EQ(r.message, "005I@S@2@" + std::string(254, 'N') + "@HP");
    kuiResetState();
    // 128 two-byte characters: 256 bytes in UTF-8 pass, one more fails.
    std::string latin;
    for (int i = 0; i < 128; i++) latin += "\xC3\xA9";
    EXPECT_EQ(kuiRun({"-s", latin, "-b", "BASESIT"}).message, "005I@S@2@" + latin + "@HP");
    kuiResetState();
    EXPECT_EQ(kuiRun({"-s", latin + "x", "-b", "BASESIT"}).message, "035E@S");
}

TEST_F(KuiRun, IntervalValuesAreCheckedAndWritten) {
    const char* bad[] = {"INTERVAL=1/240000", "INTERVAL=1/006000",  "INTERVAL=1234/00010",
                         "INTERVAL=12/0001",  "INTERVAL=000500",    "INTERVAL=a/000100",
                         "INTERVAL=0/00010x", "INTERVAL=000/0005000"};
    for (const char* p : bad) {
        kuiResetState();
        EXPECT_EQ(copyWith({p}).message, "016E@S") << p;
    }
    kuiResetState();
    kuiFake().statements.clear();
    EXPECT_EQ(copyWith({"INTERVAL=/000100"}).rc, 0);
    EXPECT_NE(definition().find("\"0\" ,\"000100\""), std::string::npos) << definition();
    kuiResetState();
    kuiFake().statements.clear();
    EXPECT_EQ(copyWith({"interval=0/000000"}).rc, 0);  // names are upper-cased
    EXPECT_NE(definition().find("\"0\" ,\"000000\""), std::string::npos);
}

TEST_F(KuiRun, PropertiesReplaceTheBaseColumns) {
    EXPECT_EQ(copyWith({"desc=A \"quoted\" text", "ACTION=", "RUNONSTART=No", "FORMULA=*IF x==1", "ADVICE=Call=me"})
                  .message,
              "005I@S@2@NEWSIT@HP");
    std::string def = definition();
    EXPECT_NE(def.find("N\"A \"\"quoted\"\" text\""), std::string::npos) << def;  // TEXT, escaped
    EXPECT_NE(def.find("N\"*NONE\""), std::string::npos);                         // CMD
    EXPECT_NE(def.find("\"*NO\""), std::string::npos);                            // AUTOSTART
    EXPECT_NE(def.find("N\"*IF x==1\""), std::string::npos);                      // PDT
    EXPECT_NE(def.find("N\"Call=me\""), std::string::npos);                       // ADVISE keeps the second "="
    EXPECT_EQ(def.find("CPU busy"), std::string::npos);
}

TEST_F(KuiRun, RejectedPropertiesNameTheirError) {
    struct Case {
        const char* pair;
        const char* message;
    } cases[] = {
        {"RUNONSTART=y", "024E@S"},     {"RUNONSTART=", "024E@S"},       {"FORMULA=", "022E@S"},
        {"TEXT=x", "019E@S"},           {"CMD=x", "019E@S"},             {"SITINFO=SEV=Bad", "027E@S"},
        {"SITINFO=TFWD=maybe", "028E@S"}, {"SITINFO=ATOM=1x", "030E@S"}, {"SITINFO=COUNT=0", "031E@S"},
        {"SITINFO=SEV", "032E@S"},
    };
    for (const Case& c : cases) {
        kuiResetState();
        EXPECT_EQ(copyWith({c.pair}).message, c.message) << c.pair;
    }
    kuiResetState();
    // A value whose UTF-8 form does not fit the conversion buffer is refused, not cut.
    EXPECT_EQ(copyWith({"DESC=" + std::string(2048, 'd')}).message, "099E@S");
    kuiResetState();
    EXPECT_EQ(copyWith({"DESC=" + std::string(2047, 'd')}).rc, 0);
}

TEST_F(KuiRun, AnEmptyNamePairIsValidatedOnlyWhenItStandsWithinTheCountedPairs) {
    EXPECT_EQ(copyWith({"=x", "DESC=y"}).message, "019E@S");
    kuiResetState();
    EXPECT_EQ(copyWith({"DESC=y", "=x"}).message, "005I@S@2@NEWSIT@HP");
}

TEST_F(KuiRun, EventDestinationsAreFetchedWhenTdstOccursAnywhere) {
    kuiFake().events = {"0", "7"};
    EXPECT_EQ(copyWith({"SITINFO=sev=minor;TDST=7, 0;COUNT=003"}).rc, 0);
    EXPECT_NE(definition().find("\"SEV=Minor;TDST=7,0;COUNT=3;\""), std::string::npos) << definition();
    kuiResetState();
    EXPECT_EQ(copyWith({"SITINFO=TDST=9"}).message, "029E@S");
    kuiResetState();
    kuiFake().lookups.clear();
    EXPECT_EQ(copyWith({"DESC=mentions TDST"}).rc, 0);
    EXPECT_EQ(kuiFake().lookups.at(0), "EVENTS");
    kuiResetState();
    kuiFake().eventRc = 9;
    EXPECT_EQ(copyWith({"SITINFO=TDST=0"}).message, "033E@S");
    struct Case {
        int rc;
        const char* message;
    } failures[] = {{7, "097E@S"}, {4, "014E@C"}, {8, "099E@S"}};
    for (const Case& c : failures) {
        kuiResetState();
        kuiFake().eventRc = c.rc;
        EXPECT_EQ(copyWith({"SITINFO=TDST=0"}).message, c.message);
    }
}

TEST_F(KuiRun, AServerVersionThatCannotBeReadEndsTheRun) {
    struct Case {
        int rc;
        const char* message;
    } cases[] = {{7, "097E@S"}, {4, "014E@C"}, {8, "099E@S"}};
    for (const Case& c : cases) {
        kuiResetState();
        kuiFake().statements.clear();
        kuiFake().versionRc = c.rc;
        KuiRunResult r = copyWith({});
        EXPECT_EQ(r.rc, c.rc);
        EXPECT_EQ(r.message, c.message);
        expectClosed(r);
        EXPECT_TRUE(kuiFake().statements.empty());
    }
}

TEST(KuiMessage, TheFormsOfTheResultMessageFollowTheCode) {
    kuiResetState();
    std::vector<char> buf(KUI_MSGBUF_SIZE);
    sitName = kuiDup("SHORT");
    longSitName = kuiDup("A long name");
    baseSitName = kuiDup("BASE");
    displayFileName = "f\xC3\xA9.xml";
    struct Case {
        int code;
        const char* message;
    } cases[] = {
        {1, "001E@S"},   {8, "008E@S"},        {4, "004E@S@2@SHORT@HP"}, {5, "005E@S@2@BASE@HP"},
        {9, "009E@S@2@A long name@HP"},        {11, "011E@C@1@f\xC3\xA9.xml"}, {21, "021E@C@1@f\xC3\xA9.xml"},
        {14, "014E@C"},  {17, "017E@S@1@f\xC3\xA9.xml"}, {26, "026E@S@1@f\xC3\xA9.xml"}, {39, "039E@S@1@BASE"},
        {16, "016E@S"},  {99, "099E@S"},       {10, "099E@C"},           {0, "005I@S@2@SHORT@HP"},
    };
    for (const Case& c : cases) {
        constructErrMsg(c.code, buf.data());
        EXPECT_STREQ(buf.data(), c.message) << c.code;
    }
    longNameExist = duplicateFullName = 1;
    constructErrMsg(0, buf.data());
    EXPECT_STREQ(buf.data(), "005I@S@2@A long name@HP");
    constructErrMsg(4, buf.data());
    EXPECT_STREQ(buf.data(), "004E@S@2@A long name@HP");
    tdstDiscarded = 1;
    constructErrMsg(0, buf.data());
    EXPECT_STREQ(buf.data(), "034I@S@2@A long name@HP");
    kuiResetState();
}

TEST(KuiInventory, TheModuleDescribesItselfToTheInventory) {
    EXPECT_EQ(cnt1entd(), 0);
    const KGL_Contents* c = kglcnqry("createsit");
    ASSERT_NE(c, nullptr);
    EXPECT_STREQ(c->name, "createsit");
    EXPECT_EQ(kglcnqry("nothing"), nullptr);
}

}  // namespace
