// The SQL client layer against real hub stores (SQLite files in a temp dir,
// created from data/store/schema.sql and seed.sql).
#include "sql1/sql1.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <condition_variable>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace {

using Rows = std::vector<std::vector<std::string>>;

std::string dataDir() {
    const char* src = std::getenv("CSIT_SOURCE_DIR");
    return std::string(src != nullptr ? src : ".") + "/data/store";
}

SQL1_LoginId loginOf(const char* user, const char* password) {
    SQL1_LoginId id{};
    std::strncpy(id.userId, user, sizeof id.userId);
    std::strncpy(id.password, password, sizeof id.password);
    std::snprintf(id.clientHost, sizeof id.clientHost, "%s", "testhost");
    return id;
}

std::string valueText(const SQL1_SqlVar& v) {
    if (v.nullInd < 0) return "<null>";
    auto num = [&](auto x) {
        std::memcpy(&x, v.data, sizeof x);
        return std::to_string(x);
    };
    switch (v.type) {
    case SQL1_T_SMALLINT: return num(int16_t{});
    case SQL1_T_USMALLINT: return num(uint16_t{});
    case SQL1_T_INTEGER: return num(int32_t{});
    case SQL1_T_UINTEGER: return num(uint32_t{});
    case SQL1_T_BIGINT: return num(int64_t{});
    case SQL1_T_UBIGINT: return num(uint64_t{});
    case SQL1_T_DOUBLE: return num(double{});
    default: {
        std::string s(v.data, v.length);
        while (!s.empty() && s.back() == ' ') s.pop_back();
        return s;
    }
    }
}

struct Req {
    SQL1_Handle stmt{}, req{}, row{};
    SQL1_Sqlda* in = nullptr;
    SQL1_Sqlda* out = nullptr;
};

const SQL1_Ops* ops(SQL1_Handle h) { return h.object->ops; }

int create(SQL1_Handle path, const char* sql, Req* r, const SQL1_Exit* exit = nullptr) {
    int rc = ops(path)->prepare(path, sql, &r->stmt);
    if (rc == SQL1_OK) rc = ops(path)->createRequest(r->stmt, 0, exit, &r->req, &r->row);
    if (rc == SQL1_OK) rc = ops(path)->getInputDescriptor(r->req, &r->in);
    if (rc == SQL1_OK) rc = ops(path)->getOutputDescriptor(r->row, &r->out);
    return rc;
}

// Fetches every row of an open request as text.
int fetchAll(const Req& r, Rows* rows) {
    int rc;
    while ((rc = ops(r.row)->fetch(r.row, r.out)) == SQL1_OK) {
        std::vector<std::string> row;
        for (int i = 0; i < r.out->used; i++) row.push_back(valueText(r.out->var[i]));
        rows->push_back(row);
    }
    return rc == SQL1_ST_EOD ? SQL1_OK : rc;
}

void drop(const Req& r) {
    if (r.req.object != nullptr) (void)ops(r.req)->release(r.req);
    if (r.stmt.object != nullptr) (void)ops(r.stmt)->release(r.stmt);
}

// Runs `sql` (no markers) on `path`; 0 or the first failure.
int run(SQL1_Handle path, const char* sql, Rows* rows = nullptr) {
    Req r;
    Rows ignored;
    int rc = create(path, sql, &r);
    if (rc == SQL1_OK) rc = ops(r.req)->open(r.req, r.in);
    if (rc == SQL1_OK) rc = fetchAll(r, rows != nullptr ? rows : &ignored);
    drop(r);
    return rc;
}

class Sql1Store : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/sql1-test-XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        dir_ = tmpl;
        db_ = dir_ + "/hub.db";
        ASSERT_EQ(SQL1_RegisterServer("HUBLMS", db_.c_str(), options()), SQL1_OK) << SQL1_LastError();
        SQL1_SetHome(dir_.c_str());
    }
    void TearDown() override {
        SQL1_Shutdown();
        std::filesystem::remove_all(dir_);
    }
    const SQL1_StoreOptions* options() {
        opts_.dataDir = data_.c_str();
        opts_.adminPassword = "Adm1n-pw";
        opts_.minimalHash = 1;
        opts_.local = 1;
        return &opts_;
    }
    SQL1_Handle path(const char* server = "HUBLMS") {
        SQL1_LoginId id;
        sql1cpli(&id);
        SQL1_Handle p{};
        EXPECT_EQ(sql1cpth(server, &id, &p), SQL1_OK) << SQL1_LastError();
        return p;
    }
    long count(SQL1_Handle p, const std::string& table, const std::string& where = "") {
        Rows rows;
        std::string sql = "SELECT COUNT(*) FROM " + table + (where.empty() ? "" : " WHERE " + where);
        EXPECT_EQ(run(p, sql.c_str(), &rows), SQL1_OK) << sql << ": " << SQL1_LastError();
        return rows.empty() ? -1 : std::stol(rows[0][0]);
    }

    std::string dir_, db_, data_ = dataDir();
    SQL1_StoreOptions opts_;
};

