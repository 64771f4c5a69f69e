#pragma once

#include <cstddef>
#include <new>
#include <vector>

namespace memory {

// Gives memory from the start of a cache line on. The widest vectors are as long as a line: those
// that lie across two cost twice.
template <class T>
struct LineAllocator {
  using value_type = T;
  static constexpr std::align_val_t kLine{64};

  LineAllocator() = default;
  template <class U>
  LineAllocator(const LineAllocator<U>&) {}

  T* allocate(std::size_t count) {
    return static_cast<T*>(::operator new(count * sizeof(T), kLine));
  }
  void deallocate(T* values, std::size_t) { ::operator delete(values, kLine); }
  bool operator==(const LineAllocator&) const = default;
};

template <class T>
using LineAlignedVector = std::vector<T, LineAllocator<T>>;

}  // namespace memory
