#include "effect/source_shape.h"

#include <gtest/gtest.h>

namespace kelp::effect {
namespace {

TEST(SourceShapeTest, WidthInSquarePixels) {
  const struct {
    std::int32_t width, num;
    std::uint32_t den, square;
  } cases[] = {{720, 64, 45, 1024}, {1440, 4, 3, 1920}, {720, 16, 15, 768},
               {720, 10, 11, 655},  {720, 1, 10000, 1}, {720, 0, 1, 1},
               {720, 0, 0, 1},      {0, 1, 1, 1},       {720, 1, 0, UINT32_MAX}};
  for (const auto& c : cases) {
    const SourceShape shape{c.width, 576, c.num, c.den};
    EXPECT_EQ(shape.square_width(), c.square) << c.width << " * " << c.num << ':' << c.den;
    EXPECT_EQ(shape.square_height(), 576u);
  }
  EXPECT_EQ((SourceShape{720, 576, 64, 45}.pixel_aspect()), 1024.0f / 720.0f);
  EXPECT_EQ((SourceShape{64, 0}.square_height()), 1u);
}

TEST(SourceShapeTest, SizesTellSourcesApart) {
  const SourceShape shape{64, 36};
  EXPECT_TRUE(shape.SameSize({64, 36, 2, 1}));
  EXPECT_FALSE(shape.SameSize({36, 36}));
  EXPECT_FALSE(shape.SameSize({64, 64}));
  EXPECT_TRUE((SourceShape{1, 1}.one_by_one()));
  EXPECT_FALSE((SourceShape{1, 2}.one_by_one()));
  EXPECT_FALSE((SourceShape{2, 1}.one_by_one()));
}

}  // namespace
}  // namespace kelp::effect
