// Tests of the hub list: reading the hub list file, the hub list of each
// start mode, the rewrites of the file (with failing writes), and the
// thread stack size.
#include "kshssrv.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "kdh1/kdh1.h"
#include "kshanchor.h"
#include "kshdhtpsvc.h"
#include "kshhub.h"
#include "kshstrt.h"

namespace fs = std::filesystem;

namespace {

std::string readFile(const fs::path& p) {
    std::ifstream in(p, std::ios::binary);
    std::stringstream s;
    s << in.rdbuf();
    return s.str();
}

void writeFile(const fs::path& p, const std::string& text) {
    std::ofstream out(p, std::ios::binary);
    out << text;
}

std::string hubBlock(const std::string& lms, const std::string& service, const std::string& alias) {
    return "<HUB>\n<LMS_Name>" + lms + "</LMS_Name>\n<Service_Name>" + service + "</Service_Name>\n<Alias>" + alias +
           "</Alias>\n</HUB>\n\n";
}

std::vector<WSQL_Hub*> hubsOf(LinkedList* list) {
    std::vector<WSQL_Hub*> v;
    if (list == nullptr) return v;
    LinkedListIter it(list);
    for (void* p = it.Next(); p != nullptr; p = it.Next()) v.push_back(static_cast<WSQL_Hub*>(p));
    return v;
}

class HubFileTest : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/kshssrv_test.XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        root = tmpl;
        dir = root / "HTML";
        fs::create_directories(dir);
        setenv("KSH_DIRECTORY", dir.c_str(), 1);
        for (const char* v : {"KSH_HUB_FILE", "KDC_GLBSITES", "KSH_TASK_NAME"}) unsetenv(v);
        WSQL_SetFileDirectory(dir.c_str());
        WSQL_SetHubFileWriteHook(nullptr);
        // Hubs started here listen on a port of their own.
        ASSERT_EQ(KDH1_SetListenAddress("127.0.0.1", 0), 0u);
    }
    void TearDown() override {
        WSQL_SetHubFileWriteHook(nullptr);
        WSQL_SetFileDirectory(nullptr);
        gAnchor = nullptr;
        fs::remove_all(root);
    }
    LinkedList* readHubs(WSQL_Anchor* anchor, const std::string& text) {
        writeFile(dir / "kshxhubs.xml", text);
        FILE* f = WSQL_open_file("kshxhubs.xml", nullptr, "read");
        EXPECT_NE(f, nullptr);
        if (f == nullptr) return nullptr;
        LinkedList* list = WSQL_process_hub_file(anchor, f);
        fclose(f);
        return list;
    }

    fs::path root;
    fs::path dir;
};

TEST_F(HubFileTest, FileHubsKeepOrderAccessListsAndTheSoapAliasMarksTheLocalHub) {
    WSQL_Anchor anchor;
    LinkedList* list = readHubs(&anchor,
                                "<?xml version=\"1.0\"?>\n<ENTERPRISE>\n"
                                "<HUB><Alias>east</Alias><LMS_Name>LMS_EAST</LMS_Name><Service_Name>EastSvc</Service_Name>"
                                "<Access><Query><User>reader</User><User>viewer</User></Query>"
                                "<Update><User>admin</User></Update></Access></HUB>\n"
                                "<HUB><Alias>SOAP</Alias><LMS_Name>LMS_MAIN</LMS_Name><Service_Name>other</Service_Name></HUB>\n"
                                "<HUB><Alias>west</Alias><LMS_Name>LMS_WEST</LMS_Name></HUB>\n"
                                "</ENTERPRISE>\n");
    std::vector<WSQL_Hub*> hubs = hubsOf(list);
    ASSERT_EQ(hubs.size(), 3u);
    EXPECT_STREQ(hubs[0]->getAliasName(), "east");
    EXPECT_STREQ(hubs[0]->getLMSName(), "LMS_EAST");
    EXPECT_STREQ(hubs[0]->getServiceName(), "eastsvc");
    EXPECT_EQ(hubs[0]->verifyUser("reader"), WSQL_ACCESS_QUERY);
    EXPECT_EQ(hubs[0]->verifyUser("viewer"), WSQL_ACCESS_QUERY);
    EXPECT_EQ(hubs[0]->verifyUser("admin"), WSQL_ACCESS_UPDATE);
    EXPECT_EQ(hubs[0]->verifyUser("stranger"), WSQL_ACCESS_NONE);
    // The local hub's service is "soap" whatever the file says.
    EXPECT_STREQ(hubs[1]->getServiceName(), "soap");
    EXPECT_STREQ(hubs[2]->getServiceName(), "");
    EXPECT_EQ(hubs[2]->verifyUser("anyone"), WSQL_ACCESS_UPDATE);
    EXPECT_NE(anchor.flags & WSQL_ANCHOR_LOCALHUB, 0u);
    delete list;
}

