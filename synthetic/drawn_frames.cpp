#include "synthetic/drawn_frames.h"

namespace synthetic {

std::size_t scene_frame_source::width() const {
  return static_cast<std::size_t>(world_.options().width);
}

std::size_t scene_frame_source::height() const {
  return static_cast<std::size_t>(world_.options().height);
}

std::size_t scene_frame_source::frame_count() const {
  return static_cast<std::size_t>(world_.options().frame_count);
}

marrow::tracking::ArgbFrame scene_frame_source::fetch(std::size_t frame_index) {
  if (pixels_.empty() || drawn_frame_ != frame_index) {
    pixels_.resize(width() * height());
    world_.render(static_cast<int>(frame_index), pixels_.data(), width());
    drawn_frame_ = frame_index;
  }
  return {reinterpret_cast<const std::uint8_t*>(pixels_.data()),
          static_cast<std::ptrdiff_t>(width() * sizeof(HX_Pixel8)), width(), height()};
}

void scene_frame_source::LoadLuma(std::size_t frame_index, std::uint8_t* destination) {
  marrow::tracking::LumaFromArgb(fetch(frame_index), destination);
}

void scene_frame_source::LoadMask(std::size_t frame_index, std::uint8_t* destination) {
  marrow::tracking::MaskFromArgb(fetch(frame_index), destination);
}

void scene_frame_source::LoadColor(std::size_t frame_index, float* destination) {
  marrow::tracking::ColorFromArgb(fetch(frame_index), destination);
}

}  // namespace synthetic
