#include "tavi/batch.h"

#include <atomic>
#include <condition_variable>
#include <exception>
#include <mutex>
#include <optional>
#include <thread>

namespace tavi {

void runBatch(const std::vector<ImageInput>& inputs, const FinderSettings& settings, int threads,
              const std::function<void(const ImageReport&)>& emit,
              const std::function<void(size_t)>& progress) {
  std::vector<std::optional<ImageReport>> reports(inputs.size());
  std::atomic<size_t> next{0};
  std::mutex mutex;
  std::condition_variable done;
  std::exception_ptr failure;
  size_t finishedWorkers = 0;

  auto work = [&] {
    try {
      FaceFinder finder(settings);
      for (size_t i = next++; i < inputs.size(); i = next++) {
        ImageReport report = finder.process(inputs[i]);
        const std::lock_guard<std::mutex> lock(mutex);
        reports[i] = std::move(report);
        done.notify_one();
      }
    } catch (...) {
      const std::lock_guard<std::mutex> lock(mutex);
      failure = std::current_exception();
      next = inputs.size();  // the others stop after their current file
    }
    const std::lock_guard<std::mutex> lock(mutex);
    ++finishedWorkers;
    done.notify_one();
  };
  std::vector<std::thread> workers;
  for (int t = 0; t < threads; ++t) {
    workers.emplace_back(work);
  }
  for (size_t emitted = 0; emitted < inputs.size(); ++emitted) {
    std::unique_lock<std::mutex> lock(mutex);
    done.wait(lock, [&] {
      return reports[emitted].has_value() || finishedWorkers == workers.size();
    });
    if (!reports[emitted].has_value()) {
      break;
    }
    const ImageReport report = std::move(*reports[emitted]);
    reports[emitted].reset();
    lock.unlock();
    emit(report);
    if (progress) {
      progress(emitted + 1);
    }
  }
  for (std::thread& worker : workers) {
    worker.join();
  }
  if (failure) {
    std::rethrow_exception(failure);
  }
}

}  // namespace tavi
