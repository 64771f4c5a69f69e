#pragma once

#include <string>
#include <vector>

namespace calmframe::media {

// What a clip's name stands for on the disk.
struct ClipFiles {
  std::vector<std::string> paths;  // one file, or the pictures of a sequence in their order
  // Of a sequence what FFmpeg knows it by, with an absolute path; else empty.
  std::string pattern;
  bool is_glob = false;  // the pattern is; else its pictures are numbered
  int first_number = 0;  // of numbered pictures
};

// Of a plain file; of "-" (standard input) and of a FIFO, which are read to their end the first
// time and kept, without a name, where temporary files go, as long as the program runs; of pictures
// named by f%04d.png, by a glob, or by the folder that holds them, in each a picture for every
// number, in the order of their names. Throws Failure (input): nothing is there, or neither of
// these; a number is missing; the names' order isn't that of their numbers. Any thread.
ClipFiles FilesOf(const std::string& path);

// Whether the name stands for pictures that are there.
bool IsSequence(const std::string& path);

// Whether FFmpeg takes a file of that extension (".png") for a picture.
bool IsPictureExtension(const std::string& extension);

}  // namespace calmframe::media
