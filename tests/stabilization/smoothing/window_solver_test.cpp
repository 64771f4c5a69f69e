#include "stabilization/smoothing/window_solver.h"

#include <gtest/gtest.h>

#include <cmath>
#include <random>
#include <string>
#include <vector>

#include "platform/tessel/debug.h"
#include "stabilization/fade_weight.h"

namespace marrow::stabilization {
namespace {

const progress_functor kNoProgress = [] {};

// The same least squares as a list of weighted equations in all unknowns, summed into a dense
// matrix and eliminated.
class DenseReference {
 public:
  explicit DenseReference(std::size_t unknowns)
      : n_(unknowns), matrix_(unknowns * unknowns), right_(unknowns) {}

  // weight (row . u - target)^2
  void Add(const std::vector<double>& row, double target, double weight) {
    for (std::size_t i = 0; i < n_; ++i) {
      if (row[i] == 0) continue;
      for (std::size_t j = 0; j < n_; ++j) matrix_[i * n_ + j] += weight * row[i] * row[j];
      right_[i] += weight * row[i] * target;
    }
  }

  std::vector<double> Solve() {
    for (std::size_t k = 0; k < n_; ++k) {
      for (std::size_t i = k + 1; i < n_; ++i) {
        const double factor = matrix_[i * n_ + k] / matrix_[k * n_ + k];
        for (std::size_t j = k; j < n_; ++j) matrix_[i * n_ + j] -= factor * matrix_[k * n_ + j];
        right_[i] -= factor * right_[k];
      }
    }
    for (std::size_t k = n_; k-- > 0;) {
      for (std::size_t j = k + 1; j < n_; ++j) right_[k] -= matrix_[k * n_ + j] * right_[j];
      right_[k] /= matrix_[k * n_ + k];
    }
    return right_;
  }

 private:
  std::size_t n_;
  std::vector<double> matrix_;
  std::vector<double> right_;
};

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
    std::vector<Trajectory> t = {{0, 0, 0, 60},  {1, 0, 15, 34}, {2, 0, 18, 28}, {3, 0, 20, 31},
                                 {4, 0, 22, 60}, {5, 0, 26, 33}, {6, 0, 27, 29}, {7, 0, 10, 40}};
    std::sort(t.begin(), t.end(), [](auto& a, auto& b) { return a.first < b.first; });
    global_.trajectories = t;
    global_.feature_count = 8;
    global_.frame_count = kFrames;
    global_.input.resize(8 * kFrames);
    global_.output.assign(8 * kFrames, {0, 0, -1, 9});
    for (track_sample& s : global_.input) s = {Random(100), Random(100), 0, 0};
    window_.first = window_.overlap_end = kFirst;
    window_.end = kFirst + kLength;
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
    for (std::size_t i = 0; i < 8 * frames; ++i) {
      window_.overlap_rows.push_back({Random(100), Random(100), i % 5 == 0 ? -1 : 0, 0});
    }
  }

  bool HasOverlap(std::size_t t, std::size_t row) const {
    if (kind_ == stitch::window) return previous_.takes_part(t);
    return window_.overlap_rows[row * 8 + global_.trajectories[t].feature].status >= 0;
  }

  std::vector<double> Row(const double* c, std::size_t f, double factor = 1) const {
    std::vector<double> row(kRank * kLength);
    for (std::size_t i = 0; i < kRank; ++i) row[f * kRank + i] = factor * c[i];
    return row;
  }

