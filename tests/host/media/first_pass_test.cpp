// Clips that are opened by what their containers promise.

#include <random>

#include "tests/host/media/clip_fixture.h"

namespace calmframe::media {
namespace {

class FirstPassTest : public ClipTest {
 protected:
  static constexpr std::size_t kFrames = 60;
  void MakeWalk(const std::string& name) const {
    Ffmpeg(
        "-f lavfi -i testsrc=s=96x64:r=30:d=2 -c:v libx264 -x264-params keyint=12:bframes=3 "
        "-pix_fmt yuv420p -movflags +faststart " +
        In(name));
  }
  // Until all are read or one can't be.
  static void ReadAll(ClipReader& reader) {
    try {
      for (std::size_t i = 0; i < reader.info().frame_count; ++i) ReadFrame<HX_Pixel8>(reader, i);
    } catch (const Failure&) {
    }
  }
};

TEST_F(FirstPassTest, WhatIsPromisedIsFoundWhenAllFramesAreRead) {
  MakeWalk("a.mp4");
  Ffmpeg("-i " + In("a.mp4") + " -c copy -metadata:s:v rotate=90 " + In("turned.mov"));
  Ffmpeg("-f lavfi -i testsrc=s=98x66:r=25:d=1 -vf select='mod(n\\,5)' -vsync vfr -c:v libx264 " +
         In("vfr.mp4"));
  Ffmpeg("-f lavfi -i testsrc=s=96x64:r=25:d=1,setsar=16/11 -c:v prores_ks " + In("wide.mov"));
  for (const char* name : {"a.mp4", "turned.mov", "vfr.mp4", "wide.mov"}) {
    SCOPED_TRACE(name);
    const auto decoded = ClipReader::Open(In(name));
    const auto promised = ClipReader::OpenPromised(In(name));
    const auto found = promised->found();
    EXPECT_EQ(found->standing(), Standing::promised);
    EXPECT_TRUE(found->Bytes().empty());
    EXPECT_EQ(promised->info(), decoded->info());
    for (std::size_t i = 0; i < decoded->info().frame_count; ++i) {
      EXPECT_TRUE(SamePixels(ReadFrame<HX_Pixel8>(*promised, i), ReadFrame<HX_Pixel8>(*decoded, i)))
          << i;
    }
    EXPECT_EQ(found->standing(), Standing::decoded);
    EXPECT_EQ(found->Bytes(), decoded->found()->Bytes());
    EXPECT_TRUE(SamePixels(ReadFrame<HX_Pixel8>(*promised, 7), ReadFrame<HX_Pixel8>(*decoded, 7)));
  }
  // Those that promise nothing, or not each frame, are decoded.
  Ffmpeg("-i " + In("a.mp4") + " -c copy " + In("a.ts"));
  Ffmpeg("-ss 0.5 -i " + In("a.mp4") + " -c copy " + In("edited.mp4"));
  Ffmpeg("-f lavfi -i testsrc=s=96x64:r=25:d=1 -c:v mpeg2video -flags +ilme+ildct " +
         In("fields.mov"));
  for (const char* name : {"a.ts", "edited.mp4", "fields.mov"}) {
    EXPECT_EQ(ClipReader::OpenPromised(In(name))->found()->standing(), Standing::decoded) << name;
  }
}

TEST_F(FirstPassTest, AnyOrderMeanwhileGivesTheFramesThatTheSequenceGives) {
  MakeWalk("a.mp4");
  const auto decoded = ClipReader::Open(In("a.mp4"));
  const auto expect = [&](ClipReader& reader, std::size_t frame) {
    EXPECT_TRUE(
        SamePixels(ReadFrame<HX_Pixel8>(reader, frame), ReadFrame<HX_Pixel8>(*decoded, frame)))
        << frame;
  };
  for (const std::size_t jump : {0, 1, 5, 12, 40, 59}) {
    SCOPED_TRACE(jump);
    const auto jumps = ClipReader::OpenPromised(In("a.mp4"));
    const auto shared = ClipReader::OpenPromised(In("a.mp4"));
    const auto at_once = ClipReader::OpenPromised(In("a.mp4"));
    for (const std::size_t frame : {0, 1, 2}) {
      expect(*jumps, frame);
      expect(*shared, frame);
    }
    const auto again = shared->Again();
    for (const std::size_t frame : {jump, jump / 2, std::size_t{3}, std::size_t{4}}) {
      expect(*jumps, frame);
      expect(*again, frame);
      expect(*at_once, frame);
    }
    for (const std::size_t frame : {3, 4, 5}) expect(*shared, frame);
    for (const auto* reader : {&jumps, &shared, &again}) {
      EXPECT_EQ((*reader)->found()->standing(), Standing::decoded);
      EXPECT_EQ((*reader)->found()->Bytes(), decoded->found()->Bytes());
    }
  }
  const auto dropped_early = ClipReader::OpenPromised(In("a.mp4"));
  ReadFrame<HX_Pixel8>(*dropped_early, 0);
}

TEST_F(FirstPassTest, DamageBreaksThePromiseInEveryRun) {
  MakeWalk("whole.mp4");
  const std::string whole = Content("whole.mp4");
  int broken = 0;
  for (unsigned number = 0; number < 60; ++number) {
    SCOPED_TRACE(number);
    std::mt19937 random(number);
    std::string bytes = whole;
    for (unsigned i = random() % 3 + 1; i-- > 0;) bytes[random() % bytes.size()] ^= 0x10;
    std::ofstream(In("a.mp4"), std::ios::binary) << bytes;
    std::unique_ptr<ClipReader> decoded, promised;
    try {
      decoded = ClipReader::Open(In("a.mp4"));
    } catch (const Failure& failure) {
      EXPECT_EQ(LineOf(Failure::Side::input, [&] { ClipReader::OpenPromised(In("a.mp4")); }),
                failure.what());
      continue;
    }
    promised = ClipReader::OpenPromised(In("a.mp4"));
    ReadAll(*promised);
    if (promised->found()->standing() == Standing::broken) {
      ++broken;
      LineOf(Failure::Side::input, [&] { promised->Again(); });
      LineOf(Failure::Side::input, [&] { ReadFrame<HX_Pixel8>(*promised, 0); });
      continue;
    }
    EXPECT_EQ(promised->found()->standing(), Standing::decoded);
    EXPECT_EQ(promised->info(), decoded->info());
  }
  EXPECT_GT(broken, 20);
}

}  // namespace
}  // namespace calmframe::media
