#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "host/project/project_file.h"
#include "host/stabilize/shot_source.h"
#include "host/stabilize/steady_clip.h"
#include "host/stabilize/watcher.h"

namespace calmframe::host {

// Which shots a clip has.
struct ShotRequest {
  enum class Kind {
    automatic,  // as saved work has them, else as they are found while the clip is analysed
    one,
    list
  };
  Kind kind = Kind::automatic;
  // Of a list: the first frames of all shots but the first, ascending, of the whole clip.
  std::function<std::vector<std::int64_t>(const media::ClipInfo&)> list = {};
};

// Where shots begin in these frames of a clip, found by decoding them, with nothing analysed. Shows
// the stage "looking". Throws Interrupted, media::Failure, and BrokenPromise of a clip that was
// opened by promises.
std::vector<ShotBorder> FindShots(const ClipMedium& medium, const media::FrameRange& range,
                                  Watcher& watcher);

// The first frames of a clip's shots, the clip's own first; found like that where the request
// leaves it to that. Throws as FindShots, and what the request's list throws.
std::vector<std::size_t> ShotStarts(const ClipMedium& medium, const ShotRequest& request,
                                    Watcher& watcher);

// A clip as one shot behind the other. Each is analysed, solved, framed and drawn as if it were a
// clip of its own: an effect of its own on a layer that ends where the shot does, so that nothing
// of one gets into another. One is open at a time, and a film takes the memory of its longest shot
// and of what is saved of the others.
//
//   for (SteadyClip* shot = film.Next(); shot; shot = film.Next()) {
//     shot->Work(watcher);  // from here on range() ends where the shot does
//     ...
//     film.Keep();
//   }
class Film {
 public:
  // A clip of which nothing is done yet, or with a `part` these frames of it alone; or saved work,
  // as far as it goes. Throws media::Failure, and what `part` and the request's list throw.
  Film(const std::string& plugin, const std::string& path, Opening opening = Opening::decoded,
       const media::ClipReader::Part& part = {}, const ShotRequest& request = {});
  // Saved shots that are no beginning of those that are requested count for nothing but their
  // controls.
  Film(const std::string& plugin, const Project& project, const std::string& path,
       const ShotRequest& request = {});
  // Of a clip that is gone: what was made of it stands, its frames are blank.
  Film(const std::string& plugin, const Project& project);
  // The same of a clip that is open, whoever has its frames: all of it, or the saved work's part.
  Film(const std::string& plugin, const ClipMedium& medium, const ShotRequest& request);
  Film(const std::string& plugin, const ClipMedium& medium, const Project& project,
       const ShotRequest& request);

  const media::ClipInfo& whole() const { return medium_.info; }
  // The clip's frames that are worked, and what they are as a clip of their own.
  const media::FrameRange& range() const { return range_; }
  media::ClipInfo info() const { return media::PartOf(medium_.info, range_); }

  // From the next shot on, what an analysis has decoded stays for the render behind it, as much as
  // fits in `bytes`: for whoever draws each shot in order, right after its work.
  void KeepDecoded(std::size_t bytes) { medium_.kept_bytes = bytes; }

  // Closes the shot that is open and opens the next; null behind the last one. Throws as
  // SteadyClip does.
  SteadyClip* Next();
  // Closes the shot that is open and opens this one of Saved(); Next goes on from there.
  SteadyClip* Open(std::size_t number);
  // The shot that is open; null: none is.
  SteadyClip* shot() const { return shot_.get(); }
  // Of the shot that is open, counted from 0.
  std::size_t number() const { return number_; }
  // Of the shot that is open: whether it is all of the film, as far as is known by now.
  bool is_one_shot() const;

  // The work of the shot that is open goes into Saved(). Throws SolveFailure.
  void Keep();
  // What was kept, and what was taken up.
  const Project& Saved() const { return saved_; }

 private:
  Film(const std::string& plugin, const ClipMedium& medium, const media::ClipReader::Part& part,
       const ShotRequest& request);
  Film(const std::string& plugin, const ClipMedium& medium, const media::FrameRange& range,
       const Project* project, const ShotRequest& request);

  const std::string plugin_;
  ClipMedium medium_;  // its source tells where shots end
  const media::FrameRange range_;
  Project saved_;            // its shots: none at first
  bool has_frames_ = false;  // saved_ has those of the clip as they will stay
  ParamValues given_;        // to shots that begin anew
  std::unique_ptr<SteadyClip> shot_;
  std::size_t number_ = 0;
  std::size_t next_ = 0;  // frame that the shot behind the open one begins with, once it is closed
};

}  // namespace calmframe::host
