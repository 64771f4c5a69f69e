#include "stabilizer/render/frame_pass.h"

#include <utility>

#include "platform/tessel/threads.h"
#include "stabilizer/render/strip_renderer.h"

namespace marrow::render {

using stabilization::VarVector;

template <class Pixel>
std::optional<FrameMesh> meshOfFrame(const FramePass<Pixel>& pass, std::size_t M, int width,
                                     int height) {
  VarVector aligned;
  boost::shared_ptr<const VarVector> own;
  const VarVector* warp = &aligned;
  if (M == pass.frame) {
    own = pass.warps.frameWarp(M);
    warp = own.get();
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
  drawMesh(*mesh, *pass.sources.fetch(M), output, nullptr, clears);
  return true;
}

#define CALMFRAME_INSTANTIATE(Pixel)                                                             \
  template std::optional<FrameMesh> meshOfFrame(const FramePass<Pixel>&, std::size_t, int, int); \
  template void drawMesh(const FrameMesh&, const WorldX<Pixel>&, WorldX<Pixel>&, const TileMap*, \
                         bool);                                                                  \
  template bool drawFrame(const FramePass<Pixel>&, std::size_t, WorldX<Pixel>&, bool);
CALMFRAME_INSTANTIATE(HX_Pixel8)
CALMFRAME_INSTANTIATE(HX_Pixel16)
CALMFRAME_INSTANTIATE(HX_PixelFloat)
#undef CALMFRAME_INSTANTIATE

}  // namespace marrow::render
