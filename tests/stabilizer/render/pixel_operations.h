#pragma once

#include <gtest/gtest.h>

#include "host/pixels/world_operations.h"
#include "stabilizer/render/world_operations.h"

namespace marrow::render {

// A render's operations as the host does them, without a plug-in between.
template <class Pixel>
class PixelOperations final : public WorldOperations<Pixel> {
 public:
  void TransferBehind(const WorldX<Pixel>& from, int x, int y, WorldX<Pixel>& to) override {
    HX_World target = world_of(to);
    EXPECT_EQ(calmframe::host::Transfer(world_of(from), kBehind, x, y, target), HX_ERR_NONE);
  }
  void Blur(const WorldX<Pixel>& from, WorldX<Pixel>& to, float radius) override {
    HX_World target = world_of(to);
    EXPECT_EQ(calmframe::host::Blur(world_of(from), target, radius), HX_ERR_NONE);
  }
};

}  // namespace marrow::render
