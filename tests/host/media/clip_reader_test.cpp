#include <random>

#include "tests/host/media/clip_fixture.h"

namespace calmframe::media {
namespace {

class ClipReaderTest : public ClipTest {
 protected:
  // B-frames and short groups, and the counter in testsrc makes each frame its own.
  void MakeWalk(const std::string& name) const {
    Ffmpeg(
        "-f lavfi -i testsrc=s=96x64:r=30:d=2 -c:v libx264 -x264-params keyint=12:bframes=3 "
        "-pix_fmt yuv420p -movflags +faststart " +
        In(name));
  }
};

TEST_F(ClipReaderTest, EachWayInAndAnyOrderGivesTheFramesThatTheSequenceGives) {
  MakeWalk("a.mp4");
  const std::string copy = "-i " + In("a.mp4") + " -c copy ";
  const std::string source = "-f lavfi -i testsrc=s=98x66:r=30:d=2";
  const struct {
    const char* name;
    std::string make;
    std::size_t frames;
    bool promises;  // each of its frames, in its packets
  } clips[] = {
      {"a.mp4", "", 60, true},
      {"turned.mov", copy + "-metadata:s:v rotate=90", 60, true},
      {"open.mp4", source + " -c:v libx264 -x264-params keyint=12:bframes=3:open-gop=1", 60, true},
      {"vfr.mp4", source + " -vf select='mod(n\\,5)' -vsync vfr -c:v libx264", 48, true},
      {"wide.mov", source + ",setsar=16/11 -c:v prores_ks", 60, true},
      {"a.ts", copy, 60, true},
      {"a.mkv", copy, 60, true},
      {"vp9.webm",
       source + " -c:v libvpx-vp9 -cpu-used 8 -deadline realtime -auto-alt-ref 1 -lag-in-frames 16",
       60, true},
      {"av1.mkv", source + " -c:v libaom-av1 -cpu-used 8 -usage realtime", 60, true},
      {"in_order.avi", source + " -c:v mjpeg", 60, true},
      {"a.h264", copy + "-bsf:v h264_mp4toannexb -f h264", 60, false},
      {"edited.mp4", "-ss 0.5 " + copy, 45, false},
      {"b.avi", source + " -c:v mpeg4 -bf 2 -g 10", 60, false},
      {"fields.mov", source + ",setsar=16/11 -c:v mpeg2video -flags +ilme+ildct", 60, false},
  };
  for (const auto& clip : clips) {
    SCOPED_TRACE(clip.name);
    if (!clip.make.empty()) Ffmpeg(clip.make + " " + In(clip.name));
    const auto reader = ClipReader::Open(In(clip.name));
    const ClipInfo& info = reader->info();
    EXPECT_EQ(info.warning, "");
    ASSERT_EQ(info.frame_count, clip.frames);
    const auto promised = ClipReader::OpenPromised(In(clip.name));
    const auto found = promised->found();
    EXPECT_EQ(found->standing(), clip.promises ? Standing::promised : Standing::decoded);
    EXPECT_EQ(found->Bytes().empty(), clip.promises);
    EXPECT_EQ(promised->info(), info);
    std::vector<std::vector<HX_Pixel8>> frames;
    for (std::size_t i = 0; i < clip.frames; ++i) {
      frames.push_back(ReadFrame(*reader, i));
      EXPECT_TRUE(SamePixels(ReadFrame(*promised, i), frames[i])) << i;
      EXPECT_TRUE(i == 0 || !SamePixels(frames[i - 1], frames[i])) << i;
    }
    EXPECT_EQ(found->standing(), Standing::decoded);
    EXPECT_EQ(found->Bytes(), reader->found()->Bytes());
    const auto known = ClipReader::Open(In(clip.name), found->Bytes());
    EXPECT_EQ(known->info(), info);
    EXPECT_EQ(known->found()->Bytes(), found->Bytes());
    std::mt19937 random(1);
    for (int i = 0; i < 30; ++i) {
      const std::size_t frame = random() % (clip.frames - 1);
      ClipReader& one = *(i % 3 == 0 ? reader : i % 3 == 1 ? promised : known);
      EXPECT_TRUE(SamePixels(ReadFrame(one, frame), frames[frame])) << frame;
      if (i % 2 == 0) {
        EXPECT_TRUE(SamePixels(ReadFrame(one, frame + 1), frames[frame + 1])) << frame;
      }
    }
    const FrameRange part{clip.frames / 2 - 5, clip.frames / 2 + 7};
    const auto of_part = ClipReader::OpenPromised(In(clip.name), [&](const ClipInfo& whole) {
      EXPECT_EQ(whole, info);
      return part;
    });
    const auto ask = [&](ClipReader& one, std::size_t frame) {
      EXPECT_TRUE(SamePixels(ReadFrame(one, frame), frames[frame])) << frame << " of a part";
    };
    for (std::size_t i = part.first; i < part.end; ++i) ask(*of_part, i);
    ASSERT_EQ(of_part->found()->standing(), Standing::decoded);
    const auto part_known = ClipReader::Open(In(clip.name), of_part->found()->Bytes());
    EXPECT_EQ(part_known->info(), info);
    for (const std::size_t i : {part.end - 1, part.first, part.first + 1, std::size_t{0}, part.end,
                                clip.frames - 1, part.first}) {
      ask(*of_part, i);
      ask(*part_known, i);
    }
    ReadFrame(*ClipReader::Open(In(clip.name)), 0);  // and dropped while it decodes ahead
    // Read once, the last ones are there for another reader; those before them need the file.
    constexpr std::size_t kBound = 300'000, kLeastAFrame = 96 * 64 * 3 / 2;  // bytes
    const auto once = ClipReader::OpenPromised(In(clip.name));
    const auto keep = [&] {
      once->KeepDecoded(kBound);
      for (std::size_t i = 0; i < clip.frames; ++i) ReadFrame(*once, i);
      once->KeepDecoded(0);
    };
    keep();
    auto twice = once->Again();
    for (std::size_t i = 0; i < clip.frames; ++i) {
      EXPECT_TRUE(SamePixels(ReadFrame(*twice, i), frames[i])) << i << ", kept or decoded anew";
    }
    keep();
    twice = once->Again();
    std::filesystem::rename(In(clip.name), In("gone"));
    std::size_t first = clip.frames;
    const auto is_there = [&](std::size_t i) {
      try {
        EXPECT_TRUE(SamePixels(ReadFrame(*twice, i), frames[i])) << i << ", kept";
        return true;
      } catch (const Failure&) {
        return false;
      }
    };
    while (first > 0 && is_there(first - 1)) --first;
    EXPECT_GE(clip.frames - first, 3u);
    EXPECT_LE(clip.frames - first, kBound / kLeastAFrame);
    EXPECT_FALSE(is_there(clip.frames - 2)) << "it went as it was read";
    std::filesystem::rename(In("gone"), In(clip.name));
  }
}

TEST_F(ClipReaderTest, AnyOrderIsRightWhileFramesAreStillPromised) {
  MakeWalk("a.mp4");
  const auto decoded = ClipReader::Open(In("a.mp4"));
  const auto expect = [&](ClipReader& reader, std::size_t frame) {
    EXPECT_TRUE(SamePixels(ReadFrame(reader, frame), ReadFrame(*decoded, frame))) << frame;
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
      for (const auto* reader : {&jumps, &again, &at_once}) expect(**reader, frame);
    }
    for (const std::size_t frame : {3, 4, 5}) expect(*shared, frame);
    for (const auto* reader : {&jumps, &shared, &again}) {
      EXPECT_EQ((*reader)->found()->standing(), Standing::decoded);
      EXPECT_EQ((*reader)->found()->Bytes(), decoded->found()->Bytes());
    }
  }
  ReadFrame(*ClipReader::OpenPromised(In("a.mp4")), 0);
}

TEST_F(ClipReaderTest, OfAPartTheRestIsNotLookedAt) {
  for (const std::string name : {"a.mov", "a.avi"}) {
    SCOPED_TRACE(name);
    Ffmpeg("-f lavfi -i testsrc=s=96x64:r=30:d=2 -c:v mjpeg -q:v 2 " + In(name));
    const auto whole = ClipReader::Open(In(name));
    std::string bytes = Content(name);
    for (const auto& [from, to] : {std::pair{0.2, 0.35}, {0.75, 0.85}}) {
      for (auto at = static_cast<std::size_t>(from * bytes.size()); at < to * bytes.size();
           at += 7) {
        bytes[at] ^= 0x55;
      }
    }
    MakeFile("damaged" + name, bytes);
    const FrameRange part{27, 41};
    const auto read =
        ClipReader::OpenPromised(In("damaged" + name), [&](const ClipInfo&) { return part; });
    for (std::size_t i = part.first; i < part.end; ++i) {
      EXPECT_TRUE(SamePixels(ReadFrame(*read, i), ReadFrame(*whole, i))) << i;
    }
    EXPECT_EQ(read->found()->standing(), Standing::decoded);
    EXPECT_EQ(read->info().warning, "");
    EXPECT_NE(ClipReader::Open(In("damaged" + name))->info().warning, "");
  }
}

TEST_F(ClipReaderTest, WhatIsCutShortGivesWhatDecodesAndIsTold) {
  MakeWalk("whole.mp4");
  const std::string whole = Content("whole.mp4");
  const auto found = ClipReader::Open(In("whole.mp4"))->found()->Bytes();
  MakeFile("cut.mp4", whole.substr(0, whole.size() * 6 / 10));
  const auto cut = ClipReader::Open(In("cut.mp4"));
  const std::size_t count = cut->info().frame_count;
  EXPECT_GT(count, 12u);
  EXPECT_LT(count, 55u);
  EXPECT_EQ(cut->info().warning, In("cut.mp4") + ": damaged or cut short, " +
                                     std::to_string(count) + " of 60 frames decode");
  for (std::size_t i = count; i-- > 0;) ReadFrame(*cut, i);
  // A search meets the damage; who knows the clip doesn't search.
  MakeFile("whole.mp4", whole.substr(0, whole.size() / 2) + std::string(whole.size() / 2, 'x'));
  EXPECT_NE(ClipReader::Open(In("whole.mp4"))->info().warning, "");
  EXPECT_EQ(ClipReader::Open(In("whole.mp4"), found)->info().warning, "");
}

TEST_F(ClipReaderTest, PicturesAndPipesAreClipsAsFilesAre) {
  std::filesystem::create_directory(In("p"));
  Ffmpeg("-f lavfi -i testsrc=s=96x64:r=25:d=0.4 -c:v ffv1 -pix_fmt bgr0 " + In("a.mkv") +
         " -start_number 97 " + In("p/f%d.png") + " -start_number 97 " + In("p/0%03d.jpg"));
  Output("mkfifo " + In("pipe") + "; (timeout 60 cat " + In("a.mkv") + " >" + In("pipe") + " &) >" +
         In("log"));
  const auto file = ClipReader::Open(In("a.mkv"));
  const auto expect_same = [&](const std::string& name) {
    SCOPED_TRACE(name);
    const auto reader = ClipReader::Open(In(name));
    ASSERT_EQ(reader->info().frame_count, 10u);
    EXPECT_EQ(reader->info().path, In(name));
    for (const std::size_t i : {9, 0, 1, 5}) {
      EXPECT_TRUE(SamePixels(ReadFrame(*reader, i), ReadFrame(*file, i))) << i;
    }
  };
  expect_same("pipe");
  expect_same("p/f%d.png");
  const auto fails = [&](const std::string& name, const std::string& cause) {
    EXPECT_THAT([&] { ClipReader::Open(In(name)); },
                Fails(Failure::Side::input, testing::HasSubstr(cause)));
  };
  fails("p/*.png", "order of their names, f106.png before f97.png");
  for (int i = 97; i < 107; ++i) {
    const std::string number = std::to_string(i);
    std::filesystem::rename(In("p/f" + number + ".png"),
                            In("p/f" + std::string(i < 100, '0') + number + ".png"));
  }
  for (const char* name : {"p/f%03d.png", "p/f*.png"}) expect_same(name);
  std::filesystem::remove(In("p/0097.jpg"));
  expect_same("p");  // the kind that is there most
  std::filesystem::remove(In("p/f100.png"));
  fails("p/f%03d.png", "p/f%03d.png: f100.png is missing");
  fails("p/f099.png", "one picture alone has no motion");
  fails("p/f%04d.png", "no file has such a name");
}

TEST_F(ClipReaderTest, AMovieWithoutItsIndexIsToldToLackIt) {
  Ffmpeg("-f lavfi -i testsrc=s=96x64:r=30:d=1 -c:v libx264 " + In("whole.mp4"));
  const std::string whole = Content("whole.mp4");
  for (const std::size_t size : {whole.find("moov") - 4, whole.find("mdat") + 1000}) {
    MakeFile("cut.mp4", whole.substr(0, size));
    EXPECT_THAT([&] { ClipReader::Open(In("cut.mp4")); },
                Fails(Failure::Side::input, testing::HasSubstr("its index is missing")));
  }
}

TEST_F(ClipReaderTest, DamageAnywhereIsToldOrBreaksThePromiseInEveryRun) {
  MakeWalk("whole.mp4");
  const std::string whole = Content("whole.mp4");
  int broken = 0;
  for (unsigned number = 0; number < 40; ++number) {
    SCOPED_TRACE(number);
    std::mt19937 random(number);
    std::string bytes = whole;
    for (unsigned i = random() % 3 + 1; i-- > 0;) bytes[random() % bytes.size()] ^= 0x10;
    MakeFile("a.mp4", bytes);
    std::unique_ptr<ClipReader> decoded;
    try {
      decoded = ClipReader::Open(In("a.mp4"));
    } catch (const Failure& failure) {
      EXPECT_THAT([&] { ClipReader::OpenPromised(In("a.mp4")); },
                  Fails(Failure::Side::input, failure.what()));
      continue;
    }
    const auto promised = ClipReader::OpenPromised(In("a.mp4"));
    try {  // until one can't be read
      for (std::size_t i = 0; i < promised->info().frame_count; ++i) ReadFrame(*promised, i);
    } catch (const Failure&) {
    }
    if (promised->found()->standing() == Standing::broken) {
      ++broken;
      EXPECT_THAT([&] { promised->Again(); }, Fails(Failure::Side::input, testing::_));
      EXPECT_THAT([&] { ReadFrame(*promised, 0); }, Fails(Failure::Side::input, testing::_));
      continue;
    }
    EXPECT_EQ(promised->found()->standing(), Standing::decoded);
    EXPECT_EQ(promised->info(), decoded->info());
  }
  EXPECT_GT(broken, 14);
}

TEST_F(ClipReaderTest, AFrameInTwoPacketsIsOneFrame) {
  const std::string path = CALMFRAME_SHARED "/clips/static-van-interlaced-1080i.mts";
  if (!std::filesystem::exists(path)) GTEST_SKIP() << "no footage here";
  const auto van = ClipReader::Open(path);
  EXPECT_EQ(van->info().frame_count, 36u);
  EXPECT_EQ(van->info().field_order, FieldOrder::top_first);
  EXPECT_EQ(van->info().frame_rate.num, 25 * van->info().frame_rate.den);
  const auto last = ReadFrame(*van, 35), middle = ReadFrame(*van, 17);
  for (const std::size_t i : {0, 16, 17, 18, 34, 35}) {
    const auto frame = ReadFrame(*van, i);
    EXPECT_EQ(SamePixels(frame, middle), i == 17);
    EXPECT_EQ(SamePixels(frame, last), i == 35);
  }
}

}  // namespace
}  // namespace calmframe::media
