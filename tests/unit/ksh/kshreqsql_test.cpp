// The SQL text a request builds (InitReq) for each request shape, the
// routing over the hub's topology, and the refusals that keep request text
// out of the statement: escaped literals, names that must be identifiers,
// statements that do not fit.
#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "kshcol.h"
#include "kshhub.h"
#include "kshreq.h"
#include "kshreqfix.h"
#include "kshtab.h"
#include "wsql_rc.h"

using kshtest::FakeHttp;
using kshtest::FrozenClock;
using kshtest::Record;
using kshtest::TestStore;

namespace {

class KshReqSql : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        ASSERT_NE(kshtest::catalog(), nullptr);
        ASSERT_EQ(WSQL_Request::initialize(), 0);
    }
    static void TearDownTestSuite() { (void)WSQL_Request::terminate(); }

    // The SQL of `rec` for `action`, with InitReq's result in *rc.
    std::string build(Record& rec, const char* action = "start", int* rc = nullptr, WSQL_Hub* h = nullptr,
                      FakeHttp* server = nullptr) {
        FakeHttp local;
        WSQL_Request req(h != nullptr ? h : &hub, server != nullptr ? server : &local);
        int st = req.InitReq(&rec.r, action);
        if (rc != nullptr) *rc = st;
        lastType = req.getType();
        hadSelect = req.getSelect() != nullptr;
        return req.getSQL();
    }

    WSQL_Hub hub{"REQSQL_NOSTORE", "soap", "sql", nullptr};
    uint32_t lastType = 0;
    bool hadSelect = false;
};

}  // namespace

TEST_F(KshReqSql, SelectShapesFollowTheDialectExactly) {
    Record a;
    a.table("O4SRV.TSITDESC").column("ORIGINNODE").column("SITNAME").parma("NODELIST", "*ALL");
    EXPECT_EQ(build(a), "SELECT ORIGINNODE,SITNAME FROM O4SRV.TSITDESC WHERE  SYSTEM.PARMA(\"NODELIST\", \"*ALL\", 4)");
    EXPECT_TRUE(lastType & WSQL_TYPE_SELECT);

    Record b;
    b.table("O4SRV.TSITSTSH").column("SITNAME").filter("DELTASTAT", "EQ", "Y");
    b.r.history = 1;
    b.r.thrunode = b.keep("REMOTE_EAST");
    EXPECT_EQ(build(b), "SELECT SITNAME FROM O4SRV.TSITSTSH AT (\"REMOTE_EAST\") HISTORY() WHERE  DELTASTAT = \"Y\"");

    // Attribute form: unknown attributes are left out with their comma.
    Record c;
    c.table("ZAG.CPU").column("Busy_Percent").column("Nope").column("CPU_ID");
    c.r.attributeForm = 1;
    EXPECT_EQ(build(c), "SELECT BUSYPCT,CPUID FROM ZAG.CPU ");

    // No columns: every column of the table in catalog order.
    Record d;
    d.table("ZAG.CPU").parma("NODELIST", "x").filter("CPUID", "eq", "1").filter("BUSYPCT", "GT", "9000");
    EXPECT_EQ(build(d),
              "SELECT ORIGINNODE,TIMESTAMP,CPUID,BUSYPCT,USERPCT,SYSPCT FROM ZAG.CPU WHERE  SYSTEM.PARMA(\"NODELIST\", "
              "\"x\", 1) AND  CPUID = 1 AND BUSYPCT > 9000");

    // History adds WRITETIME in front of a private copy of the table.
    Record e;
    e.table("ZAG.DISK").column("MOUNT");
    e.r.history = 1;
    FakeHttp server;
    WSQL_Request req(&hub, &server);
    ASSERT_EQ(req.InitReq(&e.r, "start"), 0);
    EXPECT_STREQ(req.getSQL(), "SELECT MOUNT FROM ZAG.DISK HISTORY() ");
    WSQL_Table* copy = req.getTable();
    EXPECT_NE(copy, kshtest::catalog()->GetTable("ZAG.DISK"));
    LinkedListIter it(copy->Columns());
    auto* first = static_cast<WSQL_Column*>(it.Next());
    EXPECT_STREQ(first->ColName(), "WRITETIME");
    EXPECT_STREQ(first->AttrName(), "Write_Time");
    EXPECT_EQ(kshtest::catalog()->GetTable("ZAG.DISK")->GetColumn("WRITETIME"), nullptr);
}

