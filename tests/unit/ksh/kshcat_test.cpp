// Attribute catalog: look-ups, ownership, copies, enumerations, the
// process-wide access point, and the shipped attribute files checked
// against the hub store's schema.
#include "kshcat.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <map>
#include <regex>
#include <set>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "kshatrp.h"
#include "kshcol.h"
#include "kshlst.h"
#include "kshtab.h"

namespace {

std::string columnNames(const WSQL_Table* t) {
    std::string out;
    LinkedListIter it(t->Columns());
    while (auto* c = static_cast<WSQL_Column*>(it.Next())) out += std::string(out.empty() ? "" : ",") + c->ColName();
    return out;
}

WSQL_Table* tableWith(const char* name, const char* object, const char* file, std::vector<const char*> cols) {
    auto* t = new WSQL_Table(name, object, file);
    for (const char* c : cols) EXPECT_EQ(t->AppendColumn(new WSQL_Column(c, c, false)), 0);
    return t;
}

TEST(Catalog, LookUpsFollowTheirCaseRulesAndTreeOrder) {
    WSQL_Catalog cat;
    ASSERT_EQ(cat.AddTable(tableWith("O4SRV.TSITDESC", "Situation_Definition", "o4srv.atr", {"SITNAME"})), 0);
    ASSERT_EQ(cat.AddTable(tableWith("KAB.TSITDESC", "Copy", "kab.atr", {"X"})), 0);
    ASSERT_EQ(cat.AddTable(tableWith("NODOT", "", "", {})), 0);

    EXPECT_EQ(cat.GetTable("o4srv.tsitdesc"), nullptr);
    ASSERT_NE(cat.GetTable("O4SRV.TSITDESC"), nullptr);
    EXPECT_STREQ(cat.GetTableByObject("situation_DEFINITION")->TableName(), "O4SRV.TSITDESC");
    EXPECT_STREQ(cat.GetUnqualifiedTable("TSITDESC")->TableName(), "KAB.TSITDESC");  // KAB sorts first
    EXPECT_EQ(cat.GetUnqualifiedTable("tsitdesc"), nullptr);
    WSQL_Table* nodot = cat.GetUnqualifiedTable("NODOT");
    ASSERT_NE(nodot, nullptr);
    EXPECT_STREQ(nodot->ObjectName(), "NODOT");  // empty object name: the table name
    EXPECT_STREQ(nodot->UnqualifiedTableName(), "NODOT");
    EXPECT_EQ(cat.GetTable(nullptr), nullptr);
    EXPECT_EQ(cat.GetTableByObject("nothing"), nullptr);

    // A second table of the same name is refused and stays the caller's.
    WSQL_Table* dup = tableWith("KAB.TSITDESC", "Dup", "", {});
    EXPECT_EQ(cat.AddTable(dup), 6);
    EXPECT_STREQ(cat.GetTable("KAB.TSITDESC")->ObjectName(), "Copy");
    delete dup;
    EXPECT_EQ(cat.AddTable(nullptr), 2);

    // Walking by name visits every table once, in byte order.
    std::string walk;
    for (WSQL_Table* t = cat.NextTable(nullptr); t; t = cat.NextTable(t->TableName())) walk += std::string(t->TableName()) + " ";
    EXPECT_EQ(walk, "KAB.TSITDESC NODOT O4SRV.TSITDESC ");
    EXPECT_EQ(cat.NextTable("O4SRV.TSITDESC"), nullptr);

    EXPECT_EQ(cat.RemoveTable("KAB.TSITDESC"), 0);
    EXPECT_EQ(cat.RemoveTable("KAB.TSITDESC"), 5);
    EXPECT_STREQ(cat.GetUnqualifiedTable("TSITDESC")->TableName(), "O4SRV.TSITDESC");
    EXPECT_EQ(cat.NumTables(), 2u);
}

TEST(Catalog, RemovingByAttributeFileTakesEveryMatchingTableAndOnlyThose) {
    WSQL_Catalog cat;
    ASSERT_EQ(cat.AddTable(tableWith("A.T1", "", "one.atr", {})), 0);
    ASSERT_EQ(cat.AddTable(tableWith("A.T2", "", "ONE.ATR", {})), 0);
    ASSERT_EQ(cat.AddTable(tableWith("A.T3", "", "two.atr", {})), 0);
    ASSERT_EQ(cat.AddTable(tableWith("B.T4", "", "one.atr", {})), 0);
    EXPECT_EQ(cat.RemoveAttributeFile("none.atr"), 0);
    EXPECT_EQ(cat.NumTables(), 4u);
    EXPECT_EQ(cat.RemoveAttributeFile("One.Atr"), 0);
    EXPECT_EQ(cat.NumTables(), 1u);
    EXPECT_NE(cat.GetTable("A.T3"), nullptr);
}

TEST(Table, ColumnsKeepOrderAndAreFoundIgnoringCase) {
    WSQL_Table t("KAB.T", "Obj", "f.atr");
    ASSERT_EQ(t.AppendColumn(new WSQL_Column("COLA", "Attr_A", false)), 0);
    ASSERT_EQ(t.AppendColumn(new WSQL_Column("COLB", nullptr, false)), 0);
    ASSERT_EQ(t.InsertColumn(new WSQL_Column("WRITETIME", "Write_Time", false)), 0);
    EXPECT_EQ(columnNames(&t), "WRITETIME,COLA,COLB");
    EXPECT_STREQ(t.GetColumn("cola")->AttrName(), "Attr_A");
    EXPECT_STREQ(t.GetAttr("attr_a")->ColName(), "COLA");
    EXPECT_EQ(t.GetAttr("COLA"), nullptr);  // column names are not attribute names
    WSQL_Column* b = t.GetColumn("COLB");
    EXPECT_FALSE(b->HasAttrName());
    EXPECT_STREQ(b->AttrName(), "");
    EXPECT_EQ(t.GetAttr(""), nullptr);  // a column without attribute name is never found by one
    EXPECT_EQ(b->GetType(), WSQL_TYPE_UNSET);
    EXPECT_EQ(t.GetColumn("nope"), nullptr);
}

TEST(Table, CopiesAreDeepAndIndependent) {
    WSQL_Table t("KAB.T", "Obj", "f.atr");
    t.setDynamic(true);
    auto* c = new WSQL_Column("S", "State", false);
    c->SetType(452);
    c->SetScale(2);
    auto* enums = new LinkedList(destroy_WSQL_Enum);
    auto* e = new WSQL_Enum("Running", nullptr);
    ASSERT_EQ(e->addVali("R"), 0);
    ASSERT_EQ(enums->AppendEntry(e), 0);
    c->SetEnums(enums);
    ASSERT_EQ(t.AppendColumn(c), 0);

    auto* copy = new WSQL_Table(t);
    ASSERT_EQ(copy->InsertColumn(new WSQL_Column("WRITETIME", "Write_Time", false)), 0);
    EXPECT_TRUE(copy->dynamicAdd());
    EXPECT_STREQ(copy->AttributeFilename(), "f.atr");
    EXPECT_EQ(columnNames(copy), "WRITETIME,S");
    EXPECT_EQ(columnNames(&t), "S");
    WSQL_Column* cc = copy->GetColumn("S");
    ASSERT_NE(cc, c);
    EXPECT_EQ(cc->GetType(), 452);
    EXPECT_EQ(cc->GetScale(), 2);
    ASSERT_NE(cc->Enums(), c->Enums());
    delete copy;  // the original's columns and enumerations survive
    EXPECT_STREQ(c->GetEnumeration("r"), "Running");
}

TEST(Column, EnumerationsTurnStoredCodesIntoDisplayTexts) {
    WSQL_Column plain("C", "C", false);
    EXPECT_FALSE(plain.Enumerated());
    EXPECT_STREQ(plain.GetEnumeration("7"), "7");

    WSQL_Column c("C", "C", false);
    auto* list = new LinkedList(destroy_WSQL_Enum);
    const char* pairs[][2] = {{"Normal", "0"}, {"Full", "2"}, {"Shadowed", "2"}};
    for (auto& p : pairs) {
        auto* e = new WSQL_Enum(nullptr, p[1]);
        ASSERT_EQ(e->addVale(p[0]), 0);
        ASSERT_EQ(list->AppendEntry(e), 0);
    }
    c.SetEnums(list);
    EXPECT_TRUE(c.Enumerated());
    EXPECT_STREQ(c.GetEnumeration("2"), "Full");  // the first match
    EXPECT_STREQ(c.GetEnumeration("9"), "9");
    EXPECT_EQ(c.GetEnumeration(nullptr), nullptr);
    c.SetEnums(nullptr);
    EXPECT_FALSE(c.Enumerated());
}

TEST(Enum, HalvesCompleteOnlyAcrossKinds) {
    WSQL_Enum both("Shown", "ignored");
    EXPECT_STREQ(both.Vale(), "Shown");
    EXPECT_STREQ(both.Vali(), "");
    WSQL_Enum none(nullptr, "");
    EXPECT_STREQ(none.Vale(), "");
    EXPECT_EQ(none.addVali("x"), 5);  // no vale to pair with

    WSQL_Enum e("First", nullptr);
    EXPECT_EQ(e.addVale("Second"), 5);  // same kind twice: the first is lost, no pair
    EXPECT_STREQ(e.Vale(), "Second");
    EXPECT_EQ(e.addVali(std::string(200, 'v').c_str()), 0);
    EXPECT_EQ(std::string(e.Vali()), std::string(WSQL_ENUM_MAX, 'v'));
    WSQL_Enum copy(e);
    EXPECT_STREQ(copy.Vale(), "Second");
    EXPECT_STREQ(copy.Vali(), e.Vali());
}

TEST(Catalog, LookUpsStaySoundWhileOtherThreadsAddTables) {
    WSQL_Catalog cat;
    ASSERT_EQ(cat.AddTable(tableWith("KAB.BASE", "Base", "", {"C"})), 0);
    std::atomic<bool> stop{false};
    std::atomic<long> found{0};
    std::vector<std::thread> readers;
    for (int r = 0; r < 3; r++)
        readers.emplace_back([&] {
            while (!stop) {
                WSQL_Table* b = cat.GetTable("KAB.BASE");
                if (b && b->GetColumn("C") && cat.GetTableByObject("base") && cat.GetUnqualifiedTable("BASE")) found++;
            }
        });
    std::vector<std::thread> writers;
    for (int w = 0; w < 2; w++)
        writers.emplace_back([&, w] {
            for (int i = 0; i < 300; i++) {
                std::string n = "DYN" + std::to_string(w) + "." + std::to_string(i);
                auto* t = new WSQL_Table(n.c_str(), "", "");
                if (cat.AddTable(t) != 0) delete t;
                WSQL_Table* base = cat.GetTable("KAB.BASE");
                auto* c = new WSQL_Column(n.c_str(), n.c_str(), false);
                if (base->AppendColumn(c) != 0) delete c;
            }
        });
    for (auto& t : writers) t.join();
    stop = true;
    for (auto& t : readers) t.join();
    EXPECT_GT(found.load(), 0);
    EXPECT_EQ(cat.NumTables(), 601u);
    EXPECT_EQ(cat.GetTable("KAB.BASE")->Columns()->NumEntries(), 601u);
}

// ---- the process-wide catalog ------------------------------------------

TEST(CatalogAccess, TheFirstCallersShareOneCatalogReadFromTheAttributeDirectory) {
    char tmpl[] = "/tmp/kshcatXXXXXX";
    ASSERT_NE(mkdtemp(tmpl), nullptr);
    std::string dir = tmpl;
    {
        std::ofstream f(dir + "/k.atr");
        f << "entr ATTR\nappl KAB\ntabl T\nname Things.Thing\ncolu THING\n";
    }
    setenv("CT_ATTRLIB", dir.c_str(), 1);
    std::vector<std::thread> ts;
    std::vector<WSQL_Catalog*> got(6, nullptr);
    for (size_t i = 0; i < got.size(); i++) ts.emplace_back([&, i] { got[i] = WSQL_GetCatalog(); });
    for (auto& t : ts) t.join();
    ASSERT_NE(got[0], nullptr);
    for (WSQL_Catalog* c : got) EXPECT_EQ(c, got[0]);
    ASSERT_NE(got[0]->GetTable("KAB.T"), nullptr);
    EXPECT_STREQ(got[0]->GetTableByObject("things")->TableName(), "KAB.T");

    // Built once: a file added later is not read, and the pointer stays.
    {
        std::ofstream f(dir + "/l.atr");
        f << "entr ATTR\nappl KAB\ntabl U\nname Other.Thing\ncolu THING\n";
    }
    EXPECT_EQ(WSQL_GetCatalog(), got[0]);
    EXPECT_EQ(got[0]->GetTable("KAB.U"), nullptr);
    EXPECT_EQ(WSQL_EnsureCatalog(), got[0]);
    unsetenv("CT_ATTRLIB");
    std::string cmd = "rm -rf '" + dir + "'";
    ASSERT_EQ(system(cmd.c_str()), 0);
}

// ---- the shipped attribute files ---------------------------------------

// Tables and their column names, in order, from the store's CREATE TABLE
// statements.
std::map<std::string, std::vector<std::string>> schemaTables(const std::string& path) {
    std::ifstream in(path);
    std::stringstream ss;
    ss << in.rdbuf();
    std::string text = ss.str();
    std::map<std::string, std::vector<std::string>> out;
    std::regex create(R"re(CREATE TABLE "([A-Z0-9_.]+)" \(([^;]*)\);)re");
    std::regex column(R"(^\s*([A-Z_0-9]+)\s+[A-Z])");
    for (auto m = std::sregex_iterator(text.begin(), text.end(), create); m != std::sregex_iterator(); ++m) {
        std::vector<std::string> cols;
        std::istringstream body((*m)[2].str());
        std::string line;
        while (std::getline(body, line)) {
            std::smatch c;
            if (std::regex_search(line, c, column)) cols.push_back(c[1]);
        }
        out[(*m)[1]] = cols;
    }
    return out;
}

TEST(ShippedAttributeFiles, DescribeTheStoreTablesColumnForColumn) {
    const char* src = getenv("CSIT_SOURCE_DIR");
    ASSERT_NE(src, nullptr) << "run under ctest";
    WSQL_Catalog cat;
    WSQL_AttrParser parser(&cat);
    ASSERT_EQ(parser.parseDir((std::string(src) + "/data/attrlib").c_str()), 0);

    auto schema = schemaTables(std::string(src) + "/data/store/schema.sql");
    ASSERT_GT(schema.size(), 10u);
    std::set<std::string> described;
    for (const auto& [name, cols] : schema) {
        bool history = name.size() > 5 && name.compare(name.size() - 5, 5, "_HIST") == 0;
        if (history) continue;  // read through HISTORY() on the base table
        WSQL_Table* t = cat.GetTable(name.c_str());
        ASSERT_NE(t, nullptr) << name << " has no attribute file entry";
        std::string want;
        for (const auto& c : cols) want += (want.empty() ? "" : ",") + c;
        EXPECT_EQ(columnNames(t), want) << name;
        described.insert(name);
    }
    // Views are tables to the gateway too.
    ASSERT_NE(cat.GetTable("O4SRV.ISITSTSH"), nullptr);
    EXPECT_EQ(columnNames(cat.GetTable("O4SRV.ISITSTSH")), columnNames(cat.GetTable("O4SRV.TSITSTSH")));
    EXPECT_EQ(cat.NumTables(), described.size() + 1);

    // Server tables answer with their column names as element names, so
    // that rows read back can be written again unchanged.
    for (const char* n : {"O4SRV.TSITDESC", "O4SRV.TOBJACCL", "O4SRV.TNAME", "O4SRV.EVNTMAP"}) {
        LinkedListIter it(cat.GetTable(n)->Columns());
        while (auto* c = static_cast<WSQL_Column*>(it.Next())) {
            EXPECT_STREQ(c->AttrName(), c->ColName()) << n;
            EXPECT_FALSE(c->Enumerated()) << n;
            EXPECT_FALSE(c->Hidden()) << n;
        }
    }
    EXPECT_EQ(cat.GetTable("O4SRV.TSITDESC")->GetColumn("PDT")->GetType(), 1022);
    EXPECT_EQ(cat.GetTable("O4SRV.TSITDESC")->GetColumn("REEV_TIME")->GetType(), 452);

    // The agent application: objects, scaled numbers and enumerations.
    WSQL_Table* cpu = cat.GetTableByObject("zag_cpu");
    ASSERT_NE(cpu, nullptr);
    EXPECT_STREQ(cpu->TableName(), "ZAG.CPU");
    EXPECT_EQ(cpu->GetAttr("Busy_Percent")->GetScale(), 2);
    EXPECT_EQ(cpu->GetAttr("Busy_Percent")->GetType(), 496);
    WSQL_Table* disk = cat.GetTable("ZAG.DISK");
    ASSERT_NE(disk, nullptr);
    EXPECT_STREQ(disk->GetColumn("STATUS")->GetEnumeration("2"), "Full");
    EXPECT_EQ(disk->GetAttr("Size_MB")->GetType(), 492);
    EXPECT_STREQ(cat.GetTable("ZAG.PROCESS")->GetAttr("State")->GetEnumeration("r"), "Running");
    EXPECT_STREQ(cat.GetTable("ZAG.PROCESS")->GetAttr("Origin_Node")->ColName(), "ORIGINNODE");
}

}  // namespace
