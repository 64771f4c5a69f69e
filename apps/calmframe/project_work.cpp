#include "apps/calmframe/project_work.h"

#include <filesystem>

#include "apps/calmframe/flags.h"
#include "apps/calmframe/plugin_path.h"
#include "host/project/project_keeper.h"
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

// Links followed, also of a name in the present folder of which nothing is there yet.
std::filesystem::path PlaceOf(const std::string& path, std::error_code& error) {
  const std::filesystem::path whole = std::filesystem::absolute(path, error);
  return error ? whole : std::filesystem::weakly_canonical(whole, error);
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

std::unique_ptr<host::Film> TakeUp(const std::string& clip, const std::string& project,
                                   host::Opening opening, const Stretch& stretch,
                                   const host::ShotRequest& shots) {
  CheckOrder(stretch);
  std::error_code error;
  const bool is_there = !project.empty() && std::filesystem::exists(project, error);
  if (!is_there || !host::HoldsWork(project)) {
    // An analysis that goes on where one was stopped does not decode the clip in order.
    const host::Opening how = is_there ? host::Opening::decoded : opening;
    return std::make_unique<host::Film>(PluginPath(), clip, how, PartFor(stretch), shots);
  }
  host::Project saved = host::LoadProject(project);
  if (host::ContentOf(clip) != saved.clip_content) {
    throw media::Failure(media::Failure::Side::input,
                         project + ": is of another clip, " + saved.clip_path);
  }
  KeepPlace(project, clip, saved);
  auto taken = std::make_unique<host::Film>(PluginPath(), saved, clip, shots);
  if (stretch.is_given() && FramesOf(stretch, taken->whole()) != taken->range()) {
    throw UsageFailure(project + ": " + WorkedText(*taken) +
                       "; another stretch takes a project of its own, and a part of this one is "
                       "drawn by calmframe render");
  }
  return taken;
}

host::SteadyClip* NextShot(host::Film& film, const ControlFlags& controls) {
  host::SteadyClip* const shot = film.Next();
  if (shot) shot->SetControls(ResolveControls(controls, shot->host().declarations()));
  return shot;
}

std::string WorkedText(const host::Film& film) {
  const media::FrameRange& worked = film.range();
  return "holds work from " + TimeText(film.whole(), worked.first) + " to " +
         TimeText(film.whole(), worked.end) + " of the clip, frames " +
         std::to_string(worked.first) + " to " + std::to_string(worked.end);
}

std::string FindMovedClip(const std::string& path, host::Project& project) {
  const std::string clip = host::FindClip(path, project);
  KeepPlace(path, clip, project);
  return clip;
}

std::unique_ptr<host::Film> OpenSaved(const std::string& path, Confinement confinement) {
  host::Project project = host::LoadProject(path);
  const std::string clip = FindMovedClip(path, project);
  confinement.read.push_back(clip);
  confinement.written.push_back(path);
  confinement.Begin();
  return std::make_unique<host::Film>(PluginPath(), project, clip);
}

void KeepApart(const std::string& output, const std::vector<std::string>& inputs,
               const std::string& what) {
  for (const std::string& input : inputs) {
    if (input.empty()) continue;
    std::error_code unknown, input_unknown;
    bool same = std::filesystem::equivalent(output, input, unknown);
    if (!same) {  // one that is not there yet, such as a project to be made
      same =
          PlaceOf(output, unknown) == PlaceOf(input, input_unknown) && !unknown && !input_unknown;
    }
    if (same) {
      throw media::Failure(media::Failure::Side::output, output + ": is " + what + " itself");
    }
  }
}

WorkFile::WorkFile(const std::string& project) : project_(project), saver_(project) {}

void WorkFile::Leave(host::Film& film) {
  if (project_.empty()) return;
  film.Keep();
  trouble_.clear();
  try {
    saver_.Save(film.Saved(), film.number());
  } catch (const host::ProjectFailure& failure) {
    trouble_ = failure.what();
  }
}

void WorkFile::Throw() const {
  if (!trouble_.empty()) throw media::Failure(media::Failure::Side::output, trouble_);
}

void WorkAndLeave(host::Film& film, host::SteadyClip& shot, WorkFile& file,
                  ProgressLine& progress) {
  if (!file.project().empty()) {
    const auto first = static_cast<std::int32_t>(shot.range().first);
    shot.effect().shared()->SetKeeper(std::make_shared<host::ProjectKeeper>(file.project(), first));
  }
  const host::Reuse reuse = shot.Work(progress);
  if (file.project().empty()) return;
  if (const std::string text = reuse.Text(); !text.empty()) {
    progress.Note(file.project() + ": " + text);
  }
  if (!reuse.framing || shot.has_new_controls()) file.Leave(film);
}

}  // namespace calmframe
