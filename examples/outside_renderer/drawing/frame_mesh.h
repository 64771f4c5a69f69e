#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "examples/outside_renderer/drawing/exports.h"

namespace outside {

enum class Framing { stabilize_only = 1, crop = 2, crop_auto_scale = 3 };

// What a frame's place depends on beside the solve, as the embedding program knows it.
struct Controls {
  Framing framing = Framing::crop_auto_scale;
  float action_safe_margin = 0;  // these three are fractions
  float maximum_scale = 1.5f;
  float additional_scale = 1;
  std::int32_t pixel_aspect_num = 1, pixel_aspect_den = 1;  // width : height of the layer's pixel
};

// One cell of the warped grid. Output positions have their pixels' centres at whole numbers.
struct Cell {
  // Clockwise from the grid's top left.
  std::array<float, 4> x, y;
  // Homogeneous, row-major: from (output - output_origin, 1) to source - source_origin, where the
  // sample is taken. The origins lie at the cell, so that 32-bit floats are exact to some 1e-5
  // pixels, however large the frame.
  std::array<float, 9> source_from_output;
  std::array<std::int32_t, 2> output_origin, source_origin;
};

// How one frame is drawn: cell after cell, a later one over an earlier one. What no cell covers is
// clear.
struct FrameMesh {
  std::int32_t width = 0, height = 0;                     // of the output
  std::int32_t left = 0, top = 0, right = 0, bottom = 0;  // part of it that is drawn, half-open
  std::vector<Cell> cells;
};

// At full size. With a crop the output is the layer's frame; else it is as large as what all warps
// cover together, and keeps the frame in its middle. Along the outline of a frame that isn't
// cropped the plug-in draws up to two pixels more.
FrameMesh MeshOf(const SolvedFrame& frame, const Controls& controls);

}  // namespace outside
