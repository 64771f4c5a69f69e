#pragma once

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "tests/faults/faults_run.h"

// Changes of the folder FAULTS_ROOT: written down, or the last that a run makes.
namespace faults {

// Whether changes are told, or ended at.
bool Watches();

// The name without links in its folders; empty outside of the root.
struct Place {
  char path[PATH_MAX] = "";

  Place() = default;
  Place(int folder, const char* name);
  explicit Place(int file);
  explicit operator bool() const { return path[0] != 0; }
};
// The same, empty where nobody watches.
Place PlaceAt(int folder, const char* name);

// The change that an object of this is made for happens within its life, and is the only one.
class Change {
 public:
  explicit Change(bool is_inside);
  ~Change();
  Change(const Change&) = delete;
  Change& operator=(const Change&) = delete;

  bool is_end() const { return is_end_; }

  void Tell(const char* operation, std::uint64_t inode, std::int64_t offset, const void* bytes,
            std::int64_t size, const char* path, const char* second = "") const;

 private:
  const bool is_inside_;
  bool is_end_ = false;
};

std::uint64_t InodeOf(int file);
// Of a file that was written by the C library within itself.
void TellWhole(const Change& change, const Place& place);

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

}  // namespace faults
