#pragma once
// The worker pool: runs independent pieces of one job (rows of an image) on
// the worker threads and returns when all are done. The caller waits, so
// nothing it shares read-only with the pieces needs a lock.
//
// Results never depend on how the work is split: each piece writes its own
// rows, so the same job gives the same bits whatever the thread count.
//
// Thread safety: any thread may start a job; jobs may nest.
#include <functional>

#include "host/core/Export.h"

namespace Orvane {

/// Calls fn(begin, end) on contiguous sub-ranges covering [first, last).
/// `grain` is the smallest range worth handing to one worker.
ORVANE_API void ParallelRange(int first, int last, const std::function<void(int, int)> &fn, int grain = 1);
/// Calls fn(i) once for each i in [0, count).
ORVANE_API void ParallelFor(int count, const std::function<void(int)> &fn, int grain = 1);

/// Number of worker threads (the calling thread included).
ORVANE_API int WorkerCount();
/// Sets the number of workers; 0 means one per core. Affects later jobs.
ORVANE_API void SetWorkerCount(int count);

} // namespace Orvane