TEST_F(KshReqSql, FilterValuesAreQuotedByColumnTypeAndAlwaysEscaped) {
    EXPECT_STREQ(WSQL_Request::filterOper("eq"), "=");
    EXPECT_STREQ(WSQL_Request::filterOper("Ne"), "<>");
    EXPECT_STREQ(WSQL_Request::filterOper("LIKE"), "LIKE");
    EXPECT_STREQ(WSQL_Request::filterOper("="), "");
    EXPECT_STREQ(WSQL_Request::filterOper(nullptr), "");

    Record r;
    r.table("O4SRV.TSITDESC").column("SITNAME");
    r.filter("SITNAME", "EQ", "x\" OR \"1\"=\"1");   // character: quoted, quote doubled
    r.filter("Text", "EQ", "caf\xc3\xa9", true);      // attribute of a national column
    r.filter("REEV_DAYS", "NE", "0");
    EXPECT_EQ(build(r),
              "SELECT SITNAME FROM O4SRV.TSITDESC WHERE  SITNAME = \"x\"\" OR \"\"1\"\"=\"\"1\" AND TEXT =  N\"caf\xc3\xa9\" "
              "AND REEV_DAYS <> \"0\"");
    // The attribute filter now names its column.
    EXPECT_STREQ(r.r.filters[1].column, "TEXT");
    EXPECT_EQ(r.r.filters[1].isAfilter, 0);

    // An integer column takes numbers bare, anything else as a literal.
    Record n;
    n.table("ZAG.CPU").column("CPUID").filter("CPUID", "EQ", "1 OR 1=1").filter("BUSYPCT", "GE", "-12.5");
    EXPECT_EQ(build(n), "SELECT CPUID FROM ZAG.CPU WHERE  CPUID = \"1 OR 1=1\" AND BUSYPCT >= -12.5");

    // A request that keeps its statement binds markers instead.
    Record p;
    p.table("ZAG.CPU").column("CPUID").filter("CPUID", "EQ", "1").persist();
    EXPECT_EQ(build(p), "SELECT CPUID FROM ZAG.CPU WHERE  CPUID = ?");
    EXPECT_EQ(lastType & (WSQL_TYPE_PERSISTED | WSQL_TYPE_ASYNC | WSQL_TYPE_BOUNDINPUT),
              WSQL_TYPE_PERSISTED | WSQL_TYPE_ASYNC | WSQL_TYPE_BOUNDINPUT);

    // An unknown filter column of an all-columns request joins the table as
    // character data.
    Record u;
    u.table("O4SRV.TEVTDEST").filter("NOTACOL", "EQ", "v");
    std::string sql = build(u);
    EXPECT_NE(sql.find(" NOTACOL = \"v\""), std::string::npos) << sql;
    WSQL_Column* added = kshtest::catalog()->GetTable("O4SRV.TEVTDEST")->GetColumn("NOTACOL");
    ASSERT_NE(added, nullptr);
    EXPECT_EQ(added->GetType(), 452);
}

TEST_F(KshReqSql, NamesThatAreNotIdentifiersNeverReachTheStatement) {
    int rc = 0;
    FakeHttp server;
    Record t;
    t.table("ZAG.CPU WHERE 1=1 --").column("CPUID");
    (void)build(t, "start", &rc, nullptr, &server);
    EXPECT_EQ(rc, WSQL_NOTFOUND);
    EXPECT_FALSE(hadSelect);
    EXPECT_STREQ(server.getFaultString(), "Invalid object name");
    EXPECT_TRUE(server.isClientFault());

    const char* bad[] = {"CPUID,BUSYPCT", "1=1", "A B", "X\"Y", ""};
    for (const char* name : bad) {
        FakeHttp s1, s2, s3;
        Record col;
        col.table("ZAG.CPU").column(name);
        EXPECT_EQ((build(col, "start", &rc, nullptr, &s1), rc), WSQL_NOTFOUND) << name;
        EXPECT_FALSE(hadSelect) << name;
        EXPECT_STREQ(s1.getFaultString(), "No valid attributes found for object");
        Record flt;
        flt.table("ZAG.CPU").column("CPUID").filter(name, "EQ", "1");
        EXPECT_EQ((build(flt, "start", &rc, nullptr, &s2), rc), WSQL_NOTFOUND) << name;
        Record ins;
        ins.table("O4SRV.TEVTDEST").value("DESTID", "1").value(name, "x");
        EXPECT_EQ((build(ins, "insert", &rc, nullptr, &s3), rc), WSQL_NOTFOUND) << name;
        EXPECT_FALSE(hadSelect);
    }
    // A quoted node name is a value: escaped, not refused.
    Record node;
    node.table("O4SRV.TSITDESC").column("SITNAME");
    node.r.thrunode = node.keep("N\"1");
    EXPECT_EQ(build(node), "SELECT SITNAME FROM O4SRV.TSITDESC AT (\"N\"\"1\")  ");
}

