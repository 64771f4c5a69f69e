#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "platform/tessel/debug.h"
#include "stabilization/displacements.h"
#include "stabilization/models/matrix3.h"
#include "stabilization/stabilizer_main.h"
#include "synthetic/track_world.h"

// Whole clips through the solve.
namespace marrow::stabilization {

inline SolverParamsRecord params_1080p() {
  SolverParamsRecord parameters;
  parameters.reconstruction_error_threshold = 0.0045 * 1920;
  parameters.reconstruction_error_third = parameters.reconstruction_error_threshold / 3;
  return parameters;
}

// A track table filled by hand: positions as functions of the frame.
inline stabilizer_global empty_table(std::size_t frames, std::size_t slots) {
  stabilizer_global global;
  global.frame_count = frames;
  global.feature_count = slots;
  global.input.assign(frames * slots, {0, 0, -1, 0});
  global.output.assign(frames * slots, {0, 0, -1, 0});
  return global;
}

// Puts a track into the slot over [first, end); at(frame) tells where it is.
inline void put_track(stabilizer_global& global, std::size_t slot, int first, int end,
                      const std::function<point2(int)>& at) {
  for (int f = first; f < end; ++f) {
    const point2 p = at(f);
    global.input[static_cast<std::size_t>(f) * global.feature_count + slot] = {
        static_cast<float>(p.x), static_cast<float>(p.y), f == first ? f + 1 : 0, 1.0f};
  }
}

// Points all over a 1080p frame, at least 100 pixels inside.
inline point2 scattered(std::size_t slot) {
  return {100.0 + static_cast<double>(slot * 379 % 1720),
          100.0 + static_cast<double>(slot * 523 % 880)};
}

struct solved_clip {
  stabilizer_global global;
  std::vector<transition_record> transitions;
  std::vector<factorization_window> windows;
  int result = 0;
  std::string log;

  // "first end;" of each.
  std::string window_spans() const {
    std::string text;
    for (const factorization_window& w : windows) {
      text += std::to_string(w.first) + " " + std::to_string(w.end) + ";";
    }
    return text;
  }
  std::string transition_spans() const {
    std::string text;
    for (const transition_record& r : transitions) {
      text += (r.kind == transition_record::solved ? "solved " : "unsolved ") +
              std::to_string(r.first) + " " + std::to_string(r.end) + ";";
    }
    return text;
  }

  // The second difference of the track about frame f, in pixels; NaN at its ends.
  double bend(const std::vector<track_sample>& rows, const Trajectory& t, std::size_t f) const {
    if (static_cast<int>(f) <= t.first || static_cast<int>(f) + 1 >= t.last) return NAN;
    const auto at = [&](std::size_t frame) {
      return rows[frame * global.feature_count + static_cast<std::size_t>(t.feature)];
    };
    const track_sample a = at(f - 1), b = at(f), c = at(f + 1);
    if (a.status < 0 || b.status < 0 || c.status < 0) return NAN;
    return std::hypot(double{a.x} - 2.0 * b.x + c.x, double{a.y} - 2.0 * b.y + c.y);
  }
};

inline solved_clip solve(stabilizer_global global, const SolverParamsRecord& parameters) {
  solved_clip clip;
  clip.global = std::move(global);
  tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 1);
  tessel::debug::SetSink([&](const std::string& text) {
    if (!text.starts_with("Frame ") && !text.starts_with("Not enough points")) clip.log += text;
  });
  clip.result =
      stabilizer_main(clip.global, parameters, clip.transitions, clip.windows, 1920, 1080, [] {});
  tessel::debug::SetSink({});
  tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 0);
  return clip;
}

inline solved_clip solve(const synthetic::track_world& world,
                         const SolverParamsRecord& parameters) {
  return solve(*world.global, parameters);
}

inline double median(std::vector<double> values) {
  std::erase_if(values, [](double v) { return std::isnan(v); });
  if (values.empty()) return NAN;
  const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
  std::nth_element(values.begin(), middle, values.end());
  return *middle;
}

// The positions that the warp of each frame goes by: windows blended where they overlap.
inline std::vector<track_sample> blended_output(const solved_clip& clip,
                                                const SolverParamsRecord& parameters) {
  std::vector<track_sample> rows(clip.global.output.size(), {0, 0, -1, 0});
  const displacement_lists lists = blended_displacements(clip.global, clip.windows, parameters);
  for (std::size_t f = 0; f < lists.size(); ++f) {
    for (const Displacement& d : lists[f]) {
      rows[f * clip.global.feature_count + static_cast<std::size_t>(d.track->feature)] = {
          static_cast<float>(d.targetX), static_cast<float>(d.targetY), 0, 0};
    }
  }
  return rows;
}

// Root mean square of a track's second differences.
inline double roughness(const solved_clip& clip, const std::vector<track_sample>& rows,
                        const Trajectory& t) {
  double sum = 0;
  int count = 0;
  for (int f = t.first + 1; f + 1 < t.last; ++f) {
    const double bend = clip.bend(rows, t, static_cast<std::size_t>(f));
    if (std::isnan(bend)) continue;
    sum += bend * bend;
    ++count;
  }
  return count == 0 ? NAN : std::sqrt(sum / count);
}

// Median over the tracks of their second difference about frame f, in pixels.
inline double median_bend(const solved_clip& clip, const std::vector<track_sample>& rows,
                          std::size_t f) {
  std::vector<double> bends;
  for (const Trajectory& t : clip.global.trajectories) bends.push_back(clip.bend(rows, t, f));
  return median(bends);
}

// (I + lambda^2 D'D) u = signal, D the second difference: what a lone window does to a signal.
// Plain elimination.
inline std::vector<double> smoothed_signal(std::vector<double> signal, double lambda) {
  const std::size_t n = signal.size();
  std::vector<std::vector<double>> a(n, std::vector<double>(n));
  for (std::size_t i = 0; i < n; ++i) a[i][i] = 1;
  const double d[3] = {1, -2, 1};
  for (std::size_t f = 0; f + 2 < n; ++f) {
    for (std::size_t i = 0; i < 3; ++i) {
      for (std::size_t j = 0; j < 3; ++j) a[f + i][f + j] += lambda * lambda * d[i] * d[j];
    }
  }
  for (std::size_t k = 0; k < n; ++k) {
    for (std::size_t i = k + 1; i < std::min(n, k + 3); ++i) {
      const double factor = a[i][k] / a[k][k];
      for (std::size_t j = k; j < n; ++j) a[i][j] -= factor * a[k][j];
      signal[i] -= factor * signal[k];
    }
  }
  for (std::size_t k = n; k-- > 0;) {
    for (std::size_t j = k + 1; j < n; ++j) signal[k] -= a[k][j] * signal[j];
    signal[k] /= a[k][k];
  }
  return signal;
}

}  // namespace marrow::stabilization
