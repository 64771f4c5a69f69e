#include "editors/mlt/results_place.h"

#include <zlib.h>

#include <charconv>
#include <cstdlib>
#include <filesystem>
#include <stdexcept>

namespace calmframe::mlt {
namespace {

namespace fs = std::filesystem;

std::string Environment(const char* name) {
  const char* const value = std::getenv(name);
  return value ? value : "";
}

// Where the number at the end of "path@number" begins, or npos.
std::size_t FirstIn(const std::string& text) {
  const std::size_t at = text.rfind('@');
  if (at == std::string::npos || at + 1 == text.size()) return std::string::npos;
  return text.find_first_not_of("0123456789", at + 1) == std::string::npos ? at + 1
                                                                           : std::string::npos;
}

}  // namespace

std::string TextOf(const ResultsPlace& place) {
  if (place.first == 0 && FirstIn(place.path) == std::string::npos) return place.path;
  return place.path + '@' + std::to_string(place.first);
}

ResultsPlace ResultsPlaceFrom(const std::string& text) {
  const std::size_t number = FirstIn(text);
  ResultsPlace place{text};
  if (number == std::string::npos) return place;
  const char* const end = text.data() + text.size();
  if (std::from_chars(text.data() + number, end, place.first).ec != std::errc()) return {text};
  place.path.resize(number - 1);
  return place;
}

std::string ResultsFolder() {
  fs::path data = Environment("XDG_DATA_HOME");
  if (!data.is_absolute()) data = fs::path(Environment("HOME")) / ".local/share";
  if (!data.is_absolute()) throw std::runtime_error("no home, and no filename for the results");
  return data / "calmframe";
}

std::string ResultsName(const std::string& clip, const ClipFrames& frames, const Controls& controls,
                        std::int64_t first, std::int64_t count) {
  std::string kind = frames.identity;
  for (const int number : {frames.width, frames.height, frames.aspect_num, frames.aspect_den,
                           frames.rate_num, frames.rate_den}) {
    kind.append(" ").append(std::to_string(number));
  }
  for (const auto& [name, value] : controls)
    kind.append(" ").append(name).append(" ").append(value);
  const unsigned long sum =
      crc32(0, reinterpret_cast<const Bytef*>(kind.data()), static_cast<uInt>(kind.size()));
  return fs::path(clip).stem().string() + '-' + std::to_string(first) + '-' +
         std::to_string(first + count - 1) + '-' + std::to_string(sum) + ".calm";
}

std::string FindResults(const std::string& path, const std::string& clip) {
  std::error_code ignored;
  if (fs::path(path).is_absolute() || fs::exists(path, ignored)) return path;
  const fs::path beside = fs::path(clip).parent_path() / path;
  if (fs::exists(beside, ignored)) return beside;
  // Not needed for more, it may be unknown.
  const fs::path kept = fs::path(ResultsFolder()) / path;
  return fs::exists(kept, ignored) ? kept.string() : path;
}

}  // namespace calmframe::mlt
