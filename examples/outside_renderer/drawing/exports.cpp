#include "examples/outside_renderer/drawing/exports.h"

#include <dlfcn.h>

#include <stdexcept>
#include <type_traits>

namespace outside {
namespace {

bool ReadData(const Exports& exports, const void* block, SolvedFrame& f) {
  return exports.get_data(block, &f.frame_count, &f.first_frame, &f.columns, &f.rows, &f.crop_width,
                          &f.crop_height, &f.min_x, &f.min_y, &f.max_x, &f.max_y, &f.source_width,
                          &f.source_height) != 0;
}

bool SameSolve(const SolvedFrame& a, const SolvedFrame& b) {
  return a.frame_count == b.frame_count && a.first_frame == b.first_frame &&
         a.columns == b.columns && a.rows == b.rows && a.crop_width == b.crop_width &&
         a.crop_height == b.crop_height && a.min_x == b.min_x && a.min_y == b.min_y &&
         a.max_x == b.max_x && a.max_y == b.max_y && a.source_width == b.source_width &&
         a.source_height == b.source_height;
}

}  // namespace

void Exports::Close::operator()(void* library) const {
  dlclose(library);
}

Exports::Exports(const std::string& plugin)
    : library_(dlopen(plugin.c_str(), RTLD_NOW | RTLD_NOLOAD)) {
  if (!library_) throw std::runtime_error(plugin + " is not loaded");
  const auto find = [&](auto& function, const char* name) {
    void* const address = dlsym(library_.get(), name);
    if (!address) throw std::runtime_error(plugin + " has no " + name);
    function = reinterpret_cast<std::remove_reference_t<decltype(function)>>(address);
  };
  find(allow_rendering, HX_EXPORT_ALLOW_CUDA_RENDERING);
  find(get_warp, HX_EXPORT_GET_VAR_VECTOR);
  find(get_crop_window, HX_EXPORT_GET_CROP_WINDOW);
  find(get_data, HX_EXPORT_GET_STABILIZER_DATA);
}

// Each export has the lock for itself alone, so a solve may come between two of them. Then what
// they tell does not belong together, and the effect has asked for a render anew.
bool ReadFrame(const Exports& exports, const void* block, std::int32_t layer_frame,
               std::int32_t start_frame, SolvedFrame& frame) {
  frame = {};
  if (!exports.allow_rendering(block) || !ReadData(exports, block, frame)) return false;
  const std::int32_t row = layer_frame + start_frame - frame.first_frame;
  if (row < 0 || row >= frame.frame_count) return false;
  frame.warp = exports.get_warp(block, row);
  exports.get_crop_window(block, row, &frame.left, &frame.top, &frame.right, &frame.bottom);
  SolvedFrame after;
  return frame.warp && ReadData(exports, block, after) && SameSolve(frame, after) &&
         exports.allow_rendering(block);
}

}  // namespace outside
