#pragma once

#include <atomic>
#include <boost/shared_ptr.hpp>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "host/plugin/plugin_library.h"
#include "host/stabilize/film.h"
#include "library/calmframe.h"
#include "library/control_set.h"
#include "library/frame_feed.h"
#include "library/session_request.h"
#include "library/shot_result.h"
#include "library/worker.h"

namespace calmframe::library {

// Has open sessions closed when the process ends, ahead of what was made for the end before: the
// plug-in's statics come with its work, so this is called for each stage.
void CloseAtEnd() noexcept;

// See calmframe.h, whose functions these are. Any thread; failures are exceptions that
// TellException knows. Sessions have nothing in common but the processors.
class ClipSession {
 public:
  explicit ClipSession(SessionRequest request);
  ~ClipSession();
  ClipSession(const ClipSession&) = delete;
  ClipSession& operator=(const ClipSession&) = delete;

  // Ends all that runs. Other calls end soon.
  void Close();

  void Set(const std::string& name, const std::string& value);
  std::string ControlsJson() const;

  void Start();
  calmframe_result Push(std::int64_t frame, const calmframe_image* image, bool waits);
  void Finish();
  calmframe_result Wait(std::int64_t milliseconds);
  void Cancel();
  std::int32_t state() const;
  calmframe_progress progress() const;

  std::size_t ShotCount() const;
  calmframe_shot Shot(std::size_t number) const;
  calmframe_outcome Outcome() const;
  std::string ReportJson() const;
  void Path(std::int64_t first, std::int64_t count, calmframe_place* places);

  void Render(std::int64_t frame, const calmframe_image* source, const calmframe_image* out);

  host::Project Save();
  void Load(host::Project project);

  // The line of the last failure; kept for calmframe_error_text.
  void KeepError(const char* line) noexcept;
  std::size_t ErrorText(char* text, std::size_t size) const;

 private:
  class Onlooker;
  class ShotHold;

  // -- On the worker --
  void Work();
  void WorkShots();
  // Of what stands already, or anew.
  host::SteadyClip& FirstShot();
  void WorkShot(host::SteadyClip& shot);
  // Goes on with another shot of a solved clip.
  void OpenShot(std::size_t number);
  // Works and frames it; false where it stays as it was filmed. Throws SolveFailure of the only
  // shot.
  bool Steady(host::SteadyClip& shot, host::Watcher& watcher);
  // Its frames are drawn from now on.
  void Show(host::SteadyClip& shot, std::size_t number);
  bool IsOnlyShot(const host::SteadyClip& shot) const;
  // Into the film's saved work, unless it is there.
  void KeepOpenShot();
  host::Project Kept();
  void DropFilm();

  // -- With mutex_ held --
  void ExpectSolved() const;
  void Begin();
  [[noreturn]] void ThrowEnd() const;  // what ended the work
  std::size_t ShotNumberOf(std::int64_t frame) const;

  double FramesPerSecond() const;

  const SessionRequest request_;
  const host::PluginLibrary plugin_;  // stays loaded from film to film
  // Tasks of the plug-in's that end late may still look at it.
  const boost::shared_ptr<FrameFeed> feed_source_;
  FrameFeed& feed_ = *feed_source_;
  std::atomic<bool> pushing_{false}, cancelled_{false}, closing_{false};

  mutable std::mutex mutex_;  // guards all below, up to the worker's
  std::condition_variable changed_;
  ControlSet controls_;
  std::int32_t state_ = CALMFRAME_IDLE;
  calmframe_result end_code_ = CALMFRAME_OK;  // of work that failed
  std::string end_line_;
  calmframe_progress progress_{};
  char error_[512] = {};
  std::vector<ShotResult> shots_;
  std::vector<std::string> warnings_;
  // Of drawing: the shot that is open, and the one that somebody waits for.
  std::size_t open_ = 0;
  std::optional<std::size_t> wanted_;
  bool is_switching_ = false;
  int users_ = 0;  // that need the open shot
  std::vector<std::unique_ptr<host::Renderer>> idle_;
  host::Effect* drawn_ = nullptr;  // of the open shot
  int depth_ = 8;
  bool fills_edges_ = false;

  // The worker's own, but that Begin sets the last two.
  std::optional<host::Project> saved_;  // what there is if the film is dropped
  std::unique_ptr<host::Film> film_;
  bool is_kept_ = false;  // the open shot
  host::ParamValues values_;
  host::WindowSettings window_;

  Worker worker_;
};

}  // namespace calmframe::library
