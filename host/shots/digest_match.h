#pragma once

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

}  // namespace calmframe::host
