#include "stabilizer/render/edge_synthesis.h"

#include <algorithm>
#include <cmath>
#include <optional>

namespace marrow::render {
namespace {

template <class Pixel>
bool isOpen(const WorldX<Pixel>& world, const pixel_rect& rect) {
  for (int y = rect.top; y < rect.bottom; ++y) {
    const Pixel* row = world.row(y);
    for (int x = rect.left; x < rect.right; ++x) {
      if (!(row[x].alpha == world_view<Pixel>::full)) return true;
    }
  }
  return false;
}

// A rounded sample may keep its colours without any alpha. Composing leaves none of them.
template <class Pixel>
void clearHiddenColours(WorldX<Pixel>& world, const pixel_rect& rect) {
  for (int y = rect.top; y < rect.bottom; ++y) {
    Pixel* row = world.row(y);
    for (int x = rect.left; x < rect.right; ++x) {
      if (row[x].alpha == 0) row[x] = {};
    }
  }
}

// The part of a buffer that a rectangle covers.
template <class Pixel>
WorldX<Pixel> partOf(WorldX<Pixel>& world, const pixel_rect& rect) {
  return {rect.right - rect.left, rect.bottom - rect.top, world.row_bytes(),
          world.row(rect.top) + rect.left};
}

template <class Pixel>
void boostAlpha(WorldX<Pixel>& world, const pixel_rect& rect, int times) {
  using Alpha = decltype(Pixel::alpha);
  constexpr Alpha full = world_view<Pixel>::full;
  using Product = decltype(full + 1);
  const auto factor = static_cast<Product>(times);
  for (int y = rect.top; y < rect.bottom; ++y) {
    Pixel* row = world.row(y);
    for (int x = rect.left; x < rect.right; ++x) {
      Alpha& alpha = row[x].alpha;
      if (alpha < full) alpha = static_cast<Alpha>(std::min<Product>(factor * alpha, full));
    }
  }
}

}  // namespace

template <class Pixel>
void synthesizeEdges(const FramePass<Pixel>& pass, WorldX<Pixel>& output) {
  TileMap open(output.width(), output.height());
  open.add(0, 0, output.width(), output.height());
  const auto close = [&] {
    open.filter([&output](const pixel_rect& tile) { return isOpen(output, tile); });
  };
  close();

  const auto frame = static_cast<std::int64_t>(pass.frame);
  const auto count = static_cast<std::int64_t>(pass.warps.frameCount());
  const std::int64_t range =
      std::min(pass.settings.synthesis_range, std::max(frame, count - 1 - frame));
  std::optional<WorldX<Pixel>> layer;
  bool composes = false;
  for (std::int64_t k = 1; k <= range && !open.empty(); k = k > 0 ? -k : 1 - k) {
    const std::int64_t M = frame + k;
    if (M < 0 || M >= count) continue;
    const std::optional<FrameMesh> mesh =
        meshOfFrame(pass, static_cast<std::size_t>(M), output.width(), output.height());
    if (!mesh) continue;
    if (!composes) {
      for (const pixel_rect& part : open.rects()) clearHiddenColours(output, part);
      composes = true;
    }
    TileMap shown = mesh->tiles();
    shown.intersect(open);
    const std::vector<pixel_rect> parts = shown.rects();
    if (parts.empty()) continue;

    const boost::shared_ptr<const WorldX<Pixel>> source =
        pass.sources.fetch(static_cast<std::size_t>(M));
    if (!layer) layer.emplace(output.width(), output.height());
    for (const pixel_rect& part : parts) partOf(*layer, part).clear();
    drawMesh(*mesh, *source, *layer, &shown);
    for (const pixel_rect& part : parts) {
      pass.operations.TransferBehind(partOf(*layer, part), part.left, part.top, output);
    }
    close();
  }

  const long boost = std::lround(pass.settings.alpha_boost);
  if (boost < 2) return;
  for (const pixel_rect& part : open.rects()) boostAlpha(output, part, static_cast<int>(boost));
}

template void synthesizeEdges(const FramePass<HX_Pixel8>&, WorldX<HX_Pixel8>&);
template void synthesizeEdges(const FramePass<HX_Pixel16>&, WorldX<HX_Pixel16>&);
template void synthesizeEdges(const FramePass<HX_PixelFloat>&, WorldX<HX_PixelFloat>&);

}  // namespace marrow::render
