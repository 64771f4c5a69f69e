#include "host/effects/opaque_store.h"

#include "host/base/operations.h"

namespace calmframe::host {

void* OpaqueStore::Find(std::uint64_t reference) {
  std::lock_guard lock(mutex_);
  const auto found = entries_.find(reference);
  if (found == entries_.end()) return nullptr;
  ++found->second.uses;
  return found->second.block;
}

void* OpaqueStore::Set(std::uint64_t reference, void* block) {
  std::lock_guard lock(mutex_);
  Entry& entry = entries_[reference];
  if (entry.uses == 0) entry.block = block;
  ++entry.uses;
  return entry.block;
}

bool OpaqueStore::Release(std::uint64_t reference) {
  std::lock_guard lock(mutex_);
  const auto found = entries_.find(reference);
  if (found == entries_.end()) {
    Ledger::Get().Mistake("Opaque Effect Data.Release: nothing is held");
    return false;
  }
  if (--found->second.uses > 0) return false;
  entries_.erase(found);
  return true;
}

void* OpaqueStore::Peek(std::uint64_t reference) const {
  std::lock_guard lock(mutex_);
  const auto found = entries_.find(reference);
  return found == entries_.end() ? nullptr : found->second.block;
}

std::size_t OpaqueStore::uses() const {
  std::lock_guard lock(mutex_);
  std::size_t uses = 0;
  for (const auto& [reference, entry] : entries_) uses += entry.uses;
  return uses;
}

}  // namespace calmframe::host
