#include <gtest/gtest.h>

#include <cmath>
#include <set>

#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/support/hosted_effect.h"
#include "tests/support/shaken_table.h"

namespace calmframe::host {
namespace {

using kelp::effect::StabilizerEffect;
using marrow::tracking::AllFeatures;

constexpr std::int32_t kFrames = 20, kScene = 40, kWalker = 40;  // slots
constexpr std::int32_t kDeleted = -10;                           // status of a deleted seed

// In a host that keeps the parameter, on a grey clip: a shaken scene, and somebody large who walks
// across it and bobs, whose tracks may be left out.
class DeletionsTest : public ::testing::Test {
 protected:
  static AllFeatures Tracks(bool with_walker) {
    AllFeatures table = ShakenTable(kFrames, kScene + kWalker);
    for (std::int32_t f = 0; f < kFrames; ++f) {
      for (std::int32_t s = kScene; s < kScene + kWalker; ++s) {
        auto& cell = (*table.features)[f * table.feature_count + s];
        cell.x += static_cast<float>(3 * f + 5 * std::sin(1.3 * f));
        if (!with_walker) cell.status = -1;
      }
    }
    return table;
  }
  // A point somewhere on each track of the walker: the frame above the slot.
  static std::vector<std::uint64_t> Walker() {
    std::vector<std::uint64_t> points;
    for (std::uint64_t s = 0; s < kWalker; ++s) points.push_back(s % kFrames << 32 | (kScene + s));
    return points;
  }
  static SourcePtr GreyClip() {
    const SourceInfo info{.width = 640,
                          .height = 360,
                          .frame_count = kFrames,
                          .content = tessel::utility::Guid::FromText("grey")};
    return MakeDrawnSource(info, [](std::int64_t, Picture& picture) {
      FillPicture(picture, [](int, int) { return HX_PixelFloat{1, 0.5f, 0.5f, 0.5f}; });
    });
  }

  void SetUp() override {
    ASSERT_EQ(hosted.Analyse(), 8);
    SolveTracks(true);
    first = Warps();
  }
  void SolveTracks(bool with_walker) {
    hosted.Inside([=](StabilizerEffect& effect) {
      KeepTable(*effect.GetState(), Tracks(with_walker));
      effect.GetState()->MakeResultIdentityUnique();
      effect.MarkNeedsSolve();
    });
    ASSERT_EQ(hosted.Settle(), 8);
    hosted.stages().Take();
  }
  // Deletes them and no others, which is told and solved.
  void Delete(const std::vector<std::uint64_t>& points) {
    hosted.SetDeletions(points);
    EXPECT_TRUE(hosted.Tick().ok());
    EXPECT_EQ(hosted.Status(), 7);
    EXPECT_EQ(hosted.Runs(), "factorization crop ");
  }
  std::vector<std::vector<double>> Warps() {
    std::vector<std::vector<double>> all;
    for (std::int32_t f = 0; f < kFrames; ++f) all.push_back(hosted.Warp(f));
    return all;
  }
  // In the first frame.
  std::int32_t StatusOf(std::int32_t slot) {
    std::int32_t status = 0;
    hosted.Inside([&](StabilizerEffect& effect) {
      status = (*marrow::tracking::CellsOf(TableOf(*effect.GetState())))[slot].status;
    });
    return status;
  }

  HostedEffect hosted{GreyClip(), {.keeps_deletions = true}};
  std::vector<std::vector<double>> first;
};

TEST_F(DeletionsTest, WhatIsDeletedWasNeverThereAndUndoIsExact) {
  Delete(Walker());
  const auto without = Warps();
  EXPECT_NE(without, first);
  EXPECT_EQ(StatusOf(kScene), kDeleted);
  EXPECT_EQ(hosted.Runs(), "") << "once is enough";
  Delete({});
  EXPECT_EQ(Warps(), first);
  EXPECT_EQ(StatusOf(kScene), 1) << "the analysis' own cells";
  Delete({std::uint64_t{kFrames} << 32, 9999});  // unknown points have a solve of their own
  EXPECT_EQ(Warps(), first);
  hosted.SetDeletions({});
  SolveTracks(false);
  EXPECT_EQ(Warps(), without);
}

// Set back, the warps stay; saved, it is solved again.
TEST_F(DeletionsTest, AChangeOrASaveDuringASolve) {
  for (const bool saves : {false, true}) {
    hosted.HoldSolve();
    hosted.SetDeletions(Walker());
    hosted.TickUntilHeld();
    if (!saves) hosted.SetDeletions({});
    {
      const std::jthread release = hosted.ReleaseSoon();
      saves ? void(hosted.Save()) : void(hosted.Tick());
    }
    EXPECT_EQ(hosted.Settle(), 8);
    EXPECT_EQ(Warps() == first, !saves);
    EXPECT_EQ(StatusOf(kScene), saves ? kDeleted : 1);
  }
}

TEST_F(DeletionsTest, WithoutAnyTrackTheClipRestsUntilTheyComeBack) {
  std::vector<std::uint64_t> all = Walker();
  for (std::uint64_t s = 0; s < kScene; ++s) all.push_back(s);
  hosted.SetDeletions(all);
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_NE(Warps(), first);
  hosted.stages().Take();
  EXPECT_EQ(hosted.Runs(), "") << "once is enough";
  hosted.SetDeletions({});
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_EQ(Warps(), first);
}

TEST_F(DeletionsTest, AProjectKnowsWhatItsSolveLeftOut) {
  Delete(Walker());
  hosted.Save();  // and loaded where it stands
  const auto loaded = Warps();
  EXPECT_EQ(hosted.Runs(), "");
  Delete({});
  EXPECT_NE(Warps(), loaded);
  EXPECT_EQ(StatusOf(kScene), 1);
}

TEST_F(DeletionsTest, AnalyzeForgetsThem) {
  hosted.SetDeletions({7});
  EXPECT_EQ(hosted.Settle(), 8);
  Operations::Get().FailNth(1, "Param Utils.SetParamValue");
  EXPECT_EQ(hosted.Set(kDetailedAnalysis, 1).code, kFaultCode);
  EXPECT_EQ(hosted.Deletions(), std::vector<std::uint64_t>{7});
  hosted.Set(kDetailedAnalysis, 0);
  EXPECT_TRUE(hosted.Deletions().empty());
  const auto value = [this] {
    return hosted.effect().Param(hosted.deletions_index())->u.arb_d.value;
  };
  const HX_Handle empty = value();
  hosted.Set(kDetailedAnalysis, 1);
  EXPECT_EQ(value(), empty) << "empty already";
}

// Whatever call fails on the way, nothing is left behind and the deletion is solved in the end.
TEST_F(DeletionsTest, AFailingCallAnywhereOnTheWay) {
  const auto names = HostedEffect::OperationsOf([this] {
    hosted.SetDeletions({5});
    hosted.Settle();
  });
  EXPECT_GT(names.size(), 50u);
  const std::set<std::string> different(names.begin(), names.end());
  std::uint64_t point = 6;
  for (const std::string& name : different) {
    hosted.SetDeletions({point});
    Operations::Get().FailNth(1, name);
    for (int tick = 0; tick < 3; ++tick) hosted.Tick();
    Operations::Get().FailNone();
    EXPECT_EQ(hosted.Settle(), 8) << name;
    EXPECT_EQ(StatusOf(static_cast<std::int32_t>(point)), kDeleted) << name;
    EXPECT_NE(StatusOf(static_cast<std::int32_t>(point) - 1), kDeleted) << name;
    ++point;
  }
}

}  // namespace
}  // namespace calmframe::host
