#ifndef NN_ENGINE_H_
#define NN_ENGINE_H_

#include <boost/random/mersenne_twister.hpp>
#include <boost/shared_ptr.hpp>

#include <atomic>
#include <cstdint>

namespace nn {

// The engine's one global object: the device layers run on (always the CPU
// here), whether nets are training or testing, and the random generator.
//
// The instance and the generator are created once, whichever threads ask
// first; mode and phase may be set and read from any thread. Draws from the
// generator must come from one thread at a time (nets are built under the
// detector's load lock). Loading sets mode and phase before any net is built;
// forward passes only read them.
class Engine {
 public:
  enum Brew { CPU = 0, GPU = 1 };
  enum Phase { TRAIN = 0, TEST = 1 };

  // A Mersenne Twister generator behind shared ownership, so that a layer can
  // keep a private one.
  class RNG {
   public:
    class Generator;
    explicit RNG(unsigned int seed);
    boost::mt19937& engine();

   private:
    boost::shared_ptr<Generator> generator_;
  };

  static Engine& Get();
  static Brew mode() { return Get().mode_; }
  static void set_mode(Brew mode) { Get().mode_ = mode; }
  static Phase phase() { return Get().phase_; }
  static void set_phase(Phase phase) { Get().phase_ = phase; }
  // The engine's generator, seeded from the process number and the clock at
  // the first draw; the sequence differs between runs.
  static boost::mt19937& rng_engine();

  // The seed of the engine's generator for a process number and a time in
  // seconds: |(t * (pid - 83) * 64979) mod 104729| with 64-bit wrap-around.
  static int64_t SeedFor(int64_t pid, int64_t seconds);

 private:
  Engine() = default;

  boost::shared_ptr<RNG> rng_;
  std::atomic<Brew> mode_{CPU};
  std::atomic<Phase> phase_{TRAIN};

  static boost::shared_ptr<Engine> singleton_;
};

}  // namespace nn

#endif  // NN_ENGINE_H_
