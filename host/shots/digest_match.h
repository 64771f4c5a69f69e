#pragma once

#include <optional>

#include "host/shots/frame_digest.h"

namespace calmframe::host {

// In cells of a digest: what one frame shows at (x, y) the other shows at (x + shift.x, ...).
struct CellShift {
  int x = 0, y = 0;
  bool operator==(const CellShift&) const = default;
};
inline CellShift operator+(CellShift a, CellShift b) {
  return {a.x + b.x, a.y + b.y};
}
inline CellShift operator-(CellShift a, CellShift b) {
  return {a.x - b.x, a.y - b.y};
}

// The least area that holds both.
FrameDigest::Area Union(const FrameDigest::Area& a, const FrameDigest::Area& b);

struct DigestMatch {
  CellShift shift;  // from the first to the second, of the frame as a whole
  // How much of what the frames show differs once the second is laid over the first, 0 to 1: the
  // mean over blocks of the residual's share in the contrast. Light may change by a gain of the
  // frame and an offset of each block, and each block may lie a little beside the others. Blocks
  // without contrast count for little; two frames without any are alike.
  double difference = 0;
  // The same of the third of the blocks (by what they weigh) that are most alike: a thing that
  // comes into the picture changes the rest of it little.
  double common = 0;
};

// Looks for shifts by up to half of the frame, so that frames of a quick pan are laid over each
// other. Some 0.1 ms.
DigestMatch MatchOf(const FrameDigest& first, const FrameDigest& second);

// The difference that is left when the light is taken to have changed by any curve of tones, so
// when a lamp goes on and part of the picture is too bright to be seen: at most match.difference,
// which is of the same frames. Some 0.2 ms.
double DifferenceButForLight(const FrameDigest& first, const FrameDigest& second,
                             const DigestMatch& match);

// What the first frame leaves of the second's contrast at its best place, about the one that the
// motion from frame to frame gives: a share of its square, 0 to 1. None where they share less than
// half of the frame.
std::optional<double> LeftAlone(const FrameDigest& first, const FrameDigest& second,
                                CellShift second_from_first);

// A frame as first_weight * A + second_weight * B + an offset, by least squares over where both
// lie, each at its best place. What is left over is a share of the frame's contrast, 0 to 1.
struct Mixture {
  double first_weight = 0, second_weight = 0;
  double left = 1;                         // by both
  double first_left = 1, second_left = 1;  // by A alone, by B alone
};

// Where A and B lie in the frame is looked for about the places that the motion from frame to frame
// gives. `worth`: nothing is fitted where A or B alone leave less than that. None where A and B
// share less than half of the frame with it.
std::optional<Mixture> MixtureOf(const FrameDigest& a, const FrameDigest& frame,
                                 const FrameDigest& b, CellShift frame_from_a,
                                 CellShift frame_from_b, double worth);

}  // namespace calmframe::host
