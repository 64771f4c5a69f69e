#pragma once

#include <vector>

#include "platform/hx/hx_pixel.h"
#include "synthetic/scene.h"

namespace synthetic {

// A shot of a film: frames of a scene, which must outlive the film.
struct film_shot {
  const scene* world = nullptr;
  int first = 0;   // the scene's frame that it begins with
  int frames = 1;  // in which it alone is seen
  // Frames before these in which it comes up while the shot before goes down, as both go on. 0: a
  // cut. Of n frames the k-th, from 1, has k / (n + 1) of this shot, or with `through_black` |1 -
  // 2k / (n + 1)| of the shot before or this one, and of black the rest.
  int mixed = 0;
  bool through_black = false;
};

// A change of light: values are multiplied and then raised, up to 255.
struct film_light {
  int first = 0;  // of the film
  int frames = 1;
  double gain = 2;
  double lift = 0;  // 255ths
};

// Shots one behind the other, as an editor joins them. All scenes are of one size.
class film {
 public:
  explicit film(std::vector<film_shot> shots, std::vector<film_light> lights = {});

  int frame_count() const { return frame_count_; }
  // Opaque pixels in rows without a gap. `frame`: 0 to frame_count() - 1.
  std::vector<HX_Pixel8> render(int frame) const;

 private:
  std::vector<film_shot> shots_;
  std::vector<film_light> lights_;
  std::vector<int> starts_;  // where each shot alone begins
  int frame_count_ = 0;
};

}  // namespace synthetic
