#include "platform/memory/large_pages.h"

#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>

namespace memory {

void PreferLargePages(void* start, std::size_t bytes) {
#ifdef MADV_HUGEPAGE
  static const auto page = static_cast<std::uintptr_t>(sysconf(_SC_PAGESIZE));
  const auto begin = reinterpret_cast<std::uintptr_t>(start);
  const std::uintptr_t first = (begin + page - 1) / page * page;
  const std::uintptr_t end = (begin + bytes) / page * page;
  // A system without large pages refuses, and nothing is lost.
  if (first < end) madvise(reinterpret_cast<void*>(first), end - first, MADV_HUGEPAGE);
#else
  (void)start;
  (void)bytes;
#endif
}

}  // namespace memory
