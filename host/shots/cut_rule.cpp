#include "host/shots/cut_rule.h"

#include <algorithm>
#include <cmath>
#include <vector>

namespace calmframe::host {
namespace {

// All figures about differences are of DigestMatch::difference. Where they come from: of five
// clips of 65 to 495 frames (walking, a telephoto pan, a drive, a room, a phone's pan) no frame
// differed from the one before by more than 0.092, and of 230 cuts between pieces of them, a third
// within one clip, none by less than 0.10.
constexpr double kLeast = 0.09;
// The odds of the difference above those of the frames about it: 1.65 at most within these clips,
// 2.1 and more at the cuts.
constexpr double kAbove = 1.9;
// Odds that count as no motion at all: a picture that stands has any ratio.
constexpr double kStill = 0.015;
// A flash is over after so many frames at most; the shortest shot is longer.
constexpr std::int64_t kLongestFlash = 4;

double Odds(double difference) {
  return difference / (1 - std::min(difference, 0.98));
}

// How much the frames about it differ from one to the next: the frames beside it and, because shake
// and a whip pan come and go, three quarters of what their neighbours do, but for the sharpest
// quarter of these, which may be cuts.
double LevelAbout(const FrameHistory& history, std::int64_t frame) {
  constexpr std::int64_t kAbout = 7;
  std::vector<double> others;
  for (std::int64_t f = frame - kAbout; f <= frame + kAbout; ++f) {
    if (std::abs(f - frame) > 1 && history.Holds(f) && f > 0) {
      others.push_back(history.difference(f));
    }
  }
  double level = std::max(history.difference(frame - 1), history.difference(frame + 1));
  if (!others.empty()) {
    const auto at = others.begin() + static_cast<std::ptrdiff_t>(others.size() * 3 / 4);
    std::nth_element(others.begin(), at, others.end());
    level = std::max(level, 0.75 * *at);
  }
  return level;
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

// A flash, a frame that was decoded wrongly: there is another edge, and beyond both the picture
// goes on.
bool Returns(const FrameHistory& history, std::int64_t frame, double difference) {
  // What is left of a change that fades, a flash's, at its other edge.
  constexpr double kOtherEdge = 0.4;
  constexpr double kSame = 0.5;  // of the change
  for (std::int64_t n = 1; n <= kLongestFlash; ++n) {
    for (const std::int64_t other : {frame - n, frame + n}) {
      if (other < 1 || !history.Holds(other)) continue;
      if (history.difference(other) < kOtherEdge * difference) continue;
      const std::int64_t start = std::min(frame, other), end = std::max(frame, other);
      if (LeastBetween(history, start - 2, start - 1, end, end + 1) < kSame * difference) {
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
  const double difference = LeastBetween(history, frame - 2, frame - 1, frame, frame + 1);
  const double above = Odds(difference) / (kStill + Odds(LevelAbout(history, frame)));
  const double margin = std::min(difference / kLeast, above / kAbove);
  if (margin < 1 || Returns(history, frame, difference)) return {};
  return 1 - 0.5 / margin;
}

}  // namespace calmframe::host
