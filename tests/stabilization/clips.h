#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <boost/make_shared.hpp>
#include <cmath>
#include <cstddef>
#include <string>
#include <utility>
#include <vector>

#include "platform/tessel/debug.h"
#include "stabilization/models/similarity.h"
#include "stabilization/stabilizer_main.h"
#include "stabilization/warp/cp_warper.h"
#include "synthetic/track_world.h"

// Displacements and clips made by hand, clips through the whole solve, and clips for the warper.
namespace marrow::stabilization {

inline const progress_functor kNoProgress = [] {};

// What is logged while this lives.
class captured_log {
 public:
  captured_log() {
    tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 1);
    tessel::debug::SetSink([this](const std::string& line) { text += line; });
  }
  ~captured_log() {
    tessel::debug::SetSink({});
    tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 0);
  }
  captured_log(const captured_log&) = delete;

  std::string text;
};

inline Displacement displacement(point2 source, point2 target, double weight = 1) {
  Displacement d;
  d.sourceX = source.x;
  d.sourceY = source.y;
  d.targetX = target.x;
  d.targetY = target.y;
  d.weight = weight;
  return d;
}

inline void expect_matrix_near(const matrix3& actual, const matrix3& expected, double tolerance) {
  for (int i = 0; i < 9; ++i) EXPECT_NEAR(actual[i], expected[i], tolerance) << "entry " << i;
}

inline void expect_point_near(point2 actual, point2 expected, double tolerance) {
  EXPECT_NEAR(actual.x, expected.x, tolerance);
  EXPECT_NEAR(actual.y, expected.y, tolerance);
}

inline point2 position(const track_sample& s) {
  return {s.x, s.y};
}

// A grid over a frame, its outermost vertices on the first and last pixels, each moved by `to`.
template <class To>
VarVector grid_over(int width, int height, int cols, int rows, To to) {
  VarVector grid(cols, rows);
  for (int v = 0; v < cols * rows; ++v) {
    const point2 p =
        to(point2{v % cols * (width - 1.0) / (cols - 1), v / cols * (height - 1.0) / (rows - 1)});
    grid.values[2 * v] = p.x;
    grid.values[2 * v + 1] = p.y;
  }
  return grid;
}

// A clip's tables with one slot for each track; no sample anywhere until a track is added.
inline stabilizer_global empty_clip(std::size_t slots, std::size_t frames) {
  stabilizer_global global;
  global.feature_count = slots;
  global.frame_count = frames;
  global.input.assign(slots * frames, {0, 0, -1, 0});
  global.output = global.input;
  return global;
}

// A window of no overlap.
inline factorization_window window_over(std::uint64_t first, std::uint64_t end) {
  factorization_window window;
  window.first = window.overlap_end = first;
  window.end = end;
  return window;
}

inline void build_trajectories(stabilizer_global& global) {
  global.trajectories =
      tracking::BuildTrajectories(global.input.data(), global.feature_count, global.frame_count);
}

// Tracks over [first, end), each in a slot of its own.
struct lives {
  int count, first, end;
};

// at(slot, frame) tells where the tracks are.
template <class At>
stabilizer_global clip_of(int frames, const std::vector<lives>& tracks, At at) {
  std::size_t slots = 0, slot = 0;
  for (const lives& l : tracks) slots += l.count;
  stabilizer_global global = empty_clip(slots, frames);
  for (const lives& l : tracks) {
    for (const std::size_t next = slot + l.count; slot < next; ++slot) {
      for (int f = l.first; f < l.end; ++f) {
        const point2 p = at(slot, f);
        global.input[f * slots + slot] = {static_cast<float>(p.x), static_cast<float>(p.y),
                                          f == l.first ? f + 1 : 0, 1};
      }
    }
  }
  build_trajectories(global);
  return global;
}

// "first end;" of each.
inline std::string spans_of(const std::vector<factorization_window>& windows) {
  std::string text;
  for (const auto& w : windows) text += std::to_string(w.first) + " " + std::to_string(w.end) + ";";
  return text;
}

