// Stands between a program and its C library (LD_PRELOAD): counts the calls of a run by where they
// are made, lets one of them fail, kills all processes of the run at one, or writes down what a run
// does to a folder. The environment says which:
//   FAULTS_STATE  a file of zeros, at least as large as State, that the processes of a run share
//   FAULTS_MODE   sites: FAULTS_OUT gets a line for each place that calls: function, file and
//                   offset of the return address, calls
//                 fail: the calls FAULTS_FIRST (from 1) to FAULTS_FIRST + FAULTS_COUNT - 1 of the
//                   place FAULTS_SITE ("function file offset") end with FAULTS_ERROR, an errno; 0
//                   lets them read or write half
//                 kill: before change FAULTS_AT of the folder FAULTS_ROOT (from 1), or, a write,
//                   half way through it
//                 record: FAULTS_OUT gets each change of FAULTS_ROOT: a line "operation inode
//                   offset bytes length-of-path length-of-second-path", then paths and bytes
// What a library calls within itself is not seen, nor what is called before main: nothing can be
// done about that, as no exception can be caught there.

#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <pthread.h>
#include <stdarg.h>
#include <stdio.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <new>

#include "tests/faults/folder_changes.h"

using namespace faults;

static void* Block(void* block) {
  if (!block) throw std::bad_alloc();
  return block;
}

