#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cmath>

#include "analysis/effect/analysis_parameter_rows.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "synthetic/track_world.h"
#include "tests/stabilizer/effect/stabilizer_host.h"

namespace kelp::effect {
namespace {

using analysis::FrameStatus;
using analysis::effect::DeletedTrackPoints;
using marrow::stabilization::CPWarper;
using marrow::tracking::AllFeatures;
using marrow::tracking::TrackPoints;

constexpr std::int32_t kFrames = 60, kBackground = 40, kForeground = 120;

// A street-like scene under a shaken camera, and somebody large who walks across it and bobs.
struct World {
  World() {
    synthetic::track_world_options options;
    options.frame_count = kFrames;
    options.slots = kBackground;
    options.width = 640;
    options.height = 360;
    options.focal = 520;
    options.whole_clip = true;
    options.gain = 0.3;
    background = make_track_world(options);
    table.feature_count = kBackground + kForeground;
    table.frame_count = kFrames;
    for (std::int32_t f = 0; f < kFrames; ++f) {
      for (std::int32_t s = 0; s < kBackground; ++s) {
        table.features->push_back((*background.features.features)[background.cell(f, s)]);
      }
      for (std::int32_t s = 0; s < kForeground; ++s) {
        const double x = 120 + 10 * (s % 12) + 3.0 * f + 5 * std::sin(1.3 * f);
        const double y = 60 + 22 * (s / 12) + 8 * std::sin(0.9 * f);
        table.features->push_back(
            {static_cast<float>(x), static_cast<float>(y), f == 0 ? 1 : 0, 1.0f});
      }
    }
  }

  // Root mean square of the second differences of where the scene's points are shown, in pixels.
  double Jitter(const CPWarper& warper) const {
    const auto shown = [&](std::int32_t f, std::int32_t s) {
      const synthetic::point2 at = background.exact[background.cell(f, s)];
      const auto& record = *warper.frameWarp(f);
      const double u = std::clamp(at.x / warper.cellWidth(), 0.0, record.cols - 1.001);
      const double v = std::clamp(at.y / warper.cellHeight(), 0.0, record.rows - 1.001);
      const auto i = static_cast<int>(u), j = static_cast<int>(v);
      synthetic::point2 sum{0, 0};
      for (int corner = 0; corner < 4; ++corner) {
        const int a = corner % 2, b = corner / 2;
        const double weight = (a ? u - i : 1 - u + i) * (b ? v - j : 1 - v + j);
        const std::size_t vertex = static_cast<std::size_t>(record.cols * (j + b) + i + a);
        sum.x += weight * record.values[2 * vertex];
        sum.y += weight * record.values[2 * vertex + 1];
      }
      return sum;
    };
    double sum = 0;
    for (std::int32_t f = 1; f + 1 < kFrames; ++f) {
      for (std::int32_t s = 0; s < kBackground; ++s) {
        const auto a = shown(f - 1, s), b = shown(f, s), c = shown(f + 1, s);
        sum += std::pow(a.x - 2 * b.x + c.x, 2) + std::pow(a.y - 2 * b.y + c.y, 2);
      }
    }
    return std::sqrt(sum / ((kFrames - 2) * kBackground));
  }

  // A point somewhere on each track of the walker.
  static DeletedTrackPoints Walker() {
    DeletedTrackPoints points;
    for (std::int32_t s = 0; s < kForeground; ++s) points.Add({s % kFrames, kBackground + s});
    return points;
  }

  synthetic::track_world background;
  AllFeatures table;
};

std::vector<double> WarpsOf(const CPWarper& warper) {
  std::vector<double> all;
  for (std::size_t f = 0; f < warper.frameWarpCount(); ++f) {
    const auto& values = warper.frameWarp(f)->values;
    all.insert(all.end(), values.begin(), values.end());
  }
  return all;
}

class DeletionsTest : public ::testing::Test {
 protected:
  DeletionsTest() : test(kFrames) {}
  void SetUpSolved() {
    test.SetDeletions({});
    test.Analysed(world.table);
    test.TickUntilSolved();
    ASSERT_EQ(test.Status(), 8);
  }

