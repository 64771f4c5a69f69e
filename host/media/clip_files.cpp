#include "host/media/clip_files.h"

#include <fcntl.h>
#include <glob.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <map>
#include <mutex>
#include <optional>
#include <utility>

#include "host/media/ffmpeg.h"

namespace calmframe::media {
namespace {

namespace fs = std::filesystem;

[[noreturn]] void Refuse(const std::string& path, const std::string& cause) {
  throw Failure(Failure::Side::input, path + ": " + cause);
}

bool IsDigit(char c) {
  return c >= '0' && c <= '9';
}

// A file without a name, open for reading and writing; -1 with errno.
int Nameless(const fs::path& folder) {
  const int file = open(folder.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600);
  if (file >= 0 || (errno != EOPNOTSUPP && errno != EISDIR)) return file;
  std::string name = folder / "calmframe-XXXXXX";
  const int named = mkostemp(name.data(), O_CLOEXEC);
  if (named >= 0) unlink(name.c_str());
  return named;
}

// Reads a pipe to its end.
int Copied(const std::string& shown, const std::string& path) {
  const int from = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (from < 0) Refuse(shown, std::strerror(errno));
  std::error_code error;
  const fs::path folder = fs::temp_directory_path(error);
  const int to = Nameless(folder);
  std::vector<char> bytes(1 << 20);
  ssize_t got = to < 0 ? -1 : 1;
  bool kept = to >= 0;
  while (kept && (got = read(from, bytes.data(), bytes.size())) != 0) {
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) break;
    for (ssize_t done = 0, put = 0; kept && done < got; done += put) {
      put = write(to, bytes.data() + done, static_cast<std::size_t>(got - done));
      kept = put > 0;
    }
  }
  const int cause = errno;
  close(from);
  if (kept && got == 0) return to;
  if (to >= 0) close(to);
  Refuse(shown, (kept ? "can't be read: " : "can't be kept in " + folder.string() + ": ") +
                    std::strerror(cause));
}

std::string KeptPipe(const std::string& shown, const std::string& path, const struct stat& pipe) {
  static std::mutex mutex;
  static std::map<std::pair<dev_t, ino_t>, int> kept;  // open until the program ends
  const std::lock_guard lock(mutex);
  const auto [place, is_new] = kept.try_emplace({pipe.st_dev, pipe.st_ino}, -1);
  if (is_new) {
    try {
      place->second = Copied(shown, path);
    } catch (...) {
      kept.erase(place);
      throw;
    }
  }
  return "/proc/self/fd/" + std::to_string(place->second);
}

// The number that begins in front of the first character in which two names differ.
std::optional<std::pair<std::string, std::string>> Numbers(const std::string& a,
                                                           const std::string& b) {
  std::size_t at = 0;
  while (at < a.size() && at < b.size() && a[at] == b[at]) ++at;
  while (at > 0 && IsDigit(a[at - 1])) --at;
  const auto number = [at](const std::string& name) {
    std::size_t begin = std::min(name.find_first_not_of('0', at), name.size()), end = begin;
    while (end < name.size() && IsDigit(name[end])) ++end;
    return at < name.size() && IsDigit(name[at]) ? name.substr(begin, end - begin) : "-";
  };
  if (number(a) == "-" || number(b) == "-") return {};
  return std::pair{number(a), number(b)};
}

void CheckPictures(const std::string& shown, const std::vector<std::string>& paths) {
  for (std::size_t i = 0; i < paths.size(); ++i) {
    std::error_code error;
    if (!fs::is_regular_file(paths[i], error)) Refuse(paths[i], "is not a file on disk");
    if (i == 0) continue;
    const auto numbers = Numbers(paths[i - 1], paths[i]);
    if (!numbers) continue;
    const auto& [before, after] = *numbers;
    if (before.size() > after.size() || (before.size() == after.size() && before > after)) {
      Refuse(shown, "its pictures would come in the order of their names, " +
                        fs::path(paths[i - 1]).filename().string() + " before " +
                        fs::path(paths[i]).filename().string() +
                        "; a name like f%d.png goes by the numbers");
    }
  }
}

ClipFiles Globbed(const std::string& shown, const std::string& pattern) {
  ClipFiles files;
  files.is_glob = true;
  files.pattern = fs::absolute(pattern).string();
  glob_t found{};
  if (glob(files.pattern.c_str(), 0, nullptr, &found) == 0) {
    files.paths.assign(found.gl_pathv, found.gl_pathv + found.gl_pathc);
  }
  globfree(&found);
  if (files.paths.empty()) Refuse(shown, "no file has such a name");
  CheckPictures(shown, files.paths);
  return files;
}

ClipFiles InFolder(const std::string& shown) {
  std::map<std::string, int> extensions;
  std::error_code error;
  for (const auto& entry : fs::directory_iterator(shown, error)) {
    const fs::path name = entry.path().filename();
    if (name.string()[0] != '.' && IsPictureExtension(name.extension())) {
      ++extensions[name.extension()];
    }
  }
  if (extensions.empty()) Refuse(shown, "is a directory without pictures");
  const auto most =
      std::max_element(extensions.begin(), extensions.end(),
                       [](const auto& a, const auto& b) { return a.second < b.second; });
  std::string escaped;
  for (const char c : fs::absolute(shown).string()) {
    if (std::strchr("*?[]{}\\", c)) escaped += '\\';
    escaped += c;
  }
  return Globbed(shown, escaped + "/*" + most->first);
}

// %d or %04d in a file's name, which stands for a number.
struct NumberedName {
  std::string before, after;
  int digits = 0;
};

std::optional<NumberedName> NumberedNameOf(const std::string& name) {
  const std::size_t percent = name.find('%');
  if (percent == std::string::npos) return {};
  std::size_t end = percent + 1;
  while (end < name.size() && IsDigit(name[end])) ++end;
  if (end == name.size() || name[end] != 'd' || end > percent + 4) return {};
  NumberedName numbered{name.substr(0, percent), name.substr(end + 1)};
  numbered.digits = std::atoi(name.substr(percent + 1, end - percent - 1).c_str());
  if (numbered.after.find('%') != std::string::npos) return {};
  return numbered;
}

ClipFiles Numbered(const std::string& shown, const NumberedName& name) {
  const fs::path folder = fs::absolute(shown).parent_path();
  std::vector<int> numbers;
  std::error_code error;
  const auto text_of = [&](int number) {
    std::string digits = std::to_string(number);
    const auto least = static_cast<std::size_t>(name.digits);
    if (digits.size() < least) digits.insert(0, least - digits.size(), '0');
    return name.before + digits + name.after;
  };
  for (const auto& entry : fs::directory_iterator(folder, error)) {
    const std::string text = entry.path().filename();
    constexpr std::size_t kMostDigits = 9;
    if (text.size() <= name.before.size() + name.after.size() ||
        text.size() > name.before.size() + name.after.size() + kMostDigits) {
      continue;
    }
    const int number = std::atoi(text.c_str() + name.before.size());
    if (text_of(number) == text) numbers.push_back(number);
  }
  if (numbers.empty()) Refuse(shown, "no file has such a name");
  std::sort(numbers.begin(), numbers.end());
  ClipFiles files;
  files.pattern = fs::absolute(shown).string();
  files.first_number = numbers.front();
  for (std::size_t i = 0; i < numbers.size(); ++i) {
    const int expected = files.first_number + static_cast<int>(i);
    if (numbers[i] != expected) Refuse(shown, text_of(expected) + " is missing");
    files.paths.push_back(folder / text_of(expected));
  }
  CheckPictures(shown, files.paths);
  return files;
}

}  // namespace

