#include "host/stabilize/motion_groups.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <optional>
#include <span>
#include <utility>
#include <vector>

#include "host/stabilize/window/clip_windows.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

// Lengths are in widths of the frame, about its middle; misses are squared, in squares of this.
constexpr double kMostMiss = 4;      // of a track that follows neither
constexpr std::size_t kFewest = 12;  // tracks from one frame to the next that tell of motions

// Rounds of the mixture: with two motions that are equals, then with the background known.
constexpr int kEqualRounds = 3, kUnequalRounds = 5;
// How sure a track's group must be, from -1, the subject, to 1, the background.
constexpr double kSure = 0.5;

double MissOf(const Point& off) {
  return (off.x * off.x + off.y * off.y) / (kTrackTolerance * kTrackTolerance);
}

// -- Tracks --

// A track from a frame to the one before.
struct Step {
  std::size_t track;
  Point at, move;
};

class Tracks {
 public:
  explicit Tracks(const SolvedClip& clip)
      : clip_(clip),
        aspect_(clip.width / static_cast<double>(clip.source_width)),
        width_(clip.width),
        height_(clip.height),
        pairs_(static_cast<std::size_t>(clip.frame_count)) {
    std::vector<KeptStep> steps;
    TrackRow before;
    Walk([&](std::size_t row, const TrackRow& tracks, const std::vector<std::size_t>& of_slot) {
      steps.clear();
      for (std::size_t slot = 0; slot < of_slot.size(); ++slot) {
        if (of_slot[slot] == kNone) continue;
        if (Begins(tracks.statuses[slot])) {
          begun_.push_back({static_cast<int>(row), static_cast<int>(slot)});
          continue;
        }
        const Point &at = tracks.places[slot], &was = before.places[slot];
        if (!IsNear(InWidths(at)) || !IsNear(InWidths(was))) continue;
        steps.push_back({static_cast<std::uint32_t>(of_slot[slot]), static_cast<float>(at.x),
                         static_cast<float>(at.y), static_cast<float>(was.x),
                         static_cast<float>(was.y)});
      }
      pairs_[row] = steps;
      before = tracks;
    });
  }

  std::size_t count() const { return begun_.size(); }
  const std::vector<GroupedTrack>& begun() const { return begun_; }
  std::size_t pairs() const { return pairs_.size(); }
  std::size_t StepsIn(std::size_t pair) const { return pairs_[pair].size(); }
  std::size_t TrackOf(std::size_t pair, std::size_t step) const { return pairs_[pair][step].track; }
  // From a row to the one before; none of the first row.
  std::vector<Step> Pair(std::size_t pair) const {
    std::vector<Step> steps;
    steps.reserve(pairs_[pair].size());
    for (const KeptStep& kept : pairs_[pair]) {
      const Point at = InWidths({kept.x, kept.y}),
                  before = InWidths({kept.before_x, kept.before_y});
      steps.push_back({kept.track, at, {before.x - at.x, before.y - at.y}});
    }
    return steps;
  }
  // visit(track, place) for all of a row's, and then end_of_row().
  template <class Visit, class End>
  void ForEachCell(const Visit& visit, const End& end_of_row) const {
    Walk([&](std::size_t, const TrackRow& tracks, const std::vector<std::size_t>& of_slot) {
      for (std::size_t slot = 0; slot < of_slot.size(); ++slot) {
        if (of_slot[slot] != kNone) visit(of_slot[slot], InWidths(tracks.places[slot]));
      }
      end_of_row();
    });
  }
  double half_height() const { return height_ / width_ / 2; }

 private:
  static constexpr std::size_t kNone = std::numeric_limits<std::size_t>::max();
  // In the source's own pixels, of which tracks lie on 32nds: floats hold them.
  struct KeptStep {
    std::uint32_t track;
    float x, y, before_x, before_y;
  };

  static bool Begins(std::int32_t status) { return status > 0 || status == kDeletedTrackBegins; }

