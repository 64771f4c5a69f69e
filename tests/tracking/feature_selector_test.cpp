#include "tracking/feature_selector.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <random>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "tests/support/each_instruction_set.h"
#include "tests/tracking/plain_smoothing.h"

namespace marrow::tracking {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

struct Image {
  int width, height;
  std::vector<float> luma;
  std::vector<std::uint8_t> mask;
  Image(int w, int h, float value) : width(w), height(h), luma(w * h, value), mask(w * h, 1) {}
  Image& Fill(int x0, int y0, int x1, int y1, float value) {
    for (int y = y0; y < std::min(y1, height); ++y) {
      for (int x = x0; x < std::min(x1, width); ++x) luma[y * width + x] = value;
    }
    return *this;
  }
};

// Blocks of random brightness with noise on top: corners, edges and texture. Or in steps of 32
// without noise, of which every sum over a window is exact: flat surfaces and many equal scores.
Image RandomImage(int width, int height, unsigned seed, bool in_steps = false) {
  std::mt19937 random(seed);
  const int step = in_steps ? 32 : 1;
  Image image(width, height, 96.0f);
  for (int i = 0; i < width * height / 60; ++i) {
    // One draw after the other: the order of arguments is the compiler's, and the picture is not.
    const int x = random() % width, y = random() % height;
    const int value = random() % 256 / step * step;
    const int bottom = y + 2 + random() % 14, right = x + 2 + random() % 14;
    image.Fill(x, y, right, bottom, value);
  }
  for (float& v : image.luma) v = std::min<float>(255, v + (in_steps ? 0 : random() % 6));
  for (auto& m : image.mask) m = random() % 8 != 0;
  return image;
}

FeatureSelector Candidates(const SelectorParams& params, const Image& image) {
  FeatureSelector selector(params);
  selector.Configure(image.width, image.height);
  std::copy(image.luma.begin(), image.luma.end(), selector.luma());
  std::copy(image.mask.begin(), image.mask.end(), selector.mask());
  selector.ComputeCandidates();
  return selector;
}

std::string Text(float x, float y, float score) {
  std::ostringstream text;
  text << x << ',' << y << ' ' << score;
  return text.str();
}

std::vector<std::string> Texts(const FeatureSelector& selector) {
  std::vector<std::string> texts;
  for (const auto& c : selector.candidates) {
    texts.push_back(Text(c.pixel % selector.width(), c.pixel / selector.width(), c.score));
  }
  return texts;
}

// Image after image over the whole frame, as one would write it down.
std::vector<FeatureSelector::Candidate> PlainCandidates(const SelectorParams& p, const Image& image,
                                                        int* below_zero) {
  const int w = image.width, h = image.height;
  const int hx = p.half_winx, hy = p.half_winy, border = p.border;
  std::vector<float> plane = image.luma;
  const int gx = std::max(0, border - hx - 2), gy = std::max(0, border - hy - 2);
  if (2 * gx >= w || 2 * gy >= h) return {};
  if (p.presmoothing) {
    const std::vector<float> kernel =
        IntegratedGaussian((2 * std::max(hx, hy) + 1) * static_cast<double>(p.presmooth_factor));
    const int r = kernel.size() / 2, px = std::max(0, gx - r), py = std::max(0, gy - r);
    plane = testing::PlainSmoothing(
        plane, w, {std::size_t(px), std::size_t(py), std::size_t(w - px), std::size_t(h - py)},
        kernel);
  }
  std::vector<float> score(w * h, 0);
  for (int y = gy + hy + 1; y < h - gy - hy - 1; ++y) {
    for (int x = gx + hx + 1; x < w - gx - hx - 1; ++x) {
      double sums[3] = {};
      for (int v = y - hy; v <= y + hy; ++v) {
        for (int u = x - hx; u <= x + hx; ++u) {
          const float* at = &plane[v * w + u];
          const float ix = at[1] - at[-1], iy = at[w] - at[-w];
          sums[0] += ix * ix, sums[1] += iy * iy, sums[2] += ix * iy;
        }
      }
      const float a = sums[0], b = sums[1], c = sums[2], t = a + b;
      const float radicand = t * t - 4 * (a * b - c * c);
      if (below_zero != nullptr) *below_zero += radicand < 0;
      const float d = std::sqrt(std::max(0.0f, radicand));
      score[y * w + x] = t + d > (t - d) * p.eig_ratio_threshold ? 0 : t - d;
    }
  }
  const int mx = std::max(border, hx + 2), my = std::max(border, hy + 2);
  std::vector<FeatureSelector::Candidate> maxima;
  for (int y = my; y < h - my; ++y) {
    for (int x = mx; x < w - mx; ++x) {
      const int i = y * w + x;
      bool above = image.mask[i] != 0;
      for (const int n : {-w - 1, -w, -w + 1, -1, 1, w - 1, w, w + 1}) {
        above = above && score[i] > score[i + n];
      }
      if (above) maxima.push_back({static_cast<std::uint32_t>(i), score[i]});
    }
  }
  if (maxima.empty()) return {};
  std::stable_sort(maxima.begin(), maxima.end(),
                   [](const auto& a, const auto& b) { return a.score > b.score; });
  const float area = (2 * hx + 1) * (2 * hy + 1);
  const float limit =
      std::max(p.threshold * std::min(maxima[0].score, p.max_eig * area), p.min_eig * area);
  std::erase_if(maxima, [&](const auto& c) { return c.score < limit; });
  return maxima;
}

// The same pixels by falling score on every instruction set, to the bit where sums are exact. Of
// others a score at a round corner, where the radicand cancels, can be off by the root of the few
// 2^-24 that its sums are off. Gives the number of pixels, and counts radicands below 0.
std::size_t ExpectAsPlain(const SelectorParams& params, const Image& image, bool exact,
                          int* below_zero = nullptr) {
  std::vector<FeatureSelector::Candidate> expected = PlainCandidates(params, image, below_zero);
  const auto by_pixel = [](const auto& a, const auto& b) { return a.pixel < b.pixel; };
  if (!exact) std::sort(expected.begin(), expected.end(), by_pixel);
  std::vector<FeatureSelector::Candidate> first;
  tests::OnEachInstructionSet([&] {
    std::vector<FeatureSelector::Candidate> found = Candidates(params, image).candidates;
    ASSERT_EQ(found.size(), expected.size());
    for (std::size_t i = 1; i < found.size(); ++i) ASSERT_GE(found[i - 1].score, found[i].score);
    if (first.empty()) first = found;
    for (std::size_t i = 0; i < found.size(); ++i) ASSERT_EQ(found[i].score, first[i].score);
    if (!exact) std::sort(found.begin(), found.end(), by_pixel);
    for (std::size_t i = 0; i < found.size(); ++i) {
      ASSERT_EQ(found[i].pixel, expected[i].pixel);
      ASSERT_NEAR(found[i].score / expected[i].score, 1.0f, exact ? 0.0f : 0x1p-11f);
    }
  });
  return expected.size();
}

TEST(FeatureSelectorCandidates, TheFloorPerWindowPixelAndTheCapOnTheBest) {
  // Two strong corners, and one whose contrast is a tenth.
  const Image image = Image(90, 48, 40.0f).Fill(18, 20, 40, 48, 200.0f).Fill(66, 20, 90, 48, 56.0f);
  const struct {
    float threshold, max_eig, min_eig;
    bool faint;
  } cases[] = {{0.02f, 6000, 1, true},   // 0.02 * 6000 * 25 = 3000
               {0.02f, 8000, 1, false},  // 4000
               {0, 8000, 143, true},     // 3575
               {0, 8000, 144, false}};   // 3600
  for (const auto& c : cases) {
    SelectorParams params;
    params.half_winx = params.half_winy = 2;
    params.border = 6;
    params.presmoothing = false;
    params.threshold = c.threshold;
    params.max_eig = c.max_eig;
    params.min_eig = c.min_eig;
    std::vector<std::string> expected = {"19,21 358400", "38,21 358400"};
    if (c.faint) expected.push_back("67,21 3584");
    EXPECT_EQ(Texts(Candidates(params, image)), expected) << c.max_eig << ' ' << c.min_eig;
  }
}

// Windows lower than a group of rows of the running sums, of every remainder over whole groups, and
// wider than a segment of a folded row is long.
TEST(FeatureSelectorCandidates, EqualThePlainSelectorForEveryWindow) {
  constexpr std::uint64_t kHalves[][2] = {{0, 0}, {1, 1},  {1, 2},  {2, 2},   {0, 5},
                                          {1, 3}, {3, 4},  {6, 0},  {7, 4},   {4, 7},
                                          {9, 9}, {3, 11}, {15, 8}, {15, 15}, {20, 20}};
  unsigned seed = 1;
  std::size_t total = 0;
  for (const auto& [hx, hy] : kHalves) {
    for (const auto& [width, height] :
         {std::pair{64, 48}, {97, 61}, {47, 90}, {11, 130}, {130, 11}, {231, 170}}) {
      for (const bool smooth : {false, true}) {
        SelectorParams params;
        params.half_winx = hx;
        params.half_winy = hy;
        params.border = (const int[]){1, 12, 17}[++seed % 3];
        params.presmoothing = smooth;
        if (!smooth) params.threshold = params.min_eig = 0;
        const Image image = RandomImage(width, height, seed, !smooth);
        SCOPED_TRACE(::testing::Message() << width << " half " << hx << ',' << hy << " border "
                                          << params.border << ' ' << smooth);
        total += ExpectAsPlain(params, image, !smooth);
      }
    }
  }
  EXPECT_GT(total, 1000u);
}

// At some of which the radicand rounds below 0.
TEST(FeatureSelectorCandidates, EqualThePlainSelectorOnRoundBlobs) {
  Image blobs(250, 60, 30.0f);
  for (int y = 0; y < 60; ++y) {
    for (int x = 0; x < 250; ++x) {
      const int dx = x % 20 - 10, dy = y - 30;
      blobs.luma[y * 250 + x] +=
          std::round(200.0f * std::exp(-0.01f * (1 + x / 20) * (dx * dx + dy * dy)));
    }
  }
  int below_zero = 0;
  for (const std::uint64_t half : {2, 3, 5, 7}) {
    SelectorParams params;
    params.half_winx = params.half_winy = half;
    EXPECT_GT(ExpectAsPlain(params, blobs, false, &below_zero), 5u);
  }
  EXPECT_GT(below_zero, 0);
}

TEST(FeatureSelectorCandidates, StrongTextureLeavesNoTraceAboutIt) {
  std::mt19937 random(2);
  Image image(200, 200, 12.0f);
  for (int y = 60; y < 100; ++y) {
    for (int x = 60; x < 100; ++x) image.luma[y * 200 + x] = random() % 256;
  }
  SelectorParams params;
  params.half_winx = params.half_winy = 15;
  params.threshold = params.min_eig = 0;
  constexpr int kReach = 15 + 11 + 1;  // of the window, the smoothing, and the differences
  for (const auto& c : Candidates(params, image).candidates) {
    const int x = c.pixel % 200, y = c.pixel / 200;
    EXPECT_TRUE(x >= 60 - kReach && x < 100 + kReach) << x << ',' << y;
    EXPECT_TRUE(y >= 60 - kReach && y < 100 + kReach) << x << ',' << y;
  }
}

TEST(FeatureSelectorCandidates, FlatTransparentStraightAndTinyFramesHaveNone) {
  Image transparent = RandomImage(90, 80, 4);
  std::fill(transparent.mask.begin(), transparent.mask.end(), 0);
  for (const Image& image :
       {Image(90, 80, 173.0f), transparent, Image(90, 80, 20.0f).Fill(40, 0, 90, 80, 220.0f)}) {
    FeatureSelector selector = Candidates({}, image);
    EXPECT_THAT(Texts(selector), IsEmpty());
    selector.SelectFirst();
    EXPECT_THAT(selector.selected, IsEmpty());
  }
  for (const auto& [w, h] : {std::pair{1, 1}, {2, 5}, {12, 12}, {24, 24}, {25, 300}, {400, 3}}) {
    SCOPED_TRACE(::testing::Message() << w << 'x' << h);
    ExpectAsPlain({}, RandomImage(w, h, 5), false);
  }
  // Lengths beyond any image.
  for (auto SelectorParams::*field :
       {&SelectorParams::half_winx, &SelectorParams::half_winy, &SelectorParams::border}) {
    SelectorParams longest;
    longest.*field = std::numeric_limits<std::uint64_t>::max();
    EXPECT_THAT(Texts(Candidates(longest, RandomImage(64, 64, 6))), IsEmpty());
  }
}

TEST(FeatureSelectorCandidates, APresmoothFactorThatMeansNothingSmoothsNothing) {
  SelectorParams plain;
  plain.presmoothing = false;
  const Image image = RandomImage(80, 60, 8);
  const auto expected = Texts(Candidates(plain, image));
  for (const float factor : {0.0f, -1.0f, std::nanf("")}) {
    SelectorParams params;
    params.presmooth_factor = factor;
    EXPECT_EQ(Texts(Candidates(params, image)), expected) << factor;
  }
  SelectorParams params;
  params.presmooth_factor = std::numeric_limits<float>::infinity();
  EXPECT_THAT(Texts(Candidates(params, image)), IsEmpty());  // smoothed to grey
}

// Selections from candidates that the case sets itself.
FeatureSelector Selector(std::uint64_t spacing, std::uint64_t max_count = 100) {
  SelectorParams params;
  params.spacing = spacing;
  params.max_count = max_count;
  FeatureSelector selector(params);
  selector.Configure(40, 30);
  return selector;
}

std::vector<std::string> Selected(const FeatureSelector& selector) {
  std::vector<std::string> texts;
  for (const auto& f : selector.selected) texts.push_back(Text(f.x, f.y, f.score));
  return texts;
}

TEST(FeatureSelectionTest, TheBetterOfTwoWithinTheSpacingAndTheDiscsRim) {
  FeatureSelector selector = Selector(5);
  // (3, 4) lies on the circle; (4, 4) outside; (5, 0) on it; (6, 0) outside.
  const auto at = [](std::uint32_t x, std::uint32_t y) { return 40 * y + x; };
  selector.candidates = {
      {at(10, 10), 9}, {at(13, 14), 8}, {at(14, 14), 7}, {at(5, 10), 6}, {at(4, 10), 5}};
  for (const int round : {0, 1}) {  // no selection is in another's way
    selector.SelectFirst();
    EXPECT_THAT(Selected(selector), ElementsAre("10,10 9", "14,14 7", "4,10 5")) << round;
    const tracking_feature<float> cell{15.0f, 14.0f, 0, 0.0f};
    selector.SelectAvoiding(&cell, 1);
    EXPECT_THAT(Selected(selector), ElementsAre("10,10 9", "4,10 5")) << round;
  }
}

TEST(FeatureSelectionTest, StopsAtTheCountOrTheLimit) {
  FeatureSelector selector = Selector(1, 2);
  selector.candidates = {{0, 9.0f}, {10, 8.0f}, {20, 7.0f}};
  selector.SelectFirst();
  EXPECT_EQ(selector.selected.size(), 2u);
  selector.SelectAvoiding(nullptr, 0, 1);
  EXPECT_EQ(selector.selected.size(), 1u);
  selector.SelectAvoiding(nullptr, 0, 0);
  EXPECT_THAT(selector.selected, IsEmpty());
  // A spacing beyond the image leaves one.
  FeatureSelector wide = Selector(std::numeric_limits<std::uint64_t>::max());
  wide.candidates = {{0, 9.0f}, {1199, 8.0f}};
  wide.SelectFirst();
  EXPECT_EQ(wide.selected.size(), 1u);
}

// Dead, far and unbounded ones cover nothing.
TEST(FeatureSelectionTest, LiveFeaturesKeepTheirDistanceFromTheirRealCentre) {
  FeatureSelector selector = Selector(4);
  constexpr float kInf = std::numeric_limits<float>::infinity();
  const tracking_feature<float> cells[] = {
      {20.3f, 12.6f, 0, 0}, {0.5f, 29.4f, 0, 0}, {-3.5f, 10, 0, 0},
      {7, 7, 3, 0},         {20, 15, -1, 0},     {20, 15, -10, 0},
      {1e30f, 15, 0, 0},    {20, -kInf, 0, 0},   {std::nanf(""), 15, 3, 0}};
  for (const auto& cell : cells) {
    for (std::uint32_t i = 0; i < 1200; ++i) {  // every pixel alone as the one candidate
      const int x = i % 40, y = i / 40;
      selector.candidates = {{i, 1.0f}};
      selector.SelectAvoiding(&cell, 1);
      const bool near = cell.status >= 0 && std::hypot(x - cell.x, y - cell.y) <= 4.0;
      ASSERT_EQ(selector.selected.empty(), near)
          << cell.x << ',' << cell.y << " at " << x << ',' << y;
    }
  }
}

}  // namespace
}  // namespace marrow::tracking
