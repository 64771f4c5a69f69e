#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/tesselui/drawbot.h"
#include "platform/tesselui/save_dialog.h"

namespace tesselui {
namespace {

using drawbot::Color;
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

TEST(DrawbotTest, FillsInBlueGreenRedAlphaOrderOnFlush) {
  Picture picture(8, 6);
  Surface surface = picture.surface();
  surface.FillPath(Rect(2, 1, 3, 2), {{1, 0.5f, 0.2f, 1}});
  EXPECT_EQ(picture.Cover(), 0);
  surface.Flush();
  EXPECT_EQ(picture.Pixel(2, 1), (Pixel{51, 128, 255, 255}));
  EXPECT_EQ(picture.Pixel(4, 2), (Pixel{51, 128, 255, 255}));
  EXPECT_EQ(picture.Cover(), 6);
  surface.Flush();  // nothing is drawn twice
  EXPECT_EQ(picture.Pixel(2, 1), (Pixel{51, 128, 255, 255}));
}

TEST(DrawbotTest, ComposesStraightAlphaOverWhatIsThere) {
  Picture picture(3, 1);
  std::copy_n(std::array<unsigned char, 4>{0, 0, 255, 255}.data(), 4, picture.At(0, 0));
  std::copy_n(std::array<unsigned char, 4>{0, 0, 255, 128}.data(), 4, picture.At(1, 0));
  Surface surface = picture.surface();
  surface.FillPath(Rect(0, 0, 3, 1), {{0, 0, 1, 0.6f}});  // alpha 153
  surface.Flush();
  // a = as + ad (1 - as), c = (cs as + cd ad (1 - as)) / a
  EXPECT_EQ(picture.Pixel(0, 0), (Pixel{153, 0, 102, 255}));
  EXPECT_EQ(picture.Pixel(1, 0), (Pixel{191, 0, 64, 204}));
  EXPECT_EQ(picture.Pixel(2, 0), (Pixel{255, 0, 0, 153}));
}

TEST(DrawbotTest, CirclesStrokesAndWindingHaveTheirAreas) {
  Picture picture(64, 64);
  Path circle;
  circle.AddArc(32.5, 32.5, 20, 0, 360);
  {
    Surface surface = picture.surface();
    surface.FillPath(circle, {{1, 1, 1, 1}});
    surface.Flush();
    EXPECT_NEAR(picture.Cover(), M_PI * 400, 4);
  }
  Picture ring(64, 64);
  Surface surface = ring.surface();
  surface.StrokePath(circle, {{1, 1, 1, 1}, 3});
  surface.Flush();
  EXPECT_NEAR(ring.Cover(), 2 * M_PI * 20 * 3, 4);
  EXPECT_EQ(ring.Pixel(32, 32)[3], 0);

  Picture half(64, 64);
  Path arc;
  arc.AddArc(32, 32, 20, 0, -180);  // over the top
  arc.Close();
  Surface upper = half.surface();
  upper.FillPath(arc, {{1, 1, 1, 1}});
  upper.Flush();
  EXPECT_NEAR(half.Cover(), M_PI * 200, 4);
  EXPECT_EQ(half.Pixel(32, 40)[3], 0);
  EXPECT_EQ(half.Pixel(32, 20)[3], 255);
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
  ASSERT_GT(extent.width, 0);
  EXPECT_GT(font.Ascent(), extent.height / 2);
  EXPECT_LT(font.Ascent(), extent.height);
  Picture picture(extent.width + 40, extent.height + 20);
  Surface surface = picture.surface();
  surface.DrawText(font, text, 20, 10, {1, 0, 0, 1});
  surface.Flush();
  EXPECT_GT(picture.Cover(), extent.height * 5);
  int above_baseline = 0, below = 0;
  for (int y = 0; y < extent.height + 20; ++y) {
    for (int x = 0; x < extent.width + 40; ++x) {
      const Pixel pixel = picture.Pixel(x, y);
      if (pixel[3] == 0) continue;
      EXPECT_EQ(pixel[2], 255);  // one colour, however thin the edge
      EXPECT_EQ(pixel[0] + pixel[1], 0);
      EXPECT_TRUE(x >= 19 && x < extent.width + 21 && y >= 10 && y < extent.height + 10)
          << x << ' ' << y;
      ++(y < 10 + font.Ascent() ? above_baseline : below);
    }
  }
  EXPECT_GT(above_baseline, below);
  EXPECT_GT(below, 20);  // the tails of gjpqy
}

TEST(FontTest, ExtentsGrowWithTextLinesAndSize) {
  const Font font = Font::HostFont(20), doubled = Font::HostFont(40);
  const TextExtent one = font.Measure("Stabilizing"),
                   two = font.Measure("Stabilizing\nStabilizing");
  EXPECT_EQ(two.width, one.width);
  EXPECT_NEAR(two.height, 2 * one.height, 1);
  EXPECT_NEAR(doubled.Measure("Stabilizing").width, 2 * one.width, 0.1 * one.width);
  EXPECT_GT(font.Measure("Stabilizing.").width, one.width);
  EXPECT_EQ(font.Measure("").width, 0);
  EXPECT_GE(font.Measure("\xff\xfe").height, one.height);  // not UTF-8
}

// The longest text, with the band's margins, is made to fit a width of 1200.
TEST(FontTest, TheLongestBannerFitsItsBand) {
  const TextExtent extent = Font::HostFont().Measure(
      "To avoid extreme cropping set Framing to Stabilize Only or adjust other parameters.");
  EXPECT_LE(extent.width + 4 + 80, 1200);
  EXPECT_GT(extent.width, 600);
}

TEST(FontTest, ThreadsMayDrawTextAtOnce) {
  const TextExtent expected = Font::HostFont().Measure("Stabilizing (step 2 of 2)");
  std::vector<std::thread> threads;
  std::array<double, 4> covers{};
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < 5; ++i) {
        const Font font = Font::HostFont();
        EXPECT_EQ(font.Measure("Stabilizing (step 2 of 2)").width, expected.width);
        Picture picture(expected.width, expected.height);
        Surface surface = picture.surface();
        surface.DrawText(font, "Stabilizing (step 2 of 2)", 0, 0, {1, 1, 1, 1});
        surface.Flush();
        covers[t] = picture.Cover();
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_GT(covers[0], 0);
  for (const double cover : covers) EXPECT_EQ(cover, covers[0]);
}

TEST(SaveDialogTest, TheHostAnswers) {
  const SaveDialogRequest request{"TRK Files (*.trk)", "trk", "trk", 4};
  EXPECT_EQ(SaveAs(request), std::nullopt);
  InstallSaveDialog([](const SaveDialogRequest& asked) {
    return std::optional<std::string>("/tmp/a." + asked.default_extension);
  });
  EXPECT_EQ(SaveAs(request), "/tmp/a.trk");
  InstallSaveDialog({});
  EXPECT_EQ(SaveAs(request), std::nullopt);
}

}  // namespace
}  // namespace tesselui
