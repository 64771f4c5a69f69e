#include "synthetic/camera_path.h"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <utility>
#include <vector>

#include "synthetic/random.h"

namespace synthetic {
namespace {

using std::numbers::pi;

camera_pose sum(camera_pose a, const camera_pose& b) {
  for (std::size_t k = 0; k < 3; ++k) {
    a.rotation[k] += b.rotation[k];
    a.centre[k] += b.centre[k];
  }
  return a;
}

// A sum of sinusoids: random frequencies and phases, unit variance.
class band_limited_noise {
 public:
  band_limited_noise(double low_hertz, double high_hertz, random_stream& random) {
    double power = 0.0;
    for (term& t : terms_) {
      // Even in log frequency.
      const double hertz = low_hertz * std::pow(high_hertz / low_hertz, random.uniform());
      t = {2.0 * pi * hertz, random.uniform(0.0, 2.0 * pi), 1.0 / hertz};
      power += 0.5 * t.amplitude * t.amplitude;
    }
    for (term& t : terms_) t.amplitude /= std::sqrt(power);
  }

  double at(double seconds) const {
    double value = 0.0;
    for (const term& t : terms_) value += t.amplitude * std::sin(t.pulsation * seconds + t.phase);
    return value;
  }

 private:
  struct term {
    double pulsation;  // radians a second
    double phase;
    double amplitude;
  };
  std::array<term, 12> terms_{};
};

}  // namespace

camera_path jittered_path(int frame_count, const jittered_path_options& options) {
  const double g = options.gain;
  const auto intended = [g](double t) {
    return camera_pose{
        {g * 0.10 * std::sin(2 * pi * t / 400), g * 0.20 * std::sin(2 * pi * t / 600 + 0.3),
         g * 0.03 * std::sin(2 * pi * t / 500)},
        {g * 2.0 * std::sin(2 * pi * t / 700), g * 0.4 * std::sin(2 * pi * t / 450),
         g * 0.004 * t}};
  };
  // One frame more than the clip has: the last frame's rows are read after it begins.
  std::vector<camera_pose> jitter(static_cast<std::size_t>(std::max(frame_count, 1)) + 1);
  random_stream random(options.seed);
  for (std::size_t f = 1; f < jitter.size(); ++f) {
    for (double& r : jitter[f].rotation) r = options.rotation_jitter * random.normal();
    for (double& c : jitter[f].centre) c = options.translation_jitter * random.normal();
  }
  const auto shaken = [intended, jitter = std::move(jitter)](double t) {
    const double last = static_cast<double>(jitter.size() - 1);
    const double clamped = std::clamp(t, 0.0, last);
    const auto f = static_cast<std::size_t>(std::min(std::floor(clamped), last - 1));
    const double b = clamped - static_cast<double>(f);
    camera_pose pose = intended(t);
    for (std::size_t k = 0; k < 3; ++k) {
      pose.rotation[k] += (1 - b) * jitter[f].rotation[k] + b * jitter[f + 1].rotation[k];
      pose.centre[k] += (1 - b) * jitter[f].centre[k] + b * jitter[f + 1].centre[k];
    }
    return pose;
  };
  return {shaken, intended};
}

camera_path handheld_path(const handheld_path_options& options) {
  const auto intended = [o = options](double t) {
    const double s = t / o.frame_rate;
    return camera_pose{
        {0.25 * o.pan * std::sin(2 * pi * s / 11), o.pan * std::sin(2 * pi * s / 14), 0},
        {0.3 * std::sin(2 * pi * s / 9), -o.eye_height, o.speed * s}};
  };
  random_stream random(options.seed);
  std::vector<band_limited_noise> noise;
  for (int axis = 0; axis < 6; ++axis) noise.emplace_back(0.8, 9.0, random);
  const auto shaken = [intended, o = options, noise = std::move(noise)](double t) {
    const double s = t / o.frame_rate;
    const double r = o.shake_rotation;
    const double c = o.shake_translation;
    return sum(intended(t), {{r * noise[0].at(s), r * noise[1].at(s), 0.5 * r * noise[2].at(s)},
                             {c * noise[3].at(s), c * noise[4].at(s), c * noise[5].at(s)}});
  };
  return {shaken, intended};
}

camera_path with_whip_pans(const camera_path& path, const std::vector<int>& starts, double frames,
                           double angle) {
  const auto turned = [starts, frames, angle](const std::function<camera_pose(double)>& pose_at) {
    return [=](double t) {
      camera_pose pose = pose_at(t);
      for (const int start : starts) {
        const double u = std::clamp((t - start) / frames, 0.0, 1.0);
        // Rotation maps the world to the camera, so it is against the camera's turn.
        pose.rotation[1] -= angle * u * u * (3 - 2 * u);
      }
      return pose;
    };
  };
  return {turned(path.shaken), turned(path.intended)};
}

camera_path resting_path(const camera_pose& pose) {
  const auto rest = [pose](double) { return pose; };
  return {rest, rest};
}

}  // namespace synthetic
