#include "host/base/sandbox.h"

#include <fcntl.h>
#include <linux/landlock.h>
#include <seccomp.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string_view>
#include <system_error>

namespace calmframe::host {
namespace {

namespace fs = std::filesystem;

// Newer than the headers of the systems that this is built on.
constexpr std::uint64_t kTruncate = std::uint64_t{1} << 14;  // from the third version on

constexpr std::uint64_t kReadRights = LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_READ_DIR;
// Links, devices and sockets are made by nobody.
constexpr std::uint64_t kWriteRights =
    kReadRights | LANDLOCK_ACCESS_FS_WRITE_FILE | LANDLOCK_ACCESS_FS_REMOVE_FILE |
    LANDLOCK_ACCESS_FS_REMOVE_DIR | LANDLOCK_ACCESS_FS_MAKE_REG | LANDLOCK_ACCESS_FS_MAKE_DIR |
    LANDLOCK_ACCESS_FS_REFER | kTruncate;
constexpr std::uint64_t kHandled = kWriteRights | LANDLOCK_ACCESS_FS_EXECUTE |
                                   LANDLOCK_ACCESS_FS_MAKE_CHAR | LANDLOCK_ACCESS_FS_MAKE_SOCK |
                                   LANDLOCK_ACCESS_FS_MAKE_FIFO | LANDLOCK_ACCESS_FS_MAKE_BLOCK |
                                   LANDLOCK_ACCESS_FS_MAKE_SYM;
constexpr std::uint64_t kOfFiles =
    LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_WRITE_FILE | kTruncate;

// What libraries read as they go: themselves, fonts and their cache, how many processors and how
// much memory there is, and the drivers of encoders in hardware.
constexpr const char* kSystem[] = {"/usr",
                                   "/lib",
                                   "/lib64",
                                   "/opt",
                                   "/nix/store",
                                   "/run/opengl-driver",
                                   "/etc/ld.so.cache",
                                   "/etc/fonts",
                                   "/etc/localtime",
                                   "/etc/drirc",
                                   "/etc/OpenCL",
                                   "/var/cache/fontconfig",
                                   "/proc/self",
                                   "/proc/cpuinfo",
                                   "/proc/meminfo",
                                   "/proc/stat",
                                   "/proc/filesystems",
                                   "/proc/sys/vm",
                                   "/proc/sys/kernel",
                                   "/sys/devices",
                                   "/sys/dev",
                                   "/sys/class/drm",
                                   "/sys/bus/pci",
                                   "/sys/fs/cgroup",
                                   "/sys/kernel/mm",
                                   "/dev/random",
                                   "/dev/urandom"};
constexpr const char* kDevices[] = {
    "/dev/null",    "/dev/zero",      "/dev/full",       "/dev/dri",
    "/dev/nvidia0", "/dev/nvidiactl", "/dev/nvidia-uvm", "/dev/nvidia-uvm-tools"};
struct OfTheUser {
  const char* variable;
  const char* otherwise;  // below the home folder
  const char* folder;
};
constexpr OfTheUser kFonts[] = {{"XDG_DATA_HOME", ".local/share", "fonts"},
                                {"XDG_CONFIG_HOME", ".config", "fontconfig"},
                                {"XDG_CACHE_HOME", ".cache", "fontconfig"},
                                {"HOME", "", ".fonts"}};

// Doors that no work of this kind goes through: other machines and programs, what others run, and
// parts of the kernel that faults were found in more often than in others.
constexpr const char* kRefused[] = {"socket",
                                    "execve",
                                    "execveat",
                                    "ptrace",
                                    "process_vm_readv",
                                    "process_vm_writev",
                                    "pidfd_getfd",
                                    "pidfd_open",
                                    "kcmp",
                                    "rt_sigqueueinfo",
                                    "rt_tgsigqueueinfo",
                                    "io_uring_setup",
                                    "io_uring_enter",
                                    "bpf",
                                    "userfaultfd",
                                    "perf_event_open",
                                    "keyctl",
                                    "add_key",
                                    "request_key",
                                    "unshare",
                                    "setns",
                                    "mount",
                                    "umount2",
                                    "move_mount",
                                    "open_tree",
                                    "fsopen",
                                    "fsmount",
                                    "fsconfig",
                                    "mount_setattr",
                                    "pivot_root",
                                    "chroot",
                                    "open_by_handle_at",
                                    "name_to_handle_at",
                                    "swapon",
                                    "swapoff",
                                    "reboot",
                                    "kexec_load",
                                    "kexec_file_load",
                                    "init_module",
                                    "finit_module",
                                    "delete_module",
                                    "iopl",
                                    "ioperm",
                                    "acct",
                                    "quotactl",
                                    "settimeofday",
                                    "clock_settime",
                                    "adjtimex",
                                    "clock_adjtime",
                                    "sethostname",
                                    "setdomainname",
                                    "syslog",
                                    "vhangup",
                                    "chmod",
                                    "fchmodat",
                                    "chown",
                                    "lchown",
                                    "fchownat",
                                    "setxattr",
                                    "lsetxattr",
                                    "mknod",
                                    "mknodat"};

class Descriptor {
 public:
  explicit Descriptor(int number) : number_(number) {}
  ~Descriptor() {
    if (number_ >= 0) close(number_);
  }
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  int get() const { return number_; }