TEST_F(Sql1Store, DescriptorsCarryTheDeclaredTypesAndValuesOfTheStoresColumns) {
    SQL1_Handle p = path();
    Req r;
    ASSERT_EQ(create(p, "SELECT SITNAME, TEXT, REEV_TIME, SITINFO FROM O4SRV.TSITDESC WHERE SITNAME = \"ZAG_Disk_Full\"", &r),
              SQL1_OK) << SQL1_LastError();
    ASSERT_EQ(r.out->used, 4);
    const struct {
        int16_t type;
        uint16_t max;
        const char* name;
    } expect[] = {{452, 32, "SITNAME"}, {1018, 1024, "TEXT"}, {452, 6, "REEV_TIME"}, {448, 256, "SITINFO"}};
    for (int i = 0; i < 4; i++) {
        EXPECT_EQ(r.out->var[i].type, expect[i].type) << i;
        EXPECT_EQ(r.out->var[i].maxLength, expect[i].max) << i;
        EXPECT_STREQ(r.out->var[i].name, expect[i].name);
    }
    EXPECT_EQ(r.in->used, 0);
    ASSERT_EQ(ops(r.req)->open(r.req, r.in), SQL1_OK);
    ASSERT_EQ(ops(r.row)->fetch(r.row, r.out), SQL1_OK);
    // Fixed character values come back padded to their maximum.
    EXPECT_EQ(r.out->var[0].length, 32);
    EXPECT_EQ(std::string(r.out->var[0].data, 14), "ZAG_Disk_Full ");
    EXPECT_EQ(valueText(r.out->var[1]), "File system nearly full");
    EXPECT_EQ(r.out->var[1].length, std::strlen("File system nearly full"));
    EXPECT_EQ(ops(r.row)->fetch(r.row, r.out), SQL1_ST_EOD);
    EXPECT_EQ(ops(r.row)->fetch(r.row, r.out), SQL1_ST_EOD);
    drop(r);

    // Numbers in their sizes; an expression column is text; NULL has its indicator.
    Req n;
    ASSERT_EQ(create(p, "SELECT CPUID, BUSYPCT, COUNT(*), NULL FROM ZAG.CPU WHERE ORIGINNODE = \"alpha:ZAG\" AND CPUID = 1", &n),
              SQL1_OK);
    EXPECT_EQ(n.out->var[0].type, 500);
    EXPECT_EQ(n.out->var[1].type, 496);
    EXPECT_EQ(n.out->var[2].type, 448);
    ASSERT_EQ(ops(n.req)->open(n.req, nullptr), SQL1_OK);
    Rows rows;
    ASSERT_EQ(fetchAll(n, &rows), SQL1_OK);
    ASSERT_EQ(rows.size(), 1u);
    EXPECT_EQ(rows[0], (std::vector<std::string>{"1", "4020", "1", "<null>"}));
    drop(n);

    rows.clear();
    ASSERT_EQ(run(p, "SELECT SIZEMB FROM ZAG.DISK WHERE MOUNT = \"/var\" AND ORIGINNODE = \"alpha:ZAG\"", &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"102400"}}));
    // A value too large for its declared type is an error, not a wrapped number.
    ASSERT_EQ(run(p, "UPDATE ZAG.CPU SET BUSYPCT = 5000000000 WHERE CPUID = 1"), SQL1_OK);
    EXPECT_EQ(run(p, "SELECT BUSYPCT FROM ZAG.CPU WHERE CPUID = 1", &rows), SQL1_ST_RANGE);
    (void)ops(p)->release(p);
}

TEST_F(Sql1Store, MarkersBindValuesOfTheirColumnsType) {
    SQL1_Handle p = path();
    Req ins;
    ASSERT_EQ(create(p, "INSERT INTO ZAG.CPU AT (\"*HUB\") ( ORIGINNODE,CPUID,BUSYPCT,TIMESTAMP) VALUES( ?, ?, ?, ? )", &ins),
              SQL1_OK) << SQL1_LastError();
    ASSERT_EQ(ins.in->used, 4);
    EXPECT_EQ(ins.in->var[0].type, 452);
    EXPECT_EQ(ins.in->var[1].type, 500);
    EXPECT_EQ(ins.in->var[2].type, 496);
    // A fixed character marker blank-filled over its maximum; the integers
    // in their sizes; the varying timestamp... is CHAR(16) too: zero-filled.
    std::memset(ins.in->var[0].data, ' ', ins.in->var[0].maxLength);
    std::memcpy(ins.in->var[0].data, "delta:ZAG", 9);
    int16_t cpu = 7;
    int32_t busy = -12345;
    std::memcpy(ins.in->var[1].data, &cpu, sizeof cpu);
    std::memcpy(ins.in->var[2].data, &busy, sizeof busy);
    std::memcpy(ins.in->var[3].data, "1260101000000000", 16);
    ASSERT_EQ(ops(ins.req)->open(ins.req, ins.in), SQL1_OK) << SQL1_LastError();
    long changed = 0;
    EXPECT_EQ(ops(ins.req)->changes(ins.req, &changed), SQL1_OK);
    EXPECT_EQ(changed, 1);
    EXPECT_EQ(ops(ins.row)->fetch(ins.row, ins.out), SQL1_ST_EOD);
    EXPECT_EQ(ops(ins.req)->open(ins.req, ins.in), SQL1_ST_STATE);  // still open
    ASSERT_EQ(ops(ins.req)->close(ins.req), SQL1_OK);
    // Reopened with a NULL timestamp and another name.
    std::memcpy(ins.in->var[0].data, "omega:ZAG", 9);
    ins.in->var[3].nullInd = -1;
    ASSERT_EQ(ops(ins.req)->open(ins.req, ins.in), SQL1_OK);
    drop(ins);

    Req sel;
    ASSERT_EQ(create(p, "SELECT ORIGINNODE, BUSYPCT, TIMESTAMP FROM ZAG.CPU WHERE ORIGINNODE = ? AND CPUID = ?", &sel), SQL1_OK);
    ASSERT_EQ(sel.in->used, 2);
    // The text form (string, no length): read up to the first NUL.
    std::snprintf(sel.in->var[0].data, sel.in->var[0].maxLength + 1u, "%s", "delta:ZAG");
    std::memcpy(sel.in->var[1].data, &cpu, sizeof cpu);
    ASSERT_EQ(ops(sel.req)->open(sel.req, sel.in), SQL1_OK);
    Rows rows;
    ASSERT_EQ(fetchAll(sel, &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"delta:ZAG", "-12345", "1260101000000000"}}));
    ASSERT_EQ(ops(sel.req)->close(sel.req), SQL1_OK);
    std::memset(sel.in->var[0].data, 0, sel.in->var[0].maxLength);
    std::memcpy(sel.in->var[0].data, "omega:ZAG", 9);
    ASSERT_EQ(ops(sel.req)->open(sel.req, nullptr), SQL1_OK);
    rows.clear();
    ASSERT_EQ(fetchAll(sel, &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"omega:ZAG", "-12345", "<null>"}}));
    drop(sel);
    (void)ops(p)->release(p);
}

