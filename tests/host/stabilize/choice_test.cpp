#include "host/stabilize/choice.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <nlohmann/json.hpp>
#include <optional>
#include <random>
#include <string>
#include <vector>

namespace calmframe::host {
namespace {

// Points of a flat scene that a shaking hand films, and warps that undo the shake but for `noise`
// pixels by which each vertex of each frame is off. Every fourth vertex of the noise has it alone,
// so that no similarity undoes it.
SolvedClip Filmed(double noise) {
  constexpr int kFrames = 90, kSlots = 80;
  std::mt19937 random(6);
  std::uniform_real_distribution<double> even(-1, 1);
  SolvedClip clip;
  clip.source_width = clip.width = 400;
  clip.source_height = clip.height = 300;
  clip.frame_count = kFrames;
  clip.columns = 5;
  clip.rows = 4;
  clip.slots = kSlots;
  std::vector<Point> scene;
  for (int s = 0; s < kSlots; ++s) {
    scene.push_back({200 + 180 * even(random), 150 + 130 * even(random)});
  }
  for (int f = 0; f < kFrames; ++f) {
    const Similarity hand{1, 0.01 * even(random), 6 * even(random), 6 * even(random)};
    for (const Point& point : scene) {
      clip.tracks.push_back(hand(point));
      clip.statuses.push_back(f == 0 ? 1 : 0);
    }
    for (int r = 0; r < clip.rows; ++r) {
      for (int c = 0; c < clip.columns; ++c) {
        const Point still = Inverse(hand)({399.0 * c / 4, 299.0 * r / 3});
        clip.vertices.push_back({still.x + noise * even(random), still.y + noise * even(random)});
      }
    }
  }
  return clip;
}

const Candidate kBent{.name = "bent"};
const Candidate kUnbent{.name = "unbent", .warps = Warps::none};
const Candidate kAsFilmed{.name = "as filmed", .warps = Warps::none, .follows = false};

// The best of these, in this order.
Choice Best(const SolvedClip& clip, const std::vector<Candidate>& candidates,
            const FollowSettings& settings = {}) {
  Chooser chooser(clip, settings, 30);
  for (const Candidate& candidate : candidates) chooser.Consider(candidate, clip);
  EXPECT_EQ(chooser.choice().candidates.size(), candidates.size());
  EXPECT_EQ(chooser.windows().size(), 90u);
  return chooser.choice();
}

TEST(ChooserTest, BendsAreKeptWhereTheyHelpAndLeftWhereTheyAreNoise) {
  const Choice good = Best(Filmed(0), {kUnbent, kBent, kAsFilmed});
  EXPECT_EQ(good.best().name, "bent");
  EXPECT_LT(good.best().outcome.after.mean, 0.05);
  EXPECT_LT(good.best().outcome.wobble_after, 0.01);
  const Choice bad = Best(Filmed(15), {kBent, kUnbent, kAsFilmed});
  EXPECT_EQ(bad.best().name, "unbent");
  EXPECT_LT(bad.best().outcome.after.mean, 0.2);
  EXPECT_LT(bad.best().outcome.tracks_after, 0.2);
  const Outcome& noise = bad.candidates[0].outcome;
  EXPECT_GT(noise.after.mean, 2 * bad.best().outcome.after.mean);
  EXPECT_GT(noise.wobble_after, 5);
  for (const Outcome& outcome : {good.best().outcome, bad.best().outcome, noise}) {
    EXPECT_LE(outcome.most_zoom, 1.5 + 1e-3);
    EXPECT_LT(outcome.most_black, 1e-4);
  }
}

// What nothing steadies is better not touched.
TEST(ChooserTest, WhatIsNoBetterThanTheSourceIsLeftAsItIs) {
  SolvedClip still = Filmed(15);
  for (int f = 1; f < still.frame_count; ++f) {  // a tripod's tracks under the shaking hand's warps
    std::copy_n(still.tracks.begin(), still.slots, still.tracks.begin() + f * still.slots);
  }
  const Choice choice = Best(still, {kBent, kAsFilmed});
  EXPECT_EQ(choice.best().name, "as filmed");
  EXPECT_NEAR(choice.best().outcome.width_kept, 1, 1e-9);
  EXPECT_EQ(choice.best().outcome.after.mean, 0);
}

// The same windows, enlarged or made smaller afterwards.
TEST(ChooserTest, AnEnlargementComesOnTop) {
  const SolvedClip clip = Filmed(0);
  const Outcome plain = Best(clip, {kBent}).best().outcome;
  FollowSettings settings;
  settings.enlarged = 1.25;
  const Outcome larger = Best(clip, {kBent}, settings).best().outcome;
  EXPECT_NEAR(larger.width_kept * 1.25, plain.width_kept, 1e-6);
  settings.enlarged = 0.8;
  EXPECT_GT(Best(clip, {kBent}, settings).best().outcome.most_black, 0.2);
}

TEST(ChooserTest, ATextBringsTheChoiceBack) {
  const SolvedClip clip = Filmed(15);
  Chooser first(clip, {}, 30);
  first.Consider(kBent, clip);
  first.Consider({.name = "calmer", .changes = {{20, 80}, {281, 0}}, .warps = Warps::none}, clip);
  const std::string text = first.choice().Json().dump();
  const std::optional<Choice> read = Choice::Parse(text);
  ASSERT_TRUE(read);
  EXPECT_EQ(read->taken, 1u);
  EXPECT_EQ(read->best().changes, (ParamValues{{20, 80}, {281, 0}}));
  EXPECT_EQ(read->Json().dump(), text);
  Chooser again(clip, {}, 30);
  again.Take(*read, clip);
  ASSERT_EQ(again.windows().size(), first.windows().size());
  for (std::size_t f = 0; f < first.windows().size(); ++f) {
    EXPECT_EQ(again.windows()[f].dx, first.windows()[f].dx) << f;
  }
  for (const char* none : {"", "{}", "[1]", "{\"still\":\"nobody\"}"}) {
    EXPECT_FALSE(Choice::Parse(none)) << none;
  }
  EXPECT_FALSE(Choice::Parse(text.substr(0, text.size() / 2)));
}

}  // namespace
}  // namespace calmframe::host
