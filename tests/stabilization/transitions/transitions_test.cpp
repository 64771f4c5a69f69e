#include "stabilization/transitions/transitions.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <utility>
#include <vector>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

// Tracks of plane points under a shaky camera.
struct scene {
  stabilizer_global global;
  std::vector<transition_record> records = {};
  SolverParamsRecord parameters = {};

  scene(int frames, const std::vector<lives>& tracks) : global(shaken_clip(frames, tracks)) {}

  int slots() const { return static_cast<int>(global.feature_count); }
  int frames() const { return static_cast<int>(global.frame_count); }

  void transition(int first, int end, bool translation_only = false) {
    transition_window(global, first, end, parameters, kWidth, kHeight, translation_only, records,
                      kNoProgress);
    expect_records_agree_with_output();
  }
  void lockdown(int first, int end, const similarity& target = {}) {
    lockdown_window(global, first, end, parameters, target, records, kNoProgress);
    expect_records_agree_with_output();
  }

  // Every live output sample is its record's map of the input sample.
  void expect_records_agree_with_output() const {
    for (const transition_record& r : records) {
      for (std::uint64_t f = r.first; f < r.end; ++f) {
        const double* m = &r.motion[4 * (f - r.first)];
        for (std::size_t s = 0; s < global.feature_count; ++s) {
          const track_sample& out = global.output_at(f, s);
          if (out.status < 0) continue;
          const point2 p =
              transform(similarity{m[0], m[1], m[2], m[3]}, position(global.input_at(f, s)));
          expect_point_near(position(out), p, 1e-3);
        }
      }
    }
  }
};

// The sum of squares that a transition over [first, end of the clip), without overlap, minimises
// for tracks that all span the clip. New: flanks of 30 frames, of which the one at the clip's start
// is open, give a sample 15 at most. Old: 1, but 10 on the last frame.
double plain_cost(const scene& s, const std::vector<double>& motion, int first) {
  const int frames = s.frames() - first;
  const bool use_new = s.parameters.use_new_solver;
  const auto moved = [&](int f, int i) {
    const double* m = &motion[4 * f];
    return transform(similarity{m[0], m[1], m[2], m[3]}, position(s.global.input_at(first + f, i)));
  };
  double sum = 0;
  for (int i = 0; i < s.slots(); ++i) {
    for (int f = 0; f < frames; ++f) {
      const double fade = first == 0 ? 15 : std::min(f + 1, 15);
      const double wd = use_new ? fade : f + 1 < frames ? 1 : 10;
      const double ws = use_new ? fade * s.parameters.transition_stab_lambda / motion[4 * f]
                                : s.parameters.smoothness_lambda;
      const point2 o = position(s.global.input_at(first + f, i)), t = moved(f, i);
      sum += wd * wd * (std::pow(t.x - o.x, 2) + std::pow(t.y - o.y, 2));
      if (f == 0 || f + 1 == frames) continue;
      const point2 a = moved(f - 1, i), b = moved(f + 1, i);
      sum += ws * ws * (std::pow(a.x + b.x - 2 * t.x, 2) + std::pow(a.y + b.y - 2 * t.y, 2));
    }
  }
  return sum;
}

TEST(TransitionWindow, ShakyTracksComeToAMinimumOfTheCost) {
  for (const auto& [first, use_new] : {std::pair(0, true), {20, true}, {0, false}}) {
    scene s(first + 30, {{60, 0, first + 30}});
    s.parameters.use_new_solver = use_new;
    s.parameters.transition_tail_overlap = 0;
    s.transition(first, s.frames());
    ASSERT_EQ(s.records.size(), 1u);
    for (int i = 0; i < 30 * 60; ++i) {
      EXPECT_EQ(s.global.output[first * 60 + i].status, i < 60);
    }

    // A frame's four numbers by themselves, about a tenth of a pixel each; then all frames together
    // along and across, shifted and at a slant.
    const std::vector<double> solved = s.records[0].motion;
    const double least = plain_cost(s, solved, first);
    for (std::size_t k = 0; k < solved.size() + 4; ++k) {
      for (const double sign : {1.0, -1.0}) {
        std::vector<double> moved = solved;
        if (k < solved.size()) moved[k] += sign * (k % 4 < 2 ? 1e-4 : 0.1);
        for (std::size_t f = 0; k >= solved.size() && f < 30; ++f) {
          moved[4 * f + 2 + k % 2] += sign * 0.01 * (k % 4 < 2 ? 1.0 : f / 30.0);
        }
        EXPECT_GT(plain_cost(s, moved, first), least) << k << ", from " << first;
      }
    }
  }
}

