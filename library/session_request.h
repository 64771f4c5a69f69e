#pragma once

#include <cstdint>
#include <string>

#include "host/stabilize/film.h"
#include "library/calmframe.h"
#include "library/frame_format.h"
#include "platform/tessel/guid.h"

namespace calmframe::library {

// What a session is asked for, without what the options point at.
struct SessionRequest {
  // Throws Refusal, media::Failure for a clip that can't be read.
  explicit SessionRequest(const calmframe_options& options);

  FrameFormat format;
  media::ClipInfo clip;  // its path: that of the clip, or what stands for it in texts
  tessel::utility::Guid content;
  host::ShotRequest shots;
  bool shots_by_source;  // nobody said which: saved work has its own
  calmframe_fetch fetch;
  void* user;
  std::string plugin;
};

}  // namespace calmframe::library
