#pragma once

#include <memory>
#include <string>
#include <vector>

#include "apps/calmframe/command.h"
#include "apps/calmframe/controls.h"
#include "apps/calmframe/progress_line.h"
#include "apps/calmframe/render_clip.h"
#include "apps/calmframe/side_by_side.h"
#include "apps/calmframe/stretch.h"
#include "host/media/clip.h"
#include "host/stabilize/film.h"
#include "host/stabilize/framing.h"
#include "host/stabilize/steady_clip.h"

namespace calmframe {

// How much a command tells, and how many processors it uses.
struct RunFlags {
  int threads = 0;  // 0: all processors
  bool quiet = false;
  bool json = false;

  ProgressLine::Form progress_form() const {
    if (json) return quiet ? ProgressLine::Form::json_end : ProgressLine::Form::json;
    return quiet ? ProgressLine::Form::none : ProgressLine::Form::line;
  }
};
void AddRunFlags(CLI::App& command, RunFlags& flags);

// Adds the flags for what of each frame is shown.
void AddWindowFlags(CLI::App& command, host::WindowSettings& window);

// How the result is framed and written.
struct OutputFlags {
  host::WindowSettings window;
  media::EncodeSettings encode;
  int depth = 0;  // see RenderClip
  bool warning_banner = false;
  std::string side_by_side;  // a file, of before and after; empty: none
  bool labels_sides = false;
  bool thumbnails = false;  // of one frame, told among what comes out

  bool is_draft() const { return encode.preset == "draft"; }
};
void AddOutputFlags(CLI::App& command, OutputFlags& flags);
// Adds --side-by-side.
void AddSideBySideFlag(CLI::App& command, OutputFlags& flags);
// What that asks for, null for nothing. Throws media::Failure (output) where it can't be written,
// or is `output` or one of `inputs`.
std::unique_ptr<SideBySide> MakeSideBySide(const OutputFlags& flags, const media::ClipInfo& info,
                                           const std::string& output,
                                           const std::vector<std::string>& inputs);
// The clip as its frames are written: of a draft with half of each side, rounded down to an even
// number of pixels.
media::ClipInfo WrittenAs(const media::ClipInfo& clip, const OutputFlags& flags);
RenderSettings SettingsOf(const OutputFlags& flags, int threads);

// From a file to a file; of a stretch only its frames are worked and written. `project`: where
// saved work is taken up, if it is there, and left; empty for none. Throws media::Failure,
// UsageFailure, SolveFailure, host::ProjectFailure, Interrupted.
void Stabilize(const std::string& input, const std::string& output, const std::string& project,
               const Stretch& stretch, const host::ShotRequest& shots, const ControlFlags& controls,
               const OutputFlags& flags, int threads, ProgressLine& progress);

// One line, with the flags that help; empty where all is well.
std::string TroubleText(const host::CropTrouble& trouble, const host::SteadyClip& clip);

// Refuses a clip of which nothing would be seen, by SolveFailure, and tells of one that loses much.
void TellTrouble(const host::CropTrouble& trouble, const host::SteadyClip& clip,
                 ProgressLine& progress);

// After the clip's work: as host::ChooseFraming, with the flags' own words where they can't be had
// together. Throws UsageFailure, SolveFailure, Interrupted.
[[nodiscard]] host::CropTrouble Choose(host::SteadyClip& clip, const host::WindowSettings& window,
                                       ProgressLine& progress);

// The same, and tells what there is to tell of that, by TellTrouble.
void Frame(host::SteadyClip& clip, const host::WindowSettings& window, ProgressLine& progress);

// `calmframe stabilize IN OUT`. Added to the program's parser; runs when that has chosen it.
class StabilizeCommand final : public Command {
 public:
  explicit StabilizeCommand(CLI::App& program);
  bool json() const override { return run_.json; }
  std::vector<std::string> Kept() const override { return {project_}; }
  void Run() override;

 private:
  std::string input_, output_, project_;
  Stretch stretch_;
  host::ShotRequest shots_;
  ControlFlags controls_;
  OutputFlags flags_;
  RunFlags run_;
};

}  // namespace calmframe
