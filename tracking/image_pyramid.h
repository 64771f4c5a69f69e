#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace marrow::tracking {

// A level's samples, interleaved by channel, rows top-down without padding.
struct level_image {
  const float* floats = nullptr;
  std::size_t width = 0;
  std::size_t height = 0;
  const std::uint8_t* bytes = nullptr;  // in place of floats, if set

  // Calls use(samples) with either pointer.
  template <class Use>
  void WithSamples(const Use& use) const {
    bytes != nullptr ? use(bytes) : use(floats);
  }
};

// Levels of an image, each half the size of the one before. A point of level 0 lies at its
// coordinates times 0.5^l on level l, without a half-pixel shift: column j lies over column 2j of
// the level before. Samples are 32-bit floats; those of level 0 are bytes if the image comes so,
// which spares the memory, the slowest part of a tracker, three quarters of the work.
class ImagePyramid {
 public:
  enum class first_level { floats, bytes };

  ImagePyramid() = default;
  // Sizes every level, all zero. Level 0 is there even if `levels` is 0.
  ImagePyramid(std::size_t width, std::size_t height, std::size_t channels, std::size_t levels,
               first_level first = first_level::floats);

  // ceil(width / 2^level), ceil(height / 2^level), and the first sample of a level of floats.
  std::size_t LevelWidth(std::size_t level) const;
  std::size_t LevelHeight(std::size_t level) const;
  float* LevelData(std::size_t level) { return data.data() + level_starts_[level]; }
  const float* LevelData(std::size_t level) const { return data.data() + level_starts_[level]; }
  level_image Level(std::size_t level) const {
    return {LevelData(level), LevelWidth(level), LevelHeight(level),
            level == 0 && !bytes.empty() ? bytes.data() : nullptr};
  }

  // Constant after construction, but for the samples.
  std::size_t width = 0;
  std::size_t height = 0;
  std::size_t channels = 0;
  std::size_t levels = 0;
  std::vector<float> data;          // the levels of floats, finest first, no gaps
  std::vector<std::uint8_t> bytes;  // level 0 of a pyramid that starts with bytes, else empty

 private:
  std::vector<std::size_t> level_starts_;
};

// Fills levels 1 to levels - 1 from a level 0 of floats by ReduceLevel.
void BuildLevels(ImagePyramid& pyramid);

// Reduces `source`, width by height pixels, to `destination`, (width + 1) / 2 by (height + 1) / 2.
// Each row that is kept (every other one) is smoothed along x by (1 2 1) / 4; there is no filter
// along y. The destination's outermost pixels are 0. A source with a side under 3 clears the
// destination's first row and leaves the rest as it was. channels is 1, 3 or 4; with any other
// count the destination gets its black frame only. The images may not overlap.
void ReduceLevel(const float* source, std::size_t width, std::size_t height, std::size_t channels,
                 float* destination);

// One of the destination's rows but the first and the last, from the source's row over it, which
// has `width` pixels, at least 3.
void ReduceRow(const float* source, std::size_t width, std::size_t channels, float* destination);

}  // namespace marrow::tracking
