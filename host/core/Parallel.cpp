#include "host/core/Parallel.h"

#include <memory>
#include <mutex>

#include <tbb/blocked_range.h>
#include <tbb/info.h>
#include <tbb/parallel_for.h>
#include <tbb/task_arena.h>

namespace Orvane {
namespace {

struct Pool {
    std::mutex lock;
    std::shared_ptr<tbb::task_arena> arena;
    int count = 0;
};

Pool &ThePool() {
    static Pool *pool = new Pool; // lives for the process: workers may still run during static teardown
    return *pool;
}

std::shared_ptr<tbb::task_arena> Arena() {
    Pool &p = ThePool();
    std::lock_guard<std::mutex> guard(p.lock);
    if (!p.arena) {
        const int n = p.count > 0 ? p.count : tbb::info::default_concurrency();
        p.arena = std::make_shared<tbb::task_arena>(n);
        p.count = n;
    }
    return p.arena;
}

} // namespace

void ParallelRange(int first, int last, const std::function<void(int, int)> &fn, int grain) {
    if (last <= first) return;
    if (grain < 1) grain = 1;
    if (last - first <= grain) {
        fn(first, last);
        return;
    }
    std::shared_ptr<tbb::task_arena> arena = Arena();
    if (arena->max_concurrency() <= 1) {
        fn(first, last);
        return;
    }
    arena->execute([&] {
        tbb::parallel_for(tbb::blocked_range<int>(first, last, grain),
                          [&](const tbb::blocked_range<int> &r) { fn(r.begin(), r.end()); });
    });
}

void ParallelFor(int count, const std::function<void(int)> &fn, int grain) {
    ParallelRange(
        0, count,
        [&](int begin, int end) {
            for (int i = begin; i < end; ++i) fn(i);
        },
        grain);
}

int WorkerCount() { return Arena()->max_concurrency(); }

void SetWorkerCount(int count) {
    Pool &p = ThePool();
    std::lock_guard<std::mutex> guard(p.lock);
    p.count = count > 0 ? count : tbb::info::default_concurrency();
    p.arena.reset();
}

} // namespace Orvane