  // visit(row, its tracks, which track is in each slot)
  template <class Visit>
  void Walk(const Visit& visit) const {
    std::size_t begun = 0;
    std::vector<std::size_t> of_slot(static_cast<std::size_t>(clip_.slots), kNone);
    for (std::size_t row = 0; row < pairs_.size(); ++row) {
      const TrackRow tracks = clip_.TracksOf(row);
      for (std::size_t slot = 0; slot < of_slot.size(); ++slot) {
        const std::int32_t status = tracks.statuses[slot];
        if (Begins(status)) {
          of_slot[slot] = begun++;
        } else if (status != 0 && status != kDeletedTrackGoesOn) {
          of_slot[slot] = kNone;
        }
      }
      visit(row, tracks, of_slot);
    }
  }

  Point InWidths(const Point& p) const {
    return {((p.x + 0.5) * aspect_ - width_ / 2) / width_, (p.y + 0.5 - height_ / 2) / width_};
  }
  // From a file they may lie anywhere.
  static bool IsNear(const Point& p) { return std::abs(p.x) < 2 && std::abs(p.y) < 2; }

  const SolvedClip& clip_;
  double aspect_, width_, height_;
  std::vector<GroupedTrack> begun_;
  std::vector<std::vector<KeptStep>> pairs_;
};

// -- Motions --

constexpr std::size_t kAffine = 3, kQuadratic = 6;

// How points move from a frame to the one before, as a polynomial of their place: affine, or with
// the second order too, which is how a plane moves, near enough, and many a scene with depth.
template <std::size_t kTerms>
class Flow {
 public:
  // Weighted least squares, by Cholesky's factorization (Golub and Van Loan, Matrix Computations,
  // ch. 4.2). What the points don't tell is as small as it may be.
  void Fit(std::span<const Step> steps, const std::vector<double>& weights) {
    constexpr double kRidge[] = {1e-9, 2e-5, 2e-5, 5e-4, 5e-4, 5e-4};  // of each point
    std::array<Terms, kTerms> normal{};
    std::array<Point, kTerms> right{};
    for (std::size_t i = 0; i < steps.size(); ++i) {
      const Terms basis = BasisAt(steps[i].at);
      for (std::size_t r = 0; r < kTerms; ++r) {
        const double weighted = weights[i] * basis[r];
        for (std::size_t c = 0; c <= r; ++c) normal[r][c] += weighted * basis[c];
        right[r].x += weighted * steps[i].move.x;
        right[r].y += weighted * steps[i].move.y;
      }
    }
    for (std::size_t r = 0; r < kTerms; ++r) {
      normal[r][r] += kRidge[r] * static_cast<double>(steps.size());
      for (std::size_t c = 0; c <= r; ++c) {
        for (std::size_t k = 0; k < c; ++k) normal[r][c] -= normal[r][k] * normal[c][k];
        normal[r][c] = r == c ? std::sqrt(normal[r][c]) : normal[r][c] / normal[c][c];
      }
      for (std::size_t k = 0; k < r; ++k) Subtract(right[r], normal[r][k], right[k]);
      right[r] = {right[r].x / normal[r][r], right[r].y / normal[r][r]};
    }
    for (std::size_t r = kTerms; r-- > 0;) {
      for (std::size_t k = r + 1; k < kTerms; ++k) Subtract(right[r], normal[k][r], right[k]);
      right[r] = {right[r].x / normal[r][r], right[r].y / normal[r][r]};
    }
    factors_ = right;
  }

  double MissOf(const Step& step) const {
    const Terms basis = BasisAt(step.at);
    Point off = step.move;
    for (std::size_t i = 0; i < kTerms; ++i) Subtract(off, basis[i], factors_[i]);
    return host::MissOf(off);
  }

 private:
  using Terms = std::array<double, kTerms>;

  static Terms BasisAt(const Point& p) {
    if constexpr (kTerms == kAffine) {
      return {1, p.x, p.y};
    } else {
      return {1, p.x, p.y, p.x * p.x, p.x * p.y, p.y * p.y};
    }
  }
  static void Subtract(Point& from, double factor, const Point& what) {
    from.x -= factor * what.x;
    from.y -= factor * what.y;
  }

  std::array<Point, kTerms> factors_{};
};

// -- Where the subject is --

// An ellipse: a mean and the spread about it, xx, xy, yy.
struct Ellipse {
  Point mean;
  std::array<double, 3> spread = {0.0225, 0, 0.0225};

