#include "apps/calmframe/project_work.h"

#include <filesystem>

#include "apps/calmframe/flags.h"
#include "host/timeline/source.h"

namespace calmframe {

void AddProjectFlag(CLI::App& command, std::string& project) {
  PutInGroup(
      "Saved work",
      {AddFile(
          command, "--project", project,
          "Take up saved work from this file where it is there, with its controls, and save to it; "
          "what still stands of it is not done again",
          Need::optional)});
}

std::unique_ptr<SteadyClip> TakeUp(const std::string& clip, const std::string& project,
                                   const ControlFlags& controls, Opening opening) {
  std::error_code error;
  if (project.empty() || !std::filesystem::exists(project, error)) {
    return std::make_unique<SteadyClip>(clip, controls, opening);
  }
  const host::Project saved = host::LoadProject(project);
  if (host::ContentOf(clip) != saved.clip_content) {
    throw media::Failure(media::Failure::Side::input,
                         project + ": is of another clip, " + saved.clip_path);
  }
  return std::make_unique<SteadyClip>(saved, clip, controls);
}

std::unique_ptr<SteadyClip> OpenSaved(const std::string& path, const ControlFlags& controls) {
  const host::Project project = host::LoadProject(path);
  return std::make_unique<SteadyClip>(project, host::FindClip(path, project), controls);
}

void KeepApart(const std::string& output, const std::vector<std::string>& inputs) {
  for (const std::string& input : inputs) {
    if (input.empty()) continue;
    std::error_code unknown, input_unknown;
    bool same = std::filesystem::equivalent(output, input, unknown);
    if (!same) {  // one that is not there yet, such as a project to be made
      const auto place = std::filesystem::weakly_canonical(output, unknown);
      same = place == std::filesystem::weakly_canonical(input, input_unknown) && !unknown &&
             !input_unknown;
    }
    if (same) {
      throw media::Failure(media::Failure::Side::output, output + ": is an input itself");
    }
  }
}

void Unsaved::Throw() const {
  if (!line_.empty()) throw media::Failure(media::Failure::Side::output, line_);
}

Unsaved WorkAndLeave(SteadyClip& clip, const std::string& project, ProgressLine& progress) {
  const Reuse reuse = clip.Work(progress);
  if (project.empty()) return Unsaved();
  if (const std::string text = reuse.Text(); !text.empty()) progress.Note(project + ": " + text);
  if (reuse.framing && !clip.has_new_controls()) return Unsaved();
  try {
    host::SaveProject(project, clip.Saved());
  } catch (const host::ProjectFailure& failure) {
    return Unsaved(failure.what());
  }
  return Unsaved();
}

}  // namespace calmframe
