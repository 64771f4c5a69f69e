#include "examples/outside_renderer/comparison.h"

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <stdexcept>

namespace outside {
namespace {

constexpr std::int32_t kRim = 4;

// Which of `count` places, `stride` apart, have no clear one within the rim's width, nor the end.
void KeepInner(std::vector<char>& covered, std::size_t first, std::size_t stride,
               std::int32_t count) {
  std::int32_t last_clear = -1;
  std::vector<char> inner(static_cast<std::size_t>(count));
  for (std::int32_t i = 0; i < count + kRim; ++i) {
    const bool clear = i >= count || !covered[first + static_cast<std::size_t>(i) * stride];
    if (clear) last_clear = i;
    // The place kRim back has now seen both sides.
    if (i >= kRim) inner[static_cast<std::size_t>(i - kRim)] = i - last_clear > 2 * kRim;
  }
  for (std::int32_t i = 0; i < count; ++i) {
    covered[first + static_cast<std::size_t>(i) * stride] = inner[static_cast<std::size_t>(i)];
  }
}

}  // namespace

Picture CopyOf(const HX_World& world) {
  Picture picture{world.width, world.height, {}};
  for (std::int32_t y = 0; y < world.height; ++y) {
    const auto* row = reinterpret_cast<const HX_Pixel8*>(static_cast<const char*>(world.data) +
                                                         std::ptrdiff_t{world.row_bytes} * y);
    picture.pixels.insert(picture.pixels.end(), row, row + world.width);
  }
  return picture;
}

Comparison Compare(const Picture& theirs, const Picture& ours) {
  if (theirs.width != ours.width || theirs.height != ours.height) return {255, 0};
  const auto width = static_cast<std::size_t>(theirs.width);
  std::vector<char> away(theirs.pixels.size());
  std::transform(theirs.pixels.begin(), theirs.pixels.end(), away.begin(),
                 [](const HX_Pixel8& pixel) { return pixel.alpha != 0; });
  for (std::int32_t y = 0; y < theirs.height; ++y) {
    KeepInner(away, static_cast<std::size_t>(y) * width, 1, theirs.width);
  }
  for (std::size_t x = 0; x < width; ++x) KeepInner(away, x, width, theirs.height);

  Comparison result;
  std::size_t count = 0;
  for (std::size_t i = 0; i < away.size(); ++i) {
    if (!away[i]) continue;
    ++count;
    const HX_Pixel8 &a = theirs.pixels[i], &b = ours.pixels[i];
    result.largest = std::max({result.largest, std::abs(a.alpha - b.alpha), std::abs(a.red - b.red),
                               std::abs(a.green - b.green), std::abs(a.blue - b.blue)});
  }
  result.share = away.empty() ? 0 : static_cast<double>(count) / static_cast<double>(away.size());
  return result;
}

void WriteBeside(const std::string& path, const Picture& theirs, const Picture& ours) {
  std::ofstream file(path, std::ios::binary);
  const std::int32_t height = std::min(theirs.height, ours.height);
  file << "P6 " << theirs.width + ours.width << ' ' << height << " 255\n";
  for (std::int32_t y = 0; y < height; ++y) {
    for (const Picture* picture : {&theirs, &ours}) {
      for (std::int32_t x = 0; x < picture->width; ++x) {
        const HX_Pixel8& pixel =
            picture->pixels[static_cast<std::size_t>(y) * static_cast<std::size_t>(picture->width) +
                            static_cast<std::size_t>(x)];
        file.put(static_cast<char>(pixel.red))
            .put(static_cast<char>(pixel.green))
            .put(static_cast<char>(pixel.blue));
      }
    }
  }
  if (!file.flush()) throw std::runtime_error(path + " can't be written");
}

}  // namespace outside
