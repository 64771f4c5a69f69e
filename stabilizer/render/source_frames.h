#pragma once

#include <boost/shared_ptr.hpp>
#include <cstddef>

#include "stabilizer/render/world.h"

namespace marrow::render {

// Where source frames come from: the analysed clip's frame `frame`, at the render's scale. Failures
// are thrown and leave the render.
template <class Pixel>
class SourceFrames {
 public:
  virtual ~SourceFrames() = default;
  virtual boost::shared_ptr<const WorldX<Pixel>> fetch(std::size_t frame) = 0;
};

}  // namespace marrow::render
