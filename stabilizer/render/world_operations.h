#pragma once

#include "stabilizer/render/world.h"

namespace marrow::render {

// What a render has its host do on frame buffers. Failures are thrown and leave the render.
template <class Pixel>
class WorldOperations {
 public:
  virtual ~WorldOperations() = default;
  // Composes `from`, its top left at pixel (x, y) of `to`, behind what `to` holds: what is opaque
  // there stays, what is transparent is filled. Where `from` is transparent nothing
  // changes but colours without alpha, which become 0.
  virtual void TransferBehind(const WorldX<Pixel>& from, int x, int y, WorldX<Pixel>& to) = 0;
  // All four channels, edges repeated; radius in pixels; both worlds are of one size.
  virtual void Blur(const WorldX<Pixel>& from, WorldX<Pixel>& to, float radius) = 0;
};

}  // namespace marrow::render
