// The hub object against a real store: access rules, the server path, the
// shared path drop, and the topology cache (queried once, shared templates,
// node lists, node status refresh at most every 120 seconds).
#include "kshhub.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "kshanchor.h"
#include "kshreq.h"
#include "kshreqfix.h"
#include "wsql_rc.h"

using kshtest::FrozenClock;
using kshtest::TestStore;

namespace {

LinkedList* userList(std::initializer_list<const char*> names) {
    auto* l = new LinkedList(WSQL_FreeText);
    for (const char* n : names) (void)l->AppendEntry(strdup(n));
    return l;
}

std::vector<std::string> names(LinkedList* nodes) {
    std::vector<std::string> out;
    if (nodes == nullptr) return out;
    LinkedListIter it(nodes);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) out.emplace_back(static_cast<Node*>(v)->getName());
    return out;
}

SitTemplate* templateNamed(LinkedList* temps, const char* name) {
    if (temps == nullptr) return nullptr;
    LinkedListIter it(temps);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) {
        auto* t = static_cast<SitTemplate*>(v);
        if (std::strcmp(t->getTemplate(), name) == 0) return t;
    }
    return nullptr;
}

ManagedObj* firstMO(SitTemplate* t) {
    LinkedListIter it(t->getMOList());
    return static_cast<ManagedObj*>(it.Next());
}

class KshHubCache : public ::testing::Test {
protected:
    static void SetUpTestSuite() { ASSERT_EQ(WSQL_Request::initialize(), 0); }
    static void TearDownTestSuite() { (void)WSQL_Request::terminate(); }
};

}  // namespace

TEST(KshHub, AccessFollowsTheQueryAndUpdateLists) {
    WSQL_Hub open("HUB_ACCESS_OPEN", "soap", "a", nullptr);
    EXPECT_EQ(open.verifyUser("anyone"), WSQL_ACCESS_UPDATE);
    EXPECT_EQ(open.verifyUser(nullptr), WSQL_ACCESS_UPDATE);

    WSQL_Hub queryOnly("HUB_ACCESS_Q", "soap", "q", nullptr);
    queryOnly.setQueryUserList(userList({"reader"}));
    EXPECT_EQ(queryOnly.verifyUser("reader"), WSQL_ACCESS_QUERY);
    EXPECT_EQ(queryOnly.verifyUser("READER"), WSQL_ACCESS_NONE);  // names compared exactly
    EXPECT_EQ(queryOnly.verifyUser("other"), WSQL_ACCESS_NONE);
    EXPECT_EQ(queryOnly.verifyUser(nullptr), WSQL_ACCESS_NONE);

    WSQL_Hub both("HUB_ACCESS_QU", "soap", "qu", nullptr);
    both.setQueryUserList(userList({"reader", "writer"}));
    both.setUpdateUserList(userList({"writer"}));
    EXPECT_EQ(both.verifyUser("writer"), WSQL_ACCESS_UPDATE);
    EXPECT_EQ(both.verifyUser("reader"), WSQL_ACCESS_QUERY);
}

TEST(KshHub, NamesAndServerPathOfLocalAndRemoteHubs) {
    WSQL_Hub hub("LMS_A", "SoAp", "alias", "qual");
    EXPECT_STREQ(hub.getLMSName(), "LMS_A[qual]");
    EXPECT_STREQ(hub.getServiceName(), "soap");
    EXPECT_STREQ(hub.getAliasName(), "alias");

    const std::string remote = "NCS:{SOCKET=LMS_A} CT/DS:{SERVER=SRVR01 USER=KSH TERMPATH=INVOWNER OWNER=KSH}";
    EXPECT_EQ(hub.setServerPath("LMS_A", "HUB_A"), static_cast<int>(remote.size()));
    char path[256];
    ASSERT_TRUE(hub.copyServerPath(path, sizeof path));
    EXPECT_EQ(remote, path);
    EXPECT_FALSE(hub.copyServerPath(path, 10));  // does not fit: nothing cut
    EXPECT_STREQ(hub.getNodeID(), "HUB_A");
    EXPECT_EQ(hub.getValidate(), WSQL_VALIDATE_UNKNOWN);

    // The node named like the local server's alias is the local hub: its
    // settings come from the host's record, not from a logon.
    WSQL_LocalServer local{};
    std::snprintf(local.alias, sizeof local.alias, "%s", "HUB_LOCAL");
    local.aliasLength = 9;
    local.version = 621;
    local.build = 77;
    local.options = WSQL_LOCAL_NLS;
    WSQL_Anchor anchor;
    anchor.flags = WSQL_ANCHOR_EMBEDDED | WSQL_ANCHOR_VALIDATE;
    anchor.localServer = &local;
    gAnchor = &anchor;
    WSQL_Hub lh("LOCAL_LMS", "soap", "soap", nullptr);
    EXPECT_EQ(lh.setServerPath("LOCAL_LMS", "HUB_LOCAL"), 30);
    ASSERT_TRUE(lh.copyServerPath(path, sizeof path));
    EXPECT_STREQ(path, "CT/DS:{SERVER=SRVR01 USER=KSH}");
    EXPECT_EQ(lh.getValidate(), WSQL_VALIDATE_ON);
    EXPECT_EQ(lh.getLMSVersion(), 621);
    EXPECT_TRUE(lh.isHubNLS());
    // Same bytes but a different length is not the local alias.
    WSQL_Hub near("LOCAL_LMS", "soap", "x", nullptr);
    (void)near.setServerPath("LOCAL_LMS", "HUB_LOCAL2");
    ASSERT_TRUE(near.copyServerPath(path, sizeof path));
    EXPECT_EQ(std::strncmp(path, "NCS:", 4), 0);
    gAnchor = nullptr;
}