TEST_F(HubFileTest, AHubWithoutLmsNameEndsTheReadingAndABrokenFileGivesNone) {
    WSQL_Anchor anchor;
    LinkedList* list = readHubs(&anchor,
                                "<ENTERPRISE><HUB><Alias>a</Alias><LMS_Name>LA</LMS_Name></HUB>"
                                "<HUB><Alias>b</Alias></HUB>"
                                "<HUB><Alias>c</Alias><LMS_Name>LC</LMS_Name></HUB></ENTERPRISE>");
    std::vector<WSQL_Hub*> hubs = hubsOf(list);
    ASSERT_EQ(hubs.size(), 1u);
    EXPECT_STREQ(hubs[0]->getAliasName(), "a");
    EXPECT_EQ(anchor.flags & WSQL_ANCHOR_LOCALHUB, 0u);
    delete list;

    EXPECT_EQ(readHubs(&anchor, "<ENTERPRISE><HUB><Alias>a</Alias><LMS_Name>LA</LMS_Name></HUB>"), nullptr);
    EXPECT_EQ(readHubs(&anchor, "<ENTERPRISE></ENTERPRISE>"), nullptr);
}

TEST_F(HubFileTest, StartModeAppendsTheLocalHubLastUnlessTheFileNamesIt) {
    WSQL_LocalServer local{};
    std::snprintf(local.alias, sizeof local.alias, "HUB_LOCAL");
    local.aliasLength = 9;
    std::snprintf(local.lmsName, sizeof local.lmsName, "LMS_LOCAL");
    WSQL_Anchor anchor;
    anchor.flags = WSQL_ANCHOR_EMBEDDED;
    anchor.localServer = &local;
    gAnchor = &anchor;

    writeFile(dir / "kshxhubs.xml",
              "<ENTERPRISE>\n" + hubBlock("LMS_A", "sa", "a") + hubBlock("LMS_B", "sb", "b") + "</ENTERPRISE>\n");
    LinkedList* list = WSQL_build_hub_list(&anchor);
    std::vector<WSQL_Hub*> hubs = hubsOf(list);
    ASSERT_EQ(hubs.size(), 3u);
    EXPECT_STREQ(hubs[0]->getAliasName(), "a");
    EXPECT_STREQ(hubs[1]->getAliasName(), "b");
    EXPECT_STREQ(hubs[2]->getAliasName(), "HUB_LOCAL");
    EXPECT_STREQ(hubs[2]->getLMSName(), "LMS_LOCAL");
    EXPECT_STREQ(hubs[2]->getServiceName(), "soap");
    EXPECT_STREQ(hubs[2]->getNodeID(), "HUB_LOCAL");
    delete list;

    writeFile(dir / "kshxhubs.xml", "<ENTERPRISE>\n" + hubBlock("LMS_MAIN", "x", "soap") + "</ENTERPRISE>\n");
    list = WSQL_build_hub_list(&anchor);
    hubs = hubsOf(list);
    ASSERT_EQ(hubs.size(), 1u);
    EXPECT_STREQ(hubs[0]->getLMSName(), "LMS_MAIN");
    delete list;

    // A file that does not parse, or none at all: only the local hub.
    anchor.flags = WSQL_ANCHOR_EMBEDDED;
    writeFile(dir / "kshxhubs.xml", "<ENTERPRISE><HUB>");
    list = WSQL_build_hub_list(&anchor);
    ASSERT_EQ(hubsOf(list).size(), 1u);
    EXPECT_STREQ(hubsOf(list)[0]->getAliasName(), "HUB_LOCAL");
    delete list;
    fs::remove(dir / "kshxhubs.xml");
    list = WSQL_build_hub_list(&anchor);
    ASSERT_EQ(hubsOf(list).size(), 1u);
    delete list;
}

