#include "tests/faults/faults_run.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <utility>

namespace faults {

std::atomic<bool> is_in_main = false;
std::atomic<Mode> mode = Mode::unknown;
State* state = nullptr;
std::int64_t at = 0;
int error_number = 0;
char root[PATH_MAX];
std::size_t root_length = 0;

namespace {

constexpr std::size_t kLongestName = 48;
struct Site {
  std::atomic<const void*> address;
  std::atomic<std::int64_t> calls;
  const char* function;
  std::uintptr_t offset;
  char file[kLongestName];
};
constexpr std::size_t kSites = 1 << 16;

char wanted_function[kLongestName], wanted_file[kLongestName];
std::uintptr_t wanted_offset = 0;
std::int64_t first = 0, count = 0;
int out = -1;
Site sites[kSites];

const char* Value(const char* name) {
  const char* const value = std::getenv(name);
  return value ? value : "";
}

const char* BaseName(const char* path) {
  const char* const slash = path ? std::strrchr(path, '/') : nullptr;
  return slash ? slash + 1 : path ? path : "?";
}

void Count(const char* function, const void* caller) {
  std::size_t i = reinterpret_cast<std::uintptr_t>(caller) * 0x9E3779B97F4A7C15u >> 48;
  for (std::size_t tries = 0; tries < kSites; ++tries, i = (i + 1) % kSites) {
    Site& site = sites[i];
    const void* there = site.address.load();
    if (!there && site.address.compare_exchange_strong(there, caller)) {
      Dl_info info{};
      dladdr(caller, &info);
      std::snprintf(site.file, sizeof site.file, "%s", BaseName(info.dli_fname));
      site.offset = reinterpret_cast<std::uintptr_t>(caller) -
                    reinterpret_cast<std::uintptr_t>(info.dli_fbase);
      site.function = function;
      there = caller;
    }
    if (there != caller) continue;
    ++site.calls;
    return;
  }
}

void Start() {
  Mode none = Mode::unknown;
  if (!mode.compare_exchange_strong(none, Mode::starting)) return;
  const char* const name = Value("FAULTS_MODE");
  Mode chosen = Mode::off;
  for (const auto& [word, value] : {std::pair{"sites", Mode::sites},
                                    {"fail", Mode::fail},
                                    {"kill", Mode::kill},
                                    {"record", Mode::record}}) {
    if (std::strcmp(name, word) == 0) chosen = value;
  }
  const long file = syscall(SYS_openat, AT_FDCWD, Value("FAULTS_STATE"), O_RDWR | O_CLOEXEC, 0);
  if (chosen == Mode::off || file < 0) {
    mode = Mode::off;
    return;
  }
  state = static_cast<State*>(reinterpret_cast<void*>(
      syscall(SYS_mmap, nullptr, sizeof(State), PROT_READ | PROT_WRITE, MAP_SHARED, file, 0)));
  syscall(SYS_close, file);
  const int process = state->processes.fetch_add(1);
  if (process < 64) state->process[process] = static_cast<int>(syscall(SYS_getpid));
  std::sscanf(Value("FAULTS_SITE"), "%47s %47s %lx", wanted_function, wanted_file, &wanted_offset);
  first = std::atoll(Value("FAULTS_FIRST"));
  count = std::atoll(Value("FAULTS_COUNT"));
  at = std::atoll(Value("FAULTS_AT"));
  error_number = std::atoi(Value("FAULTS_ERROR"));
  std::snprintf(root, sizeof root, "%s", Value("FAULTS_ROOT"));
  root_length = std::strlen(root);
  if (chosen == Mode::sites || chosen == Mode::record) {
    out = static_cast<int>(syscall(SYS_openat, AT_FDCWD, Value("FAULTS_OUT"),
                                   O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644));
    // Out of the way of programs that close or copy descriptors by number.
    const long high = syscall(SYS_fcntl, out, F_DUPFD_CLOEXEC, 500);
    if (high >= 0) {
      syscall(SYS_close, out);
      out = static_cast<int>(high);
    }
  }
  mode = chosen;
}

}  // namespace

void Put(const char* text, std::size_t size) {
  while (size > 0) {
    const long put = syscall(SYS_write, out, text, size);
    if (put <= 0) return;
    text += put;
    size -= static_cast<std::size_t>(put);
  }
}

Mode Now() {
  Mode now = mode.load(std::memory_order_acquire);
  if (now == Mode::unknown) {
    Start();
    now = mode.load(std::memory_order_acquire);
  }
  return now;
}

// Where a debugger stops at a fault.
extern "C" __attribute__((noinline, visibility("default"))) void faults_placed() {
  asm volatile("");
}

bool Fails(const char* function, const void* caller) {
  if (!is_in_main) return false;
  const Mode now = Now();
  if (now == Mode::sites) Count(function, caller);
  if (now != Mode::fail) return false;
  const auto address = reinterpret_cast<std::uintptr_t>(caller);
  if ((address & 0xfff) != (wanted_offset & 0xfff) || std::strcmp(function, wanted_function) != 0) {
    return false;
  }
  Dl_info info{};
  if (dladdr(caller, &info) == 0 ||
      address - reinterpret_cast<std::uintptr_t>(info.dli_fbase) != wanted_offset ||
      std::strncmp(BaseName(info.dli_fname), wanted_file, kLongestName - 1) != 0 ||
      state->disarmed) {
    return false;
  }
  const std::int64_t n = ++state->hits;
  if (n < first || n >= first + count) return false;
  ++state->fired;
  faults_placed();
  errno = error_number;
  return true;
}

__attribute__((destructor)) static void TellSites() {
  if (mode != Mode::sites) return;
  for (const Site& site : sites) {
    if (!site.address) continue;
    char line[160];
    const int length = std::snprintf(line, sizeof line, "%s %s %lx %ld\n", site.function, site.file,
                                     site.offset, site.calls.load());
    Put(line, static_cast<std::size_t>(length));
  }
}

}  // namespace faults
