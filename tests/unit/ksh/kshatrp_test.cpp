// Attribute file parser: line syntax, items, visibility, value pairs and the
// directory scan, each read from real files in a temporary directory into a
// catalog of the test's own.
#include "kshatrp.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "kshcat.h"
#include "kshcol.h"
#include "kshlst.h"
#include "kshtab.h"

namespace {

class AttrParserTest : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/kshatrpXXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        dir_ = tmpl;
    }
    void TearDown() override {
        unsetenv("CT_ATTRLIB");
        unsetenv("ATTRLIB");
        std::string cmd = "rm -rf '" + dir_ + "'";
        ASSERT_EQ(system(cmd.c_str()), 0);
    }
    void write(const std::string& name, const std::string& text, const std::string& sub = "") {
        std::string d = sub.empty() ? dir_ : dir_ + "/" + sub;
        mkdir(d.c_str(), 0700);
        FILE* f = fopen((d + "/" + name).c_str(), "w");
        ASSERT_NE(f, nullptr);
        fputs(text.c_str(), f);
        fclose(f);
    }
    // Parses `text` as the one attribute file t.atr.
    int parseText(const std::string& text) {
        write("t.atr", text);
        WSQL_AttrParser p(&cat_);
        return p.parseFile(dir_.c_str(), "t.atr");
    }
    // Column names of `table`, in order ("" when the table is missing).
    std::string columns(const char* table) {
        WSQL_Table* t = cat_.GetTable(table);
        if (!t) return "";
        std::string out;
        LinkedListIter it(t->Columns());
        while (auto* c = static_cast<WSQL_Column*>(it.Next())) out += std::string(out.empty() ? "" : ",") + c->ColName();
        return out;
    }
    std::string dir_;
    WSQL_Catalog cat_;
};

TEST_F(AttrParserTest, KeywordsAreTheFirstFourLettersOfALineWithALowerCaseStart) {
    ASSERT_EQ(parseText("appl kab\n"
                        "tables  widgets extra\n"    // any word beginning "tabl"; cut at the blank
                        "entry ATTR\n"
                        "Name Skip.Capitalised\n"    // capital first letter: prose, ignored
                        "nAME Obj.First\n"           // letters 2-4 are lower-cased
                        "   colu INDENTED\n"         // indented: no keyword
                        "colu\n"                     // keyword only, no value
                        "col X\n"                    // shorter keyword
                        "# colu COMMENT\n"
                        "column  c_one \r\n"         // CRLF and blanks around the value
                        "type\t4 2\n"                // after a tab the value starts at the first blank
                        "entr ATTR\n"
                        "name Obj.Second\n"
                        "colu C2\n"),
              0);
    WSQL_Table* t = cat_.GetTable("KAB.WIDGETS");
    ASSERT_NE(t, nullptr);
    EXPECT_STREQ(t->ObjectName(), "Obj");
    EXPECT_EQ(columns("KAB.WIDGETS"), "C_ONE,C2");
    WSQL_Column* first = t->GetColumn("C_ONE");
    ASSERT_NE(first, nullptr);
    EXPECT_STREQ(first->AttrName(), "First");
    EXPECT_EQ(first->GetType(), 452);  // value "2" of "type\t4 2"
    EXPECT_EQ(t->GetColumn("C2")->GetType(), 0);  // no type line
}

TEST_F(AttrParserTest, ValuesAreNormalisedCutAndMapped) {
    ASSERT_EQ(parseText("appl applicationcode\n"
                        "tabl averyveryverylongtable\n"
                        "entr ATTR\n"
                        "name Group One.1st Attr-Name%\n"
                        "colu averyveryverylongcolumn\n"
                        "type 10\n"
                        "scal 3\n"
                        "entr ATTR\n"
                        "name Second\n"            // no dot: object stays
                        "colu B\n"
                        "type 11\n"
                        "type 99\n"                 // unknown: type stays 492
                        "entr ATTR\n"
                        "name Third\n"
                        "colu C\n"
                        "type 1\n"
                        "scal 99999999999999999999\n"),  // clamped, not undefined
              0);
    WSQL_Table* t = cat_.GetTable("APPLICATI.AVERYVERYVE");
    ASSERT_NE(t, nullptr);
    EXPECT_STREQ(t->ObjectName(), "Group One");
    EXPECT_STREQ(t->UnqualifiedTableName(), "AVERYVERYVE");
    WSQL_Column* a = t->GetColumn("AVERYVERYVE");
    ASSERT_NE(a, nullptr);
    EXPECT_STREQ(a->AttrName(), "stAttrName");
    EXPECT_EQ(a->GetType(), 1022);
    EXPECT_EQ(a->GetScale(), 3);
    EXPECT_EQ(t->GetAttr("second")->GetType(), 492);
    EXPECT_EQ(t->GetAttr("Third")->GetType(), 496);
    EXPECT_EQ(t->GetAttr("Third")->GetScale(), 2147483647);
}

