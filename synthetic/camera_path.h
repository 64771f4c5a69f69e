#pragma once

#include <cstdint>
#include <functional>
#include <vector>

#include "synthetic/camera.h"

namespace synthetic {

// A camera's motion as a function of time, in frames from the first one; time may lie between
// frames and beyond the clip. Deterministic, and safe to read from several threads.
struct camera_path {
  std::function<camera_pose(double)> shaken;    // what the camera did
  std::function<camera_pose(double)> intended;  // the same without the shake
};

// Pan, tilt, roll and travel by slow sinusoids, with white jitter from frame to frame:
//   rotation g (.10 sin(2 pi t / 400), .20 sin(2 pi t / 600 + .3), .03 sin(2 pi t / 500)),
//   centre g (2 sin(2 pi t / 700), .4 sin(2 pi t / 450), .004 t).
struct jittered_path_options {
  double gain = 1.0;                 // g
  double rotation_jitter = 2e-3;     // deviation for each axis, radians
  double translation_jitter = 0.01;  // likewise, metres
  std::uint64_t seed = 1;
};

// Jitter is linear between frames, and nought on frame 0 and before.
camera_path jittered_path(int frame_count, const jittered_path_options& options);

// Somebody walking forward with a camera held in the hand.
struct handheld_path_options {
  double frame_rate = 30.0;         // frames a second: turns the shake's spectrum into frames
  double speed = 1.1;               // forward, metres a second
  double eye_height = 1.6;          // above y = 0 (y points down, so the centre has y = -1.6)
  double pan = 0.10;                // amplitude of the slow look from side to side, radians
  double shake_rotation = 0.010;    // deviation of pitch and yaw, radians; half of it for roll
  double shake_translation = 0.02;  // deviation for each axis, metres
  std::uint64_t seed = 1;
};

// The shake is band-limited, 0.8 to 9 Hz with a 1/f amplitude: most of its power at the pace of
// steps, a little tremor on top.
camera_path handheld_path(const handheld_path_options& options);

// The path with quick turns to the right: from each of `starts` on, in frames, within `frames` and
// by `angle` radians, slowly at its start and end (the cubic 3 u^2 - 2 u^3).
camera_path with_whip_pans(const camera_path& path, const std::vector<int>& starts, double frames,
                           double angle);

// No motion at all, at the given pose.
camera_path resting_path(const camera_pose& pose);

}  // namespace synthetic
