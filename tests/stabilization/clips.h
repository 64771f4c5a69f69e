#pragma once

#include <gtest/gtest.h>

#include <cmath>
#include <cstddef>
#include <random>
#include <string>
#include <vector>

#include "platform/tessel/debug.h"
#include "stabilization/displacements.h"
#include "stabilization/models/matrix3.h"
#include "stabilization/solve_records.h"
#include "stabilization/stabilizer_global.h"
#include "stabilization/warp/var_vector.h"

// Displacements and clips made by hand.
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

// Puts samples into the slot over [first, end); at(frame) tells where the track is.
template <class At>
void put_track(stabilizer_global& global, std::size_t slot, int first, int end, At at) {
  for (int f = first; f < end; ++f) {
    const point2 p = at(f);
    global.input[f * global.feature_count + slot] = {
        static_cast<float>(p.x), static_cast<float>(p.y), f == first ? f + 1 : 0, 1};
  }
}

// The same with its trajectory and its stabilized positions, wanted(frame, source).
template <class At, class Wanted>
void add_track(stabilizer_global& global, std::size_t slot, int first, int end, At at,
               Wanted wanted) {
  put_track(global, slot, first, end, at);
  global.trajectories.push_back({static_cast<int>(slot), 0, first, end});
  for (int f = first; f < end; ++f) {
    const point2 q = wanted(f, position(global.input_at(f, slot)));
    global.output_at(f, slot) = {static_cast<float>(q.x), static_cast<float>(q.y), f == first, 0};
  }
}

// Of a track that stands still.
template <class Wanted>
void add_still(stabilizer_global& global, std::size_t slot, int first, int end, point2 p,
               Wanted wanted) {
  add_track(
      global, slot, first, end, [p](int) { return p; },
      [&](int f, point2 q) { return wanted(f, q); });
}

inline void build_trajectories(stabilizer_global& global) {
  global.trajectories =
      tracking::BuildTrajectories(global.input.data(), global.feature_count, global.frame_count);
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

// The second difference of a slot about frame f, in pixels; NaN where it lacks a sample.
inline double bend(const stabilizer_global& global, const std::vector<track_sample>& rows,
                   std::size_t slot, std::size_t f) {
  if (f == 0 || f + 1 >= global.frame_count) return NAN;
  const track_sample* at = &rows[f * global.feature_count + slot];
  const track_sample &a = at[-static_cast<std::ptrdiff_t>(global.feature_count)], &b = at[0],
                     &c = at[global.feature_count];
  if (a.status < 0 || b.status != 0 || c.status != 0) return NAN;
  return std::hypot(double{a.x} - 2.0 * b.x + c.x, double{a.y} - 2.0 * b.y + c.y);
}

// Root mean square of the second differences about frames [first, end); NaN where there are none.
inline double roughness(const stabilizer_global& global, const std::vector<track_sample>& rows,
                        std::size_t slot, int first, int end) {
  double sum = 0;
  int count = 0;
  for (int f = first; f < end; ++f) {
    const double d = bend(global, rows, slot, static_cast<std::size_t>(f));
    if (std::isnan(d)) continue;
    sum += d * d;
    ++count;
  }
  return std::sqrt(sum / count);
}

}  // namespace marrow::stabilization
