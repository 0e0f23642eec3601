// Base services: once-control, the replaceable clock, environment, locks.
#include "bss1/bss1.h"
#include "pfm1/pfm1.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstdlib>
#include <stdexcept>
#include <thread>
#include <vector>

namespace {
std::atomic<int> initRuns{0};
void countingInit(void* arg) {
    BSS1_Sleep(20);  // widen the window in which other threads arrive
    initRuns++;
    *static_cast<int*>(arg) = 42;
}
time_t frozen() { return 1796306709; }
}  // namespace

TEST(Bss1Once, InitialisationRunsExactlyOnceAndLaterCallersSeeItsResult) {
    static BSS1_Once once;
    int value = 0;
    std::vector<std::thread> ts;
    std::atomic<int> seen42{0};
    for (int i = 0; i < 8; i++)
        ts.emplace_back([&] {
            BSS1_InitializeOnce(&once, countingInit, &value);
            if (value == 42) seen42++;
        });
    for (auto& t : ts) t.join();
    EXPECT_EQ(initRuns.load(), 1);
    EXPECT_EQ(seen42.load(), 8);
    EXPECT_TRUE(BSS1_OnceDone(&once));
}

TEST(Bss1Time, TheClockCanBeFrozenAndRestored) {
    EXPECT_EQ(BSS1_SetClock(frozen), nullptr);
    EXPECT_EQ(BSS1_Time(), frozen());
    EXPECT_EQ(BSS1_SetClock(nullptr), frozen);
    EXPECT_NEAR((double)BSS1_Time(), (double)time(nullptr), 2.0);
}

TEST(Bss1Env, EmptyOrUnsetGivesTheDefault) {
    setenv("BSS1_TEST_VAR", "", 1);
    EXPECT_STREQ(BSS1_GetEnv("BSS1_TEST_VAR", "dflt"), "dflt");
    setenv("BSS1_TEST_VAR", "v", 1);
    EXPECT_STREQ(BSS1_GetEnv("BSS1_TEST_VAR", "dflt"), "v");
    unsetenv("BSS1_TEST_VAR");
    EXPECT_EQ(BSS1_GetEnv("BSS1_TEST_VAR", nullptr), nullptr);
}

TEST(Bss1Lock, IsRecursiveAndExcludesOtherThreads) {
    BSS1_Lock lock;
    ASSERT_EQ(BSS1_InitializeLock(&lock), 0);
    long counter = 0;
    std::vector<std::thread> ts;
    for (int t = 0; t < 4; t++)
        ts.emplace_back([&] {
            for (int i = 0; i < 10000; i++) {
                BSS1_GetLock(&lock);
                BSS1_GetLock(&lock);
                counter++;
                BSS1_ReleaseLock(&lock);
                BSS1_ReleaseLock(&lock);
            }
        });
    for (auto& t : ts) t.join();
    EXPECT_EQ(counter, 40000);
    BSS1_DestroyLock(&lock);
}

TEST(Bss1Info, NamesTheHost) {
    BSS1_HostInfo info;
    ASSERT_EQ(BSS1_Info(&info), 0);
    EXPECT_GT(strlen(info.hostName), 0u);
    EXPECT_GE(info.cpuCount, 1);
}

TEST(Pfm1Guard, ExceptionsBecomeResultEightAndResultsPassThrough) {
    EXPECT_EQ(PFM1_Guard("ok", [] { return 5; }), 5);
    EXPECT_EQ(PFM1_Guard("alloc", []() -> int { throw std::bad_alloc(); }), PFM1_ABEND);
    EXPECT_EQ(PFM1_Guard("runtime", []() -> int { throw std::runtime_error("x"); }), PFM1_ABEND);
    EXPECT_EQ(PFM1_Guard("other", []() -> int { throw 3; }), PFM1_ABEND);
}
