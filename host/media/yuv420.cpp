#include "host/media/yuv420.h"

#include <algorithm>
#include <bit>

// The target of last resort has to be the emulated 128-bit one, as there are halves of vectors to
// take. The library avoids it under older g++, which miscompile the high halves of its integer
// products (GCC bug 106322); there are none here.
#define HWY_BROKEN_EMU128 0
#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "host/media/yuv420.cpp"
#include <hwy/foreach_target.h>  // IWYU pragma: keep
#include <hwy/highway.h>

#ifndef CALMFRAME_YUV420_ROWS
#define CALMFRAME_YUV420_ROWS
namespace calmframe::media {
namespace {

constexpr int kUpTaps = 4, kDownTaps = 8;
constexpr std::size_t kLineFloats = 16;       // of a cache line and the widest vector
constexpr std::size_t kMargin = kLineFloats;  // before and behind the samples of a row
constexpr int kRing = 16;                     // rows in work, a power of two
constexpr std::size_t kRowsOfRing = 2 * kRing, kRowsBeside = 2;

// Floats from one row of a picture's width to the next.
std::size_t Stride(int width) {
  const auto samples = static_cast<std::size_t>(width);
  return (samples + kLineFloats - 1) / kLineFloats * kLineFloats + 2 * kMargin;
}

// Rows of chroma of full width, in floats, and some beside them.
struct ChromaRows {
  float* memory;
  std::size_t stride;

  float* of(int row, int plane) const {
    return memory +
           (2 * static_cast<std::size_t>(row % kRing) + static_cast<std::size_t>(plane)) * stride +
           kMargin;
  }
  float* beside(std::size_t i) const { return memory + (kRowsOfRing + i) * stride + kMargin; }
};

// A sample's weights, those that it has not 0.
void CopyWeights(const ResamplingTaps& taps, int sample, int size, float* weights) {
  std::fill_n(std::copy_n(taps.of(sample), taps.width, weights),
              static_cast<std::size_t>(size) - taps.width, 0.0f);
}

}  // namespace
}  // namespace calmframe::media
#endif

