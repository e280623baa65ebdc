#include "host/core/Object.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstdint>
#include <cstring>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <typeinfo>
#include <unordered_set>
#include <vector>

#include <tbb/info.h>

#include "host/core/OvID.h"
#include "host/core/Parallel.h"
#include "host/core/ScriptInfo.h"

namespace Orvane::objtest {
namespace {

// ---------------------------------------------------------------------------------------------------------------
// Ref<T>

std::atomic<int> aliveCount{0};

class Counted : public RefObject {
public:
    explicit Counted(int v = 0) : value(v) { ++aliveCount; }
    int value;

protected:
    ~Counted() override { --aliveCount; }
};

class DerivedCounted : public Counted {
public:
    explicit DerivedCounted(int v) : Counted(v) {}
    int extra = 5;
};

TEST(RefHandle, AdoptAndShare) {
    aliveCount = 0;
    {
        Ref<Counted> a = MakeRef<Counted>(3);
        EXPECT_EQ(aliveCount, 1);
        EXPECT_EQ(a->RefCount(), 1); // the maker's reference, adopted
        EXPECT_EQ(a->value, 3);
        EXPECT_EQ((*a).value, 3);

        Counted *raw = new Counted(4); // starts with one reference
        Ref<Counted> shared(raw);      // shares: adds one
        EXPECT_EQ(raw->RefCount(), 2);
        raw->Recycle(); // the maker lets go of its own
        EXPECT_EQ(raw->RefCount(), 1);
        EXPECT_EQ(aliveCount, 2);

        Ref<Counted> adopted = Ref<Counted>::Adopt(new Counted(5));
        EXPECT_EQ(adopted->RefCount(), 1);
        EXPECT_EQ(aliveCount, 3);
    }
    EXPECT_EQ(aliveCount, 0);
}

TEST(RefHandle, CopyMoveReleaseReset) {
    aliveCount = 0;
    Ref<Counted> a = MakeRef<Counted>(1);
    Counted *p = a.Get();
    {
        Ref<Counted> b = a; // copy
        EXPECT_EQ(p->RefCount(), 2);
        EXPECT_TRUE(b == a);
        Ref<Counted> c = std::move(b); // move: no change
        EXPECT_EQ(p->RefCount(), 2);
        EXPECT_FALSE(b);
        EXPECT_EQ(b.Get(), nullptr);
        Ref<Counted> d;
        d = c; // copy assignment
        EXPECT_EQ(p->RefCount(), 3);
        const Ref<Counted> &same = d; // assigned through another name, as real self assignment happens
        d = same;                     // self assignment keeps the count
        EXPECT_EQ(p->RefCount(), 3);
        d = std::move(c);
        EXPECT_EQ(p->RefCount(), 2);
        EXPECT_FALSE(c);
    }
    EXPECT_EQ(p->RefCount(), 1);

    Counted *released = a.Release();
    EXPECT_EQ(released, p);
    EXPECT_FALSE(a);
    EXPECT_EQ(p->RefCount(), 1);
    EXPECT_EQ(aliveCount, 1);
    a = Ref<Counted>::Adopt(released);

    // Assigning over the last reference deletes the old object.
    a = MakeRef<Counted>(2);
    EXPECT_EQ(aliveCount, 1);
    EXPECT_EQ(a->value, 2);
    a.Reset();
    EXPECT_FALSE(a);
    EXPECT_EQ(aliveCount, 0);

    Ref<Counted> empty = nullptr;
    EXPECT_FALSE(empty);
    EXPECT_TRUE(empty == Ref<Counted>());
    Ref<Counted> nullShare(static_cast<Counted *>(nullptr));
    EXPECT_FALSE(nullShare);
    empty.Reset(); // no-op on an empty handle
}

TEST(RefHandle, DerivedConvertsToBase) {
    aliveCount = 0;
    Ref<DerivedCounted> d = MakeRef<DerivedCounted>(9);
    {
        Ref<Counted> copy = d; // converting copy: shares
        EXPECT_EQ(d->RefCount(), 2);
        EXPECT_EQ(copy.Get(), d.Get());
        Ref<RefObject> root = copy;
        EXPECT_EQ(d->RefCount(), 3);
    }
    EXPECT_EQ(d->RefCount(), 1);
    Ref<Counted> moved = std::move(d); // converting move: takes the reference over
    EXPECT_FALSE(d);
    EXPECT_EQ(moved->RefCount(), 1);
    EXPECT_EQ(moved->value, 9);
    EXPECT_EQ(aliveCount, 1);
    moved.Reset();
    EXPECT_EQ(aliveCount, 0);
}

TEST(RefHandle, ConcurrentSharingCountsEveryReference) {
    aliveCount = 0;
    Ref<Counted> obj = MakeRef<Counted>(0);
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t)
        threads.emplace_back([&obj] {
            for (int i = 0; i < 20000; ++i) {
                Ref<Counted> a = obj;
                Ref<Counted> b = a;
                Ref<RefObject> c = b;
            }
        });
    for (auto &t : threads) t.join();
    EXPECT_EQ(obj->RefCount(), 1);
    EXPECT_EQ(aliveCount, 1);
    obj.Reset();
    EXPECT_EQ(aliveCount, 0);
}

TEST(RefObjectAttrs, MergedAndPersisted) {
    Ref<Counted> obj = MakeRef<Counted>();
    std::string label = "label text";
    obj->SetAttrsTagList({{0x10000f10, 3}, {0x20000f10, 0.5}, {0x30000f10, label.c_str()}});
    obj->SetAttrsTagList({{0x10000f10, 4}, {0x10000f11, 1}});
    label.assign(label.size(), '#');
    EXPECT_EQ(obj->GetAttrL(0x10000f10), 4);
    EXPECT_EQ(obj->GetAttrD(0x20000f10), 0.5);
    EXPECT_TRUE(obj->GetAttrB(0x10000f11));
    EXPECT_FALSE(obj->GetAttrB(0x10000f12));
    EXPECT_EQ(obj->GetAttrL(0x10000f12, -2), -2);
    EXPECT_STREQ(obj->Attrs().GetText(0x30000f10), "label text");
}

// ---------------------------------------------------------------------------------------------------------------
// Reuser

template <size_t N> struct Blob : Reuser { unsigned char bytes[N]; };

TEST(ReuserBlocks, FreedBlockIsHandedOutAgain) {
#if defined(__SANITIZE_ADDRESS__)
    GTEST_SKIP() << "blocks go straight back to the heap under AddressSanitizer";
#endif
    Reuser::Trim();
    ASSERT_EQ(Reuser::CachedBlocks(), 0u);

    auto *a = new Blob<40>; // 40 and 48 bytes share a size class
    void *where = a;
    delete a;
    EXPECT_EQ(Reuser::CachedBlocks(), 1u);
    auto *b = new Blob<48>;
    EXPECT_EQ(static_cast<void *>(b), where);
    EXPECT_EQ(Reuser::CachedBlocks(), 0u);
    std::memset(b->bytes, 0xab, sizeof b->bytes); // the whole block is usable

    // Another size class does not take it.
    delete b;
    auto *c = new Blob<200>;
    EXPECT_NE(static_cast<void *>(c), where);
    EXPECT_EQ(Reuser::CachedBlocks(), 1u);
    delete c;
    EXPECT_EQ(Reuser::CachedBlocks(), 2u);

    // Large blocks go back to the heap at once.
    delete new Blob<4096>;
    EXPECT_EQ(Reuser::CachedBlocks(), 2u);

    // The blocks a class hands out next are the ones freed into it.
    std::vector<Blob<64> *> batch;
    for (int i = 0; i < 5; ++i) batch.push_back(new Blob<64>);
    std::set<void *> distinct(batch.begin(), batch.end());
    EXPECT_EQ(distinct.size(), batch.size());
    for (auto *p : batch) delete p;
    EXPECT_EQ(Reuser::CachedBlocks(), 7u);
    std::set<void *> again;
    for (int i = 0; i < 5; ++i) {
        auto *p = new Blob<64>;
        EXPECT_TRUE(distinct.count(p)) << "block " << i << " is not one of the freed ones";
        again.insert(p);
    }
    EXPECT_EQ(again, distinct);
    for (void *p : again) delete static_cast<Blob<64> *>(p);

    Reuser::Trim();
    EXPECT_EQ(Reuser::CachedBlocks(), 0u);
}

TEST(ReuserBlocks, NoBlockHasTwoOwnersUnderConcurrency) {
    struct Owned : Reuser {
        uint32_t owner = 0, serial = 0;
        unsigned char pad[40];
    };
    struct Small : Reuser {
        uint64_t stamp = 0;
    };
    std::mutex liveLock;
    std::unordered_set<const void *> live;
    std::atomic<int> doubleOwned{0}, clobbered{0};

    constexpr int Threads = 6, Rounds = 3000, Batch = 12;
    std::vector<std::thread> threads;
    for (int t = 0; t < Threads; ++t)
        threads.emplace_back([&, t] {
            std::vector<Owned *> mine;
            std::vector<Small *> small;
            for (int round = 0; round < Rounds; ++round) {
                for (int i = 0; i < Batch; ++i) {
                    auto *o = new Owned;
                    o->owner = static_cast<uint32_t>(t);
                    o->serial = static_cast<uint32_t>(round * Batch + i);
                    std::memset(o->pad, t, sizeof o->pad);
                    auto *s = new Small;
                    s->stamp = (static_cast<uint64_t>(t) << 32) | static_cast<uint32_t>(round);
                    {
                        std::lock_guard<std::mutex> guard(liveLock);
                        if (!live.insert(o).second) ++doubleOwned;
                        if (!live.insert(s).second) ++doubleOwned;
                    }
                    mine.push_back(o);
                    small.push_back(s);
                }
                std::this_thread::yield();
                for (size_t i = 0; i < mine.size(); ++i) {
                    const Owned *o = mine[i];
                    bool ok = o->owner == static_cast<uint32_t>(t) &&
                              o->serial == static_cast<uint32_t>(round * Batch + static_cast<int>(i));
                    for (unsigned char c : o->pad) ok = ok && c == static_cast<unsigned char>(t);
                    ok = ok && small[i]->stamp == ((static_cast<uint64_t>(t) << 32) | static_cast<uint32_t>(round));
                    if (!ok) ++clobbered;
                }
                {
                    std::lock_guard<std::mutex> guard(liveLock);
                    for (Owned *o : mine) live.erase(o);
                    for (Small *s : small) live.erase(s);
                }
                for (Owned *o : mine) delete o;
                for (Small *s : small) delete s;
                mine.clear();
                small.clear();
            }
        });
    for (auto &t : threads) t.join();
    EXPECT_EQ(doubleOwned.load(), 0);
    EXPECT_EQ(clobbered.load(), 0);
    EXPECT_TRUE(live.empty());
    Reuser::Trim();
}

// ---------------------------------------------------------------------------------------------------------------
// OvID

TEST(OvIDIntern, EqualTextSharesOnePointer) {
    const std::string built = std::string("ObjTest") + "Interned";
    const OvID a("ObjTestInterned"), b(built), c(std::string_view("ObjTestInternedXYZ", 15));
    EXPECT_EQ(a, b);
    EXPECT_EQ(a, c);
    EXPECT_EQ(a.Text(), b.Text());
    EXPECT_NE(a.Text(), built.c_str());
    EXPECT_STREQ(a.Text(), "ObjTestInterned");
    EXPECT_NE(a, OvID("ObjTestInterneD"));
    EXPECT_EQ(std::hash<OvID>()(a), std::hash<OvID>()(b));
    EXPECT_EQ(OvID::FromInterned(a.Text()), a);

    EXPECT_TRUE(OvID().IsNull());
    EXPECT_TRUE(OvID("").IsNull());
    EXPECT_TRUE(OvID(static_cast<const char *>(nullptr)).IsNull());
    EXPECT_EQ(OvID(""), OvID());
    EXPECT_STREQ(OvID().Text(), "");
    EXPECT_FALSE(OvID());
    EXPECT_TRUE(a);

    // Ordering follows the text.
    EXPECT_TRUE(OvID("ObjTestA") < OvID("ObjTestB"));
    EXPECT_FALSE(OvID("ObjTestB") < OvID("ObjTestA"));
    EXPECT_FALSE(OvID("ObjTestA") < OvID("ObjTestA"));
    EXPECT_TRUE(OvID() < OvID("ObjTestA"));
    EXPECT_TRUE(OvID("ObjTestAB") < OvID("ObjTestB"));
}

TEST(OvIDIntern, ManyThreadsAgree) {
    constexpr int Threads = 8, Names = 2000;
    std::vector<std::vector<const char *>> seen(Threads, std::vector<const char *>(Names));
    std::atomic<bool> go{false};
    std::vector<std::thread> threads;
    for (int t = 0; t < Threads; ++t)
        threads.emplace_back([&, t] {
            while (!go.load()) std::this_thread::yield();
            for (int i = 0; i < Names; ++i) {
                const int n = (i * 7 + t * 13) % Names; // each thread in its own order
                seen[t][n] = OvID("ObjTestThreaded" + std::to_string(n)).Text();
            }
        });
    go = true;
    for (auto &t : threads) t.join();
    std::set<const char *> distinct;
    for (int n = 0; n < Names; ++n) {
        const OvID expect("ObjTestThreaded" + std::to_string(n));
        for (int t = 0; t < Threads; ++t) ASSERT_EQ(seen[t][n], expect.Text()) << "name " << n << " thread " << t;
        distinct.insert(expect.Text());
    }
    EXPECT_EQ(distinct.size(), static_cast<size_t>(Names));
}

// ---------------------------------------------------------------------------------------------------------------
// ScriptInfo and type links

struct TypeRoot {};
struct TypeMid {};
struct TypeLeaf {};
struct TypeLoose {};
struct TypeCycleA {};
struct TypeCycleB {};
struct ScriptedThing {};

TEST(ScriptInfoTypes, RecordAndDerivation) {
    const ScriptInfoT<ScriptedThing> info(3, "ScriptedThing", "help", nullptr);
    EXPECT_EQ(info.Version(), 3u);
    EXPECT_EQ(info.Name(), "ScriptedThing");
    int object = 0;
    EXPECT_EQ(info.ToObject(&object), &object); // no pointer adjustment
    EXPECT_EQ(info.FromObject(&object), &object);
    EXPECT_EQ(ScriptInfo(1, nullptr, nullptr, nullptr).Name(), "");

    SetTypeInfo(typeid(TypeMid), typeid(TypeRoot));
    SetTypeInfo(typeid(TypeLeaf), typeid(TypeMid));
    struct Case {
        const std::type_info &type, &base;
        bool derives;
    };
    const Case cases[] = {
        {typeid(TypeLeaf), typeid(TypeMid), true},    {typeid(TypeLeaf), typeid(TypeRoot), true},
        {typeid(TypeMid), typeid(TypeRoot), true},    {typeid(TypeRoot), typeid(TypeLeaf), false},
        {typeid(TypeMid), typeid(TypeLeaf), false},   {typeid(TypeLoose), typeid(TypeRoot), false},
        {typeid(TypeLoose), typeid(TypeLoose), true}, // a type is its own base, recorded or not
        {typeid(TypeLeaf), typeid(TypeLeaf), true},   {typeid(TypeRoot), typeid(TypeLoose), false},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << c.type.name() << " from " << c.base.name());
        EXPECT_EQ(TypeDerivesFrom(c.type, c.base), c.derives);
    }

