#include "host/media/file_pattern.h"

#include <dirent.h>
#include <glob.h>
#include <sys/stat.h>

#include <cerrno>
#include <climits>
#include <cstddef>

namespace calmframe::media {
namespace {

constexpr std::size_t kMostSpelled = 1000;
constexpr int kMostNames = 1'000'000;
constexpr int kNamesAFolder = 100;  // that opening it counts for

// What glob calls knows no caller.
thread_local int names_left = 0;

bool SpellsTooMany(const std::string& pattern) {
  if (pattern.size() > PATH_MAX) return true;
  // At most: as if each brace stood beside the others.
  std::vector<std::size_t> open;
  std::size_t spelled = 1;
  for (const char c : pattern) {
    if (c == '{') open.push_back(1);
    if (c == ',' && !open.empty()) ++open.back();
    if (c == '}' && !open.empty()) {
      spelled *= open.back();
      open.pop_back();
      if (spelled > kMostSpelled) return true;
    }
  }
  return false;
}

void* Open(const char* folder) {
  names_left -= kNamesAFolder;
  if (names_left > 0) return opendir(folder);
  errno = E2BIG;
  return nullptr;
}

dirent* Next(void* folder) {
  return --names_left > 0 ? readdir(static_cast<DIR*>(folder)) : nullptr;
}

void Close(void* folder) {
  closedir(static_cast<DIR*>(folder));
}

int EndsAt(const char*, int error) {
  return error == E2BIG ? 1 : 0;
}

}  // namespace

std::vector<std::string> FilesNamedLike(const std::string& pattern) {
  if (SpellsTooMany(pattern)) return {};
  names_left = kMostNames;
  glob_t found{};
  found.gl_opendir = Open;
  found.gl_readdir = Next;
  found.gl_closedir = Close;
  found.gl_stat = [](const char* path, struct stat* status) { return stat(path, status); };
  found.gl_lstat = [](const char* path, struct stat* status) { return lstat(path, status); };
  std::vector<std::string> files;
  const int error = glob(pattern.c_str(), GLOB_BRACE | GLOB_ALTDIRFUNC, EndsAt, &found);
  if (error == 0 && names_left > 0) {
    files.assign(found.gl_pathv, found.gl_pathv + found.gl_pathc);
  }
  globfree(&found);
  return files;
}

}  // namespace calmframe::media
