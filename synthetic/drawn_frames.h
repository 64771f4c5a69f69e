#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "synthetic/scene.h"
#include "tracking/frame_preparation.h"
#include "tracking/frame_source.h"

namespace synthetic {

// A scene's frames as the tracking loop reads them. The frame that was asked for last is kept, so
// that each is drawn once. The scene must outlive the source.
class scene_frame_source final : public marrow::tracking::FrameSource {
 public:
  explicit scene_frame_source(const scene& world) : world_(world) {}

  std::size_t width() const override;
  std::size_t height() const override;
  std::size_t frame_count() const override;
  void LoadLuma(std::size_t frame_index, std::uint8_t* destination) override;
  void LoadMask(std::size_t frame_index, std::uint8_t* destination) override;
  void LoadColor(std::size_t frame_index, float* destination) override;

 private:
  marrow::tracking::ArgbFrame fetch(std::size_t frame_index);

  const scene& world_;
  std::vector<HX_Pixel8> pixels_;
  std::size_t drawn_frame_ = 0;  // meaningful once pixels_ holds a frame
};

}  // namespace synthetic
