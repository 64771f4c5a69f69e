#include "host/batch/files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <nlohmann/json.hpp>
#include <system_error>

#include "host/base/json_bounds.h"
#include "host/batch/clip_names.h"
#include "host/media/output_file.h"

namespace calmframe::batch {
namespace {

constexpr char kPartSuffix[] = ".part";

}  // namespace

std::optional<FileIdentity> IdentityOf(const std::string& path) {
  struct stat status;
  if (stat(path.c_str(), &status) != 0 || !S_ISREG(status.st_mode)) return std::nullopt;
  return FileIdentity{status.st_size,
                      std::int64_t{status.st_mtim.tv_sec} * 1000000000 + status.st_mtim.tv_nsec};
}

nlohmann::ordered_json JsonOf(const FileIdentity& identity) {
  return {{"size", identity.size}, {"modified", identity.modified}};
}

FileIdentity IdentityOf(const nlohmann::ordered_json& json) {
  return {WholeOf(json.at("size")), WholeOf(json.at("modified"))};
}

bool WriteWhole(const std::string& path, const std::string& text) {
  // Unique for a process of any machine that shares the folder.
  char machine[65] = "";
  gethostname(machine, sizeof machine - 1);
  const std::string part = path + "." + machine + "-" + std::to_string(getpid()) + kPartSuffix;
  std::ofstream file(part, std::ios::binary | std::ios::trunc);
  file << text;
  file.close();
  // Bytes first: of a name without them the end of the machine would leave an empty file.
  if (file && media::Synced(part) && std::rename(part.c_str(), path.c_str()) == 0) {
    media::SyncFolderOf(path);
    return true;
  }
  const int error = errno;
  unlink(part.c_str());
  errno = error;
  return false;
}

void SweepParts(const std::string& folder) {
  for (const std::string& name : media::NamesIn(folder)) {
    std::error_code ignored;
    if (name.ends_with(kPartSuffix)) std::filesystem::remove_all(folder + "/" + name, ignored);
  }
}

std::optional<nlohmann::ordered_json> ReadObject(const std::string& path, std::int64_t most) {
  // In a folder that others write into there may be anything, such as a pipe that nobody feeds.
  const auto there = IdentityOf(path);
  if (!there || there->size > most) return std::nullopt;
  std::string text;
  try {
    std::ifstream file(path, std::ios::binary);
    text.assign(std::istreambuf_iterator<char>(file), {});
  } catch (const std::ios_base::failure&) {  // of the disk, which iterators throw
    return std::nullopt;
  }
  if (ExceedsBounds(text)) return std::nullopt;
  auto object = nlohmann::ordered_json::parse(text, nullptr, false);
  if (!object.is_object()) return std::nullopt;
  return object;
}

FileLock::FileLock(const std::string& path)
    : file_(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0666)) {
  if (file_ < 0) throw std::system_error(errno, std::generic_category());
  // Of the open file, not of the process: threads of one process keep each other out too, and it is
  // not lost where the file is opened and closed elsewhere.
  struct flock whole = {};
  whole.l_type = F_WRLCK;
  whole.l_whence = SEEK_SET;
  int taken = -1;
  do {
    taken = fcntl(file_, F_OFD_SETLK, &whole);
  } while (taken != 0 && errno == EINTR);
  if (taken != 0 && errno != EAGAIN && errno != EACCES) {
    const int error = errno;
    close(file_);
    throw std::system_error(error, std::generic_category());
  }
  is_held_ = taken == 0;
}

FileLock::~FileLock() {
  close(file_);
}

}  // namespace calmframe::batch
