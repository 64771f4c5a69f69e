#include "host/media/pixel_planes.h"

#include <cstring>

// The target of last resort has to be the emulated 128-bit one, as there are bytes to take in
// pairs. The library avoids it under older g++, which miscompile the high halves of its integer
// products (GCC bug 106322); there are none here.
#define HWY_BROKEN_EMU128 0
#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "host/media/pixel_planes.cpp"
#include <hwy/foreach_target.h>  // IWYU pragma: keep
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace calmframe::media {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

using D = hn::CappedTag<std::uint8_t, 64>;
using V = hn::Vec<D>;
constexpr std::size_t kMaxLanes = 64;

// Calls work(first) for vectors that begin at pixel 0, `lanes`, ...; the last ends with the row and
// may repeat pixels of the one before. False, with nothing done, for less than a vector.
template <class Work>
HWY_INLINE bool InVectors(std::size_t lanes, std::size_t count, const Work& work) {
  if (count < lanes) return false;
  for (std::size_t i = 0; i + lanes <= count; i += lanes) work(i);
  if (count % lanes != 0) work(count - lanes);
  return true;
}

void Pack(const std::uint8_t* const* planes, std::size_t count, std::uint8_t* pixels) {
  const D d;
  const auto row = [&](const std::uint8_t* const* from, std::size_t size,
                       std::uint8_t* to) HWY_ATTR {
    return InVectors(hn::Lanes(d), size, [&](std::size_t i) HWY_ATTR {
      const V alpha = from[0] ? hn::LoadU(d, from[0] + i) : hn::Set(d, 255);
      hn::StoreInterleaved4(alpha, hn::LoadU(d, from[1] + i), hn::LoadU(d, from[2] + i),
                            hn::LoadU(d, from[3] + i), d, to + 4 * i);
    });
  };
  if (row(planes, count, pixels)) return;
  std::uint8_t channels[4][kMaxLanes] = {};
  std::uint8_t packed[4 * kMaxLanes];
  const std::uint8_t* from[4] = {};
  for (int c = 0; c < 4; ++c) {
    if (!planes[c]) continue;
    std::memcpy(channels[c], planes[c], count);
    from[c] = channels[c];
  }
  row(from, hn::Lanes(d), packed);
  std::memcpy(pixels, packed, 4 * count);
}

// colour * alpha / 255, rounded. Even and odd bytes apart, in 16 bits; what a division by 255 gives
// below 65535 is (v + 1 + v / 256) / 256.
HWY_INLINE V OverBlack(V colour, V alpha) {
  const hn::Repartition<std::uint16_t, D> d;
  const auto low = hn::Set(d, 255);
  const auto over = [&](auto c, auto a) HWY_ATTR {
    const auto v = hn::Add(hn::Mul(c, a), hn::Set(d, 127 + 1));
    return hn::Add(v, hn::ShiftRight<8>(hn::Sub(v, hn::Set(d, 1))));
  };
  const auto c = hn::BitCast(d, colour), a = hn::BitCast(d, alpha);
  const auto even = hn::ShiftRight<8>(over(hn::And(c, low), hn::And(a, low)));
  const auto odd = hn::AndNot(low, over(hn::ShiftRight<8>(c), hn::ShiftRight<8>(a)));
  return hn::BitCast(D(), hn::Or(even, odd));
}

void Unpack(const std::uint8_t* pixels, std::size_t count, std::uint8_t* const* planes) {
  const D d;
  const auto row = [&](const std::uint8_t* from, std::size_t size, std::uint8_t* const* to)
                       HWY_ATTR {
                         return InVectors(hn::Lanes(d), size, [&](std::size_t i) HWY_ATTR {
                           V alpha, red, green, blue;
                           hn::LoadInterleaved4(d, from + 4 * i, alpha, red, green, blue);
                           if (to[0]) {
                             hn::StoreU(alpha, d, to[0] + i);
                           } else if (!hn::AllTrue(d, hn::Eq(alpha, hn::Set(d, 255)))) {
                             red = OverBlack(red, alpha);
                             green = OverBlack(green, alpha);
                             blue = OverBlack(blue, alpha);
                           }
                           hn::StoreU(red, d, to[1] + i);
                           hn::StoreU(green, d, to[2] + i);
                           hn::StoreU(blue, d, to[3] + i);
                         });
                       };
  if (row(pixels, count, planes)) return;
  std::uint8_t packed[4 * kMaxLanes] = {};
  std::uint8_t channels[4][kMaxLanes];
  std::memcpy(packed, pixels, 4 * count);
  std::uint8_t* const to[4] = {planes[0] ? channels[0] : nullptr, channels[1], channels[2],
                               channels[3]};
  row(packed, hn::Lanes(d), to);
  for (int c = 0; c < 4; ++c) {
    if (planes[c]) std::memcpy(planes[c], channels[c], count);
  }
}

}  // namespace HWY_NAMESPACE
}  // namespace calmframe::media
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace calmframe::media {
HWY_EXPORT(Pack);
HWY_EXPORT(Unpack);

void PackPixels(const std::uint8_t* const (&planes)[4], std::size_t count, std::uint8_t* pixels) {
  HWY_DYNAMIC_DISPATCH(Pack)(planes, count, pixels);
}

void UnpackPixels(const std::uint8_t* pixels, std::size_t count, std::uint8_t* const (&planes)[4]) {
  HWY_DYNAMIC_DISPATCH(Unpack)(pixels, count, planes);
}
}  // namespace calmframe::media
#endif
