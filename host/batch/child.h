#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace calmframe::batch {

// A program that runs beside this one: its crash is its own, and it is asked to end when this one
// ends in whatever way, or when the thread does that started it. It has a process group of its own,
// so that a Ctrl-C reaches it once, from here, and inherits no descriptor but those that are named.
// For one thread.
class Child {
 public:
  // words: the program's path first. It reads nothing; what it says by either stream comes as
  // lines. kept: a descriptor that it inherits. Throws std::system_error where it can't be started.
  explicit Child(const std::vector<std::string>& words, int kept = -1);
  // Asks it to end if it runs, and waits.
  ~Child();
  Child(const Child&) = delete;
  Child& operator=(const Child&) = delete;

  enum class Said { line, nothing, end };
  // The next line that it says, or says at its end without a newline; nothing: not within that
  // time. Of a line of more than a megabyte the rest is left out.
  Said Next(std::string& line, int milliseconds);
  // Asks it to end, once.
  void AskToEnd();
  // Ends it and what it has started, whether it listens or not.
  void Kill();
  // Waits for its end: its exit code, or 128 + the signal that ended it.
  int Wait();

 private:
  pid_t process_ = -1;
  int says_ = -1;
  std::string text_;
  std::size_t looked_ = 0;  // bytes at its front without a newline
  bool is_asked_ = false;
  bool has_ended_ = false;
};

}  // namespace calmframe::batch