TEST_F(KshReqSql, StatementsThatDoNotFitFailWithoutBeingSent) {
    int rc = 0;
    Record big;
    big.table("O4SRV.TSITDESC");
    for (int i = 0; i < 200; i++) big.column("COLUMN_NAME_WITH_A_LONG_SPELLING_NUMBER_" + std::to_string(i));
    std::string sql = build(big, "start", &rc);
    EXPECT_EQ(rc, WSQL_NOMEM);
    EXPECT_FALSE(hadSelect);
    EXPECT_LT(sql.size(), WSQL_SQL_SIZE);
    // The text ends with the last term that fitted whole.
    size_t comma = sql.rfind(',');
    ASSERT_NE(comma, std::string::npos);
    std::string last = sql.substr(comma + 1);
    EXPECT_EQ(last.rfind("COLUMN_NAME_WITH_A_LONG_SPELLING_NUMBER_", 0), 0u) << last;
    EXPECT_EQ(big.r.columns[std::stoi(last.substr(40))], last);
    EXPECT_EQ(sql.find("NUMBER_199"), std::string::npos);

    Record value;
    value.table("O4SRV.TSITDESC").column("SITNAME").filter("SITNAME", "EQ", std::string(5000, '"'));
    (void)build(value, "start", &rc);  // doubled quotes make 10000 bytes
    EXPECT_EQ(rc, WSQL_NOMEM);
    EXPECT_FALSE(hadSelect);

    Record pre;
    pre.table("O4SRV.TSITDESC");
    pre.r.sql = pre.keep("SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME <> \"" + std::string(8100, 'x') + "\"");
    (void)build(pre, "start", &rc);
    EXPECT_EQ(rc, WSQL_NOMEM);

    Record ok;
    ok.table("O4SRV.TSITDESC");
    ok.r.sql = ok.keep("SELECT SITNAME FROM O4SRV.TSITDESC");
    EXPECT_EQ(build(ok, "start", &rc), "SELECT SITNAME FROM O4SRV.TSITDESC");
    EXPECT_EQ(rc, 0);
    EXPECT_TRUE(kshtest::catalog()->GetTable("O4SRV.TSITDESC")->dynamicAdd());
}

