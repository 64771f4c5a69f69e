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
namespace sampling {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// A vector holds one channel of as many pixels as it has lanes, so that opaque pixels need no work
// for their alpha and weights no spreading over channels.
using DF = hn::CappedTag<float, 16>;
using DU = hn::RebindToUnsigned<DF>;
using DI = hn::RebindToSigned<DF>;
using D64 = hn::Repartition<std::uint64_t, DF>;
using DOffset = hn::RebindToSigned<D64>;
using VF = hn::Vec<DF>;
using VU = hn::Vec<DU>;
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
HWY_INLINE hn::Vec<DI> Whole(VF v) {
#if HWY_ARCH_X86 && HWY_TARGET <= HWY_AVX3  // the library's also looks for what is out of range
  return hn::Vec<DI>{_mm512_cvttps_epi32(v.raw)};
#elif HWY_TARGET == HWY_AVX2
  return hn::Vec<DI>{_mm256_cvttps_epi32(v.raw)};
#else
  return hn::ConvertTo(DI(), v);
#endif
}

HWY_INLINE VF Rounded(VF v) {  // 0 <= v < 2^31
  return hn::ConvertTo(DF(), Whole(hn::Add(v, hn::Set(DF(), 0.5f))));
}

HWY_INLINE VU Bits(VF whole) {
  return hn::BitCast(DU(), hn::Add(whole, hn::Set(DF(), whole_bits)));
}

HWY_INLINE VF Lanes(VU v) {
  return hn::ConvertTo(DF(), hn::BitCast(DI(), v));
}

// A depth: how neighbours are read into raw channels, up to four vectors a pixel, how these become
// f32 and how samples are written. Channel 0 is alpha.
struct Depth8 {
  using Pixel = HX_Pixel8;
  static constexpr bool rounds = true;
  static HWY_INLINE void Load(const unsigned char* p, VOffset lower, VOffset upper, VU& left, VU&,
                              VU&, VU&, VU& right, VU&, VU&, VU&) {
    Words(p, lower, upper, left, right);
  }
  template <int channel>
  static HWY_INLINE VF Channel(VU r0, VU, VU, VU) {
    if constexpr (channel == 3) return Lanes(hn::ShiftRight<24>(r0));
    return Lanes(hn::And(hn::ShiftRight<8 * channel>(r0), hn::Set(DU(), 255)));
  }
  static HWY_INLINE bool OneAlpha(VU a, VU b, VU c, VU d) {
    const auto differ = hn::Or(hn::Xor(a, b), hn::Or(hn::Xor(a, c), hn::Xor(a, d)));
    return hn::AllTrue(DU(), hn::Eq(hn::And(differ, hn::Set(DU(), 255)), hn::Zero(DU())));
  }
  // The samples of pixels with one alpha for all four corners. Red and green are not
  // shifted down: as 2^8 and 2^16 of themselves, with weights as much smaller, they make the very
  // same products.
  static HWY_INLINE void StoreOneAlpha(VU a, VU b, VU c, VU e, VF sx, VF tx, VF sy, VF ty,
                                       unsigned char* out) {
    const DF d;
    const auto between = [&](VF p, VF q, VF s, VF t) HWY_ATTR {
      const auto v = hn::Add(hn::Mul(p, s), hn::Mul(q, t));
      return Whole(hn::Add(v, hn::Set(d, 0.5f)));
    };
    const auto sample = [&](const auto& channel, VF s, VF t) HWY_ATTR {
      const auto left = hn::ConvertTo(d, between(channel(a), channel(c), s, t));
      const auto right = hn::ConvertTo(d, between(channel(b), channel(e), s, t));
      return hn::BitCast(DU(), between(left, right, sx, tx));
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
    const auto shown = hn::IfThenZeroElse(hn::Eq(alpha, hn::Zero(DU())), packed);
    const hn::Repartition<std::uint8_t, DF> bytes;
    hn::StoreU(hn::BitCast(bytes, shown), bytes, out);
  }
  static HWY_INLINE void Store(VF alpha, VF red, VF green, VF blue, unsigned char* out) {
    // What lies above a channel's bits is shifted out or covered.
    const auto upper = hn::Or(hn::ShiftLeft<16>(Bits(green)), hn::ShiftLeft<24>(Bits(blue)));
    const auto lower = hn::Or(hn::And(Bits(alpha), hn::Set(DU(), 255)),
                              hn::ShiftRight<16>(hn::ShiftLeft<24>(Bits(red))));
    const hn::Repartition<std::uint8_t, DF> bytes;
    hn::StoreU(hn::BitCast(bytes, hn::Or(upper, lower)), bytes, out);
  }
};

struct Depth16 {
  using Pixel = HX_Pixel16;
  static constexpr bool rounds = true;
  static HWY_INLINE void Load(const unsigned char* p, VOffset lower, VOffset upper, VU& left0,
                              VU& left1, VU&, VU&, VU& right0, VU& right1, VU&, VU&) {
    Words(p, lower, upper, left0, left1);
    Words(p + sizeof(Pixel), lower, upper, right0, right1);
  }
  template <int channel>
  static HWY_INLINE VF Channel(VU r0, VU r1, VU, VU) {
    const VU r = channel < 2 ? r0 : r1;
    if constexpr (channel % 2 == 1) return Lanes(hn::ShiftRight<16>(r));
    return Lanes(hn::And(r, hn::Set(DU(), 65535)));
  }
  static HWY_INLINE bool OneAlpha(VU a, VU b, VU c, VU d) {
    const auto differ = hn::Or(hn::Xor(a, b), hn::Or(hn::Xor(a, c), hn::Xor(a, d)));
    return hn::AllTrue(DU(), hn::Eq(hn::And(differ, hn::Set(DU(), 65535)), hn::Zero(DU())));
  }
  static HWY_INLINE void Store(VF alpha, VF red, VF green, VF blue, unsigned char* out) {
    const auto mask = hn::Set(DU(), 65535);
    hn::StoreInterleaved2(hn::Or(hn::And(Bits(alpha), mask), hn::ShiftLeft<16>(Bits(red))),
                          hn::Or(hn::And(Bits(green), mask), hn::ShiftLeft<16>(Bits(blue))), DU(),
                          reinterpret_cast<std::uint32_t*>(out));
  }
};

struct DepthFloat {
  using Pixel = HX_PixelFloat;
  static constexpr bool rounds = false;
  static HWY_INLINE void Load(const unsigned char* p, VOffset lower, VOffset upper, VU& left0,
                              VU& left1, VU& left2, VU& left3, VU& right0, VU& right1, VU& right2,
                              VU& right3) {
    Words(p, lower, upper, left0, left1);
    Words(p + 8, lower, upper, left2, left3);
    Words(p + 16, lower, upper, right0, right1);
    Words(p + 24, lower, upper, right2, right3);
  }
  template <int channel>
  static HWY_INLINE VF Channel(VU r0, VU r1, VU r2, VU r3) {
    return hn::BitCast(DF(), channel == 0 ? r0 : channel == 1 ? r1 : channel == 2 ? r2 : r3);
  }
  static HWY_INLINE bool OneAlpha(VU a, VU b, VU c, VU d) {
    const auto first = hn::BitCast(DF(), a);
    const auto as_first = [&](VU other)
                              HWY_ATTR { return hn::Eq(first, hn::BitCast(DF(), other)); };
    return hn::AllTrue(DF(), hn::And(as_first(b), hn::And(as_first(c), as_first(d))));
  }
  static HWY_INLINE void Store(VF alpha, VF red, VF green, VF blue, unsigned char* out) {
    hn::StoreInterleaved4(alpha, red, green, blue, DF(), reinterpret_cast<float*>(out));
  }
};

template <class Depth>
HWY_INLINE VF Between(VF p, VF q, VF s, VF t) {
  const auto v = hn::Add(hn::Mul(p, s), hn::Mul(q, t));
  if constexpr (Depth::rounds) {
    return Rounded(v);
  } else {
    return v;
  }
}

// The interpolation at t = 1 - s between pixels of the alphas a and b. Where these are equal, what
// weighs a colour is the fraction alone.
template <class Depth>
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
  HWY_INLINE VF Alpha() const { return Stored(alpha_); }
  HWY_INLINE VF Colour(VF p, VF q) const {
    return Stored(hn::Div(hn::Add(hn::Mul(p, p_), hn::Mul(q, q_)), divisor_));
  }

