#include "host/stabilize/steady_clip.h"

#include <malloc.h>

#include <algorithm>
#include <boost/make_shared.hpp>
#include <chrono>
#include <cstring>
#include <limits>
#include <nlohmann/json.hpp>
#include <numeric>
#include <utility>

#include "host/stabilize/control_items.h"
#include "host/stabilize/failures.h"
#include "platform/hx/hx_controls.h"

namespace calmframe::host {
namespace {

// Disk ids of the effect's parameters.
constexpr std::int32_t kAnalyzeButton = 1;
constexpr std::int32_t kCancelButton = 11;
constexpr std::int32_t kStabilizationGroup = 12;
constexpr std::int32_t kAutoScaleGroup = 17;  // its name tells the scale
constexpr std::int32_t kMethod = HX_METHOD.disk_id;
constexpr std::int32_t kDeblur = 15;                         // an experts' group, with a checkbox
constexpr std::int32_t kSynthesisCuts[] = {31, 32, 33, 34};  // pixels taken off each side
constexpr std::int32_t kAlphaBoost = 283;
constexpr std::int32_t kShowTracks = 280;
// What is drawn depends on them, and nothing that is solved or cropped.
constexpr std::int32_t kDrawnAlone[] = {
    HX_ADDITIONAL_SCALE.disk_id, HX_SYNTHESIS_INPUT_RANGE.disk_id,
    HX_SYNTHESIS_EDGE_FEATHER.disk_id, HX_HIDE_WARNING_BANNER.disk_id, kAlphaBoost};

bool IsDrawnAlone(std::int32_t disk_id) {
  return std::find(std::begin(kDrawnAlone), std::end(kDrawnAlone), disk_id) !=
         std::end(kDrawnAlone);
}

// Where few tracks are, those that leave the others by more than so many pixels of a picture 1000
// wide count less. Of eight filmed clips' first 6 to 14 frames 2 to 3 kept the most of the width.
constexpr double kTransitionBisquareSigma = 3;

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

constexpr std::int32_t kDeletedTrackBegins = -10;  // see SolvedClip::statuses

// The effect's words for what its status counter tells when it has ended without a result.
enum Status { kReady = 8, kAnalysisFailed = 9, kSolveFailed = 10 };

// What was freed of a clip in small pieces goes back to the system; see Settle. Else it would stand
// beside what the next step takes. Of short ones it is not worth the time.
void GiveBack(std::size_t frames) {
  constexpr std::size_t kLeast = 500;
  if (frames >= kLeast) malloc_trim(0);
}

// A tracking window of the least size needs that much.
constexpr int kLeastSide = 20;

media::FieldOrder OrderOf(std::int32_t field_type) {
  switch (field_type) {
    case HX_FIELD_FIRST_ORDER:
      return media::FieldOrder::top_first;
    case HX_FIELD_SECOND_ORDER:
      return media::FieldOrder::bottom_first;
    default:
      return media::FieldOrder::progressive;
  }
}

HostSettings SettingsFor(const media::ClipInfo& info) {
  HostSettings settings;
  settings.experimental_parameters = true;  // some of them are set below
  // A walk from the first frame to the last needs what is ahead of it and little more.
  constexpr std::size_t kFrames = 6;
  settings.media.cache_bytes =
      kFrames * static_cast<std::size_t>(info.width) * static_cast<std::size_t>(info.height) * 4;
  // Of what is saved time and again while a clip is worked, a project alone is to be small.
  settings.saves_as = PayloadForm::packed;
  return settings;
}

// Frames that an analysis of the layer asks its host for; of an interlaced one each field.
double FramesToAnalyse(const LayerState& layer) {
  return layer.length * (layer.field_type == HX_FIELD_PROGRESSIVE ? 1.0 : 2.0);
}

std::string FailureText(int status, const std::vector<std::string>& messages) {
  if (!messages.empty()) return messages.back();
  switch (status) {
    case kAnalysisFailed:
      return "the clip could not be analysed";
    case kSolveFailed:
      return "the motion of this clip could not be solved";
    default:
      return "the effect has no result for this clip (status " + std::to_string(status) + ")";
  }
}

// A layer may reach beyond its clip.
media::FrameRange RangeOf(const SavedShot& shot, const media::ClipInfo& clip) {
  const auto count = static_cast<std::int64_t>(clip.frame_count);
  const std::int64_t first = std::clamp<std::int64_t>(shot.start_frame, 0, count - 1);
  const std::int64_t end =
      std::clamp<std::int64_t>(std::int64_t{shot.start_frame} + shot.length, first + 1, count);
  return {static_cast<std::size_t>(first), static_cast<std::size_t>(end)};
}

// Shows nothing to a watcher who may stop the work all the same.
class Unseen final : public Watcher {
 public:
  explicit Unseen(Watcher& watcher) : watcher_(watcher) {}
  void Show(const Progress&) override {}
  void Warn(const std::string&) override {}
  bool Stops() override { return watcher_.Stops(); }