TEST_F(Sql1Store, AtAndHistoryReturnTheRowsOfTheNamedNodes) {
    SQL1_Handle p = path();
    Rows rows;
    // The hub's agents (alpha, gamma) and the remote server's (beta).
    ASSERT_EQ(run(p, "SELECT DISTINCT ORIGINNODE FROM ZAG.CPU AT (\"*HUB\") ORDER BY ORIGINNODE", &rows), SQL1_OK)
        << SQL1_LastError();
    EXPECT_EQ(rows, (Rows{{"alpha:ZAG"}, {"gamma:ZAG"}}));
    rows.clear();
    ASSERT_EQ(run(p, "SELECT DISTINCT ORIGINNODE FROM ZAG.CPU AT (\"REMOTE_EAST\")", &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"beta:ZAG"}}));
    rows.clear();
    ASSERT_EQ(run(p, "SELECT MOUNT FROM ZAG.DISK AT (\"beta:ZAG\") WHERE  USEDPCT > 90", &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"/var"}}));
    // History rows with their write time.
    rows.clear();
    ASSERT_EQ(run(p, "SELECT WRITETIME, BUSYPCT FROM ZAG.CPU AT (\"alpha:ZAG\") HISTORY() WHERE  CPUID = 0 ORDER BY WRITETIME",
                  &rows),
              SQL1_OK) << SQL1_LastError();
    EXPECT_EQ(rows, (Rows{{"1260115081500000", "2210"}, {"1260115083000000", "5105"}, {"1260115084500000", "9020"}}));
    // The applications of one node; a table without node column is not limited.
    rows.clear();
    ASSERT_EQ(run(p, "SELECT APPL_NAME, VERSION, LEVEL, TIMESTAMP FROM SYSTEM.SYSAPPLS AT (\"REMOTE_EAST\")", &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"ZAG", "01.02.00", "00", "1260101000000000"}}));
    EXPECT_EQ(count(p, "O4SRV.TSITDESC AT (\"nowhere\")"), 5);

    // Parma terms do not filter; the caller reads them from the request.
    Req r;
    ASSERT_EQ(create(p, "SELECT NODEL FROM O4SRV.TOBJACCL WHERE OBJNAME =\"ZAG_Disk_Full\" AND SYSTEM.PARMA('QIBNODE', "
                        "'QPANOSCOPE', 32)",
                     &r),
              SQL1_OK) << SQL1_LastError();
    const char* name = nullptr;
    const char* value = nullptr;
    ASSERT_EQ(ops(r.req)->getParma(r.req, 0, &name, &value), SQL1_OK);
    EXPECT_STREQ(name, "QIBNODE");
    EXPECT_STREQ(value, "QPANOSCOPE");
    EXPECT_EQ(ops(r.stmt)->getParma(r.stmt, 0, &name, &value), SQL1_OK);
    EXPECT_EQ(ops(r.req)->getParma(r.req, 1, &name, &value), SQL1_ST_EOD);
    ASSERT_EQ(ops(r.req)->open(r.req, nullptr), SQL1_OK);
    rows.clear();
    ASSERT_EQ(fetchAll(r, &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"alpha:ZAG"}, {"beta:ZAG"}}));
    drop(r);
    (void)ops(p)->release(p);
}

