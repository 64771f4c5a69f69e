#include "tests/faults/folder_changes.h"

#include <sys/syscall.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace faults {
namespace {

bool IsInside(const char* path) {
  return std::strncmp(path, root, root_length) == 0 && path[root_length] == '/';
}

[[noreturn]] void Kill() {
  const int self = static_cast<int>(syscall(SYS_getpid));
  for (const auto& process : state->process) {
    if (process != 0 && process != self) syscall(SYS_kill, process.load(), SIGKILL);
  }
  syscall(SYS_kill, self, SIGKILL);
  for (;;) syscall(SYS_pause);
}

}  // namespace

bool Watches() {
  const Mode now = Now();
  return now == Mode::kill || now == Mode::record;
}

Place::Place(int folder, const char* name) {
  char parent[PATH_MAX], link[64];
  if (name[0] != '/' && folder != AT_FDCWD) {
    std::snprintf(link, sizeof link, "/proc/self/fd/%d", folder);
    const long length = syscall(SYS_readlink, link, parent, sizeof parent - 1);
    if (length < 0) return;
    parent[length] = 0;
    std::snprintf(path, sizeof path, "%.2000s/%.2000s", parent, name);
  } else {
    std::snprintf(parent, sizeof parent, "%s", name);
    char* slash = std::strrchr(parent, '/');
    if (slash && !slash[1]) *slash = 0, slash = std::strrchr(parent, '/');
    const char* base = slash ? slash + 1 : parent;
    char whole[PATH_MAX];
    if (slash) *slash = 0;
    if (!realpath(slash ? (*parent ? parent : "/") : ".", whole)) return;
    std::snprintf(path, sizeof path, "%.2000s/%.2000s", whole, base);
  }
  if (!IsInside(path)) path[0] = 0;
}

Place::Place(int file) {
  char link[64];
  std::snprintf(link, sizeof link, "/proc/self/fd/%d", file);
  const long length = syscall(SYS_readlink, link, path, sizeof path - 1);
  path[length < 0 ? 0 : length] = 0;
  if (!IsInside(path) && std::strcmp(path, root) != 0) path[0] = 0;
}

Place PlaceAt(int folder, const char* name) {
  return Watches() ? Place(folder, name) : Place();
}

Change::Change(bool is_inside) : is_inside_(is_inside) {
  if (!is_inside_) return;
  while (state->lock.exchange(1) != 0) syscall(SYS_sched_yield);
  is_end_ = ++state->changes == at && mode == Mode::kill;
  if (is_end_ && at % 2 == 0) Kill();  // of odd ones a write is half done, others are whole
}

Change::~Change() {
  if (!is_inside_) return;
  if (is_end_) Kill();
  state->lock = 0;
}

void Change::Tell(const char* operation, std::uint64_t inode, std::int64_t offset,
                  const void* bytes, std::int64_t size, const char* path,
                  const char* second) const {
  if (!is_inside_ || mode != Mode::record) return;
  const int error = errno;
  char line[160];
  const int length = std::snprintf(line, sizeof line, "%s %lu %ld %ld %zu %zu\n", operation, inode,
                                   offset, size, std::strlen(path), std::strlen(second));
  Put(line, static_cast<std::size_t>(length));
  Put(path, std::strlen(path));
  Put(second, std::strlen(second));
  if (bytes) Put(static_cast<const char*>(bytes), static_cast<std::size_t>(size));
  errno = error;
}

std::uint64_t InodeOf(int file) {
  struct stat status;
  return fstat(file, &status) == 0 ? status.st_ino : 0;
}

void TellWhole(const Change& change, const Place& place) {
  const int file =
      static_cast<int>(syscall(SYS_openat, AT_FDCWD, place.path, O_RDONLY | O_CLOEXEC, 0));
  struct stat status;
  if (file < 0 || fstat(file, &status) != 0) return;
  void* const bytes = __libc_malloc(static_cast<std::size_t>(status.st_size));
  const long size = syscall(SYS_read, file, bytes, status.st_size);
  if (size > 0) change.Tell("write", status.st_ino, 0, bytes, size, place.path);
  std::free(bytes);
  syscall(SYS_close, file);
}

}  // namespace faults