// Stretches of a clip, each solved where tracks hold it and the identity where none do.
TEST(TransitionWindow, RecordsCoverTheStretch) {
  using clip = std::vector<lives>;
  const clip whole = {{12, 0, 130}}, hole = {{8, 0, 25}, {8, 35, 60}},
             long_hole = {{8, 5, 40}, {8, 90, 120}}, rest = {{12, 0, 81}};
  // Two tracks of two frames: eight residuals for eight unknowns would do, but not with ten frames
  // of overlap behind a hole.
  const clip brief = {{2, 0, 2}}, brief_behind = {{2, 30, 32}, {8, 40, 60}};
  const struct {
    const char* situation;
    int frames, max_duration, first;
    clip tracks;
    bool old_too;
    const char* records;
  } cases[] = {
      {"no frames", 10, 200, 10, {{4, 0, 10}}, true, ""},
      {"no tracks", 12, 200, 0, {{12, 0, 0}}, true, "unsolved 0 12;"},
      {"one track", 12, 200, 0, {{1, 0, 12}}, false, "unsolved 0 12;"},
      {"a hole", 60, 200, 0, hole, true, "solved 0 25;unsolved 25 35;solved 35 60;"},
      {"a hole longer than a chunk ends it", 120, 20, 0, long_hole, false,
       "unsolved 0 5;solved 5 20;solved 20 40;unsolved 40 120;"},
      {"chunks", 130, 40, 0, whole, true, "solved 0 40;solved 40 80;solved 80 120;solved 120 130;"},
      {"a rest of one frame", 81, 40, 0, rest, true, "solved 0 40;solved 40 81;"},
      {"chunks of one frame", 10, 1, 0, {{6, 0, 10}}, false, "unsolved 0 10;"},
      {"less than none", 10, -5, 0, {{6, 0, 10}}, false, "unsolved 0 10;"},
      {"just enough residuals", 10, 200, 0, brief, false, "solved 0 2;unsolved 2 10;"},
      {"too few residuals", 60, 200, 20, brief_behind, false,
       "unsolved 20 30;unsolved 30 32;unsolved 32 40;solved 40 60;"}};
  for (const auto& e : cases) {
    for (int use_new = !e.old_too; use_new < 2; ++use_new) {
      SCOPED_TRACE(e.situation);
      scene s(e.frames, e.tracks);
      s.parameters.use_new_solver = use_new;
      s.parameters.transition_max_duration = e.max_duration;
      s.transition(e.first, e.frames);
      EXPECT_EQ(spans_of(s.records), e.records);
      expect_unsolved_untouched(s.global, s.records);
    }
  }
}

// The largest second difference along x, in pixels, of six swaying dots' stabilized paths over a
// transition that goes from `first` to the clip's end in chunks.
double bend_of_chunks(int first, int max_duration) {
  scene s(120, {{6, 0, 120}});
  for (int i = 0; i < 6 * 120; ++i) {
    s.global.input[i].x = static_cast<float>(scattered(i % 6).x + 60 * std::sin(0.5 * (i / 6)));
    s.global.input[i].y = static_cast<float>(scattered(i % 6).y + 40 * std::cos(0.4 * (i / 6)));
  }
  s.parameters.transition_max_duration = max_duration;
  s.transition(first, 120);
  float largest = 0;
  for (int i = 6 * (first + 1); i < 6 * 119; ++i) {
    const track_sample* at = &s.global.output[i];
    largest = std::max(largest, std::fabs(at[-6].x - 2 * at->x + at[6].x));
  }
  return largest;
}

// As tracks turn by up to 15 pixels a frame, chunks that don't know of each other part by 11.
TEST(TransitionWindow, ChunksJoinEachOther) {
  for (const int first : {0, 2}) {
    EXPECT_LT(bend_of_chunks(first, 40), 2) << first;
    EXPECT_LT(bend_of_chunks(first, 200), 0.2) << first;
  }
}

// The largest step along x from frame 19 to the transition behind it. The frames before 20 hold
// solved positions, standing 50 pixels from the input's first ones; `broken`: every track begins
// anew on frame 15.
double step_behind_solved(bool use_new, bool broken) {
  scene s(50, {{20, 0, 50}});
  s.parameters.use_new_solver = use_new;
  for (int i = 0; i < 20 * 20; ++i) {
    const track_sample& first = s.global.input[i % 20];
    const bool starts = i / 20 == 0 || (broken && i / 20 == 15);
    s.global.output[i] = {first.x + 50, first.y, starts, 0.25f};
  }
  s.transition(20, 50);
  EXPECT_EQ(spans_of(s.records), "solved 20 50;");
  float largest = 0;
  for (int i = 0; i < 20; ++i) {
    const float before = s.global.output_at(19, i).x;
    EXPECT_EQ(before, s.global.input_at(0, i).x + 50);
    largest = std::max(largest, std::fabs(s.global.output_at(20, i).x - before));
  }
  return largest;
}

