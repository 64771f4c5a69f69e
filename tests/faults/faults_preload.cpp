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
#include <signal.h>
#include <stdarg.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

extern "C" {
void* __libc_malloc(std::size_t size);
void* __libc_calloc(std::size_t count, std::size_t size);
void* __libc_realloc(void* block, std::size_t size);
void* __libc_memalign(std::size_t alignment, std::size_t size);
}

namespace {

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

constexpr std::size_t kLongestName = 48;
struct Site {
  std::atomic<const void*> address;
  std::atomic<std::int64_t> calls;
  const char* function;
  std::uintptr_t offset;
  char file[kLongestName];
};
constexpr std::size_t kSites = 1 << 16;

std::atomic<bool> is_in_main = false;

// Constant once `mode` is beyond `starting`.
std::atomic<Mode> mode = Mode::unknown;
State* state = nullptr;
char wanted_function[kLongestName], wanted_file[kLongestName];
std::uintptr_t wanted_offset = 0;
std::int64_t first = 0, count = 0, at = 0;
int error_number = 0;
char root[PATH_MAX];
std::size_t root_length = 0;
int out = -1;
Site sites[kSites];

const char* Value(const char* name) {
  const char* const value = std::getenv(name);
  return value ? value : "";
}

void Put(const char* text, std::size_t size) {
  while (size > 0) {
    const long put = syscall(SYS_write, out, text, size);
    if (put <= 0) return;
    text += put;
    size -= static_cast<std::size_t>(put);
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

Mode Now() {
  Mode now = mode.load(std::memory_order_acquire);
  if (now == Mode::unknown) {
    Start();
    now = mode.load(std::memory_order_acquire);
  }
  return now;
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

// Where a debugger stops at a fault.
extern "C" __attribute__((noinline, visibility("default"))) void faults_placed() {
  asm volatile("");
}

// Whether this call is to fail; errno says how.
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

// ---- Changes of the folder.

bool Watches() {
  const Mode now = Now();
  return now == Mode::kill || now == Mode::record;
}

bool IsInside(const char* path) {
  return std::strncmp(path, root, root_length) == 0 && path[root_length] == '/';
}

// The name without links in its folders; empty outside of the root.
struct Place {
  char path[PATH_MAX] = "";

  Place() = default;
  Place(int folder, const char* name) {
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
  explicit Place(int file) {
    char link[64];
    std::snprintf(link, sizeof link, "/proc/self/fd/%d", file);
    const long length = syscall(SYS_readlink, link, path, sizeof path - 1);
    path[length < 0 ? 0 : length] = 0;
    if (!IsInside(path) && std::strcmp(path, root) != 0) path[0] = 0;
  }
  explicit operator bool() const { return path[0] != 0; }
};

// The change that an object of this is made for happens within its life, and is the only one.
class Change {
 public:
  explicit Change(bool is_inside) : is_inside_(is_inside) {
    if (!is_inside_) return;
    while (state->lock.exchange(1) != 0) syscall(SYS_sched_yield);
    is_end_ = ++state->changes == at && mode == Mode::kill;
    if (is_end_ && at % 2 == 0) Kill();  // of odd ones a write is half done, others are whole
  }
  ~Change() {
    if (!is_inside_) return;
    if (is_end_) Kill();
    state->lock = 0;
  }
  Change(const Change&) = delete;
  Change& operator=(const Change&) = delete;

  bool is_end() const { return is_end_; }

  void Tell(const char* operation, std::uint64_t inode, std::int64_t offset, const void* bytes,
            std::int64_t size, const char* path, const char* second = "") const {
    if (!is_inside_ || mode != Mode::record) return;
    const int error = errno;
    char line[160];
    const int length = std::snprintf(line, sizeof line, "%s %lu %ld %ld %zu %zu\n", operation,
                                     inode, offset, size, std::strlen(path), std::strlen(second));
    Put(line, static_cast<std::size_t>(length));
    Put(path, std::strlen(path));
    Put(second, std::strlen(second));
    if (bytes) Put(static_cast<const char*>(bytes), static_cast<std::size_t>(size));
    errno = error;
  }

 private:
  [[noreturn]] static void Kill() {
    const int self = static_cast<int>(syscall(SYS_getpid));
    for (const auto& process : state->process) {
      if (process != 0 && process != self) syscall(SYS_kill, process.load(), SIGKILL);
    }
    syscall(SYS_kill, self, SIGKILL);
    for (;;) syscall(SYS_pause);
  }

  const bool is_inside_;
  bool is_end_ = false;
};

std::uint64_t InodeOf(int file) {
  struct stat status;
  return fstat(file, &status) == 0 ? status.st_ino : 0;
}

// Opens, and tells of a file that came to be or lost its contents.
template <class Open>
int Opened(const Place& place, int flags, const Open& open) {
  const Change change(static_cast<bool>(place));
  struct stat before;
  const bool was_there = place && lstat(place.path, &before) == 0;
  const int file = open();
  if (file < 0 || !place) return file;
  const bool is_new = !was_there && (flags & O_CREAT) != 0;
  if (is_new) change.Tell("create", InodeOf(file), 0, nullptr, 0, place.path);
  if (was_there && (flags & O_TRUNC) != 0) {
    change.Tell("truncate", InodeOf(file), 0, nullptr, 0, place.path);
  }
  return file;
}

// `write(size)` writes so much of `size` bytes; `offset`: below 0 at the file's own.
template <class Write>
ssize_t Written(int file, const void* bytes, std::size_t size, std::int64_t offset,
                const Write& write) {
  if (!Watches()) return write(size);
  const Place place(file);
  struct stat status;
  const Change change(place && fstat(file, &status) == 0 && S_ISREG(status.st_mode));
  const ssize_t done = write(change.is_end() ? size / 2 : size);
  if (done > 0 && place) {
    const std::int64_t end = offset < 0 ? lseek(file, 0, SEEK_CUR) : offset + done;
    change.Tell("write", InodeOf(file), end - done, bytes, done, place.path);
  }
  return done;
}

// Of a file that was written by the C library within itself.
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

template <class Do>
int Named(const char* operation, const Place& place, const Place& second, const Do& act) {
  const Change change(place || second);
  const int result = act();
  if (result == 0) change.Tell(operation, 0, 0, nullptr, 0, place.path, second.path);
  return result;
}

template <class Do>
int OfFile(const char* operation, int file, std::int64_t offset, const Do& act) {
  const Place place = Watches() ? Place(file) : Place();
  const Change change(static_cast<bool>(place));
  const int result = act();
  if (result == 0) change.Tell(operation, InodeOf(file), offset, nullptr, 0, place.path);
  return result;
}

Place PlaceAt(int folder, const char* name) {
  return Watches() ? Place(folder, name) : Place();
}

void* Block(void* block) {
  if (!block) throw std::bad_alloc();
  return block;
}

}  // namespace

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
