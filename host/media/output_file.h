#pragma once

#include <optional>
#include <string>
#include <vector>

#include "host/media/clip_files.h"

namespace calmframe::media {

// Has what a file holds, or the names that a folder has by now, outlast an end of the machine.
// False with errno where that can't be had.
bool Synced(const std::string& path);

// Of the folder of `path`: a name that it was given lasts. Not every kind of disk does that for a
// folder, and the file is whole under either name, so that nothing is told.
void SyncFolderOf(const std::string& path);

// What a folder has, "." and ".." too; nothing where it can't be read. The standard library's own
// way there ends the process where it finds no memory. Empty is the present folder.
std::vector<std::string> NamesIn(const std::string& folder);

// Makes a folder with those above it that are missing; they last. Throws std::system_error.
void MakeFolders(const std::string& path);

// What is being written, a file or a folder, under a name of its own until it is whole; it goes
// with this object. What programs that were killed have left in the same folder is removed too.
class OutputPart {
 public:
  // In `folder`, which may be empty for the present one. Throws Failure (output), of `shown`.
  OutputPart(const std::string& folder, bool is_folder, const std::string& shown);
  ~OutputPart();
  OutputPart(const OutputPart&) = delete;
  OutputPart& operator=(const OutputPart&) = delete;

  const std::string& path() const { return path_; }
  // A descriptor of it, whose lock tells that it is being written.
  int lock() const { return lock_; }

 private:
  std::string path_;
  int lock_ = -1;
};

// A file that gets its name only when it is whole.
class OutputFile {
 public:
  // Throws Failure (output): `path` exists and overwrite is off, is `source` under any name, is
  // not a plain file, or its folder can't be written.
  OutputFile(const std::string& path, const std::string& source, bool overwrite);

  const std::string& temporary() const { return part_.path(); }
  // Flushes to the disk and renames. Throws Failure (output).
  void Commit();

 private:
  const std::string shown_;
  const bool overwrite_;
  const std::string path_;  // links followed
  OutputPart part_;
};

// Pictures that get their names only when all of them are whole.
class OutputPictures {
 public:
  // Of the numbers 1 to `count`. A last folder that isn't there is made if `makes_folder`. Throws
  // Failure (output) as OutputFile does.
  OutputPictures(const NumberedPath& paths, const std::vector<std::string>& sources,
                 std::size_t count, bool overwrite, bool makes_folder);
  ~OutputPictures();
  OutputPictures(const OutputPictures&) = delete;
  OutputPictures& operator=(const OutputPictures&) = delete;

  // Where they are written.
  NumberedPath temporary() const;
  // Flushes to the disk and renames. Throws Failure (output).
  void Commit();

 private:
  const NumberedPath paths_;
  const int count_;
  const bool overwrite_;
  const bool made_folder_;
  std::optional<OutputPart> part_;
};

}  // namespace calmframe::media
