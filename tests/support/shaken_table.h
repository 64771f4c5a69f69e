#pragma once

#include <cmath>
#include <cstdint>

#include "tracking/track_store.h"

// Tracks of a rigid scene of 640 x 360 shaken in both directions, all alive throughout.
inline marrow::tracking::AllFeatures ShakenTable(std::int32_t frames, std::int32_t slots) {
  marrow::tracking::AllFeatures table;
  table.feature_count = slots;
  table.frame_count = frames;
  for (std::int32_t f = 0; f < frames; ++f) {
    for (std::int32_t s = 0; s < slots; ++s) {
      table.features->push_back({static_cast<float>(20 + (s * 37) % 600 + 4 * std::sin(1.7 * f)),
                                 static_cast<float>(20 + (s * 53) % 320 + 3 * std::cos(2.3 * f)),
                                 f == 0 ? 1 : 0, 1.0f});
    }
  }
  return table;
}
