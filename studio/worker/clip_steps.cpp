#include <algorithm>
#include <chrono>
#include <cmath>
#include <filesystem>
#include <utility>

#include "host/base/param_text.h"
#include "host/media/clip_files.h"
#include "host/stabilize/control_items.h"
#include "host/stabilize/drawing.h"
#include "host/stabilize/failures.h"
#include "host/stabilize/framing.h"
#include "platform/hx/hx_controls.h"
#include "studio/wire/roots.h"
#include "studio/worker/clip_desk.h"
#include "studio/worker/curves.h"
#include "studio/worker/panel.h"

// What a clip's desk does on the thread that owns the effect.
namespace calmframe::studio {
namespace {

double RateOf(const media::ClipInfo& info) {
  return static_cast<double>(info.frame_rate.num) / static_cast<double>(info.frame_rate.den);
}

nlohmann::json InfoOf(const media::ClipInfo& info) {
  const double aspect =
      static_cast<double>(info.pixel_aspect.num) / static_cast<double>(info.pixel_aspect.den);
  return {{"width", info.width},
          {"height", info.height},
          {"shown_width", std::lround(info.width * aspect)},
          {"frames", info.frame_count},
          {"rate", RateOf(info)},
          {"codec", info.codec},
          {"bit_depth", info.bit_depth},
          {"interlaced", info.field_order != media::FieldOrder::progressive}};
}

bool IsThere(const std::string& path) {
  std::error_code error;
  return !path.empty() && std::filesystem::exists(path, error);
}

}  // namespace

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
    const std::lock_guard lock(desk_.mutex_);
    return desk_.ended_ || desk_.cancelled_ || desk_.open_ || desk_.version_ != version_;
  }

 private:
  ClipDesk& desk_;
  const std::uint64_t version_;
  std::string stage_;
  std::chrono::steady_clock::time_point begin_, told_;
};

void ClipDesk::Act(Step step) try {
  switch (step) {
    case Step::open: {
      OpenRequest request;
      {
        const std::lock_guard lock(mutex_);
        request = std::move(*open_);
        open_.reset();
      }
      return OpenClip(request);
    }
    case Step::work:
      return WorkAll();
    case Step::renew:
      if (!is_solved()) {  // the panel alone
        Settings settings;
        {
          const std::lock_guard lock(mutex_);
          settings = settings_;
          shot_version_ = version_;
        }
        Apply(*film_->shot(), settings);
        return TellPanel(*film_->shot());
      }
      Steady(*film_->shot());
      TellState();
      return;
    case Step::look: {
      std::optional<std::size_t> number;
      {
        const std::lock_guard lock(mutex_);
        if (looked_at_) number = ShotAt(*looked_at_);
        looked_at_.reset();
      }
      if (number && film_ && *number != film_->number()) OpenShot(*number);
      TellState();
      return;
    }
    case Step::save: {
      SaveRequest request;
      {
        const std::lock_guard lock(mutex_);
        request = std::move(saves_.front());
        saves_.pop_front();
      }
      return SaveNow(request);
    }
    case Step::keep:
      is_kept_ = true;
      if (!opened_.keep.empty() && is_solved() && film_->shot()) {
        film_->Keep();
        host::SaveProject(opened_.keep, film_->Saved());
      }
      return;
    case Step::end:
      return;
  }
} catch (const host::Interrupted&) {
  bool goes_on = false;
  {
    const std::lock_guard lock(mutex_);
    goes_on = !cancelled_;
  }
  if (film_ && film_->shot() && !goes_on) TellPanel(*film_->shot());
  state_ = goes_on ? state_ : (is_solved() ? "ready" : "open");
  if (!goes_on) TellState();
} catch (const std::exception& error) {
  Fail(error.what());
}

void ClipDesk::Fail(const std::string& line) {
  error_ = line;
  {
    const std::lock_guard lock(mutex_);
    wants_work_ = false;
    given_up_ = version_;
  }
  state_ = is_solved() ? "ready" : film_ && film_->shot() ? "open" : "failed";
  TellState();
}

void ClipDesk::TellState() {
  nlohmann::json shows = nullptr;
  if (is_solved() && film_->shot()) shows = shots_[film_->number()].version;
  tell_({{"state", state_},
         {"error", error_},
         {"warnings", warnings_},
         {"shows", shows},
         {"progress", nullptr}});
}

void ClipDesk::TellPanel(host::SteadyClip& shot) {
  nlohmann::json panel = PanelOf(shot);
  {
    const std::lock_guard lock(mutex_);
    if (panel == panel_) return;
    panel_ = std::move(panel);
  }
  tell_({{"panel", ++panels_}});
}