    // Re-recording a link replaces it; clearing one cuts the chain there.
    SetTypeInfo(typeid(TypeLeaf), typeid(TypeLoose));
    EXPECT_TRUE(TypeDerivesFrom(typeid(TypeLeaf), typeid(TypeLoose)));
    EXPECT_FALSE(TypeDerivesFrom(typeid(TypeLeaf), typeid(TypeRoot)));
    SetTypeInfo(typeid(TypeLeaf), typeid(TypeMid));
    ClearTypeInfo(typeid(TypeMid));
    EXPECT_FALSE(TypeDerivesFrom(typeid(TypeLeaf), typeid(TypeRoot)));
    EXPECT_TRUE(TypeDerivesFrom(typeid(TypeLeaf), typeid(TypeMid)));
    ClearTypeInfo(typeid(TypeLeaf));
    EXPECT_FALSE(TypeDerivesFrom(typeid(TypeLeaf), typeid(TypeMid)));

    // A loop in the records ends the search instead of spinning.
    SetTypeInfo(typeid(TypeCycleA), typeid(TypeCycleB));
    SetTypeInfo(typeid(TypeCycleB), typeid(TypeCycleA));
    EXPECT_TRUE(TypeDerivesFrom(typeid(TypeCycleA), typeid(TypeCycleB)));
    EXPECT_FALSE(TypeDerivesFrom(typeid(TypeCycleA), typeid(TypeRoot)));
    ClearTypeInfo(typeid(TypeCycleA));
    ClearTypeInfo(typeid(TypeCycleB));
}

