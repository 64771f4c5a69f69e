#include "studio/worker/lasso.h"

#include <gmock/gmock.h>

#include <vector>

#include "tests/support/given_frames.h"

namespace calmframe::studio {
namespace {

using host::TrackPoint;
using testing::ElementsAre;
using testing::IsEmpty;

// A frame of 100 x 50, three slots, four rows from frame 10 on. Slot 0: a track that walks right,
// 20 pixels a row. Slot 1: one that stands at (50, 25) for two rows, then another one at (9, 9).
// Slot 2: one that is deleted, and behind it none.
host::SolvedClip Tracked() {
  host::SolvedClip clip;
  clip.source_width = 100;
  clip.source_height = 50;
  clip.first_frame = 10;
  clip.frame_count = 4;
  clip.slots = 3;
  host::GivenFrames& given = host::GivenFrames::In(clip);
  given.statuses = {1, 1, -10, 0, 0, -11, 0, 3, -1, 0, 0, -1};
  given.tracks = {{9.5, 4.5},  {49.5, 24.5}, {49.5, 24.5}, {29.5, 4.5}, {49.5, 24.5}, {49.5, 24.5},
                  {49.5, 4.5}, {8.5, 8.5},   {},           {69.5, 4.5}, {8.5, 8.5},   {}};
  return clip;
}

std::vector<TrackPoint> Points(const Lasso& lasso, int fields = 1) {
  std::vector<TrackPoint> points;
  for (const LassoedTrack& track : TracksIn(lasso, Tracked(), fields))
    points.push_back(track.point);
  return points;
}

TEST(LassoTest, HoldsWhatIsInsideInItsFrameOrInAny) {
  const std::vector<host::Point> right = {{0.45, 0}, {1, 0}, {1, 1}, {0.45, 1}};
  EXPECT_THAT(Points({10, right}), ElementsAre(TrackPoint{10, 1}));
  EXPECT_THAT(Points({12, right}), ElementsAre(TrackPoint{12, 0}));
  EXPECT_THAT(Points({12, right, true}), ElementsAre(TrackPoint{10, 1}, TrackPoint{12, 0}));
  const std::vector<host::Point> all;
  EXPECT_THAT(Points({12, all, true}),
              ElementsAre(TrackPoint{10, 0}, TrackPoint{10, 1}, TrackPoint{12, 1}));
  EXPECT_THAT(Points({9, all}), IsEmpty());
  EXPECT_THAT(Points({14, all}), IsEmpty());
  EXPECT_THAT(Points({-1000000000000, all}), IsEmpty());
  // Of an interlaced clip frame 5 is the first two rows.
  EXPECT_THAT(Points({5, all}, 2), ElementsAre(TrackPoint{10, 0}, TrackPoint{10, 1}));
  const auto found = TracksIn({10, right}, Tracked(), 1);
  EXPECT_EQ(found[0].place, (host::Point{0.5, 0.5}));
}

TEST(LassoTest, AShapeThatIsHollowedOutAndOneThatCrossesItself) {
  // A U around (0.5, 0.5), which lies in its opening.
  const std::vector<host::Point> u = {{0.2, 0.2}, {0.4, 0.2}, {0.4, 0.8}, {0.6, 0.8},
                                      {0.6, 0.2}, {0.8, 0.2}, {0.8, 0.9}, {0.2, 0.9}};
  EXPECT_THAT(Points({10, u}), IsEmpty());
  // A star of five points in one stroke: its middle is gone around twice.
  const std::vector<host::Point> star = {
      {0.5, 0.1}, {0.74, 0.82}, {0.12, 0.38}, {0.88, 0.38}, {0.26, 0.82}};
  EXPECT_THAT(Points({10, star}), IsEmpty());
  // A bow tie, whose left wing holds (0.1, 0.1).
  const std::vector<host::Point> tie = {{0, 0}, {0, 0.2}, {0.4, 0}, {0.4, 0.2}};
  EXPECT_THAT(Points({10, tie}), ElementsAre(TrackPoint{10, 0}));
}

}  // namespace
}  // namespace calmframe::studio
