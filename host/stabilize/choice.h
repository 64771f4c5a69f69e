#pragma once

#include <cstdint>
#include <nlohmann/json_fwd.hpp>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "host/effects/param_table.h"
#include "host/effects/track_point.h"
#include "host/stabilize/moving_clip.h"
#include "host/stabilize/outcome.h"

namespace calmframe::host {

// One way to show a clip by windows that follow its picture.
struct Candidate {
  std::string name;          // as users are told of it
  ParamValues changes = {};  // of the effect's parameters, against the controls as they were given
  Warps warps = Warps::solved;
  bool follows = true;  // by windows; else the source as it was filmed
  bool fills = true;    // the edges, where the framing does; else the windows stay in their frames
  double width_weight = WindowWeights().width;  // of the windows; set by the chooser
  Outcome outcome = {};
  // What windows that follow promise: nothing black, and no frame enlarged beyond the limit.
  bool holds = true;
  double cost = 0;  // decibels; see ChoiceWeights
};

// What counts for one candidate against another, in decibels. Found on nine filmed clips of several
// kinds; docs/quality.md has what it chooses there.
struct ChoiceWeights {
  // The shake of the background and that of all tracks count half each: of the former alone, a near
  // face may shake more for a calmer wall behind it; long tracks alone may all be on one person.
  double seen = 0.5;   // thousandths of the width: shake far below it is not told from none
  double width = 0.4;  // a hundredth of the source's width that is not shown
  // What the picture's own shape flickers more than the source's counts as shake does; far below
  // so many thousandths of the width it is not told from none.
  double wobble = 0.2;
  // By how much frames that are shown as shot must be better than bent ones: bends follow depth and
  // the shutter, which the measures see only in part.
  double bends = 0.5;
  double change = 0.5;  // by how much other controls must be better than those given
  // Share of a frame, and of the zoom's limit: more is never chosen where there is a way around.
  double black = 0.001, over = 0.001;
};

// Whose motion is smoothed away: everybody's, or that of the background or a near subject alone, by
// leaving out the tracks of the other. Automatic: the background's, where there is a subject and
// the background shows on most of the frame.
enum class Still : std::uint8_t { automatic, all, background, subject };

// What was chosen for a clip, and what of.
struct Choice {
  Still still = Still::all;              // never automatic
  double most_zoom = 0, zoom_speed = 0;  // that the windows were held to
  ParamValues given;  // of the parameters that candidates change: as the user has them
  std::vector<Candidate> candidates;  // at least one; the first is what was asked for
  std::size_t taken = 0;              // of the candidates

  const Candidate& best() const { return candidates[taken]; }
  // What was taken, of how many: "method position-scale-rotation, best of 5".
  std::string Text() const;
  // What the next best is worse at, and better: "next comes as set, 1.2 decibels behind: it keeps
  // less of the width (79 % against 85 %)"; empty where there is no other whose windows follow, and
  // of the clip as it was filmed.
  std::string Why() const;
  // As projects keep it and programs read it: "still", "most_zoom", "zoom_speed", "given", and
  // "candidates" with "name", "changes", "fills", "holds", "taken", "cost" and the names of
  // Outcome::Json.
  nlohmann::ordered_json Json() const;
  // None of what is no choice.
  static std::optional<Choice> Parse(const std::string& text);
};

// Who stands still in a shot, and the tracks that a person has deleted besides: of what an effect
// has left out it doesn't tell those from a group's.
struct LeftOut {
  Still still = Still::all;      // never automatic
  std::set<TrackPoint> deleted;  // where still is all: empty, and all that is left out
};

// As SavedShot has both: a choice, which may be null, as it is by itself unless something stands
// beside it. Empty where there is neither.
std::string TextOf(const Choice* choice, const LeftOut& left_out);
// Of such a text, or any.
LeftOut LeftOutIn(const std::string& text);

// Weighs candidates of one clip against each other, one after the other.
class Chooser {
 public:
  // `clip`: any solve of it, for what the source does.
  Chooser(const MovingClip& clip, const FollowSettings& settings,
          const ChoiceWeights& weights = {});

  // Measures a candidate with a solve of it; true where it is the best so far. Its windows are the
  // best of those that come of some weights of the width, or, `by_best_width`, of the weight of
  // the best so far.
  bool Consider(Candidate candidate, const MovingClip& solved, bool by_best_width = false);
  // After all others: the clip as it was filmed, which is taken where none of them is calmer, or
  // none holds. What it has ahead of them, its width, counts for nothing.
  void ConsiderAsFilmed();
  // The windows of a candidate that was chosen before, with its solve.
  void Take(const Choice& choice, const MovingClip& solved);

  const Choice& choice() const { return choice_; }
  // Of the best, as WithWindows takes them.
  const std::vector<Similarity>& windows() const { return windows_; }
  // Whether the best leaves shake that is worth another try.
  bool leaves_shake() const;

 private:
  bool Holds(const Outcome& outcome) const;
  FollowSettings SettingsFor(const Candidate& candidate) const;
  // Shake and flicker, in decibels.
  double UnrestOf(const Outcome& outcome) const;
  double CostOf(const Candidate& candidate) const;

  const FollowSettings settings_;
  const ChoiceWeights weights_;
  const Outcome source_;
  const std::vector<Similarity> whole_frames_;
  Choice choice_;
  std::vector<Similarity> windows_;
};

}  // namespace calmframe::host