  void CheckAgainstDense(bool no_motion, bool first_window) {
    DenseReference dense(kRank * kLength);
    std::vector<double> norm(kLength);
    std::vector<std::size_t> count(kLength);
    const auto fade = [&](const Trajectory& t, std::size_t f) {
      return fade_weight(t.first, t.last, kFrames, kFirst + f, 8, parameters_.track_fade_minimum);
    };
    for (const Trajectory& t : global_.trajectories) {
      for (std::size_t f = 0; f < kLength; ++f) {
        if (static_cast<int>(kFirst + f) < t.first || static_cast<int>(kFirst + f) >= t.last) {
          continue;
        }
        norm[f] += fade(t, f) * fade(t, f);
        ++count[f];
      }
    }
    const std::size_t overlap = window_.overlap_end - kFirst;
    for (std::size_t k = 0; k < global_.trajectories.size(); ++k) {
      const Trajectory& t = global_.trajectories[k];
      const auto alive = [&](std::size_t f) {
        return f < kLength && static_cast<int>(kFirst + f) >= t.first &&
               static_cast<int>(kFirst + f) < t.last;
      };
      const bool anchored = overlap > 0 && alive(0) && HasOverlap(k, 0);
      for (int axis = 0; axis < 2; ++axis) {
        const double* c = &window_.coefficients[k * 2 * kRank + axis * kRank];
        const double center = axis ? parameters_.center_y : parameters_.center_x;
        const auto of = [&](const track_sample& s) { return (axis ? s.y : s.x) - center; };
        const auto in_overlap = [&](std::size_t row) {
          return of(window_.overlap_rows[row * 8 + t.feature]);
        };
        for (std::size_t f = 0; f < kLength; ++f) {
          if (!alive(f)) continue;
          const double w = std::pow(fade(t, f), 2) / norm[f];
          if (!no_motion) {
            dense.Add(Row(c, f), of(global_.input_at(kFirst + f, t.feature)), w);
            if (f < overlap && HasOverlap(k, f)) {
              dense.Add(Row(c, f), in_overlap(f), w * 100 * (1 - f / double(overlap)));
            }
            if (f > 0 && alive(f - 1) && alive(f + 1)) {
              std::vector<double> row = Row(c, f, -2);
              for (std::size_t i = 0; i < kRank; ++i) {
                row[(f - 1) * kRank + i] = row[(f + 1) * kRank + i] = c[i];
              }
              dense.Add(row, 0, w * std::pow(lambdas_[kFirst + f], 2));
            }
            continue;
          }
          if (first_window) {
            double target = 0;
            if (alive(7)) {
              target = of(global_.input_at(kFirst + 7, t.feature));
            } else {
              for (std::size_t i = 0; i < kRank; ++i) {
                target += c[i] * window_.basis[i * kLength + 7];
              }
            }
            dense.Add(Row(c, f), target, w);
          } else if (anchored) {
            dense.Add(Row(c, f), in_overlap(0), w);
          }
          if (anchored && f < overlap) dense.Add(Row(c, f), in_overlap(0), 100 * w);
          if (alive(f + 1)) {
            std::vector<double> row = Row(c, f, 1);
            for (std::size_t i = 0; i < kRank; ++i) row[(f + 1) * kRank + i] = -c[i];
            dense.Add(row, 0, w * 2000.0 * 2000.0);
          }
        }
      }
    }
    for (std::size_t f = 0; f < kLength; ++f) {
      if (count[f] >= kRank) continue;
      for (std::size_t i = 0; i < kRank; ++i) {
        std::vector<double> row(kRank * kLength);
        row[f * kRank + i] = 1;
        dense.Add(row, 0, 0.01);
      }
    }

    window_solver solver(global_, parameters_, lambdas_, kNoProgress);
    solver.load(first_window ? window_ : previous_, window_);
    solver.overlap_from_transition = kind_ != stitch::window;
    ASSERT_TRUE(no_motion ? solver.solve_window_no_motion() : solver.solve_window());
    const std::vector<double> expected = dense.Solve();
    double scale = 0;
    for (const double u : expected) scale = std::max(scale, std::fabs(u));
    for (std::size_t f = 0; f < kLength; ++f) {
      for (std::size_t i = 0; i < kRank; ++i) {
        EXPECT_NEAR(solver.solved_basis()[i * kLength + f], expected[f * kRank + i], 1e-8 * scale)
            << "frame " << f << ", signal " << i;
      }
    }
    for (std::size_t k = 0; k < global_.trajectories.size(); ++k) {
      const Trajectory& t = global_.trajectories[k];
      for (int f = 0; f < static_cast<int>(kFrames); ++f) {
        const track_sample& out = global_.output_at(f, t.feature);
        const int first = std::max<int>(t.first, kFirst);
        if (f < first || f >= std::min<int>(t.last, kFirst + kLength)) {
          EXPECT_EQ(out.status, -1);
          continue;
        }
        EXPECT_EQ(out.status, f == first ? 1 : 0);
        EXPECT_EQ(out.error, 9);
        double x = parameters_.center_x, y = parameters_.center_y;
        for (std::size_t i = 0; i < kRank; ++i) {
          const double u = expected[(f - kFirst) * kRank + i];
          x += window_.coefficients[k * 2 * kRank + i] * u;
          y += window_.coefficients[k * 2 * kRank + kRank + i] * u;
        }
        EXPECT_NEAR(out.x, x, 1e-4 * (1 + std::fabs(x)));
        EXPECT_NEAR(out.y, y, 1e-4 * (1 + std::fabs(y)));
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

TEST_F(WindowSolverTest, AloneAgreesWithTheDenseReference) {
  CheckAgainstDense(false, true);
}

TEST_F(WindowSolverTest, NoMotionAloneAgreesWithTheDenseReference) {
  CheckAgainstDense(true, true);
}

TEST_F(WindowSolverTest, BehindATransitionAgreesWithTheDenseReference) {
  Stitch(stitch::transition, 5);
  CheckAgainstDense(false, true);
}

TEST_F(WindowSolverTest, BehindAWindowAgreesWithTheDenseReference) {
  Stitch(stitch::window, 6);
  CheckAgainstDense(false, false);
}

TEST_F(WindowSolverTest, NoMotionBehindATransitionAgreesWithTheDenseReference) {
  Stitch(stitch::transition, 5);
  CheckAgainstDense(true, true);
}

TEST_F(WindowSolverTest, NoMotionBehindAWindowAgreesWithTheDenseReference) {
  Stitch(stitch::window, 6);
  CheckAgainstDense(true, false);
}

TEST_F(WindowSolverTest, FramesWithFewTracksAreHeldByTheRegularizer) {
  // Of the trajectories in order of their start, [0, 60), [10, 40) and [18, 28): three tracks to
  // frame 27, two from there on.
  for (const int k : {2, 4, 5, 6, 7}) window_.trajectory_flags[k] = 0;
  std::string log;
  window_solver solver(global_, parameters_, lambdas_, kNoProgress);
  tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 1);
  tessel::debug::SetSink([&](const std::string& text) { log += text; });
  solver.load(window_, window_);
  EXPECT_TRUE(solver.solve_window());
  tessel::debug::SetSink({});
  tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 0);
  std::string expected;
  for (int f = 28; f < 34; ++f) {
    expected += "Not enough points (2) on frame " + std::to_string(f) + ", need regularizer\n";
  }
  EXPECT_EQ(log, expected);
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
