#include "stabilization/smoothing/window_solver.h"

#include <gtest/gtest.h>

#include <cmath>
#include <numeric>
#include <random>
#include <string>
#include <vector>

#include "stabilization/fade_weight.h"
#include "tests/stabilization/clips.h"
#include "tests/stabilization/dense_reference.h"

namespace marrow::stabilization {
namespace {

enum class stitch { none, transition, window };

// A window of 14 frames at frame 20 of a clip of 60, rank 3, tracks of all kinds of lives.
class WindowSolverTest : public ::testing::Test {
 protected:
  static constexpr std::size_t kFirst = 20, kLength = 14, kRank = 3, kFrames = 60;

  WindowSolverTest() {
    parameters_.center_x = 3;
    parameters_.center_y = -2;
    parameters_.track_fade_duration = 8;
    for (std::size_t f = 0; f < kFrames; ++f) lambdas_.push_back(0.5 + 0.1 * f);
    global_ = empty_clip(8, kFrames);
    global_.trajectories = {{0, 0, 0, 60},  {7, 0, 10, 40}, {1, 0, 15, 34}, {2, 0, 18, 28},
                            {3, 0, 20, 31}, {4, 0, 22, 60}, {5, 0, 26, 33}, {6, 0, 27, 29}};
    for (track_sample& s : global_.output) s.error = 9;
    for (track_sample& s : global_.input) s = {Random(100), Random(100), 0, 0};
    window_ = window_over(kFirst, kFirst + kLength);
    window_.rank = kRank;
    for (std::size_t i = 0; i < kRank * kLength; ++i) window_.basis.push_back(Random(1));
    for (int k = 1; k <= 8; ++k) {
      window_.trajectory_flags.push_back(k);
      for (std::size_t i = 0; i < 2 * kRank; ++i) window_.coefficients.push_back(Random(2));
    }
    previous_ = window_;
    previous_.trajectory_flags[2] = 0;
  }

  float Random(double scale) {
    return static_cast<float>(scale * std::normal_distribution<double>()(random_));
  }

  void Stitch(stitch kind, std::size_t frames) {
    kind_ = kind;
    window_.overlap_end = kFirst + frames;
    window_.overlap_rows.clear();
    for (std::size_t i = 0; i < 8 * frames; ++i) {
      window_.overlap_rows.push_back({Random(100), Random(100), i % 5 == 0 ? -1 : 0, 0});
    }
  }

  bool HasOverlap(std::size_t t, std::size_t row) const {
    if (kind_ == stitch::window) return previous_.takes_part(t);
    return window_.overlap_rows[row * 8 + global_.trajectories[t].feature].status >= 0;
  }

  // Of a frame of the window.
  bool Alive(std::size_t k, std::size_t f) const {
    const Trajectory& t = global_.trajectories[k];
    const int frame = static_cast<int>(kFirst + f);
    return window_.takes_part(k) && f < kLength && frame >= t.first && frame < t.last;
  }
  double Fade(const Trajectory& t, std::size_t f) const {
    return fade_weight(t.first, t.last, kFrames, kFirst + f, 8, parameters_.track_fade_minimum);
  }

  // c . (sum of factor u[frame]) as terms of the unknowns.
  using factors = std::vector<std::pair<std::size_t, double>>;
  static factors Terms(const double* c, const factors& of_frames) {
    factors terms;
    for (const auto& [f, factor] : of_frames) {
      for (std::size_t i = 0; i < kRank; ++i) terms.push_back({f * kRank + i, factor * c[i]});
    }
    return terms;
  }

  // One coordinate of one track, as the header states it.
  void AddTrack(dense_reference& dense, std::size_t k, int axis, bool no_motion,
                const std::vector<double>& norm) const {
    const Trajectory& t = global_.trajectories[k];
    const double* c = &window_.coefficients[k * 2 * kRank + axis * kRank];
    const double center = axis ? parameters_.center_y : parameters_.center_x;
    const auto of = [&](const track_sample& s) { return (axis ? s.y : s.x) - center; };
    const auto seen = [&](std::size_t f) { return of(global_.input_at(kFirst + f, t.feature)); };
    const auto solved = [&](std::size_t f) { return of(window_.overlap_rows[f * 8 + t.feature]); };
    const std::size_t overlap = window_.overlap_end - kFirst;
    const bool anchored = overlap > 0 && Alive(k, 0) && HasOverlap(k, 0);
    double still = 0;  // where the tracks of a window without overlap are to stand
    for (std::size_t i = 0; i < kRank; ++i) still += c[i] * window_.basis[i * kLength + 7];
    if (Alive(k, 7)) still = seen(7);
    for (std::size_t f = 0; f < kLength; ++f) {
      if (!Alive(k, f)) continue;
      const double w = std::pow(Fade(t, f), 2) / norm[f];
      const factors here = Terms(c, {{f, 1}});
      if (!no_motion) {
        dense.add(w, here, seen(f));
        if (f < overlap && HasOverlap(k, f)) {
          dense.add(w * 100 * (1 - static_cast<double>(f) / overlap), here, solved(f));
        }
        if (f > 0 && Alive(k, f - 1) && Alive(k, f + 1)) {
          dense.add(w * std::pow(lambdas_[kFirst + f], 2),
                    Terms(c, {{f - 1, 1}, {f, -2}, {f + 1, 1}}), 0);
        }
        continue;
      }
      if (overlap == 0) dense.add(w, here, still);
      if (anchored) dense.add(w, here, solved(0));
      if (anchored && f < overlap) dense.add(100 * w, here, solved(0));
      if (Alive(k, f + 1)) dense.add(w * 2000 * 2000, Terms(c, {{f, 1}, {f + 1, -1}}), 0);
    }
  }

