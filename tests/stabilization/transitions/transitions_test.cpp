#include "stabilization/transitions/transitions.h"

#include <gtest/gtest.h>

#include <cmath>
#include <random>

#include "platform/tessel/debug.h"
#include "stabilization/transitions/transition_tracks.h"

namespace marrow::stabilization {
namespace {

const progress_functor kNoProgress = [] {};

// Tracks of random plane points under a shaky camera.
struct scene {
  stabilizer_global global;
  std::mt19937 random{11};
  std::vector<point2> shake;
  std::vector<transition_record> records;
  SolverParamsRecord parameters;

  scene(int frames, int slots) {
    global.frame_count = frames;
    global.feature_count = slots;
    global.input.assign(global.frame_count * slots, {0, 0, -1, 0});
    global.output.assign(global.frame_count * slots, {0, 0, -1, 0});
    std::normal_distribution<double> jitter(0, 4);
    for (int f = 0; f < frames; ++f) shake.push_back({2.0 * f + jitter(random), jitter(random)});
  }

  // A point seen through `slot` over [first, last).
  void track(int slot, int first, int last) {
    std::uniform_real_distribution<double> x(100, 1800), y(100, 1000);
    const point2 p = {x(random), y(random)};
    for (int f = first; f < last; ++f) {
      const double angle = 0.002 * std::sin(1.7 * f);
      global.input[f * global.feature_count + slot] = {
          static_cast<float>(p.x - angle * p.y - shake[f].x),
          static_cast<float>(p.y + angle * p.x - shake[f].y), f == first ? first + 1 : 0, 0};
    }
  }
  scene& full() {
    for (std::size_t s = 0; s < global.feature_count; ++s) {
      track(static_cast<int>(s), 0, static_cast<int>(global.frame_count));
    }
    return *this;
  }

  void build() {
    global.trajectories =
        tracking::BuildTrajectories(global.input.data(), global.feature_count, global.frame_count);
  }
  void transition(int first, int end, bool translation_only = false,
                  const progress_functor& progress = kNoProgress) {
    build();
    transition_window(global, first, end, parameters, translation_only, records, progress);
  }
  void lockdown(int first, int end, const similarity& target = {},
                const progress_functor& progress = kNoProgress) {
    build();
    lockdown_window(global, first, end, parameters, target, records, progress);
  }

  // "kind first end" of each record.
  std::string spans() const {
    std::string text;
    for (const transition_record& r : records) {
      text += (r.kind == transition_record::solved ? "solved " : "unsolved ") +
              std::to_string(r.first) + " " + std::to_string(r.end) + ";";
      EXPECT_EQ(r.motion.size(), 4 * (r.end - r.first));
    }
    return text;
  }

  double roughness(const std::vector<track_sample>& rows, int first, int end) const {
    double sum = 0;
    int count = 0;
    for (int f = first + 1; f + 1 < end; ++f) {
      for (std::size_t s = 0; s < global.feature_count; ++s) {
        const track_sample& a = rows[(f - 1) * global.feature_count + s];
        const track_sample& b = rows[f * global.feature_count + s];
        const track_sample& c = rows[(f + 1) * global.feature_count + s];
        if (a.status < 0 || b.status != 0 || c.status != 0) continue;
        sum += std::pow(a.x - 2 * b.x + c.x, 2) + std::pow(a.y - 2 * b.y + c.y, 2);
        ++count;
      }
    }
    EXPECT_GT(count, 0);
    return std::sqrt(sum / count);
  }

