#include <stdexcept>

#include "examples/outside_renderer/drawing/frame_drawer.h"

namespace outside {

std::unique_ptr<FrameDrawer> MakeGlDrawer() {
  throw std::runtime_error("it was built without OpenGL");
}

}  // namespace outside
