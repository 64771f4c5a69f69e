#pragma once

#include <cstddef>

#include "tracking/window_shape.h"

namespace marrow::tracking {

// How colours may change between template and image.
enum class color_mode : int {
  none = 0,
  unused = 1,     // tracks nothing
  joint = 2,      // gain and bias of each channel, solved together with the motion
  regressed = 3,  // gain and bias by linear regression in each iteration; translation only
};

// Motion of one feature since its seed: offset (u, v) of its first window now lies at
//   X = x + (1 + a) u + b v + dx,  Y = y + c u + (1 + d) v + dy,
// and its first colours are gain * (present colours) + bias. x, y: position in the seed frame.
struct AffineState {
  AffineState() : AffineState(0.0f, 0.0f) {}
  AffineState(float anchor_x, float anchor_y) : x(anchor_x), y(anchor_y) {
    for (float& g : gain) g = 1.0f;
  }

  float x, y;
  float dx = 0.0f, dy = 0.0f;
  float a = 0.0f, b = 0.0f, c = 0.0f, d = 0.0f;
  float gain[kMaxChannels];
  float bias[kMaxChannels] = {};
};

// Steps under which a level solver stops.
struct solver_tolerances {
  float translation = 0.0f;   // pixels of the level
  float affine = 0.0f;        // each of a, b, c, d; verification only
  float color_lambda = 0.0f;  // log of the gain, joint mode only
  float color_delta = 0.0f;   // bias, 0 to 255, joint mode only
};

// Applies the color steps of the joint mode, {log gain, bias} for each channel, and tells whether
// all of them are under the tolerances.
bool UpdateColors(const double* steps, std::size_t channels, const solver_tolerances& tolerances,
                  AffineState& state);

// Result of a level solver that gave up; otherwise it is the index of the iteration at which it
// converged, or max_iterations.
inline constexpr int kLevelFailed = -1;

}  // namespace marrow::tracking
