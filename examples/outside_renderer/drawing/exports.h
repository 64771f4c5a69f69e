#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "platform/hx/hx_exports.h"

namespace outside {

// All that this renderer knows of the plug-in. Any thread.
class Exports {
 public:
  // Of a library that the process has loaded already, which stays as long as this. Throws
  // std::runtime_error, one line.
  explicit Exports(const std::string& plugin);

  HX_AllowCUDARendering allow_rendering = nullptr;
  HX_GetOVVarVector get_warp = nullptr;
  HX_GetCropWindow get_crop_window = nullptr;
  HX_GetStabilizerData get_data = nullptr;

 private:
  struct Close {
    void operator()(void* library) const;
  };
  std::unique_ptr<void, Close> library_;
};

// One frame of a solve. Lengths are in pixels of the analysed frame, but for the source's size.
struct SolvedFrame {
  std::int32_t frame_count = 0, first_frame = 0;
  std::int32_t columns = 0, rows = 0;
  std::int32_t crop_width = 0, crop_height = 0;  // 0 without a crop
  float min_x = 0, min_y = 0, max_x = 0, max_y = 0;
  std::int32_t source_width = 0, source_height = 0;
  float left = 0, top = 0, right = 0, bottom = 0;  // of the crop window; 0 without a crop
  const HX_VarVector* warp = nullptr;              // until this thread reads its next frame
};

// The frame, counted on the layer, whose in-point is the source's frame start_frame, below 0 where
// the layer begins before its media; false where the plug-in's own picture has to be taken. The
// block must stay during the call.
bool ReadFrame(const Exports& exports, const void* block, std::int32_t layer_frame,
               std::int32_t start_frame, SolvedFrame& frame);

}  // namespace outside
