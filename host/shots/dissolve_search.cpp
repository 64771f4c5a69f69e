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
// What the mixture may leave of that: 0.04 to 0.35 in dissolves; over the shortest way, which a
// near thing may cross, 0.25 in short dissolves, which are over by then.
constexpr double kLeft = 0.4, kLeftOfShortest = 0.25;
// The weights' sum: light may change a little on the way.
constexpr double kSum[2] = {0.7, 1.3};
constexpr double kSureSum[2] = {0.8, 1.15};  // of those that tell where it begins and ends
// The share of the frame behind: in the middle the mixture tells most.
constexpr double kShare[2] = {0.25, 0.75};
// By how much it grows over each half of the way, at least; a third to a half it should be.
constexpr double kGrowth = 0.08;
// Strength, see HitAt: the sum over a dissolve's frames times the greatest. Outside of dissolves
// 0.09 at most, over a pan across a repeated pattern; less in two of 24 dissolves between similar
// places, in none between others.
constexpr double kStrong = 0.12;
constexpr double kWeak = 0.06;  // is still a part of a dissolve

// Of what either frame alone leaves: so much can be seen well.
constexpr double kFull = 0.4;
// How far beyond the frames that are surely in a dissolve its ends are looked for, in steps.
constexpr std::int64_t kBeyond = 22;
constexpr double kSure = 0.25;  // of the strength of the best

double ShareOf(const Mixture& m) {
  return m.second_weight / (m.first_weight + m.second_weight);
}

std::optional<Mixture> MixtureAt(const FrameHistory& history, std::int64_t a, std::int64_t frame,
                                 std::int64_t b, double worth) {
  return MixtureOf(history.digest(a), history.digest(frame), history.digest(b),
                   history.Motion(a, frame), history.Motion(b, frame), worth);
}

// Three frames evenly apart, by steps from one that all count from, and how much of the last is in
// the middle one beside the first.
struct Triple {
  std::int64_t first, middle, last;
  double share;
  double weight;  // how much there is to see, 0 to 1
};

// How much of the shot behind is in a frame, if the first pure frames of both are these.
double ShareIn(std::int64_t frame, std::int64_t pure_before, std::int64_t pure_behind) {
  return std::clamp(
      static_cast<double>(frame - pure_before) / static_cast<double>(pure_behind - pure_before),
      0.0, 1.0);
}

// Of the frames from `first` to before `end`, those that show a mixture well.
std::vector<Triple> TriplesBetween(const FrameHistory& history, std::int64_t first,
                                   std::int64_t end, std::int64_t step) {
  std::vector<Triple> triples;
  for (const std::int64_t width : kWidths) {
    for (std::int64_t a = first; a + 2 * width * step < end; a += step) {
      const std::optional<Mixture> m =
          MixtureAt(history, a, a + width * step, a + 2 * width * step, 0);
      if (!m) continue;
      const double alone = std::max(m->first_left, m->second_left);
      const double sum = m->first_weight + m->second_weight;
      if (!(m->left < kLeft * alone && alone > kAlone && sum > kSureSum[0] && sum < kSureSum[1])) {
        continue;
      }
      const std::int64_t at = (a - first) / step;
      triples.push_back({at, at + width, at + 2 * width, std::clamp(ShareOf(*m), 0.0, 1.0),
                         std::min(1.0, alone * alone / (kFull * kFull))});
    }
  }
  return triples;
}

struct Span {
  std::int64_t before = 0, behind = 0;  // the last pure frame of one shot, the first of the other
};

// The straight ramp that explains the triples best: least squares, of which no triple adds more
// than one that the ramp says nothing about, since shake spoils some.
Span BestSpan(const std::vector<Triple>& triples, std::int64_t count, std::int64_t first_sure,
              std::int64_t last_sure) {
  constexpr double kMost = 0.2 * 0.2;
  constexpr double kLeastChange = 0.18;  // of the share, below which it can't be parted
  Span best;
  double least = 1e30;
  for (std::int64_t before = 0; before < first_sure; ++before) {
    for (std::int64_t behind = last_sure + 1; behind < count; ++behind) {
      double sum = 0;
      for (const Triple& t : triples) {
        const double at_first = ShareIn(t.first, before, behind);
        const double change = ShareIn(t.last, before, behind) - at_first;
        double miss = kMost / 2;
        if (change > kLeastChange) {
          const double off = t.share - (ShareIn(t.middle, before, behind) - at_first) / change;
          miss = std::min(kMost, off * off);
        }
        sum += t.weight * miss;
      }
      if (sum < least) {
        least = sum;
        best = {before, behind};
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
    const double most_left = steps == kWidths[0] ? kLeftOfShortest : kLeft;
    if (!(whole->left < most_left * alone && sum > kSum[0] && sum < kSum[1] && share > kShare[0] &&
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
  double sum = 0;
  for (const Hit& hit : hits_) sum += hit.strength;
  const double margin = sum * best.strength / kStrong;
  // Three frames in a row are no accident, but of the shortest dissolves there are no more.
  if (margin < 1 || (hits_.size() < 3 && best.width > 2 * step_)) return {};

  std::int64_t first_sure = best.frame, last_sure = best.frame;
  for (const Hit& hit : hits_) {
    if (hit.strength < kSure * best.strength) continue;
    first_sure = std::min(first_sure, hit.frame);
    last_sure = std::max(last_sure, hit.frame);
  }
  const std::int64_t first = std::max({best.first, history.first(), first_sure - kBeyond * step_});
  const std::int64_t end = std::min({best.end, history.end(), last_sure + kBeyond * step_ + 1});
  const std::vector<Triple> triples = TriplesBetween(history, first, end, step_);
  const Span span = BestSpan(triples, (end - first + step_ - 1) / step_,
                             (first_sure - first) / step_, (last_sure - first) / step_);
  if (span.behind <= span.before) return {};
  ShotBorder border;
  border.kind = ShotBorder::Kind::dissolve;
  border.first = first + span.before * step_ + 1;
  border.last = first + span.behind * step_ - 1;
  border.frame = (border.first + border.last + 1) / 2;
  border.confidence = 1 - 0.5 / margin;
  return border;
}

}  // namespace calmframe::host
