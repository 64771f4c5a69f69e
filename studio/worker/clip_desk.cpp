#include "studio/worker/clip_desk.h"

#include <algorithm>
#include <chrono>
#include <exception>
#include <thread>
#include <utility>

namespace calmframe::studio {
namespace {

// Two at least: one decodes while the other draws.
int DrawingThreads() {
  return static_cast<int>(std::clamp(std::thread::hardware_concurrency(), 2u, 4u));
}

}  // namespace

ClipDesk::ClipDesk(std::string plugin, Tell tell)
    : plugin_(std::move(plugin)), tell_(std::move(tell)), frames_(DrawingThreads()) {}

ClipDesk::~ClipDesk() = default;

void ClipDesk::Open(OpenRequest request) {
  const std::lock_guard lock(mutex_);
  if (request.settings) settings_ = *request.settings;
  version_ = request.version;
  open_ = std::move(request);
  changed_.notify_all();
}

void ClipDesk::Set(const Settings& settings, std::uint64_t version) {
  const std::lock_guard lock(mutex_);
  settings_ = settings;
  version_ = version;
  changed_.notify_all();
}

void ClipDesk::Work() {
  const std::lock_guard lock(mutex_);
  wants_work_ = true;
  cancelled_ = false;
  given_up_ = 0;
  changed_.notify_all();
}

void ClipDesk::Cancel() {
  const std::lock_guard lock(mutex_);
  wants_work_ = false;
  cancelled_ = true;
  given_up_ = version_;
  changed_.notify_all();
}

void ClipDesk::Save(std::string path, Done done) {
  const std::lock_guard lock(mutex_);
  saves_.push_back({std::move(path), std::move(done)});
  given_up_ = 0;
  cancelled_ = false;
  changed_.notify_all();
}

void ClipDesk::End() {
  const std::lock_guard lock(mutex_);
  ended_ = true;
  changed_.notify_all();
}

nlohmann::json ClipDesk::Panel() {
  const std::lock_guard lock(mutex_);
  return panel_;
}

nlohmann::json ClipDesk::Curves() {
  const std::lock_guard lock(mutex_);
  return curves_;
}

void ClipDesk::ShowTracks() {
  const std::lock_guard lock(mutex_);
  wants_tracks_ = true;
  changed_.notify_all();
}

std::vector<LassoedTrack> ClipDesk::TracksIn(const Lasso& lasso) {
  std::shared_ptr<const host::MovingClip> found;
  int fields = 1;
  {
    const std::lock_guard lock(mutex_);
    found = found_;
    fields = fields_;
  }
  if (!found) return {};
  return studio::TracksIn(lasso, found->clip(), fields);
}

void ClipDesk::LookAt(std::int64_t frame) {
  const std::lock_guard lock(mutex_);
  looked_at_ = frame;
  changed_.notify_all();
}

std::string ClipDesk::OutputTrouble(const std::string& path, const media::EncodeSettings& encode) {
  std::optional<media::ClipInfo> info;
  {
    const std::lock_guard lock(mutex_);
    info = info_;
  }
  if (!info) return "";
  try {
    media::ClipWriter::Create(path, *info, info->width, info->height, encode);
  } catch (const std::exception& failure) {
    return failure.what();
  }
  return "";
}

std::optional<std::size_t> ClipDesk::ShotAt(std::int64_t frame) const {
  for (std::size_t s = 0; s < shots_.size(); ++s) {
    const media::FrameRange& range = shots_[s].range;
    if (frame >= static_cast<std::int64_t>(range.first) &&
        frame < static_cast<std::int64_t>(range.end)) {
      return s;
    }
  }
  return {};
}

ClipDesk::Step ClipDesk::NextStep() {
  std::unique_lock lock(mutex_);
  // What a person has made is kept once they pause.
  constexpr std::chrono::milliseconds kPause(700);
  const auto now = [&]() -> std::optional<Step> {
    if (ended_) return Step::end;
    if (open_) return Step::open;
    if (!film_) return saves_.empty() ? std::nullopt : std::optional(Step::save);  // to be refused
    if (wants_work_ && !whole_) return Step::work;
    if (is_solved() && film_->shot()) {
      const Shot& shot = shots_[film_->number()];
      if (shot.version != version_ && given_up_ != version_) {
        return previewed_ == version_ ? Step::renew : Step::preview;
      }
      const auto looked_at = looked_at_ ? ShotAt(*looked_at_) : std::nullopt;
      if (looked_at && *looked_at != film_->number()) return Step::look;
    } else if (film_->shot() && !whole_ && shot_version_ != version_) {
      return Step::renew;
    }
    if (wants_tracks_ && is_solved() && film_->shot()) return Step::tracks;
    if (!saves_.empty()) return Step::save;
    return {};
  };
  using Clock = std::chrono::steady_clock;
  const Clock::time_point keep_at = Clock::now() + (is_kept_ ? std::chrono::hours(24) : kPause);
  while (true) {
    const std::optional<Step> step = now();
    const Clock::time_point time = Clock::now();
    if (step == Step::renew && steady_at_ > time) {
      changed_.wait_until(lock, steady_at_);
    } else if (step) {
      return *step;
    } else if (time >= keep_at) {
      return is_kept_ ? Step::look : Step::keep;
    } else {
      changed_.wait_until(lock, keep_at);
    }
  }
}

void ClipDesk::Run() {
  while (true) {
    const Step step = NextStep();
    if (step == Step::end) break;
    Act(step);
  }
  frames_.Hide();
  film_.reset();
}

}  // namespace calmframe::studio
