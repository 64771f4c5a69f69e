#include "host/media/glance.h"

#include <algorithm>

#include "host/media/decoder.h"

namespace calmframe::media {

Glance GlanceAt(const std::string& path) {
  const InputPtr container = OpenInput(path);
  const AVStream& stream = VideoStreamOf(*container, path);
  Glance glance{stream.codecpar->width, stream.codecpar->height,
                static_cast<double>(stream.nb_frames)};
  if (glance.frames <= 0 && container->duration > 0 && stream.avg_frame_rate.den > 0) {
    glance.frames =
        static_cast<double>(container->duration) / AV_TIME_BASE * av_q2d(stream.avg_frame_rate);
  }
  glance.frames = std::max(glance.frames, 0.0);
  return glance;
}

}  // namespace calmframe::media
