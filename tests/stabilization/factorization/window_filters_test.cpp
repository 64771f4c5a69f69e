#include "stabilization/factorization/window_filters.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include "platform/tessel/debug.h"

namespace marrow::stabilization {
namespace {

const progress_functor kNoProgress = [] {};

// A window with every trajectory flagged, rank 1: basis 1 on every frame, coefficients (10, 20).
struct Fixture {
  Fixture(std::uint64_t frames, std::uint64_t first, std::uint64_t end,
          const std::vector<Trajectory>& trajectories) {
    global.frame_count = frames;
    global.feature_count = trajectories.size();
    global.trajectories = trajectories;
    global.input.assign(frames * trajectories.size(), {10, 20, 0, 0});
    global.output.assign(frames * trajectories.size(), {0, 0, -1, -7});
    window.first = first;
    window.end = end;
    window.rank = 1;
    window.basis.assign(end - first, 1.0);
    for (std::size_t t = 0; t < trajectories.size(); ++t) {
      window.trajectory_flags.push_back(static_cast<int>(t) + 1);
      window.coefficients.insert(window.coefficients.end(), {10.0, 20.0});
    }
  }
  quality_result Check(double threshold = 7.5) {
    return quality_check(global, window, parameters, threshold, kNoProgress);
  }
  stabilizer_global global;
  factorization_window window;
  SolverParamsRecord parameters;
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
  EXPECT_EQ(f.global.output_at(12, 0).error, 5.0f);
  EXPECT_EQ(f.global.output_at(10, 0).error, 0.0f);
  EXPECT_EQ(f.global.output_at(9, 0).error, -7.0f);
  EXPECT_EQ(f.global.output_at(15, 0).error, -7.0f);
  EXPECT_EQ(f.global.output_at(19, 1).error, 0.0f);
  EXPECT_EQ(f.global.output_at(20, 1).error, -7.0f);
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
  f.global.output_at(29, 3).error = std::numeric_limits<float>::quiet_NaN();
  drop_outliers(f.global, f.window, 8.64f);
  EXPECT_FALSE(f.window.takes_part(3));

  Fixture brief(40, 10, 14, Tracks(1, 0, 40));
  drop_short_tracks(brief.global, brief.window, 10);
  EXPECT_TRUE(brief.window.takes_part(0));  // as long as the window itself
}

TEST(WindowFiltersTest, QualityOfWholeClipTracks) {
  EXPECT_TRUE(Fixture(50, 0, 50, Tracks(500, 0, 50)).Check().passes);
  EXPECT_TRUE(Fixture(50, 0, 50, Tracks(15, 0, 50)).Check().passes);  // 7.5 exactly
  const quality_result weak = Fixture(50, 0, 50, Tracks(14, 0, 50)).Check();
  EXPECT_FALSE(weak.passes);
  EXPECT_EQ(weak.bad_frame, 1u);
  EXPECT_EQ(weak.next_good_frame, 49u);
}

TEST(WindowFiltersTest, QualityFindsTheWeakStretch) {
  // Two groups of long tracks with frames 140 to 159 held by nobody.
  std::vector<Trajectory> tracks;
  for (int k = 0; k < 20; ++k) tracks.push_back({k, 0, 0, 140});
  for (int k = 0; k < 20; ++k) tracks.push_back({k, 0, 160, 400});
  Fixture f(400, 0, 300, tracks);
  // The first group fades out from frame 40 (duration 100): 20 (140 - f) / 100 < 7.5 from 103 on;
  // the second fades in: 20 (f - 159) / 100 >= 7.5 from 197 on.
  const quality_result r = f.Check();
  EXPECT_FALSE(r.passes);
  EXPECT_EQ(r.bad_frame, 103u);
  EXPECT_EQ(r.next_good_frame, 197u);
}

TEST(WindowFiltersTest, QualityOfTinyWindows) {
  const quality_result r = Fixture(50, 3, 17, Tracks(500, 0, 50)).Check();  // 14 frames
  EXPECT_FALSE(r.passes);
  EXPECT_EQ(r.bad_frame, 3u);
  EXPECT_EQ(r.next_good_frame, 17u);
  EXPECT_TRUE(Fixture(50, 3, 18, Tracks(500, 0, 50)).Check().passes);
  Fixture none(50, 3, 5, {});
  none.parameters.factorization_window_overlap = 2;
  EXPECT_TRUE(none.Check().passes);  // no frame between first and last
}

TEST(WindowFiltersTest, QualityLogsEachFrame) {
  std::string log;
  tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 1);
  tessel::debug::SetSink([&](const std::string& text) { log += text; });
  Fixture f(50, 7, 9, Tracks(3, 0, 50));
  f.parameters.factorization_window_overlap = 2;
  f.Check();
  tessel::debug::SetSink({});
  tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 0);
  EXPECT_EQ(log, "Frame 7, sum of weights = 1.500000Frame 8, sum of weights = 1.500000");
}

}  // namespace
}  // namespace marrow::stabilization
