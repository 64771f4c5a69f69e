#include "tracking/color_pyramid.h"

#include <algorithm>
#include <cstdint>

namespace marrow::tracking {
namespace {

constexpr std::size_t kChannels = 3;

// `row` is row y of `level`: makes the row under it of the next level, and what depends on that.
void ReduceOnwards(ImagePyramid& pyramid, std::size_t level, std::size_t y, const float* row) {
  while (level + 1 < pyramid.levels && y % 2 == 0) {
    const std::size_t width = pyramid.LevelWidth(level);
    ++level;
    y /= 2;
    if (y == 0 || y + 1 >= pyramid.LevelHeight(level)) return;
    float* reduced = pyramid.LevelData(level) + y * pyramid.LevelWidth(level) * kChannels;
    ReduceRow(row, width, kChannels, reduced);
    row = reduced;
  }
}

// With levels too small for a filter.
void ReduceWholeLevels(ImagePyramid& pyramid, std::vector<float>& scratch) {
  scratch.resize(std::max(scratch.size(), pyramid.bytes.size()));
  FloatsFromBytes(pyramid.bytes.data(), pyramid.bytes.size(), scratch.data());
  const float* level = scratch.data();
  for (std::size_t l = 1; l < pyramid.levels; ++l) {
    ReduceLevel(level, pyramid.LevelWidth(l - 1), pyramid.LevelHeight(l - 1), kChannels,
                pyramid.LevelData(l));
    level = pyramid.LevelData(l);
  }
}

}  // namespace

bool ColorPyramidFromArgb(const ArgbFrame& frame, ImagePyramid& pyramid,
                          std::vector<float>& scratch, std::uint8_t* luma) {
  const std::size_t deepest = std::max<std::size_t>(pyramid.levels, 1) - 1;
  if (pyramid.LevelWidth(deepest) < 3 || pyramid.LevelHeight(deepest) < 3) {
    const bool opaque = ColorAndLumaFromArgb(frame, pyramid.bytes.data(), luma);
    ReduceWholeLevels(pyramid, scratch);
    return opaque;
  }
  const std::size_t samples = frame.width * kChannels;
  scratch.resize(std::max(scratch.size(), samples));
  bool opaque = true;
  for (std::size_t y = 0; y < frame.height; ++y) {
    const ArgbFrame line{frame.top_row + static_cast<std::ptrdiff_t>(y) * frame.row_bytes,
                         frame.row_bytes, frame.width, 1};
    std::uint8_t* row = pyramid.bytes.data() + y * samples;
    if (!ColorAndLumaFromArgb(line, row, luma + y * frame.width)) opaque = false;
    if (y % 2 != 0 || deepest == 0) continue;
    FloatsFromBytes(row, samples, scratch.data());
    ReduceOnwards(pyramid, 0, y, scratch.data());
  }
  for (std::size_t l = 1; l < pyramid.levels; ++l) {
    const std::size_t row = pyramid.LevelWidth(l) * kChannels;
    std::fill_n(pyramid.LevelData(l), row, 0.0f);
    std::fill_n(pyramid.LevelData(l) + (pyramid.LevelHeight(l) - 1) * row, row, 0.0f);
  }
  return opaque;
}

}  // namespace marrow::tracking
