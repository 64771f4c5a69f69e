#pragma once

#include <cstdint>

#include "platform/hx/hx_effect.h"

namespace kelp::effect {

// The frames of a source: their size in its own pixels, and what shape these have.
struct SourceShape {
  std::int32_t width = 0, height = 0;
  std::int32_t par_num = 1;  // width : height of a pixel
  std::uint32_t par_den = 1;

  bool operator==(const SourceShape&) const = default;

  // That of an instance without a layer.
  bool one_by_one() const { return width == 1 && height == 1; }
  bool SameSize(const SourceShape& other) const {
    return width == other.width && height == other.height;
  }

  // The size in square pixels, each at least 1; the width rounded half away from zero.
  std::uint32_t square_width() const;
  std::uint32_t square_height() const;
  // What x is multiplied by for square pixels: square_width / width.
  float pixel_aspect() const;
};

// The source as the host has it now.
inline SourceShape ShapeOf(const HX_InData& in) {
  return {in.width, in.height, in.pixel_aspect.num, in.pixel_aspect.den};
}

}  // namespace kelp::effect
