#include <fstream>
#include <thread>

#include "host/timeline/source.h"
#include "tests/host/media/clip_fixture.h"
#include "tests/support/drawn_clip.h"

namespace calmframe::host {
namespace {

class ClipSourceTest : public media::ClipTest {
 protected:
  static constexpr int kWidth = 64, kHeight = 48;
  static constexpr std::size_t kFrames = 40;

  // A lossy clip with several keyframes, each frame of its own colours.
  std::string Clip(const std::string& name) {
    media::ClipInfo info = Made(kWidth, kHeight, kFrames);
    info.frame_rate = {30000, 1001};
    info.pixel_aspect = {10, 11};
    WriteClip(In(name), info, [](int frame, HX_Pixel8* pixels) {
      for (int i = 0; i < kWidth * kHeight; ++i) {
        pixels[i] = {255, static_cast<std::uint8_t>(6 * frame),
                     static_cast<std::uint8_t>(4 * (i % kWidth)),
                     static_cast<std::uint8_t>(i / kWidth + 90 * (frame % 2))};
      }
    });
    return In(name);
  }
  template <class Pixel>
  static std::vector<Pixel> PixelsOf(const PicturePtr& picture) {
    std::vector<Pixel> pixels;
    for (int y = 0; y < picture->height(); ++y) {
      const Pixel* row = picture->row<Pixel>(y);
      pixels.insert(pixels.end(), row, row + picture->width());
    }
    return pixels;
  }
};

TEST_F(ClipSourceTest, GivesTheReadersPixelsInAnyOrder) {
  const std::string path = Clip("a.mp4");
  const auto reader = media::ClipReader::Open(path);
  const SourcePtr source = OpenClip(path);
  EXPECT_EQ(source->info().frame_count, static_cast<std::int64_t>(kFrames));
  EXPECT_EQ(source->info().ticks_per_frame, 23543520);
  EXPECT_EQ(source->info().pixel_aspect.num, 10);
  EXPECT_EQ(source->info().pixel_aspect.den, 11u);
  // In order, slightly out of order as several threads ask, two consumers in turn, and jumps.
  for (const std::int64_t frame :
       {0, 2, 1, 3, 4, 7, 5, 6, 8, 30, 9, 31, 10, 32, 11, 33, 0, 39, 12, 34, 39, 20, 1, 38}) {
    const PicturePtr picture = source->Fetch(frame, PixelKind::argb8);
    ASSERT_TRUE(picture);
    EXPECT_TRUE(media::SamePixels(PixelsOf<HX_Pixel8>(picture),
                                  ReadFrame<HX_Pixel8>(*reader, static_cast<std::size_t>(frame))))
        << frame;
  }
  EXPECT_TRUE(media::SamePixels(PixelsOf<HX_Pixel16>(source->Fetch(5, PixelKind::argb16)),
                                ReadFrame<HX_Pixel16>(*reader, 5)));
  EXPECT_TRUE(media::SamePixels(PixelsOf<HX_PixelFloat>(source->Fetch(5, PixelKind::argbf)),
                                ReadFrame<HX_PixelFloat>(*reader, 5)));
  EXPECT_FALSE(source->Fetch(-1, PixelKind::argb8));
  EXPECT_FALSE(source->Fetch(kFrames, PixelKind::argb8));
}

TEST_F(ClipSourceTest, ThreadsThatShareItGetTheFramesTheyAskFor) {
  const std::string path = Clip("a.mp4");
  const SourcePtr source = OpenClip(path);
  const auto red = [](const PicturePtr& picture) { return picture->row<HX_Pixel8>(9)[9].red; };
  std::vector<int> expected;
  for (std::size_t f = 0; f < kFrames; ++f) {
    expected.push_back(red(source->Fetch(static_cast<std::int64_t>(f), PixelKind::argb8)));
  }
  std::vector<std::jthread> threads;
  for (std::int64_t first : {0, 1, 2, 20}) {
    threads.emplace_back([&, first] {
      for (std::int64_t f = first; f < static_cast<std::int64_t>(kFrames); f += 3) {
        EXPECT_EQ(red(source->Fetch(f, PixelKind::argb8)), expected[static_cast<std::size_t>(f)]);
      }
    });
  }
}

}  // namespace
}  // namespace calmframe::host
