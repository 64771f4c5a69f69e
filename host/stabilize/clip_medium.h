#pragma once

#include <cstddef>
#include <memory>
#include <string>

#include "host/media/clip.h"
#include "host/project/project_file.h"
#include "host/timeline/source.h"

namespace calmframe::host {

// How a clip without saved work is opened: all of it decoded to number its frames; or by what its
// container promises of them, while the analysis is the first to decode them.
enum class Opening { decoded, promised };

// A clip that is open.
struct ClipMedium {
  media::ClipInfo info;
  SourcePtr source;
  std::shared_ptr<const media::FoundFrames> found;  // null: a stand-in for one that is gone
  std::size_t end = 0;  // behind the last frame that is to be worked of it
  // Of decoded frames that an analysis leaves to the render behind it.
  std::size_t kept_bytes = 0;
};

// Throws media::Failure where the frames are too small to be stabilized.
ClipMedium MediumOf(std::unique_ptr<media::ClipReader> reader);
// Of the clip at a path, or these frames of it. Throws as MediumOf, and what `part` throws.
ClipMedium OpenMedium(const std::string& path, Opening opening,
                      const media::ClipReader::Part& part = {});
// What stands for the clip of saved work that is gone: blank frames.
ClipMedium StandInFor(const Project& project);

}  // namespace calmframe::host
