#include "host/shots/frame_digest.h"

#include <gtest/gtest.h>

#include <cmath>
#include <vector>

namespace calmframe::host {
namespace {

// A frame in padded rows; what lies behind a row is white.
class PaddedFrame {
 public:
  template <class Draw>  // a HX_Pixel8 of (x, y), y from the top
  PaddedFrame(int width, int height, const Draw& draw, bool top_down = true)
      : width_(width), height_(height), top_down_(top_down), pixels_(Stride() * height) {
    for (int y = 0; y < height; ++y) {
      for (int x = 0; x < Stride(); ++x) {
        At(y)[x] = x < width ? draw(x, y) : HX_Pixel8{255, 255, 255, 255};
      }
    }
  }
  ArgbView view() {
    const std::ptrdiff_t bytes = Stride() * static_cast<std::ptrdiff_t>(sizeof(HX_Pixel8));
    return {At(0), top_down_ ? bytes : -bytes, width_, height_};
  }

 private:
  int Stride() const { return width_ + 5; }
  HX_Pixel8* At(int y) {
    return pixels_.data() + static_cast<std::size_t>(Stride()) * (top_down_ ? y : height_ - 1 - y);
  }
  int width_, height_;
  bool top_down_;
  std::vector<HX_Pixel8> pixels_;
};

HX_Pixel8 Grey(double value) {
  const auto v = static_cast<std::uint8_t>(value);
  return {255, v, v, v};
}

TEST(FrameDigestTest, CellsAreTheLumaOfTheirPartOfTheFrame) {
  // A plane of a slope that is the same in cells at any size: smoothing leaves it.
  for (const auto& [width, height] : {std::pair{1920, 1080}, {640, 360}, {90, 160}}) {
    for (const bool top_down : {true, false}) {
      PaddedFrame frame(
          width, height,
          [&, w = width, h = height](int x, int y) {
            // 30 to 186 across, twenty more down.
            return Grey(30 + 156 * (x + 0.5) / w + 20 * (y + 0.5) / h);
          },
          top_down);
      const FrameDigest digest = DigestOf(frame.view());
      for (int y = 1; y < FrameDigest::kRows - 1; ++y) {
        for (int x = 1; x < FrameDigest::kColumns - 1; ++x) {
          const double expected =
              30 + 156 * (x + 0.5) / FrameDigest::kColumns + 20 * (y + 0.5) / FrameDigest::kRows;
          // Half a step that Grey cuts off, half a pixel of the smallest frame.
          ASSERT_NEAR(digest.cells[y * FrameDigest::kColumns + x], expected - 0.5, 1.6)
              << width << " " << x << " " << y;
        }
      }
    }
  }
}

TEST(FrameDigestTest, ColoursHaveTheirLumaAndChroma) {
  // .299, .587 and .114 of 200; .564 of blue less that, .713 of red less that.
  struct Painted {
    HX_Pixel8 pixel;
    int luma, blue, red;
  };
  const Painted cases[] = {{{0, 200, 0, 0}, 60, -34, 100},
                           {{255, 0, 200, 0}, 117, -66, -84},
                           {{255, 0, 0, 200}, 23, 100, -16},
                           {{255, 255, 0, 0}, 77, -43, 127},
                           {{255, 255, 255, 0}, 226, -127, 21}};
  for (const Painted& colour : cases) {
    // Grey to the right.
    PaddedFrame frame(40, 30, [&](int x, int) { return x < 20 ? colour.pixel : Grey(90); });
    const FrameDigest digest = DigestOf(frame.view());
    EXPECT_EQ(digest.cells[460], colour.luma);
    const std::size_t left = 10 * FrameDigest::kHalfColumns + 15;
    EXPECT_NEAR(digest.blue[left], colour.blue, 1) << colour.luma;
    EXPECT_NEAR(digest.red[left], colour.red, 1) << colour.luma;
    EXPECT_NEAR(digest.blue[left + 1], 0, 1);
    EXPECT_NEAR(digest.red[left + 1], 0, 1);
  }
}

TEST(FrameDigestTest, LimitedRangeIsWidened) {
  // 16 is black and 235 white, 125 halfway but for half a step; beyond both is what they are.
  const std::pair<int, int> cases[] = {{16, 0}, {235, 255}, {125, 127}, {4, 0}, {250, 255}};
  for (const auto& [value, full] : cases) {
    const std::vector<std::uint8_t> luma(50 * 40, static_cast<std::uint8_t>(value));
    EXPECT_EQ(DigestOf(LumaView{luma.data(), 50, 40, 40, true}).cells[500], full) << value;
    EXPECT_EQ(DigestOf(LumaView{luma.data(), 50, 40, 40}).cells[500], value);
  }
}

TEST(FrameDigestTest, BarsAreLeftOut) {
  using Area = FrameDigest::Area;
  // Bars and two cells more: the one that is half bar, and what smoothing spreads.
  const struct {
    double left, top, right, bottom;  // the picture's, of the frame
    Area area;
  } cases[] = {{0, 0, 1, 1, {0, 0, 64, 36}},
               {0, 4.0 / 36, 1, 30.0 / 36, {0, 6, 64, 28}},
               {16.0 / 64, 0, 40.0 / 64, 1, {18, 0, 38, 36}},
               {0, 0, 0, 0, {}}};
  for (const auto& c : cases) {
    PaddedFrame frame(640, 360, [&](int x, int y) {
      const double u = (x + 0.5) / 640, v = (y + 0.5) / 360;
      const bool inside = u > c.left && u < c.right && v > c.top && v < c.bottom;
      return Grey(inside ? 60 + 100 * u + 40 * v : 2);
    });
    EXPECT_EQ(DigestOf(frame.view()).area, c.area) << c.left << " " << c.top;
  }
}

}  // namespace
}  // namespace calmframe::host
