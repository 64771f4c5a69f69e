#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <nlohmann/json.hpp>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "host/stabilize/film.h"
#include "studio/wire/settings.h"
#include "studio/worker/frame_desk.h"
#include "studio/worker/lasso.h"

namespace calmframe::studio {

// What is to be opened.
struct OpenRequest {
  std::string clip;                  // empty: the project's
  std::string project;               // saved work to take up; empty, or not there: none
  std::string keep;                  // where work is saved by itself; empty: nowhere
  std::vector<std::string> roots;    // folders that the clip may lie in, whatever a project says
  std::optional<Settings> settings;  // none: the saved work's
  std::uint64_t version = 1;         // of the settings; see ClipDesk::Set
};

// A clip that a person works on: opens it, works it as it is asked to, and tells how it stands.
// Run is for one thread, which owns the effect; all else any thread.
//
// What it tells are objects: parts of the clip's state that are new, each key's value whole.
// "state": "opening", "open" (not analysed), "working", "ready", "failed"; "error"; "info";
// "progress"; "panel" and "curves", numbers that grow when Panel() and Curves() change; "picture",
// which grows when steady frames look different; "shows": the version of the settings that they
// show; "outcome", "shots" (of the first with "choice"), "warnings"; "settings", of saved work that
// was opened with its own. See ToldOf, which tells what of them the studio hears.
class ClipDesk {
 public:
  using Tell = std::function<void(nlohmann::json part)>;
  // An error in one line, empty where all went well.
  using Done = std::function<void(const std::string& error)>;

  ClipDesk(std::string plugin, Tell tell);
  ~ClipDesk();

  void Open(OpenRequest request);
  // version: the caller's own number for them, another one for each.
  void Set(const Settings& settings, std::uint64_t version);
  void Work();
  // Ends what is being worked; it stays as it is until something is changed or asked for.
  void Cancel();
  // As the settings ask for it, all shots.
  void Save(std::string path, Done done);
  void End();

  nlohmann::json Panel();
  // Of the shots that are solved, each with "first" and "curves".
  nlohmann::json Curves();
  FrameDesk& frames() { return frames_; }
  // Somebody looks at the tracks.
  void ShowTracks();
  // Of the shot that the lasso's frame is in, where that is open and solved; else none.
  std::vector<LassoedTrack> TracksIn(const Lasso& lasso);
  // Somebody looks at that frame.
  void LookAt(std::int64_t frame);
  // Why the clip can't be written to a file like that, one line; empty where it can, or isn't open
  // yet. Nothing is left there.
  std::string OutputTrouble(const std::string& path, const media::EncodeSettings& encode);

  void Run();

 private:
  class Onlooker;
  struct Shot {
    media::FrameRange range;
    std::uint64_t version = 0;  // of the settings that all below tells of
    std::uint64_t shows = 0;    // of those that its frames are drawn by
    bool solved = false;
    host::Outcome outcome;
    nlohmann::json choice, curves;
  };
  struct SaveRequest {
    std::string path;
    Done done;
  };
  enum class Step { end, open, work, preview, renew, look, tracks, save, keep };

  // -- On the thread of Run --
  Step NextStep();
  void Act(Step step);
  void OpenClip(const OpenRequest& request);
  void OpenAnew(host::Opening opening);
  void WorkAll();
  void OpenShot(std::size_t number);
  // Works and frames the open shot by the settings as they are now.
  void Steady(host::SteadyClip& shot);
  // Draws by the settings as they are now what needs no more than that.
  void Preview(host::SteadyClip& shot);
  // Whether it ends for what was asked for since, even if nobody cancelled it.
  bool IsOutdated(std::uint64_t version);
  void Frame(host::SteadyClip& shot, const Settings& settings, Onlooker& onlooker);
  // What the settings ask for beside what the shot has.
  struct Changes {
    host::ParamValues values;
    std::set<std::int32_t> resets;
  };
  Changes ChangesOf(host::SteadyClip& shot, const Settings& settings) const;
  void Apply(host::SteadyClip& shot, const Settings& settings);
  void ShowPicture(host::SteadyClip& shot, std::uint64_t version, bool solved);
  void ForgetDeleted();
  void KeepResult(host::SteadyClip& shot, std::uint64_t version, bool solved);
  void SaveNow(const SaveRequest& request);
  void TellInfo();
  void TellPanel(host::SteadyClip& shot);
  void TellShots();
  void TellPicture();
  void TellState();
  void Fail(const std::string& line);
  Settings SettingsOfWork(host::SteadyClip& shot) const;
  static double RateOf(const media::ClipInfo& info);
  static nlohmann::json InfoOf(const media::ClipInfo& info);

  std::optional<std::size_t> ShotAt(std::int64_t frame) const;
  bool is_solved() const { return film_ && whole_ && !shots_.empty(); }

  const std::string plugin_;
  const Tell tell_;

  std::mutex mutex_;  // guards all up to the thread's own
  std::condition_variable changed_;
  bool ended_ = false;
  std::optional<OpenRequest> open_;
  Settings settings_;
  std::uint64_t version_ = 1;  // of the settings
  bool wants_work_ = false;
  bool cancelled_ = false;          // until something else is wanted
  std::uint64_t given_up_ = 0;      // version whose work was cancelled
  std::uint64_t shot_version_ = 0;  // that the open shot was given
  // Version that Preview has had, and when a shot is to be steadied by it.
  std::uint64_t previewed_ = 0;
  std::chrono::steady_clock::time_point steady_at_;
  std::optional<std::int64_t> looked_at_;
  bool wants_tracks_ = false;
  std::optional<media::ClipInfo> info_;            // none: it isn't open
  int fields_ = 1;                                 // that a frame is of
  std::shared_ptr<const host::MovingClip> found_;  // of the shot that is shown; may be null
  std::deque<SaveRequest> saves_;
  nlohmann::json panel_ = nlohmann::json::array(), curves_ = nlohmann::json::array();

  // The thread's own.
  OpenRequest opened_;
  std::unique_ptr<host::Film> film_;
  bool whole_ = false;       // all shots were worked
  std::vector<Shot> shots_;  // those that were
  // Who was asked to stand still when a shot's window was chosen, by the shot's number.
  std::map<std::size_t, host::Still> asked_still_;
  // Controls that were ever set, and those that are on the open shot.
  std::set<std::int32_t> touched_, applied_;
  std::vector<std::string> warnings_;
  std::string error_;
  std::string state_ = "opening";
  std::uint64_t panels_ = 0, pictures_ = 0;
  bool is_kept_ = true;

  FrameDesk frames_;  // last: its threads draw what is above
};

}  // namespace calmframe::studio
