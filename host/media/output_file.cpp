#include "host/media/output_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <system_error>

#include "host/media/clip.h"

namespace calmframe::media {
namespace {

[[noreturn]] void Fail(const std::string& path, const std::string& cause) {
  throw Failure(Failure::Side::output, path + ": " + cause);
}

constexpr char kPrefix[] = ".calmframe-";
constexpr char kSuffix[] = ".part";

// What a program that was killed has left in the folder: who writes holds a lock on its file, which
// ends with it.
void Sweep(const std::filesystem::path& folder) {
  std::error_code error;
  for (std::filesystem::directory_iterator entry(folder.empty() ? "." : folder, error), end;
       !error && entry != end; entry.increment(error)) {
    const std::string name = entry->path().filename().string();
    if (!name.starts_with(kPrefix) || !name.ends_with(kSuffix)) continue;
    const int file = open(entry->path().c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK);
    if (file < 0) continue;
    if (flock(file, LOCK_EX | LOCK_NB) == 0) unlink(entry->path().c_str());
    close(file);
  }
}

// The file's descriptor where nobody has swept it between its making and its locking; else -1.
int Locked(int file) {
  if (file < 0) return -1;
  struct stat status;
  while (flock(file, LOCK_EX) != 0 && errno == EINTR) {  // other errors: without locks no sweep
  }
  if (fstat(file, &status) == 0 && status.st_nlink > 0) return file;
  close(file);
  errno = EEXIST;  // another name, then
  return -1;
}

}  // namespace

OutputFile::OutputFile(const std::string& path, const std::string& source, bool overwrite)
    : shown_(path), overwrite_(overwrite), path_(path) {
  struct stat status;
  if (stat(path.c_str(), &status) == 0) {
    struct stat source_status;
    if (!source.empty() && stat(source.c_str(), &source_status) == 0 &&
        source_status.st_dev == status.st_dev && source_status.st_ino == status.st_ino) {
      Fail(path, "is the input itself");
    }
    if (S_ISDIR(status.st_mode)) Fail(path, "is a directory");
    if (!S_ISREG(status.st_mode)) Fail(path, "is not a file on disk");
    if (!overwrite) Fail(path, "exists already (--overwrite replaces it)");
    std::error_code error;
    const auto target = std::filesystem::canonical(path, error);
    if (!error) path_ = target.string();
  } else if (errno != ENOENT) {
    Fail(path, std::strerror(errno));
  }
  // A name of its own length, so that a long final name leaves room for it.
  static std::atomic<unsigned> serial = 0;
  const std::filesystem::path folder = std::filesystem::path(path_).parent_path();
  Sweep(folder);
  do {
    temporary_ =
        (folder / (kPrefix + std::to_string(getpid()) + "-" + std::to_string(serial++) + kSuffix))
            .string();
    lock_ = Locked(open(temporary_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666));
  } while (lock_ < 0 && errno == EEXIST);
  if (lock_ < 0) {
    const int error = errno;
    temporary_.clear();
    Fail(path, "can't be written: " + (error == ENOENT ? "there is no folder " + folder.string()
                                                       : std::string(std::strerror(error))));
  }
}

OutputFile::~OutputFile() {
  if (!temporary_.empty()) unlink(temporary_.c_str());
  close(lock_);
}

void OutputFile::Commit() {
  const int file = open(temporary_.c_str(), O_RDONLY | O_CLOEXEC);
  const bool flushed = file >= 0 && fsync(file) == 0;
  const int error = errno;
  if (file >= 0) close(file);
  if (!flushed) Fail(shown_, std::string("can't be written: ") + std::strerror(error));
  // Linking fails where renaming would replace a file that came up meanwhile.
  if (!overwrite_ && link(temporary_.c_str(), path_.c_str()) == 0) {
    unlink(temporary_.c_str());
    temporary_.clear();
    return;
  }
  if (!overwrite_ && errno == EEXIST) Fail(shown_, "exists already (--overwrite replaces it)");
  if (std::rename(temporary_.c_str(), path_.c_str()) != 0) {
    Fail(shown_, std::string("can't be written: ") + std::strerror(errno));
  }
  temporary_.clear();
}

}  // namespace calmframe::media
