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

PicturePtr FrameCache::Insert(const Guid& identifier, const PicturePtr& picture) {
  std::list<PicturePtr> dropped;
  std::lock_guard lock(mutex_);
  const auto [at, made] = entries_.try_emplace(identifier);
  Entry& entry = at->second;
  if (entry.picture) return entry.picture;
  entry.picture = picture;
  bytes_ += picture->bytes();
  if (made) entry.place = unused_.insert(unused_.end(), identifier);
  dropped = Trim();
  return picture;
}

void FrameCache::Reference(const Guid& identifier) {
  std::lock_guard lock(mutex_);
  const auto [at, made] = entries_.try_emplace(identifier);
  Entry& entry = at->second;
  if (!made && entry.references == 0) unused_.erase(entry.place);
  ++entry.references;
  ++references_;
}

void FrameCache::Dereference(const Guid& identifier) {
  std::list<PicturePtr> dropped;
  std::lock_guard lock(mutex_);
  const auto found = entries_.find(identifier);
  if (found == entries_.end() || found->second.references == 0) return;
  --references_;
  if (--found->second.references > 0) return;
  if (!found->second.picture) {
    entries_.erase(found);
    return;
  }
  found->second.place = unused_.insert(unused_.end(), identifier);
  dropped = Trim();
}

void FrameCache::SetBound(std::size_t bytes) {
  std::list<PicturePtr> dropped;
  std::lock_guard lock(mutex_);
  bound_ = bytes;
  dropped = Trim();
}

std::list<PicturePtr> FrameCache::Trim() {
  std::list<PicturePtr> dropped;
  while (bytes_ > bound_ && !unused_.empty()) {
    const auto found = entries_.find(unused_.front());
    bytes_ -= found->second.picture->bytes();
    dropped.push_back(std::move(found->second.picture));
    entries_.erase(found);
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
