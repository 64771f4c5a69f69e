#pragma once

#include <concepts>
#include <type_traits>

#include "tracking/selector_params.h"
#include "tracking/tracker_params.h"

namespace kelp::analysis {

// visit(name, value) for each field, in the order that the tracker's identity depends on.
template <class Params, class Visit>
requires std::same_as<std::remove_const_t<Params>, marrow::tracking::SelectorParams>
void ForEachField(Params& p, const Visit& visit) {
  visit("max_count", p.max_count);
  visit("spacing", p.spacing);
  visit("half_winx", p.half_winx);
  visit("half_winy", p.half_winy);
  visit("border", p.border);
  visit("threshold", p.threshold);
  visit("min_eig", p.min_eig);
  visit("max_eig", p.max_eig);
  visit("presmoothing", p.presmoothing);
  visit("presmooth_factor", p.presmooth_factor);
  visit("eig_ratio_threshold", p.eig_ratio_threshold);
}

template <class Params, class Visit>
requires std::same_as<std::remove_const_t<Params>, marrow::tracking::TrackerParams>
void ForEachField(Params& p, const Visit& visit) {
  visit("max_iterations", p.max_iterations);
  visit("tolerance_translation", p.tolerance_translation);
  visit("tolerance_affine", p.tolerance_affine);
  visit("pyramidal_levels", p.pyramidal_levels);
  visit("half_win_x", p.half_win_x);
  visit("half_win_y", p.half_win_y);
  visit("color_correction_translation", p.color_correction_translation);
  visit("color_correction_affine", p.color_correction_affine);
  visit("affine_verification", p.affine_verification);
  visit("tolerance_color_lambda", p.tolerance_color_lambda);
  visit("tolerance_color_delta", p.tolerance_color_delta);
  visit("tolerance_min_correlation", p.tolerance_min_correlation);
  visit("tolerance_primary_color_threshold", p.tolerance_primary_color_threshold);
  visit("kill_tracks_shorter_than", p.kill_tracks_shorter_than);
}

}  // namespace kelp::analysis
