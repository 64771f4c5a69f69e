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
  const auto& source = *all_features.features;
  for (std::size_t i = 0; i < cells; ++i) {
    global.input[i] = {source[i].x * x_scale, source[i].y, source[i].status, source[i].correlation};
  }
}

}  // namespace marrow::stabilization
