#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cmath>

#include "stabilizer/effect/src/stabilizer_effect.h"
#include "synthetic/track_world.h"
#include "tests/support/hosted_effect.h"

namespace calmframe::host {
namespace {

using kelp::effect::StabilizerEffect;
using marrow::stabilization::CPWarper;
using marrow::tracking::AllFeatures;

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

  // A point somewhere on each track of the walker: the frame above the slot.
  static std::vector<std::uint64_t> Walker() {
    std::vector<std::uint64_t> points;
    for (std::uint64_t s = 0; s < kForeground; ++s) {
      points.push_back(s % kFrames << 32 | (kBackground + s));
    }
    return points;
  }

  synthetic::track_world background;
  AllFeatures table;
};

// In a host that keeps the parameter, with the world's tracks as those of a blank clip.
class DeletionsTest : public ::testing::Test {
 protected:
  static SourcePtr BlankClip() {
    SourceInfo info;
    info.width = 640;
    info.height = 360;
    info.frame_count = kFrames;
    info.content = tessel::utility::Guid::FromText("blank");
    return MakeDrawnSource(info, [](std::int64_t, Picture&) {});
  }
  void SetUp() override {
    ASSERT_EQ(hosted.Analyse(), 8);
    hosted.Inside([this](StabilizerEffect& effect) {
      effect.GetState()->all_features = world.table;
      effect.GetState()->MakeResultIdentityUnique();
      effect.MarkNeedsSolve();
    });
    ASSERT_EQ(hosted.Settle(), 8);
    hosted.stages().Take();
  }
  boost::shared_ptr<const CPWarper> Warper() {
    boost::shared_ptr<const CPWarper> warper;
    hosted.Inside([&](StabilizerEffect& effect) { warper = effect.GetState()->warper; });
    return warper;
  }
  double Jitter() { return world.Jitter(*Warper()); }
  std::vector<double> Warps() {
    std::vector<double> all;
    for (std::int32_t f = 0; f < kFrames; ++f) {
      const std::vector<double> warp = hosted.Warp(f);
      all.insert(all.end(), warp.begin(), warp.end());
    }
    return all;
  }
  // Of the walker's first track in the first frame.
  std::int32_t MarkOf(std::int32_t slot) {
    std::int32_t status = 0;
    hosted.Inside([&](StabilizerEffect& effect) {
      status = (*effect.GetState()->all_features.features)[slot].status;
    });
    return status;
  }

