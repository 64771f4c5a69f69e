#pragma once

#include <cstdint>

#include "stabilization/solver_params.h"
#include "stabilizer/effect/src/table_reader.h"
#include "stabilizer/render/framing.h"
#include "tracking/selector_params.h"
#include "tracking/tracker_params.h"

// How parameters become the record of a solve, and how the few controls that a person sees become
// parameters.
namespace kelp::effect {

using marrow::render::Framing;

// The controls that a person sees, with their defaults. Percentages as shown: 50 is 50 %.
struct Controls {
  Result result = Result::smooth_motion;
  double smoothness = 50;  // percent, 0 to 1000
  Method method = Method::subspace_warp;
  Framing framing = Framing::crop_auto_scale;
  double maximum_scale = 150;     // percent, 100 to 10000
  double action_safe_margin = 0;  // percent, 0 to 100
  double additional_scale = 100;  // percent, 0 to 10000
  bool detailed_analysis = false;
  RollingShutterRipple rolling_shutter_ripple = RollingShutterRipple::automatic_reduction;
  double crop_less_smooth_more = 50;   // percent, 0 to 100
  double synthesis_input_range = 0.5;  // seconds, 0 to 999
  double synthesis_edge_feather = 10;  // pixels, 0 to 999
};

// The analysed clip, as the rules need it.
struct ClipGeometry {
  std::uint32_t width = 0;  // pixels of a frame
  std::uint32_t height = 0;
  std::int64_t pixel_aspect_num = 1;  // width : height of a pixel
  std::int64_t pixel_aspect_den = 1;
  double frame_rate = 25;  // frames a second, also of an interlaced clip

  // The frame's width in square pixels: rounded half away from zero, at least 1.
  std::uint32_t square_width() const;
  // What x is multiplied by for square pixels: square_width / width.
  float pixel_aspect() const;
};

marrow::stabilization::SolverParamsRecord GetSolverParams(const ParameterReader& params,
                                                          const ClipGeometry& clip);

// All parameters with the controls' values, the others at their defaults.
ParameterValues ValuesOf(const Controls& controls);

// The records of the controls.
marrow::tracking::SelectorParams MakeSelectorParams(const Controls& controls,
                                                    const ClipGeometry& clip);
marrow::tracking::TrackerParams MakeTrackerParams(const Controls& controls,
                                                  const ClipGeometry& clip);
marrow::stabilization::SolverParamsRecord MakeSolverParams(const Controls& controls,
                                                           const ClipGeometry& clip);

}  // namespace kelp::effect
