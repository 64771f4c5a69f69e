#include "synthetic/track_world.h"

#include <gtest/gtest.h>

#include <cmath>
#include <stdexcept>

namespace synthetic {
namespace {

using marrow::tracking::BuildTrajectories;
using marrow::tracking::Trajectory;

const auto& cell_of(const track_world& world, int frame, int slot) {
  return (*world.features.features)[world.cell(frame, slot)];
}

std::vector<Trajectory> trajectories_of(const track_world& world) {
  return BuildTrajectories(world.features.features->data(), world.features.feature_count,
                           world.features.frame_count);
}

void ExpectWellFormed(const track_world& world) {
  for (int s = 0; s < world.features.feature_count; ++s) {
    bool live = false;
    for (int f = 0; f < world.features.frame_count; ++f) {
      const auto& cell = cell_of(world, f, s);
      const point2 exact = world.exact[world.cell(f, s)];
      if (cell.status > 0) {
        ASSERT_EQ(cell.status, f + 1);
        live = true;
      } else if (cell.status == 0) {
        ASSERT_TRUE(live) << "frame " << f << " slot " << s << " goes on from nothing";
      } else {
        ASSERT_EQ(cell.status, -1);
        live = false;
      }
      ASSERT_EQ(std::isnan(exact.x), !live);
    }
  }
}

TEST(TrackWorldTest, EveryKindOfSceneIsWellFormedAndRepeatable) {
  for (const track_scene scene : {track_scene::depth, track_scene::planar, track_scene::translation,
                                  track_scene::similarity, track_scene::still}) {
    SCOPED_TRACE(static_cast<int>(scene));
    const track_world_options options = {.frame_count = 80,
                                         .slots = 60,
                                         .scene = scene,
                                         .mean_life = 20,
                                         .outlier_share = 0.2,
                                         .occluder = true,
                                         .hole = {30, 42},
                                         .readout = 0.7,
                                         .seed = 9};
    const track_world world = make_track_world(options);
    ExpectWellFormed(world);
    for (int f = 0; f < 80; ++f) {
      ASSERT_EQ(cell_of(world, f, 0).status == -1, f >= 30 && f < 42) << f;
    }
    const track_world again = make_track_world(options);
    for (std::size_t i = 0; i < world.exact.size(); ++i) {
      ASSERT_EQ((*world.features.features)[i].x, (*again.features.features)[i].x);
    }
    ASSERT_EQ(world.global->input.size(), 80u * 60u);
    EXPECT_EQ(world.global->input_at(50, 7).x, cell_of(world, 50, 7).x);
    EXPECT_EQ(world.global->input_at(50, 7).status, cell_of(world, 50, 7).status);
    EXPECT_EQ(world.global->output_at(50, 7).status, -1);
  }
}

TEST(TrackWorldTest, NoiseHasItsDeviationAndOutliersDrift) {
  const track_world world = make_track_world(
      {.frame_count = 100, .slots = 200, .mean_life = 40, .noise = 0.1, .outlier_share = 0.25});
  double square = 0, outliers = 0;
  int count = 0;
  const auto tracks = trajectories_of(world);
  for (const Trajectory& t : tracks) {
    const bool outlier = world.outlier[world.cell(t.first, t.feature)] != 0;
    outliers += outlier;
    for (int f = t.first; f < t.last; ++f) {
      const point2 exact = world.exact[world.cell(f, t.feature)];
      const auto& cell = cell_of(world, f, t.feature);
      const double dx = cell.x - exact.x, dy = cell.y - exact.y;
      if (outlier) {
        const double drift = std::hypot(dx, dy);
        ASSERT_GT(drift + 0.7, 0.5 * (f - t.first));
        ASSERT_LT(drift - 0.7, 3.0 * (f - t.first));
      } else {
        square += 0.5 * (dx * dx + dy * dy);
        ++count;
      }
    }
  }
  EXPECT_NEAR(std::sqrt(square / count), 0.1, 0.003);
  EXPECT_NEAR(outliers / tracks.size(), 0.25, 0.06);
}

TEST(TrackWorldTest, WholeClipTracksSpanTheClip) {
  const track_world world = make_track_world(
      {.frame_count = 200, .slots = 50, .gain = 0.1, .whole_clip = true, .noise = 0});
  const auto tracks = trajectories_of(world);
  ASSERT_EQ(tracks.size(), 50u);
  for (const Trajectory& t : tracks) {
    EXPECT_EQ(t.last, 200);
    const std::size_t first = world.cell(0, t.feature);
    EXPECT_EQ(world.exact[first].x, world.intended[first].x) << "no jitter on frame 0";
    EXPECT_EQ(cell_of(world, 0, t.feature).x, static_cast<float>(world.exact[first].x));
  }
  EXPECT_THROW(make_track_world({.frame_count = 600, .slots = 1, .gain = 20, .whole_clip = true}),
               std::runtime_error);
  EXPECT_THROW(make_track_world({.width = 35}), std::invalid_argument);
}

// With X = (x - cx) / f, Y likewise, rotations about the three axes shift x by f X Y, f (1 + X^2)
// and f Y each: for pixels evenly over the frame and 2e-3 rad that is 3 px sqrt(1.3066 + .0059 +
// .0432).
TEST(TrackWorldTest, JitterMovesThePictureByTheFocalLength) {
  const track_world world = make_track_world(
      {.frame_count = 300, .slots = 60, .gain = 0.1, .translation_jitter = 0, .noise = 0});
  double square = 0;
  for (std::size_t i = 0; i < world.exact.size(); ++i) {
    square += std::pow(world.exact[i].x - world.intended[i].x, 2) / world.exact.size();
  }
  EXPECT_NEAR(std::sqrt(square), 3.49, 0.2);
}

TEST(TrackWorldTest, SimilarityScenesMoveBySimilarities) {
  const track_world world = make_track_world({.frame_count = 50,
                                              .slots = 3,
                                              .scene = track_scene::similarity,
                                              .gain = 0.3,
                                              .whole_clip = true});
  const auto side = [&](int frame, int a, int b) {
    const point2 p = world.exact[world.cell(frame, a)], q = world.exact[world.cell(frame, b)];
    return std::hypot(p.x - q.x, p.y - q.y);
  };
  for (int f = 1; f < 50; ++f) {
    const double scale = side(f, 0, 1) / side(0, 0, 1);
    EXPECT_NE(scale, 1.0);
    EXPECT_NEAR(side(f, 1, 2) / side(0, 1, 2), scale, 1e-9);
    EXPECT_NEAR(side(f, 0, 2) / side(0, 0, 2), scale, 1e-9);
  }
}

// With a readout of a whole frame, a row at the bottom of frame f shows what the top row of f + 1
// shows: the picture's shift at row y of frame f is the one of time f + y / (height - 1).
TEST(TrackWorldTest, RowsAreSeenAtTheirTime) {
  const track_world_options rolling = {.frame_count = 40,
                                       .slots = 20,
                                       .scene = track_scene::translation,
                                       .rotation_jitter = 1e-2,
                                       .whole_clip = true,
                                       .readout = 1.0,
                                       .seed = 3};
  const track_world world = make_track_world(rolling);
  const camera_path path = jittered_path(40, {.rotation_jitter = 1e-2, .seed = 3});
  for (int s = 0; s < 20; ++s) {
    const point2 a = world.exact[world.cell(4, s)], b = world.exact[world.cell(31, s)];
    const camera_pose pose_a = path.shaken(4 + a.y / 1079), pose_b = path.shaken(31 + b.y / 1079);
    EXPECT_NEAR(b.x - a.x, 1500 * (pose_b.rotation[1] - pose_a.rotation[1]), 1e-6);
    EXPECT_NEAR(b.y - a.y, 1500 * (pose_b.rotation[0] - pose_a.rotation[0]), 1e-6);
  }
}

TEST(TrackWorldTest, NoTrackLivesUnderTheOccluder) {
  const track_world world = make_track_world(
      {.frame_count = 100, .slots = 100, .mean_life = 1e9, .noise = 0, .occluder = true});
  int ended = 0;
  for (const Trajectory& t : trajectories_of(world)) ended += t.last < 100;
  EXPECT_GT(ended, 50);
  // Half-way through, the bar covers the middle of the frame.
  for (int s = 0; s < 100; ++s) {
    EXPECT_GT(std::abs(world.exact[world.cell(50, s)].x - 960), 0.07 * 1920);
  }
}

}  // namespace
}  // namespace synthetic
