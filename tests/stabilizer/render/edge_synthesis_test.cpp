#include "stabilizer/render/edge_synthesis.h"

#include <cmath>

#include "tests/stabilizer/render/solved_clip.h"

namespace marrow::render {
namespace {

// Every pass in full.
template <class Pixel>
void PlainSynthesis(const FramePass<Pixel>& pass, WorldX<Pixel>& output) {
  drawFrame(pass, pass.frame, output);
  const auto frame = static_cast<long>(pass.frame);
  for (long distance = 1; distance <= pass.settings.synthesis_range; ++distance) {
    for (const long M : {frame + distance, frame - distance}) {
      if (M < 0 || M >= static_cast<long>(pass.warps.frameCount())) continue;
      WorldX<Pixel> layer(output.width(), output.height());
      if (drawFrame(pass, static_cast<std::size_t>(M), layer)) {
        pass.operations.TransferBehind(layer, 0, 0, output);
      }
    }
  }
  const double n = std::max(std::floor(pass.settings.alpha_boost + 0.5), 1.0);
  for (int i = 0; i < output.width() * output.height(); ++i) {
    auto& alpha = output.row(i / output.width())[i % output.width()].alpha;
    if (alpha < full<Pixel>) alpha = std::min<double>(n * alpha, full<Pixel>);
  }
}

template <class Pixel>
class EdgeSynthesis : public testing::Test {};
TYPED_TEST_SUITE(EdgeSynthesis, Depths);

TYPED_TEST(EdgeSynthesis, WhatIsNotDrawnWouldNotHaveShown) {
  std::mt19937 random(11);
  const auto within = [&](double a) { return a * (random() % 2001 / 1000.0 - 1); };
  PixelOperations<TypeParam> operations;
  for (int run = 0; run < 30; ++run) {
    SCOPED_TRACE(run);
    SolvedClip clip(190, 140, 9, 7);
    Pictures<TypeParam> bare, prepared;
    const double shake = run % 2 ? 40 : 6;
    RenderSettings settings{.framing = Framing::synthesize_edges,
                            .additional_scale = run % 7 == 3 ? 0.7f : 1.0f,
                            .shift_x = 15,
                            .shift_y = 4,
                            .synthesis_range = run % 5 == 0 ? 3 : 20,
                            .alpha_boost = 1.0 * (run % 4)};
    if (run % 3 != 1) settings.edges = {2.0 * (run % 2), 0, 3, 1, 4};
    for (int f = 0; f < 9; ++f) {
      const double dx = within(shake), dy = within(shake), turn = within(0.05), bend = within(3);
      clip.Add([=](double x, double y) {
        return point2{x - turn * y + bend * std::sin(y / 9) + dx,
                      y + turn * x + bend * std::sin(x / 7) + dy};
      });
      bare.Add(Textured<TypeParam>(190, 140, 100 * run + f, run % 3 ? alphas::full : alphas::odd));
      prepared.Add(190, 140, {});
      prepareEdges(*bare.worlds[f], scaledEdges(settings.edges, 1), *prepared.worlds[f]);
    }
    if (run % 4 == 0) clip.without_motion = {1, 5};
    Renderer renderer = makeRenderer(clip, 1, 1);
    // A part of the plane, in rows with padding.
    const int width = renderer.planeWidth - 20, height = renderer.planeHeight - 9;
    PaddedWorld<TypeParam> found(width, height), expected(width, height);
    const std::size_t frame = run < 2 ? 8 * run : random() % 9;

    ASSERT_TRUE(renderFrame<TypeParam>(clip, nullptr, settings, renderer, frame, bare, operations,
                                       found.pixels));
    EXPECT_EQ(std::set<std::size_t>(bare.asked.begin(), bare.asked.end()).size(),
              bare.asked.size());
    expected.pixels.clear();
    PlainSynthesis<TypeParam>({clip, settings, renderer, prepared, operations, frame,
                               wholePlane(renderer), settings.additional_scale},
                              expected.pixels);
    ASSERT_TRUE(found.buffer == expected.buffer);
  }
}

using Asked = std::vector<std::size_t>;

// Frames of one colour each, moved sideways by whole pixels. A pixel at x shows the source half a
// pixel to the left of x - shift; the outermost column is repeated in the two pixels beside it.
template <class Pixel>
class Stripes : public testing::Test {
 protected:
  static constexpr int kSide = 24;

  void Shoot(const std::vector<double>& shifts) {
    for (const double shift : shifts) {
      clip.Add(Moved(shift, 0));
      pictures.Add(kSide, kSide, PixelOf<Pixel>(1, 0.1 * clip.frameCount(), 0, 0));
    }
  }
  // The middle row.
  std::vector<Pixel> Row(std::size_t frame) {
    pictures.asked.clear();
    const WorldX<Pixel> output = Rendered(clip, pictures, settings, frame);
    return {output.row(kSide / 2), output.row(kSide / 2) + output.width()};
  }
  // Which frame shows in a pixel of the row; -1 for none.
  int Shown(std::size_t frame, std::size_t x) {
    const Pixel p = Row(frame).at(x);
    return p.alpha == 0 ? -1 : static_cast<int>(std::lround(p.red / full<Pixel> * 10)) - 1;
  }

