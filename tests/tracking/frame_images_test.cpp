#include "tracking/frame_images.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <random>
#include <vector>

#include "tests/support/each_instruction_set.h"

namespace marrow::tracking {
namespace {

class FrameImagesTest : public ::testing::Test {
 protected:
  void ExpectOwnLumaAndMask(std::size_t index, const ArgbFrame& frame) {
    std::vector<std::uint8_t> found(frame.width * frame.height), expected = found;
    images.Luma(index, frame, found.data());
    LumaFromArgb(frame, expected.data());
    ASSERT_EQ(found, expected);
    images.Mask(index, frame, found.data());
    MaskFromArgb(frame, expected.data());
    ASSERT_EQ(found, expected);
  }

  FrameImages images;
  std::vector<float> scratch;
};

// Sizes with a level too small for a filter, and with odd sides.
TEST_F(FrameImagesTest, EqualTheirConversionsAndLevelsApart) {
  std::mt19937 random(3);
  for (const auto& [w, h] :
       {std::pair{1, 1}, {30, 70}, {97, 49}, {98, 51}, {333, 200}, {1003, 801}}) {
    const std::ptrdiff_t row_bytes = 4 * w + 12;
    std::vector<std::uint8_t> bytes(row_bytes * h);
    for (auto& b : bytes) b = random() & 255;
    // Bottom-up.
    const ArgbFrame frame{bytes.data() + (h - 1) * row_bytes, -row_bytes, std::size_t(w),
                          std::size_t(h)};
    for (const std::size_t levels : {1, 3, 5}) {
      ImagePyramid expected(w, h, 3, levels);
      ColorFromArgb(frame, expected.LevelData(0));
      BuildLevels(expected);
      tests::OnEachInstructionSet([&, w = w, h = h] {
        ImagePyramid pyramid(w, h, 3, levels, ImagePyramid::first_level::bytes);
        // What a frame before may have left.
        std::fill(pyramid.data.begin(), pyramid.data.end(), 7.0f);
        images.ColorPyramid(0, frame, pyramid, scratch);
        std::vector<float> found(pyramid.bytes.begin(), pyramid.bytes.end());
        found.insert(found.end(), pyramid.data.begin(), pyramid.data.end());
        ASSERT_TRUE(found == expected.data) << w << "x" << h << ", " << levels;
        ExpectOwnLumaAndMask(0, frame);
      });
    }
  }
}

TEST_F(FrameImagesTest, LumaAndMaskAreThoseOfTheirOwnPixels) {
  for (const std::size_t width : {1, 16, 37}) {
    const std::size_t size = 6 * width;
    std::vector<std::uint8_t> pixels(4 * size, 200);
    const ArgbFrame frame{pixels.data(), static_cast<std::ptrdiff_t>(4 * width), width, 6};
    ImagePyramid pyramid(width, 6, 3, 2, ImagePyramid::first_level::bytes);
    images = {};
    ExpectOwnLumaAndMask(0, frame);  // no pyramid yet
    images.ColorPyramid(0, frame, pyramid, scratch);
    ExpectOwnLumaAndMask(0, frame);
    for (std::size_t hole = 0; hole < size; ++hole) {
      pixels[4 * hole] = 127;
      pixels[4 * hole + 1] = static_cast<std::uint8_t>(hole);
      images.ColorPyramid(hole, frame, pyramid, scratch);
      ExpectOwnLumaAndMask(hole, frame);
      pixels[4 * hole] = 128;
    }
    // Other pixels than the pyramid's: a later frame in the same place, and another place.
    images.ColorPyramid(7, frame, pyramid, scratch);
    pixels[0] = pixels[1] = 0;
    ExpectOwnLumaAndMask(8, frame);
    std::vector<std::uint8_t> others(4 * size, 0);
    ExpectOwnLumaAndMask(7, {others.data(), frame.row_bytes, width, 6});
  }
}

}  // namespace
}  // namespace marrow::tracking
