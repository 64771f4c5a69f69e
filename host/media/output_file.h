#pragma once

#include <string>

namespace calmframe::media {

// A file that gets its name only when it is whole: written under another name in the same folder,
// which is removed unless Commit succeeds. What programs that were killed have left in the folder
// is removed too.
class OutputFile {
 public:
  // Throws Failure (output): `path` exists and overwrite is off, is `source` under any name, is
  // not a plain file, or its folder can't be written.
  OutputFile(const std::string& path, const std::string& source, bool overwrite);
  ~OutputFile();
  OutputFile(const OutputFile&) = delete;
  OutputFile& operator=(const OutputFile&) = delete;

  const std::string& temporary() const { return temporary_; }
  // Flushes to the disk and renames. Throws Failure (output).
  void Commit();

 private:
  const std::string shown_;
  const bool overwrite_;
  std::string path_;  // links followed
  std::string temporary_;
  int lock_ = -1;  // a descriptor of it, whose lock tells that it is being written
};

}  // namespace calmframe::media
