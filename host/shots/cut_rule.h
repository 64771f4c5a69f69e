#pragma once

#include <cstdint>
#include <optional>

#include "host/shots/frame_history.h"

namespace calmframe::host {

// Whether a shot begins with the frame, by the frames that the history holds about it: 1 at least
// before it, 7 behind it where the film has them. How sure, 0.5 to 1, if so.
std::optional<double> CutAt(const FrameHistory& history, std::int64_t frame);

// The contrast, in 255ths, below which a frame shows nothing: black, white, another plain picture
// with the noise that a coder leaves in it.
inline constexpr double kPlain = 3;

}  // namespace calmframe::host
