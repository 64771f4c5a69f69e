#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <mutex>

#include "platform/hx/hx_types.h"

namespace calmframe::host {

// One pointer for each effect reference, with a count of its uses (HX_OpaqueEffectDataSuite1). Each
// operation is atomic. Any thread.
class OpaqueStore {
 public:
  // Null when there is none; else counts a use.
  void* Find(std::uint64_t reference);
  // Stores the block when there is none yet; counts a use of what stands, and answers it.
  void* Set(std::uint64_t reference, void* block);
  // Drops a use; true when it was the last, and the pointer is forgotten. False, and a mistake in
  // the Ledger, for an unknown reference.
  bool Release(std::uint64_t reference);
  // What an outside renderer is handed; counts nothing, so the block must be known to live.
  void* Peek(std::uint64_t reference) const;
  std::size_t uses() const;

 private:
  struct Entry {
    void* block = nullptr;
    std::size_t uses = 0;
  };
  mutable std::mutex mutex_;
  std::map<std::uint64_t, Entry> entries_;  // guarded by mutex_
};

}  // namespace calmframe::host
