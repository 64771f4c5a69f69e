#include "tracking/frame_images.h"

#include <algorithm>

#include "platform/memory/large_pages.h"
#include "tracking/color_pyramid.h"

namespace marrow::tracking {

void FrameImages::ColorPyramid(std::size_t frame_index, const ArgbFrame& frame,
                               ImagePyramid& pyramid, std::vector<float>& scratch) {
  memory::ResizeOnLargePages(luma_, frame.width * frame.height);
  opaque_ = ColorPyramidFromArgb(frame, pyramid, scratch, luma_.data());
  frame_index_ = frame_index;
  top_row_ = frame.top_row;
}

void FrameImages::Luma(std::size_t frame_index, const ArgbFrame& frame, std::uint8_t* luma) {
  if (Knows(frame_index, frame)) {
    std::copy_n(luma_.data(), frame.width * frame.height, luma);
  } else {
    LumaFromArgb(frame, luma);
  }
}

void FrameImages::Mask(std::size_t frame_index, const ArgbFrame& frame, std::uint8_t* mask) {
  if (opaque_ && Knows(frame_index, frame)) {
    std::fill_n(mask, frame.width * frame.height, std::uint8_t{1});
  } else {
    MaskFromArgb(frame, mask);
  }
}

}  // namespace marrow::tracking
