#include "tracking/pyramid_search.h"

#include <gmock/gmock.h>

#include <functional>
#include <vector>

namespace marrow::tracking {
namespace {

using ::testing::ElementsAre;

constexpr int kMaxIterations = 9;

// Plays the level solvers by a function of the level and notes the levels that were visited.
struct scripted_stage {
  std::function<int(std::size_t, AffineState&)> solve;
  std::function<float(std::size_t)> correlation = [](std::size_t) { return 1.0f; };
  std::vector<int> solved = {}, correlated = {};

  int Solve(std::size_t level, AffineState& state) {
    solved.push_back(static_cast<int>(level));
    return solve(level, state);
  }
  float Correlation(std::size_t level) {
    correlated.push_back(static_cast<int>(level));
    return correlation(level);
  }
};

AffineState Start() {
  AffineState state(40, 24);
  state.dx = 4, state.dy = -2, state.a = 0.5f;
  state.gain[1] = 2, state.bias[2] = 7;
  return state;
}

TEST(PyramidSearchTest, EachAttemptStartsACoarserLevelFromTheInitialGuess) {
  std::vector<float> xs, ys, dxs;
  scripted_stage stage;
  stage.solve = [&](std::size_t level, AffineState& s) {
    xs.push_back(s.x), ys.push_back(s.y), dxs.push_back(s.dx);
    EXPECT_EQ(s.a, 0.5f) << "the warp has no scale";
    EXPECT_EQ(s.gain[1], 2.0f);
    EXPECT_EQ(s.bias[2], 7.0f);
    s.dx += 1;
    // Attempt 0 fails, attempt 1 fails on its second level, attempt 2 succeeds.
    if (stage.solved.size() == 1) return kLevelFailed;
    if (stage.solved.size() == 3) return kMaxIterations;
    return static_cast<int>(level);
  };
  AffineState state = Start();
  const search_result result = SearchPyramid(stage, 4, 0.7f, kMaxIterations, state);
  EXPECT_EQ(result.start_level, 2);
  EXPECT_THAT(stage.solved, ElementsAre(0, 1, 0, 2, 1, 0));
  EXPECT_THAT(stage.correlated, ElementsAre(1, 2)) << "at the coarsest level of an attempt only";
  EXPECT_THAT(xs, ElementsAre(40, 20, 40, 10, 20, 40));
  EXPECT_THAT(ys, ElementsAre(24, 12, 24, 6, 12, 24));
  EXPECT_THAT(dxs, ElementsAre(4, 2, 6, 1, 4, 10));
  EXPECT_EQ(state.dx, 11);
  EXPECT_EQ(state.dy, -2);
  EXPECT_EQ(state.x, 40);
}

TEST(PyramidSearchTest, AFailedSearchLeavesTheState) {
  scripted_stage stage{[](std::size_t, AffineState& s) { return s.dx += 9, kMaxIterations; }};
  AffineState state = Start();
  EXPECT_FALSE(SearchPyramid(stage, 3, 0.7f, kMaxIterations, state).found());
  EXPECT_THAT(stage.solved, ElementsAre(0, 1, 2));
  EXPECT_EQ(state.dx, 4);
  EXPECT_FALSE(SearchPyramid(stage, 0, 0.7f, kMaxIterations, state).found());
  EXPECT_EQ(stage.solved.size(), 3u);
}

TEST(PyramidSearchTest, ALowCorrelationAtTheCoarsestLevelEndsAnAttempt) {
  const auto converge = [](std::size_t, AffineState&) { return 0; };
  scripted_stage stage{converge, [](std::size_t level) { return level == 1 ? 0.7f : 0.69f; }};
  AffineState state = Start();
  EXPECT_EQ(SearchPyramid(stage, 3, 0.7f, kMaxIterations, state).start_level, 1)
      << "at the limit is enough";
  EXPECT_THAT(stage.solved, ElementsAre(0, 1, 0));
  scripted_stage worst{converge, [](std::size_t) { return -1.0f; }};
  EXPECT_EQ(SearchPyramid(worst, 3, kAnyCorrelation, kMaxIterations, state).start_level, 0);
  EXPECT_THAT(worst.solved, ElementsAre(0)) << "the finest level alone comes first";
}

}  // namespace
}  // namespace marrow::tracking