void ClipDesk::TellShots() {
  nlohmann::json list = nlohmann::json::array(), curves = nlohmann::json::array();
  std::vector<host::ShotOutcome> outcomes;
  const double rate = RateOf(film_->whole());
  for (const Shot& shot : shots_) {
    list.push_back({{"first", shot.range.first},
                    {"end", shot.range.end},
                    {"solved", shot.solved},
                    {"outcome", shot.outcome.Json()},
                    {"choice", shot.choice}});
    curves.push_back(
        {{"first", shot.range.first}, {"end", shot.range.end}, {"curves", shot.curves}});
    if (!shot.solved) continue;
    outcomes.push_back({.outcome = shot.outcome,
                        .begins = static_cast<double>(shot.range.first) / rate,
                        .frames = std::max<std::size_t>(shot.range.size(), 1)});
  }
  nlohmann::json outcome = nullptr;
  if (!outcomes.empty()) {
    const host::Outcome film = host::OutcomeOf(outcomes);
    outcome = film.Json();
    outcome["text"] = film.Text();
  }
  {
    const std::lock_guard lock(mutex_);
    curves_ = std::move(curves);
  }
  const std::uint64_t picture = ++pictures_;
  tell_({{"shots", std::move(list)},
         {"outcome", std::move(outcome)},
         {"picture", picture},
         {"curves", picture}});
}

void ClipDesk::OpenClip(const OpenRequest& request) {
  frames_.Hide();
  film_.reset();
  shots_.clear();
  whole_ = false;
  error_.clear();
  warnings_.clear();
  opened_ = request;
  state_ = "opening";
  TellState();
  try {
    OpenAnew(host::Opening::promised);
  } catch (...) {
    film_.reset();
    frames_.SetSource(nullptr, {});
    throw;
  }
  const media::ClipInfo& whole = film_->whole();
  if (!whole.warning.empty()) warnings_.push_back(whole.warning);
  tell_({{"info", InfoOf(whole)}, {"path", whole.path}});
  // All that was saved stands as it is shown; the rest waits for a word.
  const host::Project& saved = film_->Saved();
  const bool is_whole =
      !saved.shots.empty() && saved.shots.back().start_frame + saved.shots.back().length >=
                                  static_cast<std::int32_t>(film_->range().end);
  host::SteadyClip& shot = *film_->Next();
  Settings settings;
  const Settings of_work = SettingsOfWork(shot);
  for (const auto& control : of_work.controls) touched_.insert(control.first);
  if (!request.settings) {
    settings = of_work;
    tell_({{"settings", JsonOf(settings)}});
  }
  {
    const std::lock_guard lock(mutex_);
    if (!request.settings) settings_ = settings;
    settings = settings_;
    shot_version_ = version_;
    wants_work_ = wants_work_ || is_whole;
  }
  frames_.SetSource(shot.effect().shared()->layer()->state()->source, whole);
  Apply(shot, settings);
  TellPanel(shot);
  state_ = is_whole ? "working" : "open";
  TellState();
}

void ClipDesk::OpenAnew(host::Opening opening) {
  applied_.clear();
  film_.reset();
  if (!IsThere(opened_.project)) {
    film_ = std::make_unique<host::Film>(plugin_, opened_.clip, opening);
    return;
  }
  const host::Project project = host::LoadProject(opened_.project);
  std::string clip = opened_.clip;
  if (clip.empty()) clip = host::FindClip(opened_.project, project);
  const std::filesystem::path place = clip;
  Roots(opened_.roots).Existing(media::IsSequence(clip) ? place.parent_path() : place);
  if (host::ContentOf(clip) != project.clip_content) {
    if (opened_.project != opened_.keep) {
      throw host::ProjectFailure(opened_.project + ": is of another clip, " + project.clip_path);
    }
    // The clip has changed since; what was made of it is worth nothing.
    film_ = std::make_unique<host::Film>(plugin_, clip, opening);
    return;
  }
  film_ = std::make_unique<host::Film>(plugin_, project, clip);
}

// What somebody gave the saved shot, without what was chosen beside it.
Settings ClipDesk::SettingsOfWork(host::SteadyClip& shot) const {
  Settings settings;
  for (const HX_ParamDef& declared : shot.host().declarations()) {
    if (!IsControl(declared) || declared.disk_id == HX_TRANSITION_BISQUARE_SIGMA.disk_id ||
        declared.disk_id == HX_HIDE_WARNING_BANNER.disk_id) {
      continue;
    }
    double value = shot.ValueOf(declared.disk_id);
    if (const host::Choice* choice = shot.choice()) {
      const auto given = choice->given.find(declared.disk_id);
      if (given != choice->given.end()) value = given->second;
    }
    if (IsChanged(declared, value)) settings.controls[declared.disk_id] = value;
  }
  return settings;
}

