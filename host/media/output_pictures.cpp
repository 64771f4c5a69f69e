#include "host/media/output_pictures.h"

#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <system_error>

#include "host/media/ffmpeg.h"

namespace calmframe::media {
namespace {

[[noreturn]] void CantWrite(const std::string& path, const std::string& cause) {
  throw Failure(Failure::Side::output, path + ": " + cause);
}

std::string NameOf(const std::string& pattern, std::size_t number) {
  std::string name(pattern.size() + 64, '\0');
  if (av_get_frame_filename(name.data(), static_cast<int>(name.size()), pattern.c_str(),
                            static_cast<int>(number)) < 0) {
    CantWrite(pattern, "its name needs one place for a number, like f%04d.png");
  }
  return name.c_str();
}

}  // namespace

OutputPictures::OutputPictures(const std::string& pattern, const std::vector<std::string>& sources,
                               std::size_t count, bool overwrite, bool makes_folder)
    : pattern_(pattern), count_(count) {
  const std::filesystem::path place(pattern);
  std::error_code error;
  for (std::size_t i = 1; i <= count; ++i) {
    const std::string name = NameOf(pattern, i);
    if (!std::filesystem::exists(name, error)) continue;
    for (const std::string& source : sources) {
      if (std::filesystem::equivalent(name, source, error)) CantWrite(name, "is an input itself");
    }
    if (!std::filesystem::is_regular_file(name, error)) CantWrite(name, "is not a file on disk");
    if (!overwrite) CantWrite(name, "exists already (--overwrite replaces it)");
  }
  const std::filesystem::path parent = place.parent_path();
  made_folder_ = makes_folder && std::filesystem::create_directory(parent, error);
  static std::atomic<unsigned> serial = 0;
  do {
    folder_ = (parent / (".calmframe-" + std::to_string(getpid()) + "-" + std::to_string(serial++) +
                         ".part"))
                  .string();
  } while (!std::filesystem::create_directory(folder_, error) && !error);
  if (error) {
    folder_.clear();
    if (made_folder_) std::filesystem::remove(parent, error);
    CantWrite(pattern, "can't be written: " + error.message());
  }
  for (const char c : folder_) {
    temporary_ += c;
    if (c == '%') temporary_ += c;
  }
  temporary_ += '/';
  temporary_ += place.filename().string();
}

OutputPictures::~OutputPictures() {
  std::error_code error;
  std::filesystem::remove_all(folder_, error);
  // Where nothing came into it.
  if (made_folder_) {
    std::filesystem::remove(std::filesystem::path(pattern_).parent_path(), error);
  }
}

void OutputPictures::Commit() {
  for (std::size_t i = 1; i <= count_; ++i) {
    std::error_code error;
    std::filesystem::rename(NameOf(temporary_, i), NameOf(pattern_, i), error);
    if (error) CantWrite(NameOf(pattern_, i), "can't be written: " + error.message());
  }
}

}  // namespace calmframe::media
