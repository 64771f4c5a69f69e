#include "stabilizer/render/edge_preparation.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <cstring>
#include <type_traits>
#include <vector>

namespace marrow::render {
namespace {

std::int32_t wholePixels(double value, float scale) {
  return static_cast<std::int32_t>(std::clamp(value * scale + 0.5, 0.0, 1073741824.0));
}

// By distance, as far as the feather reaches into a frame of that size.
std::vector<float> featherFactors(float feather, int longer_side) {
  const int reach = static_cast<int>(std::clamp(feather + 0.5f, 0.0f, 1073741824.0f));
  std::vector<float> factors(static_cast<std::size_t>(std::min(reach, longer_side)));
  for (std::size_t d = 0; d < factors.size(); ++d) {
    const double q = (static_cast<double>(d) + 1.0) / (static_cast<double>(feather) + 1.0);
    factors[d] = static_cast<float>(q <= 0.5 ? 2.0 * q * q : (4.0 - 2.0 * q) * q - 1.0);
  }
  return factors;
}

template <class Pixel>
void scaleAlpha(Pixel* pixels, int count, float factor) {
  using Alpha = decltype(Pixel::alpha);
  for (int i = 0; i < count; ++i) {
    const float alpha = static_cast<float>(pixels[i].alpha) * factor;
    if constexpr (std::is_same_v<Alpha, float>) {
      pixels[i].alpha = alpha;
    } else {
      pixels[i].alpha = static_cast<Alpha>(alpha + 0.5f);
    }
  }
}

template <class Pixel>
void clearAlpha(Pixel* pixels, int count) {
  for (int i = 0; i < count; ++i) pixels[i].alpha = 0;
}

}  // namespace

EdgePreparation scaledEdges(const EdgeSettings& edges, float scaleX) {
  return {wholePixels(edges.left, scaleX), wholePixels(edges.top, scaleX),
          wholePixels(edges.right, scaleX), wholePixels(edges.bottom, scaleX),
          static_cast<float>(edges.feather * scaleX)};
}

template <class Pixel>
void prepareEdges(const WorldX<Pixel>& from, const EdgePreparation& edges, WorldX<Pixel>& to) {
  const int width = from.width(), height = from.height();
  const int left = std::min(edges.left, width), top = std::min(edges.top, height);
  const int right = std::max(width - edges.right, left);
  const int bottom = std::max(height - edges.bottom, top);
  const std::vector<float> factors = featherFactors(edges.feather, std::max(width, height));
  const int reach = static_cast<int>(factors.size());
  const auto factor = [&factors](int d) { return factors[static_cast<std::size_t>(d)]; };
  // The stretch whose columns are further in than the feather reaches.
  const int inner_left = std::min(left + reach, right);
  const int inner_right = std::max(right - std::max(reach - 1, 0), inner_left);

  for (int y = 0; y < height; ++y) {
    Pixel* const row = to.row(y);
    std::memcpy(static_cast<void*>(row), from.row(y),
                sizeof(Pixel) * static_cast<std::size_t>(width));
    if (y < top || y >= bottom) {
      clearAlpha(row, width);
      continue;
    }
    clearAlpha(row, left);
    clearAlpha(row + right, width - right);
    const int dy = std::min(y - top, bottom - y);
    const auto featherColumns = [&](int begin, int end) {
      for (int x = begin; x < end; ++x) {
        scaleAlpha(row + x, 1, factor(std::min({x - left, right - x, dy})));
      }
    };
    featherColumns(left, inner_left);
    if (dy < reach) scaleAlpha(row + inner_left, inner_right - inner_left, factor(dy));
    featherColumns(inner_right, right);
  }
}

template <class Pixel>
boost::shared_ptr<const WorldX<Pixel>> PreparedSources<Pixel>::fetch(std::size_t frame) {
  for (const prepared* held : {&first_neighbour_, &latest_}) {
    if (held->world && held->frame == frame) return held->world;
  }
  const boost::shared_ptr<const WorldX<Pixel>> source = sources_.fetch(frame);
  prepared& place = frame != frame_ && !first_neighbour_.world ? first_neighbour_ : latest_;
  boost::shared_ptr<WorldX<Pixel>> world = std::move(place.world);
  place.world.reset();
  if (!world || world.use_count() > 1 || world->width() != source->width() ||
      world->height() != source->height()) {
    world = boost::make_shared<WorldX<Pixel>>(source->width(), source->height());
  }
  prepareEdges(*source, edges_, *world);
  place = {frame, world};
  return world;
}

#define CALMFRAME_INSTANTIATE(Pixel)                                                        \
  template void prepareEdges(const WorldX<Pixel>&, const EdgePreparation&, WorldX<Pixel>&); \
  template class PreparedSources<Pixel>;
CALMFRAME_INSTANTIATE(HX_Pixel8)
CALMFRAME_INSTANTIATE(HX_Pixel16)
CALMFRAME_INSTANTIATE(HX_PixelFloat)
#undef CALMFRAME_INSTANTIATE

}  // namespace marrow::render
