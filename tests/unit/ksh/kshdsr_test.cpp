// Database request objects against real hub stores: logon over the hub's
// shared path and over own paths, what the first logon learns about the
// server, the reconnect after a lost connection, marker binding and the
// state machine.
#include "kshdsr.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <string>

#include "kshhub.h"
#include "kshreqfix.h"
#include "wsql_rc.h"

using kshtest::TestStore;

namespace {

void setLogin(DS_SQLRequest& r, const char* user, const char* password) {
    SQL1_LoginId* id = r.loginId();
    std::memset(id, 0, sizeof *id);
    std::strncpy(id->userId, user, sizeof id->userId);
    std::strncpy(id->password, password, sizeof id->password);
    std::strncpy(id->clientHost, "10.1.2.3", sizeof id->clientHost);
}

// Fetches the first column of every row of an open select.
std::vector<std::string> column0(DS_SQLSelect& s) {
    std::vector<std::string> out;
    while (s.fetch() == 0) {
        const SQL1_SqlVar& v = s.getOutputSQLDA()->var[0];
        std::string t(v.data, v.length);
        while (!t.empty() && t.back() == ' ') t.pop_back();
        out.push_back(t);
    }
    return out;
}

}  // namespace

TEST(KshDsr, FirstLogonLearnsValidationVersionAndNLSFromTheServer) {
    SQL1_StoreOptions on;
    on.validate = 1;
    TestStore validating("DSR_VALIDATING", on);
    ASSERT_EQ(validating.status(), 0);
    WSQL_Hub hub(validating.lms(), "soap", "dsrv", nullptr);
    EXPECT_EQ(hub.getValidate(), WSQL_VALIDATE_UNKNOWN);

    DS_SQLRequest probe(&hub, nullptr);
    probe.useGlobalPath();
    ASSERT_EQ(probe.login(0), 0);
    EXPECT_EQ(probe.CurrentState(), DS_SQLRequest::SQL_LOGGEDON);
    EXPECT_EQ(hub.getValidate(), WSQL_VALIDATE_ON);
    EXPECT_EQ(hub.getLMSVersion(), 630);
    EXPECT_TRUE(hub.isHubNLS());
    EXPECT_EQ(hub.getGlobalState(), DS_SQLRequest::SQL_LOGGEDON);
    EXPECT_STREQ(hub.getNodeID(), "HUB_MAIN");

    SQL1_StoreOptions off;
    off.validate = 0;
    TestStore open("DSR_OPEN", off);
    WSQL_Hub openHub(open.lms(), "soap", "dsro", nullptr);
    DS_SQLRequest probe2(&openHub, nullptr);
    probe2.useGlobalPath();
    ASSERT_EQ(probe2.login(0), 0);
    EXPECT_EQ(openHub.getValidate(), WSQL_VALIDATE_OFF);
}

TEST(KshDsr, AnOldServerLevelIsNotNLSCapableSoEveryLogonFailsWith107) {
    SQL1_StoreOptions old;
    old.level = 300;
    TestStore store("DSR_OLDLEVEL", old);
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "dsrold", nullptr);

    DS_SQLRequest global(&hub, nullptr);
    global.useGlobalPath();
    EXPECT_EQ(global.login(0), WSQL_NONLS);
    EXPECT_EQ(hub.getValidate(), WSQL_VALIDATE_UNSURE);
    EXPECT_FALSE(hub.isHubNLS());
    EXPECT_EQ(global.CurrentState(), DS_SQLRequest::SQL_NOTLOGGEDON);

    DS_SQLRequest own(&hub, nullptr);
    setLogin(own, "sysadmin", "adminpw");
    EXPECT_EQ(own.login(1), WSQL_NONLS);
    EXPECT_EQ(own.CurrentState(), DS_SQLRequest::SQL_NOTLOGGEDON);
}

TEST(KshDsr, OwnPathLogonChecksTheUsersPasswordWhenTheHubValidates) {
    SQL1_StoreOptions on;
    on.validate = 1;
    TestStore store("DSR_USERS", on);
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "dsru", nullptr);

    DS_SQLRequest wrong(&hub, nullptr);
    setLogin(wrong, "sysadmin", "not-it");
    EXPECT_EQ(wrong.login(1), SQL1_ST_LOGON_PASSWORD);
    EXPECT_EQ(wrong.CurrentState(), DS_SQLRequest::SQL_NOTLOGGEDON);

    DS_SQLRequest none(&hub, nullptr);
    setLogin(none, "sysadmin", "");
    EXPECT_EQ(none.login(1), SQL1_ST_LOGON_NOPASSWORD);

    DS_SQLRequest right(&hub, nullptr);
    setLogin(right, "sysadmin", "adminpw");
    EXPECT_EQ(right.login(1), 0);
    EXPECT_EQ(right.CurrentState(), DS_SQLRequest::SQL_LOGGEDON);

    // A request on the global path with flag bit 0 leaves it when the hub
    // validates users: its own (wrong) credentials then decide.
    DS_SQLRequest switched(&hub, nullptr);
    switched.useGlobalPath();
    setLogin(switched, "sysadmin", "bad");
    EXPECT_EQ(switched.login(1), SQL1_ST_LOGON_PASSWORD);
    EXPECT_FALSE(switched.usesGlobalPath());
}

