#include "stabilizer/render/sampling.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <type_traits>

// The kernel needs four lanes, so the target of last resort has to be the emulated 128-bit one. The
// library avoids it under older g++, which miscompile the high halves of its integer products (GCC
// bug 106322); there are none here.
#define HWY_BROKEN_EMU128 0
#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "stabilizer/render/sampling.cpp"
#include <hwy/foreach_target.h>  // IWYU pragma: keep
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::render::sampling {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

using DF = hn::CappedTag<float, 16>;
using DU = hn::RebindToUnsigned<DF>;
using DI = hn::RebindToSigned<DF>;
using D64 = hn::Repartition<std::uint64_t, DF>;
using DOffset = hn::RebindToSigned<D64>;
using VF = hn::Vec<DF>;
using VU = hn::Vec<DU>;
using VI = hn::Vec<DI>;
using VOffset = hn::Vec<DOffset>;
using Mask = hn::Mask<DF>;

constexpr std::size_t max_lanes = 16;
constexpr float whole_bits = 8388608.0f;  // 2^23 + v has v in its lowest bits

// Where output pixels that stand side by side look up the source. Filled run by run: runs are often
// shorter than a few vectors, stretches are long.
constexpr int max_stretch = 512;
struct Stretch {
  HWY_ALIGN std::int32_t ix[max_stretch + max_lanes];
  HWY_ALIGN std::int32_t iy[max_stretch + max_lanes];
  HWY_ALIGN float fx[max_stretch + max_lanes];
  HWY_ALIGN float fy[max_stretch + max_lanes];
  int count = 0;
  unsigned char* out = nullptr;
};

// One axis of a vector of positions: clamped, then whole and fractional part.
class Axis {
 public:
  Axis(double start, double step, double highest, int size)
      : base_(std::fabs(start) < 16777216.0 ? std::floor(start) : 0.0),
        first_(static_cast<float>(start - base_)),
        step_(static_cast<float>(step)),
        low_(static_cast<float>(0.0001 - base_)),
        high_(static_cast<float>(highest - base_)),
        last_(size - 2) {}

  HWY_INLINE VF Step(VF index) const { return hn::Mul(index, hn::Set(DF(), step_)); }
  HWY_INLINE void Place(VF offset, std::int32_t* HWY_RESTRICT whole,
                        float* HWY_RESTRICT fraction) const {
    const DF d;
    const DI di;
    auto p = hn::Add(hn::Set(d, first_), offset);
    const auto low = hn::Set(d, low_), high = hn::Set(d, high_);
    p = hn::IfThenElse(hn::Ge(p, low), p, low);  // not a number fails
    p = hn::IfThenElse(hn::Le(p, high), p, high);
    const auto floor = hn::Floor(p);
    // 1.5 * 2^23 has room for both signs.
    const auto bits = hn::BitCast(di, hn::Add(floor, hn::Set(d, 1.5f * whole_bits)));
    const auto i = hn::Add(bits, hn::Set(di, static_cast<std::int32_t>(base_) - 0x4B400000));
    hn::StoreU(hn::Min(hn::Max(i, hn::Zero(di)), hn::Set(di, last_)), di, whole);
    hn::StoreU(hn::Sub(p, floor), d, fraction);
  }

 private:
  double base_;
  float first_, step_, low_, high_;
  std::int32_t last_;
};

template <class Pixel>
HWY_INLINE void Locate(const source_plane& source, const source_run<Pixel>& run, Stretch& s) {
  const DF d;
  const int lanes = static_cast<int>(hn::Lanes(d));
  const Axis x(run.x, run.dx, source.max_x, source.width);
  const Axis y(run.y, run.dy, source.max_y, source.height);
  const float g = static_cast<float>(run.g);
  auto index = hn::Iota(d, 0.0f);
  const auto next = hn::Set(d, static_cast<float>(lanes));
  // slowed(k) makes of a step to pixel k, on either axis, what the projection leaves of it.
  const auto each = [&](const auto& slowed) HWY_ATTR {
    for (int k = s.count; k < s.count + run.count; k += lanes) {
      const auto offset = slowed(index);
      x.Place(offset(x.Step(index)), s.ix + k, s.fx + k);
      y.Place(offset(y.Step(index)), s.iy + k, s.fy + k);
      index = hn::Add(index, next);
    }
  };
  const auto divisor = [&](VF k) HWY_ATTR {
    return hn::Add(hn::Set(d, 1.0f), hn::Mul(hn::Set(d, g), k));
  };
  if (g == 0) {
    each([](VF) HWY_ATTR { return [](VF step) HWY_ATTR { return step; }; });
#if HWY_ARCH_X86 && HWY_TARGET <= HWY_AVX2  // with a fused product
  } else if (std::fabs(g) * max_run <= 0.25f) {
    // One division for both axes: a quotient's remainder, which a fused product leaves exact,
    // rounds it as a division does (Markstein, Computation of elementary functions on the IBM RISC
    // System/6000 processor, 1990). That asks for a divisor whose reciprocal is a normal number.
    each([&](VF k) HWY_ATTR {
      const auto by = divisor(k);
      const auto reciprocal = hn::Div(hn::Set(d, 1.0f), by);
      return [=](VF step) HWY_ATTR {
        const auto quotient = hn::Mul(step, reciprocal);
        return hn::MulAdd(hn::NegMulAdd(quotient, by, step), reciprocal, quotient);
      };
    });
#endif
  } else {
    each([&](VF k) HWY_ATTR {
      const auto by = divisor(k);
      return [=](VF step) HWY_ATTR { return hn::Div(step, by); };
    });
  }
  s.count += run.count;
}

// Low and high halves of the 64-bit words at p plus the offsets of a vector's pixels.
HWY_INLINE void Words(const unsigned char* p, VOffset lower, VOffset upper, VU& low, VU& high) {
  const auto* base = reinterpret_cast<const std::uint64_t*>(p);
  const auto first = hn::BitCast(DU(), hn::GatherOffset(D64(), base, lower));
  const auto second = hn::BitCast(DU(), hn::GatherOffset(D64(), base, upper));
  low = hn::ConcatEven(DU(), second, first);
  high = hn::ConcatOdd(DU(), second, first);
}

// Lane j is lane place[j] of the vectors `first` and `second`, one behind the other.
HWY_INLINE VU LookUp(VU first, VU second, VU place) {
#if HWY_ARCH_X86 && HWY_TARGET <= HWY_AVX3  // one instruction, which the library doesn't offer
  return VU{_mm512_permutex2var_epi32(first.raw, place.raw, second.raw)};
#else
  const DU d;
  const auto last = hn::Set(d, static_cast<std::uint32_t>(hn::Lanes(d) - 1));
  const auto lane = hn::IndicesFromVec(d, hn::And(place, last));
  return hn::IfThenElse(hn::Gt(place, last), hn::TableLookupLanes(second, lane),
                        hn::TableLookupLanes(first, lane));
#endif
}

// Corners a b above c d of pixels of 32 bits, or false: where the source positions lie close
// together in a row or two, as they do in a warp near the identity, whole loads and lookups take
// the place of gathers.
HWY_INLINE bool Corners(const source_plane& source, const std::int32_t* ix, const std::int32_t* iy,
                        VU& a, VU& b, VU& c, VU& e) {
  const DI di;
  const DU du;
  const int lanes = static_cast<int>(hn::Lanes(di));
  const std::int32_t left = ix[0];
  const std::int32_t top = std::min(iy[0], iy[lanes - 1]);
  if (left > source.width - 2 * lanes) return false;
  const auto place = hn::BitCast(du, hn::Sub(hn::Load(di, ix), hn::Set(di, left)));
  const auto row = hn::BitCast(du, hn::Sub(hn::Load(di, iy), hn::Set(di, top)));
  const auto near = hn::And(hn::Lt(place, hn::Set(du, static_cast<std::uint32_t>(2 * lanes - 1))),
                            hn::Lt(row, hn::Set(du, 2)));
  if (!hn::AllTrue(du, near)) return false;
  const auto right_place = hn::Add(place, hn::Set(du, 1));
  const hn::Repartition<std::uint8_t, DU> bytes;
  const unsigned char* p = source.data + top * source.row_bytes + 4 * std::ptrdiff_t{left};
  const auto of_row = [&](int r, VU& at_left, VU& at_right) HWY_ATTR {
    const unsigned char* pixels = p + r * source.row_bytes;
    const auto first = hn::BitCast(du, hn::LoadU(bytes, pixels));
    const auto second = hn::BitCast(du, hn::LoadU(bytes, pixels + 4 * lanes));
    at_left = LookUp(first, second, place);
    at_right = LookUp(first, second, right_place);
  };
  of_row(0, a, b);
  of_row(1, c, e);
  const auto lower = hn::Eq(row, hn::Set(du, 1));
  if (hn::AllFalse(du, lower)) return true;
  VU below_left, below_right;
  of_row(2, below_left, below_right);
  a = hn::IfThenElse(lower, c, a);
  b = hn::IfThenElse(lower, e, b);
  c = hn::IfThenElse(lower, below_left, c);
  e = hn::IfThenElse(lower, below_right, e);
  return true;
}

// The whole part of 0 <= v < 2^31.
HWY_INLINE VI Whole(VF v) {
#if HWY_ARCH_X86 && HWY_TARGET <= HWY_AVX3  // the library's also looks for what is out of range
  return VI{_mm512_cvttps_epi32(v.raw)};
#elif HWY_TARGET == HWY_AVX2
  return VI{_mm256_cvttps_epi32(v.raw)};
#else
  return hn::ConvertTo(DI(), v);
#endif
}

// The whole part of 0 <= v < 2^31, as a float.
HWY_INLINE VF Truncated(VF v) {
#if HWY_ARCH_X86 && HWY_TARGET > HWY_SSE4  // has no instruction for it
  return hn::ConvertTo(DF(), Whole(v));
#else
  return hn::Floor(v);
#endif
}

HWY_INLINE VF PlusHalf(VF v) {
  return hn::Add(v, hn::Set(DF(), 0.5f));
}

HWY_INLINE VU Bits(VF whole) {
  return hn::BitCast(DU(), hn::Add(whole, hn::Set(DF(), whole_bits)));
}

HWY_INLINE VF Lanes(VU v) {
  return hn::ConvertTo(DF(), hn::BitCast(DI(), v));
}

template <bool kRounds>
HWY_INLINE VF Stored(VF v) {
  if constexpr (kRounds) v = Truncated(PlusHalf(v));
  return v;
}

// The interpolation at t = 1 - s between pixels of the alphas a and b. Where these are equal, what
// weighs a colour is the fraction alone.
template <bool kRounds>
class Weights {
 public:
  HWY_INLINE Weights(VF a, VF b, VF s, VF t)
      : p_(hn::Mul(a, s)), q_(hn::Mul(b, t)), alpha_(hn::Add(p_, q_)) {
    const DF d;
    const auto equal = hn::Eq(a, b);
    p_ = hn::IfThenElse(equal, s, p_);
    q_ = hn::IfThenElse(equal, t, q_);
    divisor_ = hn::IfThenElse(equal, hn::Set(d, 1.0f), alpha_);
    nothing_ = hn::Eq(alpha_, hn::Zero(d));
  }
  HWY_INLINE VF Alpha() const { return Shown(alpha_); }
  HWY_INLINE VF Colour(VF p, VF q) const {
    return Shown(hn::Div(hn::Add(hn::Mul(p, p_), hn::Mul(q, q_)), divisor_));
  }

 private:
  HWY_INLINE VF Shown(VF v) const { return hn::IfThenZeroElse(nothing_, Stored<kRounds>(v)); }

  VF p_, q_, alpha_, divisor_;
  Mask nothing_;
};

// Pixels of 8 bits. A vector holds one channel of as many pixels as it has lanes, so that opaque
// pixels need no work for their alpha and weights no spreading over channels.

template <int channel>
HWY_INLINE VF Channel(VU pixels) {
  if constexpr (channel == 3) return Lanes(hn::ShiftRight<24>(pixels));
  return Lanes(hn::And(hn::ShiftRight<8 * channel>(pixels), hn::Set(DU(), 255)));
}

HWY_INLINE bool OneAlpha(VU a, VU b, VU c, VU e) {
  const auto differ = hn::Or(hn::Xor(a, b), hn::Or(hn::Xor(a, c), hn::Xor(a, e)));
  return hn::AllTrue(DU(), hn::Eq(hn::And(differ, hn::Set(DU(), 255)), hn::Zero(DU())));
}

// The samples of pixels with one alpha for all four corners. Red and green are not shifted down: as
// 2^8 and 2^16 of themselves, with weights as much smaller, they make the very same products.
HWY_INLINE VU SampleOneAlpha(VU a, VU b, VU c, VU e, VF sx, VF tx, VF sy, VF ty) {
  const DF d;
  const auto between = [&](VF p, VF q, VF s, VF t)
                           HWY_ATTR { return PlusHalf(hn::Add(hn::Mul(p, s), hn::Mul(q, t))); };
  const auto sample = [&](const auto& channel, VF s, VF t) HWY_ATTR {
    const auto left = Truncated(between(channel(a), channel(c), s, t));
    const auto right = Truncated(between(channel(b), channel(e), s, t));
    return hn::BitCast(DU(), Whole(between(left, right, sx, tx)));
  };
  const auto down8 = hn::Set(d, 1.0f / 256), down16 = hn::Set(d, 1.0f / 65536);
  const auto red = sample([](VU v) HWY_ATTR { return Lanes(hn::And(v, hn::Set(DU(), 0xFF00))); },
                          hn::Mul(sy, down8), hn::Mul(ty, down8));
  const auto green =
      sample([](VU v) HWY_ATTR { return Lanes(hn::And(v, hn::Set(DU(), 0xFF0000))); },
             hn::Mul(sy, down16), hn::Mul(ty, down16));
  const auto blue = sample([](VU v) HWY_ATTR { return Lanes(hn::ShiftRight<24>(v)); }, sy, ty);
  const auto alpha = hn::And(a, hn::Set(DU(), 255));
  const auto packed = hn::Or(hn::Or(alpha, hn::ShiftLeft<8>(red)),
                             hn::Or(hn::ShiftLeft<16>(green), hn::ShiftLeft<24>(blue)));
  return hn::IfThenZeroElse(hn::Eq(alpha, hn::Zero(DU())), packed);
}

HWY_INLINE VU SampleWeighted(VU a, VU b, VU c, VU e, VF sx, VF tx, VF sy, VF ty) {
  const Weights<true> left(Channel<0>(a), Channel<0>(c), sy, ty);
  const Weights<true> right(Channel<0>(b), Channel<0>(e), sy, ty);
  const Weights<true> both(left.Alpha(), right.Alpha(), sx, tx);
  const auto colour = [&](auto i) HWY_ATTR {
    constexpr int channel = decltype(i)::value;
    return Bits(both.Colour(left.Colour(Channel<channel>(a), Channel<channel>(c)),
                            right.Colour(Channel<channel>(b), Channel<channel>(e))));
  };
  const auto red = colour(std::integral_constant<int, 1>());
  const auto green = colour(std::integral_constant<int, 2>());
  const auto blue = colour(std::integral_constant<int, 3>());
  // What lies above a channel's bits is shifted out or covered.
  return hn::Or(hn::Or(hn::ShiftLeft<16>(green), hn::ShiftLeft<24>(blue)),
                hn::Or(hn::And(Bits(both.Alpha()), hn::Set(DU(), 255)),
                       hn::ShiftRight<16>(hn::ShiftLeft<24>(red))));
}

// Corners a b above c e by gathers, wherever they lie.
HWY_INLINE void GatherCorners(const source_plane& source, VI ix, VI iy, VU& a, VU& b, VU& c,
                              VU& e) {
  const DI di;
  const DOffset dofs;
  const hn::Half<DI> half;
  const auto row_bytes = hn::Set(di, static_cast<std::int32_t>(source.row_bytes));
  const auto pixel_bytes = hn::Set(di, static_cast<std::int32_t>(sizeof(HX_Pixel8)));
  const auto offset = [&](auto x, auto y) HWY_ATTR {
    const auto bytes = [&](auto v, auto unit) HWY_ATTR {
      return hn::MulEven(hn::BitCast(di, hn::PromoteTo(dofs, v)), unit);
    };
    return hn::Add(bytes(y, row_bytes), bytes(x, pixel_bytes));
  };
  const auto lower = offset(hn::LowerHalf(half, ix), hn::LowerHalf(half, iy));
  const auto upper = offset(hn::UpperHalf(half, ix), hn::UpperHalf(half, iy));
  Words(source.data, lower, upper, a, b);
  Words(source.data + source.row_bytes, lower, upper, c, e);
}

// The lanes of the last vector that are left over repeat the last pixel.
HWY_INLINE void RepeatLast(Stretch& s) {
  for (std::int32_t* whole : {s.ix, s.iy}) {
    hn::StoreU(hn::Set(DI(), whole[s.count - 1]), DI(), whole + s.count);
  }
  for (float* part : {s.fx, s.fy}) hn::StoreU(hn::Zero(DF()), DF(), part + s.count);
}

HWY_INLINE void Sample(const source_plane& source, Stretch& s, HX_Pixel8*) {
  const DF d;
  const DI di;
  const hn::Repartition<std::uint8_t, DF> bytes;
  const int lanes = static_cast<int>(hn::Lanes(d));
  for (int k = 0; k < s.count; k += lanes) {
    VU a, b, c, e;
    if (!Corners(source, s.ix + k, s.iy + k, a, b, c, e)) {
      GatherCorners(source, hn::Load(di, s.ix + k), hn::Load(di, s.iy + k), a, b, c, e);
    }
    const auto tx = hn::Load(d, s.fx + k), ty = hn::Load(d, s.fy + k);
    const auto sx = hn::Sub(hn::Set(d, 1.0f), tx), sy = hn::Sub(hn::Set(d, 1.0f), ty);
    const auto sample =
        hn::BitCast(bytes, OneAlpha(a, b, c, e) ? SampleOneAlpha(a, b, c, e, sx, tx, sy, ty)
                                                : SampleWeighted(a, b, c, e, sx, tx, sy, ty));
    unsigned char* out = s.out + std::ptrdiff_t{4} * k;
    if (k + lanes <= s.count) {
      hn::StoreU(sample, bytes, out);
    } else {
      HWY_ALIGN unsigned char rest[4 * max_lanes];
      hn::Store(sample, bytes, rest);
      std::memcpy(out, rest, std::size_t{4} * static_cast<std::size_t>(s.count - k));
    }
  }
}

// Deeper pixels. A vector holds the four channels of a few pixels as they lie in memory: pixels
// that neighbour each other come in one load, where gathers would fetch each by itself.

constexpr int group = static_cast<int>(hn::MaxLanes(DF())) / 4;  // pixels of a vector

HWY_INLINE VF LoadFloats(const unsigned char* pixels, HX_PixelFloat*) {
  const hn::Repartition<std::uint8_t, DF> bytes;
  return hn::BitCast(DF(), hn::LoadU(bytes, pixels));
}

HWY_INLINE VF LoadFloats(const unsigned char* pixels, HX_Pixel16*) {
  const hn::Rebind<std::uint16_t, DF> words;
  const hn::Repartition<std::uint8_t, decltype(words)> bytes;
  const auto raw = hn::BitCast(words, hn::LoadU(bytes, pixels));
  return hn::ConvertTo(DF(), hn::PromoteTo(DI(), raw));
}

HWY_INLINE void StoreFloats(VF v, unsigned char* pixels, HX_PixelFloat*) {
  const hn::Repartition<std::uint8_t, DF> bytes;
  hn::StoreU(hn::BitCast(bytes, v), bytes, pixels);
}

HWY_INLINE void StoreFloats(VF v, unsigned char* pixels, HX_Pixel16*) {
  const hn::Rebind<std::uint16_t, DF> words;
  const hn::Repartition<std::uint8_t, decltype(words)> bytes;
  hn::StoreU(hn::BitCast(bytes, hn::DemoteTo(words, Whole(v))), bytes, pixels);
}

template <class Pixel>
HWY_INLINE void Sample(const source_plane& source, Stretch& s, Pixel* kind) {
  constexpr bool kRounds = std::is_same_v<Pixel, HX_Pixel16>;
  constexpr std::ptrdiff_t kBytes = sizeof(Pixel);
  const DF d;
  const DI di;
  const DU du;
  const hn::CappedTag<std::int32_t, group> dgroup;
  // Lane 4 j + i is channel i of pixel j.
  const auto lane = hn::Iota(du, 0);
  const auto channel = hn::And(lane, hn::Set(du, 3));
  const auto of_pixel = hn::IndicesFromVec(d, hn::ShiftRight<2>(lane));
  const auto alpha_lanes = hn::RebindMask(d, hn::Eq(channel, hn::Zero(du)));
  const auto spread = [&](VF of_pixels)
                          HWY_ATTR { return hn::TableLookupLanes(of_pixels, of_pixel); };

  for (int k = 0; k < s.count; k += group) {
    const std::int32_t* ix = s.ix + k;
    const std::int32_t* iy = s.iy + k;
    VF a, b, c, e;  // corners a b above c e
    const auto place = hn::Sub(hn::LoadU(dgroup, ix), hn::Set(dgroup, ix[0]));
    const auto strays = hn::Or(hn::AndNot(hn::Set(dgroup, group - 1), place),
                               hn::Xor(hn::LoadU(dgroup, iy), hn::Set(dgroup, iy[0])));
    if (ix[0] + group < source.width && hn::AllTrue(dgroup, hn::Eq(strays, hn::Zero(dgroup)))) {
      const unsigned char* p = source.data + iy[0] * source.row_bytes + ix[0] * kBytes;
      const auto places = hn::BitCast(d, hn::Sub(hn::LoadU(di, ix), hn::Set(di, ix[0])));
      const auto from = hn::IndicesFromVec(
          d, hn::Add(hn::ShiftLeft<2>(hn::BitCast(du, spread(places))), channel));
      const auto at = [&](const unsigned char* pixels)
                          HWY_ATTR { return hn::TableLookupLanes(LoadFloats(pixels, kind), from); };
      a = at(p);
      b = at(p + kBytes);
      c = at(p + source.row_bytes);
      e = at(p + source.row_bytes + kBytes);
    } else {
      HWY_ALIGN unsigned char corners[4][group * kBytes];
      for (int j = 0; j < group; ++j) {
        const unsigned char* p = source.data + iy[j] * source.row_bytes + ix[j] * kBytes;
        std::memcpy(corners[0] + j * kBytes, p, kBytes);
        std::memcpy(corners[1] + j * kBytes, p + kBytes, kBytes);
        std::memcpy(corners[2] + j * kBytes, p + source.row_bytes, kBytes);
        std::memcpy(corners[3] + j * kBytes, p + source.row_bytes + kBytes, kBytes);
      }
      a = LoadFloats(corners[0], kind);
      b = LoadFloats(corners[1], kind);
      c = LoadFloats(corners[2], kind);
      e = LoadFloats(corners[3], kind);
    }
    const auto tx = spread(hn::LoadU(d, s.fx + k)), ty = spread(hn::LoadU(d, s.fy + k));
    const auto sx = hn::Sub(hn::Set(d, 1.0f), tx), sy = hn::Sub(hn::Set(d, 1.0f), ty);

    // Where the four alphas of each pixel are one, and not 0, no weight depends on them.
    const auto one =
        hn::And(hn::And(hn::Eq(a, b), hn::Eq(a, c)), hn::And(hn::Eq(a, e), hn::Ne(a, hn::Zero(d))));
    VF sample;
    if (hn::AllFalse(d, hn::AndNot(one, alpha_lanes))) {
      const auto between = [](VF p, VF q, VF s_, VF t)
                               HWY_ATTR { return hn::Add(hn::Mul(p, s_), hn::Mul(q, t)); };
      sample = between(Stored<kRounds>(between(a, c, sy, ty)),
                       Stored<kRounds>(between(b, e, sy, ty)), sx, tx);
      if constexpr (kRounds) sample = PlusHalf(sample);  // storing truncates
    } else {
      const auto mixed = [&](VF p, VF q, VF s_, VF t) HWY_ATTR {
        const Weights<kRounds> weights(hn::Broadcast<0>(p), hn::Broadcast<0>(q), s_, t);
        return hn::IfThenElse(alpha_lanes, weights.Alpha(), weights.Colour(p, q));
      };
      sample = mixed(mixed(a, c, sy, ty), mixed(b, e, sy, ty), sx, tx);
    }
    unsigned char* out = s.out + kBytes * k;
    if (k + group <= s.count) {
      StoreFloats(sample, out, kind);
    } else {
      HWY_ALIGN unsigned char rest[group * kBytes];
      StoreFloats(sample, rest, kind);
      std::memcpy(out, rest, static_cast<std::size_t>(kBytes * (s.count - k)));
    }
  }
}

template <class Pixel>
HWY_INLINE void Runs(const source_plane& source, const source_run<Pixel>* runs, std::size_t n) {
  Stretch s;
  Pixel* end = nullptr;
  const auto sample = [&] HWY_ATTR {
    RepeatLast(s);
    Sample(source, s, end);
    s.count = 0;
  };
  for (std::size_t i = 0; i < n; ++i) {
    const auto& run = runs[i];
    if (s.count > 0 && (run.out != end || s.count + run.count > max_stretch)) {
      sample();
    }
    if (s.count == 0) s.out = reinterpret_cast<unsigned char*>(run.out);
    Locate(source, run, s);
    end = run.out + run.count;
  }
  if (s.count > 0) sample();
}

void Runs8(const source_plane& source, const source_run<HX_Pixel8>* runs, std::size_t n) {
  Runs(source, runs, n);
}
void Runs16(const source_plane& source, const source_run<HX_Pixel16>* runs, std::size_t n) {
  Runs(source, runs, n);
}
void RunsFloat(const source_plane& source, const source_run<HX_PixelFloat>* runs, std::size_t n) {
  Runs(source, runs, n);
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::render::sampling
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::render {
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

}  // namespace marrow::render
#endif
