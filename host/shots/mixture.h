#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>

#include "host/shots/digest_match.h"
#include "host/shots/frame_digest.h"

namespace calmframe::host {

// A digest's cells less the mean of those about them: where the edges of things are, without the
// light and without what all pictures have alike, as a bright sky. Another scene's have nothing to
// do with it. Nothing outside of the digest's area.
struct FrameDetail {
  // Cells are kept in quarters of a 255th. The square of one's that says nothing: noise, a coder.
  static constexpr int kUnit = 4;
  static constexpr double kNothing = kUnit * kUnit;
  std::array<std::int16_t, FrameDigest::kColumns * FrameDigest::kRows> cells;
  // The means of four, as FrameDigest::half.
  std::array<std::int16_t, FrameDigest::kHalfColumns * FrameDigest::kHalfRows> half;
  FrameDigest::Area area;
  // Sums of squares over all cells above and to the left, a row and a column more than cells,
  // modulo 2^32: of any rectangle's squares, which are less, the difference of four is right.
  std::array<std::uint32_t, (FrameDigest::kColumns + 1) * (FrameDigest::kRows + 1)> squares;
  std::array<std::uint32_t, (FrameDigest::kHalfColumns + 1) * (FrameDigest::kHalfRows + 1)>
      half_squares;
  // The sum over an area, of which nothing lies outside of the frame.
  double SquareIn(const FrameDigest::Area& within) const;
};
FrameDetail DetailOf(const FrameDigest& digest);

// What is left of a frame's detail when another's is laid over it, at its best place and with the
// best weight, each part of it moved a little beside the others: a share of its square, 0 to 1. All
// parts that have any detail count alike.
struct Laid {
  CellShift shift;  // of the frame as a whole, from the other
  double left = 1;
};
// Looks about a shift. None where less than half of the frame is in both.
std::optional<Laid> Lay(const FrameDetail& other, const FrameDetail& frame, CellShift about);

// A frame's detail as first_weight * A + second_weight * B, by least squares over where both lie.
struct Mixture {
  double first_weight = 0, second_weight = 0;
  double left = 1;  // by both
  // By A or B alone, laid over the frame twice: where things at two depths move against each other
  // any two pictures explain more than one.
  double first_left = 1, second_left = 1;
};
// `a`, `b`: how each of them lies alone. None where less than a third of the frame is in both.
std::optional<Mixture> MixtureOf(const FrameDetail& first, const Laid& a, const FrameDetail& frame,
                                 const FrameDetail& second, const Laid& b);

}  // namespace calmframe::host
