#pragma once

#include <cstdint>

#include "effect/parameter_reader.h"
#include "stabilization/solver_params.h"

// How parameters become the record of a solve.
namespace kelp::effect {

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

}  // namespace kelp::effect
