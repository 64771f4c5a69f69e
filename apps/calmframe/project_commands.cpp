#include "apps/calmframe/project_commands.h"

#include <cstdio>
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
RenderCommand::RenderCommand(CLI::App& program)
    : Command(AddCommand(
          program, "render",
          "Draw saved work, or a part of it\n\n"
          "With --from and --to a part, with its sound, to look at before the whole is drawn. They "
          "count in the clip, as for stabilize; but a whole number alone is a frame.",
          "Examples:\n"
          "  calmframe render --project shaky.calm steady.mp4\n"
          "  calmframe render --project shaky.calm look.mp4 --from 10 --to 20")) {
  AddFile(parser_, "OUT", output_,
          "The steady clip to write; - for a pipe: raw frames, or Matroska with --codec; "
          "f%04d.png or a folder with / for pictures");
  AddFile(parser_, "--project", project_, "The saved work");
  AddStretchFlags(parser_, stretch_, BareNumber::frame);
  AddOutputFlags(parser_, flags_);
  AddSideBySideFlag(parser_, flags_);
  AddRunFlags(parser_, run_);
}

void RenderCommand::Run() {
  const tessel::threads::ProcessorLimit limit(run_.threads);
  ProgressLine progress(run_.progress_form());
  CheckOrder(stretch_);
  const std::unique_ptr<host::SteadyClip> clip = OpenSaved(project_);
  const media::FrameRange range = RangeOf(*clip);
  // As the clip's own frames; the rest counts from the first that was worked.
  const media::FrameRange part{range.first - clip->range().first, range.end - clip->range().first};
  KeepApart(output_, {project_, clip->path()});
  const media::ClipInfo written = media::PartOf(clip->whole(), range);
  const std::unique_ptr<media::ClipWriter> writer =
      media::ClipWriter::Create(output_, written, written.width, written.height, flags_.encode);
  const std::unique_ptr<SideBySide> both =
      MakeSideBySide(flags_, written, output_, {project_, clip->path()});
  TellLosses(*writer, both.get(), progress);
  Unsaved unsaved = WorkAndLeave(*clip, project_, progress);
  Frame(*clip, flags_.window, progress);
  if (clip->has_new_choice()) unsaved = Leave(*clip, project_);
  RenderClip(*clip, part, SettingsOf(flags_, run_.threads), *writer, both.get(), progress);
  TellOutcome(*clip, progress);
  unsaved.Throw();
  if (both) both->Throw();
}

media::FrameRange RenderCommand::RangeOf(const host::SteadyClip& clip) const {
  if (!stretch_.is_given()) return clip.range();
  media::FrameRange range = FramesOf(stretch_, clip.whole());
  const media::FrameRange& worked = clip.range();
  if (!stretch_.from) range.first = worked.first;
  if (!stretch_.to) range.end = worked.end;
  if (range.first >= range.end || !worked.Holds(range)) {
    throw UsageFailure(project_ + ": " + WorkedText(clip) +
                       ", and --from and --to must lie within");
  }
  return range;
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
