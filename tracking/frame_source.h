#pragma once

#include <cstddef>
#include <cstdint>

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
  // Luma 0 to 255, width * height floats.
  virtual void LoadLuma(std::size_t frame_index, float* destination) = 0;
  // 1 where a feature may be selected, else 0; width * height bytes.
  virtual void LoadMask(std::size_t frame_index, std::uint8_t* destination) = 0;
  // Red, green, blue 0 to 255, interleaved, width * height * 3 floats: level 0 of a pyramid.
  virtual void LoadColor(std::size_t frame_index, float* destination) = 0;
};

}  // namespace marrow::tracking
