#pragma once

#include <cstdint>

#include "stabilizer/render/deblur.h"
#include "stabilizer/render/edge_preparation.h"
#include "stabilizer/render/framing.h"

namespace marrow::render {

struct RenderSettings {
  Framing framing = Framing::crop_auto_scale;
  float action_safe = 0.0f;       // fraction of the frame
  float maximum_scale = 1.5f;     // fraction; for crop_auto_scale alone
  float additional_scale = 1.0f;  // fraction, above 0
  // What the given output differs by from the one that setupOutputRect asked for, in pixels: the
  // output's origin plus the setup's.
  double shift_x = 0.0;
  double shift_y = 0.0;
  // For synthesize_edges alone.
  std::int64_t synthesis_range = 0;  // frames on each side
  EdgeSettings edges{};
  double alpha_boost = 1.0;  // see synthesizeEdges
  DeblurSettings deblur = {};
};

}  // namespace marrow::render
