#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "tracking/frame_preparation.h"
#include "tracking/image_pyramid.h"

namespace marrow::tracking {

// The images of a source's frames. Of the same pixels the pyramid's walk makes the luma too, and
// finds out whether the frame is opaque, as most are: neither luma nor mask then needs a second
// look at pixels that have left the cache. Pixels are the same if index and address are.
class FrameImages {
 public:
  void ColorPyramid(std::size_t frame_index, const ArgbFrame& frame, ImagePyramid& pyramid,
                    std::vector<float>& scratch);
  void Luma(std::size_t frame_index, const ArgbFrame& frame, std::uint8_t* luma);
  void Mask(std::size_t frame_index, const ArgbFrame& frame, std::uint8_t* mask);

 private:
  bool Knows(std::size_t frame_index, const ArgbFrame& frame) const {
    return top_row_ == frame.top_row && frame_index_ == frame_index;
  }

  // Of the last pyramid.
  std::vector<std::uint8_t> luma_;
  bool opaque_ = false;
  std::size_t frame_index_ = 0;
  const std::uint8_t* top_row_ = nullptr;
};

}  // namespace marrow::tracking
