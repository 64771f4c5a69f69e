#pragma once

#include <cstddef>
#include <list>
#include <map>
#include <mutex>

#include "host/timeline/picture.h"
#include "platform/tessel/guid.h"

namespace calmframe::host {

// Frames by identifier. One that is referenced stays, and stays where it is; the others go, the
// least recently used first, while all together take more than the bound. Any thread.
class FrameCache {
 public:
  using Guid = tessel::utility::Guid;

  explicit FrameCache(std::size_t bound_bytes) : bound_(bound_bytes) {}

  // Null when absent.
  PicturePtr Find(const Guid& identifier);
  // The frame that stands under the identifier from now on: an earlier one stays. Where the bound
  // leaves no room it is gone at once, and the result all that is left of it.
  PicturePtr Insert(const Guid& identifier, const PicturePtr& picture);

  // Counted; also before there is a frame.
  void Reference(const Guid& identifier);
  void Dereference(const Guid& identifier);  // not below 0

  void SetBound(std::size_t bytes);

  std::size_t bytes() const;       // of all frames
  std::size_t references() const;  // of all identifiers together

 private:
  struct Entry {
    PicturePtr picture;  // null: referenced before it exists
    std::size_t references = 0;
    // Its own place, from the beginning, so that giving back needs no memory: in unused_ where
    // references is 0, else in kept.
    std::list<Guid>::iterator place;
    std::list<Guid> kept;
  };
  using Entries = std::map<Guid, Entry>;

  // The entry of the identifier; a new one has no references.
  Entry& EntryOf(const Guid& identifier);
  // Takes out what the bound has no room for; the caller lets go of it unlocked.
  Entries Trim();

  mutable std::mutex mutex_;  // guards all below
  std::size_t bound_;
  std::size_t bytes_ = 0;
  std::size_t references_ = 0;
  Entries entries_;         // each has a picture or references
  std::list<Guid> unused_;  // without references, the least recently used first
};

}  // namespace calmframe::host
