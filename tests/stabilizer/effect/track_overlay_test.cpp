#include <gtest/gtest.h>

#include <filesystem>
#include <optional>

#include "effect/parameter_row.h"
#include "platform/tesselui/save_dialog.h"
#include "tests/stabilizer/effect/shifted_clip.h"
#include "tests/support/scratch_folder.h"

namespace calmframe::host {
namespace {

constexpr double kDot = 3.14 * 5.3 * 5.3;  // pixels that a dot touches

// A solved clip of two frames whose one track is at (20, 20) and (24, 23), shown with its tracks.
class ExperimentalTrackOverlayTest : public ShiftedClipTest {
 protected:
  void SetUp() override {
    if (!kelp::effect::ShowsExperimentalParameters()) GTEST_SKIP();
    Load(kelp::effect::ShiftingWarper(kWidth, kHeight, {{0, 0}, {10, 6}}),
         {{kFraming, 1}, {kShowTracks, 1}}, Ramp, [](kelp::effect::SavedState& state) {
           marrow::tracking::AllFeatures table;
           table.frame_count = 2;
           table.feature_count = 1;
           *table.features = {{20, 20, 1, 1}, {24, 23, 0, 1}};
           KeepTable(state, table);
         });
  }
  // Pixels of a whole frame that are not the source's.
  static int Changed(const WorldBuffer& pixels) {
    EXPECT_EQ(Sides(pixels.rect()), (std::vector<int>{0, 0, kWidth, kHeight}));
    int changed = 0;
    for (int y = 0; y < kHeight; ++y) {
      for (int x = 0; x < kWidth; ++x)
        changed += std::abs(ChannelAt(pixels, x, y, 1) - x / 100.0) > 0.01;
    }
    return changed;
  }
};

TEST_F(ExperimentalTrackOverlayTest, BothPathsAndPartsShowTheInputWithItsTracksAtEveryDepth) {
  EXPECT_EQ(OrdersOf(1), 1u);
  for (const int depth : {8, 16, 32}) {
    const auto whole = DrawBoth({1, depth});
    EXPECT_NEAR(Changed(*whole), kDot, 8) << "one dot, nothing stabilized";
    const auto part = DrawBoth({1, depth, {1, 1}, HX_Rect{15, 12, 35, 26}});
    for (int i = 0; i < 14 * 20 * 4; ++i) {
      const int x = 15 + i / 4 % 20, y = 12 + i / 80;
      ASSERT_EQ(ChannelAt(*part, x, y, i % 4), ChannelAt(*whole, x, y, i % 4)) << x << " " << y;
    }
  }
}

TEST_F(ExperimentalTrackOverlayTest, ShownWhileADeletionIsSolvedAndNotOutsideTheRange) {
  const auto mark = [this](bool needs_solve, bool on_deletion) {
    hosted().Inside([=](kelp::effect::StabilizerEffect& effect) {
      effect.GetState()->needs_solve = needs_solve;
      effect.GetState()->subsequent_solve = on_deletion;
      effect.PublishSharedData();
    });
  };
  mark(true, true);
  EXPECT_NEAR(Changed(*DrawBoth({1})), kDot, 8) << "the tracks, and no banner over them";
  hosted().Set(kHideBanner, 1);
  mark(true, false);
  EXPECT_EQ(Changed(*DrawBoth({1})), 0);
  mark(false, false);
  EXPECT_NEAR(Changed(*DrawBoth({1})), kDot, 8);
  hosted().Place(1, 1);
  hosted().Inside([](kelp::effect::StabilizerEffect& effect) {
    auto table = TableOf(*effect.GetState());
    table.first_frame = 3;
    KeepTable(*effect.GetState(), table);
    effect.PublishSharedData();
  });
  EXPECT_EQ(Changed(*DrawBoth({0})), 0);
}

// The third button of the experts.
TEST_F(ExperimentalTrackOverlayTest, TheSaveButtonWritesTheTracksWhereTheUserSays) {
  const ScratchFolder folder;
  const std::string path = folder.In("clip.trk");
  tesselui::InstallSaveDialog([&](const tesselui::SaveDialogRequest& request) {
    EXPECT_EQ(request.filter, "TRK Files (*.trk)");
    EXPECT_EQ(request.default_extension, "trk");
    return std::optional<std::string>(path);
  });
  EXPECT_TRUE(hosted().Press(kSaveTracks).ok());
  EXPECT_EQ(std::filesystem::file_size(path), 20u + 16 * 2);
  EXPECT_TRUE(hosted().Enabled(kSaveTracks));
  std::filesystem::remove(path);

  tesselui::InstallSaveDialog({});  // a cancel
  EXPECT_TRUE(hosted().Press(kSaveTracks).ok());
  EXPECT_TRUE(hosted().Enabled(kSaveTracks));
  EXPECT_FALSE(std::filesystem::exists(path));
}

}  // namespace
}  // namespace calmframe::host
