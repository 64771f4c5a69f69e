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

// Blocks of random brightness with noise on top: corners, edges and texture.
Image RandomImage(int width, int height, unsigned seed) {
  std::mt19937 random(seed);
  Image image(width, height, 90.0f);
  for (int i = 0; i < width * height / 60; ++i) {
    const int x = random() % width, y = random() % height;
    image.Fill(x, y, x + 2 + random() % 14, y + 2 + random() % 14, random() % 256);
  }
  for (float& v : image.luma) v = std::min(255.0f, v + random() % 6);
  for (auto& m : image.mask) m = random() % 8 != 0;
  return image;
}

FeatureSelector Candidates(const SelectorParams& params, const Image& image,
                           FeatureSelector::ScoreRange* range = nullptr) {
  FeatureSelector selector(params);
  selector.Configure(image.width, image.height);
  std::copy(image.luma.begin(), image.luma.end(), selector.luma());
  std::copy(image.mask.begin(), image.mask.end(), selector.mask());
  const auto found = selector.ComputeCandidates();
  if (range) *range = found;
  return selector;
}

std::vector<std::string> Texts(const FeatureSelector& selector) {
  std::vector<std::string> texts;
  for (const auto& c : selector.candidates) {
    std::ostringstream text;
    text << c.pixel % selector.width() << ',' << c.pixel / selector.width() << ' ' << c.score;
    texts.push_back(text.str());
  }
  return texts;
}

SelectorParams Small() {
  SelectorParams params;
  params.half_winx = params.half_winy = 2;
  params.border = 6;
  params.presmoothing = false;
  return params;
}

// Image after image over the whole frame, as one would write it down.
std::vector<FeatureSelector::Candidate> PlainCandidates(const SelectorParams& p,
                                                        const Image& image) {
  const int w = image.width, h = image.height;
  const int hx = p.half_winx, hy = p.half_winy, border = p.border;
  std::vector<float> plane = image.luma;
  const int gx = std::max(0, border - hx - 2), gy = std::max(0, border - hy - 2);
  if (p.presmoothing) {
    const std::vector<float> kernel =
        IntegratedGaussian((2 * std::max(hx, hy) + 1) * static_cast<double>(p.presmooth_factor));
    const int r = kernel.size() / 2, px = std::max(0, gx - r), py = std::max(0, gy - r);
    for (const bool along_x : {true, false}) {
      const std::vector<float> source = plane;
      for (int y = py; y < h - py; ++y) {
        for (int x = px; x < w - px; ++x) {
          const auto at = [&](int k) {
            return along_x ? source[y * w + std::clamp(x + k, 0, w - 1)]
                           : source[std::clamp(y + k, 0, h - 1) * w + x];
          };
          float sum = kernel[r] * at(0);
          for (int k = 1; k <= r; ++k) sum += kernel[r + k] * (at(-k) + at(k));
          plane[y * w + x] = sum;
        }
      }
    }
  }
  if (2 * gx >= w || 2 * gy >= h) return {};
  std::vector<float> xx(w * h, 0), yy(w * h, 0), xy(w * h, 0), score(w * h, 0);
  for (int y = gy; y < h - gy; ++y) {
    for (int x = gx; x < w - gx; ++x) {
      const int i = y * w + x;
      const float ix = x == gx || x == w - gx - 1 ? 0 : plane[i + 1] - plane[i - 1];
      const float iy = y == gy || y == h - gy - 1 ? 0 : plane[i + w] - plane[i - w];
      xx[i] = ix * ix, yy[i] = iy * iy, xy[i] = ix * iy;
    }
  }
  for (int y = gy + hy + 1; y < h - gy - hy - 1; ++y) {
    for (int x = gx + hx + 1; x < w - gx - hx - 1; ++x) {
      double sums[3] = {};
      for (int v = y - hy; v <= y + hy; ++v) {
        for (int u = x - hx; u <= x + hx; ++u) {
          sums[0] += xx[v * w + u], sums[1] += yy[v * w + u], sums[2] += xy[v * w + u];
        }
      }
      const float a = sums[0], b = sums[1], c = sums[2], t = a + b;
      const float d = std::sqrt(std::max(0.0f, t * t - 4 * (a * b - c * c)));
      score[y * w + x] = t + d > (t - d) * p.eig_ratio_threshold ? 0 : t - d;
    }
  }
  const int mx = std::max(border, hx + 2), my = std::max(border, hy + 2);
  std::vector<int> maxima;
  float best = -100000.0f;
  for (int y = my; y < h - my; ++y) {
    for (int x = mx; x < w - mx; ++x) {
      const int i = y * w + x;
      bool above = image.mask[i] != 0;
      for (const int n : {-w - 1, -w, -w + 1, -1, 1, w - 1, w, w + 1}) {
        above = above && score[i] > score[i + n];
      }
      if (above) maxima.push_back(i), best = std::max(best, score[i]);
    }
  }
  if (best < 0) return {};
  const float area = (2 * hx + 1) * (2 * hy + 1);
  const float limit = std::max(p.threshold * std::min(best, p.max_eig * area), p.min_eig * area);
  std::stable_sort(maxima.begin(), maxima.end(), [&](int i, int j) { return score[i] > score[j]; });
  std::vector<FeatureSelector::Candidate> candidates;
  for (const int i : maxima) {
    if (score[i] >= limit) candidates.push_back({static_cast<std::uint32_t>(i), score[i]});
  }
  return candidates;
}

