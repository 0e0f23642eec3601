// The trace facility: configuration grammar, cached levels, whole lines.
#include "ras1/ras1.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

RAS1_UNIT("kshreq");

TEST(Ras1Config, UnitItemsWinOverTheDefaultAndTheLongestPrefixWins) {
    EXPECT_EQ(RAS1_LevelFor(nullptr, "kshreq"), RAS1_ERROR);
    EXPECT_EQ(RAS1_LevelFor("", "kshreq"), RAS1_ERROR);
    EXPECT_EQ(RAS1_LevelFor("NONE", "kshreq"), 0);
    EXPECT_EQ(RAS1_LevelFor("kshreq:ALL,kui:STATE", "kshreq"), RAS1_ALL);
    EXPECT_EQ(RAS1_LevelFor("kshreq:ALL,kui:STATE", "kuicreatesit"), RAS1_STATE);
    EXPECT_EQ(RAS1_LevelFor("kshreq:ALL,kui:STATE", "kshhub"), RAS1_ERROR);
    EXPECT_EQ(RAS1_LevelFor("ksh:FLOW,kshreq:STATE+ERROR", "kshreq"), RAS1_STATE | RAS1_ERROR);
    EXPECT_EQ(RAS1_LevelFor("kshreq:STATE,ksh:FLOW", "kshreq"), RAS1_STATE);
    EXPECT_EQ(RAS1_LevelFor("kshreq:STATE,NONE", "kshreq"), RAS1_STATE);
    EXPECT_EQ(RAS1_LevelFor("NONE,kshreq:STATE", "kshhub"), 0);
    // Unknown level words are ignored, not guessed.
    EXPECT_EQ(RAS1_LevelFor("kshreq:LOUD", "kshreq"), RAS1_ERROR);
}

class Ras1Output : public ::testing::Test {
protected:
    std::string path;
    void SetUp() override {
        char tmpl[] = "/tmp/ras1-test-XXXXXX";
        int fd = mkstemp(tmpl);
        ASSERT_GE(fd, 0);
        close(fd);
        path = tmpl;
    }
    void TearDown() override {
        RAS1_Configure("", "");
        unlink(path.c_str());
    }
    std::vector<std::string> lines() {
        std::ifstream in(path);
        std::vector<std::string> out;
        for (std::string l; std::getline(in, l);) out.push_back(l);
        return out;
    }
};

TEST_F(Ras1Output, ReconfigurationReachesCachedUnitsAndEventsCarryResults) {
    RAS1_Configure("kshreq:ERROR", path.c_str());
    int ras = RAS1_Sync(RAS1_THIS);
    EXPECT_EQ(ras, RAS1_ERROR);
    RAS1_EXIT_RC(ras, 7);  // flow is off: nothing written
    RAS1_Configure("kshreq:FLOW+STATE", path.c_str());
    ras = RAS1_Sync(RAS1_THIS);
    EXPECT_EQ(ras, RAS1_FLOW | RAS1_STATE);
    RAS1_ENTRY(ras);
    RAS1_TRACE_IF(ras, RAS1_STATE, "rows %d\n", 3);
    RAS1_EXIT_RC(ras, 7);
    auto l = lines();
    ASSERT_EQ(l.size(), 3u);
    EXPECT_NE(l[0].find("kshreq:"), std::string::npos);
    EXPECT_NE(l[0].find("Entry "), std::string::npos);
    EXPECT_NE(l[1].find("rows 3"), std::string::npos);
    EXPECT_EQ(l[1].back(), '3');  // the trailing newline of the format is not doubled
    EXPECT_NE(l[2].find("rc=7"), std::string::npos);
}

TEST_F(Ras1Output, LinesFromConcurrentThreadsNeverInterleave) {
    RAS1_Configure("ALL", path.c_str());
    const int kThreads = 8, kLines = 500;
    std::string payload(300, 'x');
    std::vector<std::thread> ts;
    for (int t = 0; t < kThreads; t++)
        ts.emplace_back([&, t] {
            for (int i = 0; i < kLines; i++) RAS1_Printf(RAS1_THIS, __LINE__, "T%d <%s>", t, payload.c_str());
        });
    for (auto& t : ts) t.join();
    auto l = lines();
    ASSERT_EQ(l.size(), (size_t)kThreads * kLines);
    for (const auto& line : l) {
        auto open = line.find('<');
        ASSERT_NE(open, std::string::npos);
        EXPECT_EQ(line.substr(open), "<" + payload + ">");
    }
}

TEST_F(Ras1Output, DumpWritesHexAndPrintableText) {
    RAS1_Configure("ALL", path.c_str());
    const char data[] = "ABCDEFGHIJKLMNOPQ";
    RAS1_Dump(RAS1_THIS, __LINE__, data, 17);
    auto l = lines();
    ASSERT_EQ(l.size(), 3u);
    EXPECT_NE(l[1].find("41 42 43"), std::string::npos);
    EXPECT_NE(l[1].find("ABCDEFGHIJKLMNOP"), std::string::npos);
    EXPECT_NE(l[2].find("51"), std::string::npos);
}
