#pragma once

#include <cstdint>

namespace marrow::stabilization {

// The default of transition_bisquare_sigma: transitions trust all tracks alike, as they did before
// that number had a meaning, so that saved work comes out as it was.
inline constexpr double kTrustAllTracks = 5.0;

// Every number that rules a solve. Durations, steps and overlaps in frames; lengths in square
// pixels of the analysed frame unless told otherwise. Filled anew each time a solve may start.
struct SolverParamsRecord {
  std::int32_t rank = 9;                        // dimension of the motion subspace
  std::int32_t duration = 40;                   // the moving window
  std::int32_t step = 5;                        // by which the moving window advances
  std::int32_t min_duration = 5;                // shorter trajectories are removed
  std::int32_t kernel_size = 100;               // held and printed only
  std::int32_t short_trajectory_duration = 10;  // least overlap of a trajectory with its window
  std::int32_t track_fade_duration = 100;
  std::int32_t track_fade_minimum = 5;     // shorter trajectories weigh nothing
  double smoothness_lambda = 200.0;        // weight of the smoothing terms
  bool conservative_factorization = true;  // run the window quality check
  double conservative_threshold = 7.5;     // least sum of track weights on a frame
  double _reconstruction_error_threshold_ratio = 0.0045;
  double reconstruction_error_threshold = 0.0;  // the ratio times the frame's larger side
  double data_weight = 1.0;
  double reconstruction_error_third = 0.0;  // reconstruction_error_threshold / 3
  double center_x = 0.0;                    // subtracted from all samples before factorization
  double center_y = 0.0;
  std::int64_t max_factorization_frames = 300;
  std::int64_t max_transition_iterations = 10;
  std::int64_t transition_min_observations = 1;
  // Unless kTrustAllTracks: how far a track may leave the others within a frame before it counts
  // less in a transition, pixels of a picture 1000 wide; and transitions don't turn or resize
  // frames that few tracks hold. See transition_window.
  double transition_bisquare_sigma = kTrustAllTracks;
  bool use_new_solver = true;
  std::int64_t transition_max_duration = 200;
  double transition_stab_lambda = 100.0;
  std::int64_t transition_fade_duration = 30;
  std::int32_t factorization_window_overlap = 30;
  std::int64_t transition_tail_overlap = 10;  // frames that a transition reaches back over
  std::int32_t transition_window_overlap =
      10;                               // frames of a window taken into the transition before it
  std::int32_t crop_constant = 1;       // hashed only
  float path_gaussian_sigma = 30.0f;    // frames; exactly 1000000 selects the constant window
  float path_bilateral_sigma = 500.0f;  // pixels
  float action_safe_margin = 0.1f;      // fraction
  float maximum_scale = 1.5f;           // fraction
  bool crop = true;
  bool use_frame_bounds = true;  // the cropper reads outlines, not filled cells
  bool no_motion = false;
  float homography_limit = 50.0f;
  float method_level = 4.0f;  // 1 translation, 2 similarity, 3 homography, 4 control points; real
  float pixel_aspect = 1.0f;  // multiplies x at the start
};

}  // namespace marrow::stabilization
