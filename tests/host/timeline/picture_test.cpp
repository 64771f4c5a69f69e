#include "host/timeline/picture.h"

#include <gtest/gtest.h>

#include "host/timeline/source.h"

namespace calmframe::host {
namespace {

// Green of 10 y + x, in steps of the kind.
template <class Pixel>
void Ramp(Picture& picture) {
  using Sample = decltype(Pixel::green);
  for (int y = 0; y < picture.height(); ++y) {
    for (int x = 0; x < picture.width(); ++x) {
      const auto v = static_cast<Sample>(10 * y + x);
      picture.row<Pixel>(y)[x] = {static_cast<Sample>(1), v, v, v};
    }
  }
}

template <class Pixel>
void FieldsOfFiveLines(PixelKind kind) {
  const auto pool = PicturePool::Make();
  for (const int parity : {0, 1}) {
    const auto picture = pool->NewPicture(kind, 3, 5);
    Ramp<Pixel>(*picture);
    KeepField(*picture, parity);
    // Lines 0 2 4 with 1 and 3 between them; or 1 and 3, and the nearest of them at the edges.
    const double expected[2][5] = {{2, 12, 22, 32, 42}, {12, 12, 22, 32, 32}};
    for (int y = 0; y < 5; ++y) {
      EXPECT_EQ(static_cast<double>(picture->row<Pixel>(y)[2].green), expected[parity][y]);
      EXPECT_EQ(static_cast<double>(picture->row<Pixel>(y)[2].alpha), 1);
    }
  }
  const auto line = pool->NewPicture(kind, 3, 1);
  Ramp<Pixel>(*line);
  KeepField(*line, 1);
  EXPECT_EQ(static_cast<double>(line->row<Pixel>(0)[2].green), 2);
}

TEST(Picture, AFieldFillsItsFrameFromItsOwnLines) {
  FieldsOfFiveLines<HX_Pixel8>(PixelKind::argb8);
  FieldsOfFiveLines<HX_Pixel16>(PixelKind::argb16);
  FieldsOfFiveLines<HX_PixelFloat>(PixelKind::argbf);
}

TEST(Picture, MemoryIsUsedAgainAndOutlivesThePool) {
  auto pool = PicturePool::Make();
  PicturePtr kept = pool->NewPicture(PixelKind::argb16, 8, 8);
  const std::uint8_t* const first = kept->memory();
  kept = nullptr;
  kept = pool->NewPicture(PixelKind::argbf, 4, 8);  // as many bytes
  EXPECT_EQ(kept->memory(), first);
  const PicturePtr other = pool->NewPicture(PixelKind::argbf, 4, 8);
  EXPECT_NE(other->memory(), first);
  pool = nullptr;
  EXPECT_EQ(kept->memory(), first);
  EXPECT_THROW(PicturePool::Make()->NewPicture(PixelKind::argbf, 1 << 30, 2), std::bad_alloc);
}

TEST(ResizedSource, ScalesOnceAndIsAnotherIdentity) {
  SourceInfo info;
  info.width = 4;
  info.height = 2;
  info.frame_count = 1;
  const SourcePtr source = MakeDrawnSource(info, [](std::int64_t, Picture& picture) {
    FillPicture(picture, [](int x, int) { return HX_PixelFloat{1, x < 2 ? 0.2f : 0.6f, 0, 0}; });
  });
  const SourcePtr half = MakeResizedSource(source, 2, 1);
  EXPECT_EQ(half->info().width, 2);
  EXPECT_NE(half->info().content, source->info().content);
  const PicturePtr picture = half->Fetch(0, PixelKind::argb8);
  ASSERT_TRUE(picture);
  EXPECT_EQ(picture->row<HX_Pixel8>(0)[0].red, 51);
  EXPECT_EQ(picture->row<HX_Pixel8>(0)[1].red, 153);
  EXPECT_FALSE(half->Fetch(1, PixelKind::argb8));

  EXPECT_EQ(MakeResizedSource(half, 4, 2), source);
  const SourcePtr by_way = MakeResizedSource(MakeResizedSource(source, 1, 1), 2, 1);
  EXPECT_EQ(by_way->info().content, half->info().content);
  EXPECT_EQ(by_way->Fetch(0, PixelKind::argb8)->row<HX_Pixel8>(0)[1].red, 153);
}

}  // namespace
}  // namespace calmframe::host
