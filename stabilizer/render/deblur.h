#pragma once

#include <cstdint>

#include "stabilizer/render/world.h"

namespace marrow::render {

template <class Pixel>
struct FramePass;

// The popup's values.
enum class DeblurDebug : std::int32_t {
  off = 1,
  blurred_sharper_frame = 2,
  blurred_this_frame = 3,
  sharper_frame = 4,
  this_frame = 5,
  aligned_frame = 6
};

// Sharper pixels for frames that the camera's shake blurred. They need the motion between frames,
// which a clip has only where its edges are synthesized: with any other framing nothing changes.
struct DeblurSettings {
  std::int32_t range = 0;        // frames on each side that are looked through; 0: off
  double frame_threshold = 5.0;  // pixels that a frame's neighbours lie apart, above which it is
                                 // treated
  float comparison_blur = 9.0f;  // radius, pixels of the output
  // Of the sum of the colours' absolute differences, full scale 1: up to pixel_threshold pixels
  // agree, from pixel_limit on they don't.
  float pixel_threshold = 0.03f;
  float pixel_limit = 0.07f;
  bool show_map = false;  // for the picture: white where the sharper frame's pixels are taken
  DeblurDebug debug = DeblurDebug::off;
  double aligned_frame = 0.0;  // for DeblurDebug::aligned_frame: offset of the frame to show
};

// How far from a frame the ones lie that its deblurring may fetch.
std::int32_t deblurReach(const DeblurSettings& settings);

// Treats the pass's frame, as drawn into `output`: takes the pixels of the slowest frame of its
// parity within the range, aligned to it, where both agree once blurred; the weight falls from 1 to
// 0 between the thresholds. A frame that isn't fast enough, or that is the slowest, stays as it is,
// with debug views too. So do pixels that the slower frame leaves transparent, and those whose
// difference is not a number; a clip without the motion between the two stays whole. The result is
// the same for any number of processors. Throws what the pass's sources and operations throw.
template <class Pixel>
void deblurFrame(const FramePass<Pixel>& pass, WorldX<Pixel>& output);

}  // namespace marrow::render
