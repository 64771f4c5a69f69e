#include "host/batch/child.h"

#include <fcntl.h>
#include <linux/close_range.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

namespace calmframe::batch {
namespace {

constexpr std::size_t kLongestLine = 1 << 20;

[[noreturn]] void ThrowError() {
  throw std::system_error(errno, std::generic_category());
}

// Between fork and exec of a program with threads: system calls alone. Another thread may hold any
// lock.
[[noreturn]] void Become(char* const* words, pid_t parent, int says, int kept) {
  // posix_spawn has no place for this.
  prctl(PR_SET_PDEATHSIG, SIGTERM);
  if (getppid() != parent) _exit(127);  // it has ended meanwhile
  setpgid(0, 0);
  const int none = open("/dev/null", O_RDONLY);
  if (none < 0 || dup2(none, 0) < 0 || dup2(says, 1) < 0 || dup2(says, 2) < 0) _exit(127);
  // Not all that is open closes by itself: sockets of a library's, and what was opened this moment.
  syscall(SYS_close_range, 3u, ~0u, CLOSE_RANGE_CLOEXEC);
  if (kept >= 0) fcntl(kept, F_SETFD, 0);
  // nohup's, and what the program does by itself, go on; handlers don't outlast exec.
  execv(words[0], words);
  _exit(127);
}

}  // namespace

Child::Child(const std::vector<std::string>& words, int kept) {
  std::vector<char*> arguments;
  for (const std::string& word : words) arguments.push_back(const_cast<char*>(word.c_str()));
  arguments.push_back(nullptr);
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) ThrowError();
  const pid_t parent = getpid();
  process_ = fork();
  if (process_ == 0) Become(arguments.data(), parent, ends[1], kept);
  const int error = errno;
  close(ends[1]);
  says_ = ends[0];
  if (process_ > 0) return;
  close(says_);
  throw std::system_error(error, std::generic_category());
}

Child::~Child() {
  AskToEnd();
  close(says_);
  Wait();
}

Child::Said Child::Next(std::string& line, int milliseconds) {
  for (;;) {
    if (const std::size_t end = text_.find('\n', looked_); end != std::string::npos) {
      line = text_.substr(0, end);
      text_.erase(0, end + 1);
      looked_ = 0;
      return Said::line;
    }
    looked_ = text_.size();
    pollfd waited{says_, POLLIN, 0};
    const int ready = poll(&waited, 1, milliseconds);
    if (ready == 0 || (ready < 0 && errno == EINTR)) return Said::nothing;
    char part[4096];
    const ssize_t got = read(says_, part, sizeof part);
    if (got < 0 && errno == EINTR) continue;
    if (got > 0) {
      // A newline that comes late ends the line all the same.
      const auto size = static_cast<std::size_t>(got);
      if (text_.size() < kLongestLine) {
        text_.append(part, size);
      } else if (std::find(part, part + size, '\n') != part + size) {
        text_.append(std::find(part, part + size, '\n'), part + size);
      }
      continue;
    }
    if (text_.empty()) return Said::end;
    line.swap(text_);
    text_.clear();
    looked_ = 0;
    return Said::line;
  }
}

void Child::AskToEnd() {
  if (is_asked_ || has_ended_) return;
  is_asked_ = true;
  kill(process_, SIGTERM);
}

void Child::Kill() {
  if (has_ended_) return;
  kill(-process_, SIGKILL);
  kill(process_, SIGKILL);  // one that has left its group
}

int Child::Wait() {
  if (has_ended_) return 0;
  int status = 0;
  while (waitpid(process_, &status, 0) < 0 && errno == EINTR) {
  }
  has_ended_ = true;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

}  // namespace calmframe::batch
