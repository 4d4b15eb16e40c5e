#include "detector_training/parallel_items.h"

#include <thread>
#include <vector>

namespace training {

void forEachItem(size_t count, size_t workers, const std::function<void(size_t, size_t)>& work) {
  auto run = [&](size_t worker) {
    for (size_t item = worker; item < count; item += workers) {
      work(item, worker);
    }
  };
  std::vector<std::thread> threads;
  for (size_t worker = 1; worker < workers; ++worker) {
    threads.emplace_back(run, worker);
  }
  run(0);
  for (std::thread& thread : threads) {
    thread.join();
  }
}

}  // namespace training