bool IsPictureExtension(const std::string& extension) {
  const AVOutputFormat* format = av_guess_format(nullptr, ("%d" + extension).c_str(), nullptr);
  return format && std::strcmp(format->name, "image2") == 0;
}

ClipFiles FilesOf(const std::string& path) {
  const std::string place = path == "-" ? "/dev/stdin" : path;
  struct stat status;
  if (stat(place.c_str(), &status) == 0) {
    if (S_ISDIR(status.st_mode)) return InFolder(path);
    if (S_ISFIFO(status.st_mode)) return {{KeptPipe(path, place, status)}, ""};
    if (!S_ISREG(status.st_mode)) Refuse(path, "is not a file on disk");
    return {{place}, ""};
  }
  const int error = errno;
  if (const auto name = NumberedNameOf(fs::path(path).filename())) return Numbered(path, *name);
  if (path.find_first_of("*?[") != std::string::npos) return Globbed(path, path);
  Refuse(path, std::strerror(error));
}

bool IsSequence(const std::string& path) {
  std::error_code error;
  const fs::file_type type = fs::status(path, error).type();
  if (type != fs::file_type::directory && type != fs::file_type::not_found) return false;
  try {
    return !FilesOf(path).pattern.empty();
  } catch (const Failure&) {
    return false;
  }
}

}  // namespace calmframe::media
