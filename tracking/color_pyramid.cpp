#include "tracking/color_pyramid.h"

#include <hwy/cache_control.h>

#include <algorithm>
#include <cstdint>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/color_pyramid.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// Copies to memory without a place in the cache, which saves reading what is to be overwritten.
void StreamRow(const float* row, std::size_t count, float* to) {
  const hn::ScalableTag<float> d;
  const std::size_t N = hn::Lanes(d);
  const std::size_t vector_bytes = N * sizeof(float);
  std::size_t i = 0;
  for (; i < count && reinterpret_cast<std::uintptr_t>(to + i) % vector_bytes != 0; ++i) {
    to[i] = row[i];
  }
  for (; i + N <= count; i += N) hn::Stream(hn::LoadU(d, row + i), d, to + i);
  for (; i < count; ++i) to[i] = row[i];
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {
namespace {

HWY_EXPORT(StreamRow);

constexpr std::size_t kChannels = 3;

// A level beyond this would only push out of the cache what is wanted there.
constexpr std::size_t kStreamedBytes = std::size_t{8} << 20;

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

}  // namespace

void ColorPyramidFromArgb(const ArgbFrame& frame, ImagePyramid& pyramid,
                          std::vector<float>& scratch) {
  const std::size_t deepest = std::max<std::size_t>(pyramid.levels, 1) - 1;
  if (pyramid.LevelWidth(deepest) < 3 || pyramid.LevelHeight(deepest) < 3) {
    ColorFromArgb(frame, pyramid.LevelData(0));
    BuildLevels(pyramid);
    return;
  }
  const std::size_t samples = frame.width * kChannels;
  scratch.resize(std::max(scratch.size(), samples));
  const bool streamed = samples * frame.height * sizeof(float) > kStreamedBytes;
  for (std::size_t y = 0; y < frame.height; ++y) {
    const ArgbFrame line{frame.top_row + static_cast<std::ptrdiff_t>(y) * frame.row_bytes,
                         frame.row_bytes, frame.width, 1};
    float* level0 = pyramid.LevelData(0) + y * samples;
    float* row = streamed ? scratch.data() : level0;
    ColorFromArgb(line, row);
    if (streamed) HWY_DYNAMIC_DISPATCH(StreamRow)(row, samples, level0);
    ReduceOnwards(pyramid, 0, y, row);
  }
  if (streamed) hwy::FlushStream();
  for (std::size_t l = 1; l < pyramid.levels; ++l) {
    const std::size_t row = pyramid.LevelWidth(l) * kChannels;
    std::fill_n(pyramid.LevelData(l), row, 0.0f);
    std::fill_n(pyramid.LevelData(l) + (pyramid.LevelHeight(l) - 1) * row, row, 0.0f);
  }
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
