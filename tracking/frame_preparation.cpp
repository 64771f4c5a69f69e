#include "tracking/frame_preparation.h"

#include <hwy/cache_control.h>

#include <algorithm>
#include <bit>
#include <cstring>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/frame_preparation.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// A pixel is taken as one 32-bit lane: alpha in the lowest byte, then red, green, blue.
static_assert(std::endian::native == std::endian::little);

// How far ahead of itself a conversion asks for pixels: another core has just made them, and rows
// of small pages stop the processor's own foresight.
constexpr std::size_t kBytesAhead = 4096;

using Pixels = hn::ScalableTag<std::int32_t>;
using Floats = hn::ScalableTag<float>;

template <class V>
HWY_INLINE V Red(V pixels) {
  return hn::And(hn::ShiftRight<8>(pixels), hn::Set(Pixels(), 255));
}
template <class V>
HWY_INLINE V Green(V pixels) {
  return hn::And(hn::ShiftRight<16>(pixels), hn::Set(Pixels(), 255));
}
template <class V>
HWY_INLINE V Blue(V pixels) {
  return hn::And(hn::ShiftRight<24>(pixels), hn::Set(Pixels(), 255));
}
HWY_INLINE auto LoadPixels(const std::uint8_t* row, std::size_t x) {
  const Pixels d;
#if HWY_TARGET == HWY_SCALAR  // one lane, which has no room for four bytes
  std::int32_t pixel;
  std::memcpy(&pixel, row + 4 * x, sizeof(pixel));
  return hn::Set(d, pixel);
#else
  const hn::Repartition<std::uint8_t, Pixels> bytes;
  return hn::BitCast(d, hn::LoadU(bytes, row + 4 * x));
#endif
}

template <class V>
HWY_INLINE V LumaOf(V pixels) {
  const Pixels d;
  const auto red_green =
      hn::Add(hn::Mul(Red(pixels), hn::Set(d, 9798)), hn::Mul(Green(pixels), hn::Set(d, 19235)));
  const auto blue_half = hn::Add(hn::Mul(Blue(pixels), hn::Set(d, 3735)), hn::Set(d, 16384));
  return hn::ShiftRight<15>(hn::Add(red_green, blue_half));
}

HWY_INLINE std::uint8_t LumaOfPixel(const std::uint8_t* p) {
  return static_cast<std::uint8_t>((9798 * p[1] + 19235 * p[2] + 3735 * p[3] + 16384) >> 15);
}

void LumaRows(const ArgbFrame& frame, std::uint8_t* luma) {
  const hn::Rebind<std::uint8_t, Pixels> d8;
  const std::size_t N = hn::Lanes(Pixels());
  for (std::size_t y = 0; y < frame.height; ++y, luma += frame.width) {
    const std::uint8_t* row = frame.top_row + static_cast<std::ptrdiff_t>(y) * frame.row_bytes;
    std::size_t x = 0;
    for (; x + N <= frame.width; x += N) {
      hwy::Prefetch(row + 4 * x + kBytesAhead);
      hn::StoreU(hn::DemoteTo(d8, LumaOf(LoadPixels(row, x))), d8, luma + x);
    }
    for (; x < frame.width; ++x) luma[x] = LumaOfPixel(row + 4 * x);
  }
}

void MaskRows(const ArgbFrame& frame, std::uint8_t* mask) {
  const hn::ScalableTag<std::uint32_t> d;
  const hn::Rebind<std::uint8_t, decltype(d)> d8;
  const std::size_t N = hn::Lanes(d);
  for (std::size_t y = 0; y < frame.height; ++y, mask += frame.width) {
    const std::uint8_t* row = frame.top_row + static_cast<std::ptrdiff_t>(y) * frame.row_bytes;
    std::size_t x = 0;
    for (; x + N <= frame.width; x += N) {
      const auto pixels = hn::BitCast(d, LoadPixels(row, x));
      const auto opaque = hn::And(hn::ShiftRight<7>(pixels), hn::Set(d, 1u));
      hn::StoreU(hn::TruncateTo(d8, opaque), d8, mask + x);
    }
    for (; x < frame.width; ++x) mask[x] = row[4 * x] >> 7;
  }
}