// "solved first end;" or "unsolved first end;" of each.
inline std::string spans_of(const std::vector<transition_record>& records) {
  std::string text;
  for (const transition_record& r : records) {
    text += (r.kind == transition_record::solved ? "solved " : "unsolved ") +
            std::to_string(r.first) + " " + std::to_string(r.end) + ";";
    EXPECT_EQ(r.motion.size(), 4 * (r.end - r.first));
  }
  return text;
}

// The motion of what is unsolved is the identity, and no track has a place there.
inline void expect_unsolved_untouched(const stabilizer_global& global,
                                      const std::vector<transition_record>& records) {
  for (const transition_record& r : records) {
    if (r.kind == transition_record::solved) continue;
    for (std::size_t k = 0; k < r.motion.size(); ++k) ASSERT_EQ(r.motion[k], k % 4 == 0);
    for (std::size_t i = r.first * global.feature_count; i < r.end * global.feature_count; ++i) {
      ASSERT_EQ(global.output[i].status, -1);
    }
  }
}

// Points all over a 1080p frame, at least 100 pixels inside.
inline point2 scattered(std::size_t slot) {
  return {100.0 + static_cast<double>(slot * 379 % 1720),
          100.0 + static_cast<double>(slot * 523 % 880)};
}

// Where a still point is seen by a camera that pans by 2 pixels a frame, shakes and rolls: of
// tracks that move so the matrix has rank 4.
inline point2 shaken(point2 p, int f) {
  const double roll = 0.002 * std::sin(1.7 * f);
  return {p.x - roll * p.y + 8 * std::sin(1.7 * f) - 2 * f,
          p.y + roll * p.x + 6 * std::cos(2.9 * f)};
}

inline stabilizer_global shaken_clip(int frames, const std::vector<lives>& tracks) {
  return clip_of(frames, tracks, [](std::size_t s, int f) { return shaken(scattered(s), f); });
}

inline SolverParamsRecord params_1080p() {
  SolverParamsRecord parameters;
  parameters.reconstruction_error_threshold = 0.0045 * 1920;
  parameters.reconstruction_error_third = parameters.reconstruction_error_threshold / 3;
  return parameters;
}

inline synthetic::track_world_options world_of(int frames, int slots, double mean_life = 60) {
  synthetic::track_world_options options;
  options.frame_count = frames;
  options.slots = slots;
  options.mean_life = mean_life;
  return options;
}

inline stabilizer_global clip_of(const synthetic::track_world_options& options) {
  stabilizer_global global = *make_track_world(options).global;
  build_trajectories(global);
  return global;
}

struct solved_clip {
  stabilizer_global global;
  std::vector<transition_record> transitions;
  std::vector<factorization_window> windows;
  int result = 0;
  std::string log;
};

inline solved_clip solve(stabilizer_global global, const SolverParamsRecord& parameters,
                         const progress_functor& progress = kNoProgress) {
  solved_clip clip;
  clip.global = std::move(global);
  captured_log log;
  clip.result = stabilizer_main(clip.global, parameters, clip.transitions, clip.windows, 1920, 1080,
                                progress);
  clip.log = log.text;
  return clip;
}

// Median over the tracks of their second difference about frame f, in pixels; NaN without tracks.
inline double median_bend(const solved_clip& clip, const std::vector<track_sample>& rows,
                          std::size_t f) {
  const std::size_t columns = clip.global.feature_count;
  std::vector<double> bends;
  for (std::size_t i = f * columns; i < (f + 1) * columns; ++i) {
    const track_sample &a = rows[i - columns], &b = rows[i], &c = rows[i + columns];
    if (a.status < 0 || b.status != 0 || c.status != 0) continue;
    bends.push_back(std::hypot(double{a.x} - 2.0 * b.x + c.x, double{a.y} - 2.0 * b.y + c.y));
  }
  if (bends.empty()) return NAN;
  const auto middle = bends.begin() + static_cast<std::ptrdiff_t>(bends.size() / 2);
  std::ranges::nth_element(bends, middle);
  return *middle;
}

