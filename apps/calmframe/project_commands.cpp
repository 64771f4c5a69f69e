#include "apps/calmframe/project_commands.h"

#include <cstdio>
#include <limits>
#include <memory>
#include <nlohmann/json.hpp>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/project_work.h"
#include "apps/calmframe/render_clip.h"
#include "apps/calmframe/track_export.h"
#include "host/media/output_file.h"
#include "host/project/project_file.h"
#include "host/stabilize/steady_clip.h"
#include "platform/tessel/threads.h"

namespace calmframe {
namespace {

// The clip as a writer of a part sees it: its other streams belong to the whole.
media::ClipInfo PartOf(const media::ClipInfo& info, const FrameRange& range) {
  media::ClipInfo part = info;
  part.frame_count = range.end - range.first;
  if (part.frame_count == info.frame_count) return part;
  part.path.clear();
  if (!info.times.empty()) {
    part.times.assign(info.times.begin() + static_cast<std::ptrdiff_t>(range.first),
                      info.times.begin() + static_cast<std::ptrdiff_t>(range.end));
  }
  return part;
}

}  // namespace

RenderCommand::RenderCommand(CLI::App& program)
    : Command(AddCommand(
          program, "render",
          "Draw saved work, or a part of it\n\n"
          "With --from and --to a part, to look at before the whole is drawn; such a part is "
          "without sound.",
          "Examples:\n"
          "  calmframe render --project shaky.calm steady.mp4\n"
          "  calmframe render --project shaky.calm look.mp4 --from 10 --to 20")) {
  AddFile(parser_, "OUT", output_,
          "The steady clip to write; - for a pipe: raw frames, or Matroska with --codec; "
          "f%04d.png or a folder with / for pictures");
  AddFile(parser_, "--project", project_, "The saved work");
  constexpr int kMost = std::numeric_limits<int>::max();
  AddNumber<int>(
      parser_, "--from", [this](int frame) { from_ = static_cast<std::size_t>(frame); }, "FRAME", 0,
      kMost, "First frame, counted from 0");
  AddNumber<int>(
      parser_, "--to", [this](int frame) { to_ = static_cast<std::size_t>(frame); }, "FRAME", 0,
      kMost, "Frame behind the last; the clip's end at first");
  AddOutputFlags(parser_, flags_);
  AddRunFlags(parser_, run_);
}

void RenderCommand::Run() {
  const tessel::threads::ProcessorLimit limit(run_.threads);
  ProgressLine progress(run_.progress_form());
  const std::unique_ptr<host::SteadyClip> clip = OpenSaved(project_);
  const media::ClipInfo& info = clip->info();
  const FrameRange range{from_, to_ == 0 ? info.frame_count : to_};
  if (range.first >= range.end || range.end > info.frame_count) {
    throw UsageFailure("--from must be below --to, and both within the clip's " +
                       std::to_string(info.frame_count) + " frames");
  }
  KeepApart(output_, {project_, clip->path()});
  const std::unique_ptr<media::ClipWriter> writer = media::ClipWriter::Create(
      output_, PartOf(info, range), info.width, info.height, flags_.encode);
  TellLosses(*writer, progress);
  const Unsaved unsaved = WorkAndLeave(*clip, project_, progress);
  Frame(*clip, flags_.window, progress);
  RenderClip(*clip, range, {.depth = flags_.depth, .threads = run_.threads}, *writer, progress);
  TellOutcome(*clip, progress);
  unsaved.Throw();
}

InfoCommand::InfoCommand(CLI::App& program)
    : Command(AddCommand(program, "info",
                         "Tell what saved work holds, and whether its clip is still the one",
                         "Examples:\n"
                         "  calmframe info shaky.calm")) {
  AddFile(parser_, "PROJECT", project_, "The saved work");
  AddSwitch(parser_, "--json", json_, "As a JSON object");
}

void InfoCommand::Run() {
  host::Project project = host::LoadProject(project_);
  std::string clip, trouble;
  try {
    clip = FindMovedClip(project_, project);
  } catch (const host::ProjectFailure& failure) {
    trouble = failure.what();
  }
  const double rate =
      static_cast<double>(HX_TICKS_PER_SECOND) / static_cast<double>(project.ticks_per_frame);
  if (json_) {
    nlohmann::ordered_json json;
    json["clip"] = clip.empty() ? project.clip_path : clip;
    json["fits"] = trouble.empty();
    if (!trouble.empty()) json["trouble"] = trouble;
    json["width"] = project.width;
    json["height"] = project.height;
    json["start_frame"] = project.start_frame;
    json["frames"] = project.length;
    json["rate"] = rate;
    json["instance_bytes"] = project.effect.instance.size();
    std::printf("%s\n", JsonLine(json).c_str());
    return;
  }
  std::printf("%s: %d frames of %dx%d from %d, %.6g a second, %zu bytes of results\n",
              clip.empty() ? project.clip_path.c_str() : clip.c_str(), project.length,
              project.width, project.height, project.start_frame, rate,
              project.effect.instance.size());
  std::printf("%s\n", trouble.empty() ? "the clip is the one that was analysed" : trouble.c_str());
}

TracksCommand::TracksCommand(CLI::App& program)
    : Command(AddCommand(program, "tracks", "Write the tracks of saved work to a file",
                         "Examples:\n"
                         "  calmframe tracks shaky.calm shaky.trk")) {
  AddFile(parser_, "PROJECT", project_, "The saved work");
  AddFile(parser_, "OUT", output_, "The track file, .trk");
  AddSwitch(parser_, "--overwrite", overwrite_, "Replace OUT where it exists");
}

void TracksCommand::Run() {
  media::OutputFile file(output_, project_, overwrite_);
  const std::unique_ptr<host::SteadyClip> clip = OpenSaved(project_);
  KeepApart(output_, {clip->path()});
  SaveTracks(*clip, project_, file.temporary(), output_);
  file.Commit();
}

}  // namespace calmframe
