#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "host/effects/host.h"
#include "host/effects/param_table.h"
#include "host/effects/session.h"
#include "host/media/clip.h"
#include "host/project/project_file.h"
#include "host/stabilize/choice.h"
#include "host/stabilize/motion_groups.h"
#include "host/stabilize/moving_clip.h"
#include "host/stabilize/shown_path.h"
#include "host/stabilize/watcher.h"
#include "host/timeline/source.h"

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

// How a clip without saved work is opened: all of it decoded to number its frames; or by what its
// container promises of them, while the analysis is the first to decode them.
enum class Opening { decoded, promised };

// How a clip is to be shown by windows that follow its picture.
struct FollowRequest {
  double most_zoom = 1.5;                           // each frame is enlarged at most so far
  double zoom_speed = FollowSettings().zoom_speed;  // percent a second
  // Other controls than those that were set are tried as well, and the clip as it was filmed.
  bool may_choose = true;
  Still still = Still::automatic;
};

// A clip that is open.
struct ClipMedium {
  media::ClipInfo info;
  SourcePtr source;
  std::shared_ptr<const media::FoundFrames> found;  // null: a stand-in for one that is gone
  std::size_t end = 0;  // behind the last frame that is to be worked of it
};

// Throws media::Failure where the frames are too small to be stabilized.
ClipMedium MediumOf(std::unique_ptr<media::ClipReader> reader);
// Of the clip at a path, or these frames of it. Throws as MediumOf, and what `part` throws.
ClipMedium OpenMedium(const std::string& path, Opening opening,
                      const media::ClipReader::Part& part = {});
// What stands for the clip of saved work that is gone: blank frames.
ClipMedium StandInFor(const Project& project);

// A clip, or a shot of one, on the timeline of a host, with the effect applied to it: worked,
// framed, measured and saved. For the thread that made it; others of the process have nothing to do
// with it.
class SteadyClip {
 public:
  // `plugin`: the effect's library. These frames of a clip, of which nothing is done yet, or as far
  // as the medium's source finds them to be of one shot; or the saved work of one of the project's
  // shots. Throws SolveFailure when the effect can't be had.
  SteadyClip(const std::string& plugin, const ClipMedium& medium, const media::FrameRange& range);
  SteadyClip(const std::string& plugin, const ClipMedium& medium, const Project& project,
             std::size_t shot);

  // Sets these of the effect's parameters; host().declarations() has them all. What they ask for is
  // there after the next Work; what was chosen beside the controls before is undone. Throws
  // SolveFailure.
  void SetControls(const ParamValues& values);
  // The same for what they were declared with; they count as never set.
  void ResetControls(const std::set<std::int32_t>& disk_ids);
  // The controls of other saved work, before any Work; none of them counts as set.
  void TakeControls(const ParamValues& values);
  // The controls again as they were given, before any choice, and all tracks; what they ask for is
  // there after the next Work. False where that is what there is. Throws SolveFailure.
  bool ForgetChoice();

  const std::string& path() const { return info_.path; }
  // As a clip of its own: a part, where only a stretch of it is worked.
  const media::ClipInfo& info() const { return info_; }
  const media::ClipInfo& whole() const { return whole_; }
  // What is worked, in frames of the whole clip. Where the source finds that another shot begins in
  // it, it ends there as soon as that is known, after Work at the latest.
  const media::FrameRange& range() const { return range_; }
  Host& host() { return host_; }
  // Since it was opened.
  bool has_new_controls() const { return has_new_controls_; }
  Effect& effect() { return *effect_; }
  // What draws the frames: the effect, or where windows follow the picture one that shows these.
  Effect& drawn() { return drawn_ ? *drawn_ : *effect_; }

  // Waits until the effect has analysed and solved the clip, as far as that is to do. What was
  // drawn before is drawn until its framing is chosen anew, unless that was the effect itself; see
  // Watcher::Redraws. Once stopped it goes on where it was. Throws Interrupted, SolveFailure,
  // media::Failure; the last also where a clip that is gone would have to be analysed;
  // BrokenPromise of a clip that was opened by promises, before anything is told of how the work
  // ended.
  Reuse Work(Watcher& watcher);

  // Has what is drawn take controls at once, ahead of SetControls, Work and the framing, which may
  // find its windows anew. False, and nothing is changed, where one of them does more than change
  // how a frame is drawn. Throws SolveFailure.
  bool Preview(const ParamValues& values);
  // Keeps what is found out of a solve for the next framing, measure and path, which then take less
  // time, and as much memory as the solve.
  void KeepWhatIsFound() { keeps_found_ = true; }

  // Solves once more with the controls as they stand, for what only a running solve tells. Throws
  // as Work.
  void SolveAnew(Watcher& watcher);

