#include "stabilizer/render/edge_preparation.h"

#include <cmath>
#include <vector>

#include "tests/stabilizer/render/solved_clip.h"

namespace marrow::render {
namespace {

template <class Pixel>
class EdgePreparationTest : public testing::Test {};
TYPED_TEST_SUITE(EdgePreparationTest, Depths);

double Factor(int x, int y, int W, int H, const EdgePreparation& e) {
  if (x < e.left || x >= W - e.right || y < e.top || y >= H - e.bottom) return 0;
  const int d = std::min({x - e.left, W - e.right - x, y - e.top, H - e.bottom - y});
  if (d >= static_cast<int>(e.feather + 0.5f)) return 1;
  const double q = (d + 1.0) / (e.feather + 1.0);
  return q <= 0.5 ? 2 * q * q : (4 - 2 * q) * q - 1;
}

TYPED_TEST(EdgePreparationTest, AlphaRisesFromTheCutsAndColoursStay) {
  const EdgePreparation edges[] = {{0, 0, 0, 0, 10},     {3, 1, 0, 2, 4.4f},  {0, 0, 0, 0, 0.4f},
                                   {0, 0, 0, 0, 0.5f},   {5, 0, 2, 9, 0},     {30, 20, 30, 20, 2.f},
                                   {200, 0, 0, 0, 10.f}, {1, 1, 1, 1, 999.f}, {0, 0, 0, 70, 3.f}};
  for (const auto& [width, height] : {std::pair{61, 43}, {7, 50}, {1, 1}}) {
    const auto from = Textured<TypeParam>(width, height, 3, alphas::patches);
    for (const EdgePreparation& e : edges) {
      PaddedWorld<TypeParam> to(width, height);
      prepareEdges(*from, e, to.pixels);
      for (int y = 0; y < height; ++y) {
        for (int x = 0; x < width; ++x) {
          const TypeParam &p = to.pixels.row(y)[x], &s = from->row(y)[x];
          const double alpha = s.alpha * Factor(x, y, width, height, e);
          ASSERT_NEAR(p.alpha, rounds<TypeParam> ? std::floor(alpha + 0.5) : alpha,
                      rounds<TypeParam> ? 0 : 1e-6)
              << x << ", " << y << " of " << width << " by " << height;
          ASSERT_TRUE(p.red == s.red && p.green == s.green && p.blue == s.blue);
        }
      }
    }
  }
}

TEST(EdgeSettingsTest, OneScaleForAllSides) {
  const auto [left, top, right, bottom, feather] = scaledEdges({3, 5, 0.9, 4, 7}, 0.5f);
  EXPECT_THAT((std::vector<double>{1.0 * left, 1.0 * top, 1.0 * right, 1.0 * bottom, feather}),
              testing::ElementsAre(2, 3, 0, 2, 3.5));
  EXPECT_FALSE(EdgeSettings{}.any());
  EXPECT_TRUE((EdgeSettings{0, 0, 0, 0.1, 0}.any()));
}

TEST(PreparedSources, EachFrameIsPreparedOnceThoughTwoAreHeld) {
  Pictures<HX_Pixel8> frames;
  for (std::uint8_t f = 0; f < 10; ++f) {
    const int side = f == 8 ? 6 : 4;
    frames.Add(side, side, {255, f, 0, 0});
  }
  frames.refused = 13;
  PreparedSources<HX_Pixel8> prepared(frames, {1, 0, 0, 0, 0}, 5);
  // The frame, twice a neighbour that some pass wants beforehand, then all in their order.
  const auto kept = prepared.fetch(9);
  for (const std::size_t frame : {5, 9, 9, 6, 4, 7, 3, 8, 2, 9}) {
    const auto world = prepared.fetch(frame);
    EXPECT_EQ(world->row(1)[1].red, frame);
    EXPECT_EQ(world->row(1)[0].alpha, 0);
    EXPECT_EQ(world->row(1)[1].alpha, 255);
  }
  EXPECT_EQ(frames.asked, (std::vector<std::size_t>{9, 5, 6, 4, 7, 3, 8, 2}));
  EXPECT_EQ(kept->row(0)[1].red, 9);
  // What somebody still holds is not written over.
  const auto two = prepared.fetch(2);
  prepared.fetch(1);
  EXPECT_EQ(two->row(1)[1].red, 2);
  EXPECT_THROW(prepared.fetch(13), std::int32_t);
  EXPECT_EQ(prepared.fetch(1)->row(1)[1].red, 1);
}

}  // namespace
}  // namespace marrow::render
