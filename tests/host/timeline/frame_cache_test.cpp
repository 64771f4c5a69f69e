#include "host/timeline/frame_cache.h"

#include <gtest/gtest.h>

#include <string>

namespace calmframe::host {
namespace {

using tessel::utility::Guid;

class FrameCacheTest : public testing::Test {
 protected:
  static Guid Id(int n) { return Guid::FromText("frame " + std::to_string(n)); }
  PicturePtr Frame() { return pool->NewPicture(PixelKind::argb8, 5, 5); }  // of 100 bytes
  void Insert(int n) { cache.Insert(Id(n), Frame()); }
  std::string Kept(int count) {
    std::string kept;
    for (int n = 0; n < count; ++n) kept += cache.Find(Id(n)) ? '#' : '.';
    return kept;
  }

  const boost::shared_ptr<PicturePool> pool = PicturePool::Make();
  FrameCache cache{300};
};

TEST_F(FrameCacheTest, DropsTheLeastRecentlyUsed) {
  for (int n = 0; n < 3; ++n) Insert(n);
  EXPECT_TRUE(cache.Find(Id(0)));
  Insert(3);
  EXPECT_EQ(Kept(4), "#.##");
  EXPECT_EQ(cache.bytes(), 300u);
  cache.SetBound(100);
  EXPECT_EQ(Kept(4), "...#");
  EXPECT_EQ(cache.bytes(), 100u);
}

TEST_F(FrameCacheTest, WhatIsReferencedStaysBeyondTheBound) {
  cache.Reference(Id(0));
  cache.Reference(Id(0));
  EXPECT_FALSE(cache.Find(Id(0)));
  EXPECT_EQ(cache.references(), 2u);
  Insert(0);
  const Picture* const place = cache.Find(Id(0)).get();
  cache.SetBound(0);
  const PicturePtr other = Frame();
  EXPECT_EQ(cache.Insert(Id(1), other), other) << "handed on, though there is no room";
  EXPECT_EQ(Kept(2), "#.");
  EXPECT_EQ(cache.Insert(Id(0), Frame()).get(), place) << "the first one stays where it is";
  cache.Dereference(Id(0));
  EXPECT_EQ(cache.Find(Id(0)).get(), place);
  cache.Dereference(Id(0));
  EXPECT_FALSE(cache.Find(Id(0)));
  EXPECT_EQ(cache.bytes(), 0u);
}

TEST_F(FrameCacheTest, CountsNeverFallBelowZero) {
  cache.Dereference(Id(0));
  Insert(0);
  cache.Dereference(Id(0));
  cache.Reference(Id(0));
  cache.Dereference(Id(0));
  cache.Reference(Id(1));  // never made
  cache.Dereference(Id(1));
  EXPECT_EQ(cache.references(), 0u);
  for (int n = 2; n < 5; ++n) Insert(n);
  EXPECT_EQ(Kept(5), "..###") << "a frame that was referenced is dropped like any other";
}

}  // namespace
}  // namespace calmframe::host
