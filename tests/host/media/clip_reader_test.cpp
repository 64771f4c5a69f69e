#include <algorithm>
#include <random>
#include <set>

#include "tests/host/media/clip_fixture.h"

namespace calmframe::media {
namespace {

TEST_F(ClipTest, AnyOrderGivesTheFramesThatTheSequenceGives) {
  // B-frames, open groups, short groups, and the counter in testsrc makes each frame its own.
  Ffmpeg(
      "-f lavfi -i testsrc=s=96x64:r=30:d=3 -c:v libx264 -x264-params "
      "keyint=12:bframes=3:open-gop=1 -pix_fmt yuv420p " +
      In("a.mp4"));
  Ffmpeg("-i " + In("a.mp4") + " -c copy " + In("a.ts"));
  Ffmpeg("-i " + In("a.mp4") + " -c copy -bsf:v h264_mp4toannexb -f h264 " + In("a.h264"));
  Ffmpeg("-f lavfi -i testsrc=s=96x64:r=30:d=3 -c:v mpeg4 -bf 2 -g 10 " + In("b.avi"));
  for (const char* name : {"a.mp4", "a.ts", "a.h264", "b.avi"}) {
    SCOPED_TRACE(name);
    const auto reader = ClipReader::Open(In(name));
    ASSERT_EQ(reader->info().frame_count, 90u);
    EXPECT_EQ(reader->info().warning, "");
    std::vector<std::vector<HX_Pixel8>> frames;
    for (std::size_t i = 0; i < 90; ++i) frames.push_back(ReadFrame<HX_Pixel8>(*reader, i));
    for (std::size_t i = 1; i < 90; ++i) EXPECT_FALSE(SamePixels(frames[i - 1], frames[i])) << i;
    std::mt19937 random(1);
    for (int i = 0; i < 40; ++i) {
      const std::size_t frame = random() % 90;
      EXPECT_TRUE(SamePixels(ReadFrame<HX_Pixel8>(*reader, frame), frames[frame])) << frame;
      if (frame + 1 < 90 && i % 3 == 0) {
        EXPECT_TRUE(SamePixels(ReadFrame<HX_Pixel8>(*reader, frame + 1), frames[frame + 1]));
      }
    }
    const auto dropped_early = ClipReader::Open(In(name));
    ReadFrame<HX_Pixel8>(*dropped_early, 0);
  }
}

TEST_F(ClipTest, MatrixAndRangeAsTagged) {
  // Y 126, Cb 90, Cr 200: R = 1.1644 (Y - 16) + 1.7927 (Cr - 128) and so on for BT.709 limited.
  struct Case {
    const char* matrix;
    const char* range;
    int red, green, blue;
  };
  for (const Case& c : {Case{"bt709", "tv", 255, 98, 48}, Case{"smpte170m", "tv", 243, 84, 51},
                        Case{"bt709", "pc", 239, 99, 55}, Case{"bt2020nc", "tv", 249, 88, 47}}) {
    SCOPED_TRACE(std::string(c.matrix) + c.range);
    Ffmpeg(
        "-f lavfi -i \"color=s=64x32:d=0.1,format=yuv444p,geq=lum=126:cb=90:cr=200\" "
        "-c:v libx264 -qp 0 -pix_fmt yuv444p -colorspace " +
        std::string(c.matrix) + " -color_range " + c.range + " " + In("c.mp4"));
    const auto reader = ClipReader::Open(In("c.mp4"));
    const HX_Pixel8 p8 = ReadFrame<HX_Pixel8>(*reader, 0)[700];
    EXPECT_NEAR(p8.red, c.red, 1);
    EXPECT_NEAR(p8.green, c.green, 1);
    EXPECT_NEAR(p8.blue, c.blue, 1);
    EXPECT_EQ(p8.alpha, 255);
    const HX_Pixel16 p16 = ReadFrame<HX_Pixel16>(*reader, 0)[700];
    EXPECT_NEAR(p16.green / 32768.0 * 255, c.green, 0.6);
    EXPECT_EQ(p16.alpha, 32768);
    const HX_PixelFloat f = ReadFrame<HX_PixelFloat>(*reader, 0)[700];
    EXPECT_NEAR(f.blue * 255, c.blue, 0.6);
    EXPECT_EQ(f.alpha, 1.0f);
  }
}

TEST_F(ClipTest, WhiteIsFullWhiteAtEveryDepth) {
  for (const char* format : {"yuv420p", "yuv420p10le", "rgb24", "gray", "gbrp12le"}) {
    SCOPED_TRACE(format);
    // The command-line conversion to deeper RGB falls short of white.
    const std::string white =
        std::string(format) == "gbrp12le" ? ",format=gbrp12le,geq=r=4095:g=4095:b=4095" : "";
    Ffmpeg("-f lavfi -i color=white:s=64x32:d=0.1" + white + " -pix_fmt " + format +
           " -c:v ffv1 -strict -2 " + In("w.mkv"));
    const auto reader = ClipReader::Open(In("w.mkv"));
    EXPECT_EQ(ReadFrame<HX_Pixel8>(*reader, 0)[70].green, 255);
    EXPECT_EQ(ReadFrame<HX_Pixel16>(*reader, 0)[70].red, 32768);
    EXPECT_FLOAT_EQ(ReadFrame<HX_PixelFloat>(*reader, 0)[70].blue, 1.0f);
  }
}

TEST_F(ClipTest, TenBitsStayMoreThanEight) {
  Ffmpeg(
      "-f lavfi -i \"color=s=1024x32:d=0.1,format=yuv420p10le,geq=lum=X:cb=512:cr=512\" "
      "-c:v ffv1 " +
      In("ten.mkv"));
  const auto reader = ClipReader::Open(In("ten.mkv"));
  EXPECT_EQ(reader->info().bit_depth, 10);
  std::set<int> levels;
  for (const HX_Pixel16& p : ReadFrame<HX_Pixel16>(*reader, 0)) levels.insert(p.green);
  EXPECT_GT(levels.size(), 800u);  // 876 code words from black to white
}

TEST_F(ClipTest, DamagedFilesGiveWhatDecodes) {
  Ffmpeg("-f lavfi -i testsrc2=s=160x120:r=25:d=4 -c:v libx264 -g 10 -movflags +faststart " +
         In("whole.mp4"));
  const std::string bytes = Content("whole.mp4");
  std::ofstream(In("cut.mp4"), std::ios::binary) << bytes.substr(0, bytes.size() * 6 / 10);
  const auto cut = ClipReader::Open(In("cut.mp4"));
  const std::size_t count = cut->info().frame_count;
  EXPECT_GT(count, 20u);
  EXPECT_LT(count, 90u);
  EXPECT_NE(cut->info().warning.find(std::to_string(count) + " of 100 frames"), std::string::npos)
      << cut->info().warning;
  for (std::size_t i = count; i-- > 0;) ReadFrame<HX_Pixel8>(*cut, i);

  std::string noisy = bytes;
  std::mt19937 random(2);
  for (int i = 0; i < 60; ++i) noisy[4000 + random() % (noisy.size() - 4000)] ^= 0x55;
  std::ofstream(In("noisy.mp4"), std::ios::binary) << noisy;
  const auto damaged = ClipReader::Open(In("noisy.mp4"));
  EXPECT_NE(damaged->info().warning, "");
  for (std::size_t i = 0; i < damaged->info().frame_count; ++i) ReadFrame<HX_Pixel8>(*damaged, i);
}

TEST_F(ClipTest, WhatIsNoClipIsRefusedInOneLine) {
  std::ofstream(In("empty.mp4"));
  std::string noise(100000, '\0');
  std::mt19937 random(3);
  for (char& c : noise) c = static_cast<char>(random());
  std::ofstream(In("noise.mp4"), std::ios::binary) << noise;
  std::ofstream(In("text.txt")) << "This is no clip.\nNot at all.\n";
  Ffmpeg("-f lavfi -i sine=d=1 " + In("sound.wav"));
  for (const char* name : {"none.mp4", "empty.mp4", "noise.mp4", "text.txt", "sound.wav", "."}) {
    const std::string path = In(name);
    EXPECT_EQ(LineOf(Failure::Side::input, [&] { ClipReader::Open(path); }).find(path), 0u) << name;
  }
}

TEST_F(ClipTest, RealClipsHaveTheirCounts) {
  const std::filesystem::path clips = std::filesystem::path(CALMFRAME_SHARED) / "clips";
  if (!std::filesystem::exists(clips)) GTEST_SKIP() << "no footage here";
  const auto van = ClipReader::Open((clips / "static-van-interlaced-1080i.mts").string());
  EXPECT_EQ(van->info().frame_count, 36u);
  EXPECT_EQ(van->info().field_order, FieldOrder::top_first);
  EXPECT_EQ(van->info().frame_rate.num, 25 * van->info().frame_rate.den);
  const auto last = ReadFrame<HX_Pixel8>(*van, 35);
  const auto middle = ReadFrame<HX_Pixel8>(*van, 17);
  for (std::size_t i = 0; i < 36; ++i) {
    const auto pixels = ReadFrame<HX_Pixel8>(*van, i);
    if (i == 17) {
      EXPECT_TRUE(SamePixels(pixels, middle));
    }
    if (i == 35) {
      EXPECT_TRUE(SamePixels(pixels, last));
    }
  }
  const auto hdr = ClipReader::Open((clips / "pan-to-window-hdr10-720x1280.mp4").string());
  EXPECT_EQ(hdr->info().frame_count, 127u);
  EXPECT_EQ(hdr->info().bit_depth, 10);
  EXPECT_EQ(hdr->info().colour.transfer, 16);  // PQ
}

}  // namespace
}  // namespace calmframe::media
