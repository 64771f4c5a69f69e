#pragma once

#include <atomic>
#include <cstddef>
#include <map>
#include <memory>
#include <mutex>

#include "host/pixels/world_buffer.h"

namespace calmframe::host {

// Frame buffers that plug-ins own (HX_WorldSuite2). Any thread.
class WorldStore {
 public:
  // HX_ERR_MEMORY when there is no memory, HX_ERR_UNKNOWN for an unknown format or a negative size.
  HX_Err New(int width, int height, bool clear, std::uint32_t format, HX_World* world);
  // Empties the record. A world that isn't held is a mistake in the Ledger.
  HX_Err Dispose(HX_World* world);
  std::size_t count() const;

  // Bytes behind each row of the worlds made from now on. Writing there is a mistake.
  void SetRowPadding(int bytes) { padding_ = bytes; }
  int row_padding() const { return padding_; }

 private:
  std::atomic<int> padding_{0};
  mutable std::mutex mutex_;
  std::map<const void*, std::unique_ptr<WorldBuffer>>
      worlds_;  // by their pixels; guarded by mutex_
};

}  // namespace calmframe::host