TEST(KshHub, OnlyConnectionLevelStatusesDropTheSharedPath) {
    TestStore store("HUB_DROP");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "drop", nullptr);
    DS_SQLRequest r(&hub, nullptr);
    r.useGlobalPath();
    ASSERT_EQ(r.login(0), 0);
    SQL1_Handle global = hub.getGlobalPathHdl();

    for (int status : {149, 200, 514, 0}) {
        EXPECT_EQ(hub.setGlobalPathStatus(status), 0);
        EXPECT_TRUE(SQL1_IsCurrent(hub.getGlobalPathHdl())) << status;
        EXPECT_TRUE(hub.hasServerPath()) << status;
        EXPECT_EQ(hub.getGlobalState(), DS_SQLRequest::SQL_LOGGEDON) << status;
    }
    EXPECT_EQ(hub.setGlobalPathStatus(150), 0);
    EXPECT_FALSE(SQL1_IsCurrent(global));
    EXPECT_FALSE(hub.hasServerPath());
    EXPECT_EQ(hub.getGlobalState(), DS_SQLRequest::SQL_NOTLOGGEDON);
    EXPECT_EQ(hub.getValidate(), WSQL_VALIDATE_UNKNOWN);
    // Without a shared path the server path still goes for 199.
    (void)hub.setServerPath(store.lms(), "HUB_MAIN");
    EXPECT_EQ(hub.setGlobalPathStatus(199), 0);
    EXPECT_FALSE(hub.hasServerPath());
}

TEST_F(KshHubCache, TemplatesAreQueriedOnceAndSharedBetweenSituations) {
    TestStore store("HUB_TEMPLATES");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "tmpl", nullptr);

    LinkedList* disk = hub.getCachedTempsForSit("ZAG_Disk_Full");
    ASSERT_NE(disk, nullptr);
    EXPECT_EQ(disk->NumEntries(), 2u);
    unsigned afterFirst = hub.getCacheQueryCount();
    EXPECT_EQ(hub.getCachedTempsForSit("ZAG_Disk_Full"), disk);
    EXPECT_EQ(hub.getCacheQueryCount(), afterFirst);

    SitTemplate* health = templateNamed(disk, "ZAG_Host_Health");
    SitTemplate* storage = templateNamed(disk, "ZAG_Storage");
    ASSERT_NE(health, nullptr);
    ASSERT_NE(storage, nullptr);
    EXPECT_STREQ(health->getState(), "Critical");  // the state of the row that cached it
    EXPECT_EQ(names(firstMO(storage)->getMSList()), (std::vector<std::string>{"beta:ZAG", "gamma:ZAG"}));
    EXPECT_EQ(names(firstMO(health)->getMSList()),
              (std::vector<std::string>{"alpha:ZAG", "beta:ZAG", "gamma:ZAG"}));

    // The second situation of the shared template: one query for its
    // templates, none for the template's managed objects.
    LinkedList* cpu = hub.getCachedTempsForSit("ZAG_CPU_Busy");
    EXPECT_EQ(hub.getCacheQueryCount(), afterFirst + 1);
    ASSERT_NE(cpu, nullptr);
    EXPECT_EQ(templateNamed(cpu, "ZAG_Host_Health"), health);

    // A situation without templates is remembered as such.
    EXPECT_EQ(hub.getCachedTempsForSit("UADVISOR_ZAG_CPU"), nullptr);
    unsigned n = hub.getCacheQueryCount();
    EXPECT_EQ(hub.getCachedTempsForSit("UADVISOR_ZAG_CPU"), nullptr);
    EXPECT_EQ(hub.getCacheQueryCount(), n);

    // A name with a quote is a value, never part of the statement.
    EXPECT_EQ(hub.getCachedTempsForSit("x\" OR \"1\"=\"1"), nullptr);
}

