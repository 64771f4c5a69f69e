#include "apps/calmframe/analyze_command.h"

#include <cstdio>
#include <memory>
#include <nlohmann/json.hpp>

#include "apps/calmframe/flags.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/stabilize_command.h"
#include "host/stabilize/framing.h"
#include "host/stabilize/steady_clip.h"
#include "platform/tessel/threads.h"

namespace calmframe {

AnalyzeCommand::AnalyzeCommand(CLI::App& program)
    : Command(AddCommand(
          program, "analyze",
          "Analyse and solve a clip, without rendering it\n\n"
          "Prints the effect's own crop window and how far it is enlarged. What follows the "
          "picture "
          "in its place is found by stabilize, and shown by report. With --project, these and "
          "render go on from there.",
          "Examples:\n"
          "  calmframe analyze shaky.mp4\n"
          "  calmframe analyze shaky.mp4 --project shaky.calm --smoothness 20")) {
  AddFile(parser_, "IN", input_,
          "The shaky clip; - for a pipe, f%04d.png, a quoted glob or a folder for pictures");
  AddControlFlags(parser_, controls_);
  AddStretchFlags(parser_, stretch_, BareNumber::seconds);
  AddProjectFlag(parser_, project_);
  AddRunFlags(parser_, run_);
}

void AnalyzeCommand::Run() {
  const tessel::threads::ProcessorLimit limit(run_.threads);
  ProgressLine progress(run_.progress_form());
  RunOnPromises([&](host::Opening opening) { Analyze(opening, progress); });
}

void AnalyzeCommand::Analyze(host::Opening opening, ProgressLine& progress) const {
  const std::unique_ptr<host::SteadyClip> taken =
      TakeUp(input_, project_, controls_, opening, stretch_);
  host::SteadyClip& clip = *taken;
  const media::ClipInfo& info = clip.info();
  if (!info.warning.empty()) progress.Warn(info.warning);
  const Unsaved unsaved = WorkAndLeave(clip, project_, progress);
  // The effect's own window is no trouble where it isn't what is shown.
  const bool follows = host::Follows(clip, {});
  if (!follows) TellTrouble(host::CropTroubleOf(clip), clip, progress);
  if (run_.json) {
    const std::unique_ptr<host::CropWindow> crop = clip.Crop();
    nlohmann::ordered_json json;
    json["clip"] = input_;
    json["width"] = info.width;
    json["height"] = info.height;
    json["frames"] = info.frame_count;
    if (crop) {
      json["crop_width"] = crop->width;
      json["crop_height"] = crop->height;
    }
    std::printf("%s\n", JsonLine(json).c_str());
    return unsaved.Throw();
  }
  std::printf("%s: %zu %s of %dx%d\n", input_.c_str(), info.frame_count,
              info.frame_count == 1 ? "frame" : "frames", info.width, info.height);
  if (const std::string text = clip.CropText(); !text.empty()) {
    std::printf("%s%s\n", text.c_str(), follows ? ", with --window steady" : "");
  }
  unsaved.Throw();
}

}  // namespace calmframe