  const World world;
  StabilizerHost test;
};

TEST_F(DeletionsTest, WithoutAMovingObjectsTracksTheBackgroundIsSteadierAndUndoIsExact) {
  SetUpSolved();
  StabilizerState& state = *test.state();
  const std::vector<double> first = WarpsOf(*state.warper);
  const double before = world.Jitter(*state.warper);

  test.SetDeletions(World::Walker());
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  ASSERT_TRUE(state.solver);
  EXPECT_EQ(test.Status(), 7);
  EXPECT_EQ(test.Effect().GetStatusForFrame(0), FrameStatus::SubsequentSolveOnDeletion);
  test.TickUntilSolved();
  EXPECT_EQ(test.Status(), 8);
  const double after = world.Jitter(*state.warper);
  RecordProperty("jitter_before", std::to_string(before));
  RecordProperty("jitter_after", std::to_string(after));
  EXPECT_LT(after, 0.2 * before) << before << " to " << after;
  EXPECT_EQ((*state.all_features.features)[kBackground].status, -10);
  EXPECT_EQ((*world.table.features)[kBackground].status, 1) << "the analysis' own cells";
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_FALSE(state.needs_solve) << "once is enough";

  test.SetDeletions({});
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_EQ(test.Status(), 7);
  test.TickUntilSolved();
  EXPECT_EQ(WarpsOf(*state.warper), first);
}

TEST_F(DeletionsTest, WhileItIsSolvedFramesShowTheInputUnderAFaintBanner) {
  SetUpSolved();
  test.SetDeletions(World::Walker());
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  test.RenderCopy();
  TestWorld source(640, 360, 8), output(640, 360, 8);
  for (int y = 0; y < 360; ++y) {
    for (int x = 0; x < 640; ++x) source.Set(x, y, 0.5, 0.5);
  }
  test.host.params[0].u.ld = *source.get();
  ASSERT_EQ(test.Call(HX_CMD_PREPARE_FRAME), HX_ERR_NONE);
  EXPECT_EQ(test.Effect().GetStatusForFrame(0), FrameStatus::SubsequentSolveOnDeletion);
  ASSERT_EQ(test.Call(HX_CMD_RENDER_FRAME, output.get()), HX_ERR_NONE);
  // Stripes of (0.8, 0.333, 0) and four fifths of that, a fifth opaque.
  for (const int x : {1, 60, 630}) {
    EXPECT_NEAR(output.At(x, 156, 1), 0.544, 0.02);
    EXPECT_NEAR(output.At(x, 156, 2), 0.46, 0.012);
    EXPECT_NEAR(output.At(x, 156, 3), 0.2, 0.004);
    EXPECT_NEAR(output.At(x, 20, 1), 0.5, 0.003);
  }
}

TEST_F(DeletionsTest, UnknownPointsChangeNothingButAreSolvedOnce) {
  SetUpSolved();
  StabilizerState& state = *test.state();
  const std::vector<double> first = WarpsOf(*state.warper);
  const auto cells = state.all_features.features;
  test.SetDeletions(DeletedTrackPoints(TrackPoints{{kFrames, 0}, {0, 9999}}));
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_EQ(test.Status(), 7);
  EXPECT_FALSE(state.solver->warper_supplied()) << "a solve of its own";
  test.TickUntilSolved();
  EXPECT_EQ(WarpsOf(*state.warper), first);
  EXPECT_EQ(state.all_features.features, cells);
}

TEST_F(DeletionsTest, AChangeDuringASolveStartsAnotherAndASetBackKeepsTheWarps) {
  SetUpSolved();
  StabilizerState& state = *test.state();
  const auto warper = state.warper;
  test.SetDeletions(World::Walker());
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  const Solver* const first = state.solver.get();
  while (first->GetState() == Solver::not_started) std::this_thread::yield();
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  if (state.solver) {
    EXPECT_EQ(state.solver.get(), first) << "the same set";
  }
  test.SetDeletions({});
  test.TickUntilSolved();
  EXPECT_EQ(WarpsOf(*state.warper), WarpsOf(*warper));
  EXPECT_EQ((*state.all_features.features)[kBackground].status, 1);
}

TEST_F(DeletionsTest, WithoutAnyTrackTheClipRestsUntilTheyComeBack) {
  SetUpSolved();
  StabilizerState& state = *test.state();
  const std::vector<double> first = WarpsOf(*state.warper);
  DeletedTrackPoints all = World::Walker();
  for (std::int32_t s = 0; s < kBackground; ++s) all.Add({0, s});
  test.SetDeletions(all);
  test.TickUntilSolved();
  EXPECT_EQ(test.Status(), 8);
  EXPECT_NE(WarpsOf(*state.warper), first);
  for (int i = 0; i < 3; ++i) ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_FALSE(state.solver) << "once is enough";
  test.SetDeletions({});
  test.TickUntilSolved();
  EXPECT_EQ(test.Status(), 8);
  EXPECT_EQ(WarpsOf(*state.warper), first);
}

TEST_F(DeletionsTest, AProjectKnowsWhatItsSolveLeftOut) {
  SetUpSolved();
  test.SetDeletions(World::Walker());
  test.TickUntilSolved();
  ASSERT_EQ(test.Call(HX_CMD_FLATTEN_INSTANCE), HX_ERR_NONE);
  ASSERT_EQ(test.Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
  const std::vector<double> loaded = WarpsOf(*test.state()->warper);
  for (int i = 0; i < 2; ++i) ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_FALSE(test.state()->solver);
  EXPECT_FALSE(test.state()->needs_solve);
  test.SetDeletions({});
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_EQ(test.Status(), 7);
  test.TickUntilSolved();
  EXPECT_NE(WarpsOf(*test.state()->warper), loaded);
  EXPECT_EQ((*test.state()->all_features.features)[kBackground].status, 1);
}

TEST_F(DeletionsTest, AProjectSavedDuringTheSolveSolvesItAgain) {
  SetUpSolved();
  const double before = world.Jitter(*test.state()->warper);
  test.SetDeletions(World::Walker());
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  ASSERT_EQ(test.Call(HX_CMD_FLATTEN_INSTANCE), HX_ERR_NONE);
  ASSERT_EQ(test.Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
  test.TickUntilSolved();
  EXPECT_LT(world.Jitter(*test.state()->warper), 0.2 * before);
}

TEST_F(DeletionsTest, AnalyzeForgetsThem) {
  SetUpSolved();
  test.SetDeletions(World::Walker());
  test.TickUntilSolved();
  HX_ParamChangedExtra pressed{test.Effect().ParamIdToIndex(analysis::effect::kAnalyzeParam)};
  ASSERT_EQ(test.Call(HX_CMD_PARAM_CHANGED, nullptr, &pressed), HX_ERR_NONE);
  EXPECT_TRUE(test.Deletions().empty());
  EXPECT_EQ(test.deletions_param().change_flag, 1);
  EXPECT_EQ(test.host.replaced_values.size(), 1u);
  test.deletions_param().change_flag = 0;
  ASSERT_EQ(test.Call(HX_CMD_PARAM_CHANGED, nullptr, &pressed), HX_ERR_NONE);
  EXPECT_EQ(test.deletions_param().change_flag, 0) << "empty already";
}

// Whatever call fails on the way, nothing is left behind and the deletion is solved in the end.
TEST_F(DeletionsTest, AFailingCallAnywhereOnTheWay) {
  const AllFeatures table = ShakenTable(8, 20);
  test.SetDeletions({});
  StabilizerState& state = test.Analysed(table);
  test.TickUntilSolved();
  for (int n = 1; n < 400; ++n) {
    test.SetDeletions(n % 2 ? DeletedTrackPoints(TrackPoints{{3, 5}}) : DeletedTrackPoints());
    test.host.ForgetOperations();
    test.host.FailOperation(n);
    for (int tick = 0; tick < 3; ++tick) {
      test.Tick();
      if (state.solver) state.solver->Wait();
    }
    const bool all = test.host.operations().size() < static_cast<std::size_t>(n);
    test.host.FailOperation(0);
    ASSERT_EQ(test.Tick(), HX_ERR_NONE);
    test.TickUntilSolved();
    EXPECT_EQ((*state.all_features.features)[5].status, n % 2 ? -10 : 1) << n;
    EXPECT_EQ(test.Status(), 8) << n;
    if (all) return;
  }
  FAIL() << "no end of host calls";
}

}  // namespace
}  // namespace kelp::effect
