#include "stabilizer/render/render_geometry.h"

#include <algorithm>
#include <cmath>

namespace {

// Bounds of a folded warp can lie anywhere; a plane of 2^30 is as good as infinite.
std::int32_t saturated(double value) {
  if (!(value > -1073741824.0)) return -1073741824;
  return static_cast<std::int32_t>(std::min(value, 1073741824.0));
}

// Rounded up, as the host rounds a frame's side. A scale is a quotient of sides: what its rounding
// puts above a whole number would stretch the picture by a pixel.
std::int32_t scaledSide(std::int32_t side, double scale) {
  constexpr double kRounding = 1e-6;
  return saturated(std::ceil(side * scale - kRounding));
}

}  // namespace

Renderer::Renderer(const marrow::stabilization::frame_bounds& unionBounds, std::int32_t frameWidth,
                   std::int32_t frameHeight, std::int32_t gridCols, std::int32_t gridRows,
                   double render_scale_x, double render_scale_y)
    : scaleX(static_cast<float>(render_scale_x)),
      scaleY(static_cast<float>(render_scale_y)),
      boundsMinX(unionBounds.min_x * scaleX),
      boundsMinY(unionBounds.min_y * scaleY),
      boundsMaxX(unionBounds.max_x * scaleX),
      boundsMaxY(unionBounds.max_y * scaleY),
      sourceWidth(scaledSide(frameWidth, render_scale_x)),
      sourceHeight(scaledSide(frameHeight, render_scale_y)),
      cols(gridCols),
      rows(gridRows),
      cellWidth(static_cast<double>(sourceWidth - 1) / (cols - 1)),
      cellHeight(static_cast<double>(sourceHeight - 1) / (rows - 1)),
      planeWidth(saturated(std::ceil(boundsMaxX - boundsMinX))),
      planeHeight(saturated(std::ceil(boundsMaxY - boundsMinY))) {}

float Renderer::fitZoom(std::int32_t frameWidth, std::int32_t frameHeight, std::int32_t cropWidth,
                        std::int32_t cropHeight, float actionSafe, float maxScale,
                        float additional) {
  const auto w = static_cast<float>(frameWidth);
  const auto h = static_cast<float>(frameHeight);
  const auto cw = static_cast<float>(cropWidth);
  const auto ch = static_cast<float>(cropHeight);
  const float m = 1.0f - actionSafe;
  const float sy = (h * m + 1.0f) / ch;
  const float sx = (w * m + 1.0f) / cw;
  const float s = std::max(std::min(std::max(sx, sy), maxScale), 1.0f);
  const float z = additional * s;
  const float pw = cw * z;
  const float ph = ch * z;
  outLeft = std::max(0, saturated(std::ceil((w - pw) * scaleX * 0.5f)));
  outTop = std::max(0, saturated(std::ceil((h - ph) * scaleY * 0.5f)));
  outRight = std::min(saturated(scaleX * pw) + outLeft, saturated(scaleX * w + 0.5f));
  outBottom = std::min(saturated(scaleY * ph) + outTop, saturated(scaleY * h + 0.5f));
  return z;
}