  const World world;
  HostedEffect hosted{BlankClip(), {.keeps_deletions = true}};
};

TEST_F(DeletionsTest, WithoutAMovingObjectsTracksTheBackgroundIsSteadierAndUndoIsExact) {
  const std::vector<double> first = Warps();
  const double before = Jitter();
  hosted.SetDeletions(World::Walker());
  EXPECT_TRUE(hosted.Tick().ok());
  EXPECT_EQ(hosted.Status(), 7);
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_EQ(hosted.stages().Take(), "factorization crop ");
  const double after = Jitter();
  RecordProperty("jitter_before", std::to_string(before));
  RecordProperty("jitter_after", std::to_string(after));
  EXPECT_LT(after, 0.2 * before) << before << " to " << after;
  EXPECT_EQ(MarkOf(kBackground), -10);
  EXPECT_EQ((*world.table.features)[kBackground].status, 1) << "the analysis' own cells";
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_EQ(hosted.stages().Take(), "") << "once is enough";

  hosted.SetDeletions({});
  EXPECT_TRUE(hosted.Tick().ok());
  EXPECT_EQ(hosted.Status(), 7);
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_EQ(Warps(), first);
}

TEST_F(DeletionsTest, WhileItIsSolvedFramesShowTheInputUnderAFaintBanner) {
  hosted.HoldSolve();
  hosted.SetDeletions(World::Walker());
  hosted.TickUntilHeld();
  const RenderedFrame frame = hosted.Render(0);
  ASSERT_TRUE(frame.pixels);
  // Over black, stripes of (0.8, 0.333, 0) and four fifths of that, a fifth opaque.
  double darkest = 1, brightest = 0;
  for (int x = 1; x < 100; x += 3) {  // left of the text
    const double red = ChannelAt(*frame.pixels, x, 156, 1);
    darkest = std::min(darkest, red);
    brightest = std::max(brightest, red);
    EXPECT_NEAR(ChannelAt(*frame.pixels, x, 156, 2), red / 2.4, 0.01);
    EXPECT_EQ(ChannelAt(*frame.pixels, x, 20, 1), 0);
  }
  EXPECT_NEAR(brightest, 0.8, 0.02) << "its colour, where nothing is beneath";
  EXPECT_NEAR(darkest, 0.64, 0.02);
}

TEST_F(DeletionsTest, UnknownPointsChangeNothingButAreSolvedOnce) {
  const std::vector<double> first = Warps();
  hosted.SetDeletions({std::uint64_t{kFrames} << 32, 9999});
  EXPECT_TRUE(hosted.Tick().ok());
  EXPECT_EQ(hosted.Status(), 7);
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_EQ(hosted.stages().Take(), "factorization crop ") << "a solve of its own";
  EXPECT_EQ(Warps(), first);
  EXPECT_EQ(MarkOf(kBackground), 1);
}

TEST_F(DeletionsTest, AChangeDuringASolveStartsAnotherAndASetBackKeepsTheWarps) {
  const std::vector<double> first = Warps();
  hosted.HoldSolve();
  hosted.SetDeletions(World::Walker());
  hosted.TickUntilHeld();
  hosted.SetDeletions({});
  {
    const std::jthread release = hosted.ReleaseSoon();
    EXPECT_TRUE(hosted.Tick().ok());
  }
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_EQ(Warps(), first);
  EXPECT_EQ(MarkOf(kBackground), 1);
}

TEST_F(DeletionsTest, WithoutAnyTrackTheClipRestsUntilTheyComeBack) {
  const std::vector<double> first = Warps();
  std::vector<std::uint64_t> all = World::Walker();
  for (std::uint64_t s = 0; s < kBackground; ++s) all.push_back(s);
  hosted.SetDeletions(all);
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_NE(Warps(), first);
  hosted.stages().Take();
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_EQ(hosted.stages().Take(), "") << "once is enough";
  hosted.SetDeletions({});
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_EQ(Warps(), first);
}

TEST_F(DeletionsTest, AProjectKnowsWhatItsSolveLeftOut) {
  hosted.SetDeletions(World::Walker());
  EXPECT_EQ(hosted.Settle(), 8);
  hosted.stages().Take();
  hosted.Save();  // and loaded where it stands
  const std::vector<double> loaded = Warps();
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_EQ(hosted.stages().Take(), "");
  hosted.SetDeletions({});
  EXPECT_TRUE(hosted.Tick().ok());
  EXPECT_EQ(hosted.Status(), 7);
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_NE(Warps(), loaded);
  EXPECT_EQ(MarkOf(kBackground), 1);
}

TEST_F(DeletionsTest, AProjectSavedDuringTheSolveSolvesItAgain) {
  const double before = Jitter();
  hosted.HoldSolve();
  hosted.SetDeletions(World::Walker());
  hosted.TickUntilHeld();
  {
    const std::jthread release = hosted.ReleaseSoon();
    hosted.Save();
  }
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_LT(Jitter(), 0.2 * before);
}

TEST_F(DeletionsTest, AnalyzeForgetsThem) {
  hosted.SetDeletions({7});
  EXPECT_EQ(hosted.Settle(), 8);
  hosted.Set(kDetailedAnalysis, 1);
  EXPECT_TRUE(hosted.Deletions().empty());
  const auto value = [this] {
    return hosted.effect().Param(hosted.deletions_index())->u.arb_d.value;
  };
  const HX_Handle empty = value();
  hosted.Set(kDetailedAnalysis, 0);
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
    EXPECT_EQ(MarkOf(static_cast<std::int32_t>(point)), -10) << name;
    EXPECT_NE(MarkOf(static_cast<std::int32_t>(point) - 1), -10) << name;
    ++point;
  }
}

}  // namespace
}  // namespace calmframe::host
