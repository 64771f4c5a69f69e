#include "host/stabilize/steady_clip.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <nlohmann/json.hpp>
#include <set>
#include <string>
#include <vector>

#include "host/stabilize/drawing.h"
#include "host/stabilize/failures.h"
#include "host/stabilize/film.h"
#include "platform/hx/hx_controls.h"
#include "tests/support/drawn_clip.h"
#include "tests/support/given_frames.h"
#include "tests/support/scratch_folder.h"

namespace calmframe::host {
namespace {

using Texts = std::vector<std::string>;

// Stops the work as soon as it has come to a stage.
class Onlooker final : public Watcher {
 public:
  explicit Onlooker(std::string last_stage = "") : last_stage_(std::move(last_stage)) {}
  void Show(const Progress& progress) override {
    if (stages.empty() || stages.back() != progress.stage) stages.push_back(progress.stage);
  }
  void Warn(const std::string& line) override { ADD_FAILURE() << line; }
  bool Stops() override { return !stages.empty() && stages.back() == last_stage_; }

  Texts stages;

 private:
  const std::string last_stage_;
};

double MostZoom(const ShownPath& path) {
  return *std::max_element(path.output.zooms.begin(), path.output.zooms.end());
}

// Mean over all bytes.
double DifferenceOf(const WorldBuffer& one, const WorldBuffer& other) {
  double sum = 0;
  const int bytes = 4 * one.world().width;
  for (int y = 0; y < one.world().height; ++y) {
    for (int i = 0; i < bytes; ++i) {
      sum += std::abs(one.row<std::uint8_t>(y)[i] - other.row<std::uint8_t>(y)[i]);
    }
  }
  return sum / bytes / one.world().height;
}

class SteadyClipTest : public testing::Test {
 protected:
  SteadyClipTest() { WriteStreet(path_, Made(160, 120, 24, 25), 7); }

