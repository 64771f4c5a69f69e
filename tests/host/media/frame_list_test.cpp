#include "host/media/frame_list.h"

#include "platform/tessel/filesupport.h"
#include "tests/host/media/clip_fixture.h"

namespace calmframe::media {
namespace {

using namespace tessel::filesupport;
using Bytes = std::vector<std::uint8_t>;

std::string Inflated(const Bytes& bytes) {
  IStringByteStream stream(bytes.data(), bytes.size());
  IZipByteStream zip(stream);
  std::string all;
  char part[4096];
  while (const std::size_t got = zip.ReadSome(part, sizeof part)) all.append(part, got);
  return all;
}

Bytes Deflated(const std::string& all) {
  OStringByteStream bytes;
  OZipByteStream zip(bytes);
  zip.Write(all.data(), all.size());
  zip.Close();
  return {bytes.bytes().begin(), bytes.bytes().end()};
}

class FrameListTest : public ClipTest {
 protected:
  Bytes BytesOf(const std::string& name) const {
    return ClipReader::Open(In(name))->found()->Bytes();
  }
  void MakeWalk() const {
    Ffmpeg(
        "-f lavfi -i testsrc=s=96x64:r=30:d=3 -c:v libx264 -x264-params keyint=12:bframes=3 "
        "-pix_fmt yuv420p -movflags +faststart " +
        In("a.mp4"));
  }
};

TEST_F(FrameListTest, AClipThatIsKnownIsNotSearchedAgain) {
  MakeWalk();
  Ffmpeg("-i " + In("a.mp4") + " -c copy " + In("a.ts"));
  Ffmpeg("-i " + In("a.mp4") + " -c copy -bsf:v h264_mp4toannexb -f h264 " + In("a.h264"));
  Ffmpeg("-i " + In("a.mp4") + " -c copy -metadata:s:v rotate=90 " + In("turned.mov"));
  Ffmpeg("-f lavfi -i testsrc=s=96x64:r=30:d=1,setsar=16/11 -c:v mpeg2video -flags +ilme+ildct " +
         In("fields.mkv"));
  for (const char* name : {"a.mp4", "a.ts", "a.h264", "turned.mov", "fields.mkv"}) {
    SCOPED_TRACE(name);
    const auto searched = ClipReader::Open(In(name));
    const auto known = ClipReader::Open(In(name), searched->found()->Bytes());
    EXPECT_EQ(known->info(), searched->info());
    for (const std::size_t frame : {29, 3, 4, 17, 0}) {
      EXPECT_TRUE(
          SamePixels(ReadFrame<HX_Pixel8>(*known, frame), ReadFrame<HX_Pixel8>(*searched, frame)))
          << frame;
    }
    EXPECT_EQ(known->found()->Bytes(), searched->found()->Bytes());
  }
  // A search would meet the damage.
  const Bytes found = BytesOf("a.mp4");
  std::string bytes = Content("a.mp4");
  bytes.replace(bytes.size() / 2, bytes.size() / 4, bytes.size() / 4, 'x');
  std::ofstream(In("a.mp4"), std::ios::binary) << bytes;
  EXPECT_NE(ClipReader::Open(In("a.mp4"))->info().warning, "");
  EXPECT_EQ(ClipReader::Open(In("a.mp4"), found)->info().warning, "");
}

TEST_F(FrameListTest, DamageIsToldAgainUnderTheNameOfTheDay) {
  MakeWalk();
  const std::string bytes = Content("a.mp4");
  std::ofstream(In("cut.mp4"), std::ios::binary) << bytes.substr(0, bytes.size() * 6 / 10);
  const auto searched = ClipReader::Open(In("cut.mp4"));
  ASSERT_NE(searched->info().warning, "");
  std::filesystem::rename(In("cut.mp4"), In("moved.mp4"));
  const ClipInfo again = ClipReader::Open(In("moved.mp4"), searched->found()->Bytes())->info();
  EXPECT_EQ(again.warning, In("moved.mp4") + searched->info().warning.substr(In("cut.mp4").size()));
}

TEST_F(FrameListTest, AnHourTakesSomeNineBytesAFrame) {
  FrameList list;
  list.info.path = "a";
  constexpr std::size_t kFrames = 100'000;
  for (std::size_t i = 0; i < kFrames; ++i) {
    const auto pts = static_cast<std::int64_t>(i) * 1001;
    list.info.times.push_back({pts, 1001});
    list.index.push_back({pts, (i + 1) * 0x9E3779B97F4A7C15u, i % 250 == 0});
  }
  list.info.width = list.info.height = 16;
  list.info.frame_count = kFrames;
  list.info.stream = 0;
  const Bytes bytes = list.Bytes();
  EXPECT_LT(bytes.size(), 10 * kFrames);
  const std::optional<FrameList> read = FrameListOf(bytes, "a");
  ASSERT_TRUE(read);
  EXPECT_EQ(read->info, list.info);
  for (std::size_t i = 0; i < kFrames; ++i) {
    ASSERT_EQ(read->index[i].pts, list.index[i].pts);
    ASSERT_EQ(read->index[i].fingerprint, list.index[i].fingerprint);
    ASSERT_EQ(read->index[i].keyframe, list.index[i].keyframe);
  }
}

TEST_F(FrameListTest, WhatCantBeBelievedIsSearched) {
  MakeWalk();
  Ffmpeg("-f lavfi -i testsrc2=s=96x64:r=30:d=2 -c:v libx264 " + In("other.mp4"));
  const ClipInfo truth = ClipReader::Open(In("a.mp4"))->info();
  const Bytes good = BytesOf("a.mp4");
  EXPECT_EQ(ClipReader::Open(In("a.mp4"), BytesOf("other.mp4"))->info(), truth);
  for (std::size_t at = 0; at < good.size(); at += 13) {
    Bytes bad = good;
    bad[at] ^= 0x10;
    EXPECT_FALSE(FrameListOf(bad, In("a.mp4"))) << at;
    bad.assign(good.begin(), good.begin() + static_cast<std::ptrdiff_t>(at));
    EXPECT_FALSE(FrameListOf(bad, In("a.mp4"))) << at;
  }
  // Whoever writes such bytes deflates them well, and tells what he likes.
  const std::string inflated = Inflated(good);
  for (const std::size_t maker : {0, 4, 8}) {
    std::string other = inflated;
    ++other[maker];
    EXPECT_FALSE(FrameListOf(Deflated(other), In("a.mp4"))) << maker;
  }
  EXPECT_FALSE(FrameListOf(Deflated(inflated + "x"), In("a.mp4")));
  for (std::size_t at = 12; at < inflated.size(); ++at) {
    for (const std::uint64_t wrong : {std::uint64_t{0}, ~std::uint64_t{0}, std::uint64_t{1} << 63,
                                      (std::uint64_t{1} << 63) - 1, std::uint64_t{0x7fffffff}}) {
      std::string told = inflated;
      std::memcpy(told.data() + at, &wrong, std::min<std::size_t>(8, told.size() - at));
      const std::optional<FrameList> list = FrameListOf(Deflated(told), In("a.mp4"));
      if (!list) continue;
      const ClipInfo& info = list->info;
      ASSERT_EQ(info.times.size(), list->index.size()) << at;
      ASSERT_EQ(info.times.size(), info.frame_count) << at;
      ASSERT_TRUE(info.width > 0 && info.height > 0 && info.frame_rate.num > 0 &&
                  info.frame_rate.den > 0 && info.pixel_aspect.num > 0 &&
                  info.pixel_aspect.den > 0 && info.time_base.num > 0 && info.time_base.den > 0)
          << at;
      for (std::size_t i = 0; i + 1 < info.times.size(); ++i) {
        ASSERT_GT(info.times[i].duration, 0) << at;
        ASSERT_EQ(info.times[i].pts + info.times[i].duration, info.times[i + 1].pts) << at;
      }
      if (at % 97 != 0) continue;
      // Frames are had by it, or told to be none.
      const auto reader = ClipReader::Open(In("a.mp4"), Deflated(told));
      try {
        for (const std::size_t frame : {5, 80, 20}) ReadFrame<HX_Pixel8>(*reader, frame);
      } catch (const Failure&) {
      }
    }
  }
}

}  // namespace
}  // namespace calmframe::media
