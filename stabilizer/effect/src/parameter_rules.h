#pragma once

#include <cstdint>

#include "stabilization/solver_params.h"
#include "stabilizer/render/frame_renderer.h"
#include "tracking/selector_params.h"
#include "tracking/tracker_params.h"

// How the controls become the three parameter records: defaults of the hidden controls, values
// found from the frame's size where a control says 0 = auto, and the solve's numbers from the few
// controls that a person sees.
namespace kelp::effect {

enum class Result { smooth_motion = 1, no_motion = 2 };
enum class Method { position = 1, position_scale_rotation = 2, perspective = 3, subspace_warp = 4 };
enum class RollingShutterRipple { automatic_reduction = 1, enhanced_reduction = 2 };

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
  double crop_less_smooth_more = 50;  // percent, 0 to 100
};

// The analysed clip, as the rules need it.
struct ClipGeometry {
  std::uint32_t width = 0;  // pixels of a frame
  std::uint32_t height = 0;
  std::int64_t pixel_aspect_num = 1;  // width : height of a pixel
  std::int64_t pixel_aspect_den = 1;
  double frame_rate = 25;  // analysed frames a second

  // The frame's width in square pixels: rounded half away from zero, at least 1.
  std::uint32_t square_width() const;
  // What x is multiplied by for square pixels: square_width / width.
  float pixel_aspect() const;
};

// Half side of a window: 7 at 480 lines or less, 15 at 1080 or more, linear between and truncated;
// 5 more when detailed.
std::uint64_t WindowRule(std::uint32_t height, bool detailed);

// The records of the hidden controls' defaults with every automatic value filled in.
marrow::tracking::SelectorParams MakeSelectorParams(const Controls& controls,
                                                    const ClipGeometry& clip);
marrow::tracking::TrackerParams MakeTrackerParams(const Controls& controls,
                                                  const ClipGeometry& clip);
marrow::stabilization::SolverParamsRecord MakeSolverParams(const Controls& controls,
                                                           const ClipGeometry& clip);

}  // namespace kelp::effect