// ---------------------------------------------------------------------------------------------------------------
// Parallel

// Restores the worker count a test changed.
struct WorkerCountGuard {
    int saved = WorkerCount();
    ~WorkerCountGuard() { SetWorkerCount(saved); }
};

TEST(ParallelJobs, RangeCoveredExactlyOnce) {
    WorkerCountGuard guard;
    struct Range {
        int first, last;
    };
    const Range ranges[] = {{0, 0}, {5, 5}, {9, 3}, {3, 4}, {-17, 250}, {0, 1000}, {100, 2101}};
    for (int workers : {1, 2, 3, 8}) {
        SetWorkerCount(workers);
        EXPECT_EQ(WorkerCount(), workers);
        for (int grain : {-3, 0, 1, 3, 7, 64, 5000}) {
            for (const Range &r : ranges) {
                SCOPED_TRACE(testing::Message() << "workers " << workers << " grain " << grain << " range [" << r.first
                                                << ", " << r.last << ")");
                const int n = std::max(r.last - r.first, 0);
                std::vector<std::atomic<int>> hits(n);
                std::atomic<int> badPieces{0};
                ParallelRange(
                    r.first, r.last,
                    [&](int b, int e) {
                        if (b >= e || b < r.first || e > r.last) {
                            ++badPieces;
                            return;
                        }
                        for (int i = b; i < e; ++i) ++hits[i - r.first];
                    },
                    grain);
                EXPECT_EQ(badPieces.load(), 0);
                int wrong = 0;
                for (int i = 0; i < n; ++i) wrong += hits[i].load() != 1;
                EXPECT_EQ(wrong, 0);

                std::vector<std::atomic<int>> each(n);
                ParallelFor(
                    n, [&](int i) { ++each[i]; }, grain);
                wrong = 0;
                for (int i = 0; i < n; ++i) wrong += each[i].load() != 1;
                EXPECT_EQ(wrong, 0);
            }
        }
    }
    int calls = 0;
    ParallelFor(-4, [&](int) { ++calls; });
    EXPECT_EQ(calls, 0);
}

