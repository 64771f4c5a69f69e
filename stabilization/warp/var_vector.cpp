#include "stabilization/warp/var_vector.h"

#include <algorithm>
#include <cmath>
#include <stdexcept>

#include "platform/memory/packed_grid.h"

namespace marrow::stabilization {
namespace {

constexpr float kStepsPerPixel = 256.0f;
constexpr float kStep = 0.00390625f;

// Calls visit(i, predicted) for each vertex in order, i the index of its x.
template <class Visit>
void for_each_prediction(const std::array<point2, 4>& corners, std::int32_t cols, std::int32_t rows,
                         Visit visit) {
  const matrix3 plane = square_to_quad(corners[0], corners[1], corners[2], corners[3]);
  std::size_t i = 0;
  for (std::int32_t r = 0; r < rows; ++r) {
    const double v = static_cast<double>(r) / (rows - 1);
    for (std::int32_t c = 0; c < cols; ++c, i += 2) {
      visit(i, transform(plane, {static_cast<double>(c) / (cols - 1), v}));
    }
  }
}

std::int32_t steps(double offset) {
  // The largest float below 2^31: beyond it the conversion is undefined. fmin and fmax would turn
  // a NaN into a bound.
  constexpr float kMost = 2147483520.0f;
  const float scaled = static_cast<float>(offset) * kStepsPerPixel;
  if (std::isnan(scaled)) return 0;
  return static_cast<std::int32_t>(std::round(std::clamp(scaled, -kMost, kMost)));
}

}  // namespace

quantised_warp quantise(const VarVector& record) {
  const std::int32_t right = record.cols - 1, bottom = record.rows - 1;
  quantised_warp quantised;
  quantised.corners = {record.vertex(0, 0), record.vertex(right, 0), record.vertex(0, bottom),
                       record.vertex(right, bottom)};
  quantised.offsets.resize(record.values.size());
  for_each_prediction(quantised.corners, record.cols, record.rows,
                      [&](std::size_t i, point2 predicted) {
                        quantised.offsets[i] = steps(record.values[i] - predicted.x);
                        quantised.offsets[i + 1] = steps(record.values[i + 1] - predicted.y);
                      });
  return quantised;
}

VarVector rebuild(const quantised_warp& quantised, std::int32_t cols, std::int32_t rows) {
  VarVector record(cols, rows);
  for_each_prediction(quantised.corners, cols, rows, [&](std::size_t i, point2 predicted) {
    const float dx = static_cast<float>(quantised.offsets[i]) * kStep;
    const float dy = static_cast<float>(quantised.offsets[i + 1]) * kStep;
    record.values[i] = static_cast<double>(dx) + predicted.x;
    record.values[i + 1] = static_cast<double>(dy) + predicted.y;
  });
  const std::size_t row = 2 * static_cast<std::size_t>(cols);
  const std::size_t first_of_last_row = row * static_cast<std::size_t>(rows - 1);
  const std::size_t at[4] = {0, row - 2, first_of_last_row, first_of_last_row + row - 2};
  for (std::size_t k = 0; k < 4; ++k) {
    record.values[at[k]] = quantised.corners[k].x;
    record.values[at[k] + 1] = quantised.corners[k].y;
  }
  return record;
}

packed_warp pack(const quantised_warp& quantised, std::int32_t cols) {
  packed_warp packed{quantised.corners, {}};
  memory::PackGrid(quantised.offsets, static_cast<std::size_t>(cols), packed.offsets);
  packed.offsets.shrink_to_fit();
  return packed;
}

quantised_warp unpack(const packed_warp& packed, std::int32_t cols, std::int32_t rows) {
  quantised_warp quantised;
  quantised.corners = packed.corners;
  quantised.offsets.resize(2 * static_cast<std::size_t>(cols) * static_cast<std::size_t>(rows));
  if (!memory::UnpackGrid(packed.offsets, static_cast<std::size_t>(cols), quantised.offsets)) {
    throw std::invalid_argument("a packed warp's bytes are none");
  }
  return quantised;
}

}  // namespace marrow::stabilization
