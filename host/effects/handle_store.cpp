#include "host/effects/handle_store.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <new>
#include <utility>

#include "host/base/operations.h"

namespace calmframe::host {
namespace {

// Zeroed; null without memory.
std::unique_ptr<std::uint8_t[]> NewBytes(std::uint64_t size) {
  if (size > static_cast<std::uint64_t>(std::numeric_limits<std::ptrdiff_t>::max())) return nullptr;
  return std::unique_ptr<std::uint8_t[]>(new (
      std::nothrow) std::uint8_t[static_cast<std::size_t>(std::max<std::uint64_t>(size, 1))]());
}

}  // namespace

HandleStore::Block* HandleStore::Find(HX_Handle handle, const char* operation) {
  const auto found = blocks_.find(reinterpret_cast<std::uintptr_t>(handle));
  if (found != blocks_.end()) return &found->second;
  Ledger::Get().Mistake(operation, ": unknown handle");
  return nullptr;
}

HX_Handle HandleStore::New(std::uint64_t size) {
  std::unique_ptr<std::uint8_t[]> bytes = NewBytes(size);
  if (!bytes) return nullptr;
  std::lock_guard lock(mutex_);
  blocks_.emplace(++last_, Block{std::move(bytes), size, 0});
  return reinterpret_cast<HX_Handle>(last_);
}

void* HandleStore::Lock(HX_Handle handle) {
  std::lock_guard lock(mutex_);
  Block* block = Find(handle, "lock_handle");
  if (!block) return nullptr;
  ++block->locks;
  return block->bytes.get();
}

void HandleStore::Unlock(HX_Handle handle) {
  std::lock_guard lock(mutex_);
  Block* block = Find(handle, "unlock_handle");
  if (!block) return;
  if (block->locks == 0) {
    Ledger::Get().Mistake("unlock_handle: not locked");
    return;
  }
  if (--block->locks > 0 || !moves_) return;
  std::unique_ptr<std::uint8_t[]> moved = NewBytes(block->size);
  if (!moved) return;
  std::memcpy(moved.get(), block->bytes.get(), static_cast<std::size_t>(block->size));
  block->bytes = std::move(moved);
}

void HandleStore::Dispose(HX_Handle handle) {
  std::lock_guard lock(mutex_);
  Block* block = Find(handle, "dispose_handle");
  if (!block) return;
  if (block->locks != 0) Ledger::Get().Mistake("dispose_handle: locked");
  blocks_.erase(reinterpret_cast<std::uintptr_t>(handle));
}

HX_Err HandleStore::Resize(HX_Handle handle, std::uint64_t size) {
  std::unique_ptr<std::uint8_t[]> bytes = NewBytes(size);
  if (!bytes) return HX_ERR_MEMORY;
  std::lock_guard lock(mutex_);
  Block* block = Find(handle, "resize_handle");
  if (!block) return HX_ERR_UNKNOWN;
  if (block->locks != 0) {
    Ledger::Get().Mistake("resize_handle: locked");
    return HX_ERR_UNKNOWN;
  }
  std::memcpy(bytes.get(), block->bytes.get(),
              static_cast<std::size_t>(std::min(size, block->size)));
  block->bytes = std::move(bytes);
  block->size = size;
  return HX_ERR_NONE;
}

std::uint64_t HandleStore::Size(HX_Handle handle) {
  std::lock_guard lock(mutex_);
  const Block* block = Find(handle, "handle_size");
  return block ? block->size : 0;
}

HX_Handle HandleStore::NewFrom(const std::vector<std::uint8_t>& bytes) {
  const HX_Handle handle = New(bytes.size());
  if (!handle) throw std::bad_alloc();
  if (!bytes.empty()) std::memcpy(Lock(handle), bytes.data(), bytes.size());
  if (!bytes.empty()) Unlock(handle);
  return handle;
}

std::vector<std::uint8_t> HandleStore::BytesOf(HX_Handle handle) {
  std::lock_guard lock(mutex_);
  const Block* block = Find(handle, "save");
  if (!block) return {};
  return {block->bytes.get(), block->bytes.get() + block->size};
}

std::size_t HandleStore::count() const {
  std::lock_guard lock(mutex_);
  return blocks_.size();
}

std::size_t HandleStore::locks() const {
  std::lock_guard lock(mutex_);
  std::size_t locks = 0;
  for (const auto& [handle, block] : blocks_) locks += static_cast<std::size_t>(block.locks);
  return locks;
}

}  // namespace calmframe::host
