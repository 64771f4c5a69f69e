#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "host/media/frame_index.h"

namespace calmframe::media {

// All that ScanFrames finds: how a clip's frames are numbered, and how each is known again.
// Constant once it is shared.
struct FrameList final : FoundFrames {
  ClipInfo info;
  FrameIndex index;  // one a frame
  // Those that were decoded, beside frame 0; of the others the index has a time and no more.
  FrameRange known;

  Standing standing() const override { return Standing::decoded; }
  std::vector<std::uint8_t> Bytes() const override;
};

// The list that Bytes made, of the clip at `path` now. None where the bytes are no such list, are
// of another version, or the frames were numbered by other libraries than those of this process.
std::optional<FrameList> FrameListOf(const std::vector<std::uint8_t>& bytes,
                                     const std::string& path);

// What was found of stretches of a clip, as one: the Bytes of each, in ascending order, as far as
// they go on where the one before them ends. Empty where the first of them is no list, or one is of
// another clip.
std::vector<std::uint8_t> JoinFound(const std::vector<std::vector<std::uint8_t>>& stretches);

}  // namespace calmframe::media
