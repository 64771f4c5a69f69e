#pragma once

#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

namespace calmframe::fuzz {

// A file in a folder of its own below $TMPDIR, which goes with the object, and what else is there.
class ScratchFile {
 public:
  ScratchFile() {
    std::string folder = std::filesystem::temp_directory_path() / "calmframe-fuzz-XXXXXX";
    if (!mkdtemp(folder.data())) std::abort();
    folder_ = folder;
  }
  ~ScratchFile() {
    std::error_code ignored;
    std::filesystem::remove_all(folder_, ignored);
  }
  ScratchFile(const ScratchFile&) = delete;
  ScratchFile& operator=(const ScratchFile&) = delete;

  const std::string& folder() const { return folder_; }
  std::string path() const { return folder_ + "/file"; }
  void Write(const std::string& bytes) const {
    std::ofstream(path(), std::ios::binary | std::ios::trunc) << bytes;
  }

 private:
  std::string folder_;
};

}  // namespace calmframe::fuzz
