#pragma once

#include <boost/asio/io_context.hpp>
#include <boost/asio/steady_timer.hpp>
#include <chrono>
#include <cstdint>
#include <functional>
#include <list>
#include <map>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "host/batch/files.h"
#include "studio/server/clip.h"
#include "studio/server/render_queue.h"
#include "studio/server/sample_clip.h"
#include "studio/wire/roots.h"

namespace calmframe::studio {

struct StudioSettings {
  std::string program;              // that workers and renders are runs of
  std::vector<std::string> worker;  // words behind it that make it a worker; see WorkerProcess
  std::vector<std::string> roots;
  std::string folder;         // where clips, choices and work are kept; made where it isn't there
  std::string password = {};  // that lets in; with another one whoever was let in before is out
  std::vector<std::string> sample = {};  // words that make the program draw the sample clip
  // The part of it that workers and renders need: the rest has the secret.
  std::string WorkFolder() const { return folder + "/work"; }
  std::string SampleFolder() const { return WorkFolder() + "/sample"; }
};

// What a person works on: clips and renders, as every window of theirs sees them. On the context's
// thread.
class Studio {
 public:
  // What a window hears: an event's data.
  using Listener = std::function<void(const std::shared_ptr<const std::string>& event)>;
  using Answer = std::function<void(nlohmann::json answer)>;

  // Takes up what was kept in the folder. Throws PathRefused, std::system_error, and
  // std::runtime_error where another studio has the folder.
  Studio(boost::asio::io_context& context, const StudioSettings& settings);
  ~Studio();
  Studio(const Studio&) = delete;
  Studio& operator=(const Studio&) = delete;

  // Ends workers and renders; for the end of the context.
  void StopAll();

  const Roots& roots() const { return roots_; }
  // Kept with all else, so that a page that is open goes on with a studio that was started again.
  const std::string& secret() const { return secret_; }

  // Adds a clip or saved work unless it is there; its id. Throws PathRefused,
  // std::invalid_argument.
  std::string Add(const std::string& path);
  // What a page asks for: an object with "op". Answers with an object, at once or later, with
  // "error" in one line where it could not be.
  void Do(const nlohmann::json& request, const Answer& answer);
  // To the clip's worker; see RunWorker. One that has ended by itself is not started for it. The
  // number to forget it by; none: there is no such clip.
  std::optional<std::uint64_t> Ask(const std::string& clip, nlohmann::json head, Clip::Reply reply);
  void Forget(const std::string& clip, std::uint64_t number);

  // Hears all there is at once, then what changes.
  std::uint64_t Listen(Listener listener);
  void StopListening(std::uint64_t number) { listeners_.erase(number); }

 private:
  nlohmann::json Act(const nlohmann::json& request, const Answer& later, bool* answers_later);
  nlohmann::json ActOnClip(const std::string& op, Clip& clip, const nlohmann::json& request,
                           const Answer& later, bool* answers_later);
  nlohmann::json Render(Clip& clip, const nlohmann::json& request, const Answer& later,
                        bool* answers_later);
  void AskForTracks(Clip& clip, const nlohmann::json& request, const Answer& later);
  Clip* Find(const std::string& id) const;
  Clip& At(const nlohmann::json& request) const;
  void Open(Clip& clip);
  void Restore();
  void Changed(const std::string& clip, ClipSurroundings::When when = ClipSurroundings::When::now);
  void Flush(ClipSurroundings::When when = ClipSurroundings::When::now);
  void Send(const nlohmann::json& event);
  nlohmann::json Order() const;
  // True where it is on the disk.
  bool Keep();
  void KeepSoon();
  std::string KeepPath(const std::string& id) const { return work_folder_ + "/" + id + ".calm"; }

  const Roots roots_;
  const Roots readable_;  // these and the sample's folder, which pages don't browse
  const std::string folder_, work_folder_;
  std::unique_ptr<batch::FileLock> lock_;
  std::string secret_, kept_password_;  // the latter as a mark
  EndingThreads ending_;
  ClipSurroundings surroundings_;
  std::vector<std::unique_ptr<Clip>> clips_;
  std::list<std::string> used_;  // open clips, the last used first
  std::unique_ptr<RenderQueue> renders_;
  std::unique_ptr<SampleClip> sample_;
  std::map<std::uint64_t, Listener> listeners_;
  std::uint64_t listeners_ever_ = 0;
  std::set<std::string> changed_;
  bool renders_changed_ = false, order_changed_ = false, sample_changed_ = false;
  boost::asio::steady_timer flush_, keep_;
  bool flushes_ = false, keeps_ = false;
  std::chrono::steady_clock::time_point flushed_at_;
  std::chrono::steady_clock::duration flush_took_{};
  std::string trouble_;  // what can't be kept, and why
};

}  // namespace calmframe::studio