  SolvedClip clip{kSide, kSide, 4, 4};
  Pictures<Pixel> pictures;
  RenderSettings settings{.framing = Framing::synthesize_edges, .synthesis_range = 10};
};
TYPED_TEST_SUITE(Stripes, Depths);

TYPED_TEST(Stripes, TheNearestFrameThatCoversAPixelShowsAndTheNextOneBeforeTheLast) {
  //     frame  0   1   2  3   4    5
  this->Shoot({60, 30, 0, 30, 60, -30});
  ASSERT_EQ(this->Row(2).size(), 113u);  // 23 + 60 + 30, from -30 on
  const Asked all{2, 3, 1, 4, 0, 5};
  const struct {
    std::size_t frame, x;
    int range, shown;
    Asked asked;
    std::set<std::size_t> without_motion = {};
  } cases[] = {{2, 10, 10, 5, all},
               {2, 27, 10, -1, all},
               {2, 40, 10, 2, all},
               {2, 70, 10, 3, all},   // not 1
               {2, 100, 10, 4, all},  // not 0
               {2, 70, 10, 1, {2, 1, 4, 0, 5}, {3}},
               {2, 70, 10, -1, {2, 4, 0, 5}, {1, 3}},
               {2, 100, 1, -1, {2, 3, 1}},
               {2, 70, 0, -1, {2}},
               // At the clip's ends only one side is there.
               {0, 70, 2, 1, {0, 1, 2}},
               {5, 70, 2, 3, {5, 4, 3}}};
  for (const auto& c : cases) {
    this->settings.synthesis_range = c.range;
    this->clip.without_motion = c.without_motion;
    EXPECT_EQ(this->Shown(c.frame, c.x), c.shown) << c.frame << ", " << c.x;
    EXPECT_EQ(this->pictures.asked, c.asked) << c.frame << ", " << c.x;
  }
}

TYPED_TEST(Stripes, FeatherAndBoostAreInTheAlphas) {
  const double near = rounds<TypeParam> ? 1.5 / 255 : 1e-6;
  this->Shoot({0, 0});
  this->settings.edges.feather = 3;
  // Columns have 1/8, 1/2, 7/8, 1; a pixel shows the middle between its column and the one before,
  // and with another frame behind a + b - a b.
  const struct {
    int range;
    double boost, first, second, third;
  } cases[] = {{1, 1, 10 - 25. / 16, 22 - 121. / 16, 30 - 225. / 16},
               {0, 0, 5, 11, 15},
               {0, 1.4, 5, 11, 15},
               {0, 1.5, 10, 16, 16},
               {0, 3, 15, 16, 16}};
  for (const auto& c : cases) {
    this->settings.synthesis_range = c.range;
    this->settings.alpha_boost = c.boost;
    const auto row = this->Row(0);
    EXPECT_NEAR(row[1].alpha / full<TypeParam>, c.first / 16, near * std::max(c.boost, 1.0));
    EXPECT_NEAR(row[2].alpha / full<TypeParam>, c.second / 16, near);
    EXPECT_NEAR(row[3].alpha / full<TypeParam>, c.third / 16, near);
    EXPECT_EQ(row[4].alpha, full<TypeParam>);
  }
  EXPECT_NEAR(this->Row(0)[1].red / full<TypeParam>, 0.1, near);
}

using StripesFloat = Stripes<HX_PixelFloat>;

TEST_F(StripesFloat, NothingIsFetchedForAClosedPicture) {
  Shoot({0, 0, 0});
  Row(1);
  EXPECT_EQ(pictures.asked, (Asked{1}));
  settings.edges.feather = 2;
  Row(1);
  EXPECT_EQ(pictures.asked, (Asked{1, 2, 0}));
  // Another framing knows no feather.
  settings.framing = Framing::stabilize_only;
  EXPECT_EQ(Row(1)[0].alpha, 1);
}

TEST_F(StripesFloat, AFrameThatCannotBeHadEndsTheRenderWithItsCode) {
  Shoot({0, 30, -30});
  pictures.refused = 2;
  EXPECT_THROW(Row(0), std::int32_t);
  settings.synthesis_range = 1;
  EXPECT_EQ(Shown(0, 80), 1) << "not asked for what is out of range";
}

TEST(EdgeSynthesisTiles, ANeighbourThatReachesNothingOpenIsNotFetched) {
  SolvedClip clip(200, 200, 4, 4, Moved(0, 0));
  clip.Add([](double x, double y) { return point2{0.3 * x + 60, 0.3 * y + 60}; });  // in its middle
  clip.Add(Moved(30, 0));
  clip.Add(Moved(300, 0));  // far away
  Pictures<HX_Pixel8> pictures;
  for (int f = 0; f < 4; ++f) pictures.Add(200, 200, {255, 0, 0, 0});
  Rendered(clip, pictures, {.framing = Framing::synthesize_edges, .synthesis_range = 3});
  EXPECT_EQ(pictures.asked, (Asked{0, 2, 3}));
}

}  // namespace
}  // namespace marrow::render
