#include "host/stabilize/worked_effect.h"

#include <malloc.h>

#include <algorithm>
#include <boost/make_shared.hpp>
#include <chrono>
#include <iterator>
#include <limits>
#include <optional>
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
// What is drawn depends on them, and nothing that is solved or cropped.
constexpr std::int32_t kDrawnAlone[] = {
    HX_ADDITIONAL_SCALE.disk_id, HX_SYNTHESIS_INPUT_RANGE.disk_id,
    HX_SYNTHESIS_EDGE_FEATHER.disk_id, HX_HIDE_WARNING_BANNER.disk_id, kAlphaBoost};

// Where few tracks are, those that leave the others by more than so many pixels of a picture 1000
// wide count less. Of eight filmed clips' first 6 to 14 frames 2 to 3 kept the most of the width.
constexpr double kTransitionBisquareSigma = 3;

// The effect's words for what its status counter tells when it has ended without a result.
enum Status { kReady = 8, kAnalysisFailed = 9, kSolveFailed = 10 };

HostSettings SettingsFor(const media::ClipInfo& info) {
  HostSettings settings;
  settings.experimental_parameters = true;  // one of them is set below
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

// A source keeps what it decodes while this lives.
class KeepingDecoded {
 public:
  KeepingDecoded(SourcePtr source, std::size_t bytes) : source_(std::move(source)) {
    source_->KeepDecoded(bytes);
  }
  ~KeepingDecoded() { source_->KeepDecoded(0); }
  KeepingDecoded(const KeepingDecoded&) = delete;
  KeepingDecoded& operator=(const KeepingDecoded&) = delete;

 private:
  const SourcePtr source_;
};

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

WorkedEffect::WorkedEffect(const std::string& plugin, const ClipMedium& medium,
                           const media::FrameRange& range)
    : WorkedEffect(plugin, medium, nullptr, nullptr, range) {}

WorkedEffect::WorkedEffect(const std::string& plugin, const ClipMedium& medium,
                           const Project& project, std::size_t shot)
    : WorkedEffect(plugin, medium, &project, &project.shots.at(shot),
                   RangeOf(project.shots.at(shot), medium.info)) {}

WorkedEffect::WorkedEffect(const std::string& plugin, const ClipMedium& medium,
                           const Project* project, const SavedShot* shot,
                           const media::FrameRange& range) try
    : whole_(medium.info),
      range_(range),
      info_(media::PartOf(whole_, range_)),
      end_(medium.end),
      kept_bytes_(medium.kept_bytes),
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
  knows_deleted_ = !shot;
} catch (const PluginError& error) {
  throw SolveFailure(error.what());
}

void WorkedEffect::EndWithShot() {
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

void WorkedEffect::TakeAsSaved() {
  const CommandResult result = effect_->Save(nullptr);
  if (!result.ok()) throw SolveFailure(result.Line(path()));
}

void WorkedEffect::Settle(Watcher& watcher, Progress& shown, Reuse& reuse) {
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
    GiveBack();
    analysed_ = false;
  }
  // The render that follows has its own pattern of buffers: what the analysis took goes back.
  malloc_trim(0);
}

void WorkedEffect::End(Watcher& watcher, Progress& shown) {
  if (!shown.stage.empty()) {
    shown.ends = true;
    shown.done = shown.total;
    watcher.Show(shown);
  }
  shown = {};
}

bool WorkedEffect::IsDrawnAlone(std::int32_t disk_id) {
  return std::find(std::begin(kDrawnAlone), std::end(kDrawnAlone), disk_id) !=
         std::end(kDrawnAlone);
}

void WorkedEffect::Set(std::int32_t disk_id, double value) {
  if (!IsDrawnAlone(disk_id)) is_worked_ = false;
  const CommandResult result = effect_->SetParam(effect_->IndexOf(disk_id), value);
  if (!result.ok()) throw SolveFailure(result.Line(path()));
}

template <class Act>
auto WorkedEffect::Keeping(std::int32_t disk_id, const Act& act) {
  const double value = ValueOf(disk_id);
  try {
    return act(value);
  } catch (...) {
    effect_->SetParam(effect_->IndexOf(disk_id), value);
    throw;
  }
}

Reuse WorkedEffect::Work(Watcher& watcher) {
  if (is_worked_) return {true, true, true};
  // All frames that it asks for are the analysis's.
  const KeepingDecoded keeps(effect_->shared()->layer()->state()->source, kept_bytes_);
  const Reuse reuse =
      Keeping(HX_FRAMING.disk_id, [&](double framing) { return WorkFramedLast(framing, watcher); });
  is_worked_ = true;
  return reuse;
}

Reuse WorkedEffect::WorkFramedLast(double framing, Watcher& watcher) {
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
  if (Crops(framing) && IsReady(*effect_)) {
    Set(HX_FRAMING.disk_id, framing);
    Settle(watcher, shown, reuse);
  }
  End(watcher, shown);
  reuse.framing = reuse.framing && reuse.solve;
  CheckResult(watcher);
  return reuse;
}

