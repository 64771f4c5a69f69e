#include "stabilizer/render/sampling.h"

#include <hwy/cache_control.h>

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

template <class D>
using Bytes = hn::Repartition<std::uint8_t, D>;

// How channels become f32 lanes, and lanes that hold whole numbers channels. D is the tag of the
// lanes: one pixel or two. Loads and stores are of bytes: rows may lie anywhere.
template <class Channel>
struct IntegerDepth {
  using channel = Channel;
  static constexpr bool rounds = true;
  template <class D>
  static HWY_INLINE hn::Vec<Bytes<hn::Rebind<Channel, D>>> Raw(D, const unsigned char* p) {
    return hn::LoadU(Bytes<hn::Rebind<Channel, D>>(), p);
  }
  template <class D, class V>
  static HWY_INLINE hn::Vec<D> Lanes(D d, V raw) {
    const auto channels = hn::BitCast(hn::Rebind<Channel, D>(), raw);
    return hn::ConvertTo(d, hn::PromoteTo(hn::RebindToSigned<D>(), channels));
  }
  template <class D>
  static HWY_INLINE void Store(D d, hn::Vec<D> v, unsigned char* p) {
    // 2^23 + v has v in its lowest bits.
    const hn::RebindToSigned<D> di;
    const auto magic = hn::Set(d, 8388608.0f);
    const auto whole = hn::Xor(hn::BitCast(di, hn::Add(v, magic)), hn::BitCast(di, magic));
    const hn::Rebind<Channel, D> dc;
    const Bytes<hn::Rebind<Channel, D>> db;
    hn::StoreU(hn::BitCast(db, hn::DemoteTo(dc, whole)), db, p);
  }
};

struct Depth8 : IntegerDepth<std::uint8_t> {
  using Pixel = HX_Pixel8;
};

struct Depth16 : IntegerDepth<std::uint16_t> {
  using Pixel = HX_Pixel16;
};