TEST(KshDsr, LostConnectionWithAKnownPathReconnectsExactlyOnce) {
    TestStore store("DSR_RECONNECT");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "dsrr", nullptr);
    DS_SQLRequest first(&hub, nullptr);
    setLogin(first, "sysadmin", "adminpw");
    ASSERT_EQ(first.login(1), 0);
    SQL1_Handle oldGlobal = hub.getGlobalPathHdl();
    ASSERT_TRUE(SQL1_IsCurrent(oldGlobal));

    // One lost connection: the own path's creation fails, the hub drops its
    // paths, and the second pass looks the server up and logs on again.
    ASSERT_EQ(SQL1_InjectStatus(store.lms(), SQL1_ST_CONNLOST, 1, 0), 0);
    DS_SQLRequest again(&hub, nullptr);
    setLogin(again, "sysadmin", "adminpw");
    EXPECT_EQ(again.login(1), 0);
    EXPECT_EQ(again.CurrentState(), DS_SQLRequest::SQL_LOGGEDON);
    EXPECT_FALSE(SQL1_IsCurrent(oldGlobal));
    EXPECT_TRUE(SQL1_IsCurrent(hub.getGlobalPathHdl()));
    EXPECT_TRUE(hub.hasServerPath());

    // Two in a row: the retry meets the second one with no known path and
    // gives up instead of looping.
    ASSERT_EQ(SQL1_InjectStatus(store.lms(), SQL1_ST_CONNLOST, 2, 0), 0);
    DS_SQLRequest twice(&hub, nullptr);
    setLogin(twice, "sysadmin", "adminpw");
    EXPECT_EQ(twice.login(1), SQL1_ST_CONNLOST);
    EXPECT_EQ(twice.CurrentState(), DS_SQLRequest::SQL_NOTLOGGEDON);
    ASSERT_EQ(SQL1_InjectStatus(store.lms(), 0, 0, 0), 0);

    // And the next request finds the server again.
    DS_SQLRequest after(&hub, nullptr);
    after.useGlobalPath();
    EXPECT_EQ(after.login(0), 0);
}

TEST(KshDsr, UnknownServerFailsTheLookUpWith5) {
    WSQL_Hub hub("DSR_NO_SUCH_SERVER", "soap", "nohub", nullptr);
    DS_SQLRequest r(&hub, nullptr);
    r.useGlobalPath();
    EXPECT_EQ(r.login(0), WSQL_NOTFOUND);
    EXPECT_FALSE(hub.hasServerPath());
}

