#include "stabilization/fade_weight.h"

#include <gtest/gtest.h>

#include <vector>

namespace marrow::stabilization {
namespace {

// Tracks over [first, last) of a clip, in flanks of 100 frames, those under 5 frames dropped.
TEST(FadeWeight, TracksRiseAndFallUnlessTheClipCutsThem) {
  const struct {
    int first, last, frames;
    std::vector<std::pair<int, double>> weights;  // of frames
  } tracks[] = {
      {0, 300, 300, {{0, 1}, {150, 1}, {299, 1}}},
      {0, 150, 150, {{0, .75}, {149, .75}}},
      {0, 99, 300, {{0, .99}, {50, .49}, {98, .01}}},
      {0, 100, 300, {{0, .5}, {49, .5}, {50, .5}, {51, .49}, {99, .01}}},
      {0, 101, 300, {{0, .505}, {50, .505}, {100, .01}}},
      {250, 300, 300, {{250, .01}, {274, .25}, {299, .5}}},
      {10, 15, 300, {{10, .01}, {11, .02}, {12, .025}, {13, .02}, {14, .01}}},
      {10, 16, 300, {{10, .01}, {12, .03}, {13, .03}, {15, .01}}},
      {10, 14, 300, {{10, 0}, {12, 0}}},
      {50, 350, 1000, {{50, .01}, {148, .99}, {149, 1}, {250, 1}, {251, .99}, {349, .01}}},
      {20, 180, 1000, {{20, .01}, {98, .79}, {99, .8}, {100, .8}, {101, .79}, {179, .01}}}};
  for (const auto& t : tracks) {
    for (const auto& [frame, weight] : t.weights) {
      EXPECT_NEAR(fade_weight(t.first, t.last, t.frames, frame, 100, 5), weight, 1e-12)
          << t.first << " to " << t.last << ", frame " << frame;
    }
  }
}

// In units of one step of a flank of 30 frames.
TEST(FadeWeight, SpansTooShortForTheirFlanks) {
  const struct {
    fade_span span;
    std::vector<double> weights;
  } spans[] = {{{3, false, false}, {1, 1.5, 1}},
               {{4, false, false}, {1, 2, 2, 1}},
               {{4, true, true}, {4, 4, 4, 4}},
               {{4, true, false}, {4, 3, 2, 1}},
               {{4, false, true}, {1, 2, 3, 4}}};
  for (const auto& s : spans) {
    for (std::size_t p = 0; p < s.weights.size(); ++p) {
      EXPECT_NEAR(30 * fade_weight(s.span, static_cast<std::int64_t>(p), 30), s.weights[p], 1e-12);
    }
  }
  EXPECT_EQ(fade_weight({7, false, false}, 3, 0), 1.0);  // no flanks
}

}  // namespace
}  // namespace marrow::stabilization
