#include <thread>

#include "host/timeline/source.h"
#include "tests/host/media/clip_fixture.h"

namespace calmframe::host {
namespace {

class ClipSourceTest : public media::ClipTest {};

template <class Pixel>
std::vector<Pixel> PixelsOf(const PicturePtr& picture) {
  const auto* const first = picture->row<Pixel>(0);
  return {first, first + picture->bytes() / sizeof(Pixel)};
}

// Of a lossy clip with several keyframes, each frame of its own colours.
TEST_F(ClipSourceTest, GivesTheReadersPixelsInAnyOrderAndToSeveralThreads) {
  constexpr int kWidth = 64, kFrames = 40;
  media::ClipInfo info = Made(kWidth, 48, kFrames, 30, {10, 11});
  info.frame_rate = {30000, 1001};
  WriteClip(In("a.mp4"), info, [](int frame, HX_Pixel8* pixels) {
    for (int i = 0; i < kWidth * 48; ++i) {
      pixels[i] = {255, static_cast<std::uint8_t>(6 * frame),
                   static_cast<std::uint8_t>(4 * (i % kWidth)),
                   static_cast<std::uint8_t>(i / kWidth + 90 * (frame % 2))};
    }
  });
  const auto reader = media::ClipReader::Open(In("a.mp4"));
  std::vector<std::vector<HX_Pixel8>> frames;
  for (int f = 0; f < kFrames; ++f) frames.push_back(ReadFrame(*reader, f));
  const SourcePtr source = OpenClip(In("a.mp4"));
  EXPECT_EQ(source->info().frame_count, kFrames);
  EXPECT_EQ(source->info().ticks_per_frame, 23543520);
  EXPECT_EQ(source->info().pixel_aspect.num, 10);
  EXPECT_EQ(source->info().pixel_aspect.den, 11u);
  const auto expect = [&](std::int64_t frame) {
    const PicturePtr picture = source->Fetch(frame, PixelKind::argb8);
    ASSERT_TRUE(picture);
    EXPECT_TRUE(SamePixels(PixelsOf<HX_Pixel8>(picture), frames[frame])) << frame;
  };
  // In order, slightly out of order as several threads ask, two consumers in turn, and jumps.
  for (const std::int64_t frame :
       {0, 2, 1, 3, 4, 7, 5, 6, 8, 30, 9, 31, 10, 32, 11, 33, 0, 39, 12, 34, 39, 20, 1, 38}) {
    expect(frame);
  }
  EXPECT_TRUE(SamePixels(PixelsOf<HX_Pixel16>(source->Fetch(5, PixelKind::argb16)),
                         ReadFrame<HX_Pixel16>(*reader, 5)));
  EXPECT_TRUE(SamePixels(PixelsOf<HX_PixelFloat>(source->Fetch(5, PixelKind::argbf)),
                         ReadFrame<HX_PixelFloat>(*reader, 5)));
  EXPECT_FALSE(source->Fetch(-1, PixelKind::argb8));
  EXPECT_FALSE(source->Fetch(kFrames, PixelKind::argb8));
  std::vector<std::jthread> threads;
  for (const int first : {0, 1, 2, 20}) {
    threads.emplace_back([&expect, first] {
      for (int f = first; f < kFrames; f += 3) expect(f);
    });
  }
}

}  // namespace
}  // namespace calmframe::host
