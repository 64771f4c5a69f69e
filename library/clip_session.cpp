#include "library/clip_session.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <utility>

#include "host/effects/host.h"
#include "host/effects/renderer.h"
#include "host/stabilize/drawing.h"
#include "host/stabilize/failures.h"
#include "library/refusal.h"

namespace calmframe::library {
namespace {

[[noreturn]] void Refuse(calmframe_result code, const std::string& line) {
  throw Refusal(code, line);
}

// What waits for the session's threads, one of which may be waiting for this one.
void ExpectNotFetching() {
  if (FrameFeed::IsFetching()) Refuse(CALMFRAME_ERROR_STATE, "a frame is being fetched");
}

// As of a SteadyClip: the first host of a process settles which parameters are declared.
host::HostSettings WithExperimental() {
  host::HostSettings settings;
  settings.experimental_parameters = true;
  return settings;
}

}  // namespace

ClipSession::ClipSession(SessionRequest request)
    : request_(std::move(request)),
      plugin_(request_.plugin),
      feed_source_(boost::make_shared<FrameFeed>(request_.format, request_.clip, request_.content,
                                                 request_.fetch, request_.user)),
      controls_(host::Host(request_.plugin, WithExperimental()).declarations()) {}

ClipSession::~ClipSession() {
  Close();
}

void ClipSession::Close() {
  {
    std::unique_lock lock(mutex_);
    closing_ = true;
    feed_.Stop();
    changed_.notify_all();
    changed_.wait(lock, [this] { return users_ == 0; });
  }
  worker_.End([this] { DropFilm(); });
}

// -- Controls --

void ClipSession::Set(const std::string& name, const std::string& value) {
  const std::lock_guard lock(mutex_);
  if (state_ == CALMFRAME_WORKING) Refuse(CALMFRAME_ERROR_STATE, "the clip is being worked");
  controls_.Set(name, value);
}

std::string ClipSession::ControlsJson() const {
  const std::lock_guard lock(mutex_);
  return controls_.Json();
}

// -- Working --

void ClipSession::Begin() {
  if (closing_) Refuse(CALMFRAME_ERROR_CANCELLED, "was closed");
  if (users_ > 0) Refuse(CALMFRAME_ERROR_BUSY, "frames are being drawn");
  values_ = controls_.values();
  window_ = controls_.window();
  cancelled_ = false;
  feed_.BeginWork();
  if (!worker_.Post([this] { Work(); })) Refuse(CALMFRAME_ERROR_CANCELLED, "was closed");
  state_ = CALMFRAME_WORKING;
  end_code_ = CALMFRAME_OK;
  end_line_.clear();
  progress_ = {};
  shots_.clear();
  warnings_.clear();
  idle_.clear();
  drawn_ = nullptr;
}

void ClipSession::Start() {
  const std::lock_guard lock(mutex_);
  if (state_ == CALMFRAME_WORKING) Refuse(CALMFRAME_ERROR_STATE, "the clip is being worked");
  if (feed_.is_pushed() && feed_.pushed() > 0 && !feed_.is_whole()) {
    Refuse(CALMFRAME_ERROR_STATE, "its frames were pushed and are gone; open a session anew");
  }
  if (state_ == CALMFRAME_FAILED || state_ == CALMFRAME_CANCELLED) {
    // Without work that stands a pushed clip can't be begun again.
    if (feed_.is_pushed() && feed_.pushed() > 0 &&
        !worker_.Do([this] { return saved_ || film_; })) {
      Refuse(CALMFRAME_ERROR_STATE, "its frames were pushed and are gone; open a session anew");
    }
  }
  Begin();
}

calmframe_result ClipSession::Push(std::int64_t frame, const calmframe_image* image, bool waits) {
  if (!feed_.is_pushed()) Refuse(CALMFRAME_ERROR_STATE, "the session fetches its frames");
  request_.format.Check(image, "the image");
  if (pushing_.exchange(true)) Refuse(CALMFRAME_ERROR_BUSY, "another thread is pushing");
  struct Pushing {
    ~Pushing() { pushing = false; }
    std::atomic<bool>& pushing;
  } const pushing{pushing_};
  {
    const std::lock_guard lock(mutex_);
    if (state_ == CALMFRAME_IDLE) {
      if (frame != 0) {
        Refuse(CALMFRAME_ERROR_ARGUMENT,
               "frame " + std::to_string(frame) + " was pushed, and the next is 0");
      }
      Begin();
    }
    if (state_ == CALMFRAME_FAILED || state_ == CALMFRAME_CANCELLED) ThrowEnd();
  }
  switch (feed_.Push(frame, *image, waits)) {
    case FrameFeed::Pushed::taken:
      return CALMFRAME_OK;
    case FrameFeed::Pushed::no_room:
      return CALMFRAME_AGAIN;
    default: {
      std::unique_lock lock(mutex_);
      changed_.wait(lock, [this] { return closing_ || state_ != CALMFRAME_WORKING; });
      ThrowEnd();
    }
  }
}

void ClipSession::Finish() {
  if (!feed_.is_pushed()) Refuse(CALMFRAME_ERROR_STATE, "the session fetches its frames");
  feed_.Finish();
}

calmframe_result ClipSession::Wait(std::int64_t milliseconds) {
  ExpectNotFetching();
  std::unique_lock lock(mutex_);
  if (state_ == CALMFRAME_IDLE) Refuse(CALMFRAME_ERROR_STATE, "nothing was begun");
  const auto is_over = [this] { return closing_ || state_ != CALMFRAME_WORKING; };
  if (milliseconds < 0) {
    changed_.wait(lock, is_over);
  } else {
    // A day is as good as any more, and no clock runs over.
    constexpr std::int64_t kMost = 24 * 3600 * 1000;
    const std::chrono::milliseconds time(std::min(milliseconds, kMost));
    if (!changed_.wait_for(lock, time, is_over)) return CALMFRAME_AGAIN;
  }
  if (closing_ || state_ != CALMFRAME_SOLVED) ThrowEnd();
  return CALMFRAME_OK;
}

void ClipSession::Cancel() {
  const std::lock_guard lock(mutex_);
  if (state_ != CALMFRAME_WORKING) return;
  cancelled_ = true;
  feed_.Stop();
}

std::int32_t ClipSession::state() const {
  const std::lock_guard lock(mutex_);
  return state_;
}

calmframe_progress ClipSession::progress() const {
  const std::lock_guard lock(mutex_);
  return progress_;
}

void ClipSession::ThrowEnd() const {
  if (closing_) Refuse(CALMFRAME_ERROR_CANCELLED, "was closed");
  if (end_code_ == CALMFRAME_OK) Refuse(CALMFRAME_ERROR_STATE, "all frames were pushed");
  Refuse(end_code_, end_line_);
}

// -- What was solved --

double ClipSession::FramesPerSecond() const {
  const media::Ratio& rate = request_.clip.frame_rate;
  return static_cast<double>(rate.num) / static_cast<double>(rate.den);
}

void ClipSession::ExpectSolved() const {
  if (state_ != CALMFRAME_SOLVED) Refuse(CALMFRAME_ERROR_STATE, "nothing is solved");
}

std::size_t ClipSession::ShotCount() const {
  const std::lock_guard lock(mutex_);
  ExpectSolved();
  return shots_.size();
}

calmframe_shot ClipSession::Shot(std::size_t number) const {
  const std::lock_guard lock(mutex_);
  ExpectSolved();
  if (number >= shots_.size()) {
    Refuse(CALMFRAME_ERROR_ARGUMENT, "there are " + std::to_string(shots_.size()) + " shots");
  }
  return library::ShotOf(shots_[number]);
}

calmframe_outcome ClipSession::Outcome() const {
  const std::lock_guard lock(mutex_);
  ExpectSolved();
  return OutcomeOf(OutcomeOf(shots_, FramesPerSecond()));
}

std::string ClipSession::ReportJson() const {
  const std::lock_guard lock(mutex_);
  ExpectSolved();
  return ReportOf(shots_, FramesPerSecond(), warnings_);
}

std::size_t ClipSession::ShotNumberOf(std::int64_t frame) const {
  for (std::size_t number = 0; number < shots_.size(); ++number) {
    if (frame >= shots_[number].first && frame < shots_[number].end) return number;
  }
  Refuse(CALMFRAME_ERROR_ARGUMENT, "frame " + std::to_string(frame) + ": the clip has " +
                                       std::to_string(shots_.empty() ? 0 : shots_.back().end));
}

// Keeps a frame's shot open while it lives. Whoever needs another one waits until nobody needs this
// one any more; from then on nobody new comes in before the change.
class ClipSession::ShotHold {
 public:
  ShotHold(ClipSession& session, std::int64_t frame) : session_(session) {
    std::unique_lock lock(session_.mutex_);
    while (true) {
      if (session_.closing_) Refuse(CALMFRAME_ERROR_CANCELLED, "was closed");
      session_.ExpectSolved();
      number_ = session_.ShotNumberOf(frame);
      first_ = session_.shots_[number_].first;
      const bool is_mine = !session_.wanted_ || *session_.wanted_ == number_;
      const bool is_open = session_.drawn_ && session_.open_ == number_;
      if (is_mine && is_open && !session_.is_switching_) break;
      if (is_mine && !session_.is_switching_) {
        session_.wanted_ = number_;
        if (session_.users_ == 0) {
          Switch(lock);
          continue;
        }
      }
      session_.changed_.wait(lock);
    }
    session_.wanted_.reset();
    ++session_.users_;
  }
  ~ShotHold() {
    const std::lock_guard lock(session_.mutex_);
    --session_.users_;
    session_.changed_.notify_all();
  }
  ShotHold(const ShotHold&) = delete;
  ShotHold& operator=(const ShotHold&) = delete;

