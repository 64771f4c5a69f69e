#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "tracking/image_pyramid.h"

namespace marrow::tracking {

// Where the tracking loop gets its working images from. For each frame in ascending order the loop
// calls, for frame 0, LoadLuma, LoadMask, LoadColor, and for every later frame LoadColor, LoadLuma,
// LoadMask. A source may throw to end the run; that is how a run is cancelled.
class FrameSource {
 public:
  virtual ~FrameSource() = default;
  virtual std::size_t width() const = 0;
  virtual std::size_t height() const = 0;
  virtual std::size_t frame_count() const = 0;
  // Luma, width * height bytes.
  virtual void LoadLuma(std::size_t frame_index, std::uint8_t* destination) = 0;
  // 1 where a feature may be selected, else 0; width * height bytes.
  virtual void LoadMask(std::size_t frame_index, std::uint8_t* destination) = 0;
  // Red, green, blue 0 to 255, interleaved, width * height * 3 floats: level 0 of a pyramid.
  virtual void LoadColor(std::size_t frame_index, float* destination) = 0;
  // How the pyramids that the loop hands to LoadColorPyramid begin.
  virtual ImagePyramid::first_level first_level() const {
    return ImagePyramid::first_level::floats;
  }
  // The whole pyramid of a frame, of three channels: what the loop calls for LoadColor. A source
  // that has the frame's pixels at hand makes it in one pass, and of bytes.
  virtual void LoadColorPyramid(std::size_t frame_index, ImagePyramid& pyramid,
                                std::vector<float>& /*scratch*/) {
    LoadColor(frame_index, pyramid.LevelData(0));
    BuildLevels(pyramid);
  }
  // The same of a frame that the loop does not go on from, ahead of the first that it does.
  virtual void LookBack(std::size_t frame_index, ImagePyramid& pyramid,
                        std::vector<float>& scratch) {
    LoadColorPyramid(frame_index, pyramid, scratch);
  }
};

}  // namespace marrow::tracking
