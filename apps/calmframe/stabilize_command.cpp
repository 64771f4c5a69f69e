#include "apps/calmframe/stabilize_command.h"

#include <memory>
#include <vector>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/render_clip.h"
#include "platform/tessel/threads.h"

namespace calmframe {
void CheckCrop(SteadyClip& clip, ProgressLine& progress) {
  const std::unique_ptr<CropWindow> crop = clip.Crop();
  if (!crop) return;
  if (crop->width <= 0 || crop->height <= 0) {
    throw SolveFailure(
        "no part of the picture stays in view; set --framing stabilize-only or adjust other flags");
  }
  constexpr double kSmall = 0.4;  // of a side
  const media::ClipInfo& info = clip.info();
  const double width = static_cast<double>(info.width) *
                       static_cast<double>(info.pixel_aspect.num) /
                       static_cast<double>(info.pixel_aspect.den);
  if (crop->width < kSmall * width || crop->height < kSmall * info.height) {
    progress.Warn("of " + std::to_string(info.width) + "x" + std::to_string(info.height) +
                  " pixels only " + std::to_string(crop->width) + "x" +
                  std::to_string(crop->height) +
                  " stay in view; less --smoothness or --framing stabilize-only keeps more");
  }
}

void AddRunFlags(CLI::App& command, RunFlags& flags) {
  command.add_option("--threads", flags.threads, "Processors to use")
      ->check(CLI::Range(1, 1024))
      ->group("Output");
  CLI::Option* quiet = command.add_flag("--quiet", flags.quiet, "Show no progress");
  quiet->group("Output");
  command.add_flag("--json", flags.json, "Show progress as one JSON object a line")
      ->excludes(quiet)
      ->group("Output");
}

void AddOutputFlags(CLI::App& command, OutputFlags& flags) {
  command.add_option("--codec", flags.encode.codec, "Encoder, or the name of what it encodes")
      ->type_name("NAME")
      ->group("Output");
  command
      .add_option("--crf", flags.encode.crf, "Quality of the encoder: less is better and larger")
      ->check(CLI::Range(0, 63))
      ->capture_default_str()
      ->group("Output");
  command.add_option("--pixel-format", flags.encode.pixel_format, "Pixel format of the encoder")
      ->type_name("NAME")
      ->group("Output");
  command.add_option("--depth", flags.depth, "Bits of a component in the render")
      ->check(CLI::IsMember(std::vector<int>{8, 16, 32}))
      ->type_name("8|16|32")
      ->group("Output");
  command.add_flag("--overwrite", flags.encode.overwrite, "Replace an existing file")
      ->group("Output");
}

void Stabilize(const std::string& input, const std::string& output, const std::string& project,
               const ControlFlags& controls, const OutputFlags& flags, int threads,
               ProgressLine& progress) {
  const tessel::threads::ProcessorLimit limit(threads);
  const std::unique_ptr<SteadyClip> clip = TakeUp(input, project, controls);
  const media::ClipInfo& info = clip->info();
  if (!info.warning.empty()) progress.Warn(info.warning);
  // Made first, so that an output that cannot be written costs nobody an analysis.
  const std::unique_ptr<media::ClipWriter> writer =
      media::ClipWriter::Create(output, info, info.width, info.height, flags.encode);
  const Unsaved unsaved = WorkAndLeave(*clip, project, progress);
  CheckCrop(*clip, progress);
  RenderClip(*clip, {0, info.frame_count}, {.depth = flags.depth, .threads = threads}, *writer,
             progress);
  writer->Finish();
  for (const std::string& line : writer->warnings()) progress.Warn(line);
  unsaved.Throw();
}

StabilizeCommand::StabilizeCommand(CLI::App& program)
    : command_(program.add_subcommand("stabilize", "Steady a clip")) {
  command_->add_option("IN", input_, "The shaky clip")->required();
  command_->add_option("OUT", output_, "The steady clip to write; - for raw frames to a pipe")
      ->required();
  AddProjectFlag(*command_, project_);
  AddControlFlags(*command_, controls_);
  AddOutputFlags(*command_, flags_);
  AddRunFlags(*command_, run_);
}

void StabilizeCommand::Run() {
  ProgressLine progress(run_.progress_form());
  Stabilize(input_, output_, project_, controls_, flags_, run_.threads, progress);
}

}  // namespace calmframe
