#include "synthetic/film.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <utility>

namespace synthetic {
namespace {

template <class Change>
void change_values(HX_Pixel8& pixel, const Change& change) {
  const auto changed = [&change](std::uint8_t value, std::size_t channel) {
    return static_cast<std::uint8_t>(std::lround(std::clamp(change(value, channel), 0.0, 255.0)));
  };
  pixel = {pixel.alpha, changed(pixel.red, 0), changed(pixel.green, 1), changed(pixel.blue, 2)};
}

}  // namespace

film::film(std::vector<film_shot> shots, std::vector<film_light> lights)
    : shots_(std::move(shots)), lights_(std::move(lights)) {
  for (const film_shot& shot : shots_) {
    starts_.push_back(frame_count_ + shot.mixed);
    frame_count_ += shot.mixed + shot.frames;
  }
}

std::vector<HX_Pixel8> film::render(int frame) const {
  // The shot that is seen, or that comes up.
  std::size_t i = 0;
  while (i + 1 < shots_.size() && frame >= starts_[i + 1] - shots_[i + 1].mixed) ++i;
  const auto seen = [&](std::size_t k) {
    const film_shot& shot = shots_[k];
    return shot.world->render(shot.first + shot.mixed + frame - starts_[k]);
  };
  std::vector<HX_Pixel8> pixels = seen(i);
  if (frame < starts_[i]) {
    const film_shot& shot = shots_[i];
    const double part = (frame - (starts_[i] - shot.mixed) + 1.0) / (shot.mixed + 1);
    const double of_this = shot.through_black ? std::max(0.0, 2 * part - 1) : part;
    const double of_other = shot.through_black ? std::max(0.0, 1 - 2 * part) : 1 - part;
    const std::vector<HX_Pixel8> other =
        i > 0 ? seen(i - 1) : std::vector<HX_Pixel8>(pixels.size(), HX_Pixel8{255, 0, 0, 0});
    for (std::size_t p = 0; p < pixels.size(); ++p) {
      const std::uint8_t values[] = {other[p].red, other[p].green, other[p].blue};
      change_values(pixels[p], [&](double value, std::size_t channel) {
        return of_this * value + of_other * values[channel];
      });
    }
  }
  for (const film_light& light : lights_) {
    if (frame < light.first || frame >= light.first + light.frames) continue;
    for (HX_Pixel8& pixel : pixels) {
      change_values(pixel,
                    [&](double value, std::size_t) { return light.gain * value + light.lift; });
    }
  }
  return pixels;
}

}  // namespace synthetic
