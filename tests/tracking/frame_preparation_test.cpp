#include "tracking/frame_preparation.h"

#include <gmock/gmock.h>

#include <random>
#include <vector>

#include "tests/support/each_instruction_set.h"

namespace marrow::tracking {
namespace {

// Widths about a vector, rows padded and misaligned, both directions. A value behind each image
// must stay.
void ExpectPlainLoops(std::size_t width, std::ptrdiff_t padding, bool bottom_up,
                      std::mt19937& random) {
  constexpr std::size_t kRows = 3;
  const std::ptrdiff_t pitch = 4 * width + padding;
  std::vector<std::uint8_t> bytes(pitch * (kRows - 1) + 4 * width);
  for (auto& b : bytes) b = random() & 255;
  const ArgbFrame frame{bytes.data() + (bottom_up ? pitch * (kRows - 1) : 0),
                        bottom_up ? -pitch : pitch, width, kRows};
  std::vector<std::uint8_t> luma, mask, color;
  for (std::size_t i = 0; i < width * kRows; ++i) {
    const auto* p =
        frame.top_row + static_cast<std::ptrdiff_t>(i / width) * frame.row_bytes + 4 * (i % width);
    luma.push_back((9798 * p[1] + 19235 * p[2] + 3735 * p[3] + 16384) / 32768);
    mask.push_back(p[0] > 127 ? 1 : 0);
    color.insert(color.end(), p + 1, p + 4);
  }
  for (auto* image : {&luma, &mask, &color}) image->push_back(7);
  std::vector<std::uint8_t> found_luma(luma.size(), 7),
      found_mask = found_luma, both_luma = found_luma, both_color(color.size(), 7);
  std::vector<float> found_color(color.size(), 7);
  LumaFromArgb(frame, found_luma.data());
  MaskFromArgb(frame, found_mask.data());
  ColorFromArgb(frame, found_color.data());
  ColorAndLumaFromArgb(frame, both_color.data(), both_luma.data());
  ASSERT_EQ(found_luma, luma);
  ASSERT_EQ(found_mask, mask);
  ASSERT_EQ(found_color, std::vector<float>(color.begin(), color.end()));
  ASSERT_EQ(both_luma, luma);
  ASSERT_EQ(both_color, color);
}

TEST(FramePreparationTest, EqualsThePlainLoopsForAnyWidthAndStride) {
  tests::OnEachInstructionSet([] {
    std::mt19937 random(3);
    for (std::size_t width = 1; width < 70; ++width) {
      for (const std::ptrdiff_t padding : {0, 1, 12}) {
        ExpectPlainLoops(width, padding, false, random);
        ExpectPlainLoops(width, padding, true, random);
      }
    }
  });
}

}  // namespace
}  // namespace marrow::tracking