TEST_F(Sql1Store, TheCommandsStatementsRunAsComposed) {
    SQL1_Handle p = path();
    const char* sit =
        "INSERT INTO O4SRV.TSITDESC(SITNAME ,TEXT ,PDT ,CMD ,LSTUSRPRF ,REEV_DAYS ,REEV_TIME ,QIBCLASSID) VALUES "
        "(\"NEWSIT\" ,N\"say \"\"hi\"\" it's\" ,N\"*IF *VALUE ZAG_CPU.Busy_Percent *GT 10\" ,N\"*NONE\" ,\"&QIBUSER\" "
        ",\"000\" ,\"000500\" ,\"5140\")";
    ASSERT_EQ(run(p, sit), SQL1_OK) << SQL1_LastError();
    EXPECT_EQ(run(p, sit), SQL1_ST_CONSTRAINT);  // the name is taken
    ASSERT_EQ(run(p, "INSERT INTO O4SRV.TOBJACCL(ACTIVATION ,HUB ,LOCFLAG ,LSTDATE ,LSTRELEASE ,LSTUSRPRF ,NETID ,NODEL "
                     ",OBJCLASS ,OBJECTLOCK ,OBJNAME ,QIBCLASSID) VALUES (\"\" ,\"Y\" ,\"\" ,\"\" ,\"\" ,\"&QIBUSER\" ,\"\" "
                     ",\"*ZAG_HOSTS\" ,\"5140\" ,\"\" ,\"NEWSIT\" ,\"5535\")"),
              SQL1_OK) << SQL1_LastError();
    ASSERT_EQ(run(p, "INSERT INTO O4SRV.TNAME(ID,FULLNAME,OBJCLASS,LSTUSRPRF,QIBCLASSID) VALUES (\"NEWSIT\", N\"A new "
                     "situation with a long name\", \"5140\", \"&QIBUSER\", \"2012\")"),
              SQL1_OK) << SQL1_LastError();
    ASSERT_EQ(run(p, "INSERT INTO O4SRV.EVNTMAP(ID,OBJCLASS,SEQUENCE,TYPE,LSTDATE,LSTUSRPRF,LSTRELEASE,LOCFLAG,RESERVED,MAP,"
                     "QIBCLASSID) VALUES(\"NEWSIT\", \"5140\", \"1\", \"S\", \"\", \"&QIBUSER\", \"\", \"\", \"\", "
                     "N'<slot a=\"1\" b=''2''/> & more', \"2250\")"),
              SQL1_OK) << SQL1_LastError();
    Rows rows;
    // The base-situation read names every column of the definition row.
    ASSERT_EQ(run(p, "SELECT ADVISE,AFFINITIES,ALERTLIST,AUTOSOPT,AUTOSTART,CMD,DESTNODE,HUB,LOCFLAG,LSTCCSID,LSTDATE,"
                     "LSTRELEASE,LSTUSRPRF,NOTIFYARGS,NOTIFYOPTS,OBJECTLOCK,PDT,PRNAMES,QIBSCOPE,REEV_DAYS,REEV_TIME,"
                     "REFLEXOK,SENDMSGQ,SITINFO,SITNAME,SOURCE,TEXT FROM O4SRV.TSITDESC WHERE SITNAME =\"ZAG_CPU_Busy\"",
                  &rows),
              SQL1_OK) << SQL1_LastError();
    ASSERT_EQ(rows.size(), 1u);
    EXPECT_EQ(rows[0].size(), 27u);
    EXPECT_EQ(rows[0][24], "ZAG_CPU_Busy");
    rows.clear();
    ASSERT_EQ(run(p, "SELECT TEXT, REEV_TIME, ADVISE, SENDMSGQ FROM O4SRV.TSITDESC WHERE SITNAME =\"NEWSIT\"", &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"say \"hi\" it's", "000500", "", "*NONE"}}));  // unnamed columns take their defaults
    rows.clear();
    ASSERT_EQ(run(p, "SELECT ID FROM O4SRV.TNAME WHERE FULLNAME = N\"A new situation with a long name\"", &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"NEWSIT"}}));
    rows.clear();
    ASSERT_EQ(run(p, "SELECT MAP FROM O4SRV.EVNTMAP WHERE ID = \"NEWSIT\"", &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"<slot a=\"1\" b='2'/> & more"}}));
    EXPECT_EQ(count(p, "O4SRV.TOBJACCL", "OBJNAME = \"NEWSIT\""), 1);
    rows.clear();
    ASSERT_EQ(run(p, "SELECT VALUE FROM SYSTEM.SERVERINFO WHERE NAME = \"VERSION\"", &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"06.30"}}));
    // A name longer than its column is refused with nothing written.
    std::string longName = "INSERT INTO O4SRV.TOBJACCL(NODEL ,OBJNAME) VALUES (\"n\" ,\"" + std::string(40, 'L') + "\")";
    EXPECT_EQ(run(p, longName.c_str()), SQL1_ST_TOOLONG);
    EXPECT_EQ(count(p, "O4SRV.TOBJACCL"), 7);
    (void)ops(p)->release(p);
}

TEST_F(Sql1Store, ActionTablesRecordTheCommandsSelectedThroughThem) {
    SQL1_Handle p = path();
    Rows rows;
    const char* wto =
        "SELECT ACTSECURE,CLCMD FROM O4SRV.CLACTLCL WHERE  ACTSECURE = \"oper\" AND CLCMD = \"message:severity= "
        ";Category= ;message=disk full\"";
    ASSERT_EQ(run(p, wto, &rows), SQL1_OK) << SQL1_LastError();
    EXPECT_EQ(rows, (Rows{{"oper", "message:severity= ;Category= ;message=disk full"}}));
    EXPECT_EQ(count(p, "O4SRV.CLACTLCL"), 1);
    // With bound values, as threshold overrides are sent.
    Req r;
    ASSERT_EQ(create(p, "SELECT CLCMD FROM O4SRV.CLACTRMT WHERE ACTSECURE = ? AND CLCMD = ?", &r), SQL1_OK);
    std::memcpy(r.in->var[0].data, "oper", 4);
    std::memcpy(r.in->var[1].data, "thresh:<overrides/>", 19);
    r.in->var[1].length = 19;
    ASSERT_EQ(ops(r.req)->open(r.req, r.in), SQL1_OK) << SQL1_LastError();
    rows.clear();
    ASSERT_EQ(fetchAll(r, &rows), SQL1_OK);
    EXPECT_EQ(rows, (Rows{{"thresh:<overrides/>"}}));
    drop(r);
    EXPECT_EQ(count(p, "O4SRV.CLACTRMT", "ACTSECURE = \"oper\""), 1);
    (void)ops(p)->release(p);
}