TEST_F(AttrParserTest, VisibilityRulesDecideWhichItemsBecomeColumns) {
    // An item is stored at the next entry line, so the application and
    // table lines of a new group follow that entry line.
    ASSERT_EQ(parseText("appl O4SRV\ntabl T\n"
                        "entr HIDDEN\nname O.KeptHidden\ncolu K1\n"        // level 1, server app: kept
                        "entr ATTR\nname O.Two.Dots\ncolu K2\n"            // level 1: kept for O4SRV
                        "entr HIDDEN\nname O.A.B\ncolu D1\n"               // level 2: dropped
                        "entr SECRET\nname O.Other\ncolu D2\n"             // other word: level 2
                        "entr ATTR\nopgroup 0\nname O.OpZero\ncolu K3\n"  // op group 0 ok for O4SRV
                        "entr HIDDEN\nappl KAB\nname O.Hidden\ncolu D3\n"  // level 1, other app
                        "entr ATTR\nname O.Two.Dots\ncolu D4\n"
                        "entr ATTR\nopgr 0\nname O.OpZero\ncolu D5\n"
                        "entr ATTR\nopgr 3\nname O.OpThree\ncolu K4\n"
                        "entr HIDDEN\nname O.Node\ncolu ORIGINNODE\n"      // kept, as a hidden column
                        "entr HIDDEN\nappl kmq\nname O.Hidden\ncolu K5\n"
                        "entr ATTR\nappl KOS\nopgr 0\nname O.OpZero\ncolu K6\n"
                        "entr HIDDEN\nname O.Hidden\ncolu D6\n"),          // KOS is not a server app
              0);
    EXPECT_EQ(columns("O4SRV.T"), "K1,K2,K3");
    EXPECT_EQ(columns("KAB.T"), "K4,ORIGINNODE");
    EXPECT_EQ(columns("KMQ.T"), "K5");
    EXPECT_EQ(columns("KOS.T"), "K6");
    EXPECT_FALSE(cat_.GetTable("O4SRV.T")->GetColumn("K1")->Hidden());
    EXPECT_FALSE(cat_.GetTable("KAB.T")->GetColumn("K4")->Hidden());
    WSQL_Column* node = cat_.GetTable("KAB.T")->GetColumn("ORIGINNODE");
    EXPECT_TRUE(node->Hidden());
    EXPECT_STREQ(node->AttrName(), "Node");
}

TEST_F(AttrParserTest, AnItemWithoutColumnCarriesOverAndOneWithoutTableIsDropped) {
    ASSERT_EQ(parseText("appl KAB\n"
                        "entr ATTR\nname O.NoTable\ncolu X\n"      // no table: dropped
                        "entr HIDDEN\ntabl T\nname O.Carried\n"     // no column: not stored
                        "entr ATTR\ncolu C\n"                      // attribute and level 1 carry in
                        "entr ATTR\nname O.Last\ncolu L\n"),
              0);
    EXPECT_EQ(cat_.GetTable("KAB."), nullptr);
    EXPECT_EQ(columns("KAB.T"), "L");  // C inherited level 1 from the item before and was dropped
    EXPECT_EQ(cat_.NumTables(), 1u);

    // The same carry-over with a level that still lets it through.
    WSQL_Catalog other;
    write("u.atr", "appl KAB\ntabl U\nentr ATTR\nname O.Carried\nentr ATTR\ncolu C\n");
    WSQL_AttrParser p(&other);
    ASSERT_EQ(p.parseFile(dir_.c_str(), "u.atr"), 0);
    ASSERT_NE(other.GetTable("KAB.U"), nullptr);
    EXPECT_STREQ(other.GetTable("KAB.U")->GetColumn("C")->AttrName(), "Carried");
}

TEST_F(AttrParserTest, ValuePairsNeedBothHalvesInEitherOrder) {
    std::string longText(120, 'x');
    ASSERT_EQ(parseText("appl KAB\ntabl T\n"
                        "entr ATTR\nname O.Status\ncolu S\n"
                        "vale  Running \nvali R\n"
                        "vali S\nvale Sleeping\n"
                        "vale Lost\nvale Also lost\nvali Z\n"  // two vales: no pair; Z pending
                        "entr ATTR\nname O.Long\ncolu L\n"
                        "vale " + longText + "\nvali " + longText + "\n"
                        "entr ATTR\nname O.Plain\ncolu P\n"
                        "vali orphan\n"),                      // half a pair, dropped with the item
              0);
    WSQL_Table* t = cat_.GetTable("KAB.T");
    ASSERT_NE(t, nullptr);
    WSQL_Column* s = t->GetColumn("S");
    ASSERT_TRUE(s->Enumerated());
    EXPECT_EQ(s->Enums()->NumEntries(), 2u);
    EXPECT_STREQ(s->GetEnumeration("r"), "Running");
    EXPECT_STREQ(s->GetEnumeration("S"), "Sleeping");
    EXPECT_STREQ(s->GetEnumeration("Z"), "Z");  // pending half never completed
    WSQL_Column* l = t->GetColumn("L");
    ASSERT_TRUE(l->Enumerated());
    std::string cut(WSQL_ENUM_MAX, 'x');
    EXPECT_EQ(std::string(l->GetEnumeration(cut.c_str())), cut);
    EXPECT_FALSE(t->GetColumn("P")->Enumerated());
}

