#include <algorithm>
#include <chrono>
#include <utility>

#include "host/base/param_text.h"
#include "host/stabilize/failures.h"
#include "host/stabilize/framing.h"
#include "platform/hx/hx_controls.h"
#include "studio/worker/clip_desk.h"
#include "studio/worker/curves.h"

// How a clip's desk brings a shot to what its settings ask for.
namespace calmframe::studio {

// Tells how far the work is, and ends it when something else is wanted.
class ClipDesk::Onlooker final : public host::Watcher {
 public:
  Onlooker(ClipDesk& desk, std::uint64_t version) : desk_(desk), version_(version) {}

  void Show(const host::Progress& progress) override {
    const auto now = std::chrono::steady_clock::now();
    const bool begins = stage_ != progress.stage;
    if (begins) {
      stage_ = progress.stage;
      begin_ = now;
    }
    constexpr std::chrono::milliseconds kBetween(100);
    if (!begins && !progress.ends && now - told_ < kBetween) return;
    told_ = now;
    const double elapsed = std::chrono::duration<double>(now - begin_).count();
    const double share =
        progress.ends
            ? 1
            : (progress.total > 0 ? std::clamp(progress.done / progress.total, 0.0, 1.0) : 0.0);
    nlohmann::json shown = {{"stage", progress.stage}, {"says", progress.says}};
    if (progress.total > 0) shown["share"] = share;
    if (!progress.unit.empty()) {
      shown["done"] = progress.done;
      shown["total"] = progress.total;
      shown["unit"] = progress.unit;
    }
    if (share > 0.02 && share < 1) shown["left"] = elapsed * (1 - share) / share;
    desk_.tell_({{"progress", std::move(shown)}});
  }
  void Warn(const std::string& line) override {
    std::vector<std::string>& lines = desk_.warnings_;
    if (std::find(lines.begin(), lines.end(), line) == lines.end()) lines.push_back(line);
  }
  bool Stops() override {
    if (desk_.IsOutdated(version_)) return true;
    const std::lock_guard lock(desk_.mutex_);
    return desk_.cancelled_;
  }
  void Redraws() override { desk_.frames_.Hide(); }

