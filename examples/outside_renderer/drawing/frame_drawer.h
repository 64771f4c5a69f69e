#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "examples/outside_renderer/drawing/frame_mesh.h"
#include "platform/hx/hx_pixel.h"

namespace outside {

// Pixels of 8 bits a channel, top row first, straight alpha.
struct SourceView {
  const HX_Pixel8* pixels = nullptr;
  std::ptrdiff_t row_bytes = 0;
  std::int32_t width = 0, height = 0;  // at least 2
};

struct Picture {
  std::int32_t width = 0, height = 0;
  std::vector<HX_Pixel8> pixels;
};

// Each output pixel takes its source's four neighbours, weighted by where the cell's map puts it.
// Made, used and destroyed on one thread.
class FrameDrawer {
 public:
  virtual ~FrameDrawer() = default;
  virtual std::string name() const = 0;  // what draws
  // Throws std::runtime_error where the output is too large for what draws.
  virtual void Draw(const FrameMesh& mesh, const SourceView& source, Picture& output) = 0;
};

std::unique_ptr<FrameDrawer> MakePlainDrawer();

// On OpenGL ES 3: a graphics card's, or else the system's software driver. Throws
// std::runtime_error, one line, where there is none.
std::unique_ptr<FrameDrawer> MakeGlDrawer();

}  // namespace outside
