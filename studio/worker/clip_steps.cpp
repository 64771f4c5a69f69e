#include <algorithm>
#include <utility>

#include "host/stabilize/failures.h"
#include "studio/worker/clip_desk.h"
#include "studio/worker/panel.h"

// What a clip's desk does on the thread that owns the effect.
namespace calmframe::studio {

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
    case Step::preview:
      return Preview(*film_->shot());
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
    case Step::tracks: {
      {
        const std::lock_guard lock(mutex_);
        wants_tracks_ = false;
      }
      if (shots_[film_->number()].solved) frames_.ShowTracks(film_->shot()->ShowingTracks());
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
  if (is_solved() && film_->shot()) shows = shots_[film_->number()].shows;
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
    list.push_back({{"first", shot.range.first}, {"end", shot.range.end}});
    if (list.size() == 1) list.front()["choice"] = shot.choice;  // a film has many
    curves.push_back(
        {{"first", shot.range.first}, {"end", shot.range.end}, {"curves", shot.curves}});
    if (!shot.solved) continue;
    outcomes.push_back({.outcome = shot.outcome,
                        .begins = static_cast<double>(shot.range.first) / rate,
                        .frames = std::max<std::size_t>(shot.range.size(), 1)});
  }
  nlohmann::json outcome = nullptr;
  if (!outcomes.empty()) {
    outcome = host::OutcomeOf(outcomes).Json();
  }
  {
    const std::lock_guard lock(mutex_);
    curves_ = std::move(curves);
  }
  tell_({{"shots", std::move(list)}, {"outcome", std::move(outcome)}, {"curves", pictures_}});
}

// From where the work is; a clip that holds other frames than its container promised is opened anew
// and worked from its start.
void ClipDesk::WorkAll() {
  try {
    while (true) {
      host::SteadyClip* const shot = film_->shot() ? film_->shot() : film_->Next();
      const bool done = film_->number() < shots_.size() && shots_[film_->number()].version > 0;
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
    TellInfo();
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