TEST_F(HubFileTest, PlainModeWithoutHubsServesTheDefaultHubOfTheSitesFile) {
    WSQL_Anchor anchor;  // an anchor outside START mode
    writeFile(root / "glb_site.txt", "\n\nip:10.1.2.3\nip:10.9.9.9\n");
    LinkedList* list = WSQL_build_hub_list(&anchor);
    std::vector<WSQL_Hub*> hubs = hubsOf(list);
    ASSERT_EQ(hubs.size(), 1u);
    EXPECT_STREQ(hubs[0]->getLMSName(), "ip:10.1.2.3");
    EXPECT_STREQ(hubs[0]->getServiceName(), "websql");
    EXPECT_STREQ(hubs[0]->getAliasName(), "websql");
    delete list;

    fs::remove(root / "glb_site.txt");
    setenv("KSH_TASK_NAME", "MyTask", 1);
    list = WSQL_build_hub_list(&anchor);
    hubs = hubsOf(list);
    ASSERT_EQ(hubs.size(), 1u);
    EXPECT_STREQ(hubs[0]->getLMSName(), "ip:127.0.0.1");
    EXPECT_STREQ(hubs[0]->getServiceName(), "mytask");
    EXPECT_STREQ(hubs[0]->getAliasName(), "MyTask");
    delete list;

    // KDC_GLBSITES names another sites file, relative to the folder above.
    writeFile(root / "sites.lst", "ip:192.0.2.7\r\n");
    setenv("KDC_GLBSITES", "sites.lst", 1);
    list = WSQL_build_hub_list(&anchor);
    ASSERT_EQ(hubsOf(list).size(), 1u);
    EXPECT_STREQ(hubsOf(list)[0]->getLMSName(), "ip:192.0.2.7");
    delete list;

    // Without an anchor nothing is made up.
    EXPECT_EQ(WSQL_build_hub_list(nullptr), nullptr);
}

TEST_F(HubFileTest, RemovingHubsDropsTheirLinesWithoutDoubleBlankLinesAndKeepsTheBackup) {
    const std::string original = "<?xml version=\"1.0\"?>\n<ENTERPRISE>\n\n" + hubBlock("L1", "s1", "one") +
                                 hubBlock("L2", "s2", "two") + hubBlock("L3", "s3", "three") + "</ENTERPRISE>\n";
    writeFile(dir / "kshxhubs.xml", original);
    ASSERT_EQ(WSQL_Remove_Hubs("#2"), 0);
    const std::string after = readFile(dir / "kshxhubs.xml");
    EXPECT_EQ(after, "<?xml version=\"1.0\"?>\n<ENTERPRISE>\n\n" + hubBlock("L1", "s1", "one") +
                         hubBlock("L3", "s3", "three") + "</ENTERPRISE>\n");
    EXPECT_EQ(after.find("\n\n\n"), std::string::npos);
    EXPECT_EQ(readFile(dir / "_kshxhubs.xml~"), original);
    EXPECT_FALSE(fs::exists(dir / "_kshxhubs.xml"));

    // Several positions at once, and a hub written on one line.
    writeFile(dir / "kshxhubs.xml", "<ENTERPRISE>\n<HUB><Alias>x</Alias><LMS_Name>LX</LMS_Name></HUB>\n" +
                                        hubBlock("L2", "s2", "two") + hubBlock("L3", "s3", "three") + "</ENTERPRISE>\n");
    ASSERT_EQ(WSQL_Remove_Hubs("#1#3"), 0);
    EXPECT_EQ(readFile(dir / "kshxhubs.xml"), "<ENTERPRISE>\n" + hubBlock("L2", "s2", "two") + "</ENTERPRISE>\n");

    fs::remove(dir / "kshxhubs.xml");
    EXPECT_EQ(WSQL_Remove_Hubs("#1"), -1);
}

