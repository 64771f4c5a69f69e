#include "stabilization/factorization/moving_factorizer.h"

#include <gtest/gtest.h>

#include <cmath>
#include <random>
#include <stdexcept>
#include <vector>

#include "platform/lapack/lapack.h"
#include "stabilization/factorization/window_filters.h"

namespace marrow::stabilization {
namespace {

struct life {
  int first;
  int last;
};

// Tracks that are exact mixtures of `rank` smooth signals, each in a slot of its own, as f32.
class LowRankClip {
 public:
  LowRankClip(int frames, int rank, const std::vector<life>& lives, unsigned seed = 1) {
    std::mt19937 random(seed);
    std::normal_distribution<double> normal;
    global.frame_count = static_cast<std::uint64_t>(frames);
    global.feature_count = lives.size();
    global.input.assign(lives.size() * frames, {0, 0, -1, 0});
    global.output = global.input;
    for (std::size_t s = 0; s < lives.size(); ++s) {
      std::vector<double> cx(rank), cy(rank);
      for (int i = 0; i < rank; ++i) {
        cx[i] = (i == 0 ? 300 : 40) * normal(random);
        cy[i] = (i == 0 ? 300 : 40) * normal(random);
      }
      for (int f = lives[s].first; f < lives[s].last; ++f) {
        double x = 0, y = 0;
        for (int i = 0; i < rank; ++i) {
          x += cx[i] * Signal(i, f);
          y += cy[i] * Signal(i, f);
        }
        global.input[f * lives.size() + s] = {static_cast<float>(x), static_cast<float>(y),
                                              f == lives[s].first ? f + 1 : 0, 1};
      }
    }
    global.trajectories = tracking::BuildTrajectories(global.input.data(), lives.size(), frames);
    for (const Trajectory& t : global.trajectories) order_.push_back(t.feature);
  }

  static double Signal(int i, int f) {
    return i == 0 ? 1.0 : std::sin(0.05 * (i + 1) * f + i) + 0.01 * i * std::cos(0.9 * f + i);
  }

  // Index of the trajectory of slot s.
  std::size_t TrajectoryOf(int s) const {
    for (std::size_t t = 0; t < order_.size(); ++t) {
      if (order_[t] == s) return t;
    }
    throw std::logic_error("no such slot");
  }

  double LargestError(const factorization_window& window) {
    reprojection_errors(global, window, 0, 0);
    double largest = 0;
    for (std::size_t t = 0; t < global.trajectories.size(); ++t) {
      if (!window.takes_part(t)) continue;
      const Trajectory& tr = global.trajectories[t];
      for (int f = std::max<int>(tr.first, window.first); f < std::min<int>(tr.last, window.end);
           ++f) {
        largest = std::max<double>(largest, global.output_at(f, tr.feature).error);
      }
    }
    return largest;
  }

  stabilizer_global global;

