#pragma once

#include "tracking/affine_state.h"
#include "tracking/image_pyramid.h"
#include "tracking/packed_cholesky.h"
#include "tracking/window_shape.h"

namespace marrow::tracking {

// Inverse of the normal matrix of one template level, sum of J'J with J = (Gx / 2, Gy / 2) and in
// the joint mode T and 1 for each channel.
struct translation_normal {
  double xx, xy, yy;  // closed-form inverse of the modes without color columns
  packed_cholesky joint;
};

// False if the joint matrix is not positive definite. A singular matrix of the other modes passes:
// its steps are not finite, and the next bounds test stops them.
bool PrepareTranslation(const float* t, const window_shape& shape, color_mode mode,
                        translation_normal& normal);

// Inverse-compositional alignment of a template (Baker and Matthews, Lucas-Kanade 20 Years On,
// 2004) by translation: iterates state.dx, dy (and gain, bias) until the steps are under the
// tolerances. t: the template's plane. state.x, y: its position on this level. `window`, a plane,
// receives the last sample, of the state before the last step, unless the level failed. Returns the
// iteration at which it converged, max_iterations, or kLevelFailed when the window leaves the image
// or the mode is not one of color_mode.
int SolveTranslation(const float* t, const window_shape& shape, const translation_normal& normal,
                     const level_image& image, color_mode mode, const solver_tolerances& tolerances,
                     int max_iterations, AffineState& state, float* window);

}  // namespace marrow::tracking
