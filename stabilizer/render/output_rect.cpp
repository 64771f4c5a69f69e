#include "stabilizer/render/output_rect.h"

namespace marrow::render {

using stabilization::point2;
using stabilization::VarVector;

Renderer makeRenderer(const ClipWarps& warps, double scaleX, double scaleY) {
  return Renderer(warps.unionBounds(), warps.frameWidth(), warps.frameHeight(), warps.gridCols(),
                  warps.gridRows(), scaleX, scaleY);
}

double getZoom(const ClipWarps& warps, const cropper* crop, const RenderSettings& settings,
               Renderer& renderer) {
  if (!crops(settings.framing) || crop == nullptr || crop->cropWidth <= 0 ||
      crop->cropHeight <= 0) {
    return settings.additional_scale;
  }
  const float maximum =
      settings.framing == Framing::crop_auto_scale ? settings.maximum_scale : 1.0f;
  return renderer.fitZoom(warps.frameWidth(), warps.frameHeight(), crop->cropWidth,
                          crop->cropHeight, settings.action_safe, maximum,
                          settings.additional_scale);
}

bool isOvercropped(const ClipWarps& warps, const cropper& crop, const RenderSettings& settings,
                   Renderer& renderer) {
  const auto least_width = static_cast<std::int32_t>(static_cast<float>(warps.frameWidth()) * 0.4f);
  const auto least_height =
      static_cast<std::int32_t>(static_cast<float>(warps.frameHeight()) * 0.4f);
  if (crop.cropWidth >= least_width && crop.cropHeight >= least_height) return false;
  const double zoom = getZoom(warps, &crop, settings, renderer);
  return crop.cropWidth * zoom < least_width || crop.cropHeight * zoom < least_height;
}

OutputRect setupOutputRect(Framing framing, const Renderer& renderer, std::int32_t width,
                           std::int32_t height) {
  if (crops(framing)) return {width, height, 0, 0};
  return {renderer.planeWidth, renderer.planeHeight,
          static_cast<std::int32_t>((width - renderer.planeWidth) * -0.5),
          static_cast<std::int32_t>((height - renderer.planeHeight) * -0.5)};
}

crop_rect wholePlane(const Renderer& renderer) {
  return {0, static_cast<float>(renderer.planeWidth - 1), 0,
          static_cast<float>(renderer.planeHeight - 1)};
}

std::vector<float> outlinePolygon(const ClipWarps& warps, std::size_t frame,
                                  const Renderer& renderer, const RenderSettings& settings,
                                  double setupOriginX, double setupOriginY) {
  const auto kept = warps.frameWarp(frame);
  const VarVector& warp = *kept;
  const crop_rect plane = wholePlane(renderer);
  const double move_x = renderer.planeWidth / 2.0 -
                        ((plane.left + plane.right) / 2.0 + renderer.boundsMinX) - setupOriginX;
  const double move_y = renderer.planeHeight / 2.0 -
                        ((plane.top + plane.bottom) / 2.0 + renderer.boundsMinY) - setupOriginY;
  const double centre_x = renderer.sourceWidth / 2.0;
  const double centre_y = renderer.sourceHeight / 2.0;
  std::vector<float> polygon;
  const auto add = [&](std::int32_t c, std::int32_t r) {
    const point2 p = warp.vertex(c, r);
    const double x = p.x * renderer.scaleX + move_x;
    const double y = p.y * renderer.scaleY + move_y;
    polygon.push_back(
        static_cast<float>((x - centre_x) * settings.additional_scale + centre_x + setupOriginX));
    polygon.push_back(
        static_cast<float>((y - centre_y) * settings.additional_scale + centre_y + setupOriginY));
  };
  for (std::int32_t c = 0; c < warp.cols; ++c) add(c, 0);
  for (std::int32_t r = 0; r < warp.rows; ++r) add(warp.cols - 1, r);
  for (std::int32_t c = warp.cols - 1; c >= 0; --c) add(c, warp.rows - 1);
  for (std::int32_t r = warp.rows - 1; r >= 0; --r) add(0, r);
  return polygon;
}

}  // namespace marrow::render
