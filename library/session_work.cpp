#include <algorithm>
#include <cstdio>
#include <thread>
#include <utility>

#include "host/effects/renderer.h"
#include "host/stabilize/control_items.h"
#include "host/stabilize/drawing.h"
#include "host/stabilize/failures.h"
#include "library/clip_session.h"
#include "library/refusal.h"
#include "platform/hx/hx_controls.h"

// What a session does on its worker: shot by shot, from frames to what can be drawn.
namespace calmframe::library {
namespace {

// The frames are the caller's and always what they are; no list of them is kept.
class AllFound final : public media::FoundFrames {
 public:
  media::Standing standing() const override { return media::Standing::decoded; }
  std::vector<std::uint8_t> Bytes() const override { return {}; }
};

template <std::size_t size>
void Copy(const std::string& from, char (&to)[size]) {
  std::snprintf(to, size, "%s", from.c_str());
}

}  // namespace

// Tells the session how far its work is, and the work when it is to end.
class ClipSession::Onlooker final : public host::Watcher {
 public:
  explicit Onlooker(ClipSession& session) : session_(session) {}
  void Show(const host::Progress& progress) override {
    const std::lock_guard lock(session_.mutex_);
    calmframe_progress& shown = session_.progress_;
    if (progress.stage != shown.stage) CloseAtEnd();
    Copy(progress.stage, shown.stage);
    Copy(progress.says, shown.says);
    shown.shot = static_cast<std::int32_t>(session_.shots_.size());
    shown.done = progress.done;
    shown.total = progress.total;
  }
  void Warn(const std::string& line) override {
    const std::lock_guard lock(session_.mutex_);
    std::vector<std::string>& lines = session_.warnings_;
    if (std::find(lines.begin(), lines.end(), line) == lines.end()) lines.push_back(line);
  }
  bool Stops() override { return session_.cancelled_ || session_.closing_; }