  // After Work, with a framing that crops or fills the edges: from now on what is drawn are the
  // calmest windows that stay in the picture, in place of what the effect shows by itself. Where it
  // may choose, parameters that nobody set are tried on copies of the effect, which solve side by
  // side; the effect becomes the one that serves the clip best, and what was chosen is saved with
  // it. A choice that was made before stands as long as controls and request do. Throws
  // Interrupted, SolveFailure.
  void FollowPicture(const FollowRequest& request, Watcher& watcher);
  // After Work: the effect draws by itself, solved anew without the tracks of the background or the
  // subject, or with all, as where there is no subject. Automatic leaves them as they are. Throws
  // as Work.
  void HoldStill(Still still, Watcher& watcher);
  // From now on the frames are drawn as they were filmed, whatever the framing: of a clip that was
  // not solved, or of which nothing would be seen. It is no choice, and is not saved. Throws
  // Interrupted, SolveFailure.
  void ShowAsFilmed(Watcher& watcher);
  // Tracks that a person deletes, beside those that HoldStill and FollowPicture leave out; as
  // Effect::DeleteTracks takes them. What is solved without them is there after the next Work, and
  // a choice that was made before is undone. Throws SolveFailure.
  void DeleteTracks(const std::set<TrackPoint>& points);
  // The same as they are; of saved work those that it holds, unless tracks of a group are left out
  // of it, which can't be told apart from them. An analysis forgets them.
  const std::set<TrackPoint>& DeletedTracks();
  // Null where nothing was to choose.
  const Choice* choice() const { return choice_ ? &*choice_ : nullptr; }
  // Made by FollowPicture since it was opened or saved.
  bool has_new_choice() const { return has_new_choice_; }
  // After Work: what the output shows.
  Outcome Measure();
  // The same frame by frame. Throws SolveFailure.
  ShownPath Path();

  // Throws SolveFailure where the effect can't be saved.
  SavedShot Saved();
  // After Work: what is solved, as it would be saved. Throws SolveFailure.
  SolvedClip Solved();

  // After Work: the same, with what is known of how it moves. Throws SolveFailure.
  std::shared_ptr<const MovingClip> Found() { return SolvedAndFramed(); }
  // After Work: what draws the frames as they were filmed, with the effect's own dots on the tracks
  // that it solves with. It is made when it is first asked for, and goes when there is something to
  // work; see Watcher::Redraws. Throws SolveFailure.
  Effect& ShowingTracks();

  // After Work. Null where the framing has none.
  std::unique_ptr<CropWindow> Crop();
  // "crop window 575x298, Auto-scale (121.1%)"; empty where the framing has none.
  std::string CropText();
  // The name of a parameter as the effect has it now, of a group with its readout.
  std::string NameOf(std::int32_t disk_id) const;
  // The value of a parameter as the effect has it now; 0 of one without.
  double ValueOf(std::int32_t disk_id) const;

  // Throws media::Failure when the clip could not be read to its end.
  void CheckMedia();

 private:
  SteadyClip(const std::string& plugin, const ClipMedium& medium, const Project* project,
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
  // Of a parameter, as it was declared. Throws SolveFailure.
  void Set(std::int32_t disk_id, double value);
  // What the effect would save, null where nobody wants it, and what of it is solved. Throws
  // SolveFailure.
  static SolvedClip Solved(Effect& effect, SavedEffect* saved, const std::string& name);
  // Solved, with a crop only where the framing has one. `saved`, where it isn't null: the effect.
  std::shared_ptr<const MovingClip> SolvedAndFramed(SavedEffect* saved = nullptr);
  // Of its own, for another effect on the same clip.
  boost::shared_ptr<Layer> LayerOfItsOwn() const;
  // Whether nobody set a parameter, so that it may be chosen.
  bool IsFree(std::int32_t disk_id) const;
  // The controls as they were given; the tracks that are left out stay so.
  void UndoChoice();
  // Tracks, beside those that are deleted, out of what is solved from the next Work on. Throws
  // SolveFailure.
  void Leave(const std::vector<TrackPoint>& left_out);
  void LeaveOut(Still still, const SolvedClip& solved, const MotionGroups& groups,
                Watcher& watcher);
  // `saved`: the effect. The copy that is better than all considered before; null: none is.
  Effect* TryControls(const SavedEffect& saved, Chooser& chooser, Watcher& watcher);
  // Goes on with a copy that was solved under other controls.
  void BecomeCopy(Effect& copy, Watcher& watcher);
  void Draw(const Candidate& shown, const std::vector<Similarity>& windows, SavedEffect saved,
            Watcher& watcher);
  void DrawByItself(Watcher& watcher);
  double FramesPerSecond() const;  // fields, of an interlaced clip
  // None of a framing that leaves the edges empty.
  std::optional<Filling> FillingOfEdges() const;
  // At which the effect shows its crop window.
  double Zoom(const SolvedClip& solved) const;
  // Throws SolveFailure where the effect is not ready.
  void CheckResult(Watcher& watcher);
  // Address of the first frame's warp, which goes with its solve; null without one.
  const void* FirstWarp();

  const media::ClipInfo whole_;
  media::FrameRange range_;
  media::ClipInfo info_;
  const std::size_t end_;                                  // of the medium
  const std::shared_ptr<const media::FoundFrames> found_;  // null of a stand-in
  Host host_;
  Session session_;
  Effect* effect_ = nullptr;         // the session's
  Effect* drawn_ = nullptr;          // the session's; null: the effect itself
  std::vector<Similarity> windows_;  // that it shows; none of the effect itself
  double drawn_scale_ = 100;         // Additional Scale that is in them
  std::optional<Choice> choice_;
  bool has_new_choice_ = false;
  std::set<TrackPoint> deleted_;      // by a person
  bool knows_deleted_ = true;         // else saved work may hold some
  std::vector<TrackPoint> left_out_;  // of a group
  Effect* with_tracks_ = nullptr;     // the session's
  Still held_ = Still::all;           // as a choice or HoldStill has it
  std::set<std::int32_t> set_;        // disk ids of the parameters that somebody set
  bool has_new_controls_ = false;
  bool analysed_ = false;   // anew, and what is solved of it is still to begin
  bool is_worked_ = false;  // Work has nothing to do
  bool keeps_found_ = false;
  std::shared_ptr<const MovingClip> found_of_;  // what was saved last; null: nothing is known
  std::vector<std::uint8_t> found_instance_;    // that it was saved as; empty: it has changed
};

}  // namespace calmframe::host
