#include "host/shots/cut_rule.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <vector>

namespace calmframe::host {
namespace {

// All figures about differences are of DigestMatch. Where they come from: five clips of 65 to 495
// frames (walking, a telephoto pan, a drive, a room, a phone's pan), 414 cuts between pieces of
// them, a third of these within one clip; and the clips with titles, lamps, whip pans and near
// things that go by drawn into them. No frame of the clips differs from the one before by more than
// 0.092; of the cuts nine by less.
constexpr double kLeast = 0.08;
// The odds of the difference above those of the frames about it: 1.65 at most within the clips, 2.0
// in a whip pan, 2.2 and more at all cuts but two.
constexpr double kAbove = 2.05;
// Odds that count as no motion at all: a picture that stands has any ratio.
constexpr double kStill = 0.015, kCommonStill = 0.004;
// Either the picture jumps, by so many cells beside the motion of the frames about it, 0 or 1 where
// a title comes and up to 3 in a whip pan; or it changes everywhere: the odds of what its most
// alike parts differ above those about it, 3.2 at most where a title comes, 2.1 at most where one
// comes that changes much.
constexpr int kJump = 4;
constexpr double kEverywhere = 3.2, kEverywhereOfMuch = 2.6, kMuch = 0.2;
// But for the light the picture is the same, where a lamp goes on.
constexpr double kLit = 0.5, kLitLeast = 0.15;
// A flash is over after so many frames at most; the shortest shot is longer.
constexpr std::int64_t kLongestFlash = 4;

double Odds(double difference) {
  return difference / (1 - std::min(difference, 0.98));
}

// How much frames differ from one to the next about one: the frames beside it and, because shake
// and a whip pan come and go, three quarters of what their neighbours do, but for the sharpest
// quarter of these, which may be cuts.
double LevelAbout(const FrameHistory& history, std::int64_t frame, double DigestMatch::*measure) {
  constexpr std::int64_t kAbout = 7;
  std::vector<double> others;
  for (std::int64_t f = frame - kAbout; f <= frame + kAbout; ++f) {
    if (std::abs(f - frame) > 1 && history.Holds(f) && f > 0) {
      others.push_back(history.match(f).*measure);
    }
  }
  double level = std::max(history.match(frame - 1).*measure, history.match(frame + 1).*measure);
  if (!others.empty()) {
    const auto at = others.begin() + static_cast<std::ptrdiff_t>(others.size() * 3 / 4);
    std::nth_element(others.begin(), at, others.end());
    level = std::max(level, 0.75 * *at);
  }
  return level;
}

// By how much the picture's motion to a frame is unlike that to any of the four about it.
int JumpAt(const FrameHistory& history, std::int64_t frame) {
  const CellShift shift = history.match(frame).shift;
  int x = FrameDigest::kColumns, y = FrameDigest::kRows;
  for (const std::int64_t f : {frame - 2, frame - 1, frame + 1, frame + 2}) {
    if (!history.Holds(f) || f < 1) continue;
    const CellShift off = shift - history.match(f).shift;
    x = std::min(x, std::abs(off.x));
    y = std::min(y, std::abs(off.y));
  }
  return std::max(x, y);
}

// The least difference of any frame from `a` to `a_last` to any from `b` to `b_last`.
double LeastBetween(const FrameHistory& history, std::int64_t a, std::int64_t a_last,
                    std::int64_t b, std::int64_t b_last) {
  double least = 1;
  for (std::int64_t i = a; i <= a_last; ++i) {
    for (std::int64_t j = b; j <= b_last; ++j) {
      if (history.Holds(i) && history.Holds(j)) {
        least = std::min(least, history.Difference(i, j));
      }
    }
  }
  return least;
}

// A flash, a frame that was decoded wrongly: there are two edges, the frame's and another or one on
// either side of it, and beyond both the picture goes on.
bool Returns(const FrameHistory& history, std::int64_t frame, double difference) {
  // What is left of a change that fades, a flash's, at its other edge.
  constexpr double kOtherEdge = 0.4;
  // Of the change, what the picture may move in the meantime.
  constexpr double kSame = 0.7;
  const auto is_edge = [&](std::int64_t f) {
    return f > 0 && history.difference(f) > kOtherEdge * difference;
  };
  for (std::int64_t start = frame - kLongestFlash; start <= frame; ++start) {
    if (!is_edge(start)) continue;
    for (std::int64_t end = std::max(start + 1, frame); end <= start + kLongestFlash; ++end) {
      if (is_edge(end) &&
          LeastBetween(history, start - 2, start - 1, end, end + 1) < kSame * difference) {
        return true;
      }
    }
  }
  return false;
}

// The dark middle of a fade without a frame of black: contrast falls to it and rises from it.
bool IsInDip(const FrameHistory& history, std::int64_t frame) {
  constexpr double kSlope = 1.3;
  const double before = history.contrast(frame - 1), behind = history.contrast(frame);
  if (before < kPlain || behind < kPlain) return true;
  return history.Holds(frame - 3) && history.Holds(frame + 2) &&
         history.contrast(frame - 3) > kSlope * before &&
         history.contrast(frame + 2) > kSlope * behind;
}

}  // namespace

std::optional<double> CutAt(const FrameHistory& history, std::int64_t frame) {
  if (history.difference(frame) < kLeast || IsInDip(history, frame)) return {};
  // One frame that is like the other side, a repeated one say, is enough against a cut.
  const DigestMatch match = history.match(frame);
  const double lit = DifferenceButForLight(history.digest(frame - 1), history.digest(frame), match);
  const double difference =
      std::min(lit, LeastBetween(history, frame - 2, frame - 1, frame, frame + 1));
  const double above =
      Odds(difference) / (kStill + Odds(LevelAbout(history, frame, &DigestMatch::difference)));
  const double margin = std::min(difference / kLeast, above / kAbove);
  if (margin < 1) return {};
  const int jump = JumpAt(history, frame);
  if (lit < kLit * match.difference && lit < kLitLeast && jump < kJump) return {};
  const double everywhere =
      Odds(match.common) / (kCommonStill + Odds(LevelAbout(history, frame, &DigestMatch::common)));
  if (jump < kJump && everywhere < (difference < kMuch ? kEverywhere : kEverywhereOfMuch))
    return {};
  if (Returns(history, frame, difference)) return {};
  return 1 - 0.5 / margin;
}

}  // namespace calmframe::host