  // In squares of the spread.
  double Distance(const Point& p) const {
    const double x = p.x - mean.x, y = p.y - mean.y;
    const auto [xx, xy, yy] = spread;
    return (yy * x * x - 2 * xy * x * y + xx * y * y) / (xx * yy - xy * xy);
  }
};

// The ellipses of a walk through the clip, each fitted to the subject's tracks there and to the
// ellipse before: mean and spread of a multivariate t distribution (McLachlan and Peel, ch. 7), so
// that tracks far off, which merely move alike, count for little.
class EllipseWalk {
 public:
  // None before there is a subject.
  const std::optional<Ellipse>& Visit(std::span<const Step> steps,
                                      const std::vector<double>& leans) {
    constexpr double kOfSubject = -0.4;  // leans that take part at all
    constexpr double kFreedom = 0.5;     // degrees of it, of the distribution
    constexpr double kMemory = 0.9;      // what counts in the next frame
    constexpr double kLeast = 5;         // tracks to begin with
    constexpr double kThinnest = 1e-5;
    double sum = 0;
    weights_.clear();
    for (const Step& step : steps) {
      const double lean = leans[step.track];
      weights_.push_back(lean < kOfSubject ? (1 - lean) * (1 - lean) / 4 : 0);
      sum += weights_.back();
    }
    if (!ellipse_) {
      if (sum <= kLeast) return ellipse_;
      ellipse_.emplace();
      ellipse_->mean = MedianOfWeighted(steps);
    }
    const Ellipse before = *ellipse_;
    for (int round = 0; round < 3; ++round) {
      double mass = mass_ + 1e-9;
      Point mean = {mass * before.mean.x, mass * before.mean.y};
      pulls_.clear();
      for (std::size_t i = 0; i < steps.size(); ++i) {
        const Point& at = steps[i].at;
        const double pull =
            weights_[i] == 0 ? 0
                             : weights_[i] * (kFreedom + 2) / (kFreedom + ellipse_->Distance(at));
        pulls_.push_back(pull);
        mass += pull;
        mean.x += pull * at.x;
        mean.y += pull * at.y;
      }
      Ellipse next{{mean.x / mass, mean.y / mass}, before.spread};
      for (double& entry : next.spread) entry *= mass_ + 1e-9;
      for (std::size_t i = 0; i < steps.size(); ++i) {
        const double x = steps[i].at.x - next.mean.x, y = steps[i].at.y - next.mean.y;
        next.spread[0] += pulls_[i] * x * x;
        next.spread[1] += pulls_[i] * x * y;
        next.spread[2] += pulls_[i] * y * y;
      }
      for (double& entry : next.spread) entry /= mass_ + 1e-9 + sum;
      next.spread[0] += kThinnest;
      next.spread[2] += kThinnest;
      ellipse_ = next;
    }
    mass_ = kMemory * (mass_ + sum);
    return ellipse_;
  }

 private:
  Point MedianOfWeighted(std::span<const Step> steps) const {
    std::vector<double> x, y;
    for (std::size_t i = 0; i < steps.size(); ++i) {
      if (weights_[i] == 0) continue;
      x.push_back(steps[i].at.x);
      y.push_back(steps[i].at.y);
    }
    const auto middle = static_cast<std::ptrdiff_t>(x.size() / 2);
    std::nth_element(x.begin(), x.begin() + middle, x.end());
    std::nth_element(y.begin(), y.begin() + middle, y.end());
    return {x[static_cast<std::size_t>(middle)], y[static_cast<std::size_t>(middle)]};
  }

  std::optional<Ellipse> ellipse_;
  double mass_ = 0;                      // of what the ellipse remembers
  std::vector<double> weights_, pulls_;  // of the steps
};

// By pair: the mean of the walks from both ends, since either lags behind.
std::vector<std::optional<Ellipse>> FindSubject(const Tracks& tracks,
                                                const std::vector<double>& leans) {
  std::vector<std::optional<Ellipse>> found(tracks.pairs());
  EllipseWalk there, back;
  for (std::size_t i = 0; i < found.size(); ++i) found[i] = there.Visit(tracks.Pair(i), leans);
  for (std::size_t i = found.size(); i-- > 0;) {
    const std::optional<Ellipse>& other = back.Visit(tracks.Pair(i), leans);
    if (!other) continue;
    if (!found[i]) {
      found[i] = other;
      continue;
    }
    found[i]->mean = {(found[i]->mean.x + other->mean.x) / 2,
                      (found[i]->mean.y + other->mean.y) / 2};
    for (std::size_t k = 0; k < other->spread.size(); ++k) {
      found[i]->spread[k] = (found[i]->spread[k] + other->spread[k]) / 2;
    }
  }
  return found;
}

