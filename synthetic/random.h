#pragma once

#include <cmath>
#include <cstdint>
#include <numbers>
#include <random>

namespace synthetic {

// A seeded stream of random numbers. The standard fixes the engine's output but leaves the
// distributions to each library, so those are written out here: a seed means the same everywhere.
class random_stream {
 public:
  explicit random_stream(std::uint64_t seed) : engine_(seed) {}

  std::uint64_t bits() { return engine_(); }

  // In [0, 1).
  double uniform() { return static_cast<double>(engine_() >> 11) * 0x1p-53; }

  double uniform(double low, double high) { return low + (high - low) * uniform(); }

  // Mean 0, deviation 1 (Box and Muller, 1958).
  double normal() {
    if (has_spare_) {
      has_spare_ = false;
      return spare_;
    }
    const double radius = std::sqrt(-2.0 * std::log(1.0 - uniform()));
    const double angle = 2.0 * std::numbers::pi * uniform();
    spare_ = radius * std::sin(angle);
    has_spare_ = true;
    return radius * std::cos(angle);
  }

 private:
  std::mt19937_64 engine_;
  double spare_ = 0.0;
  bool has_spare_ = false;
};

// A well-mixed function of its argument (the finalizer of SplitMix64; Steele, Lea and Flood, 2014).
inline std::uint64_t mix(std::uint64_t v) {
  v += 0x9e3779b97f4a7c15u;
  v = (v ^ (v >> 30)) * 0xbf58476d1ce4e5b9u;
  v = (v ^ (v >> 27)) * 0x94d049bb133111ebu;
  return v ^ (v >> 31);
}

// The seed of a further, independent stream.
inline std::uint64_t substream(std::uint64_t seed, std::uint64_t which) {
  return mix(mix(seed) + which);
}

}  // namespace synthetic
