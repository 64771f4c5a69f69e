#include "tracking/image_pyramid.h"

#include <algorithm>

#include "platform/memory/large_pages.h"

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/image_pyramid.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// smoothed[i] = (row[i - step] + 2 row[i] + row[i + step]) / 4 for i in [first, end).
void SmoothRow(const float* HWY_RESTRICT row, std::size_t first, std::size_t end, std::size_t step,
               float* HWY_RESTRICT smoothed) {
  const hn::ScalableTag<float> d;
  const std::size_t N = hn::Lanes(d);
  const auto quarter = hn::Set(d, 0.25f);
  std::size_t i = first;
  for (; i + N <= end; i += N) {
    const auto centre = hn::LoadU(d, row + i);
    const auto sum = hn::Add(hn::Add(hn::LoadU(d, row + i - step), hn::Add(centre, centre)),
                             hn::LoadU(d, row + i + step));
    hn::StoreU(hn::Mul(sum, quarter), d, smoothed + i);
  }
  for (; i < end; ++i) {
    smoothed[i] = (row[i - step] + (row[i] + row[i]) + row[i + step]) * 0.25f;
  }
}

// Pixels 0, 2, 4 ... of `row`, `count` of them: in a vector's lanes they come in runs, which are
// pushed together.
template <std::size_t kChannels>
void TakeEveryOtherPixel(const float* HWY_RESTRICT row, std::size_t count,
                         float* HWY_RESTRICT taken) {
  const hn::ScalableTag<float> d;
  const std::size_t N = hn::Lanes(d);
  const std::size_t end = count * kChannels;
  std::size_t i = 0;  // of the samples taken
  if constexpr (hn::MaxLanes(hn::ScalableTag<float>()) >= 4) {
    constexpr std::size_t kPatterns = 2 * kChannels;
    float kept[hn::MaxLanes(hn::ScalableTag<float>()) + kPatterns];
    for (std::size_t j = 0; j < N + kPatterns; ++j) {
      kept[j] = j / kChannels % 2 == 0 ? 1.0f : 0.0f;
    }
    for (std::size_t from = 0; i + N <= end; from += N) {
      const auto mask = hn::Gt(hn::LoadU(d, kept + from % kPatterns), hn::Zero(d));
      hn::StoreU(hn::Compress(hn::LoadU(d, row + from), mask), d, taken + i);
      i += hn::CountTrue(d, mask);
    }
  }
  for (; i < end; ++i) taken[i] = row[i / kChannels * kChannels + i];
}

// A row of the destination: columns 1 .. size - 2 from the source's row over it, 0 in the outermost
// ones. A whole row is smoothed in place of its every other pixel: contiguous loads, whatever the
// channel count.
template <std::size_t kChannels>
void ReduceInterior(const float* row, std::size_t reduced_width, float* destination,
                    float* smoothed) {
  const std::size_t columns = reduced_width - 2;
  SmoothRow(row, 2 * kChannels, (2 * columns + 1) * kChannels, kChannels, smoothed);
  TakeEveryOtherPixel<kChannels>(smoothed + 2 * kChannels, columns, destination + kChannels);
  std::fill_n(destination, kChannels, 0.0f);
  std::fill_n(destination + (reduced_width - 1) * kChannels, kChannels, 0.0f);
}

void ReduceRowOf1(const float* row, std::size_t reduced_width, float* destination,
                  float* smoothed) {
  ReduceInterior<1>(row, reduced_width, destination, smoothed);
}
void ReduceRowOf3(const float* row, std::size_t reduced_width, float* destination,
                  float* smoothed) {
  ReduceInterior<3>(row, reduced_width, destination, smoothed);
}
void ReduceRowOf4(const float* row, std::size_t reduced_width, float* destination,
                  float* smoothed) {
  ReduceInterior<4>(row, reduced_width, destination, smoothed);
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {
namespace {

HWY_EXPORT(ReduceRowOf1);
HWY_EXPORT(ReduceRowOf3);
HWY_EXPORT(ReduceRowOf4);

std::size_t CeilOfHalvings(std::size_t length, std::size_t level) {
  if (length == 0) return 0;
  return level < 64 ? ((length - 1) >> level) + 1 : 1;
}

}  // namespace

ImagePyramid::ImagePyramid(std::size_t level0_width, std::size_t level0_height,
                           std::size_t channel_count, std::size_t level_count)
    : width(level0_width), height(level0_height), channels(channel_count), levels(level_count) {
  std::size_t size = 0;
  for (std::size_t l = 0; l < std::max<std::size_t>(levels, 1); ++l) {
    level_starts_.push_back(size);
    size += channels * LevelWidth(l) * LevelHeight(l);
  }
  memory::ResizeOnLargePages(data, size);
}

std::size_t ImagePyramid::LevelWidth(std::size_t level) const {
  return CeilOfHalvings(width, level);
}

std::size_t ImagePyramid::LevelHeight(std::size_t level) const {
  return CeilOfHalvings(height, level);
}

void BuildLevels(ImagePyramid& pyramid, std::vector<float>& scratch) {
  for (std::size_t l = 1; l < pyramid.levels; ++l) {
    ReduceLevel(pyramid.LevelData(l - 1), pyramid.LevelWidth(l - 1), pyramid.LevelHeight(l - 1),
                pyramid.channels, pyramid.LevelData(l), scratch);
  }
}

void ReduceLevel(const float* source, std::size_t width, std::size_t height, std::size_t channels,
                 float* destination, std::vector<float>& scratch) {
  const std::size_t reduced_height = (height + 1) / 2;
  const std::size_t row = (width + 1) / 2 * channels;
  std::fill_n(destination, reduced_height == 0 ? 0 : row, 0.0f);
  if (width < 3 || height < 3) return;
  // Only rows that are kept are smoothed, one at a time, so that the scratch stays in the cache.
  scratch.resize(std::max(scratch.size(), width * channels));
  for (std::size_t j = 1; j + 1 < reduced_height; ++j) {
    ReduceRow(source + 2 * j * width * channels, width, channels, destination + j * row,
              scratch.data());
  }
  std::fill_n(destination + (reduced_height - 1) * row, row, 0.0f);
}

void ReduceRow(const float* source, std::size_t width, std::size_t channels, float* destination,
               float* scratch) {
  const std::size_t reduced_width = (width + 1) / 2;
  if (channels == 1) {
    HWY_DYNAMIC_DISPATCH(ReduceRowOf1)(source, reduced_width, destination, scratch);
  } else if (channels == 3) {
    HWY_DYNAMIC_DISPATCH(ReduceRowOf3)(source, reduced_width, destination, scratch);
  } else if (channels == 4) {
    HWY_DYNAMIC_DISPATCH(ReduceRowOf4)(source, reduced_width, destination, scratch);
  } else {
    std::fill_n(destination, channels, 0.0f);
    std::fill_n(destination + (reduced_width - 1) * channels, channels, 0.0f);
  }
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