void ClipDesk::Apply(host::SteadyClip& shot, const Settings& settings) {
  const auto given_to = [&shot](std::int32_t disk_id) {
    if (const host::Choice* choice = shot.choice()) {
      const auto given = choice->given.find(disk_id);
      if (given != choice->given.end()) return given->second;
    }
    return shot.ValueOf(disk_id);
  };
  host::ParamValues changes;
  std::set<std::int32_t> resets;
  for (const HX_ParamDef& declared : shot.host().declarations()) {
    const std::int32_t id = declared.disk_id;
    if (!IsControl(declared)) continue;
    const auto wanted = settings.controls.find(id);
    if (wanted != settings.controls.end()) {
      // What is as it is asked for is left, and a choice with it.
      if (given_to(id) != wanted->second) changes[id] = wanted->second;
    } else if (applied_.count(id) > 0 ||
               (touched_.count(id) > 0 && given_to(id) != DefaultOf(declared))) {
      resets.insert(id);
    }
  }
  if (!resets.empty()) shot.ResetControls(resets);
  shot.SetControls(changes);
  for (const std::int32_t id : resets) applied_.erase(id);
  for (const auto& change : changes) {
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
  frames_.Hide();
  Onlooker onlooker(*this, version);
  warnings_.clear();
  if (!film_->whole().warning.empty()) warnings_.push_back(film_->whole().warning);
  error_.clear();
  state_ = "working";
  TellState();
  bool solved = true;
  try {
    Apply(shot, settings);
    shot.Work(onlooker);
    Frame(shot, settings, onlooker);
  } catch (const host::SolveFailure& failure) {
    solved = false;
    onlooker.Warn(std::string(failure.what()) + "; the shot stays as it was filmed");
    shot.ShowAsFilmed(onlooker);
  }
  KeepResult(shot, version, solved);
  TellPanel(shot);
  TellShots();
  frames_.Show(shot);
  is_kept_ = false;
  state_ = whole_ ? "ready" : "working";
}

void ClipDesk::KeepResult(host::SteadyClip& shot, std::uint64_t version, bool solved) {
  const std::size_t number = film_->number();
  if (shots_.size() <= number) shots_.resize(number + 1);
  Shot& kept = shots_[number];
  kept = {.range = shot.range(),
          .version = version,
          .solved = solved,
          .outcome = host::AsFilmed(),
          .choice = nullptr,
          .curves = nullptr};
  if (!solved) return;
  kept.outcome = shot.Measure();
  kept.curves = CurvesOf(shot.Path());
  if (const host::Choice* choice = shot.choice()) {
    kept.choice = choice->Json();
    kept.choice["text"] = choice->Text();
    kept.choice["why"] = choice->Why();
  }
}

// From where the work is; a clip that holds other frames than its container promised is opened anew
// and worked from its start.
void ClipDesk::WorkAll() {
  try {
    while (true) {
      host::SteadyClip* const shot = film_->shot() ? film_->shot() : film_->Next();
      const bool done = film_->number() < shots_.size();
      if (!done) Steady(*shot);
      if (shot->range().end >= film_->range().end) break;
      film_->Keep();
      frames_.Hide();
      applied_.clear();
      if (!film_->Next()) break;
    }
  } catch (const host::BrokenPromise&) {
    shots_.clear();
    frames_.Hide();
    frames_.SetSource(nullptr, {});
    OpenAnew(host::Opening::decoded);
    host::SteadyClip* const shot = film_->Next();
    frames_.SetSource(shot->effect().shared()->layer()->state()->source, film_->whole());
    tell_({{"info", InfoOf(film_->whole())}});
    return;  // and once more
  }
  whole_ = true;
  {
    const std::lock_guard lock(mutex_);
    wants_work_ = false;
  }
  state_ = "ready";
  TellState();
}

void ClipDesk::OpenShot(std::size_t number) {
  frames_.Hide();
  film_->Keep();
  applied_.clear();
  Steady(*film_->Open(number));
}

void ClipDesk::SaveNow(const SaveRequest& request) {
  std::string error;
  try {
    if (!film_ || !film_->shot()) throw std::runtime_error("the clip could not be opened");
    if (!is_solved()) throw std::runtime_error("the clip isn't analysed yet");
    // Shots that nobody looked at since the settings changed.
    for (std::size_t s = 0; s < shots_.size(); ++s) {
      std::uint64_t version = 0;
      {
        const std::lock_guard lock(mutex_);
        version = version_;
      }
      if (shots_[s].version == version) continue;
      if (s != film_->number()) {
        OpenShot(s);
      } else {
        Steady(*film_->shot());
      }
    }
    film_->Keep();
    host::SaveProject(request.path, film_->Saved());
    TellState();
  } catch (const host::Interrupted&) {
    error = "something else was asked for meanwhile";
    TellState();
  } catch (const std::exception& failure) {
    error = failure.what();
    TellState();
  }
  request.done(error);
}

}  // namespace calmframe::studio
