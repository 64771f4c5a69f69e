#pragma once

#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "host/effects/host.h"
#include "host/effects/param_table.h"
#include "host/effects/session.h"
#include "host/media/clip.h"
#include "host/project/project_file.h"
#include "host/stabilize/clip_medium.h"
#include "host/stabilize/solved_clip.h"
#include "host/stabilize/watcher.h"

namespace calmframe::host {

// The crop window that the effect found for a clip, in square pixels of its frames.
struct CropWindow {
  int width = 0, height = 0;
};

// What of a project's results still stood.
struct Reuse {
  bool analysis = false, solve = false, framing = false;

  // "reused the analysis and the solve"; empty for nothing.
  std::string Text() const;
};

// The effect on a clip, or on a shot of one, on the timeline of a host of its own: worked by its
// controls and its tracks until it has a result. What is chosen beside it, SteadyClip knows. For
// the thread that made it.
class WorkedEffect {
 public:
  // See SteadyClip.
  WorkedEffect(const std::string& plugin, const ClipMedium& medium, const media::FrameRange& range);
  WorkedEffect(const std::string& plugin, const ClipMedium& medium, const Project& project,
               std::size_t shot);

  const std::string& path() const { return info_.path; }
  // As a clip of its own: a part, where only a stretch of it is worked.
  const media::ClipInfo& info() const { return info_; }
  const media::ClipInfo& whole() const { return whole_; }
  // What is worked, in frames of the whole clip; see SteadyClip::range.
  const media::FrameRange& range() const { return range_; }
  Host& host() { return host_; }
  const Host& host() const { return host_; }
  Session& session() { return session_; }
  Effect& effect() { return *effect_; }

  // Whether a frame's drawing alone depends on a parameter, and nothing that is solved or cropped.
  static bool IsDrawnAlone(std::int32_t disk_id);
  // Of a parameter, as it was declared. Throws SolveFailure.
  void Set(std::int32_t disk_id, double value);
  // Of a parameter as the effect has it now; 0 of one without.
  double ValueOf(std::int32_t disk_id) const;
  // The name of a parameter as the effect has it now, of a group with its readout.
  std::string NameOf(std::int32_t disk_id) const;

  // See SteadyClip::Work.
  Reuse Work(Watcher& watcher);
  // Nothing is left to do for Work.
  bool is_worked() const { return is_worked_; }
  // See SteadyClip::SolveAnew.
  void SolveAnew(Watcher& watcher);
  // Goes on with another effect of the session, which was solved under other controls.
  void Become(Effect& other, Watcher& watcher);

  // Takes tracks of a group out of what is solved from the next Work on, beside those that a person
  // deleted. Throws SolveFailure.
  void LeaveOut(const std::vector<TrackPoint>& of_group);
  // See SteadyClip::DeleteTracks and DeletedTracks.
  void DeleteTracks(const std::set<TrackPoint>& points);
  const std::set<TrackPoint>& DeletedTracks();
  // Of what saved work leaves out a person deleted these, and the rest is a group's; else all.
  void TakeDeleted(std::set<TrackPoint> deleted) {
    deleted_ = std::move(deleted);
    knows_deleted_ = true;
  }

  // What the effect would save, null where nobody wants it, and what of it is solved. Throws
  // SolveFailure.
  SolvedClip Solved(SavedEffect* saved);
  // The same of any effect; `name` stands ahead of what it throws.
  static SolvedClip SolvedBy(Effect& effect, SavedEffect* saved, const std::string& name);
  static bool IsReady(const Effect& effect);
  // Throws SolveFailure, with the last of the messages if there are any, where it isn't.
  void CheckReady(const Effect& effect, const std::vector<std::string>& messages = {}) const;
  // As projects keep it. Throws SolveFailure where it can't be saved.
  SavedShot Saved();

  // What was freed of the clip in small pieces goes back to the system. Else it would stand beside
  // what the next step takes. Of short ones it is not worth the time.
  void GiveBack() const;

  // For another effect on the same frames.
  boost::shared_ptr<Layer> LayerOfItsOwn() const;
  double FramesPerSecond() const;  // fields, of an interlaced clip

  // See SteadyClip.
  std::unique_ptr<CropWindow> Crop();
  std::string CropText();
  void CheckMedia();

 private:
  WorkedEffect(const std::string& plugin, const ClipMedium& medium, const Project* project,
               const SavedShot* shot, const media::FrameRange& range);
  // Ends where the source sees the shot end by now.
  void EndWithShot();
  bool IsBroken() const;
  Reuse WorkFramedLast(double framing, Watcher& watcher);
  // act(the parameter's value); what act throws leaves it with that value.
  template <class Act>
  auto Keeping(std::int32_t disk_id, const Act& act);
  // Ticks until nothing is left to do. What was seen at work is taken from `reuse`. `shown`: the
  // stage that was shown last and goes on until another one begins or End ends it.
  void Settle(Watcher& watcher, Progress& shown, Reuse& reuse);
  static void End(Watcher& watcher, Progress& shown);
  // The effect goes on from what it would save, which is rounded: so a clip looks the same whether
  // its work went through a project or not. Throws SolveFailure.
  void TakeAsSaved();
  // Throws SolveFailure where the effect is not ready.
  void CheckResult(Watcher& watcher);
  // Address of the first frame's warp, which goes with its solve; null without one.
  const void* FirstWarp();

  const media::ClipInfo whole_;
  media::FrameRange range_;
  media::ClipInfo info_;
  const std::size_t end_, kept_bytes_;                     // of the medium
  const std::shared_ptr<const media::FoundFrames> found_;  // null of a stand-in
  Host host_;
  Session session_;
  Effect* effect_ = nullptr;          // the session's
  std::set<TrackPoint> deleted_;      // by a person
  bool knows_deleted_ = true;         // else all that saved work leaves out
  std::vector<TrackPoint> left_out_;  // of a group
  bool analysed_ = false;             // anew, and what is solved of it is still to begin
  bool is_worked_ = false;
};

}  // namespace calmframe::host