TEST_F(KshReqSql, InsertUpdateAndDeleteShapes) {
    Record ins;
    ins.table("O4SRV.TEVTDEST").value("NAME", "x").value("DESTID", "5");
    EXPECT_EQ(build(ins, "insert"), "INSERT INTO O4SRV.TEVTDEST AT (\"*HUB\") ( NAME,DESTID) VALUES( \"x\",  5  )");
    EXPECT_TRUE(lastType & WSQL_TYPE_INSERT);

    Record nat;
    nat.table("O4SRV.TSITDESC").value("SITNAME", "S\"1").value("TEXT", "t").value("REEV_DAYS", "0").value("UNKNOWNCOL", "u");
    nat.r.thrunode = nat.keep("REMOTE_EAST");
    EXPECT_EQ(build(nat, "INSERT"),
              "INSERT INTO O4SRV.TSITDESC AT (\"REMOTE_EAST\") ( SITNAME,TEXT,REEV_DAYS,UNKNOWNCOL) VALUES( \"S\"\"1\",N\"t\",  0 , \"u\" )");

    // Filters stand in for values; bound input writes markers.
    Record flt;
    flt.table("O4SRV.CLACTRMT").filter("ACTSECURE", "EQ", "me").filter("CLCMD", "EQ", "thresh:x");
    flt.r.type |= WSQL_TYPE_BOUNDINPUT;
    EXPECT_EQ(build(flt, "insert"), "INSERT INTO O4SRV.CLACTRMT AT (\"*HUB\") ( ACTSECURE,CLCMD) VALUES( ?, ? )");

    Record none;
    none.table("O4SRV.TEVTDEST");
    int rc = 0;
    (void)build(none, "insert", &rc);
    EXPECT_EQ(rc, WSQL_NOTFOUND);
    (void)build(none, "update", &rc);
    EXPECT_EQ(rc, WSQL_NOTFOUND);

    Record up;
    up.table("O4SRV.TEVTDEST").value("NAME", "x");
    EXPECT_EQ(build(up, "update"), "UPDATE O4SRV.TEVTDEST SET NAME =  \"x\" ");
    Record up2;
    up2.table("O4SRV.TEVTDEST").value("NAME", "it's \"new\"").value("DESTID", "3").filter("DESTID", "EQ", "5").filter(
        "NAME", "NE", "y");
    up2.r.thrunode = up2.keep("REMOTE_EAST");
    EXPECT_EQ(build(up2, "update"),
              "UPDATE O4SRV.TEVTDEST AT (\"REMOTE_EAST\") SET NAME =  \"it's \"\"new\"\"\",DESTID =   3  WHERE DESTID =   5  AND "
              "NAME <>  \"y\" ");
    EXPECT_TRUE(lastType & WSQL_TYPE_UPDATE);

    Record del;
    del.table("O4SRV.TEVTDEST").filter("DESTID", "EQ", "1").filter("NAME", "EQ", "a\"b");
    EXPECT_EQ(build(del, "delete"), "DELETE FROM O4SRV.TEVTDEST AT (\"*HUB\") WHERE  DESTID = \"1\" AND  NAME = \"a\"\"b\"");
    EXPECT_TRUE(lastType & WSQL_TYPE_DELETE);
}

TEST_F(KshReqSql, TableResolutionByObjectVersionAndDynamicTables) {
    Record obj;
    obj.table("ZAG_DISK").column("MOUNT");
    obj.r.methods = WSQL_METHOD_GET;
    obj.r.elements = WSQL_ELEM_OBJECT;
    EXPECT_EQ(build(obj), "SELECT MOUNT FROM ZAG.DISK ");

    // A versioned name the catalog knows only without the V.
    Record ver;
    ver.table("ZAG.VDISK").column("MOUNT");
    EXPECT_EQ(build(ver), "SELECT MOUNT FROM ZAG.VDISK ");
    EXPECT_EQ(ver.r.versionedTable, 1);

    // Unknown, with columns: a dynamic table; without: refused.
    Record dyn;
    dyn.table("NODOT").column("A");
    EXPECT_EQ(build(dyn), "SELECT A FROM NODOT ");
    WSQL_Table* t = kshtest::catalog()->GetTable("NODOT");
    ASSERT_NE(t, nullptr);
    EXPECT_TRUE(t->dynamicAdd());
    EXPECT_STREQ(t->AttributeFilename(), "DynamicObject");
    int rc = 0;
    FakeHttp server;
    Record unknown;
    unknown.table("NO.SUCH_TABLE");
    (void)build(unknown, "start", &rc, nullptr, &server);
    EXPECT_EQ(rc, WSQL_NOTFOUND);
    EXPECT_STREQ(server.getFaultDetail(), "NO.SUCH_TABLE");

    char name[] = "1.Disk_Name%";
    EXPECT_EQ(WSQL_ConvertAttr(name), 0);
    EXPECT_STREQ(name, "Disk_Name");
}

namespace {
int resolveToEast(const char*, const char*, char* out, int size) {
    std::snprintf(out, static_cast<size_t>(size), "%s", "REMOTE_EAST");
    return 0;
}
int resolveToNothing(const char*, const char*, char* out, int) {
    out[0] = '\0';
    return 0;
}
}  // namespace

