#include <cmath>
#include <filesystem>
#include <utility>

#include "host/base/param_text.h"
#include "platform/hx/hx_controls.h"
#include "studio/wire/roots.h"
#include "studio/worker/clip_desk.h"
#include "studio/worker/panel.h"

// How a clip's desk opens clips and saved work.
namespace calmframe::studio {
namespace {

bool IsThere(const std::string& path) {
  std::error_code error;
  return !path.empty() && std::filesystem::exists(path, error);
}

}  // namespace

double ClipDesk::RateOf(const media::ClipInfo& info) {
  return static_cast<double>(info.frame_rate.num) / static_cast<double>(info.frame_rate.den);
}

nlohmann::json ClipDesk::InfoOf(const media::ClipInfo& info) {
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

void ClipDesk::OpenClip(const OpenRequest& request) {
  frames_.Hide();
  film_.reset();
  shots_.clear();
  asked_still_.clear();
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
  tell_({{"path", whole.path}});
  TellInfo();
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

void ClipDesk::TellInfo() {
  {
    const std::lock_guard lock(mutex_);
    info_ = film_->whole();
  }
  tell_({{"info", InfoOf(film_->whole())}});
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
  const Roots roots(opened_.roots);
  if (clip.empty()) {
    std::string outside;
    const auto admits = [&](const std::string& place) {
      try {
        roots.ExistingClip(place);
        return true;
      } catch (const PathRefused&) {
        outside = place;
        return false;
      }
    };
    try {
      clip = host::FindClip(opened_.project, project, admits);
    } catch (const host::ProjectFailure&) {
      if (!outside.empty()) roots.ExistingClip(outside);
      throw;
    }
  }
  roots.ExistingClip(clip);
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
  settings.deleted = shot.DeletedTracks();
  return settings;
}

}  // namespace calmframe::studio