// The same pixels, by falling score. At a round corner the radicand of a score cancels, so that its
// root can make the rounding of the sums, 2^-24, as large as 2^-12.
void ExpectCandidates(std::vector<FeatureSelector::Candidate> found,
                      std::vector<FeatureSelector::Candidate> expected) {
  EXPECT_TRUE(std::is_sorted(found.begin(), found.end(),
                             [](const auto& a, const auto& b) { return a.score > b.score; }));
  ASSERT_EQ(found.size(), expected.size());
  for (auto* list : {&found, &expected}) {
    std::sort(list->begin(), list->end(),
              [](const auto& a, const auto& b) { return a.pixel < b.pixel; });
  }
  for (std::size_t i = 0; i < found.size(); ++i) {
    ASSERT_EQ(found[i].pixel, expected[i].pixel);
    ASSERT_NEAR(found[i].score / expected[i].score, 1.0f, 2.5e-4f) << found[i].pixel;
  }
}

TEST(FeatureSelectorCandidates, WorkedCorner) {
  const Image corner = Image(48, 48, 40.0f).Fill(18, 20, 48, 48, 200.0f);
  FeatureSelector::ScoreRange range;
  EXPECT_THAT(Texts(Candidates(Small(), corner, &range)), ElementsAre("19,21 358400"));
  EXPECT_FLOAT_EQ(range.best, 358400.0f / 25);
  EXPECT_FLOAT_EQ(range.worst, 358400.0f / 25);

  SelectorParams smoothed = Small();
  smoothed.half_winx = smoothed.half_winy = 7;
  smoothed.border = 12;
  smoothed.presmoothing = true;
  const FeatureSelector found = Candidates(smoothed, corner);
  ASSERT_EQ(found.candidates.size(), 1u);
  EXPECT_EQ(found.candidates[0].pixel, 25u * 48 + 23);
  EXPECT_NEAR(found.candidates[0].score, 370829.8f, 1.0f);
}

TEST(FeatureSelectorCandidates, ASquareHasFourOfEqualScore) {
  const Image square = Image(48, 48, 40.0f).Fill(18, 20, 27, 29, 200.0f);
  EXPECT_THAT(Texts(Candidates(Small(), square)),
              ElementsAre("19,21 358400", "25,21 358400", "19,27 358400", "25,27 358400"));
}

TEST(FeatureSelectorCandidates, EqualThePlainSelectorOnRandomImages) {
  unsigned seed = 1;
  std::size_t total = 0;
  for (const auto& [width, height] :
       {std::pair{64, 48}, {97, 61}, {40, 90}, {11, 130}, {130, 11}, {231, 170}}) {
    for (const auto& [hx, hy] :
         {std::pair{0, 0}, {1, 2}, {2, 2}, {5, 5}, {7, 4}, {3, 11}, {15, 15}}) {
      for (const int border : {1, 12, 17}) {
        for (const bool smooth : {false, true}) {
          SelectorParams params;
          params.half_winx = hx;
          params.half_winy = hy;
          params.border = border;
          params.presmoothing = smooth;
          const Image image = RandomImage(width, height, seed++);
          const auto expected = PlainCandidates(params, image);
          total += expected.size();
          SCOPED_TRACE(testing::Message() << width << " half " << hx << ',' << hy << " border "
                                          << border << ' ' << smooth);
          ExpectCandidates(Candidates(params, image).candidates, expected);
        }
      }
    }
  }
  EXPECT_GT(total, 1000u);
}

