#include "stabilization/transitions/transitions.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <utility>
#include <vector>

#include "stabilization/transitions/transition_tracks.h"
#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

// Tracks of plane points under a shaky camera.
struct scene {
  stabilizer_global global;
  std::vector<transition_record> records;
  SolverParamsRecord parameters;

  scene(int frames, int slots) : global(empty_clip(slots, frames)) {}

  int slots() const { return static_cast<int>(global.feature_count); }
  int frames() const { return static_cast<int>(global.frame_count); }

  // Slots [begin, end) over frames [first, last).
  scene& tracks(int begin, int end, int first, int last) {
    for (int s = begin; s < end; ++s) {
      put_track(global, s, first, last, [&](int f) { return shaken(scattered(s + first), f); });
    }
    return *this;
  }
  scene& full() { return tracks(0, slots(), 0, frames()); }

  scene& transition(int first, int end, bool translation_only = false) {
    build_trajectories(global);
    transition_window(global, first, end, parameters, translation_only, records, kNoProgress);
    return *this;
  }
  scene& lockdown(int first, int end, const similarity& target = {}) {
    build_trajectories(global);
    lockdown_window(global, first, end, parameters, target, records, kNoProgress);
    return *this;
  }

  double rough(const std::vector<track_sample>& rows, int first, int end) const {
    double sum = 0;
    for (int s = 0; s < slots(); ++s) sum += std::pow(roughness(global, rows, s, first, end), 2);
    return std::sqrt(sum / slots());
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

TEST(TransitionWindow, ShakyTracksComeOutSmoothAtAMinimumOfTheCost) {
  for (const auto& [first, use_new] : {std::pair(0, true), {20, true}, {0, false}}) {
    scene s(first + 30, 60);
    s.parameters.use_new_solver = use_new;
    s.parameters.transition_tail_overlap = 0;
    s.full().transition(first, s.frames());
    ASSERT_EQ(s.records.size(), 1u);
    const int begin = first + 1, end = s.frames() - 1;
    EXPECT_LT(s.rough(s.global.output, begin, end), s.rough(s.global.input, begin, end) / 5);
    for (int i = 0; i < 30 * 60; ++i) {
      EXPECT_EQ(s.global.output[first * 60 + i].status, i < 60);
    }
    s.expect_records_agree_with_output();

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
  struct lives {
    int count, first, last;
  };
  using clip = std::vector<lives>;
  const clip whole = {{12, 0, 130}}, hole = {{8, 0, 25}, {8, 35, 60}},
             long_hole = {{8, 5, 40}, {8, 90, 120}};
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
      {"no tracks", 12, 200, 0, {}, true, "unsolved 0 12;"},
      {"one track", 12, 200, 0, {{1, 0, 12}}, false, "unsolved 0 12;"},
      {"a hole", 60, 200, 0, hole, true, "solved 0 25;unsolved 25 35;solved 35 60;"},
      {"a hole longer than a chunk ends it", 120, 20, 0, long_hole, false,
       "unsolved 0 5;solved 5 20;solved 20 40;unsolved 40 120;"},
      {"chunks", 130, 40, 0, whole, true, "solved 0 40;solved 40 80;solved 80 120;solved 120 130;"},
      {"chunks of one frame", 10, 1, 0, {{6, 0, 10}}, false, "unsolved 0 10;"},
      {"less than none", 10, -5, 0, {{6, 0, 10}}, false, "unsolved 0 10;"},
      {"just enough residuals", 10, 200, 0, brief, false, "solved 0 2;unsolved 2 10;"},
      {"too few residuals", 60, 200, 20, brief_behind, false,
       "unsolved 20 30;unsolved 30 32;unsolved 32 40;solved 40 60;"}};
  for (const auto& e : cases) {
    for (int use_new = !e.old_too; use_new < 2; ++use_new) {
      SCOPED_TRACE(e.situation);
      scene s(e.frames, 12);
      s.parameters.use_new_solver = use_new;
      s.parameters.transition_max_duration = e.max_duration;
      for (const lives& l : e.tracks) s.tracks(0, l.count, l.first, l.last);
      s.transition(e.first, e.frames);
      EXPECT_EQ(spans_of(s.records), e.records);
      expect_unsolved_untouched(s.global, s.records);
      s.expect_records_agree_with_output();
    }
  }
}

// The frames before 20 hold solved positions, standing 50 pixels from the input's first ones.
scene solved_before() {
  scene s(50, 20);
  s.full();
  for (int f = 0; f < 20; ++f) {
    for (int i = 0; i < 20; ++i) {
      const track_sample& first = s.global.input_at(0, i);
      s.global.output_at(f, i) = {first.x + 50, first.y, f == 0, 0.25f};
    }
  }
  return s;
}

double step_at(const scene& s, int frame) {
  double largest = 0;
  for (int i = 0; i < s.slots(); ++i) {
    largest = std::max<double>(
        largest, std::fabs(s.global.output_at(frame, i).x - s.global.output_at(frame - 1, i).x));
  }
  return largest;
}

TEST(TransitionWindow, PathJoinsTheSolvedFramesBefore) {
  scene joined = solved_before();
  joined.transition(20, 50);
  EXPECT_EQ(spans_of(joined.records), "solved 20 50;");
  for (int i = 0; i < 20; ++i) {
    EXPECT_EQ(joined.global.output_at(19, i).x, joined.global.input_at(0, i).x + 50);
  }

  // A break in every track inside the overlap: none reaches back, and the path starts afresh.
  scene broken = solved_before();
  for (int i = 0; i < 20; ++i) broken.global.output_at(15, i).status = 1;
  broken.transition(20, 50);
  EXPECT_LT(step_at(joined, 20), 0.3 * step_at(broken, 20));

  scene old = solved_before();
  old.parameters.use_new_solver = false;
  old.transition(20, 50);
  EXPECT_EQ(spans_of(old.records), "solved 20 50;");
  EXPECT_LT(step_at(old, 20), 10);
  EXPECT_LT(old.rough(old.global.output, 21, 50), old.rough(old.global.input, 21, 50) / 3);
  old.expect_records_agree_with_output();
}

TEST(TransitionWindow, TranslationOnlyHoldsInRecordsAndOutput) {
  for (const bool use_new : {true, false}) {
    scene s(40, 20);
    s.parameters.use_new_solver = use_new;
    s.full().transition(0, 40, true);
    ASSERT_EQ(s.records.size(), 1u);
    double travel = 0;
    for (int f = 0; f < 40; ++f) {
      EXPECT_EQ(s.records[0].motion[4 * f], 1.0);
      EXPECT_EQ(s.records[0].motion[4 * f + 1], 0.0);
      travel += std::fabs(s.records[0].motion[4 * f + 2]);
    }
    EXPECT_GT(travel, 1.0);
    s.expect_records_agree_with_output();
  }
}

TEST(LockdownWindow, TracksStandStillAtTheTarget) {
  for (const similarity& goal : {similarity{}, similarity{1.1, 0.2, 30, -20}}) {
    scene s(40, 20);
    s.full().lockdown(0, 40, goal);
    EXPECT_EQ(spans_of(s.records), "solved 0 40;");
    s.expect_records_agree_with_output();
    for (int i = 0; i < 20; ++i) {
      const point2 start = transform(goal, position(s.global.input_at(0, i)));
      for (int f = 0; f < 40; ++f) {
        expect_point_near(position(s.global.output_at(f, i)), start, 0.05);
      }
    }
  }
}

TEST(LockdownWindow, HolesAndMissingTracks) {
  scene s(60, 8);  // a single track holds frames 12 and 13
  s.tracks(0, 8, 4, 12).tracks(0, 1, 12, 25).tracks(1, 8, 14, 25).tracks(0, 8, 35, 50);
  s.lockdown(0, 60).expect_records_agree_with_output();
  EXPECT_EQ(spans_of(s.records),
            "unsolved 0 4;solved 4 25;unsolved 25 35;solved 35 50;unsolved 50 60;");
  EXPECT_EQ(spans_of(scene(9, 0).lockdown(0, 9).records), "unsolved 0 9;");
  EXPECT_EQ(spans_of(scene(9, 3).full().lockdown(4, 4).records), "");
}

}  // namespace
}  // namespace marrow::stabilization
