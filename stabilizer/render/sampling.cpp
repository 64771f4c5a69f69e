#include "stabilizer/render/sampling.h"

#include <cmath>
#include <cstdint>
#include <cstring>

// The kernel needs four lanes, so the target of last resort has to be the emulated 128-bit one. The
// library avoids it under older g++, which miscompile its integer multiplications (GCC bug 106322);
// there are none here.
#define HWY_BROKEN_EMU128 0
#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "stabilizer/render/sampling.cpp"
#include <hwy/foreach_target.h>  // IWYU pragma: keep
#include <hwy/highway.h>

#ifndef CALMFRAME_SAMPLING_ONCE
#define CALMFRAME_SAMPLING_ONCE

namespace {

// Four channels as f32, interpolated where the alphas differ; the fast kernel does the rest.
struct channels {
  float v[4];  // alpha first
};

template <bool rounds>
channels weighted(const channels& p, const channels& q, float t) {
  const float a = p.v[0];
  const float b = q.v[0];
  channels result;
  if (a == b) {
    result.v[0] = a * (1 - t) + b * t;
    if (result.v[0] == 0) return {};
    for (int i = 1; i < 4; ++i) result.v[i] = p.v[i] * (1 - t) + q.v[i] * t;
  } else {
    const float wa = a * (1 - t);
    const float wb = b * t;
    result.v[0] = wa + wb;
    if (result.v[0] == 0) return {};
    for (int i = 1; i < 4; ++i) result.v[i] = (p.v[i] * wa + q.v[i] * wb) / result.v[0];
  }
  if constexpr (rounds) {
    for (float& v : result.v) v = static_cast<float>(static_cast<std::int32_t>(v + 0.5f));
  }
  return result;
}

}  // namespace
#endif

