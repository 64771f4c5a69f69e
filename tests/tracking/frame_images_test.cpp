#include "tracking/frame_images.h"

#include <gmock/gmock.h>

#include <vector>

namespace marrow::tracking {
namespace {

TEST(FrameImagesTest, LumaAndMaskAreThoseOfTheirOwnPixels) {
  for (const std::size_t width : {1, 16, 37}) {
    const std::size_t size = 6 * width;
    std::vector<std::uint8_t> pixels(4 * size, 200), found(size), expected(size);
    std::vector<float> scratch;
    ImagePyramid pyramid(width, 6, 3, 2, ImagePyramid::first_level::bytes);
    FrameImages images;
    const ArgbFrame frame{pixels.data(), static_cast<std::ptrdiff_t>(4 * width), width, 6};
    const auto expect_own = [&](std::size_t index, const ArgbFrame& of) {
      images.Luma(index, of, found.data());
      LumaFromArgb(of, expected.data());
      ASSERT_EQ(found, expected);
      images.Mask(index, of, found.data());
      MaskFromArgb(of, expected.data());
      ASSERT_EQ(found, expected);
    };
    expect_own(0, frame);  // no pyramid yet
    images.ColorPyramid(0, frame, pyramid, scratch);
    expect_own(0, frame);
    for (std::size_t hole = 0; hole < size; ++hole) {
      pixels[4 * hole] = 127;
      pixels[4 * hole + 1] = static_cast<std::uint8_t>(hole);
      images.ColorPyramid(hole, frame, pyramid, scratch);
      expect_own(hole, frame);
      pixels[4 * hole] = 128;
    }
    // Other pixels than the pyramid's: a later frame in the same place, and another place.
    images.ColorPyramid(7, frame, pyramid, scratch);
    pixels[0] = pixels[1] = 0;
    expect_own(8, frame);
    std::vector<std::uint8_t> others(4 * size, 0);
    expect_own(7, {others.data(), frame.row_bytes, width, 6});
  }
}

}  // namespace
}  // namespace marrow::tracking
