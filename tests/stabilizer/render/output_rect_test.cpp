#include "stabilizer/render/output_rect.h"

#include "tests/stabilizer/render/solved_clip.h"

namespace marrow::render {
namespace {

TEST(IsOvercropped, UnderTwoFifthsAsShown) {
  const SolvedClip clip(1920, 1080, 3, 3, Moved(0, 0));
  Renderer renderer = makeRenderer(clip, 1, 1);
  const struct {
    int width, height;
    Framing framing;
    bool overcropped;
  } cases[] = {{768, 432, Framing::crop, false},
               {767, 432, Framing::crop, true},
               {1900, 431, Framing::crop, true},
               {767, 431, Framing::crop_auto_scale, false},  // enlarged
               {511, 431, Framing::crop_auto_scale, true},
               {0, -3, Framing::crop_auto_scale, true}};
  for (const auto& c : cases) {
    cropper crop(1, 1920, 1080);
    crop.cropWidth = c.width;
    crop.cropHeight = c.height;
    EXPECT_EQ(isOvercropped(clip, crop, {.framing = c.framing}, renderer), c.overcropped)
        << c.width << " by " << c.height;
  }
}

// A plane of 132 x 82 about a frame of 100 x 80. Pixels' centres are whole in the plane, and its
// edges half a pixel away; all shrinks about its middle.
TEST(OutlinePolygon, GoesAroundThePictureAsItIsShown) {
  SolvedClip clip(100, 80, 3, 3, Moved(7, -5));
  clip.Add(Moved(40, -2));
  const struct {
    float scale, additional;
    int origin_x, origin_y;
    std::size_t frame;
    double left, top, right, bottom;  // of the picture's vertices
  } cases[] = {
      {1, 1, 16, 1, 0, 0.5, 0.5, 99.5, 79.5},
      {1, 1, 16, 1, 1, 33.5, 3.5, 132.5, 82.5},
      {1, 0.5f, 16, 1, 0, 66 - 65.5 / 2, 41 - 40.5 / 2, 66 + 33.5 / 2, 41 + 38.5 / 2},
      {1, 2, 16, 1, 1, 66 - 32.5 * 2, 41 - 37.5 * 2, 66 + 66.5 * 2, 41 + 41.5 * 2},
      // Half of that, and a frame of 50 x 40; the origin's 0.5 is cut off.
      {0.5f, 0.5f, 8, 0, 0, 33 - 32.5 / 2, 20 - 19.5 / 2, 33 + 17.0 / 2, 20 + 20.0 / 2},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::Message() << c.scale << " " << c.additional << " " << c.frame);
    const Renderer renderer = makeRenderer(clip, c.scale, c.scale);
    const auto p = outlinePolygon(clip, c.frame, renderer, {.additional_scale = c.additional},
                                  c.origin_x, c.origin_y);
    const double x[] = {c.left, (c.left + c.right) / 2, c.right};
    const double y[] = {c.top, (c.top + c.bottom) / 2, c.bottom};
    const int around[][2] = {{0, 0}, {1, 0}, {2, 0}, {2, 0}, {2, 1}, {2, 2},
                             {2, 2}, {1, 2}, {0, 2}, {0, 2}, {0, 1}, {0, 0}};
    ASSERT_EQ(p.size(), 2 * std::size(around));
    for (std::size_t i = 0; i < std::size(around); ++i) {
      EXPECT_NEAR(p[2 * i], x[around[i][0]], 1e-4) << i;
      EXPECT_NEAR(p[2 * i + 1], y[around[i][1]], 1e-4) << i;
    }
  }
}

}  // namespace
}  // namespace marrow::render