  // Every live output sample is its record's map of the input sample.
  void expect_records_agree_with_output(double tolerance) const {
    int live = 0;
    for (const transition_record& r : records) {
      for (std::uint64_t f = r.first; f < r.end; ++f) {
        const double* m = &r.motion[4 * (f - r.first)];
        for (std::size_t s = 0; s < global.feature_count; ++s) {
          const track_sample& out = global.output_at(f, s);
          if (out.status < 0) continue;
          const point2 p = transform(similarity{m[0], m[1], m[2], m[3]},
                                     input_position(global, static_cast<std::int64_t>(f), s));
          EXPECT_NEAR(out.x, p.x, tolerance) << "frame " << f << " slot " << s;
          EXPECT_NEAR(out.y, p.y, tolerance);
          ++live;
        }
      }
    }
    EXPECT_GT(live, 0);
  }
};

TEST(TransitionWindow, ShakyTracksComeOutSmooth) {
  scene s(30, 60);
  s.full().transition(0, 30);
  EXPECT_EQ(s.spans(), "solved 0 30;");
  EXPECT_LT(s.roughness(s.global.output, 0, 30), s.roughness(s.global.input, 0, 30) / 5);
  for (int f = 0; f < 30; ++f) {
    EXPECT_NEAR(s.records[0].motion[4 * f], 1.0, 0.01) << f;
    for (std::size_t i = 0; i < 60; ++i) {
      EXPECT_EQ(s.global.output_at(f, i).status, f == 0 ? 1 : 0);
    }
  }
  s.expect_records_agree_with_output(1e-3);
}

// The sum of squares that a transition minimises, written out for tracks that all span a clip of 30
// frames: flanks of 30 frames give every sample the weight 0.5 * 30.
double plain_cost(const scene& s, const std::vector<double>& motion) {
  const double wd = 15, ws = 15 * s.parameters.transition_stab_lambda;
  const auto moved = [&](int f, std::size_t i) {
    const double* m = &motion[4 * f];
    return transform(similarity{m[0], m[1], m[2], m[3]}, input_position(s.global, f, i));
  };
  double sum = 0;
  for (std::size_t i = 0; i < s.global.feature_count; ++i) {
    for (int f = 0; f < 30; ++f) {
      const point2 o = input_position(s.global, f, i), t = moved(f, i);
      sum += wd * wd * (std::pow(t.x - o.x, 2) + std::pow(t.y - o.y, 2));
      if (f == 0 || f == 29) continue;
      const point2 a = moved(f - 1, i), b = moved(f + 1, i);
      sum += std::pow(ws / motion[4 * f], 2) *
             (std::pow(a.x + b.x - 2 * t.x, 2) + std::pow(a.y + b.y - 2 * t.y, 2));
    }
  }
  return sum;
}

TEST(TransitionWindow, ResultIsAMinimumOfTheCost) {
  scene s(30, 60);
  s.full().transition(0, 30);
  ASSERT_EQ(s.spans(), "solved 0 30;");
  const std::vector<double> solved = s.records[0].motion;
  std::vector<double> start;
  for (int f = 0; f < 30; ++f) start.insert(start.end(), {1, 0, 0, 0});
  const double least = plain_cost(s, solved);
  EXPECT_LT(least, plain_cost(s, start) / 20);
  for (std::size_t k = 0; k < solved.size(); ++k) {
    for (const double sign : {1.0, -1.0}) {
      std::vector<double> moved = solved;
      moved[k] += sign * (k % 4 < 2 ? 1e-4 : 0.1);  // about a tenth of a pixel
      EXPECT_GT(plain_cost(s, moved), least) << k;
    }
  }
}

TEST(TransitionWindow, EmptyStretchMakesNoRecord) {
  scene s(10, 4);
  s.full().transition(5, 5);
  EXPECT_TRUE(s.records.empty());
}

TEST(TransitionWindow, TooFewTracksLeaveTheIdentity) {
  for (const int slots : {0, 1}) {
    scene s(12, slots);
    s.full().transition(0, 12);
    EXPECT_EQ(s.spans(), "unsolved 0 12;");
    for (int i = 0; i < 48; ++i) EXPECT_EQ(s.records[0].motion[i], i % 4 == 0 ? 1.0 : 0.0);
    for (const track_sample& sample : s.global.output) EXPECT_EQ(sample.status, -1);
  }
}

TEST(TransitionWindow, HoleGivesThreeRecordsInOrder) {
  for (const bool use_new : {true, false}) {
    scene s(60, 8);
    s.parameters.use_new_solver = use_new;
    for (int i = 0; i < 8; ++i) {
      s.track(i, 0, 25);
      s.track(i, 35, 60);
    }
    s.transition(0, 60);
    EXPECT_EQ(s.spans(), "solved 0 25;unsolved 25 35;solved 35 60;");
    s.expect_records_agree_with_output(1e-3);
  }
}

TEST(TransitionWindow, HoleAsLongAsAChunkEndsTheWindow) {
  scene s(120, 8);
  s.parameters.transition_max_duration = 20;
  for (int i = 0; i < 8; ++i) {
    s.track(i, 5, 40);
    s.track(i, 90, 120);
  }
  s.transition(0, 120);
  EXPECT_EQ(s.spans(), "unsolved 0 5;solved 5 20;solved 20 40;unsolved 40 120;");
}

TEST(TransitionWindow, ChunksCoverALongClip) {
  for (const bool use_new : {true, false}) {
    scene s(130, 12);
    s.parameters.use_new_solver = use_new;
    s.parameters.transition_max_duration = 40;
    s.full().transition(0, 130);
    EXPECT_EQ(s.spans(), "solved 0 40;solved 40 80;solved 80 120;solved 120 130;");
    s.expect_records_agree_with_output(1e-3);
  }
}

TEST(TransitionWindow, MaxDurationOfNothingEnds) {
  for (const int duration : {1, 0, -5}) {
    scene s(10, 6);
    s.parameters.transition_max_duration = duration;
    s.full().transition(0, 10);
    EXPECT_EQ(s.spans(), "unsolved 0 10;");
  }
}

TEST(TransitionWindow, TooFewResidualsAreAFailureAndTheRestGoesOn) {
  // Two tracks of two frames: eight residuals for eight unknowns are enough without overlap frames,
  // but not with ten of them behind a hole.
  scene s(60, 8);
  for (int i = 0; i < 2; ++i) s.track(i, 30, 32);
  for (int i = 0; i < 8; ++i) s.track(i, 40, 60);
  s.transition(20, 60);
  EXPECT_EQ(s.spans(), "unsolved 20 30;unsolved 30 32;unsolved 32 40;solved 40 60;");
  EXPECT_EQ(s.global.output_at(30, 0).status, -1);
}

// The frames before 20 hold solved positions, 50 pixels from the input ones.
scene solved_before(int slots) {
  scene s(50, slots);
  s.full();
  for (int f = 0; f < 20; ++f) {
    for (int i = 0; i < slots; ++i) {
      const point2 first = input_position(s.global, 0, i);
      s.global.output_at(f, i) = {static_cast<float>(first.x + 50), static_cast<float>(first.y),
                                  f == 0 ? 1 : 0, 0.25f};
    }
  }
  return s;
}

double step_at(const scene& s, int frame) {
  double largest = 0;
  for (std::size_t i = 0; i < s.global.feature_count; ++i) {
    largest = std::max<double>(
        largest, std::fabs(s.global.output_at(frame, i).x - s.global.output_at(frame - 1, i).x));
  }
  return largest;
}

TEST(TransitionWindow, PathJoinsTheSolvedFramesBefore) {
  scene joined = solved_before(20);
  const std::vector<track_sample> before = joined.global.output;
  joined.transition(20, 50);
  EXPECT_EQ(joined.spans(), "solved 20 50;");
  for (std::size_t i = 0; i < 20 * joined.global.feature_count; ++i) {
    EXPECT_EQ(joined.global.output[i].x, before[i].x) << "frames before the window stay";
    EXPECT_EQ(joined.global.output[i].status, before[i].status);
  }

  // A break in every track inside the overlap: none reaches back, and the path starts afresh.
  scene broken = solved_before(20);
  for (std::size_t i = 0; i < 20; ++i) broken.global.output_at(15, i).status = 1;
  broken.transition(20, 50);
  EXPECT_LT(step_at(joined, 20), 0.3 * step_at(broken, 20));
}

TEST(TransitionWindow, OldPathContinuesTheSolvedFramesBefore) {
  scene joined = solved_before(20);
  joined.parameters.use_new_solver = false;
  joined.transition(20, 50);
  EXPECT_EQ(joined.spans(), "solved 20 50;");
  EXPECT_LT(step_at(joined, 20), 10);
  EXPECT_LT(joined.roughness(joined.global.output, 20, 50),
            joined.roughness(joined.global.input, 20, 50) / 3);
  joined.expect_records_agree_with_output(1e-3);
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
    s.expect_records_agree_with_output(1e-3);
  }
}

TEST(LockdownWindow, TracksStandStillAtTheTarget) {
  const similarity target = {1.1, 0.2, 30, -20};
  for (const similarity& goal : {similarity{}, target}) {
    scene s(40, 20);
    s.full().lockdown(0, 40, goal);
    EXPECT_EQ(s.spans(), "solved 0 40;");
    s.expect_records_agree_with_output(1e-3);
    for (std::size_t i = 0; i < 20; ++i) {
      const point2 start = transform(goal, input_position(s.global, 0, i));
      for (int f = 0; f < 40; ++f) {
        EXPECT_NEAR(s.global.output_at(f, i).x, start.x, 0.05);
        EXPECT_NEAR(s.global.output_at(f, i).y, start.y, 0.05);
      }
    }
  }
}

TEST(LockdownWindow, HolesAndMissingTracks) {
  scene s(60, 8);
  for (int i = 0; i < 8; ++i) {
    s.track(i, 4, 25);
    s.track(i, 35, 50);
  }
  s.lockdown(0, 60);
  EXPECT_EQ(s.spans(), "unsolved 0 4;solved 4 25;unsolved 25 35;solved 35 50;unsolved 50 60;");
  s.expect_records_agree_with_output(1e-3);

  scene none(9, 0);
  none.lockdown(0, 9);
  EXPECT_EQ(none.spans(), "unsolved 0 9;");
  scene empty(9, 3);
  empty.full().lockdown(4, 4);
  EXPECT_TRUE(empty.records.empty());
}

TEST(LockdownWindow, FrameHeldByASingleTrackDoesNotFail) {
  scene s(30, 8);
  s.track(0, 0, 30);
  for (int i = 1; i < 8; ++i) {
    s.track(i, 0, 12);
    s.track(i, 14, 30);
  }
  s.lockdown(0, 30);
  EXPECT_EQ(s.spans(), "solved 0 30;");
  s.expect_records_agree_with_output(1e-3);
}

struct cancelled {};

TEST(Transitions, CancellationAtEveryCallPassesThrough) {
  for (const int kind : {0, 1, 2}) {
    for (int limit = 0;; ++limit) {
      scene s(16, 6);
      s.full();
      s.parameters.use_new_solver = kind != 1;
      int calls = 0;
      const progress_functor progress = [&calls, limit] {
        if (calls++ == limit) throw cancelled();
      };
      try {
        if (kind == 2) {
          s.lockdown(0, 16, {}, progress);
        } else {
          s.transition(0, 16, false, progress);
        }
        EXPECT_GT(limit, 2);
        break;
      } catch (const cancelled&) {
        EXPECT_EQ(calls, limit + 1);
      }
    }
  }
}

TEST(Transitions, LogTellsTheWindowsAndTheSolversOutcome) {
  std::string log;
  tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 1);
  tessel::debug::SetSink([&log](const std::string& text) { log += text; });
  scene s(20, 8);
  s.full().transition(0, 20);
  scene t(20, 8);
  t.full().lockdown(0, 20);
  tessel::debug::SetSink({});
  tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 0);
  for (const char* text :
       {"Transition window (0 : 20)", "Sub-transition window (0 : 20)", "Lockdown window (0 : 20)",
        "Sub-lockdown window (0 : 20)", " jacobian evaluations.\n", " iterations, "}) {
    EXPECT_NE(log.find(text), std::string::npos) << text << " in " << log;
  }
}

}  // namespace
}  // namespace marrow::stabilization
