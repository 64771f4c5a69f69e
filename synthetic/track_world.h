#pragma once

#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <vector>

#include "stabilization/stabilizer_global.h"
#include "synthetic/camera_path.h"
#include "tracking/track_store.h"

namespace synthetic {

enum class track_scene {
  depth,        // points 5 to 25 m away
  planar,       // points on one tilted plane, about 12 m away
  translation,  // the image shifts, no more
  similarity,   // the image shifts, turns and scales about its middle
  still         // nothing moves; the path and its jitter are left out
};

// Frames in which no slot holds a feature: [first, end).
struct frame_range {
  int first = 0;
  int end = 0;
};

struct track_world_options {
  int frame_count = 300;
  int slots = 500;
  int width = 1920;
  int height = 1080;
  double focal = 1500.0;  // pixels

  track_scene scene = track_scene::depth;
  double gain = 1.0;              // of the intended motion, see jittered_path
  double rotation_jitter = 2e-3;  // radians
  double translation_jitter = 0.01;

  // Mean of the geometric life of a track, in frames; infinity: it ends at the frame's edge only.
  double mean_life = 60.0;
  // Every track is seen in all frames (of the stretch between two holes): points that would leave
  // the frame are not taken, and mean_life is not looked at. Points that meet the occluder are not
  // taken either.
  bool whole_clip = false;

  double noise = 0.1;          // deviation of each coordinate, pixels
  double outlier_share = 0.0;  // part of the tracks that drift off the scene, 0 to 1
  bool occluder = false;       // a bar that crosses the frame once; tracks end where it covers them
  frame_range hole = {};
  // Time from a frame's first row to its last, as a fraction of the time between frames.
  double readout = 0.0;
  std::uint64_t seed = 1;
};

// Tracks of a known scene under a known camera. In each frame every empty slot takes a random pixel
// of the frame, at least 17 pixels inside, with a random depth; the point lives on until its life
// is over or it comes within 16 pixels of the edge, and the slot is filled again in that same
// frame.
struct track_world {
  marrow::tracking::AllFeatures
      features;  // positions with noise; correlation is 0 on seeds, else 1
  boost::shared_ptr<marrow::stabilization::stabilizer_global> global;  // filled, x scale 1

  // For each cell of the table, pixels, without noise and without an outlier's drift; NaN where the
  // slot is empty.
  std::vector<point2> exact;     // under the shaken camera
  std::vector<point2> intended;  // the same point under the camera without jitter

  std::vector<std::uint8_t> outlier;  // for each cell: 1 on the tracks that drift

  std::size_t cell(std::size_t frame, std::size_t slot) const {
    return frame * static_cast<std::size_t>(features.feature_count) + slot;
  }
};

// The same options give the same world. Throws std::invalid_argument for a frame too small to hold
// a point 17 pixels inside, and std::runtime_error where whole_clip finds no points because the
// camera moves too far.
track_world make_track_world(const track_world_options& options);

}  // namespace synthetic
