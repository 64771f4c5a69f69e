#pragma once

#include <string>
#include <vector>

namespace calmframe::host {

// What a process may still do that works with files of strangers: a fault in a decoder, which such
// a file may have been made for, reaches no other file, no network and no other program. Files are
// bounded by Landlock, the rest by a filter of system calls (seccomp); both need Linux, hold for
// the calling thread and all that it starts, and can't be taken back.
class Sandbox {
 public:
  // A file, or a folder with all below it, may be read; links are followed. What isn't there adds
  // nothing, so that whoever opens it is told so.
  void AllowReading(const std::string& path);
  // A file may be written, and read, also in parts beside it and under other names in its folder:
  // so all of the folder may. Of what is there and no plain file, such as a pipe, it alone may.
  void AllowWriting(const std::string& file);
  // A folder with all below it may be read and written.
  void AllowWritingIn(const std::string& folder);

  struct Bounds {
    bool files = false, calls = false;
  };
  // Before any thread is started. What the kernel doesn't have, or doesn't let the process do, is
  // left out; the result says what holds.
  Bounds Enter() const;

 private:
  std::vector<std::string> read_, written_, folders_;
};

}  // namespace calmframe::host
