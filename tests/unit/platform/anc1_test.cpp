// Numeric handle aliases.
#include "anc1/anc1.h"

#include <gtest/gtest.h>

#include <set>
#include <thread>
#include <vector>

namespace {

TEST(Anc1, AliasesConvertBackUntilReleasedAndUnknownOnesResolveToNothing) {
    int a = 1, b = 2;
    unsigned ha = 0, hb = 0;
    ASSERT_EQ(ANC1_Reserve(&a, &ha), ANC1_OK);
    ASSERT_EQ(ANC1_Reserve(&b, &hb), ANC1_OK);
    EXPECT_NE(ha, 0u);
    EXPECT_NE(ha, hb);
    void* obj = nullptr;
    ASSERT_EQ(ANC1_Convert(ha, &obj), ANC1_OK);
    EXPECT_EQ(obj, &a);
    ASSERT_EQ(ANC1_Release(ha), ANC1_OK);
    EXPECT_EQ(ANC1_Convert(ha, &obj), ANC1_NOTFOUND);
    EXPECT_EQ(obj, nullptr);
    EXPECT_EQ(ANC1_Release(ha), ANC1_NOTFOUND);
    ASSERT_EQ(ANC1_Convert(hb, &obj), ANC1_OK);
    EXPECT_EQ(obj, &b);
    for (unsigned never : {0u, 0xFFFFFFFFu, hb + 0x10000u, (hb & 0xFFFF0000u) | 0xFFFFu}) {
        EXPECT_EQ(ANC1_Convert(never, &obj), ANC1_NOTFOUND) << never;
    }
    EXPECT_EQ(ANC1_Reserve(nullptr, &ha), ANC1_BADARG);
    EXPECT_EQ(ANC1_Convert(hb, nullptr), ANC1_BADARG);
    EXPECT_EQ(ANC1_Release(hb), ANC1_OK);
}

TEST(Anc1, AReleasedAliasNeverResolvesToALaterObject) {
    // Many short-lived aliases, as requests come and go: none is issued
    // twice, and every old one stays dead.
    std::vector<int> objects(2000);
    std::set<unsigned> seen;
    std::vector<unsigned> old;
    for (int& o : objects) {
        unsigned h = 0;
        ASSERT_EQ(ANC1_Reserve(&o, &h), ANC1_OK);
        EXPECT_TRUE(seen.insert(h).second) << h;
        ASSERT_EQ(ANC1_Release(h), ANC1_OK);
        old.push_back(h);
    }
    unsigned live = 0;
    ASSERT_EQ(ANC1_Reserve(&objects[0], &live), ANC1_OK);
    void* obj = nullptr;
    for (unsigned h : old) EXPECT_EQ(ANC1_Convert(h, &obj), ANC1_NOTFOUND);
    EXPECT_EQ(ANC1_Release(live), ANC1_OK);
}

TEST(Anc1, ConcurrentUsersEachGetTheirOwnObjectsBack) {
    constexpr int kThreads = 4, kRounds = 2000;
    std::vector<int> bad(kThreads, 0);
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; t++) {
        threads.emplace_back([&, t] {
            std::vector<int> mine(8);
            for (int r = 0; r < kRounds; r++) {
                unsigned h[8];
                for (int i = 0; i < 8; i++) {
                    if (ANC1_Reserve(&mine[i], &h[i]) != ANC1_OK) bad[t]++;
                }
                for (int i = 0; i < 8; i++) {
                    void* o = nullptr;
                    if (ANC1_Convert(h[i], &o) != ANC1_OK || o != &mine[i]) bad[t]++;
                    if (ANC1_Release(h[i]) != ANC1_OK) bad[t]++;
                }
            }
        });
    }
    for (auto& th : threads) th.join();
    for (int t = 0; t < kThreads; t++) EXPECT_EQ(bad[t], 0) << t;
}

TEST(Anc1, TheTableRefusesMoreThanItsSlotsAndRecoversAfterARelease) {
    static int obj;
    std::vector<unsigned> held;
    unsigned h = 0;
    int rc;
    while ((rc = ANC1_Reserve(&obj, &h)) == ANC1_OK) held.push_back(h);
    EXPECT_EQ(rc, ANC1_FULL);
    EXPECT_EQ(held.size(), 0xFFFFu);
    ASSERT_EQ(ANC1_Release(held.back()), ANC1_OK);
    unsigned again = 0;
    ASSERT_EQ(ANC1_Reserve(&obj, &again), ANC1_OK);
    EXPECT_NE(again, held.back());
    held.back() = again;
    for (unsigned x : held) EXPECT_EQ(ANC1_Release(x), ANC1_OK);
}

}  // namespace
