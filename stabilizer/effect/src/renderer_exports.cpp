#include <cstddef>
#include <cstdint>
#include <mutex>
#include <shared_mutex>

#include "platform/hx/hx_exports.h"
#include "stabilizer/effect/src/shared_data.h"

// What a renderer outside the plug-in calls; see platform/hx/hx_exports.h. Each reads under the
// block's lock.

using kelp::effect::StabilizerSharedData;
using marrow::stabilization::VarVector;

// HX_VarVector is how a VarVector lies in memory: a vector begins with its data's address.
static_assert(sizeof(HX_VarVector) == sizeof(VarVector) &&
              offsetof(HX_VarVector, columns) == offsetof(VarVector, cols) &&
              offsetof(HX_VarVector, rows) == offsetof(VarVector, rows));

namespace {

// Calls read(contents) under the lock; `otherwise` without a block, and where nothing is published.
template <class Result, class Read>
Result ReadBlock(const void* block, Result otherwise, const Read& read) {
  if (!block) return otherwise;
  const auto& shared = *static_cast<const StabilizerSharedData*>(block);
  const std::shared_lock<std::shared_mutex> lock(shared.lock);
  if (!shared.contents.result) return otherwise;
  return read(shared.contents);
}

using Contents = StabilizerSharedData::Contents;

}  // namespace

extern "C" {

std::uint8_t allowCUDARendering(const void* block) {
  return ReadBlock(block, std::uint8_t{0},
                   [](const Contents& shared) { return std::uint8_t{shared.gpu_allowed}; });
}

// A warp is never written, and a new solve brings new ones. The thread's hold is what makes the
// address good once the lock is gone and the warper with it.
const HX_VarVector* getOVVarVector(const void* block, std::int32_t frame) {
  thread_local boost::shared_ptr<const VarVector> held;
  held = ReadBlock(block, boost::shared_ptr<const VarVector>(), [frame](const Contents& shared) {
    const auto& warper = shared.solve_result->warper;
    return warper ? warper->frameWarp(static_cast<std::size_t>(frame))
                  : boost::shared_ptr<const VarVector>();
  });
  return reinterpret_cast<const HX_VarVector*>(held.get());
}

void getCropWindow(const void* block, std::int32_t frame, float* left, float* top, float* right,
                   float* bottom) {
  ReadBlock(block, false, [&](const Contents& shared) {
    const auto& crop = shared.solve_result->crop;
    if (!crop || crop->rects.empty()) return false;
    const crop_rect& rect = crop->rects[static_cast<std::size_t>(frame)];
    *left = rect.left;
    *top = rect.top;
    *right = rect.right;
    *bottom = rect.bottom;
    return true;
  });
}

std::uint8_t getStabilizerData(const void* block, std::int32_t* frame_count,
                               std::int32_t* first_frame, std::int32_t* grid_columns,
                               std::int32_t* grid_rows, std::int32_t* crop_width,
                               std::int32_t* crop_height, float* min_x, float* min_y, float* max_x,
                               float* max_y, std::int32_t* source_width,
                               std::int32_t* source_height) {
  return ReadBlock(block, std::uint8_t{0}, [&](const Contents& shared) {
    const auto& warper = shared.solve_result->warper;
    const auto& crop = shared.solve_result->crop;
    if (!warper) return std::uint8_t{0};
    const auto& bounds = warper->unionBounds();
    *frame_count = static_cast<std::int32_t>(warper->frameWarpCount());
    *first_frame = shared.result->all_features.first_frame;
    *grid_columns = warper->gridCols();
    *grid_rows = warper->gridRows();
    if (crop) {
      *crop_width = crop->cropWidth;
      *crop_height = crop->cropHeight;
    }
    *min_x = static_cast<float>(bounds.min_x);
    *min_y = static_cast<float>(bounds.min_y);
    *max_x = static_cast<float>(bounds.max_x);
    *max_y = static_cast<float>(bounds.max_y);
    *source_width = shared.source.width;
    *source_height = shared.source.height;
    return std::uint8_t{1};
  });
}

}  // extern "C"