bool WorkedEffect::IsReady(const Effect& effect) {
  return Session::StatusOf(effect) == kReady;
}

void WorkedEffect::CheckReady(const Effect& effect,
                              const std::vector<std::string>& messages) const {
  if (IsReady(effect)) return;
  throw SolveFailure(path() + ": " + FailureText(Session::StatusOf(effect), messages));
}

void WorkedEffect::CheckResult(Watcher& watcher) {
  CheckMedia();
  const std::vector<std::string> messages = effect_->TakeMessages();
  CheckReady(*effect_, messages);
  for (const std::string& message : messages) watcher.Warn(message);
}

void WorkedEffect::SolveAnew(Watcher& watcher) {
  Progress shown;
  Reuse ignored;
  Keeping(HX_METHOD.disk_id, [&](double value) {
    const std::int32_t method = effect_->IndexOf(HX_METHOD.disk_id);
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

void WorkedEffect::Become(Effect& other, Watcher& watcher) {
  is_worked_ = false;
  session_.Remove(*effect_);
  effect_ = &other;
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

SolvedClip WorkedEffect::Solved(SavedEffect* saved) {
  return SolvedBy(*effect_, saved, path());
}

SolvedClip WorkedEffect::SolvedBy(Effect& effect, SavedEffect* saved, const std::string& name) {
  SavedEffect unwanted;
  const CommandResult result = effect.Save(saved ? saved : &unwanted);
  if (!result.ok()) throw SolveFailure(result.Line(name));
  try {
    return ReadSolvedClip(saved ? saved->instance : std::move(unwanted.instance));
  } catch (const NoSolvedClip& failure) {
    throw SolveFailure(name + ": " + failure.what());
  }
}

SavedShot WorkedEffect::Saved() {
  SavedShot shot;
  host_.SaveAs(PayloadForm::deflated);
  const CommandResult saved = effect_->Save(&shot.effect);
  host_.SaveAs(PayloadForm::packed);
  if (!saved.ok()) throw SolveFailure(saved.Line(path()));
  const auto layer = effect_->shared()->layer()->state();
  shot.start_frame = layer->start_frame;
  shot.length = layer->length;
  return shot;
}

void WorkedEffect::GiveBack() const {
  constexpr std::size_t kLeast = 500;  // frames
  if (range_.size() >= kLeast) malloc_trim(0);
}

boost::shared_ptr<Layer> WorkedEffect::LayerOfItsOwn() const {
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

void WorkedEffect::LeaveOut(const std::vector<TrackPoint>& of_group) {
  std::vector<TrackPoint> all = of_group;
  all.insert(all.end(), DeletedTracks().begin(), DeletedTracks().end());
  is_worked_ = false;
  left_out_ = of_group;
  const CommandResult result = effect_->DeleteTracks(all);
  if (!result.ok()) throw SolveFailure(result.Line(path()));
}

void WorkedEffect::DeleteTracks(const std::set<TrackPoint>& points) {
  deleted_ = points;
  knows_deleted_ = true;
  LeaveOut(left_out_);
}

const std::set<TrackPoint>& WorkedEffect::DeletedTracks() {
  if (knows_deleted_) return deleted_;
  knows_deleted_ = true;
  try {
    const SolvedClip solved = Solved(nullptr);
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

double WorkedEffect::FramesPerSecond() const {
  return static_cast<double>(info_.frame_rate.num) / static_cast<double>(info_.frame_rate.den) *
         (info_.field_order == media::FieldOrder::progressive ? 1 : 2);
}

const void* WorkedEffect::FirstWarp() {
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

std::unique_ptr<CropWindow> WorkedEffect::Crop() {
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

std::string WorkedEffect::CropText() {
  const std::unique_ptr<CropWindow> crop = Crop();
  if (!crop) return "";
  return "crop window " + std::to_string(crop->width) + "x" + std::to_string(crop->height) + ", " +
         NameOf(kAutoScaleGroup);
}

std::string WorkedEffect::NameOf(std::int32_t disk_id) const {
  const auto param = effect_->Param(effect_->IndexOf(disk_id));
  return param ? param->name : "";
}

double WorkedEffect::ValueOf(std::int32_t disk_id) const {
  const auto param = effect_->Param(effect_->IndexOf(disk_id));
  return param ? host::ValueOf(*param).value_or(0.0) : 0.0;
}

bool WorkedEffect::IsBroken() const {
  return found_ && found_->standing() == media::Standing::broken;
}

void WorkedEffect::CheckMedia() {
  const std::string failure = host_.media().failure();
  if (!failure.empty()) throw media::Failure(media::Failure::Side::input, failure);
}

}  // namespace calmframe::host
