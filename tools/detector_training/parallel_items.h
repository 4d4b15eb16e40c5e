#ifndef TOOLS_DETECTOR_TRAINING_PARALLEL_ITEMS_H_
#define TOOLS_DETECTOR_TRAINING_PARALLEL_ITEMS_H_

#include <cstddef>
#include <functional>

namespace training {

// Calls work(item, worker) for every item below count, item i on worker
// i % workers, each worker a thread of its own (worker 0 the caller's), and
// returns when all are done. Workers index per-thread resources, such as a
// copy of the cascade, since a net serves one thread at a time.
void forEachItem(size_t count, size_t workers, const std::function<void(size_t, size_t)>& work);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_PARALLEL_ITEMS_H_
