#pragma once

#include <gtest/gtest.h>

#include <random>
#include <vector>

#include "stabilization/displacements.h"
#include "stabilization/models/matrix3.h"

// Displacements and clips made by hand, for the tests of the warper's parts.
namespace marrow::stabilization {

inline Displacement displacement(point2 source, point2 target, double weight = 1) {
  Displacement d;
  d.sourceX = source.x;
  d.sourceY = source.y;
  d.targetX = target.x;
  d.targetY = target.y;
  d.weight = weight;
  return d;
}

// Random sources over a frame, targets under m.
inline std::vector<Displacement> displacements_under(const matrix3& m, int count, double width,
                                                     double height, unsigned seed = 1) {
  std::mt19937 random(seed);
  std::uniform_real_distribution<double> unit(0, 1);
  std::vector<Displacement> list;
  for (int i = 0; i < count; ++i) {
    const point2 p = {unit(random) * (width - 1), unit(random) * (height - 1)};
    list.push_back(displacement(p, transform(m, p), 0.2 + 0.8 * unit(random)));
  }
  return list;
}

inline void expect_matrix_near(const matrix3& actual, const matrix3& expected, double tolerance) {
  for (int i = 0; i < 9; ++i) EXPECT_NEAR(actual[i], expected[i], tolerance) << "entry " << i;
}

// A clip's tables with one slot for each track; no sample anywhere until a track is added.
inline stabilizer_global empty_clip(int features, int frames) {
  stabilizer_global global;
  global.feature_count = features;
  global.frame_count = frames;
  global.input.assign(static_cast<std::size_t>(features) * frames, {0, 0, -1, 0});
  global.output = global.input;
  return global;
}

// Adds a track over [first, last) in the slot; at(f) gives the source, wanted(f, source) the
// stabilized position.
template <class At, class Wanted>
void add_track(stabilizer_global& global, int slot, int first, int last, At at, Wanted wanted) {
  global.trajectories.push_back({slot, 0, first, last});
  for (int f = first; f < last; ++f) {
    const point2 p = at(f);
    track_sample& source = global.input[f * global.feature_count + slot];
    source = {static_cast<float>(p.x), static_cast<float>(p.y), f == first ? f + 1 : 0, 0};
    const point2 q = wanted(f, point2{source.x, source.y});
    global.output_at(f, slot) = {static_cast<float>(q.x), static_cast<float>(q.y), f == first, 0};
  }
}

}  // namespace marrow::stabilization
