#include "host/media/output_file.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <memory>
#include <new>
#include <set>
#include <system_error>
#include <utility>

#include "host/media/clip.h"

namespace calmframe::media {
namespace {

[[noreturn]] void FailToWrite(const std::string& path, const std::string& cause) {
  throw Failure(Failure::Side::output, path + ": " + cause);
}

constexpr char kExists[] = "exists already (--overwrite replaces it)";
constexpr char kPrefix[] = ".calmframe-";
constexpr char kSuffix[] = ".part";

// What a program that was killed has left in the folder: who writes holds a lock on its part, which
// ends with it.
void Sweep(const std::filesystem::path& folder) {
  for (const std::string& name : NamesIn(folder.string())) {
    if (!name.starts_with(kPrefix) || !name.ends_with(kSuffix)) continue;
    const std::filesystem::path path = folder / name;
    const int part = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK);
    if (part < 0) continue;
    std::error_code ignored;
    if (flock(part, LOCK_EX | LOCK_NB) == 0) std::filesystem::remove_all(path, ignored);
    close(part);
  }
}

// The part's descriptor where nobody has swept it between its making and its locking; else -1, and
// EEXIST: another name, then.
int Locked(int part, const std::string& path) {
  if (part < 0) return -1;
  struct stat status;
  while (flock(part, LOCK_EX) != 0 && errno == EINTR) {  // other errors: without locks no sweep
  }
  int error = 0;
  if (fstat(part, &status) != 0) {
    error = errno;
    std::error_code ignored;
    std::filesystem::remove(path, ignored);
  } else if (status.st_nlink == 0) {
    error = EEXIST;
  }
  if (error == 0) return part;
  close(part);
  errno = error;
  return -1;
}

int Made(const std::string& path, bool is_folder) {
  if (!is_folder) return open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666);
  if (mkdir(path.c_str(), 0777) != 0) return -1;
  return open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
}

// What a file is, under any name.
using Identity = std::pair<dev_t, ino_t>;

std::set<Identity> IdentitiesOf(const std::vector<std::string>& paths) {
  std::set<Identity> identities;
  struct stat status;
  for (const std::string& path : paths) {
    if (stat(path.c_str(), &status) == 0) identities.emplace(status.st_dev, status.st_ino);
  }
  return identities;
}

// Whether there is something, which may be replaced.
bool Replaces(const std::string& path, const std::set<Identity>& sources, bool overwrite) {
  struct stat status;
  if (stat(path.c_str(), &status) != 0) {
    if (errno != ENOENT) FailToWrite(path, std::strerror(errno));
    return false;
  }
  if (sources.count({status.st_dev, status.st_ino}) > 0) FailToWrite(path, "is the input itself");
  if (S_ISDIR(status.st_mode)) FailToWrite(path, "is a directory");
  if (!S_ISREG(status.st_mode)) FailToWrite(path, "is not a file on disk");
  if (!overwrite) FailToWrite(path, kExists);
  return true;
}

std::string PlaceOf(const std::string& path, const std::string& source, bool overwrite) {
  if (!Replaces(path, IdentitiesOf({source}), overwrite)) return path;
  std::error_code error;
  const auto target = std::filesystem::canonical(path, error);
  return error ? path : target.string();
}

void GiveName(const std::string& part, const std::string& path, bool overwrite,
              const std::string& shown) {
  // Linking fails where renaming would replace a file that came up meanwhile.
  if (!overwrite && link(part.c_str(), path.c_str()) == 0) {
    unlink(part.c_str());
    return;
  }
  if (!overwrite && errno == EEXIST) FailToWrite(shown, kExists);
  if (std::rename(part.c_str(), path.c_str()) != 0) {
    FailToWrite(shown, std::string("can't be written: ") + std::strerror(errno));
  }
}

}  // namespace

std::vector<std::string> NamesIn(const std::string& folder) {
  const std::unique_ptr<DIR, int (*)(DIR*)> open(opendir(folder.empty() ? "." : folder.c_str()),
                                                 closedir);
  std::vector<std::string> names;
  while (const dirent* entry = open ? readdir(open.get()) : nullptr) {
    names.emplace_back(entry->d_name);
  }
  return names;
}

