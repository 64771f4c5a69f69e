#include "host/shots/dissolve_search.h"

#include <algorithm>
#include <cmath>

namespace calmframe::host {
namespace {

// Half the frames that a mixture is looked for over, in steps: a dissolve of any length is one over
// its parts too, but over short ones it changes little, and over long ones shake adds up.
constexpr std::int64_t kWidths[] = {2, 4, 8, 14, 20};

// Where the figures come from: thirty dissolves of 8 to 40 frames between pieces of nine clips,
// nearly all of them shaken, and these clips without any. Strength: how much of the frame's detail
// the mixture explains that neither frame does by itself, laid over it twice, as things at two
// depths want it; times how little the ends fit each other. 0.15 to 0.36 at the best frame of
// dissolves; outside up to 0.15 where somebody runs through a crowd, so there is the evidence, see
// EvidenceFor, which is nought there.
constexpr double kWeak = 0.08;
// The best strength times the evidence: 0.096 to 0.32 in the dissolves that are told, up to
// 0.079 where there is none.
constexpr double kStrong = 0.08;
// What either frame alone must leave of the one between: less is a picture that moved a little.
constexpr double kAlone = 0.12;
// What the first leaves of the last: a title that comes up changes a part of the picture.
constexpr double kApart = 0.5;
// The weights' sum: light may change a little on the way.
constexpr double kSum[2] = {0.7, 1.3};
// Of those that tell where it begins and ends, and what they explain that one frame does not.
constexpr double kSureSum[2] = {0.8, 1.15};
constexpr double kSureGain = 0.1;
constexpr double kFullGain = 0.4;  // of more it is as sure
// The share of the frame behind: in the middle the mixture tells most.
constexpr double kShare[2] = {0.25, 0.75};
// See Dips: what covariance, motion and noise may add.
constexpr double kDip = 0.85;
// By how much the share grows over each half of the way, at least; a third to a half it should be.
constexpr double kGrowth = 0.08;
// How far from the best frame its ends are looked for, in steps.
constexpr std::int64_t kBeyond = 28;

double ShareOf(const Mixture& m) {
  return m.second_weight / (m.first_weight + m.second_weight);
}

// Whether the middle frame has as little contrast in its details as a mixture of the other two: of
// two scenes that have nothing to do with each other the squares a^2 and (1 - a)^2 are left, which
// is less than a and 1 - a.
bool Dips(const FrameDetail& first, const FrameDetail& middle, const FrameDetail& last) {
  const double more = std::max(first.square(), last.square());
  const double less = std::min(first.square(), last.square());
  return middle.square() < kDip * (kShare[1] * more + kShare[0] * less);
}

// None where either frame alone leaves less than `worth` of the one between.
std::optional<Mixture> MixtureAt(const FrameHistory& history, std::int64_t a, std::int64_t frame,
                                 std::int64_t b, double worth) {
  const FrameDetail& middle = history.detail(frame);
  const std::optional<Laid> first = Lay(history.detail(a), middle, history.Motion(a, frame));
  if (!first || first->left < worth) return {};
  const std::optional<Laid> second = Lay(history.detail(b), middle, history.Motion(b, frame));
  if (!second || second->left < worth) return {};
  return MixtureOf(history.detail(a), *first, middle, history.detail(b), *second);
}

// Three frames evenly apart, by steps from one that all count from, and how much of the last is in
// the middle one beside the first.
struct Triple {
  std::int64_t first, middle, last;
  double share;
  double weight;  // how much there is to see, 0 to 1
};

// The change of the share below which a triple can't be parted.
constexpr double kLeastChange = 0.18;

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
      const double gain = std::max(m->first_left, m->second_left) - m->left;
      const double sum = m->first_weight + m->second_weight;
      if (!(gain > kSureGain && sum > kSureSum[0] && sum < kSureSum[1])) continue;
      const std::int64_t at = (a - first) / step;
      triples.push_back({at, at + width, at + 2 * width, std::clamp(ShareOf(*m), 0.0, 1.0),
                         std::min(1.0, gain * gain / (kFullGain * kFullGain))});
    }
  }
  return triples;
}

struct Span {
  std::int64_t before = 0, behind = 0;  // the last pure frame of one shot, the first of the other
  double evidence = 0;                  // see EvidenceFor
};

// What of the triples' shares a ramp explains that none does which goes on for ever, by which the
// middle frame is halfway between any two: where things move too much to be followed, all seem so.
double EvidenceFor(const Span& span, const std::vector<Triple>& triples) {
  double by_ramp = 0, halfway = 0;
  for (const Triple& t : triples) {
    const double at_first = ShareIn(t.first, span.before, span.behind);
    const double change = ShareIn(t.last, span.before, span.behind) - at_first;
    if (!(change > kLeastChange)) continue;
    const double off = t.share - (ShareIn(t.middle, span.before, span.behind) - at_first) / change;
    by_ramp += t.weight * off * off;
    halfway += t.weight * (t.share - 0.5) * (t.share - 0.5);
  }
  return halfway > 0 ? 1 - by_ramp / halfway : 0;
}

// The straight ramp that explains the triples best: least squares, of which no triple adds more
// than one that the ramp says nothing about, since shake spoils some.
Span BestSpan(const std::vector<Triple>& triples, std::int64_t count, std::int64_t sure) {
  constexpr double kMost = 0.2 * 0.2;
  Span best;
  double least = 1e30;
  for (std::int64_t before = 0; before < sure; ++before) {
    for (std::int64_t behind = sure + 1; behind < count; ++behind) {
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
  best.evidence = EvidenceFor(best, triples);
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
    if (!Dips(history.detail(a), history.detail(frame), history.detail(b))) continue;
    const std::optional<Mixture> whole = MixtureAt(history, a, frame, b, kAlone);
    if (!whole) continue;
    const double sum = whole->first_weight + whole->second_weight, share = ShareOf(*whole);
    if (!(sum > kSum[0] && sum < kSum[1] && share > kShare[0] && share < kShare[1])) continue;
    const double gain = std::min(whole->first_left, whole->second_left) - whole->left;
    if (gain <= best.strength || gain < kWeak) continue;
    const std::optional<Laid> ends =
        Lay(history.detail(a), history.detail(b), history.Motion(a, b));
    const double apart = ends ? ends->left : 1;
    const double strength = gain * apart;
    if (apart < kApart || strength <= best.strength) continue;
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
  if (best.strength < kStrong) return {};
  // Three frames in a row are no accident, but of the shortest dissolves there are two.
  if (hits_.size() < (best.width > 2 * step_ ? 3 : 2)) return {};

  const std::int64_t first = std::max({best.first, history.first(), best.frame - kBeyond * step_});
  const std::int64_t end = std::min({best.end, history.end(), best.frame + kBeyond * step_ + 1});
  const std::vector<Triple> triples = TriplesBetween(history, first, end, step_);
  const Span span =
      BestSpan(triples, (end - first + step_ - 1) / step_, (best.frame - first) / step_);
  const double margin = best.strength * span.evidence / kStrong;
  if (!(margin >= 1)) return {};
  ShotBorder border;
  border.kind = ShotBorder::Kind::dissolve;
  border.first = first + span.before * step_ + 1;
  border.last = first + span.behind * step_ - 1;
  border.frame = (border.first + border.last + 1) / 2;
  border.confidence = 1 - 0.5 / margin;
  return border;
}

}  // namespace calmframe::host
