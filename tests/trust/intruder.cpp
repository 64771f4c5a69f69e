// What a fault in a decoder could be made to do: preloaded, it stands in for the calls that open
// a clip and take packets from it, and tries one door after the other from there, on whatever
// thread that is. Writes a line a door, "NAME open" or "NAME closed", to the file INTRUDER_REPORT;
// what it reaches for lies in the folder INTRUDER_TARGET, and in INTRUDER_OUTPUT, where the program
// writes.

#include <arpa/inet.h>
#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <sched.h>
#include <spawn.h>
#include <sys/ptrace.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <string>

extern char** environ;

namespace {

int report = -1;

std::string Environment(const char* name) {
  const char* const value = std::getenv(name);
  return value ? value : "";
}

// Before main, so before any border.
[[gnu::constructor]] void OpenReport() {
  report =
      open(Environment("INTRUDER_REPORT").c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0600);
}

void Tell(const char* door, bool is_open) {
  dprintf(report, "%s %s\n", door, is_open ? "open" : "closed");
}

bool Opens(const std::string& path, int flags) {
  const int file = open(path.c_str(), flags | O_CLOEXEC, 0600);
  if (file >= 0) close(file);
  return file >= 0;
}

bool Runs(const char* program) {
  std::string name = program;
  char* const words[] = {name.data(), nullptr};
  pid_t child = 0;
  if (posix_spawn(&child, program, nullptr, nullptr, words, environ) != 0) return false;
  int status = 0;
  return waitpid(child, &status, 0) == child && WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

bool HasSocket(int family, int type) {
  const int made = socket(family, type | SOCK_CLOEXEC, 0);
  if (made >= 0) close(made);
  return made >= 0;
}

bool Follows(pid_t process) {
  if (ptrace(PTRACE_SEIZE, process, nullptr, nullptr) != 0) return false;
  ptrace(PTRACE_DETACH, process, nullptr, nullptr);
  return true;
}

void TryAll() {
  const std::string target = Environment("INTRUDER_TARGET");
  const std::string output = Environment("INTRUDER_OUTPUT");
  const std::string secret = target + "/secret", victim = target + "/victim";
  DIR* const folder = opendir(target.c_str());
  Tell("list", folder != nullptr);
  if (folder) closedir(folder);
  Tell("read", Opens(secret, O_RDONLY));
  Tell("read-by-link", symlink(secret.c_str(), (output + "/by-link").c_str()) == 0 &&
                           Opens(output + "/by-link", O_RDONLY));
  Tell("read-under-another-name", link(secret.c_str(), (output + "/another").c_str()) == 0 &&
                                      Opens(output + "/another", O_RDONLY));
  Tell("write", Opens(victim, O_WRONLY));
  Tell("make", Opens(target + "/made", O_WRONLY | O_CREAT | O_EXCL));
  Tell("truncate", truncate(victim.c_str(), 1) == 0);
  Tell("change-mode", chmod(victim.c_str(), 0600) == 0);
  Tell("rename", rename(victim.c_str(), (target + "/renamed").c_str()) == 0);
  Tell("remove", unlink((target + "/removed").c_str()) == 0);
  Tell("environment-of-parent", Opens("/proc/" + std::to_string(getppid()) + "/environ", O_RDONLY));
  Tell("network", HasSocket(AF_INET, SOCK_STREAM));
  Tell("network-packets", HasSocket(AF_INET6, SOCK_DGRAM));
  Tell("local-services", HasSocket(AF_UNIX, SOCK_STREAM));
  Tell("run", Runs("/bin/true"));
  Tell("signal-parent", kill(getppid(), 0) == 0);
  Tell("trace-parent", Follows(getppid()));
  Tell("memory-of-parent", Opens("/proc/" + std::to_string(getppid()) + "/mem", O_RDONLY));
  char parameters[256] = {};
  const long ring = syscall(SYS_io_uring_setup, 1, parameters);
  Tell("ring-of-calls", ring >= 0);
  if (ring >= 0) close(static_cast<int>(ring));
  // Last: from here on it would be another user.
  Tell("own-namespace", unshare(CLONE_NEWNS) == 0);
}

void TryOnce() {
  static std::once_flag once;
  std::call_once(once, TryAll);
}

template <class Call>
Call* Real(const char* name) {
  return reinterpret_cast<Call*>(dlsym(RTLD_NEXT, name));
}

}  // namespace

extern "C" int avformat_open_input(void** clip, const char* name, const void* format,
                                   void** options) {
  TryOnce();
  static auto* const real = Real<decltype(avformat_open_input)>("avformat_open_input");
  return real(clip, name, format, options);
}

extern "C" int av_read_frame(void* clip, void* packet) {
  TryOnce();
  static auto* const real = Real<decltype(av_read_frame)>("av_read_frame");
  return real(clip, packet);
}
