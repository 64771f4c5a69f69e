#pragma once

#include <calmframe.hpp>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>

#include "editors/mlt/controls.h"
#include "editors/mlt/pictures.h"

namespace calmframe::mlt {

// The frames of a clip, so far as they differ from those of any other.
struct ClipFrames {
  std::string identity;  // IdentityOf
  int width = 0, height = 0;
  int aspect_num = 1, aspect_den = 1;  // of a pixel
  int rate_num = 25, rate_den = 1;
};

// For frames of these; the count is left to whoever opens the session.
Options OptionsFor(const ClipFrames& frames, const PictureKind& kind);

// The pass that looks at a clip: frames go in in their order, the work goes to a file. Any thread.
class Analysis {
 public:
  // Of `count` source frames from `first` on. Throws Error.
  Analysis(const ClipFrames& frames, const PictureKind& kind, const Controls& controls,
           std::int64_t first, std::int64_t count);

  std::int64_t first() const { return first_; }
  // How many frames went in.
  std::int64_t next() const {
    const std::lock_guard lock(mutex_);
    return next_;
  }

  // Waits for its turn, since frame threads bring frames in a slightly wrong order; one that was
  // given before counts for nothing. True with the last frame, when the clip is solved. Throws
  // Error, also where frames before it don't come.
  bool Push(std::int64_t source_frame, const calmframe_image& image);
  void Save(const std::string& path) { session_.Save(path); }

 private:
  const std::int64_t first_, count_;
  Session session_;
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::int64_t next_ = 0;    // guarded by mutex_
  bool is_pushing_ = false;  // guarded by mutex_
};

}  // namespace calmframe::mlt
