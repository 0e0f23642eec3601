// The list: order of adds, removal while iterators are registered, the
// hand-over of RemoveFirst, the 16-bit limit, and several threads at once.
#include "kshlst.h"

#include <gtest/gtest.h>

#include <atomic>
#include <map>
#include <new>
#include <random>
#include <thread>
#include <vector>

#include "wsql_rc.h"

namespace {

// Destructor calls per value, keyed by the value's address.
std::map<void*, int> destroyed;
void countDestroy(void* v) { destroyed[v]++; }

std::vector<void*> walk(LinkedList& l) {
    std::vector<void*> out;
    LinkedListIter it(&l);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) out.push_back(v);
    return out;
}

class ListTest : public ::testing::Test {
protected:
    int a = 1, b = 2, c = 3, d = 4;
    void SetUp() override { destroyed.clear(); }
};

}  // namespace

TEST_F(ListTest, AddPrependsAppendAppendsAndRemovalsFindTheFirstLiveMatch) {
    LinkedList l(countDestroy);
    ASSERT_EQ(l.AddEntry(&a), 0);
    ASSERT_EQ(l.AddEntry(&b), 0);
    ASSERT_EQ(l.AddEntry(&c), 0);
    EXPECT_EQ(walk(l), (std::vector<void*>{&c, &b, &a}));

    LinkedList m(countDestroy);
    ASSERT_EQ(m.AppendEntry(&a), 0);
    ASSERT_EQ(m.AppendEntry(&b), 0);
    ASSERT_EQ(m.AppendEntry(&a), 0);
    EXPECT_EQ(m.NumEntries(), 3u);
    // Only the first of two equal values goes, and it reaches the destructor.
    EXPECT_EQ(m.RemoveEntry(&a), 0);
    EXPECT_EQ(walk(m), (std::vector<void*>{&b, &a}));
    EXPECT_EQ(destroyed[&a], 1);
    EXPECT_EQ(m.RemoveEntry(&c), WSQL_NOTFOUND);

    // ChangeValue swaps without destroying; a missing value changes nothing.
    EXPECT_EQ(m.ChangeValue(&b, &d), 0);
    EXPECT_EQ(destroyed.count(&b), 0u);
    EXPECT_EQ(m.ChangeValue(&c, &b), WSQL_NOTFOUND);
    EXPECT_EQ(walk(m), (std::vector<void*>{&d, &a}));
    EXPECT_EQ(m.OnList(&d), 1);
    EXPECT_EQ(m.OnList(&b), 0);

    // Clearing hands every value to the destructor once.
    destroyed.clear();
    m.Clear();
    EXPECT_EQ(m.NumEntries(), 0u);
    EXPECT_EQ(m.getHead(), nullptr);
    EXPECT_EQ(destroyed, (std::map<void*, int>{{&d, 1}, {&a, 1}}));
    EXPECT_TRUE(walk(m).empty());
}