HWY_BEFORE_NAMESPACE();
namespace calmframe::media {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

using DF = hn::CappedTag<float, 16>;
using DU = hn::RebindToUnsigned<DF>;
using DI = hn::RebindToSigned<DF>;
using D8 = hn::Repartition<std::uint8_t, DF>;
using D16 = hn::Repartition<std::int16_t, DF>;
using VF = hn::Vec<DF>;
using VU = hn::Vec<DU>;
using VI = hn::Vec<DI>;

// The sum of products with the values that load(k) gives, those of even and of odd k apart.
template <int taps, class D, class Load>
HWY_INLINE hn::Vec<D> Weighted(D d, const float* weights, const Load& load) {
  auto even = hn::Mul(hn::Set(d, weights[0]), load(0));
  auto odd = hn::Mul(hn::Set(d, weights[1]), load(1));
  for (int k = 2; k < taps; k += 2) {
    even = hn::MulAdd(hn::Set(d, weights[k]), load(k), even);
    odd = hn::MulAdd(hn::Set(d, weights[k + 1]), load(k + 1), odd);
  }
  return hn::Add(even, odd);
}

// Calls work(first) for vectors that cover a row; the last ends with it.
template <class Work>
HWY_INLINE void Cover(int size, const Work& work) {
  const int lanes = static_cast<int>(hn::Lanes(DF()));
  for (int i = 0; i < size; i += lanes) work(std::min(i, size - lanes));
}

HWY_INLINE VF Units(VU codes, float unit, float zero) {
  const DF d;
  return hn::MulAdd(hn::ConvertTo(d, hn::BitCast(DI(), codes)), hn::Set(d, unit), hn::Set(d, zero));
}

HWY_INLINE VI Nearest(VF v) {               // |v| < 2^31
#if HWY_ARCH_X86 && HWY_TARGET <= HWY_AVX3  // the library's also looks for what is out of range
  return VI{_mm512_cvtps_epi32(v.raw)};
#elif HWY_TARGET == HWY_AVX2
  return VI{_mm256_cvtps_epi32(v.raw)};
#else
  return hn::NearestInt(v);
#endif
}

HWY_INLINE VU LowByte(VU v) {
  return hn::And(v, hn::Set(DU(), 255));
}

// In each block of 128 bits, the bytes of a's lanes, then of b's.
HWY_INLINE hn::Vec<D8> Bytes(hn::Vec<D16> a, hn::Vec<D16> b) {
#if HWY_ARCH_X86 && HWY_TARGET <= HWY_AVX3  // not in the library
  return hn::Vec<D8>{_mm512_packus_epi16(a.raw, b.raw)};
#elif HWY_TARGET == HWY_AVX2
  return hn::Vec<D8>{_mm256_packus_epi16(a.raw, b.raw)};
#else
  const hn::Half<D8> half;
  return hn::Combine(D8(), hn::DemoteTo(half, b), hn::DemoteTo(half, a));
#endif
}

// Opaque pixels of colours of 0 to 255.
HWY_INLINE hn::Vec<D8> Pixels(VF red, VF green, VF blue) {
  const auto first = hn::ReorderDemote2To(D16(), hn::Set(DI(), 255), Nearest(red));
  const auto second = hn::ReorderDemote2To(D16(), Nearest(green), Nearest(blue));
  alignas(16) static constexpr std::uint8_t kPlaces[16] = {0, 4, 8,  12, 1, 5, 9,  13,
                                                           2, 6, 10, 14, 3, 7, 11, 15};
  return hn::TableLookupBytes(Bytes(first, second), hn::LoadDup128(D8(), kPlaces));
}

void WidenRow(const Yuv420::Plan& plan, const std::uint8_t* codes, float* narrow, float* wide) {
  const DF d;
  const hn::Rebind<std::uint8_t, DF> d8;
  const int size = plan.width / 2;
  Cover(size, [&](int i) HWY_ATTR {
    const VU code = hn::PromoteTo(DU(), hn::LoadU(d8, codes + i));
    hn::StoreU(Units(code, plan.chroma_unit, plan.chroma_zero), d, narrow + i);
  });
  const Yuv420::Across& across = plan.up_across;
  Cover(size, [&](int i) HWY_ATTR {
    const auto sample = [&](int phase) HWY_ATTR {
      const float* from = narrow + i + across.first[phase];
      const auto load = [&](int k) HWY_ATTR { return hn::LoadU(d, from + k); };
      return Weighted<kUpTaps>(d, across.weights[phase], load);
    };
    hn::StoreInterleaved2(sample(0), sample(1), d, wide + 2 * i);
  });
  for (const int x : across.ends) {
    const hn::CappedTag<float, 1> d1;
    float weights[kUpTaps];
    CopyWeights(across.taps, x, kUpTaps, weights);
    const float* from = narrow + across.taps.left[static_cast<std::size_t>(x)];
    const auto load = [&](int k) HWY_ATTR { return hn::LoadU(d1, from + k); };
    hn::StoreU(Weighted<kUpTaps>(d1, weights, load), d1, wide + x);
  }
}

void PixelsOf(const Yuv420::Plan& plan, const AVFrame& frame, std::uint8_t* pixels,
              std::ptrdiff_t row_bytes, float* memory) {
  const DF d;
  const hn::Rebind<std::uint8_t, DF> d8;
  const int rows = plan.height / 2;
  const ChromaRows chroma{memory, Stride(plan.width)};
  int made = 0;
  for (int y = 0; y < plan.height; ++y) {
    const int left = plan.up_rows.left[static_cast<std::size_t>(y)];
    const int last = std::min(left + kUpTaps, rows) - 1;
    for (; made <= last; ++made) {
      for (int p = 0; p < 2; ++p) {
        WidenRow(plan, frame.data[1 + p] + std::ptrdiff_t{made} * frame.linesize[1 + p],
                 chroma.beside(0), chroma.of(made, p));
      }
    }
    float weights[kUpTaps];
    CopyWeights(plan.up_rows, y, kUpTaps, weights);
    const float* from[2][kUpTaps];
    for (int k = 0; k < kUpTaps; ++k) {
      for (int p = 0; p < 2; ++p) from[p][k] = chroma.of(std::min(left + k, last), p);
    }
    const std::uint8_t* luma = frame.data[0] + std::ptrdiff_t{y} * frame.linesize[0];
    std::uint8_t* out = pixels + y * row_bytes;
    Cover(plan.width, [&](int i) HWY_ATTR {
      const auto of_plane = [&](int p) HWY_ATTR {
        const auto load = [&](int k) HWY_ATTR { return hn::LoadU(d, from[p][k] + i); };
        return Weighted<kUpTaps>(d, weights, load);
      };
      const auto plus = [&](VF sum, VF part, float factor)
                            HWY_ATTR { return hn::Add(sum, hn::Mul(part, hn::Set(d, factor))); };
      const auto code = [&](VF part) HWY_ATTR { return hn::Mul(part, hn::Set(d, 255.0f)); };
      const VF y_part =
          Units(hn::PromoteTo(DU(), hn::LoadU(d8, luma + i)), plan.luma_unit, plan.luma_zero);
      const VF u = of_plane(0), v = of_plane(1);
      const VF red = plus(y_part, v, plan.red_v), blue = plus(y_part, u, plan.blue_u);
      const VF green = plus(plus(y_part, u, plan.green_u), v, plan.green_v);
      hn::StoreU(Pixels(code(red), code(green), code(blue)), D8(), out + 4 * i);
    });
  }
}

// colour * alpha / 255, rounded. What a division by 255 gives below 65535 is (v + 1 + v / 256) /
// 256.
HWY_INLINE VU OverBlack(VU colour, VU alpha) {
  const DU d;
  const auto v = hn::Add(hn::Mul(colour, alpha), hn::Set(d, 127 + 1));
  return hn::ShiftRight<8>(hn::Add(v, hn::ShiftRight<8>(hn::Sub(v, hn::Set(d, 1)))));
}

// A row's code words of luma, and its chroma in floats.
void ReadRow(const Yuv420::Plan& plan, const std::uint8_t* pixels, std::uint8_t* luma, float* u,
             float* v) {
  const DF d;
  const DU du;
  const hn::Rebind<std::uint8_t, DF> d8;
  Cover(plan.width, [&](int i) HWY_ATTR {
    const VU pixel = hn::BitCast(du, hn::LoadU(D8(), pixels + 4 * i));
    VU red = LowByte(hn::ShiftRight<8>(pixel)), green = LowByte(hn::ShiftRight<16>(pixel));
    VU blue = hn::ShiftRight<24>(pixel);
    const VU alpha = LowByte(pixel);
    if (!hn::AllTrue(du, hn::Eq(alpha, hn::Set(du, 255)))) {
      red = OverBlack(red, alpha);
      green = OverBlack(green, alpha);
      blue = OverBlack(blue, alpha);
    }
    const VF r = Units(red, 1.0f / 255, 0), g = Units(green, 1.0f / 255, 0);
    const VF b = Units(blue, 1.0f / 255, 0);
    const auto sum = [&](const float(&weights)[3]) HWY_ATTR {
      return hn::Add(
          hn::Add(hn::Mul(hn::Set(d, weights[0]), r), hn::Mul(hn::Set(d, weights[1]), g)),
          hn::Mul(hn::Set(d, weights[2]), b));
    };
    const VF code =
        hn::MulAdd(sum(plan.y), hn::Set(d, plan.luma_range), hn::Set(d, plan.luma_black));
    hn::StoreU(hn::DemoteTo(d8, Nearest(code)), d8, luma + i);
    hn::StoreU(sum(plan.u), d, u + i);
    hn::StoreU(sum(plan.v), d, v + i);
  });
}

void CodesOf(const Yuv420::Plan& plan, const std::uint8_t* pixels, std::ptrdiff_t row_bytes,
             const AVFrame& frame, float* memory) {
  const DF d;
  const hn::Rebind<std::uint8_t, DF> d8;
  const int lanes = static_cast<int>(hn::Lanes(d));
  const int size = plan.width / 2, rows = plan.height / 2;
  const ChromaRows chroma{memory, Stride(plan.width)};
  const Yuv420::Across& across = plan.down_across;
  int made = 0;
  for (int row = 0; row < rows; ++row) {
    const int left = plan.down_rows.left[static_cast<std::size_t>(row)];
    const int last = std::min(left + kDownTaps, plan.height) - 1;
    for (; made <= last; ++made) {
      ReadRow(plan, pixels + made * row_bytes,
              frame.data[0] + std::ptrdiff_t{made} * frame.linesize[0], chroma.of(made, 0),
              chroma.of(made, 1));
    }
    float weights[kDownTaps];
    CopyWeights(plan.down_rows, row, kDownTaps, weights);
    for (int p = 0; p < 2; ++p) {
      const float* from[kDownTaps];
      for (int k = 0; k < kDownTaps; ++k) from[k] = chroma.of(std::min(left + k, last), p);
      // Columns of even numbers, and of odd ones.
      float* const joined[2] = {chroma.beside(0), chroma.beside(1)};
      Cover(size, [&](int i) HWY_ATTR {
        const auto sample = [&](int x) HWY_ATTR {
          const auto load = [&](int k) HWY_ATTR { return hn::LoadU(d, from[k] + x); };
          return Weighted<kDownTaps>(d, weights, load);
        };
        const VF first = sample(2 * i), second = sample(2 * i + lanes);
        hn::StoreU(hn::ConcatEven(d, second, first), d, joined[0] + i);
        hn::StoreU(hn::ConcatOdd(d, second, first), d, joined[1] + i);
      });
      const auto column = [&](int x) HWY_ATTR { return joined[x & 1] + (x >> 1); };
      const auto code = [&](auto dx, auto value) HWY_ATTR {
        return hn::MulAdd(value, hn::Set(dx, plan.chroma_range), hn::Set(dx, plan.chroma_grey));
      };
      std::uint8_t* out = frame.data[1 + p] + std::ptrdiff_t{row} * frame.linesize[1 + p];
      const float* columns[kDownTaps];
      for (int k = 0; k < kDownTaps; ++k) columns[k] = column(across.first[0] + k);
      Cover(size, [&](int i) HWY_ATTR {
        const auto load = [&](int k) HWY_ATTR { return hn::LoadU(d, columns[k] + i); };
        const VF value = Weighted<kDownTaps>(d, across.weights[0], load);
        hn::StoreU(hn::DemoteTo(d8, Nearest(code(d, value))), d8, out + i);
      });
      for (const int x : across.ends) {
        const hn::CappedTag<float, 1> d1;
        float of_end[kDownTaps];
        CopyWeights(across.taps, x, kDownTaps, of_end);
        const int begin = across.taps.left[static_cast<std::size_t>(x)];
        const auto load = [&](int k) HWY_ATTR { return hn::LoadU(d1, column(begin + k)); };
        const auto value = code(d1, Weighted<kDownTaps>(d1, of_end, load));
        const hn::Rebind<std::uint8_t, decltype(d1)> byte;
        hn::StoreU(hn::DemoteTo(byte, hn::NearestInt(value)), byte, out + x);
      }
    }
  }
}

}  // namespace HWY_NAMESPACE
}  // namespace calmframe::media
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace calmframe::media {
HWY_EXPORT(PixelsOf);
HWY_EXPORT(CodesOf);
namespace {

Yuv420::Plan PlanOf(int width, int height, const ColourModel& model) {
  // Chroma's place beside the centre of the luma samples that it belongs to, in its own samples.
  const bool centred = model.chroma == AVCHROMA_LOC_CENTER || model.chroma == AVCHROMA_LOC_TOP ||
                       model.chroma == AVCHROMA_LOC_BOTTOM;
  const bool top = model.chroma == AVCHROMA_LOC_TOPLEFT || model.chroma == AVCHROMA_LOC_TOP;
  const bool bottom =
      model.chroma == AVCHROMA_LOC_BOTTOMLEFT || model.chroma == AVCHROMA_LOC_BOTTOM;
  const double x = centred ? 0 : -0.25;
  const double y = top ? -0.25 : bottom ? 0.25 : 0;
  const LumaWeights weights = WeightsOf(model.matrix);
  const double red = weights.red, blue = weights.blue, green = 1 - red - blue;
  const double luma = model.full_range ? 255 : 219, chroma = model.full_range ? 255 : 224;
  const double black = model.full_range ? 0 : 16;
  constexpr double kGrey = 128;
  const auto single = [](double value) { return static_cast<float>(value); };
  return {.width = width,
          .height = height,
          .up_across = {{width / 2, width, -x}, 2, 1},
          .down_across = {{width, width / 2, 2 * x}, 1, 2},
          .up_rows = {height / 2, height, -y},
          .down_rows = {height, height / 2, 2 * y},
          .luma_unit = single(1 / luma),
          .luma_zero = single(-black / luma),
          .chroma_unit = single(1 / chroma),
          .chroma_zero = single(-kGrey / chroma),
          .luma_range = single(luma),
          .luma_black = single(black),
          .chroma_range = single(chroma),
          .chroma_grey = single(kGrey),
          .red_v = single(2 * (1 - red)),
          .green_u = single(-2 * (1 - blue) * blue / green),
          .green_v = single(-2 * (1 - red) * red / green),
          .blue_u = single(2 * (1 - blue)),
          .y = {single(red), single(green), single(blue)},
          .u = {single(-red / (2 * (1 - blue))), single(-green / (2 * (1 - blue))), 0.5f},
          .v = {0.5f, single(-green / (2 * (1 - red))), single(-blue / (2 * (1 - red)))}};
}

}  // namespace

Yuv420::Across::Across(const ResamplingTaps& all, int every, int steps)
    : taps(all), period(every), step(steps) {
  const int size = static_cast<int>(taps.left.size());
  const int middle = size / 2 / period * period;
  const auto begin = [&](int i) {
    return taps.left[static_cast<std::size_t>(i)] - i / period * step;
  };
  for (int phase = 0; phase < period; ++phase) {
    first[phase] = begin(middle + phase);
    CopyWeights(taps, middle + phase, 8, weights[phase]);
  }
  for (int i = 0; i < size; ++i) {
    const int alike = middle + i % period;
    if (begin(i) != begin(alike) ||
        !std::equal(taps.of(i), taps.of(i) + taps.width, taps.of(alike))) {
      ends.push_back(i);
    }
  }
}

bool Yuv420::Takes(AVPixelFormat format, int width, int height) {
  return (format == AV_PIX_FMT_YUV420P || format == AV_PIX_FMT_YUVJ420P) && width >= 64 &&
         height >= 32 && width % 2 == 0 && height % 2 == 0;
}

Yuv420::Yuv420(int width, int height, const ColourModel& model)
    : model_(model),
      plan_(PlanOf(width, height, model)),
      memory_((kRowsOfRing + kRowsBeside) * Stride(width) + kLineFloats) {}

float* Yuv420::Memory() {
  constexpr std::size_t kLine = kLineFloats * sizeof(float);
  const std::size_t off = std::bit_cast<std::uintptr_t>(memory_.data()) % kLine / sizeof(float);
  return memory_.data() + (kLineFloats - off);
}

void Yuv420::ToPixels(const AVFrame& frame, HX_Pixel8* pixels, std::ptrdiff_t row_bytes) {
  HWY_DYNAMIC_DISPATCH(PixelsOf)
  (plan_, frame, reinterpret_cast<std::uint8_t*>(pixels), row_bytes, Memory());
}

void Yuv420::FromPixels(const HX_Pixel8* pixels, std::ptrdiff_t row_bytes, AVFrame& frame) {
  HWY_DYNAMIC_DISPATCH(CodesOf)
  (plan_, reinterpret_cast<const std::uint8_t*>(pixels), row_bytes, frame, Memory());
}

}  // namespace calmframe::media
#endif
