#include "host/timeline/frame_cache.h"

namespace calmframe::host {

PicturePtr FrameCache::Find(const Guid& identifier) {
  std::lock_guard lock(mutex_);
  const auto found = entries_.find(identifier);
  if (found == entries_.end()) return nullptr;
  Entry& entry = found->second;
  if (entry.references == 0) unused_.splice(unused_.end(), unused_, entry.place);
  return entry.picture;
}

FrameCache::Entry& FrameCache::EntryOf(const Guid& identifier) {
  std::list<Guid> place = {identifier};
  const auto [at, made] = entries_.try_emplace(identifier);
  if (made) {
    at->second.place = place.begin();
    unused_.splice(unused_.end(), place);
  }
  return at->second;
}

PicturePtr FrameCache::Insert(const Guid& identifier, const PicturePtr& picture) {
  Entries dropped;
  std::lock_guard lock(mutex_);
  Entry& entry = EntryOf(identifier);
  if (entry.picture) return entry.picture;
  entry.picture = picture;
  bytes_ += picture->bytes();
  dropped = Trim();
  return picture;
}

void FrameCache::Reference(const Guid& identifier) {
  std::lock_guard lock(mutex_);
  Entry& entry = EntryOf(identifier);
  if (entry.references == 0) entry.kept.splice(entry.kept.begin(), unused_, entry.place);
  ++entry.references;
  ++references_;
}

void FrameCache::Dereference(const Guid& identifier) {
  Entries dropped;
  std::lock_guard lock(mutex_);
  const auto found = entries_.find(identifier);
  if (found == entries_.end() || found->second.references == 0) return;
  --references_;
  if (--found->second.references > 0) return;
  if (!found->second.picture) {
    entries_.erase(found);
    return;
  }
  unused_.splice(unused_.end(), found->second.kept);
  dropped = Trim();
}

void FrameCache::SetBound(std::size_t bytes) {
  Entries dropped;
  std::lock_guard lock(mutex_);
  bound_ = bytes;
  dropped = Trim();
}

FrameCache::Entries FrameCache::Trim() {
  Entries dropped;
  while (bytes_ > bound_ && !unused_.empty()) {
    const auto found = entries_.find(unused_.front());
    bytes_ -= found->second.picture->bytes();
    dropped.insert(entries_.extract(found));
    unused_.pop_front();
  }
  return dropped;
}

std::size_t FrameCache::bytes() const {
  std::lock_guard lock(mutex_);
  return bytes_;
}

std::size_t FrameCache::references() const {
  std::lock_guard lock(mutex_);
  return references_;
}

}  // namespace calmframe::host