struct DepthFloat {
  using Pixel = HX_PixelFloat;
  using channel = float;
  static constexpr bool rounds = false;
  template <class D>
  static HWY_INLINE hn::Vec<Bytes<D>> Raw(D, const unsigned char* p) {
    return hn::LoadU(Bytes<D>(), p);
  }
  template <class D, class V>
  static HWY_INLINE hn::Vec<D> Lanes(D d, V raw) {
    return hn::BitCast(d, raw);
  }
  template <class D>
  static HWY_INLINE void Store(D, hn::Vec<D> v, unsigned char* p) {
    const Bytes<D> db;
    hn::StoreU(hn::BitCast(db, v), db, p);
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

template <class Depth, class D>
HWY_INLINE hn::Vec<D> Between(D d, hn::Vec<D> p, hn::Vec<D> q, hn::Vec<D> t) {
  const auto s = hn::Sub(hn::Set(d, 1.0f), t);
  const auto v = hn::Add(hn::Mul(p, s), hn::Mul(q, t));
  if constexpr (Depth::rounds) {
    return hn::Floor(hn::Add(v, hn::Set(d, 0.5f)));  // v >= 0
  } else {
    return v;
  }
}

// The source about a run's pixels.
struct Neighbours {
  const source_plane& source;
  const Positions& at;
  std::ptrdiff_t pixel;  // bytes

  const unsigned char* operator[](int k) const {
    return source.data + source.row_bytes * at.iy[k] + pixel * at.ix[k];
  }
};

#if HWY_MAX_BYTES >= 32 && !HWY_HAVE_SCALABLE
#define CALMFRAME_PAIRS 1
// Two pixels at a time, each from two loads of two neighbours, as if all alphas were equal. False
// where they are not, or are 0 or not a number; the samples then are of no use.
template <class Depth>
HWY_INLINE bool RunOfOneAlpha(const source_plane& source, const Positions& at, int count,
                              unsigned char* out) {
  using channel = typename Depth::channel;
  constexpr std::ptrdiff_t pixel = sizeof(typename Depth::Pixel);
  const hn::FixedTag<float, 8> d;
  const Bytes<hn::Rebind<channel, decltype(d)>> db;
  const Neighbours neighbours{source, at, pixel};
  HWY_ALIGN unsigned char bytes[2 * pixel];
  std::memcpy(bytes, neighbours[0], pixel);
  std::memcpy(bytes + pixel, neighbours[0], pixel);
  const auto first = hn::Load(db, bytes);
  auto differ = hn::Zero(db);
  const auto columns = [&](int k) HWY_ATTR {
    const unsigned char* p = neighbours[k];
    const auto top = Depth::Raw(d, p);
    const auto bottom = Depth::Raw(d, p + source.row_bytes);
    differ = hn::Or(differ, hn::Or(hn::Xor(top, first), hn::Xor(bottom, first)));
    return Between<Depth>(d, Depth::Lanes(d, top), Depth::Lanes(d, bottom), hn::Set(d, at.fy[k]));
  };
  // One more than an odd count: its position is computed too.
  for (int k = 0; k < count; k += 2, out += 2 * pixel) {
    const auto even = columns(k);
    const auto odd = columns(k + 1);
    const auto tx = hn::OddEvenBlocks(hn::Set(d, at.fx[k + 1]), hn::Set(d, at.fx[k]));
    const auto sample = Between<Depth>(d, hn::ConcatLowerLower(d, odd, even),
                                       hn::ConcatUpperUpper(d, odd, even), tx);
    if (k + 1 < count) {
      Depth::Store(d, sample, out);
    } else {
      Depth::Store(hn::Half<decltype(d)>(), hn::LowerHalf(sample), out);
    }
  }
  hn::Store(differ, db, bytes);
  channel left, right, alpha;
  std::memcpy(&left, bytes, sizeof(left));
  std::memcpy(&right, bytes + pixel, sizeof(right));
  std::memcpy(&alpha, neighbours[0], sizeof(alpha));
  return left == 0 && right == 0 && alpha != 0 && alpha == alpha;
}
#endif

template <class Pixel>
HWY_INLINE void Locate(const source_plane& source, const source_run<Pixel>& run, Positions& at) {
  const float g = static_cast<float>(run.g);
  AxisPositions(run.x, run.dx, g, source.max_x, source.width, run.count, at.ix, at.fx);
  AxisPositions(run.y, run.dy, g, source.max_y, source.height, run.count, at.iy, at.fy);
  // Rows of a cell are too short for the processor to foresee. The row above is there already, from
  // the run before.
  const Neighbours neighbours{source, at, sizeof(Pixel)};
  const std::ptrdiff_t below = source.height > 1 ? source.row_bytes : 0;
  hwy::Prefetch(neighbours[0] + below);
  hwy::Prefetch(neighbours[run.count - 1] + below);
  hwy::Prefetch(run.out);
  hwy::Prefetch(run.out + run.count - 1);
}

template <class Depth>
HWY_INLINE void Sample(const source_plane& source, const Positions& at, int count,
                       typename Depth::Pixel* out_pixels) {
  using channel = typename Depth::channel;
  const hn::FixedTag<float, 4> d;
  constexpr std::ptrdiff_t pixel = sizeof(typename Depth::Pixel);
  auto* out = reinterpret_cast<unsigned char*>(out_pixels);
#ifdef CALMFRAME_PAIRS
  if (source.width > 1 && source.height > 1 && RunOfOneAlpha<Depth>(source, at, count, out)) {
    return;
  }
#endif
  const std::ptrdiff_t right = source.width > 1 ? pixel : 0;
  const std::ptrdiff_t below = source.height > 1 ? source.row_bytes : 0;
  const Neighbours neighbours{source, at, pixel};
  for (int k = 0; k < count; ++k, out += pixel) {
    const unsigned char* p = neighbours[k];
    channel a00, a10, a01, a11;
    std::memcpy(&a00, p, sizeof(a00));
    std::memcpy(&a10, p + right, sizeof(a10));
    std::memcpy(&a01, p + below, sizeof(a01));
    std::memcpy(&a11, p + below + right, sizeof(a11));
    const auto p00 = Depth::Lanes(d, Depth::Raw(d, p));
    const auto p10 = Depth::Lanes(d, Depth::Raw(d, p + right));
    const auto p01 = Depth::Lanes(d, Depth::Raw(d, p + below));
    const auto p11 = Depth::Lanes(d, Depth::Raw(d, p + below + right));
    if (a00 == a10 && a00 == a01 && a00 == a11) {
      if (a00 == 0) {
        std::memset(out, 0, pixel);
        continue;
      }
      const auto ty = hn::Set(d, at.fy[k]);
      Depth::Store(d,
                   Between<Depth>(d, Between<Depth>(d, p00, p01, ty),
                                  Between<Depth>(d, p10, p11, ty), hn::Set(d, at.fx[k])),
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
    channel rounded[4];
    for (int i = 0; i < 4; ++i) rounded[i] = static_cast<channel>(mixed.v[i]);
    std::memcpy(out, rounded, pixel);
  }
}

// The positions of the run ahead are found before a run is sampled, to hide their latency.
template <class Depth>
void Runs(const source_plane& source, const source_run<typename Depth::Pixel>* runs,
          std::size_t n) {
  Positions at[2];
  if (n > 0) Locate(source, runs[0], at[0]);
  for (std::size_t i = 0; i < n; ++i) {
    if (i + 1 < n) Locate(source, runs[i + 1], at[(i + 1) % 2]);
    Sample<Depth>(source, at[i % 2], runs[i].count, runs[i].out);
  }
}

void Runs8(const source_plane& source, const source_run<HX_Pixel8>* runs, std::size_t n) {
  Runs<Depth8>(source, runs, n);
}
void Runs16(const source_plane& source, const source_run<HX_Pixel16>* runs, std::size_t n) {
  Runs<Depth16>(source, runs, n);
}
void RunsFloat(const source_plane& source, const source_run<HX_PixelFloat>* runs, std::size_t n) {
  Runs<DepthFloat>(source, runs, n);
}

#undef CALMFRAME_PAIRS
}  // namespace HWY_NAMESPACE
}  // namespace sampling
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace sampling {
HWY_EXPORT(Runs8);
HWY_EXPORT(Runs16);
HWY_EXPORT(RunsFloat);
}  // namespace sampling

void SampleRuns(const source_plane& source, const source_run<HX_Pixel8>* runs, std::size_t n) {
  using namespace sampling;
  HWY_DYNAMIC_DISPATCH(Runs8)(source, runs, n);
}
void SampleRuns(const source_plane& source, const source_run<HX_Pixel16>* runs, std::size_t n) {
  using namespace sampling;
  HWY_DYNAMIC_DISPATCH(Runs16)(source, runs, n);
}
void SampleRuns(const source_plane& source, const source_run<HX_PixelFloat>* runs, std::size_t n) {
  using namespace sampling;
  HWY_DYNAMIC_DISPATCH(RunsFloat)(source, runs, n);
}
#endif