 private:
  HWY_INLINE VF Stored(VF v) const {
    if constexpr (Depth::rounds) v = Rounded(v);
    return hn::IfThenZeroElse(nothing_, v);
  }

  VF p_, q_, alpha_, divisor_;
  Mask nothing_;
};

template <class Depth>
HWY_INLINE void Sample(const source_plane& source, Stretch& s) {
  using Pixel = typename Depth::Pixel;
  const DF d;
  const DI di;
  const DOffset dofs;
  const hn::Half<DI> half;
  const int lanes = static_cast<int>(hn::Lanes(d));
  const auto row_bytes = hn::Set(di, static_cast<std::int32_t>(source.row_bytes));
  const auto pixel_bytes = hn::Set(di, static_cast<std::int32_t>(sizeof(Pixel)));
  const unsigned char* below = source.data + source.row_bytes;
  // The lanes of the last vector that are left over repeat the last pixel.
  for (std::int32_t* whole : {s.ix, s.iy}) {
    hn::StoreU(hn::Set(di, whole[s.count - 1]), di, whole + s.count);
  }
  for (float* part : {s.fx, s.fy}) hn::StoreU(hn::Zero(d), d, part + s.count);

  for (int k = 0; k < s.count; k += lanes) {
    // Corners a b above c d.
    VU a0, a1, a2, a3, b0, b1, b2, b3, c0, c1, c2, c3, d0, d1, d2, d3;
    a0 = a1 = a2 = a3 = b0 = b1 = b2 = b3 = hn::Zero(DU());
    c0 = c1 = c2 = c3 = d0 = d1 = d2 = d3 = hn::Zero(DU());
    bool loaded = false;
    if constexpr (sizeof(Pixel) == 4) {
      loaded = Corners(source, s.ix + k, s.iy + k, a0, b0, c0, d0);
    }
    if (!loaded) {
      const auto ix = hn::Load(di, s.ix + k), iy = hn::Load(di, s.iy + k);
      const auto offset = [&](auto x, auto y) HWY_ATTR {
        const auto bytes = [&](auto v, auto unit) HWY_ATTR {
          return hn::MulEven(hn::BitCast(di, hn::PromoteTo(dofs, v)), unit);
        };
        return hn::Add(bytes(y, row_bytes), bytes(x, pixel_bytes));
      };
      const auto lower = offset(hn::LowerHalf(half, ix), hn::LowerHalf(half, iy));
      const auto upper = offset(hn::UpperHalf(half, ix), hn::UpperHalf(half, iy));
      Depth::Load(source.data, lower, upper, a0, a1, a2, a3, b0, b1, b2, b3);
      Depth::Load(below, lower, upper, c0, c1, c2, c3, d0, d1, d2, d3);
    }
    const auto tx = hn::Load(d, s.fx + k), ty = hn::Load(d, s.fy + k);
    const auto sx = hn::Sub(hn::Set(d, 1.0f), tx), sy = hn::Sub(hn::Set(d, 1.0f), ty);

    unsigned char* out = s.out + static_cast<std::ptrdiff_t>(sizeof(Pixel)) * k;
    HWY_ALIGN unsigned char rest[max_lanes * sizeof(Pixel)];
    unsigned char* to = k + lanes <= s.count ? out : rest;
    VF red, green, blue;
    const auto of_channels = [&](const auto& sample) HWY_ATTR {
      const auto channel = [&](auto i) HWY_ATTR {
        return sample(
            Depth::template Channel<i>(a0, a1, a2, a3), Depth::template Channel<i>(b0, b1, b2, b3),
            Depth::template Channel<i>(c0, c1, c2, c3), Depth::template Channel<i>(d0, d1, d2, d3));
      };
      red = channel(std::integral_constant<int, 1>());
      green = channel(std::integral_constant<int, 2>());
      blue = channel(std::integral_constant<int, 3>());
    };
    if (!Depth::OneAlpha(a0, b0, c0, d0)) {
      const Weights<Depth> left(Depth::template Channel<0>(a0, a1, a2, a3),
                                Depth::template Channel<0>(c0, c1, c2, c3), sy, ty);
      const Weights<Depth> right(Depth::template Channel<0>(b0, b1, b2, b3),
                                 Depth::template Channel<0>(d0, d1, d2, d3), sy, ty);
      const Weights<Depth> both(left.Alpha(), right.Alpha(), sx, tx);
      of_channels([&](VF a, VF b, VF c, VF e)
                      HWY_ATTR { return both.Colour(left.Colour(a, c), right.Colour(b, e)); });
      Depth::Store(both.Alpha(), red, green, blue, to);
    } else if constexpr (std::is_same_v<Depth, Depth8>) {
      Depth::StoreOneAlpha(a0, b0, c0, d0, sx, tx, sy, ty, to);
    } else {
      const auto sample = [&](VF a, VF b, VF c, VF e) HWY_ATTR {
        return Between<Depth>(Between<Depth>(a, c, sy, ty), Between<Depth>(b, e, sy, ty), sx, tx);
      };
      of_channels(sample);
      auto alpha = Depth::template Channel<0>(a0, a1, a2, a3);
      const auto nothing = hn::Eq(alpha, hn::Zero(d));
      if constexpr (!Depth::rounds) alpha = sample(alpha, alpha, alpha, alpha);
      const auto shown = [&](VF v) HWY_ATTR { return hn::IfThenZeroElse(nothing, v); };
      Depth::Store(shown(alpha), shown(red), shown(green), shown(blue), to);
    }
    if (to == rest) {
      std::memcpy(out, rest, sizeof(Pixel) * static_cast<std::size_t>(s.count - k));
    }
  }
  s.count = 0;
}

template <class Depth>
HWY_INLINE void Runs(const source_plane& source, const source_run<typename Depth::Pixel>* runs,
                     std::size_t n) {
  Stretch s;
  const typename Depth::Pixel* end = nullptr;
  for (std::size_t i = 0; i < n; ++i) {
    const auto& run = runs[i];
    if (s.count > 0 && (run.out != end || s.count + run.count > max_stretch)) {
      Sample<Depth>(source, s);
    }
    if (s.count == 0) s.out = reinterpret_cast<unsigned char*>(run.out);
    Locate(source, run, s);
    end = run.out + run.count;
  }
  if (s.count > 0) Sample<Depth>(source, s);
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
