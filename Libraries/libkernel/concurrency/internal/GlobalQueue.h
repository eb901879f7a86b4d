#pragma once

#include "libkernel/core/Types.h"

/// The process's queues of jobs, one for each priority, and the threads that work them off. Threads are made when jobs
/// wait and processors are free or workers block, and end after a while of idleness. Nothing here is ever destroyed:
/// jobs may run until the process has ended.
namespace Kernel::GlobalQueue {

constexpr int c_low = -2;
constexpr int c_default = 0;
constexpr int c_high = 2;

using JobFunction = void (*)(void* context);
/// Runs the indices from begin to end - 1, one by one.
using RangeFunction = void (*)(void* context, u64 begin, u64 end);

/// Which of the three queues a priority means; the default one for any other number.
using Queue = int;
Queue GetQueue(int priority);

/// Queues a job and returns; throws std::bad_alloc if there is no room, or no thread to run it. At most 256 jobs run at
/// once, blocked ones included. Jobs of one queue start in the order given, a higher queue's before a lower one's. A
/// job that throws ends the process.
void Async(Queue queue, void* context, JobFunction work);

/// Runs all indices below @p count on this thread and on workers, and returns when the last is done. Indices are
/// claimed in runs: single ones while an index takes long, longer runs, shrinking towards the end, while they are
/// short.
void Apply(u64 count, Queue queue, void* context, RangeFunction work);

} // namespace Kernel::GlobalQueue
