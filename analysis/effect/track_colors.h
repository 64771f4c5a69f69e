#pragma once

#include <array>
#include <cstdint>
#include <optional>

#include "effect/host_context.h"
#include "platform/tesselui/drawbot.h"

namespace kelp::analysis::effect {

inline constexpr int kTrackHues = 12;
inline constexpr double kSelectedHue = 60;  // yellow, which no other track has

// Which of the hues a track has: a number drawn from a generator that the id times 9301 seeds, so
// that it is the same in every frame, render and process. The generator is the minimal standard one
// (Park, Miller and Stockmeyer, 1993): its output is fixed by the language's standard, and its seed
// costs nothing, with thousands of them a frame.
int TrackHueNumber(std::int32_t id);
// Degrees, 0 to 360 without (30, 90].
double TrackHue(int number);

// How one point is drawn.
struct TrackColors {
  tesselui::drawbot::Color line, fill;
};

// The colours of a drawing, through the host's colour utility, which is asked once for each hue. On
// the thread of the call; throws the host's code.
class TrackPalette {
 public:
  explicit TrackPalette(const kelp::effect::HostContext& context) : context_(context) {}
  TrackColors ColorsOf(std::int32_t id, bool selected, bool hovered);

 private:
  const tesselui::drawbot::Color& LineColor(std::size_t which);

  const kelp::effect::HostContext& context_;
  std::array<std::optional<tesselui::drawbot::Color>, kTrackHues + 1> lines_;  // selected: last
};

}  // namespace kelp::analysis::effect
