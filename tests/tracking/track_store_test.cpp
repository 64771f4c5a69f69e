#include "tracking/track_store.h"

#include <gmock/gmock.h>

#include <sstream>
#include <string>
#include <vector>

namespace marrow::tracking {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

// A table from text: a row for each frame, a column for each slot, entries are statuses. x is 10 *
// frame + slot.
AllFeatures Table(const std::string& text) {
  AllFeatures table;
  std::stringstream rows(text);
  for (std::string row; std::getline(rows, row);) {
    std::stringstream entries(row);
    std::int32_t slot = 0;
    for (std::int32_t status; entries >> status; ++slot) {
      table.features->push_back({10.0f * table.frame_count + slot, 5.0f, status, 0.9f});
    }
    table.feature_count = slot;
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
  EXPECT_THAT(Tracks(Table("1 1 -1\n"
                           "0 0 2\n"
                           "-3 0 0\n"
                           "4 0 0\n")),
              ElementsAre("0: 0-2", "1: 0-4", "2: 1-4", "0: 3-4"));
  // A seed under a seed ends the earlier track; deleted and dead cells start nothing.
  EXPECT_THAT(Tracks(Table("1\n2\n3\n0\n")), ElementsAre("0: 0-1", "0: 1-2", "0: 2-4"));
  EXPECT_THAT(Tracks(Table("-10 -1 0\n-11 0 0\n")), IsEmpty());
  EXPECT_THAT(Tracks(AllFeatures()), IsEmpty());
}

TEST(RemoveShortTracksTest, OfTheLimitStaysShorterGoesLeavingYAndCorrelation) {
  AllFeatures table = Table("1 1 1\n0 0 -2\n0 -4 -1\n");
  RemoveShortTracks(table, 3);
  EXPECT_THAT(Tracks(table), ElementsAre("0: 0-3"));
  const auto& removed = (*table.features)[4];
  EXPECT_EQ(removed.status, -4);
  EXPECT_EQ(removed.x, 0.0f);
  EXPECT_EQ(removed.y, 5.0f);
  EXPECT_EQ(removed.correlation, 0.9f);
  EXPECT_EQ((*table.features)[5].status, -2);  // the cell behind a track stays as it was
  for (const std::int32_t limit : {0, 1, -3}) {
    AllFeatures short_ones = Table("1 1\n2 0\n");
    RemoveShortTracks(short_ones, limit);
    EXPECT_THAT(Tracks(short_ones), ElementsAre("0: 0-1", "1: 0-2", "0: 1-2")) << limit;
  }
}

}  // namespace
}  // namespace marrow::tracking
