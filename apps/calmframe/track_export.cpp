#include "apps/calmframe/track_export.h"

#include <filesystem>
#include <optional>
#include <system_error>

#include "apps/calmframe/failures.h"
#include "platform/tesselui/save_dialog.h"

namespace calmframe {
namespace {

constexpr std::int32_t kSaveTracksButton = 290;  // disk id

}  // namespace

void SaveTracks(SteadyClip& clip, const std::string& shown, const std::string& path) {
  tesselui::InstallSaveDialog(
      [&path](const tesselui::SaveDialogRequest&) -> std::optional<std::string> { return path; });
  const host::CommandResult pressed = clip.effect().Press(clip.effect().IndexOf(kSaveTracksButton));
  tesselui::InstallSaveDialog({});
  if (!pressed.ok()) throw SolveFailure(pressed.Line(path));
  std::error_code error;
  const std::uintmax_t bytes = std::filesystem::file_size(path, error);
  if (error || bytes == 0) throw SolveFailure(shown + ": holds no tracks");
}

}  // namespace calmframe