TEST_F(Sql1Store, LogonIsRefusedWithItsReasonAndTheLayersTablesStayOutOfReach) {
    ASSERT_EQ(SQL1_SetUser(db_.c_str(), "oper", "op-pass", 1, 1), SQL1_OK);
    ASSERT_EQ(SQL1_SetUser(db_.c_str(), "gone", "gone-pass", 0, 1), SQL1_OK);
    ASSERT_EQ(SQL1_SetUser(db_.c_str(), "sixteen-chars-id", "sixteen-char-pwd", 1, 1), SQL1_OK);  // fills the fields
    EXPECT_EQ(SQL1_SetUser(db_.c_str(), "seventeen-chars-x", "pw", 1, 1), SQL1_ST_BADARG);
    const struct {
        const char* user;
        const char* password;
        int status;
    } cases[] = {
        {"sysadmin", "Adm1n-pw", SQL1_OK},
        {"oper", "op-pass", SQL1_OK},
        {"oper", "op-pass", SQL1_OK},  // remembered check
        {"oper", "op-Pass", SQL1_ST_LOGON_PASSWORD},
        {"oper", "", SQL1_ST_LOGON_NOPASSWORD},
        {"", "op-pass", SQL1_ST_LOGON_NOUSER},
        {"nobody", "op-pass", SQL1_ST_LOGON_UNKNOWN},
        {"gone", "gone-pass", SQL1_ST_LOGON_DISABLED},
        {"sixteen-chars-id", "sixteen-char-pwd", SQL1_OK},
        {"sixteen-chars-id", "sixteen-char-pw", SQL1_ST_LOGON_PASSWORD},
    };
    for (const auto& c : cases) {
        SQL1_LoginId id = loginOf(c.user, c.password);
        SQL1_Handle p{};
        EXPECT_EQ(sql1cpth("HUBLMS", &id, &p), c.status) << c.user << "/" << c.password;
        EXPECT_EQ(SQL1_IsCurrent(p), c.status == SQL1_OK);
        if (c.status == SQL1_OK) (void)ops(p)->release(p);
    }
    // A changed password takes effect at once, also for a remembered login.
    ASSERT_EQ(SQL1_SetUser(db_.c_str(), "oper", "new-pass", 1, 1), SQL1_OK);
    SQL1_LoginId old = loginOf("oper", "op-pass");
    SQL1_Handle p{};
    EXPECT_EQ(sql1cpth("HUBLMS", &old, &p), SQL1_ST_LOGON_PASSWORD);

    // Statements cannot reach the users, nor switch validation off.
    SQL1_Handle sys = path();
    EXPECT_EQ(run(sys, "SELECT PWHASH FROM CSIT_USERS"), SQL1_ST_DENIED);
    EXPECT_EQ(run(sys, "SELECT name FROM pragma_table_info(\"CSIT_USERS\")"), SQL1_ST_DENIED);
    EXPECT_EQ(run(sys, "UPDATE SYSTEM.SERVERINFO SET VALUE = \"N\" WHERE NAME = \"VALIDATE\""), SQL1_ST_DENIED);
    EXPECT_EQ(run(sys, "DELETE FROM SYSTEM.SERVERINFO"), SQL1_ST_DENIED);
    long v = 0;
    ASSERT_EQ(ops(sys)->getProperty(sys, SQL1_PROP_VALIDATE, &v), SQL1_OK);
    EXPECT_EQ(v, 1);
    (void)ops(sys)->release(sys);

    // A store that does not validate lets any login through.
    SQL1_StoreOptions o;
    o.validate = 0;
    ASSERT_EQ(SQL1_CreateStore(db_.c_str(), &o), SQL1_OK);
    SQL1_LoginId any = loginOf("whoever", "");
    EXPECT_EQ(sql1cpth("HUBLMS", &any, &p), SQL1_OK);
    ASSERT_EQ(ops(p)->getProperty(p, SQL1_PROP_VALIDATE, &v), SQL1_OK);
    EXPECT_EQ(v, 0);
    (void)ops(p)->release(p);
}

