#pragma once

#include <cstdint>
#include <vector>

#include "host/effects/track_point.h"
#include "host/stabilize/solved_clip.h"

// Which tracks of a clip are of the background, and which of a near subject that moves by itself: a
// person in front, a face, an arm.
namespace calmframe::host {

enum class MotionGroup : std::uint8_t { unsure, background, subject };

struct GroupedTrack {
  int row = 0, slot = 0;  // where it begins, as SolvedClip counts them
  MotionGroup group = MotionGroup::unsure;
};

struct MotionGroups {
  std::vector<GroupedTrack> tracks;  // all, by row, then by slot
  // Whether there is a second motion that explains enough of the tracks and clearly better than the
  // background's. If not, all tracks are the background's, also those that nothing explains.
  bool has_subject = false;
  // What that was judged by: of the tracks that one motion doesn't explain how far they go, from
  // one frame to the next, from where the background's motion takes them, and from where their own
  // does. Root mean squares in thousandths of the width, above 6 taken for 6.
  double miss_of_background = 0, miss_of_subject = 0;
  // Share of the frame over which a group's tracks are spread, 0 to 1: of 8 x 5 cells those in
  // which there is one of them, mean over all frames.
  double background_cover = 0, subject_cover = 0;
};

// By two motions from each frame to the one before, and by which of them each track keeps to over
// its whole life: a mixture, fitted by expectation and maximization (McLachlan and Peel, Finite
// Mixture Models, 2000). The background is the motion that reaches further along the frame's upper
// and lateral edges; people stand on the lower one. Deleted tracks count like all others: what is
// found doesn't change when one of the groups is deleted. The same for any number of processors, of
// which it uses all.
MotionGroups FindMotionGroups(const SolvedClip& clip);

// A point on each track of that group, as Effect::DeleteTracks takes them.
std::vector<TrackPoint> TracksOf(const SolvedClip& clip, const MotionGroups& groups,
                                 MotionGroup group);

}  // namespace calmframe::host
