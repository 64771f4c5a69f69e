#include "host/timeline/picture.h"

#include <gtest/gtest.h>

#include <tuple>

#include "tests/host/timeline/drawn_media.h"

namespace calmframe::host {
namespace {

template <class Pixel>
void ExpectFields(PixelKind kind) {
  using Sample = decltype(Pixel::green);
  // Lines 0 2 4 with 1 and 3 between them; 1 and 3, and the nearest of them at the edges; one line.
  const struct {
    int parity;
    std::vector<Sample> greens;  // of the third column
  } cases[] = {{0, {2, 12, 22, 32, 42}}, {1, {12, 12, 22, 32, 32}}, {1, {2}}};
  for (const auto& c : cases) {
    const int height = static_cast<int>(c.greens.size());
    const auto picture = PicturePool::Make()->NewPicture(kind, 3, height);
    for (int i = 0; i < 3 * height; ++i) {
      const auto green = static_cast<Sample>(10 * (i / 3) + i % 3);
      picture->row<Pixel>(i / 3)[i % 3] = {1, 0, green, 0};
    }
    KeepField(*picture, c.parity);
    for (int y = 0; y < height; ++y) {
      EXPECT_EQ(picture->row<Pixel>(y)[2].green, c.greens[y]) << y;
      EXPECT_EQ(picture->row<Pixel>(y)[2].alpha, 1);
    }
  }
}

// (100 * 200 + 50 * 80) / 150; all of the one that isn't clear; nothing of two clear ones.
template <class Pixel>
void ExpectWeights(PixelKind kind) {
  const auto picture = PicturePool::Make()->NewPicture(kind, 3, 3);
  const Pixel lines[][3] = {{{100, 200, 9, 0}, {0, 7, 7, 7}, {0, 7, 7, 7}},
                            {{1, 1, 1, 1}, {1, 1, 1, 1}, {1, 1, 1, 1}},
                            {{50, 80, 9, 150}, {200, 30, 40, 50}, {0, 90, 90, 90}}};
  for (int i = 0; i < 9; ++i) picture->row<Pixel>(i / 3)[i % 3] = lines[i / 3][i % 3];
  KeepField(*picture, 0);
  const Pixel expected[] = {{75, 160, 9, 50}, {100, 30, 40, 50}, {0, 0, 0, 0}};
  for (int x = 0; x < 3; ++x) {
    const Pixel &found = picture->row<Pixel>(1)[x], &e = expected[x];
    EXPECT_EQ(std::tie(found.alpha, found.red, found.green, found.blue),
              std::tie(e.alpha, e.red, e.green, e.blue))
        << x;
  }
}

TEST(Picture, AFieldsColoursCountAsMuchAsTheirAlpha) {
  ExpectWeights<HX_Pixel8>(PixelKind::argb8);
  ExpectWeights<HX_Pixel16>(PixelKind::argb16);
  ExpectWeights<HX_PixelFloat>(PixelKind::argbf);
}

TEST(Picture, AFieldFillsItsFrameFromItsOwnLines) {
  ExpectFields<HX_Pixel8>(PixelKind::argb8);
  ExpectFields<HX_Pixel16>(PixelKind::argb16);
  ExpectFields<HX_PixelFloat>(PixelKind::argbf);
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
  const auto draw = [](std::int64_t, Picture& picture) {
    FillPicture(picture, [](int x, int) { return HX_PixelFloat{1, x < 2 ? 0.2f : 0.6f, 0, 0}; });
  };
  const SourcePtr source = MakeDrawnSource(DrawnInfo(4, 2, 1), draw);
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
