#include <gtest/gtest.h>

#include <cmath>
#include <string>
#include <vector>

#include "stabilization/factorization/active_track.h"
#include "tests/stabilization/solve_clips.h"

// How the windows of a clip lie, and how their solutions meet.
namespace marrow::stabilization {
namespace {

TEST(StabilizerMainWindows, SteadyTracksCoverTheClip) {
  const std::pair<int, const char*> clips[] = {{40, "0 40;"},
                                               {330, "0 330;"},
                                               {331, "0 300;270 331;"},
                                               {1000, "0 300;270 570;540 840;810 1000;"}};
  for (const auto& [frames, spans] : clips) {
    synthetic::track_world_options options;
    options.frame_count = frames;
    options.slots = 120;
    options.mean_life = 120;
    const solved_clip clip = solve(make_track_world(options), params_1080p());
    EXPECT_EQ(clip.result, 1);
    EXPECT_EQ(clip.window_spans(), spans);
    EXPECT_EQ(clip.transition_spans(), "");
  }
}

TEST(StabilizerMainWindows, NeighboursAgreeWhereTheyOverlap) {
  synthetic::track_world_options options;
  options.frame_count = 900;
  const solved_clip clip = solve(make_track_world(options), params_1080p());
  ASSERT_EQ(clip.result, 1);
  ASSERT_EQ(clip.window_spans(), "0 300;270 570;540 840;810 900;");
  for (std::size_t w = 1; w < clip.windows.size(); ++w) {
    const factorization_window& window = clip.windows[w];
    ASSERT_EQ(window.overlap_end, window.first + 30);
    const auto apart = [&](std::size_t row) {
      std::vector<double> distances;
      for (std::size_t s = 0; s < 500; ++s) {
        const track_sample& before = window.overlap_rows[row * 500 + s];
        const track_sample& after = clip.global.output_at(window.first + row, s);
        if (before.status < 0 || after.status < 0) continue;
        distances.push_back(std::hypot(before.x - after.x, before.y - after.y));
      }
      EXPECT_GT(distances.size(), 300u);
      return median(distances);
    };
    EXPECT_LT(apart(0), 0.6) << w;
    EXPECT_LT(apart(15), 0.8) << w;
    EXPECT_LT(apart(29), 10.0) << w;  // the old window's free end
    EXPECT_GT(apart(29), apart(0)) << w;
  }
  // The blend over the overlap hides the step from one solution to the next.
  const std::vector<track_sample> blended = blended_output(clip, params_1080p());
  for (std::size_t f = 1; f + 1 < 900; ++f) {
    EXPECT_GT(median_bend(clip, clip.global.input, f), 1.0);
    EXPECT_LT(median_bend(clip, blended, f), 0.15) << "frame " << f;
  }
}

// What a track travels within a window, in pixels: the largest and the median over its tracks.
struct travel {
  double largest = 0;
  double median = 0;
};
travel travel_in(const solved_clip& clip, const factorization_window& window, std::size_t end) {
  std::vector<double> all;
  for (std::size_t t = 0; t < clip.global.trajectories.size(); ++t) {
    if (!window.takes_part(t)) continue;
    frame_span span = span_in_window(clip.global.trajectories[t], window);
    span.end = std::min(span.end, end);
    if (span.first >= span.end) continue;
    const auto feature = static_cast<std::size_t>(clip.global.trajectories[t].feature);
    double lowest[2] = {1e9, 1e9}, highest[2] = {-1e9, -1e9};
    for (std::size_t f = span.first; f < span.end; ++f) {
      const track_sample& s = clip.global.output_at(f, feature);
      const float at[2] = {s.x, s.y};
      for (int k = 0; k < 2; ++k) {
        lowest[k] = std::min(lowest[k], double{at[k]});
        highest[k] = std::max(highest[k], double{at[k]});
      }
    }
    all.push_back(std::hypot(highest[0] - lowest[0], highest[1] - lowest[1]));
  }
  travel result;
  result.median = median(all);
  for (const double d : all) result.largest = std::max(result.largest, d);
  return result;
}

TEST(StabilizerMainWindows, NoMotionHoldsEveryTrackStill) {
  for (const bool whole_clip : {true, false}) {
    for (const double gain : {0.0, 0.3}) {
      synthetic::track_world_options options;
      options.slots = 200;
      options.gain = gain;
      options.whole_clip = whole_clip;
      SolverParamsRecord parameters = params_1080p();
      parameters.no_motion = true;
      const solved_clip clip = solve(make_track_world(options), parameters);
      ASSERT_EQ(clip.result, 1);
      ASSERT_EQ(clip.window_spans(), "0 300;");
      const travel found = travel_in(clip, clip.windows.front(), 300);
      EXPECT_LT(found.median, 2e-4) << "whole clip " << whole_clip << ", gain " << gain;
      EXPECT_LT(found.largest, 1e-3) << "whole clip " << whole_clip << ", gain " << gain;
    }
  }
}

// Tracks that are missing on a window's first frame have nothing to hold them there, so stillness
// from window to window is a promise for long tracks alone.
TEST(StabilizerMainWindows, NoMotionOverSeveralWindowsOfLongTracks) {
  synthetic::track_world_options options;
  options.frame_count = 900;
  options.slots = 200;
  options.gain = 0.1;
  options.mean_life = 2000;
  SolverParamsRecord parameters = params_1080p();
  parameters.no_motion = true;
  const solved_clip clip = solve(make_track_world(options), parameters);
  ASSERT_EQ(clip.result, 1);
  ASSERT_EQ(clip.window_spans(), "0 300;270 570;540 840;810 900;");
  for (std::size_t w = 0; w < clip.windows.size(); ++w) {
    const std::size_t end = w + 1 < clip.windows.size() ? clip.windows[w + 1].first : 900;
    const travel found = travel_in(clip, clip.windows[w], end);
    EXPECT_LT(found.largest, 0.004) << "window " << w;
    if (w == 0) continue;
    std::vector<double> steps;
    for (std::size_t s = 0; s < 200; ++s) {
      const track_sample& before = clip.global.output_at(clip.windows[w].first - 1, s);
      const track_sample& after = clip.global.output_at(clip.windows[w].first, s);
      if (before.status < 0 || after.status < 0) continue;
      steps.push_back(std::hypot(before.x - after.x, before.y - after.y));
    }
    EXPECT_GT(steps.size(), 150u);
    EXPECT_LT(median(steps), 1.0) << "into window " << w;
  }
}

// Half of the rank's tracks must be complete over the window's duration, and hold it with their
// weight.
TEST(StabilizerMainWindows, FewTracks) {
  struct {
    int slots;
    double life;
    const char* spans;
  } const cases[] = {
      {3, 60, ""}, {10, 60, ""}, {20, 60, ""}, {80, 60, "0 200;"}, {20, 200, "0 200;"}};
  for (const auto& c : cases) {
    synthetic::track_world_options options;
    options.frame_count = 200;
    options.slots = c.slots;
    options.mean_life = c.life;
    const solved_clip clip = solve(make_track_world(options), params_1080p());
    EXPECT_EQ(clip.result, 1);
    EXPECT_EQ(clip.window_spans(), c.spans) << c.slots << " slots, life " << c.life;
    EXPECT_EQ(clip.transition_spans(), clip.windows.empty() ? "solved 0 200;" : "");
  }
}

// In between, strong stretches get windows and weak ones transitions: nothing stays open.
TEST(StabilizerMainWindows, WindowsAndTransitionsCoverTheClip) {
  bool mixed = false;
  for (const std::uint64_t seed : {1, 2, 3, 4, 5, 6}) {
    synthetic::track_world_options options;
    options.frame_count = 400;
    options.slots = 40;
    options.seed = seed;
    const solved_clip clip = solve(make_track_world(options), params_1080p());
    ASSERT_EQ(clip.result, 1);
    std::vector<int> covered(400);
    for (const factorization_window& w : clip.windows) {
      for (std::uint64_t f = w.first; f < w.end; ++f) covered[f] = 1;
    }
    std::uint64_t last = 0;
    for (const transition_record& r : clip.transitions) {
      EXPECT_LE(last, r.first);
      EXPECT_LT(r.first, r.end);
      last = r.end;
      for (std::uint64_t f = r.first; f < r.end; ++f) covered[f] = 1;
    }
    EXPECT_EQ(std::count(covered.begin(), covered.end(), 0), 0) << "seed " << seed;
    mixed |= !clip.windows.empty() && !clip.transitions.empty();
    for (const Trajectory& t : clip.global.trajectories) {
      for (int f = t.first; f < t.last; ++f) {
        const track_sample& s = clip.global.output_at(f, t.feature);
        ASSERT_TRUE(s.status < 0 || (std::isfinite(s.x) && std::isfinite(s.y)));
      }
    }
  }
  EXPECT_TRUE(mixed);
}

}  // namespace
}  // namespace marrow::stabilization
