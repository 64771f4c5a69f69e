#include "host/stabilize/choice.h"

#include <cmath>
#include <utility>

namespace calmframe::host {
namespace {

Choice Follow(const SolvedClip& clip, const Background& background, const FollowSettings& settings,
              double frames_per_second, Warps warps) {
  Choice choice{warps, FollowWindows(clip, background, settings), {}};
  choice.outcome = MeasureOutcome(clip, background, choice.windows, frames_per_second);
  choice.outcome.follows = true;
  choice.outcome.bends = warps == Warps::solved;
  return choice;
}

double CostOf(const Choice& choice, const ChoiceWeights& weights) {
  return 20 * std::log10(std::hypot(choice.outcome.after.mean, weights.seen)) +
         weights.width * 100 * (1 - choice.outcome.width_kept) +
         (choice.warps == Warps::none ? weights.bends : 0);
}

}  // namespace

Choice Choose(const SolvedClip& clip, const FollowSettings& settings, double frames_per_second,
              bool may_leave_warps, const ChoiceWeights& weights) {
  const Background background = FindBackground(clip);
  Choice solved = Follow(clip, background, settings, frames_per_second, Warps::solved);
  if (!may_leave_warps) return solved;
  Choice none = Follow(WithoutWarps(clip), {background.in_source, background.in_source}, settings,
                       frames_per_second, Warps::none);
  return CostOf(none, weights) < CostOf(solved, weights) ? std::move(none) : std::move(solved);
}

}  // namespace calmframe::host
