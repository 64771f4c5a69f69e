#include "stabilizer/render/frame_renderer.h"

#include "stabilizer/render/deblur.h"
#include "stabilizer/render/edge_preparation.h"
#include "stabilizer/render/edge_synthesis.h"
#include "stabilizer/render/frame_pass.h"
#include "stabilizer/render/output_rect.h"

namespace marrow::render {
namespace {

crop_rect scaledCrop(const cropper* crop, bool crops_frame, std::size_t frame,
                     const Renderer& renderer) {
  if (!crops_frame || crop == nullptr || frame >= crop->rects.size()) return wholePlane(renderer);
  const crop_rect& rect = crop->rects[frame];
  return {rect.left * renderer.scaleX, rect.right * renderer.scaleX, rect.top * renderer.scaleY,
          rect.bottom * renderer.scaleY};
}

}  // namespace

template <class Pixel>
bool renderFrame(const ClipWarps& warps, const cropper* crop, const RenderSettings& settings,
                 Renderer& renderer, std::size_t frame, SourceFrames<Pixel>& sources,
                 WorldOperations<Pixel>& operations, WorldX<Pixel>& output) {
  if (frame >= warps.frameCount()) return false;
  const double zoom = getZoom(warps, crop, settings, renderer);
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
                              scaledCrop(crop, crops(settings.framing), frame, renderer),
                              zoom};
  // A band clears what its cells leave.
  drawFrame(pass, frame, output, true);
  deblurFrame(pass, output);
  if (synthesizes) synthesizeEdges(pass, output);
  return true;
}

#define CALMFRAME_INSTANTIATE(Pixel)                                                            \
  template bool renderFrame(const ClipWarps&, const cropper*, const RenderSettings&, Renderer&, \
                            std::size_t, SourceFrames<Pixel>&, WorldOperations<Pixel>&,         \
                            WorldX<Pixel>&);
CALMFRAME_INSTANTIATE(HX_Pixel8)
CALMFRAME_INSTANTIATE(HX_Pixel16)
CALMFRAME_INSTANTIATE(HX_PixelFloat)
#undef CALMFRAME_INSTANTIATE

}  // namespace marrow::render