TEST_F(KshReqSql, TargetsAreRoutedThroughTheTopologyCache) {
    FrozenClock clock;
    TestStore store("REQSQL_ROUTES");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub routed(store.lms(), "soap", "routes", nullptr);
    DS_SQLRequest probe(&routed, nullptr);
    probe.useGlobalPath();
    ASSERT_EQ(probe.login(0), 0);

    // All targets: the hub and the online managing servers with the
    // table's application.
    Record all;
    all.table("ZAG.CPU").column("CPUID").parma("NODELIST", "*ALL");
    all.r.type = WSQL_TYPE_ALLTARGETS;
    EXPECT_EQ(build(all, "start", nullptr, &routed),
              "SELECT CPUID FROM ZAG.CPU AT (\"*HUB\",\"REMOTE_EAST\")   WHERE  SYSTEM.PARMA(\"NODELIST\", \"*ALL\", 4)");
    Record sys;  // no managing server has an application "SYSTEM"
    sys.table("SYSTEM.SYSAPPLS").column("NODE");
    sys.r.type = WSQL_TYPE_ALLTARGETS;
    EXPECT_EQ(build(sys, "start", nullptr, &routed), "SELECT NODE FROM SYSTEM.SYSAPPLS  ");
    Record nodot;
    nodot.table("NODOT").column("A");
    nodot.r.type = WSQL_TYPE_ALLTARGETS;
    EXPECT_EQ(build(nodot, "start", nullptr, &routed), "SELECT A FROM NODOT  ");

    ASSERT_TRUE(store.exec("UPDATE \"O4SRV.INODESTS\" SET O4ONLINE = 'N' WHERE NODE = 'REMOTE_EAST'"));
    clock.step(121);
    EXPECT_EQ(build(all, "start", nullptr, &routed),
              "SELECT CPUID FROM ZAG.CPU AT (\"*HUB\")   WHERE  SYSTEM.PARMA(\"NODELIST\", \"*ALL\", 4)");

    // One target: a managed system is routed to itself, a node list not.
    Record agent;
    agent.table("ZAG.CPU").column("CPUID");
    agent.r.target = agent.keep("alpha:ZAG");
    EXPECT_EQ(build(agent, "start", nullptr, &routed), "SELECT CPUID FROM ZAG.CPU AT (\"alpha:ZAG\")  ");
    Record list;
    list.table("ZAG.CPU").column("CPUID");
    list.r.target = list.keep("*ZAG_HOSTS");
    EXPECT_EQ(build(list, "start", nullptr, &routed), "SELECT CPUID FROM ZAG.CPU ");

    // A managing server that is offline.
    int rc = 0;
    FakeHttp offline;
    Record east;
    east.table("ZAG.CPU").column("CPUID");
    east.r.target = east.keep("REMOTE_EAST");
    (void)build(east, "start", &rc, &routed, &offline);
    EXPECT_EQ(rc, WSQL_NOTFOUND);
    EXPECT_STREQ(offline.getFaultString(), "Managing system not online");
    EXPECT_FALSE(offline.isClientFault());

    // A node reached through another node: the resolver decides.
    Record sw;
    sw.table("ZAG.CPU").column("CPUID");
    sw.r.target = sw.keep("*ALL_LMS");
    KFA_ResolveThruNode_t loaded = WSQL_Request::setResolver(nullptr);
    FakeHttp noResolver;
    (void)build(sw, "start", &rc, &routed, &noResolver);
    EXPECT_EQ(rc, WSQL_FAULT);
    EXPECT_STREQ(noResolver.getFaultString(), "System error function not found");
    (void)WSQL_Request::setResolver(resolveToEast);
    EXPECT_EQ(build(sw, "start", nullptr, &routed), "SELECT CPUID FROM ZAG.CPU AT (\"REMOTE_EAST\")  ");
    (void)WSQL_Request::setResolver(resolveToNothing);
    EXPECT_EQ(build(sw, "start", nullptr, &routed), "SELECT CPUID FROM ZAG.CPU ");  // the cached HUB_MAIN is the hub
    (void)WSQL_Request::setResolver(loaded);

    // The resolver the request layer loaded answers from the store.
    ASSERT_NE(loaded, nullptr);
    char thru[33];
    EXPECT_EQ(loaded(store.lms(), "beta:ZAG", thru, sizeof thru), 0);
    EXPECT_STREQ(thru, "REMOTE_EAST");
    EXPECT_EQ(loaded(store.lms(), "nobody", thru, sizeof thru), 0);
    EXPECT_STREQ(thru, "");
    EXPECT_NE(loaded("REQSQL_UNKNOWN_LMS", "beta:ZAG", thru, sizeof thru), 0);
}
