#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "host/media/clip.h"

namespace calmframe::host {

// A point of a clip as a person names it: a frame, or a time. Both count from the clip's first
// frame, whatever its time stamp.
struct Moment {
  std::string text;  // as it was given
  bool is_frame = false;
  double value = 0;  // frames or seconds
};

// What a whole number without a unit stands for.
enum class BareNumber { seconds, frame };

// Of "12.5" or "12s", "M:SS" or "H:MM:SS", both with a fraction where need be, and "300f"; none of
// anything else.
std::optional<Moment> ParseMoment(const std::string& text, BareNumber bare);

// Seconds from the clip's first frame to where a frame begins to be shown, or to the clip's end.
double SecondsAt(const media::ClipInfo& clip, std::size_t frame);

// The first frame that begins to be shown at the moment or later, to half a millisecond; the clip's
// end where none does. A frame is itself.
std::size_t FrameAt(const Moment& moment, const media::ClipInfo& clip);

// "0:12.5,300f": where shots begin, in any order, a number without a unit in seconds. Their first
// frames, ascending and each once. Throws std::invalid_argument, with a line that names the item,
// for one that is no moment, or lies outside of the clip or at its first frame.
std::vector<std::int64_t> ParseBorders(const std::string& list, const media::ClipInfo& clip);

}  // namespace calmframe::host
