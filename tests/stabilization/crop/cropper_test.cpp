#include "stabilization/crop/cropper.h"

#include <gmock/gmock.h>

#include <boost/make_shared.hpp>
#include <cmath>
#include <functional>
#include <limits>

#include "stabilization/crop/crop_path.h"
#include "stabilization/crop/outline_mask.h"

using namespace marrow::stabilization;
using testing::FloatNear;

namespace {

using motion = std::function<point2(double, double)>;

boost::shared_ptr<const VarVector> warped(int width, int height, int cols, int rows,
                                          const motion& to) {
  const auto warp = boost::make_shared<VarVector>(cols, rows);
  for (int r = 0; r < rows; ++r) {
    for (int c = 0; c < cols; ++c) {
      const point2 p = to(c * (width - 1.0) / (cols - 1), r * (height - 1.0) / (rows - 1));
      warp->values[2 * (r * cols + c)] = p.x;
      warp->values[2 * (r * cols + c) + 1] = p.y;
    }
  }
  return warp;
}

boost::shared_ptr<const VarVector> full_hd(const motion& to) {
  return warped(1920, 1080, 64, 36, to);
}

motion shift(double dx, double dy) {
  return [=](double x, double y) { return point2{x + dx, y + dy}; };
}

frame_bounds bounds_of(const std::vector<boost::shared_ptr<const VarVector>>& warps) {
  frame_bounds b{1e300, 1e300, -1e300, -1e300};
  for (const auto& warp : warps) {
    for (std::size_t i = 0; i < warp->values.size(); i += 2) {
      b.min_x = std::min(b.min_x, warp->values[i]);
      b.max_x = std::max(b.max_x, warp->values[i]);
      b.min_y = std::min(b.min_y, warp->values[i + 1]);
      b.max_y = std::max(b.max_y, warp->values[i + 1]);
    }
  }
  return b;
}

boost::shared_ptr<cropper> crop(const std::vector<boost::shared_ptr<const VarVector>>& warps,
                                bool no_motion) {
  SolverParamsRecord parameters;
  parameters.no_motion = no_motion;
  std::size_t calls = 0;
  const auto result = RunCropper(parameters, warps, bounds_of(warps), false, [&calls] { ++calls; });
  EXPECT_EQ(calls, warps.size());
  return result;
}

void expect_rect(const crop_rect& rect, float left, float right, float top, float bottom,
                 float tolerance = 0) {
  EXPECT_THAT(rect.left, FloatNear(left, tolerance));
  EXPECT_THAT(rect.right, FloatNear(right, tolerance));
  EXPECT_THAT(rect.top, FloatNear(top, tolerance));
  EXPECT_THAT(rect.bottom, FloatNear(bottom, tolerance));
}

std::vector<crop_rect> four_rects() {
  return {{0, 99, 0, 59}, {4, 103, 0, 59}, {8, 107, 2, 61}, {2, 101, 2, 61}};
}

TEST(Cropper, StillClip) {
  for (const bool no_motion : {false, true}) {
    const auto c = crop({full_hd(shift(0, 0)), full_hd(shift(0, 0))}, no_motion);
    EXPECT_EQ(c->maskWidth, 1919u);
    EXPECT_EQ(c->maskHeight, 1079u);
    EXPECT_EQ(c->cropWidth, 1918);
    EXPECT_EQ(c->cropHeight, 1078);
    for (const crop_rect& rect : c->rects) expect_rect(rect, 1, 1918, 1, 1078);
  }
}

TEST(Cropper, ShiftedFrames) {
  const std::vector<boost::shared_ptr<const VarVector>> warps = {
      full_hd(shift(0, 0)), full_hd(shift(6.25, 0)), full_hd(shift(0, -3.5))};
  cropper c(3, 1926, 1083);
  for (std::size_t f = 0; f < 3; ++f) c.computeFrameRect(f, *warps[f], {0, -3.5}, true);
  expect_rect(c.rects[0], 1, 1918, 4, 1082);
  expect_rect(c.rects[1], 7, 1924, 4, 1082);
  expect_rect(c.rects[2], 1, 1918, 1, 1078);
  const auto constant = crop(warps, true);
  EXPECT_EQ(constant->cropWidth, 1912);
  EXPECT_EQ(constant->cropHeight, 1075);
  for (const crop_rect& rect : constant->rects) expect_rect(rect, 7, 1918, 4, 1078);
}

TEST(Cropper, RotatedFrame) {
  const auto warp = full_hd([](double x, double y) {
    const double c = std::cos(.02), s = std::sin(.02);
    return point2{959.5 + c * (x - 959.5) - s * (y - 539.5),
                  539.5 + s * (x - 959.5) + c * (y - 539.5)};
  });
  const frame_bounds b = bounds_of({warp});
  cropper c(1, static_cast<std::uint64_t>(std::ceil(b.max_x - b.min_x)),
            static_cast<std::uint64_t>(std::ceil(b.max_y - b.min_y)));
  EXPECT_EQ(c.maskWidth, 1941u);
  EXPECT_EQ(c.maskHeight, 1118u);
  c.computeFrameRect(0, *warp, {b.min_x, b.min_y}, true);
  // From the seed (970, 558) the cross reaches 10, 1929, 19, 1097; the left side stops when the
  // bottom, in step with it, has left the bottom edge.
  expect_rect(c.rects[0], 29, 1910, 38, 1078);
}

TEST(Cropper, FilledCellsGiveTheLargestRectangle) {
  // A diamond of half diagonal 20 about (20, 20): of the inscribed rectangles the square of half
  // side 10 is largest.
  const auto diamond = warped(41, 41, 9, 9, [](double x, double y) {
    return point2{20 + (x - 20) / 2 - (y - 20) / 2, 20 + (x - 20) / 2 + (y - 20) / 2};
  });
  cropper c(1, 40, 40);
  c.computeFrameRect(0, *diamond, {0, 0}, false);
  expect_rect(c.rects[0], 10, 30, 10, 30);
}

TEST(Cropper, FoldedAndBrokenWarps) {
  const auto message = [](const VarVector& warp) -> std::string {
    cropper c(1, 100, 100);
    try {
      c.computeFrameRect(0, warp, {0, 0}, true);
    } catch (const std::runtime_error& error) {
      return error.what();
    }
    return "";
  };
  VarVector warp = *warped(101, 101, 3, 3, shift(0, 0));
  EXPECT_EQ(message(warp), "");
  // The centre of the middle cell drawn onto the top edge's line.
  VarVector on_line = *warped(101, 101, 3, 3, [](double x, double) { return point2{x, 50}; });
  EXPECT_EQ(message(on_line), "Unknown cropping error 2");
  VarVector above = *warped(101, 101, 3, 3, shift(0, -90));
  EXPECT_EQ(message(above), "Unknown cropping error 1");
  warp.values.assign(warp.values.size(), std::numeric_limits<double>::quiet_NaN());
  EXPECT_EQ(message(warp), "Unknown cropping error 1");
  // Beside the mask the test lets a seed through; nothing is read or hung on there.
  VarVector beside = *warped(101, 101, 3, 3, shift(500, 0));
  EXPECT_EQ(message(beside), "");
}

TEST(Cropper, NothingInCommon) {
  const auto c = RunCropper(SolverParamsRecord(), {full_hd(shift(0, 0))}, {0, 0, 1919, 1079}, true,
                            [] { FAIL(); });
  EXPECT_EQ(c->cropWidth, 0);
  EXPECT_EQ(c->cropHeight, 0);
  EXPECT_EQ(c->rects.size(), 1u);
}

TEST(OutlineMask, LinesAreClippedAndHaveBothEnds) {
  outline_mask mask(8, 6);
  mask.draw_line(-3, 2, 12, 2);
  for (int x = 0; x < 8; ++x) EXPECT_TRUE(mask.at(x, 2));
  mask.draw_line(5, 4, 5, 4);
  EXPECT_TRUE(mask.at(5, 4));
  mask.draw_line(0, 0, 3, 1);  // the minor coordinate is cut, not rounded: 0, .33, .67, 1
  EXPECT_TRUE(mask.at(2, 0));
  EXPECT_FALSE(mask.at(2, 1));
  EXPECT_TRUE(mask.at(3, 1));
  EXPECT_THROW(outline_mask(std::int64_t{1} << 40, 1 << 20), std::length_error);
}

TEST(OutlineMask, ShrinkStopsAtTheSeed) {
  outline_mask mask(20, 20);
  for (int x = 0; x < 20; ++x) {
    for (int y = 0; y < 20; ++y) {
      if (x != 10 && y != 10) mask.set(x, y);
    }
  }
  mask_rect rect{0, 19, 0, 19};
  shrink_to_clear(mask, 10, 10, rect);
  EXPECT_EQ(rect.left, 10);
  EXPECT_GE(rect.right, 10);
  EXPECT_LE(rect.top, 10);
  EXPECT_GE(rect.bottom, 10);
}

TEST(CropPath, SmoothedCentres) {
  struct expectation {
    float sigma, bilateral_sigma;
    int width, height;
    std::vector<float> x0, y0;
  };
  for (const expectation& e :
       {expectation{1,
                    1000,
                    96,
                    59,
                    {3.3481f, 6.1599f, 8.0f, 5.79918f},
                    {.46694f, .88068f, 2.0f, 2.41374f}},
        expectation{2, 4, 98, 59, {2.22239f, 4.92241f, 8.0f, 3.85189f}, {}}}) {
    std::vector<crop_rect> rects = four_rects();
    const crop_size size = smooth_crop_path(rects, true, e.sigma, e.bilateral_sigma, false);
    EXPECT_EQ(size.width, e.width);
    EXPECT_EQ(size.height, e.height);
    for (std::size_t f = 0; f < 4; ++f) {
      EXPECT_NEAR(rects[f].left, e.x0[f], 2e-5 * 8);
      EXPECT_FLOAT_EQ(rects[f].right, rects[f].left + size.width - 1);
      if (!e.y0.empty()) {
        EXPECT_NEAR(rects[f].top, e.y0[f], 2e-5);
      }
    }
  }
}

TEST(CropPath, ConstantWindow) {
  std::vector<crop_rect> rects = four_rects();
  const crop_size size = smooth_crop_path(rects, false, 1, 0, true);
  EXPECT_EQ(size.width, 92);
  EXPECT_EQ(size.height, 58);
  for (const crop_rect& rect : rects) expect_rect(rect, 8, 99, 2, 59);

  std::vector<crop_rect> disjoint = {{0, 9, 0, 9}, {20, 29, 0, 9}};
  EXPECT_EQ(smooth_crop_path(disjoint, false, 1, 0, true).width, 0);
  for (const crop_rect& rect : disjoint) expect_rect(rect, 20, 19, 0, 9);
}

TEST(CropPath, ShortLists) {
  std::vector<crop_rect> none;
  EXPECT_EQ(smooth_crop_path(none, true, 30, 500, false).width, 0);
  std::vector<crop_rect> one = {{3, 102, 5, 64}};
  const crop_size size = smooth_crop_path(one, true, 30, 500, false);
  EXPECT_EQ(size.width, 100);
  EXPECT_EQ(size.height, 60);
  expect_rect(one[0], 3, 102, 5, 64);
  // A sigma of 0 leaves the path as it is.
  std::vector<crop_rect> unfiltered = {{0, 99, 0, 59}, {4, 103, 0, 59}};
  smooth_crop_path(unfiltered, false, 0, 0, false);
  EXPECT_FLOAT_EQ(unfiltered[1].left - unfiltered[0].left, 4);
}

}  // namespace
