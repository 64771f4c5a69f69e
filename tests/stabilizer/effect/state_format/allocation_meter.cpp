#include "tests/stabilizer/effect/state_format/allocation_meter.h"

#include <malloc.h>

#include <algorithm>
#include <cstdlib>
#include <new>

namespace {
thread_local std::int64_t live = 0, most = 0;
}  // namespace

AllocationMeter::AllocationMeter() : begin_(live) {
  most = live;
}

std::int64_t AllocationMeter::Peak() const {
  return most - begin_;
}

void* operator new(std::size_t size) {
  void* const block = std::malloc(size);
  if (!block) throw std::bad_alloc();
  live += static_cast<std::int64_t>(malloc_usable_size(block));
  most = std::max(most, live);
  return block;
}
void operator delete(void* block) noexcept {
  if (block) live -= static_cast<std::int64_t>(malloc_usable_size(block));
  std::free(block);
}
void operator delete(void* block, std::size_t) noexcept {
  operator delete(block);
}
