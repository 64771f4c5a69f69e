#include "host/stabilize/choice.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <nlohmann/json.hpp>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "tests/support/given_frames.h"

namespace calmframe::host {
namespace {

// Points of a flat scene that a shaking hand films, and warps that undo its motion but for `noise`
// pixels by which each vertex of each frame is off. Every fourth vertex of the noise has it alone,
// so that no similarity undoes it. `growth`: by which the camera comes nearer from frame to frame.
// `roll`: radians by which it turns at most.
SolvedClip Filmed(double noise, double growth = 1, double roll = 0) {
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
  GivenFrames& given = GivenFrames::In(clip);
  std::vector<Point> scene;
  for (int s = 0; s < kSlots; ++s) {
    scene.push_back({200 + 180 * even(random), 150 + 130 * even(random)});
  }
  for (int f = 0; f < kFrames; ++f) {
    const double near = std::pow(growth, f - kFrames / 2);
    Similarity hand{near, 0.01 * even(random), 6 * even(random) + 200 * (1 - near),
                    6 * even(random) + 150 * (1 - near)};
    if (roll > 0) {
      const double turn = roll * even(random), c = std::cos(turn), s = std::sin(turn);
      hand = Compose({c, s, 200 - 200 * c + 150 * s, 150 - 200 * s - 150 * c}, hand);
    }
    for (const Point& point : scene) {
      given.tracks.push_back(hand(point));
      given.statuses.push_back(f == 0 ? 1 : 0);
    }
    for (int r = 0; r < clip.rows; ++r) {
      for (int c = 0; c < clip.columns; ++c) {
        const Point still = Inverse(hand)({399.0 * c / 4, 299.0 * r / 3});
        given.vertices.push_back({still.x + noise * even(random), still.y + noise * even(random)});
      }
    }
  }
  return clip;
}

const Candidate kBent{.name = "bent"};
const Candidate kUnbent{.name = "unbent", .warps = Warps::none};

// The best of these, in this order, and of the clip as it was filmed.
Choice Best(const SolvedClip& clip, const std::vector<Candidate>& candidates,
            const FollowSettings& settings = {}) {
  Chooser chooser(clip, settings);
  for (const Candidate& candidate : candidates) chooser.Consider(candidate, clip);
  if (settings.enlarged == 1) chooser.ConsiderAsFilmed();
  EXPECT_EQ(chooser.windows().size(), 90u);
  return chooser.choice();
}

TEST(ChooserTest, BendsAreKeptWhereTheyHelpAndLeftWhereTheyAreNoise) {
  const Choice good = Best(Filmed(0), {kUnbent, kBent});
  EXPECT_EQ(good.best().name, "bent");
  EXPECT_LT(good.best().outcome.after.mean, 0.05);
  EXPECT_LT(good.best().outcome.wobble_after, 0.01);
  const Choice bad = Best(Filmed(15), {kBent, kUnbent});
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
  GivenFrames& given = GivenFrames::In(still);
  for (int f = 1; f < still.frame_count; ++f) {  // a tripod's tracks under the shaking hand's warps
    std::copy_n(given.tracks.begin(), still.slots, given.tracks.begin() + f * still.slots);
  }
  const Choice choice = Best(still, {kBent});
  EXPECT_EQ(choice.best().name, "as filmed");
  EXPECT_NEAR(choice.best().outcome.width_kept, 1, 1e-9);
  EXPECT_EQ(choice.best().outcome.after.mean, 0);
  EXPECT_EQ(choice.best().outcome.window, Outcome::Window::none);
}

// A hand that turns the camera by 23 degrees to either side, of which a window goes along with 9:
// what warps undo of it shows some frames 1.4 times enlarged, 1.3 times at least. A window that
// keeps `rim` pixels off the edges of a frame that is not bent shows it 300 / (300 - 2 rim) times
// enlarged, where no neighbour fills more.
TEST(ChooserTest, TheZoomsLimitCountsBeforeAllThatIsCalmer) {
  const SolvedClip clip = Filmed(0, 1, 0.4);
  const Candidate unfilled{.name = "unfilled", .warps = Warps::none, .fills = false};
  struct Case {
    double limit, rim;  // 0: nothing is filled
    std::vector<Candidate> candidates;
    const char* taken;
  };
  for (const Case& c :
       {Case{1.5, 0, {kUnbent, kBent}, "bent"}, Case{1.2, 0, {kBent, kUnbent}, "unbent"},
        Case{1.2, 0, {kUnbent, kBent}, "unbent"}, Case{1.2, 0, {kBent}, "as filmed"},
        Case{1.2, 10, {kBent, kUnbent}, "unbent"},
        Case{1.05, 10, {kBent, kUnbent, unfilled}, "unfilled"},
        Case{1, 10, {kBent, kUnbent, unfilled}, "as filmed"}}) {
    FollowSettings settings;
    settings.most_zoom = c.limit;
    if (c.rim > 0) settings.filling = Filling{0, c.rim};
    const Choice choice = Best(clip, c.candidates, settings);
    EXPECT_EQ(choice.best().name, c.taken) << c.limit << ", " << c.rim;
    EXPECT_LE(choice.best().outcome.most_zoom, c.limit * 1.001) << c.taken;
    EXPECT_LT(choice.best().outcome.most_black, 0.001) << c.taken;
  }
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

// 9 % a second, and the same with warps that take it away again.
TEST(FollowWindowsTest, WhatTheCameraZoomsIsNoChangeOfZoom) {
  const SolvedClip clip = Filmed(0, 1.003);
  for (const Warps warps : {Warps::none, Warps::solved}) {
    const WarpedPlane plane(clip, warps);
    const PictureMotion motion = FindMotion(plane);
    FollowSettings settings;
    const auto most_change = [&](double speed) {
      settings.zoom_speed = speed;
      const ShownMotion shown = MotionShown(plane, motion, FollowWindows(plane, motion, settings));
      const auto [least, most] = std::minmax_element(shown.zooms.begin(), shown.zooms.end());
      return *most / *least;
    };
    EXPECT_LT(most_change(0), 1.002);
    EXPECT_GT(most_change(1000), 1.01);
  }
}

TEST(ChoiceTest, TellsWhatTheNextBestIsWorseAt) {
  const auto way = [](const char* name, double cost, double width, double shake, double tracks,
                      double wobble, double black = 0) {
    Candidate candidate{.name = name};
    candidate.cost = cost;
    candidate.outcome.width_kept = width;
    candidate.outcome.after.mean = shake;
    candidate.outcome.tracks_after = tracks;
    candidate.outcome.wobble_before = 0.3;
    candidate.outcome.wobble_after = wobble;
    candidate.outcome.most_black = black;
    candidate.holds = black == 0;
    return candidate;
  };
  const Candidate good = way("good", 2, 0.85, 1.2, 1, 0.2), far = way("far", 9, 0.5, 4, 4, 0.3),
                  mixed = way("mixed", 3.2, 0.79, 1.5, 0.7, 0.6),
                  same = way("same", 2.5, 0.8501, 1.201, 1, 0.25),
                  black = way("black", 1, 0.9, 1, 1, 0.2, 0.02);
  Candidate filmed = way("as filmed", 1, 1, 9, 9, 0.3), near = way("near", 1, 0.6, 1, 1, 0.2);
  filmed.follows = false;  // it is not weighed by its cost
  near.outcome.most_zoom = 1.625;
  near.holds = false;
  struct Case {
    std::vector<Candidate> candidates;
    std::size_t taken;
    std::string why;
  };
  for (const Case& c :
       {Case{{good}, 0, ""},
        Case{{far, good, mixed},
             1,
             "next comes mixed, 1.2 decibels behind: it keeps less of the width (79 % against "
             "85 %), its background shakes more (1.50 against 1.20), it wobbles more (0.60 against "
             "0.30); but its tracks shake less (0.70 against 1.00)"},
        Case{{good, same, mixed}, 0, "next comes same, 0.5 decibels behind"},
        Case{{good, filmed}, 0, ""}, Case{{good, filmed, mixed}, 1, ""},
        Case{{black, good}, 1, "next comes black, which leaves 2.0 % of a frame black"},
        Case{{near, good}, 1, "next comes near, which enlarges 1.62 times"},
        Case{{good, far, black},
             0,
             "next comes far, 7.0 decibels behind: it keeps less of the width (50 % against 85 %), "
             "its background shakes more (4.00 against 1.20), its tracks shake more (4.00 against "
             "1.00)"}}) {
    Choice choice;
    choice.candidates = c.candidates;
    choice.taken = c.taken;
    EXPECT_EQ(choice.Why(), c.why);
  }
}

TEST(ChooserTest, ATextBringsTheChoiceBack) {
  const SolvedClip clip = Filmed(15);
  Chooser first(clip, {.zoom_speed = 2.5});
  first.Consider(kBent, clip);
  first.Consider(
      {.name = "calmer", .changes = {{20, 80}, {281, 0}}, .warps = Warps::none, .fills = false},
      clip);
  const std::string text = first.choice().Json().dump();
  const std::optional<Choice> read = Choice::Parse(text);
  ASSERT_TRUE(read);
  EXPECT_EQ(read->taken, 1u);
  EXPECT_EQ(read->zoom_speed, 2.5);
  EXPECT_EQ(read->best().changes, (ParamValues{{20, 80}, {281, 0}}));
  EXPECT_FALSE(read->best().fills);
  EXPECT_EQ(read->Json().dump(), text);
  Chooser again(clip, {.zoom_speed = 2.5});
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