TEST_F(ListTest, RemovalDuringAWalkMarksUntilTheLastIteratorFinishes) {
    LinkedList l(countDestroy);
    for (int* v : {&a, &b, &c, &d}) ASSERT_EQ(l.AppendEntry(v), 0);
    {
        LinkedListIter outer(&l);
        {
            LinkedListIter it(&l);
            EXPECT_EQ(it.Remove(), WSQL_NOTFOUND);  // nothing returned yet
            EXPECT_EQ(it.Next(), &a);
            EXPECT_EQ(it.Next(), &b);
            EXPECT_EQ(it.Remove(), 0);              // b, under the iterator
            EXPECT_EQ(it.Remove(), WSQL_NOTFOUND);  // already gone
            EXPECT_EQ(l.RemoveEntry(&c), 0);        // c, ahead of it
            EXPECT_EQ(l.NumEntries(), 2u);
            EXPECT_EQ(l.OnList(&b), 0);
            EXPECT_EQ(l.OnList(&c), 0);
            EXPECT_EQ(l.RemoveEntry(&c), WSQL_NOTFOUND);
            EXPECT_EQ(it.Next(), &d);               // skips the marked c
            EXPECT_EQ(it.Next(), nullptr);
            EXPECT_EQ(it.Next(), &a);               // a new walk after the end
            EXPECT_TRUE(destroyed.empty());
        }
        EXPECT_TRUE(destroyed.empty());  // outer is still registered
        EXPECT_EQ(outer.Next(), &a);
        EXPECT_EQ(outer.Next(), &d);
    }
    EXPECT_EQ(destroyed, (std::map<void*, int>{{&b, 1}, {&c, 1}}));
    EXPECT_EQ(walk(l), (std::vector<void*>{&a, &d}));

    // A list of one, cleared during a walk, keeps its element until the walk ends.
    destroyed.clear();
    LinkedList one(countDestroy);
    ASSERT_EQ(one.AppendEntry(&a), 0);
    {
        LinkedListIter it(&one);
        EXPECT_EQ(it.Next(), &a);
        one.Clear();
        one.Clear();  // marked entries are not marked twice
        EXPECT_EQ(one.NumEntries(), 0u);
        EXPECT_NE(one.getHead(), nullptr);
        EXPECT_TRUE(destroyed.empty());
        EXPECT_EQ(it.Next(), nullptr);
    }
    EXPECT_EQ(one.getHead(), nullptr);
    EXPECT_EQ(destroyed, (std::map<void*, int>{{&a, 1}}));

    // The head removed while marked: the head moves on when it goes for good.
    destroyed.clear();
    LinkedList h(countDestroy);
    for (int* v : {&a, &b, &c}) ASSERT_EQ(h.AppendEntry(v), 0);
    {
        LinkedListIter it(&h);
        EXPECT_EQ(h.RemoveEntry(&a), 0);
        EXPECT_EQ(h.RemoveEntry(&c), 0);
        EXPECT_EQ(it.Next(), &b);
        EXPECT_EQ(it.Next(), nullptr);
    }
    ASSERT_NE(h.getHead(), nullptr);
    EXPECT_EQ(h.getHead()->Value(), &b);
    EXPECT_EQ(h.getHead()->Next(), h.getHead());
    EXPECT_EQ(destroyed.size(), 2u);
}

TEST_F(ListTest, RemoveFirstHandsOwnershipToTheCallerAndSkipsMarkedEntries) {
    LinkedList l(countDestroy);
    EXPECT_EQ(l.RemoveFirst(), nullptr);
    for (int* v : {&a, &b, &c}) ASSERT_EQ(l.AppendEntry(v), 0);
    EXPECT_EQ(l.RemoveFirst(), &a);
    EXPECT_TRUE(destroyed.empty());  // the caller owns a now
    {
        LinkedListIter it(&l);
        EXPECT_EQ(l.RemoveEntry(&b), 0);  // marked, still linked at the head
        EXPECT_EQ(l.RemoveFirst(), &c);   // b is skipped, not handed out
        EXPECT_EQ(l.RemoveFirst(), nullptr);
        EXPECT_EQ(l.NumEntries(), 0u);
        EXPECT_EQ(it.Next(), nullptr);
    }
    // b was removed for destruction, c was handed out: only b is destroyed.
    EXPECT_EQ(destroyed, (std::map<void*, int>{{&b, 1}}));
    EXPECT_EQ(l.getHead(), nullptr);
}

TEST_F(ListTest, DestroyingAListWithARegisteredIteratorStillDestroysEveryValue) {
    auto* l = new LinkedList(countDestroy);
    for (int* v : {&a, &b, &c}) ASSERT_EQ(l->AppendEntry(v), 0);
    // The iterator is deliberately never destroyed: it would outlive its list.
    alignas(LinkedListIter) unsigned char room[sizeof(LinkedListIter)];
    auto* it = new (room) LinkedListIter(l);
    EXPECT_EQ(it->Next(), &a);
    EXPECT_EQ(l->RemoveEntry(&b), 0);
    delete l;
    EXPECT_EQ(destroyed, (std::map<void*, int>{{&a, 1}, {&b, 1}, {&c, 1}}));
}

