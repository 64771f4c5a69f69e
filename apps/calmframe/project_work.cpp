#include "apps/calmframe/project_work.h"

#include <filesystem>

#include "apps/calmframe/flags.h"
#include "apps/calmframe/plugin_path.h"
#include "host/timeline/source.h"

namespace calmframe {
namespace {

// Where the clip lies by now. A project that may not be written is found by its old places again.
void KeepPlace(const std::string& path, const std::string& clip, host::Project& project) {
  std::error_code error;
  const std::filesystem::path place = std::filesystem::canonical(clip, error);
  const std::filesystem::path folder = std::filesystem::canonical(path, error).parent_path();
  if (error ||
      (place == project.clip_path && place.lexically_relative(folder) == project.clip_relative)) {
    return;
  }
  project.clip_path = place;
  try {
    host::SaveProject(path, project);
  } catch (const host::ProjectFailure&) {
  }
}

std::unique_ptr<host::SteadyClip> WithControls(std::unique_ptr<host::SteadyClip> clip,
                                               const ControlFlags& controls) {
  clip->SetControls(ResolveControls(controls, clip->host().declarations()));
  return clip;
}

}  // namespace

void AddProjectFlag(CLI::App& command, std::string& project) {
  PutInGroup(
      "Saved work",
      {AddFile(
          command, "--project", project,
          "Take up saved work from this file where it is there, with its controls, and save to it; "
          "what still stands of it is not done again",
          Need::optional)});
}

std::unique_ptr<host::SteadyClip> TakeUp(const std::string& clip, const std::string& project,
                                         const ControlFlags& controls, host::Opening opening) {
  std::error_code error;
  if (project.empty() || !std::filesystem::exists(project, error)) {
    return WithControls(std::make_unique<host::SteadyClip>(PluginPath(), clip, opening), controls);
  }
  host::Project saved = host::LoadProject(project);
  if (host::ContentOf(clip) != saved.clip_content) {
    throw media::Failure(media::Failure::Side::input,
                         project + ": is of another clip, " + saved.clip_path);
  }
  KeepPlace(project, clip, saved);
  return WithControls(std::make_unique<host::SteadyClip>(PluginPath(), saved, clip), controls);
}

std::string FindMovedClip(const std::string& path, host::Project& project) {
  const std::string clip = host::FindClip(path, project);
  KeepPlace(path, clip, project);
  return clip;
}

std::unique_ptr<host::SteadyClip> OpenSaved(const std::string& path, const ControlFlags& controls) {
  host::Project project = host::LoadProject(path);
  const std::string clip = FindMovedClip(path, project);
  return WithControls(std::make_unique<host::SteadyClip>(PluginPath(), project, clip), controls);
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

Unsaved WorkAndLeave(host::SteadyClip& clip, const std::string& project, ProgressLine& progress) {
  const host::Reuse reuse = clip.Work(progress);
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
