#include "nn/engine.h"

#include <unistd.h>

#include <cstdlib>
#include <ctime>
#include <mutex>

namespace nn {

class Engine::RNG::Generator {
 public:
  explicit Generator(unsigned int seed) : engine_(new boost::mt19937(seed)) {}
  boost::mt19937& engine() { return *engine_; }

 private:
  boost::shared_ptr<boost::mt19937> engine_;
};

Engine::RNG::RNG(unsigned int seed) : generator_(new Generator(seed)) {}

boost::mt19937& Engine::RNG::engine() { return generator_->engine(); }

boost::shared_ptr<Engine> Engine::singleton_;

Engine& Engine::Get() {
  static std::once_flag created;
  std::call_once(created, [] { singleton_.reset(new Engine()); });
  return *singleton_;
}

int64_t Engine::SeedFor(int64_t pid, int64_t seconds) {
  // Wrap-around is part of the formula; unsigned arithmetic gives it defined.
  const uint64_t product = static_cast<uint64_t>(seconds) * static_cast<uint64_t>(pid - 83) *
                           static_cast<uint64_t>(64979);
  return std::llabs(static_cast<int64_t>(product) % 104729);
}

boost::mt19937& Engine::rng_engine() {
  Engine& engine = Get();
  static std::once_flag seeded;
  std::call_once(seeded, [&engine] {
    const int64_t seed = SeedFor(getpid(), static_cast<int64_t>(std::time(nullptr)));
    engine.rng_.reset(new RNG(static_cast<unsigned int>(seed)));
  });
  return engine.rng_->engine();
}

}  // namespace nn
