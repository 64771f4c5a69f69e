#include "stabilization/factorization/factorization_queue.h"

#include <gtest/gtest.h>

#include <utility>
#include <vector>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

using range = std::pair<std::uint64_t, std::uint64_t>;

// A clip in which windows reach as far as their limit in steps of 5 from 40, and frames of the
// given stretch are too weak.
class ScriptedMaker : public window_maker {
 public:
  ScriptedMaker(std::uint64_t frames, const range& weak) : frames_(frames), weak_(weak) {}

  factorization_window make(std::uint64_t first, std::uint64_t limit) override {
    requests.push_back({first, limit});
    const std::uint64_t steps = limit < 40 ? limit : limit / 5 * 5;
    return window_over(first, frames_ - first <= limit ? frames_ : first + steps);
  }

  quality_result check(const factorization_window& window) override {
    if (window.end - window.first < 15) return {false, window.first, window.end};
    for (std::uint64_t f = window.first + 1; f + 1 < window.end; ++f) {
      if (!Weak(f)) continue;
      std::uint64_t good = f;
      while (good < window.end - 1 && Weak(good)) ++good;
      return {false, f, good};
    }
    return {};
  }

  std::vector<range> requests;

 private:
  bool Weak(std::uint64_t f) const { return f >= weak_.first && f < weak_.second; }
  std::uint64_t frames_;
  range weak_;
};

// The windows and the requests for them. no_start: frames from which too few tracks are complete.
std::pair<std::vector<range>, std::vector<range>> run(std::uint64_t frames, const range& weak,
                                                      const range& no_start = {},
                                                      const SolverParamsRecord& parameters = {}) {
  stabilizer_global global;
  global.frame_count = frames;
  std::vector<std::size_t> complete(frames, 5);
  for (std::uint64_t f = no_start.first; f < no_start.second; ++f) complete[f] = 4;
  ScriptedMaker maker(frames, weak);
  std::vector<factorization_window> windows;
  run_factorization_queue(global, parameters, complete, maker, windows, kNoProgress);
  std::vector<range> found;
  for (const auto& w : windows) found.push_back({w.first, w.end});
  return {found, maker.requests};
}

TEST(FactorizationQueueTest, WindowsCoverWhatTheirTracksHold) {
  const struct {
    const char* situation;
    std::uint64_t frames;
    range weak, no_start;
    std::vector<range> windows;
  } cases[] = {{"one window", 40, {}, {}, {{0, 40}}},
               {"a short rest joins", 330, {}, {}, {{0, 330}}},
               {"a longer one does not", 331, {}, {}, {{0, 300}, {270, 331}}},
               {"and a rest", 1000, {}, {}, {{0, 300}, {270, 570}, {540, 840}, {810, 1000}}},
               {"a weak stretch truncates", 300, {120, 140}, {}, {{0, 120}, {140, 300}}},
               {"in whole steps", 300, {118, 140}, {}, {{0, 115}, {140, 300}}},
               {"near the start it abandons", 300, {29, 50}, {}, {{50, 300}}},
               {"but not at the overlap itself", 300, {30, 50}, {}, {{0, 30}, {50, 300}}},
               {"all weak", 100, {0, 100}, {}, {}},
               {"begins where enough are complete", 300, {}, {0, 17}, {{17, 300}}},
               {"which they never are", 300, {}, {0, 300}, {}}};
  for (const auto& e : cases) {
    EXPECT_EQ(run(e.frames, e.weak, e.no_start).first, e.windows) << e.situation;
  }
}

TEST(FactorizationQueueTest, ATruncatedWindowIsMadeAgainOnlyIfChecked) {
  // [0, 300) fails on 120; made again over 120 frames; goes on at 140.
  EXPECT_EQ(run(300, {120, 140}).second, (std::vector<range>{{0, 301}, {0, 120}, {140, 161}}));
  SolverParamsRecord unchecked;
  unchecked.conservative_factorization = false;
  EXPECT_EQ(run(400, {120, 140}, {}, unchecked).first, (std::vector<range>{{0, 300}, {270, 400}}));
}

TEST(FactorizationQueueTest, CompleteTrajectoriesCountWhatTheDurationAsks) {
  stabilizer_global global;
  global.frame_count = 100;
  global.trajectories = {
      {0, 0, 0, 100}, {1, 0, 0, 50}, {2, 0, 20, 60}, {3, 0, 70, 100}, {4, 0, 75, 99}};
  const auto complete = complete_trajectories(global, 40);
  const std::pair<int, std::size_t> counts[] = {{0, 2},  {10, 2}, {11, 1}, {20, 2},
                                                {21, 1}, {69, 1}, {70, 2}, {99, 2}};
  for (const auto& [frame, count] : counts) EXPECT_EQ(complete[frame], count) << frame;
}

}  // namespace
}  // namespace marrow::stabilization
