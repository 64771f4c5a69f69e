#include "tracking/track_store.h"

#include <gmock/gmock.h>

#include <sstream>
#include <string>
#include <vector>

namespace marrow::tracking {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

// A table of statuses: a row for each frame, a column for each slot. x is 10 * frame + slot.
AllFeatures Table(const std::vector<std::vector<std::int32_t>>& rows) {
  AllFeatures table;
  for (const auto& row : rows) {
    table.feature_count = 0;
    for (const std::int32_t status : row) {
      const float x = 10.0f * table.frame_count + table.feature_count++;
      table.features->push_back({x, 5.0f, status, 0.9f});
    }
    ++table.frame_count;
  }
  return table;
}

std::vector<std::string> Tracks(const AllFeatures& table) {
  std::vector<std::string> found;
  for (const Trajectory& t :
       BuildTrajectories(table.features->data(), table.feature_count, table.frame_count)) {
    std::ostringstream text;
    text << t.feature << ": " << t.first << "-" << t.last;
    found.push_back(text.str());
  }
  return found;
}

TEST(BuildTrajectoriesTest, OrderedBySeedFrameThenSlot) {
  EXPECT_THAT(Tracks(Table({{1, 1, -1}, {0, 0, 2}, {-3, 0, 0}, {4, 0, 0}})),
              ElementsAre("0: 0-2", "1: 0-4", "2: 1-4", "0: 3-4"));
  // A seed under a seed ends the earlier track; deleted and dead cells start nothing.
  EXPECT_THAT(Tracks(Table({{1}, {2}, {3}, {0}})), ElementsAre("0: 0-1", "0: 1-2", "0: 2-4"));
  EXPECT_THAT(Tracks(Table({{-10, -1, 0}, {-11, 0, 0}})), IsEmpty());
  EXPECT_THAT(Tracks(AllFeatures()), IsEmpty());
}

TEST(RemoveShortTracksTest, OfTheLimitStaysShorterGoesLeavingYAndCorrelation) {
  AllFeatures table = Table({{1, 1, 1}, {0, 0, -2}, {0, -4, -1}});
  RemoveShortTracks(table, 3);
  EXPECT_THAT(Tracks(table), ElementsAre("0: 0-3"));
  const auto& removed = (*table.features)[4];
  EXPECT_EQ(removed.status, -4);
  EXPECT_EQ(removed.x, 0.0f);
  EXPECT_EQ(removed.y, 5.0f);
  EXPECT_EQ(removed.correlation, 0.9f);
  EXPECT_EQ((*table.features)[5].status, -2);  // the cell behind a track stays as it was
  for (const std::int32_t limit : {0, 1, -3}) {
    AllFeatures short_ones = Table({{1, 1}, {2, 0}});
    RemoveShortTracks(short_ones, limit);
    EXPECT_THAT(Tracks(short_ones), ElementsAre("0: 0-1", "1: 0-2", "0: 1-2")) << limit;
  }
}

}  // namespace
}  // namespace marrow::tracking