TEST(FeatureSelectorCandidates, TheSameBitsOnEveryInstructionSet) {
  SelectorParams params;
  const Image image = RandomImage(150, 110, 77);
  using Bits = std::vector<std::pair<std::uint32_t, float>>;
  Bits first;
  tests::OnEachInstructionSet([&] {
    Bits bits;
    for (const auto& c : Candidates(params, image).candidates) bits.push_back({c.pixel, c.score});
    ASSERT_FALSE(bits.empty());
    if (first.empty()) first = bits;
    EXPECT_EQ(bits, first);
  });
}

TEST(FeatureSelectorCandidates, FlatTransparentStraightAndTinyFramesHaveNone) {
  SelectorParams params;
  EXPECT_THAT(Texts(Candidates(params, Image(90, 80, 173.0f))), IsEmpty());
  Image transparent = RandomImage(90, 80, 4);
  std::fill(transparent.mask.begin(), transparent.mask.end(), 0);
  FeatureSelector::ScoreRange range{1, 1};
  FeatureSelector selector = Candidates(params, transparent, &range);
  selector.SelectFirst();
  EXPECT_THAT(selector.selected, IsEmpty());
  EXPECT_EQ(range.best, 0.0f);
  EXPECT_EQ(range.worst, 0.0f);
  EXPECT_THAT(Texts(Candidates(params, Image(90, 80, 20.0f).Fill(40, 0, 90, 80, 220.0f))),
              IsEmpty());
  for (const auto& [w, h] : {std::pair{1, 1}, {2, 5}, {12, 12}, {24, 24}, {25, 300}, {400, 3}}) {
    SCOPED_TRACE(testing::Message() << w << 'x' << h);
    ExpectCandidates(Candidates(params, RandomImage(w, h, 5)).candidates,
                     PlainCandidates(params, RandomImage(w, h, 5)));
  }
}

