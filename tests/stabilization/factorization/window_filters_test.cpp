#include "stabilization/factorization/window_filters.h"

#include <gtest/gtest.h>

#include <cmath>
#include <vector>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

// A window with every trajectory flagged, rank 1: basis 1 on every frame, coefficients (10, 20).
struct Fixture {
  Fixture(std::uint64_t frames, std::uint64_t first, std::uint64_t end,
          const std::vector<Trajectory>& trajectories)
      : global(empty_clip(trajectories.size(), frames)), window(window_over(first, end)) {
    global.trajectories = trajectories;
    for (track_sample& s : global.input) s = {10, 20, 0, 0};
    for (track_sample& s : global.output) s.error = -7;
    window.rank = 1;
    window.basis.assign(end - first, 1.0);
    for (std::size_t t = 0; t < trajectories.size(); ++t) {
      window.trajectory_flags.push_back(static_cast<int>(t) + 1);
      window.coefficients.insert(window.coefficients.end(), {10.0, 20.0});
    }
  }
  stabilizer_global global;
  factorization_window window;
};

std::vector<Trajectory> Tracks(int count, int first, int last) {
  std::vector<Trajectory> tracks;
  for (int k = 0; k < count; ++k) tracks.push_back({k, 0, first, last});
  return tracks;
}

TEST(WindowFiltersTest, ErrorsAreDistancesWithinTheWindowAlone) {
  Fixture f(30, 10, 20, {{0, 0, 5, 15}, {1, 0, 12, 30}});
  f.global.input[12 * 2 + 0] = {13, 24, 0, 0};
  reprojection_errors(f.global, f.window, 0, 0);
  for (std::size_t i = 0; i < 30; ++i) {
    EXPECT_EQ(f.global.output_at(i, 0).error, i < 10 || i >= 15 ? -7 : i == 12 ? 5 : 0) << i;
    EXPECT_EQ(f.global.output_at(i, 1).error, i < 12 || i >= 20 ? -7 : 0) << i;
  }
}

TEST(WindowFiltersTest, ShortOverlapsAndOutliersLoseTheirFlag) {
  Fixture f(40, 10, 30, {{0, 0, 0, 19}, {1, 0, 0, 20}, {2, 0, 21, 40}, {3, 0, 5, 35}});
  drop_short_tracks(f.global, f.window, 10);
  EXPECT_FALSE(f.window.takes_part(0));  // 9 frames
  EXPECT_TRUE(f.window.takes_part(1));   // 10
  EXPECT_FALSE(f.window.takes_part(2));  // 9
  reprojection_errors(f.global, f.window, 0, 0);
  f.global.output_at(15, 1).error = 8.64f;
  drop_outliers(f.global, f.window, 8.64f);
  EXPECT_TRUE(f.window.takes_part(1));  // not above the limit
  f.global.output_at(15, 1).error = 8.65f;
  f.global.output_at(32, 3).error = 100.0f;  // outside the window
  drop_outliers(f.global, f.window, 8.64f);
  EXPECT_FALSE(f.window.takes_part(1));
  EXPECT_TRUE(f.window.takes_part(3));
  f.global.output_at(29, 3).error = NAN;
  drop_outliers(f.global, f.window, 8.64f);
  EXPECT_FALSE(f.window.takes_part(3));

  Fixture brief(40, 10, 14, Tracks(1, 0, 40));
  drop_short_tracks(brief.global, brief.window, 10);
  EXPECT_TRUE(brief.window.takes_part(0));  // as long as the window itself
}

TEST(WindowFiltersTest, QualityIsTheSumOfTheTracksWeights) {
  std::vector<Trajectory> groups = Tracks(20, 0, 140);
  for (const Trajectory& t : Tracks(20, 160, 400)) groups.push_back(t);
  const struct {
    const char* situation;
    std::uint64_t frames, first, end;
    std::vector<Trajectory> tracks;
    quality_result expected;
  } cases[] = {{"strong", 50, 0, 50, Tracks(500, 0, 50), {}},
               {"7.5 exactly", 50, 0, 50, Tracks(15, 0, 50), {}},
               {"weak", 50, 0, 50, Tracks(14, 0, 50), {false, 1, 49}},
               // Over flanks of 100 frames the first group holds 20 (140 - f) / 100 and the second
               // 20 (f - 159) / 100.
               {"weak between two groups", 400, 0, 300, groups, {false, 103, 197}},
               {"under half the overlap of windows", 50, 3, 17, Tracks(500, 0, 50), {false, 3, 17}},
               {"half the overlap", 50, 3, 18, Tracks(500, 0, 50), {}}};
  for (const auto& e : cases) {
    const Fixture f(e.frames, e.first, e.end, e.tracks);
    const quality_result found = quality_check(f.global, f.window, {}, 7.5, kNoProgress);
    EXPECT_EQ(found.passes, e.expected.passes) << e.situation;
    EXPECT_EQ(found.bad_frame, e.expected.bad_frame) << e.situation;
    EXPECT_EQ(found.next_good_frame, e.expected.next_good_frame) << e.situation;
  }
}

}  // namespace
}  // namespace marrow::stabilization