TEST_F(ListTest, AListWithoutALockOrDestructorWorksAndRefusesThe65536thEntry) {
    LinkedList l(nullptr, nullptr);
    static char cells[0x10000];
    for (unsigned i = 0; i < 0xFFFF; ++i) ASSERT_EQ(l.AppendEntry(&cells[i]), 0) << i;
    EXPECT_EQ(l.NumEntries(), 0xFFFFu);
    EXPECT_EQ(l.AppendEntry(&cells[0xFFFF]), WSQL_NOTHING);
    EXPECT_EQ(l.AddEntry(&cells[0xFFFF]), WSQL_NOTHING);
    EXPECT_EQ(l.NumEntries(), 0xFFFFu);
    EXPECT_EQ(l.OnList(&cells[0xFFFF]), 0);
    // Marked entries still take room until they are unlinked.
    {
        LinkedListIter it(&l);
        EXPECT_EQ(l.RemoveEntry(&cells[0]), 0);
        EXPECT_EQ(l.AppendEntry(&cells[0xFFFF]), WSQL_NOTHING);
    }
    EXPECT_EQ(l.AppendEntry(&cells[0xFFFF]), 0);
    EXPECT_EQ(l.RemoveFirst(), &cells[1]);
    EXPECT_EQ(l.NumEntries(), 0xFFFFu - 1);
}

// Several threads add, remove, hand out and walk one locked list. Every value
// ends up destroyed or handed out exactly once, and no value an iterator has
// seen is destroyed while that iterator is registered.
namespace {

constexpr int kWriters = 4;
constexpr int kPerWriter = 1500;

struct Slot {
    std::atomic<int> destroyedCalls{0};
    std::atomic<int> handedOut{0};
    std::atomic<bool> added{false};
};
Slot slots[kWriters * kPerWriter];

void destroySlot(void* v) { static_cast<Slot*>(v)->destroyedCalls.fetch_add(1); }

}  // namespace

TEST(ListThreads, ConcurrentAddsRemovesAndWalksNeverTouchFreedOrDoubleDestroyedValues) {
    auto* list = new LinkedList(destroySlot);
    std::atomic<int> writersLeft{kWriters};
    std::atomic<int> violations{0};
    std::atomic<long> seen{0};

    auto writer = [&](int t) {
        std::mt19937 rng(t);
        for (int i = 0; i < kPerWriter; ++i) {
            Slot* s = &slots[t * kPerWriter + i];
            s->added = true;
            int rc = (i & 1) ? list->AppendEntry(s) : list->AddEntry(s);
            if (rc != 0) violations++;
            switch (rng() % 6) {
            case 0:
            case 1: {  // remove one of my earlier values; another thread may have taken it
                Slot* old = &slots[t * kPerWriter + (int)(rng() % (unsigned)(i + 1))];
                int r = list->RemoveEntry(old);
                if (r != 0 && r != WSQL_NOTFOUND) violations++;
                break;
            }
            case 2: {
                void* v = list->RemoveFirst();
                if (v) static_cast<Slot*>(v)->handedOut.fetch_add(1);
                break;
            }
            default:
                break;
            }
            if (i % 700 == 699 && t == 0) list->Clear();
        }
        writersLeft--;
    };
    auto walker = [&](int t) {
        std::mt19937 rng(100 + t);
        while (writersLeft.load() > 0) {
            std::vector<Slot*> mine;
            LinkedListIter it(list);
            for (void* v = it.Next(); v != nullptr; v = it.Next()) {
                Slot* s = static_cast<Slot*>(v);
                if (s->destroyedCalls.load() != 0) violations++;
                mine.push_back(s);
                if (rng() % 16 == 0) it.Remove();
            }
            for (Slot* s : mine)
                if (s->destroyedCalls.load() != 0) violations++;
            seen += (long)mine.size();
        }
    };

    std::vector<std::thread> threads;
    for (int t = 0; t < kWriters; ++t) threads.emplace_back(writer, t);
    for (int t = 0; t < 2; ++t) threads.emplace_back(walker, t);
    for (auto& th : threads) th.join();
    delete list;

    EXPECT_EQ(violations.load(), 0);
    EXPECT_GT(seen.load(), 0);
    int wrong = 0;
    for (Slot& s : slots) {
        ASSERT_TRUE(s.added);
        if (s.destroyedCalls.load() + s.handedOut.load() != 1) wrong++;
    }
    EXPECT_EQ(wrong, 0);
}
