// The dialect translator over a small dictionary of its own.
#include <gtest/gtest.h>

#include <map>

#include "sql1/sql1.h"
#include "sql1/sql1dial.h"

namespace {

class Dict : public SQL1_DialDictionary {
public:
    Dict() {
        add({"O4SRV.TSITDESC", "", false, "", {{"SITNAME", 452, 32}, {"TEXT", 1018, 64}, {"PDT", 1018, 200}}, ""});
        add({"O4SRV.TOBJACCL", "", false, "", {{"OBJNAME", 452, 32}, {"NODEL", 452, 32}}, ""});
        add({"O4SRV.INODESTS", "", false, "", {{"NODE", 452, 32}, {"THRUNODE", 452, 32}, {"PRODUCT", 452, 2}}, ""});
        add({"ZAG.CPU", "ORIGINNODE", true, "ZAG.CPU_HIST",
             {{"ORIGINNODE", 452, 32}, {"CPUID", 500, 2}, {"BUSYPCT", 496, 4}}, ""});
        add({"ZAG.CPU_HIST", "", false, "",
             {{"WRITETIME", 452, 16}, {"ORIGINNODE", 452, 32}, {"CPUID", 500, 2}, {"BUSYPCT", 496, 4}}, ""});
        add({"SYSTEM.SYSAPPLS", "NODE", false, "", {{"NODE", 452, 32}, {"APPL_NAME", 452, 8}}, ""});
        add({"O4SRV.CLACTLCL", "", false, "", {{"ACTSECURE", 452, 10}, {"CLCMD", 448, 200}}, "CLCMD"});
    }
    const SQL1_DialTable* find(std::string_view name) const override {
        std::string u(name);
        for (char& c : u) c = static_cast<char>(toupper(static_cast<unsigned char>(c)));
        auto it = tables_.find(u);
        return it == tables_.end() ? nullptr : &it->second;
    }

private:
    void add(SQL1_DialTable t) { tables_[t.name] = std::move(t); }
    std::map<std::string, SQL1_DialTable> tables_;
};

struct Result {
    int rc;
    SQL1_Translation tr;
};

Result translate(const char* text) {
    static Dict dict;
    Result r{};
    r.rc = SQL1_Translate(text, dict, "HUB_X", &r.tr);
    return r;
}

std::string sqlOf(const char* text) {
    Result r = translate(text);
    EXPECT_EQ(r.rc, SQL1_OK) << text << ": " << r.tr.error;
    return r.tr.sql;
}

TEST(Sql1Dialect, LiteralsOfEveryQuotingBecomeSqliteStringsAndKeepTheirContent) {
    EXPECT_EQ(sqlOf("SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = \"ab\"\"c\""),
              "SELECT SITNAME FROM \"O4SRV.TSITDESC\" WHERE SITNAME = 'ab\"c'");
    // National literals of both quotes; a single quote inside is doubled.
    EXPECT_EQ(sqlOf("SELECT TEXT FROM O4SRV.TSITDESC WHERE TEXT = N\"it's\" OR TEXT = N'o''k' OR TEXT = 'x\"y'"),
              "SELECT TEXT FROM \"O4SRV.TSITDESC\" WHERE TEXT = 'it''s' OR TEXT = 'o''k' OR TEXT = 'x\"y'");
    // Dialect words and table names inside literals stay text.
    const char* tricky =
        "SELECT SITNAME FROM O4SRV.TSITDESC WHERE PDT = \"x AT (\"\"n\"\") HISTORY() SYSTEM.PARMA(a, b, 1) "
        "O4SRV.TOBJACCL CSIT_USERS\"";
    EXPECT_EQ(sqlOf(tricky),
              "SELECT SITNAME FROM \"O4SRV.TSITDESC\" WHERE PDT = 'x AT (\"n\") HISTORY() SYSTEM.PARMA(a, b, 1) "
              "O4SRV.TOBJACCL CSIT_USERS'");
    // An identifier ending in N before a literal is not a national prefix.
    EXPECT_EQ(sqlOf("SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME IN(\"a\")"),
              "SELECT SITNAME FROM \"O4SRV.TSITDESC\" WHERE SITNAME IN('a')");
    EXPECT_EQ(translate("SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = \"open").rc, SQL1_ST_SYNTAX);
    EXPECT_EQ(translate("SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = N'open''").rc, SQL1_ST_SYNTAX);
}

TEST(Sql1Dialect, AtAndHistoryRouteTheStatementsOwnTable) {
    Result r = translate("SELECT ORIGINNODE FROM ZAG.CPU AT (\"*HUB\",\"n'2\") HISTORY() WHERE  CPUID = 1");
    ASSERT_EQ(r.rc, SQL1_OK) << r.tr.error;
    EXPECT_EQ(r.tr.sql,
              "SELECT ORIGINNODE FROM \"ZAG.CPU_HIST\" WHERE (\"ORIGINNODE\" IN ('HUB_X','n''2') OR \"ORIGINNODE\" "
              "IN (SELECT NODE FROM \"O4SRV.INODESTS\" WHERE THRUNODE IN ('HUB_X','n''2'))) AND (  CPUID = 1)");
    ASSERT_NE(r.tr.table, nullptr);
    EXPECT_EQ(r.tr.table->name, "ZAG.CPU_HIST");

    // Without a WHERE the predicate goes before ORDER BY (or at the end).
    EXPECT_EQ(sqlOf("SELECT NODE FROM SYSTEM.SYSAPPLS AT (\"N1\") ORDER BY NODE"),
              "SELECT NODE FROM \"SYSTEM.SYSAPPLS\" WHERE \"NODE\" IN ('N1') ORDER BY NODE");
    EXPECT_EQ(sqlOf("DELETE FROM SYSTEM.SYSAPPLS AT (\"N1\")"),
              "DELETE FROM \"SYSTEM.SYSAPPLS\" WHERE \"NODE\" IN ('N1')");
    // A table without a node column is not limited; an insert ignores AT.
    EXPECT_EQ(sqlOf("SELECT SITNAME FROM O4SRV.TSITDESC AT (\"N1\")"), "SELECT SITNAME FROM \"O4SRV.TSITDESC\"");
    EXPECT_EQ(sqlOf("INSERT INTO ZAG.CPU AT (\"*HUB\") ( ORIGINNODE,CPUID) VALUES( \"a\",  5  )"),
              "INSERT INTO \"ZAG.CPU\" ( ORIGINNODE,CPUID) VALUES( 'a',  5  )");

    EXPECT_EQ(translate("SELECT SITNAME FROM O4SRV.TSITDESC HISTORY()").rc, SQL1_ST_SYNTAX);  // no history table
    EXPECT_EQ(translate("SELECT NODE FROM SYSTEM.SYSAPPLS AT (N1)").rc, SQL1_ST_SYNTAX);
    EXPECT_EQ(translate("SELECT NODE FROM SYSTEM.SYSAPPLS AT (\"a\" \"b\")").rc, SQL1_ST_SYNTAX);
    EXPECT_EQ(translate("SELECT NODE FROM SYSTEM.SYSAPPLS AT (\"a\"").rc, SQL1_ST_SYNTAX);
}

TEST(Sql1Dialect, ParmaTermsAreCollectedAndLeaveAValidWhereClause) {
    Result r = translate("SELECT ORIGINNODE,SITNAME FROM O4SRV.TSITDESC WHERE  SYSTEM.PARMA(\"NODELIST\", \"*ALL\", 4)");
    ASSERT_EQ(r.rc, SQL1_OK) << r.tr.error;
    EXPECT_EQ(r.tr.sql, "SELECT ORIGINNODE,SITNAME FROM \"O4SRV.TSITDESC\"");
    ASSERT_EQ(r.tr.parmas.size(), 1u);
    EXPECT_EQ(r.tr.parmas[0].first, "NODELIST");
    EXPECT_EQ(r.tr.parmas[0].second, "*ALL");

    r = translate("SELECT NODEL FROM O4SRV.TOBJACCL WHERE OBJNAME =\"S1\" AND SYSTEM.PARMA('QIBNODE', 'QPANOSCOPE', 32)");
    ASSERT_EQ(r.rc, SQL1_OK) << r.tr.error;
    EXPECT_EQ(r.tr.sql, "SELECT NODEL FROM \"O4SRV.TOBJACCL\" WHERE OBJNAME ='S1'");
    EXPECT_EQ(r.tr.parmas.at(0).second, "QPANOSCOPE");

    EXPECT_EQ(sqlOf("SELECT NODEL FROM O4SRV.TOBJACCL WHERE SYSTEM.PARMA(\"A\", \"1\", 1) AND SYSTEM.PARMA(\"B\", "
                    "\"2\", 1) AND NODEL = \"n\""),
              "SELECT NODEL FROM \"O4SRV.TOBJACCL\" WHERE NODEL = 'n'");
    // Next to OR the term cannot simply go: it becomes true.
    EXPECT_EQ(sqlOf("SELECT NODEL FROM O4SRV.TOBJACCL WHERE NODEL = \"n\" OR SYSTEM.PARMA(\"A\", \"1\", 1)"),
              "SELECT NODEL FROM \"O4SRV.TOBJACCL\" WHERE NODEL = 'n' OR 1");
    EXPECT_EQ(translate("SELECT NODEL FROM O4SRV.TOBJACCL WHERE SYSTEM.PARMA(\"A\", \"1\")").rc, SQL1_ST_SYNTAX);
}

TEST(Sql1Dialect, MarkersTakeTheTypeOfTheirColumn) {
    Result r = translate("SELECT NODE FROM O4SRV.INODESTS WHERE PRODUCT = ? OR  PRODUCT = ?;");
    ASSERT_EQ(r.rc, SQL1_OK) << r.tr.error;
    ASSERT_EQ(r.tr.markers.size(), 2u);
    EXPECT_EQ(r.tr.markers[1].column, "PRODUCT");
    EXPECT_EQ(r.tr.markers[1].type, 452);
    EXPECT_EQ(r.tr.markers[1].maxLength, 2);

    r = translate("INSERT INTO ZAG.CPU AT (\"*HUB\") ( BUSYPCT,ORIGINNODE,CPUID) VALUES( ?, ?, ? )");
    ASSERT_EQ(r.rc, SQL1_OK) << r.tr.error;
    ASSERT_EQ(r.tr.markers.size(), 3u);
    EXPECT_EQ(r.tr.markers[0].type, 496);
    EXPECT_EQ(r.tr.markers[1].type, 452);
    EXPECT_EQ(r.tr.markers[2].type, 500);

    // Without a column list the table's column order applies; reversed
    // comparisons and UPDATE assignments are understood too.
    r = translate("INSERT INTO ZAG.CPU VALUES (?, ?, ?)");
    ASSERT_EQ(r.tr.markers.size(), 3u);
    EXPECT_EQ(r.tr.markers[2].column, "BUSYPCT");
    r = translate("UPDATE ZAG.CPU SET BUSYPCT = ? WHERE ? = CPUID AND ORIGINNODE LIKE ?");
    ASSERT_EQ(r.tr.markers.size(), 3u);
    EXPECT_EQ(r.tr.markers[0].type, 496);
    EXPECT_EQ(r.tr.markers[1].type, 500);
    EXPECT_EQ(r.tr.markers[2].type, 452);
    // A marker whose column is unknown is text.
    r = translate("SELECT SITNAME FROM O4SRV.TSITDESC WHERE NOSUCH = ?");
    EXPECT_EQ(r.tr.markers.at(0).type, 448);

    EXPECT_EQ(translate("SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = :name").rc, SQL1_ST_SYNTAX);
    EXPECT_EQ(translate("SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = ?1").rc, SQL1_ST_SYNTAX);
}

TEST(Sql1Dialect, OnlyDataStatementsOnReachableTablesAreAccepted) {
    EXPECT_EQ(translate("DROP TABLE \"O4SRV.TSITDESC\"").rc, SQL1_ST_DENIED);
    EXPECT_EQ(translate("PRAGMA table_info(x)").rc, SQL1_ST_DENIED);
    EXPECT_EQ(translate("SELECT * FROM CSIT_USERS").rc, SQL1_ST_DENIED);
    EXPECT_EQ(translate("SELECT * FROM [csit_users]").rc, SQL1_ST_DENIED);
    EXPECT_EQ(translate("SELECT name FROM sqlite_master").rc, SQL1_ST_DENIED);
    EXPECT_EQ(translate("SELECT 1; DELETE FROM O4SRV.TSITDESC").rc, SQL1_ST_SYNTAX);
    EXPECT_EQ(translate("   -- a comment\n select 1 /* x */").rc, SQL1_OK);
}

TEST(Sql1Dialect, LiteralsLongerThanTheirCharacterColumnAreRefused) {
    std::string name(33, 'x');
    std::string ins = "INSERT INTO O4SRV.TOBJACCL(OBJNAME ,NODEL) VALUES (\"" + name + "\" ,\"n\")";
    Result r = translate(ins.c_str());
    EXPECT_EQ(r.rc, SQL1_ST_TOOLONG);
    EXPECT_NE(r.tr.error.find("OBJNAME"), std::string::npos);
    // Exactly the declared length passes; a doubled quote counts once.
    std::string fits = "INSERT INTO O4SRV.TOBJACCL(OBJNAME ,NODEL) VALUES (\"" + std::string(30, 'y') + "\"\"z\" ,\"n\")";
    EXPECT_EQ(translate(fits.c_str()).rc, SQL1_OK);
    std::string upd = "UPDATE O4SRV.TSITDESC SET TEXT = N\"" + std::string(65, 't') + "\" WHERE SITNAME = \"s\"";
    EXPECT_EQ(translate(upd.c_str()).rc, SQL1_ST_TOOLONG);
    // Expressions and numeric columns are not measured.
    EXPECT_EQ(translate("UPDATE ZAG.CPU SET BUSYPCT = 123456789012 WHERE CPUID = 1").rc, SQL1_OK);
}

TEST(Sql1Dialect, ASelectNamingACommandOnAnActionTableAlsoRecordsIt) {
    Result r = translate("SELECT ACTSECURE,CLCMD FROM O4SRV.CLACTLCL WHERE  ACTSECURE = \"op\" AND CLCMD = ?");
    ASSERT_EQ(r.rc, SQL1_OK) << r.tr.error;
    EXPECT_EQ(r.tr.record, "INSERT INTO \"O4SRV.CLACTLCL\" (ACTSECURE, CLCMD) VALUES ('op', ?)");
    // Other shapes only read; so does every other table.
    EXPECT_EQ(translate("SELECT CLCMD FROM O4SRV.CLACTLCL WHERE ACTSECURE = \"op\" OR CLCMD = \"x\"").tr.record, "");
    EXPECT_EQ(translate("SELECT CLCMD FROM O4SRV.CLACTLCL WHERE ACTSECURE LIKE \"op\"").tr.record, "");
    EXPECT_EQ(translate("SELECT CLCMD FROM O4SRV.CLACTLCL").tr.record, "");
    EXPECT_EQ(translate("SELECT CLCMD FROM O4SRV.CLACTLCL WHERE ACTSECURE = \"op\"").tr.record, "");  // no command
    EXPECT_EQ(translate("SELECT ? FROM O4SRV.CLACTLCL WHERE CLCMD = ?").tr.record, "");
    EXPECT_EQ(translate("SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = \"x\"").tr.record, "");
}

TEST(Sql1Dialect, DeclaredTypesGiveCodesAndLengths) {
    const struct {
        const char* decl;
        int16_t type;
        uint16_t len;
    } cases[] = {
        {"VARCHAR(32)", 448, 32},  {"char(16)", 452, 16},    {"NVARCHAR(4000)", 1018, 4000}, {"NCHAR(8)", 1022, 8},
        {"INTEGER", 496, 4},       {"SMALLINT", 500, 2},     {"BIGINT", 492, 8},             {"USMALLINT", 2, 2},
        {"UINTEGER", 1006, 4},     {"UBIGINT", 1032, 8},     {"DOUBLE", 480, 8},             {"DECIMAL(10,2)", 484, 12},
        {"BLOB(20)", 1008, 20},    {"CHAR", 452, 1},         {"", 448, 77},                  {"TEXT", 448, 77},
        {"INTERVAL", 448, 77},
    };
    for (const auto& c : cases) {
        int16_t type = 0;
        uint16_t len = 0;
        SQL1_TypeFromDecl(c.decl, 77, &type, &len);
        EXPECT_EQ(type, c.type) << c.decl;
        EXPECT_EQ(len, c.len) << c.decl;
    }
}

}  // namespace