 private:
  int number_;
};

void Allow(int ruleset, const std::string& path, std::uint64_t rights, std::uint64_t handled) {
  const Descriptor place(open(path.c_str(), O_PATH | O_CLOEXEC));
  struct stat status;
  if (place.get() < 0 || fstat(place.get(), &status) != 0) return;
  if (!S_ISDIR(status.st_mode)) rights &= kOfFiles;
  landlock_path_beneath_attr rule{};
  rule.allowed_access = rights & handled;
  rule.parent_fd = place.get();
  syscall(SYS_landlock_add_rule, ruleset, LANDLOCK_RULE_PATH_BENEATH, &rule, 0);
}

constexpr int kMostLinks = 40;  // the kernel's own

// The folder that a file of this name is made in, links followed.
std::string FolderOf(const std::string& file) {
  std::error_code error;
  fs::path path = fs::absolute(file, error);
  // Links in a ring are refused by whoever opens them.
  for (int links = 0; links < kMostLinks && fs::is_symlink(path, error); ++links) {
    const fs::path target = fs::read_symlink(path, error);
    if (error) break;
    path = path.parent_path() / target;
  }
  // One with a slash at its end names a folder, which is made.
  if (!path.has_filename()) path = path.parent_path();
  return path.parent_path();
}

bool BoundCalls() {
  const std::unique_ptr<void, decltype(&seccomp_release)> filter(seccomp_init(SCMP_ACT_ALLOW),
                                                                 &seccomp_release);
  if (!filter) return false;
  for (const char* name : kRefused) {
#ifdef __SANITIZE_ADDRESS__
    // The search for leaks stops the process's threads by it.
    if (std::string_view(name) == "ptrace") continue;
#endif
    const int call = seccomp_syscall_resolve_name(name);
    if (call == __NR_SCMP_ERROR) continue;
    // Not every processor has each of them.
    seccomp_rule_add(filter.get(), SCMP_ACT_ERRNO(EACCES), call, 0);
  }
  // Signals to itself alone.
  const scmp_arg_cmp others{0, SCMP_CMP_NE, static_cast<scmp_datum_t>(getpid()), 0};
  for (const int call : {SCMP_SYS(kill), SCMP_SYS(tgkill)}) {
    seccomp_rule_add_array(filter.get(), SCMP_ACT_ERRNO(EACCES), call, 1, &others);
  }
  seccomp_attr_set(filter.get(), SCMP_FLTATR_CTL_TSYNC, 1);
  return seccomp_load(filter.get()) == 0;
}

}  // namespace

void Sandbox::AllowReading(const std::string& path) {
  read_.push_back(path);
}

void Sandbox::AllowWriting(const std::string& file) {
  std::error_code error;
  const fs::file_status status = fs::status(file, error);
  if (fs::exists(status) && !fs::is_regular_file(status) && !fs::is_directory(status)) {
    written_.push_back(file);
  } else {
    folders_.push_back(FolderOf(file));
  }
}

void Sandbox::AllowWritingIn(const std::string& folder) {
  folders_.push_back(folder);
}

Sandbox::Bounds Sandbox::Enter() const {
  Bounds bounds;
  const long version =
      syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION);
  // Pictures are moved from a folder to another, which the first version lets nobody do.
  if (version > 1) {
    landlock_ruleset_attr handles{};
    handles.handled_access_fs = version < 3 ? kHandled & ~kTruncate : kHandled;
    const std::uint64_t handled = handles.handled_access_fs;
    const Descriptor ruleset(
        static_cast<int>(syscall(SYS_landlock_create_ruleset, &handles, sizeof handles, 0)));
    if (ruleset.get() >= 0) {
      for (const char* path : kSystem) Allow(ruleset.get(), path, kReadRights, handled);
      for (const char* path : kDevices) {
        Allow(ruleset.get(), path, kReadRights | LANDLOCK_ACCESS_FS_WRITE_FILE, handled);
      }
      const char* const home = std::getenv("HOME");
      for (const OfTheUser& fonts : kFonts) {
        const char* const named = std::getenv(fonts.variable);
        if (!named && !home) continue;
        const fs::path base = named ? fs::path(named) : fs::path(home) / fonts.otherwise;
        if (base.is_absolute()) Allow(ruleset.get(), base / fonts.folder, kReadRights, handled);
      }
#ifdef __SANITIZE_ADDRESS__
      // Which leaks it shall not tell of is read as the process ends.
      const std::string options = std::getenv("LSAN_OPTIONS") ? std::getenv("LSAN_OPTIONS") : "";
      constexpr std::string_view kFile = "suppressions=";
      if (const std::size_t at = options.find(kFile); at != std::string::npos) {
        const std::size_t from = at + kFile.size();
        Allow(ruleset.get(), options.substr(from, options.find(':', from) - from), kReadRights,
              handled);
      }
#endif
      for (const std::string& path : read_) Allow(ruleset.get(), path, kReadRights, handled);
      for (const std::string& path : written_) Allow(ruleset.get(), path, kOfFiles, handled);
      for (const std::string& path : folders_) Allow(ruleset.get(), path, kWriteRights, handled);
      bounds.files = prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
                     syscall(SYS_landlock_restrict_self, ruleset.get(), 0) == 0;
    }
  }
  bounds.calls = BoundCalls();
  return bounds;
}

}  // namespace calmframe::host