TEST(ParallelJobs, NestedJobsComplete) {
    WorkerCountGuard guard;
    for (int workers : {1, 4}) {
        SetWorkerCount(workers);
        constexpr int Outer = 12, Inner = 300;
        std::vector<std::atomic<int>> hits(Outer * Inner);
        ParallelFor(Outer, [&](int o) {
            ParallelRange(
                0, Inner,
                [&](int b, int e) {
                    for (int i = b; i < e; ++i) ++hits[o * Inner + i];
                },
                5);
        });
        int wrong = 0;
        for (auto &h : hits) wrong += h.load() != 1;
        EXPECT_EQ(wrong, 0) << "workers " << workers;
    }
}

TEST(ParallelJobs, OneWorkerRunsInTheCallingThread) {
    WorkerCountGuard guard;
    SetWorkerCount(1);
    EXPECT_EQ(WorkerCount(), 1);
    const std::thread::id caller = std::this_thread::get_id();
    std::atomic<int> elsewhere{0}, covered{0};
    ParallelRange(
        0, 100000,
        [&](int b, int e) {
            if (std::this_thread::get_id() != caller) ++elsewhere;
            covered += e - b;
        },
        1);
    EXPECT_EQ(elsewhere.load(), 0);
    EXPECT_EQ(covered.load(), 100000);

    SetWorkerCount(0); // one per core
    EXPECT_EQ(WorkerCount(), tbb::info::default_concurrency());
    SetWorkerCount(-5);
    EXPECT_EQ(WorkerCount(), tbb::info::default_concurrency());
}

TEST(ParallelJobs, JobsFromManyThreadsAtOnce) {
    WorkerCountGuard guard;
    SetWorkerCount(3);
    constexpr int Callers = 4, N = 5000;
    std::vector<std::vector<std::atomic<int>>> hits;
    for (int c = 0; c < Callers; ++c) hits.emplace_back(N);
    std::vector<std::thread> callers;
    for (int c = 0; c < Callers; ++c)
        callers.emplace_back([&, c] {
            for (int rep = 0; rep < 10; ++rep)
                ParallelRange(
                    0, N,
                    [&](int b, int e) {
                        for (int i = b; i < e; ++i) ++hits[c][i];
                    },
                    16);
        });
    for (auto &t : callers) t.join();
    int wrong = 0;
    for (auto &row : hits)
        for (auto &h : row) wrong += h.load() != 10;
    EXPECT_EQ(wrong, 0);
}

} // namespace
} // namespace Orvane::objtest
