#pragma once

#include <cstdint>

namespace marrow::render {

// The popup's values.
enum class Framing : std::int32_t {
  stabilize_only = 1,
  crop = 2,
  crop_auto_scale = 3,
  synthesize_edges = 4
};

inline bool crops(Framing framing) {
  return framing == Framing::crop || framing == Framing::crop_auto_scale;
}

}  // namespace marrow::render
