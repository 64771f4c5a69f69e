#include "host/shots/dissolve_search.h"

#include <algorithm>
#include <cmath>

namespace calmframe::host {
namespace {

// Half the frames that a mixture is looked for over, in steps: a dissolve of any length is one over
// its parts too, but over short ones it changes little, and over long ones shake adds up.
constexpr std::int64_t kWidths[] = {2, 4, 8, 14, 20};

// Where the figures come from: five clips and 50 dissolves of 12 to 40 frames between pieces of
// them, a quarter of these within one clip.
// What either frame alone must leave of the one between: less is a picture that moved a little.
constexpr double kAlone = 0.06;
// What the mixture may leave of that: 0.04 to 0.35 in dissolves.
constexpr double kLeft = 0.4;
// The weights' sum: light may change a little on the way.
constexpr double kSum[2] = {0.7, 1.3};
// The share of the frame behind: in the middle the mixture tells most.
constexpr double kShare[2] = {0.25, 0.75};
// By how much it grows over each half of the way, at least; a third to a half it should be.
constexpr double kGrowth = 0.08;
// Strength: see HitAt. Outside of dissolves 0.24 at most, over a pan across a repeated pattern;
// 0.3 to 2 in all dissolves between different places.
constexpr double kStrong = 0.3;
constexpr double kWeak = 0.06;  // is still a part of a dissolve

double ShareOf(const Mixture& m) {
  return m.second_weight / (m.first_weight + m.second_weight);
}

std::optional<Mixture> MixtureAt(const FrameHistory& history, std::int64_t a, std::int64_t frame,
                                 std::int64_t b, double worth) {
  return MixtureOf(history.digest(a), history.digest(frame), history.digest(b),
                   history.Motion(a, frame), history.Motion(b, frame), worth);
}

struct Ramp {
  double start = 0, end = 0;  // frames where the share leaves 0 and reaches 1
};

// The straight ramp from 0 to 1 that fits the shares best, by least squares over all pairs of
// frames.
Ramp FitRamp(const std::vector<double>& shares, std::int64_t first, std::int64_t step) {
  Ramp best;
  double least = 1e30;
  const auto n = static_cast<std::int64_t>(shares.size());
  for (std::int64_t i = 0; i < n; ++i) {
    for (std::int64_t j = i + 1; j < n; ++j) {
      double sum = 0;
      for (std::int64_t k = 0; k < n; ++k) {
        const double share = shares[static_cast<std::size_t>(k)];
        if (std::isnan(share)) continue;
        const double ramp =
            std::clamp(static_cast<double>(k - i) / static_cast<double>(j - i), 0.0, 1.0);
        sum += (share - ramp) * (share - ramp);
      }
      if (sum < least) {
        least = sum;
        best = {static_cast<double>(first + step * i), static_cast<double>(first + step * j)};
      }
    }
  }
  return best;
}

}  // namespace

DissolveSearch::DissolveSearch(double frames_per_second)
    // A tenth of a frame's time more at 240 frames a second and above: there it looks at every
    // eighth frame.
    : step_(std::clamp<std::int64_t>(std::llround(frames_per_second / 30), 1, 8)) {}

std::optional<DissolveSearch::Hit> DissolveSearch::HitAt(const FrameHistory& history,
                                                         std::int64_t frame, std::int64_t first,
                                                         std::int64_t end) const {
  Hit best{frame, 0, first, end, 0};
  for (const std::int64_t steps : kWidths) {
    const std::int64_t width = steps * step_;
    const std::int64_t a = frame - width, b = frame + width;
    if (a < first || b >= end || !history.Holds(a) || !history.Holds(b)) break;
    const std::optional<Mixture> whole = MixtureAt(history, a, frame, b, kAlone);
    if (!whole) continue;
    const double alone = std::min(whole->first_left, whole->second_left);
    const double sum = whole->first_weight + whole->second_weight, share = ShareOf(*whole);
    if (!(whole->left < kLeft * alone && sum > kSum[0] && sum < kSum[1] && share > kShare[0] &&
          share < kShare[1])) {
      continue;
    }
    // Grows with how little the ends fit each other, how little each fits the frame, and how well
    // both do.
    const double apart = history.Difference(a, b);
    const double strength = apart * alone / (whole->left / alone + 0.05);
    if (strength <= best.strength || strength < kWeak) continue;
    const auto grows = [&](std::int64_t between, double low, double high) {
      const std::optional<Mixture> part = MixtureAt(history, a, between, b, 0);
      return part && ShareOf(*part) > low && ShareOf(*part) < high;
    };
    if (!grows(frame - width / 2, -kGrowth, share - kGrowth) ||
        !grows(frame + width / 2, share + kGrowth, 1 + kGrowth)) {
      continue;
    }
    best.width = width;
    best.strength = strength;
  }
  if (best.width == 0) return {};
  return best;
}

std::optional<ShotBorder> DissolveSearch::Next(const FrameHistory& history, std::int64_t frame,
                                               std::int64_t first, std::int64_t end) {
  if (frame % step_ != 0) return {};
  if (const std::optional<Hit> hit = HitAt(history, frame, first, end)) {
    std::optional<ShotBorder> border;
    // One that can't be of the same dissolve.
    if (!hits_.empty() &&
        (hits_.front().first != first || frame - hits_.front().frame > kLongest * step_)) {
      border = Finish(history);
    }
    hits_.push_back(*hit);
    return border;
  }
  // Some frames in the middle may be hard to see through.
  constexpr std::int64_t kGap = 4;
  if (!hits_.empty() && frame - hits_.back().frame > kGap * step_) return Finish(history);
  return {};
}

std::optional<ShotBorder> DissolveSearch::Finish(const FrameHistory& history) {
  std::optional<ShotBorder> border;
  if (!hits_.empty()) border = BorderOf(history);
  hits_.clear();
  return border;
}

std::optional<ShotBorder> DissolveSearch::BorderOf(const FrameHistory& history) const {
  const Hit best = *std::max_element(hits_.begin(), hits_.end(), [](const Hit& a, const Hit& b) {
    return a.strength < b.strength;
  });
  // Three frames in a row are no accident, but of the shortest dissolves there are no more.
  if (best.strength < kStrong || (hits_.size() < 3 && best.width > 2 * step_)) return {};

  // From frames that are before the dissolve and behind it, as far as the picture can be followed,
  // the shares of all between.
  for (std::int64_t width = reach(); width >= best.width; width -= 2 * step_) {
    const std::int64_t a = std::max({best.frame - width, best.first, history.first()});
    const std::int64_t b = std::min({best.frame + width, best.end - 1, history.end() - 1});
    std::vector<double> shares;
    int known = 0;
    for (std::int64_t f = a; f <= b; f += step_) {
      double share = NAN;
      if (const std::optional<Mixture> m = MixtureAt(history, a, f, b, 0)) {
        const double sum = m->first_weight + m->second_weight;
        if (sum > kSum[0] && sum < kSum[1] && m->left < 0.5) {
          share = std::clamp(ShareOf(*m), 0.0, 1.0);
          ++known;
        }
      }
      shares.push_back(share);
    }
    if (known < static_cast<int>(shares.size()) * 2 / 3) continue;
    const Ramp ramp = FitRamp(shares, a, step_);
    ShotBorder border;
    border.kind = ShotBorder::Kind::dissolve;
    // At the ramp's ends the frames are still pure.
    border.first = std::llround(ramp.start) + 1;
    border.last = std::max(border.first, static_cast<std::int64_t>(std::llround(ramp.end)) - 1);
    border.frame = (border.first + border.last + 1) / 2;
    border.confidence = 1 - 0.5 * kStrong / best.strength;
    return border;
  }
  return {};
}

}  // namespace calmframe::host
