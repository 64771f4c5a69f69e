#pragma once

#include <cstddef>
#include <map>
#include <mutex>
#include <optional>

#include "host/media/ffmpeg.h"

namespace calmframe::media {

// Of a clip that is read twice in order, such as by an analysis and by the render behind it: the
// last frames of the first time, as they were decoded, so that the second time decodes those before
// them alone. The last and not the first: a decoder that begins within a clip begins at a keyframe.
// Of all readers of a clip; any thread.
class KeptFrames {
 public:
  // How much they may take. 0, as it is at first: no more are kept, and those that there are go as
  // they are taken.
  void SetBound(std::size_t bytes);
  // A reference to it, if it is behind all that are kept; the oldest go. Where there is no memory
  // for that, or where the frame is in memory of a device, it isn't kept.
  void Keep(std::size_t number, const AVFrame& frame);
  // Null where it isn't kept.
  FramePtr Take(std::size_t number);
  // The first that is kept at or behind that one.
  std::optional<std::size_t> From(std::size_t number) const;

 private:
  struct Kept {
    FramePtr frame;
    std::size_t bytes;
  };
  void Drop(std::map<std::size_t, Kept>::iterator kept);

  mutable std::mutex mutex_;  // guards all below
  std::size_t bound_ = 0;
  std::size_t bytes_ = 0;
  std::map<std::size_t, Kept> frames_;
};

}  // namespace calmframe::media