bool Synced(const std::string& path) {
  const int file = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (file < 0) return false;
  int flushed = 0;
  while ((flushed = fsync(file)) != 0 && errno == EINTR) {
  }
  const int error = errno;
  close(file);
  errno = error;
  return flushed == 0;
}

void SyncFolderOf(const std::string& path) {
  const std::string folder = std::filesystem::path(path).parent_path().string();
  Synced(folder.empty() ? "." : folder);
}

void MakeFolders(const std::string& path) {
  std::vector<std::filesystem::path> missing;
  for (std::filesystem::path one = path; !one.empty() && !std::filesystem::exists(one);
       one = one.parent_path()) {
    missing.push_back(one);
  }
  std::filesystem::create_directories(path);
  while (!missing.empty()) {
    SyncFolderOf(missing.back().string());
    missing.pop_back();
  }
}

OutputPart::OutputPart(const std::string& folder, bool is_folder, const std::string& shown) {
  static std::atomic<unsigned> serial = 0;
  const std::filesystem::path place(folder);
  Sweep(place);
  do {
    // A name of its own length, so that a long final name leaves room for it.
    path_ =
        (place / (kPrefix + std::to_string(getpid()) + "-" + std::to_string(serial++) + kSuffix))
            .string();
    lock_ = Locked(Made(path_, is_folder), path_);
  } while (lock_ < 0 && errno == EEXIST);
  if (lock_ < 0) {
    FailToWrite(shown,
                "can't be written: " + (errno == ENOENT ? "there is no folder " + folder
                                                        : std::string(std::strerror(errno))));
  }
}

OutputPart::~OutputPart() {
  if (unlink(path_.c_str()) != 0 && errno != ENOENT) {
    try {
      std::error_code ignored;
      std::filesystem::remove_all(path_, ignored);
    } catch (const std::bad_alloc&) {  // the next output in the folder sweeps it
    }
  }
  close(lock_);
}

OutputFile::OutputFile(const std::string& path, const std::string& source, bool overwrite)
    : shown_(path),
      overwrite_(overwrite),
      path_(PlaceOf(path, source, overwrite)),
      part_(std::filesystem::path(path_).parent_path().string(), false, path) {}

void OutputFile::Commit() {
  if (!Synced(temporary())) {
    FailToWrite(shown_, std::string("can't be written: ") + std::strerror(errno));
  }
  GiveName(temporary(), path_, overwrite_, shown_);
  SyncFolderOf(path_);
}

OutputPictures::OutputPictures(const NumberedPath& paths, const std::vector<std::string>& sources,
                               std::size_t count, bool overwrite, bool makes_folder)
    : paths_(paths),
      count_(static_cast<int>(count)),
      overwrite_(overwrite),
      made_folder_(makes_folder && mkdir(paths.folder.c_str(), 0777) == 0) {
  try {
    const std::set<Identity> identities = IdentitiesOf(sources);
    for (int i = 1; i <= count_; ++i) Replaces(paths_.At(i), identities, overwrite);
    part_.emplace(paths_.folder, true, paths_.At(1));
  } catch (...) {
    if (made_folder_) rmdir(paths_.folder.c_str());
    throw;
  }
}

OutputPictures::~OutputPictures() {
  part_.reset();
  if (made_folder_) rmdir(paths_.folder.c_str());  // where nothing came into it
}

NumberedPath OutputPictures::temporary() const {
  NumberedPath paths = paths_;
  paths.folder = part_->path() + '/';
  return paths;
}

void OutputPictures::Commit() {
  if (syncfs(part_->lock()) != 0) {
    FailToWrite(paths_.At(1), std::string("can't be written: ") + std::strerror(errno));
  }
  const NumberedPath written = temporary();
  for (int i = 1; i <= count_; ++i) {
    GiveName(written.At(i), paths_.At(i), overwrite_, paths_.At(i));
  }
  SyncFolderOf(paths_.At(1));
  if (made_folder_) SyncFolderOf(std::filesystem::path(paths_.At(1)).parent_path().string());
}

}  // namespace calmframe::media