// -- The mixture --

class Mixture {
 public:
  explicit Mixture(const Tracks& tracks)
      : tracks_(tracks), leans_(tracks.count()), misses_(tracks.pairs()) {}

  // By track, from -1 to 1; see kSure.
  const std::vector<double>& leans() const { return leans_; }
  struct Misses {
    double first, second;
  };
  // Of a pair's steps in the last round, from the background and from the subject; kMostMiss at
  // most. None of a pair with too few.
  const std::vector<Misses>& misses(std::size_t pair) const { return misses_[pair]; }

  // From the motion that most tracks of a pair follow, and that most of the rest do. Which of both
  // is which in the next pair, the tracks tell that go on.
  void Begin() {
    std::vector<double> sums(leans_.size());
    ForEachPair([this](std::size_t pair, Votes& votes) { VoteForDominant(pair, votes); },
                [&](std::size_t pair, const Votes& votes) {
                  double agreement = 0;
                  for (std::size_t i = 0; i < votes.size(); ++i) {
                    agreement += sums[tracks_.TrackOf(pair, i)] * votes[i];
                  }
                  for (std::size_t i = 0; i < votes.size(); ++i) {
                    sums[tracks_.TrackOf(pair, i)] += agreement < 0 ? -votes[i] : votes[i];
                  }
                });
    Lean(sums);
  }

  void Swap() {
    for (double& lean : leans_) lean = -lean;
  }

  // Both motions by the tracks that lean to them, then these by how they follow the motions.
  // The last one keeps the misses.
  void Round(bool knows_background, bool is_last = false) {
    std::vector<std::optional<Ellipse>> subject(tracks_.pairs());
    if (knows_background) subject = FindSubject(tracks_, leans_);
    keeps_misses_ = is_last;
    std::vector<double> sums(leans_.size());
    ForEachPair(
        [&](std::size_t pair, Votes& votes) {
          if (knows_background) {
            FitPair<kQuadratic>(pair, subject[pair], votes);
          } else {
            FitPair<kAffine>(pair, subject[pair], votes);
          }
        },
        [&](std::size_t pair, const Votes& votes) {
          for (std::size_t i = 0; i < votes.size(); ++i) sums[tracks_.TrackOf(pair, i)] += votes[i];
        });
    Lean(sums);
  }

 private:
  using Votes = std::vector<double>;  // of a pair's steps