// Fails the write numbered kFailAt of the next rewrite.
std::atomic<unsigned> gFailAt{0};
int failNthWrite(unsigned n) { return n == gFailAt.load() ? 1 : 0; }

TEST_F(HubFileTest, ARewriteThatCannotBeWrittenCompletelyLeavesTheFileAsItWas) {
    const std::string original = "<ENTERPRISE>\n" + hubBlock("L1", "s1", "one") + hubBlock("L2", "s2", "two") +
                                 "</ENTERPRISE>\n";
    writeFile(dir / "kshxhubs.xml", original);
    writeFile(dir / "_kshxhubs.xml~", "old backup\n");
    WSQL_SetHubFileWriteHook(failNthWrite);
    for (unsigned n : {1u, 3u, 7u}) {
        gFailAt = n;
        EXPECT_EQ(WSQL_Remove_Hubs("#1"), 8) << "write " << n;
        EXPECT_EQ(readFile(dir / "kshxhubs.xml"), original);
        EXPECT_EQ(readFile(dir / "_kshxhubs.xml~"), "old backup\n");
        EXPECT_FALSE(fs::exists(dir / "_kshxhubs.xml"));
    }
    // A full device as the new version: the flush fails.
    WSQL_SetHubFileWriteHook(nullptr);
    fs::create_symlink("/dev/full", dir / "_kshxhubs.xml");
    EXPECT_EQ(WSQL_Remove_Hubs("#1"), 8);
    EXPECT_EQ(readFile(dir / "kshxhubs.xml"), original);
    fs::remove(dir / "_kshxhubs.xml");

    // A file without its closing root tag gets no hub appended.
    writeFile(dir / "kshxhubs.xml", "<ENTERPRISE>\n" + hubBlock("L1", "s1", "one"));
    WSQL_KDH_PublishHubList(new LinkedList(nullptr));
    EXPECT_EQ(WSQL_Add_New_Hub("L9", "s9", "nine", nullptr), 6);
    EXPECT_EQ(readFile(dir / "kshxhubs.xml"), "<ENTERPRISE>\n" + hubBlock("L1", "s1", "one"));
    (void)WSQL_KDH_StopServer();
    int joined = 0;
    LinkedList* list = WSQL_KDH_JoinServers(&joined);
    EXPECT_EQ(joined, 1);
    // The hubs belong to the list only when its destructor deletes them:
    // hand them over before the list goes.
    for (WSQL_Hub* h : hubsOf(list)) delete h;
    delete list;
    WSQL_KDH_ResetStop();
}

TEST_F(HubFileTest, AddingAHubStartsItsServiceAndWritesItsBlockBeforeTheIndentedClosingTag) {
    writeFile(dir / "kshxhubs.xml", "<ENTERPRISE>\n" + hubBlock("L1", "s1", "one") + "   </ENTERPRISE>\n");
    auto* list = new LinkedList(nullptr);
    WSQL_KDH_PublishHubList(list);
    ASSERT_EQ(WSQL_Add_New_Hub("LMS2", "Svc2", "a<b", "7000"), 0);
    EXPECT_EQ(readFile(dir / "kshxhubs.xml"),
              "<ENTERPRISE>\n" + hubBlock("L1", "s1", "one") + "   \n" + hubBlock("LMS2[7000]", "svc2", "a&lt;b") +
                  "</ENTERPRISE>\n");
    EXPECT_EQ(readFile(dir / "_kshxhubs.xml~"), "<ENTERPRISE>\n" + hubBlock("L1", "s1", "one") + "   </ENTERPRISE>\n");
    WSQL_Hub* added = searchHubList("A<B");
    ASSERT_NE(added, nullptr);
    EXPECT_STREQ(added->getLMSName(), "LMS2[7000]");

    // The rewritten file reads back with the new hub's names intact.
    FILE* f = WSQL_open_file("kshxhubs.xml", nullptr, "read");
    ASSERT_NE(f, nullptr);
    LinkedList* reread = WSQL_process_hub_file(nullptr, f);
    fclose(f);
    std::vector<WSQL_Hub*> hubs = hubsOf(reread);
    ASSERT_EQ(hubs.size(), 2u);
    EXPECT_STREQ(hubs[1]->getAliasName(), "a<b");
    delete reread;

    // A stop ends the new hub's service thread; later additions are refused.
    (void)WSQL_KDH_StopServer();
    EXPECT_TRUE(WSQL_KDH_Stopping());
    EXPECT_EQ(WSQL_Add_New_Hub("LMS3", "svc3", "three", nullptr), 2);
    int joined = 0;
    LinkedList* done = WSQL_KDH_JoinServers(&joined);
    EXPECT_EQ(done, list);
    EXPECT_EQ(joined, 1);
    EXPECT_EQ(added->getKDHServer(), 0u);
    for (WSQL_Hub* h : hubsOf(done)) delete h;
    delete done;
    WSQL_KDH_ResetStop();
    EXPECT_EQ(searchHubList("a<b"), nullptr);
}

