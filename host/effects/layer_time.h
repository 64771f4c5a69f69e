#pragma once

#include <cstdint>

#include "host/timeline/layer.h"

namespace calmframe::host {

// A layer's own time, as HX_InData tells it: 32-bit counts of 1/scale s, 0 at the layer's first
// frame. Exact, to the fields of an interlaced layer, where the rate is a ratio of small numbers;
// else instants are rounded up to the next count, so that an instant never lies before the frame
// that it stands for.
class LayerTime {
 public:
  explicit LayerTime(const LayerState& layer);

  std::uint32_t scale() const { return scale_; }
  std::int32_t step() const { return step_; }  // of one frame; at least 1
  std::int32_t total() const { return OfFrame(length_); }
  // Of the layer, or of its frame's second field, half a frame later; limited to 32 bits.
  std::int32_t OfFrame(std::int64_t frame, bool second_field = false) const;
  // Media time of an instant of the layer, in ticks. The scale may be another; above 0.
  std::int64_t MediaTicks(std::int64_t time, std::uint32_t scale) const;

 private:
  std::int64_t ticks_per_frame_;
  std::int32_t start_frame_, length_;
  std::uint32_t scale_ = 1;
  std::int32_t step_ = 1;
};

}  // namespace calmframe::host
