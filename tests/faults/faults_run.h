#pragma once

#include <limits.h>

#include <atomic>
#include <cstddef>
#include <cstdint>

// What the processes of a run share and are told; see faults_preload.cpp.

extern "C" {
void* __libc_malloc(std::size_t size);
void* __libc_calloc(std::size_t count, std::size_t size);
void* __libc_realloc(void* block, std::size_t size);
void* __libc_memalign(std::size_t alignment, std::size_t size);
}

namespace faults {

enum class Mode { unknown, starting, off, sites, fail, kill, record };

// All zero at first.
struct State {
  std::atomic<std::int64_t> hits;     // calls of the place
  std::atomic<std::int64_t> fired;    // calls that failed
  std::atomic<std::int64_t> changes;  // of the folder
  std::atomic<std::int64_t> disarmed;
  std::atomic<int> lock;
  std::atomic<int> processes;
  std::atomic<int> process[64];
};

extern std::atomic<bool> is_in_main;
// All below is constant once `mode` is beyond `starting`.
extern std::atomic<Mode> mode;
extern State* state;
extern std::int64_t at;
extern int error_number;
extern char root[PATH_MAX];
extern std::size_t root_length;

// The mode, which the first call finds out.
Mode Now();
// Appends to FAULTS_OUT.
void Put(const char* text, std::size_t size);
// Whether this call is to fail; errno says how. It is counted where calls are.
bool Fails(const char* function, const void* caller);

}  // namespace faults