TEST(KshDsr, MarkersConvertTextByTheirTypeAndRefuseExplicitLengthsForNumbers) {
    TestStore store("DSR_MARKERS", {}, "CREATE TABLE \"ZAG.BLOBS\" (K BLOB(2), W BLOB(4), B BLOB(8));");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "dsrm", nullptr);

    DS_SQLTransaction ins(&hub, "INSERT INTO ZAG.BLOBS (K, W, B) VALUES (?, ?, ?)");
    ins.useGlobalPath();
    ASSERT_EQ(ins.login(0), 0);
    ASSERT_EQ(ins.create(0, nullptr), 0);
    ASSERT_EQ(ins.setInputValue(0, "0x1F", -1), 0);
    uint16_t k = 0;
    std::memcpy(&k, ins.getInputSQLDA()->var[0].data, 2);
    EXPECT_EQ(k, 31);
    ASSERT_EQ(ins.setInputValue(1, "0X0102", -1), 0);
    ASSERT_EQ(ins.setInputValue(2, "raw", -1), 0);  // no 0x: copied as bytes
    EXPECT_EQ(ins.setInputValue(0, "0x1F", 4), -1);  // explicit length: refused
    EXPECT_EQ(ins.setInputValue(3, "1", -1), -1);    // no such marker
    EXPECT_EQ(ins.setInputValue(0, 5), -1);          // an int only fits a 496 marker
    ASSERT_EQ(ins.setInputValue(0, "0x1F", -1), 0);
    ASSERT_EQ(ins.executeTransaction(), 0);
    auto rows = store.query("SELECT hex(K), hex(W), CAST(B AS TEXT) FROM \"ZAG.BLOBS\"");
    ASSERT_EQ(rows.size(), 1u);
    EXPECT_EQ(rows[0][0], "1F00");
    EXPECT_EQ(rows[0][1], "02010000");
    EXPECT_EQ(rows[0][2], "raw");

    // Numbers by prefix (octal, hex, decimal), characters by length.
    DS_SQLSelect sel(&hub, "SELECT MOUNT FROM ZAG.DISK WHERE SIZEMB = ? AND USEDPCT = ? AND STATUS = ? AND ORIGINNODE = ?");
    sel.useGlobalPath();
    ASSERT_EQ(sel.login(0), 0);
    ASSERT_EQ(sel.create(0, nullptr), 0);
    EXPECT_EQ(sel.setInputValue(0, "20480", 5), -1);
    ASSERT_EQ(sel.setInputValue(0, "20480", -1), 0);
    ASSERT_EQ(sel.setInputValue(1, "0141", -1), 0);  // octal 97
    ASSERT_EQ(sel.setInputValue(2, 2), 0);
    ASSERT_EQ(sel.setInputValue(3, "beta:ZAG-extra", 8), 0);  // first 8 bytes only
    ASSERT_EQ(sel.open(), 0);
    EXPECT_EQ(column0(sel), std::vector<std::string>{"/var"});
    ASSERT_EQ(sel.close(), 0);

    // Rebinding replaces the old value completely (the entry is cleaned).
    ASSERT_EQ(sel.setInputValue(0, "51200", -1), 0);
    ASSERT_EQ(sel.setInputValue(1, "0x32", -1), 0);
    ASSERT_EQ(sel.setInputValue(2, "0", -1), 0);
    ASSERT_EQ(sel.setInputValue(3, "beta:ZAG", -1), 0);
    ASSERT_EQ(sel.open(), 0);
    EXPECT_EQ(column0(sel), std::vector<std::string>{"/"});
}

TEST(KshDsr, CallsInTheWrongStateReturnMinusOneAndFailuresFallBack) {
    TestStore store("DSR_STATES");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "dsrs", nullptr);

    DS_SQLSelect s(&hub, "SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = \"ZAG_CPU_Busy\"");
    EXPECT_EQ(s.create(0, nullptr), -1);
    EXPECT_EQ(s.open(), -1);
    EXPECT_EQ(s.fetch(), -1);
    s.useGlobalPath();
    ASSERT_EQ(s.login(0), 0);
    EXPECT_EQ(s.login(0), -1);
    EXPECT_EQ(s.open(), -1);
    ASSERT_EQ(s.create(0, nullptr), 0);
    EXPECT_EQ(s.close(), -1);
    EXPECT_EQ(s.setInputValue(0, "x", -1), -1);  // the statement has no markers
    ASSERT_EQ(s.open(), 0);
    EXPECT_EQ(s.CurrentState(), DS_SQLRequest::SQL_OPEN);
    EXPECT_EQ(column0(s), std::vector<std::string>{"ZAG_CPU_Busy"});
    EXPECT_EQ(s.fetch(), WSQL_ENDOFDATA);
    EXPECT_EQ(s.drop(), -1);
    ASSERT_EQ(s.close(), 0);
    ASSERT_EQ(s.drop(), 0);
    EXPECT_EQ(s.CurrentState(), DS_SQLRequest::SQL_LOGGEDON);
    EXPECT_EQ(s.getOutputSQLDA(), nullptr);
    ASSERT_EQ(s.create(0, nullptr), 0);  // created again from the same text

    // A statement the server refuses: on the shared path the request stays
    // logged on, on an own path it is logged off.
    DS_SQLSelect badGlobal(&hub, "SELECT NOSUCH FROM O4SRV.TSITDESC");
    badGlobal.useGlobalPath();
    ASSERT_EQ(badGlobal.login(0), 0);
    EXPECT_NE(badGlobal.create(0, nullptr), 0);
    EXPECT_EQ(badGlobal.CurrentState(), DS_SQLRequest::SQL_LOGGEDON);

    DS_SQLSelect badOwn(&hub, "SELECT NOSUCH FROM O4SRV.TSITDESC");
    setLogin(badOwn, "sysadmin", "adminpw");
    ASSERT_EQ(badOwn.login(1), 0);
    EXPECT_NE(badOwn.create(0, nullptr), 0);
    EXPECT_EQ(badOwn.CurrentState(), DS_SQLRequest::SQL_NOTLOGGEDON);
}
