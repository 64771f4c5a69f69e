#include "host/shots/dissolve_search.h"

#include <algorithm>
#include <cmath>

#include "host/shots/mixture.h"

namespace calmframe::host {
namespace {

// From the last frame of one shot alone to the first of the other, in steps.
constexpr std::int64_t kLengths[] = {8,  9,  10, 11, 12, 14, 16, 18, 20,
                                     23, 26, 29, 33, 37, 41, 46, 51, 56};
// Frames of both shots alone that are looked at beside them: half as many as are mixed.
constexpr std::int64_t kLeastAside = 3, kMostAside = 8;

// Where the figures come from: eighty dissolves of 8 to 40 frames between pieces of nine clips,
// nearly all of them shaken; ten clips without any, whole and at two and three times their speed;
// and, drawn into these, 150 whip pans, blurs, lights that go and come, and boards that pass.
//
// DipFit. Evidence above which a span is looked at: one in a hundred of the clips' has 0.07.
constexpr double kWeak = 0.15;
// What covariance and motion may take or add.
constexpr double kDepth[2] = {0.7, 1.35};
// ToneFit. Where spans overlap, ends that lie apart speak for one, half as much as its evidence and
// up to what two scenes mostly have: of a part of a dissolve the dip may fit better than of the
// whole, but its ends are nearer to each other.
constexpr double kRankOfApart = 0.5, kApartEnough = 0.5;
// Of a scene and itself behind a blur mostly less, of half of all dissolves above 1.5.
constexpr double kFar = 0.35;
// Of a random walk the first principal component, which is nearly a ramp, explains 6 / pi^2; of
// pictures that are shaken besides a ramp has somewhat less, of boards that pass mostly below 0.4.
constexpr double kStraight = 0.45;
// Light that takes as much of the squares as a dip of the least depth, half of 0.7, takes the root
// of it from the luma.
constexpr double kLight = 0.19;
// What the first leaves of the last, laid over it: the same scene, moved, is no other shot.
constexpr double kApart = 0.5;
// The evidence and the gain, see GainBetween, added. Where there is no dissolve it is below 0.24 of
// what all the other limits let through.
constexpr double kStrong = 0.3;

// How much of the detail of frames on the way a mixture of both ends explains that neither does by
// itself, laid over it twice, as things at two depths want it: where it is most.
double GainBetween(const FrameHistory& history, std::int64_t before, std::int64_t behind) {
  constexpr std::int64_t kParts = 8;
  const FrameDetail &first = history.detail(before), &second = history.detail(behind);
  double most = -1;
  for (std::int64_t k = 2; k <= kParts - 2; ++k) {
    const std::int64_t frame = before + k * (behind - before) / kParts;
    const FrameDetail& middle = history.detail(frame);
    const std::optional<Laid> a = Lay(first, middle, history.Motion(before, frame));
    const std::optional<Laid> b = Lay(second, middle, history.Motion(behind, frame));
    if (!a || !b) continue;
    if (const std::optional<Mixture> m = MixtureOf(first, *a, middle, second, *b)) {
      most = std::max(most, std::min(m->first_left, m->second_left) - m->left);
    }
  }
  return most;
}

}  // namespace

DissolveSearch::DissolveSearch(double frames_per_second)
    // A tenth of a frame's time more at 240 frames a second and above: there it looks at every
    // eighth frame.
    : step_(std::clamp<std::int64_t>(std::llround(frames_per_second / 30), 1, 8)) {}

Ramp DissolveSearch::RampOf(const FrameHistory& history, const Span& span) const {
  const std::int64_t steps = (span.behind - span.before) / step_;
  const std::int64_t aside = step_ * std::clamp((steps - 1) / 2, kLeastAside, kMostAside);
  Ramp ramp;
  for (std::int64_t f = span.before - aside; f <= span.behind + aside; f += step_) {
    if (f < span.first || f >= span.end || !history.Holds(f)) continue;
    if (f == span.before) ramp.before = ramp.frames.size();
    if (f == span.behind) ramp.behind = ramp.frames.size();
    ramp.frames.push_back(&history.parts(f));
  }
  return ramp;
}

bool DissolveSearch::MayBe(const FrameHistory& history, Span& span) const {
  const Ramp ramp = RampOf(history, span);
  const DipFit dip = FitDip(ramp);
  span.evidence = dip.evidence;
  if (!(dip.evidence > kWeak && dip.depth > kDepth[0] && dip.depth < kDepth[1])) return false;
  const double apart = FitTone(ramp).apart;
  span.rank = dip.evidence + kRankOfApart * std::min(apart, kApartEnough);
  return true;
}

std::optional<DissolveSearch::Span> DissolveSearch::SpanAbout(const FrameHistory& history,
                                                              std::int64_t frame,
                                                              std::int64_t first,
                                                              std::int64_t end) const {
  // No cut behind these is known.
  end = std::min(end, frame + reach() + 1);
  std::optional<Span> best;
  for (const std::int64_t length : kLengths) {
    Span span{frame - length / 2 * step_, frame + (length + 1) / 2 * step_, first, end};
    if (span.before < first || span.behind >= end || !history.Holds(span.before) ||
        !history.Holds(span.behind)) {
      break;
    }
    if (MayBe(history, span) && !(best && span.rank <= best->rank)) best = span;
  }
  return best;
}

std::optional<ShotBorder> DissolveSearch::Next(const FrameHistory& history, std::int64_t frame,
                                               std::int64_t first, std::int64_t end) {
  if (frame % step_ != 0) return {};
  std::optional<ShotBorder> border;
  if (best_ && (frame >= best_->behind || first != best_->first)) border = Finish(history);
  const std::optional<Span> span = SpanAbout(history, frame, first, end);
  if (span && !(best_ && span->rank <= best_->rank)) best_ = span;
  return border;
}

std::optional<ShotBorder> DissolveSearch::Finish(const FrameHistory& history) {
  std::optional<ShotBorder> border;
  if (best_) border = BorderOf(history, *best_);
  best_.reset();
  return border;
}

// The ends to the frame.
DissolveSearch::Span DissolveSearch::Settled(const FrameHistory& history, Span span) const {
  constexpr std::int64_t kAbout = 4;
  Span best = span;
  for (std::int64_t i = -kAbout; i <= kAbout; ++i) {
    for (std::int64_t j = -kAbout; j <= kAbout; ++j) {
      Span tried = span;
      tried.before += i * step_;
      tried.behind += j * step_;
      if (tried.before < span.first || tried.behind >= span.end || !history.Holds(tried.before) ||
          !history.Holds(tried.behind) || tried.behind - tried.before < kLengths[0] * step_) {
        continue;
      }
      if (MayBe(history, tried) && tried.rank > best.rank) best = tried;
    }
  }
  return best;
}

std::optional<ShotBorder> DissolveSearch::BorderOf(const FrameHistory& history,
                                                   const Span& found) const {
  const Span span = Settled(history, found);
  const ToneFit tone = FitTone(RampOf(history, span));
  if (!(tone.straight > kStraight && tone.apart > kFar && std::abs(tone.light) < kLight)) return {};
  const std::optional<Laid> ends = Lay(history.detail(span.before), history.detail(span.behind),
                                       history.Motion(span.before, span.behind));
  if (ends && ends->left < kApart) return {};
  const double margin = (span.evidence + GainBetween(history, span.before, span.behind)) / kStrong;
  if (!(margin >= 1)) return {};
  ShotBorder border;
  border.kind = ShotBorder::Kind::dissolve;
  border.first = span.before + 1;
  border.last = span.behind - 1;
  border.frame = (border.first + border.last + 1) / 2;
  border.confidence = 1 - 0.5 / margin;
  return border;
}

}  // namespace calmframe::host