TEST_F(Sql1Store, PathPropertiesTellVersionLevelValidationAndNls) {
    SQL1_Handle p = path();
    const struct {
        int id;
        long value;
    } expect[] = {{SQL1_PROP_VERSION, 630}, {SQL1_PROP_LEVEL, 630}, {SQL1_PROP_VALIDATE, 1},
                  {SQL1_PROP_NLS_CONVERT, 1}, {SQL1_PROP_NLS_WIDTH, 4}, {SQL1_PROP_CODEPAGE, 1208},
                  {SQL1_PROP_BUILD, 2026011}};
    for (const auto& e : expect) {
        long v = -1;
        EXPECT_EQ(ops(p)->getProperty(p, e.id, &v), SQL1_OK) << e.id;
        EXPECT_EQ(v, e.value) << e.id;
    }
    long v = 0;
    EXPECT_EQ(ops(p)->getProperty(p, 4711, &v), SQL1_ST_BADARG);
    ASSERT_EQ(ops(p)->setProperty(p, SQL1_PROP_CODEPAGE_SET, 1208), SQL1_OK);
    ASSERT_EQ(ops(p)->setProperty(p, SQL1_PROP_OPTIONS_SET, 0x03480001), SQL1_OK);
    EXPECT_EQ(ops(p)->getProperty(p, SQL1_PROP_OPTIONS_SET, &v), SQL1_OK);
    EXPECT_EQ(v, 0x03480001);
    EXPECT_EQ(ops(p)->setProperty(p, SQL1_PROP_VERSION, 1), SQL1_ST_BADARG);

    // An older server, a low level, no NLS: as configured by the host.
    SQL1_StoreOptions o;
    o.serverVersion = "06.10";
    o.level = 300;
    o.nls = 0;
    ASSERT_EQ(SQL1_RegisterServer("HUBLMS", db_.c_str(), &o), SQL1_OK);
    const struct {
        int id;
        long value;
    } older[] = {{SQL1_PROP_VERSION, 610}, {SQL1_PROP_LEVEL, 300}, {SQL1_PROP_NLS_CONVERT, 0}, {SQL1_PROP_NLS_WIDTH, 0}};
    for (const auto& e : older) {
        EXPECT_EQ(ops(p)->getProperty(p, e.id, &v), SQL1_OK);
        EXPECT_EQ(v, e.value) << e.id;
    }
    SQL1_StoreInfo info;
    ASSERT_EQ(SQL1_GetStoreInfo(db_.c_str(), &info), SQL1_OK);
    EXPECT_STREQ(info.version, "06.10");
    EXPECT_STREQ(info.hubNode, "HUB_MAIN");
    o = SQL1_StoreOptions{};
    o.serverVersion = "6.3";
    EXPECT_EQ(SQL1_CreateStore(db_.c_str(), &o), SQL1_ST_BADARG);
    (void)ops(p)->release(p);
}

TEST_F(Sql1Store, LookUpFindsRegisteredAndConfiguredServersOnly) {
    // A second store, reached through servers.conf.
    std::string remote = dir_ + "/remote.db";
    SQL1_StoreOptions o;
    o.dataDir = data_.c_str();
    o.adminPassword = "r3mote";
    o.minimalHash = 1;
    ASSERT_EQ(SQL1_CreateStore(remote.c_str(), &o), SQL1_OK);
    std::ofstream(dir_ + "/servers.conf") << "# hubs\n\nREMOTE1 sqlite:remote.db\nBROKEN sqlite:missing.db\n";

    SQL1_LbLookup_t* lb = nullptr;
    ASSERT_EQ(SQL1_LbLookup("hublms[q1]", SQL1_LB_HUB, &lb), SQL1_OK);
    ASSERT_EQ(lb->count, 1);
    EXPECT_STREQ(lb->entries[0].nodeName, "HUB_MAIN");
    EXPECT_EQ(lb->entries[0].local, 1);
    EXPECT_EQ(std::string(lb->entries[0].serverPath).rfind("sqlite:/", 0), 0u);
    EXPECT_EQ(SQL1_DestroyLbLookup(lb), SQL1_OK);
    ASSERT_EQ(SQL1_LbLookup("REMOTE1", SQL1_LB_HUB, &lb), SQL1_OK);
    EXPECT_EQ(lb->entries[0].local, 0);
    EXPECT_NE(std::string(lb->entries[0].serverPath).find("remote.db"), std::string::npos);
    EXPECT_EQ(SQL1_DestroyLbLookup(lb), SQL1_OK);
    EXPECT_EQ(SQL1_LbLookup("NOSUCH", SQL1_LB_HUB, &lb), SQL1_ST_NOTFOUND);
    EXPECT_EQ(lb, nullptr);

    // Path forms: local, by socket name, by store URI; a configured server
    // whose store is missing is a lost connection, an unknown one not found.
    SQL1_LoginId id;
    sql1cpli(&id);
    SQL1_Handle p{};
    ASSERT_EQ(sql1cpth("CT/DS:{SERVER=SRVR01 USER=KSH}", &id, &p), SQL1_OK);
    EXPECT_EQ(count(p, "O4SRV.TSITDESC"), 5);
    ASSERT_EQ(run(p, "DELETE FROM O4SRV.TSITDESC WHERE SITNAME = \"ZAG_CPU_Busy\""), SQL1_OK);
    SQL1_Handle r{};
    ASSERT_EQ(sql1cpth("NCS:{SOCKET=REMOTE1} CT/DS:{SERVER=SRVR01 USER=KSH TERMPATH=INVOWNER OWNER=KSH}", &id, &r), SQL1_OK);
    EXPECT_EQ(count(r, "O4SRV.TSITDESC"), 5);  // the other store is untouched
    EXPECT_EQ(count(p, "O4SRV.TSITDESC"), 4);
    SQL1_Handle u{};
    ASSERT_EQ(sql1cpth(("sqlite:" + remote).c_str(), &id, &u), SQL1_OK);
    EXPECT_EQ(sql1cpth("NCS:{SOCKET=BROKEN} CT/DS:{}", &id, &u), SQL1_ST_CONNLOST);
    EXPECT_EQ(sql1cpth("NCS:{SOCKET=NOSUCH} CT/DS:{}", &id, &u), SQL1_ST_NOTFOUND);
    (void)ops(p)->release(p);
    (void)ops(r)->release(r);
}

