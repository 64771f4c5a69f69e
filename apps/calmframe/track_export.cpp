#include "apps/calmframe/track_export.h"

#include <filesystem>
#include <fstream>
#include <optional>
#include <system_error>
#include <utility>

#include "apps/calmframe/failures.h"
#include "host/media/clip.h"
#include "platform/tesselui/save_dialog.h"

namespace calmframe {
namespace {

constexpr std::int32_t kSaveTracksButton = 290;  // disk id

}  // namespace

report::TrackTable SaveTracks(host::SteadyClip& clip, const std::string& work,
                              const std::string& path, const std::string& file) {
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
  std::optional<report::TrackTable> tracks = report::ReadTrackFile(path);
  if (!tracks) fail();
  return *std::move(tracks);
}

}  // namespace calmframe
