#pragma once

#include <cstdint>

#include "stabilization/warp/var_vector.h"

// The geometry of one render: what the warps' plane, the source and the output rectangle measure at
// the render's scale. Read-only while strips run.
class Renderer {
 public:
  // unionBounds, frameWidth, frameHeight: of the analysed frame, whose pixels are square.
  // render_scale_x: the host's horizontal downsample ratio over the pixel aspect; render_scale_y:
  // the vertical ratio.
  Renderer(const marrow::stabilization::frame_bounds& unionBounds, std::int32_t frameWidth,
           std::int32_t frameHeight, std::int32_t gridCols, std::int32_t gridRows,
           double render_scale_x, double render_scale_y);

  // The scale at which a crop window of cropWidth x cropHeight is shown so that it covers the frame
  // less its margin, between 1 and maxScale, times `additional`. Sets the output rectangle. All
  // sizes in square pixels of the analysed frame; the others are fractions.
  float fitZoom(std::int32_t frameWidth, std::int32_t frameHeight, std::int32_t cropWidth,
                std::int32_t cropHeight, float actionSafe, float maxScale, float additional);

  float scaleX;
  float scaleY;
  double boundsMinX;  // union of all frames' outlines, scaled
  double boundsMinY;
  double boundsMaxX;
  double boundsMaxY;
  std::int32_t sourceWidth;
  std::int32_t sourceHeight;
  std::int32_t cols;
  std::int32_t rows;
  double cellWidth;  // rest grid on the scaled source
  double cellHeight;
  std::int32_t planeWidth;
  std::int32_t planeHeight;
  std::int32_t outLeft = 0;  // half-open; where the picture lies in the output
  std::int32_t outRight = 0;
  std::int32_t outTop = 0;
  std::int32_t outBottom = 0;
  bool edgeTolerant = false;  // cells at the grid's border reach past it with a crop too
};