void ColorRows(const ArgbFrame& frame, float* color) {
  const Floats df;
  const std::size_t N = hn::Lanes(df);
  for (std::size_t y = 0; y < frame.height; ++y, color += 3 * frame.width) {
    const std::uint8_t* row = frame.top_row + static_cast<std::ptrdiff_t>(y) * frame.row_bytes;
    std::size_t x = 0;
    for (; x + N <= frame.width; x += N) {
      const auto pixels = LoadPixels(row, x);
      hn::StoreInterleaved3(hn::ConvertTo(df, Red(pixels)), hn::ConvertTo(df, Green(pixels)),
                            hn::ConvertTo(df, Blue(pixels)), df, color + 3 * x);
    }
    for (; x < frame.width; ++x) {
      for (std::size_t c = 0; c < 3; ++c) color[3 * x + c] = row[4 * x + 1 + c];
    }
  }
}

// Tells whether every pixel's alpha is above 127.
bool ColorAndLumaRows(const ArgbFrame& frame, std::uint8_t* color, std::uint8_t* luma) {
  const Pixels d32;
  auto alphas = hn::Set(d32, 255);
  std::uint8_t last_alphas = 255;
  for (std::size_t y = 0; y < frame.height; ++y, color += 3 * frame.width, luma += frame.width) {
    const std::uint8_t* row = frame.top_row + static_cast<std::ptrdiff_t>(y) * frame.row_bytes;
    std::size_t x = 0;
#if HWY_TARGET != HWY_SCALAR
    // Colours go together in each block of four pixels, then the blocks' 12 bytes. What is stored
    // too much is the next pixels' place.
    const hn::Repartition<std::uint8_t, Pixels> d;
    const hn::Repartition<std::uint32_t, Pixels> words;
    const hn::Rebind<std::uint8_t, Pixels> d8;
    const std::size_t N = hn::Lanes(d);
    HWY_ALIGN static constexpr std::uint8_t kColors[16] = {1,  2,  3,  5,  6, 7, 9, 10,
                                                           11, 13, 14, 15, 0, 0, 0, 0};
    const auto colors = hn::LoadDup128(d, kColors);
    HWY_ALIGN std::int32_t places[hn::MaxLanes(words)];
    for (std::size_t j = 0; j < N / 4; ++j) {
      places[j] = static_cast<std::int32_t>(j < N / 16 * 3 ? j / 3 * 4 + j % 3 : 0);
    }
    const auto together = hn::SetTableIndices(words, places);
    for (; 3 * x + N <= 3 * frame.width; x += N / 4) {
      hwy::Prefetch(row + 4 * x + kBytesAhead);
      const auto bytes = hn::LoadU(d, row + 4 * x);
      const auto blocks = hn::TableLookupBytes(bytes, colors);
      const auto packed = hn::TableLookupLanes(hn::BitCast(words, blocks), together);
      hn::StoreU(hn::BitCast(d, packed), d, color + 3 * x);
      const auto pixels = hn::BitCast(d32, bytes);
      alphas = hn::And(alphas, pixels);
      hn::StoreU(hn::DemoteTo(d8, LumaOf(pixels)), d8, luma + x);
    }
#endif
    for (; x < frame.width; ++x) {
      for (std::size_t c = 0; c < 3; ++c) color[3 * x + c] = row[4 * x + 1 + c];
      luma[x] = LumaOfPixel(row + 4 * x);
      last_alphas &= row[4 * x];
    }
  }
  const auto high_bit = hn::Set(d32, 128);
  return hn::AllTrue(d32, hn::Eq(hn::And(alphas, high_bit), high_bit)) && last_alphas > 127;
}