  std::size_t number() const { return number_; }
  std::int64_t first() const { return first_; }

 private:
  void Switch(std::unique_lock<std::mutex>& lock) {
    session_.is_switching_ = true;
    lock.unlock();
    std::exception_ptr failure;
    try {
      session_.worker_.Do([this] { session_.OpenShot(number_); });
    } catch (...) {
      failure = std::current_exception();
    }
    lock.lock();
    session_.is_switching_ = false;
    session_.wanted_.reset();
    session_.changed_.notify_all();
    if (failure) std::rethrow_exception(failure);
  }

  ClipSession& session_;
  std::size_t number_ = 0;
  std::int64_t first_ = 0;
};

void ClipSession::Path(std::int64_t first, std::int64_t count, calmframe_place* places) {
  ExpectNotFetching();
  if (count < 0 || first < 0) Refuse(CALMFRAME_ERROR_ARGUMENT, "frames below 0");
  if (count > media::kMaximumFrames || first > media::kMaximumFrames) {
    Refuse(CALMFRAME_ERROR_ARGUMENT, "more frames than a clip can have");
  }
  for (const std::int64_t end = first + count; first < end;) {
    const ShotHold hold(*this, first);
    std::unique_lock lock(mutex_);
    ShotResult& shot = shots_[hold.number()];
    if (!shot.path) {
      const std::int64_t frames = shot.end - shot.first;
      const bool solved = shot.solved;
      lock.unlock();
      std::vector<calmframe_place> path = PlacesAtRest(frames);
      if (solved) {
        const int rows = request_.clip.field_order == media::FieldOrder::progressive ? 1 : 2;
        path = worker_.Do([&] { return PlacesOf(film_->shot()->Path(), frames, rows); });
      }
      lock.lock();
      shot.path = std::move(path);
    }
    for (; first < end && first < shot.end; ++first) {
      *places++ = (*shot.path)[static_cast<std::size_t>(first - shot.first)];
    }
  }
}

// -- Drawing --

void ClipSession::Render(std::int64_t frame, const calmframe_image* source,
                         const calmframe_image* out) {
  request_.format.Check(out, "the output");
  if (source) request_.format.Check(source, "the source");
  ExpectNotFetching();
  const ShotHold hold(*this, frame);
  if (feed_.is_pushed() && !source) {
    Refuse(CALMFRAME_ERROR_ARGUMENT,
           "frame " + std::to_string(frame) + " was pushed, and has to be handed in once more");
  }
  std::unique_ptr<host::Renderer> renderer;
  host::Effect* drawn = nullptr;
  {
    const std::lock_guard lock(mutex_);
    if (fills_edges_ && feed_.is_pushed()) {
      Refuse(
          CALMFRAME_ERROR_ARGUMENT,
          "Framing \"Synthesize Edges\" looks at other frames, and takes a session that fetches");
    }
    drawn = drawn_;
    if (!idle_.empty()) {
      renderer = std::move(idle_.back());
      idle_.pop_back();
    }
  }
  if (!renderer) renderer = drawn->MakeRenderer();
  const FrameFeed::HandedIn handed_in(feed_, frame, source);
  const auto expect_source = [&] {
    const std::string line = feed_.Missing(fills_edges_ ? -1 : frame);
    if (!line.empty()) Refuse(CALMFRAME_ERROR_SOURCE, line);
  };
  host::SteadyFrame steady;
  try {
    steady = host::DrawFrame(*renderer, frame - hold.first(), depth_, request_.clip.field_order);
  } catch (const host::SolveFailure&) {
    expect_source();
    throw;
  }
  expect_source();
  feed_.ToImage(*steady.pixels, *out);
  const std::lock_guard lock(mutex_);
  idle_.push_back(std::move(renderer));
}

// -- Saved work --

host::Project ClipSession::Save() {
  ExpectNotFetching();
  {
    const std::lock_guard lock(mutex_);
    ExpectSolved();
  }
  return worker_.Do([this] {
    if (!film_) Refuse(CALMFRAME_ERROR_STATE, "nothing is solved");
    return Kept();
  });
}

void ClipSession::Load(host::Project project) {
  const std::lock_guard lock(mutex_);
  if (state_ != CALMFRAME_IDLE) Refuse(CALMFRAME_ERROR_STATE, "the work has begun");
  const auto expect = [](bool holds, const char* line) {
    if (!holds) Refuse(CALMFRAME_ERROR_FILE, line);
  };
  const host::SourceInfo& info = feed_.info();
  const host::SavedShot& last = project.shots.back();
  expect(project.clip_content == info.content && project.width == info.width &&
             project.height == info.height && project.ticks_per_frame == info.ticks_per_frame &&
             project.field_type == info.field_type &&
             std::int64_t{project.pixel_aspect.num} * info.pixel_aspect.den ==
                 std::int64_t{info.pixel_aspect.num} * project.pixel_aspect.den,
         "the saved work is of another clip");
  expect(project.shots.front().start_frame == 0, "the saved work begins behind the first frame");
  if (feed_.is_pushed()) {
    expect(project.end_frame <= info.frame_count, "the saved work has more frames");
    expect(last.start_frame + last.length == project.end_frame,
           "the saved work is not whole, and goes on only where frames are fetched");
    feed_.FinishAt(project.end_frame);
  } else {
    expect(project.end_frame == info.frame_count, "the saved work has another number of frames");
  }
  worker_.Do([&] { saved_ = std::move(project); });
}

// -- Errors --

void ClipSession::KeepError(const char* line) noexcept {
  const std::lock_guard lock(mutex_);
  std::snprintf(error_, sizeof error_, "%s", line);
}

std::size_t ClipSession::ErrorText(char* text, std::size_t size) const {
  const std::lock_guard lock(mutex_);
  if (text && size > 0) std::snprintf(text, size, "%s", error_);
  return std::strlen(error_);
}

}  // namespace calmframe::library
