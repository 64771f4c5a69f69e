#include "stabilizer/render/frame_renderer.h"

#include <utility>

#include "platform/tessel/threads.h"
#include "stabilizer/render/edge_synthesis.h"
#include "stabilizer/render/strip_renderer.h"

using marrow::stabilization::point2;
using marrow::stabilization::VarVector;

Renderer MakeRenderer(const ClipWarps& warps, float scaleX, float scaleY) {
  return Renderer(warps.unionBounds(), warps.frameWidth(), warps.frameHeight(), warps.gridCols(),
                  warps.gridRows(), scaleX, scaleY);
}

double GetZoom(const ClipWarps& warps, const cropper* crop, const RenderSettings& settings,
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
  const double zoom = GetZoom(warps, &crop, settings, renderer);
  return crop.cropWidth * zoom < least_width || crop.cropHeight * zoom < least_height;
}

OutputRect setupOutputRect(Framing framing, const Renderer& renderer, std::int32_t width,
                           std::int32_t height) {
  if (crops(framing)) return {width, height, 0, 0};
  return {renderer.planeWidth, renderer.planeHeight,
          static_cast<std::int32_t>((width - renderer.planeWidth) * -0.5),
          static_cast<std::int32_t>((height - renderer.planeHeight) * -0.5)};
}

namespace {

crop_rect whole_plane(const Renderer& renderer) {
  return {0, static_cast<float>(renderer.planeWidth - 1), 0,
          static_cast<float>(renderer.planeHeight - 1)};
}

crop_rect scaled_crop(const cropper* crop, bool crops_frame, std::size_t frame,
                      const Renderer& renderer) {
  if (!crops_frame || crop == nullptr || frame >= crop->rects.size()) return whole_plane(renderer);
  const crop_rect& rect = crop->rects[frame];
  return {rect.left * renderer.scaleX, rect.right * renderer.scaleX, rect.top * renderer.scaleY,
          rect.bottom * renderer.scaleY};
}

}  // namespace

std::vector<float> outlinePolygon(const ClipWarps& warps, std::size_t frame,
                                  const Renderer& renderer, const RenderSettings& settings,
                                  double setupOriginX, double setupOriginY) {
  const VarVector& warp = warps.frameWarp(frame);
  const crop_rect plane = whole_plane(renderer);
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

template <class Pixel>
std::optional<FrameMesh> meshOfFrame(const FramePass<Pixel>& pass, std::size_t M, int width,
                                     int height) {
  VarVector aligned;
  const VarVector* warp = &aligned;
  if (M == pass.frame) {
    warp = &pass.warps.frameWarp(M);
  } else if (!pass.warps.warpedGridOfFrame(M, pass.frame, aligned)) {
    return std::nullopt;
  }
  const RenderSettings& settings = pass.settings;
  const bool crop = crops(settings.framing);
  const double shift_x = crop ? 0.0 : settings.shift_x / settings.additional_scale;
  const double shift_y = crop ? 0.0 : settings.shift_y / settings.additional_scale;
  std::vector<double> vertices = warp->values;
  for (std::size_t i = 0; i + 1 < vertices.size(); i += 2) {
    vertices[i] = vertices[i] * pass.renderer.scaleX - shift_x;
    vertices[i + 1] = vertices[i + 1] * pass.renderer.scaleY - shift_y;
  }
  return FrameMesh(pass.renderer, std::move(vertices), width, height, pass.cropRect, pass.zoom,
                   crop);
}

template <class Pixel>
void drawMesh(const FrameMesh& mesh, const WorldX<Pixel>& source, WorldX<Pixel>& output,
              const TileMap* only, bool clears) {
  const StripRenderer<Pixel> strips(mesh, source, output, only, clears);
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors([&strips](std::size_t band) { strips(band); },
                                                      strips.bands());
}

template <class Pixel>
bool drawFrame(const FramePass<Pixel>& pass, std::size_t M, WorldX<Pixel>& output, bool clears) {
  const std::optional<FrameMesh> mesh = meshOfFrame(pass, M, output.width(), output.height());
  if (!mesh) return false;
  drawMesh(*mesh, *pass.sources.Fetch(M), output, nullptr, clears);
  return true;
}

template <class Pixel>
bool renderFrame(const ClipWarps& warps, const cropper* crop, const RenderSettings& settings,
                 Renderer& renderer, std::size_t frame, SourceFrames<Pixel>& sources,
                 WorldOperations<Pixel>& operations, WorldX<Pixel>& output) {
  if (frame >= warps.frameCount()) return false;
  const double zoom = GetZoom(warps, crop, settings, renderer);
  const bool synthesizes = settings.framing == Framing::synthesize_edges;
  PreparedSources<Pixel> prepared(sources, scaledEdges(settings.edges, renderer.scaleX), frame);
  SourceFrames<Pixel>& drawn =
      synthesizes && settings.edges.any() ? static_cast<SourceFrames<Pixel>&>(prepared) : sources;
  const FramePass<Pixel> pass{warps,
                              settings,
                              renderer,
                              drawn,
                              operations,
                              frame,
                              scaled_crop(crop, crops(settings.framing), frame, renderer),
                              zoom};
  // A band clears what its cells leave.
  drawFrame(pass, frame, output, true);
  deblurFrame(pass, output);
  if (synthesizes) synthesizeEdges(pass, output);
  return true;
}

#define CALMFRAME_INSTANTIATE(Pixel)                                                             \
  template std::optional<FrameMesh> meshOfFrame(const FramePass<Pixel>&, std::size_t, int, int); \
  template void drawMesh(const FrameMesh&, const WorldX<Pixel>&, WorldX<Pixel>&, const TileMap*, \
                         bool);                                                                  \
  template bool drawFrame(const FramePass<Pixel>&, std::size_t, WorldX<Pixel>&, bool);           \
  template bool renderFrame(const ClipWarps&, const cropper*, const RenderSettings&, Renderer&,  \
                            std::size_t, SourceFrames<Pixel>&, WorldOperations<Pixel>&,          \
                            WorldX<Pixel>&);
CALMFRAME_INSTANTIATE(HX_Pixel8)
CALMFRAME_INSTANTIATE(HX_Pixel16)
CALMFRAME_INSTANTIATE(HX_PixelFloat)
#undef CALMFRAME_INSTANTIATE
