#include "apps/calmframe/split_commands.h"

#include <filesystem>
#include <memory>
#include <system_error>
#include <utility>

#include "apps/calmframe/failures.h"
#include "apps/calmframe/film_work.h"
#include "apps/calmframe/flags.h"
#include "apps/calmframe/project_work.h"
#include "host/media/segment_join.h"
#include "host/project/project_join.h"

namespace calmframe {

GatherCommand::GatherCommand(CLI::App& program)
    : Command(AddCommand(
          program, "gather",
          "Make one project of a film's stretches that were worked apart\n\n"
          "For long films that several machines share: each analyses some stretches with "
          "analyze --from --to --choose, and render draws from what this writes.",
          "Examples:\n"
          "  calmframe gather --project whole.calm early.calm late.calm")) {
  AddFile(parser_, "--project", project_, "The saved work to write");
  AddFiles(parser_, "PART", parts_, "Saved work of stretches that follow each other, in any order");
  AddSwitch(parser_, "--overwrite", overwrite_, "Replace the project where it exists");
}

void GatherCommand::Run() {
  KeepApart(project_, parts_);
  std::error_code ignored;
  if (!overwrite_ && std::filesystem::exists(project_, ignored)) {
    throw media::Failure(media::Failure::Side::output,
                         project_ + ": exists; --overwrite replaces it");
  }
  std::vector<host::NamedProject> parts;
  for (const std::string& path : parts_) parts.push_back({path, host::LoadProject(path)});
  const std::string first = parts[0].name;
  const std::string clip = host::FindClip(first, parts[0].project);
  host::Project whole = host::JoinProjects(std::move(parts));
  whole.clip_path = std::filesystem::canonical(clip);
  try {
    host::SaveProject(project_, whole);
  } catch (const host::ProjectFailure& failure) {
    throw media::Failure(media::Failure::Side::output, failure.what());
  }
}

JoinCommand::JoinCommand(CLI::App& program)
    : Command(AddCommand(
          program, "join",
          "Write a film from segments that were drawn apart\n\n"
          "The segments' pictures go into OUT as they are, without being encoded again, beside the "
          "clip's sound and other streams. They come from render --segment with one project and "
          "the same flags, and hold all frames that it works, in order.",
          "Examples:\n"
          "  calmframe join --project whole.calm steady.mkv early.mkv late.mkv")) {
  AddFile(parser_, "OUT", output_, "The steady clip to write");
  AddFiles(parser_, "SEGMENT", segments_, "The segments, in the order of their frames");
  AddFile(parser_, "--project", project_, "The saved work that they were drawn from");
  AddSwitch(parser_, "--overwrite", overwrite_, "Replace OUT where it exists");
  AddRunFlags(parser_, run_);
}

void JoinCommand::Run() {
  ProgressLine progress(run_.progress_form());
  const std::unique_ptr<host::Film> film =
      OpenSaved(project_, {.read = segments_, .written = {output_}});
  std::vector<std::string> inputs = segments_;
  inputs.insert(inputs.end(), {project_, film->whole().path});
  KeepApart(output_, inputs);
  const media::ClipInfo source = film->info();
  host::Progress shown{
      .stage = "joining", .total = static_cast<double>(source.frame_count), .unit = "frames"};
  const auto goes_on = [&](std::size_t written) {
    if (progress.Stops()) throw Interrupted();
    shown.done = static_cast<double>(written);
    progress.Show(shown);
  };
  const std::vector<std::string> left_out =
      media::JoinSegments(segments_, source, output_, overwrite_, goes_on);
  shown.ends = true;
  progress.Show(shown);
  for (const std::string& line : left_out) progress.Warn(line);
  TellSavedOutcome(*film, progress);
}

}  // namespace calmframe
