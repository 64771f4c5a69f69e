#include "analysis/src/run_piece.h"

#include <gtest/gtest.h>

#include <cstring>
#include <set>

#include "synthetic/drawn_frames.h"

namespace kelp::analysis {
namespace {

using marrow::tracking::AllFeatures;
using marrow::tracking::RunState;
using tessel::utility::Guid;

const Guid kRun = Guid::FromText("a run");

// A short walk down a street, with few features.
struct Walk {
  Walk() {
    synthetic::scene_options options;
    options.width = 160;
    options.height = 90;
    options.frame_count = 24;
    options.occluder = true;
    world.emplace(synthetic::street(1), synthetic::handheld_path({}), options);
    source.emplace(*world);
    selector.max_count = 60;
    selector.spacing = 6;
    tracker.pyramidal_levels = 3;
  }
  std::optional<synthetic::scene> world;
  std::optional<synthetic::scene_frame_source> source;
  marrow::tracking::SelectorParams selector;
  marrow::tracking::TrackerParams tracker;
};

// Keeps a piece behind each of these rows.
class Keeper final : public marrow::tracking::RunWatcher {
 public:
  Keeper(const AllFeatures& table, std::set<std::size_t> rows) : table_(table), rows_(rows) {}
  bool Wants(std::size_t rows) override { return rows_.count(rows) > 0; }
  void Take(const RunState& state) override {
    pieces.push_back(PackRunPiece(kRun, table_, first_, state));
    first_ = state.rows;
  }
  std::vector<Bytes> pieces;

 private:
  const AllFeatures& table_;
  const std::set<std::size_t> rows_;
  std::size_t first_ = 0;
};

bool Same(const AllFeatures& a, const AllFeatures& b) {
  return a.features->size() == b.features->size() &&
         std::memcmp(a.features->data(), b.features->data(),
                     a.features->size() * sizeof(*a.features->data())) == 0;
}

AllFeatures EmptyTableLike(const AllFeatures& table) {
  AllFeatures empty;
  empty.feature_count = table.feature_count;
  empty.frame_count = table.frame_count;
  empty.features->resize(table.features->size());
  return empty;
}

TEST(RunPieceTest, ARunGoesOnFromAnyPieceToTheSameBits) {
  for (const bool verifies : {true, false}) {
    Walk walk;
    walk.tracker.affine_verification = verifies;
    AllFeatures whole;
    Keeper keeper(whole, {1, 2, 9, 23});
    TrackFrames(*walk.source, walk.selector, walk.tracker, whole, nullptr, &keeper);
    ASSERT_EQ(keeper.pieces.size(), 4u);
    std::set<std::int32_t> seeds;
    for (const auto& cell : *whole.features) seeds.insert(cell.status);
    ASSERT_GT(seeds.size(), 12u) << "tracks begin in many frames";

    AllFeatures table = EmptyTableLike(whole);
    RunState state;
    for (const Bytes& piece : keeper.pieces) {
      ASSERT_TRUE(TakeRunPiece(kRun, piece, table, state));
      AllFeatures gone_on = EmptyTableLike(whole);
      *gone_on.features = *table.features;
      GoOnTracking(*walk.source, walk.selector, walk.tracker, gone_on, state);
      EXPECT_TRUE(Same(gone_on, whole)) << "from row " << state.rows << ", " << verifies;
    }
  }
}

TEST(RunPieceTest, WhatIsTornOrOfAnotherRunIsPassedOver) {
  Walk walk;
  AllFeatures whole;
  Keeper keeper(whole, {3, 6});
  TrackFrames(*walk.source, walk.selector, walk.tracker, whole, nullptr, &keeper);
  AllFeatures table = EmptyTableLike(whole);
  RunState state;
  const auto refused = [&](const Guid& run, const Bytes& piece) {
    const std::size_t before = state.rows;
    return !TakeRunPiece(run, piece, table, state) && state.rows == before;
  };
  const Bytes &first = keeper.pieces[0], &second = keeper.pieces[1];
  EXPECT_TRUE(refused(kRun, second)) << "does not follow";
  EXPECT_TRUE(refused(Guid::FromText("another"), first));
  EXPECT_TRUE(refused(kRun, {}));
  for (std::size_t size = 0; size < first.size(); size += 97) {
    EXPECT_TRUE(refused(kRun, Bytes(first.begin(), first.begin() + static_cast<int>(size))));
    Bytes damaged = first;
    damaged[size] ^= 4;
    EXPECT_TRUE(refused(kRun, damaged)) << size;
  }
  ASSERT_TRUE(TakeRunPiece(kRun, first, table, state));
  EXPECT_EQ(state.rows, 3u);
  EXPECT_TRUE(refused(kRun, first));
  AllFeatures shorter = EmptyTableLike(whole);
  shorter.frame_count = 6;
  EXPECT_FALSE(TakeRunPiece(kRun, second, shorter, state)) << "no row is left";
  EXPECT_TRUE(TakeRunPiece(kRun, second, table, state));
}

}  // namespace
}  // namespace kelp::analysis