TEST_F(AttrParserTest, LongLinesArriveInPiecesWithoutHarm) {
    // The 1023-character piece ends inside the value; the rest of the line
    // arrives as a line of its own, which here begins like a column line.
    std::string line = "name O." + std::string(1023 - 7, 'a') + "colu PIECE\n";
    ASSERT_EQ(parseText("appl KAB\ntabl T\nentr ATTR\n" + line + "entr ATTR\nname O.Next\ncolu N\n"), 0);
    WSQL_Table* t = cat_.GetTable("KAB.T");
    ASSERT_NE(t, nullptr);
    EXPECT_EQ(columns("KAB.T"), "PIECE,N");
    EXPECT_EQ(std::string(t->GetColumn("PIECE")->AttrName()), std::string(WSQL_ATR_NAME_MAX, 'a'));
}

TEST_F(AttrParserTest, DirectoryScanReadsOnlyAttributeFilesInNameOrder) {
    write("b.atr", "appl KAB\ntabl T\nentr ATTR\nname O.B\ncolu B\n");
    write("a.ATR", "appl KAB\ntabl T\nentr ATTR\nname O.A\ncolu A\n");
    write("c.txt", "appl KAB\ntabl T\nentr ATTR\nname O.C\ncolu C\n");
    write("d.atr", "appl KCD\ntabl OTHER\nentr ATTR\nname Q.D\ncolu D\n");
    WSQL_AttrParser p(&cat_);
    EXPECT_EQ(p.parseDir(dir_.c_str()), 0);
    EXPECT_EQ(columns("KAB.T"), "A,B");
    EXPECT_STREQ(cat_.GetTable("KAB.T")->AttributeFilename(), "a.ATR");  // the file that created it
    EXPECT_STREQ(cat_.GetTable("KCD.OTHER")->AttributeFilename(), "d.atr");

    // Tables can be taken out again by the file they came from.
    EXPECT_EQ(cat_.RemoveAttributeFile("D.ATR"), 0);
    EXPECT_EQ(cat_.GetTable("KCD.OTHER"), nullptr);
    EXPECT_NE(cat_.GetTable("KAB.T"), nullptr);

    WSQL_Catalog empty;
    WSQL_AttrParser q(&empty);
    EXPECT_NE(q.parseDir((dir_ + "/missing").c_str()), 0);
    EXPECT_EQ(empty.NumTables(), 0u);
    EXPECT_EQ(q.parseFile(dir_.c_str(), "nofile.atr"), 8);
}

TEST_F(AttrParserTest, TheDefaultDirectoryComesFromTheEnvironment) {
    WSQL_AttrParser p(&cat_);
    EXPECT_STREQ(p.getDefaultEnv(), "ATTRLIB");
    EXPECT_STREQ(p.getDefaultDir(), ".");
    write("x.atr", "appl KAB\ntabl X\nentr ATTR\nname O.X\ncolu X\n", "one");
    write("y.atr", "appl KAB\ntabl Y\nentr ATTR\nname O.Y\ncolu Y\n", "two");
    setenv("ATTRLIB", (dir_ + "/one").c_str(), 1);
    EXPECT_STREQ(p.getDefaultEnv(), "ATTRLIB");
    EXPECT_EQ(p.getDefaultDir(), dir_ + "/one");
    setenv("CT_ATTRLIB", (dir_ + "/two:" + dir_ + "/one").c_str(), 1);  // wins, and lists both
    EXPECT_STREQ(p.getDefaultEnv(), "CT_ATTRLIB");
    EXPECT_EQ(p.parseDir(nullptr), 0);
    EXPECT_NE(cat_.GetTable("KAB.X"), nullptr);
    EXPECT_NE(cat_.GetTable("KAB.Y"), nullptr);

    char buf[16];
    EXPECT_EQ(p.getFullName(buf, sizeof buf, "/a/very/long/directory", "f.atr"), nullptr);
    EXPECT_STREQ(p.getFullName(buf, sizeof buf, "/d", "f.atr"), "/d/f.atr");
}

}  // namespace
