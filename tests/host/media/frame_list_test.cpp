#include "host/media/frame_list.h"

#include <algorithm>
#include <tuple>

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

class FrameListTest : public ClipTest {};

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
  list.known = {70'000, 80'000};
  const Bytes bytes = list.Bytes();
  EXPECT_LT(bytes.size(), 10 * kFrames);
  const std::optional<FrameList> read = FrameListOf(bytes, "a");
  ASSERT_TRUE(read);
  EXPECT_EQ(read->info, list.info);
  EXPECT_EQ(read->known, list.known);
  const auto all = [](const IndexEntry& of) {
    return std::tuple(of.pts, of.fingerprint, of.keyframe);
  };
  EXPECT_TRUE(std::ranges::equal(read->index, list.index, {}, all, all));
}

TEST_F(FrameListTest, WhatCantBeBelievedIsSearched) {
  Ffmpeg("-f lavfi -i testsrc=s=96x64:r=30:d=3 -c:v libx264 -g 12 " + In("a.mp4"));
  Ffmpeg("-f lavfi -i testsrc2=s=96x64:r=30:d=2 -c:v libx264 " + In("other.mp4"));
  const auto reader = ClipReader::Open(In("a.mp4"));
  const Bytes good = reader->found()->Bytes();
  const Bytes others = ClipReader::Open(In("other.mp4"))->found()->Bytes();
  EXPECT_EQ(ClipReader::Open(In("a.mp4"), others)->info(), reader->info());
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
      ASSERT_TRUE(info.width > 0 && info.height > 0) << at;
      for (const Ratio& ratio : {info.frame_rate, info.pixel_aspect, info.time_base}) {
        ASSERT_TRUE(ratio.num > 0 && ratio.den > 0) << at;
      }
      for (std::size_t i = 0; i + 1 < info.times.size(); ++i) {
        ASSERT_GT(info.times[i].duration, 0) << at;
        ASSERT_EQ(info.times[i].pts + info.times[i].duration, info.times[i + 1].pts) << at;
      }
      if (at % 97 != 0) continue;
      // Frames are had by it, or told to be none.
      const auto believer = ClipReader::Open(In("a.mp4"), Deflated(told));
      try {
        for (const std::size_t frame : {5, 80, 20}) ReadFrame(*believer, frame);
      } catch (const Failure&) {
      }
    }
  }
}

}  // namespace
}  // namespace calmframe::media
