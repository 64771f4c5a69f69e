#include "stabilizer/render/render_geometry.h"

#include <gtest/gtest.h>

namespace marrow::render {
namespace {

Renderer full_hd(float scale = 1) {
  return Renderer({-4.5, 0, 1925.25, 1083}, 1920, 1080, 64, 36, scale, scale);
}

struct rectangle {
  int left, top, right, bottom;
};

void expect_out(const Renderer& r, rectangle e) {
  EXPECT_EQ(r.outLeft, e.left);
  EXPECT_EQ(r.outTop, e.top);
  EXPECT_EQ(r.outRight, e.right);
  EXPECT_EQ(r.outBottom, e.bottom);
}

TEST(RendererGeometry, PlaneAndCells) {
  const Renderer r = full_hd();
  EXPECT_EQ(r.planeWidth, 1930);
  EXPECT_EQ(r.planeHeight, 1083);
  EXPECT_NEAR(r.cellWidth, 30.46031746, 1e-8);
  EXPECT_NEAR(r.cellHeight, 30.82857143, 1e-8);
  const Renderer half = full_hd(.5f);
  EXPECT_EQ(half.sourceWidth, 960);
  EXPECT_EQ(half.planeWidth, 965);
}

TEST(FitZoom, CoversTheFrame) {
  Renderer r = full_hd();
  EXPECT_NEAR(r.fitZoom(1920, 1080, 1920, 1080, 0, 1.5f, 1), 1.0009259, 1e-6);
  EXPECT_NEAR(r.fitZoom(1920, 1080, 1918, 1078, 0, 1.5f, 1), 1.0027829, 1e-6);
  EXPECT_NEAR(r.fitZoom(1920, 1080, 1800, 1000, 0, 1.5f, 1), 1.081, 1e-6);
  expect_out(r, {0, 0, 1920, 1080});
}

TEST(FitZoom, LimitsLeaveTheWindowCentred) {
  Renderer r = full_hd();
  EXPECT_EQ(r.fitZoom(1920, 1080, 1000, 600, 0, 1.5f, 1), 1.5f);
  expect_out(r, {210, 90, 1710, 990});
  EXPECT_EQ(r.fitZoom(1920, 1080, 1800, 1000, .1f, 1.5f, 1), 1.0f);
  expect_out(r, {60, 40, 1860, 1040});
  EXPECT_EQ(r.fitZoom(1920, 1080, 1800, 1000, 0, 1, 1), 1.0f);
  expect_out(r, {60, 40, 1860, 1040});
  EXPECT_EQ(r.fitZoom(1920, 1080, 1800, 1000, 0, 1, .5f), .5f);
  expect_out(r, {510, 290, 1410, 790});
}

TEST(FitZoom, HalfResolution) {
  Renderer r = full_hd(.5f);
  EXPECT_NEAR(r.fitZoom(1920, 1080, 1800, 1000, 0, 1.5f, 1), 1.081, 1e-6);
  expect_out(r, {0, 0, 960, 540});
}

}  // namespace
}  // namespace marrow::render
