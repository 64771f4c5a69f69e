#pragma once

#include <string>

namespace calmframe::media {

// What a clip's container says of its video, which its frames may break.
struct Glance {
  int width = 0, height = 0;  // as stored
  double frames = 0;          // 0: it doesn't say
};

// Costs as much as opening the file. Throws Failure (input) where that fails or there is no video.
Glance GlanceAt(const std::string& path);

}  // namespace calmframe::media
