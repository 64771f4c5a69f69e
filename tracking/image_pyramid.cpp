#include "tracking/image_pyramid.h"

#include <algorithm>
#include <cstdint>

#include "platform/memory/large_pages.h"

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/image_pyramid.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// Of each sample at `row`, with the pixels beside it: (before + 2 row + after) / 4.
template <std::size_t kChannels, class D>
HWY_INLINE hn::Vec<D> Smoothed(D d, const float* row) {
  const auto centre = hn::LoadU(d, row);
  const auto sum = hn::Add(hn::Add(hn::LoadU(d, row - kChannels), hn::Add(centre, centre)),
                           hn::LoadU(d, row + kChannels));
  return hn::Mul(sum, hn::Set(d, 0.25f));
}

// A row of the destination: columns 1 .. size - 2 from the source's row over it, 0 in the outermost
// ones. Two vectors are smoothed whole, contiguous loads whatever the channel count, and every
// other pixel of theirs makes one: as many pixels as fit, and lanes that the next ones overwrite.
template <std::size_t kChannels>
HWY_INLINE void ReduceInterior(const float* HWY_RESTRICT row, std::size_t width,
                               std::size_t reduced_width, float* HWY_RESTRICT destination) {
  const hn::ScalableTag<float> d;
  const hn::RebindToSigned<decltype(d)> di;
  constexpr std::size_t kMaxLanes = hn::MaxLanes(hn::ScalableTag<float>());
  const std::size_t N = hn::Lanes(d);
  const std::size_t end = (reduced_width - 2) * kChannels;
  std::fill_n(destination, kChannels, 0.0f);
  float* out = destination + kChannels;
  std::size_t i = 0;  // of the samples behind the first column
  if constexpr (kMaxLanes >= 4) {
    const std::size_t step = N / kChannels * kChannels;
    HWY_ALIGN std::int32_t lane[kMaxLanes];
    HWY_ALIGN std::int32_t place[kMaxLanes];
    for (std::size_t j = 0; j < N; ++j) {
      const std::size_t from = std::min(j / kChannels * kChannels + j, 2 * N - 1);
      place[j] = static_cast<std::int32_t>(from);
      lane[j] = static_cast<std::int32_t>(from % N);
    }
    const auto lanes = hn::SetTableIndices(d, lane);
    const auto is_second = hn::RebindMask(
        d, hn::Gt(hn::Load(di, place), hn::Set(di, static_cast<std::int32_t>(N) - 1)));
    const std::size_t readable = width * kChannels;
    const auto source = [](std::size_t sample) { return 2 * (sample + kChannels); };
    for (; i + N <= end && source(i) + 2 * N + kChannels <= readable; i += step) {
      const float* from = row + source(i);
      const auto first = hn::TableLookupLanes(Smoothed<kChannels>(d, from), lanes);
      const auto second = hn::TableLookupLanes(Smoothed<kChannels>(d, from + N), lanes);
      hn::StoreU(hn::IfThenElse(is_second, second, first), d, out + i);
    }
  }
  for (; i < end; ++i) {
    const float* from = row + i / kChannels * kChannels + i + 2 * kChannels;
    out[i] =
        (from[-static_cast<std::ptrdiff_t>(kChannels)] + (from[0] + from[0]) + from[kChannels]) *
        0.25f;
  }
  std::fill_n(out + end, kChannels, 0.0f);
}

void ReduceRowOf1(const float* row, std::size_t width, std::size_t reduced_width,
                  float* destination) {
  ReduceInterior<1>(row, width, reduced_width, destination);
}
void ReduceRowOf3(const float* row, std::size_t width, std::size_t reduced_width,
                  float* destination) {
  ReduceInterior<3>(row, width, reduced_width, destination);
}
void ReduceRowOf4(const float* row, std::size_t width, std::size_t reduced_width,
                  float* destination) {
  ReduceInterior<4>(row, width, reduced_width, destination);
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
                           std::size_t channel_count, std::size_t level_count, first_level first)
    : width(level0_width), height(level0_height), channels(channel_count), levels(level_count) {
  std::size_t size = 0;
  for (std::size_t l = 0; l < std::max<std::size_t>(levels, 1); ++l) {
    level_starts_.push_back(size);
    const std::size_t samples = channels * LevelWidth(l) * LevelHeight(l);
    if (l == 0 && first == first_level::bytes) {
      memory::ResizeOnLargePages(bytes, samples);
    } else {
      size += samples;
    }
  }
  memory::ResizeOnLargePages(data, size);
}

std::size_t ImagePyramid::LevelWidth(std::size_t level) const {
  return CeilOfHalvings(width, level);
}

std::size_t ImagePyramid::LevelHeight(std::size_t level) const {
  return CeilOfHalvings(height, level);
}

void BuildLevels(ImagePyramid& pyramid) {
  for (std::size_t l = 1; l < pyramid.levels; ++l) {
    ReduceLevel(pyramid.LevelData(l - 1), pyramid.LevelWidth(l - 1), pyramid.LevelHeight(l - 1),
                pyramid.channels, pyramid.LevelData(l));
  }
}

void ReduceLevel(const float* source, std::size_t width, std::size_t height, std::size_t channels,
                 float* destination) {
  const std::size_t reduced_height = (height + 1) / 2;
  const std::size_t row = (width + 1) / 2 * channels;
  std::fill_n(destination, reduced_height == 0 ? 0 : row, 0.0f);
  if (width < 3 || height < 3) return;
  for (std::size_t j = 1; j + 1 < reduced_height; ++j) {
    ReduceRow(source + 2 * j * width * channels, width, channels, destination + j * row);
  }
  std::fill_n(destination + (reduced_height - 1) * row, row, 0.0f);
}

void ReduceRow(const float* source, std::size_t width, std::size_t channels, float* destination) {
  const std::size_t reduced_width = (width + 1) / 2;
  if (channels == 1) {
    HWY_DYNAMIC_DISPATCH(ReduceRowOf1)(source, width, reduced_width, destination);
  } else if (channels == 3) {
    HWY_DYNAMIC_DISPATCH(ReduceRowOf3)(source, width, reduced_width, destination);
  } else if (channels == 4) {
    HWY_DYNAMIC_DISPATCH(ReduceRowOf4)(source, width, reduced_width, destination);
  } else {
    std::fill_n(destination, channels, 0.0f);
    std::fill_n(destination + (reduced_width - 1) * channels, channels, 0.0f);
  }
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
