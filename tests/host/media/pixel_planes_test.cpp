#include "host/media/pixel_planes.h"

#include <gtest/gtest.h>

#include <random>
#include <vector>

#include "tests/host/media/instruction_sets.h"

namespace calmframe::media {
namespace {

using Bytes = std::vector<std::uint8_t>;

constexpr std::uint8_t kUntouched = 0x5a;

Bytes Random(std::size_t size) {
  static std::mt19937 random(5);
  Bytes bytes(size);
  for (std::uint8_t& byte : bytes) byte = static_cast<std::uint8_t>(random());
  return bytes;
}

// Rows of less than a vector, of whole ones and of rests, at odd addresses.
TEST(PixelPlanes, EachInstructionSetPacksAndUnpacksAsThePlainLoopDoes) {
  tests::OnEachInstructionSet([] {
    for (const std::size_t count : {0, 1, 2, 15, 16, 17, 33, 63, 64, 65, 127, 128, 203}) {
      for (const bool has_alpha : {false, true}) {
        SCOPED_TRACE(testing::Message() << count << (has_alpha ? " with" : " without") << " alpha");
        Bytes planes[4];
        for (Bytes& plane : planes) plane = Random(count + 1);
        const auto from = [&](int c) { return planes[c].data() + 1; };
        Bytes pixels(1 + 4 * count + 8, kUntouched);
        PackPixels({has_alpha ? from(0) : nullptr, from(1), from(2), from(3)}, count,
                   pixels.data() + 1);
        Bytes expected(pixels.size(), kUntouched);
        for (std::size_t i = 0; i < count; ++i) {
          for (int c = 0; c < 4; ++c) expected[1 + 4 * i + c] = from(c)[i];
          if (!has_alpha) expected[1 + 4 * i] = 255;
        }
        EXPECT_EQ(pixels, expected);

        // Opaque at first, so that both of the ways there are over black are taken.
        Bytes source = Random(1 + 4 * count);
        for (std::size_t i = 0; i < count / 2; ++i) source[1 + 4 * i] = 255;
        Bytes got[4], wanted[4];
        for (int c = 0; c < 4; ++c) got[c] = wanted[c] = Bytes(1 + count + 8, kUntouched);
        const auto to = [&](int c) { return got[c].data() + 1; };
        UnpackPixels(source.data() + 1, count, {has_alpha ? to(0) : nullptr, to(1), to(2), to(3)});
        for (std::size_t i = 0; i < count; ++i) {
          const std::uint8_t* pixel = source.data() + 1 + 4 * i;
          if (has_alpha) wanted[0][1 + i] = pixel[0];
          for (int c = 1; c < 4; ++c) {
            wanted[c][1 + i] = has_alpha ? pixel[c] : (pixel[c] * pixel[0] + 127) / 255;
          }
        }
        for (int c = 0; c < 4; ++c) EXPECT_EQ(got[c], wanted[c]) << "channel " << c;
      }
    }
  });
}

TEST(PixelPlanes, EveryColourOverBlackWithEveryAlpha) {
  tests::OnEachInstructionSet([] {
    for (int alpha = 0; alpha < 256; ++alpha) {
      Bytes pixels;
      for (int value = 0; value < 256; ++value) {
        for (const int byte : {alpha, value, 255 - value, value / 2}) {
          pixels.push_back(static_cast<std::uint8_t>(byte));
        }
      }
      Bytes red(256), green(256), blue(256);
      UnpackPixels(pixels.data(), 256, {nullptr, red.data(), green.data(), blue.data()});
      for (int value = 0; value < 256; ++value) {
        ASSERT_EQ(red[value], (value * alpha + 127) / 255) << value << " under " << alpha;
        ASSERT_EQ(green[value], ((255 - value) * alpha + 127) / 255);
        ASSERT_EQ(blue[value], (value / 2 * alpha + 127) / 255);
      }
    }
  });
}

}  // namespace
}  // namespace calmframe::media
