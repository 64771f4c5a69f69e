#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <unordered_map>
#include <vector>

#include "platform/hx/hx_types.h"

namespace calmframe::host {

// The host's relocatable blocks (HX_Callbacks). Handles are never given twice, so that one that is
// no more is noticed; what is done to such a handle is a mistake in the Ledger and changes nothing.
// Blocks are aligned for any type. Any thread.
class HandleStore {
 public:
  HX_Handle New(std::uint64_t size);  // zeroed; null without memory
  void* Lock(HX_Handle handle);       // null for an unknown one
  void Unlock(HX_Handle handle);
  void Dispose(HX_Handle handle);
  HX_Err Resize(HX_Handle handle, std::uint64_t size);
  std::uint64_t Size(HX_Handle handle);

  // For the host itself.
  HX_Handle NewFrom(const std::vector<std::uint8_t>& bytes);
  std::vector<std::uint8_t> BytesOf(HX_Handle handle);
  std::size_t count() const;
  std::size_t locks() const;

  // From now on a block moves whenever its last lock goes, so that pointers that were kept are
  // found out.
  void MoveOnUnlock(bool moves) { moves_ = moves; }

 private:
  struct Block {
    std::unique_ptr<std::uint8_t[]> bytes;
    std::uint64_t size = 0;
    int locks = 0;
  };
  using Blocks = std::unordered_map<std::uintptr_t, Block>;

  // With mutex_ held; null, and a mistake noted, for an unknown handle.
  Block* Find(HX_Handle handle, const char* operation);

  std::atomic<bool> moves_{false};
  mutable std::mutex mutex_;
  Blocks blocks_;            // guarded by mutex_
  std::uintptr_t last_ = 0;  // guarded by mutex_
};

}  // namespace calmframe::host
