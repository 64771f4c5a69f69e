#pragma once

#include "tracking/affine_state.h"
#include "tracking/packed_cholesky.h"
#include "tracking/translation_solver.h"
#include "tracking/window_shape.h"

namespace marrow::tracking {

// Factor of the normal matrix of one template level: the sum of J'J with, for offset (u, v),
// J = (Gx, Gy, u Gx, v Gx, u Gy, v Gy) / 2 and, with color, T and 1 for each channel. False if it
// is not positive definite.
bool PrepareAffine(const float* t, const window_shape& shape, bool with_color,
                   packed_cholesky& normal);

// One inverse-compositional update: with M the warp of `state` and N = I minus the step's matrix,
// the warp becomes M inverse(N), and the step's translation is added after it was turned by that.
// step: dx, dy, a, b, c, d.
void ComposeAffine(const double* step, AffineState& state);

// Alignment of a template by an affine warp, and by gain and bias of each channel with color_mode
// joint; any other mode but none fails. Otherwise as SolveTranslation. Fails if a corner of the
// warped window is not inside the image.
int SolveAffine(const float* t, const window_shape& shape, const packed_cholesky& normal,
                const level_image& image, color_mode mode, const solver_tolerances& tolerances,
                int max_iterations, AffineState& state, float* window);

}  // namespace marrow::tracking