 private:
  std::vector<int> order_;
};

std::vector<life> WholeClip(int count, int frames) {
  return std::vector<life>(count, life{0, frames});
}

const progress_functor kNoProgress = [] {};

factorization_window Factorize(const stabilizer_global& global, int rank, int first, int limit,
                               int duration = 40, int step = 5) {
  moving_factorizer factorizer;
  EXPECT_TRUE(factorizer.Setup(global.feature_count, global.frame_count, rank, duration, step));
  factorization_window window;
  EXPECT_EQ(factorizer.Factorize(global, first, limit, 0, 0, window, kNoProgress), window.end);
  return window;
}

TEST(MovingFactorizerTest, ASingleWindowIsTheTruncatedDecomposition) {
  // Noise of full rank over a low-rank clip, so that truncation matters. Reference: the best rank
  // 4 approximation leaves exactly the squares of the further singular values.
  LowRankClip clip(20, 4, WholeClip(15, 20));
  std::mt19937 random(7);
  std::normal_distribution<float> noise(0, 2);
  for (track_sample& s : clip.global.input) {
    s.x += noise(random);
    s.y += noise(random);
  }
  std::vector<double> matrix;
  for (int s = 0; s < 15; ++s) {
    for (int f = 0; f < 20; ++f) matrix.push_back(clip.global.input_at(f, s).x);
    for (int f = 0; f < 20; ++f) matrix.push_back(clip.global.input_at(f, s).y);
  }
  const int m = 20, n = 30, lwork = 1000;
  int info = 0;
  std::vector<double> s(20), u(400), vt(900), work(lwork);
  lapack::dgesvd("N", "N", &m, &n, matrix.data(), &m, s.data(), u.data(), &m, vt.data(), &n,
                 work.data(), &lwork, &info);
  ASSERT_EQ(info, 0);
  double expected = 0;
  for (int i = 4; i < 20; ++i) expected += s[i] * s[i];

  const factorization_window window = Factorize(clip.global, 4, 0, 300, 20, 5);
  EXPECT_EQ(window.end, 20u);
  double squares = 0;
  clip.LargestError(window);
  for (const track_sample& sample : clip.global.output) squares += sample.error * sample.error;
  EXPECT_NEAR(squares, expected, 1e-5 * expected);
  for (int i = 0; i < 4; ++i) {
    double length = 0;
    for (int f = 0; f < 20; ++f) length += window.basis[i * 20 + f] * window.basis[i * 20 + f];
    EXPECT_NEAR(length, 1.0, 1e-12) << "signal " << i;
  }
}

TEST(MovingFactorizerTest, MovingKeepsExactDataExactWhileTracksComeAndGo) {
  std::vector<life> lives;
  for (int s = 0; s < 60; ++s) {
    const int first = std::max(0, (s * 7) % 260 - 30);
    lives.push_back({first, std::min(247, first + 60 + (s * 13) % 90)});
  }
  for (int s = 0; s < 12; ++s) lives.push_back({100 + s, 104 + s});  // under the rank
  LowRankClip clip(247, 5, lives);
  moving_factorizer factorizer;
  ASSERT_TRUE(factorizer.Setup(lives.size(), 247, 5, 40, 5));
  factorization_window window;
  EXPECT_EQ(factorizer.Factorize(clip.global, 0, 300, 0, 0, window, kNoProgress), 247u);
  EXPECT_EQ(window.rank, 5u);
  EXPECT_EQ(window.basis.size(), 5u * 247u);
  EXPECT_LT(clip.LargestError(window), 0.02);  // f32 storage, grown over the moves
  for (std::size_t t = 0; t < clip.global.trajectories.size(); ++t) {
    const Trajectory& tr = clip.global.trajectories[t];
    EXPECT_EQ(window.takes_part(t), tr.last - tr.first >= 5) << tr.first << " " << tr.last;
  }
  // One position for each step, the last one shorter by the clip's end.
  ASSERT_EQ(factorizer.residuals().size(), 1u + 42u);
  for (const auto& r : factorizer.residuals()) {
    EXPECT_LT(r.new_tracks, 1e-4);
    EXPECT_LT(r.new_frames, 1e-4);
  }
}

TEST(MovingFactorizerTest, TheCentreIsTakenFromThePositions) {
  LowRankClip clip(60, 3, WholeClip(10, 60));
  for (track_sample& s : clip.global.input) s.x += 500, s.y -= 300;
  moving_factorizer factorizer;
  ASSERT_TRUE(factorizer.Setup(10, 60, 3, 40, 5));
  factorization_window window;
  factorizer.Factorize(clip.global, 0, 300, 500, -300, window, kNoProgress);
  reprojection_errors(clip.global, window, 500, -300);
  for (const track_sample& s : clip.global.output) EXPECT_LT(s.error, 1e-3);
}

TEST(MovingFactorizerTest, WhereAWindowEnds) {
  LowRankClip clip(200, 3, WholeClip(10, 200));
  EXPECT_EQ(Factorize(clip.global, 3, 0, 300).end, 200u);
  EXPECT_EQ(Factorize(clip.global, 3, 0, 300, 40, 7).end, 200u);
  EXPECT_EQ(Factorize(clip.global, 3, 0, 90).end, 90u);
  EXPECT_EQ(Factorize(clip.global, 3, 0, 94).end, 90u);  // whole steps only
  EXPECT_EQ(Factorize(clip.global, 3, 10, 94).end, 100u);
  EXPECT_EQ(Factorize(clip.global, 3, 0, 40).end, 40u);  // no move
  EXPECT_EQ(Factorize(clip.global, 3, 0, 33).end, 33u);
  EXPECT_EQ(Factorize(clip.global, 3, 180, 300).end, 200u);

  std::vector<life> lives = WholeClip(1, 200);  // too few for a rank of 3 behind frame 101
  lives.insert(lives.end(), {{0, 101}, {0, 101}, {0, 101}});
  LowRankClip fading(200, 3, lives);
  EXPECT_EQ(Factorize(fading.global, 3, 0, 300).end, 100u);
  EXPECT_EQ(Factorize(fading.global, 3, 150, 300).end, 150u);  // empty
}

TEST(MovingFactorizerTest, AStretchShorterThanTheRankHasNoTracks) {
  LowRankClip clip(45, 3, WholeClip(10, 45));
  moving_factorizer factorizer;
  ASSERT_TRUE(factorizer.Setup(10, 45, 9, 40, 5));
  factorization_window window;
  factorizer.Factorize(clip.global, 0, 300, 0, 0, window, kNoProgress);  // leaves its memory used
  factorization_window rest;
  EXPECT_EQ(factorizer.Factorize(clip.global, 40, 300, 0, 0, rest, kNoProgress), 45u);
  for (std::size_t t = 0; t < 10; ++t) EXPECT_FALSE(rest.takes_part(t));
  for (std::size_t i = 5; i < 9; ++i) {
    for (std::size_t f = 0; f < 5; ++f) EXPECT_EQ(rest.basis[i * 5 + f], 0.0);
  }
}

TEST(MovingFactorizerTest, RankAboveNineAndAboveTheOverlap) {
  LowRankClip clip(120, 12, WholeClip(40, 120));
  EXPECT_LT(clip.LargestError(Factorize(clip.global, 12, 0, 300)), 0.01);
  const factorization_window window = Factorize(clip.global, 12, 0, 300, 14, 4);
  EXPECT_EQ(window.end, 120u);  // 10 frames shared, 12 signals: minimum-norm fits
}

TEST(MovingFactorizerTest, AWindowKeepsOnlyWhatMeetsIt) {
  std::vector<life> lives;
  for (int s = 0; s < 100; ++s) lives.push_back({s * 4, s * 4 + 80});
  LowRankClip clip(480, 3, lives);
  const factorization_window window = Factorize(clip.global, 3, 200, 100);
  EXPECT_EQ(window.first, 200u);
  EXPECT_EQ(window.end, 300u);
  for (std::size_t t = 0; t < 100; ++t) {
    const Trajectory& tr = clip.global.trajectories[t];
    const bool enough = std::min(tr.last, 300) - std::max(tr.first, 200) >= 3;
    EXPECT_EQ(window.takes_part(t), enough) << t;
  }
  EXPECT_LT(window.trajectory_flags.size(), 50u);
  EXPECT_LT(clip.LargestError(window), 0.01);
}

TEST(MovingFactorizerTest, ProgressMayEndIt) {
  LowRankClip clip(200, 3, WholeClip(10, 200));
  moving_factorizer factorizer;
  ASSERT_TRUE(factorizer.Setup(10, 200, 3, 40, 5));
  int calls = 0;
  factorization_window window;
  EXPECT_THROW(factorizer.Factorize(clip.global, 0, 300, 0, 0, window,
                                    [&] {
                                      if (++calls == 5) throw std::runtime_error("cancelled");
                                    }),
               std::runtime_error);
  EXPECT_EQ(calls, 5);
}

TEST(MovingFactorizerTest, NothingToSizeIsASetupError) {
  moving_factorizer factorizer;
  EXPECT_FALSE(factorizer.Setup(0, 100, 9, 40, 5));
  EXPECT_TRUE(factorizer.error());
}

}  // namespace
}  // namespace marrow::stabilization
