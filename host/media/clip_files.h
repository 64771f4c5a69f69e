#pragma once

#include <optional>
#include <string>
#include <vector>

namespace calmframe::media {

// The paths of numbered pictures: one %d or %04d in the last part stands for the number.
struct NumberedPath {
  std::string folder;  // up to its last /; may be empty
  std::string before, after;
  int digits = 0;  // at least, zeros in front; 0: as many as it takes

  // None where there is no such place, or a second %.
  static std::optional<NumberedPath> Of(const std::string& path);
  std::string At(int number) const;
  std::string Pattern() const;  // as FFmpeg knows them
};

// What a clip's name stands for on the disk.
struct ClipFiles {
  std::vector<std::string> paths;  // one file, or the pictures of a sequence in their order
  // Of a sequence what FFmpeg knows it by, with an absolute path; else empty.
  std::string pattern;
  bool is_glob = false;  // the pattern is; else its pictures are numbered
  int first_number = 0;  // of numbered pictures
};

// Of a plain file; of "-" (standard input) and of a FIFO, which are read to their end the first
// time and kept, in $TMPDIR without a name, until the program ends; of pictures named by f%04d.png,
// by a glob, or by the folder that holds them: of the kind that most of it are, in the order of
// their names. Throws Failure (input): nothing is there, or none of these; a number is missing; the
// order of the names isn't that of their numbers; a signal came while a pipe was waited for. Any
// thread.
ClipFiles FilesOf(const std::string& path);

// Whether the name stands for pictures that are there.
bool IsSequence(const std::string& path);

}  // namespace calmframe::media
