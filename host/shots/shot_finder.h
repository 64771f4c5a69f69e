#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "host/shots/frame_digest.h"

namespace calmframe::host {

// Where one shot ends and the next begins. Frames count from the first that was added.
struct ShotBorder {
  enum class Kind { cut, dissolve, fade };  // fade: through black, white or another plain picture
  std::int64_t frame = 0;  // the first of the next shot; of a dissolve or fade its middle
  // The frames that show both shots or neither; of a cut `frame` itself. first <= frame <= last.
  std::int64_t first = 0, last = 0;
  Kind kind = Kind::cut;
  double confidence = 0;  // 0.5: just taken for one, to 1: beyond doubt
  bool operator==(const ShotBorder&) const = default;
};

// Finds the shots of a film while its frames come by in order, each once. It keeps the digests of
// some two seconds, takes as long for each frame, some 0.5 ms, and tells the same of the same
// frames. A border is a change in one step that no motion of the camera, no change of light and no
// flash explains, by cuts; or frames in which two scenes are mixed, which takes detail of both, or
// that fade to a plain picture and back. Plain frames at the film's start or end belong to the shot
// beside them. For one thread.
class ShotFinder {
 public:
  struct Settings {
    double frames_per_second = 30;  // above 0: how long a dissolve or a fade takes in frames
  };
  // A cut is told when so many frames were added behind its first.
  static constexpr int kCutLag = 8;

  explicit ShotFinder(const Settings& settings);
  ~ShotFinder();

  void Add(const FrameDigest& digest);
  // The borders that became certain since the last call, by `frame`, behind all that were told
  // before; they stand. A dissolve or fade is told about a second behind its end, or when a cut
  // that follows it sooner is.
  std::vector<ShotBorder> Take();
  // No more frames: what can be decided is decided. Nothing is added any more.
  void Finish();

 private:
  class Search;
  std::unique_ptr<Search> search_;
};

}  // namespace calmframe::host
