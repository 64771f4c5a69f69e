#include "stabilizer/effect/src/solver.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <memory>
#include <random>
#include <thread>

#include "platform/tessel/threads.h"
#include "stabilizer/effect/src/parameter_rules.h"
#include "synthetic/track_world.h"
#include "tests/support/parameter_values.h"
#include "tests/support/shaken_table.h"

namespace {

using marrow::stabilization::SolverParamsRecord;
using marrow::tracking::AllFeatures;

constexpr std::uint32_t kWidth = 640;
constexpr std::uint32_t kHeight = 360;

SolverParamsRecord Params() {
  return GetSolverParams(kelp::effect::ParameterValues(), {kWidth, kHeight}, 25);
}

std::unique_ptr<Solver> NewSolver(const AllFeatures& table, bool needs_cropper = true,
                                  boost::function<void()> notify = {},
                                  std::uint32_t map_radius = 0) {
  return std::make_unique<Solver>(kWidth, kHeight, table, map_radius, Params(), needs_cropper,
                                  std::move(notify));
}

TEST(SolverTest, SuppliedWarperIsKeptAndNothingIsSolved) {
  auto first = NewSolver(ShakenTable(20, 40), false);
  first->Run();
  ASSERT_EQ(first->GetState(), Solver::finished);
  EXPECT_FALSE(first->GetCropper());
  auto second = NewSolver(ShakenTable(20, 40), true, {}, 2);
  second->SetExistingWarper(first->GetWarper());
  second->Run();
  ASSERT_EQ(second->GetState(), Solver::finished);
  // A published warper is never written: the second has its own map over the same warps.
  EXPECT_NE(second->GetWarper(), first->GetWarper());
  EXPECT_EQ(second->GetWarper()->frameWarp(0), first->GetWarper()->frameWarp(0));
  EXPECT_EQ(second->GetWarper()->frameWarp(7)->values, first->GetWarper()->frameWarp(7)->values);
  EXPECT_EQ(second->GetWarper()->frameMap()->radius(), 2);
  EXPECT_EQ(second->GetWarper()->frameMap()->entries().size(), 2u * (19 + 18));
  EXPECT_EQ(first->GetWarper()->frameMap()->radius(), 0);
  EXPECT_TRUE(second->GetFactorizationWindows().empty());
  EXPECT_TRUE(second->GetCropper());
  const auto warper = first->GetWarper();
  first.reset();
  EXPECT_EQ(warper->withFrameMap(1)->frameWarpCount(), 20u) << "it reads the tracks";
}

// Where the task has not begun yet nobody waits for it: it ends by itself, and tells so.
TEST(SolverTest, NotifiesThoughDroppedAtOnce) {
  tessel::threads::CompletionEvent notified;
  NewSolver(ShakenTable(20, 40), true, [&] { notified.Signal(); })->Start();
  notified.Wait();
  tessel::threads::Shutdown();
}

// Tracks that come and go, two windows with a bridge over a hole between them; dropped at 50 points
// all over the solve, in its factorizations, linear solves, warps and crop.
TEST(SolverTest, DroppedAnywhere) {
  synthetic::track_world_options options;
  options.width = kWidth;
  options.height = kHeight;
  options.focal = 500;
  options.frame_count = 48;
  options.slots = 60;
  options.mean_life = 100;
  options.hole = {24, 26};
  const AllFeatures table = make_track_world(options).features;
  SolverParamsRecord parameters = Params();
  parameters.duration = 12;
  parameters.factorization_window_overlap = 8;
  parameters.track_fade_duration = 10;
  const auto start = [&] {
    auto solver = std::make_unique<Solver>(kWidth, kHeight, table, 0, parameters, true);
    solver->Start();
    return solver;
  };
  const auto whole = start();
  whole->Wait();
  ASSERT_FALSE(whole->GetTransitionWindows().empty());
  std::mt19937 random(4);
  std::uniform_real_distribution<float> share(0, 1);
  for (int i = 0; i < 50; ++i) {
    const float until = i < 10 ? 0 : share(random);  // before the task begins, too
    auto solver = start();
    while (solver->GetProgress() < until && solver->GetState() <= Solver::running) {
      std::this_thread::yield();
    }
    solver.reset();
  }
}

TEST(SolverTest, ACancelAndAFailureAreStatesNotExceptions) {
  auto cancelled = NewSolver(ShakenTable(40, 40));
  cancelled->Cancel();
  cancelled->Run();
  EXPECT_EQ(cancelled->GetState(), Solver::cancelled);

  AllFeatures table = ShakenTable(40, 40);  // breaks the solve somewhere
  for (auto& cell : *table.features) cell.x = std::nanf("");
  std::atomic<int> notified{0};
  auto failed = NewSolver(table, true, [&] { ++notified; });
  failed->Start();
  failed->Wait();
  EXPECT_EQ(failed->GetState(), Solver::failed);
  EXPECT_EQ(notified, 1);
}

}  // namespace