TEST_F(Sql1Store, AnInjectedConnectionLossKillsThePathUntilANewOneIsMade) {
    SQL1_Handle p = path();
    Req r;
    ASSERT_EQ(create(p, "SELECT SITNAME FROM O4SRV.TSITDESC", &r), SQL1_OK);
    ASSERT_EQ(SQL1_InjectStatus("HUBLMS", 155, 1, 1), SQL1_OK);
    ASSERT_EQ(ops(r.req)->open(r.req, nullptr), SQL1_OK);  // skipped
    EXPECT_EQ(ops(r.row)->fetch(r.row, r.out), 155);      // injected
    // The path and everything on it stay dead; nothing else is injected.
    EXPECT_EQ(ops(r.row)->fetch(r.row, r.out), 155);
    long v = 0;
    EXPECT_EQ(ops(p)->getProperty(p, SQL1_PROP_VERSION, &v), 155);
    SQL1_Handle s{};
    EXPECT_EQ(ops(p)->prepare(p, "SELECT 1", &s), 155);
    EXPECT_EQ(ops(p)->release(p), SQL1_OK);
    EXPECT_FALSE(SQL1_IsCurrent(r.req));

    SQL1_Handle again = path();
    EXPECT_EQ(count(again, "O4SRV.TSITDESC"), 5);

    // Fail the Nth call: the third counted operation fails, with a status
    // that does not kill the path.
    ASSERT_EQ(SQL1_InjectStatus(db_.c_str(), SQL1_ST_EXEC, 1, 2), SQL1_OK);
    Req q;
    ASSERT_EQ(create(again, "SELECT SITNAME FROM O4SRV.TSITDESC", &q), SQL1_OK);  // prepare, createRequest
    EXPECT_EQ(ops(q.req)->open(q.req, nullptr), SQL1_ST_EXEC);
    EXPECT_EQ(ops(q.req)->open(q.req, nullptr), SQL1_OK);
    drop(q);
    // A path creation is an operation too.
    ASSERT_EQ(SQL1_InjectStatus("HUBLMS", 190, 1, 0), SQL1_OK);
    SQL1_LoginId id;
    sql1cpli(&id);
    EXPECT_EQ(sql1cpth("HUBLMS", &id, &s), 190);
    (void)ops(again)->release(again);
}

TEST_F(Sql1Store, StaleHandlesFailWithoutTouchingTheStore) {
    SQL1_Handle p = path();
    Req r;
    ASSERT_EQ(create(p, "SELECT SITNAME FROM O4SRV.TSITDESC", &r), SQL1_OK);
    SQL1_Handle stmt = r.stmt;
    ASSERT_EQ(ops(stmt)->release(stmt), SQL1_OK);
    EXPECT_EQ(ops(stmt)->release(stmt), SQL1_ST_STALE);
    SQL1_Handle req2{}, row2{};
    EXPECT_EQ(ops(stmt)->createRequest(stmt, 0, nullptr, &req2, &row2), SQL1_ST_STALE);
    // The request outlives its statement; a row is not released on its own.
    ASSERT_EQ(ops(r.req)->open(r.req, nullptr), SQL1_OK);
    EXPECT_EQ(ops(r.row)->release(r.row), SQL1_ST_BADARG);
    // A handle of the wrong kind is refused like a stale one.
    SQL1_Sqlda* d = nullptr;
    EXPECT_EQ(ops(p)->getInputDescriptor(r.row, &d), SQL1_ST_STALE);
    EXPECT_EQ(ops(p)->fetch(r.req, nullptr), SQL1_ST_STALE);
    // Releasing the path takes its request and row with it; the slots may be
    // reused by new objects, which old handles never reach.
    ASSERT_EQ(ops(p)->release(p), SQL1_OK);
    EXPECT_EQ(ops(p)->fetch(r.row, nullptr), SQL1_ST_STALE);
    EXPECT_EQ(ops(p)->close(r.req), SQL1_ST_STALE);
    long v = 0;
    EXPECT_EQ(ops(p)->getProperty(p, SQL1_PROP_VERSION, &v), SQL1_ST_STALE);
    SQL1_Handle fresh[4];
    for (SQL1_Handle& f : fresh) f = path();
    EXPECT_EQ(ops(p)->getProperty(p, SQL1_PROP_VERSION, &v), SQL1_ST_STALE);
    for (SQL1_Handle& f : fresh) {
        EXPECT_EQ(ops(f)->getProperty(f, SQL1_PROP_VERSION, &v), SQL1_OK);
        (void)ops(f)->release(f);
    }
    EXPECT_EQ(ops(p)->release(SQL1_Handle{}), SQL1_ST_STALE);
}

struct ExitRecord {
    std::mutex mu;
    std::condition_variable cv;
    bool called = false;
    long status = -1;
    std::thread::id thread;
};

void onExit(long status, void* arg) {
    auto* e = static_cast<ExitRecord*>(arg);
    std::lock_guard<std::mutex> g(e->mu);
    e->called = true;
    e->status = status;
    e->thread = std::this_thread::get_id();
    e->cv.notify_all();
}

long waitExit(ExitRecord* e) {
    std::unique_lock<std::mutex> l(e->mu);
    e->cv.wait(l, [e] { return e->called; });
    e->called = false;
    return e->status;
}

