#include "host/media/clip_files.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <map>
#include <mutex>
#include <optional>
#include <utility>

#include "host/media/ffmpeg.h"
#include "host/media/file_pattern.h"

namespace calmframe::media {
namespace {

namespace fs = std::filesystem;

[[noreturn]] void Refuse(const std::string& path, const std::string& cause) {
  throw Failure(Failure::Side::input, path + ": " + cause);
}

bool IsDigit(char c) {
  return c >= '0' && c <= '9';
}

// A file without a name, which is gone however the program ends, open for reading and writing; -1
// with errno.
int Nameless(const std::string& folder) {
  const int file = open(folder.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600);
  if (file >= 0 || (errno != EOPNOTSUPP && errno != EISDIR)) return file;
  std::string name = folder + "/calmframe-XXXXXX";
  const int named = mkostemp(name.data(), O_CLOEXEC);
  if (named >= 0) unlink(name.c_str());
  return named;
}

bool WriteAll(int to, const char* bytes, ssize_t size) {
  while (size > 0) {
    const ssize_t put = write(to, bytes, static_cast<std::size_t>(size));
    if (put < 0 && errno != EINTR) return false;
    bytes += std::max<ssize_t>(put, 0);
    size -= std::max<ssize_t>(put, 0);
  }
  return true;
}

// Waiting for bytes, and so for whoever writes a FIFO, ends with any signal; reading would go on.
ssize_t ReadSome(int from, std::vector<char>& bytes) {
  pollfd waited{from, POLLIN, 0};
  return poll(&waited, 1, -1) < 0 ? -1 : read(from, bytes.data(), bytes.size());
}

// What is kept of a pipe that was read to its end.
int Copied(const std::string& shown, int from) {
  const char* const set = std::getenv("TMPDIR");
  const std::string folder = set && *set ? set : "/tmp";
  const int to = Nameless(folder);
  bool kept = to >= 0;
  ssize_t got = 1;
  for (std::vector<char> bytes(1 << 20); kept && (got = ReadSome(from, bytes)) > 0;) {
    kept = WriteAll(to, bytes.data(), got);
  }
  if (kept && got == 0) return to;
  const std::string cause = std::strerror(errno);
  if (to >= 0) close(to);
  Refuse(shown, (kept ? "can't be read: " : "can't be kept in " + folder + ": ") + cause);
}

// The file that stands for a pipe, which can be read but once.
std::string KeptPipe(const std::string& path, const struct stat& pipe) {
  static std::mutex mutex;
  static std::map<std::pair<dev_t, ino_t>, int> kept;  // open until the program ends
  const std::lock_guard lock(mutex);
  const std::pair<dev_t, ino_t> identity(pipe.st_dev, pipe.st_ino);
  if (kept.count(identity) == 0) {
    const int from =
        path == "-" ? dup(STDIN_FILENO) : open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (from < 0) Refuse(path, std::strerror(errno));
    try {
      kept[identity] = Copied(path, from);
    } catch (...) {
      close(from);
      throw;
    }
    close(from);
  }
  return "/proc/self/fd/" + std::to_string(kept[identity]);
}

// The numbers, without the zeros in front, that two names have where they first differ.
std::optional<std::pair<std::string, std::string>> Numbers(const std::string& a,
                                                           const std::string& b) {
  std::size_t at = 0;
  while (at < a.size() && at < b.size() && a[at] == b[at]) ++at;
  while (at > 0 && IsDigit(a[at - 1])) --at;
  if (at == a.size() || at == b.size() || !IsDigit(a[at]) || !IsDigit(b[at])) return {};
  const auto number = [at](const std::string& name) {
    const std::size_t end = std::min(name.find_first_not_of("0123456789", at), name.size());
    const std::size_t begin = std::min(name.find_first_not_of('0', at), end);
    return name.substr(begin, end - begin);
  };
  return std::pair{number(a), number(b)};
}

void CheckPlain(const std::vector<std::string>& pictures) {
  for (const std::string& picture : pictures) {
    std::error_code error;
    if (!fs::is_regular_file(picture, error)) Refuse(picture, "is not a file on disk");
  }
}

void CheckOrder(const std::string& shown, const std::vector<std::string>& pictures) {
  for (std::size_t i = 1; i < pictures.size(); ++i) {
    const auto numbers = Numbers(pictures[i - 1], pictures[i]);
    if (!numbers) continue;
    const auto& [before, after] = *numbers;
    if (std::pair(before.size(), before) > std::pair(after.size(), after)) {
      Refuse(shown, "its pictures would come in the order of their names, " +
                        fs::path(pictures[i - 1]).filename().string() + " before " +
                        fs::path(pictures[i]).filename().string() +
                        "; a name like f%d.png goes by the numbers");
    }
  }
}

ClipFiles Globbed(const std::string& shown, const std::string& pattern) {
  ClipFiles files;
  files.is_glob = true;
  files.pattern = fs::absolute(pattern).string();
  files.paths = FilesNamedLike(files.pattern);
  if (files.paths.empty()) Refuse(shown, "no file has such a name");
  CheckPlain(files.paths);
  CheckOrder(shown, files.paths);
  return files;
}

std::vector<std::string> PicturesIn(const std::string& folder, const std::string& shown) {
  std::vector<std::string> names;
  std::error_code error;
  for (fs::directory_iterator entry(folder, error), end; !error && entry != end;
       entry.increment(error)) {
    names.push_back(entry->path().filename());
  }
  if (error) Refuse(shown, error.message());
  return names;
}

// Whether FFmpeg takes a file of that extension (".png") for a picture.
bool IsPictureExtension(const std::string& extension) {
  const AVOutputFormat* format = av_guess_format(nullptr, ("%d" + extension).c_str(), nullptr);
  return format && std::strcmp(format->name, "image2") == 0;
}

ClipFiles InFolder(const std::string& shown) {
  std::map<std::string, int> extensions;
  for (const std::string& name : PicturesIn(shown, shown)) {
    const std::string extension = fs::path(name).extension();
    if (name[0] != '.' && IsPictureExtension(extension)) ++extensions[extension];
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

ClipFiles Numbered(const std::string& shown, NumberedPath path) {
  const auto most_digits = static_cast<std::size_t>(std::max(9, path.digits));
  path.folder = fs::absolute(shown).parent_path().string() + '/';
  std::vector<int> numbers;
  for (const std::string& name : PicturesIn(path.folder, shown)) {
    const std::size_t around = path.before.size() + path.after.size();
    if (name.size() <= around || name.size() > around + most_digits) continue;
    const int number = std::atoi(name.c_str() + path.before.size());
    if (path.At(number) == path.folder + name) numbers.push_back(number);
  }
  if (numbers.empty()) Refuse(shown, "no file has such a name");
  std::sort(numbers.begin(), numbers.end());
  ClipFiles files;
  files.pattern = path.Pattern();
  files.first_number = numbers.front();
  for (const int number : numbers) {
    const std::string expected = path.At(files.first_number + static_cast<int>(files.paths.size()));
    if (path.At(number) != expected) {
      Refuse(shown, fs::path(expected).filename().string() + " is missing");
    }
    files.paths.push_back(expected);
  }
  CheckPlain(files.paths);
  return files;
}

}  // namespace

std::optional<NumberedPath> NumberedPath::Of(const std::string& path) {
  const std::size_t name = path.rfind('/') + 1;  // 0 where there is none
  const std::size_t percent = path.find('%', name);
  if (percent == std::string::npos) return {};
  const std::size_t end = path.find_first_not_of("0123456789", percent + 1);
  constexpr std::size_t kMostDigits = 3;  // of how many digits there are
  if (end == std::string::npos || path[end] != 'd' || end > percent + 1 + kMostDigits ||
      path.find('%', end) != std::string::npos) {
    return {};
  }
  return NumberedPath{path.substr(0, name), path.substr(name, percent - name), path.substr(end + 1),
                      std::atoi(path.c_str() + percent + 1)};
}

std::string NumberedPath::At(int number) const {
  std::string text = std::to_string(number);
  const auto least = static_cast<std::size_t>(digits);
  if (text.size() < least) text.insert(0, least - text.size(), '0');
  return folder + before + text + after;
}

std::string NumberedPath::Pattern() const {
  std::string pattern;
  for (const char c : folder) pattern += c == '%' ? "%%" : std::string(1, c);
  return pattern + before + '%' + (digits > 0 ? '0' + std::to_string(digits) : "") + 'd' + after;
}

ClipFiles FilesOf(const std::string& path) {
  const std::string place = path == "-" ? "/dev/stdin" : path;
  struct stat status;
  if (stat(place.c_str(), &status) == 0) {
    if (S_ISDIR(status.st_mode)) return InFolder(path);
    if (S_ISFIFO(status.st_mode)) return {{KeptPipe(path, status)}, ""};
    if (!S_ISREG(status.st_mode)) {
      Refuse(path, path == "-" ? "neither a file nor a pipe stands at the standard input"
                               : "is neither a file on disk nor a pipe");
    }
    return {{place}, ""};
  }
  const int error = errno;
  if (const auto numbered = NumberedPath::Of(path)) return Numbered(path, *numbered);
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