#define CALLER __builtin_return_address(0)
// Of the C library's function `name`; what it answers where it fails.
#define NEXT(name)                                                                         \
  ([] {                                                                                    \
    static const auto next = reinterpret_cast<decltype(&::name)>(dlsym(RTLD_NEXT, #name)); \
    return next;                                                                           \
  }())
#define FAIL(name, answer) \
  if (Fails(#name, CALLER)) return answer

using Main = int (*)(int, char**, char**);
static Main program_main = nullptr;
static int MainOfProgram(int count, char** words, char** environment) {
  is_in_main = true;
  return program_main(count, words, environment);
}
extern "C" int __libc_start_main(Main main, int count, char** words, void (*init)(), void (*fini)(),
                                 void (*loader_fini)(), void* stack_end) {
  program_main = main;
  const auto next =
      reinterpret_cast<decltype(&__libc_start_main)>(dlsym(RTLD_NEXT, "__libc_start_main"));
  return next(MainOfProgram, count, words, init, fini, loader_fini, stack_end);
}

// ---- For the program itself, which looks it up.

extern "C" __attribute__((visibility("default"))) void faults_disarm() {
  if (Now() == Mode::fail) state->disarmed = 1;
}

// ---- Memory.

extern "C" {

void* malloc(std::size_t size) {
  FAIL(malloc, nullptr);
  return __libc_malloc(size);
}
void* calloc(std::size_t number, std::size_t size) {
  FAIL(calloc, nullptr);
  return __libc_calloc(number, size);
}
void* realloc(void* block, std::size_t size) {
  FAIL(realloc, nullptr);
  return __libc_realloc(block, size);
}
void* memalign(std::size_t alignment, std::size_t size) {
  FAIL(memalign, nullptr);
  return __libc_memalign(alignment, size);
}
void* aligned_alloc(std::size_t alignment, std::size_t size) {
  FAIL(aligned_alloc, nullptr);
  return __libc_memalign(alignment, size);
}
int posix_memalign(void** block, std::size_t alignment, std::size_t size) {
  FAIL(posix_memalign, ENOMEM);
  void* const made = __libc_memalign(alignment, size);
  if (!made) return ENOMEM;
  *block = made;
  return 0;
}

}  // extern "C"

void* operator new(std::size_t size) {
  return Block(Fails("new", CALLER) ? nullptr : __libc_malloc(size));
}
void* operator new[](std::size_t size) {
  return Block(Fails("new", CALLER) ? nullptr : __libc_malloc(size));
}
void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
  return Fails("new", CALLER) ? nullptr : __libc_malloc(size);
}
void* operator new[](std::size_t size, const std::nothrow_t&) noexcept {
  return Fails("new", CALLER) ? nullptr : __libc_malloc(size);
}
void* operator new(std::size_t size, std::align_val_t alignment) {
  return Block(Fails("new", CALLER) ? nullptr
                                    : __libc_memalign(static_cast<std::size_t>(alignment), size));
}
void* operator new[](std::size_t size, std::align_val_t alignment) {
  return Block(Fails("new", CALLER) ? nullptr
                                    : __libc_memalign(static_cast<std::size_t>(alignment), size));
}
void operator delete(void* block) noexcept {
  std::free(block);
}
void operator delete[](void* block) noexcept {
  std::free(block);
}
void operator delete(void* block, std::size_t) noexcept {
  std::free(block);
}
void operator delete[](void* block, std::size_t) noexcept {
  std::free(block);
}
void operator delete(void* block, std::align_val_t) noexcept {
  std::free(block);
}
void operator delete[](void* block, std::align_val_t) noexcept {
  std::free(block);
}
void operator delete(void* block, std::size_t, std::align_val_t) noexcept {
  std::free(block);
}
void operator delete[](void* block, std::size_t, std::align_val_t) noexcept {
  std::free(block);
}

// ---- Threads and processes.

extern "C" {

int pthread_create(pthread_t* thread, const pthread_attr_t* attributes, void* (*run)(void*),
                   void* argument) noexcept {
  if (Fails("pthread_create", CALLER)) return EAGAIN;
  return NEXT(pthread_create)(thread, attributes, run, argument);
}
pid_t fork() noexcept {
  FAIL(fork, -1);
  const pid_t child = NEXT(fork)();
  if (child > 0 && Watches()) {
    const int process = state->processes.fetch_add(1);
    if (process < 64) state->process[process] = child;
  }
  return child;
}
int pipe2(int* ends, int flags) noexcept {
  FAIL(pipe2, -1);
  return NEXT(pipe2)(ends, flags);
}

// ---- Files.

#define OPEN(name)                                                                            \
  int name(const char* path, int flags, ...) {                                                \
    FAIL(name, -1);                                                                           \
    va_list more;                                                                             \
    va_start(more, flags);                                                                    \
    const mode_t access = (flags & (O_CREAT | O_TMPFILE)) != 0 ? va_arg(more, mode_t) : 0;    \
    va_end(more);                                                                             \
    return Opened(                                                                            \
        (flags & O_CREAT) != 0 || (flags & O_TRUNC) != 0 ? PlaceAt(AT_FDCWD, path) : Place(), \
        flags, [&] { return NEXT(name)(path, flags, access); });                              \
  }
OPEN(open)
OPEN(open64)
#define OPENAT(name)                                                                       \
  int name(int folder, const char* path, int flags, ...) {                                 \
    FAIL(name, -1);                                                                        \
    va_list more;                                                                          \
    va_start(more, flags);                                                                 \
    const mode_t access = (flags & (O_CREAT | O_TMPFILE)) != 0 ? va_arg(more, mode_t) : 0; \
    va_end(more);                                                                          \
    return Opened((flags & O_CREAT) != 0 ? PlaceAt(folder, path) : Place(), flags,         \
                  [&] { return NEXT(name)(folder, path, flags, access); });                \
  }
OPENAT(openat)
OPENAT(openat64)

#define MKSTEMP(name)                                                                  \
  int name(char* path) {                                                               \
    FAIL(name, -1);                                                                    \
    const Place pattern = PlaceAt(AT_FDCWD, path);                                     \
    const Change change(static_cast<bool>(pattern));                                   \
    const int file = NEXT(name)(path);                                                 \
    if (file >= 0 && pattern) {                                                        \
      change.Tell("create", InodeOf(file), 0, nullptr, 0, Place(AT_FDCWD, path).path); \
    }                                                                                  \
    return file;                                                                       \
  }
MKSTEMP(mkstemp)
MKSTEMP(mkstemp64)

#define FOPEN(name)                                                              \
  FILE* name(const char* path, const char* how) {                                \
    FAIL(name, nullptr);                                                         \
    FILE* file = nullptr;                                                        \
    const bool writes = how[0] != 'r';                                           \
    const int flags = !writes ? 0 : how[0] == 'w' ? O_CREAT | O_TRUNC : O_CREAT; \
    Opened(writes ? PlaceAt(AT_FDCWD, path) : Place(), flags, [&] {              \
      file = NEXT(name)(path, how);                                              \
      return file ? fileno(file) : -1;                                           \
    });                                                                          \
    return file;                                                                 \
  }
FOPEN(fopen)
FOPEN(fopen64)

// Of half of what was asked for, where the error is none.
#define HALF (error_number == 0 && size > 1)
ssize_t read(int file, void* bytes, std::size_t size) {
  if (Fails("read", CALLER)) {
    if (!HALF) return -1;
    size /= 2;
  }
  return NEXT(read)(file, bytes, size);
}
#define PREAD(name)                                                     \
  ssize_t name(int file, void* bytes, std::size_t size, off_t offset) { \
    if (Fails(#name, CALLER)) {                                         \
      if (!HALF) return -1;                                             \
      size /= 2;                                                        \
    }                                                                   \
    return NEXT(name)(file, bytes, size, offset);                       \
  }
PREAD(pread)
PREAD(pread64)
ssize_t write(int file, const void* bytes, std::size_t size) {
  if (Fails("write", CALLER)) {
    if (!HALF) return -1;
    size /= 2;
  }
  return Written(file, bytes, size, -1, [&](std::size_t n) { return NEXT(write)(file, bytes, n); });
}
#define PWRITE(name)                                                                   \
  ssize_t name(int file, const void* bytes, std::size_t size, off_t offset) {          \
    if (Fails(#name, CALLER)) {                                                        \
      if (!HALF) return -1;                                                            \
      size /= 2;                                                                       \
    }                                                                                  \
    return Written(file, bytes, size, offset,                                          \
                   [&](std::size_t n) { return NEXT(name)(file, bytes, n, offset); }); \
  }
PWRITE(pwrite)
PWRITE(pwrite64)
ssize_t writev(int file, const iovec* parts, int number) {
  if (Fails("writev", CALLER)) {
    if (error_number != 0) return -1;
    number = number > 1 ? number / 2 : number;
  }
  if (!Watches()) return NEXT(writev)(file, parts, number);
  ssize_t done = 0;
  for (int i = 0; i < number; ++i) {
    const ssize_t part = Written(file, parts[i].iov_base, parts[i].iov_len, -1, [&](std::size_t n) {
      return static_cast<ssize_t>(syscall(SYS_write, file, parts[i].iov_base, n));
    });
    if (part < 0) return done > 0 ? done : part;
    done += part;
    if (static_cast<std::size_t>(part) < parts[i].iov_len) break;
  }
  return done;
}

#define OF_FILE(name, operation)                                         \
  int name(int file) {                                                   \
    FAIL(name, -1);                                                      \
    return OfFile(operation, file, 0, [&] { return NEXT(name)(file); }); \
  }
OF_FILE(fsync, "sync")
OF_FILE(fdatasync, "sync")
int syncfs(int file) noexcept {
  FAIL(syncfs, -1);
  return OfFile("sync-all", file, 0, [&] { return NEXT(syncfs)(file); });
}
#define TRUNCATE(name)                                                             \
  int name(int file, off_t size) noexcept {                                        \
    FAIL(name, -1);                                                                \
    return OfFile("truncate", file, size, [&] { return NEXT(name)(file, size); }); \
  }
TRUNCATE(ftruncate)
TRUNCATE(ftruncate64)

// Closed all the same, as the system has it.
int close(int file) {
  const bool fails = Fails("close", CALLER);
  const int result = NEXT(close)(file);
  if (!fails) return result;
  errno = error_number;
  return -1;
}
int fclose(FILE* file) {
  const bool fails = Fails("fclose", CALLER);
  const Place place = Watches() ? Place(fileno(file)) : Place();
  const Change change(static_cast<bool>(place));
  const int result = NEXT(fclose)(file);
  if (place) TellWhole(change, place);
  if (!fails) return result;
  errno = error_number;
  return EOF;
}

int rename(const char* from, const char* to) noexcept {
  FAIL(rename, -1);
  return Named("rename", PlaceAt(AT_FDCWD, from), PlaceAt(AT_FDCWD, to),
               [&] { return NEXT(rename)(from, to); });
}
int link(const char* from, const char* to) noexcept {
  FAIL(link, -1);
  return Named("link", PlaceAt(AT_FDCWD, from), PlaceAt(AT_FDCWD, to),
               [&] { return NEXT(link)(from, to); });
}
#define OF_NAME(name, operation)                                                                 \
  int name(const char* path) noexcept {                                                          \
    FAIL(name, -1);                                                                              \
    return Named(operation, PlaceAt(AT_FDCWD, path), Place(), [&] { return NEXT(name)(path); }); \
  }
OF_NAME(unlink, "unlink")
OF_NAME(rmdir, "unlink")
OF_NAME(remove, "unlink")
int unlinkat(int folder, const char* path, int flags) noexcept {
  FAIL(unlinkat, -1);
  return Named("unlink", PlaceAt(folder, path), Place(),
               [&] { return NEXT(unlinkat)(folder, path, flags); });
}
int mkdir(const char* path, mode_t access) noexcept {
  FAIL(mkdir, -1);
  return Named("mkdir", PlaceAt(AT_FDCWD, path), Place(),
               [&] { return NEXT(mkdir)(path, access); });
}
char* mkdtemp(char* path) noexcept {
  FAIL(mkdtemp, nullptr);
  return NEXT(mkdtemp)(path);
}

#define MMAP(name)                                                               \
  void* name(void* place, std::size_t size, int protection, int flags, int file, \
             off_t offset) noexcept {                                            \
    FAIL(name, MAP_FAILED);                                                      \
    return NEXT(name)(place, size, protection, flags, file, offset);             \
  }
MMAP(mmap)
MMAP(mmap64)
#define STAT(name)                                           \
  int name(const char* path, struct stat* status) noexcept { \
    FAIL(name, -1);                                          \
    return NEXT(name)(path, status);                         \
  }
STAT(stat)
STAT(lstat)
int fstat(int file, struct stat* status) noexcept {
  FAIL(fstat, -1);
  return NEXT(fstat)(file, status);
}
#define STAT64(name)                                           \
  int name(const char* path, struct stat64* status) noexcept { \
    FAIL(name, -1);                                            \
    return NEXT(name)(path, status);                           \
  }
STAT64(stat64)
STAT64(lstat64)
int fstat64(int file, struct stat64* status) noexcept {
  FAIL(fstat64, -1);
  return NEXT(fstat64)(file, status);
}
#define LSEEK(name)                                       \
  off_t name(int file, off_t offset, int from) noexcept { \
    FAIL(name, -1);                                       \
    return NEXT(name)(file, offset, from);                \
  }
LSEEK(lseek)
LSEEK(lseek64)
int flock(int file, int how) noexcept {
  FAIL(flock, -1);
  return NEXT(flock)(file, how);
}
#define FCNTL(name)                          \
  int name(int file, int what, ...) {        \
    FAIL(name, -1);                          \
    va_list more;                            \
    va_start(more, what);                    \
    void* const value = va_arg(more, void*); \
    va_end(more);                            \
    return NEXT(name)(file, what, value);    \
  }
FCNTL(fcntl)
FCNTL(fcntl64)
DIR* opendir(const char* path) {
  FAIL(opendir, nullptr);
  return NEXT(opendir)(path);
}
char* getcwd(char* path, std::size_t size) noexcept {
  FAIL(getcwd, nullptr);
  return NEXT(getcwd)(path, size);
}
int chmod(const char* path, mode_t access) noexcept {
  FAIL(chmod, -1);
  return NEXT(chmod)(path, access);
}

}  // extern "C"
