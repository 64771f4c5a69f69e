#include "tests/contract/failing_memory.h"

#include <dlfcn.h>
#include <pthread.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <new>

namespace {

std::atomic<bool> armed = false;
std::atomic<std::int64_t> counted = 0, first_failing = 0, end_failing = 0;

bool Fails() {
  if (!armed.load(std::memory_order_relaxed)) return false;
  const std::int64_t n = counted.fetch_add(1, std::memory_order_relaxed) + 1;
  return n >= first_failing && n < end_failing;
}

void* Allocate(std::size_t size, std::size_t alignment) {
  void* block = nullptr;
  if (!Fails()) {
    block = alignment == 0 ? std::malloc(size)
                           : std::aligned_alloc(alignment, (size + alignment - 1) & -alignment);
  }
  if (!block) throw std::bad_alloc();
  return block;
}

}  // namespace

void FailingMemory::Arm(std::int64_t first, std::int64_t count) {
  counted = 0;
  first_failing = first;
  end_failing = first + count;
  armed = true;
}

std::int64_t FailingMemory::Disarm() {
  armed = false;
  return counted;
}

// The other forms go by these.
void* operator new(std::size_t size) {
  return Allocate(size > 0 ? size : 1, 0);
}
void* operator new(std::size_t size, std::align_val_t alignment) {
  return Allocate(size > 0 ? size : 1, static_cast<std::size_t>(alignment));
}
void operator delete(void* block) noexcept {
  std::free(block);
}
void operator delete(void* block, std::size_t) noexcept {
  std::free(block);
}
void operator delete(void* block, std::align_val_t) noexcept {
  std::free(block);
}
void operator delete(void* block, std::size_t, std::align_val_t) noexcept {
  std::free(block);
}

extern "C" int pthread_create(pthread_t* thread, const pthread_attr_t* attributes,
                              void* (*run)(void*), void* argument) {
  static const auto next =
      reinterpret_cast<decltype(&pthread_create)>(dlsym(RTLD_NEXT, "pthread_create"));
  // Those of std::thread; libraries that can't go on without theirs are let be.
  Dl_info caller{};
  const bool ours = dladdr(__builtin_return_address(0), &caller) != 0 && caller.dli_fname &&
                    std::strstr(caller.dli_fname, "libstdc++");
  return ours && Fails() ? EAGAIN : next(thread, attributes, run, argument);
}
