#include "stabilization/stabilizer_global.h"

namespace marrow::stabilization {

void FillStabilizerGlobal(stabilizer_global& global, std::uint64_t feature_count,
                          std::uint64_t frame_count, const AllFeatures& all_features,
                          float x_scale) {
  global.feature_count = feature_count;
  global.frame_count = frame_count;
  const std::size_t cells = feature_count * frame_count;
  global.input.resize(cells);
  global.output.assign(cells, track_sample{0.0f, 0.0f, -1, 0.0f});
  std::vector<tracking::tracking_feature<float>> row(feature_count);
  for (std::size_t f = 0; f < frame_count; ++f) {
    all_features.ReadRow(f, row.data());
    track_sample* sample = global.input.data() + f * feature_count;
    for (const auto& cell : row)
      *sample++ = {cell.x * x_scale, cell.y, cell.status, cell.correlation};
  }
}

}  // namespace marrow::stabilization
