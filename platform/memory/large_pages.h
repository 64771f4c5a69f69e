#pragma once

#include <cstddef>
#include <vector>

namespace memory {

// Asks the system to lay the whole pages in [start, start + bytes) on large ones, where it has
// them: a walk through tens of megabytes, or down their columns, then finds its addresses sooner.
// Helps only memory that was not touched yet. Only advice; what the memory holds stays as it is.
void PreferLargePages(void* start, std::size_t bytes);

// v.resize(size) with that advice for what it allocates.
template <class T>
void ResizeOnLargePages(std::vector<T>& v, std::size_t size) {
  if (size > v.capacity()) {
    v.reserve(size);
    PreferLargePages(v.data(), size * sizeof(T));
  }
  v.resize(size);
}

}  // namespace memory
