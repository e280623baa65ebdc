#include "host/core/Object.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstdint>
#include <cstring>
#include <functional>
#include <set>
#include <string>
#include <thread>
#include <typeinfo>
#include <vector>

#include <tbb/info.h>

#include "host/core/OvID.h"
#include "host/core/Parallel.h"
#include "host/core/ScriptInfo.h"

namespace Orvane::objtest {
namespace {

/// Runs fn(0) .. fn(n - 1) on threads of their own and waits for them.
void OnThreads(int n, const std::function<void(int)> &fn) {
    std::vector<std::thread> threads;
    for (int t = 0; t < n; ++t) threads.emplace_back(fn, t);
    for (auto &t : threads) t.join();
}

std::atomic<int> aliveCount{0};

class Counted : public RefObject {
public:
    explicit Counted(int v = 0) : value(v) { ++aliveCount; }
    int value;

protected:
    ~Counted() override { --aliveCount; }
};

struct DerivedCounted : Counted {
    explicit DerivedCounted(int v) : Counted(v) {}
};

TEST(RefHandle, CountsEveryHandleAndDeletesWithTheLast) {
    aliveCount = 0;
    Counted *raw = new Counted(4); // starts with one reference
    Ref<Counted> shared(raw);      // shares: adds one
    raw->Recycle();                // the maker lets go of its own
    EXPECT_EQ(raw->RefCount(), 1);
    Ref<Counted> a = MakeRef<Counted>(1); // the maker's reference, adopted
    Counted *p = a.Get();
    {
        Ref<Counted> b = a;            // copy
        Ref<Counted> c = std::move(b); // move: no change
        EXPECT_EQ(b.Get(), nullptr);
        Ref<Counted> d;
        d = c;                        // copy assignment
        const Ref<Counted> &same = d; // assigned through another name, as real self assignment happens
        d = same;                     // self assignment keeps the count
        EXPECT_EQ(p->RefCount(), 3);
        d = std::move(c);
        EXPECT_TRUE(!c && p->RefCount() == 2);
    }
    EXPECT_EQ(p->RefCount(), 1);
    EXPECT_TRUE(a.Release() == p && !a);
    a = Ref<Counted>::Adopt(p);
    EXPECT_EQ(p->RefCount(), 1);
    a = MakeRef<Counted>(2); // assigning over the last reference deletes the old object
    EXPECT_EQ(aliveCount, 2);
    Ref<DerivedCounted> derived = MakeRef<DerivedCounted>(9);
    {
        Ref<Counted> base = derived; // converting copy: shares
        Ref<RefObject> root = base;
        EXPECT_EQ(derived->RefCount(), 3);
    }
    Ref<Counted> moved = std::move(derived); // converting move: takes the reference over
    EXPECT_TRUE(!derived && moved->RefCount() == 1);
    for (Ref<Counted> *r : {&a, &shared, &moved}) r->Reset();
    EXPECT_EQ(aliveCount, 0);
    Ref<Counted> empty;
    empty.Reset(); // no-op on an empty handle
    EXPECT_TRUE(empty == Ref<Counted>(static_cast<Counted *>(nullptr)));
    // Attributes: later values win, earlier ones stay, and text is the object's own.
    Ref<Counted> obj = MakeRef<Counted>();
    std::string label = "label text";
    obj->SetAttrsTagList({{0x10000f10, 3}, {0x20000f10, 0.5}, {0x30000f10, label.c_str()}});
    obj->SetAttrsTagList({{0x10000f10, 4}, {0x10000f11, 1}});
    label.assign(label.size(), '#');
    EXPECT_EQ(std::tuple(obj->GetAttrL(0x10000f10), obj->GetAttrD(0x20000f10), obj->GetAttrB(0x10000f11),
                         obj->GetAttrL(0x10000f12, -2), std::string(obj->Attrs().GetText(0x30000f10))),
              std::tuple(4LL, 0.5, true, -2LL, "label text"));
}

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
    std::memset(b->bytes, 0xab, sizeof b->bytes); // the whole block is usable
    delete b;
    // Another size class does not take it; large blocks go back to the heap at once.
    auto *c = new Blob<200>;
    EXPECT_NE(static_cast<void *>(c), where);
    delete c;
    delete new Blob<4096>;
    EXPECT_EQ(Reuser::CachedBlocks(), 2u);
    // The blocks a class hands out next are the ones freed into it.
    std::set<void *> freed, again;
    for (int i = 0; i < 5; ++i) freed.insert(new Blob<64>);
    for (void *p : freed) delete static_cast<Blob<64> *>(p);
    for (int i = 0; i < 5; ++i) again.insert(new Blob<64>);
    EXPECT_EQ(again, freed);
    for (void *p : again) delete static_cast<Blob<64> *>(p);
    Reuser::Trim();
    EXPECT_EQ(Reuser::CachedBlocks(), 0u);
}

TEST(OvIDIntern, EqualTextSharesOnePointer) {
    const std::string built = std::string("ObjTest") + "Interned";
    const OvID a("ObjTestInterned"), b(built), c(std::string_view("ObjTestInternedXYZ", 15));
    EXPECT_TRUE(a.Text() == b.Text() && a.Text() == c.Text() && a.Text() != built.c_str());
    EXPECT_STREQ(a.Text(), "ObjTestInterned");
    EXPECT_NE(a, OvID("ObjTestInterneD"));
    EXPECT_EQ(std::hash<OvID>()(a), std::hash<OvID>()(b));
    EXPECT_EQ(OvID::FromInterned(a.Text()), a);
    for (const OvID &null : {OvID(), OvID(""), OvID(static_cast<const char *>(nullptr))})
        EXPECT_TRUE(null.IsNull() && !null && !*null.Text());
    // Ordering follows the text.
    const char *const ordered[] = {"", "ObjTestA", "ObjTestAB", "ObjTestB"};
    for (const char *x : ordered)
        for (const char *y : ordered) EXPECT_EQ(OvID(x) < OvID(y), std::string(x) < y) << x << " < " << y;
}

// Threads share one object, take blocks of two size classes stamped with their owner, round and place (checked after
// the other threads have had the chance to take them), and intern names, each in an order of its own.
TEST(Concurrency, ReferencesBlocksAndInternedNamesStayConsistent) {
    struct Large : Reuser {
        uint64_t stamp[6];
    };
    struct Small : Reuser {
        uint64_t stamp;
    };
    constexpr int Threads = 6, Names = 2000;
    aliveCount = 0;
    Ref<Counted> shared = MakeRef<Counted>(0);
    std::atomic<int> clobbered{0};
    std::vector<std::vector<const char *>> seen(Threads, std::vector<const char *>(Names));
    OnThreads(Threads, [&](int t) {
        std::vector<Large *> large(12);
        std::vector<Small *> small(12);
        for (uint64_t round = 0; round < 3000; ++round) {
            const int n = (round * 7 + t * 13) % Names;
            seen[t][n] = OvID("ObjTestThreaded" + std::to_string(n)).Text();
            auto stampOf = [&](size_t i) { return uint64_t(t) << 48 | round << 8 | i; };
            for (size_t i = 0; i < large.size(); ++i) {
                large[i] = new Large;
                small[i] = new Small{{}, stampOf(i)};
                for (uint64_t &s : large[i]->stamp) s = stampOf(i);
            }
            std::this_thread::yield();
            for (size_t i = 0; i < large.size(); ++i) {
                const Ref<Counted> a = shared;
                const Ref<RefObject> b = a;
                bool ok = small[i]->stamp == stampOf(i);
                for (uint64_t s : large[i]->stamp) ok = ok && s == stampOf(i);
                clobbered += !ok;
                delete large[i];
                delete small[i];
            }
        }
    });
    EXPECT_EQ(std::pair(clobbered.load(), shared->RefCount()), std::pair(0, 1));
    Reuser::Trim();
    shared.Reset();
    EXPECT_EQ(aliveCount, 0);
    std::set<const char *> distinct;
    for (int n = 0; n < Names; ++n) {
        const OvID expect("ObjTestThreaded" + std::to_string(n));
        for (int t = 0; t < Threads; ++t) ASSERT_EQ(seen[t][n], expect.Text()) << "name " << n << " thread " << t;
        distinct.insert(expect.Text());
    }
    EXPECT_EQ(distinct.size(), static_cast<size_t>(Names));
}

struct TypeRoot {};
struct TypeMid {};
struct TypeLeaf {};
struct TypeLoose {};
struct TypeCycleA {};
struct TypeCycleB {};

TEST(ScriptInfoTypes, DerivationFollowsTheRecordedLinks) {
    // Whether each of Root, Mid, Leaf and Loose derives from each of them: a type is its own base, recorded or not.
    auto derives = [] {
        const std::type_info *types[] = {&typeid(TypeRoot), &typeid(TypeMid), &typeid(TypeLeaf), &typeid(TypeLoose)};
        std::string table;
        for (const std::type_info *t : types) {
            for (const std::type_info *b : types) table += TypeDerivesFrom(*t, *b) ? '1' : '0';
            table += ' ';
        }
        return table;
    };
    SetTypeInfo(typeid(TypeMid), typeid(TypeRoot));
    SetTypeInfo(typeid(TypeLeaf), typeid(TypeMid));
    EXPECT_EQ(derives(), "1000 1100 1110 0001 ");
    SetTypeInfo(typeid(TypeLeaf), typeid(TypeLoose)); // re-recording a link replaces it
    EXPECT_EQ(derives(), "1000 1100 0011 0001 ");
    SetTypeInfo(typeid(TypeLeaf), typeid(TypeMid));
    ClearTypeInfo(typeid(TypeMid)); // clearing one cuts the chain there
    EXPECT_EQ(derives(), "1000 0100 0110 0001 ");
    ClearTypeInfo(typeid(TypeLeaf));
    EXPECT_EQ(derives(), "1000 0100 0010 0001 ");
    // A loop in the records ends the search instead of spinning.
    SetTypeInfo(typeid(TypeCycleA), typeid(TypeCycleB));
    SetTypeInfo(typeid(TypeCycleB), typeid(TypeCycleA));
    EXPECT_TRUE(TypeDerivesFrom(typeid(TypeCycleA), typeid(TypeCycleB)));
    EXPECT_FALSE(TypeDerivesFrom(typeid(TypeCycleA), typeid(TypeRoot)));
    ClearTypeInfo(typeid(TypeCycleA));
    ClearTypeInfo(typeid(TypeCycleB));
}

// Restores the worker count a test changed.
struct WorkerCountGuard {
    int saved = WorkerCount();
    ~WorkerCountGuard() { SetWorkerCount(saved); }
};

/// How many of `hits` differ from `times`.
int Wrong(const std::vector<std::atomic<int>> &hits, int times = 1) {
    int wrong = 0;
    for (const auto &h : hits) wrong += h.load() != times;
    return wrong;
}

TEST(ParallelJobs, RangesAreCoveredOnceNestedOrFromManyThreadsAndOneWorkerIsTheCallingThread) {
    WorkerCountGuard guard;
    const std::pair<int, int> ranges[] = {{0, 0}, {5, 5}, {9, 3}, {3, 4}, {-17, 250}, {0, 1000}, {100, 2101}};
    for (int workers : {1, 2, 3, 8}) {
        SetWorkerCount(workers);
        EXPECT_EQ(WorkerCount(), workers);
        for (int grain : {-3, 0, 1, 3, 7, 64, 5000})
            for (const auto &[first, last] : ranges) {
                SCOPED_TRACE(testing::Message()
                             << workers << " workers, grain " << grain << ", " << first << ".." << last);
                const int n = std::max(last - first, 0);
                std::vector<std::atomic<int>> hits(n), each(n);
                std::atomic<int> badPieces{0};
                auto count = [&, first = first, last = last](int b, int e) {
                    badPieces += b >= e || b < first || e > last;
                    for (int i = std::max(b, first); i < std::min(e, last); ++i) ++hits[i - first];
                };
                ParallelRange(first, last, count, grain);
                ParallelFor(
                    n, [&](int i) { ++each[i]; }, grain);
                EXPECT_EQ(std::tuple(badPieces.load(), Wrong(hits), Wrong(each)), std::tuple(0, 0, 0));
            }
    }
    int calls = 0;
    ParallelFor(-4, [&](int) { ++calls; });
    EXPECT_EQ(calls, 0);
    for (int workers : {1, 4}) {
        SetWorkerCount(workers);
        constexpr int Outer = 12, Inner = 300;
        std::vector<std::atomic<int>> hits(Outer * Inner);
        ParallelFor(Outer, [&](int o) {
            auto count = [&](int b, int e) {
                for (int i = b; i < e; ++i) ++hits[o * Inner + i];
            };
            ParallelRange(0, Inner, count, 5);
        });
        EXPECT_EQ(Wrong(hits), 0) << "nested, workers " << workers;
    }
    SetWorkerCount(3);
    constexpr int Callers = 4, N = 5000;
    std::vector<std::vector<std::atomic<int>>> hits;
    for (int c = 0; c < Callers; ++c) hits.emplace_back(N);
    OnThreads(Callers, [&](int c) {
        auto count = [&](int b, int e) {
            for (int i = b; i < e; ++i) ++hits[c][i];
        };
        for (int rep = 0; rep < 10; ++rep) ParallelRange(0, N, count, 16);
    });
    for (const auto &row : hits) EXPECT_EQ(Wrong(row, 10), 0) << "from many threads";
    // One worker runs in the calling thread.
    SetWorkerCount(1);
    const std::thread::id caller = std::this_thread::get_id();
    std::atomic<int> elsewhere{0}, covered{0};
    auto count = [&](int b, int e) {
        elsewhere += std::this_thread::get_id() != caller;
        covered += e - b;
    };
    ParallelRange(0, 100000, count, 1);
    EXPECT_EQ(std::pair(elsewhere.load(), covered.load()), std::pair(0, 100000));
    for (int zeroOrLess : {0, -5}) { // one per core
        SetWorkerCount(zeroOrLess);
        EXPECT_EQ(WorkerCount(), tbb::info::default_concurrency());
    }
}

} // namespace
} // namespace Orvane::objtest
