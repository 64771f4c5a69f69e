#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

#include "host/media/clip.h"

namespace calmframe::media {

// Writes a clip from segments that were encoded apart, each by a ClipWriter of a part of `source`
// with the same settings, one behind the other: their packets as they are, at the times of the
// source's frames, and the source's other streams, once. What a ClipWriter of the whole would have
// written, but for what its encoder remembers across the borders. Told of the frames that are
// written, `goes_on` may end it by what it throws; then nothing is left.
//
// Gives one line for each thing that is left out. Throws Failure (input): a segment that is no
// video, is cut off or of other settings than the first; other frames in all than the source has.
// Throws Failure (output): as ClipWriter::Create; raw frames and pictures, which have no segments.
std::vector<std::string> JoinSegments(const std::vector<std::string>& segments,
                                      const ClipInfo& source, const std::string& output,
                                      bool overwrite,
                                      const std::function<void(std::size_t)>& goes_on = {});

}  // namespace calmframe::media
