#pragma once

#include <cstdint>

// What the probe plug-in and its tests both know.
namespace probe {

// Indices of its parameters; disk ids lie 100 above, but for the status.
enum : std::int32_t { kStart = 1, kStop, kAmount, kMode, kSwitch, kStatus, kParams };

// kMode: how a frame is drawn.
enum : std::int32_t {
  kPlain = 1,
  kGrown = 2,       // by kMargin on each side
  kNeighbours = 3,  // the frame before and the frame behind, averaged; planned renders alone
};
inline constexpr std::int32_t kMargin = 4;

// Ticks that its work takes after it was started.
inline constexpr std::int32_t kTicks = 6;

}  // namespace probe
