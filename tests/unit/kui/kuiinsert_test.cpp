// The INSERT statements of the definition, distribution and long-name rows,
// their escaping, and how their replies are judged.
#include <cstring>

#include "kuiinsert.h"
#include "kuisql.h"
#include "kuitesting.h"

namespace {

class KuiInsert : public KuiTest {
protected:
    void SetUp() override {
        KuiTest::SetUp();
        buf.assign(KUI_MSGBUF_SIZE, '\0');
        sitName = kuiDup("NEWSIT");
    }
    // A column set of the given (column, value) pairs.
    void columns(const std::vector<std::pair<std::string, std::string>>& set) {
        arrayCount = arrayCapacity = (int)set.size();
        elementArray = new char*[set.size()];
        valueArray = new char*[set.size()];
        for (size_t i = 0; i < set.size(); i++) {
            elementArray[i] = kuiDup(set[i].first.c_str());
            valueArray[i] = kuiDup(set[i].second.c_str());
        }
    }
    std::vector<char> buf;
};

TEST_F(KuiInsert, TheDefinitionRowIsOneCdataStatementWithNationalLiterals) {
    columns({{"SITNAME", "NEWSIT"}, {"TEXT", "say \"hi\" ]]> now"}, {"REEV_DAYS", "3"}, {"REEV_TIME", "001500"},
             {"LSTUSRPRF", "&QIBUSER"}, {"CMD", "*NONE"}});
    snprintf(reev_days, sizeof reev_days, "12");
    EXPECT_EQ(insertintoTSITDESC(nullptr, buf.data(), nullptr), 0);
    EXPECT_EQ(sitInserted, 1);
    ASSERT_EQ(kuiFake().statements.size(), 1u);
    EXPECT_EQ(kuiFake().statements[0],
              "<![CDATA[INSERT INTO O4SRV.TSITDESC(SITNAME ,TEXT ,REEV_DAYS ,REEV_TIME ,LSTUSRPRF ,CMD) VALUES "
              "(\"NEWSIT\" ,N\"say \"\"hi\"\" ]]]]><![CDATA[> now\" ,\"12\" ,\"001500\" ,\"&QIBUSER\" ,N\"*NONE\")]]>");
    EXPECT_STREQ(valueArray[1], "say \"\"hi\"\" ]]> now") << "the column set holds the escaped value";
}

TEST_F(KuiInsert, RepliesAreJudgedByTheirTable) {
    columns({{"SITNAME", "NEWSIT"}});
    kuiFake().scripts.push_back({"TSITDESC", 0, kuiFaultReply(), 1});
    kuiFake().scripts.push_back({"TSITDESC", 4, "", 1});
    EXPECT_EQ(insertintoTSITDESC(nullptr, buf.data(), nullptr), KUIR_SERVER);
    EXPECT_EQ(errCode, KUIE_SERVER);
    EXPECT_EQ(insertintoTSITDESC(nullptr, buf.data(), nullptr), KUIR_COMM);
    EXPECT_EQ(errCode, KUIE_COMM);
    EXPECT_EQ(sitInserted, 0);
    // Nothing is written before the definition row exists.
    distList = kuiDup("NODE1");
    EXPECT_EQ(insertintoTOBJACCL(nullptr, buf.data(), nullptr), 0);
    EXPECT_EQ(kuiFake().sent("INSERT INTO O4SRV.TOBJACCL").size(), 0u);
}

TEST_F(KuiInsert, OneDistributionRowPerNonBlankTarget) {
    sitInserted = 1;
    distList = kuiDup(",NODE1, ,\tNODE2 ,");
    EXPECT_EQ(insertintoTOBJACCL(nullptr, buf.data(), nullptr), 0);
    EXPECT_EQ(distInserted, 1);
    std::vector<std::string> rows = kuiFake().sent("INSERT INTO O4SRV.TOBJACCL");
    ASSERT_EQ(rows.size(), 2u);
    const std::string head =
        "INSERT INTO O4SRV.TOBJACCL(ACTIVATION ,HUB ,LOCFLAG ,LSTDATE ,LSTRELEASE ,LSTUSRPRF ,NETID ,NODEL ,OBJCLASS "
        ",OBJECTLOCK ,OBJNAME ,QIBCLASSID) VALUES (\"\" ,\"Y\" ,\"\" ,\"\" ,\"\" ,\"&QIBUSER\" ,\"\" ,\"";
    EXPECT_EQ(rows[0], head + "NODE1\" ,\"5140\" ,\"\" ,\"NEWSIT\" ,\"5535\")");
    EXPECT_EQ(rows[1], head + "NODE2\" ,\"5140\" ,\"\" ,\"NEWSIT\" ,\"5535\")");
    // Never twice in a run.
    EXPECT_EQ(insertintoTOBJACCL(nullptr, buf.data(), nullptr), 0);
    EXPECT_EQ(kuiFake().sent("INSERT INTO O4SRV.TOBJACCL").size(), 2u);
}

TEST_F(KuiInsert, ADistributionWithoutTargetsWritesNothing) {
    sitInserted = 1;
    distList = kuiDup(" , ,,");
    EXPECT_EQ(insertintoTOBJACCL(nullptr, buf.data(), nullptr), 0);
    EXPECT_EQ(distInserted, 1);
    kuiFree(distList);
    distInserted = 0;
    EXPECT_EQ(insertintoTOBJACCL(nullptr, buf.data(), nullptr), 0);
    EXPECT_EQ(distInserted, 0);
    EXPECT_TRUE(kuiFake().statements.empty());
}

TEST_F(KuiInsert, AFailingTargetStopsTheDistributionAndKeepsEarlierRows) {
    sitInserted = 1;
    distList = kuiDup("A,B,C");
    kuiFake().scripts.push_back({"\"B\"", 0, kuiFaultReply()});
    EXPECT_EQ(insertintoTOBJACCL(nullptr, buf.data(), nullptr), KUIR_SERVER);
    EXPECT_EQ(errCode, KUIE_SERVER);
    EXPECT_EQ(distInserted, 0);
    EXPECT_EQ(kuiFake().sent("INSERT INTO O4SRV.TOBJACCL").size(), 2u);
}

TEST_F(KuiInsert, QuotesInAnyValueNeverEndTheirLiteral) {
    kuiReplace(sitName, "Q\"SIT");
    sitInserted = 1;
    distList = kuiDup("NODE\"1");
    EXPECT_EQ(insertintoTOBJACCL(nullptr, buf.data(), nullptr), 0);
    longSitName = kuiDup("A \"long\" name");
    EXPECT_EQ(insertintoTNAME(nullptr, buf.data(), nullptr), 0);
    EXPECT_STREQ(longSitName, "A \"long\" name") << "the long name itself stays as it is";
    std::vector<std::string> s = kuiFake().statements;
    ASSERT_EQ(s.size(), 2u);
    EXPECT_NE(s[0].find(",\"NODE\"\"1\" ,"), std::string::npos) << s[0];
    EXPECT_NE(s[0].find(",\"Q\"\"SIT\" ,"), std::string::npos) << s[0];
    EXPECT_EQ(s[1], "<![CDATA[INSERT INTO O4SRV.TNAME(ID,FULLNAME,OBJCLASS,LSTUSRPRF,QIBCLASSID) VALUES (\"Q\"\"SIT\", "
                    "N\"A \"\"long\"\" name\", \"5140\", \"&QIBUSER\", \"2012\")]]>");
}

TEST_F(KuiInsert, AStatementThatDoesNotFitIsNeverSent) {
    std::string huge(KUI_MSGBUF_SIZE, 'p');
    columns({{"SITNAME", "NEWSIT"}, {"PDT", huge}});
    EXPECT_EQ(insertintoTSITDESC(nullptr, buf.data(), nullptr), KUIR_INTERNAL);
    EXPECT_EQ(errCode, KUIE_INTERNAL);
    EXPECT_TRUE(kuiFake().statements.empty());
    EXPECT_LT(strlen(buf.data()), (size_t)KUI_MSGBUF_SIZE);
}

TEST(KuiStatement, ValuesCannotOpenOrCloseACdataSection) {
    std::vector<char> buf(KUI_MSGBUF_SIZE);
    KUI_Statement st(buf.data());
    st.add("X=\"").addOutsideCdata("a<![CDATA[b").add("\" Y=\"").addOutsideCdata("plain").add("\"");
    EXPECT_STREQ(st.text(), "X=\"<![CDATA[a<![CDATA[b]]>\" Y=\"plain\"");
    KUI_Statement st2(buf.data());
    st2.addInCdata("]]>]]>");
    EXPECT_STREQ(st2.text(), "]]]]><![CDATA[>]]]]><![CDATA[>");
}

}  // namespace