 private:
  ClipSession& session_;
};

void ClipSession::Work() {
  calmframe_result code = CALMFRAME_OK;
  char line[sizeof error_] = "";
  try {
    WorkShots();
  } catch (...) {
    code = TellException(line, sizeof line);
    if (cancelled_ || closing_) {
      code = CALMFRAME_ERROR_CANCELLED;
      std::snprintf(line, sizeof line, "was cancelled");
    }
    feed_.Stop();
    try {  // shots that are whole stand
      if (film_ && !film_->Saved().shots.empty()) {
        saved_ = film_->Saved();
        saved_->end_frame = static_cast<std::int32_t>(feed_.count());
      }
    } catch (const std::bad_alloc&) {
    }
    DropFilm();
  }
  feed_.EndWork();
  if (code != CALMFRAME_OK) KeepError(line);
  const std::lock_guard lock(mutex_);
  end_code_ = code;
  try {
    end_line_ = line;
  } catch (const std::bad_alloc&) {  // the code tells it, too
  }
  state_ = code == CALMFRAME_OK                ? CALMFRAME_SOLVED
           : code == CALMFRAME_ERROR_CANCELLED ? CALMFRAME_CANCELLED
                                               : CALMFRAME_FAILED;
  changed_.notify_all();
}

bool ClipSession::IsOnlyShot(const host::SteadyClip& shot) const {
  return film_->number() == 0 && static_cast<std::int64_t>(shot.range().end) >= feed_.count();
}

void ClipSession::KeepOpenShot() {
  if (!is_kept_) film_->Keep();
  is_kept_ = true;
}

host::Project ClipSession::Kept() {
  KeepOpenShot();
  host::Project project = film_->Saved();
  project.end_frame = static_cast<std::int32_t>(feed_.count());
  return project;
}

host::SteadyClip& ClipSession::FirstShot() {
  // Of a clip of one shot the effect that stands goes on.
  if (film_ && film_->number() == 0 && open_ == 0) {
    host::SteadyClip* const shot = film_->shot();
    if (shot && IsOnlyShot(*shot)) {
      saved_ = Kept();
      shot->SetControls(values_);
      return *shot;
    }
  }
  if (film_) saved_ = Kept();
  DropFilm();
  media::ClipInfo clip = request_.clip;
  clip.frame_count = static_cast<std::size_t>(feed_.count());
  const host::ClipMedium medium{clip, feed_source_,
                                feed_.is_pushed() ? nullptr : std::make_shared<const AllFound>(),
                                clip.frame_count};
  host::ShotRequest shots = request_.shots;
  if (saved_ && request_.shots_by_source) shots.kind = host::ShotRequest::Kind::automatic;
  film_ = saved_ ? std::make_unique<host::Film>(request_.plugin, medium, *saved_, shots)
                 : std::make_unique<host::Film>(request_.plugin, medium, shots);
  host::SteadyClip* const shot = film_->Next();
  shot->SetControls(values_);
  return *shot;
}

bool ClipSession::Steady(host::SteadyClip& shot, host::Watcher& watcher) try {
  shot.Work(watcher);
  const host::CropTrouble trouble = host::ChooseFraming(shot, window_, watcher);
  const std::string text = host::TroubleText(trouble);
  if (trouble.kind == host::CropTrouble::Kind::nothing_seen) throw host::SolveFailure(text);
  if (!text.empty()) watcher.Warn(text);
  return true;
} catch (const host::SolveFailure& failure) {
  // What ends the shot is known by now.
  if (IsOnlyShot(shot)) throw;
  watcher.Warn(std::string(failure.what()) + "; the shot stays as it was filmed");
  return false;
}

void ClipSession::Show(host::SteadyClip& shot, std::size_t number) {
  const int depth = request_.format.depth() == 32 ? 32 : host::DepthFor(shot);
  const int threads = static_cast<int>(std::max(1u, std::thread::hardware_concurrency()));
  host::PrepareDrawing(shot, depth, threads, false);
  const std::lock_guard lock(mutex_);
  open_ = number;
  drawn_ = &shot.drawn();
  depth_ = depth;
  fills_edges_ = shot.ValueOf(HX_FRAMING.disk_id) == host::kSynthesizeEdges;
}

void ClipSession::WorkShot(host::SteadyClip& shot) {
  Onlooker onlooker(*this);
  is_kept_ = false;
  ShotResult result;
  result.solved = Steady(shot, onlooker);
  result.first = static_cast<std::int64_t>(shot.range().first);
  result.end = std::min(static_cast<std::int64_t>(shot.range().end), feed_.count());
  if (result.solved) {
    result.outcome = shot.Measure();
    if (const host::Choice* choice = shot.choice()) result.choice = choice->Json();
  } else {
    result.outcome = host::AsFilmed();
  }
  Show(shot, film_->number());
  const std::lock_guard lock(mutex_);
  shots_.push_back(std::move(result));
}

void ClipSession::WorkShots() {
  host::SteadyClip* shot = &FirstShot();
  while (true) {
    WorkShot(*shot);
    const bool goes_on = feed_.Comes(static_cast<std::int64_t>(shot->range().end));
    if (cancelled_ || closing_) throw host::Interrupted();
    if (!goes_on) return;
    KeepOpenShot();
    {
      const std::lock_guard lock(mutex_);
      drawn_ = nullptr;
    }
    shot = film_->Next();
    if (!shot) return;
    shot->SetControls(values_);
  }
}

void ClipSession::OpenShot(std::size_t number) {
  KeepOpenShot();
  {
    const std::lock_guard lock(mutex_);
    idle_.clear();
    drawn_ = nullptr;
  }
  Onlooker onlooker(*this);
  host::SteadyClip& shot = *film_->Open(number);
  Steady(shot, onlooker);
  Show(shot, number);
}

void ClipSession::DropFilm() {
  {
    const std::lock_guard lock(mutex_);
    idle_.clear();
    drawn_ = nullptr;
  }
  film_.reset();
}

}  // namespace calmframe::library