  // vote(pair, votes), which are 0, for the pairs that have enough steps, on all processors; then
  // take(pair, votes), pair by pair. A stretch of pairs after the other, so that no more than its
  // votes are there at a time.
  template <class Vote, class Take>
  void ForEachPair(const Vote& vote, const Take& take) {
    constexpr std::size_t kStretch = 256;
    for (std::size_t first = 0; first < tracks_.pairs(); first += kStretch) {
      std::vector<Votes> votes(std::min(kStretch, tracks_.pairs() - first));
      tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
          [&](std::size_t i) {
            votes[i].resize(tracks_.StepsIn(first + i));
            if (votes[i].size() >= kFewest) vote(first + i, votes[i]);
          },
          votes.size());
      for (std::size_t i = 0; i < votes.size(); ++i) take(first + i, votes[i]);
    }
  }

  void Lean(const std::vector<double>& sums) {
    for (std::size_t i = 0; i < sums.size(); ++i) leans_[i] = std::tanh(sums[i]);
  }

  void VoteForDominant(std::size_t pair, Votes& votes) {
    const std::vector<Step> steps = tracks_.Pair(pair);
    std::vector<Point> from, to;
    std::vector<double> misses(steps.size(), 2 * kMostMiss);
    // By how much less a track misses the new motion.
    const auto fit = [&] {
      const Similarity motion = FitMotion(from, to, kTrackTolerance);
      for (std::size_t i = 0; i < steps.size(); ++i) {
        const auto& [track, at, move] = steps[i];
        const Point reached = motion(at);
        const double miss = MissOf({reached.x - at.x - move.x, reached.y - at.y - move.y});
        votes[i] = std::clamp(std::min(miss, 2.0) - std::min(misses[i], 2.0), -1.0, 1.0);
        misses[i] = miss;
      }
    };
    const auto take = [&](double least) {
      from.clear();
      to.clear();
      for (std::size_t i = 0; i < steps.size(); ++i) {
        const auto& [track, at, move] = steps[i];
        if (misses[i] < least) continue;
        from.push_back(at);
        to.push_back({at.x + move.x, at.y + move.y});
      }
    };
    take(0);
    fit();
    take(1);
    if (from.size() >= 3) {
      fit();
    } else {
      std::fill(votes.begin(), votes.end(), 0.0);
    }
  }

  template <std::size_t kBackgroundTerms>
  void FitPair(std::size_t pair, const std::optional<Ellipse>& subject, Votes& votes) {
    constexpr double kOfOthers = 1e-4;  // weight of tracks that lean to the other motion
    const std::vector<Step> steps = tracks_.Pair(pair);
    std::vector<Misses> misses(steps.size());
    std::vector<double> weights(steps.size()), own(steps.size());
    const auto fit = [&](auto flow, double side, double Misses::*miss) {
      for (std::size_t i = 0; i < steps.size(); ++i) {
        const double lean = (1 + side * leans_[steps[i].track]) / 2;
        own[i] = weights[i] = lean * lean + kOfOthers;
      }
      for (int round = 0;; ++round) {
        flow.Fit(steps, weights);
        if (round == 2) break;
        for (std::size_t i = 0; i < steps.size(); ++i) {
          const double far = 1 + flow.MissOf(steps[i]);  // Geman and McClure's weights
          weights[i] = own[i] / (far * far);
        }
      }
      for (std::size_t i = 0; i < steps.size(); ++i) {
        misses[i].*miss = std::min(flow.MissOf(steps[i]), kMostMiss);
      }
    };
    fit(Flow<kBackgroundTerms>(), 1, &Misses::first);
    fit(Flow<kAffine>(), -1, &Misses::second);
    for (std::size_t i = 0; i < steps.size(); ++i) {
      votes[i] = misses[i].second - misses[i].first;
      if (subject) votes[i] += VoteOfPlace(*subject, steps[i].at);
    }
    if (keeps_misses_) misses_[pair] = std::move(misses);
  }

  // What moves with the subject and lies far from it is behind it all the same.
  static double VoteOfPlace(const Ellipse& subject, const Point& at) {
    constexpr double kRim = 6, kWeight = 0.5;
    return kWeight * std::clamp(subject.Distance(at) - kRim, -1.0, 12.0);
  }

  const Tracks& tracks_;
  std::vector<double> leans_;
  bool keeps_misses_ = false;
  std::vector<std::vector<Misses>> misses_;  // by pair
};

// -- What came of it --

// How much of the frame a group's tracks reach, in cells a frame.
struct Reach {
  double edges = 0;  // of the upper and the lateral ones, in 18 parts
  double cells = 0;
};

class ReachCounter {
 public:
  explicit ReachCounter(double half_height) : half_height_(half_height) {}

  void Add(const Point& p) {
    constexpr double kRim = 0.12;  // of a half
    const double x = 2 * p.x, y = p.y / half_height_;
    const auto index = [](double at, std::size_t parts) -> std::size_t {
      const double part = (at + 1) / 2 * static_cast<double>(parts);
      return part > 0 ? static_cast<std::size_t>(std::min(part, static_cast<double>(parts - 1)))
                      : 0;
    };
    const std::size_t column = index(x, kColumns), row = index(y, kRows);
    cells_[row * kColumns + column] = true;
    if (x < kRim - 1) edges_[row] = true;
    if (x > 1 - kRim) edges_[kRows + row] = true;
    if (y < kRim - 1) edges_[2 * kRows + column] = true;
  }