 private:
  ClipDesk& desk_;
  const std::uint64_t version_;
  std::string stage_;
  std::chrono::steady_clock::time_point begin_, told_;
};

bool ClipDesk::IsOutdated(std::uint64_t version) {
  const std::lock_guard lock(mutex_);
  return ended_ || open_ || version_ != version;
}

// An analysis has numbered the tracks anew.
void ClipDesk::ForgetDeleted() {
  nlohmann::json left;
  {
    const std::lock_guard lock(mutex_);
    settings_.deleted.clear();
    left = JsonOf(settings_);
  }
  tell_({{"settings", std::move(left)}});
}

void ClipDesk::TellPicture() {
  tell_({{"picture", ++pictures_}, {"shows", shots_[film_->number()].shows}});
}

ClipDesk::Changes ClipDesk::ChangesOf(host::SteadyClip& shot, const Settings& settings) const {
  const auto given_to = [&shot](std::int32_t disk_id) {
    if (const host::Choice* choice = shot.choice()) {
      const auto given = choice->given.find(disk_id);
      if (given != choice->given.end()) return given->second;
    }
    return shot.ValueOf(disk_id);
  };
  Changes changes;
  for (const HX_ParamDef& declared : shot.host().declarations()) {
    const std::int32_t id = declared.disk_id;
    if (!IsControl(declared)) continue;
    const auto wanted = settings.controls.find(id);
    if (wanted != settings.controls.end()) {
      // What is as it is asked for is left, and a choice with it.
      if (given_to(id) != wanted->second) changes.values[id] = wanted->second;
    } else if (applied_.count(id) > 0 ||
               (touched_.count(id) > 0 && given_to(id) != DefaultOf(declared))) {
      changes.resets.insert(id);
    }
  }
  return changes;
}

void ClipDesk::Apply(host::SteadyClip& shot, const Settings& settings) {
  const Changes changes = ChangesOf(shot, settings);
  if (!changes.resets.empty()) shot.ResetControls(changes.resets);
  shot.SetControls(changes.values);
  if (shots_.size() > film_->number() || !settings.deleted.empty()) {
    std::set<host::TrackPoint> deleted;
    const std::int64_t fields =
        film_->whole().field_order == media::FieldOrder::progressive ? 1 : 2;
    for (const host::TrackPoint& point : settings.deleted) {
      const auto frame = static_cast<std::size_t>(point.frame / fields);
      if (frame >= shot.range().first && frame < shot.range().end) deleted.insert(point);
    }
    shot.DeleteTracks(deleted);
  }
  for (const std::int32_t id : changes.resets) applied_.erase(id);
  for (const auto& change : changes.values) {
    applied_.insert(change.first);
    touched_.insert(change.first);
  }
}

void ClipDesk::Frame(host::SteadyClip& shot, const Settings& settings, Onlooker& onlooker) {
  host::CropTrouble trouble;
  try {
    trouble = host::ChooseFraming(shot, settings.window, onlooker);
  } catch (const host::WindowRefused& refused) {
    onlooker.Warn(refused.what());
    host::WindowSettings own = settings.window;
    own.kind = host::WindowSettings::Kind::steady;
    own.most_zoom = 0;
    own.zoom_speed.reset();
    trouble = host::ChooseFraming(shot, own, onlooker);
  }
  if (const std::string text = host::TroubleText(trouble); !text.empty()) onlooker.Warn(text);
}

void ClipDesk::Preview(host::SteadyClip& shot) {
  Settings settings;
  {
    const std::lock_guard lock(mutex_);
    settings = settings_;
    previewed_ = version_;
    steady_at_ = {};
  }
  const Changes changes = ChangesOf(shot, settings);
  host::ParamValues values = changes.values;
  for (const HX_ParamDef& declared : shot.host().declarations()) {
    if (changes.resets.count(declared.disk_id) > 0) {
      values[declared.disk_id] = DefaultOf(declared);
    }
  }
  try {
    const bool follows = shot.choice() && shot.choice()->best().follows;
    if (values.empty() || host::Follows(shot, settings.window) != follows) return;
    if (!shot.Preview(values)) return;
  } catch (const std::runtime_error&) {  // told where it is steadied
    return;
  }
  TellPicture();
  // While a hand is on a control the next change comes soon, and is to find nobody busy.
  constexpr std::chrono::milliseconds kPause(150);
  const std::lock_guard lock(mutex_);
  steady_at_ = std::chrono::steady_clock::now() + kPause;
}

void ClipDesk::Steady(host::SteadyClip& shot) {
  Settings settings;
  std::uint64_t version = 0;
  {
    const std::lock_guard lock(mutex_);
    settings = settings_;
    version = version_;
    cancelled_ = false;
    shot_version_ = version_;
  }
  Onlooker onlooker(*this, version);
  warnings_.clear();
  if (!film_->whole().warning.empty()) warnings_.push_back(film_->whole().warning);
  error_.clear();
  state_ = "working";
  TellState();
  bool solved = true;
  shot.KeepWhatIsFound();
  try {
    Apply(shot, settings);
    // To a choice that stands it is all the same who was asked for before.
    host::Still& asked = asked_still_[film_->number()];
    const host::Still before = std::exchange(asked, settings.window.still);
    if (asked == host::Still::automatic && before != asked) shot.ForgetChoice();
    if (!shot.Work(onlooker).analysis && !settings.deleted.empty()) {
      onlooker.Warn("the tracks are new ones; those that were deleted are forgotten");
      ForgetDeleted();
    }
    Frame(shot, settings, onlooker);
  } catch (const host::SolveFailure& failure) {
    solved = false;
    onlooker.Warn(std::string(failure.what()) + "; the shot stays as it was filmed");
    shot.ShowAsFilmed(onlooker);
  }
  ShowPicture(shot, version, solved);
  TellPanel(shot);
  KeepResult(shot, version, solved);
  TellShots();
  is_kept_ = false;
  state_ = whole_ ? "ready" : "working";
}

// Ahead of what is told of it in figures, which takes longer.
void ClipDesk::ShowPicture(host::SteadyClip& shot, std::uint64_t version, bool solved) {
  frames_.Show(shot);
  const std::size_t number = film_->number();
  if (shots_.size() <= number) shots_.resize(number + 1);
  shots_[number].range = shot.range();
  shots_[number].shows = version;
  TellPicture();
  {
    const auto found = solved ? shot.Found() : nullptr;
    const std::lock_guard lock(mutex_);
    found_ = found;
    fields_ = film_->whole().field_order == media::FieldOrder::progressive ? 1 : 2;
  }
  if (IsOutdated(version)) throw host::Interrupted();
}

void ClipDesk::KeepResult(host::SteadyClip& shot, std::uint64_t version, bool solved) {
  Shot kept = {.range = shot.range(),
               .version = version,
               .shows = version,
               .solved = solved,
               .outcome = host::AsFilmed(),
               .choice = nullptr,
               .curves = nullptr};
  if (solved) {
    kept.outcome = shot.Measure();
    if (IsOutdated(version)) throw host::Interrupted();
    kept.curves = CurvesOf(shot.Path());
    if (const host::Choice* choice = shot.choice()) {
      kept.choice = choice->Json();
      kept.choice["text"] = choice->Text();
      kept.choice["why"] = choice->Why();
    }
  }
  shots_[film_->number()] = std::move(kept);
}

}  // namespace calmframe::studio