TEST(FeatureSelectorCandidates, LengthsBeyondAnyImageGiveNone) {
  for (auto SelectorParams::*field :
       {&SelectorParams::half_winx, &SelectorParams::half_winy, &SelectorParams::border}) {
    SelectorParams params;
    params.*field = std::numeric_limits<std::uint64_t>::max();
    EXPECT_THAT(Texts(Candidates(params, RandomImage(64, 64, 6))), IsEmpty());
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

TEST(FeatureSelectorCandidates, TheFloorPerWindowPixelAndTheCapOnTheBest) {
  // A strong corner, and one whose contrast is a tenth: scores 358400 and 3584.
  const Image image = Image(90, 48, 40.0f).Fill(18, 20, 40, 48, 200.0f).Fill(66, 20, 90, 48, 56.0f);
  SelectorParams params = Small();
  params.threshold = 0.02f;  // 0.02 * 6000 * 25 = 3000
  EXPECT_THAT(Texts(Candidates(params, image)), testing::Contains("67,21 3584"));
  params.max_eig = 8000.0f;  // 4000
  EXPECT_THAT(Texts(Candidates(params, image)), testing::Not(testing::Contains("67,21 3584")));
  params.threshold = 0.0f;
  params.min_eig = 143.0f;  // 3575
  EXPECT_THAT(Texts(Candidates(params, image)), testing::Contains("67,21 3584"));
  params.min_eig = 144.0f;
  EXPECT_THAT(Texts(Candidates(params, image)), testing::Not(testing::Contains("67,21 3584")));
}

// Selections from candidates that the case sets itself.
class FeatureSelectionTest : public testing::Test {
 protected:
  FeatureSelector Selector(std::uint64_t spacing, std::uint64_t max_count = 100) {
    SelectorParams params;
    params.spacing = spacing;
    params.max_count = max_count;
    FeatureSelector selector(params);
    selector.Configure(40, 30);
    return selector;
  }
  // Which pixels of the image can still be selected: every pixel alone as the one candidate.
  std::vector<std::string> Free(FeatureSelector& selector, float x, float y, std::int32_t status) {
    const tracking_feature<float> cell{x, y, status, 0};
    std::vector<std::string> rows(30, std::string(40, '.'));
    for (std::uint32_t i = 0; i < 1200; ++i) {
      selector.candidates = {{i, 1.0f}};
      selector.SelectAvoiding(&cell, 1);
      if (selector.selected.empty()) rows[i / 40][i % 40] = '#';
    }
    return rows;
  }
};

TEST_F(FeatureSelectionTest, TheBetterOfTwoWithinTheSpacingAndTheDiscsRim) {
  FeatureSelector selector = Selector(5);
  // (3, 4) lies on the circle; (4, 4) outside; (5, 0) on it; (6, 0) outside.
  selector.candidates = {{10 * 40 + 10, 9.0f},
                         {14 * 40 + 13, 8.0f},
                         {14 * 40 + 14, 7.0f},
                         {10 * 40 + 5, 6.0f},
                         {10 * 40 + 4, 5.0f}};
  selector.SelectFirst();
  ASSERT_EQ(selector.selected.size(), 3u);
  EXPECT_EQ(selector.selected[1].x, 14.0f);
  EXPECT_EQ(selector.selected[1].y, 14.0f);
  EXPECT_EQ(selector.selected[1].score, 7.0f);
  EXPECT_EQ(selector.selected[2].x, 4.0f);
}

TEST_F(FeatureSelectionTest, NoSelectionIsInAnothersWay) {
  FeatureSelector selector = Selector(4);
  selector.candidates = {{10 * 40 + 10, 9.0f}, {10 * 40 + 12, 8.0f}, {10 * 40 + 15, 7.0f}};
  const tracking_feature<float> cell{10.0f, 10.0f, 0, 0.0f};
  for (int round = 0; round < 600; ++round) {
    selector.SelectFirst();
    ASSERT_EQ(selector.selected.size(), 2u) << round;
    selector.SelectAvoiding(&cell, 1);
    ASSERT_EQ(selector.selected.size(), 1u) << round;
    ASSERT_EQ(selector.selected[0].x, 15.0f);
  }
}

TEST_F(FeatureSelectionTest, StopsAtTheCountOrTheLimit) {
  FeatureSelector selector = Selector(1, 2);
  selector.candidates = {{0, 9.0f}, {10, 8.0f}, {20, 7.0f}};
  selector.SelectFirst();
  EXPECT_EQ(selector.selected.size(), 2u);
  selector.SelectAvoiding(nullptr, 0, 1);
  EXPECT_EQ(selector.selected.size(), 1u);
  selector.SelectAvoiding(nullptr, 0, 0);
  EXPECT_THAT(selector.selected, IsEmpty());
}

TEST_F(FeatureSelectionTest, LiveFeaturesKeepTheirDistanceFromTheirRealCentre) {
  FeatureSelector selector = Selector(4);
  for (const auto& [cx, cy] :
       {std::pair{20.3f, 12.6f}, {0.5f, 29.4f}, {-3.5f, 10.0f}, {7.f, 7.f}}) {
    const auto rows = Free(selector, cx, cy, 0);
    for (int y = 0; y < 30; ++y) {
      for (int x = 0; x < 40; ++x) {
        const bool near = std::hypot(x - cx, y - cy) <= 4.0;
        ASSERT_EQ(rows[y][x], near ? '#' : '.') << cx << ',' << cy << " at " << x << ',' << y;
      }
    }
  }
}

TEST_F(FeatureSelectionTest, DeadFarAndUnboundedFeaturesCoverNothing) {
  FeatureSelector selector = Selector(4);
  const std::vector<std::string> all_free(30, std::string(40, '.'));
  constexpr float kInf = std::numeric_limits<float>::infinity();
  EXPECT_EQ(Free(selector, 20, 15, -1), all_free);
  EXPECT_EQ(Free(selector, 20, 15, -10), all_free);
  EXPECT_EQ(Free(selector, 1e30f, 15, 0), all_free);
  EXPECT_EQ(Free(selector, 20, -kInf, 0), all_free);
  EXPECT_EQ(Free(selector, std::nanf(""), 15, 3), all_free);
  EXPECT_NE(Free(selector, 20, 15, 3), all_free);
}

TEST_F(FeatureSelectionTest, ASpacingBeyondTheImageLeavesOne) {
  FeatureSelector selector = Selector(std::numeric_limits<std::uint64_t>::max());
  selector.candidates = {{0, 9.0f}, {1199, 8.0f}};
  selector.SelectFirst();
  EXPECT_EQ(selector.selected.size(), 1u);
}

}  // namespace
}  // namespace marrow::tracking