// The lists of all frames.
inline displacement_lists blended_displacements(const stabilizer_global& global,
                                                const std::vector<factorization_window>& windows,
                                                const SolverParamsRecord& parameters) {
  const blended_tracks tracks(global, windows, parameters);
  displacement_stream stream(tracks);
  displacement_lists lists;
  for (std::size_t f = 0; f < global.frame_count; ++f) {
    lists.push_back(stream.next(f > 0 ? &lists.back() : nullptr));
  }
  return lists;
}

// The positions that the warp of each frame goes by: windows blended where they overlap.
inline std::vector<track_sample> blended_output(const solved_clip& clip) {
  std::vector<track_sample> rows(clip.global.output.size(), {0, 0, -1, 0});
  const displacement_lists lists = blended_displacements(clip.global, clip.windows, params_1080p());
  for (std::size_t f = 0; f < lists.size(); ++f) {
    for (const Displacement& d : lists[f]) {
      rows[f * clip.global.feature_count + static_cast<std::size_t>(d.track->feature)] = {
          static_cast<float>(d.targetX), static_cast<float>(d.targetY), d.prevIndex < 0, 0};
    }
  }
  return rows;
}

inline constexpr int kWidth = 1920, kHeight = 1080;

// Tracks that stand still all the time, at(slot) each, and want to be at wanted(frame, source).
template <class Wanted, class At = point2 (*)(std::size_t)>
boost::shared_ptr<stabilizer_global> still_clip(int tracks, int frames, Wanted wanted,
                                                At at = scattered) {
  auto global = boost::make_shared<stabilizer_global>(
      clip_of(frames, {{tracks, 0, frames}}, [&](std::size_t slot, int) { return at(slot); }));
  for (int i = 0; i < tracks * frames; ++i) {
    const point2 q = wanted(i / tracks, position(global->input[i]));
    global->output[i] = {static_cast<float>(q.x), static_cast<float>(q.y), i < tracks, 0};
  }
  return global;
}

// What still_clip's tracks want under m.
inline auto under(const matrix3& m) {
  return [m](int, point2 p) { return transform(m, p); };
}

// Two rings of four corners about the frame's middle, 400 and 200 pixels to each side.
inline point2 on_rings(std::size_t slot) {
  const double ring = slot < 4 ? 400 : 200;
  return {960 + (slot & 1 ? ring : -ring), 540 + (slot & 2 ? ring : -ring)};
}

// A warper with its models decided. homography_limit: what a frame's homography may be off.
inline boost::shared_ptr<CPWarper> built(
    const boost::shared_ptr<stabilizer_global>& global, float method,
    const std::vector<factorization_window>& windows = {},
    const std::vector<transition_record>& transitions = {},
    float homography_limit = SolverParamsRecord().homography_limit) {
  const int frames = static_cast<int>(global->frame_count);
  auto warper = boost::make_shared<CPWarper>(frames, kWidth, kHeight);
  SolverParamsRecord parameters;
  parameters.method_level = method;
  parameters.track_fade_minimum = 0;
  parameters.homography_limit = homography_limit;
  warper->buildDisplacements(global, windows, transitions, parameters, kNoProgress);
  return warper;
}

inline boost::shared_ptr<CPWarper> driven(const boost::shared_ptr<stabilizer_global>& global,
                                          float method) {
  auto warper = built(global, method);
  warper->drive(kNoProgress);
  return warper;
}

// Largest distance, in pixels, of a frame's vertices from the rest grid under m.
inline double distance_from(const CPWarper& warper, int frame, const matrix3& m) {
  const VarVector grid = *warper.frameWarp(frame);
  double largest = 0;
  for (int r = 0; r < grid.rows; ++r) {
    for (int c = 0; c < grid.cols; ++c) {
      const point2 p = transform(m, {c * warper.cellWidth(), r * warper.cellHeight()});
      const point2 v = grid.vertex(c, r);
      const double d = std::hypot(v.x - p.x, v.y - p.y);
      if (!(d <= largest)) largest = d;
    }
  }
  return largest;
}

}  // namespace marrow::stabilization
