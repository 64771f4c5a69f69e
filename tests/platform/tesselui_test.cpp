#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include "platform/tesselui/drawbot.h"

namespace tesselui {
namespace {

using drawbot::Path;
using drawbot::Surface;

// A picture within a larger one, whose pixels outside of it must keep their guard value.
class Picture {
 public:
  static constexpr unsigned char kGuard = 0x5a;
  Picture(int width, int height) : width_(width), height_(height) {
    std::fill(all_.begin(), all_.end(), kGuard);
    for (int y = 0; y < height_; ++y) std::fill(At(0, y), At(width_, y), 0);
  }
  ~Picture() {
    for (int y = 0; y < height_; ++y) std::fill(At(0, y), At(width_, y), kGuard);
    EXPECT_EQ(std::count(all_.begin(), all_.end(), kGuard), static_cast<long>(all_.size()));
  }
  Surface surface() { return {At(0, 0), stride(), width_, height_}; }
  unsigned char* At(int x, int y) { return all_.data() + (y + 2) * stride() + (x + 2) * 4; }
  std::array<int, 4> Pixel(int x, int y) {
    const unsigned char* p = At(x, y);
    return {p[0], p[1], p[2], p[3]};
  }
  // Sum of alpha in pixels of full cover.
  double Cover() {
    double sum = 0;
    for (int y = 0; y < height_; ++y) {
      for (int x = 0; x < width_; ++x) sum += At(x, y)[3] / 255.0;
    }
    return sum;
  }
  int stride() const { return (width_ + 5) * 4; }

 private:
  const int width_, height_;
  std::vector<unsigned char> all_ = std::vector<unsigned char>((height_ + 4) * stride());
};

Path Rect(double x, double y, double width, double height) {
  Path path;
  path.AddRect(x, y, width, height);
  return path;
}

using Pixel = std::array<int, 4>;

TEST(DrawbotTest, FlushComposesStraightAlphaOverWhatIsThere) {
  Picture picture(5, 4);
  std::copy_n(std::array<unsigned char, 4>{0, 0, 255, 255}.data(), 4, picture.At(1, 1));
  std::copy_n(std::array<unsigned char, 4>{0, 0, 255, 128}.data(), 4, picture.At(2, 1));
  Surface surface = picture.surface();
  surface.FillPath(Rect(1, 1, 3, 1), {{0, 0, 1, 0.6f}});  // alpha 153
  surface.FillPath(Rect(3, 2, 2, 2), {{1, 0.5f, 0.2f, 1}});
  EXPECT_EQ(picture.Pixel(3, 2), Pixel());
  for (int i = 0; i < 2; ++i) {
    surface.Flush();  // nothing is drawn twice
    // Blue, green, red, alpha: a = as + ad (1 - as), c = (cs as + cd ad (1 - as)) / a
    EXPECT_EQ(picture.Pixel(1, 1), (Pixel{153, 0, 102, 255}));
    EXPECT_EQ(picture.Pixel(2, 1), (Pixel{191, 0, 64, 204}));
    EXPECT_EQ(picture.Pixel(3, 1), (Pixel{255, 0, 0, 153}));
    EXPECT_EQ(picture.Pixel(3, 2), (Pixel{51, 128, 255, 255}));
    EXPECT_NEAR(picture.Cover(), (255 + 204 + 153) / 255.0 + 4, 1e-9);
  }
}

TEST(DrawbotTest, CirclesStrokesAndWindingHaveTheirAreas) {
  Path circle, over_the_top;
  circle.AddArc(32, 32, 20, 0, 360);
  over_the_top.AddArc(32, 32, 20, 0, -180);
  over_the_top.Close();
  const struct {
    const Path& path;
    double stroke;  // 0: filled
    double area;
    int alpha_above, alpha_below;  // of the centre
  } cases[] = {{circle, 0, M_PI * 400, 255, 255},
               {circle, 3, 2 * M_PI * 20 * 3, 0, 0},
               {over_the_top, 0, M_PI * 200, 255, 0}};
  for (const auto& c : cases) {
    Picture picture(64, 64);
    Surface surface = picture.surface();
    if (c.stroke > 0) {
      surface.StrokePath(c.path, {{1, 1, 1, 1}, c.stroke});
    } else {
      surface.FillPath(c.path, {{1, 1, 1, 1}});
    }
    surface.Flush();
    EXPECT_NEAR(picture.Cover(), c.area, 4);
    EXPECT_EQ(picture.Pixel(32, 24)[3], c.alpha_above);
    EXPECT_EQ(picture.Pixel(32, 40)[3], c.alpha_below);
  }
}

TEST(DrawbotTest, ClipsWhatLiesOutsideOrNowhere) {
  constexpr double kInfinity = std::numeric_limits<double>::infinity();
  Picture picture(16, 16);
  Surface surface = picture.surface();
  surface.FillPath(Rect(-1e12, 4, 1e12 + 2, 1e12), {{1, 1, 1, 1}});
  surface.FillPath(Rect(100, 100, 10, 10), {{1, 1, 1, 1}});
  surface.DrawText(Font::HostFont(), "outside", 14, -8, {1, 1, 1, 1});
  Path nowhere;
  nowhere.AddArc(std::nan(""), kInfinity, 3, 0, 360);
  surface.StrokePath(nowhere, {{1, 1, 1, 1}, 2});
  surface.Flush();
  EXPECT_EQ(picture.Pixel(1, 15)[3], 255);
  EXPECT_EQ(picture.Pixel(8, 12)[3], 0);
}

TEST(FontTest, TextStandsWithinItsExtentAtItsPlace) {
  const Font font = Font::HostFont();
  const std::string text = "Analyzing \u00e9 gjpqy";
  const TextExtent extent = font.Measure(text);
  Picture picture(extent.width + 40, extent.height + 20);
  Surface surface = picture.surface();
  surface.DrawText(font, text, 20, 10, {1, 0, 0, 1});
  surface.Flush();
  EXPECT_GT(picture.Cover(), extent.height * 5);
  int tails = 0;  // in the lowest quarter
  for (int y = 0; y < extent.height + 20; ++y) {
    for (int x = 0; x < extent.width + 40; ++x) {
      const Pixel pixel = picture.Pixel(x, y);
      if (pixel[3] == 0) continue;
      EXPECT_EQ(pixel, (Pixel{0, 0, 255, pixel[3]}));  // one colour, however thin the edge
      EXPECT_TRUE(x >= 19 && x < extent.width + 21 && y >= 10 && y < extent.height + 10)
          << x << ' ' << y;
      tails += y > 10 + extent.height * 3 / 4;
    }
  }
  EXPECT_GT(tails, 20);
}

// The longest text, with the band's margins, is made to fit a width of 1200.
TEST(FontTest, ExtentsGrowWithTextAndLinesAndTheLongestBannerFits) {
  const Font font = Font::HostFont();
  const TextExtent one = font.Measure("Stabilizing"),
                   two = font.Measure("Stabilizing\nStabilizing");
  EXPECT_EQ(two.width, one.width);
  EXPECT_NEAR(two.height, 2 * one.height, 1);
  EXPECT_GT(font.Measure("Stabilizing.").width, one.width);
  EXPECT_EQ(font.Measure("").width, 0);
  EXPECT_GE(font.Measure("\xff\xfe").height, one.height);  // not UTF-8
  const TextExtent longest = font.Measure(
      "To avoid extreme cropping set Framing to Stabilize Only or adjust other parameters.");
  EXPECT_LE(longest.width + 4 + 80, 1200);
  EXPECT_GT(longest.width, 600);
}

}  // namespace
}  // namespace tesselui
