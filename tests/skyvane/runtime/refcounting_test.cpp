#include "runtime/RefCounting.h"

#include <gtest/gtest.h>

#include "platform/text.h"

#include <functional>
#include <stdexcept>
#include <vector>

namespace {

class CountingCounter : public VX_CRefCnt {
public:
    void OnFirstReference() override { ++first; }
    void OnLastRelease() override { ++last; }
    int first = 0;
    int last = 0;
};

// Counts its destructions in a shared tally.
struct Tracked {
    explicit Tracked(int& tally, int value = 0) : tally(tally), value(value) {}
    ~Tracked() { ++tally; }
    int& tally;
    int value;
};

class Counted : public CCmdTarget {
public:
    explicit Counted(int& tally) : tally(&tally) {}
    ~Counted() override { ++*tally; }
    int* tally;
    int zeroFilled;  // deliberately not initialised: counted objects are zero-filled
};

}  // namespace

TEST(VX_CRefCntTest, ReleaseRules) {
    CountingCounter c;
    EXPECT_EQ(c.AddRef(), 1);
    EXPECT_EQ(c.first, 1);
    c.AddRef();
    c.AddRef();
    EXPECT_EQ(c.first, 1);  // only the step from 0 to 1 counts

    EXPECT_EQ(c.Release(-1), 3);  // negative: nothing happens
    EXPECT_EQ(c.last, 0);
    EXPECT_EQ(c.Release(5), 0);  // more than held: 0, last release once
    EXPECT_EQ(c.last, 1);
    EXPECT_EQ(c.Release(1), 0);  // not referenced: nothing happens
    EXPECT_EQ(c.last, 1);

    c.AddRef();
    c.AddRef();
    EXPECT_EQ(c.Release(1), 1);
    EXPECT_EQ(c.last, 1);
    EXPECT_EQ(c.Release(0), 1);
}

TEST(VX_CRefCntTest, HolderGivesBackEverythingOnce) {
    CountingCounter c;
    {
        VX_CRef ref(&c);
        EXPECT_EQ(ref.AddRef(), 1);
        EXPECT_EQ(ref.AddRef(), 2);
        c.AddRef();  // someone else's reference survives the holder
        EXPECT_EQ(c.m_nRefCount, 3);
    }
    EXPECT_EQ(c.m_nRefCount, 1);
    EXPECT_EQ(c.last, 0);
}

TEST(VX_CRefCntTest, GuardKeepsNestedCallOutAndReleasesOnException) {
    static VX_CRefCnt busy;
    int runs = 0, refused = 0;
    std::function<void(int)> routine = [&](int depth) {
        VX_ReentranceGuard guard(busy);
        if (!guard.Entered()) {
            ++refused;
            return;
        }
        ++runs;
        if (depth == 0) routine(1);  // re-entered from inside, as a pumped message would
        if (depth == 0) throw std::runtime_error("work failed");
    };
    EXPECT_THROW(routine(0), std::runtime_error);
    EXPECT_EQ(runs, 1);
    EXPECT_EQ(refused, 1);
    EXPECT_FALSE(busy.IsReferenced());
    EXPECT_THROW(routine(0), std::runtime_error);
    EXPECT_EQ(runs, 2);
}

TEST(KeepRefCmdPtr, HoldsExactlyOneReference) {
    int destroyed = 0;
    {
        auto p = VX_CreateCounted<Counted>(destroyed);
        EXPECT_EQ(p->GetRefCount(), 1);
        EXPECT_EQ(p->zeroFilled, 0);
        {
            VX_KeepRefCmdPtr<Counted> copy = p;
            EXPECT_EQ(p->GetRefCount(), 2);
            copy = p.Get();  // same object: nothing changes
            EXPECT_EQ(p->GetRefCount(), 2);
        }
        EXPECT_EQ(p->GetRefCount(), 1);

        auto other = VX_CreateCounted<Counted>(destroyed);
        p = other;  // old one released (and gone), new one referenced
        EXPECT_EQ(destroyed, 1);
        EXPECT_EQ(other->GetRefCount(), 2);
        p.Reset();
        EXPECT_FALSE(p);
        EXPECT_EQ(other->GetRefCount(), 1);
    }
    EXPECT_EQ(destroyed, 2);
}

TEST(OwningContainers, MapDeletesEachValueExactlyOnce) {
    int destroyed = 0;
    {
        CMapOwner<CString, const char16_t*, Tracked> map;
        map.SetAt(u"a", new Tracked(destroyed, 1));
        map.SetAt(u"b", new Tracked(destroyed, 2));
        map.SetAt(u"a", new Tracked(destroyed, 3));  // replaces: the old value goes
        EXPECT_EQ(destroyed, 1);
        Tracked* found = nullptr;
        ASSERT_TRUE(map.Lookup(u"a", found));
        EXPECT_EQ(found->value, 3);
        EXPECT_TRUE(map.RemoveKey(u"b"));
        EXPECT_FALSE(map.RemoveKey(u"b"));
        EXPECT_EQ(destroyed, 2);
        map.SetAt(u"c", new Tracked(destroyed));
        map.SetAt(u"d", new Tracked(destroyed));
    }
    EXPECT_EQ(destroyed, 5);
}

TEST(OwningContainers, MapIteratesInKeyOrder) {
    int destroyed = 0;
    CMapSyncOwner<long, long, Tracked> map;
    for (long key : {5L, 1L, 3L}) map.SetAt(key, new Tracked(destroyed, static_cast<int>(key)));
    std::vector<long> keys;
    for (const auto& [key, value] : map) keys.push_back(key);
    EXPECT_EQ(keys, (std::vector<long>{1, 3, 5}));
    map.RemoveAll();
    EXPECT_EQ(destroyed, 3);
    EXPECT_TRUE(map.IsEmpty());
}

TEST(OwningContainers, HolderCellsAreOwnedNotTheirTargets) {
    // A map of holder cells owns the cells, never what they point to.
    int destroyed = 0;
    Tracked target(destroyed);
    {
        CMapOwner<DWORD, DWORD, Tracked*> cells;
        cells.SetAt(7, new Tracked*(&target));
        Tracked** cell = nullptr;
        ASSERT_TRUE(cells.Lookup(7, cell));
        EXPECT_EQ(*cell, &target);
    }
    EXPECT_EQ(destroyed, 0);
}

TEST(OwningContainers, ListOwnsUntilTakenOut) {
    int destroyed = 0;
    {
        CLstOwner<Tracked> list;
        for (int i = 0; i < 4; ++i) list.AddTail(new Tracked(destroyed, i));
        Tracked* head = list.RemoveHead();  // now ours
        EXPECT_EQ(head->value, 0);
        list.RemoveAt(list.begin());  // deletes element 1
        EXPECT_EQ(destroyed, 1);

        CLstOwner<Tracked> batch;
        batch.TakeAll(list);
        EXPECT_TRUE(list.IsEmpty());
        EXPECT_EQ(batch.GetCount(), 2);
        EXPECT_EQ(batch.GetHead()->value, 2);
        delete head;
        EXPECT_EQ(destroyed, 2);
    }
    EXPECT_EQ(destroyed, 4);
}