TEST_F(KshHubCache, NodeListsAndManagedSystemsComeFromTheCache) {
    TestStore store("HUB_NODES");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "nodes", nullptr);

    Node* all = hub.lookupCachedNode("*ALL_LMS");
    ASSERT_NE(all, nullptr);
    EXPECT_STREQ(all->getThrunode(), "HUB_MAIN");  // the hub's own V row
    EXPECT_EQ(names(all->getNodeList()), (std::vector<std::string>{"HUB_MAIN", "REMOTE_EAST"}));
    Node* east = hub.lookupCachedNode("REMOTE_EAST");
    EXPECT_STREQ(east->getThrunode(), "REMOTE_EAST");

    Node* hosts = hub.lookupCachedNode("*ZAG_HOSTS");
    ASSERT_NE(hosts, nullptr);
    EXPECT_EQ(names(hosts->getNodeList()), (std::vector<std::string>{"alpha:ZAG", "beta:ZAG", "gamma:ZAG"}));
    // Members are the cached nodes themselves; a plain system has no list.
    Node* beta = hub.lookupCachedNode("beta:ZAG");
    ASSERT_NE(beta, nullptr);
    EXPECT_EQ(beta->getNodeList(), nullptr);
    Node* eastList = hub.lookupCachedNode("*EAST");
    ASSERT_NE(eastList, nullptr);
    LinkedListIter it(eastList->getNodeList());
    EXPECT_EQ(it.Next(), beta);
    unsigned n = hub.getCacheQueryCount();
    EXPECT_EQ(hub.lookupCachedNode("*ZAG_HOSTS"), hosts);
    EXPECT_EQ(hub.getCacheQueryCount(), n);

    // Managed systems: a node list adds its members once each; plain nodes
    // are added as often as they are named.
    SitTemplate t("T", -1, "S", -1);
    auto* mos = new LinkedList(destroy_ManagedObj);
    (void)mos->AppendEntry(new ManagedObj("plain", -1, "alpha:ZAG,beta:ZAG,beta:ZAG", -1));
    (void)mos->AppendEntry(new ManagedObj("lists", -1, "*ZAG_HOSTS, *EAST,*ZAG_HOSTS", -1));
    t.setMOList(mos);
    t.buildMSLists(&hub);
    LinkedListIter mi(mos);
    auto* plain = static_cast<ManagedObj*>(mi.Next());
    auto* lists = static_cast<ManagedObj*>(mi.Next());
    EXPECT_EQ(names(plain->getMSList()), (std::vector<std::string>{"alpha:ZAG", "beta:ZAG", "beta:ZAG"}));
    EXPECT_EQ(names(lists->getMSList()), (std::vector<std::string>{"alpha:ZAG", "beta:ZAG", "gamma:ZAG"}));
}

TEST_F(KshHubCache, NodeStatusIsRefreshedAtMostEvery120Seconds) {
    FrozenClock clock;
    TestStore store("HUB_STATUS");
    ASSERT_EQ(store.status(), 0);
    WSQL_Hub hub(store.lms(), "soap", "status", nullptr);

    ASSERT_EQ(hub.refreshCachedNodeStatus("*ALL_LMS"), 0);
    Node* east = hub.lookupCachedNode("REMOTE_EAST");
    Node* main = hub.lookupCachedNode("HUB_MAIN");
    EXPECT_EQ(east->getOnline(), 'Y');
    EXPECT_EQ(main->getOnline(), 'Y');
    ASSERT_NE(east->lookupNodeAppl("ZAG"), nullptr);  // loaded for online members
    EXPECT_EQ(east->lookupNodeAppl("O4SRV"), nullptr);
    EXPECT_NE(main->lookupNodeAppl("O4SRV"), nullptr);
    EXPECT_STREQ(east->lookupNodeAppl("ZAG")->getVersion(), "01.02.00");

    ASSERT_TRUE(store.exec("UPDATE \"O4SRV.INODESTS\" SET O4ONLINE = 'N' WHERE NODE = 'REMOTE_EAST'"));
    unsigned n = hub.getCacheQueryCount();
    clock.step(120);
    ASSERT_EQ(hub.refreshCachedNodeStatus("*ALL_LMS"), 0);
    EXPECT_EQ(hub.getCacheQueryCount(), n);  // not later than refresh + 120: no query
    EXPECT_EQ(east->getOnline(), 'Y');
    clock.step(1);
    ASSERT_EQ(hub.refreshCachedNodeStatus("*ALL_LMS"), 0);
    EXPECT_GT(hub.getCacheQueryCount(), n);
    EXPECT_EQ(east->getOnline(), 'N');

    // Status rows of nodes outside the refreshed list change nothing.
    Node* hosts = hub.lookupCachedNode("*ZAG_HOSTS");
    ASSERT_EQ(hub.refreshCachedNodeStatus("*ZAG_HOSTS"), 0);
    for (const std::string& m : names(hosts->getNodeList())) EXPECT_EQ(hub.lookupCachedNode(m.c_str())->getOnline(), ' ');
    EXPECT_EQ(hub.refreshCachedNodeStatus("*NO_SUCH_LIST"), 0);

    // After the shared path was dropped the kept status query is prepared
    // again on the new path.
    (void)hub.setGlobalPathStatus(151);
    ASSERT_TRUE(store.exec("UPDATE \"O4SRV.INODESTS\" SET O4ONLINE = 'Y' WHERE NODE = 'REMOTE_EAST'"));
    clock.step(121);
    ASSERT_EQ(hub.refreshCachedNodeStatus("*ALL_LMS"), 0);
    EXPECT_EQ(east->getOnline(), 'Y');
}