TEST_F(HubFileTest, ConcurrentRewritesAreSerialised) {
    std::string original = "<ENTERPRISE>\n";
    for (int i = 1; i <= 40; ++i) original += hubBlock("L" + std::to_string(i), "s", "h" + std::to_string(i));
    original += "</ENTERPRISE>\n";
    writeFile(dir / "kshxhubs.xml", original);
    // Removing a position the file does not have rewrites the file unchanged;
    // unserialised rewrites would share the new-version file and mix it up.
    std::vector<std::thread> threads;
    std::atomic<int> failures{0};
    for (int t = 0; t < 6; ++t)
        threads.emplace_back([&] {
            for (int i = 0; i < 20; ++i)
                if (WSQL_Remove_Hubs("#999") != 0) ++failures;
        });
    for (auto& t : threads) t.join();
    EXPECT_EQ(failures.load(), 0);
    EXPECT_EQ(readFile(dir / "kshxhubs.xml"), original);
    EXPECT_EQ(readFile(dir / "_kshxhubs.xml~"), original);
}

TEST(StackSize, TheMinimumIsRoundedAndALargerSettingWins) {
    // 16 KiB minimum: 16 -> 128 units of 4096 bytes.
    EXPECT_EQ(WSQL_ThreadStackSize(16384, "100"), 524288u);
    EXPECT_EQ(WSQL_ThreadStackSize(16384, "200"), 1048576u);
    EXPECT_EQ(WSQL_ThreadStackSize(16384, nullptr), 524288u);
    EXPECT_EQ(WSQL_ThreadStackSize(16384, "2x0"), 524288u);
    EXPECT_EQ(WSQL_ThreadStackSize(0, nullptr), 524288u);
    // A minimum of 200 KiB rounds up to 256 units; 129 KiB of minimum too.
    EXPECT_EQ(WSQL_ThreadStackSize(200 * 1024, "100"), 1048576u);
    EXPECT_EQ(WSQL_ThreadStackSize(129 * 1024 - 1, nullptr), 1048576u);
    // Absurd settings are capped to what a 32-bit size can hold.
    EXPECT_GT(WSQL_ThreadStackSize(16384, "99999999999999"), 1048576u);
    EXPECT_EQ(WSQL_ThreadStackSize(16384, "99999999999999") % (64 * 4096), 0u);

    unsetenv("OVM_THREADSTACKSIZE");
    unsetenv("KDC_TASK_STACK_SIZE");
    unsetenv("KDS_THREADSTACKSIZE");
    EXPECT_EQ(WSQL_StackSizeSetting(), nullptr);
    setenv("KDS_THREADSTACKSIZE", "300", 1);
    setenv("KDC_TASK_STACK_SIZE", "200", 1);
    EXPECT_STREQ(WSQL_StackSizeSetting(), "200");
    unsetenv("KDC_TASK_STACK_SIZE");
    EXPECT_STREQ(WSQL_StackSizeSetting(), "300");
    unsetenv("KDS_THREADSTACKSIZE");
}

}  // namespace