// (before + 2 centre + after) / 4 of every other pixel. Two colours are summed in a lane, 16 bits
// each, of which a sum takes 10.
void ReducedColorRow(const std::uint8_t* row, std::size_t width, float* destination) {
  const std::size_t end = (width + 1) / 2 - 1;
  std::fill_n(destination, 3, 0.0f);
  std::size_t j = 1;
#if HWY_TARGET != HWY_SCALAR
  const Pixels d;
  const Floats df;
  const std::size_t N = hn::Lanes(d);
  const auto low_bytes = hn::Set(d, 0x00FF00FF);
  const auto quarter = hn::Set(df, 0.25f);
  const auto average = [&](auto sum) HWY_ATTR { return hn::Mul(hn::ConvertTo(df, sum), quarter); };
  for (; j + N <= end && 2 * (j + N) < width; j += N) {
    const std::uint8_t* first = row + 4 * (2 * j - 1);
    const auto left = LoadPixels(first, 0);
    const auto right = LoadPixels(first, N);
    const auto before = hn::ConcatEven(d, right, left);
    const auto centre = hn::ConcatOdd(d, right, left);
    const auto after = hn::ConcatEven(d, LoadPixels(first, N + 2), LoadPixels(first, 2));
    const auto sum = [&](auto part) HWY_ATTR {
      const auto c = part(centre);
      return hn::Add(hn::Add(part(before), part(after)), hn::Add(c, c));
    };
    const auto green = sum([&](auto v) HWY_ATTR { return hn::And(v, low_bytes); });
    const auto red_blue =
        sum([&](auto v) HWY_ATTR { return hn::And(hn::ShiftRight<8>(v), low_bytes); });
    hn::StoreInterleaved3(average(hn::And(red_blue, hn::Set(d, 0xFFFF))),
                          average(hn::ShiftRight<16>(green)), average(hn::ShiftRight<16>(red_blue)),
                          df, destination + 3 * j);
  }
#endif
  for (; j < end; ++j) {
    for (std::size_t c = 0; c < 3; ++c) {
      const std::uint8_t* centre = row + 8 * j + 1 + c;
      destination[3 * j + c] = static_cast<float>(centre[-4] + 2 * centre[0] + centre[4]) * 0.25f;
    }
  }
  std::fill_n(destination + 3 * end, 3, 0.0f);
}

void WidenBytes(const std::uint8_t* bytes, std::size_t count, float* floats) {
  const Floats d;
  const Pixels di;
  const hn::Rebind<std::uint8_t, Floats> d8;
  const std::size_t N = hn::Lanes(d);
  std::size_t i = 0;
  for (; i + N <= count; i += N) {
    hn::StoreU(hn::ConvertTo(d, hn::PromoteTo(di, hn::LoadU(d8, bytes + i))), d, floats + i);
  }
  for (; i < count; ++i) floats[i] = bytes[i];
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {

HWY_EXPORT(LumaRows);
HWY_EXPORT(MaskRows);
HWY_EXPORT(ColorRows);
HWY_EXPORT(ColorAndLumaRows);
HWY_EXPORT(ReducedColorRow);
HWY_EXPORT(WidenBytes);

void LumaFromArgb(const ArgbFrame& frame, std::uint8_t* luma) {
  HWY_DYNAMIC_DISPATCH(LumaRows)(frame, luma);
}

void MaskFromArgb(const ArgbFrame& frame, std::uint8_t* mask) {
  HWY_DYNAMIC_DISPATCH(MaskRows)(frame, mask);
}

void ColorFromArgb(const ArgbFrame& frame, float* color) {
  HWY_DYNAMIC_DISPATCH(ColorRows)(frame, color);
}

bool ColorAndLumaFromArgb(const ArgbFrame& frame, std::uint8_t* color, std::uint8_t* luma) {
  return HWY_DYNAMIC_DISPATCH(ColorAndLumaRows)(frame, color, luma);
}

void ReducedColorFromArgb(const std::uint8_t* row, std::size_t width, float* destination) {
  HWY_DYNAMIC_DISPATCH(ReducedColorRow)(row, width, destination);
}

void FloatsFromBytes(const std::uint8_t* bytes, std::size_t count, float* floats) {
  HWY_DYNAMIC_DISPATCH(WidenBytes)(bytes, count, floats);
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
