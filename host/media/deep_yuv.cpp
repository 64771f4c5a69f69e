#include "host/media/deep_yuv.h"

#include <cstring>

// The target of last resort has to be the emulated 128-bit one, as there are channels to take
// apart. The library avoids it under older g++, which miscompile the high halves of its integer
// products (GCC bug 106322); there are none here.
#define HWY_BROKEN_EMU128 0
#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "host/media/deep_yuv.cpp"
#include <hwy/foreach_target.h>  // IWYU pragma: keep
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace calmframe::media {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

using D = hn::CappedTag<float, 16>;
using V = hn::Vec<D>;
constexpr std::size_t kMaxLanes = 16;
constexpr float kCentre = 32768.0f;  // of chroma
constexpr float kFull = 32768.0f;    // of a 16-bit pixel

HWY_INLINE V Set(float value) {
  return hn::Set(D(), value);
}

HWY_INLINE V Clamp(V v, float top) {
  v = hn::IfThenElseZero(hn::Gt(v, hn::Zero(D())), v);  // not a number fails
  return hn::Min(v, Set(top));
}

using DWords = hn::Rebind<std::uint16_t, D>;

HWY_INLINE V FromWords(hn::Vec<DWords> words) {
  return hn::ConvertTo(D(), hn::PromoteTo(hn::RebindToSigned<D>(), words));
}

HWY_INLINE V LoadWords(const std::uint16_t* words) {
  return FromWords(hn::LoadU(DWords(), words));
}

HWY_INLINE hn::Vec<DWords> Rounded(V v) {  // 0 <= v <= 65535
  const auto whole = hn::ConvertTo(hn::RebindToSigned<D>(), hn::Add(v, Set(0.5f)));
  return hn::DemoteTo(DWords(), whole);
}

HWY_INLINE void StorePixels(V alpha, V red, V green, V blue, HX_Pixel16* pixels) {
  const auto word = [](V v) HWY_ATTR { return Rounded(hn::Mul(v, Set(kFull))); };
  hn::StoreInterleaved4(word(alpha), word(red), word(green), word(blue), DWords(), &pixels->alpha);
}

HWY_INLINE void StorePixels(V alpha, V red, V green, V blue, HX_PixelFloat* pixels) {
  hn::StoreInterleaved4(alpha, red, green, blue, D(), &pixels->alpha);
}

// Returns the value of full white.
HWY_INLINE float LoadPixels(const HX_Pixel16* pixels, V& alpha, V& red, V& green, V& blue) {
  hn::Vec<DWords> a, r, g, b;
  hn::LoadInterleaved4(DWords(), &pixels->alpha, a, r, g, b);
  alpha = FromWords(a);
  red = FromWords(r);
  green = FromWords(g);
  blue = FromWords(b);
  return kFull;
}

HWY_INLINE float LoadPixels(const HX_PixelFloat* pixels, V& alpha, V& red, V& green, V& blue) {
  hn::LoadInterleaved4(D(), &pixels->alpha, alpha, red, green, blue);
  return 1.0f;
}

template <class Pixel>
HWY_INLINE void ToPixelsAt(const DeepYuv::Scale& s, const std::uint16_t* const (&planes)[4],
                           std::size_t i, Pixel* pixels) {
  const auto chroma = [&](int plane) HWY_ATTR {
    return hn::Div(hn::Sub(LoadWords(planes[plane] + i), Set(kCentre)), Set(s.chroma));
  };
  const V y = hn::Div(hn::Sub(LoadWords(planes[0] + i), Set(s.black)), Set(s.luma));
  const V cb = chroma(1), cr = chroma(2);
  V alpha = Set(1.0f);
  if (planes[3]) alpha = Clamp(hn::Div(LoadWords(planes[3] + i), Set(s.top)), 1.0f);
  const V green = hn::Sub(hn::Sub(y, hn::Mul(Set(s.green_cb), cb)), hn::Mul(Set(s.green_cr), cr));
  StorePixels(alpha, Clamp(hn::Add(y, hn::Mul(Set(s.red_cr), cr)), 1.0f), Clamp(green, 1.0f),
              Clamp(hn::Add(y, hn::Mul(Set(s.blue_cb), cb)), 1.0f), pixels);
}

template <class Pixel>
HWY_INLINE void FromPixelsAt(const DeepYuv::Scale& s, const Pixel* pixels, std::size_t i,
                             std::uint16_t* const (&planes)[4]) {
  V alpha, red, green, blue;
  const V unit = Set(1.0f / LoadPixels(pixels, alpha, red, green, blue));
  alpha = hn::Mul(alpha, unit);
  const V gain = planes[3] ? unit : hn::Mul(alpha, unit);
  for (V* colour : {&red, &green, &blue}) *colour = Clamp(hn::Mul(*colour, gain), 1.0f);
  const V y = hn::Add(hn::Add(hn::Mul(Set(s.luma_red), red), hn::Mul(Set(s.luma_green), green)),
                      hn::Mul(Set(s.luma_blue), blue));
  const auto store = [&](int plane, V code) HWY_ATTR {
    hn::StoreU(Rounded(Clamp(code, 65535.0f)), DWords(), planes[plane] + i);
  };
  const auto chroma = [&](V colour, float range) HWY_ATTR {
    const V offset = hn::Div(hn::Mul(Set(s.chroma), hn::Sub(colour, y)), Set(range));
    return hn::Add(Set(kCentre), offset);
  };
  store(0, hn::Add(Set(s.black), hn::Mul(Set(s.luma), y)));
  store(1, chroma(blue, s.blue_cb));
  store(2, chroma(red, s.red_cr));
  if (planes[3]) store(3, hn::Mul(alpha, Set(s.top)));
}

template <class Pixel>
HWY_INLINE void RowToPixels(const DeepYuv::Scale& scale, const std::uint16_t* const (&planes)[4],
                            std::size_t count, Pixel* pixels) {
  const std::size_t lanes = hn::Lanes(D());
  std::size_t i = 0;
  for (; i + lanes <= count; i += lanes) ToPixelsAt(scale, planes, i, pixels + i);
  if (i == count) return;
  std::uint16_t rest[4][kMaxLanes] = {};
  Pixel made[kMaxLanes];
  for (int p = 0; p < 4; ++p) {
    if (planes[p]) std::memcpy(rest[p], planes[p] + i, sizeof(rest[p][0]) * (count - i));
  }
  ToPixelsAt(scale, {rest[0], rest[1], rest[2], planes[3] ? rest[3] : nullptr}, 0, made);
  std::memcpy(pixels + i, made, sizeof(Pixel) * (count - i));
}

template <class Pixel>
HWY_INLINE void RowFromPixels(const DeepYuv::Scale& scale, const Pixel* pixels, std::size_t count,
                              std::uint16_t* const (&planes)[4]) {
  const std::size_t lanes = hn::Lanes(D());
  std::size_t i = 0;
  for (; i + lanes <= count; i += lanes) FromPixelsAt(scale, pixels + i, i, planes);
  if (i == count) return;
  Pixel rest[kMaxLanes] = {};
  std::uint16_t made[4][kMaxLanes];
  std::memcpy(rest, pixels + i, sizeof(Pixel) * (count - i));
  FromPixelsAt(scale, rest, 0, {made[0], made[1], made[2], planes[3] ? made[3] : nullptr});
  for (int p = 0; p < 4; ++p) {
    if (planes[p]) std::memcpy(planes[p] + i, made[p], sizeof(made[p][0]) * (count - i));
  }
}

void ToPixels16(const DeepYuv::Scale& scale, const std::uint16_t* const (&planes)[4],
                std::size_t count, HX_Pixel16* pixels) {
  RowToPixels(scale, planes, count, pixels);
}

void ToPixelsFloat(const DeepYuv::Scale& scale, const std::uint16_t* const (&planes)[4],
                   std::size_t count, HX_PixelFloat* pixels) {
  RowToPixels(scale, planes, count, pixels);
}

void FromPixels16(const DeepYuv::Scale& scale, const HX_Pixel16* pixels, std::size_t count,
                  std::uint16_t* const (&planes)[4]) {
  RowFromPixels(scale, pixels, count, planes);
}

void FromPixelsFloat(const DeepYuv::Scale& scale, const HX_PixelFloat* pixels, std::size_t count,
                     std::uint16_t* const (&planes)[4]) {
  RowFromPixels(scale, pixels, count, planes);
}

}  // namespace HWY_NAMESPACE
}  // namespace calmframe::media
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace calmframe::media {
HWY_EXPORT(ToPixels16);
HWY_EXPORT(ToPixelsFloat);
HWY_EXPORT(FromPixels16);
HWY_EXPORT(FromPixelsFloat);

DeepYuv::DeepYuv(const ColourModel& model, int depth) {
  const LumaWeights weights = WeightsOf(model.matrix);
  const auto red = static_cast<float>(weights.red);
  const auto blue = static_cast<float>(weights.blue);
  const double green = 1 - weights.red - weights.blue;
  const auto top = static_cast<float>(((1 << depth) - 1) << (16 - depth));
  scale_.black = model.full_range ? 0.0f : 16.0f * 256;
  scale_.luma = model.full_range ? top : 219.0f * 256;
  scale_.chroma = model.full_range ? top : 224.0f * 256;
  scale_.top = top;
  scale_.luma_red = red;
  scale_.luma_green = 1 - red - blue;
  scale_.luma_blue = blue;
  scale_.red_cr = static_cast<float>(2 * (1 - weights.red));
  scale_.blue_cb = static_cast<float>(2 * (1 - weights.blue));
  scale_.green_cr = static_cast<float>(weights.red / green) * scale_.red_cr;
  scale_.green_cb = static_cast<float>(weights.blue / green) * scale_.blue_cb;
}

void DeepYuv::ToPixels(const std::uint16_t* const (&planes)[4], std::size_t count,
                       HX_Pixel16* pixels) const {
  HWY_DYNAMIC_DISPATCH(ToPixels16)(scale_, planes, count, pixels);
}

void DeepYuv::ToPixels(const std::uint16_t* const (&planes)[4], std::size_t count,
                       HX_PixelFloat* pixels) const {
  HWY_DYNAMIC_DISPATCH(ToPixelsFloat)(scale_, planes, count, pixels);
}

void DeepYuv::FromPixels(const HX_Pixel16* pixels, std::size_t count,
                         std::uint16_t* const (&planes)[4]) const {
  HWY_DYNAMIC_DISPATCH(FromPixels16)(scale_, pixels, count, planes);
}

void DeepYuv::FromPixels(const HX_PixelFloat* pixels, std::size_t count,
                         std::uint16_t* const (&planes)[4]) const {
  HWY_DYNAMIC_DISPATCH(FromPixelsFloat)(scale_, pixels, count, planes);
}
}  // namespace calmframe::media
#endif
