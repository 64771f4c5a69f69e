#include "stabilizer/render/edge_preparation.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cmath>
#include <random>
#include <vector>

namespace marrow::render {
namespace {

template <class Pixel>
class EdgePreparationTest : public testing::Test {};
using Depths = testing::Types<HX_Pixel8, HX_Pixel16, HX_PixelFloat>;
TYPED_TEST_SUITE(EdgePreparationTest, Depths);

template <class Pixel>
boost::shared_ptr<WorldX<Pixel>> noise(int width, int height, unsigned seed) {
  const auto world = boost::make_shared<WorldX<Pixel>>(width, height);
  std::mt19937 random(seed);
  using Channel = decltype(Pixel::red);
  const auto value = [&] {
    return static_cast<Channel>(world_view<Pixel>::full * (random() % 1000 / 999.0));
  };
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      world->row(y)[x] = {random() % 3 ? world_view<Pixel>::full : value(), value(), value(),
                          value()};
    }
  }
  return world;
}

double factor(int x, int y, int W, int H, const EdgePreparation& e) {
  if (x < e.left || x >= W - e.right || y < e.top || y >= H - e.bottom) return 0;
  const int d = std::min({x - e.left, W - e.right - x, y - e.top, H - e.bottom - y});
  if (d >= static_cast<int>(e.feather + 0.5f)) return 1;
  const double q = (d + 1.0) / (e.feather + 1.0);
  return q <= 0.5 ? 2 * q * q : (4 - 2 * q) * q - 1;
}

TYPED_TEST(EdgePreparationTest, AlphaRisesFromTheCutsAndColoursStay) {
  constexpr bool is_float = std::is_same_v<TypeParam, HX_PixelFloat>;
  const EdgePreparation edges[] = {{0, 0, 0, 0, 10},     {3, 1, 0, 2, 4.4f},  {0, 0, 0, 0, 0.4f},
                                   {0, 0, 0, 0, 0.5f},   {5, 0, 2, 9, 0},     {30, 20, 30, 20, 2.f},
                                   {200, 0, 0, 0, 10.f}, {1, 1, 1, 1, 999.f}, {0, 0, 0, 70, 3.f}};
  for (const auto& [width, height] : {std::pair{61, 43}, {7, 50}, {1, 1}}) {
    const auto from = noise<TypeParam>(width, height, 3);
    for (const EdgePreparation& e : edges) {
      // Odd rows, with padding that must stay.
      const std::ptrdiff_t row_bytes = sizeof(TypeParam) * width + 3 * alignof(TypeParam);
      std::vector<unsigned char> buffer(row_bytes * height, 0xAB);
      WorldX<TypeParam> to(width, height, row_bytes, reinterpret_cast<TypeParam*>(buffer.data()));
      prepareEdges(*from, e, to);
      for (int y = 0; y < height; ++y) {
        for (int x = 0; x < width; ++x) {
          const TypeParam &p = to.row(y)[x], &s = from->row(y)[x];
          const double alpha = s.alpha * factor(x, y, width, height, e);
          ASSERT_NEAR(p.alpha, is_float ? alpha : std::floor(alpha + 0.5), is_float ? 1e-6 : 0)
              << x << ", " << y << " of " << width << " by " << height;
          ASSERT_TRUE(p.red == s.red && p.green == s.green && p.blue == s.blue);
        }
        for (std::ptrdiff_t i = sizeof(TypeParam) * width; i < row_bytes; ++i) {
          ASSERT_EQ(buffer[row_bytes * y + i], 0xAB);
        }
      }
    }
  }
}

TEST(EdgePreparationNumbers, WorkedOut) {
  WorldX<HX_Pixel8> from(9, 5), to(9, 5);
  for (int i = 0; i < 45; ++i) from.data()[i] = {255, 1, 2, 3};
  prepareEdges(from, {0, 0, 0, 0, 3}, to);
  // q = 1/4, 1/2, 3/4: 1/8, 1/2, 7/8 of 255. The right side begins with the second of them.
  const int middle[] = {32, 128, 223, 223, 223, 223, 223, 223, 128};
  for (int x = 0; x < 9; ++x) EXPECT_EQ(to.row(2)[x].alpha, middle[x]) << x;
  EXPECT_EQ(to.row(0)[4].alpha, 32);
  EXPECT_EQ(to.row(4)[4].alpha, 128);
  EXPECT_EQ(to.row(4)[4].blue, 3);
}

TEST(EdgePreparationNumbers, OneScaleForAllSides) {
  const EdgePreparation e = scaledEdges({3, 5, 0.9, 4, 7}, 0.5f);
  EXPECT_EQ(e.left, 2);
  EXPECT_EQ(e.top, 3);
  EXPECT_EQ(e.right, 0);
  EXPECT_EQ(e.bottom, 2);
  EXPECT_EQ(e.feather, 3.5f);
  EXPECT_FALSE(EdgeSettings{}.any());
  EXPECT_TRUE((EdgeSettings{0, 0, 0, 0.1, 0}.any()));
}

class CountedFrames final : public SourceFrames<HX_Pixel8> {
 public:
  boost::shared_ptr<const WorldX<HX_Pixel8>> Fetch(std::size_t frame) override {
    asked.push_back(frame);
    if (frame == 13) throw std::int32_t{77};
    const int side = frame == 8 ? 6 : 4;
    const auto world = boost::make_shared<WorldX<HX_Pixel8>>(side, side);
    for (int i = 0; i < side * side; ++i) {
      world->data()[i] = {255, static_cast<std::uint8_t>(frame), 0, 0};
    }
    return world;
  }
  std::vector<std::size_t> asked;
};

TEST(PreparedSources, EachFrameIsPreparedOnceThoughTwoAreHeld) {
  CountedFrames frames;
  PreparedSources<HX_Pixel8> prepared(frames, {1, 0, 0, 0, 0}, 5);
  // The frame, twice a neighbour that some pass wants beforehand, then all in their order.
  const auto kept = prepared.Fetch(9);
  for (const std::size_t frame : {5, 9, 9, 6, 4, 7, 3, 8, 2, 9}) {
    const auto world = prepared.Fetch(frame);
    EXPECT_EQ(world->row(1)[1].red, frame);
    EXPECT_EQ(world->row(1)[0].alpha, 0);
    EXPECT_EQ(world->row(1)[1].alpha, 255);
  }
  EXPECT_EQ(frames.asked, (std::vector<std::size_t>{9, 5, 6, 4, 7, 3, 8, 2}));
  EXPECT_EQ(kept->row(0)[1].red, 9);
  // What somebody still holds is not written over.
  const auto two = prepared.Fetch(2);
  prepared.Fetch(1);
  EXPECT_EQ(two->row(1)[1].red, 2);
  EXPECT_THROW(prepared.Fetch(13), std::int32_t);
  EXPECT_EQ(prepared.Fetch(1)->row(1)[1].red, 1);
}

}  // namespace
}  // namespace marrow::render
