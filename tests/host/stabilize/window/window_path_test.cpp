#include "host/stabilize/window/window_path.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <random>
#include <string>
#include <vector>

#include "host/stabilize/window/clip_windows.h"

namespace calmframe::host {
namespace {

constexpr double kWide = 800, kHigh = 600;

// A hand-held camera: a walk that also turns and zooms, seen through a picture without a warp.
std::vector<WindowFrame> Walk(std::size_t frames, double shake, double most_zoom) {
  std::mt19937 random(3);
  std::normal_distribution<double> step(0, shake);
  std::vector<WindowFrame> walk(frames);
  for (WindowFrame& frame : walk) {
    frame.covered = {{1, 0, kWide / 2}, {-1, 0, kWide / 2}, {0, 1, kHigh / 2}, {0, -1, kHigh / 2}};
    frame.motion = {1 + step(random) / 1000, step(random) / 400, step(random), step(random)};
    frame.most_zoom = most_zoom;
    frame.least_growth = 0.998;
    frame.most_growth = 1.003;
  }
  return walk;
}

// How far the furthest corner of a window lies outside of what is covered.
double Outside(const WindowFrame& frame, const Similarity& window) {
  double outside = -1e9;
  for (const double x : {-kWide / 2, kWide / 2}) {
    for (const double y : {-kHigh / 2, kHigh / 2}) {
      const Point corner = window({x, y});
      for (const HalfPlane& side : frame.covered) {
        outside = std::max(outside, side.nx * corner.x + side.ny * corner.y - side.limit);
      }
    }
  }
  return outside;
}

// What the path is charged, written out from the definition.
double ChargeOf(const std::vector<WindowFrame>& frames, const std::vector<Similarity>& path,
                const WindowWeights& weights) {
  const double thousandth = kWide / 1000;
  double charge = 0;
  std::vector<std::vector<double>> motions;
  for (std::size_t f = 0; f + 1 < path.size(); ++f) {
    const Similarity next = Compose(frames[f + 1].motion, path[f + 1]);
    charge += weights.growth * 500 *
              (std::max(0.0, next.a - path[f].a / frames[f + 1].least_growth) +
               std::max(0.0, path[f].a / frames[f + 1].most_growth - next.a));
    motions.push_back({(next.dx - path[f].dx) / thousandth, (next.dy - path[f].dy) / thousandth,
                       (next.a - path[f].a) * 500, (next.b - path[f].b) * 500});
  }
  for (const double weight : {weights.motion, weights.change, weights.jerk}) {
    for (const auto& motion : motions) {
      for (const double value : motion) charge += weight * std::abs(value);
    }
    for (std::size_t f = 0; f + 1 < motions.size(); ++f) {
      for (std::size_t i = 0; i < 4; ++i) motions[f][i] = motions[f + 1][i] - motions[f][i];
    }
    motions.pop_back();
  }
  for (const Similarity& window : path) charge += weights.width * 1000 * (1 - window.a);
  return charge;
}

// The programme is convex: where no small step within the limits is cheaper, nothing is.
TEST(WindowPathTest, NothingWithinTheLimitsIsCheaper) {
  for (const WindowWeights& weights :
       {WindowWeights{}, WindowWeights{0, 0, 1, 0.05}, WindowWeights{1, 0, 0, 0.5}}) {
    const std::vector<WindowFrame> frames = Walk(12, 9, 1.3);
    const std::vector<Similarity> path = FindWindowPath(kWide, kHigh, frames, weights);
    const double charge = ChargeOf(frames, path, weights);
    std::mt19937 random(5);
    std::normal_distribution<double> normal;
    int tried = 0;
    for (int trial = 0; trial < 20000; ++trial) {
      std::vector<Similarity> other = path;
      const double size = std::pow(10, -3.0 * (trial % 7) / 6);
      const auto first = random() % path.size(), count = 1 + random() % path.size();
      const Similarity step{normal(random), normal(random), normal(random), normal(random)};
      for (std::size_t f = first; f < std::min(first + count, path.size()); ++f) {
        other[f].a += size * step.a / 500;
        other[f].b += size * step.b / 500;
        other[f].dx += size * step.dx;
        other[f].dy += size * step.dy;
      }
      bool allowed = true;
      for (std::size_t f = 0; f < other.size(); ++f) {
        allowed &= Outside(frames[f], other[f]) <= 0 && other[f].a >= 1 / 1.3;
      }
      if (!allowed) continue;
      ++tried;
      ASSERT_GT(ChargeOf(frames, other, weights), charge - 0.01 * (1 + size)) << trial;
    }
    EXPECT_GT(tried, 500);
  }
}

TEST(WindowPathTest, StaysInsideAndBelowTheZoomWhateverTheMotion) {
  for (const double shake : {0.0, 3.0, 60.0, 2000.0}) {
    const std::vector<WindowFrame> frames = Walk(300, shake, 1.4);
    const std::vector<Similarity> path = FindWindowPath(kWide, kHigh, frames, {});
    ASSERT_EQ(path.size(), frames.size());
    for (std::size_t f = 0; f < path.size(); ++f) {
      ASSERT_LE(Outside(frames[f], path[f]), 1e-6) << shake << ", frame " << f;
      ASSERT_GE(path[f].a, 1 / 1.4 - 1e-6) << shake << ", frame " << f;
    }
  }
}

// A frame that is a third as large as the others can't hold a window of the zoom that is asked for.
TEST(WindowPathTest, WhereTheZoomIsTooLittleTheLargestWindowCounts) {
  std::vector<WindowFrame> frames = Walk(40, 0, 1.5);
  for (HalfPlane& side : frames[20].covered) side.limit /= 3;
  const std::vector<Similarity> path = FindWindowPath(kWide, kHigh, frames, {});
  EXPECT_NEAR(path[20].a, 1 / 3.0, 0.005);
  EXPECT_LE(Outside(frames[20], path[20]), 1e-6);
  EXPECT_GE(path[0].a, 1 / 1.5 - 1e-6);
}

// The picture is smaller from frame 100 to 125 of 250.
TEST(WindowPathTest, TheZoomChangesNoFasterThanItMayUnlessItMust) {
  struct Dip {
    const char* what;
    double depth, most_zoom;
    double camera, speed;   // growth of a frame, as logarithms
    int faster;             // frames
    double before, within;  // the window's scale in frames 0 and 112
  };
  // To 0.9 at 0.002 takes 53 frames. No window may be smaller than 0.8 beside one of 0.6.
  for (const Dip& c : {Dip{"room on both sides", 0.9, 1.5, 0, 0.002, 0, 1, 0.9},
                       Dip{"no time", 0.8, 1.25, 0, 0, 0, 0.8, 0.8},
                       Dip{"the camera zooms", 0.9, 1.5, 0.004, 0, 0, 0.9, 0.9},
                       Dip{"no room", 0.6, 1.25, 0, 0.002, 2, 1, 0.6}}) {
    std::vector<WindowFrame> frames = Walk(250, 0, c.most_zoom);
    for (std::size_t f = 0; f < frames.size(); ++f) {
      if (f >= 100 && f < 125) {
        for (HalfPlane& side : frames[f].covered) side.limit *= c.depth;
      }
      frames[f].motion.a = std::exp(-c.camera);
      frames[f].least_growth = std::exp(c.camera - c.speed);
      frames[f].most_growth = std::exp(c.camera + c.speed);
    }
    const std::vector<Similarity> path = FindWindowPath(kWide, kHigh, frames, {});
    int faster = 0;
    for (std::size_t f = 0; f + 1 < path.size(); ++f) {
      faster += std::abs(std::log(path[f + 1].a / path[f].a)) > c.speed + 1e-5;
      ASSERT_LE(Outside(frames[f], path[f]), 1e-6) << c.what << ", frame " << f;
      ASSERT_GE(path[f].a, std::min(1 / c.most_zoom, 0.995 * c.depth) - 1e-6) << c.what;
    }
    EXPECT_EQ(faster, c.faster) << c.what;
    EXPECT_NEAR(path[0].a, c.before, 0.03) << c.what;
    EXPECT_NEAR(path[112].a, c.within, 0.03) << c.what;
  }
}

TEST(WindowPathTest, ASlowPanIsFollowedWithoutShake) {
  std::vector<WindowFrame> frames = Walk(200, 0, 1.25);
  std::mt19937 random(1);
  std::uniform_real_distribution<double> shake(-8, 8);
  double before = 0;
  for (WindowFrame& frame : frames) {
    const double now = shake(random);
    frame.motion = {1, 0, 7 + now - before, 0};
    before = now;
  }
  const std::vector<Similarity> path = FindWindowPath(kWide, kHigh, frames, {});
  for (std::size_t f = 10; f + 10 < path.size(); ++f) {
    const Similarity shown = Compose(Inverse(path[f]), Compose(frames[f + 1].motion, path[f + 1]));
    const Similarity behind =
        Compose(Inverse(path[f + 1]), Compose(frames[f + 2].motion, path[f + 2]));
    ASSERT_NEAR(shown.dx * path[f].a, 7, 1) << f;
    ASSERT_NEAR(behind.dx, shown.dx, 0.05) << f;
  }
}

TEST(FitMotionTest, TakesTheLargerGroupWhateverTheOtherDoes) {
  const Similarity background{0.998, 0.011, 5.5, -3.25}, subject{1, 0, -14, 2};
  std::mt19937 random(2);
  std::uniform_real_distribution<double> place(-400, 400), noise(-0.1, 0.1);
  std::vector<Point> from, to;
  for (int i = 0; i < 100; ++i) {
    from.push_back({place(random), place(random)});
    const Point moved = (i < 60 ? background : subject)(from.back());
    to.push_back({moved.x + noise(random), moved.y + noise(random)});
  }
  const Similarity fit = FitMotion(from, to, 1.6);
  for (const Point corner : {Point{-400, -300}, Point{400, 300}}) {
    EXPECT_NEAR(fit(corner).x, background(corner).x, 0.08);
    EXPECT_NEAR(fit(corner).y, background(corner).y, 0.08);
  }
}

// Points all over the picture, by the grid's own cells, against the half-planes.
TEST(CoveredRegionTest, HoldsNothingThatTheWarpDoesNotCover) {
  constexpr int kColumns = 9, kRows = 7;
  for (const double bend : {0.0, 12.0, -12.0}) {
    std::vector<Point> vertices;
    for (int r = 0; r < kRows; ++r) {
      for (int c = 0; c < kColumns; ++c) {
        const double u = 2.0 * c / (kColumns - 1) - 1, v = 2.0 * r / (kRows - 1) - 1;
        const double x = u * (400 + bend * v * v), y = v * (300 - bend * u * u);
        vertices.push_back({x - 0.1 * y + 15, y + 0.1 * x});
      }
    }
    const std::vector<HalfPlane> region = CoveredRegion({vertices.data(), kColumns, kRows}, 0);
    ASSERT_EQ(region.size(), 4u);
    double nearest = 1e9;
    for (const Point& vertex : vertices) {
      double outside = -1e9;
      for (const HalfPlane& side : region) {
        outside = std::max(outside, side.nx * vertex.x + side.ny * vertex.y - side.limit);
      }
      const auto at = static_cast<int>(&vertex - vertices.data());
      const int c = at % kColumns, r = at / kColumns;
      const bool border = c == 0 || r == 0 || c == kColumns - 1 || r == kRows - 1;
      if (!border) continue;
      EXPECT_GE(outside, -1e-9) << c << ", " << r;
      nearest = std::min(nearest, outside);
    }
    EXPECT_NEAR(nearest, 0, 1e-9) << "a side touches the frame";
  }
  const std::vector<Point> folded = {{0, 0}, {10, 0}, {10, 10}, {0, 10}};  // bottom turned round
  EXPECT_TRUE(CoveredRegion({folded.data(), 2, 2}, 0).empty());
  for (const double wrong : {std::nan(""), 1e300}) {
    const std::vector<Point> none = {{0, 0}, {10, 0}, {0, 10}, {wrong, 10}};
    EXPECT_TRUE(CoveredRegion({none.data(), 2, 2}, 0).empty());
  }
}

TEST(UncoveredShareTest, IsWhatTheOutlineLeavesOut) {
  struct Quad {
    std::vector<Point> corners;  // of one cell, row by row
    double uncovered;
  };
  // A square of side 2 under a frame of its size, a tenth aside; one turned by 45 degrees, whose
  // sides cut off four triangles of half a unit; around all; beside all.
  for (const Quad& c :
       {Quad{{{-1, -1}, {1, -1}, {-1, 1}, {1, 1}}, 0},
        Quad{{{-0.8, -1}, {1.2, -1}, {-0.8, 1}, {1.2, 1}}, 0.1},
        Quad{{{0, -1.5}, {1.5, 0}, {-1.5, 0}, {0, 1.5}}, 0.125},
        Quad{{{-9, -9}, {9, -9}, {-9, 9}, {9, 9}}, 0}, Quad{{{4, -1}, {6, -1}, {4, 1}, {6, 1}}, 1},
        Quad{{{-1, -1}, {std::nan(""), -1}, {-1, 1}, {1, 1}}, 1}}) {
    EXPECT_NEAR(UncoveredShare({c.corners.data(), 2, 2}, 2, 2), c.uncovered, 1e-9);
  }
}

}  // namespace
}  // namespace calmframe::host
