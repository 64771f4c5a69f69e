#pragma once

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <memory>

#include "host/effects/effect.h"
#include "host/pixels/world_operations.h"

namespace calmframe::host {

// Mean absolute difference of two frames' colours, in 255ths, over all but a margin of `margin`
// pixels; both at one size.
inline double Difference(const WorldBuffer& a, const WorldBuffer& b, int margin = 0) {
  const HX_World &first = a.world(), &second = b.world();
  EXPECT_EQ(first.width, second.width);
  EXPECT_EQ(first.height, second.height);
  WorldBuffer x(first.width, first.height, HX_FORMAT_ARGBF),
      y(first.width, first.height, HX_FORMAT_ARGBF);
  CopyWorld(first, x.world(), nullptr, nullptr);
  CopyWorld(second, y.world(), nullptr, nullptr);
  double sum = 0;
  int count = 0;
  for (int row = margin; row < first.height - margin; ++row) {
    for (int column = margin; column < first.width - margin; ++column, count += 3) {
      for (int c = 1; c < 4; ++c) {
        sum += std::abs(x.row<float>(row)[column * 4 + c] - y.row<float>(row)[column * 4 + c]);
      }
    }
  }
  return sum * 255 / count;
}

// The source's frame as the host hands it in.
inline std::shared_ptr<WorldBuffer> SourceFrame(Effect& effect, std::int64_t frame) {
  const PicturePtr picture =
      effect.shared()->layer()->state()->source->Fetch(frame, PixelKind::argb8);
  auto copy = std::make_shared<WorldBuffer>(picture->width(), picture->height(), HX_FORMAT_ARGB8);
  CopyWorld(WorldOf(*picture), copy->world(), nullptr, nullptr);
  return copy;
}

}  // namespace calmframe::host