  void CheckAgainstDense(bool no_motion, bool first_window) {
    dense_reference dense(kRank * kLength);
    std::vector<double> norm(kLength);
    for (std::size_t f = 0; f < kLength; ++f) {
      std::size_t count = 0;
      for (std::size_t k = 0; k < 8; ++k) {
        if (!Alive(k, f)) continue;
        norm[f] += std::pow(Fade(global_.trajectories[k], f), 2);
        ++count;
      }
      for (std::size_t i = 0; count < kRank && i < kRank; ++i) {
        dense.add(0.01, {{f * kRank + i, 1}}, 0);
      }
    }
    for (std::size_t k = 0; k < 8; ++k) {
      for (const int axis : {0, 1}) AddTrack(dense, k, axis, no_motion, norm);
    }

    window_solver solver(global_, parameters_, lambdas_, kNoProgress);
    solver.load(first_window ? window_ : previous_, window_);
    solver.overlap_from_transition = kind_ != stitch::window;
    ASSERT_TRUE(no_motion ? solver.solve_window_no_motion() : solver.solve_window());
    const std::vector<double> expected = dense.solve();
    for (std::size_t f = 0; f < kLength; ++f) {
      for (std::size_t i = 0; i < kRank; ++i) {
        EXPECT_NEAR(solver.solved_basis()[i * kLength + f], expected[f * kRank + i],
                    1e-8 * largest_of(expected))
            << "frame " << f << ", signal " << i;
      }
    }
    for (std::size_t k = 0; k < 8; ++k) {
      for (std::size_t f = 0; f < kFrames; ++f) {
        const track_sample& out = global_.output_at(f, global_.trajectories[k].feature);
        if (!Alive(k, f - kFirst)) {
          EXPECT_EQ(out.status, -1);
          continue;
        }
        EXPECT_EQ(out.status, !Alive(k, f - kFirst - 1));
        EXPECT_EQ(out.error, 9);
        const double* c = &window_.coefficients[k * 2 * kRank];
        const double* u = &expected[(f - kFirst) * kRank];
        const double x = std::inner_product(c, c + kRank, u, parameters_.center_x);
        const double y = std::inner_product(c + kRank, c + 2 * kRank, u, parameters_.center_y);
        expect_point_near(position(out), {x, y}, 1e-4 * (1 + std::hypot(x, y)));
      }
    }
  }

  std::mt19937 random_{5};
  stabilizer_global global_;
  SolverParamsRecord parameters_;
  std::vector<double> lambdas_;
  factorization_window window_, previous_;
  stitch kind_ = stitch::none;
};

// Alone, behind a transition and behind a window.
TEST_F(WindowSolverTest, AgreesWithTheDenseReference) {
  for (const stitch kind : {stitch::none, stitch::transition, stitch::window}) {
    if (kind != stitch::none) Stitch(kind, kind == stitch::window ? 6 : 5);
    for (const bool no_motion : {false, true}) CheckAgainstDense(no_motion, kind != stitch::window);
  }
}

TEST_F(WindowSolverTest, FramesWithFewTracksAreHeldByTheRegularizer) {
  // Of the trajectories in order of their start, [0, 60), [10, 40) and [18, 28): three tracks to
  // frame 27, two from there on.
  for (const int k : {2, 4, 5, 6, 7}) window_.trajectory_flags[k] = 0;
  captured_log log;
  CheckAgainstDense(false, true);
  EXPECT_TRUE(log.text.starts_with("Not enough points (2) on frame 28, need regularizer\n"));
}

TEST_F(WindowSolverTest, CoefficientsOfLowerRankAreAFailure) {
  for (int k = 0; k < 8; ++k) {
    window_.coefficients[k * 6 + 2] = window_.coefficients[k * 6 + 5] = 0;  // third signal unused
  }
  window_solver solver(global_, parameters_, lambdas_, kNoProgress);
  solver.load(window_, window_);
  // 8 tracks, never fewer than 3 on a frame: no regularizer hides it.
  EXPECT_FALSE(solver.solve_window());
  EXPECT_FALSE(solver.solve_window_no_motion());
  for (const track_sample& s : global_.output) EXPECT_EQ(s.status, -1);
}

}  // namespace
}  // namespace marrow::stabilization
