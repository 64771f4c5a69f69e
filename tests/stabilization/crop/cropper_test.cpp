#include "stabilization/crop/cropper.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cmath>
#include <functional>
#include <stdexcept>
#include <string>
#include <utility>

#include "stabilization/crop/crop_path.h"
#include "stabilization/crop/outline_mask.h"
#include "stabilization/warp/cp_warper.h"
#include "tests/stabilization/clips.h"

using namespace marrow::stabilization;

namespace {

using testing::FieldsAre;
using motion = std::function<point2(point2)>;
using grids = std::vector<VarVector>;

VarVector full_hd(const motion& to) {
  return grid_over(1920, 1080, 64, 36, to);
}

motion shift(double dx, double dy) {
  return [=](point2 p) { return point2{p.x + dx, p.y + dy}; };
}

grids three_shifts() {
  return {full_hd(shift(0, 0)), full_hd(shift(6.25, 0)), full_hd(shift(0, -3.5))};
}

boost::shared_ptr<cropper> crop(const grids& warps, const SolverParamsRecord& parameters) {
  CPWarper warper(static_cast<int>(warps.size()), 1920, 1080);
  for (const VarVector& warp : warps) {
    warper.storeFrameWarp(warp);
  }
  return RunCropper(parameters, warps.size(), warper, kNoProgress);
}

TEST(Cropper, ShiftedFrames) {
  const auto still = crop({full_hd(shift(0, 0)), full_hd(shift(0, 0))}, {});
  EXPECT_EQ(still->cropWidth, 1918);
  EXPECT_EQ(still->cropHeight, 1078);
  for (const crop_rect& rect : still->rects) EXPECT_THAT(rect, FieldsAre(1, 1918, 1, 1078));

  cropper c(3, 1926, 1083);
  for (std::size_t f = 0; f < 3; ++f) c.computeFrameRect(f, three_shifts()[f], {0, -3.5}, true);
  EXPECT_THAT(c.rects[0], FieldsAre(1, 1918, 4, 1082));
  EXPECT_THAT(c.rects[1], FieldsAre(7, 1924, 4, 1082));
  EXPECT_THAT(c.rects[2], FieldsAre(1, 1918, 1, 1078));
}

// Either the result or the one sigma that stands for it asks for a window that never moves.
TEST(Cropper, WhatMakesTheWindowConstant) {
  for (const auto& [no_motion, sigma] : {std::pair(true, 30.f), {false, 1e6f}, {false, 999999.f}}) {
    SolverParamsRecord parameters;
    parameters.no_motion = no_motion;
    parameters.path_gaussian_sigma = sigma;
    parameters.path_bilateral_sigma = 4;
    const auto c = crop(three_shifts(), parameters);
    if (sigma == 999999) {
      EXPECT_NE(c->rects[0].left, c->rects[1].left);
      continue;
    }
    EXPECT_EQ(c->cropWidth, 1912);
    EXPECT_EQ(c->cropHeight, 1075);
    for (const crop_rect& rect : c->rects) EXPECT_THAT(rect, FieldsAre(7, 1918, 4, 1078));
  }
}

TEST(Cropper, RotatedFrame) {
  const auto warp = full_hd([](point2 p) {
    const point2 turned = transform(similarity_matrix(1, .02, 0, 0), {p.x - 959.5, p.y - 539.5});
    return point2{959.5 + turned.x, 539.5 + turned.y};
  });
  const auto c = crop({warp}, {});
  EXPECT_EQ(c->maskWidth, 1941u);
  EXPECT_EQ(c->maskHeight, 1118u);
  // From the seed (970, 558) the cross reaches 10, 1929, 19, 1097; the left side stops when the
  // bottom, in step with it, has left the bottom edge.
  EXPECT_THAT(c->rects[0], FieldsAre(29, 1910, 38, 1078));
}

TEST(Cropper, FilledCellsGiveTheLargestRectangle) {
  // A diamond of half diagonal 20 about (20, 20): of the inscribed rectangles the square of half
  // side 10 is largest.
  const auto diamond = grid_over(41, 41, 9, 9, [](point2 p) {
    return point2{20 + (p.x - p.y) / 2, (p.x + p.y) / 2};
  });
  cropper c(1, 40, 40);
  c.computeFrameRect(0, diamond, {0, 0}, false);
  EXPECT_THAT(c.rects[0], FieldsAre(10, 30, 10, 30));
}

TEST(Cropper, FoldedAndBrokenWarps) {
  const auto error_under = [](const motion& to) -> std::string {
    try {
      cropper(1, 100, 100).computeFrameRect(0, grid_over(101, 101, 3, 3, to), {0, 0}, true);
    } catch (const std::runtime_error& error) {
      return error.what();
    }
    return "";
  };
  // The middle cell's centre drawn onto the top edge's line.
  const motion flat = [](point2 p) { return point2{p.x, 50}; };
  EXPECT_EQ(error_under(flat), "Unknown cropping error 2");
  EXPECT_EQ(error_under(shift(0, -90)), "Unknown cropping error 1");
  EXPECT_EQ(error_under(shift(NAN, NAN)), "Unknown cropping error 1");
  EXPECT_EQ(error_under(shift(500, 0)), "");  // a seed beside the mask: nothing is read there
}

TEST(Cropper, NothingInCommon) {
  const auto c = crop({full_hd(shift(0, 0)), full_hd(shift(1919, 0))}, {});
  EXPECT_EQ(c->cropWidth, 0);
  EXPECT_EQ(c->cropHeight, 0);
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

// The right and the bottom edge are drawn half a pixel further out, then cut to whole pixels.
TEST(OutlineMask, TheFarEdgesLieHalfAPixelFurtherOut) {
  for (const auto& [fraction, far] : {std::pair(0.3, 20), std::pair(0.6, 21)}) {
    outline_mask mask(30, 30);
    draw_outline(mask, grid_over(21, 21, 3, 3, shift(fraction + 5, fraction + 5)), {5, 5});
    for (int at = 0; at < 30; ++at) {
      EXPECT_EQ(mask.at(at, 10), at == 0 || at == far) << fraction << " column " << at;
      EXPECT_EQ(mask.at(10, at), at == 0 || at == far) << fraction << " row " << at;
    }
  }
}

TEST(OutlineMask, TheCrossIsThreePixelsWide) {
  outline_mask mask(21, 21);
  const int set[][2] = {{4, 9}, {15, 11}, {9, 3}, {11, 17}, {7, 8}, {13, 12}, {8, 6}, {12, 14}};
  for (const auto& [x, y] : set) mask.set(x, y);
  EXPECT_THAT(grow_cross(mask, 10, 10), FieldsAre(5, 14, 4, 16));
}

// All sides move a pixel a turn over a mask that is set throughout. The near ones stop at the seed;
// the far vertical one reaches it after 27 turns, which leaves no height and ends it.
TEST(OutlineMask, ShrinkStopsAtTheSeed) {
  outline_mask mask(40, 40);
  for (int i = 0; i < 1600; ++i) mask.set(i % 40, i / 40);
  mask_rect low{0, 39, 0, 39}, high = low;
  shrink_to_clear(mask, 10, 12, low);
  shrink_to_clear(mask, 29, 27, high);
  EXPECT_THAT(low, FieldsAre(10, 12, 12, 12));
  EXPECT_THAT(high, FieldsAre(27, 29, 27, 27));
}

TEST(CropPath, WindowsOfOneSizeFollowTheSmoothedCentres) {
  using rects = std::vector<crop_rect>;
  const rects four = {{0, 99, 0, 59}, {4, 103, 0, 59}, {8, 107, 2, 61}, {2, 101, 2, 61}};
  const rects tall = {{0, 99, 0, 299}}, apart = {{0, 9, 0, 9}, {100, 109, 0, 9}},
              wide_apart = {{0, 99, 0, 9}, {200, 299, 0, 9}};
  const struct {
    const char* situation;
    rects path;
    bool bilateral;
    float sigma, bilateral_sigma;
    bool constant;
    crop_size size;
    point2 first, last;  // the windows' top left corners
  } cases[] = {
      {"bilateral", four, true, 2, 4, false, {98, 59}, {2.22239, 1.01177}, {3.85189, 2.32519}},
      {"constant", four, false, 1, 0, true, {92, 58}, {8, 2}, {8, 2}},
      {"nothing in common", apart, false, 1, 0, true, {0, 10}, {100, 0}, {100, 0}},
      {"no frame", {}, true, 30, 500, false, {0, 0}, {}, {}},
      {"no filter", apart, false, 0, 0, false, {10, 10}, {0, 0}, {100, 0}},
      // The neighbour weighs exp(-1 / 0.33^2) = 1.028e-4, as 4 sigma reach it and 3 do not: each
      // centre moves by 0.02056.
      {"reach", wide_apart, false, .33f, 0, false, {100, 10}, {.04112, 0}, {200, 0}},
      // The height's extents start from the width: 100 to both sides of the centre at 149.5.
      {"tall", tall, false, 1, 0, false, {100, 201}, {0, 49.5}, {0, 49.5}},
      // Centres 54.4722 and 54.5278: 45.4722 short on both sides, -90.94 + 1.5 cut to -89.
      {"path beside the frames", apart, false, 30, 0, false, {-89, 10}, {99.9444, 0}, {100, 0}}};
  for (const auto& e : cases) {
    SCOPED_TRACE(e.situation);
    rects path = e.path;
    const crop_size size =
        smooth_crop_path(path, e.bilateral, e.sigma, e.bilateral_sigma, e.constant);
    EXPECT_EQ(size.width, e.size.width);
    EXPECT_EQ(size.height, e.size.height);
    if (path.empty()) continue;
    expect_point_near({path.front().left, path.front().top}, e.first, 2e-4);
    expect_point_near({path.back().left, path.back().top}, e.last, 2e-4);
    for (const crop_rect& rect : path) {
      EXPECT_FLOAT_EQ(rect.right, rect.left + static_cast<float>(e.size.width) - 1);
      EXPECT_FLOAT_EQ(rect.bottom, rect.top + static_cast<float>(e.size.height) - 1);
    }
  }
}

}  // namespace
