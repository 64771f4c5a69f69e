#include "host/stabilize/steady_clip.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <limits>
#include <nlohmann/json.hpp>
#include <utility>

#include "host/stabilize/control_items.h"
#include "host/stabilize/failures.h"
#include "platform/hx/hx_controls.h"

namespace calmframe::host {
namespace {

// Disk ids of the effect's parameters.
constexpr std::int32_t kDeblur = 15;                         // an experts' group, with a checkbox
constexpr std::int32_t kSynthesisCuts[] = {31, 32, 33, 34};  // pixels taken off each side
constexpr std::int32_t kShowTracks = 280;

// What is tried where the controls leave shake, each by itself. Of the others, the other methods
// differ little from these or from frames that are not bent once the windows follow the picture;
// the enhanced ripple setting and conservative factorization off were better on none of five
// filmed clips.
struct Trial {
  const char* name;
  std::int32_t disk_id;
  double value;
};
constexpr Trial kTrials[] = {
    {"method position-scale-rotation", HX_METHOD.disk_id, kPositionScaleRotation},
    {"smoothness 10", HX_SMOOTHNESS.disk_id, 10},
};

}  // namespace

SteadyClip::SteadyClip(const std::string& plugin, const ClipMedium& medium,
                       const media::FrameRange& range)
    : worked_(plugin, medium, range) {}

SteadyClip::SteadyClip(const std::string& plugin, const ClipMedium& medium, const Project& project,
                       std::size_t shot)
    : worked_(plugin, medium, project, shot), choice_(Choice::Parse(project.shots[shot].choice)) {
  LeftOut left_out = LeftOutIn(project.shots[shot].choice);
  held_ = left_out.still;
  if (held_ != Still::all) worked_.TakeDeleted(std::move(left_out.deleted));
}

void SteadyClip::SetControls(const ParamValues& values) {
  if (!values.empty()) UndoChoice();
  for (const auto& [disk_id, value] : values) {
    worked_.Set(disk_id, value);
    set_.insert(disk_id);
  }
  has_new_controls_ = has_new_controls_ || !values.empty();
}

void SteadyClip::ResetControls(const std::set<std::int32_t>& disk_ids) {
  ParamValues declared_values;
  for (const HX_ParamDef& declared : host().declarations()) {
    const std::optional<double> value = host::ValueOf(declared);
    if (value && disk_ids.count(declared.disk_id) > 0) declared_values[declared.disk_id] = *value;
  }
  SetControls(declared_values);
  for (const std::int32_t disk_id : disk_ids) set_.erase(disk_id);
}

void SteadyClip::TakeControls(const ParamValues& values) {
  for (const HX_ParamDef& declared : host().declarations()) {
    const auto given = values.find(declared.disk_id);
    // What is hidden is the effect's own, such as its status.
    if (given == values.end() || (declared.ui_flags & HX_PARAM_UI_HIDDEN) != 0) continue;
    if (ValueOf(declared.disk_id) != given->second) worked_.Set(declared.disk_id, given->second);
  }
}

void SteadyClip::UndoChoice() {
  if (!choice_) return;
  for (const auto& [disk_id, value] : choice_->best().changes) {
    if (ValueOf(disk_id) == value) worked_.Set(disk_id, choice_->given[disk_id]);
  }
  choice_.reset();
  has_new_controls_ = true;
}

bool SteadyClip::ForgetChoice() {
  UndoChoice();
  if (held_ != Still::all) worked_.LeaveOut({});
  held_ = Still::all;
  return !worked_.is_worked();
}

Reuse SteadyClip::Work(Watcher& watcher) {
  if (worked_.is_worked()) return {true, true, true};
  found_instance_.clear();
  if (!drawn_ || with_tracks_) watcher.Redraws();
  if (with_tracks_) worked_.session().Remove(*with_tracks_);
  with_tracks_ = nullptr;
  return worked_.Work(watcher);
}

bool SteadyClip::Preview(const ParamValues& values) {
  for (const auto& change : values) {
    if (!WorkedEffect::IsDrawnAlone(change.first)) return false;
  }
  Effect& shown = drawn();
  for (const auto& [disk_id, value] : values) {
    // Windows have the scale that they were found with.
    const bool is_in_windows = drawn_ && disk_id == HX_ADDITIONAL_SCALE.disk_id;
    const CommandResult result =
        shown.SetParam(shown.IndexOf(disk_id), is_in_windows ? value / drawn_scale_ * 100 : value);
    if (!result.ok()) throw SolveFailure(result.Line(path()));
  }
  return true;
}

void SteadyClip::SolveAnew(Watcher& watcher) {
  found_instance_.clear();
  worked_.SolveAnew(watcher);
}

SolvedClip SteadyClip::Solved() {
  return worked_.Solved(nullptr);
}

std::shared_ptr<const MovingClip> SteadyClip::SolvedAndFramed(SavedEffect* saved) {
  if (found_of_ && !found_instance_.empty()) {
    if (saved) {
      saved->match_name = host().library().properties().match_name;
      saved->values = worked_.effect().shared()->params().Values();
      saved->instance = found_instance_;
    }
    return found_of_;
  }
  SavedEffect effect;
  SolvedClip solved = worked_.Solved(saved || keeps_found_ ? &effect : nullptr);
  if (!Crops(ValueOf(HX_FRAMING.disk_id))) solved.crop.reset();  // from a framing before
  const auto moving = found_of_ ? std::make_shared<const MovingClip>(std::move(solved), *found_of_)
                                : std::make_shared<const MovingClip>(std::move(solved));
  if (keeps_found_) {
    found_of_ = moving;
    found_instance_ = effect.instance;
  }
  if (saved) *saved = std::move(effect);
  return moving;
}

bool SteadyClip::IsFree(std::int32_t disk_id) const {
  if (set_.count(disk_id) > 0) return false;
  for (const HX_ParamDef& declared : worked_.host().declarations()) {
    if (declared.disk_id == disk_id) return host::ValueOf(declared) == ValueOf(disk_id);
  }
  return false;
}

void SteadyClip::HoldStill(Still still, Watcher& watcher) {
  DrawByItself(watcher);
  if (still == Still::automatic) return;
  const SolvedClip solved = Solved();
  LeaveOut(still, solved, still == Still::all ? MotionGroups() : FindMotionGroups(solved), watcher);
}

void SteadyClip::DeleteTracks(const std::set<TrackPoint>& points) {
  if (points == DeletedTracks()) return;
  UndoChoice();
  worked_.DeleteTracks(points);
}

Effect& SteadyClip::ShowingTracks() {
  if (with_tracks_) return *with_tracks_;
  SavedEffect saved;
  SolvedAndFramed(&saved);
  saved.values[kShowTracks] = 1;
  Effect& effect = worked_.session().Load(worked_.LayerOfItsOwn(), saved);
  worked_.session().TickUntilSettled(std::chrono::hours(24));
  with_tracks_ = &effect;
  return effect;
}

void SteadyClip::LeaveOut(Still still, const SolvedClip& solved, const MotionGroups& groups,
                          Watcher& watcher) {
  std::vector<TrackPoint> left_out;
  if (still != Still::all && groups.has_subject) {
    left_out =
        TracksOf(solved, groups,
                 still == Still::background ? MotionGroup::subject : MotionGroup::background);
  } else if (still == Still::subject) {
    watcher.Warn(path() + ": nothing near moves against what is behind it; no track is left out");
  }
  worked_.LeaveOut(left_out);
  held_ = still;
  Work(watcher);
}

void SteadyClip::FollowPicture(const FollowRequest& request, Watcher& watcher) {
  const bool stands = choice_ && request.may_choose && choice_->most_zoom == request.most_zoom &&
                      choice_->zoom_speed == request.zoom_speed &&
                      (request.still == Still::automatic || request.still == choice_->still);
  if (!request.may_choose) {
    if (ForgetChoice()) Work(watcher);
  } else if (choice_ && !stands) {
    UndoChoice();
    Work(watcher);
  }
  SavedEffect saved;
  std::shared_ptr<const MovingClip> solved = SolvedAndFramed(&saved);
  FollowSettings settings;
  settings.most_zoom = request.most_zoom;
  settings.zoom_speed = request.zoom_speed;
  settings.frames_per_second = worked_.FramesPerSecond();
  settings.enlarged = ValueOf(HX_ADDITIONAL_SCALE.disk_id) / 100;
  settings.filling = FillingOfEdges();
  if (stands) {
    Chooser chooser(*solved, settings);
    chooser.Take(*choice_, *solved);
    return Draw(choice_->best(), chooser.windows(), std::move(saved), watcher);
  }
  const bool as_set = !request.may_choose && request.still == Still::automatic;
  Still still = as_set ? Still::all : request.still;
  const MotionGroups groups =
      still == Still::all ? MotionGroups() : FindMotionGroups(solved->clip());
  worked_.GiveBack();
  if (still == Still::automatic) {
    constexpr double kCovers = 0.5;  // of the frame: less of the background hardly holds a picture
    still =
        groups.has_subject && groups.background_cover > kCovers ? Still::background : Still::all;
  }
  if (still != Still::all || held_ != Still::all) {
    LeaveOut(still, solved->clip(), groups, watcher);
    solved = SolvedAndFramed(&saved);
  }
  Chooser chooser(*solved, settings);
  Progress progress{.stage = "choosing", .total = 1};
  watcher.Show(progress);
  const auto holds = [&chooser] { return chooser.choice().best().holds; };
  chooser.Consider({.name = "as set"}, *solved);
  // Deblurring goes by the warps; whoever asks for a method has its own, as far as they can be
  // shown.
  const bool may_unbend = ValueOf(kDeblur) == 0;
  if (may_unbend && ((request.may_choose && IsFree(HX_METHOD.disk_id)) || !holds())) {
    chooser.Consider({.name = "not bent", .warps = Warps::none}, *solved, holds());
  }
  if (!holds() && settings.filling) {
    chooser.Consider({.name = "edges not filled", .fills = false}, *solved);
    if (may_unbend) {
      chooser.Consider({.name = "not bent, edges not filled", .warps = Warps::none, .fills = false},
                       *solved);
    }
  }
  Effect* copy = nullptr;
  solved.reset();  // and what is known of its motion, unless that is kept
  worked_.GiveBack();
  if (request.may_choose && (chooser.leaves_shake() || !holds())) {
    copy = TryControls(saved, chooser, watcher);
  }
  if ((request.may_choose || !holds()) && settings.enlarged == 1) chooser.ConsiderAsFilmed();
  if (copy && chooser.choice().best().changes.empty()) {  // then the controls stay, too
    worked_.session().Remove(*copy);
  } else if (copy) {
    watcher.Redraws();
    found_instance_.clear();
    worked_.Become(*copy, watcher);
  }
  choice_ = chooser.choice();
  has_new_choice_ = true;
  choice_->still = still;
  for (const Candidate& candidate : choice_->candidates) {
    for (const auto& change : candidate.changes) {
      const auto given = saved.values.find(change.first);
      if (given != saved.values.end()) choice_->given.insert(*given);
    }
  }
  progress.done = progress.total;
  progress.ends = true;
  watcher.Show(progress);
  if (!choice_->best().changes.empty()) worked_.Solved(&saved);
  Draw(choice_->best(), chooser.windows(), std::move(saved), watcher);
}

Effect* SteadyClip::TryControls(const SavedEffect& saved, Chooser& chooser, Watcher& watcher) {
  std::vector<const Trial*> trials;
  for (const Trial& trial : kTrials) {
    if (IsFree(trial.disk_id)) trials.push_back(&trial);
  }
  Effect* best = nullptr;
  const auto stops = [&] { return watcher.Stops(); };
  // Whatever the machine, two at a time, and of a long clip one: each holds the tracks and warps of
  // the whole clip.
  constexpr std::size_t kLong = 3000;  // frames
  const std::size_t at_once = range().size() < kLong ? 2 : 1;
  for (std::size_t first = 0; first < trials.size(); first += at_once) {
    std::vector<std::pair<const Trial*, Effect*>> copies;
    for (std::size_t t = first; t < std::min(first + at_once, trials.size()); ++t) {
      SavedEffect changed = saved;
      changed.values[trials[t]->disk_id] = trials[t]->value;
      copies.emplace_back(trials[t], &worked_.session().Load(worked_.LayerOfItsOwn(), changed));
    }
    worked_.session().TickUntilSettled(std::chrono::hours(24), stops);
    for (const auto& [trial, copy] : copies) {
      bool is_best = false;
      if (!watcher.Stops() && WorkedEffect::IsReady(*copy)) {
        try {
          is_best =
              chooser.Consider({.name = trial->name, .changes = {{trial->disk_id, trial->value}}},
                               WorkedEffect::SolvedBy(*copy, nullptr, path()), true);
        } catch (const SolveFailure&) {  // one that can't be had is none to choose
        }
      }
      if (is_best && best) worked_.session().Remove(*best);
      if (is_best) best = copy;
      if (!is_best) worked_.session().Remove(*copy);
      worked_.GiveBack();
    }
    watcher.Show({.stage = "choosing",
                  .done = static_cast<double>(std::min(first + at_once, trials.size())) /
                          static_cast<double>(trials.size()),
                  .total = 1});
    if (watcher.Stops()) {
      if (best) worked_.session().Remove(*best);
      throw Interrupted();
    }
  }
  return best;
}

void SteadyClip::ShowAsFilmed(Watcher& watcher) {
  DrawByItself(watcher);
  choice_.reset();
  if (!WorkedEffect::IsReady(worked_.effect())) return;  // then the effect passes them through
  SavedEffect saved;
  const SolvedClip solved = worked_.Solved(&saved);
  Draw({.name = "as filmed", .warps = Warps::none, .follows = false}, WholeFrames(solved),
       std::move(saved), watcher);
}

void SteadyClip::Draw(const Candidate& shown, const std::vector<Similarity>& windows,
                      SavedEffect saved, Watcher& watcher) {
  const double framing = ValueOf(HX_FRAMING.disk_id);
  const bool fills_edges = shown.follows && framing == kSynthesizeEdges;
  saved.instance = WithWindows(saved.instance, windows, shown.warps,
                               fills_edges ? PlacedBy::bounds : PlacedBy::crop);
  // Of what stays in its frames nothing is feathered and filled.
  if (!(fills_edges && shown.fills) && !Crops(framing)) {
    saved.values[HX_FRAMING.disk_id] = kStabilizeOnly;
  }
  saved.values[HX_ADDITIONAL_SCALE.disk_id] = 100;
  Effect& next = worked_.session().Load(worked_.LayerOfItsOwn(), saved);
  saved = {};
  worked_.session().TickUntilSettled(std::chrono::hours(24), [&] { return watcher.Stops(); });
  try {
    if (watcher.Stops()) throw Interrupted();
    worked_.CheckReady(next);
  } catch (...) {
    worked_.session().Remove(next);
    throw;
  }
  watcher.Redraws();
  DrawByItself(watcher);
  drawn_ = &next;
  windows_ = windows;
  worked_.GiveBack();
  drawn_scale_ = shown.follows ? ValueOf(HX_ADDITIONAL_SCALE.disk_id) : 100;
}

void SteadyClip::DrawByItself(Watcher& watcher) {
  if (!drawn_) return;
  watcher.Redraws();
  worked_.session().Remove(*drawn_);
  drawn_ = nullptr;
  windows_.clear();
}

Outcome SteadyClip::Measure() {
  if (drawn_ && choice_) return choice_->best().outcome;
  const std::shared_ptr<const MovingClip> moving = SolvedAndFramed();
  const SolvedClip& solved = moving->clip();
  const double zoom = Zoom(solved);
  const WarpedPlane plane(solved, Warps::solved);
  const Outcome source = MeasureSource(MotionOfSource(solved, *moving->motion(Warps::none)),
                                       worked_.FramesPerSecond());
  Outcome outcome = MeasureOutcome(source,
                                   MotionShown(plane, *moving->motion(Warps::solved),
                                               OwnWindows(solved, zoom), FillingOfEdges()),
                                   worked_.FramesPerSecond());
  if (solved.crop) {  // the effect draws the window alone, which a maximum scale leaves small
    const double across = std::min(1.0, zoom * solved.crop->width / solved.width);
    const double down = std::min(1.0, zoom * solved.crop->height / solved.height);
    outcome.most_black = std::max(outcome.most_black, 1 - across * down);
  }
  return outcome;
}

ShownPath SteadyClip::Path() {
  const std::shared_ptr<const MovingClip> moving = SolvedAndFramed();
  const SolvedClip& solved = moving->clip();
  ShownPath path = drawn_ && choice_
                       ? PathShown(*moving, choice_->best().warps, windows_)
                       : PathShown(*moving, Warps::solved, OwnWindows(solved, Zoom(solved)));
  path.most_zoom =
      ValueOf(HX_ADDITIONAL_SCALE.disk_id) / 100 *
      (drawn_ && choice_ ? choice_->most_zoom : ValueOf(HX_MAXIMUM_SCALE.disk_id) / 100);
  return path;
}

std::optional<Filling> SteadyClip::FillingOfEdges() const {
  if (ValueOf(HX_FRAMING.disk_id) != kSynthesizeEdges) return {};
  double cut = 0;
  for (const std::int32_t side : kSynthesisCuts) cut = std::max(cut, ValueOf(side));
  const double reach =
      std::round(ValueOf(HX_SYNTHESIS_INPUT_RANGE.disk_id) * worked_.FramesPerSecond());
  return Filling{
      .reach = static_cast<int>(std::min(reach, double{std::numeric_limits<int>::max()})),
      .rim = RimOf(cut, ValueOf(HX_SYNTHESIS_EDGE_FEATHER.disk_id), ValueOf(kAlphaBoost))};
}

double SteadyClip::Zoom(const SolvedClip& solved) const {
  const double additional = ValueOf(HX_ADDITIONAL_SCALE.disk_id) / 100;
  if (ValueOf(HX_FRAMING.disk_id) != kCropAutoScale || !solved.crop) return additional;
  const double rest = 1 - ValueOf(HX_ACTION_SAFE_MARGIN.disk_id) / 100;
  const double fills = std::max((solved.width * rest + 1) / solved.crop->width,
                                (solved.height * rest + 1) / solved.crop->height);
  return additional * std::max(1.0, std::min(fills, ValueOf(HX_MAXIMUM_SCALE.disk_id) / 100));
}

SavedShot SteadyClip::Saved() {
  SavedShot shot = worked_.Saved();
  // Known by now, where a group is left out.
  shot.choice =
      TextOf(choice(), {held_, held_ == Still::all ? std::set<TrackPoint>() : DeletedTracks()});
  has_new_choice_ = false;
  return shot;
}

}  // namespace calmframe::host
