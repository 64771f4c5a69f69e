#pragma once

#include <cstddef>
#include <cstdint>

#include "host/media/colour_model.h"
#include "platform/hx/hx_pixel.h"

namespace calmframe::media {

// Between pixels of 16 bits or floats and YUV of full chroma size: code words of `depth` bits,
// shifted up to 16. The instruction set never shows.
class DeepYuv {
 public:
  DeepYuv(const ColourModel& model, int depth);

  // A row of planes: luma, Cb, Cr, alpha. Without alpha (null) pixels are opaque, or else stand
  // over black. Values out of range are clamped. No memory past `count` is touched.
  void ToPixels(const std::uint16_t* const (&planes)[4], std::size_t count,
                HX_Pixel16* pixels) const;
  void ToPixels(const std::uint16_t* const (&planes)[4], std::size_t count,
                HX_PixelFloat* pixels) const;
  void FromPixels(const HX_Pixel16* pixels, std::size_t count,
                  std::uint16_t* const (&planes)[4]) const;
  void FromPixels(const HX_PixelFloat* pixels, std::size_t count,
                  std::uint16_t* const (&planes)[4]) const;

  // Code words of black, of a range of 1 in luma and chroma, and of an alpha of 1; weights of red,
  // green and blue in luma; what 1 of Cr or Cb adds to red and blue and takes from green.
  struct Scale {
    float black, luma, chroma, top;
    float luma_red, luma_green, luma_blue;
    float red_cr, green_cr, green_cb, blue_cb;
  };

 private:
  Scale scale_;
};

}  // namespace calmframe::media
