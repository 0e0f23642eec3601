// Creation from a situation export file: reading the file, the export rules,
// the column set, the name checks and the event-console slot rows.
#include <algorithm>
#include <functional>

#include "kuitesting.h"

namespace {

class KuiImport : public KuiTest {
protected:
    std::string definition() const {
        std::vector<std::string> s = kuiFake().sent("<![CDATA[INSERT INTO O4SRV.TSITDESC(");
        return s.empty() ? "" : s[0];
    }
};

TEST_F(KuiImport, AValidExportIsWrittenWithItsColumnsInFileOrder) {
    KuiExport e = KuiExport::situation("IMPSIT");
    e.drop("LSTUSRPRF");
    e.set("CMD", std::nullopt);
    e.set("REEV_TIME", std::nullopt);
    e.set("DISTRIBUTION", "NODE1,NODE2");
    KuiRunResult r = import(e);
    EXPECT_EQ(r.rc, 0);
    EXPECT_EQ(r.message, "005I@S@2@IMPSIT@HP");
    EXPECT_EQ(r.done, 'Y');
    std::string def = definition();
    // LSTUSRPRF and QIBCLASSID are appended after the file's columns; the
    // distribution is no column.
    EXPECT_NE(def.find("SOURCE ,TEXT ,LSTUSRPRF ,QIBCLASSID) VALUES ("), std::string::npos) << def;
    EXPECT_EQ(def.find("DISTRIBUTION"), std::string::npos);
    EXPECT_NE(def.find("N\"*NONE\""), std::string::npos);                   // CMD without value
    EXPECT_NE(def.find(",\"001500\" ,"), std::string::npos);               // REEV_TIME without value
    EXPECT_NE(def.find("N\"CPU busy\" ,\"&QIBUSER\" ,\"5140\")]]>"), std::string::npos);
    EXPECT_EQ(kuiFake().sent("INSERT INTO O4SRV.TOBJACCL(").size(), 2u);
    EXPECT_TRUE(kuiFake().sent("INSERT INTO O4SRV.EVNTMAP").empty());
}

TEST_F(KuiImport, TheShapeOfTheExportIsChecked) {
    KuiExport e = KuiExport::situation("IMPSIT");
    e.drop("SOURCE");  // 26 columns
    EXPECT_EQ(import(e).message, "007E@S");
    kuiResetState();
    e = KuiExport::situation("IMPSIT");
    e.set("FULLNAME", std::nullopt);
    e.set("DISTRIBUTION", std::nullopt);
    e.set("QIBCLASSID", "5140");  // 30 columns, and an unknown one
    EXPECT_EQ(import(e).message, "007E@S");
    kuiResetState();
    e.drop("QIBCLASSID");  // 29
    EXPECT_EQ(import(e).message, "005I@S@2@IMPSIT@HP");
    kuiResetState();
    e.drop("FULLNAME");
    e.set("EXTRA", "1");  // 29 with a column that is not one
    EXPECT_EQ(import(e).message, "007E@S");
    kuiResetState();
    EXPECT_EQ(kuiRun({"-i", writeFile("t.xml", "<TABLES><ROW/></TABLES>")}).message, "007E@S");
    kuiResetState();
    EXPECT_EQ(kuiRun({"-i", writeFile("t.xml", "<TABLE></TABLE>")}).message, "007E@S");
}

TEST_F(KuiImport, ColumnRulesRefuseInvalidValues) {
    struct Case {
        const char* column;
        std::optional<std::string> value;
        bool valid;
    } cases[] = {
        {"AUTOSTART", "*SYN", false},       {"AUTOSTART", std::nullopt, false}, {"AUTOSTART", "*NO", true},
        {"ALERTLIST", "YES", false},        {"HUB", "X", false},                {"HUB", std::nullopt, true},
        {"QIBSCOPE", "AB", false},          {"QIBSCOPE", "A", true},
        {"PDT", "*IF *VALUE EIB_Changes.Userid *EQ x", false},                 {"PDT", std::nullopt, false},
        {"REEV_TIME", "240000", false},     {"REEV_TIME", "000060", false},     {"REEV_TIME", "235959", true},
        {"REEV_TIME", "00150", false},      {"REEV_TIME", "0a1500", false},     {"REEV_DAYS", "1000", false},
        {"REEV_DAYS", "-1", false},         {"REEV_DAYS", "999", true},         {"SITINFO", "SEV=Nope", false},
        {"SITINFO", "~", true},             {"SITNAME", std::nullopt, false},   {"SITNAME", "A&B", false},
        {"SITNAME", "A situation name of more than 31 characters", false},
    };
    for (const Case& c : cases) {
        kuiResetState();
        KuiExport e = KuiExport::situation("IMPSIT");
        e.set(c.column, c.value);
        EXPECT_EQ(import(e).message, c.valid ? "005I@S@2@IMPSIT@HP" : "007E@S") << c.column << "=" << c.value.value_or("(none)");
    }
    kuiResetState();
    kuiFake().statements.clear();
    KuiExport e = KuiExport::situation("IMPSIT");
    e.set("SITINFO", "~");
    EXPECT_EQ(import(e).rc, 0);
    EXPECT_NE(definition().find(",\"\" ,\"IMPSIT\""), std::string::npos) << "SITINFO ~ is written empty: " << definition();
}

TEST_F(KuiImport, FileProblemsNameTheFileInUtf8) {
    EXPECT_EQ(kuiRun({"-i", dir + "/missing.xml"}).message, "011E@C@1@" + dir + "/missing.xml");
    kuiResetState();
    std::string longName = dir + "/" + std::string(600, 'f');
    EXPECT_EQ(kuiRun({"-i", longName}).message, "011E@C@1@" + longName) << "a name beyond the buffer is not found";
    kuiResetState();
    EXPECT_EQ(kuiRun({"-i", writeFile("empty.xml", "")}).message, "021E@C@1@" + dir + "/empty.xml");
    kuiResetState();
    EXPECT_EQ(kuiRun({"-i", writeFile("s\xC3\xA9.xml", "{AES256}<TABLE/>")}).message, "026E@S@1@" + dir + "/s\xC3\xA9.xml");
    kuiResetState();
    EXPECT_EQ(kuiRun({"-i", writeFile("bad.xml", "<TABLE><ROW></TABLE>")}).message, "017E@S@1@" + dir + "/bad.xml");
    EXPECT_TRUE(kuiFake().statements.empty());
}

TEST_F(KuiImport, NameChecksOnTheServer) {
    KuiExport e = KuiExport::situation("IMPSIT");
    kuiFake().situations.insert("IMPSIT");
    EXPECT_EQ(import(e).message, "004E@S@2@IMPSIT@HP");
    EXPECT_TRUE(kuiFake().statements.empty());

    // Taken short name, but the export carries a long name: a short name is
    // generated and used in every row.
    kuiResetState();
    e.set("FULLNAME", "Imported situation with a long name");
    e.set("DISTRIBUTION", "NODE1");
    e.slots.push_back(kuiSlot("IMPSIT", "slot map"));
    KuiRunResult r = import(e);
    EXPECT_EQ(r.message, "005I@S@2@Imported situation with a long name@HP");
    const std::string generated = "Imported_situation_with_a_long";
    EXPECT_NE(definition().find("\"" + generated + "\""), std::string::npos) << definition();
    ASSERT_EQ(kuiFake().sent("INSERT INTO O4SRV.TOBJACCL(").size(), 1u);
    EXPECT_NE(kuiFake().sent("INSERT INTO O4SRV.TOBJACCL(")[0].find("\"" + generated + "\" ,\"5535\")"), std::string::npos);
    EXPECT_EQ(kuiFake().sent("<![CDATA[INSERT INTO O4SRV.TNAME").size(), 1u);
    ASSERT_EQ(kuiFake().sent("INSERT INTO O4SRV.EVNTMAP").size(), 1u);
    EXPECT_NE(kuiFake().sent("INSERT INTO O4SRV.EVNTMAP")[0].find("VALUES(\"" + generated + "\""), std::string::npos);

    kuiResetState();
    kuiFake().longNames["Imported situation with a long name"] = "OTHER";
    EXPECT_EQ(import(e).message, "009E@S@2@Imported situation with a long name@HP");
}

TEST_F(KuiImport, AnOldServerDropsTheLongNameWithAWarning) {
    kuiFake().version = "06.10";
    KuiExport e = KuiExport::situation("IMPSIT");
    e.set("FULLNAME", "Imported situation with a long name");
    EXPECT_EQ(import(e).message, "005I@S@2@IMPSIT@HP");
    EXPECT_EQ(kuiFake().displayed, (std::vector<std::string>{"098W"}));
    EXPECT_TRUE(kuiFake().sent("<![CDATA[INSERT INTO O4SRV.TNAME").empty());
}

TEST_F(KuiImport, ALatinNameOfMoreThan31BytesIsCurtailed) {
    std::string name = "Capacity_of_the_data_disks_low\xC3\xA9";  // 31 characters, 32 bytes
    KuiExport e = KuiExport::situation(name);
    e.slots.push_back(kuiSlot(name.substr(0, 30), "m"));  // the slot names the curtailed name
    KuiRunResult r = import(e);
    EXPECT_EQ(r.message, "005I@S@2@" + name.substr(0, 30) + "@HP") << "cut before the two-byte character, not inside it";
    EXPECT_EQ(kuiFake().displayed, (std::vector<std::string>{"025I"}));
}

TEST_F(KuiImport, ADisabledEventFacilityDropsTheDestination) {
    kuiFake().eventRc = 9;
    KuiExport e = KuiExport::situation("IMPSIT");
    e.set("SITINFO", "SEV=Minor;TDST=3");
    EXPECT_EQ(import(e).message, "034I@S@2@IMPSIT@HP");
    EXPECT_NE(definition().find("\"SEV=Minor;\""), std::string::npos) << definition();
    kuiResetState();
    kuiFake().eventRc = 4;
    EXPECT_EQ(import(e).message, "014E@C");
    kuiResetState();
    kuiFake().eventRc = 0;
    kuiFake().events = {"3"};
    e.set("SITINFO", "SEV=Minor;TDST=3;ATOM=ZAG_DISK.MOUNT;" + std::string(250, 'x') + "=1");
    EXPECT_EQ(import(e).message, "007E@S") << "a validated SITINFO longer than its buffer is refused";
}

TEST_F(KuiImport, SlotRowsAreCheckedBeforeAnythingIsWritten) {
    struct Case {
        std::function<void(std::vector<std::pair<std::string, std::optional<std::string>>>&)> change;
        bool valid;
    } cases[] = {
        {[](auto& s) { s.pop_back(); }, false},                            // nine elements
        {[](auto& s) { s.emplace_back("EXTRA", "1"); }, false},            // eleven
        {[](auto& s) { s[0].second = "OTHERSIT"; }, false},                // ID names another situation
        {[](auto& s) { s[9].second = std::nullopt; }, false},              // MAP without value
        {[](auto& s) { s[4].first = "WHATEVER"; }, false},                 // unknown element
        {[](auto& s) { s[8].second = std::nullopt; }, true},               // RESERVED may be empty
    };
    for (const Case& c : cases) {
        kuiResetState();
        kuiFake().statements.clear();
        KuiExport e = KuiExport::situation("IMPSIT");
        e.slots.push_back(kuiSlot("IMPSIT", "m"));
        c.change(e.slots[0]);
        EXPECT_EQ(import(e).message, c.valid ? "005I@S@2@IMPSIT@HP" : "007E@S");
        if (!c.valid) EXPECT_TRUE(kuiFake().statements.empty());
    }
}

TEST_F(KuiImport, SlotRowsAreWrittenInFileOrderAndStopAtTheFirstFailure) {
    KuiExport e = KuiExport::situation("IMPSIT");
    e.slots.push_back(kuiSlot("IMPSIT", "<map a=\"1\">x & y</map>"));
    auto second = kuiSlot("IMPSIT", "it's ]]> here");
    std::rotate(second.begin(), second.begin() + 9, second.end());  // MAP first: written by name, not position
    e.slots.push_back(second);
    EXPECT_EQ(import(e).rc, 0);
    std::vector<std::string> rows = kuiFake().sent("INSERT INTO O4SRV.EVNTMAP");
    ASSERT_EQ(rows.size(), 2u);
    const std::string head =
        "INSERT INTO O4SRV.EVNTMAP(ID,OBJCLASS,SEQUENCE,TYPE,LSTDATE,LSTUSRPRF,LSTRELEASE,LOCFLAG,RESERVED,MAP,"
        "QIBCLASSID) VALUES(\"IMPSIT\", \"2250\", \"1\", \"1\", \"1261206120000000\", \"&QIBUSER\", \"V630\", \"\", \"\", ";
    EXPECT_EQ(rows[0], head + "N'<![CDATA[<map a=\"1\">x & y</map>]]>', \"2250\")");
    EXPECT_EQ(rows[1], head + "N'<![CDATA[it''s ]]]]><![CDATA[> here]]>', \"2250\")");

    kuiResetState();
    kuiFake().statements.clear();
    kuiFake().scripts.push_back({"INSERT INTO O4SRV.EVNTMAP", 0, kuiInsertReply(), 1});
    kuiFake().scripts.push_back({"INSERT INTO O4SRV.EVNTMAP", 0, kuiFaultReply()});
    EXPECT_EQ(import(e).message, "097E@S");
    EXPECT_EQ(kuiFake().sent("INSERT INTO O4SRV.EVNTMAP").size(), 2u);
    EXPECT_EQ(kuiFake().sent("<![CDATA[INSERT INTO O4SRV.TSITDESC").size(), 1u) << "rows written before stay";
}

TEST_F(KuiImport, TheShippedSampleExportsImport) {
    const char* src = getenv("CSIT_SOURCE_DIR");
    ASSERT_NE(src, nullptr);
    struct Sample {
        const char* file;
        const char* message;
        size_t slots;
    } samples[] = {
        {"cpu_busy.xml", "005I@S@2@Zag_CPU_Busy_Critical@HP", 0},
        {"disk_space_long_name.xml", "005I@S@2@Disk space low on any mounted file system of the database hosts@HP", 0},
        {"process_missing_slots.xml", "005I@S@2@Zag_Process_Missing@HP", 2},
    };
    for (const Sample& s : samples) {
        kuiResetState();
        kuiFake().events = {"0", "1"};
        kuiFake().statements.clear();
        KuiRunResult r = kuiRun({"-i", std::string(src) + "/data/export/" + s.file});
        EXPECT_EQ(r.message, s.message) << s.file;
        EXPECT_EQ(kuiFake().sent("INSERT INTO O4SRV.EVNTMAP").size(), s.slots) << s.file;
    }
}

}  // namespace