  // And begins the next frame.
  void Take(Reach& sum) {
    sum.edges += static_cast<double>(std::count(edges_.begin(), edges_.end(), true));
    sum.cells += static_cast<double>(std::count(cells_.begin(), cells_.end(), true));
    edges_ = {};
    cells_ = {};
  }

  static constexpr std::size_t kColumns = 8, kRows = 5;

 private:
  double half_height_;
  std::array<bool, 2 * kRows + kColumns> edges_{};
  std::array<bool, kColumns * kRows> cells_{};
};

// group_of(track)
template <class GroupOf>
std::pair<Reach, Reach> ReachOfGroups(const Tracks& tracks, const GroupOf& group_of) {
  Reach background, subject;
  ReachCounter of_background(tracks.half_height()), of_subject(tracks.half_height());
  tracks.ForEachCell(
      [&](std::size_t track, const Point& at) {
        const MotionGroup group = group_of(track);
        if (group == MotionGroup::background) of_background.Add(at);
        if (group == MotionGroup::subject) of_subject.Add(at);
      },
      [&] {
        of_background.Take(background);
        of_subject.Take(subject);
      });
  return {background, subject};
}

MotionGroup GroupOf(double lean) {
  return lean > kSure    ? MotionGroup::background
         : lean < -kSure ? MotionGroup::subject
                         : MotionGroup::unsure;
}

void Judge(const Tracks& tracks, const Mixture& mixture, MotionGroups& groups) {
  constexpr double kLeastShare = 0.01;  // of the tracks, in frames
  constexpr double kLeastMiss = 0.5;    // of the background
  double steps = 0, of_background = 0, of_subject = 0, all = 0;
  for (std::size_t pair = 0; pair < tracks.pairs(); ++pair) {
    all += static_cast<double>(tracks.StepsIn(pair));
    for (std::size_t i = 0; i < tracks.StepsIn(pair); ++i) {
      if (GroupOf(mixture.leans()[tracks.TrackOf(pair, i)]) != MotionGroup::subject) continue;
      ++steps;
      if (mixture.misses(pair).empty()) continue;
      of_background += mixture.misses(pair)[i].first;
      of_subject += mixture.misses(pair)[i].second;
    }
  }
  if (steps == 0) return;
  groups.has_subject = steps >= kLeastShare * all && of_background >= kLeastMiss * steps &&
                       of_background >= 2 * of_subject;
  const auto root = [&](double sum) { return std::sqrt(sum / steps) * kTrackTolerance * 1000; };
  groups.miss_of_background = root(of_background);
  groups.miss_of_subject = root(of_subject);
}

}  // namespace

MotionGroups FindMotionGroups(const SolvedClip& clip) {
  const Tracks tracks(clip);
  Mixture mixture(tracks);
  const auto by_lean = [&](std::size_t track) { return GroupOf(mixture.leans()[track]); };
  mixture.Begin();
  for (int i = 0; i < kEqualRounds; ++i) mixture.Round(false);
  if (const auto [first, second] = ReachOfGroups(tracks, by_lean);
      std::pair(second.edges, second.cells) > std::pair(first.edges, first.cells)) {
    mixture.Swap();
  }
  for (int i = 0; i < kUnequalRounds; ++i) mixture.Round(true, i + 1 == kUnequalRounds);

  MotionGroups groups;
  groups.tracks = tracks.begun();
  Judge(tracks, mixture, groups);
  for (std::size_t i = 0; i < groups.tracks.size(); ++i) {
    groups.tracks[i].group = groups.has_subject ? by_lean(i) : MotionGroup::background;
  }
  const auto [background, subject] =
      ReachOfGroups(tracks, [&](std::size_t track) { return groups.tracks[track].group; });
  const double all = static_cast<double>(ReachCounter::kColumns * ReachCounter::kRows) *
                     static_cast<double>(clip.frame_count);
  groups.background_cover = background.cells / all;
  groups.subject_cover = subject.cells / all;
  return groups;
}

std::vector<TrackPoint> TracksOf(const SolvedClip& clip, const MotionGroups& groups,
                                 MotionGroup group) {
  std::vector<TrackPoint> points;
  for (const GroupedTrack& track : groups.tracks) {
    if (track.group == group) points.push_back({clip.first_frame + track.row, track.slot});
  }
  return points;
}

}  // namespace calmframe::host