// A break inside the overlap: no track reaches back, and the path starts afresh.
TEST(TransitionWindow, PathJoinsTheSolvedFramesBefore) {
  EXPECT_LT(step_behind_solved(true, false), 0.3 * step_behind_solved(true, true));
  EXPECT_LT(step_behind_solved(false, false), 10);
}

// A shift is what the frame's motion does to the middle, (959.5, 539.5).
TEST(TransitionWindow, TranslationOnlyHoldsInRecordsAndOutput) {
  for (const bool use_new : {true, false}) {
    scene whole(40, {{20, 0, 40}}), s = whole;
    whole.parameters.use_new_solver = s.parameters.use_new_solver = use_new;
    whole.transition(0, 40);
    s.transition(0, 40, true);
    ASSERT_EQ(s.records.size(), 1u);
    double turn = 0;
    for (int f = 0; f < 40; ++f) {
      const double *m = &s.records[0].motion[4 * f], *w = &whole.records[0].motion[4 * f];
      EXPECT_EQ(m[0], 1.0);
      EXPECT_EQ(m[1], 0.0);
      expect_point_near({959.5 + m[2], 539.5 + m[3]},
                        transform(similarity{w[0], w[1], w[2], w[3]}, {959.5, 539.5}), 1e-6);
      turn = std::max(turn, std::fabs(w[1]));
    }
    EXPECT_GT(turn, 1e-3);
  }
}

// The motion of ten frames of 40 tracks, of which one jumps by `jump` pixels on the last frame.
std::vector<double> motion_with_jump(double jump, double sigma) {
  scene s(10, {{40, 0, 10}});
  s.global.input[9 * 40 + 7].x += static_cast<float>(jump);
  s.parameters.transition_bisquare_sigma = sigma;
  s.transition(0, 10);
  EXPECT_EQ(spans_of(s.records), "solved 0 10;");
  return s.records[0].motion;
}

// Behind frames without tracks, and where only three of nine tracks live.
TEST(TransitionWindow, FewTracksNeitherTurnNorResizeAFrameWhereSigmaIsSet) {
  for (const double sigma : {kTrustAllTracks, 4.0}) {
    scene s(60, {{3, 30, 60}, {6, 30, 50}});
    s.parameters.transition_bisquare_sigma = sigma;
    s.transition(20, 60);
    EXPECT_EQ(spans_of(s.records), "unsolved 20 30;solved 30 60;");
    const auto is = [&](int f, std::vector<double> numbers) {
      return std::equal(numbers.begin(), numbers.end(), &s.records[1].motion[4 * (f - 30)]);
    };
    EXPECT_EQ(is(30, {1, 0, 0, 0}), sigma == 4);
    EXPECT_FALSE(is(31, {1, 0}));
    EXPECT_FALSE(is(49, {1, 0}));
    for (int f = 50; f < 60; ++f) EXPECT_EQ(is(f, {1, 0}), sigma == 4) << f;
  }
}

// How far two motions differ at most: at a distance of 500 pixels about the origin.
double apart(const std::vector<double>& a, const std::vector<double>& b) {
  double largest = 0;
  for (std::size_t k = 0; k < a.size(); ++k) {
    largest = std::max(largest, std::fabs(a[k] - b[k]) * (k % 4 < 2 ? 500 : 1));
  }
  return largest;
}

TEST(TransitionWindow, TracksThatJumpCountLessWhereSigmaIsSet) {
  const std::vector<double> clean = motion_with_jump(0, kTrustAllTracks);
  EXPECT_EQ(motion_with_jump(0, 4), clean);
  // A sigma of 4 is 7.68 pixels here.
  EXPECT_GT(apart(motion_with_jump(80, kTrustAllTracks), clean), 1);
  EXPECT_LT(apart(motion_with_jump(80, 4), clean), 0.1);
}

TEST(LockdownWindow, TracksStandStillAtTheTarget) {
  for (const similarity& goal : {similarity{}, similarity{1.1, 0.2, 30, -20}}) {
    scene s(40, {{20, 0, 40}});
    s.lockdown(0, 40, goal);
    EXPECT_EQ(spans_of(s.records), "solved 0 40;");
    for (int i = 0; i < 20 * 40; ++i) {
      const point2 start = transform(goal, position(s.global.input[i % 20]));
      expect_point_near(position(s.global.output[i]), start, 0.05);
    }
  }
}

TEST(LockdownWindow, HolesAndMissingTracks) {
  // A single track holds frames 12 and 13.
  scene s(60, {{8, 4, 12}, {1, 12, 25}, {7, 14, 25}, {8, 35, 50}});
  s.lockdown(0, 60);
  EXPECT_EQ(spans_of(s.records),
            "unsolved 0 4;solved 4 25;unsolved 25 35;solved 35 50;unsolved 50 60;");
  scene empty(9, {});
  empty.lockdown(0, 9);
  EXPECT_EQ(spans_of(empty.records), "unsolved 0 9;");
}

}  // namespace
}  // namespace marrow::stabilization