TEST_F(Sql1Store, AnAsynchronousOpenReportsThroughTheExitFromAnotherThread) {
    SQL1_Handle p = path();
    ExitRecord rec;
    SQL1_Exit exit{SQL1_EXIT_CALLBACK, onExit, &rec};
    Req r;
    ASSERT_EQ(create(p, "SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME LIKE \"ZAG%\" ORDER BY SITNAME", &r, &exit),
              SQL1_OK);
    ASSERT_EQ(ops(r.req)->open(r.req, nullptr), SQL1_OK);
    EXPECT_EQ(waitExit(&rec), 0);
    EXPECT_NE(rec.thread, std::this_thread::get_id());
    Rows rows;
    ASSERT_EQ(fetchAll(r, &rows), SQL1_OK);
    EXPECT_EQ(rows.size(), 4u);
    // Closed and opened again: a second report.
    ASSERT_EQ(ops(r.req)->close(r.req), SQL1_OK);
    ASSERT_EQ(ops(r.req)->open(r.req, nullptr), SQL1_OK);
    EXPECT_EQ(waitExit(&rec), 0);
    drop(r);

    // A failing open reports its status; fetch without waiting still sees
    // the finished open.
    Req bad;
    ASSERT_EQ(create(p, "INSERT INTO O4SRV.TSITDESC(SITNAME) VALUES (\"ZAG_Disk_Full\")", &bad, &exit), SQL1_OK);
    ASSERT_EQ(ops(bad.req)->open(bad.req, nullptr), SQL1_OK);
    EXPECT_EQ(ops(bad.row)->fetch(bad.row, nullptr), SQL1_ST_STATE);
    EXPECT_EQ(waitExit(&rec), SQL1_ST_CONSTRAINT);
    drop(bad);
    // Released while its open may still run: the release waits for it.
    Req quick;
    ASSERT_EQ(create(p, "SELECT SITNAME FROM O4SRV.TSITDESC", &quick, &exit), SQL1_OK);
    ASSERT_EQ(ops(quick.req)->open(quick.req, nullptr), SQL1_OK);
    drop(quick);
    EXPECT_EQ(waitExit(&rec), 0);
    (void)ops(p)->release(p);
}

TEST_F(Sql1Store, ConcurrentPathsOnOneStoreLoseNoRowsAndAnOpenCursorHoldsNoWrite) {
    SQL1_Handle reader = path();
    Req cursor;
    ASSERT_EQ(create(reader, "SELECT PID FROM ZAG.PROCESS", &cursor), SQL1_OK);
    ASSERT_EQ(ops(cursor.req)->open(cursor.req, nullptr), SQL1_OK);
    ASSERT_EQ(ops(cursor.row)->fetch(cursor.row, nullptr), SQL1_OK);  // left open mid-way

    constexpr int kThreads = 4, kRows = 25;
    std::vector<std::thread> threads;
    std::vector<int> failures(kThreads, 0);
    SQL1_Handle shared = path();  // one path shared by two threads, as a hub's global path is
    for (int t = 0; t < kThreads; t++) {
        threads.emplace_back([&, t] {
            SQL1_Handle own = t < 2 ? shared : path();
            for (int i = 0; i < kRows; i++) {
                std::string sql = "INSERT INTO ZAG.PROCESS (ORIGINNODE, PID, NAME) VALUES (\"t" + std::to_string(t) +
                                  "\", " + std::to_string(1000 + i) + ", \"w\")";
                if (run(own, sql.c_str()) != SQL1_OK) failures[t]++;
                Rows rows;
                if (run(own, "SELECT COUNT(*) FROM ZAG.PROCESS", &rows) != SQL1_OK) failures[t]++;
            }
            if (t >= 2) (void)ops(own)->release(own);
        });
    }
    for (auto& th : threads) th.join();
    for (int t = 0; t < kThreads; t++) EXPECT_EQ(failures[t], 0) << t;
    // Another path sees every row while the first cursor is still open.
    EXPECT_EQ(count(shared, "ZAG.PROCESS"), 6 + kThreads * kRows);
    Rows rest;
    EXPECT_EQ(fetchAll(cursor, &rest), SQL1_OK);
    drop(cursor);
    (void)ops(reader)->release(reader);
    (void)ops(shared)->release(shared);
}

TEST_F(Sql1Store, ReopeningAStoreKeepsItsRowsAndANewStoreNeedsItsAdministrator) {
    SQL1_Handle p = path();
    ASSERT_EQ(run(p, "DELETE FROM O4SRV.TNAME"), SQL1_OK);
    (void)ops(p)->release(p);
    SQL1_Shutdown();
    ASSERT_EQ(SQL1_RegisterServer("HUBLMS", db_.c_str(), options()), SQL1_OK);
    p = path();
    EXPECT_EQ(count(p, "O4SRV.TNAME"), 0);  // not seeded again
    (void)ops(p)->release(p);

    SQL1_StoreOptions o;
    o.dataDir = data_.c_str();
    EXPECT_EQ(SQL1_CreateStore((dir_ + "/new.db").c_str(), &o), SQL1_ST_BADARG);  // no password
    o.adminPassword = "pw";
    o.dataDir = "/nonexistent";
    EXPECT_EQ(SQL1_CreateStore((dir_ + "/new.db").c_str(), &o), SQL1_ST_BADARG);
    std::ofstream(dir_ + "/junk.db") << "this is not a database";
    o.dataDir = data_.c_str();
    EXPECT_EQ(SQL1_CreateStore((dir_ + "/junk.db").c_str(), &o), SQL1_ST_CONNBAD);
}

}  // namespace
