#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "tracking/track_store.h"

namespace marrow::stabilization {

using tracking::AllFeatures;
using tracking::Trajectory;

// A track's position on one frame, in square pixels. status in `input`: above 0 on the first sample
// of a track, 0 on its further ones, negative where there is none. In `output`: -1 until a solve
// writes the sample, then 1 on a track's first sample in that solve and 0 on the others. error: in
// `input` the tracker's correlation, in `output` the sample's reprojection error in pixels.
struct track_sample {
  float x;
  float y;
  std::int32_t status;
  float error;
};

// The working store of one solve. Both arrays are frame-major, frame_count x feature_count.
struct stabilizer_global {
  std::uint64_t feature_count = 0;
  std::uint64_t frame_count = 0;
  std::vector<track_sample> input;
  std::vector<Trajectory> trajectories;  // ordered by first, then by feature
  std::vector<track_sample> output;      // the stabilized positions
  std::string file_name;                 // where the tracks came from; in log lines only

  const track_sample& input_at(std::size_t frame, std::size_t feature) const {
    return input[frame * feature_count + feature];
  }
  const track_sample& output_at(std::size_t frame, std::size_t feature) const {
    return output[frame * feature_count + feature];
  }
  track_sample& output_at(std::size_t frame, std::size_t feature) {
    return output[frame * feature_count + feature];
  }
};

// Sizes input and output and copies the cells into input, row by row, with every x multiplied by
// x_scale (dead cells too). output is all zero but status -1.
void FillStabilizerGlobal(stabilizer_global& global, std::uint64_t feature_count,
                          std::uint64_t frame_count, const AllFeatures& all_features,
                          float x_scale);

}  // namespace marrow::stabilization
