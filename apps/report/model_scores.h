#pragma once

#include <cstddef>
#include <mutex>
#include <string>
#include <vector>

namespace calmframe::report {

// The solve's log while this lives, instead of its way to the standard error. It is the only place
// where a solve tells how free each frame's motion model was. One at a time.
class SolveLog {
 public:
  SolveLog();
  ~SolveLog();
  SolveLog(const SolveLog&) = delete;
  SolveLog& operator=(const SolveLog&) = delete;

  // Each frame's score by the last solve that told it, NaN where none did: 1 a shift, 2 a shift,
  // turn and size, 3 a perspective, 4 a bent grid; between two a blend of both.
  std::vector<double> Scores(std::size_t frames) const;

 private:
  mutable std::mutex mutex_;
  std::string text_;  // guarded by mutex_
};

// "bent grid: 15 frames; perspective: 36 frames"; empty where no score is known. A blend counts
// as the freer of its two.
std::string ModelsText(const std::vector<double>& scores);

}  // namespace calmframe::report