 private:
  Watcher& watcher_;
};

}  // namespace

std::string Reuse::Text() const {
  if (!analysis) return "";
  if (!solve) return "reused the analysis";
  return framing ? "reused the analysis, the solve and the framing"
                 : "reused the analysis and the solve";
}

ClipMedium MediumOf(std::unique_ptr<media::ClipReader> reader) {
  const media::ClipInfo info = reader->info();
  if (info.width < kLeastSide || info.height < kLeastSide) {
    throw media::Failure(media::Failure::Side::input,
                         info.path + ": " + std::to_string(info.width) + " by " +
                             std::to_string(info.height) + " pixels are too few to stabilize");
  }
  const std::shared_ptr<const media::FoundFrames> frames = reader->found();
  return {info, OpenClip(std::move(reader)), frames, info.frame_count};
}

ClipMedium OpenMedium(const std::string& path, Opening opening,
                      const media::ClipReader::Part& part) {
  return MediumOf(opening == Opening::promised ? media::ClipReader::OpenPromised(path, part)
                                               : media::ClipReader::Open(path));
}

ClipMedium StandInFor(const Project& project) {
  SourceInfo source;
  source.width = std::max(project.width, 1);
  source.height = std::max(project.height, 1);
  source.pixel_aspect = project.pixel_aspect;
  source.frame_count = std::int64_t{project.shots.back().start_frame} + project.shots.back().length;
  source.ticks_per_frame = project.ticks_per_frame;
  source.field_type = project.field_type;
  source.content = project.clip_content;
  media::ClipInfo info;
  info.path = project.clip_path;
  info.width = source.width;
  info.height = source.height;
  info.pixel_aspect = {project.pixel_aspect.num, project.pixel_aspect.den};
  const std::int64_t divisor = std::gcd(HX_TICKS_PER_SECOND, project.ticks_per_frame);
  info.frame_rate = {HX_TICKS_PER_SECOND / divisor, project.ticks_per_frame / divisor};
  info.frame_count = static_cast<std::size_t>(std::max<std::int64_t>(source.frame_count, 0));
  info.field_order = OrderOf(project.field_type);
  const auto draw = [](std::int64_t, Picture& picture) {
    std::memset(picture.memory(), 0xff, picture.bytes());
  };
  return {info, MakeDrawnSource(source, draw), nullptr, info.frame_count};
}

SteadyClip::SteadyClip(const std::string& plugin, const ClipMedium& medium,
                       const media::FrameRange& range)
    : SteadyClip(plugin, medium, nullptr, nullptr, range) {}

SteadyClip::SteadyClip(const std::string& plugin, const ClipMedium& medium, const Project& project,
                       std::size_t shot)
    : SteadyClip(plugin, medium, &project, &project.shots.at(shot),
                 RangeOf(project.shots.at(shot), medium.info)) {}

SteadyClip::SteadyClip(const std::string& plugin, const ClipMedium& medium, const Project* project,
                       const SavedShot* shot, const media::FrameRange& range) try
    : whole_(medium.info),
      range_(range),
      info_(media::PartOf(whole_, range_)),
      end_(medium.end),
      found_(medium.found),
      host_(plugin, SettingsFor(info_)),
      session_(host_) {
  const auto layer = boost::make_shared<Layer>(medium.source);
  layer->Change([&](LayerState& state) {
    state.name = state.file_name = path();
    state.start_frame = shot ? shot->start_frame : static_cast<std::int32_t>(range_.first);
    state.length = shot ? shot->length : static_cast<std::int32_t>(range_.size());
    if (!project) return;
    state.ticks_per_frame = project->ticks_per_frame;
    state.field_type = project->field_type;
  });
  effect_ = shot ? &session_.Load(layer, shot->effect) : &session_.Apply(layer);
  if (!effect_->creation().ok()) throw SolveFailure(effect_->creation().Line(path()));
  // Saved work keeps what it was made with.
  if (!shot) Set(HX_TRANSITION_BISQUARE_SIGMA.disk_id, kTransitionBisquareSigma);
  if (shot) choice_ = Choice::Parse(shot->choice);
  if (choice_) held_ = choice_->still;
  knows_deleted_ = !shot || held_ != Still::all;
} catch (const PluginError& error) {
  throw SolveFailure(error.what());
}

void SteadyClip::EndWithShot() {
  const auto layer = effect_->shared()->layer();
  const std::int64_t end =
      layer->state()->source->EndOfShot(static_cast<std::int64_t>(range_.first));
  if (end >= static_cast<std::int64_t>(range_.end)) return;
  range_.end = static_cast<std::size_t>(end);
  info_ = media::PartOf(whole_, range_);
  layer->Change([this](LayerState& state) {
    state.length = static_cast<std::int32_t>(range_.end) - state.start_frame;
  });
}

void SteadyClip::SetControls(const ParamValues& values) {
  if (!values.empty()) UndoChoice();
  for (const auto& [disk_id, value] : values) {
    Set(disk_id, value);
    set_.insert(disk_id);
  }
  has_new_controls_ = has_new_controls_ || !values.empty();
}

void SteadyClip::ResetControls(const std::set<std::int32_t>& disk_ids) {
  ParamValues declared_values;
  for (const HX_ParamDef& declared : host_.declarations()) {
    const std::optional<double> value = host::ValueOf(declared);
    if (value && disk_ids.count(declared.disk_id) > 0) declared_values[declared.disk_id] = *value;
  }
  SetControls(declared_values);
  for (const std::int32_t disk_id : disk_ids) set_.erase(disk_id);
}

void SteadyClip::TakeControls(const ParamValues& values) {
  for (const HX_ParamDef& declared : host_.declarations()) {
    const auto given = values.find(declared.disk_id);
    // What is hidden is the effect's own, such as its status.
    if (given == values.end() || (declared.ui_flags & HX_PARAM_UI_HIDDEN) != 0) continue;
    if (ValueOf(declared.disk_id) != given->second) Set(declared.disk_id, given->second);
  }
}

void SteadyClip::UndoChoice() {
  if (!choice_) return;
  for (const auto& [disk_id, value] : choice_->best().changes) {
    if (ValueOf(disk_id) == value) Set(disk_id, choice_->given[disk_id]);
  }
  choice_.reset();
  has_new_controls_ = true;
}

bool SteadyClip::ForgetChoice() {
  UndoChoice();
  if (held_ != Still::all) Leave({});
  held_ = Still::all;
  return !is_worked_;
}

void SteadyClip::TakeAsSaved() {
  const CommandResult result = effect_->Save(nullptr);
  if (!result.ok()) throw SolveFailure(result.Line(path()));
}

void SteadyClip::Settle(Watcher& watcher, Progress& shown, Reuse& reuse) {
  using Work = Session::Work;
  // By the analysis, which alone asks for frames here, and may be at work when it is first seen.
  const std::uint64_t delivered_before = host_.media().counts().delivered;
  bool has_new_tracks = false;
  const auto show = [&] {
    const Work work = Session::WorkOf(*effect_);
    EndWithShot();
    const std::uint64_t delivered = host_.media().counts().delivered;
    if (IsBroken()) return true;  // in this order: what it ends for that reason is not told
    const std::string stage = work == Work::analysing ? "analyzing"
                              : work == Work::solving ? "solving"
                                                      : "";
    if (stage.empty()) return watcher.Stops();
    if (stage != shown.stage) End(watcher, shown);
    reuse.framing = false;
    if (work == Work::analysing) {
      reuse.analysis = false;
      analysed_ = true;
    } else if (analysed_) {
      has_new_tracks = true;
      return true;
    }
    const bool begins = stage != shown.stage;
    if (work == Work::analysing) {
      shown.unit = "frames";
      shown.total = FramesToAnalyse(*effect_->shared()->layer()->state());
      const auto done = static_cast<double>(delivered - delivered_before);
      shown.done = begins ? 0 : std::min(done, shown.total);
    }
    shown.stage = stage;
    shown.says = NameOf(work == Work::analysing ? kCancelButton : kStabilizationGroup);
    // Nothing is done yet, whatever it says by now; or it says its bare name.
    if (begins || shown.says.find('(') == std::string::npos) shown.says.clear();
    watcher.Show(shown);
    return watcher.Stops();
  };
  while (true) {
    const auto waited = session_.TickUntilSettled(std::chrono::hours(24 * 30), show);
    if (IsBroken()) throw BrokenPromise();
    if (watcher.Stops()) throw Interrupted();
    if (!std::exchange(has_new_tracks, false)) {
      if (waited != Session::Wait::settled) throw Interrupted();
      break;
    }
    TakeAsSaved();  // ahead of what is solved of them
    GiveBack(range_.size());
    analysed_ = false;
  }
  // The render that follows has its own pattern of buffers: what the analysis took goes back.
  malloc_trim(0);
}

void SteadyClip::End(Watcher& watcher, Progress& shown) {
  if (!shown.stage.empty()) {
    shown.ends = true;
    shown.done = shown.total;
    watcher.Show(shown);
  }
  shown = {};
}

void SteadyClip::Set(std::int32_t disk_id, double value) {
  if (!IsDrawnAlone(disk_id)) is_worked_ = false;
  const CommandResult result = effect_->SetParam(effect_->IndexOf(disk_id), value);
  if (!result.ok()) throw SolveFailure(result.Line(path()));
}

template <class Act>
auto SteadyClip::Keeping(std::int32_t disk_id, const Act& act) {
  const double value = ValueOf(disk_id);
  try {
    return act(value);
  } catch (...) {
    effect_->SetParam(effect_->IndexOf(disk_id), value);
    throw;
  }
}

Reuse SteadyClip::Work(Watcher& watcher) {
  if (is_worked_) return {true, true, true};
  found_instance_.clear();
  if (!drawn_ || with_tracks_) watcher.Redraws();
  if (with_tracks_) session_.Remove(*with_tracks_);
  with_tracks_ = nullptr;
  const Reuse reuse =
      Keeping(HX_FRAMING.disk_id, [&](double framing) { return WorkFramedLast(framing, watcher); });
  is_worked_ = true;
  return reuse;
}

bool SteadyClip::Preview(const ParamValues& values) {
  for (const auto& change : values) {
    if (!IsDrawnAlone(change.first)) return false;
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

Reuse SteadyClip::WorkFramedLast(double framing, Watcher& watcher) {
  Reuse reuse{true, true, true};
  Progress shown;
  const void* const warp = FirstWarp();
  // The crop window is to be that of the warps as they are saved, so it comes behind them.
  if (Crops(framing)) Set(HX_FRAMING.disk_id, kStabilizeOnly);
  Settle(watcher, shown, reuse);
  // Saved work of another span, of other settings, or of none is not begun anew by itself.
  const std::int32_t analyze = effect_->IndexOf(kAnalyzeButton);
  if (const auto button = effect_->Param(analyze);
      button && (button->ui_flags & HX_PARAM_UI_DISABLED) == 0) {
    if (!found_) {
      throw media::Failure(media::Failure::Side::input,
                           path() + ": is gone, and what was made of it doesn't stand any more");
    }
    reuse = {};
    deleted_.clear();
    knows_deleted_ = true;
    const CommandResult pressed = effect_->Press(analyze);
    if (!pressed.ok()) throw SolveFailure(pressed.Line(path()));
    Settle(watcher, shown, reuse);
  }
  // An analysis that ended early has not seen all that was promised; a shot before the last is to.
  if (found_ && range_.end == end_ && found_->standing() != media::Standing::decoded) {
    throw BrokenPromise();
  }
  reuse.solve = reuse.analysis && warp && warp == FirstWarp();
  if (!reuse.solve && FirstWarp()) TakeAsSaved();
  if (Crops(framing) && Session::StatusOf(*effect_) == kReady) {
    Set(HX_FRAMING.disk_id, framing);
    Settle(watcher, shown, reuse);
  }
  End(watcher, shown);
  reuse.framing = reuse.framing && reuse.solve;
  CheckResult(watcher);
  return reuse;
}

void SteadyClip::CheckResult(Watcher& watcher) {
  CheckMedia();
  const std::vector<std::string> messages = effect_->TakeMessages();
  const int status = Session::StatusOf(*effect_);
  if (status != kReady) throw SolveFailure(path() + ": " + FailureText(status, messages));
  for (const std::string& message : messages) watcher.Warn(message);
}

void SteadyClip::SolveAnew(Watcher& watcher) {
  found_instance_.clear();
  Progress shown;
  Reuse ignored;
  Keeping(kMethod, [&](double value) {
    const std::int32_t method = effect_->IndexOf(kMethod);
    // A method that is quick to solve for, without a word; with the first one again, nothing of it
    // stands.
    Unseen unseen(watcher);
    effect_->SetParam(method, value == 1 ? 2.0 : 1.0);
    Settle(unseen, shown, ignored);
    shown = {};
    effect_->SetParam(method, value);
  });
  Settle(watcher, shown, ignored);
  End(watcher, shown);
  CheckResult(watcher);
}

SolvedClip SteadyClip::Solved() {
  return Solved(*effect_, nullptr, path());
}

std::shared_ptr<const MovingClip> SteadyClip::SolvedAndFramed(SavedEffect* saved) {
  if (found_of_ && !found_instance_.empty()) {
    if (saved) {
      saved->match_name = host_.library().properties().match_name;
      saved->values = effect_->shared()->params().Values();
      saved->instance = found_instance_;
    }
    return found_of_;
  }
  SavedEffect effect;
  SolvedClip solved = Solved(*effect_, saved || keeps_found_ ? &effect : nullptr, path());
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

SolvedClip SteadyClip::Solved(Effect& effect, SavedEffect* saved, const std::string& name) {
  SavedEffect unwanted;
  const CommandResult result = effect.Save(saved ? saved : &unwanted);
  if (!result.ok()) throw SolveFailure(result.Line(name));
  try {
    return ReadSolvedClip(saved ? saved->instance : std::move(unwanted.instance));
  } catch (const NoSolvedClip& failure) {
    throw SolveFailure(name + ": " + failure.what());
  }
}

boost::shared_ptr<Layer> SteadyClip::LayerOfItsOwn() const {
  const auto state = effect_->shared()->layer()->state();
  const auto layer = boost::make_shared<Layer>(state->source);
  layer->Change([&](LayerState& copy) {
    copy.name = state->name;
    copy.file_name = state->file_name;
    copy.start_frame = state->start_frame;
    copy.length = state->length;
    copy.ticks_per_frame = state->ticks_per_frame;
    copy.field_type = state->field_type;
  });
  return layer;
}

bool SteadyClip::IsFree(std::int32_t disk_id) const {
  if (set_.count(disk_id) > 0) return false;
  for (const HX_ParamDef& declared : host_.declarations()) {
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

void SteadyClip::Leave(const std::vector<TrackPoint>& left_out) {
  std::vector<TrackPoint> all = left_out;
  all.insert(all.end(), DeletedTracks().begin(), DeletedTracks().end());
  is_worked_ = false;
  left_out_ = left_out;
  const CommandResult result = effect_->DeleteTracks(all);
  if (!result.ok()) throw SolveFailure(result.Line(path()));
}

void SteadyClip::DeleteTracks(const std::set<TrackPoint>& points) {
  if (points == DeletedTracks()) return;
  UndoChoice();
  deleted_ = points;
  Leave(left_out_);
}

const std::set<TrackPoint>& SteadyClip::DeletedTracks() {
  if (knows_deleted_) return deleted_;
  knows_deleted_ = true;
  try {
    const SolvedClip solved = Solved();
    for (std::int32_t row = 0; row < solved.frame_count; ++row) {
      const TrackRow tracks = solved.TracksOf(static_cast<std::size_t>(row));
      for (std::int32_t slot = 0; slot < solved.slots; ++slot) {
        if (tracks.statuses[static_cast<std::size_t>(slot)] == kDeletedTrackBegins) {
          deleted_.insert({solved.first_frame + row, slot});
        }
      }
    }
  } catch (const SolveFailure&) {  // nothing is solved, and nothing deleted
  }
  return deleted_;
}

Effect& SteadyClip::ShowingTracks() {
  if (with_tracks_) return *with_tracks_;
  SavedEffect saved;
  SolvedAndFramed(&saved);
  saved.values[kShowTracks] = 1;
  Effect& effect = session_.Load(LayerOfItsOwn(), saved);
  session_.TickUntilSettled(std::chrono::hours(24));
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
  Leave(left_out);
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
  settings.frames_per_second = FramesPerSecond();
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
  GiveBack(range_.size());
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
  chooser.Consider({.name = "as set"}, *solved);
  // Whoever asks for a method has its warps; deblurring goes by theirs, too.
  if (request.may_choose && IsFree(kMethod) && ValueOf(kDeblur) == 0) {
    chooser.Consider({.name = "not bent", .warps = Warps::none}, *solved, true);
  }
  Effect* copy = nullptr;
  solved.reset();  // and what is known of its motion, unless that is kept
  GiveBack(range_.size());
  if (request.may_choose && chooser.leaves_shake()) copy = TryControls(saved, chooser, watcher);
  if (request.may_choose && settings.enlarged == 1) chooser.ConsiderAsFilmed();
  if (copy && chooser.choice().best().changes.empty()) {  // then the controls stay, too
    session_.Remove(*copy);
  } else if (copy) {
    BecomeCopy(*copy, watcher);
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
  if (!choice_->best().changes.empty()) Solved(*effect_, &saved, path());
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
  const std::size_t at_once = range_.size() < kLong ? 2 : 1;
  for (std::size_t first = 0; first < trials.size(); first += at_once) {
    std::vector<std::pair<const Trial*, Effect*>> copies;
    for (std::size_t t = first; t < std::min(first + at_once, trials.size()); ++t) {
      SavedEffect changed = saved;
      changed.values[trials[t]->disk_id] = trials[t]->value;
      copies.emplace_back(trials[t], &session_.Load(LayerOfItsOwn(), changed));
    }
    session_.TickUntilSettled(std::chrono::hours(24), stops);
    for (const auto& [trial, copy] : copies) {
      bool is_best = false;
      if (!watcher.Stops() && Session::StatusOf(*copy) == kReady) {
        try {
          is_best =
              chooser.Consider({.name = trial->name, .changes = {{trial->disk_id, trial->value}}},
                               Solved(*copy, nullptr, path()), true);
        } catch (const SolveFailure&) {  // one that can't be had is none to choose
        }
      }
      if (is_best && best) session_.Remove(*best);
      if (is_best) best = copy;
      if (!is_best) session_.Remove(*copy);
      GiveBack(range_.size());
    }
    watcher.Show({.stage = "choosing",
                  .done = static_cast<double>(std::min(first + at_once, trials.size())) /
                          static_cast<double>(trials.size()),
                  .total = 1});
    if (watcher.Stops()) {
      if (best) session_.Remove(*best);
      throw Interrupted();
    }
  }
  return best;
}

void SteadyClip::BecomeCopy(Effect& copy, Watcher& watcher) {
  watcher.Redraws();
  found_instance_.clear();
  is_worked_ = false;
  session_.Remove(*effect_);
  effect_ = &copy;
  TakeAsSaved();
  Unseen unseen(watcher);
  const double framing = ValueOf(HX_FRAMING.disk_id);
  if (Crops(framing)) {
    // Its crop window, too, is to be that of the warps as they are saved.
    Set(HX_FRAMING.disk_id, kStabilizeOnly);
    Progress shown;
    Reuse ignored;
    Settle(unseen, shown, ignored);
    Set(HX_FRAMING.disk_id, framing);
    Settle(unseen, shown, ignored);
    CheckResult(unseen);
  }
  is_worked_ = true;
}

void SteadyClip::ShowAsFilmed(Watcher& watcher) {
  DrawByItself(watcher);
  choice_.reset();
  if (Session::StatusOf(*effect_) != kReady) return;  // then the effect passes them through
  SavedEffect saved;
  const SolvedClip solved = Solved(*effect_, &saved, path());
  Draw({.name = "as filmed", .warps = Warps::none, .follows = false}, WholeFrames(solved),
       std::move(saved), watcher);
}

void SteadyClip::Draw(const Candidate& shown, const std::vector<Similarity>& windows,
                      SavedEffect saved, Watcher& watcher) {
  const bool fills = shown.follows && ValueOf(HX_FRAMING.disk_id) == kSynthesizeEdges;
  saved.instance =
      WithWindows(saved.instance, windows, shown.warps, fills ? PlacedBy::bounds : PlacedBy::crop);
  // Of a clip as it was filmed nothing is feathered and filled.
  if (!fills && !Crops(ValueOf(HX_FRAMING.disk_id))) {
    saved.values[HX_FRAMING.disk_id] = kStabilizeOnly;
  }
  saved.values[HX_ADDITIONAL_SCALE.disk_id] = 100;
  Effect& next = session_.Load(LayerOfItsOwn(), saved);
  saved = {};
  session_.TickUntilSettled(std::chrono::hours(24), [&] { return watcher.Stops(); });
  const int status = Session::StatusOf(next);
  if (watcher.Stops() || status != kReady) {
    session_.Remove(next);
    if (watcher.Stops()) throw Interrupted();
    throw SolveFailure(path() + ": " + FailureText(status, {}));
  }
  watcher.Redraws();
  DrawByItself(watcher);
  drawn_ = &next;
  windows_ = windows;
  GiveBack(range_.size());
  drawn_scale_ = shown.follows ? ValueOf(HX_ADDITIONAL_SCALE.disk_id) : 100;
}

void SteadyClip::DrawByItself(Watcher& watcher) {
  if (!drawn_) return;
  watcher.Redraws();
  session_.Remove(*drawn_);
  drawn_ = nullptr;
  windows_.clear();
}

Outcome SteadyClip::Measure() {
  if (drawn_ && choice_) return choice_->best().outcome;
  const std::shared_ptr<const MovingClip> moving = SolvedAndFramed();
  const SolvedClip& solved = moving->clip();
  const double zoom = Zoom(solved);
  const WarpedPlane plane(solved, Warps::solved);
  const Outcome source =
      MeasureSource(MotionOfSource(solved, *moving->motion(Warps::none)), FramesPerSecond());
  Outcome outcome = MeasureOutcome(source,
                                   MotionShown(plane, *moving->motion(Warps::solved),
                                               OwnWindows(solved, zoom), FillingOfEdges()),
                                   FramesPerSecond());
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
  const double reach = std::round(ValueOf(HX_SYNTHESIS_INPUT_RANGE.disk_id) * FramesPerSecond());
  return Filling{
      .reach = static_cast<int>(std::min(reach, double{std::numeric_limits<int>::max()})),
      .rim = RimOf(cut, ValueOf(HX_SYNTHESIS_EDGE_FEATHER.disk_id), ValueOf(kAlphaBoost))};
}

double SteadyClip::FramesPerSecond() const {
  return static_cast<double>(info_.frame_rate.num) / static_cast<double>(info_.frame_rate.den) *
         (info_.field_order == media::FieldOrder::progressive ? 1 : 2);
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
  SavedShot shot;
  host_.SaveAs(PayloadForm::deflated);
  const CommandResult saved = effect_->Save(&shot.effect);
  host_.SaveAs(PayloadForm::packed);
  if (!saved.ok()) throw SolveFailure(saved.Line(path()));
  const auto layer = effect_->shared()->layer()->state();
  shot.start_frame = layer->start_frame;
  shot.length = layer->length;
  if (choice_) shot.choice = choice_->Json().dump();
  has_new_choice_ = false;
  return shot;
}

const void* SteadyClip::FirstWarp() {
  const HX_GetStabilizerData get = host_.library().exports().get_stabilizer_data;
  const HX_GetOVVarVector get_warp = host_.library().exports().get_var_vector;
  const void* block = effect_->opaque_data();
  std::int32_t frames = 0, ignored;
  float ignored_bound;
  if (!get || !get_warp ||
      !get(block, &frames, &ignored, &ignored, &ignored, &ignored, &ignored, &ignored_bound,
           &ignored_bound, &ignored_bound, &ignored_bound, &ignored, &ignored) ||
      frames < 1) {
    return nullptr;
  }
  return get_warp(block, 0);
}

std::unique_ptr<CropWindow> SteadyClip::Crop() {
  const HX_GetStabilizerData get = host_.library().exports().get_stabilizer_data;
  const void* block = effect_->opaque_data();
  // Windows come out a little below 0 too.
  constexpr std::int32_t kUntouched = std::numeric_limits<std::int32_t>::min();
  std::int32_t frames, first, columns, rows, width = kUntouched, height = kUntouched, w, h;
  float left, top, right, bottom;
  if (!get ||
      !get(block, &frames, &first, &columns, &rows, &width, &height, &left, &top, &right, &bottom,
           &w, &h) ||
      width == kUntouched) {
    return nullptr;
  }
  return std::make_unique<CropWindow>(CropWindow{width, height});
}

std::string SteadyClip::CropText() {
  const std::unique_ptr<CropWindow> crop = Crop();
  if (!crop) return "";
  return "crop window " + std::to_string(crop->width) + "x" + std::to_string(crop->height) + ", " +
         NameOf(kAutoScaleGroup);
}

std::string SteadyClip::NameOf(std::int32_t disk_id) const {
  const auto param = effect_->Param(effect_->IndexOf(disk_id));
  return param ? param->name : "";
}

double SteadyClip::ValueOf(std::int32_t disk_id) const {
  const auto param = effect_->Param(effect_->IndexOf(disk_id));
  return param ? host::ValueOf(*param).value_or(0.0) : 0.0;
}

bool SteadyClip::IsBroken() const {
  return found_ && found_->standing() == media::Standing::broken;
}

void SteadyClip::CheckMedia() {
  const std::string failure = host_.media().failure();
  if (!failure.empty()) throw media::Failure(media::Failure::Side::input, failure);
}

}  // namespace calmframe::host
