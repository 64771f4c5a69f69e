#include "apps/calmframe/track_export.h"

#include <filesystem>
#include <fstream>
#include <optional>
#include <system_error>

#include "apps/calmframe/failures.h"
#include "host/media/clip.h"
#include "platform/tesselui/save_dialog.h"

namespace calmframe {
namespace {

constexpr std::int32_t kSaveTracksButton = 290;  // disk id

// As docs/track_file.md has it: as many cells as the header tells of.
bool IsWhole(const std::string& path) {
  constexpr std::int64_t kMarker = -11;
  constexpr std::uintmax_t kHeaderBytes = 20, kCellBytes = 16;
  std::error_code error;
  const std::uintmax_t bytes = std::filesystem::file_size(path, error);
  std::ifstream file(path, std::ios::binary);
  const auto read = [&file](auto value) {
    file.read(reinterpret_cast<char*>(&value), sizeof value);
    return value;
  };
  const auto marker = read(std::int64_t{});
  const auto first = read(std::int32_t{}), end = read(std::int32_t{});
  const auto slots = read(std::uint32_t{});
  return !error && file && marker == kMarker && first == 0 && end >= 0 &&
         (bytes - kHeaderBytes) / kCellBytes >=
             std::uintmax_t{slots} * static_cast<std::uintmax_t>(end);
}

}  // namespace

void SaveTracks(host::SteadyClip& clip, const std::string& work, const std::string& path,
                const std::string& file) {
  const auto fail = [&file] {
    throw media::Failure(media::Failure::Side::output, file + ": can't be written whole");
  };
  // Whoever writes takes the mark away first: without tracks it stays, on a full disk nothing does.
  constexpr char kMark = '?';
  std::ofstream mark(path, std::ios::binary | std::ios::trunc);
  mark.put(kMark);
  mark.close();
  if (!mark) fail();
  tesselui::InstallSaveDialog(
      [&path](const tesselui::SaveDialogRequest&) -> std::optional<std::string> { return path; });
  const host::CommandResult pressed = clip.effect().Press(clip.effect().IndexOf(kSaveTracksButton));
  tesselui::InstallSaveDialog({});
  if (!pressed.ok()) throw SolveFailure(pressed.Line(path));
  std::error_code error;
  if (std::filesystem::file_size(path, error) == sizeof kMark) {
    throw SolveFailure(work + ": holds no tracks");
  }
  if (!IsWhole(path)) fail();
}

}  // namespace calmframe
