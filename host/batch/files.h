#pragma once

#include <cstdint>
#include <nlohmann/json_fwd.hpp>
#include <optional>
#include <string>

namespace calmframe::batch {

// What tells that a file is still the one that it was, without reading it.
struct FileIdentity {
  std::int64_t size = -1;     // bytes
  std::int64_t modified = 0;  // nanoseconds since 1970
  bool operator==(const FileIdentity&) const = default;
};

// Of a plain file, links followed; none of anything else.
std::optional<FileIdentity> IdentityOf(const std::string& path);

nlohmann::ordered_json JsonOf(const FileIdentity& identity);
// Throws nlohmann::json::exception.
FileIdentity IdentityOf(const nlohmann::ordered_json& json);

// Whoever reads the file finds what stood there before or this, also after a power cut, and this
// once the call has ended. False, with errno, where it can't be written.
bool WriteWhole(const std::string& path, const std::string& text);

// Removes what a program that was killed was writing into a folder; for whoever holds its lock.
void SweepParts(const std::string& folder);

// What a run writes of a task is far smaller.
inline constexpr std::int64_t kMostOfATask = std::int64_t{16} << 20;  // bytes
// What one program writes for the next, of all its tasks or clips.
inline constexpr std::int64_t kMostOfAll = std::int64_t{256} << 20;

// The file as an object; none where it isn't there, is anything else, or is larger than `most`
// bytes, or than json_bounds has it.
std::optional<nlohmann::ordered_json> ReadObject(const std::string& path,
                                                 std::int64_t most = kMostOfATask);

// A lock that the kernel gives back when the last process that holds the descriptor has ended,
// however that comes; between machines too, where the file system hands locks on (NFS 4 does).
class FileLock {
 public:
  // Takes the lock of this file, which is made, if nobody has it. Throws std::system_error where
  // there can be no such file.
  explicit FileLock(const std::string& path);
  ~FileLock();
  FileLock(const FileLock&) = delete;
  FileLock& operator=(const FileLock&) = delete;

  bool is_held() const { return is_held_; }
  // A child that inherits it holds the lock too.
  int descriptor() const { return file_; }

 private:
  int file_ = -1;
  bool is_held_ = false;
};

}  // namespace calmframe::batch