  const ScratchFolder folder_;
  const std::string path_ = folder_.In("street.mkv");
};

TEST_F(SteadyClipTest, FromAClipToWhatItShowsAndBack) {
  Onlooker onlooker;
  Project saved;
  {
    Film film(CALMFRAME_PLUGIN, path_);
    SteadyClip& clip = *film.Next();
    clip.SetControls({{HX_SMOOTHNESS.disk_id, 80}});
    EXPECT_EQ(clip.Work(onlooker).Text(), "");
    EXPECT_EQ(onlooker.stages, (Texts{"analyzing", "solving"}));
    film.Keep();
    saved = film.Saved();
    const Outcome own = clip.Measure();
    EXPECT_EQ(own.window, Outcome::Window::steady);
    EXPECT_LT(own.after.mean, own.before.mean / 2);
    EXPECT_NEAR(MostZoom(clip.Path()), own.most_zoom, 1e-9);
    clip.FollowPicture({.most_zoom = 1.2}, onlooker);
    const Outcome following = clip.Measure();
    EXPECT_EQ(following.window, Outcome::Window::follow);
    EXPECT_LT(following.after.mean, following.before.mean / 2);
    EXPECT_LE(following.most_zoom, 1.2 + 1e-3);
    EXPECT_NEAR(MostZoom(clip.Path()), following.most_zoom, 1e-9);
    EXPECT_EQ(clip.Path().most_zoom, 1.2);
    // The picture again without its windows, with all tracks, and by other controls.
    clip.ForgetChoice();
    clip.SetControls({{HX_SMOOTHNESS.disk_id, 10}});
    EXPECT_EQ(clip.Work(onlooker).Text(), "reused the analysis");
    EXPECT_EQ(clip.Measure().window, Outcome::Window::steady);
    EXPECT_GT(clip.Measure().after.mean, own.after.mean);
  }
  Film film(CALMFRAME_PLUGIN, saved, path_);
  SteadyClip& again = *film.Next();
  EXPECT_EQ(again.Work(onlooker).Text(), "reused the analysis, the solve and the framing");
  EXPECT_EQ(again.ValueOf(HX_SMOOTHNESS.disk_id), 80);
}

TEST_F(SteadyClipTest, AChoiceIsMadeOnceAndGoesWithTheControlsItWasMadeFor) {
  Onlooker onlooker, later;
  Project saved;
  std::string chosen;
  {
    Film film(CALMFRAME_PLUGIN, path_);
    SteadyClip& clip = *film.Next();
    clip.Work(onlooker);
    clip.FollowPicture({}, onlooker);
    EXPECT_EQ(onlooker.stages.back(), "choosing");
    chosen = clip.choice()->Json().dump();
    EXPECT_EQ(clip.choice()->candidates[0].name, "as set");
    EXPECT_GE(clip.choice()->candidates.size(), 3u);
    film.Keep();
    saved = film.Saved();
    EXPECT_EQ(saved.shots.at(0).choice, chosen);
  }
  {
    Film film(CALMFRAME_PLUGIN, saved, path_);
    SteadyClip& again = *film.Next();
    again.Work(later);
    again.FollowPicture({}, later);
    EXPECT_EQ(later.stages, Texts{}) << "nothing is solved or chosen";
    EXPECT_EQ(again.choice()->Json().dump(), chosen);
    again.FollowPicture({.most_zoom = 1.1}, later);
    EXPECT_EQ(later.stages.back(), "choosing") << "of another request";
    EXPECT_LE(again.Measure().most_zoom, 1.1 + 1e-3);
    again.FollowPicture({.most_zoom = 1.1, .zoom_speed = 0}, later);
    EXPECT_EQ(again.choice()->zoom_speed, 0) << "of another request, too";
  }
  // As if Smoothness had been chosen: who sets another control has it back as it was given.
  auto made = nlohmann::json::parse(chosen);
  made["given"]["20"] = 50;
  for (auto& candidate : made["candidates"]) candidate["changes"]["20"] = 80;
  saved.shots[0].effect.values[HX_SMOOTHNESS.disk_id] = 80;
  saved.shots[0].choice = made.dump();
  {
    Film film(CALMFRAME_PLUGIN, saved, path_);
    SteadyClip& again = *film.Next();
    again.Work(later);
    again.FollowPicture({.zoom_speed = 0}, later);
    EXPECT_NE(again.ValueOf(HX_SMOOTHNESS.disk_id), 80) << "as does another request";
  }
  Film film(CALMFRAME_PLUGIN, saved, path_);
  SteadyClip& clip = *film.Next();
  clip.SetControls({{HX_METHOD.disk_id, 2}});
  EXPECT_EQ(clip.ValueOf(HX_SMOOTHNESS.disk_id), 50);
  EXPECT_EQ(clip.choice(), nullptr);
  clip.Work(later);
  clip.FollowPicture({}, later);
  for (const Candidate& candidate : clip.choice()->candidates) {
    EXPECT_EQ(candidate.changes.count(HX_METHOD.disk_id), 0u) << "set is set: " << candidate.name;
  }
}

TEST_F(SteadyClipTest, WhatWasFoundBeforeGivesTheSame) {
  Onlooker onlooker;
  const auto follow = [&](SteadyClip& clip, const ParamValues& values) {
    clip.SetControls(values);
    clip.Work(onlooker);
    clip.FollowPicture({.may_choose = false}, onlooker);
  };
  const auto draw = [](SteadyClip& clip) {
    const auto renderer = clip.drawn().MakeRenderer();
    return DrawFrame(*renderer, 12, 8, media::FieldOrder::progressive).pixels;
  };
  Film film(CALMFRAME_PLUGIN, path_);
  SteadyClip& kept = *film.Next();
  kept.KeepWhatIsFound();
  follow(kept, {});
  film.Keep();
  const Project saved = film.Saved();
  for (const ParamValues& values :
       {ParamValues{{HX_ADDITIONAL_SCALE.disk_id, 130}},
        ParamValues{{HX_MAXIMUM_SCALE.disk_id, 110}}, ParamValues{{HX_SMOOTHNESS.disk_id, 10}},
        ParamValues{{HX_FRAMING.disk_id, 4}},
        ParamValues{{HX_SYNTHESIS_EDGE_FEATHER.disk_id, 30}}}) {
    const auto before = draw(kept);
    const bool previews = kept.Preview(values);
    const auto preview = draw(kept);
    follow(kept, values);
    Film anew(CALMFRAME_PLUGIN, saved, path_);
    SteadyClip& fresh = *anew.Next();
    fresh.SetControls(kept.Saved().effect.values);
    follow(fresh, {});
    const std::int32_t id = values.begin()->first;
    EXPECT_EQ(kept.choice()->Json(), fresh.choice()->Json()) << id;
    const auto after = draw(kept);
    EXPECT_EQ(DifferenceOf(*after, *draw(fresh)), 0) << id;
    EXPECT_EQ(previews,
              id == HX_ADDITIONAL_SCALE.disk_id || id == HX_SYNTHESIS_EDGE_FEATHER.disk_id);
    if (!previews) {
      EXPECT_EQ(DifferenceOf(*before, *preview), 0) << id;
    }
    if (id == HX_ADDITIONAL_SCALE.disk_id) {
      EXPECT_LT(DifferenceOf(*after, *preview), DifferenceOf(*after, *before) / 10);
    }
  }
}

TEST_F(SteadyClipTest, TracksThatAPersonDeletesStayOutUntilTheyAreBack) {
  Onlooker onlooker;
  const auto count = [](const SolvedClip& clip) {
    const std::vector<std::int32_t> statuses = GivenFrames::Of(clip).statuses;
    return std::count_if(statuses.begin(), statuses.end(),
                         [](std::int32_t status) { return status > 0; });
  };
  Film film(CALMFRAME_PLUGIN, path_);
  SteadyClip& clip = *film.Next();
  clip.Work(onlooker);
  const SolvedClip all = clip.Solved();
  std::set<TrackPoint> some;
  for (std::int32_t slot = 0; slot < all.slots && some.size() < 5; ++slot) {
    if (all.TracksOf(0).statuses[static_cast<std::size_t>(slot)] > 0) some.insert({0, slot});
  }
  ASSERT_EQ(some.size(), 5u);
  clip.DeleteTracks(some);
  EXPECT_EQ(clip.Work(onlooker).Text(), "reused the analysis");
  EXPECT_EQ(count(clip.Solved()), count(all) - 5);
  clip.HoldStill(Still::all, onlooker);
  EXPECT_EQ(count(clip.Solved()), count(all) - 5) << "no group is left out, and these are";
  film.Keep();
  const Project saved = film.Saved();
  Film later(CALMFRAME_PLUGIN, saved, path_);
  SteadyClip& again = *later.Next();
  EXPECT_EQ(again.DeletedTracks(), some);
  again.DeleteTracks(some);
  EXPECT_TRUE(again.Work(onlooker).solve);
  again.DeleteTracks({});
  again.Work(onlooker);
  EXPECT_EQ(GivenFrames::Of(again.Solved()).vertices, GivenFrames::Of(all).vertices);
}

TEST_F(SteadyClipTest, TracksThatAPersonDeletesStayApartFromAGroupThatIsLeftOut) {
  // Somebody stands in the middle and sways, before a wall that a hand shakes.
  const std::string path = folder_.In("subject.mkv");
  constexpr int across = 320, down = 180;
  const auto noise = [](double x, double y) {
    const double value = std::sin(0.31 * x + 1.3 * std::sin(0.17 * y)) * std::sin(0.37 * y) +
                         std::sin(0.23 * y - 0.29 * x) * std::sin(0.53 * x + 0.11 * y);
    return static_cast<std::uint8_t>(std::clamp(127.5 + 60 * value, 0.0, 255.0));
  };
  WriteClip(path, Made(across, down, 24, 25), [&](int frame, HX_Pixel8* pixels) {
    const double t = frame;
    const double hand_x = 1.5 * t + 5 * std::sin(2.1 * t), hand_y = 4 * std::sin(1.7 * t + 1);
    const double sway_x = 6 * std::sin(1.1 * t + 0.5), sway_y = 3 * std::sin(0.8 * t);
    for (int y = 0; y < down; ++y) {
      for (int x = 0; x < across; ++x) {
        const bool near = std::abs(x - across / 2.0 - sway_x) < 64 && y > 45 + sway_y;
        const std::uint8_t value =
            near ? noise(x - sway_x + 5000, y - sway_y) : noise(x + hand_x, y + hand_y);
        pixels[y * across + x] = {255, value, value, value};
      }
    }
  });
  Onlooker onlooker;
  const auto left_out = [](SteadyClip& clip) {
    std::set<TrackPoint> points;
    const SolvedClip solved = clip.Solved();
    for (std::int32_t row = 0; row < solved.frame_count; ++row) {
      const TrackRow tracks = solved.TracksOf(static_cast<std::size_t>(row));
      for (std::int32_t slot = 0; slot < solved.slots; ++slot) {
        if (tracks.statuses[static_cast<std::size_t>(slot)] == kDeletedTrackBegins) {
          points.insert({solved.first_frame + row, slot});
        }
      }
    }
    return points;
  };
  for (const bool follows : {false, true}) {
    const auto hold = [&](SteadyClip& clip, Still still) {
      if (follows) return clip.FollowPicture({.may_choose = false, .still = still}, onlooker);
      if (clip.ForgetChoice()) clip.Work(onlooker);
      clip.HoldStill(still, onlooker);
    };
    Film film(CALMFRAME_PLUGIN, path);
    SteadyClip& clip = *film.Next();
    clip.Work(onlooker);
    hold(clip, Still::background);
    const std::set<TrackPoint> group = left_out(clip);
    ASSERT_GT(group.size(), 5u);
    // One that the group has, and some that it hasn't.
    std::set<TrackPoint> deleted = {*group.begin()};
    const TrackRow first = clip.Solved().TracksOf(0);
    for (std::int32_t slot = 0; deleted.size() < 4; ++slot) {
      if (first.statuses.at(static_cast<std::size_t>(slot)) > 0) deleted.insert({0, slot});
    }
    std::set<TrackPoint> both = group;
    both.insert(deleted.begin(), deleted.end());
    ASSERT_EQ(both.size(), group.size() + 3);
    clip.DeleteTracks(deleted);
    clip.Work(onlooker);
    hold(clip, Still::background);
    EXPECT_EQ(left_out(clip), both) << follows;
    film.Keep();
    const Project saved = film.Saved();

    Film later(CALMFRAME_PLUGIN, saved, path);
    SteadyClip& again = *later.Next();
    EXPECT_TRUE(again.Work(onlooker).solve);
    EXPECT_EQ(again.DeletedTracks(), deleted) << follows;
    hold(again, Still::background);
    EXPECT_EQ(left_out(again), both) << "drawn as it was shown: " << follows;
    EXPECT_EQ(GivenFrames::Of(again.Solved()).vertices, GivenFrames::Of(clip.Solved()).vertices)
        << follows;
    hold(again, Still::all);
    EXPECT_EQ(left_out(again), deleted) << "the group is back alone: " << follows;
    again.DeleteTracks({});
    again.Work(onlooker);
    hold(again, Still::background);
    EXPECT_EQ(left_out(again), group) << "they are back alone: " << follows;
  }
}

TEST_F(SteadyClipTest, StoppedWorkGoesOnToTheSameEnd) {
  std::vector<Point> expected;
  for (const char* stage : {"", "analyzing", "solving"}) {
    Film film(CALMFRAME_PLUGIN, path_);
    SteadyClip& clip = *film.Next();
    Onlooker hasty(stage), patient;
    if (*stage) {
      EXPECT_THROW(clip.Work(hasty), Interrupted) << stage;
    }
    clip.Work(patient);
    const SolvedClip solved = clip.Solved();
    EXPECT_TRUE(solved.crop) << stage;
    const std::vector<Point> vertices = GivenFrames::Of(solved).vertices;
    if (expected.empty()) expected = vertices;
    EXPECT_TRUE(vertices == expected) << stage;
  }
}

}  // namespace
}  // namespace calmframe::host
