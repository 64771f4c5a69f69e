#pragma once

#include "host/pixels/world_operations.h"
#include "stabilizer/render/frame_renderer.h"

namespace calmframe::pipeline {

// A render's operations without a plug-in between: the host's own. Throws the host's code.
template <class Pixel>
class HostOperations final : public WorldOperations<Pixel> {
 public:
  void TransferBehind(const WorldX<Pixel>& from, int x, int y, WorldX<Pixel>& to) override {
    HX_World target = WorldOf(to);
    Check(host::Transfer(WorldOf(from), kBehind, x, y, target));
  }
  void Blur(const WorldX<Pixel>& from, WorldX<Pixel>& to, float radius) override {
    HX_World target = WorldOf(to);
    Check(host::Blur(WorldOf(from), target, radius));
  }

 private:
  static void Check(HX_Err code) {
    if (code != HX_ERR_NONE) throw code;
  }
};

}  // namespace calmframe::pipeline
