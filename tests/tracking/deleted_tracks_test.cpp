#include "tracking/deleted_tracks.h"

#include <gmock/gmock.h>

#include <vector>

namespace marrow::tracking {
namespace {

using ::testing::ElementsAre;

// Rows of statuses, from absolute frame 100 on. Slot 0: a track of three cells, a gap, a track of
// two. Slot 1: a track that ends under a seed. Slot 2: cells before the first seed.
AllFeatures Table() {
  constexpr std::int32_t rows[][3] = {{1, 1, -1}, {0, 0, -1}, {0, 3, 3},
                                      {-2, 0, 0}, {5, 0, -3}, {0, 0, -1}};
  AllFeatures table;
  table.feature_count = 3;
  table.first_frame = 100;
  for (const auto& row : rows) {
    for (const std::int32_t status : row) {
      table.features->push_back({1.5f, 2.5f, status, 0.75f});
    }
    ++table.frame_count;
  }
  return table;
}

// The same as saved work has it.
AllFeatures Packed(const AllFeatures& table) {
  const auto packed = boost::make_shared<PackedCells>(3);
  for (std::size_t row = 0; row < 6; ++row) {
    packed->AppendPositions(std::vector<std::int32_t>{48, 48, 48, 80, 80, 80});
    std::vector<std::int32_t> statuses;
    for (std::size_t s = 0; s < 3; ++s) statuses.push_back((*table.features)[3 * row + s].status);
    packed->SetStatuses(row, statuses);
  }
  AllFeatures result = table;
  result.features = boost::make_shared<TrackCells>();
  result.packed = packed;
  return result;
}

std::vector<std::int32_t> Column(const AllFeatures& table, std::int32_t slot) {
  std::vector<std::int32_t> statuses;
  for (std::int32_t row = 0; row < table.frame_count; ++row) {
    statuses.push_back(
        (*CellsOf(table))[static_cast<std::size_t>(row * table.feature_count + slot)].status);
  }
  return statuses;
}

// Whether the cells are packed or not.
class DeletedTracksTest : public ::testing::TestWithParam<bool> {
 protected:
  const AllFeatures table = GetParam() ? Packed(Table()) : Table();
};
INSTANTIATE_TEST_SUITE_P(Cells, DeletedTracksTest, ::testing::Bool());

TEST_P(DeletedTracksTest, APointAnywhereDeletesItsWholeTrackAndNoOther) {
  for (const std::int32_t frame : {100, 101, 102}) {
    const AllFeatures marked = ApplyDeletedTrackPoints(table, {{frame, 0}});
    EXPECT_THAT(Column(marked, 0), ElementsAre(-10, -11, -11, -2, 5, 0)) << frame;
    EXPECT_THAT(Column(marked, 1), ElementsAre(1, 0, 3, 0, 0, 0));
    EXPECT_THAT(DeletedSeeds(marked), ElementsAre(TrackPoint{100, 0}));
    EXPECT_EQ((*CellsOf(marked))[3].x, 1.5f) << "positions stay";
  }
  EXPECT_THAT(Column(table, 0), ElementsAre(1, 0, 0, -2, 5, 0)) << "the given cells stay";
  // Of two tracks without a gap between them, and of a track that has ended.
  EXPECT_THAT(Column(ApplyDeletedTrackPoints(table, {{101, 1}}), 1),
              ElementsAre(-10, -11, 3, 0, 0, 0));
  EXPECT_THAT(Column(ApplyDeletedTrackPoints(table, {{105, 1}}), 1),
              ElementsAre(1, 0, -10, -11, -11, -11));
  EXPECT_THAT(Column(ApplyDeletedTrackPoints(table, {{103, 0}}), 0),
              ElementsAre(-10, -11, -11, -2, 5, 0));
}

TEST_P(DeletedTracksTest, PointsOffEveryTrackDeleteNothing) {
  const TrackPoints off = {{99, 0}, {106, 0}, {101, 2}, {101, 3}, {101, -1}, {-2147483647 - 1, 0}};
  EXPECT_TRUE(SeedsOf(table, off).empty());
  const AllFeatures same = ApplyDeletedTrackPoints(table, off);
  EXPECT_EQ(same.features, table.features);
  EXPECT_EQ(same.packed, table.packed);
  EXPECT_TRUE(SeedsOf(AllFeatures(), {{0, 0}}).empty());
}

TEST_P(DeletedTracksTest, TheLastSetAloneDecides) {
  const AllFeatures both = ApplyDeletedTrackPoints(table, {{101, 0}, {104, 0}, {102, 2}});
  EXPECT_THAT(Column(both, 0), ElementsAre(-10, -11, -11, -2, -10, -11));
  EXPECT_THAT(Column(both, 2), ElementsAre(-1, -1, -10, -11, -3, -1));
  EXPECT_TRUE(BuildTrajectories(CellsOf(both)->data(), 3, 6).size() == 2u) << "those of slot 1";
  // A point of a deleted track, wherever it lies, names the same track as before.
  const AllFeatures same = ApplyDeletedTrackPoints(both, {{100, 0}, {105, 0}, {103, 2}});
  EXPECT_EQ(same.features, both.features);
  EXPECT_EQ(same.packed, both.packed);
  const AllFeatures one = ApplyDeletedTrackPoints(both, {{102, 0}});
  EXPECT_THAT(Column(one, 0), ElementsAre(-10, -11, -11, -2, 1, 0));
  const AllFeatures none = ApplyDeletedTrackPoints(one, {});
  EXPECT_THAT(Column(none, 0), ElementsAre(1, 0, 0, -2, 1, 0)) << "a seed comes back as 1";
  EXPECT_THAT(Column(none, 2), ElementsAre(-1, -1, 1, 0, -3, -1));
}

}  // namespace
}  // namespace marrow::tracking