HWY_BEFORE_NAMESPACE();
namespace sampling {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// How a pixel becomes four f32 lanes and back. Loads are of bytes: rows may lie anywhere.
struct Depth8 {
  using Pixel = HX_Pixel8;
  using channel = std::uint8_t;
  static constexpr bool rounds = true;
  static HWY_INLINE hn::Vec<hn::FixedTag<float, 4>> Load(const unsigned char* p) {
    const hn::FixedTag<std::int32_t, 4> di;
    const hn::FixedTag<float, 4> df;
    return hn::ConvertTo(df, hn::PromoteTo(di, hn::LoadU(hn::FixedTag<std::uint8_t, 4>(), p)));
  }
  static HWY_INLINE void Store(hn::Vec<hn::FixedTag<std::int32_t, 4>> v, unsigned char* p) {
    const hn::FixedTag<std::uint8_t, 4> d;
    hn::StoreU(hn::DemoteTo(d, v), d, p);
  }
};

struct Depth16 {
  using Pixel = HX_Pixel16;
  using channel = std::uint16_t;
  static constexpr bool rounds = true;
  static HWY_INLINE hn::Vec<hn::FixedTag<float, 4>> Load(const unsigned char* p) {
    const hn::FixedTag<std::int32_t, 4> di;
    const hn::FixedTag<float, 4> df;
    const auto bytes = hn::LoadU(hn::FixedTag<std::uint8_t, 8>(), p);
    return hn::ConvertTo(df,
                         hn::PromoteTo(di, hn::BitCast(hn::FixedTag<std::uint16_t, 4>(), bytes)));
  }
  static HWY_INLINE void Store(hn::Vec<hn::FixedTag<std::int32_t, 4>> v, unsigned char* p) {
    const hn::FixedTag<std::uint8_t, 8> d;
    hn::StoreU(hn::BitCast(d, hn::DemoteTo(hn::FixedTag<std::uint16_t, 4>(), v)), d, p);
  }
};

struct DepthFloat {
  using Pixel = HX_PixelFloat;
  using channel = float;
  static constexpr bool rounds = false;
  static HWY_INLINE hn::Vec<hn::FixedTag<float, 4>> Load(const unsigned char* p) {
    return hn::BitCast(hn::FixedTag<float, 4>(), hn::LoadU(hn::FixedTag<std::uint8_t, 16>(), p));
  }
  static HWY_INLINE void Store(hn::Vec<hn::FixedTag<float, 4>> v, unsigned char* p) {
    const hn::FixedTag<std::uint8_t, 16> d;
    hn::StoreU(hn::BitCast(d, v), d, p);
  }
};

struct Positions {
  HWY_ALIGN std::int32_t ix[max_run];
  HWY_ALIGN std::int32_t iy[max_run];
  HWY_ALIGN float fx[max_run];
  HWY_ALIGN float fy[max_run];
};

// One axis of a run: whole and fractional parts of the clamped positions.
HWY_INLINE void AxisPositions(double start, double step, float g, double highest, int size,
                              int count, std::int32_t* HWY_RESTRICT whole,
                              float* HWY_RESTRICT fraction) {
  const hn::CappedTag<float, max_run> d;
  const hn::RebindToSigned<decltype(d)> di;
  const std::size_t lanes = hn::Lanes(d);
  const double base = std::fabs(start) < 16777216.0 ? std::floor(start) : 0.0;
  const auto first = hn::Set(d, static_cast<float>(start - base));
  const auto low = hn::Set(d, static_cast<float>(0.0001 - base));
  const auto high = hn::Set(d, static_cast<float>(highest - base));
  const auto one = hn::Set(d, 1.0f);
  const auto base_whole = hn::Set(di, static_cast<std::int32_t>(base));
  const auto last = hn::Set(di, size > 1 ? size - 2 : 0);
  for (std::size_t k = 0; k < static_cast<std::size_t>(count); k += lanes) {
    const auto index = hn::Iota(d, static_cast<float>(k));
    const auto offset = hn::Div(hn::Mul(index, hn::Set(d, static_cast<float>(step))),
                                hn::Add(one, hn::Mul(hn::Set(d, g), index)));
    auto p = hn::Add(first, offset);
    p = hn::IfThenElse(hn::Ge(p, low), p, low);  // not a number fails
    p = hn::IfThenElse(hn::Le(p, high), p, high);
    const auto floor = hn::Floor(p);
    auto i = hn::Add(hn::ConvertTo(di, floor), base_whole);
    i = hn::Min(hn::Max(i, hn::Zero(di)), last);
    hn::Store(i, di, whole + k);
    hn::Store(hn::Sub(p, floor), d, fraction + k);
  }
}

template <class Depth>
HWY_INLINE auto Finish(hn::Vec<hn::FixedTag<float, 4>> v) {
  if constexpr (Depth::rounds) {
    const hn::FixedTag<float, 4> df;
    return hn::ConvertTo(hn::FixedTag<std::int32_t, 4>(), hn::Add(v, hn::Set(df, 0.5f)));
  } else {
    return v;
  }
}

template <class Depth>
HWY_INLINE hn::Vec<hn::FixedTag<float, 4>> Between(hn::Vec<hn::FixedTag<float, 4>> p,
                                                   hn::Vec<hn::FixedTag<float, 4>> q,
                                                   hn::Vec<hn::FixedTag<float, 4>> s,
                                                   hn::Vec<hn::FixedTag<float, 4>> t) {
  const auto v = hn::Add(hn::Mul(p, s), hn::Mul(q, t));
  if constexpr (Depth::rounds) {
    return hn::ConvertTo(hn::FixedTag<float, 4>(), Finish<Depth>(v));
  } else {
    return v;
  }
}

template <class Depth>
void Run(const source_plane& source, const source_run& run, int count,
         typename Depth::Pixel* out_pixels) {
  const hn::FixedTag<float, 4> d;
  constexpr std::ptrdiff_t pixel = sizeof(typename Depth::Pixel);
  Positions at;
  const float g = static_cast<float>(run.g);
  AxisPositions(run.x, run.dx, g, source.max_x, source.width, count, at.ix, at.fx);
  AxisPositions(run.y, run.dy, g, source.max_y, source.height, count, at.iy, at.fy);
  const std::ptrdiff_t right = source.width > 1 ? pixel : 0;
  const std::ptrdiff_t below = source.height > 1 ? source.row_bytes : 0;
  auto* out = reinterpret_cast<unsigned char*>(out_pixels);
  for (int k = 0; k < count; ++k, out += pixel) {
    const unsigned char* p = source.data + source.row_bytes * at.iy[k] + pixel * at.ix[k];
    typename Depth::channel a00, a10, a01, a11;
    std::memcpy(&a00, p, sizeof(a00));
    std::memcpy(&a10, p + right, sizeof(a10));
    std::memcpy(&a01, p + below, sizeof(a01));
    std::memcpy(&a11, p + below + right, sizeof(a11));
    const auto p00 = Depth::Load(p);
    const auto p10 = Depth::Load(p + right);
    const auto p01 = Depth::Load(p + below);
    const auto p11 = Depth::Load(p + below + right);
    if (a00 == a10 && a00 == a01 && a00 == a11) {
      if (a00 == 0) {
        std::memset(out, 0, pixel);
        continue;
      }
      const auto ty = hn::Set(d, at.fy[k]);
      const auto sy = hn::Set(d, 1.0f - at.fy[k]);
      const auto tx = hn::Set(d, at.fx[k]);
      const auto sx = hn::Set(d, 1.0f - at.fx[k]);
      const auto left_column = Between<Depth>(p00, p01, sy, ty);
      const auto right_column = Between<Depth>(p10, p11, sy, ty);
      Depth::Store(Finish<Depth>(hn::Add(hn::Mul(left_column, sx), hn::Mul(right_column, tx))),
                   out);
      continue;
    }
    channels c00, c10, c01, c11;
    hn::StoreU(p00, d, c00.v);
    hn::StoreU(p10, d, c10.v);
    hn::StoreU(p01, d, c01.v);
    hn::StoreU(p11, d, c11.v);
    const channels mixed =
        weighted<Depth::rounds>(weighted<Depth::rounds>(c00, c01, at.fy[k]),
                                weighted<Depth::rounds>(c10, c11, at.fy[k]), at.fx[k]);
    typename Depth::channel rounded[4];
    for (int i = 0; i < 4; ++i) rounded[i] = static_cast<typename Depth::channel>(mixed.v[i]);
    std::memcpy(out, rounded, pixel);
  }
}

void Run8(const source_plane& source, const source_run& run, int count, HX_Pixel8* out) {
  Run<Depth8>(source, run, count, out);
}
void Run16(const source_plane& source, const source_run& run, int count, HX_Pixel16* out) {
  Run<Depth16>(source, run, count, out);
}
void RunFloat(const source_plane& source, const source_run& run, int count, HX_PixelFloat* out) {
  Run<DepthFloat>(source, run, count, out);
}

}  // namespace HWY_NAMESPACE
}  // namespace sampling
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace sampling {
HWY_EXPORT(Run8);
HWY_EXPORT(Run16);
HWY_EXPORT(RunFloat);
}  // namespace sampling

void SampleRun(const source_plane& source, const source_run& run, int count, HX_Pixel8* out) {
  using namespace sampling;
  HWY_DYNAMIC_DISPATCH(Run8)(source, run, count, out);
}
void SampleRun(const source_plane& source, const source_run& run, int count, HX_Pixel16* out) {
  using namespace sampling;
  HWY_DYNAMIC_DISPATCH(Run16)(source, run, count, out);
}
void SampleRun(const source_plane& source, const source_run& run, int count, HX_PixelFloat* out) {
  using namespace sampling;
  HWY_DYNAMIC_DISPATCH(RunFloat)(source, run, count, out);
}
#endif
