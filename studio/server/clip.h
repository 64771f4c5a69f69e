#pragma once

#include <boost/asio/steady_timer.hpp>
#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "studio/server/worker_process.h"
#include "studio/wire/settings.h"

namespace calmframe::studio {

// What every clip's worker is started with, and who hears of clips.
struct ClipSurroundings {
  boost::asio::io_context& context;
  EndingThreads& ending;
  std::vector<std::string> roots;         // see Roots
  std::vector<std::string> worker_words;  // see WorkerProcess
  // soon: within a moment is early enough, since more is likely to come of it by then.
  enum class When { now, soon };
  std::function<void(const std::string& id, When when)> changed;
};

// A clip that a person has open: its settings with their history, which outlast its worker, and
// what its worker tells.
class Clip {
 public:
  using Reply = std::function<void(const Message& answer)>;

  // keep: where its work is kept. project: saved work that it was opened from; may be empty. The
  // same of what was kept of a clip before, as Kept gives it.
  Clip(const ClipSurroundings& surroundings, std::string id, std::string path, std::string project,
       std::string keep);
  Clip(const ClipSurroundings& surroundings, const nlohmann::json& kept, std::string keep);
  ~Clip();
  Clip(const Clip&) = delete;
  Clip& operator=(const Clip&) = delete;

  const std::string& id() const { return id_; }
  // Of the clip, as far as is known; else of the saved work.
  const std::string& path() const { return path_.empty() ? project_ : path_; }
  const std::string& keep() const { return keep_; }
  const Settings& settings() const { return settings_; }
  bool is_open() const { return worker_ != nullptr; }
  bool works() const { return state_.value("state", "") == "working"; }
  // Its worker is gone, and not by the studio.
  bool has_failed() const { return !worker_ && state_.value("state", "") == "failed"; }
  std::string error() const { return state_.value("error", ""); }

  // Starts its worker unless one runs.
  void Open();
  void CloseWorker();

  // -- Each a step that can be undone. Quick changes of one thing are one step --
  void SetControl(std::int32_t id, double value);
  void ResetControl(std::int32_t id);
  // A part of the window's settings, by its name; null: as it comes. Throws std::invalid_argument.
  void SetWindow(const std::string& name, const nlohmann::json& value);
  // Another one of the ways that were tried. Throws std::invalid_argument where there is none.
  void TakeWay(std::size_t number);
  // Beside those that are; in all no more than kMostDeletedTracks. Throws std::invalid_argument.
  void DeleteTracks(const nlohmann::json& tracks);
  void RestoreTracks();
  void Undo();
  void Redo();

  // To the worker, which is opened for it. `head`: see RunWorker. The answer always comes, but for
  // a save within seconds; of a worker that ends, or gives none, it has an "error". Gives the
  // number by which it may be forgotten.
  std::uint64_t Ask(nlohmann::json head, Reply reply);
  void Forget(std::uint64_t number);
  void Tell(nlohmann::json head);

  // As pages see it.
  nlohmann::json State() const;
  // What is left when the studio ends: id, path, project, settings.
  nlohmann::json Kept() const;

 private:
  struct Waiting {
    std::string op;
    int width = 0;  // of the picture that was asked for
    Reply reply;    // none: it has had an answer, since the worker's came too late
    std::chrono::steady_clock::time_point until;
  };

  // Throw BadMessage, PathRefused, std::invalid_argument for what makes no sense.
  void Take(const Message& message);
  void TakeTold(nlohmann::json told);
  void AnswerAll(const std::string& error);
  // Answers those that have waited too long, and looks again when others will have.
  void LosePatience();
  void End(int code, const std::string& said);
  // `what`: changes of one thing in quick succession are one step.
  void Change(Settings settings, const std::string& what);
  // Takes the last of `from`; what stands goes to `to`.
  void Step(std::vector<Settings>& from, std::vector<Settings>& to);
  void Give(Settings settings);
  // With what was chosen so far as if it had been set by hand; from now on nothing is chosen.
  Settings ByHand() const;
  const nlohmann::json* ChoiceShown() const;

  const ClipSurroundings& surroundings_;
  const std::string id_;
  std::string path_, project_;
  const std::string keep_;
  Settings settings_;
  bool has_settings_ = true;  // false: those of the project are to be taken
  std::vector<Settings> undo_, redo_;
  std::string changed_last_;
  std::chrono::steady_clock::time_point changed_at_;
  nlohmann::json state_ = nlohmann::json::object();
  std::shared_ptr<WorkerProcess> worker_;
  std::map<std::uint64_t, Waiting> waiting_;
  std::size_t silent_ = 0;  // of these those without a reply
  boost::asio::steady_timer patience_;
  bool is_patient_ = false;                                          // it runs
  const std::shared_ptr<bool> here_ = std::make_shared<bool>(true);  // as long as this
  std::uint64_t asked_ = 0;
  std::uint64_t version_ = 1;  // of the settings, as the worker knows them
  std::uint64_t workers_ = 0;  // its numbers grow from worker to worker
};

}  // namespace calmframe::studio
